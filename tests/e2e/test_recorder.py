"""tallyd as programs and operators meet it, and what becomes of recordings when something breaks."""
import contextlib
import os
import plistlib
import random
import resource
import socket
import sqlite3
import subprocess
import sys
import time
import unittest

from device import BIN, NOON, STORE, TODAY, DeviceTest, group

NOBODY = 65534
AS_ROOT = unittest.skipUnless(os.geteuid() == 0, "needs a second user")


def eventually(condition, seconds=30):
    end = time.monotonic() + seconds
    while not (result := condition()) and time.monotonic() < end:
        time.sleep(0.02)
    assert result, "it did not happen"
    return result


class Recorder(DeviceTest):
    def setUp(self):
        super().setUp()
        self.root = self.device.root
        os.chmod(self.root, 0o755)
        (self.root / "var/mobile").mkdir(parents=True)
        self.clock = self.root / "clock"
        self.process = None
        self.addCleanup(self.stop)

    def set_clock(self, day, seconds=NOON):
        staged = self.clock.with_name("clock.new")
        staged.write_text(time.strftime("@%Y-%m-%d %H:%M:%S", time.gmtime(day * 86400 + seconds)))
        staged.rename(self.clock)

    def start(self, day=TODAY, **settings):
        self.device.write("Library/Preferences/tallyd.plist", settings)
        self.set_clock(day)
        environment = self.device.environment(day, FAKETIME_TIMESTAMP_FILE=str(self.clock), FAKETIME_NO_CACHE="1")
        del environment["FAKETIME"]
        self.process = subprocess.Popen([BIN / "tallyd"], stderr=subprocess.PIPE, env=environment)
        self.path = str(self.root / "run/tallyd/statsd.sock")
        eventually(lambda: self.ask("status"))

    def stop(self, status=0, asked=False):
        if self.process is None:
            return ""
        if not asked:
            self.process.terminate()
        errors = self.process.communicate(timeout=100)[1].decode()
        self.assertEqual(self.process.returncode, status, errors)
        self.process = None
        return errors

    def send(self, *lines):
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as client:
            client.connect(self.path)
            client.send("\n".join(lines).encode())

    def ask(self, question):
        try:
            with socket.socket(socket.AF_UNIX) as control:
                control.connect(str(self.root / "run/tallyd/control.sock"))
                control.sendall(question.encode() + b"\n")
                return control.makefile("rb").read()
        except OSError:
            return b""

    def status(self):
        return plistlib.loads(self.ask("status"))

    def commit(self):
        self.assertEqual(self.ask("commit"), b"done\n")

    def rows(self, query):
        with contextlib.closing(sqlite3.connect(self.root / STORE)) as store:
            return store.execute(query).fetchall()

    def scalars(self, day=TODAY):
        return dict(self.rows(f"SELECT key, value FROM scalars WHERE day = {day} AND key NOT LIKE 'vellum.%'"))

    def test_what_was_sent_is_in_the_log_of_its_day(self):
        self.device.whitelist(G=group({"shop.orders": {}, "shop.open": {}, "vellum.tallyd.refused.set": {}},
                                      {"shop.time": {"intervals": [0, 10, 100]}}))
        self.start(day=TODAY - 1)
        self.send("shop.orders:1|c|@0.1", "shop.orders:5|c", "shop.open:0|g", "shop.open:-4|g", "x:y|s",
                  "shop.time:5:50:50|ms|@0.5")
        eventually(lambda: self.status()["metrics"] == 7)
        # Nothing was committed yet; the next day's run asks for it.
        self.set_clock(TODAY, 300)
        self.device.run("-f")
        log = self.device.log()
        self.assertEqual(log["TBScalars"], {"shop.orders": 15, "shop.open": -4, "vellum.tallyd.refused.set": 1})
        self.assertEqual(log["TBDistributions"]["shop.time"][-1], 6, "each sample stands for two")
        self.assertEqual(log["TBDistributions"]["shop.time"][2], 35)
        self.assertEqual(sorted(log["TBDistributionsHistogram"]["shop.time"].values()), [2, 4])

    def test_a_clock_that_steps(self):
        self.start(day=0)
        self.send("a:1|c", "t:1|ms")
        self.commit()
        self.assertEqual(self.rows("SELECT count(*) FROM scalars"), [(0,)])
        self.send("a:1|c")
        eventually(lambda: self.status()["metrics"] == 3)
        self.set_clock(TODAY, NOON)
        self.send("a:1|c")
        eventually(lambda: self.status()["metrics"] == 4)
        self.commit()
        self.assertEqual(self.scalars(), {"a": 3})
        self.assertEqual(self.rows("SELECT day, key, samples FROM arrivals"), [(TODAY, "t", 1)])
        # Across midnight and back, as a correction of some seconds may go.
        self.set_clock(TODAY + 1, 5)
        self.send("a:10|c")
        eventually(lambda: self.status()["metrics"] == 5)
        self.set_clock(TODAY, 86390)
        self.send("a:100|c")
        eventually(lambda: self.status()["metrics"] == 6)
        self.set_clock(TODAY + 1, 10)
        self.send("a:1000|c")
        eventually(lambda: self.status()["metrics"] == 7)
        self.commit()
        total = sum(value for value, in self.rows("SELECT value FROM scalars WHERE key = 'a'"))
        self.assertEqual(total, 1113)
        self.assertEqual(self.rows("SELECT count(*) FROM undated"), [(0,)])

    def test_killed_at_any_moment_it_keeps_what_it_acknowledged(self):
        acknowledged = sent = 0
        for _ in range(8):
            self.start()
            for _ in range(random.randrange(1, 4)):
                for _ in range(20):
                    self.send("a:1|c", "t:1|ms")
                    sent += 1
                self.commit()
                acknowledged = sent
            self.send("a:1|c", "t:1|ms")
            sent += 1
            if random.random() < 0.5:
                with socket.socket(socket.AF_UNIX) as control:
                    control.connect(str(self.root / "run/tallyd/control.sock"))
                    control.sendall(b"commit\n")
                    time.sleep(random.random() * 0.01)
            self.process.kill()
            self.process.communicate()
            self.process = None
            (counted, samples), = self.rows(
                "SELECT value, (SELECT sum(weight) FROM arrivals) FROM scalars WHERE key = 'a'")
            self.assertEqual(counted, samples, "a commit is whole")
            self.assertIn(counted, range(acknowledged, sent + 1))
            sent = acknowledged = counted
        self.assertEqual(self.rows("PRAGMA integrity_check"), [("ok",)])

    def test_a_store_that_cannot_be_written_for_a_while(self):
        self.start()
        self.send("a:1|c")
        self.commit()
        # A full disk: files may not grow.
        least = resource.prlimit(self.process.pid, resource.RLIMIT_FSIZE, (4096, resource.RLIM_INFINITY))
        self.send("a:1|c", *(f"k{i}:1|c" for i in range(500)))
        self.assertIn(b"failed: ", self.ask("commit"))
        resource.prlimit(self.process.pid, resource.RLIMIT_FSIZE, least)
        self.commit()
        self.assertEqual(len(self.scalars()), 501)
        # Another writer.
        with contextlib.closing(sqlite3.connect(self.root / STORE, isolation_level=None)) as other:
            other.execute("BEGIN IMMEDIATE")
            asked = subprocess.Popen([sys.executable, "-c", "import socket, sys; s = socket.socket(socket.AF_UNIX); "
                                      "s.connect(sys.argv[1]); s.send(b'commit\\n'); print(s.recv(99).decode())",
                                      self.root / "run/tallyd/control.sock"], stdout=subprocess.PIPE)
            for _ in range(1000):
                self.send("a:1|c")
            self.assertEqual(eventually(lambda: self.status())["commits"], 2, "it goes on while it waits")
            other.execute("INSERT INTO scalars VALUES (?, 'other', 1)", (TODAY,))
            other.execute("COMMIT")
        self.assertEqual(asked.communicate(timeout=90)[0], b"done\n\n")
        self.stop()
        self.assertEqual(self.scalars()["a"], 1002)
        self.assertEqual(self.scalars()["other"], 1)

    @AS_ROOT
    def test_a_user_floods_and_another_is_recorded(self):
        self.start(KeysPerUser=1000)
        # As many different keys and samples as fit.
        flood = ("import os, socket, sys; os.setuid(65534); s = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)\n"
                 "s.connect(sys.argv[1]); i = 0\n"
                 "while True: i += 1; s.send(b'\\n'.join(b'f%d:1|c\\nflood:%d.5|h' % (i * 50 + j, i) for j in range(50)))")
        flooders = [subprocess.Popen([sys.executable, "-c", flood, self.path]) for _ in range(2)]
        try:
            eventually(lambda: self.status()["refused"].get("keys_of_user"))
            with socket.socket(socket.AF_UNIX) as client:
                client.connect(str(self.root / "run/tallyd/statsd-stream.sock"))
                for i in range(20000):
                    client.sendall(b"mine:1|c\nmy.time:%d|ms\nflood:1|h\n" % i)
        finally:
            for flooder in flooders:
                flooder.kill()
                flooder.wait()
        own = eventually(lambda: next((user for user in self.status()["users"]
                                       if user["user"] == 0 and user["metrics"] == 40000), None))
        self.assertEqual(own["refused"], {"owner": 20000})
        self.commit()
        self.assertEqual(self.scalars()["mine"], 20000)
        self.assertEqual(self.rows("SELECT sum(weight) FROM arrivals WHERE key = 'my.time'"), [(20000,)])

    @AS_ROOT
    def test_another_user_reads_and_commands_nothing(self):
        self.start()
        self.send("secret:1|c")
        self.commit()
        script = ("import os, socket, sys; os.setgroups([]); os.setgid(65534); os.setuid(65534); root = sys.argv[1]\n"
                  "c = socket.socket(socket.AF_UNIX)\n"
                  "for attempt in (lambda: c.connect(root + '/run/tallyd/control.sock'), lambda: open(sys.argv[2]),\n"
                  "                lambda: os.remove(root + '/run/tallyd/statsd.sock')):\n"
                  "    try: attempt(); print('done')\n"
                  "    except PermissionError: print('refused')\n")
        output = subprocess.check_output([sys.executable, "-c", script, self.root, self.root / STORE], text=True)
        self.assertEqual(output.split(), ["refused"] * 3)

    def test_what_comes_while_it_ends_is_for_the_next_one(self):
        """As on an upgrade: systemd keeps the sockets, here the test does."""
        folder = self.root / "run/tallyd"
        folder.mkdir(parents=True)
        self.device.tool("store", "set", "made", "1")
        day = int(time.time()) // 86400
        self.path = str(folder / "statsd.sock")
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as metrics, socket.socket(socket.AF_UNIX) as control:
            metrics.bind(self.path)
            metrics.setsockopt(socket.SOL_SOCKET, socket.SO_PASSCRED, 1)
            control.bind(str(folder / "control.sock"))
            control.listen()

            def start(metrics_read):
                passed = [metrics.fileno(), control.fileno()]
                self.process = subprocess.Popen(
                    ["sh", "-c", f'exec 3<&{passed[0]} 4<&{passed[1]}; LISTEN_FDNAMES=metrics:control LISTEN_PID=$$ '
                     'LISTEN_FDS=2 exec "$0"', BIN / "tallyd"],
                    pass_fds=passed, env=self.device.environment(), stderr=subprocess.PIPE)
                eventually(lambda: self.status()["metrics"] == metrics_read)

            self.send("a:1|c")
            start(1)
            with contextlib.closing(sqlite3.connect(self.root / STORE, isolation_level=None)) as other:
                other.execute("BEGIN IMMEDIATE")
                self.process.terminate()
                eventually(lambda: len(os.listdir(f"/proc/{self.process.pid}/task")) == 2)
                self.send("a:10|c")
                other.execute("COMMIT")
            self.stop(asked=True)
            self.assertEqual(self.scalars(day)["a"], 1)
            start(1)
            self.stop()
            self.assertEqual(self.scalars(day)["a"], 11)

    def test_a_thousand_connections(self):
        self.start()
        path = str(self.root / "run/tallyd/statsd-stream.sock")
        with contextlib.ExitStack() as clients:
            sockets = [clients.enter_context(socket.socket(socket.AF_UNIX)) for _ in range(1000)]
            for client in sockets:
                client.connect(path)
            for half in (b"many:", b"1|c\n", b"many:1|"):
                for client in sockets:
                    client.sendall(half)
            eventually(lambda: self.status()["metrics"] == 1000)
            for client in sockets:
                client.sendall(b"c")  # the end of the connection ends the line
        eventually(lambda: self.status()["metrics"] == 2000)

    def test_it_sleeps_while_nothing_comes(self):
        self.start()
        self.send("a:1|c")
        self.commit()
        time.sleep(1.5)  # the memory of a burst is returned after a second

        def switches():
            with open(f"/proc/{self.process.pid}/status") as status:
                return [line for line in status if line.startswith("voluntary_ctxt")]
        before = switches()
        time.sleep(1)
        self.assertEqual(switches(), before)

    def test_two_at_once_and_directories_of_others(self):
        self.start()
        second = subprocess.run([BIN / "tallyd"], capture_output=True, env=self.device.environment(), timeout=60)
        self.assertEqual(second.returncode, 1)
        self.assertEqual(len(second.stderr.splitlines()), 1, second.stderr)
        self.send("a:1|c")
        self.stop()
        self.assertEqual(self.scalars(), {"a": 1})
        (self.root / "run/tallyd").rename(self.root / "run/elsewhere")
        (self.root / "run/tallyd").symlink_to(self.root / "run/elsewhere")
        (self.root / "run").chmod(0o777)
        hostile = subprocess.run([BIN / "tallyd"], capture_output=True, env=self.device.environment(), timeout=60)
        self.assertEqual(hostile.returncode, 1, hostile.stderr)


if __name__ == "__main__":
    unittest.main()
