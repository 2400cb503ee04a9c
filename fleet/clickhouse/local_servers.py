"""ClickHouse servers of one's own on this machine: on loopback, on free ports, below a folder, with bounded
memory. Together they are the shards of the cluster "fleet". For tests, benchmarks and the demonstration."""
import contextlib
import pathlib
import shutil
import socket
import subprocess
import time
import urllib.error
import urllib.request

LONGEST = 1200  # seconds after which a server ends, also if whoever started it is gone
SECONDS_TO_START = 60
BYTES_OF_A_QUERY = 2 << 30

CONFIG = """<yandex>
  <logger><level>warning</level><log>{folder}/log</log><errorlog>{folder}/errors</errorlog></logger>
  <listen_host>127.0.0.1</listen_host>
  <http_port>{http}</http_port><tcp_port>{tcp}</tcp_port><interserver_http_port>{between}</interserver_http_port>
  <interserver_http_host>127.0.0.1</interserver_http_host>
  <path>{folder}/data/</path><tmp_path>{folder}/tmp/</tmp_path>
  <users_config>{folder}/users.xml</users_config>
  <default_profile>default</default_profile><default_database>default</default_database>
  <mark_cache_size>67108864</mark_cache_size><uncompressed_cache_size>0</uncompressed_cache_size>
  <remote_servers><fleet>{shards}</fleet></remote_servers>
</yandex>
"""
SHARD = "<shard><replica><host>127.0.0.1</host><port>{}</port></replica></shard>"
USERS = f"""<yandex>
  <profiles><default><max_memory_usage>{BYTES_OF_A_QUERY}</max_memory_usage></default></profiles>
  <users><default><password></password><networks><ip>127.0.0.1</ip></networks>
    <profile>default</profile><quota>default</quota></default></users>
  <quotas><default></default></quotas>
</yandex>
"""


def available():
    return shutil.which("clickhouse-server", path="/usr/bin:/usr/sbin:/usr/local/bin") is not None


def free_ports(count):
    with contextlib.ExitStack() as stack:
        sockets = [stack.enter_context(socket.socket()) for _ in range(count)]
        for each in sockets:
            each.bind(("127.0.0.1", 0))
        return [each.getsockname()[1] for each in sockets]


class Server:
    def __init__(self, folder, ports, shards):
        self.http, self.tcp, between = ports
        self.address = f"127.0.0.1:{self.http}"
        for name in ("data", "tmp"):
            (folder / name).mkdir(parents=True, exist_ok=True)
        (folder / "users.xml").write_text(USERS)
        (folder / "config.xml").write_text(
            CONFIG.format(folder=folder, http=self.http, tcp=self.tcp, between=between, shards=shards))
        self.output = open(folder / "output", "wb")
        self.process = subprocess.Popen(
            ["timeout", "--signal=KILL", str(LONGEST), shutil.which("clickhouse-server", path="/usr/bin:/usr/sbin:/usr/local/bin"),
             f"--config-file={folder}/config.xml"],
            cwd=folder, stdin=subprocess.DEVNULL, stdout=self.output, stderr=subprocess.STDOUT)

    def query(self, sql):
        with urllib.request.urlopen(f"http://{self.address}/", data=sql.encode(), timeout=60) as response:
            return response.read().decode()

    def wait(self):
        deadline = time.monotonic() + SECONDS_TO_START
        while time.monotonic() < deadline and self.process.poll() is None:
            try:
                self.query("SELECT 1")
                return
            except (urllib.error.URLError, OSError):
                time.sleep(0.1)
        raise RuntimeError(f"the server on {self.address} does not start")

    def stop(self):
        self.process.terminate()  # which timeout passes on
        try:
            self.process.wait(20)
        except subprocess.TimeoutExpired:
            self.process.kill()
            self.process.wait()
        self.output.close()


@contextlib.contextmanager
def running(folder, count=1):
    """That many servers, which know each other as shards."""
    ports = free_ports(3 * count)
    shards = "".join(SHARD.format(ports[3 * number + 1]) for number in range(count))
    servers = []
    try:
        for number in range(count):
            servers.append(Server(pathlib.Path(folder) / f"server-{number}", ports[3 * number:3 * number + 3], shards))
        for server in servers:
            server.wait()
        yield servers
    finally:
        for server in servers:
            server.stop()
