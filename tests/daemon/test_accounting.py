"""The sheet of messages in admin.status: it adds up, at rest and at work."""

import re
import socket
import threading
import unittest

import msgpack

from harness import DaemonTest


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


class Accounting(DaemonTest):
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
        return {key: int(value) for key, value in re.findall(r"(\w+) = (\d+)", sheet)}

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
