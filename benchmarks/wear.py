#!/usr/bin/env python3
"""What telemetry costs a flash disk and a battery: bytes written to the device, syncs, and
wake-ups of the daemon, by how many messages come and how long they may wait.

usage: wear.py HALYARDD FAULTY_DISK_LIBRARY [--seconds N] [--rates 1,10,1000]
               [--intervals 50ms,500ms,5s,30s]

Each daemon has an ext4 of its own on a loop device, whose counter of written sectors tells
what really reaches a disk, the journal included; that takes root. Without it, /proc/PID/io
says what the daemon has written. Syncs are counted by the library of the daemon's tests.
Wake-ups are the voluntary context switches of all its threads. The daemons run side by side.

Bytes and syncs do not depend on how fast time goes, so they are measured with groups as large
as the interval makes them, one behind the other (admin.flush commits each), until 24 MiB are
written, and four groups: hours of one message a second. Wake-ups are measured in real time.
"""

import argparse
import os
import shutil
import subprocess
import sys
import tempfile
import threading
import time

sys.path.append(os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "scripts"))
sys.path.append(os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "tests", "daemon"))
import launcher  # noqa: E402
from faulty_disk import FaultyDisk  # noqa: E402
from harness import Client  # noqa: E402

SECONDS = {"50ms": 0.05, "500ms": 0.5, "5s": 5, "30s": 30}
DISK_MIB = 448
WARM_UP = 5
# The log is moved into the file every 4 MiB: what is measured holds some of that, and of
# large groups more than one.
FIRST = 1024 * 1024
ENOUGH = 24 * 1024 * 1024
GROUPS = 4


class Disk:
    """An ext4 on a loop device, mounted where the daemon keeps its state."""

    def __init__(self, place):
        self.image = place + ".img"
        self.place = place
        subprocess.run(["truncate", "-s", f"{DISK_MIB}M", self.image], check=True)
        subprocess.run(["mkfs.ext4", "-q", "-E", "lazy_itable_init=0,lazy_journal_init=0",
                        self.image], check=True)
        self.device = subprocess.run(["losetup", "--find", "--show", self.image], check=True,
                                     capture_output=True, text=True).stdout.strip()
        subprocess.run(["mount", "-o", "noatime", self.device, place], check=True)

    def written(self):
        name = os.path.basename(self.device)
        with open(f"/sys/block/{name}/stat", encoding="ascii") as file:
            return int(file.read().split()[6]) * 512

    def remove(self):
        subprocess.run(["umount", self.place], check=False)
        subprocess.run(["losetup", "--detach", self.device], check=False)
        os.remove(self.image)


class Run:
    """One daemon at one rate."""

    def __init__(self, arguments, rate, interval):
        self.rate, self.interval = rate, interval
        self.root = tempfile.mkdtemp(prefix="halyard-wear-")
        self.daemon = launcher.Launcher(arguments.halyardd, self.root)
        self.daemon.configure(f'[store]\nsync_interval = "{interval}"\n')
        self.disk = Disk(self.daemon.path("state")) if arguments.device else None
        self.faulty = FaultyDisk(arguments.library, self.daemon.path("faults"))
        self.daemon.start(extra=self.faulty.environment())
        self.daemon.wait_until_it_accepts(60)
        self.client = Client(self.daemon.socket_path)
        self.client.session(1)
        self.sent = 0

    def counts(self):
        """Bytes written, syncs, wake-ups."""
        pid = self.daemon.process.pid
        if self.disk:
            written = self.disk.written()
        else:
            with open(f"/proc/{pid}/io", encoding="ascii") as file:
                written = int(dict(line.split(": ") for line in file)["write_bytes"])
        wakes = 0
        for thread in os.listdir(f"/proc/{pid}/task"):
            with open(f"/proc/{pid}/task/{thread}/status", encoding="ascii") as file:
                wakes += next(int(line.split()[1]) for line in file
                              if line.startswith("voluntary_ctxt_switches"))
        return written, self.faulty.syncs(), wakes

    def message(self):
        n = self.sent
        self.sent += 1
        return {"audiotag": f"Playback_Start_{n}", "sample_rate": 48000, "channels": 2,
                "route": "Speaker", "device": "alsa_output.pci-0000_00_1f.3.analog-stereo",
                "application": "com.example.player", "volume": 0.25 + n % 7, "latency": n,
                "text": "x" * 100}

    def send(self, seconds):
        began = time.monotonic()
        for n in range(int(self.rate * seconds)):
            late = began + n / self.rate - time.monotonic()
            if late > 0:
                time.sleep(late)
            self.client.notify("sendMessage", self.message(), 4, 1, [1])
        time.sleep(max(0, began + seconds - time.monotonic()))

    def commit_group(self):
        """What one interval brings."""
        for _ in range(max(1, round(self.rate * SECONDS[self.interval]))):
            self.client.notify("sendMessage", self.message(), 4, 1, [1])
        self.client.result("admin.flush")

    def commit_groups(self, number, written):
        """At least so many, and so many bytes."""
        before = self.counts()[0]
        while number > 0 or self.counts()[0] - before < written:
            self.commit_group()
            number -= 1

    def write_enough(self):
        """Bytes and syncs per message."""
        self.commit_groups(1, FIRST)
        before, sent = self.counts(), self.sent
        self.commit_groups(GROUPS, ENOUGH)
        after = self.counts()
        self.bytes, self.syncs = ((b - a) / (self.sent - sent)
                                  for a, b in list(zip(before, after))[:2])

    def measure(self, seconds):
        if self.rate > 0:
            self.write_enough()
        self.send(WARM_UP)
        before, sent = self.counts(), self.sent
        self.send(seconds)
        self.figures = [b - a for a, b in zip(before, self.counts())]
        self.messages = self.sent - sent

    def remove(self):
        self.client.close()
        self.daemon.terminate(60)
        if self.disk:
            self.disk.remove()
        shutil.rmtree(self.root, ignore_errors=True)


def row(run):
    written, syncs, wakes = run.figures
    if run.messages == 0:
        return f"| none | {run.interval} | {written} in all | | {syncs} in all | {wakes} in all |"
    return (f"| {run.rate} | {run.interval} | {run.bytes:.0f} | {run.bytes * run.rate * 0.0864:.0f} "
            f"| {run.syncs:.4f} | {wakes / run.messages:.2f} |")


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("halyardd")
    parser.add_argument("library")
    parser.add_argument("--seconds", type=int, default=120)
    parser.add_argument("--rates", default="0,1,10,1000")
    parser.add_argument("--intervals", default="50ms,500ms,5s,30s")
    arguments = parser.parse_args()
    arguments.device = os.geteuid() == 0
    print("written as", "the loop device's counter" if arguments.device else "/proc/PID/io says")
    print("| messages/s | interval | bytes/message | MB a day | syncs/message | wake-ups/message |")
    print("|---|---|---|---|---|---|")
    for rate in map(int, arguments.rates.split(",")):
        runs = []
        try:
            for interval in arguments.intervals.split(","):
                runs.append(Run(arguments, rate, interval))
            threads = [threading.Thread(target=run.measure, args=(arguments.seconds,))
                       for run in runs]
            for thread in threads:
                thread.start()
            for thread in threads:
                thread.join()
            for run in runs:
                print(row(run), flush=True)
        finally:
            for run in runs:
                run.remove()


if __name__ == "__main__":
    main()
