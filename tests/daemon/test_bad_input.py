"""What the socket does with input that is not right: a request that is wrong is
answered and the connection lives on; bytes that are no requests close it, and
nobody else notices."""

import struct
import unittest

import msgpack

from harness import DaemonTest

DOMAIN = "com.kestrel.halyard.ipc"
SEND = "sendMessage"


class BadRequests(DaemonTest):
    def assertRefused(self, code, mentions, method, *params):
        client = self.connect()
        error, result = client.call(method, *params)
        self.assertEqual((error["domain"], error["code"]), (DOMAIN, code))
        self.assertIn(mentions, error["message"])
        self.assertIsNone(result)
        self.assertEqual(client.result("getAllReporters"), [], "the connection lives on")

    def test_unknown_method(self):
        self.assertRefused(1, "nope", "nope")

    def test_missing_argument(self):
        self.assertRefused(2, "reporterID", "createReportingSession")

    def test_extra_argument(self):
        self.assertRefused(2, "extra", "createReportingSession", 1, 2)

    def test_wrong_type(self):
        self.assertRefused(2, "reporterID", "createReportingSession", "one")
        self.assertRefused(2, "reporterID", "createReportingSession", 1.0)
        self.assertRefused(2, "reporterID", "createReportingSession", None)
        self.assertRefused(2, "dictionary", SEND, [], 4, 1, None)
        self.assertRefused(2, "reporterIDs", SEND, {}, 4, 1, 7)
        self.assertRefused(2, "reporterIDs", SEND, {}, 4, 1, ["7"])

    def test_integer_out_of_range(self):
        self.assertRefused(2, "serviceType", "setServiceType", 65536, 1)
        self.assertRefused(2, "category", SEND, {}, -1, 1, None)
        self.assertRefused(2, "category", SEND, {}, 1 << 32, 1, None)
        self.assertRefused(2, "type", SEND, {}, 4, 65536, None)
        self.assertRefused(2, "reporterID", "createReportingSession", 1 << 63)

    def test_dictionary_keys_that_are_no_strings(self):
        self.assertRefused(2, "dictionary", SEND, {1: 2}, 4, 1, None)

    def test_unknown_extension_type(self):
        self.assertRefused(2, "dictionary", SEND, {"a": msgpack.ExtType(5, b"x")}, 4, 1, None)

    def test_a_notification_that_is_wrong_gets_no_answer(self):
        client = self.connect()
        client.notify("nope")
        self.assertEqual(client.call("getAllReporters"), [None, []])


class BadBytes(DaemonTest):
    def assertCloses(self, data):
        other = self.connect()
        client = self.connect()
        try:
            client.raw(data)
        except (BrokenPipeError, ConnectionResetError):
            pass
        self.assertTrue(client.closed())
        self.assertEqual(other.result("getAllReporters"), [], "nobody else notices")
        self.daemon.wait_for(lambda: "closing connection" in self.daemon.log())

    def test_no_messagepack(self):
        self.assertCloses(b"\xc1")

    def test_text(self):
        self.assertCloses(b"GET / HTTP/1.1\r\n\r\n")

    def test_an_answer(self):
        self.assertCloses(msgpack.packb([1, 1, None, True]))

    def test_a_frame_of_the_wrong_length(self):
        self.assertCloses(msgpack.packb([0, 1, "getAllReporters"]))
        self.assertCloses(msgpack.packb([0, 1, "getAllReporters", [], 5]))

    def test_params_that_are_no_array(self):
        self.assertCloses(msgpack.packb([0, 1, "getAllReporters", {}]))

    def test_a_method_that_is_no_string(self):
        self.assertCloses(msgpack.packb([0, 1, 5, []]))

    def test_a_message_id_out_of_range(self):
        self.assertCloses(msgpack.packb([0, 1 << 32, "getAllReporters", []]))

    def test_a_frame_above_1_mib(self):
        self.assertCloses(msgpack.packb([0, 1, SEND, [{"a": "x" * (1 << 20)}, 4, 1, None]]))

    def test_a_head_that_announces_4_gib(self):
        self.assertCloses(b"\x94\x00\x01\xdb" + struct.pack(">I", 0xFFFFFFFF))

    def test_too_many_elements(self):
        self.assertCloses(msgpack.packb([0, 1, SEND, [{"a": [0] * 65536}, 4, 1, None]]))

    def test_too_deep(self):
        value = 0
        for _ in range(30):
            value = [value]
        self.assertCloses(msgpack.packb([0, 1, SEND, [{"a": value}, 4, 1, None]]))

    def test_the_deepest_and_largest_that_are_allowed(self):
        client = self.connect()
        value = 0
        for _ in range(29):  # The frame, its params and the dictionary are three.
            value = [value]
        self.assertIsNone(client.result(SEND, {"a": value}, 4, 1, None))
        frame = [0, 1, SEND, [{"a": ""}, 4, 1, None]]
        room = (1 << 20) - len(msgpack.packb(frame)) - 4
        self.assertIsNone(client.result(SEND, {"a": "x" * room}, 4, 1, None))


if __name__ == "__main__":
    unittest.main()
