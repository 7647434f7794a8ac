#!/usr/bin/env python3
"""tools/unity_groups.py on planted files."""

import os
import subprocess
import sys
import tempfile
import unittest

TOOL = os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "unity_groups.py")


def unnamed(*lines):
    return "\n".join(["namespace kx {", "namespace {", "", *lines, "", "}  // namespace", "",
                      "}  // namespace kx", ""])


class UnityGroups(unittest.TestCase):

    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.root = folder.name

    def write(self, name, text):
        with open(os.path.join(self.root, name), "w", encoding="utf-8") as stream:
            stream.write(text)

    def groups(self, *options, **files):
        """The names of the files that are compiled as one, joined by "+"."""
        for name, text in files.items():
            self.write(name + ".cpp", text)
        paths = [os.path.join(self.root, name + ".cpp") for name in files]
        done = subprocess.run([sys.executable, "-B", TOOL, "--root", self.root, *options, *paths],
                              capture_output=True, text=True, check=True)
        found = {}
        for line in done.stdout.splitlines():
            path, group = line.rsplit(";", 1)
            found.setdefault(int(group), []).append(os.path.basename(path)[:-4])
        self.assertEqual(sorted(sum(found.values(), [])), sorted(files))
        return [found[group] for group in sorted(found)]

    def together(self, one, other):
        return len(self.groups(a=one, b=other)) == 1

    def test_files_without_common_names_meet(self):
        self.assertTrue(self.together(unnamed("constexpr int kA = 1;", "void f() {}"),
                                      unnamed("constexpr int kB = 1;", "struct G { int x; };")))

    def test_the_same_constant_function_type_or_test_keeps_files_apart(self):
        for text in ("constexpr int kA[] = {1};", "std::string f(int a) { return {}; }",
                     "template <typename T> T f(T a) { return a; }", "class A final : public B {};",
                     "enum class A : int { kX };", "std::map<int, int> a{{1, 2}};",
                     "const int kA{2};", "TEST(Suite, Name) { run(); }",
                     "RC_GTEST_PROP(Suite, Name, (int a)) { run(); }"):
            with self.subTest(text):
                self.assertFalse(self.together(unnamed(text), unnamed(text)))

    def test_a_word_that_is_a_constant_or_type_elsewhere_keeps_files_apart(self):
        self.assertFalse(self.together(unnamed("constexpr int kA = 1;"),
                                       "void f() { int kA = 2; use(kA); }\n"))
        self.assertFalse(self.together("#define LIMIT 3\n", "int LIMIT;\n"))
        self.assertFalse(self.together("static int counter = 0;\n", "int counter();\n"))

    def test_a_function_is_in_the_way_of_calls_alone(self):
        function = unnamed("int size(int a) { return a; }")
        self.assertFalse(self.together(function, "int f() { return size(2); }\n"))
        self.assertTrue(self.together(function, "int f(B b) { return b.size() + b->size(); }\n"))
        self.assertTrue(self.together(function, "int f(B size) { return size + B::size(); }\n"))

    def test_a_type_that_a_header_declares_keeps_files_apart(self):
        self.write("inner.h", "namespace kx {\nstruct Place {};\n}  // namespace kx\n")
        self.write("outer.h", '#include "inner.h"\n')
        self.assertFalse(self.together(unnamed("struct Place { int x; };"),
                                       '#include "outer.h"\nint f();\n'))

    def test_aliases_may_be_repeated_but_not_differ(self):
        alias = unnamed("using Rows = std::vector<int>;", "Rows all();")
        self.assertTrue(self.together(unnamed("using Rows = std::vector<int>;"),
                                      unnamed("using Rows = std::vector<int>;")))
        self.assertFalse(self.together(unnamed("using Rows = std::list<int>;"), alias))
        self.assertFalse(self.together(unnamed("using Rows = std::list<int>;"), "Rows f;\n"))

    def test_using_directives_are_shared_by_all_or_none(self):
        directive = unnamed("") + "using namespace test;\n"
        self.assertTrue(self.together(directive, directive))
        self.assertFalse(self.together(directive, "int f();\n"))

    def test_comments_and_literals_say_nothing(self):
        self.assertTrue(self.together(unnamed("constexpr int kA = 1;"),
                                      '// kA\nconst char* f() { return "kA"; }\n'))

    def test_a_group_has_about_so_many_lines(self):
        text = "\n".join(["// a"] * 60) + "\n"
        self.assertEqual(self.groups("--lines", "150", a=text, b=text, c=text, d=text),
                         [["a", "b"], ["c", "d"]])


if __name__ == "__main__":
    unittest.main()
