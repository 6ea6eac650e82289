#!/usr/bin/python3
"""Does everything to a daemon at once that may happen to it, for as long as it is told to, and
keeps books of what was promised to whom.

usage: torture.py BUILD_FOLDER [--minutes N] [--seed N] [--life N] [--keep-going]

What is done follows from the seed, which is printed; when it is done depends on the machine.
--life lives a single one of the run, on a store of its own. On a fault it prints the seed, the
minute and the last acts, leaves the run's directory, and ends with 1.
"""

import argparse
import collections
import json
import math
import os
import random
import shutil
import signal
import sys
import tempfile
import time

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path += [os.path.join(HERE, "..", "..", "scripts"), os.path.join(HERE, "..", "daemon")]
import checks  # noqa: E402
import launcher  # noqa: E402
import library  # noqa: E402
import plan  # noqa: E402
from faulty_disk import FaultyDisk  # noqa: E402
from hands import FORK, start  # noqa: E402
from harness import Daemon  # noqa: E402
from life import LifeRun  # noqa: E402

Programs = collections.namedtuple("Programs", "halyardd halyardctl faulty_disk libhalyard python")


class Run:
    """What outlasts a life: the daemon's folders, the disk, the program with the library."""

    def __init__(self, arguments):
        build = os.path.abspath(arguments.build)
        self.programs = Programs(*(os.path.join(build, name) for name in (
            "halyardd", "halyardctl", "libfaulty_disk.so", "libhalyard.so")), sys.executable)
        self.seed = arguments.seed
        self.root = tempfile.mkdtemp(prefix="halyard-torture-")
        self.daemon = Daemon.__new__(Daemon)
        os.makedirs(self.file("daemon"))
        launcher.Launcher.__init__(self.daemon, self.programs.halyardd, self.file("daemon"))
        self.disk = FaultyDisk(self.programs.faulty_disk, self.file("faults"))
        self.clock_ahead = 0
        self.clock_untold = False
        self.counts = collections.Counter()
        self.totals = collections.Counter()
        self.waits = []
        self.peak = 0
        self.honest_answered = 0
        self.library = Library(self)

    def file(self, name):
        return os.path.join(self.root, name)

    def live(self, number):
        """Lives one life; the texts of its faults."""
        planned = plan.life(self.seed, number)
        life = LifeRun(planned, self)
        try:
            life.live()
            self.add(life)
        except launcher.Ended as error:
            life.fault(str(error)[-2000:])
        finally:
            if self.daemon.process is not None and self.daemon.process.poll() is None:
                self.daemon.kill()
            self.disk.tell()
        self.counts["lives"] += 1
        self.library.lived(life)
        return life

    def add(self, life):
        """To the sheet of the whole run: the last that each life knew of itself."""
        if not life.statuses:
            return
        status = life.statuses[-1][2]
        messages = life.sheet or status["messages"]
        for key in ("requests", "offered", "own", "repeats", "delivered", "waiting", "refused",
                    "bounded", "unaddressed"):
            self.totals[key] += messages[key]
        for inner in ("not_uploaded", "lost_in_clients"):
            for key, count in messages[inner].items():
                self.totals[f"{inner}.{key}"] += count
        for outer in ("lost", "removed"):
            for table, count in status["store"][outer].items():
                for reason, n in count.items() if isinstance(count, dict) else [("", count)]:
                    self.totals[f"{outer}.{table}.{reason}".rstrip(".")] += n


class Library:
    """The process that reports through libhalyard all the time, and its books."""

    def __init__(self, run):
        self.run = run
        self.stop = FORK.Event()
        self.path = run.file("library")
        self.process = start(library.run, run.programs.libhalyard, run.daemon.socket_path,
                             self.stop, self.path)
        self.stored = set()
        self.last_end = 0
        self.excused = []  # (from, until): what was sent then may be missing

    def lived(self, life):
        rows = getattr(life, "library_rows", [])
        self.stored.update(rows)
        began, ended = getattr(life, "began", 0), getattr(life, "ended", time.monotonic())
        self.last_end = ended
        orderly = life.plan.end != "sigkill" and not life.hands.moved
        if not orderly or not hasattr(life, "counted") or life.counted or life.removed():
            self.excused.append((began - 5, ended))
        elif life.hands.rows_taken is not None:
            self.excused.append((began - 5, ended))

    def pause(self):
        os.kill(self.process.pid, signal.SIGSTOP)

    def go_on(self):
        os.kill(self.process.pid, signal.SIGCONT)

    def end(self):
        """While a daemon runs. The faults found."""
        self.stop.set()
        self.process.join(60)
        if self.process.is_alive():
            self.process.kill()
            return ["the program with libhalyard does not end"]
        return []

    def faults(self):
        with open(self.path, encoding="utf-8") as file:
            ledger = json.load(file)
        self.excused.append((self.last_end - 1, math.inf))  # Nobody took these.
        missing = [(n, at) for n, at in ledger["taken"] if n not in self.stored and
                   not any(start <= at <= end for start, end in self.excused)]
        figures = ledger["statistics"]
        given_up = sum(figures[name] for name in ("dropped_discarded", "dropped_queue_full"))
        print(f"libhalyard: {len(ledger['taken'])} taken, {len(self.stored)} stored,"
              f" {ledger['refused']} refused, {figures}")
        if len(missing) > given_up:
            return [f"{len(missing)} messages of libhalyard are missing and {given_up} given up:"
                    f" {missing[:3]}"]
        return []


def report_fault(run, life, minute):
    print(f"\nFAULT with seed {run.seed}, life {life.plan.number}, minute {minute:.1f},"
          f" end {life.plan.end}, settings {life.plan.settings}")
    for fault in life.faults[:12]:
        print("  " + fault[:1500])
    print("  the last acts: " + "; ".join(life.recent[-12:]))
    print(f"  kept in {run.root}; this life alone: --seed {run.seed} --life {life.plan.number}")
    shutil.copytree(run.daemon.root, life.file("daemon"),
                    ignore=shutil.ignore_patterns("*.sock"))


def report(run, minutes):
    print(f"\nafter {minutes:.1f} minutes with seed {run.seed}:")
    for title, counts in (("done", run.counts), ("messages", run.totals)):
        print(f"{title}: " + ", ".join(f"{name} {counts[name]}" for name in sorted(counts)
                                       if counts[name]))
    print(f"honest clients: {run.honest_answered} messages answered")
    if run.waits:
        waits = sorted(run.waits)
        print("their waits while the disk was well: " + ", ".join(
            f"{name} {value * 1000:.1f} ms" for name, value in (
                ("median", checks.quantile(waits, 0.5)), ("p99", checks.quantile(waits, 0.99)),
                ("longest", waits[-1]))) + f" of {len(waits)}")
    print(f"peak of memory: {run.peak:.0f} MiB")


def torture(run, arguments):
    """True when all was well."""
    began = time.monotonic()
    number = arguments.life or 0
    well = True
    def minutes():
        return (time.monotonic() - began) / 60
    while True:
        life = run.live(number)
        print(f"life {number:3} {minutes():5.1f} min {life.plan.end:12}"
              f" {len(getattr(life, 'library_rows', [])):6} of the library,"
              f" counted {getattr(life, 'counted', '?'):>5}, removed {life.removed():>6}, "
              + ", ".join(act.split(": ")[1] for act in life.recent), flush=True)
        if life.faults:
            report_fault(run, life, minutes())
            well = False
        number += 1
        if (life.faults and not arguments.keep_going) or arguments.life is not None \
                or minutes() >= arguments.minutes:
            break
        if not life.faults:
            shutil.rmtree(life.file(""))
    ended = run.library.end()
    for fault in ended or (run.library.faults() if well else []):
        print("FAULT " + fault)
        well = False
    report(run, minutes())
    return well


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("build")
    parser.add_argument("--minutes", type=float, default=10)
    parser.add_argument("--seed", type=int, default=None)
    parser.add_argument("--life", type=int, default=None)
    parser.add_argument("--keep-going", action="store_true")
    arguments = parser.parse_args()
    if arguments.seed is None:
        arguments.seed = random.SystemRandom().randrange(1_000_000)
    print(f"seed {arguments.seed}, {arguments.minutes:g} minutes", flush=True)
    signal.signal(signal.SIGTERM, lambda *_: sys.exit(1))  # And all that it started.
    run = Run(arguments)
    well = torture(run, arguments)
    if well:
        shutil.rmtree(run.root, ignore_errors=True)
    sys.exit(0 if well else 1)


if __name__ == "__main__":
    main()
