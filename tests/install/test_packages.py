"""What debian/ says, beside what the tree is."""

import os
import re
import subprocess
import unittest

from installed import PATIENCE, Root
from test_files import COMPONENTS

TREE = os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "..")
# g++ comes with every package build, and the compiler cache is no part of it.
NOT_FOR_PACKAGES = {"g++", "ccache"}


def text(*names):
    with open(os.path.join(TREE, *names), encoding="utf-8") as file:
        return file.read()


class Packages(unittest.TestCase):
    def test_are_the_components_of_an_installation(self):
        packages = re.findall("^Package: (.*)$", text("debian", "control"), re.M)
        self.assertEqual(sorted(packages), sorted(COMPONENTS))

    def test_are_built_with_what_the_programs_are_built_with(self):
        field = re.search("^Build-Depends:\n((?: .*\n)+)", text("debian", "control"), re.M)[1]
        named = {re.split("[ :,]", line.strip())[0] for line in field.splitlines()}
        makefile = text("Makefile").replace("\\\n", " ")
        needed = set(re.search("^BUILD_PACKAGES := (.*)$", makefile, re.M)[1].split())
        helpers = {name for name in named if name.startswith(("debhelper-", "dh-"))}
        self.assertEqual(named - helpers, needed - NOT_FOR_PACKAGES)

    def test_have_the_version_of_the_programs(self):
        ours = re.search(r"^project\(halyard VERSION (\S+)", text("CMakeLists.txt"), re.M)[1]
        packaged = re.match(r"halyard \(([^)]+)\)", text("debian", "changelog"))[1]
        self.assertEqual(packaged, ours)

    def test_name_every_symbol_of_the_library_and_no_other(self):
        root = Root().install("libhalyard0")
        self.addCleanup(root.remove)
        shown = subprocess.run(
            ["nm", "-D", "--defined-only", root.lib("libhalyard.so.0")], check=True,
            capture_output=True, text=True, timeout=PATIENCE).stdout
        symbols = text("debian", "libhalyard0.symbols")
        self.assertEqual(
            sorted(re.findall(r"^ (\S+@HALYARD_0) \S+$", symbols, re.M)),
            sorted(re.sub("^HALYARD_0$", "HALYARD_0@HALYARD_0", name.replace("@@", "@"))
                   for name in re.findall(r" [A-Z] (\S+)", shown)))


if __name__ == "__main__":
    unittest.main()
