"""A temporary tree of files for the checks' own tests, and a way to run a check over it."""

import os
import subprocess
import sys
import tempfile
import unittest

TOOLS = os.path.abspath(os.path.join(os.path.dirname(__file__), ".."))


class PlantedTree(unittest.TestCase):
    check = ""  # the check's file name

    def setUp(self):
        folder = tempfile.TemporaryDirectory(prefix="kx-planted-")
        self.addCleanup(folder.cleanup)
        self.root = folder.name

    def plant(self, path, text):
        full = os.path.join(self.root, path)
        os.makedirs(os.path.dirname(full), exist_ok=True)
        with open(full, "w", encoding="utf-8") as stream:
            stream.write(text)

    def run_check(self):
        path = os.path.join(TOOLS, self.check)
        command = [sys.executable, path] if path.endswith(".py") else [path]
        result = subprocess.run(command + [self.root], capture_output=True, text=True, check=False)
        return result.returncode, result.stdout + result.stderr

    def assert_green(self):
        code, text = self.run_check()
        self.assertEqual(code, 0, text)

    def assert_red(self, *expected):
        code, text = self.run_check()
        self.assertNotEqual(code, 0, text)
        for piece in expected:
            self.assertIn(piece, text)
