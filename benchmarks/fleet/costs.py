#!/usr/bin/env python3
"""What the export of a large backlog costs a device.

usage: benchmarks/fleet/costs.py HALYARD_EXPORT [--mebibytes 256] [--rounds 1] [--store FILE]

Makes a store, keeps it at FILE if one is named (and takes it from there the next time),
and sends it with --once to a receiver that only counts. The receiver and the exporter
share the machine, so the time is an upper bound; processor time is the exporter's own.
"""

import argparse
import http.server
import os
import random
import shutil
import socketserver
import sqlite3
import subprocess
import sys
import tempfile
import threading
import time

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.append(HERE)
import stores  # noqa: E402

EVENTS = 40   # of a session, besides the six rows that it begins and ends with


class Counter(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"
    disable_nagle_algorithm = True
    requests = {}
    octets = {}

    def do_POST(self):
        length = int(self.headers["Content-Length"])
        self.rfile.read(length)
        head = len(self.raw_requestline) + len(bytes(self.headers))
        Counter.requests[self.path] = Counter.requests.get(self.path, 0) + 1
        Counter.octets[self.path] = Counter.octets.get(self.path, 0) + length + head
        self.send_response_only(200)
        self.send_header("Content-Length", "0")
        self.end_headers()

    def log_message(self, *_):
        pass


class Server(socketserver.ThreadingMixIn, http.server.HTTPServer):
    daemon_threads = True


def make(path, mebibytes):
    store = stores.Store(path, "3f0c2a52-0b1c-4a43-9a6e-1d1f0a1b2c3d", random.Random(1))
    while True:
        store.begin()
        for _ in range(200):
            store.whole_session(EVENTS)
        store.commit()
        store.logs.clear()
        (pages,) = store.connection.execute("PRAGMA page_count").fetchone()
        if pages * 4096 >= mebibytes * 1024 * 1024:
            break
    store.connection.execute("PRAGMA wal_checkpoint(TRUNCATE)")
    store.close()


def measure(program, root, port):
    own = tempfile.mkdtemp(dir=root)
    environment = {"STATE_DIRECTORY": own, "CONFIGURATION_DIRECTORY": os.path.join(root, "etc"),
                   "PATH": os.environ["PATH"]}
    Counter.requests.clear()
    Counter.octets.clear()
    began = time.monotonic()
    child = subprocess.Popen([program, "--state", os.path.join(root, "state"), "--once"],
                             env=environment)
    _, status, usage = os.wait4(child.pid, 0)
    took = time.monotonic() - began
    child.returncode = os.waitstatus_to_exitcode(status)
    shutil.rmtree(own)
    return child.returncode, took, usage


def run(arguments, root):
    for name in ("state", "etc"):
        os.mkdir(os.path.join(root, name))
    path = os.path.join(root, "state", "telemetry.db")
    if arguments.store and os.path.exists(arguments.store):
        shutil.copy(arguments.store, path)
    else:
        make(path, arguments.mebibytes)
        if arguments.store:
            shutil.copy(path, arguments.store)
    database = sqlite3.connect(f"file:{path}?immutable=1", uri=True)
    rows, octets = database.execute(
        "SELECT count(*), avg(length(payload)) FROM upload_message").fetchone()
    (sessions,) = database.execute("SELECT count(*) FROM upload_session").fetchone()
    database.close()
    server = Server(("127.0.0.1", 0), Counter)
    threading.Thread(target=server.serve_forever, daemon=True).start()
    with open(os.path.join(root, "etc", "halyard.toml"), "w", encoding="utf-8") as file:
        file.write(f'[export]\nconsent = true\nmax_bytes_per_day = "2GiB"\n'
                   f'endpoint = "http://127.0.0.1:{server.server_port}"\n')
    print(f"a store of {os.path.getsize(path) / 1048576:.0f} MiB: {rows} messages of "
          f"{octets:.0f} bytes in {sessions} sessions")
    code = 0
    for _ in range(arguments.rounds):
        status, took, usage = measure(arguments.program, root, server.server_port)
        processor = usage.ru_utime + usage.ru_stime
        sent = Counter.octets
        print(f"exit {status}; {took:.1f} s; processor {processor:.2f} s "
              f"({usage.ru_utime:.2f} user), {processor / rows * 1e6:.2f} us a message; "
              f"largest {usage.ru_maxrss / 1024:.1f} MiB")
        for name in sorted(sent):
            print(f"    {name:12} {Counter.requests[name]:6} requests {sent[name]:11} bytes "
                  f"{sent[name] / rows:7.1f} a message")
        print(f"    {'all':12} {sum(Counter.requests.values()):6} requests "
              f"{sum(sent.values()):11} bytes {sum(sent.values()) / rows:7.1f} a message",
              flush=True)
        code = code or status
    return code


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("program")
    parser.add_argument("--mebibytes", type=int, default=256)
    parser.add_argument("--rounds", type=int, default=1)
    parser.add_argument("--store", help="keep the store there, or take it from there")
    arguments = parser.parse_args()
    root = tempfile.mkdtemp(prefix="halyard-costs-")
    try:
        return run(arguments, root)
    finally:
        shutil.rmtree(root, ignore_errors=True)


if __name__ == "__main__":
    sys.exit(main())
