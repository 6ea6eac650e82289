"""One client process cannot take the machine: what benchmarks/hostile.py measures, as
far as it is quick, with bounds on memory and on what is kept and counted.
"""

import time
import unittest

import attacks
from harness import DaemonTest

# What the daemon stays below whatever one process does, and comes back below after it.
MOST = 600
AFTER = 200


class Attacked(DaemonTest):
    def memory(self, field):
        """In MiB."""
        with open(f"/proc/{self.daemon.process.pid}/status", encoding="utf-8") as file:
            return next(int(line.split()[1]) for line in file if line.startswith(field)) / 1024

    def attack(self, attack, scale):
        witness = self.connect()
        witness.session(77)
        attacker = attacks.start(attack, self.daemon.socket_path, scale)
        while attacker.is_alive():
            witness.result("sendMessage", {"time": time.monotonic()}, 4, 1, [77])
            time.sleep(0.05)
        attacker.join()
        self.assertLess(self.memory("VmHWM"), MOST)
        self.daemon.wait_for(lambda: self.memory("VmRSS") < AFTER, 30)
        return witness.result("admin.status")

    def test_copies_for_one_id_many_times(self):
        status = self.attack(attacks.one_id_many_times, 0.25)
        self.assertEqual(status["messages"]["bounded"], 1)

    def test_a_long_text_for_one_id_many_times(self):
        status = self.attack(attacks.long_text_many_times, 0.5)
        self.assertEqual(status["messages"]["bounded"], 1)

    def test_configurations_without_end(self):
        self.attack(attacks.configuration_keys, 0.25)

    def test_configurations_of_many_keys(self):
        self.attack(attacks.configuration_many_keys, 0.1)

    def test_frames_without_end(self):
        status = self.attack(attacks.unfinished_frames, 0.3)
        self.assertGreater(status["listener"]["broken"], 100)

    def test_kinds_of_message(self):
        status = self.attack(attacks.kinds_of_message, 1)
        self.assertGreater(status["messages"]["bounded"], 0)  # As far as it comes in its time.

    def test_sessions_without_end(self):
        self.attack(attacks.many_sessions, 0.2)

    def test_answers_left_lying(self):
        self.attack(attacks.answers_left_lying, 0.2)

    def test_names_and_lists_that_are_long_leave_little_in_the_log(self):
        self.attack(attacks.long_application_name, 0.1)
        self.attack(attacks.started_sessions, 0.05)
        self.attack(attacks.unknown_ids, 0.05)
        self.assertLess(len(self.daemon.log()), 10_000_000)

    def test_an_id_that_stands_twice_is_offered_twice(self):
        client = self.connect()
        client.session(5)
        client.result("sendMessage", {"n": 1}, 11, 1, [5] * 1000)
        stored = self.rows("SELECT count(*) FROM upload_message WHERE category = 11")
        self.assertEqual(stored, [(1000,)])

    def test_a_request_beyond_a_bound_is_answered_with_its_name(self):
        self.daemon.configure("[limits]\nsessions = 2\n")
        client = self.connect()
        client.result("createReportingSession", 1)
        client.result("createReportingSession", 2)
        def refused():
            error, _ = client.call("createReportingSession", 3)
            return error is not None and error["code"] == 5 and "limits.sessions" in error["message"]
        self.daemon.wait_for(refused)


if __name__ == "__main__":
    unittest.main()
