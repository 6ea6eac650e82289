#!/usr/bin/env python3
"""Devices that send their logs to a store of two nodes, each of which is killed once.

usage: benchmarks/fleet/cluster.py HALYARD_EXPORT LOKI [--devices 10] [--seconds 40]
           [--kills 10] [--seed 1]

The nodes are Grafana Loki's (loki.yaml), which takes OTLP by itself: logs only. Half of the
devices talk to each. In the end every device's records are asked for, and added up: each
is there, or was counted as lost by its device. Ends with 1 when the sum does not close.
"""

import argparse
import concurrent.futures
import json
import os
import random
import shutil
import signal
import subprocess
import sys
import tempfile
import time
import urllib.parse
import urllib.request

sys.path.append(os.path.dirname(os.path.abspath(__file__)))
import fleet  # noqa: E402
import stores  # noqa: E402

HERE = os.path.dirname(os.path.abspath(__file__))
START = 90   # seconds that a node may take
SETTLE = 60  # seconds in which a node that was killed gives what only it has
PAST = 3600  # how old the first message is: a node asks its memory for the last hours only


class Node:
    def __init__(self, program, number, root):
        self.program, self.number, self.starts = program, number, 0
        self.place = os.path.join(root, f"node-{number}")
        self.url = f"http://127.0.0.1:310{number}"
        self.child = None

    def start(self):
        self.starts += 1
        environment = {"NODE": str(self.number), "PLACE": self.place, "HOME": self.place}
        with open(self.place + ".log", "ab") as log:
            self.child = subprocess.Popen(
                [self.program, "-config.file", os.path.join(HERE, "loki.yaml"),
                 "-config.expand-env=true"], env=environment, stdout=log, stderr=log)

    def kill(self):
        if self.child is not None and self.child.poll() is None:
            self.child.kill()
            self.child.wait()

    def await_ready(self):
        until = time.monotonic() + START
        while time.monotonic() < until and self.child.poll() is None:
            try:
                with urllib.request.urlopen(self.url + "/ready") as answer:
                    if answer.status == 200:
                        return
            except OSError:
                pass
            time.sleep(0.5)
        raise SystemExit(f"a node does not start: see {self.place}.log")

    def names_of(self, device):
        """Of all records of the device, as often as they are there."""
        now = int(time.time())
        query = urllib.parse.urlencode({
            "query": f'{{device_id="{device.name}"}}', "limit": 100000, "direction": "forward",
            "start": (now - 3 * PAST) * 10**9, "end": (now + PAST) * 10**9})
        with urllib.request.urlopen(f"{self.url}/loki/api/v1/query_range?{query}") as answer:
            streams = json.load(answer)["data"]["result"]
        return [stream["stream"]["log_record_uid"] for stream in streams for _ in stream["values"]]


def make_device(number, program, root, node, seed):
    device = fleet.Device(number, program, root, 0, seed)
    with open(os.path.join(device.root, "etc", "halyard.toml"), "w", encoding="utf-8") as file:
        file.write(f'[export]\nconsent = true\nsignals = ["logs"]\nendpoint = "{node.url}/otlp"\n')
    return device


def run(arguments, devices, nodes, chance):
    first, second = nodes
    acts = [(chance.uniform(1, arguments.seconds - 1), None) for _ in range(arguments.kills)]
    def kill_second():
        first.await_ready()  # Of two that are away nobody is left to answer.
        second.kill()
    acts += [(arguments.seconds * part, act) for part, act in (
        (0.2, first.kill), (0.35, first.start), (0.6, kill_second), (0.7, second.start))]
    acts.sort(key=lambda act: act[0])
    began = time.monotonic()
    while (now := time.monotonic() - began) < arguments.seconds:
        device = chance.choice(devices)
        device.go_on()
        while acts and acts[0][0] < now:
            act = acts.pop(0)[1]
            if act is None:
                device.stop(signal.SIGKILL)
                device.start()
            else:
                act()
        time.sleep(0.02)


def finish(devices, nodes):
    for device in devices:
        device.grow(device.wanted)
        if device.store.open is not None:
            device.store.close_session()
        device.stop(signal.SIGTERM)
    for node in nodes:
        node.await_ready()
    with concurrent.futures.ThreadPoolExecutor(2) as pool:
        list(pool.map(fleet.Device.drain, devices))


def ask(node, device, wanted):
    """What was sent while the other was away one node has alone, and tells when both have
    found each other again."""
    until = time.monotonic() + SETTLE
    while len(set(names := node.names_of(device))) < wanted and time.monotonic() < until:
        time.sleep(1)
    return names


def add_up(devices, nodes, chance):
    wanted = arrived = twice = lost = 0
    closes = True
    for device in devices:
        logs, counted = device.store.logs, device.losses()["logs"]
        names = ask(chance.choice(nodes), device, len(logs) - counted)
        there = set(names)
        if device.status != 0 or there - logs or len(logs - there) != counted:
            closes = False
            print(f"{device.name}: --once ended with {device.status}, {len(logs)} messages,"
                  f" {len(logs & there)} there, {len(there - logs)} strangers, {counted} lost")
        wanted, arrived, lost = wanted + len(logs), arrived + len(logs & there), lost + counted
        twice += len(names) - len(there)
    print(f"logs           {wanted}: arrived {arrived}, counted as lost {lost}, twice {twice}")
    print("the sum closes" if closes else "the sum does not close")
    return closes


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n", maxsplit=1)[0])
    parser.add_argument("program")
    parser.add_argument("loki")
    parser.add_argument("--devices", type=int, default=10)
    parser.add_argument("--seconds", type=float, default=40)
    parser.add_argument("--kills", type=int, default=10, help="of exporters")
    parser.add_argument("--seed", default="1")
    arguments = parser.parse_args()
    root = tempfile.mkdtemp(prefix="halyard-cluster-")
    os.chmod(root, 0o755)
    program = shutil.copy(arguments.program, os.path.join(root, "halyard-export"))
    chance = random.Random(arguments.seed)
    stores.FIRST = time.time() - PAST
    nodes = [Node(arguments.loki, number, root) for number in (1, 2)]
    devices = []
    try:
        for node in nodes:
            node.start()
        for node in nodes:
            node.await_ready()
        devices = [make_device(number, program, root, nodes[number % 2], arguments.seed)
                   for number in range(arguments.devices)]
        for device in devices:
            device.start()
        run(arguments, devices, nodes, chance)
        finish(devices, nodes)
        return 0 if add_up(devices, nodes, chance) else 1
    finally:
        for device in devices:
            if device.child is not None and device.child.poll() is None:
                device.stop(signal.SIGKILL)
        for node in nodes:
            node.kill()
        shutil.rmtree(root, ignore_errors=True)


if __name__ == "__main__":
    sys.exit(main())
