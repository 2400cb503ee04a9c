"""The blocks of docs/recording.md run as they are, against a recorder; what a recipe records is in the store."""
import os
import re
import subprocess
import unittest

from device import BIN
from installed import BUILD, TOP, main_with_optional_clients
from recorder import RecordingDevice
from test_documents import FENCE, RECIPES

DOCUMENT = RECIPES.read_text()
SECTION = re.search(r"^## In your language\n.*?(?=^## |\Z)", DOCUMENT, re.MULTILINE | re.DOTALL)[0]
CLIENT = f"-I {TOP / 'include'} -L {BUILD} -ltallyclient"
# How each language runs: a file, and the shell commands that it needs to run and that run it.
RUNNERS = {
    "sh": ("recipe.sh", ":", "bash -euo pipefail recipe.sh"),
    "python": ("recipe.py", "test -x /usr/bin/python3", "/usr/bin/python3 recipe.py"),
    "c": ("recipe.c", f"ls {BUILD}/libtallyclient.so",
          f"cc -Wall -Werror recipe.c {CLIENT} -o recipe && ./recipe && c++ -fsyntax-only -x c++ recipe.c {CLIENT}"),
    "go": ("recipe.go", "command -v go || command -v gccgo",
           "if command -v go; then go run recipe.go; else gccgo recipe.go -o recipe && ./recipe; fi"),
    "rust": ("recipe.rs", "command -v rustc", "rustc recipe.rs && ./recipe"),
    "javascript": ("recipe.js", "command -v node", "node recipe.js"),
    "perl": ("recipe.pl", "command -v perl", "perl -w recipe.pl"),
    "ruby": ("recipe.rb", "command -v ruby", "ruby -w recipe.rb"),
}
# What a recipe needs beside its language, by what it contains.
FURTHER_NEEDS = {"nc -U": "nc -h 2>&1 | grep OpenBSD", "socat": "command -v socat",
                 "import statsd": "/usr/bin/python3 -c 'import statsd'"}


class Recipes(unittest.TestCase):
    def setUp(self):
        self.device = RecordingDevice()
        self.addCleanup(self.device.remove)
        self.environment = {"PATH": f"{BIN}:{os.environ['PATH']}", "TALLYRUN_ROOT": str(self.device.root),
                            "TALLYCLIENT_SOCKET": self.device.socket("statsd.sock"), "LD_LIBRARY_PATH": str(BUILD),
                            "GOCACHE": str(self.device.root / "go")}

    def shell(self, command, **how):
        return subprocess.run(["bash", "-c", command], cwd=self.device.root, text=True, stdout=subprocess.PIPE,
                              stderr=subprocess.STDOUT, timeout=120, check=False,
                              env={**os.environ, **self.environment}, **how)

    def run_block(self, language, content):
        file, need, command = RUNNERS[language]
        for needed in (need, *(further for text, further in FURTHER_NEEDS.items() if text in content)):
            if self.shell(needed).returncode != 0:
                self.skipTest(f"a recipe of {language} needs what cannot be installed: {needed}")
        (self.device.root / file).write_text(content.replace("/run/tallyd", str(self.device.root / "run/tallyd")))
        result = self.shell(command)
        self.assertEqual(result.returncode, 0, f"{content}\n{result.stdout}")

    def check_recipe(self, language, content):
        self.run_block(language, content)
        self.device.commit()
        rows = re.sub(r",\d+,(\d*),", ",,", self.device.tool("store", "dump")).splitlines()[1:]
        self.assertEqual(sorted(rows), ["distribution,com.example.backup.time,,12.5",
                                        "scalar,com.example.backup.free,,512", "scalar,com.example.backup.runs,,1"])

    def test_every_other_block_runs(self):
        for language, content in FENCE.findall(DOCUMENT.replace(SECTION, "")):
            self.assertIn(language, {"sh", "xml", "text"})
            if language == "sh":
                self.run_block(language, content)


for number, (block_language, block) in enumerate(FENCE.findall(SECTION), 1):
    setattr(Recipes, f"test_{number}_{block_language}",
            lambda self, language=block_language, content=block: self.check_recipe(language, content))


if __name__ == "__main__":
    main_with_optional_clients()
