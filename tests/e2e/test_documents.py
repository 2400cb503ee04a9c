"""What the documents show is true: commands run, examples are those that are built, links lead somewhere."""
import os
import pathlib
import plistlib
import re
import shutil
import subprocess
import tempfile
import unittest

from bus import BusDevice
from device import BIN, Device, checked

TOP = pathlib.Path(__file__).resolve().parents[2]
DOCUMENTS = sorted([TOP / "README.md", TOP / "CONTRIBUTING.md", *TOP.glob("docs/*.md")])
FENCE = re.compile(r"^```(\w*)\n(.*?)^```$", re.MULTILINE | re.DOTALL)
# A file's path alone on the line before a block: the block is its content.
FILE_NAMED = re.compile(r"^`([^`]+\.plist)`[^\n]*:\n\n\Z", re.MULTILINE)
# What a block may call that is too large to be run here, and what runs it.
RUN_BY_OTHERS = {
    "cmake --preset default": "scripts/test",
    "cmake --build build": "scripts/test",
    "cpack --config build/CPackConfig.cmake": "test_package.py",
    "apt install ./build/packages-debian/tallyrun_*.deb": "test_package.py",
    **dict.fromkeys(("cmake -S examples/hwreport -B example", "cmake --build example", "example/channels", *(
        f"cmake --install build --prefix /usr/local --component {name}"
        for name in ("tallykv", "tallykv-dev", "hwreport", "hwreport-dev", "tallyclient", "tallyclient-dev")),
        "cmake -S examples/client -B example", "example/record"), "test_library.py"),
    "scripts/demo": ".ci/run", "scripts/test": ".ci/run", "scripts/test --sanitize": ".ci/run",
    "scripts/lint": ".ci/run", "scripts/fuzz 20": ".ci/run",
    "scripts/fuzz 600": ".ci/run, for a shorter time", "scripts/load": "the test bench.load, at a smaller size",
    "scripts/test --arch armhf": ".ci/run", "scripts/vm --resets 5": ".ci/run",
    "scripts/fleet-demo": "test_fleet_demo.py, with fewer devices",
    "scripts/bench": "by hand, when docs/performance.md is made anew",
}
# Its blocks need a recorder, and are in more languages than the examples: test_recipes.py runs them.
RECIPES = TOP / "docs/recording.md"
STANDS_IN = "#!/bin/sh\necho \"$TALLYRUN_SHOWN $*\" >> \"$TALLYRUN_CALLS\"\n"


class Documents(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-documents-"))
        cls.addClassCleanup(shutil.rmtree, cls.folder, ignore_errors=True)
        cls.demo = cls.folder / "demo-root"
        for command in ([TOP / "scripts/make-demo-root", cls.demo], [BIN / "tallyrun", "-f"]):
            checked(*command, TALLYRUN_ROOT=str(cls.demo))

    def clone(self):
        """A folder that looks like a clone after its demo; calls that are too large to run are recorded."""
        clone = pathlib.Path(tempfile.mkdtemp(dir=self.folder))
        (clone / "build").mkdir()
        shutil.copytree(self.demo, clone / "build/demo-root")
        (clone / "build/bin").symlink_to(BIN)
        (clone / "examples").symlink_to(TOP / "examples")
        for name in ("stand-ins/cmake", "stand-ins/cpack", "stand-ins/apt", "example/channels", "example/record",
                     *(f"scripts/{path.name}" for path in (TOP / "scripts").iterdir())):
            program = clone / name
            program.parent.mkdir(exist_ok=True)
            program.write_text(STANDS_IN.replace("$TALLYRUN_SHOWN", name.removeprefix("stand-ins/")))
            program.chmod(0o755)
        return clone

    def run_document(self, text, clone, device):
        (clone / "calls").touch()
        environment = {**device.environment(), "TALLYRUN_CALLS": str(clone / "calls"),
                       "TALLYRUN_ROOT": str(clone / "build/demo-root"),
                       "PATH": f"{clone}/stand-ins:{BIN}:{os.environ['PATH']}"}
        ran = 0
        for block in FENCE.finditer(text):
            language, content = block.groups()
            named = FILE_NAMED.search(text[:block.start()])
            if language == "xml" and named:
                (clone / named[1]).write_text(content)
            if language != "sh":
                continue
            ran += 1
            result = subprocess.run(["bash", "-euo", "pipefail", "-c", content], cwd=clone, env=environment,
                                    stdout=subprocess.PIPE, stderr=subprocess.STDOUT, timeout=120, check=False)
            self.assertEqual(result.returncode, 0, f"{content}\n{result.stdout.decode()[-2000:]}")
        for call in (clone / "calls").read_text().splitlines():
            self.assertIn(call.strip(), RUN_BY_OTHERS)
        return ran

    def test_every_command_runs(self):
        ran = 0
        for document in set(DOCUMENTS) - {RECIPES}:
            with self.subTest(document.name):
                clone = self.clone()
                device = BusDevice(clone / "build/demo-root")
                self.addCleanup(device.remove)
                ran += self.run_document(document.read_text(), clone, device)
        self.assertGreater(ran, 15)

    def test_blocks_say_what_they_are_and_examples_are_those_that_are_built(self):
        sources = {language: [path.read_text() for path in (TOP / "examples").rglob(f"*.{language}")]
                   for language in ("cpp", "c")}
        sources["python"] = [path.read_text() for path in (TOP / "examples").rglob("*.py")]
        for document in set(DOCUMENTS) - {RECIPES}:
            for language, content in FENCE.findall(document.read_text()):
                self.assertIn(language, {"sh", "xml", "csv", "json", "text", *sources}, document.name)
                if language in sources:
                    self.assertTrue(any(content.strip() in source for source in sources[language]), content)

    def test_an_example_replaces_a_service(self):
        device = Device(self.clone() / "build/demo-root")
        device.command = lambda *arguments: [BIN / "example_platform", *arguments]
        for _ in range(2):
            device.run("-f", day=None)
        self.assertEqual(device.info(device.log_files()[0])["Options"]["previous_os_version"], "<unknown>")
        self.assertEqual(device.preferences()["LastOSVersion"], "Trailhead 4.2 (R1180)")

    def test_the_device_description_is_documented_as_it_is_read(self):
        header = (TOP / "src/host/described/described_entries.h").read_text()
        entry = re.compile(r'\{Described::\w+,\s*"(\w+)",\s*KvType::(\w+),\s*((?:"[^"]*"\s*)+)')
        read = [(name, kind.lower().replace("number", "integer"), "".join(re.findall('"([^"]*)"', answers)))
                for name, kind, answers in entry.findall(header.split("kDescribedEntries[]")[1])]
        text = (TOP / "docs/device-root.md").read_text().split("## The device description")[1]
        shown = re.findall(r"^\| `(\w+)` \| (\w+)[^|]*\| ([^|]+?) \|", text.split("Device queries:")[0], re.M)
        self.assertEqual(read, shown)

    def test_the_whitelist_for_makers_admits_what_a_linux_device_sweeps_and_what_recorders_lack(self):
        """Every daily key of the tables, and none that the sweep or the recorder cannot store."""
        rows = [row.split("|") for row in (TOP / "docs/linux.md").read_text().splitlines() if row.startswith("| `")]
        kinds = re.search(r"kind of a wakeup source: (.*?)\. ", (TOP / "docs/linux.md").read_text())[1]
        swept = {f"vellum.hwreport.{key}".replace("#", str(number)).replace("%", kind)
                 for row in rows if len(row) > 8 and (key := row[7].strip(" `"))
                 for number in range(4) for kind in re.findall("`(.*?)`", kinds)}
        whitelist = plistlib.loads((TOP / "packaging/Whitelist_Nimbus.plist").read_bytes())
        listed = [key for group in whitelist.values() for key in group["ScalarKeys"]]
        self.assertEqual({key for key in listed if key.startswith("vellum.hwreport.")}, swept)
        refused = re.findall(r'"(vellum\.tallyd\.[^"]+)"', (TOP / "src/recorder/refusal.h").read_text())
        self.assertGreater(len(refused), 20)
        self.assertEqual({key for key in listed if key.startswith("vellum.tallyd.")}, set(refused))
        self.assertEqual(len(listed), len(set(listed)))
        own = re.findall(r'\{"(vellum\.[^"]+)", OwnSource', (TOP / "src/platform/tables/own_metrics.h").read_text())
        example = plistlib.loads((TOP / "examples/own-figures/Whitelist_Nimbus.plist").read_bytes())
        self.assertEqual(list(example["OwnFigures"]["ScalarKeys"]), own)
        self.assertFalse(set(own) & set(listed))
        self.assertTrue(all(set(group) == {"ScalarKeys"} for group in whitelist.values()))

    def test_every_command_of_the_tool_is_documented(self):
        def rows(*words):
            out = checked(BIN / "tallyctl", *words, "--help")
            description, usage = (" ".join(part.split()) for part in out.split("\n\n")[:2])
            commands = out.partition("\nCommands:\n")[2].partition("\n\n")[0]
            names = re.findall(r"^  (\S+)", commands, re.MULTILINE)
            if not names:
                form = usage.removeprefix("Usage: tallyctl ").removesuffix(" [OPTION...]")
                return [f"| `{form}` | {description.removesuffix('.')} |"]
            return [row for name in names for row in rows(*words, name)]
        expected = "\n".join(["| command | effect |", "|---|---|", *rows()]) + "\n\n"
        documented = (TOP / "docs/commands.md").read_text().split("## tallyctl\n\n")[1]
        self.assertTrue(documented.startswith(expected), f"docs/commands.md needs this table:\n{expected}")

    @unittest.skipUnless(shutil.which("man"), "man is missing")
    def test_manual_pages_are_sound(self):
        pages = [path for path in (TOP / "packaging/man").iterdir() if path.suffix != ".in"]
        pages += [path for path in (BIN.parent / "packaging/man").glob("*.[1-8]")]
        self.assertGreaterEqual(len(pages), 5)
        for page in pages:
            result = subprocess.run(["man", "--warnings", "-l", "-E", "UTF-8", page], capture_output=True,
                                    env={**os.environ, "MANWIDTH": "80", "PAGER": "cat"}, check=True)
            self.assertEqual(result.stderr, b"", page)
            self.assertNotIn(b"@", result.stdout)

    def test_links_and_named_files_are_there(self):
        for document in DOCUMENTS:
            text = FENCE.sub("", document.read_text())
            for target in re.findall(r"\]\(([^)#]+)(?:#[^)]*)?\)", text):
                self.assertTrue((document.parent / target).exists(), f"{document.name}: {target}")
            for name in re.findall(r"`((?:tests|scripts|fuzz|src|examples|bench|docs)/[\w./-]+)`", text):
                self.assertTrue((TOP / name).exists(), f"{document.name}: {name}")


if __name__ == "__main__":
    unittest.main()
