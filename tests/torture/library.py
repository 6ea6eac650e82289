"""A program that reports by libhalyard through all lives of the daemon.

Its ledger has, for each message that the library took, its number and when.
"""

import ctypes
import json
import os
import time

RATE = 40  # messages a second


class Statistics(ctypes.Structure):
    _fields_ = [("size", ctypes.c_size_t)] + [(name, ctypes.c_uint64) for name in (
        "sent", "dropped_queue_full", "dropped_discarded", "dropped_too_large",
        "dropped_invalid", "reconnects", "queued_bytes", "memory_limit")]


def load(path):
    library = ctypes.CDLL(path)
    for name in ("client_create", "session_create", "dictionary_create"):
        getattr(library, "halyard_" + name).restype = ctypes.c_void_p
    return library


class Program:
    def __init__(self, library_path, socket_path):
        self.library = load(library_path)
        self.client = ctypes.c_void_p(self.call("client_create", socket_path.encode()))
        self.session = ctypes.c_void_p(self.call("session_create", self.client,
                                                 ctypes.c_int64((1 << 50) - 7)))
        self.message = ctypes.c_void_p(self.call("dictionary_create", ctypes.c_size_t(0)))
        self.call("session_set_service_type", self.session, ctypes.c_uint16(7))
        self.call("session_start", self.session, None, None)
        self.taken = []
        self.refused = 0
        self.n = 0

    def call(self, name, *arguments):
        return getattr(self.library, "halyard_" + name)(*arguments)

    def send(self):
        self.call("dictionary_clear", self.message)
        self.call("dictionary_set_string", self.message, b"who", b"library")
        self.call("dictionary_set_uint", self.message, b"n", ctypes.c_uint64(self.n))
        result = self.call("session_send", self.session, self.message, ctypes.c_uint32(4),
                           ctypes.c_uint16(1))
        if result == 0:
            self.taken.append((self.n, time.monotonic()))
        else:
            self.refused += 1
        self.n += 1

    def statistics(self):
        figures = Statistics(size=ctypes.sizeof(Statistics))
        self.call("client_statistics", self.client, ctypes.byref(figures))
        return {name: getattr(figures, name) for name, _ in Statistics._fields_[1:]}

    def ledger(self):
        return {"taken": self.taken, "refused": self.refused, "statistics": self.statistics()}

    def end(self):
        self.call("client_flush", self.client, ctypes.c_uint32(20000))
        ledger = self.ledger()
        ledger["destroyed"] = self.call("client_destroy", self.client, ctypes.c_uint32(20000))
        return ledger


def run(library_path, socket_path, stop, ledger_path):
    program = Program(library_path, socket_path)
    while not stop.is_set():
        program.send()
        time.sleep(1 / RATE)
    ledger = program.end()
    with open(ledger_path + ".new", "w", encoding="utf-8") as file:
        json.dump(ledger, file)
    os.rename(ledger_path + ".new", ledger_path)
