#!/usr/bin/env python3
"""What the package says of itself beside what the tree says: control_test.py SOURCE-FOLDER."""

import json
import os
import sys
import unittest

SOURCE = os.path.abspath(sys.argv[1])


def read(*names):
    with open(os.path.join(SOURCE, *names)) as file:
        return file.read()


class Control(unittest.TestCase):
    def test_it_is_built_with_the_libraries_of_the_tree(self):
        lines = [line.split() for line in read("scripts/packages").splitlines()]
        libraries = {line[1] for line in lines if line and line[0] == "build" and line[1].endswith("-dev")}
        self.assertGreater(len(libraries), 5)
        control = read("packaging/debian/control")
        wanted = {line.strip(" ,") for line in control.split("Package:")[0].splitlines()}
        self.assertEqual(libraries - wanted, set())

    def test_the_licence_of_what_the_page_holds_is_told(self):
        packages = json.loads(read("web/package-lock.json"))["packages"]
        bundled = [path for path, it in packages.items() if path and not it.get("dev")]
        self.assertGreater(len(bundled), 0)
        named = read("packaging/debian/copyright")
        self.assertEqual([path for path in bundled if f"Files: web/{path}/*" not in named], [])

    def test_both_are_of_one_version(self):
        version = read("packaging/debian/changelog").split("(")[1].split(")")[0]
        self.assertIn(f"project(arbory VERSION {version} ", read("CMakeLists.txt"))


if __name__ == "__main__":
    unittest.main(argv=sys.argv[:1])
