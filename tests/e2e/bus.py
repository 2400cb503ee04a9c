"""A private message bus that starts the program for a device, as the machine's own bus would."""
import contextlib
import os
import pathlib
import shutil
import signal
import subprocess
import tempfile
import threading
import time

from device import Device, parse_messages, texts

# The real day: a clock that is faked fakes the event loop's timers too. A test must not meet midnight.
if 86400 - time.time() % 86400 < 300:
    time.sleep(301)
TODAY = int(time.time() // 86400)
NAME = "vellum.tallyd.tallyrun"
OBJECT = "/vellum/tallyd/tallyrun"
CONFIG = """<busconfig><type>system</type><listen>unix:path={folder}/socket</listen>
<servicedir>{folder}/services</servicedir><limit name="max_replies_per_connection">50000</limit>
<policy context="default"><allow user="*"/>{rules}</policy>{include}</busconfig>"""
OPEN = {"rules": '<allow own="*"/><allow send_destination="*" eavesdrop="true"/><allow eavesdrop="true"/>',
        "include": ""}
# As the machine's system bus has it: what no policy allows is refused.
SHIPPED = {"rules": """<deny own="*"/><deny send_type="method_call"/>
<allow send_type="signal"/><allow send_requested_reply="true" send_type="method_return"/>
<allow send_requested_reply="true" send_type="error"/><allow receive_type="method_call"/>
<allow receive_type="method_return"/><allow receive_type="error"/><allow receive_type="signal"/>
<allow send_destination="org.freedesktop.DBus"/>""",
           "include": f"<include>{pathlib.Path(__file__).parents[2]}/packaging/dbus/system.conf</include>"}


class BusDevice(Device):
    """A device, a bus, and the messages of every run that the bus started."""
    today = TODAY
    address = None  # until there is a bus

    def __init__(self, root=None, shipped_policy=False):
        super().__init__(root)
        self.shipped_policy = shipped_policy
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-bus-"))
        self.folder.chmod(0o755)  # another user has to reach the socket
        self.address = f"unix:path={self.folder}/socket"
        self.messages_file = self.folder / "messages"
        self.messages_file.touch()
        (self.folder / "services").mkdir()
        starter = self.folder / "start"
        wanted = ("TALLYRUN", "DBUS", "ASAN", "UBSAN", "LANG", "LC_", "TZ", "PATH")
        exports = "".join(f"export {key}='{value}'\n" for key, value in self.environment().items()
                          if key.startswith(wanted))
        command = " ".join(f"'{part}'" for part in self.command())
        starter.write_text(f"#!/bin/sh\n{exports}echo $$ > {self.folder}/pid\n"
                           f"exec {command} 2>> {self.messages_file}\n")
        starter.chmod(0o755)
        (self.folder / "services" / f"{NAME}.service").write_text(
            f"[D-BUS Service]\nName={NAME}\nExec={starter}\nUser=root\n")
        config = self.folder / "config"
        config.write_text(CONFIG.format(folder=self.folder, **(SHIPPED if shipped_policy else OPEN)))
        with open(self.folder / "daemon", "wb") as errors:
            self.daemon = subprocess.Popen(["dbus-daemon", f"--config-file={config}", "--nofork",
                                            "--nopidfile", "--nosyslog"], stderr=errors)
        self.until(lambda: (self.folder / "socket").exists(), 30, "the bus")

    def remove(self):
        self.daemon.terminate()
        self.daemon.wait()
        shutil.rmtree(self.folder, ignore_errors=True)
        super().remove()

    def environment(self, day=None, *moment, **more):
        bus = {f"DBUS_{kind}_BUS_ADDRESS": self.address for kind in ("SYSTEM", "SESSION") if self.address}
        return super().environment(day, *moment, **bus, **more)

    def messages(self):
        return parse_messages(self.messages_file.read_bytes())

    def default_texts(self):
        return texts(self.messages(), "default")

    def error_texts(self):
        return texts(self.messages(), "error")

    def until(self, condition, seconds, what):
        end = time.monotonic() + seconds
        while not condition():
            assert time.monotonic() < end, f"{what}: not after {seconds} s: {self.messages()[-9:]}"
            time.sleep(0.05)

    def wait_for_end(self, runs=1, seconds=150):
        self.until(lambda: self.messages_file.read_bytes().count(b"tallyrun ended") >= runs,
                   seconds, "the end of the run")
        return self.default_texts()

    @contextlib.contextmanager
    def kept_awake(self):
        """Sends messages without effect meanwhile, since a slow machine may need more than the ten quiet seconds
        after which the run ends."""
        done = threading.Event()

        def ping():
            while not done.wait(2):
                self.dbus_send("string:ping")
        thread = threading.Thread(target=ping)
        thread.start()
        try:
            yield
        finally:
            done.set()
            thread.join()

    @contextlib.contextmanager
    def suspended(self):
        """Stops the running program, so that a sender is gone before its message is read."""
        process = int((self.folder / "pid").read_text())
        os.kill(process, signal.SIGSTOP)
        try:
            yield
        finally:
            os.kill(process, signal.SIGCONT)

    def kill_daemon(self):
        self.daemon.send_signal(signal.SIGKILL)
        self.daemon.wait()

    def busctl(self, *fields, count=1, user=None, status=0, waits=True):
        return self.client("busctl", f"--address={self.address}",
                           f"--expect-reply={'yes' if waits else 'no'}", "--", "call", NAME, OBJECT, NAME, "Send",
                           "a{sv}", str(count), *fields, user=user, status=status)

    def gdbus(self, dictionary):
        return self.client("gdbus", "call", "--address", self.address, "--dest", NAME,
                           "--object-path", OBJECT, "--method", f"{NAME}.Send", dictionary)

    def dbus_send(self, *arguments, status=0):
        return self.client("dbus-send", f"--bus={self.address}", "--print-reply", f"--dest={NAME}",
                           OBJECT, f"{NAME}.Send", *arguments, status=status)

    def client(self, *command, user=None, status=0):
        result = subprocess.run(command, capture_output=True, timeout=120, user=user,
                                env=self.environment())
        assert result.returncode == status, (command[:3], result.returncode, result.stderr[-1000:])
        return (result.stdout + result.stderr).decode()

    def monitor(self):
        """Starts to record the signals of the program's notifications."""
        with open(self.folder / "signals", "wb") as output:
            process = subprocess.Popen(["dbus-monitor", "--address", self.address, "--profile",
                                        "type='signal',path='/vellum'"], stdout=output)
        time.sleep(0.5)
        return process

    def signals(self):
        lines = (self.folder / "signals").read_text().splitlines()
        return [tuple(line.split("\t")[5:8]) for line in lines if "\t/vellum\t" in line]
