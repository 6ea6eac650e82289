#!/usr/bin/env python3
"""What the daemon loses by an exporter that reads its store.

usage: benchmarks/fleet/beside.py HALYARDD HALYARD_EXPORT [--rounds 10] [--rate 5000]
           [--seconds 6]

Daemons by turns alone and with an exporter of what they store, to a receiver that only
counts; each gets messages of about 317 bytes at an even rate. Per message, the median of all
rounds: processor time of the daemon, and how long a request takes that is sent every 10 ms.
In the end every message must be in the store.
"""

import argparse
import os
import shutil
import statistics
import subprocess
import sys
import tempfile
import threading
import time

import msgpack

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path += [HERE, os.path.join(HERE, "..", "..", "tests", "daemon")]
import costs  # noqa: E402
from harness import Client, Daemon  # noqa: E402

TURN = 0.01  # seconds between two writes
WARM_UP = 2


def message(n):
    return {"audiotag": "Playback_Progress", "n": n, "stream": f"stream-{n % 7}", "rate": 48000,
            "route": "Speaker", "volume": n % 100 / 100, "channels": [1, 2],
            "device": {"name": "alsa_output.pci-0000_00_1f.3.analog-stereo", "text": "x" * 90}}


def processor_time(pid):
    """In seconds, of all its threads."""
    total = 0
    for thread in os.listdir(f"/proc/{pid}/task"):
        with open(f"/proc/{pid}/task/{thread}/schedstat", encoding="ascii") as file:
            total += int(file.read().split()[0])
    return total / 1e9


class Load:
    def __init__(self, daemon, rate):
        self.client = Client(daemon.socket_path)
        self.client.session(1)
        self.turn = max(1, round(rate * TURN))
        self.sent = 0
        self.waits = []

    def run(self, seconds):
        began = time.monotonic()
        for turn in range(int(seconds / TURN)):
            late = began + turn * TURN - time.monotonic()
            if late > 0:
                time.sleep(late)
            numbers = range(self.sent + 1, self.sent + self.turn)
            self.client.raw(b"".join(msgpack.packb([2, "sendMessage", [message(n), 4, 1, [1]]])
                                     for n in numbers))
            asked = time.monotonic()
            self.client.result("sendMessage", message(self.sent + self.turn), 4, 1, [1])
            self.waits.append(time.monotonic() - asked)
            self.sent += self.turn


def exporter(program, daemon, port):
    folders = {name: daemon.path(name) for name in ("exporter", "exporter-etc")}
    for folder in folders.values():
        os.makedirs(folder)
    with open(os.path.join(folders["exporter-etc"], "halyard.toml"), "w",
              encoding="utf-8") as file:
        file.write(f'[export]\nconsent = true\nmax_bytes_per_day = "2GiB"\n'
                   f'endpoint = "http://127.0.0.1:{port}"\n')
    return subprocess.Popen([program, "--state", daemon.path("state")],
                            env={"STATE_DIRECTORY": folders["exporter"], "PATH": os.environ["PATH"],
                                 "CONFIGURATION_DIRECTORY": folders["exporter-etc"]},
                            stderr=subprocess.DEVNULL)


def measure(arguments, port):
    """Microseconds of processor time a message, and the waits."""
    daemon = Daemon("[export]\nconsent = true\n")
    daemon.program = arguments.halyardd
    child = None
    try:
        daemon.start()
        daemon.wait_until_it_accepts(30)
        load = Load(daemon, arguments.rate)
        if port:
            child = exporter(arguments.exporter, daemon, port)
        load.run(WARM_UP)
        load.waits.clear()
        before, sent = processor_time(daemon.process.pid), load.sent
        load.run(arguments.seconds)
        took = processor_time(daemon.process.pid) - before
        load.client.result("admin.flush")
        (stored,), = daemon.rows("SELECT count(*) FROM upload_message WHERE category = 4")
        if stored != load.sent:
            raise SystemExit(f"{load.sent} messages were sent and {stored} are stored")
        return took / (load.sent - sent) * 1e6, load.waits
    finally:
        if child is not None:
            child.terminate()
            child.wait()
        daemon.remove()


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
    parser.add_argument("halyardd")
    parser.add_argument("exporter")
    parser.add_argument("--rounds", type=int, default=10)
    parser.add_argument("--rate", type=int, default=5000)
    parser.add_argument("--seconds", type=float, default=6)
    arguments = parser.parse_args()
    for name in ("halyardd", "exporter"):
        setattr(arguments, name, os.path.abspath(getattr(arguments, name)))
    server = costs.Server(("127.0.0.1", 0), costs.Counter)
    threading.Thread(target=server.serve_forever, daemon=True).start()
    costs_of, waits = {"alone": [], "beside": []}, {"alone": [], "beside": []}
    for _ in range(arguments.rounds):
        for name, port in (("alone", None), ("beside", server.server_port)):
            took, waited = measure(arguments, port)
            costs_of[name].append(took)
            waits[name] += waited
    for name, each in costs_of.items():
        all_waits = sorted(waits[name])
        print(f"{name:7} {statistics.median(each):7.2f} us a message ({min(each):.2f} to"
              f" {max(each):.2f}); a request {statistics.median(all_waits) * 1e6:.0f} us,"
              f" p99 {all_waits[len(all_waits) * 99 // 100] * 1e6:.0f} us")
    print(f"ratio {statistics.median(costs_of['beside']) / statistics.median(costs_of['alone']):.3f};"
          f" {sum(costs.Counter.requests.values())} requests taken")


if __name__ == "__main__":
    main()
