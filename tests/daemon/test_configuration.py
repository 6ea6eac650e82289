"""The device state that goes into sessions, and the file it comes from."""

import json
import signal
import unittest

from harness import DaemonTest

NAMED = '[preferences."com.kestrel.halyard"]\ndevice_name = "%s"\n'


class Features(DaemonTest):
    configuration = NAMED % "kitchen"

    def states(self):
        """The feature states that have reached the store, oldest first."""
        return [json.loads(row[0]) for row in self.rows(
            "SELECT payload FROM upload_message WHERE category = 8 AND type = 5 ORDER BY id")]

    def test_a_start_sends_the_state(self):
        self.connect().session(1)
        self.flush()
        [state] = self.states()
        self.assertEqual(state["device_name"], "kitchen")
        self.assertEqual(set(state), {"device_name", "hyreporting_timestamp", "systemuptime_sec",
                                      "audiotag"})

    def test_a_changed_preference_reaches_started_and_other_sessions(self):
        client = self.connect()
        client.session(1)
        client.session(2, start=False)
        client.result("getAllReporters")
        self.daemon.configure(NAMED % "bath")
        self.daemon.wait_for(lambda: len(self.states()) == 3)
        self.assertEqual([state["device_name"] for state in self.states()[1:]], ["bath", "bath"])

    def test_a_posted_notification_sends_the_state_again(self):
        client = self.connect()
        client.session(1, start=False)
        self.assertIs(client.result("admin.postNotification", "com.kestrel.halyard.reporting"),
                      True)
        self.daemon.wait_for(lambda: len(self.states()) == 1)

    def test_sighup_reads_the_file_again(self):
        self.daemon.process.send_signal(signal.SIGHUP)
        client = self.connect()
        client.session(1)
        self.flush()
        self.assertEqual(self.states()[0]["device_name"], "kitchen")

    def test_a_broken_file_is_told_and_changes_nothing(self):
        self.daemon.configure("[preferences\n")
        self.daemon.wait_for(lambda: "halyard.toml" in self.daemon.log())
        self.connect().session(1)
        self.flush()
        self.assertEqual(self.states()[0]["device_name"], "kitchen")


class NoFeatures(DaemonTest):
    def test_nothing_is_sent_on_start(self):
        self.connect().session(1)
        self.assertEqual(self.rows("SELECT count(*) FROM upload_message"), [(0,)])


class LogLevel(DaemonTest):
    configuration = '[log]\nlevel = "error"\n'

    def test_silences_what_is_below(self):
        client = self.connect()
        client.session(1)
        client.result("sendMessage", {"a": 1}, 4, 1, [99])
        self.daemon.wait_for(lambda: "failed to find reporting session 99" in self.daemon.log())
        self.assertEqual([line for line in self.daemon.log().splitlines()
                          if not line.startswith("error ")], [])

    def test_no_text_forges_a_line(self):
        client = self.connect()
        client.call("nope\nerror hyrs forged")
        client.result("createReportingSession", 1)
        client.result("setConfiguration", {"HostApplicationDisplayID": "a\nerror x y"}, 1)
        client.raw(b"\xc1")
        client.closed()
        self.daemon.wait_for(lambda: "closing connection" in self.daemon.log())
        self.assertNotIn("\nerror hyrs forged", self.daemon.log())
        self.assertNotIn("\nerror x y", self.daemon.log())


if __name__ == "__main__":
    unittest.main()
