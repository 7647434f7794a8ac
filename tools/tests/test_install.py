"""What "cmake --install" puts where, tried in a new prefix.

Environment: KX_CMAKE, KX_BUILD_DIR, KX_MAKE_SAMPLE, CXX.
"""

import glob
import os
import subprocess
import tempfile
import unittest


class Install(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.folder = tempfile.TemporaryDirectory(prefix="kx-install-")
        cls.prefix = os.path.join(cls.folder.name, "prefix")
        subprocess.run([os.environ["KX_CMAKE"], "--install", os.environ["KX_BUILD_DIR"], "--prefix",
                        cls.prefix], check=True, stdout=subprocess.DEVNULL)

    @classmethod
    def tearDownClass(cls):
        cls.folder.cleanup()

    def installed(self):
        return {os.path.relpath(path, self.prefix) for path in
                glob.glob(os.path.join(self.prefix, "**"), recursive=True) if os.path.isfile(path)}

    def test_nothing_but_programs_module_and_headers(self):
        others = {path for path in self.installed() if not path.startswith("include/kxsync/platform/")}
        modules = {path for path in others if path.endswith("/kxsync/kxsyncbundle.so")}
        self.assertEqual(len(modules), 1)
        self.assertTrue(modules.copy().pop().startswith("lib"))
        self.assertEqual(others - modules, {"bin/kxsync", "bin/ferrule"})
        self.assertIn("include/kxsync/platform/sync/FRClient.h", self.installed())

    def test_all_headers_compile_from_where_they_are(self):
        headers = sorted(path for path in self.installed() if path.endswith(".h"))
        root = os.path.join(self.prefix, "include", "kxsync")
        text = "".join(f'#include "{os.path.relpath(path, "include/kxsync")}"\n' for path in headers)
        source = os.path.join(self.folder.name, "all.cpp")
        with open(source, "w", encoding="utf-8") as stream:
            stream.write(text)
        subprocess.run([os.environ.get("CXX", "c++"), "-std=c++20", "-fsyntax-only", "-I", root,
                        source], check=True)

    def test_installed_program_finds_the_installed_module(self):
        sample = os.path.join(self.folder.name, "sample")
        device = os.path.join(self.folder.name, "device")
        subprocess.run([os.environ["KX_MAKE_SAMPLE"], sample], check=True)
        program = os.path.join(self.prefix, "bin", "kxsync")
        result = subprocess.run([program, "sync", "--json", sample, device], check=False,
                                capture_output=True, text=True)
        self.assertEqual(result.returncode, 0, result.stderr)
        self.assertIn('"imported":12', result.stdout.replace(" ", ""))


if __name__ == "__main__":
    unittest.main()
