"""The daemon under more than it can do, and under the worst way to end it."""

import json
import threading
import unittest

import msgpack

from harness import Client, Daemon, DaemonTest


def message(number):
    return {"n": number, "text": "x" * 120, "rate": 48000.5, "list": [1, 2, 3], "more": {"a": 1}}


def flood(path, reporter_id, stop):
    """Sends as fast as the daemon takes it."""
    client = Client(path)
    client.session(reporter_id)
    number = 0
    try:
        while not stop.is_set():
            burst = b"".join(
                msgpack.packb([2, "sendMessage", [message(number + i), 4, 1, [reporter_id]]])
                for i in range(50))
            client.raw(burst)
            number += 50
    except OSError:
        pass  # The daemon was killed.
    finally:
        client.close()


class KilledInFullLoad(DaemonTest):
    def test_nothing_committed_is_missing(self):
        stop = threading.Event()
        sender = threading.Thread(target=flood, args=(self.daemon.socket_path, 1, stop))
        sender.start()
        count = "SELECT count(*) FROM upload_message"
        self.daemon.wait_for(lambda: self.daemon.rows(count)[0][0] > 5000)
        [(committed,)] = self.daemon.rows(count)
        # Accepted: the daemon has taken these requests, it answers behind them.
        witness = self.connect()
        requests = witness.result("admin.status")["listener"]["requests"]
        self.daemon.wait_for(
            lambda: self.daemon.rows(count)[0][0] >= requests - 20)
        self.daemon.kill()
        stop.set()
        sender.join()

        self.daemon.run()
        self.assertEqual(self.daemon.rows("PRAGMA integrity_check"), [("ok",)])
        [(kept,)] = self.daemon.rows(count)
        self.assertGreaterEqual(kept, committed)
        self.assertGreaterEqual(kept, requests - 20)
        numbers = self.daemon.rows("SELECT payload FROM upload_message ORDER BY id")
        self.assertEqual([json.loads(row[0])["n"] for row in numbers], list(range(kept)))


class Overloaded(DaemonTest):
    def test_reads_less_grows_little_and_loses_nothing(self):
        clients = 4
        each = 20000
        senders = []
        for reporter_id in range(1, clients + 1):
            senders.append(threading.Thread(target=self.send, args=(reporter_id, each)))
        for sender in senders:
            sender.start()
        for sender in senders:
            sender.join()
        [(stored,)] = self.rows("SELECT count(*) FROM upload_message")
        self.assertEqual(stored, clients * each)
        status = self.connect().result("admin.status")
        lost = status["store"]["lost"].values()
        self.assertEqual({count for table in lost for count in table.values()}, {0})

    def send(self, reporter_id, count):
        client = self.connect()
        client.session(reporter_id)
        frames = b"".join(
            msgpack.packb([2, "sendMessage", [message(i), 4, 1, [reporter_id]]])
            for i in range(count))
        client.raw(frames)
        client.result("getAllReporters")


class ManySessions(DaemonTest):
    def threads(self):
        with open(f"/proc/{self.daemon.process.pid}/status", encoding="utf-8") as file:
            return int(next(line for line in file if line.startswith("Threads:")).split()[1])

    def test_a_thousand_sessions_use_no_more_threads_than_one(self):
        client = self.connect()
        client.session(1)
        client.result("admin.flush")
        before = self.threads()
        for reporter_id in range(2, 1001):
            client.start("createReportingSession", reporter_id)
            client.start("startReportingSessionForID", reporter_id)
        self.assertEqual(client.result("admin.status")["sessions_started"], 1000)
        self.assertEqual(self.threads(), before)


class SecondDaemon(DaemonTest):
    def test_is_told_that_there_is_one(self):
        second = Daemon()
        self.addCleanup(second.remove)
        second.root, kept = self.daemon.root, second.root
        second.log_path = kept + "/stderr"
        self.assertRaisesRegex(AssertionError, "another daemon listens", self.run_second, second)
        second.root = kept
        self.assertEqual(self.connect().result("getAllReporters"), [])

    @staticmethod
    def run_second(second):
        second.socket_path = "/nonexistent"
        second.run()


if __name__ == "__main__":
    unittest.main()
