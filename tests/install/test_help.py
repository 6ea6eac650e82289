"""Man pages and completions hold all that the programs say they can."""

import glob
import os
import re
import shutil
import subprocess
import unittest

from installed import PATIENCE, PREFIX, Root

ZSH = "share/zsh/" + ("vendor-completions" if PREFIX == "/usr" else "site-functions")
COMMAND = re.compile(r"^  ([a-z]+)\s{2,}", re.M)
OPTION = re.compile(r"^  (?:-\w, ?)?(--[\w-]+)", re.M)


def output(*command, **options):
    return subprocess.run(command, check=True, capture_output=True, text=True, timeout=PATIENCE,
                          **options).stdout


class Installed(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.root = Root().install("halyard", "halyard-tools", "halyard-pipewire", "libhalyard-dev",
                                  "halyard-export")
        cls.addClassCleanup(cls.root.remove)

    def help(self, program, *arguments):
        return output(self.root.prefixed("bin", program), *arguments, "--help",
                      env=os.environ | {"LD_LIBRARY_PATH": os.environ["BUILD"]})

    def commands(self):
        return COMMAND.findall(self.help("halyardctl").split("Subcommands:")[1])

    def options(self, *command):
        return set(OPTION.findall(self.help("halyardctl", *command)))

    def page(self, name):
        with open(self.root.prefixed("share/man", f"man{name[-1]}", name),
                  encoding="utf-8") as file:
            return file.read()


class Pages(Installed):
    def named_options(self, page):
        return {"--" + name for name in re.findall(r"Fl -([a-z][\w-]*)", self.page(page))}

    def test_have_no_mistakes(self):
        if not shutil.which("mandoc"):
            self.skipTest("no mandoc here")
        pages = glob.glob(self.root.prefixed("share/man/man*/*"))
        self.assertEqual(len(pages), 6)
        found = subprocess.run(["mandoc", "-T", "lint", *pages], text=True, timeout=PATIENCE,
                               stdout=subprocess.PIPE, stderr=subprocess.STDOUT).stdout
        # The pages that they name need not be installed here.
        mistakes = [line for line in found.splitlines()
                    if "referenced manual not found" not in line and "mandoc.db" not in line]
        self.assertEqual(mistakes, [])

    def test_halyardctl_s_names_every_command(self):
        words = {word for line in self.page("halyardctl.1").splitlines()
                 if line.startswith(".It Cm") for word in line.split()}
        self.assertEqual(set(self.commands()) - words, set())

    def test_halyardctl_s_names_every_option_and_no_other(self):
        known = self.options().union(*(self.options(name) for name in self.commands()))
        self.assertEqual(self.named_options("halyardctl.1"), known)

    def test_halyard_pipewire_s_names_every_option_and_no_other(self):
        known = set(re.findall(r"--[\w-]+", self.help("halyard-pipewire")))
        self.assertEqual(self.named_options("halyard-pipewire.1"), known)

    def test_halyard_export_s_names_every_option_and_no_other(self):
        known = set(OPTION.findall(output(self.root.prefixed("sbin/halyard-export"), "--help")))
        self.assertEqual(self.named_options("halyard-export.8"), known)

    def test_the_configuration_s_names_every_key_that_the_file_shows(self):
        with open(os.path.join(self.root.path, "etc/halyard/halyard.toml"),
                  encoding="utf-8") as file:
            keys = re.findall(r"^#(?:   )?([\w-]+) = ", file.read(), re.M)
        page = self.page("halyard.toml.5")
        named = set(re.findall(r"[\w-]+", " ".join(
            line for line in page.splitlines() if line.startswith(".It Ic"))))
        self.assertGreater(len(keys), 10)
        self.assertEqual(set(keys) - named, set())

    def test_the_library_s_names_what_there_is(self):
        with open(self.root.prefixed("include/halyard/halyard.h"), encoding="utf-8") as file:
            header = file.read()
        for name in re.findall(r"(?:Fn|Dv) (\w+)", self.page("halyard.3")):
            self.assertTrue(name == "NULL" or name in header, name)


class Completions(Installed):
    def completed(self, *words):
        """What bash offers for the last of `words`."""
        path = self.root.prefixed("share/bash-completion/completions/halyardctl")
        script = (f'source "{path}"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _halyardctl;'
                  ' printf "%s\\n" "${COMPREPLY[@]}"')
        return set(output("bash", "-c", script, "bash", "halyardctl", *words).split())

    def test_bash_s_offer_every_command(self):
        self.assertEqual(self.completed(""), set(self.commands()))
        self.assertEqual(self.completed("--state", "/", "se"),
                         {name for name in self.commands() if name.startswith("se")})

    def test_bash_s_offer_every_option_of_a_command(self):
        for name in self.commands():
            with self.subTest(name):
                offered = {word for word in self.completed(name, "--")}
                self.assertEqual(offered, self.options(name) | self.options())

    def test_bash_s_offer_what_an_option_takes(self):
        self.assertEqual(self.completed("glitches", "--by", ""), {"app", "device", "cause", "hour"})
        self.assertEqual(self.completed("watch", ""),
                         {"messages", "glitches", "events", "incidents"})

    def test_zsh_s_are_a_program_that_names_all_of_them(self):
        path = self.root.prefixed(ZSH, "_halyardctl")
        if shutil.which("zsh"):
            output("zsh", "-n", path)
        with open(path, encoding="utf-8") as file:
            text = file.read()
        for name in self.commands():
            self.assertIn(f"'{name}:", text)
            for option in self.options(name):
                self.assertRegex(text, f"'\\*?{option}\\[")


if __name__ == "__main__":
    unittest.main()
