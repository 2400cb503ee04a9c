"""The Debian package: installed into a clean root, used there, and gone again but for the data."""
import os
import pathlib
import re
import shutil
import subprocess
import tempfile
import unittest

from bus import BusDevice, NAME, TODAY
from device import BIN, group

BUILD = BIN.parent
DATA = {"var", "Library"}  # what a device recorded stays
STAMP_FOLDERS = {"var/lib/systemd", "var/lib/systemd/timers"}  # the system's own


def run(*command, **options):
    result = subprocess.run(command, capture_output=True, timeout=280, check=False, **options)
    assert result.returncode == 0, (command, (result.stdout + result.stderr).decode()[-3000:])
    return result.stdout.decode()


class PackagedDevice(BusDevice):
    """A bus that starts the installed program."""

    def __init__(self, program):
        self.program = program
        super().__init__()

    def command(self, *arguments):
        return [str(self.program), *arguments]


class Package(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-package-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        run("cpack", "--config", str(BUILD / "CPackConfig.cmake"), "-B", str(cls.folder / "made"))
        cls.packages = sorted((cls.folder / "made").glob("*.deb"))
        cls.package = next(path for path in cls.packages if path.name.startswith("tallyrun_"))

    def clean_root(self):
        root = pathlib.Path(tempfile.mkdtemp(prefix="root-", dir=self.folder))
        (root / "var/lib/dpkg/info").mkdir(parents=True)
        (root / "var/lib/dpkg/updates").mkdir()
        (root / "var/lib/dpkg/status").touch()
        return root

    def dpkg(self, root, *arguments):
        return run("dpkg", f"--root={root}", "--force-script-chrootless", "--force-depends",
                   "--force-not-root", "--log=/dev/null", *arguments)

    def files(self, root):
        return {str(path.relative_to(root)) for path in root.rglob("*")
                if not str(path.relative_to(root)).startswith("var/lib/dpkg")}

    def test_installed_used_and_removed(self):
        root = self.clean_root()
        before = self.files(root)
        self.dpkg(root, "-i", str(self.package))
        wanted = ["usr/bin/tallyrun", "usr/bin/tallyctl", "usr/share/man/man1/tallyrun.1.gz",
                  "usr/share/man/man1/tallyctl.1.gz", "usr/lib/systemd/system/tallyrun.service",
                  "usr/lib/systemd/system/timers.target.wants/tallyrun-day.timer",
                  f"usr/share/dbus-1/system-services/{NAME}.service",
                  f"usr/share/dbus-1/services/{NAME}.service",
                  f"usr/share/dbus-1/system.d/{NAME}.conf",
                  "usr/share/bash-completion/completions/tallyctl", "Library/Preferences", "var/mobile"]
        self.assertLessEqual(set(wanted), self.files(root))
        self.assertTrue((root / wanted[5]).resolve().is_file())
        self.use(root)
        # The machine's own root is the device, as it is when it is installed for real.
        (root / "var/mobile/Library").mkdir()
        (root / "var/mobile/Library/log").write_text("data")
        self.dpkg(root, "-P", "tallyrun")
        left = self.files(root) - before
        self.assertEqual({path for path in left if path.split("/")[0] not in DATA}, set())
        self.assertIn("var/mobile/Library/log", left)

    def use(self, root):
        """Two messages with stock tools, and the app list is in the day's log."""
        device = PackagedDevice(root / "usr/bin/tallyrun")
        self.addCleanup(device.remove)
        device.whitelist(G=group({"a": {}}))
        device.store([("a", TODAY - 1, 1)])
        device.busctl("operation", "x", "0")
        device.gdbus("{'operation': <int64 2>, 'app_data': <@aa{sv} []>}")
        device.wait_for_end()
        self.assertEqual(device.log()["TBActivatedAppInfo"], [])
        output = run("dbus-daemon", f"--config-file={self.policy(root)}", "--print-address=1", "--fork",
                     "--print-pid=1")
        os.kill(int(output.split()[-1]), 15)

    def policy(self, root):
        """A bus configuration of the installed policy alone: it has to be one that the bus takes."""
        config = self.folder / "policy.conf"
        config.write_text(f"<busconfig><type>system</type><listen>unix:path={self.folder}/s</listen>"
                          f"<includedir>{root}/usr/share/dbus-1/system.d</includedir>"
                          f"<servicedir>{root}/usr/share/dbus-1/system-services</servicedir></busconfig>")
        return config

    def test_removal_without_data_leaves_nothing(self):
        root = self.clean_root()
        before = self.files(root)
        self.dpkg(root, "-i", str(self.package))
        stamp = root / "var/lib/systemd/timers/stamp-tallyrun-day.timer"
        stamp.parent.mkdir(parents=True)
        stamp.touch()  # as the timer of a running system does
        self.dpkg(root, "-P", "tallyrun")
        self.assertEqual(self.files(root) - before - {"usr", "var", *STAMP_FOLDERS}, set())

    @unittest.skipUnless(shutil.which("systemd-tmpfiles"), "systemd-tmpfiles is missing")
    def test_a_home_stays_as_its_user_has_it(self):
        root = self.clean_root()
        home = root / "var/mobile"
        home.mkdir()
        home.chmod(0o700)
        self.dpkg(root, "-i", str(self.package))
        run("systemd-tmpfiles", f"--root={root}", "--create", "tallyrun.conf")
        # Whatever root made there would be root's, and the user could not read what comes into it.
        self.assertEqual((home.stat().st_mode & 0o777, list(home.iterdir())), (0o700, []))

    @unittest.skipUnless(shutil.which("systemd-analyze"), "systemd-analyze is missing")
    def test_units_are_sound(self):
        root = self.clean_root()
        self.dpkg(root, "-i", str(self.package))
        units = root / "usr/lib/systemd/system"
        for unit in units.glob("*.service"):  # the program is not installed on this machine
            unit.write_text(unit.read_text().replace("/usr/bin/", f"{root}/usr/bin/"))
            exposure = run("systemd-analyze", "security", "--offline=true", "--threshold=30", str(unit))
            self.assertRegex(exposure, "Overall exposure level")
        result = subprocess.run(["systemd-analyze", "verify", "--man=no",
                                 *map(str, units.glob("tallyrun*"))], capture_output=True, check=False)
        complaints = [line for line in result.stderr.decode().splitlines() if "tallyrun" in line]
        self.assertEqual((result.returncode, complaints), (0, []), result.stderr)

    @unittest.skipUnless(shutil.which("lintian"), "lintian is missing")
    def test_the_packages_have_no_serious_faults(self):
        found = subprocess.run(["lintian", "--allow-root", "--fail-on", "none", *map(str, self.packages)],
                               capture_output=True, timeout=280, check=False).stdout.decode()
        self.assertEqual(re.findall(r"^E: .*", found, re.M), [], found)

    def test_completion_offers_what_the_tool_has(self):
        script = pathlib.Path(__file__).parents[2] / "packaging/completion/tallyctl"
        cases = [  # words, one of the proposals
            (["tallyctl", "ta"], "tasking"), (["tallyctl", "send", ""], "apps"),
            (["tallyctl", "--root", "/", "tasking", "apply", "--d"], "--dry-run"),
            (["tallyctl", "store", "im"], "import")]
        for words, wanted in cases:
            with self.subTest(words):
                code = (f'source {script}; COMP_WORDS=({" ".join(map(repr, words))}); '
                        f'COMP_CWORD={len(words) - 1}; _tallyctl; echo "${{COMPREPLY[@]}}"')
                environment = dict(os.environ, PATH=f"{BIN}:{os.environ['PATH']}")
                self.assertIn(wanted, run("bash", "-c", code, env=environment).split())


if __name__ == "__main__":
    unittest.main()
