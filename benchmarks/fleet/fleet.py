#!/usr/bin/env python3
"""A fleet in small: many devices, one receiver, and all that goes wrong between them.

usage: benchmarks/fleet/fleet.py HALYARD_EXPORT [--devices 100] [--seconds 60]
           [--kills 20] [--faults 0.25] [--seed 1] [--keep] [--collector PROGRAM]

Each device has a store that is written to while it runs, and an exporter. Exporters and
the receiver are killed at random and started again; the receiver is away for a while,
slow, refuses and cuts connections; some devices remove their oldest rows before they
could be sent. In the end everything may drain, and is added up: each record of each
device arrived, or was counted as lost by the device that lost it; what arrived twice has
the same name, and was in flight at a kill or a cut. Ends with 1 when the sum does not
close.

As root each device is a user of its own, because the kernel limits what one may watch.
"""

import argparse
import collections
import concurrent.futures
import glob
import gzip
import json
import os
import random
import shutil
import signal
import socket
import sqlite3
import subprocess
import sys
import tempfile
import time
import uuid

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.append(HERE)
import otlp  # noqa: E402
import receiver as receiving  # noqa: E402
import stores  # noqa: E402

TIMEOUT = 10          # seconds that an exporter waits for an answer
FIRST_USER = 61000
RETENTION = 10        # one device of so many
AWAY = 6              # seconds that the receiver is away, in the middle


class Device:
    def __init__(self, number, program, root, port, seed):
        self.random = random.Random(f"{seed}/{number}")
        self.name = str(uuid.UUID(int=self.random.getrandbits(128), version=4))
        self.program, self.user = program, FIRST_USER + number if os.geteuid() == 0 else None
        self.root = os.path.join(root, f"device-{number}")
        for place in ("state", "etc", "own"):
            os.makedirs(os.path.join(self.root, place))
        with open(os.path.join(self.root, "etc", "halyard.toml"), "w", encoding="utf-8") as file:
            file.write(f'[export]\nconsent = true\nendpoint = "http://127.0.0.1:{port}"\n')
        self.store = stores.Store(os.path.join(self.root, "state", "telemetry.db"), self.name,
                                  self.random)
        self.wanted = self.random.randrange(300, 1500)   # messages, at the end
        self.has_retention = number % RETENTION == RETENTION - 1
        self.grow(self.wanted // 2)
        self.own_all()
        self.child = None
        self.stops = []    # when its exporter was ended, and might have been sending
        self.status = None

    def own_all(self):
        if self.user is not None:
            for folder, _, files in os.walk(self.root):
                for path in [folder, *(os.path.join(folder, file) for file in files)]:
                    os.chown(path, self.user, self.user)

    def grow(self, rows):
        self.store.begin()
        while self.store.rows < rows:
            self.something()
        self.store.commit()

    def something(self):
        if self.store.open is None:
            self.store.open_session()
        elif self.random.random() < 0.03:
            self.store.close_session()
        else:
            self.store.something()

    def go_on(self):
        if self.store.rows < self.wanted:
            self.grow(min(self.store.rows + self.random.randrange(1, 60), self.wanted))

    def launch(self, *words):
        environment = {"STATE_DIRECTORY": os.path.join(self.root, "own"),
                       "CONFIGURATION_DIRECTORY": os.path.join(self.root, "etc"), "HOME": self.root,
                       "OTEL_BLRP_SCHEDULE_DELAY": "200",
                       "OTEL_EXPORTER_OTLP_TIMEOUT": str(TIMEOUT * 1000)}
        as_user = {} if self.user is None else {"user": self.user, "group": self.user,
                                                "extra_groups": []}
        with open(os.path.join(self.root, "log"), "ab") as log:
            return subprocess.Popen([self.program, "--state", os.path.join(self.root, "state"),
                                     *words], env=environment, stderr=log, stdout=log,
                                    cwd="/", **as_user)

    def start(self):
        self.child = self.launch()

    def stop(self, how):
        asked = time.monotonic()
        self.child.send_signal(how)
        try:
            self.child.wait(TIMEOUT)
        except subprocess.TimeoutExpired:
            self.child.kill()
            self.child.wait()
        self.stops.append((asked, time.monotonic()))

    def drain(self):
        for _ in range(10):
            self.status = self.launch("--once").wait()
            if self.status == 0:
                break
        return self.status

    def losses(self):
        """By signal."""
        lost = collections.Counter()
        path = os.path.join(self.root, "own", "export.db")
        if os.path.exists(path):
            database = sqlite3.connect(path)
            for name, count in database.execute("SELECT signal, count FROM loss"):
                lost[name] += count
            database.close()
        return lost


class Receiver:
    def __init__(self, root, port, seed):
        self.directory, self.port, self.seed, self.starts = root, port, seed, 0
        self.child = None

    def start(self, faults):
        self.starts += 1
        self.child = subprocess.Popen([sys.executable, os.path.join(HERE, "receiver.py"),
                                       self.directory, str(self.port),
                                       f"{self.seed}/{self.starts}", str(faults)])
        await_port(self.child, self.port)

    def kill(self):
        self.child.kill()
        self.child.wait()


class Collector:
    """Stands between the devices and the receiver. Without a queue of its own, so that what it
    answers is what the receiver answered."""

    CONFIGURATION = """
receivers:
  otlp: {{ protocols: {{ http: {{ endpoint: "127.0.0.1:{port}" }} }} }}
processors:
  memory_limiter: {{ check_interval: 1s, limit_mib: 512 }}
exporters:
  otlphttp:
    endpoint: http://127.0.0.1:{behind}
    sending_queue: {{ enabled: false }}
    retry_on_failure: {{ enabled: false }}
service:
  telemetry: {{ metrics: {{ level: none }} }}
  pipelines:
    logs: &all {{ receivers: [otlp], processors: [memory_limiter], exporters: [otlphttp] }}
    traces: *all
    metrics: *all
"""

    def __init__(self, program, root, port, behind):
        self.program, self.port, self.behind, self.starts = program, port, behind, 0
        self.child, self.log = None, os.path.join(root, "collector.log")
        self.path = os.path.join(root, "collector.yaml")
        with open(self.path, "w", encoding="utf-8") as file:
            file.write(self.CONFIGURATION.format(port=port, behind=behind.port))

    def start(self, faults):
        del faults   # the receiver's, whose answers are not handed on one by one
        self.starts += 1
        if self.behind.child is None or self.behind.child.poll() is not None:
            self.behind.start(0)
        with open(self.log, "ab") as log:
            self.child = subprocess.Popen([self.program, "--config", f"file:{self.path}"],
                                          stdout=log, stderr=log)
        await_port(self.child, self.port)

    def kill(self):
        """Every other time with what is behind it."""
        self.child.kill()
        self.child.wait()
        if self.starts % 2 == 0:
            self.behind.kill()


def await_port(child, port):
    while child.poll() is None:
        with socket.socket() as probe:
            if probe.connect_ex(("127.0.0.1", port)) == 0:
                return
        time.sleep(0.02)
    raise SystemExit("the receiver does not start")


def free_port():
    with socket.socket() as free:
        free.bind(("127.0.0.1", 0))
        return free.getsockname()[1]


class Request:
    def __init__(self, facts, body):
        self.signal, self.fate, self.began = facts["signal"], facts["fate"], facts["began"]
        self.number, self.answered, self.unsure = facts["number"], None, False
        self.octets = len(body)
        self.items = list(otlp.items(gzip.decompress(body) if facts["packed"] else body))
        self.device = self.items[0][0] if self.items else None

    def is_kept(self):
        return self.fate not in receiving.UNKEPT

    def is_unsure(self, stops, following):
        """Whether its sender may not know what became of it. `following`: its next request of
        this signal, which it would not have made had it waited for an answer to this one."""
        if self.answered is None or self.answered - self.began > TIMEOUT / 2:
            return True
        return any(self.began <= ended and (following is None or following.began >= asked)
                   for asked, ended in stops)


def read_journal(path):
    requests = {}
    with open(path, "rb") as file:
        while line := file.readline():
            if not line.endswith(b"\n"):
                break
            facts = json.loads(line)
            body = file.read(facts["length"])
            if len(body) < facts["length"]:
                break   # killed while it wrote: it did not keep it
            if "answered" in facts:
                requests[facts["answered"]].answered = facts["time"]
            else:
                requests[facts["number"]] = Request(facts, body)
    return requests.values()


class Sum:
    """What arrived from one device, beside what was to leave it."""

    def __init__(self, device, requests, is_direct):
        self.device = device
        self.requests = sorted(requests, key=lambda request: request.began)
        self.wrong = []
        self.twice = 0
        self.lost = device.losses()
        last = {}
        for request in reversed(self.requests):
            request.unsure = (not is_direct
                              or request.is_unsure(device.stops, last.get(request.signal)))
            last[request.signal] = request

    def names_in(self, request, name_of):
        names = [name_of(record) for _, record in request.items]
        # Of a partial success the first is the one that was rejected.
        return names[1:] if request.fate == "partial" else names

    def add(self, signal_name, wanted, forgiven, name_of):
        """How many of the wanted arrived, and how many did not."""
        arrived, unsure = {}, set()
        for request in self.requests:
            if request.signal != signal_name or not request.is_kept():
                continue
            names = self.names_in(request, name_of)
            for name in names:
                if name not in wanted:
                    self.wrong.append(f"{signal_name}: a stranger")
                elif name in arrived:
                    self.twice += 1
                    self.check_repeat(arrived[name], request)
                arrived[name] = request
            unsure.update(names if request.unsure else ())
        missed = len(wanted - arrived.keys() - forgiven)
        lost = self.lost[signal_name]
        # What had arrived without the device's knowledge may count as lost all the same, and
        # what is forgiven may have been refused before.
        if not missed <= lost <= missed + len(unsure) + len(forgiven):
            self.wrong.append(f"{signal_name}: {missed} did not arrive, {lost} counted as lost")
        return len(arrived.keys() - forgiven), missed

    def check_repeat(self, first, second):
        if not first.unsure:
            self.wrong.append(f"{first.signal}: request {first.number} ({first.fate}) was "
                              f"repeated by {second.number} ({second.fate})")

    def add_metrics(self):
        known = {}
        for request in self.requests:
            if request.signal == "metrics" and request.is_kept():
                for _, metric in request.items:
                    for name, start, end, cause, count, total in otlp.points(metric):
                        if name != "halyard.audio.issue.duration":
                            continue
                        key = (start, end, cause)
                        if known.setdefault(key, (count, total)) != (count, total):
                            self.wrong.append(f"metrics: two values of {key}")
        found = sum(count for count, _ in known.values())
        may_lack = self.device.has_retention or self.lost["metrics"] > 0
        if found > self.device.store.glitches or found < self.device.store.glitches and not may_lack:
            self.wrong.append(f"metrics: {found} glitches of {self.device.store.glitches}")
        return found


def log_name(record):
    for pair in otlp.all_of(record, 6):
        parts = dict(otlp.fields(pair))
        if parts[1] == b"log.record.uid":
            return dict(otlp.fields(parts[2]))[1].decode()
    return None


def span_name(record):
    return dict(otlp.fields(record))[2]


def run(arguments, root, devices, receiver, chance):
    """The time in which things go wrong."""
    end = time.monotonic() + arguments.seconds
    moments = sorted((chance.uniform(1, arguments.seconds - 1), what)
                     for what in ("exporter", "receiver") for _ in range(arguments.kills))
    began, away, back = time.monotonic(), None, None
    while (now := time.monotonic()) < end:
        device = chance.choice(devices)
        device.go_on()
        if away is None and now - began > arguments.seconds / 2:
            receiver.kill()
            away, back = now, now + AWAY
            for each in devices:
                if each.has_retention:
                    each.go_on()
                    each.store.forget(0.8)
        if back and now > back:
            receiver.start(arguments.faults)
            back = None
        while moments and now - began > moments[0][0]:
            _, what = moments.pop(0)
            if what == "exporter":
                device.stop(signal.SIGKILL)
                device.start()
            elif back is None:
                receiver.kill()
                time.sleep(chance.uniform(0, 0.5))
                receiver.start(arguments.faults)
        time.sleep(0.02)
    if back:
        receiver.start(0)


def finish(devices, receiver):
    receiver.kill()
    for device in devices:
        device.grow(device.wanted)
        if device.store.open is not None:
            device.store.close_session()
        device.stop(signal.SIGTERM)
        if device.random.random() < 0.5:
            device.store.close()   # its daemon has ended; the others' still runs
    receiver.start(0)
    with concurrent.futures.ThreadPoolExecutor(4) as pool:
        list(pool.map(Device.drain, devices))
    receiver.kill()


def add_up(devices, journals, is_direct):
    """Prints the sum, and says whether it closes."""
    requests = [request for path in journals for request in read_journal(path)]
    by_device = collections.defaultdict(list)
    for request in requests:
        by_device[request.device].append(request)
    fates = collections.Counter(request.fate for request in requests)
    print("requests      ", len(requests), dict(fates.most_common()),
          "and never answered:", sum(request.answered is None for request in requests))
    total = collections.Counter()
    wrong = []
    for device in devices:
        sheet = Sum(device, by_device[device.name], is_direct)
        if device.status != 0:
            sheet.wrong.append(f"--once ended with {device.status}")
        arrived, missed = sheet.add("logs", device.store.logs, set(), log_name)
        spans = device.store.spans
        # Glitches of a session that was removed went with it, and are not counted apart.
        forgiven = spans - device.store.session_spans if device.has_retention else set()
        spans_arrived, spans_missed = sheet.add("traces", spans, forgiven, span_name)
        total.update({"logs": len(device.store.logs), "logs arrived": arrived,
                      "logs missed": missed, "logs lost": sheet.lost["logs"],
                      "spans": len(spans - forgiven), "spans arrived": spans_arrived,
                      "spans missed": spans_missed, "spans lost": sheet.lost["traces"],
                      "glitches": device.store.glitches,
                      "glitches counted": sheet.add_metrics(), "twice": sheet.twice,
                      "exact": sheet.lost["logs"] == missed})
        wrong += [f"{device.name}: {what}" for what in sheet.wrong]
    print(f"devices        {len(devices)}, of which retention was faster with "
          f"{sum(device.has_retention for device in devices)}; "
          f"lost as many logs as did not arrive: {total['exact']}")
    for name in ("logs", "spans"):
        print(f"{name:14} {total[name]}: arrived {total[name + ' arrived']}, did not arrive "
              f"{total[name + ' missed']}; counted as lost {total[name + ' lost']}")
    print(f"glitches       {total['glitches']}: in metrics {total['glitches counted']}")
    print(f"sent twice     {total['twice']} (in flight at a kill, a cut or a late answer)")
    print("the sum closes" if not wrong else f"the sum does not close: {len(wrong)}")
    for line in list(dict.fromkeys(wrong))[:20]:
        print("   ", line)
    return not wrong


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("program")
    parser.add_argument("--devices", type=int, default=100)
    parser.add_argument("--seconds", type=float, default=60)
    parser.add_argument("--kills", type=int, default=20, help="of exporters, and of the receiver")
    parser.add_argument("--faults", type=float, default=0.25, help="share of requests that fail")
    parser.add_argument("--seed", default="1")
    parser.add_argument("--collector", metavar="PROGRAM", help="stands before the receiver")
    parser.add_argument("--keep", action="store_true", help="leave everything for a look")
    arguments = parser.parse_args()
    root = tempfile.mkdtemp(prefix="halyard-fleet-")
    os.chmod(root, 0o755)
    program = shutil.copy(arguments.program, os.path.join(root, "halyard-export"))
    chance = random.Random(arguments.seed)
    devices, last = [], Receiver(root, free_port(), arguments.seed)
    receiver = last
    if arguments.collector:
        receiver = Collector(arguments.collector, root, free_port(), last)
    try:
        devices = [Device(number, program, root, receiver.port, arguments.seed)
                   for number in range(arguments.devices)]
        print(f"{len(devices)} devices stand, with {sum(each.store.rows for each in devices)} "
              "messages", flush=True)
        receiver.start(arguments.faults)
        for device in devices:
            device.start()
        run(arguments, root, devices, receiver, chance)
        finish(devices, receiver)
        kills = sum(len(device.stops) - 1 for device in devices)
        print(f"killed         {kills} exporters, receiver started {receiver.starts} times")
        journals = glob.glob(os.path.join(root, "*.journal"))
        return 0 if add_up(devices, journals, is_direct=receiver is last) else 1
    finally:
        for child in [device.child for device in devices] + [receiver.child, last.child]:
            if child is not None and child.poll() is None:
                child.kill()
                child.wait()
        if arguments.keep:
            print(f"left in {root}")
        else:
            shutil.rmtree(root, ignore_errors=True)


if __name__ == "__main__":
    sys.exit(main())
