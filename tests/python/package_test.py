"""The examples of the documentation, and the types."""
import doctest
import importlib
import os
import pathlib
import subprocess
import sys
import tempfile
import unittest

import veltra

PACKAGE = pathlib.Path(veltra.__file__).parent


class Package(unittest.TestCase):
    def test_examples_show_what_happens(self):
        examples = 0
        for path in PACKAGE.glob("*.py"):
            module = importlib.import_module("veltra" if path.stem == "__init__" else f"veltra.{path.stem}")
            result = doctest.testmod(module)
            self.assertEqual(result.failed, 0)
            examples += result.attempted
        readme = pathlib.Path(__file__).parents[2] / "python/README.md"
        self.assertEqual(doctest.testfile(str(readme), module_relative=False).failed, 0)
        self.assertGreater(examples, 0)

    def test_types_are_consistent(self):
        with tempfile.TemporaryDirectory() as cache:
            command = [sys.executable, "-m", "mypy", "--strict", f"--cache-dir={cache}", "--package=veltra"]
            found = subprocess.run(command, cwd=PACKAGE.parent, env={**os.environ, "MYPYPATH": "."}, stdout=subprocess.PIPE)
        self.assertEqual(found.returncode, 0, found.stdout.decode())
