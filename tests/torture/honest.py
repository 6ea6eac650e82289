"""Clients that do as they should, and write down what they were promised.

Each is a process of its own. Its ledger, a JSON file, has: `who`; `answered`, the numbers of
messages that the daemon had taken for sure, and when; `written`, how many whole messages the
kernel took; `flushed`, through which number and when admin.flush had answered; `refused`, by
code; `waits`, when and how long an answer took.
"""

import json
import os
import random
import sys
import time

sys.path.append(os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "daemon"))
from harness import Client  # noqa: E402

FIRST_ID = 1 << 50  # Nobody else's.
FLUSH_EVERY = 1.0


class Honest:
    """What all of them share: a connection, a session, a ledger."""

    started = True

    def __init__(self, path, who, number, seed):
        self.who = who
        self.session_id = FIRST_ID + number * 100_000
        self.random = random.Random(f"{seed}/{who}")
        self.client = Client(path)
        self.ledger = {"who": who, "answered": [], "written": 0, "flushed": [], "refused": {},
                       "waits": [], "error": None}
        self.n = 0
        self.last_flush = time.monotonic()
        self.client.session(self.session_id, service_type=7, start=self.started)

    def message(self):
        return {"who": self.who, "n": self.n, "text": "x" * self.random.choice([0, 20, 300])}

    def answered(self, n, error):
        if error is None:
            self.ledger["answered"].append((n, time.monotonic()))
        else:
            code = str(error["code"])
            self.ledger["refused"][code] = self.ledger["refused"].get(code, 0) + 1

    def ask(self):
        """One message, and its answer."""
        began = time.monotonic()
        request = self.client.start("sendMessage", self.message(), 4, 1, [self.session_id])
        n, self.n = self.n, self.n + 1
        self.ledger["written"] = self.n
        error, _ = self.client.answer(request)
        self.ledger["waits"].append((began, time.monotonic() - began))
        self.answered(n, error)

    def flush(self):
        if time.monotonic() - self.last_flush > FLUSH_EVERY:
            asked = time.monotonic()
            self.client.result("admin.flush")
            self.last_flush = time.monotonic()
            self.ledger["flushed"].append((self.n - 1, asked, self.last_flush))

    def step(self):
        for _ in range(self.random.choice([1, 1, 5])):
            self.ask()
        self.flush()
        time.sleep(self.random.uniform(0.005, 0.02))

    def finish(self):
        self.client.result("stopReportingSessionForID", self.session_id)


class Asker(Honest):
    """Waits for each answer."""


class Single(Honest):
    """Its session does not run, so each message goes out on its own."""

    started = False


class Notifier(Honest):
    """Writes without answers, and asks now and then whether all of it was taken."""

    def step(self):
        first = self.n
        for _ in range(self.random.randint(1, 60)):
            self.client.notify("sendMessage", self.message(), 4, 1, [self.session_id])
            self.n += 1
            self.ledger["written"] = self.n
        if self.random.random() < 0.3:
            began = time.monotonic()
            self.client.result("reporterIDValid", self.session_id)
            now = time.monotonic()
            self.ledger["waits"].append((began, now - began))
            known = len(self.ledger["answered"])
            self.ledger["answered"] += [(n, now) for n in range(known, self.n)]
            self.flush()
        time.sleep(self.random.uniform(0.01, 0.1) * (self.n - first) / 30)


class Player(Honest):
    """A session for each few messages."""

    def step(self):
        end = self.random.choice(["stopReportingSessionForID", "destroyReportingSession"])
        for _ in range(self.random.randint(1, 5)):
            self.ask()
        self.client.result(end, self.session_id)
        if end == "destroyReportingSession":
            self.session_id += 1
            self.client.result("createReportingSession", self.session_id)
        self.client.start("startReportingSessionForID", self.session_id)
        self.flush()
        time.sleep(self.random.uniform(0.02, 0.1))


KINDS = [Asker, Asker, Single, Notifier, Player]


def run(kind, path, who, number, seed, stop, ledger_path):
    """The process of one of them."""
    client = None
    try:
        client = kind(path, who, number, seed)
        while not stop.is_set():
            client.step()
        client.finish()
    except (ConnectionError, BrokenPipeError):
        pass  # The daemon ended.
    except Exception as error:  # pylint: disable=broad-except
        if client is not None:
            client.ledger["error"] = repr(error)
    if client is not None:
        with open(ledger_path + ".new", "w", encoding="utf-8") as file:
            json.dump(client.ledger, file)
        os.rename(ledger_path + ".new", ledger_path)


def watch(path, every, file_path):
    """Asks for the status all the time: a line of JSON for each, with when it was asked."""
    client = Client(path)
    with open(file_path, "w", encoding="utf-8") as file:
        try:
            while True:
                asked = time.monotonic()
                status = client.result("admin.status")
                file.write(json.dumps([asked, time.monotonic(), status]) + "\n")
                file.flush()
                time.sleep(every)
        except (OSError, AssertionError) as error:
            file.write(json.dumps([time.monotonic(), 0, repr(error)]) + "\n")
