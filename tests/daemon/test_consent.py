"""What a store says of itself: whose it is, and when its owner agreed; and the command that
says so. HALYARDCTL names the program."""

import json
import os
import sqlite3
import stat
import subprocess
import tempfile
import time
import unittest

from harness import PATIENCE, DaemonTest

HALYARDCTL = os.environ.get("HALYARDCTL", "build/release/halyardctl")
AGREED = "[export]\nconsent = true\n"


class Notes(DaemonTest):
    def notes(self):
        """Of the store; none while it has no such table yet."""
        try:
            return [given for [given] in self.rows("SELECT given FROM consent ORDER BY id")]
        except sqlite3.OperationalError:
            return None

    def identity(self):
        return self.rows("SELECT device FROM identity")[0][0]

    def drop_in(self, name, text):
        folder = os.path.join(self.daemon.path("etc"), "halyard.d")
        os.makedirs(folder, exist_ok=True)
        with open(os.path.join(folder, name), "w", encoding="utf-8") as file:
            file.write(text)

    def wait_for_notes(self, expected):
        self.daemon.wait_for(lambda: self.notes() == expected)

    def test_each_change_is_noted_as_it_comes(self):
        self.daemon.configure(AGREED)
        self.wait_for_notes([1])
        self.drop_in("50.toml", "export.consent = false\n")
        self.wait_for_notes([1, 0])
        self.drop_in("60.toml", AGREED)
        self.wait_for_notes([1, 0, 1])
        [[newest]] = self.rows("SELECT max(time) FROM consent")
        self.assertLess(abs(newest - time.time()), 60)

    def test_a_broken_drop_in_changes_nothing(self):
        self.daemon.configure(AGREED)
        self.wait_for_notes([1])
        self.drop_in("50.toml", "export.consent = no\n")
        self.daemon.wait_for(lambda: "halyard.d/50.toml:1:" in self.daemon.log())
        self.assertEqual(self.notes(), [1])

    def test_kills_lose_and_repeat_nothing(self):
        self.daemon.configure(AGREED)
        self.wait_for_notes([1])
        identity = self.identity()
        for expected in ([1], [1, 0], [1, 0]):
            self.daemon.kill()
            self.daemon.configure("" if 0 in expected else AGREED)
            self.daemon.run()
            self.connect().session(1)
            self.flush()
            self.assertEqual((self.notes(), self.identity()), (expected, identity))

    def test_a_purge_forgets_whose_it_was(self):
        self.daemon.configure(AGREED)
        self.wait_for_notes([1])
        identity, [[before]] = self.identity(), self.rows("SELECT time FROM consent")
        self.connect().result("admin.purge")
        self.assertNotEqual(self.identity(), identity)
        [[given, after]] = self.rows("SELECT given, time FROM consent")
        self.assertEqual(given, 1)
        self.assertGreater(after, before)


class Command(DaemonTest):
    """halyardctl consent beside a running daemon."""

    def setUp(self):
        super().setUp()
        self.etc = self.daemon.path("etc")
        self.file = os.path.join(self.etc, "halyard.d", "consent.toml")

    def consent(self, *arguments, **options):
        return subprocess.run(
            [HALYARDCTL, "--state", self.daemon.path("state"), "consent", *arguments,
             "--config", self.etc],
            text=True, capture_output=True, timeout=PATIENCE, check=False, **options)

    def shown(self):
        done = self.consent("show", "--json")
        self.assertEqual(done.returncode, 0, done.stderr)
        return json.loads(done.stdout)

    def write(self, name, text):
        path = os.path.join(self.etc, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, "w", encoding="utf-8") as file:
            file.write(text)
        return path

    def test_without_any_word_there_is_no_consent(self):
        self.assertEqual(self.shown(), {"given": False, "file": None, "since": None})
        self.assertEqual(self.consent("show").stdout,
                         "Consent is not given: no file says anything, which means no.\n")

    def test_what_is_given_reaches_the_store(self):
        done = self.consent("give")
        self.assertEqual(done.returncode, 0, done.stderr)
        self.assertEqual(done.stdout,
                         f"Wrote {self.file}.\nConsent is given: {self.file} says so.\n"
                         "Before it was not given: no file says anything, which means no.\n")
        self.daemon.wait_for(lambda: self.shown()["since"] is not None)
        self.assertEqual(self.shown(), {"given": True, "file": self.file,
                                        "since": self.rows("SELECT time FROM consent")[0][0]})

    def test_what_is_withdrawn_wins_over_the_operators_file(self):
        operators = self.write("halyard.toml", AGREED)
        done = self.consent("withdraw", "--json")
        self.assertEqual(done.returncode, 0, done.stderr)
        shown = json.loads(done.stdout)
        del shown["since"]  # The daemon may have noted it already.
        self.assertEqual(shown, {"given": False, "file": self.file, "before": True})
        with open(operators, encoding="utf-8") as file:
            self.assertEqual(file.read(), AGREED)

    def test_the_daemons_user_may_read_what_was_written_whatever_the_umask(self):
        self.assertEqual(self.consent("give", umask=0o077).returncode, 0)
        self.assertEqual(stat.S_IMODE(os.stat(self.file).st_mode), 0o644)
        self.assertEqual(stat.S_IMODE(os.stat(os.path.dirname(self.file)).st_mode), 0o755)
        self.assertEqual(os.listdir(os.path.dirname(self.file)), ["consent.toml"])

    def test_a_drop_in_with_a_later_name_is_told(self):
        later = self.write("halyard.d/x.toml", AGREED)
        done = self.consent("withdraw")
        self.assertEqual(done.returncode, 1)
        self.assertIn(f"{later} wins over {self.file}", done.stderr)
        self.assertIn(f"Consent is given: {later} says so.", done.stdout)

    def test_a_mistake_in_any_file_is_told(self):
        broken = self.write("halyard.toml", "[export\n")
        for arguments in (["show"], ["withdraw"]):
            done = self.consent(*arguments)
            self.assertEqual(done.returncode, 1)
            self.assertIn(f"{broken}:1:", done.stderr)
        self.assertTrue(os.path.exists(self.file))

    def test_who_may_not_write_is_told_so(self):
        if os.geteuid() != 0:
            self.skipTest("only root becomes somebody else")
        os.chmod(self.daemon.root, 0o755)
        done = self.consent("give", user=65534, group=65534, extra_groups=[])
        self.assertEqual(done.returncode, 4, done.stderr)
        self.assertIn("cannot write", done.stderr)
        self.assertFalse(os.path.exists(self.file))

    def test_other_words_are_wrong_use(self):
        self.assertEqual(self.consent("sell").returncode, 2)
        self.assertEqual(self.consent().returncode, 2)

    def test_missing_directories_are_made(self):
        with tempfile.TemporaryDirectory() as root:
            self.etc = os.path.join(root, "a", "b")
            self.assertEqual(self.consent("give").returncode, 0)
            self.assertTrue(self.shown()["given"])


if __name__ == "__main__":
    unittest.main()
