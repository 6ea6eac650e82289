"""What the daemon keeps is its own user's to read, whatever the umask and whoever
made the directories; a group of readers may be let in."""

import grp
import os
import stat
import unittest

from harness import Daemon

INTERNAL = "[device_properties]\nInternalBuild = true\n"


class PrivateFiles(unittest.TestCase):
    def start(self, configuration):
        daemon = Daemon(configuration)
        self.addCleanup(daemon.remove)
        for name in ("state", "log"):
            os.chmod(daemon.path(name), 0o777)
        return daemon

    def run_under_no_mask(self, daemon):
        before = os.umask(0)
        try:
            daemon.run()
        finally:
            os.umask(before)
        client = daemon.client()
        self.addCleanup(client.close)
        client.session(1)
        client.result("sendMessage", {"text": "private"}, 4, 1, [1])
        client.result("stopReportingSessionForID", 1)
        client.result("admin.flush")
        return client

    def kinds(self, daemon):
        """(mode, group) of all files and of all directories in state and logs."""
        files, directories = {}, {}
        for top in (daemon.path("state"), daemon.path("log")):
            for path, _, names in os.walk(top):
                directories[path] = self.kind(path)
                files |= {name: self.kind(os.path.join(path, name)) for name in names}
        return files, directories

    @staticmethod
    def kind(path):
        facts = os.lstat(path)
        return oct(stat.S_IMODE(facts.st_mode)), facts.st_gid

    def test_nobody_else_reads_anything(self):
        daemon = self.start(INTERNAL)
        self.run_under_no_mask(daemon)
        files, directories = self.kinds(daemon)
        self.assertLessEqual({"telemetry.db", "telemetry.db-wal", "telemetry.db-shm"}, set(files))
        self.assertTrue([name for name in files if name.endswith(".json")], files)
        self.assertEqual({mode for mode, _ in files.values()}, {"0o600"}, files)
        self.assertEqual({mode for mode, _ in directories.values()}, {"0o750"}, directories)
        self.assertEqual(self.kind(daemon.socket_path)[0], "0o666")
        self.assertEqual(self.kind(daemon.path("run"))[0], "0o755")

    def test_readers_read_also_what_is_made_later(self):
        # Another group than the one that files have anyway.
        groups = [group for group in os.getgroups() if group != os.getegid()]
        if os.geteuid() == 0:
            groups = [entry.gr_gid for entry in grp.getgrall() if entry.gr_gid != os.getegid()]
        if not groups:
            self.skipTest("there is no second group")
        daemon = self.start(INTERNAL + f'[access]\nreaders = "{groups[0]}"\n')
        self.run_under_no_mask(daemon)
        files, directories = self.kinds(daemon)
        self.assertTrue([name for name in files if name.endswith(".json")], files)
        self.assertEqual(set(files.values()), {("0o640", groups[0])}, files)
        self.assertEqual(set(directories.values()), {("0o750", groups[0])}, directories)

    def test_links_are_not_followed(self):
        daemon = self.start(INTERNAL)
        elsewhere = daemon.path("elsewhere")
        os.mkdir(elsewhere)
        os.symlink(elsewhere, daemon.path("log", "Reporting"))
        os.symlink(os.path.join(elsewhere, "db"), daemon.store_path)
        self.run_under_no_mask(daemon)
        self.assertEqual(os.listdir(elsewhere), [])
        self.assertIn("it is a symbolic link", daemon.log())


if __name__ == "__main__":
    unittest.main()
