"""What a store says of itself: whose it is, and when its owner agreed."""

import os
import sqlite3
import time
import unittest

from harness import DaemonTest

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


if __name__ == "__main__":
    unittest.main()
