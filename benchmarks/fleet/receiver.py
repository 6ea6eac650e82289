#!/usr/bin/env python3
"""A receiver that keeps what it takes, and misbehaves by a seed.

usage: receiver.py DIRECTORY PORT SEED FAULTS

FAULTS is the share of requests that go wrong. What it keeps is in a file of its own in
DIRECTORY before it answers: a line of JSON, then the body. Another line says that the
answer has left. So whoever kills it can still tell what it had, and what it had said.
"""

import http.server
import itertools
import json
import os
import random
import socket
import socketserver
import sys
import threading
import time

TOO_SLOW = 12    # seconds: more than the exporters wait
# What may go wrong, and how often beside the others.
FATES = {"slow": 4, "too slow": 1, "429": 4, "503": 4, "cut before": 4, "cut after": 4,
         "half an answer": 3, "huge answer": 2, "partial": 1, "400": 1, "redirect": 1}
# Nothing of these is kept.
UNKEPT = ("429", "503", "400", "redirect")
STATUS = {"429": 429, "503": 503, "400": 400, "redirect": 302}


class Journal:
    def __init__(self, path):
        self.descriptor = os.open(path, os.O_WRONLY | os.O_CREAT | os.O_EXCL, 0o600)
        self.lock = threading.Lock()

    def write(self, facts, body=b""):
        line = json.dumps({**facts, "length": len(body), "time": time.monotonic()}).encode()
        with self.lock:
            data = memoryview(line + b"\n" + body)
            while data:
                data = data[os.write(self.descriptor, data):]


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"
    disable_nagle_algorithm = True

    def fate(self):
        with self.server.lock:
            if self.server.random.random() >= self.server.faults:
                return "taken"
            return self.server.random.choices(list(FATES), list(FATES.values()))[0]

    def do_POST(self):
        began = time.monotonic()
        fate = self.fate()
        if fate == "cut before":
            self.cut()
            return
        body = self.rfile.read(int(self.headers["Content-Length"]))
        number = next(self.server.numbers)
        facts = {"number": number, "signal": self.path.rsplit("/", 1)[1], "fate": fate,
                 "began": began, "packed": self.headers.get("Content-Encoding") == "gzip"}
        self.server.journal.write(facts, body)
        if fate == "cut after":
            self.cut()
            return
        if fate in ("slow", "too slow"):
            time.sleep(TOO_SLOW if fate == "too slow" else 0.7)
        if fate == "half an answer":
            self.wfile.write(b"HTTP/1.1 200 OK\r\nContent-Le")
            self.cut()
            return
        try:
            self.answer(fate)
        except OSError:
            return   # they have gone
        self.server.journal.write({"answered": number})

    def answer(self, fate):
        # One record is rejected: field 1 of field 1.
        words = {"partial": b"\x0a\x02\x08\x01", "huge answer": bytes(2 << 20)}.get(fate, b"")
        self.send_response_only(STATUS.get(fate, 200))
        if fate == "429":
            self.send_header("Retry-After", "1")
        if fate == "redirect":
            self.send_header("Location", "http://127.0.0.1:9/")
        self.send_header("Content-Length", str(len(words)))
        self.end_headers()
        self.wfile.write(words)

    def cut(self):
        self.close_connection = True
        try:
            self.connection.shutdown(socket.SHUT_RDWR)
        except OSError:
            pass

    def log_message(self, *_):
        pass


class Server(socketserver.ThreadingMixIn, http.server.HTTPServer):
    daemon_threads = True
    request_queue_size = 512

    def handle_error(self, request, client_address):
        pass   # cut connections are what this is about


def main():
    directory, port, seed, faults = sys.argv[1:]
    server = Server(("127.0.0.1", int(port)), Handler)
    server.random, server.faults = random.Random(seed), float(faults)
    server.lock, server.numbers = threading.Lock(), itertools.count(1)
    server.journal = Journal(os.path.join(directory, f"{time.monotonic_ns()}.journal"))
    server.serve_forever(0.05)


if __name__ == "__main__":
    main()
