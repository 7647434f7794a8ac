import os
import subprocess
import unittest

import planted_tree


class CheckModule(planted_tree.PlantedTree):
    check = "check_module.py"

    def build(self, text, *options):
        self.plant("a.cpp", text)
        module = os.path.join(self.root, "a.so")
        subprocess.run([os.environ.get("CXX", "c++"), "-shared", "-fPIC", "-o", module,
                        os.path.join(self.root, "a.cpp"), *options], check=True)
        self.root = module

    def test_module_with_one_entry_is_green(self):
        self.build('extern "C" int kxsync_plugin_create_client() { return 1; }\n')
        self.assert_green()

    def test_needed_library_is_red(self):
        self.build('extern "C" int kxsync_plugin_create_client() { return 1; }\n', "-Wl,--no-as-needed", "-lsqlite3")
        self.assert_red("needs libsqlite3.so")

    def test_second_symbol_is_red(self):
        self.build('extern "C" int kxsync_plugin_create_client() { return 1; }\nint Other() { return 2; }\n')
        self.assert_red("shows _Z5Otherv")

    def test_module_without_entry_is_red(self):
        self.build("static int a;\n")
        self.assert_red("does not show kxsync_plugin_create_client")


if __name__ == "__main__":
    unittest.main()
