"""What a program that links libhalyard leaves in the store."""

import json
import os
import subprocess
import unittest

from harness import PATIENCE, DaemonTest

EXAMPLE = os.environ.get("EXAMPLE", "build/test/halyard_client_example")


class ExampleProgram(DaemonTest):
    configuration = '[analytics]\nwanted = ["com.kestrel.*"]\n'

    def setUp(self):
        super().setUp()
        subprocess.run([EXAMPLE, self.daemon.socket_path], check=True, timeout=PATIENCE)

    def test_its_issue_is_a_message_of_its_session(self):
        [(category, payload)] = self.rows(
            "SELECT category, payload FROM upload_message JOIN upload_session"
            " ON upload_session.id = upload_session WHERE type = 7")
        message = json.loads(payload)
        self.assertEqual(category, 4)
        self.assertEqual({key: message.get(key) for key in self.ISSUE}, self.ISSUE)
        self.assertIsInstance(message["any_channel_silence_seconds"], float)
        self.assertGreater(message["hyreporting_timestamp"], 1.6e9)

    def test_its_issue_is_a_metric(self):
        self.assertEqual(self.rows("SELECT metric_id, message FROM metric"),
                         [(0x5B0003, b"\x10\x01\x1a\x0bclient_slow\x22\x0eExample Player"
                                     b"\x2a\x12org.example.player")])

    def test_its_issue_is_an_analytics_event(self):
        [(payload,)] = self.rows("SELECT payload FROM analytics_event WHERE name ="
                                 " 'com.kestrel.halyard.Playback.IssueDetector'")
        message = json.loads(payload)
        self.assertEqual({key: message.get(key) for key in self.ISSUE}, self.ISSUE)

    ISSUE = {"issue_type": "client_slow", "rtaid_client": "org.example.player",
             "node": "Example Player", "any_channel_silence_seconds": 1.5, "buffered_frames": 0}


if __name__ == "__main__":
    unittest.main()
