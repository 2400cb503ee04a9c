"""Unmodified clients of others record into one recorder at the same time; the day's log holds what each sent."""
import json
import os
import re
import shutil
import statistics
import subprocess
import unittest
from collections import namedtuple

from device import BIN, checked, group
from installed import BUILD, TOP, main_with_optional_clients
from recorder import RecordingDevice

# Every client sends the same: a counter of 1 and 2; one of 1 at a rate of 0.1; a gauge that is 10, 0 and
# -7 in turn; durations of 12 and 30, and one of 50 at a rate of 0.1. Chance, asked by clients that
# sample, always says that it is sent.
SCALARS = {"count": 3, "sampled": 10, "gauge": -7}
DURATIONS = [12, 30] + 10 * [50]
LINES = "\n".join(["KEY.count:1|c", "KEY.count:2|c", "KEY.sampled:1|c|@0.1", "KEY.gauge:10|g", "KEY.gauge:0|g",
                   "KEY.gauge:-7|g", "KEY.time:12:30|ms", "KEY.time:50|ms|@0.1"])

PYTHON_STATSD = """
import os, random, statsd
random.random = lambda: 0
def record(client):
    client.incr("count"); client.incr("count", 2); client.incr("sampled", rate=0.1)
    client.gauge("gauge", 10); client.gauge("gauge", -7)
    client.timing("time", 12); client.timing("time", 30); client.timing("time", 50, rate=0.1)
"""
AIODOGSTATSD = """
import asyncio, os, random
random.random = lambda: 0
import aiodogstatsd
async def main():
    async with aiodogstatsd.Client(host="127.0.0.1", port=int(os.environ["PORT"]), namespace=os.environ["KEY"],
                                   constant_tags={"site": "north"}) as client:
        client.increment("count"); client.increment("count", value=2); client.increment("sampled", sample_rate=0.1)
        for value in (10, 0, -7): client.gauge("gauge", value=value)
        client.timing("time", value=12); client.histogram("time", value=30)
        client.distribution("time", value=50, sample_rate=0.1)
asyncio.run(main())
"""
PERL = """
BEGIN { *CORE::GLOBAL::rand = sub (;$) { 0 } }
use Net::Statsd;
($Net::Statsd::HOST, $Net::Statsd::PORT) = ("127.0.0.1", $ENV{PORT});
my $key = $ENV{KEY};
Net::Statsd::increment("$key.count"); Net::Statsd::update_stats("$key.count", 2);
Net::Statsd::increment("$key.sampled", 0.1);
Net::Statsd::gauge("$key.gauge", 10, "$key.gauge", 0, "$key.gauge", -7);
Net::Statsd::timing("$key.time", 12); Net::Statsd::timing("$key.time", 30); Net::Statsd::timing("$key.time", 50, 0.1);
"""
RUBY = """
module Kernel; def rand(*) = 0; end
require "statsd"
client = Statsd.new("127.0.0.1", ENV["PORT"].to_i)
client.namespace = ENV["KEY"]
client.increment "count"; client.count "count", 2; client.increment "sampled", 0.1
client.batch { |batch| [10, 0, -7].each { |value| batch.gauge "gauge", value } }
client.timing "time", 12; client.timing "time", 30; client.timing "time", 50, 0.1
"""
# Both for Node.js have the same functions.
NODE = """
Math.random = () => 0;
const { KEY, PORT, DATAGRAMS } = process.env;
const client = new (require("%s"))(%s);
client.increment("count"); client.increment("count", 2); client.increment("sampled", 1, 0.1);
for (const value of [10, 0, -7]) client.gauge("gauge", value);
client.timing("time", 12); client.histogram("time", 30);
client.timing("time", 50, 0.1, () => client.close());
"""
C = """
#include <stdlib.h>
#include <string.h>
#include <tallyclient/tallyclient.h>
static const char* key(const char* end) {
  static char text[100];
  return strcat(strcpy(text, getenv("KEY")), end);
}
int main(void) {
  tallyclient* client = tallyclient_open(getenv("DATAGRAMS"));
  const double times[] = {12, 30, 50, 50, 50, 50, 50, 50, 50, 50, 50, 50};
  tallyclient_add(client, key(".count"), 1);
  tallyclient_add(client, key(".count"), 2);
  tallyclient_add(client, key(".sampled"), 10);
  tallyclient_set(client, key(".gauge"), 10);
  tallyclient_set(client, key(".gauge"), -7);
  tallyclient_push_many(client, key(".time"), times, 12);
  return tallyclient_close(client);
}
"""
TALLYCTL = """
tallyctl record add $KEY.count
printf 'add %s 2\\nset %s 10\\nset %s -7\\n' $KEY.count $KEY.gauge $KEY.gauge | tallyctl record lines
tallyctl record add $KEY.sampled 10
tallyctl record push $KEY.time 12 30 50 50 50 50 50 50 50 50 50 50
"""

# own: run by the user of the test, who may be the only one to reach its files; each of the others is run
# by a user of its own, if root runs the test.
Client = namedtuple("Client", "needs command own", defaults=[False])
DEBIAN_PYTHON = "/usr/bin/python3"  # for which Debian's modules are


def python(module, text):
    return Client([DEBIAN_PYTHON, "-c", f"import {module}"], [DEBIAN_PYTHON, "-c", text])


def bash(text):
    return ["bash", "-euo", "pipefail", "-c", text]


def netcat(options):  # Debian has another one, without UNIX sockets
    return Client(bash("nc -h 2>&1 | grep -q OpenBSD"), bash('printf %s "$LINES" | nc ' + options))


def socat(address):
    return Client(bash("command -v socat"), bash(f'printf %s "$LINES" | socat -u - "{address}"'))


def node(options, module, *more):
    needs = "".join(f"require('{name}');" for name in (module, *more))
    return Client(["node", "-e", needs], ["node", "-e", NODE % (module, options)], own=True)


CLIENTS = {
    "python3-statsd-stream": python("statsd", PYTHON_STATSD + """
record(statsd.UnixSocketStatsClient(os.environ["STREAM"], prefix=os.environ["KEY"]))"""),
    "python3-statsd-udp": python("statsd", PYTHON_STATSD + """
with statsd.StatsClient("127.0.0.1", int(os.environ["PORT"]), prefix=os.environ["KEY"]).pipeline() as pipeline:
    record(pipeline)"""),
    "python3-aiodogstatsd": python("aiodogstatsd", AIODOGSTATSD),
    "libnet-statsd-perl": Client(["perl", "-MNet::Statsd", "-e1"], ["perl", "-e", PERL]),
    "ruby-statsd": Client(["ruby", "-e", "require 'statsd'"], ["ruby", "-e", RUBY]),
    "hot-shots-datagram": node("{ protocol: 'uds', path: DATAGRAMS, prefix: `${KEY}.` }", "hot-shots", "unix-dgram"),
    "hot-shots-udp": node("{ host: '127.0.0.1', port: +PORT, prefix: `${KEY}.` }", "hot-shots"),
    "node-statsd": node("'127.0.0.1', PORT, `${KEY}.`", "node-statsd"),
    "nc-datagram": netcat('-U -u -q 0 "$DATAGRAMS"'),
    "nc-stream": netcat('-U -q 0 "$STREAM"'),
    "nc-udp": netcat('-u -q 0 127.0.0.1 "$PORT"'),
    "socat-datagram": socat("UNIX-SENDTO:$DATAGRAMS"),
    "socat-stream": socat("UNIX-CONNECT:$STREAM"),
    "tallyctl": Client(bash("command -v tallyctl"), bash(TALLYCTL), own=True),
    "libtallyclient": Client(["ls", BUILD / "libtallyclient.so.0"], ["./client"]),
}
OWNED = [DEBIAN_PYTHON, "-c", """
import os, socket
socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM).sendto(b"com.example.owned:1|c", os.environ["DATAGRAMS"])"""]
NODE_MODULES = TOP / "build/npm-clients/node_modules"  # where scripts/install-deps installs them
FIRST_USER = 20000
IS_ROOT = os.geteuid() == 0


class Clients(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.device = RecordingDevice()
        cls.addClassCleanup(cls.device.remove)
        keys = [f"com.example.{name}" for name in CLIENTS]
        cls.device.whitelist(G=group(
            {**{f"{key}.{scalar}": {} for key in keys for scalar in SCALARS},
             "com.example.owned": {}, "vellum.tallyd.refused.owner": {}},
            {f"{key}.time": {"intervals": [20, 40]} for key in keys}))
        cls.environment = {**os.environ, "PATH": f"{BIN}:{os.environ['PATH']}", "TALLYRUN_ROOT": str(cls.device.root),
                           "NODE_PATH": str(NODE_MODULES), "LD_LIBRARY_PATH": str(cls.device.root),
                           "PORT": str(cls.device.port), "DATAGRAMS": cls.device.socket("statsd.sock"),
                           "STREAM": cls.device.socket("statsd-stream.sock")}
        asked = {name: cls.start(client.needs) for name, client in CLIENTS.items()}
        cls.missing = {name for name, process in asked.items() if cls.outcome(process)[0] != 0}
        if "libtallyclient" not in cls.missing:
            (cls.device.root / "client.c").write_text(C)
            shutil.copy(BUILD / "libtallyclient.so.0", cls.device.root)
            checked("cc", cls.device.root / "client.c", f"-I{TOP / 'include'}", cls.device.root / "libtallyclient.so.0",
                    "-o", cls.device.root / "client")
        running = {}
        for user, (name, client) in enumerate(CLIENTS.items(), FIRST_USER):
            if name not in cls.missing:
                key = f"com.example.{name}"
                running[name] = cls.start(client.command, None if client.own else user, KEY=key,
                                          LINES=LINES.replace("KEY", key))
        cls.ended = {name: cls.outcome(process) for name, process in running.items()}
        for user in (None, FIRST_USER):  # the first one owns the key
            cls.outcome(cls.start(OWNED, user))
        cls.status = json.loads(cls.device.tool("--json", "recorder"))
        cls.stored_before = cls.device.tool("store", "dump")
        cls.device.run("-f", day=cls.device.today)
        cls.log = cls.device.log()

    @classmethod
    def start(cls, command, user=None, **environment):
        """As that user, if root runs the test. None without the program."""
        other = {"user": user, "group": user, "extra_groups": []} if user and IS_ROOT else {}
        try:
            return subprocess.Popen(command, cwd=cls.device.root, env={**cls.environment, **environment}, text=True,
                                    stdout=subprocess.PIPE, stderr=subprocess.STDOUT, **other)
        except FileNotFoundError:
            return None

    @staticmethod
    def outcome(process):
        """The exit status and what was printed."""
        if process is None:
            return 127, ""
        printed, _ = process.communicate(timeout=60)
        return process.returncode, printed

    def check(self, name):
        if name in self.missing:
            self.skipTest(f"the client {name} is missing and could not be installed")
        self.assertEqual(self.ended[name][0], 0, self.ended[name][1])
        key = f"com.example.{name}"
        self.assertEqual({scalar: self.log["TBScalars"].get(f"{key}.{scalar}") for scalar in SCALARS}, SCALARS)
        *range_, mean, squares, count = self.log["TBDistributions"][f"{key}.time"]
        self.assertEqual((range_, count), ([12, 50], 12))
        self.assertAlmostEqual(mean, statistics.mean(DURATIONS))
        self.assertAlmostEqual(squares, 12 * statistics.pvariance(DURATIONS))
        self.assertEqual(self.log["TBDistributionsHistogram"][f"{key}.time"],
                         {"(-inf, 20]": 1, "(20, 40]": 1, "(40, inf)": 10})

    def test_the_daily_run_has_what_was_in_memory_committed(self):
        self.assertNotIn("com.example.", self.stored_before)
        self.assertIn("com.example.owned", self.device.tool("store", "dump"))

    @unittest.skipUnless(IS_ROOT, "only root can record as other users")
    def test_a_key_is_its_first_users(self):
        self.assertEqual(self.log["TBScalars"]["com.example.owned"], 1)
        self.assertEqual(self.log["TBScalars"]["vellum.tallyd.refused.owner"], 1)
        keys = {user["user"]: (user["keys"], user["refused"]) for user in self.status["users"]}
        self.assertEqual(keys[FIRST_USER][1], {"owner": 1})
        for user, (name, client) in enumerate(CLIENTS.items(), FIRST_USER):
            if re.search("-stream|-datagram|client", name) and not client.own and name not in self.missing:
                self.assertEqual(keys[user][0], len(SCALARS) + 1, name)


for client_name in CLIENTS:
    setattr(Clients, f"test_{client_name}", lambda self, name=client_name: self.check(name))


if __name__ == "__main__":
    main_with_optional_clients()
