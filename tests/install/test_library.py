"""libhalyard as another project finds it: nothing but the installed tree."""

import os
import re
import subprocess
import sys
import tempfile
import unittest

from installed import PATIENCE, Root

sys.path.append(os.path.join(os.path.dirname(__file__), "..", "daemon"))
from harness import DaemonTest  # noqa: E402

PROGRAM = os.path.join(os.path.dirname(os.path.abspath(__file__)), "program")
HEADER_FUNCTION = re.compile(r"\b((?:halyard|evmark)_[a-z_]+)\(")


def output(*command, **options):
    return subprocess.run(command, check=True, capture_output=True, text=True, timeout=PATIENCE,
                          **options).stdout


class Library(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.root = Root().install("libhalyard0", "libhalyard-dev")
        cls.addClassCleanup(cls.root.remove)

    def test_shows_what_the_header_declares_and_nothing_else(self):
        shown = re.findall(r" [A-Z] (\S+)", output("nm", "-D", "--defined-only",
                                                   self.root.lib("libhalyard.so.0")))
        with open(self.root.prefixed("include/halyard/halyard.h"), encoding="utf-8") as file:
            code = re.sub(r"/\*.*?\*/", "", file.read(), flags=re.DOTALL)
        declared = {f"{name}@@HALYARD_0" for name in HEADER_FUNCTION.findall(code)}
        self.assertEqual(set(shown), declared | {"HALYARD_0"})

    def test_says_its_soname(self):
        dynamic = output("readelf", "-d", self.root.lib("libhalyard.so"))
        self.assertIn("soname: [libhalyard.so.0]", dynamic)


class Examples(DaemonTest):
    """The example programs, built and run from a tree that has been moved."""

    @classmethod
    def setUpClass(cls):
        cls.root = Root().install("libhalyard0", "libhalyard-dev")
        cls.addClassCleanup(cls.root.remove)
        moved = tempfile.TemporaryDirectory(prefix="halyard-program-")
        cls.addClassCleanup(moved.cleanup)
        cls.work = moved.name
        cls.examples = cls.root.prefixed("share/doc/libhalyard-dev/examples")

    def report(self, *program):
        environment = os.environ | {"LD_LIBRARY_PATH": self.root.lib()}
        subprocess.run([*program, self.daemon.socket_path], check=True, env=environment,
                       timeout=PATIENCE, stdout=subprocess.DEVNULL)

    def applications(self):
        return [name for name, in self.rows(  # Sessions open side by side.
            "SELECT json_extract(user_info, '$.HostApplicationDisplayID') AS name"
            " FROM upload_session ORDER BY name")]

    def test_build_with_cmake(self):
        build = os.path.join(self.work, "cmake")
        output("cmake", "-G", "Ninja", "-S", PROGRAM, "-B", build, f"-DEXAMPLES={self.examples}",
               f"-DCMAKE_PREFIX_PATH={self.root.prefixed()}")
        output("cmake", "--build", build)
        self.report(os.path.join(build, "player"))
        self.report(os.path.join(build, "recorder"))
        self.assertEqual(self.applications(), ["org.example.player", "org.example.recorder"])

    def built_with_pkg_config(self):
        """Both programs."""
        flags = output("pkg-config", "--cflags", "--libs", "halyard",
                       env=os.environ | {"PKG_CONFIG_PATH": self.root.lib("pkgconfig")}).split()
        self.assertIn("-I" + self.root.prefixed("include"),
                      [flag[:2] + os.path.realpath(flag[2:]) for flag in flags])
        for compiler, source in (["cc", "-std=c11"], "player.c"), (["c++", "-std=c++20"],
                                                                   "recorder.cpp"):
            program = os.path.join(self.work, source + ".out")
            output(*compiler, "-Wall", "-Wextra", "-Werror",
                   os.path.join(self.examples, source), *flags, "-o", program)
            yield program

    def test_build_with_pkg_config(self):
        for program in self.built_with_pkg_config():
            self.report(program)
        self.assertEqual(self.applications(), ["org.example.player", "org.example.recorder"])

    def test_say_so_where_there_is_no_daemon(self):
        for program in self.built_with_pkg_config():
            done = subprocess.run([program, os.path.join(self.work, "no-socket")], check=False,
                                  env=os.environ | {"LD_LIBRARY_PATH": self.root.lib()},
                                  timeout=PATIENCE, stderr=subprocess.DEVNULL)
            self.assertEqual(done.returncode, 1, program)


if __name__ == "__main__":
    unittest.main()
