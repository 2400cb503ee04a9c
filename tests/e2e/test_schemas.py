"""What every command prints with --json follows its published schema, and every schema is of a command."""
import copy
import json
import pathlib
import plistlib
import re
import subprocess
import sys
import tempfile
import unittest
import uuid

import jsonschema

from bus import BusDevice
from device import BIN, TODAY, Device, checked
from recorder import RecordingDevice

TOP = pathlib.Path(__file__).resolve().parents[2]
SCHEMAS = {path.stem: json.loads(path.read_text()) for path in sorted((TOP / "docs/schema").glob("*.json"))}
NOT_OF_A_COMMAND = {"common", "error", "version", "fleet-ask", "fleet-load"}
sys.path.insert(0, str(TOP / "tests/devices"))
import device_tree  # noqa: E402

# What runs: the words of a command and, after them, a device, arguments and an exit status. Several rows
# of one command differ in what its output has.
CASES = (
    ("store set", "demo", "a.b 1"), ("store set", "demo", "a.b 1 c.d -2"),
    ("store push", "demo", "e.f 1.5 inf"), ("store import", "demo", "FOLDER/rows.csv", 1), ("store dump", "demo", ""),
    ("store keys", "demo", ""), ("store dump", "empty", ""), ("store keys", "empty", ""),
    ("record set", "recorder", "a.b 1"), ("record add", "recorder", "c.d"), ("record push", "recorder", "e.f 1 2"),
    ("record time", "recorder", "g.h true"), ("record lines", "recorder", "", 1),
    ("recorder", "recorder", "--commit"), ("recorder", "recorder", ""), ("recorder", "empty", "", 1),
    ("whitelist check", "demo", ""), ("whitelist check", "demo", "FOLDER/bad.plist", 1),
    ("whitelist check", "demo", "--privacy"), ("whitelist check", "empty", "", 1),
    ("whitelist test", "demo", "vellum.power.wakeups vellum.wifi.rssi_dbm"),
    ("whitelist absent", "demo", ""), ("whitelist absent", "demo", "--day today --all"),
    ("report preview", "demo", ""), ("report preview", "demo", "--diff --day today"), ("report preview", "empty", "", 1),
    ("report list", "demo", ""), ("report list", "empty", ""), ("report show", "demo", ""),
    ("report show", "demo", "FOLDER/a.log"), ("report show", "demo", "STRUCTURED"), ("report show", "empty", "", 1),
    ("report page", "demo", "-o FOLDER/page.html"), ("report export", "demo", ""), ("report export", "demo", "FOLDER/a.log", 1),
    ("report pseudonym", "demo", ""), ("report pseudonym", "empty", ""), ("report hooks", "demo", "", None),
    ("explain", "demo", "vellum.power.wakeups"), ("explain", "demo", "vellum.wifi.rssi_dbm"),
    ("explain", "demo", "a.b", 1), ("explain", "empty", "a.b", 1),
    ("nand devices", "laptop", ""), ("nand devices", "phone", ""), ("nand devices", "demo", "", 1),
    ("nand info", "demo", ""), ("nand info", "empty", "", 1), ("nand health", "demo", ""), ("nand health", "worn", ""),
    ("nand telemetry", "demo", ""), ("nand validity", "demo", ""), ("nand validity", "empty", "", 1),
    ("nand defects", "demo", ""), ("nand storage-log", "demo", "--preview"), ("nand events", "demo", ""),
    ("nand snapshot", "demo", "ROOT/device/snapshot.bin"),
    ("channels list", "demo", "--verbose"), ("channels list", "phone", "--verbose"), ("channels list", "empty", "", 1),
    ("channels sample", "demo", ""), ("channels sample", "phone", "", None), ("channels sample", "empty", "", 1),
    ("channels sample", "demo", "--delta 0.1"), ("channels keep", "phone", ""),
    ("device record", "laptop", "FOLDER/recorded --seconds 0"),
    ("prefs set", "demo", "listed --file FOLDER/bad.plist"), ("prefs get", "demo", "listed"),
    ("prefs get", "demo", "none", 1), ("prefs list", "demo", ""), ("prefs list", "demo", "--domain vellum.tallyd.tallyrun"),
    ("prefs delete", "demo", "listed"), ("doctor", "demo", "", None), ("doctor", "laptop", "", None),
    ("send logging", "bus", ""), ("send day", "bus", "today"), ("send apps", "bus", "FOLDER/apps.json"),
    ("send apps", "empty", "FOLDER/apps.json", 1),
    ("tasking show", "demo", ""), ("tasking apply", "demo", "EXAMPLES/tasking.plist --dry-run"),
    ("tasking apply", "demo", "EXAMPLES/tasking.plist"), ("tasking show", "demo", ""),
    ("report take", "demo", "--to FOLDER/taken"), ("forget", "demo", "--yes"),
)
LINES = b"set a.b 2\npush e.f nothing\n"


def closed(schema, part=False):
    """The schema without the permission to add members, which a later version has of an earlier one."""
    if isinstance(schema, list):
        return [closed(one, part) for one in schema]
    if not isinstance(schema, dict):
        return schema
    result = {key: closed(value, key in ("allOf", "oneOf")) for key, value in schema.items() if key != "$defs"}
    if "$defs" in schema:  # those called ...Members are parts of objects
        result["$defs"] = {name: closed(value, name.endswith("Members")) for name, value in schema["$defs"].items()}
    if "properties" in schema and not part and "additionalProperties" not in schema:
        result["unevaluatedProperties"] = False
    return result


def bundled(name):
    """The schema with the definitions that it refers to in another file."""
    def renamed(text, definition):
        return json.loads(json.dumps(text).replace(definition, "#/$defs/common-"))
    common = renamed(SCHEMAS["common-1"]["$defs"], "#/$defs/")
    schema = renamed(SCHEMAS[name], "common-1.json#/$defs/")
    definitions = {**schema.get("$defs", {}), **{f"common-{key}": value for key, value in common.items()}}
    return {**schema, "$defs": definitions}


def validators(name):
    """One that accepts further members, and one that does not."""
    return [jsonschema.Draft202012Validator(schema) for schema in (bundled(name), closed(bundled(name)))]


def commands(*words):
    out = checked(BIN / "tallyctl", *words, "--help")
    names = re.findall(r"^  (\S+)", out.partition("\nCommands:\n")[2].partition("\n\n")[0], re.MULTILINE)
    return [command for name in names for command in commands(*words, name)] or [" ".join(words)]


def documents(text):
    """Of a text that is one after the other, as with --watch."""
    found, at, decoder = [], 0, json.JSONDecoder()
    while text[at:].strip():
        document, end = decoder.raw_decode(text[at:].lstrip())
        at = len(text) - len(text[at:].lstrip()) + end
        found.append(document)
    return found


class Schemas(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = pathlib.Path(tempfile.mkdtemp(prefix="tally-schemas-"))
        demo, empty, worn = Device(cls.folder / "demo"), Device(), Device()
        checked(TOP / "scripts/make-demo-root", demo.root)
        checked(BIN / "tallyrun", "-f", TALLYRUN_ROOT=str(demo.root))
        (worn.root / "device/device.plist").unlink()
        for used, day in enumerate((TODAY, TODAY + 100, TODAY + 200), 2):
            for name, content in {"type": "MMC", "life_time": f"0x0{used} 0x02", "pre_eol_info": "0x01",
                                  "cid": "150100"}.items():
                worn.write(f"sys/block/mmcblk0/device/{name}", content.encode() + b"\n")
            worn.run("-f", day=day)
        cls.devices = {"demo": demo, "empty": empty, "worn": worn, "recorder": RecordingDevice(), "bus": BusDevice()}
        for name in ("laptop", "phone"):
            device_tree.unpack((TOP / f"tests/devices/{name}.tree").read_text(), cls.folder / name)
            cls.devices[name] = Device(cls.folder / name)
        for device in cls.devices.values():
            cls.addClassCleanup(device.remove)
        (cls.folder / "rows.csv").write_text("kind,key,day,offset,value\nscalar,a.b,20000,,5\nscalar,a.b,x,,5\n")
        (cls.folder / "bad.plist").write_bytes(plistlib.dumps(
            {"G": {"ScalarKeys": {"a.b": {"significant_bits": -1}}, "Scalars": {}}, "list": [1, 2.5, b"x"]}))
        (cls.folder / "a.log").write_text("a text\n")
        (cls.folder / "apps.json").write_text(json.dumps([
            {"bundle_id": "org.example.a", "version": "1", "adam_id": 1, "arch": 1, "uuid": str(uuid.UUID(int=1))}]))

    def run_tool(self, device, words, arguments):
        structured = next(device.root.glob("var/mobile/Library/Logs/StructuredData/*.plist"), "none")
        for name, path in (("FOLDER", self.folder), ("ROOT", device.root), ("EXAMPLES", TOP / "examples"),
                           ("STRUCTURED", structured)):
            arguments = arguments.replace(name, str(path))
        return subprocess.run([BIN / "tallyctl", "--root", device.root, "--json", *words.split(), *arguments.split()],
                              input=LINES, capture_output=True, timeout=120, env=device.environment())

    def check(self, name, document):
        for validator in validators(name):
            fault = jsonschema.exceptions.best_match(validator.iter_errors(document))
            self.assertIsNone(fault, f"{name}: {fault and (fault.json_path, fault.message[:1000])}")

    def test_every_command_prints_what_its_schema_says(self):
        printed = set()
        for words, device, arguments, *status in CASES:
            with self.subTest(words, device=device, arguments=arguments):
                result = self.run_tool(self.devices[device], words, arguments)
                self.assertIn(result.returncode, {*(status or [0])} if status != [None] else {0, 1}, result.stderr)
                for document in documents(result.stdout.decode()):
                    self.check(newest(words), document)
                    printed.add(words)
                if result.returncode != 0:
                    self.check("error-1", json.loads(result.stderr.splitlines()[-1]))
        self.assertLessEqual({words for words, *_ in CASES} - printed, {"record time", "report hooks"})
        self.check("version-1", json.loads(checked(BIN / "tallyctl", "--version", "--json")))

    def test_commands_and_schemas_are_the_same(self):
        table = re.findall(r"^\| `([^`]+)` \| \[([\w-]+)\.json\]\(([\w-]+)\.json\) \|$",
                           (TOP / "docs/schema/README.md").read_text(), re.M)
        self.assertEqual([row for row in table if row[1] != row[2]], [])
        words = commands()
        self.assertEqual([row[:2] for row in table if row[0].startswith("tallyctl ")][:len(words)],
                         [(f"tallyctl {command}", newest(command)) for command in words])
        self.assertEqual({re.sub(r"-\d+$", "", name) for name in SCHEMAS},
                         {command.replace(" ", "-") for command in words} | NOT_OF_A_COMMAND)
        self.assertEqual(set(words) - {case[0] for case in CASES}, set(), "commands that no case runs")

    def test_schemas_are_schemas_that_find_drift(self):
        for name, schema in SCHEMAS.items():
            jsonschema.Draft202012Validator.check_schema(schema)
            self.assertTrue(schema["$id"].endswith(f"/{name}.json"), name)
        document = {"error": {"status": 1, "message": "m"}}
        for change, valid in (({}, [True, True]), ({"hint": "m"}, [True, False]),
                               ({"status": "1"}, [False, False])):
            changed = copy.deepcopy(document)
            changed["error"].update(change)
            self.assertEqual([one.is_valid(changed) for one in validators("error-1")], valid)


def newest(words):
    """The newest version of a command's schema."""
    names = [name for name in SCHEMAS if re.fullmatch(words.replace(" ", "-") + r"-\d+", name)]
    return max(names, key=lambda name: int(name.rpartition("-")[2]), default="none")


if __name__ == "__main__":
    unittest.main()
