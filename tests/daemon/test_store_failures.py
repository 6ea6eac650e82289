"""A store that cannot write stops no session and no reply; what it could not
keep is counted and told once."""

import os
import re
import sqlite3
import subprocess
import unittest

from faulty_disk import FaultyDisk
from harness import PATIENCE, Daemon, DaemonTest


def send(client, reporter_id, count, size=2000):
    for number in range(count):
        client.notify("sendMessage", {"n": number, "text": "x" * size}, 4, 1, [reporter_id])
    client.result("getAllReporters")


class Locked(DaemonTest):
    def test_a_locked_store_holds_up_nobody_and_catches_up(self):
        client = self.connect()
        client.session(1)
        client.result("admin.flush")
        lock = sqlite3.connect(self.daemon.store_path)
        lock.execute("BEGIN IMMEDIATE")
        send(client, 1, 100)
        self.assertIs(client.result("reporterIDValid", 1)["reporterID"], 1)
        lock.rollback()
        lock.close()
        self.daemon.wait_for(lambda: self.daemon.rows(
            "SELECT count(*) FROM upload_message")[0][0] == 100)


class OnTmpfs(unittest.TestCase):
    """A file system that fills."""

    def setUp(self):
        if os.geteuid() != 0:
            self.skipTest("mounting needs root")
        self.daemon = Daemon()
        self.addCleanup(self.daemon.remove)
        self.state = os.path.dirname(self.daemon.store_path)
        mounted = subprocess.run(["mount", "-t", "tmpfs", "-o", "size=2m", "none", self.state],
                                 stderr=subprocess.DEVNULL, check=False)
        if mounted.returncode != 0:
            self.skipTest("mounting is not allowed here")
        self.addCleanup(subprocess.run, ["umount", self.state], check=False)
        self.daemon.run()
        self.addCleanup(self.daemon.kill)

    def test_a_full_disk_is_counted_and_told_once(self):
        client = self.daemon.client()
        self.addCleanup(client.close)
        client.session(1)
        send(client, 1, 20000)
        self.daemon.wait_for(lambda: self.lost(client) > 0)
        self.assertEqual(client.result("reporterIDValid", 1)["reporterID"], 1)
        told = [line for line in self.daemon.log().splitlines()
                if line.startswith("error hyrx") and "Store" in line]
        self.assertEqual(len(told), 1, told)

        subprocess.run(["mount", "-o", "remount,size=200m", self.state], check=True)
        self.daemon.wait_for(lambda: client.result("admin.status")["store"]["failing"] is False)
        stored = client.result("admin.status")["store"]["rows"]["upload_message"]
        send(client, 1, 10)
        client.result("admin.flush")
        self.assertGreaterEqual(
            client.result("admin.status")["store"]["rows"]["upload_message"], stored + 10)

    @staticmethod
    def lost(client):
        return client.result("admin.status")["store"]["lost"]["upload_message"]["disk_full"]


class NotOpened(unittest.TestCase):
    def start(self, prepare):
        daemon = Daemon()
        self.addCleanup(daemon.remove)
        prepare(daemon)
        return daemon.run()

    def test_a_newer_schema_is_left_alone(self):
        def prepare(daemon):
            database = sqlite3.connect(daemon.store_path)
            database.execute("PRAGMA user_version = 99")
            database.execute("CREATE TABLE theirs(x)")
            database.commit()
            database.close()

        daemon = self.start(prepare)
        client = daemon.client()
        self.addCleanup(client.close)
        client.session(1)
        client.result("sendMessage", {"a": 1}, 4, 1, [1])
        self.assertIs(client.result("admin.flush"), True)
        daemon.wait_for(lambda: "no backends found" in daemon.log())
        self.assertEqual(daemon.rows("SELECT name FROM sqlite_master"), [("theirs",)])

    def test_a_damaged_file_is_set_aside(self):
        def prepare(daemon):
            with open(daemon.store_path, "wb") as file:
                file.write(b"this is no database" * 1000)

        daemon = self.start(prepare)
        client = daemon.client()
        self.addCleanup(client.close)
        client.session(1)
        client.result("sendMessage", {"a": 1}, 4, 1, [1])
        client.result("admin.flush")
        self.assertEqual(daemon.rows("SELECT count(*) FROM upload_message"), [(1,)])
        aside = [name for name in os.listdir(os.path.dirname(daemon.store_path))
                 if name.startswith("telemetry.db.damaged-")]
        self.assertEqual(len(aside), 1)


class FaultyDiskTest(unittest.TestCase):
    """A disk that answers late, with errors, or not at all."""

    configuration = ""

    def setUp(self):
        library = os.environ.get("FAULTY_DISK_LIBRARY", "")
        if not os.path.exists(library):
            self.skipTest("FAULTY_DISK_LIBRARY names no library")
        self.daemon = Daemon(self.configuration)
        self.addCleanup(self.daemon.remove)
        self.disk = FaultyDisk(library, self.daemon.path("disk"))
        self.daemon.start(extra=self.disk.environment())
        self.daemon.wait_until_it_accepts(PATIENCE)
        self.client = self.daemon.client()
        self.addCleanup(self.client.close)
        self.client.session(1)
        self.sent = 0

    def send(self):
        self.client.result("sendMessage", {"n": self.sent}, 4, 1, [1])
        self.sent += 1

    def store(self):
        return self.client.result("admin.status")["store"]

    def messages(self):
        return self.daemon.rows("SELECT count(*) FROM upload_message WHERE category = 4")[0][0]


class OnAFaultyDisk(FaultyDiskTest):
    def test_a_hang_is_told_and_so_is_what_it_costs(self):
        self.send()
        self.client.result("admin.flush")
        self.disk.tell("hang")

        def failing():
            self.send()
            return self.store()["failing"]

        self.daemon.wait_for(failing)
        self.daemon.wait_for(lambda: "the file system does not answer" in self.daemon.log())
        status = self.daemon.terminate()
        self.assertEqual(status, 0)
        lost = re.search(r"closing .*, (\d+) rows lost", self.daemon.log())
        self.assertIsNotNone(lost, self.daemon.log())
        self.assertGreaterEqual(int(lost.group(1)), self.sent - self.messages())

    def test_a_service_that_is_killed_waits_for_a_disk_that_is_slow(self):
        self.send()
        self.client.result("admin.flush")
        self.disk.tell("slow", 2500)
        for _ in range(5):
            self.send()
        self.client.start("killService")
        self.assertEqual(self.daemon.process.wait(PATIENCE), 2)
        self.assertEqual(self.messages(), self.sent)
        self.assertIn('"waiting":0,', self.daemon.log().splitlines()[-1])

    def test_read_errors_for_a_while_cost_nothing(self):
        for _ in range(100):
            self.send()
        self.client.result("admin.flush")
        other = sqlite3.connect(self.daemon.store_path)  # Makes the daemon read again.
        other.execute("INSERT INTO incident(signature) VALUES('{}')")
        other.commit()
        other.execute("PRAGMA wal_checkpoint(TRUNCATE)")
        other.close()
        self.disk.tell("read_error")
        self.send()
        self.daemon.wait_for(lambda: self.store()["failing"])
        self.disk.tell("none")
        self.send()
        self.client.result("admin.flush")
        self.assertEqual(self.messages(), self.sent)
        self.assertNotIn("set aside", self.daemon.log())

    def test_a_log_that_is_removed_takes_nothing_along(self):
        self.send()
        self.client.result("admin.flush")
        os.remove(self.daemon.store_path + "-wal")
        for _ in range(10):
            self.send()
        self.client.result("admin.flush")
        self.daemon.kill()
        self.assertEqual(self.messages(), self.sent)

    def test_a_log_that_is_removed_is_missed_though_nothing_is_written(self):
        self.send()
        self.client.result("admin.flush")
        os.remove(self.daemon.store_path + "-wal")
        self.daemon.wait_for(lambda: "what was in it is kept" in self.daemon.log())
        self.daemon.kill()
        self.assertEqual(self.messages(), self.sent)


class AnInternalBuild(FaultyDiskTest):
    configuration = "[device_properties]\nInternalBuild = true\n"

    def hang_while_a_session_writes_its_file(self):
        self.send()
        self.client.result("admin.flush")
        syncs = self.disk.syncs()
        self.disk.tell("hang")
        self.client.start("stopReportingSessionForID", 1)
        self.daemon.wait_for(lambda: self.disk.syncs() > syncs)

    def test_ends_though_a_session_writes_its_file_to_a_disk_that_hangs(self):
        self.hang_while_a_session_writes_its_file()
        self.assertEqual(self.daemon.terminate(), 0)

    def test_tells_the_requests_that_a_disk_that_hangs_kept_it_from(self):
        self.hang_while_a_session_writes_its_file()
        for n in range(20):
            self.client.notify("sendMessage", {"n": n}, 4, 1, [1])
        self.assertEqual(self.daemon.terminate(), 0)
        undone = re.search(r"work left undone: (\d+) requests were not looked at",
                           self.daemon.log())
        self.assertIsNotNone(undone, self.daemon.log())
        self.assertIn(int(undone.group(1)) - 20, [0, 1])  # The client's end is one.


if __name__ == "__main__":
    unittest.main()
