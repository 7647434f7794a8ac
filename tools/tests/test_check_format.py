import os
import shutil
import unittest

import planted_tree


class CheckFormat(planted_tree.PlantedTree):
    check = "check_format"

    def setUp(self):
        super().setUp()
        shutil.copy(os.path.join(planted_tree.TOOLS, "..", ".clang-format"), self.root)

    def test_formatted_file_is_green(self):
        self.plant("client/A.cpp", "int* Give(int* a) { return a; }\n")
        self.assert_green()

    def test_unformatted_file_is_red(self):
        self.plant("client/A.cpp", "int *Give( int *a ){return a;}\n")
        self.assert_red("client/A.cpp:1:")

    def test_one_bad_file_among_many_is_red(self):
        for number in range(100):
            self.plant(f"client/A{number:03}.h", "int a;\n")
        self.plant("client/A007.h", "int  a;\n")
        self.assert_red("client/A007.h:1:")

    def test_empty_tree_is_red(self):
        self.assert_red("no C++ file found")


if __name__ == "__main__":
    unittest.main()
