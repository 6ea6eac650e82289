"""The sheet of messages in admin.status: it adds up, at rest and at work."""

import json
import os
import re
import socket
import threading
import unittest

import msgpack

from harness import Daemon, DaemonTest


class Writer(threading.Thread):
    """Writes messages for a session as fast as the daemon takes them, until it takes none."""

    def __init__(self, client, reporter_id, wants_answers=False):
        super().__init__()
        self.client = client
        self.reporter_id = reporter_id
        self.frame_type = [0, 1] if wants_answers else [2]
        self.frames = 0  # that the kernel has taken in whole

    def run(self):
        try:
            while True:
                self.write(msgpack.packb([*self.frame_type, "sendMessage",
                                          [{"n": self.frames}, 4, 1, [self.reporter_id]]]))
                self.frames += 1
        except (BrokenPipeError, ConnectionResetError, BlockingIOError):
            pass

    def write(self, frame):
        while frame:
            frame = frame[self.client.socket.send(frame):]


class AccountingTest(DaemonTest):
    def sheet(self, client):
        status = client.result("admin.status")
        return status["messages"], status["store"]

    def assert_it_adds_up(self, client):
        messages, store = self.sheet(client)
        self.assertGreaterEqual(messages["waiting"], 0, messages)
        self.assertEqual(
            messages["offered"] + messages["own"],
            messages["repeats"] + sum(messages["not_uploaded"].values())
            + messages["delivered"] + messages["waiting"], messages)
        self.assertEqual(messages["delivered"],
                         store["rows"]["upload_message"]
                         + sum(store["lost"]["upload_message"].values()), (messages, store))
        return messages


class Accounting(AccountingTest):
    def send_many(self):
        with_sessions = self.connect()
        for reporter_id in range(1, 8):
            with_sessions.session(reporter_id, service_type=11 if reporter_id == 2 else 7)
        for i in range(2000):
            with_sessions.notify("sendMessage", {"n": i // 2}, 4, 1, [i % 9, i % 9])
            with_sessions.notify("sendMessage", {"n": i}, 4, 2, None if i % 50 == 0 else [])
        for reporter_id in range(1, 6):
            with_sessions.result("stopReportingSessionForID", reporter_id)

    def test_it_adds_up_while_clients_send_and_when_they_are_done(self):
        sending = [threading.Thread(target=self.send_many) for _ in range(2)]
        for thread in sending:
            thread.start()
        admin = self.connect()
        looks = 0
        while any(thread.is_alive() for thread in sending) or looks == 0:
            self.assert_it_adds_up(admin)
            looks += 1
        for thread in sending:
            thread.join()
        rows = self.rows("SELECT count(*) FROM upload_message")[0][0]
        messages = self.assert_it_adds_up(admin)
        self.assertEqual(messages["waiting"], 0)
        self.assertEqual(messages["delivered"], rows)
        self.assertEqual(messages["requests"], 8000)
        for rule in ("test", "limit"):
            self.assertGreater(messages["not_uploaded"][rule], 0, rule)
        for key in ("repeats", "unaddressed", "own"):
            self.assertGreater(messages[key], 0, key)

    def test_a_single_message_waits_for_its_second(self):
        client = self.connect()
        client.result("sendMessage", {"n": 1}, 4, 1, None)
        self.assertEqual(self.assert_it_adds_up(client)["waiting"], 1)
        self.flush()
        self.assertEqual(self.assert_it_adds_up(client)["delivered"], 1)

    def test_a_killed_daemon_leaves_sessions_that_were_interrupted(self):
        client = self.connect()
        client.session(7, service_type=7)
        client.result("sendMessage", {"n": 1}, 4, 1, [7])
        [(last,)] = self.rows("SELECT max(time) FROM upload_message")
        self.daemon.kill()
        self.daemon.run()
        self.assertEqual(self.rows("SELECT closed, ended FROM upload_session"),
                         [(last, "interrupted")])


class NothingLeavesUntold(AccountingTest):
    """Each way in which a message can go without a row, taken by a stranger."""

    def told(self, client):
        """The counts that are not 0, once all work is done."""
        self.flush()
        messages = self.assert_it_adds_up(client)
        for inner in ("not_uploaded", "lost_in_clients"):
            messages.update(messages.pop(inner))
        return {key: count for key, count in messages.items() if count}

    def send(self, client, reporter_ids, count=1):
        for n in range(count):
            client.result("sendMessage", {"n": n}, 4, 1, reporter_ids)

    def test_sessions_beyond_the_limit(self):
        client = self.connect()
        for reporter_id in range(1, 8):
            client.session(reporter_id, service_type=7)
        self.send(client, list(range(1, 8)), 3)
        self.assertEqual(self.told(client),
                         {"requests": 3, "offered": 21, "limit": 6, "delivered": 15})
        status = client.result("admin.status")
        self.assertEqual(status["sessions_not_uploaded"], 2)
        self.assertEqual(status["upload_limit"], 5)

    def test_sessions_of_tests(self):
        client = self.connect()
        client.session(1, service_type=11)
        self.send(client, [1], 3)
        self.assertEqual(self.told(client), {"requests": 3, "offered": 3, "test": 3})

    def test_what_no_session_has_the_id_of(self):
        client = self.connect()
        client.session(1)
        client.result("destroyReportingSession", 1)
        client.result("createReportingSession", 0)
        for reporter_ids in ([1], [99], [0], [], [0, 99, 1]):
            self.send(client, reporter_ids)
        self.assertEqual(self.told(client), {"requests": 5, "unaddressed": 5})

    def test_lists_that_reach_some(self):
        client = self.connect()
        client.session(1)
        self.send(client, [0, 99, 1, 1])
        self.assertEqual(self.told(client),
                         {"requests": 1, "offered": 2, "repeats": 1, "delivered": 1})

    def test_sessions_that_do_not_run(self):
        client = self.connect()
        client.session(1, start=False)
        self.send(client, [1])
        client.session(2)
        client.result("stopReportingSessionForID", 2)
        self.send(client, [2])
        told = self.told(client)
        self.assertEqual(told["offered"], 2)
        self.assertEqual(told["offered"] + told["own"], told["delivered"])
        self.assertEqual(self.daemon.rows("SELECT count(*) FROM upload_message"
                                          " WHERE upload_session IS NULL"), [(2,)])

    def test_sessions_that_are_destroyed_or_replaced_while_they_run(self):
        client = self.connect()
        for end in ("destroyReportingSession", "createReportingSession"):
            client.session(1, service_type=7)
            self.send(client, [1], 3)
            client.result(end, 1)
        told = self.told(client)
        self.assertEqual(told["offered"] + told.get("own", 0), told["delivered"])
        self.assertEqual(told["delivered"],
                         self.daemon.rows("SELECT count(*) FROM upload_message")[0][0])

    def test_what_clients_lost(self):
        client = self.connect()
        client.notify("client.dropped", {"queue_full": 3, "made_up": 2, "invalid": -4})
        self.assertEqual(self.told(client), {"queue_full": 3, "other": 2})


class Retention(AccountingTest):
    configuration = '[store]\nmax_bytes = "256KiB"\n'

    def test_what_is_removed_for_want_of_room_is_counted(self):
        client = self.connect()
        client.session(1, service_type=7)
        for n in range(3000):
            client.notify("sendMessage", {"n": n, "text": "x" * 500}, 4, 1, [1])
        client.result("getAllReporters")
        self.flush()
        self.assert_it_adds_up(client)
        store = client.result("admin.status")["store"]
        left = self.daemon.rows("SELECT count(*) FROM upload_message")[0][0]
        self.assertGreater(store["removed"]["upload_message"], 0)
        self.assertEqual(store["rows"]["upload_message"] - store["removed"]["upload_message"],
                         left)


class WithoutAStore(unittest.TestCase):
    def test_messages_have_no_back_end_and_none_is_lost(self):
        daemon = Daemon()
        self.addCleanup(daemon.remove)
        os.makedirs(daemon.store_path)
        client = daemon.run().client()
        self.addCleanup(client.close)
        client.session(1, service_type=7)
        client.result("sendMessage", {"n": 1}, 4, 1, [1])
        client.result("stopReportingSessionForID", 1)
        client.result("sendMessage", {"n": 1}, 4, 1, None)
        client.result("admin.flush")
        status = client.result("admin.status")
        messages = status["messages"]
        self.assertFalse(status["store"]["open"])
        self.assertEqual(messages["not_uploaded"]["no_backend"],
                         messages["offered"] + messages["own"])
        self.assertEqual((messages["delivered"], messages["waiting"]), (0, 0))


class KilledProgramsTest(AccountingTest):
    def kill_five(self):
        for reporter_id in range(1, 6):
            client = self.daemon.client()
            client.session(reporter_id, service_type=7)
            client.result("getAllReporters")
            client.close()

    def upload_one(self):
        self.kill_five()
        client = self.connect()
        self.daemon.wait_for(lambda: client.result("admin.status")["connections"] == 1)
        client.session(99, service_type=7)
        client.result("sendMessage", {"n": 1}, 4, 1, [99])
        self.flush()
        return self.assert_it_adds_up(client)["not_uploaded"]["limit"]


class KilledPrograms(KilledProgramsTest):
    def test_keep_uploads_from_the_next_which_is_told(self):
        self.assertEqual(self.upload_one(), 1)
        told = "those started beyond 5 are not uploaded"
        self.daemon.wait_for(lambda: told in self.daemon.log())
        self.daemon.terminate()
        self.assertEqual(self.daemon.log().count(told), 1)


class Recounting(KilledProgramsTest):
    configuration = "[sessions]\nrecount = true\n"

    def test_killed_programs_make_room_for_the_next(self):
        self.assertEqual(self.upload_one(), 0)
        self.assertNotIn("are not uploaded", self.daemon.log())


class TheEnd(DaemonTest):
    """What the kernel took from a client is in the store, or told."""

    def stored(self, reporter_id):
        return self.daemon.rows(
            "SELECT count(*) FROM upload_message JOIN upload_session ON upload_session ="
            " upload_session.id WHERE session_id = ? AND category = 4", reporter_id)[0][0]

    def writer(self, reporter_id, **how):
        client = self.connect()
        client.session(reporter_id, service_type=7)
        client.result("getAllReporters")
        writer = Writer(client, reporter_id, **how)
        writer.start()
        return writer

    def last_sheet(self):
        [sheet] = re.findall("messages since the start: (.*)", self.daemon.log())
        return json.loads(sheet)

    def test_sigterm_leaves_nothing_behind_that_writers_had_written(self):
        writers = [self.writer(reporter_id, wants_answers=reporter_id == 4)
                   for reporter_id in range(1, 5)]
        admin = self.connect()
        self.daemon.wait_for(lambda: admin.result("admin.status")["listener"]["requests"] > 20000)
        self.assertEqual(self.daemon.terminate(), 0)
        for writer in writers:
            writer.join()
            self.assertEqual(self.stored(writer.reporter_id), writer.frames)
        sheet = self.last_sheet()
        self.assertEqual(sheet["offered"], sum(writer.frames for writer in writers))
        self.assertEqual(sheet["offered"] + sheet["own"], sheet["delivered"])
        self.assertEqual((sheet["lost"], sheet["waiting"]), (0, 0))

    def test_sigterm_waits_for_no_second(self):
        client = self.connect()
        for n in range(100):
            client.notify("sendMessage", {"n": n}, 4, 1, None)
        self.assertEqual(self.daemon.terminate(), 0)
        self.assertEqual(self.daemon.rows("SELECT count(*) FROM upload_message"), [(100,)])

    def test_what_was_written_before_a_close_is_taken_though_no_answer_was_read(self):
        writer = self.writer(1, wants_answers=True)
        self.daemon.wait_for(lambda: writer.frames > 2000)
        writer.client.socket.shutdown(socket.SHUT_WR)
        writer.join()
        writer.client.close()
        self.daemon.wait_for(
            lambda: self.connect().result("admin.status")["sessions"] == 0)
        self.flush()
        self.assertEqual(self.stored(1), writer.frames)


if __name__ == "__main__":
    unittest.main()
