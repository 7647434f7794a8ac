import unittest

from planted_tree import PlantedTree


class Tidy(PlantedTree):
    check = "tidy.py"

    def setUp(self):
        super().setUp()
        self.plant("client/Good.cpp", "namespace kx {\nint Add(int a, int b) { return a + b; }\n}\n")

    def plant_function(self, lines, head="void Long()"):
        self.plant("client/A.cpp", "namespace kx {\n" + head + " {\n" + "  Call();\n" * (lines - 2)
                   + "}\n}  // namespace kx\n")

    def test_tidy_tree_is_green(self):
        self.assert_green()

    def test_file_budget(self):
        self.plant("client/A.cpp", "\n" * 600)
        self.plant("tests/client/ATest.cpp", "TEST(A, B) {}\n" + "\n" * 899)
        self.assert_green()
        self.plant("client/A.cpp", "\n" * 601)
        self.assert_red("client/A.cpp:1: 601 lines, 600 are allowed")
        self.plant("client/A.cpp", "")
        self.plant("tests/client/ATest.cpp", "TEST(A, B) {}\n" + "\n" * 900)
        self.assert_red("901 lines, 900 are allowed")

    def test_function_budget(self):
        heads = ("void Long()", "Thing::Thing(int a) : a_{a}, b_(a)",
                 "template <typename T>\nstd::vector<T> Thing<T>::Long(const std::map<T, int>& m) const",
                 "class Thing {\n public:\n  bool operator==(const Thing& other) const")
        for head in heads:
            with self.subTest(head):
                extra = head.count("\n") if not head.startswith("class") else 0
                self.plant_function(70 - extra, head)
                if not head.startswith("class"):
                    self.assert_green()
                self.plant_function(72 - extra, head)
                self.assert_red("lines, 70 are allowed")

    def test_a_lambda_counts_towards_its_function(self):
        self.plant("client/A.cpp", "void Outer() {\n  auto f = [] {\n" + "    Call();\n" * 70
                   + "  };\n}\n")
        self.assert_red("Outer: 74 lines")

    def test_braces_in_text_do_not_end_a_function(self):
        self.plant("client/A.cpp", 'void Outer() {\n  Say("}"); // }\n' + "  Call();\n" * 70 + "}\n")
        self.assert_red("Outer: 73 lines")

    def test_parameter_budget(self):
        five = "int a, std::map<int, int> b, std::function<void(int, int)> c, int d = f(1, 2), int e"
        for end in (";", " { Call(); }"):
            with self.subTest(end):
                self.plant("client/A.cpp", f"void Take({five}){end}\n")
                self.assert_green()
                self.plant("client/A.cpp", f"void Take({five}, int f){end}\n")
                self.assert_red("client/A.cpp:1: Take: 6 parameters")

    def test_sleeping(self):
        for call in ("std::this_thread::sleep_for(1ms)", "usleep(5)", "sleep(1)", "nanosleep(&t, 0)"):
            with self.subTest(call):
                self.plant("tests/client/ATest.cpp", f"TEST(A, B) {{ {call}; }}\n")
                self.assert_red("sleeping is banned")

    def test_sleeping_script(self):
        self.plant("tests/e2e/a_test.py", "import time\ntime.sle" "ep(1)\n")
        self.assert_red("tests/e2e/a_test.py:2: sleeping is banned")

    def test_reading_a_clock(self):
        for call in ("std::chrono::system_clock::now()", "time(nullptr)", "clock_gettime(0, &t)",
                     "gettimeofday(&t, nullptr)", "std::chrono::steady_clock::now()"):
            with self.subTest(call):
                self.plant("daemon/A.cpp", f"void Now() {{ {call}; }}\n")
                self.assert_red("daemon/A.cpp:1: reading a clock is banned")
        self.plant("daemon/A.cpp", "void Now() { clock.time(0); end_time(0); }\n")
        self.plant("device/Clock.cpp", "void Now() { clock_gettime(0, &t); }\n")
        self.assert_green()

    def test_file_system_library(self):
        self.plant("cli/A.cpp", "#include <filesystem>\n")
        self.assert_green()
        self.plant("device/A.cpp", "#include <filesystem>\n")
        self.assert_red("device/A.cpp:1: std::filesystem is banned")

    def test_banned_words_in_text_do_not_count(self):
        self.plant("daemon/A.cpp", '// usleep(1)\nvoid F() { Say("sleep(1)"); }\n')
        self.assert_green()

    def test_left_over_marks(self):
        for mark in ("TO" "DO", "FIX" "ME", "XX" "X", "st" "ub", "not imple" "mented"):
            with self.subTest(mark):
                self.plant("client/A.cpp", f"// {mark}: later\n")
                self.assert_red("client/A.cpp:1: a mark of unfinished work")
        self.plant("client/A.cpp", '// "Method not imple' 'mented on base class"\n')
        self.assert_green()

    def test_references_outside_the_project(self):
        for text in ("see Pa" "rt 3.1", "is" "sue #7", "as the sp" "ec says: the sp" "ec"):
            with self.subTest(text):
                self.plant("client/A.cpp", f"// {text}\n")
                self.assert_red("refers to something outside the project")

    def test_test_file_without_test(self):
        self.plant("tests/client/ATest.cpp", "// TEST(A, B) {}\n")
        self.assert_red("a test file without a test")
        self.plant("tests/client/ATest.cpp", "TEST_F(A, B) {}\n")
        self.assert_green()

    def test_document_type_declaration(self):
        self.plant("fuzz/corpus/a", "<?xml?>\n<!" "DOCTYPE plist>\n")
        self.assert_red("fuzz/corpus/a:2: holds a document type declaration")

    def test_paths_in_documents(self):
        self.plant("docs/a.md", "See `client/Good.cpp`, `client/`, `Good.cpp`, `./client/Good.cpp`, "
                   "[this](../client/Good.cpp), `a/b`, `--json`.\n")
        self.assert_green()
        for text in ("`client/Gone.cpp`", "`client/gone/`", "`Gone.h`", "[this](gone.md)"):
            with self.subTest(text):
                self.plant("docs/a.md", f"\nSee {text}.\n")
                self.assert_red("docs/a.md:2:", "does not exist")


if __name__ == "__main__":
    unittest.main()
