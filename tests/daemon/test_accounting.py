"""The sheet of messages in admin.status: it adds up, at rest and at work."""

import threading
import unittest

from harness import DaemonTest


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


if __name__ == "__main__":
    unittest.main()
