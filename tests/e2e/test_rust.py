"""The examples in Rust, compiled against the installed libraries, if there is a compiler."""
import shutil
import unittest

from device import Device, checked
from installed import REGISTRY, TOP, Installed, main_with_optional_clients


class Rust(Installed):
    @unittest.skipUnless(shutil.which("rustc"), "rustc is missing and could not be installed")
    def test_examples(self):
        device = Device()
        self.addCleanup(device.remove)
        device.write("device/registry.plist", REGISTRY)
        self.check_counters(device, self.compiled("hwreport/counters.rs"))
        self.check_health(self.compiled("storage/health.rs"))

    def compiled(self, source):
        program = self.folder / source.rpartition("/")[2].removesuffix(".rs")
        checked("rustc", "-O", TOP / "examples" / source, "-L", self.library,
                "-C", f"link-arg=-Wl,-rpath-link,{self.library}", "-o", program)
        return program


if __name__ == "__main__":
    main_with_optional_clients()
