"""One life of the daemon: everything at once, then the end, then the books."""

import collections
import json
import os
import re
import shutil
import signal
import sqlite3
import subprocess
import time

import checks
import honest
import launcher
from hands import FORK, SUFFIXES, Hands, start

WHO = re.compile(r'"who":"([^"]+)","n":(\d+)')
SHEET = re.compile(r"messages since the start: (\{.*\})")
UNDONE = re.compile(r"stopping with work left undone: (\d+) requests were not looked at")
# What an orderly end may take: 10 s for the disk and 5 for the clients, and a busy machine.
END = 30
# How long memory, threads and descriptors may take to come back.
SETTLE = 40
# Answered so long before a kill, on a disk that works, is in the store (section Durability
# of docs/store.md has half a second and what a commit takes; the rest is the machine).
SURELY = 4.0


def names_below(folder):
    found = []
    for path, _, names in os.walk(folder):
        found += [os.path.relpath(os.path.join(path, name), folder) for name in names]
    return sorted(found)


class Snapshot:
    """What a store holds, seen in a copy, so that the daemon finds its own as it left it."""

    def __init__(self, store_path, folder):
        shutil.rmtree(folder, ignore_errors=True)
        os.makedirs(folder)
        self.messages = []  # (who, n, upload session) in the order of ids
        self.tables = {}
        self.faults = []
        copy = os.path.join(folder, "copy.db")
        for suffix in SUFFIXES[:2]:
            if os.path.exists(store_path + suffix):
                shutil.copy(store_path + suffix, copy + suffix)
        if os.path.exists(copy):
            self.read(copy)
        shutil.rmtree(folder)

    def read(self, path):
        database = sqlite3.connect(path)
        try:
            self.faults = [f"the store is damaged: {line}" for (line,) in
                           database.execute("PRAGMA integrity_check(5)") if line != "ok"]
            for (table,) in database.execute(
                    "SELECT name FROM sqlite_master WHERE type = 'table'").fetchall():
                self.tables[table] = database.execute(f"SELECT count(*) FROM {table}").fetchone()[0]
            if "upload_message" in self.tables:
                self.messages = [
                    (match[1], int(match[2]), session) for match, session in (
                        (WHO.search(payload), session) for payload, session in database.execute(
                            "SELECT payload, upload_session FROM upload_message WHERE payload LIKE"
                            " '{\"who\":%' ORDER BY id")) if match]
        except sqlite3.Error as error:
            self.faults.append(f"the store cannot be read: {error}")
        finally:
            database.close()


class LifeRun:
    """Lives one life of the plan. `place` is the run: its folders, daemon, disk and counts."""

    def __init__(self, plan, place):
        self.plan, self.place, self.daemon = plan, place, place.daemon
        self.hands = Hands(place.daemon, place.disk, place.programs, place, self.file)
        self.faults = []
        self.clients = []
        self.recent = []
        self.statuses = []

    def live(self):
        self.start()
        began = time.monotonic()
        coming = [act for act in self.plan.acts if act.at >= 0]
        while time.monotonic() - began < self.plan.seconds and self.alive():
            while coming and coming[0].at <= time.monotonic() - began:
                self.recent.append(str(coming[0]))
                self.hands.do(coming.pop(0))
            self.hands.tick()
            time.sleep(0.02)
        if not self.alive():
            self.fault(f"the daemon ended by itself with {self.daemon.process.returncode}")
        self.end()
        self.account()

    def fault(self, text):
        self.faults.append(text)

    def file(self, name):
        """What this life leaves to be looked at."""
        folder = self.place.file(f"life-{self.plan.number}")
        os.makedirs(folder, exist_ok=True)
        return os.path.join(folder, name)

    def alive(self):
        return self.daemon.process.poll() is None

    # The start.

    def start(self):
        self.before = Snapshot(self.daemon.store_path, self.place.file("copy"))
        self.fault_all(self.before.faults)
        self.daemon.configure(self.plan.configuration)
        self.daemon.log_path = self.file("log")
        for act in self.plan.acts:
            if act.at < 0:
                self.recent.append(str(act))
                self.hands.do(act)
        self.daemon.start(extra=self.place.disk.environment())
        self.wait_until_it_accepts()
        self.began = time.monotonic()
        self.warm_up()
        self.handles = self.at_rest()
        self.stop = FORK.Event()
        self.watcher_path = self.file("status")
        self.watcher = start(honest.watch, self.daemon.socket_path, 0.4, self.watcher_path)
        for number, kind in enumerate(honest.KINDS):
            who = f"{kind.__name__.lower()}{number}@{self.plan.number}"
            ledger = self.file(f"ledger-{number}")
            process = start(honest.run, kind, self.daemon.socket_path, who, number,
                            self.place.seed, self.stop, ledger)
            self.clients.append((who, process, ledger))

    def fault_all(self, texts):
        self.faults += texts

    def wait_until_it_accepts(self):
        until = time.monotonic() + 60
        while not self.daemon.accepts():
            self.hands.tick()  # A disk may hang from before the start.
            if not self.alive() or time.monotonic() > until:
                raise launcher.Ended(f"it takes no connections: {self.daemon.log()}")
            time.sleep(0.02)

    def warm_up(self):
        """What the first session makes stays: the sources of driver statistics, for one."""
        client = self.daemon.client()
        client.session(1)
        client.result("stopReportingSessionForID", 1)
        client.close()

    def at_rest(self):
        """How many threads it has, and what its descriptors are."""
        pid = self.daemon.process.pid
        descriptors = []
        for name in os.listdir(f"/proc/{pid}/fd"):
            try:
                descriptors.append(os.readlink(f"/proc/{pid}/fd/{name}").split("[")[0])
            except FileNotFoundError:
                pass  # Closed meanwhile.
        return len(os.listdir(f"/proc/{pid}/task")), collections.Counter(descriptors)

    def memory(self, field):
        with open(f"/proc/{self.daemon.process.pid}/status", encoding="ascii") as file:
            return next((int(line.split()[1]) / 1024 for line in file
                         if line.startswith(field)), 0)

    # The end.

    def end(self):
        if self.alive():
            self.fault_all(checks.size(self.memory("VmHWM")))
            self.place.peak = max(self.place.peak, self.memory("VmHWM"))
        self.faulty_end = self.plan.end != "quiet" and any(
            end > time.monotonic() for _, end in self.hands.faulty)
        getattr(self, "end_" + self.plan.end)()
        self.ended = time.monotonic()
        self.hands.calm()
        self.stop.set()
        self.ledgers = [self.ledger(*client) for client in self.clients]
        self.watcher.join(70)
        self.watcher.kill()
        self.fault_all(self.hands.ctl_faults())

    def end_quiet(self):
        self.hands.calm()
        self.stop.set()
        for _, process, _ in self.clients:
            process.join(90)
        self.settle()
        self.watcher.kill()
        self.watcher.join()
        self.place.library.pause()
        self.look_at_rest()
        self.order(0)
        self.place.library.go_on()

    def end_sigterm(self):
        self.order(0)

    def end_kill_service(self):
        self.place.counts["killService"] += 1
        self.go_on()
        code = ("import sys, socket, msgpack; s = socket.socket(socket.AF_UNIX); s.settimeout(60);"
                "s.connect(sys.argv[1]); s.sendall(msgpack.packb([0, 1, 'killService', []]));"
                "s.recv(1)")
        try:
            subprocess.run([self.place.programs.python, "-c", code, self.daemon.socket_path],
                           check=False, timeout=60, stderr=subprocess.DEVNULL)
        except subprocess.TimeoutExpired:
            pass
        self.wait_for_end(2)

    def end_sigkill(self):
        self.place.counts["sigkill"] += 1
        if self.alive():
            self.daemon.kill()

    def order(self, status):
        if not self.alive():
            return
        self.go_on()
        self.daemon.process.terminate()
        self.wait_for_end(status)

    def go_on(self):
        """One that is stopped cannot end."""
        if self.alive():
            os.kill(self.daemon.process.pid, signal.SIGCONT)

    def wait_for_end(self, status):
        try:
            code = self.daemon.process.wait(END)
            if code != status:
                self.fault(f"ended with {code}")
        except subprocess.TimeoutExpired:
            self.fault(f"did not end within {END} s")
            self.daemon.kill()

    def settle(self):
        """All clients but the watcher are gone: what they cost comes back."""
        until = time.monotonic() + SETTLE
        while True:
            threads, descriptors = self.at_rest()
            faults = checks.size(0, self.memory("VmRSS"))
            faults += checks.threads(self.handles[0], threads)
            # The watcher's and the library's connection, the store's files if the disk was
            # full at the start.
            faults += checks.descriptors(self.handles[1], descriptors, more=6)
            if not faults or time.monotonic() > until or not self.alive():
                break
            time.sleep(0.2)
        self.fault_all(faults)

    def look_at_rest(self):
        """The status while nothing is written, and the rows that are there then."""
        self.last_status = None
        try:
            client = self.daemon.client()
            client.result("admin.flush")
            for _ in range(100):
                status = client.result("admin.status")
                self.rows_at_rest = self.count_rows(self.daemon.store_path)
                after = client.result("admin.status")["store"]
                # Retention may still be at work, a slab at a time.
                if all(after[what] == status["store"][what] for what in ("rows", "removed")):
                    self.last_status = status
                    break
                time.sleep(0.2)
            client.close()
        except (OSError, AssertionError, sqlite3.Error) as error:
            self.fault(f"no look at the daemon at rest: {error!r}")

    @staticmethod
    def count_rows(path):
        database = sqlite3.connect(f"file:{path}?mode=ro", uri=True, timeout=20,
                                   isolation_level=None)
        try:
            database.execute("BEGIN")
            return {table: database.execute(f"SELECT count(*) FROM {table}").fetchone()[0]
                    for (table,) in database.execute(
                        "SELECT name FROM sqlite_master WHERE type = 'table'").fetchall()}
        finally:
            database.close()

    def ledger(self, who, process, path):
        process.join(90)
        if process.is_alive():
            self.fault(f"{who} does not end")
            process.kill()
            process.join()
        try:
            with open(path, encoding="utf-8") as file:
                ledger = json.load(file)
        except FileNotFoundError:  # It could not even make its session.
            ledger = {"who": who, "answered": [], "written": 0, "flushed": [], "refused": {},
                      "waits": [], "error": None}
        if ledger["error"]:
            self.fault(f"{who}: {ledger['error']}")
        return ledger

    # The books.

    def account(self):
        self.read_statuses()
        log = self.daemon.log()
        found = SHEET.findall(log)
        self.sheet = json.loads(found[-1]) if found else None
        # A disk so slow that even an end within its limits cannot wait for it.
        self.faulty_end = self.faulty_end or "the file system does not answer" in log[-3000:]
        # A storm may leave the log's level where the sheet is not told.
        if self.plan.end != "sigkill" and self.sheet is None and not self.plan.has("storm"):
            self.fault("the log lacks the last sheet")
        if self.sheet:
            self.fault_all(checks.sheet(self.sheet, lost=self.sheet["lost"]))
            if self.sheet["waiting"] and not self.faulty_end:
                self.fault(f"ended with {self.sheet['waiting']} messages that wait")
        if "set aside" in log:
            self.fault("the store was set aside")
        self.after = Snapshot(self.daemon.store_path, self.place.file("copy"))
        self.moved = [Snapshot(path, self.place.file("copy")) for path in self.hands.moved]
        for snapshot in [self.after, *self.moved]:
            self.fault_all(snapshot.faults)
        if self.plan.end == "quiet":
            self.account_at_rest()
        self.account_of_retention()
        self.account_of_clients()
        # What a kill leaves is gone with the next start, so with the next orderly end. Who
        # reads the store then keeps its log there.
        shared = self.plan.end != "quiet" and self.plan.has("reader", "lock", "halyardctl")
        # Nor can a file be removed from a disk that takes nothing.
        stuck = any(act.kind == "disk" and act.name == "read_only" for act in self.plan.acts)
        if self.plan.end != "sigkill" and not self.faulty_end and not shared and not stuck:
            self.fault_all(checks.files(names_below(self.daemon.path("state")),
                                        names_below(self.daemon.path("log"))))
        self.account_waits()

    def read_statuses(self):
        """The statuses that the watcher saw; the last is what a kill leaves to know."""
        self.statuses = []
        with open(self.watcher_path, encoding="utf-8") as file:
            for line in file:
                try:
                    asked, came, status = json.loads(line)
                except ValueError:
                    continue  # The watcher was ended in the middle of it.
                if isinstance(status, dict):
                    self.statuses.append((asked, came, status))
        for _, _, status in self.statuses:
            self.fault_all(checks.sheet(status["messages"], store=status["store"])[:1])
            if self.faults:
                break

    def account_at_rest(self):
        status = self.last_status
        if status is None:
            return
        self.statuses.append((self.ended, self.ended, status))
        self.fault_all(checks.sheet(status["messages"], store=status["store"]))
        if status["messages"]["waiting"] != 0:
            self.fault(f"{status['messages']['waiting']} messages wait though nobody sends")
        if self.hands.rows_taken is None:
            after = dict(self.rows_at_rest)
            for moved in self.moved:
                for table, count in moved.tables.items():
                    after[table] = after.get(table, 0) + count
            self.fault_all(checks.rows(self.before.tables, status["store"], after))

    def account_of_retention(self):
        """Nothing goes for want of room where there is room, nor by a clock that jumps."""
        most = max((status["store"]["file_bytes"] for _, _, status in self.statuses), default=0)
        roomy = self.plan.settings["max_bytes"] == "64MiB" and most < 40 << 20
        if roomy and not self.plan.has("attack") and not self.place.clock_untold:
            self.fault_all(checks.removed(self.removed()))
        # The daemon notes a jump with its next commit: a kill may come before.
        self.place.clock_untold = self.plan.has("clock") and self.plan.end == "sigkill"

    def account_of_clients(self):
        rows = {}
        orders = {}
        for store, snapshot in enumerate([*self.moved, self.after]):
            first = {}  # Of the last store, which is the one that retention looks after.
            for who, n, session in snapshot.messages:
                rows.setdefault(who, []).append(n)
                first[who] = min(n, first.get(who, n))
                orders.setdefault((who, store, session), []).append(n)
        for (who, _, _), numbers in orders.items():
            self.fault_all(checks.order(who, numbers))
        self.library_rows = rows.get("library", [])
        presents = []
        sent_at = {}
        for ledger in self.ledgers:
            required = self.required(ledger)
            presents.append(checks.Present(ledger["who"], rows.get(ledger["who"], []), required,
                                           ledger["written"] - 1, first.get(ledger["who"])))
            sent_at.update({(ledger["who"], n): at for n, at in ledger["answered"]})
            self.place.honest_answered += len(ledger["answered"])
        self.counted = self.not_kept()
        if any(act.kind == "clock" and act.amount < 0 for act in self.plan.acts):
            self.counted += self.removed()  # What came after it looks older than what was there.
        taken = self.hands.rows_taken
        def excused(who, n):
            return taken is not None and sent_at.get((who, n), 0) < taken + 1
        self.fault_all(checks.kept(presents, self.counted, self.removed() > 0, excused))

    def not_kept(self):
        """How many messages the daemon says it could not keep, or did not upload."""
        # What waits at the end, on a disk that hangs, is lost and told.
        lost = self.sheet["lost"] + self.sheet["waiting"] if self.sheet else 0
        lost += sum(int(count) for count in UNDONE.findall(self.daemon.log()))
        messages = self.sheet or {}
        if self.sheet is None and self.statuses:
            status = self.statuses[-1][2]
            lost = sum(status["store"]["lost"]["upload_message"].values())
            messages = status["messages"]
        rules = messages.get("not_uploaded", {})
        return lost + sum(rules.get(rule, 0) for rule in ("limit", "no_backend"))

    def removed(self):
        return self.statuses[-1][2]["store"]["removed"]["upload_message"] if self.statuses else 1

    def required(self, ledger):
        """What has to be in the store, or counted."""
        answered = ledger["answered"]
        if self.plan.end == "quiet" or self.plan.end == "sigterm":
            return list(range(ledger["written"])) if not ledger["refused"] else [
                n for n, _ in answered]
        if self.plan.end == "kill_service":
            return [n for n, _ in answered]
        known = self.statuses[-1][0] if self.statuses else 0
        through = max((n for n, _, came in ledger["flushed"] if came < known), default=-1)
        until = self.surely_until()
        return [n for n, at in answered if n <= through or at < until]

    def surely_until(self):
        """What was answered by then is on the disk, or counted in the last status."""
        if (self.plan.settings["sync_interval"] != "50ms" or self.plan.has("storm")
                or any(end > self.ended - 12 for _, end in self.hands.troubled)):
            return 0
        known = self.statuses[-1][0] if self.statuses else 0
        return min(self.ended, known) - SURELY

    def account_waits(self):
        quiet = []
        for ledger in self.ledgers:
            quiet += [took for began, took in ledger["waits"]
                      if not any(start - 1 < began + took and began < end + 3
                                 for start, end in self.hands.troubled)]
        self.place.waits += quiet
        self.fault_all(checks.waits(quiet))
