"""Does to a daemon what the plan says, and takes it back in time.

Everything here is begun at once and ended later: nobody waits, so acts overlap.
"""

import multiprocessing
import os
import random
import shutil
import signal
import sqlite3
import subprocess
import sys
import time

sys.path.append(os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "daemon"))
import attacks  # noqa: E402
from harness import Client  # noqa: E402

FORK = multiprocessing.get_context("fork")
SUFFIXES = ("", "-wal", "-shm")

STORM = ['[log]\nlevel = "%s"\n' % level for level in ("info", "debug", "error")] + [
    '[preferences."com.kestrel.halyard"]\ndevice_name = "%s"\n' % name for name in ("a", "b")] + [
    '[store]\nsync_interval = "200ms"\n', '[store]\nmax_age = "30d"\n',
    '[analytics]\nwanted = []\n', '[limits]\nmemory = "64MiB"\n', '[limits]\nsessions = 20000\n',
    "this is no TOML", "[store]\nmax_age = 7\n", ""]


def start(target, *arguments):
    """A process that does not outlive this one."""
    process = FORK.Process(target=target, args=arguments, daemon=True)
    process.start()
    return process


def storm(daemon, seed, seconds):
    """Rewrites the drop-ins and has them read, and configures sessions, all the time."""
    choose = random.Random(seed)
    folder = daemon.path("etc", "halyard.d")
    os.makedirs(folder, exist_ok=True)
    until = time.monotonic() + seconds
    number = 0
    while time.monotonic() < until:
        path = os.path.join(folder, f"{choose.randint(0, 5)}.toml")
        with open(path, "w", encoding="utf-8") as file:
            file.write(choose.choice(STORM))
        if choose.random() < 0.3:
            os.remove(path)
        if choose.random() < 0.3:
            os.kill(daemon.process.pid, signal.SIGHUP)
        number += 1
        try:
            configure(daemon, number)
        except (OSError, AssertionError):
            pass
        time.sleep(choose.uniform(0, 0.05))


def configure(daemon, number):
    client = Client(daemon.socket_path)
    client.session(900 + number, application=f"org.example.{number}")
    client.call("setConfiguration", {"key": number}, 900 + number)
    client.close()


def read(path, seconds):
    """A reader that stays in one transaction."""
    try:
        database = sqlite3.connect(f"file:{path}?mode=ro", uri=True, isolation_level=None)
        database.execute("BEGIN")
        database.execute("SELECT count(*) FROM upload_message").fetchall()
        time.sleep(seconds)
    except sqlite3.Error:
        pass  # The disk fails for others than the daemon as well.


def lock(path, seconds):
    try:
        # Not one that makes a file where there is none.
        database = sqlite3.connect(f"file:{path}?mode=rw", uri=True, isolation_level=None)
        database.execute("BEGIN IMMEDIATE")
        time.sleep(seconds)
        database.execute("ROLLBACK")
    except sqlite3.Error:
        pass


def purge(path, answers):
    try:
        client = Client(path)
        answers.put((client.call("admin.purge"), time.monotonic()))
    except OSError:
        pass


class Hands:
    """Borrows the daemon and the disk, for one life."""

    def __init__(self, daemon, faults, programs, place, file):
        self.daemon, self.faults, self.programs, self.place = daemon, faults, programs, place
        self.counts = place.counts
        self.file = file                # where a name of this life's lies
        self.processes = []
        self.undo = []                 # (when, what), for what has to be taken back
        self.troubled = []             # [from, until]: when others may well have to wait
        self.faulty = []               # the same, for the disk alone
        self.moved = []                # stores that were moved away
        self.rows_taken = None         # when rows were last taken out on purpose
        self.purges = FORK.SimpleQueue()
        self.ctl = []                  # (arguments, process)
        self.clock_jumped = False

    def do(self, act):
        self.counts[f"{act.kind} {act.name}".strip() if act.kind in ("attack", "disk")
                    else act.kind] += 1
        getattr(self, act.kind)(act)

    def tick(self):
        now = time.monotonic()
        due = [each for each in self.undo if each[0] <= now]
        self.undo = [each for each in self.undo if each[0] > now]
        for _, action in due:
            action()

    def begin(self, target, *arguments):
        process = start(target, *arguments)
        self.processes.append(process)

    def later(self, seconds, action):
        self.undo.append((time.monotonic() + seconds, action))

    # The acts, by the plan's names for them.

    def attack(self, act):
        attack = getattr(attacks, act.name)
        self.processes.append(attacks.start(attack, self.daemon.socket_path, act.amount))

    def disk(self, act):
        now = time.monotonic()
        self.faults.tell(act.name, int(act.amount))
        for stretches in (self.troubled, self.faulty):
            stretches.append([now, now + act.seconds])
        self.later(act.seconds, self.faults.tell)

    def pause(self, act):
        now = time.monotonic()
        os.kill(self.daemon.process.pid, signal.SIGSTOP)
        self.troubled.append([now, now + act.seconds])
        self.later(act.seconds, lambda: os.kill(self.daemon.process.pid, signal.SIGCONT))

    def clock(self, act):
        self.clock_jumped = True
        self.place.clock_ahead += int(act.amount)
        self.faults.set_clock_ahead(self.place.clock_ahead)

    def storm(self, act):
        self.begin(storm, self.daemon, act.amount, act.seconds)

    def reader(self, act):
        self.begin(read, self.daemon.store_path, act.seconds)

    def lock(self, act):
        now = time.monotonic()
        self.troubled.append([now, now + act.seconds])
        self.faulty.append([now, now + act.seconds])
        self.begin(lock, self.daemon.store_path, act.seconds)

    def halyardctl(self, act):
        arguments = [self.programs.halyardctl, "--state", self.daemon.path("state"), "--socket",
                     self.daemon.socket_path, *act.name.split()]
        output = open(self.file("halyardctl"), "ab")  # pylint: disable=consider-using-with
        self.ctl.append((act.name, subprocess.Popen(  # pylint: disable=consider-using-with
            arguments, stdout=subprocess.DEVNULL, stderr=output, stdin=subprocess.DEVNULL)))
        output.close()

    def remove_log(self, act):
        # Rows in a log that nobody has open go with it, which no daemon can help.
        if self.daemon.has_open(self.daemon.store_path + act.name):
            self.each_file(os.remove, [act.name])

    def move_store(self, act):
        folder = self.file(f"moved-{len(self.moved)}")
        os.makedirs(folder)
        self.moved.append(os.path.join(folder, "telemetry.db"))
        self.each_file(lambda path: shutil.move(path, folder), SUFFIXES)

    def remove_store(self, act):
        self.rows_taken = time.monotonic()
        self.each_file(os.remove, SUFFIXES)

    def purge(self, act):
        self.rows_taken = time.monotonic() + 1e6  # Until it has answered.
        self.begin(purge, self.daemon.socket_path, self.purges)

    def each_file(self, action, suffixes):
        for suffix in suffixes:
            try:
                action(self.daemon.store_path + suffix)
            except FileNotFoundError:
                pass

    # The end.

    def calm(self):
        """Takes everything back and waits for what was begun."""
        self.faults.tell()
        for stretch in self.troubled + self.faulty:
            stretch[1] = min(stretch[1], time.monotonic())
        if self.daemon.process.poll() is None:
            os.kill(self.daemon.process.pid, signal.SIGCONT)
        self.undo = []
        until = time.monotonic() + 15
        for process in self.processes:
            process.join(max(0, until - time.monotonic()))
            if process.is_alive():
                process.kill()
                process.join()
        self.processes = []
        shutil.rmtree(self.daemon.path("etc", "halyard.d"), ignore_errors=True)
        while not self.purges.empty():
            self.rows_taken = self.purges.get()[1]

    def ctl_faults(self):
        """Its end may tell of trouble; it may not crash, or hang."""
        faults = []
        for name, process in self.ctl:
            try:
                code = process.wait(90)
            except subprocess.TimeoutExpired:
                process.kill()
                process.wait()
                faults.append(f"halyardctl {name} does not end")
                continue
            self.counts[f"halyardctl ended with {code}"] += 1
            if code < 0:
                faults.append(f"halyardctl {name} ended with signal {-code}")
        return faults
