import unittest

from planted_tree import PlantedTree


class CheckLayers(PlantedTree):
    check = "check_layers.py"

    def setUp(self):
        super().setUp()
        self.plant("platform/foundation/Value.h", "#include <string>\n")
        self.plant("device/Library.h", "#include <sqlite3.h>\n"
                   '#include "platform/foundation/Value.h"\n')

    def test_allowed_includes_are_green(self):
        self.plant("client/A.cpp", '#include <vector>\n#include "platform/foundation/Value.h"\n')
        self.plant("daemon/A.cpp", '#include <dlfcn.h>\n#include "device/Library.h"\n')
        self.plant("tests/device/ATest.cpp", '#include <gtest/gtest.h>\n'
                   '#include "device/Library.h"\n')
        self.assert_green()

    def test_upward_include_is_red(self):
        self.plant("client/A.cpp", '// first\n#include "device/Library.h"\n')
        self.assert_red("client/A.cpp:2:", "client may not include device")

    def test_backup_stands_between_device_and_daemon(self):
        self.plant("backup/Reader.h", '#include "device/Library.h"\n#include <nlohmann/json.hpp>\n')
        self.plant("daemon/A.cpp", '#include "backup/Reader.h"\n')
        self.plant("cli/A.cpp", '#include "backup/Reader.h"\n')
        self.assert_green()
        self.plant("device/B.cpp", '#include "backup/Reader.h"\n')
        self.assert_red("device/B.cpp:1:", "device may not include backup")
        self.plant("device/B.cpp", "")
        self.plant("daemon/Host.h", "")
        self.plant("backup/B.cpp", '#include "daemon/Host.h"\n')
        self.assert_red("backup/B.cpp:1:", "backup may not include daemon")

    def test_foundation_may_not_include_dispatch(self):
        self.plant("platform/dispatch/Queue.h", "")
        self.plant("platform/foundation/A.cpp", '#include "platform/dispatch/Queue.h"\n')
        self.assert_red("platform/foundation may not include platform/dispatch")

    def test_database_outside_device_is_red(self):
        self.plant("daemon/A.cpp", "#include <sqlite3.h>\n")
        self.assert_red("daemon/A.cpp:1: <sqlite3.h>")

    def test_each_library_has_its_folders(self):
        for target in ("exiv2/exiv2.hpp", "nlohmann/json.hpp", "CLI/CLI.hpp", "dlfcn.h",
                       "gtest/gtest.h"):
            with self.subTest(target):
                self.plant("testing/A.cpp", f"#include <{target}>\n")
                self.assert_red(f"<{target}>")

    def test_operating_system_header_in_the_plug_in_is_red(self):
        for folder in ("platform/foundation", "records", "transport", "client"):
            with self.subTest(folder):
                self.plant(f"{folder}/A.cpp", "#include <unistd.h>\n")
                self.assert_red(f"{folder} uses the C++ standard library alone")
                self.plant(f"{folder}/A.cpp", "")

    def test_test_twins_only_in_the_drive_console(self):
        self.plant("testing/Clock.h", "")
        self.plant("daemon/drive/A.cpp", '#include "testing/Clock.h"\n')
        self.assert_green()
        self.plant("daemon/A.cpp", '#include "testing/Clock.h"\n')
        self.assert_red("daemon may not include testing")

    def test_missing_file_is_red(self):
        self.plant("client/A.cpp", '#include "client/Gone.h"\n')
        self.assert_red('"client/Gone.h" is no file')

    def test_file_outside_every_layer_is_red(self):
        self.plant("extras/A.cpp", "")
        self.assert_red("extras/A.cpp:1: lies in no known layer")

    def test_commented_include_does_not_count(self):
        self.plant("client/A.cpp", '/*\n#include <sqlite3.h>\n*/\n// #include <sqlite3.h>\n')
        self.assert_green()


class NothingToCheck(PlantedTree):
    check = "check_layers.py"

    def test_empty_tree_is_red(self):
        self.assert_red("0 files checked")


if __name__ == "__main__":
    unittest.main()
