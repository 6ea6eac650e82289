"""What the service manager's own checker says of the units, and what their sandbox leaves open."""

import os
import re
import shutil
import subprocess
import unittest

from installed import PATIENCE, PREFIX, Root

UNITS = ("/lib/systemd/system" if PREFIX == "/usr" else PREFIX + "/lib/systemd/system")


def analyze(*arguments):
    return subprocess.run(["systemd-analyze", "--no-pager", *arguments], text=True,
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT, timeout=PATIENCE)


@unittest.skipUnless(shutil.which("systemd-analyze"), "no systemd-analyze here")
class Units(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.root = Root().install("halyard", "halyard-pipewire", "halyard-export")
        cls.addClassCleanup(cls.root.remove)
        # Checked are units whose programs exist; these do in the root.
        for unit in cls.all_units():
            with open(unit, encoding="utf-8") as file:
                text = file.read()
            with open(unit, "w", encoding="utf-8") as file:
                file.write(text.replace(f"ExecStart={PREFIX}", f"ExecStart={cls.root.prefixed()}"))

    @classmethod
    def unit(cls, name):
        return cls.root.path + UNITS + "/" + name

    @classmethod
    def all_units(cls):
        return [cls.unit("halyardd.service"), cls.unit("halyardd.socket"),
                cls.root.prefixed("lib/systemd/user/halyard-pipewire.service"),
                cls.unit("halyard-export.service")]

    def test_the_daemon_s_have_no_mistakes(self):
        found = analyze("verify", "--man=no", self.unit("halyardd.socket"),
                        self.unit("halyardd.service"))
        ours = [line for line in found.stdout.splitlines() if "halyard" in line]
        self.assertEqual(ours, [])

    def test_the_export_s_has_no_mistakes(self):
        found = analyze("verify", "--man=no", self.unit("halyard-export.service"))
        self.assertEqual([line for line in found.stdout.splitlines() if "halyard" in line], [])

    def test_the_user_s_has_no_mistakes(self):
        found = analyze("verify", "--man=no", "--user", self.all_units()[2])
        # "Failed to prepare filename", where no service manager has made its folders.
        ours = [line for line in found.stdout.splitlines() if "halyard-pipewire.service:" in line]
        self.assertEqual(ours, [])

    def exposure(self, unit):
        found = analyze("security", "--offline=yes", unit).stdout
        return float(re.search(r"Overall exposure level for \S+: (\S+)", found)[1])

    def test_the_daemon_s_sandbox_leaves_little_open(self):
        self.assertLessEqual(self.exposure(self.unit("halyardd.service")), 1.5)

    def test_the_export_s_sandbox_leaves_little_but_the_network_open(self):
        self.assertLessEqual(self.exposure(self.unit("halyard-export.service")), 1.5)

    def test_event_traces_open_no_more_than_they_need(self):
        drop_in = self.unit("halyardd.service") + ".d"
        os.mkdir(drop_in)
        self.addCleanup(shutil.rmtree, drop_in)
        shutil.copy(self.root.prefixed("share/doc/halyard/examples/event-traces.conf"), drop_in)
        self.assertLessEqual(self.exposure(self.unit("halyardd.service")), 2.2)
        found = analyze("security", "--offline=yes", self.unit("halyardd.service")).stdout
        self.assertRegex(found, "✗ CapabilityBoundingSet=~CAP_SYS_PTRACE")
        self.assertRegex(found, "✓ CapabilityBoundingSet=~CAP_SYS_ADMIN")


if __name__ == "__main__":
    unittest.main()
