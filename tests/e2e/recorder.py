"""A device whose recorder runs; the day of its runs is the next one, so that their log has what was recorded."""
import socket
import subprocess
import time

from device import BIN, Device

DAY = 86400
PATIENCE = 60


def free_port():
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as probe:
        probe.bind(("127.0.0.1", 0))
        return probe.getsockname()[1]


class RecordingDevice(Device):
    def __init__(self):
        # The recorder's clock is the machine's: libfaketime spoils its timers. A test ends on its day.
        while DAY - time.time() % DAY < PATIENCE / 2:
            time.sleep(1)
        self.today = int(time.time() / DAY) + 1
        super().__init__()
        self.root.chmod(0o755)  # any user may record
        self.port = free_port()
        self.recorder = subprocess.Popen([BIN / "tallyd", "--udp", f"127.0.0.1:{self.port}"], env=self.environment())
        try:
            self.wait()
        except AssertionError:
            self.remove()
            raise

    def wait(self):
        end = time.monotonic() + PATIENCE
        while subprocess.run([BIN / "tallyctl", "--root", self.root, "recorder"], capture_output=True,
                             check=False).returncode != 0:
            assert self.recorder.poll() is None and time.monotonic() < end, "the recorder does not answer"
            time.sleep(0.02)

    def commit(self):
        with socket.socket(socket.AF_UNIX) as control:
            control.connect(self.socket("control.sock"))
            control.sendall(b"commit\n")
            assert control.makefile().read() == "done\n"

    def remove(self):
        self.recorder.terminate()
        self.recorder.wait(timeout=PATIENCE)
        super().remove()

    def socket(self, name):
        return str(self.root / "run/tallyd" / name)
