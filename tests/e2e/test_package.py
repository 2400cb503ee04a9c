"""The Debian package: installed into a clean root, used, and removed again except for the data."""
import os
import pathlib
import re
import shutil
import subprocess
import tempfile
import unittest

from device import BIN, Device, LAST_DAY, PROGRAM_DOMAIN as NAME, TODAY, checked, group

BUILD = BIN.parent
DATA = {"var", "Library"}  # what a device recorded stays
WANTED = "etc/systemd/system"
TIMER_LINK = f"{WANTED}/timers.target.wants/tallyrun-day.timer"
SOCKET_LINKS = {f"{WANTED}/sockets.target.wants/{name}.socket" for name in ("tallyd", "tallyd-control")}
LIBRARIES = {"libtallykv0": "libtallykv.so.0", "libhwreport0": "libhwreport.so.0",
             "libtallystorage0": "libtallystorage.so.0", "libtallyclient0": "libtallyclient.so.0"}
# Files that packages of the first release had at other paths.
FORMER_FILES = {"tallyrun": ["bin/tallyrun", "lib/systemd/system/timers.target.wants/tallyrun-day.timer"],
                **{package: [f"lib/{name}", f"lib/{name}.1.0"] for package, name in LIBRARIES.items()},
                "libtallykv-dev": ["lib/libtallykv.so", "lib/pkgconfig/tallykv.pc"]}


class Package(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-package-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        checked("cpack", "--config", BUILD / "CPackConfig.cmake", "-B", cls.folder / "made")
        cls.packages = sorted((cls.folder / "made").glob("*.deb"))
        cls.names = {path.name.split("_")[0]: path for path in cls.packages}
        cls.package = cls.names["tallyrun"]

    def clean_root(self):
        root = pathlib.Path(tempfile.mkdtemp(prefix="root-", dir=self.folder))
        for name in ("var/lib/dpkg/info", "var/lib/dpkg/updates", "etc"):
            (root / name).mkdir(parents=True)
        (root / "var/lib/dpkg/status").touch()
        return root

    def dpkg(self, root, *arguments):
        return checked("dpkg", f"--root={root}", "--force-script-chrootless", "--force-depends",
                       "--force-not-root", "--log=/dev/null", *arguments)

    def files(self, root):
        return {str(path.relative_to(root)) for path in root.rglob("*")
                if not str(path.relative_to(root)).startswith("var/lib/dpkg")}

    def test_installed_and_removed(self):
        root = self.clean_root()
        before = self.files(root)
        self.dpkg(root, "-i", self.package)
        # The programs' manual pages are lintian's.
        wanted = ["Library/Preferences", TIMER_LINK, *SOCKET_LINKS, *(f"usr/{path}" for path in (
            "bin/tallyctl", "lib/systemd/system/tallyrun.service", "lib/systemd/system/tallyrun-day.timer",
            "lib/systemd/system/tallyrun-counters.service",
            "bin/tallyd", "lib/systemd/system/tallyd.service", "lib/systemd/system/tallyd-udp.socket",
            *(f"lib/systemd/system/tallyrun-{unit}" for unit in (
                "submitted.path", "submitted.service", "upload.path", "upload.service", "upload.timer")),
            "lib/tallyrun/tallyrun-day.so", "libexec/tallyrun-nvme-health", "lib/systemd/system/tallyrun-nvme-health.service",
            f"share/dbus-1/system-services/{NAME}.service", f"share/dbus-1/services/{NAME}.service",
            f"share/dbus-1/system.d/{NAME}.conf", "share/bash-completion/completions/tallyctl",
            "share/tallyrun/Whitelist_Nimbus.plist", "share/man/man5/tallyrun-root.5.gz", "share/man/man7/tallyrun.7.gz",
            "share/doc/tallyrun/docs/security.md", "share/doc/tallyrun/SECURITY.md"))]
        self.assertLessEqual(set(wanted), self.files(root))
        # UDP senders are anonymous, and a hand-over empties the spool: both are the administrator's choice.
        enabled = {path for path in self.files(root) if path.startswith(f"{WANTED}/sockets.target.wants/")}
        self.assertEqual(enabled, SOCKET_LINKS)
        self.assertFalse((root / WANTED / "paths.target.wants").exists())
        self.assertEqual((root / "var/spool/tallyrun").stat().st_mode & 0o7777, 0o2770)
        self.assertEqual(os.readlink(root / TIMER_LINK), "/usr/lib/systemd/system/tallyrun-day.timer")
        user = re.search(r"^mobile:x:(\d+):", (root / "etc/passwd").read_text(), re.M)
        self.assertEqual((root / "var/mobile").stat().st_uid, int(user[1]))
        (root / "var/mobile/Library").mkdir()
        (root / "var/mobile/Library/log").write_text("data")
        self.dpkg(root, "-r", "tallyrun")
        (root / TIMER_LINK).unlink()  # as the administrator does who wants no timer
        self.dpkg(root, "-i", self.package)
        self.assertFalse((root / TIMER_LINK).is_symlink())
        stamp = root / "var/lib/systemd/timers/stamp-tallyrun-day.timer"
        stamp.parent.mkdir(parents=True)
        stamp.touch()  # as the timer of a running system does
        self.dpkg(root, "-P", "tallyrun")
        left = self.files(root) - before
        self.assertEqual({path for path in left if path.split("/")[0] not in {*DATA, "etc", "usr"}}, set())
        self.assertIn("var/mobile/Library/log", left)
        self.assertEqual([path for path in left if "tally" in path or "Library/Preferences" in path], [])

    def test_upgrade_from_the_first_release_keeps_data(self):
        root = self.clean_root()
        device = Device(root)  # the machine's own root, as when the package is installed for real
        device.command = lambda *arguments: [root / "usr/bin/tallyrun", *arguments]
        former = {name: files for name, files in FORMER_FILES.items() if name in self.names}
        self.dpkg(root, "-i", *(self.former(name, files) for name, files in former.items()))
        device.describe()
        device.whitelist(G=group({"a": {}}))
        device.store([("a", TODAY - 1, 7)])
        device.set_preferences(kept=5)
        self.dpkg(root, "-i", *self.packages)
        device.run("-d", day=TODAY)
        self.assertEqual(device.log()["TBScalars"]["a"], 7)
        kept = device.preferences()
        self.assertEqual((kept["kept"], kept[LAST_DAY]), (5, TODAY - 1))
        self.assertEqual([file for files in former.values() for file in files
                          if file.startswith("lib") and os.path.lexists(root / "usr" / file)], [])

    def former(self, name, files):
        """A package of the first release: its name, version and paths."""
        tree = self.folder / f"former-{name}"
        for file in files:
            (tree / "usr" / file).parent.mkdir(parents=True, exist_ok=True)
            (tree / "usr" / file).write_text("former")
        (tree / "DEBIAN").mkdir()
        (tree / "DEBIAN/control").write_text(
            f"Package: {name}\nVersion: 0.1.0-1\nArchitecture: {checked('dpkg', '--print-architecture').strip()}\n"
            "Maintainer: nobody <nobody@example.org>\nDescription: former\n")
        checked("dpkg-deb", "-b", tree, f"{tree}.deb")
        return f"{tree}.deb"

    @unittest.skipUnless((BUILD / "libhwreport.so").exists(), "built without shared libraries")
    def test_libraries_say_what_they_export(self):
        root = self.clean_root()
        self.dpkg(root, "-i", *self.packages)
        self.assertEqual(set(LIBRARIES), {name for name in self.names if name[-1].isdigit()})
        for package, name in LIBRARIES.items():
            library, = (root / "usr/lib").glob(f"*/{name}")  # the architecture's directory
            exported = {line.split()[2] for line in checked("nm", "-D", "--defined-only", library).splitlines()}
            file, = (root / "var/lib/dpkg/info").glob(f"{package}*.symbols")
            head, _, *symbols = file.read_text().splitlines()
            self.assertEqual(head.split()[:2], [name, package])
            self.assertEqual({line.split("@")[0].strip() for line in symbols}, exported)

    @unittest.skipUnless(shutil.which("systemd-analyze"), "systemd is missing")
    def test_units_are_sound_and_a_home_stays_as_its_user_has_it(self):
        root = self.clean_root()
        home = root / "var/mobile"
        home.mkdir(mode=0o700)
        self.dpkg(root, "-i", self.package)
        checked("systemd-tmpfiles", f"--root={root}", "--create", "tallyrun.conf")
        # Whatever root made there would be root's, and the user could not read what comes into it.
        self.assertEqual((home.stat().st_mode & 0o777, list(home.iterdir())), (0o700, []))
        units = root / "usr/lib/systemd/system"
        for unit in units.glob("*.service"):  # the program is not installed on this machine
            unit.write_text(re.sub("/usr/(bin|libexec)/", rf"{root}/usr/\1/", unit.read_text()))
            exposure = checked("systemd-analyze", "security", "--offline=true", "--threshold=30", unit)
            self.assertRegex(exposure, "Overall exposure level")
        result = subprocess.run(["systemd-analyze", "verify", "--man=no",
                                 *map(str, units.glob("tally*"))], capture_output=True, check=False)
        complaints = [line for line in result.stderr.decode().splitlines() if "tally" in line]
        self.assertEqual((result.returncode, complaints), (0, []), result.stderr)

    @unittest.skipUnless(shutil.which("lintian"), "lintian is missing")
    def test_the_packages_have_no_faults(self):
        found = subprocess.run(["lintian", "--allow-root", "--fail-on", "none", *map(str, self.packages)],
                               capture_output=True, timeout=600, check=False).stdout.decode()
        self.assertEqual(re.findall(r"^[EW]: .*", found, re.M), [], found)

    def test_completion_offers_what_the_tool_has(self):
        script = pathlib.Path(__file__).parents[2] / "packaging/completion/tallyctl"
        for words, wanted in ((["send", ""], "apps"), (["--root", "/", "tasking", "apply", "--d"], "--dry-run")):
            code = (f'source {script}; COMP_WORDS=({BIN}/tallyctl {" ".join(map(repr, words))}); '
                    f'COMP_CWORD={len(words)}; _tallyctl; echo "${{COMPREPLY[@]}}"')
            self.assertIn(wanted, checked("bash", "-c", code).split())


if __name__ == "__main__":
    unittest.main()
