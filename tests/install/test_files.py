"""Which files an installation lays down, and what they hold."""

import os
import re
import stat
import subprocess
import unittest

from installed import BUILD, PATIENCE, PREFIX, Root

ZSH = "share/zsh/" + ("vendor-completions" if PREFIX == "/usr" else "site-functions")
UNITS = "/lib/systemd/system" if PREFIX == "/usr" else "lib/systemd/system"
COMPONENTS = {
    "halyard": [
        "/etc/halyard/halyard.toml", f"{UNITS}/halyardd.service", f"{UNITS}/halyardd.socket",
        "lib/sysusers.d/halyard.conf", "sbin/halyardd",
        "share/doc/halyard/examples/event-traces.conf",
        "share/man/man5/halyard.toml.5", "share/man/man8/halyardd.8"],
    "libhalyard0": ["LIB/libhalyard.so.0", "LIB/libhalyard.so.0.1.0"],
    "libhalyard-dev": [
        "LIB/cmake/halyard/halyardConfig.cmake", "LIB/cmake/halyard/halyardConfigVersion.cmake",
        "LIB/cmake/halyard/halyardTargets-CONFIGURATION.cmake",
        "LIB/cmake/halyard/halyardTargets.cmake", "LIB/libhalyard.so",
        "LIB/pkgconfig/halyard.pc", "include/halyard/halyard.h", "include/halyard/halyard.hpp",
        "share/doc/libhalyard-dev/examples/player.c",
        "share/doc/libhalyard-dev/examples/recorder.cpp", "share/man/man3/halyard.3"],
    "halyard-tools": [
        "bin/halyardctl", "share/bash-completion/completions/halyardctl",
        "share/man/man1/halyardctl.1", f"{ZSH}/_halyardctl"],
    "halyard-pipewire": [
        "bin/halyard-pipewire", "lib/systemd/user/halyard-pipewire.service",
        "share/man/man1/halyard-pipewire.1"],
    "halyard-export": [
        f"{UNITS}/halyard-export.service", "lib/sysusers.d/halyard-export.conf",
        "sbin/halyard-export", "share/man/man8/halyard-export.8"],
}


class Files(unittest.TestCase):
    def installed(self, *components):
        root = Root()
        self.addCleanup(root.remove)
        return root.install(*components)

    def test_each_component_has_its_own(self):
        for component, files in COMPONENTS.items():
            with self.subTest(component):
                found = [re.sub("Targets-[a-z]+", "Targets-CONFIGURATION", path)
                         for path in self.installed(component).files()]
                self.assertEqual(found, sorted(files))

    def test_no_file_is_of_no_component(self):
        everything = Root()
        self.addCleanup(everything.remove)
        subprocess.run(["cmake", "--install", BUILD], check=True, stdout=subprocess.DEVNULL,
                       env=os.environ | {"DESTDIR": everything.path}, timeout=PATIENCE)
        self.assertEqual(everything.files(), self.installed(*COMPONENTS).files())

    def test_an_edited_configuration_stays(self):
        root = self.installed("halyard")
        path = os.path.join(root.path, "etc/halyard/halyard.toml")
        with open(path, "w", encoding="utf-8") as file:
            file.write("# mine\n")
        root.install("halyard")
        with open(path, encoding="utf-8") as file:
            self.assertEqual(file.read(), "# mine\n")

    def test_nothing_is_for_some_users_only(self):
        root = self.installed(*COMPONENTS)
        for folder, _, names in os.walk(root.path):
            for name in names:
                mode = stat.S_IMODE(os.stat(os.path.join(folder, name)).st_mode)
                self.assertEqual(mode & 0o444, 0o444, name)
                self.assertEqual(mode & 0o7022, 0, name)

    def test_units_name_the_programs_where_they_are(self):
        root = self.installed("halyard", "halyard-pipewire")
        for unit in root.files():
            if not unit.endswith(".service"):
                continue
            path = root.path + unit if unit.startswith("/") else root.prefixed(unit)
            with open(path, encoding="utf-8") as file:
                program = re.search("^ExecStart=(\\S+)$", file.read(), re.M)[1]
            self.assertTrue(os.access(root.path + program, os.X_OK), program)

    def test_programs_find_their_libraries_as_others_do(self):
        root = self.installed("halyard", "halyard-tools", "halyard-pipewire")
        for program in ("sbin/halyardd", "bin/halyardctl", "bin/halyard-pipewire"):
            dynamic = subprocess.run(["readelf", "-d", root.prefixed(program)], check=True,
                                     capture_output=True, text=True, timeout=PATIENCE).stdout
            self.assertNotRegex(dynamic, "R(UN)?PATH")


if __name__ == "__main__":
    unittest.main()
