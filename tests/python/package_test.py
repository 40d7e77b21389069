"""The examples of the documentation, and the types."""
import doctest
import importlib
import pathlib
import subprocess
import sys
import tempfile
import unittest

PACKAGE = pathlib.Path(importlib.import_module("veltra").__file__).parent


class Package(unittest.TestCase):
    def test_examples_show_what_happens(self):
        for name in ("veltra", "veltra.der", "veltra.img4", "veltra.sysconfig3"):
            result = doctest.testmod(importlib.import_module(name))
            self.assertTrue(result.attempted and not result.failed)
        readme = pathlib.Path(__file__).parents[2] / "python/README.md"
        self.assertEqual(doctest.testfile(str(readme), module_relative=False).failed, 0)

    def test_types_are_consistent(self):
        with tempfile.TemporaryDirectory() as cache:
            command = [sys.executable, "-m", "mypy", "--strict", f"--cache-dir={cache}", "--package=veltra"]
            subprocess.run(command, cwd=PACKAGE.parent, check=True)
