"""The whole path of a message: from the socket to the five tables."""

import glob
import json
import os
import re
import unittest

from harness import DaemonTest

INTERNAL = """
[device_properties]
InternalBuild = true
[analytics]
wanted = ["com.kestrel.*"]
[log]
level = "debug"
"""

ENERGY, ISSUE = 8, 7
# Every connection that ends adds one of these.
UPTIME = "com.kestrel.halyard.hyreportingclientuptime"


class EverySink(DaemonTest):
    configuration = INTERNAL

    def setUp(self):
        super().setUp()
        self.client = self.connect()
        self.client.session(7, service_type=3, application="app")

    def send(self, message, category, type_, ids=(7,)):
        self.client.result("sendMessage", message, category, type_,
                           None if ids is None else list(ids))

    def test_analytics_gets_both_names_with_the_application(self):
        self.send({"a": 1}, 4, 1)
        rows = self.rows("SELECT name, payload FROM analytics_event WHERE name <> ? ORDER BY id", UPTIME)
        self.assertEqual([row[0] for row in rows],
                         ["com.kestrel.halyard.Playback.Start",
                          "com.kestrel.haptics.Playback.Start"])
        for _, payload in rows:
            self.assertEqual(json.loads(payload), {"a": 1, "HostApplicationDisplayID": "app"})

    def test_the_energy_ledger_gets_engine_time(self):
        self.send({"EngineOnTime": 2.5, "hyreporting_timestamp": 1700000000.25}, 1, ENERGY)
        [(client, name, payload)] = self.rows("SELECT client, name, payload FROM energy_event")
        self.assertEqual((client, name), (28, "Flexmedia_Haptics"))
        self.assertEqual(json.loads(payload), {"EngineOnDuration": 2.5, "ApplicationName": "app",
                                               "TimestampEnd": 1700000000.25})

    def test_the_metric_is_a_protocol_buffer(self):
        self.send({"issue_type": "glitch", "node": "n", "rtaid_client": 5,
                   "any_channel_silence_seconds": 4294967297}, 11, ISSUE)
        self.assertEqual(self.rows("SELECT metric_id, message FROM metric"),
                         [(0x5B0003, b"\x10\x01\x1a\x06glitch\x22\x01n\x2a\x015")])

    def test_an_empty_issue_still_posts(self):
        self.send({"x": 1}, 11, ISSUE)
        [(message,)] = self.rows("SELECT message FROM metric")
        self.assertEqual(message.hex(), "10001a0022002a00")
        def missing():
            return re.findall(r"Failed to get (\w+) for AudioIssueDetected", self.daemon.log())
        self.daemon.wait_for(lambda: len(missing()) >= 4)
        self.assertEqual(missing(), ["issue_type", "rtaid_client", "node",
                                     "any_channel_silence_seconds"])

    def test_the_second_distinct_leak_takes_a_snapshot(self):
        self.leak_twice()
        [(signature, report)] = self.rows("SELECT signature, report FROM incident")
        self.assertEqual(json.loads(signature),
                         {"domain": "AudioAnalytics", "type": "haptics", "subType": "Generic",
                          "subtypeContext": "EnergyLedger", "detectedProcess": "python3"})
        self.assertTrue(os.path.isdir(report))
        self.assertIn("incident.json", [os.path.basename(name)
                                         for name in glob.glob(report + "/**", recursive=True)])

    def test_a_snapshot_that_cannot_be_written_is_counted(self):
        with open(self.daemon.path("state", "incidents"), "w", encoding="utf-8"):
            pass  # where the folder should be
        self.leak_twice()
        self.assertEqual(self.client.result("admin.status")["incidents"],
                         {"refused": 0, "failed": 1})
        self.assertEqual(self.rows("SELECT count(*) FROM incident"), [(0,)])

    def leak_twice(self):
        """Two leaks that differ, which is one more than is put up with."""
        for seconds in (1, 1, 2):
            self.send({"Haptic_Active_Hardware_Time_Seconds": seconds}, 1, ENERGY)
        self.daemon.wait_for(lambda: "Response from incidentReporter" in self.daemon.log())

    def test_one_message_in_every_table_and_its_order(self):
        message = {"EngineOnTime": 1}
        self.send(message, 1, ENERGY)
        self.assertEqual(self.rows("SELECT count(*) FROM upload_session"), [(1,)])
        self.assertEqual(self.rows("SELECT count(*) FROM energy_event"), [(1,)])
        self.assertEqual(self.rows("SELECT count(*) FROM analytics_event WHERE name <> ?", UPTIME),
                         [(2,)])
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(1,)])
        self.assertBefore("failed to get HYReporting timestamp for energyledger",
                          "sending message for session owned by 7")

    def test_broadcast_feeds_the_session_before_the_sinks(self):
        self.send({"EngineOnTime": 1}, 1, ENERGY, ids=None)
        self.assertEqual(self.rows("SELECT count(*) FROM energy_event"), [(1,)])
        self.assertBefore("sending message for session owned by 7",
                          "failed to get HYReporting timestamp for energyledger")

    def test_standalone_reaches_every_sink_once(self):
        self.client.result("stopReportingSessionForID", 7)
        before = self.rows("SELECT count(*) FROM upload_message")[0][0]
        self.send({"EngineOnTime": 1}, 1, ENERGY, ids=None)
        [(payload,)] = self.rows("SELECT payload FROM energy_event")
        self.assertEqual(json.loads(payload)["ApplicationName"], "Unknown")
        names = [row[0] for row in self.rows(
            "SELECT name FROM analytics_event WHERE name <> ? ORDER BY id", UPTIME)]
        self.assertEqual(names[-1], "com.kestrel.standalone.Generic.EnergyLedger")
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(before + 1,)])

    def assertBefore(self, first, second):
        self.flush()
        self.daemon.wait_for(lambda: first in self.daemon.log() and second in self.daemon.log())
        log = self.daemon.log()
        self.assertLess(log.index(first), log.index(second))


class OrdinaryBuild(DaemonTest):
    def test_never_takes_a_snapshot(self):
        client = self.connect()
        client.session(7)
        for seconds in range(4):
            client.result("sendMessage", {"Haptic_Active_Hardware_Time_Seconds": seconds}, 1,
                          ENERGY, [7])
        self.assertEqual(self.rows("SELECT count(*) FROM incident"), [(0,)])
        self.assertEqual(self.rows("SELECT count(*) FROM energy_event"), [(4,)])

    def test_nothing_wanted_means_no_events(self):
        self.daemon.configure("[analytics]\nwanted = []\n")
        client = self.connect()
        client.session(7)
        self.daemon.wait_for(lambda: self.sends_nothing(client))

    def sends_nothing(self, client):
        """The file is read again in its own time: whether it has been."""
        before = self.rows("SELECT count(*) FROM analytics_event")
        client.result("sendMessage", {"a": 1}, 4, 1, [7])
        return self.rows("SELECT count(*) FROM analytics_event") == before


if __name__ == "__main__":
    unittest.main()
