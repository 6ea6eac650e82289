"""The eleven requests, as python3-msgpack sends them."""

import json
import pathlib
import unittest

import msgpack

from harness import DaemonTest


class Requests(DaemonTest):
    def test_a_session_from_creation_to_destruction(self):
        client = self.connect()
        held = client.session(7, service_type=7, application="player")
        client.result("sendMessage", {"a key": 1, "rate": 48000.0}, 4, 1, [7])
        self.assertIs(client.result("stopReportingSessionForID", 7), True)
        self.assertEqual(client.answer(held), [None, True])
        self.assertIs(client.result("destroyReportingSession", 7), True)
        self.assertEqual(client.result("getAllReporters"), [])

        [(session_id, session_info, user_info, closed)] = self.rows(
            "SELECT session_id, session_info, user_info, closed FROM upload_session")
        self.assertEqual(session_id, 7)
        self.assertIsNotNone(closed)
        info = json.loads(session_info)
        self.assertEqual(info["kRelayReportingSessionInfoClientType"], 19)
        self.assertEqual(info["kRelayReportingSessionInfoClientVersion"], 2.1)
        self.assertEqual(info["kRelayReportingSessionInfoClientBundleID"], "player")
        self.assertIs(info["kRelayReportingSessionInfoBatchEvent"], True)
        self.assertEqual(json.loads(user_info)["kRelayReportingUserInfoServiceName"],
                         "longformaudio_session")
        first = self.rows("SELECT category, type, payload FROM upload_message ORDER BY id")[0]
        self.assertEqual(first[:2], (4, 1))
        self.assertEqual(json.loads(first[2]),
                         {"a_key": 1, "rate": 48000.0, "audiotag": "PlaybackStart"})

    def test_a_start_is_answered_right_before_the_stop_of_its_session(self):
        client = self.connect()
        held = client.session(7)
        for _ in range(2):
            stopped = client.start("stopReportingSessionForID", 7)
            while stopped not in client.answers:
                client.receive()
            # In the order of their arrival.
            self.assertEqual(list(client.answers.items()),
                             [(held, [None, True]), (stopped, [None, True])])
            client.answers.clear()
            held = client.start("startReportingSessionForID", 7)

    def test_a_start_of_a_started_session_is_answered_at_once_and_changes_nothing(self):
        client = self.connect()
        held = client.session(7)
        self.assertIs(client.result("startReportingSessionForID", 7), True)
        self.assertNotIn(held, client.answers)
        self.assertEqual(client.result("admin.status")["active_session_count"], 1)

    def test_a_held_start_whose_session_is_destroyed_is_told(self):
        client = self.connect()
        held = client.session(7)
        destroyed = client.start("destroyReportingSession", 7)
        while destroyed not in client.answers:
            client.receive()
        self.assertEqual(list(client.answers), [held, destroyed])  # in their order
        error, _ = client.answer(held)
        self.assertEqual((error["domain"], error["code"]), ("com.kestrel.halyard.ipc", 4))

    def test_the_sixth_concurrent_session_is_not_uploaded(self):
        client = self.connect()
        for reporter_id in range(1, 8):
            client.session(reporter_id)
            client.result("sendMessage", {"id": reporter_id}, 4, 1, [reporter_id])
        uploaded = self.rows("SELECT session_id FROM upload_session ORDER BY session_id")
        self.assertEqual([row[0] for row in uploaded], [1, 2, 3, 4, 5])

    def test_a_destroy_leaves_the_count_too_high(self):
        client = self.connect()
        client.session(1)
        client.result("destroyReportingSession", 1)
        self.assertEqual(client.result("admin.status")["active_session_count"], 1)

    def test_lookups_span_clients_and_changes_do_not(self):
        owner, other = self.connect(), self.connect()
        owner.session(7, service_type=4, start=False)
        self.assertEqual(other.result("getServiceNameForReporterID", 7), 4)
        self.assertIs(other.result("setServiceType", 9, 7), True)
        self.assertEqual(other.result("reporterIDValid", 7), {"reporterID": 7, "serviceType": 4})
        self.assertEqual(other.result("getAllReporters"), [7])

    def test_unknown_ids_get_the_neutral_answers(self):
        client = self.connect()
        self.assertEqual(client.result("getServiceNameForReporterID", 99), 65535)
        self.assertEqual(client.result("reporterIDValid", 99),
                         {"reporterID": 0, "serviceType": 65535})
        for method in ("startReportingSessionForID", "stopReportingSessionForID",
                       "destroyReportingSession"):
            self.assertIs(client.result(method, 99), True)
        self.assertIsNone(client.result("sendMessage", {"a": 1}, 4, 1, [0, 99]))
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(0,)])

    def test_id_zero_is_created_but_never_found(self):
        client = self.connect()
        client.result("createReportingSession", 0)
        self.assertEqual(client.result("getAllReporters"), [0])
        self.assertEqual(client.result("reporterIDValid", 0), {"reporterID": 0, "serviceType": 65535})
        self.assertIs(client.result("startReportingSessionForID", 0), True)
        self.assertEqual(client.result("admin.status")["active_session_count"], 0)

    def test_a_lost_connection_stops_its_sessions_and_reports_its_uptime(self):
        client = self.connect()
        client.session(7)
        client.result("sendMessage", {"a": 1}, 4, 1, [7])
        client.close()
        watcher = self.connect()
        self.daemon.wait_for(lambda: watcher.result("getAllReporters") == [])
        [(closed,)] = self.rows("SELECT closed FROM upload_session")
        self.assertIsNotNone(closed)
        payloads = self.rows("SELECT payload FROM analytics_event WHERE name = ?",
                             "com.kestrel.halyard.hyreportingclientuptime")
        self.assertIn("python3", [json.loads(row[0])["processName"] for row in payloads])

    def test_a_message_for_another_clients_session_reaches_it(self):
        owner, other = self.connect(), self.connect()
        owner.session(7)
        owner.result("getAllReporters")  # The start before it has been taken.
        other.result("sendMessage", {"from": "other"}, 4, 1, [7])
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(1,)])

    def test_a_broadcast_reaches_every_started_session(self):
        client = self.connect()
        for reporter_id in (1, 2, 3):
            client.session(reporter_id)
        client.result("sendMessage", {"a": 1}, 4, 1, None)
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(3,)])
        self.assertEqual(self.rows("SELECT count(*) FROM analytics_event WHERE name LIKE '%Start'"),
                         [(3,)])

    def test_a_broadcast_without_sessions_goes_out_on_its_own(self):
        client = self.connect()
        client.result("sendMessage", {"a": 1}, 4, 1, None)
        [(upload, session_info, user_info, payload)] = self.rows(
            "SELECT upload_session, session_info, user_info, payload FROM upload_message")
        self.assertIsNone(upload)
        self.assertEqual(json.loads(session_info)["kRelayReportingSessionInfoSessionID"], -1)
        self.assertEqual(json.loads(user_info)["kRelayReportingUserInfoServiceName"], "standalone")
        self.assertEqual(json.loads(payload), {"a": 1})

    def test_an_empty_list_sends_nothing(self):
        client = self.connect()
        client.session(1)
        client.result("sendMessage", {"a": 1}, 4, 1, [])
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(0,)])

    def test_a_message_before_the_start_goes_out_on_its_own(self):
        client = self.connect()
        client.session(9, service_type=4, start=False)
        client.result("sendMessage", {"a": 1}, 4, 1, [9])
        [(upload, user_info)] = self.rows("SELECT upload_session, user_info FROM upload_message")
        self.assertIsNone(upload)
        self.assertEqual(json.loads(user_info)["kRelayReportingUserInfoServiceName"], "alarms")

    def test_repeats_are_dropped_and_errors_are_not(self):
        client = self.connect()
        client.session(1)
        for stamp in (1.5, 2.5):
            client.result("sendMessage", {"v": 1, "hyreporting_timestamp": stamp}, 4, 1, [1])
            client.result("sendMessage", {"v": 1, "hyreporting_timestamp": stamp}, 11, 1, [1])
        self.assertEqual(
            self.rows("SELECT category, count(*) FROM upload_message GROUP BY 1 ORDER BY 1"),
            [(4, 1), (11, 2)])

    def test_messages_keep_their_order(self):
        client = self.connect()
        client.session(1)
        for number in range(5000):
            client.notify("sendMessage", {"n": number}, 4, 1, [1])
        client.result("getAllReporters")  # All of them have been read.
        payloads = self.rows("SELECT payload FROM upload_message ORDER BY id")
        self.assertEqual([json.loads(row[0])["n"] for row in payloads], list(range(5000)))

    def test_what_a_client_wrote_before_it_left_is_done(self):
        client = self.connect()
        client.session(1)
        requests = [[0, 10 + number, "sendMessage", [{"n": number}, 4, 1, [1]]]
                    for number in range(4000)]
        client.raw(b"".join(map(msgpack.packb, requests)))
        client.close()
        operator = self.connect()
        self.daemon.wait_for(lambda: operator.result("admin.status")["connections"] == 1)
        payloads = self.rows("SELECT payload FROM upload_message WHERE category = 4 ORDER BY id")
        self.assertEqual([json.loads(row[0])["n"] for row in payloads], list(range(4000)))

    def test_kill_service_ends_with_status_2_and_keeps_what_was_accepted(self):
        client = self.connect()
        client.result("sendMessage", {"single": True}, 4, 1, None)  # waits for its second
        client.session(1)
        for number in range(100):
            client.notify("sendMessage", {"n": number}, 4, 1, [1])
        client.result("sendMessage", {"n": 100}, 4, 1, [1])
        killed = client.start("killService")
        self.assertEqual(self.daemon.process.wait(60), 2)

        self.assertTrue(client.closed())
        self.assertNotIn(killed, client.answers)
        self.assertIn("DESTROYING SERVICE", self.daemon.log())
        rows = self.daemon.rows("SELECT payload FROM upload_message WHERE category = 4 ORDER BY id")
        messages = [json.loads(row[0]) for row in rows]
        self.assertEqual([each["n"] for each in messages if "n" in each], list(range(101)))
        self.assertEqual([each for each in messages if "single" in each], [{"single": True}])

    def test_who_reads_has_the_priority_of_who_serves(self):
        self.connect().result("getAllReporters")
        pid = str(self.daemon.process.pid)
        nice = {}
        for task in pathlib.Path(f"/proc/{pid}/task").iterdir():
            name, facts = (task / "stat").read_text().split("(", 1)[1].rsplit(")", 1)
            # A thread that has only begun has the name of the first.
            nice["first" if task.name == pid else name] = int(facts.split()[16])
        self.assertEqual(nice["first"], nice["hy-service"])

    def test_sigterm_delivers_commits_and_exits_0(self):
        client = self.connect()
        client.session(1)
        for number in range(100):
            client.notify("sendMessage", {"n": number}, 4, 1, [1])
        client.result("getAllReporters")
        self.assertEqual(self.daemon.terminate(), 0)
        self.assertEqual(self.daemon.rows("SELECT count(*) FROM upload_message WHERE category = 4"),
                         [(100,)])
        self.assertEqual(self.daemon.rows("SELECT count(*) FROM upload_session WHERE closed"),
                         [(1,)])


if __name__ == "__main__":
    unittest.main()
