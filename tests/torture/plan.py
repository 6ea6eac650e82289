"""What happens to the daemon, and when: all of it follows from the seed.

The run is a row of lives of the daemon, each planned by itself from the seed and its
number, so that one can be lived again without those before it.
"""

import random
from dataclasses import dataclass, field

# The attacks, and how hard each may try at most here, where others are at work as well.
ATTACKS = {"one_id_many_times": 0.5, "long_text_many_times": 0.5, "configuration_keys": 0.1,
           "unfinished_frames": 0.2, "kinds_of_message": 0.3, "small_messages": 0.01,
           "many_sessions": 0.1, "all_reporters": 0.05, "all_reporters_untold": 0.02,
           "configuration_many_keys": 0.1, "long_application_name": 0.1, "started_sessions": 0.1,
           "broadcasts": 0.05, "unknown_ids": 0.2, "large_rows": 0.1, "answers_left_lying": 0.1,
           "nested_values": 0.1, "single_messages": 0.2, "flood": 0.2, "bad_frames": 0.1}

# How each fault of the disk is drawn: milliseconds (of slow ones), and for how many seconds.
DISK = {"slow": ((20, 600), (2, 8)), "hang": ((0, 0), (1, 13)), "read_error": ((0, 0), (1, 8)),
        "write_error": ((0, 0), (1, 6)), "torn": ((0, 0), (1, 5)), "full": ((0, 0), (1, 8)),
        "read_only": ((0, 0), (1, 8))}

HALYARDCTL = [["status"], ["--json", "sessions"], ["--json", "messages", "--since", "1m"], [],
              ["check"], ["glitches"], ["--json", "events", "--since", "1m"]]

# By how much the wall clock is set, in seconds.
JUMPS = [2 * 3600, 10 * 86400, -3 * 3600, 90, -60, 40 * 86400]

BASE = """\
[analytics]
wanted = ["com.kestrel.*"]
[sessions]
recount = true
upload_limit = %(upload_limit)d
[store]
max_bytes = "%(max_bytes)s"
sync_interval = "%(sync_interval)s"
[device_properties]
InternalBuild = %(internal)s
[log]
level = "%(level)s"
"""

ENDS = ["quiet", "sigterm", "sigkill", "kill_service"]


@dataclass(frozen=True)
class Act:
    """Begins `at` seconds after the life's start and, where that matters, lasts `seconds`."""
    at: float
    kind: str
    name: str = ""
    amount: float = 0
    seconds: float = 0

    def __str__(self):
        parts = [f"{self.at:.1f} s: {self.kind}", self.name]
        parts += [f"{self.amount:g}"] if self.amount else []
        parts += [f"for {self.seconds:.1f} s"] if self.seconds else []
        return " ".join(part for part in parts if part)


@dataclass(frozen=True)
class Life:
    """One life of the daemon; the acts stand in the order of their beginning."""
    number: int
    seconds: float
    end: str
    settings: dict
    acts: list = field(default_factory=list)

    @property
    def configuration(self):
        return BASE % self.settings

    def has(self, *kinds):
        return any(act.kind in kinds for act in self.acts)


class Planner:
    """Draws the acts of one life."""

    def __init__(self, seed, number):
        self.number = number
        self.random = random.Random(f"{seed}/{number}")

    def life(self):
        # The first that ends quietly comes soon: what is wrong at rest is cheap to find.
        end = "quiet" if self.number == 0 else self.random.choices(ENDS, [4, 3, 4, 1])[0]
        seconds = self.random.uniform(8, 24)
        acts = []
        for kind, most in (("attack", 3), ("disk", 3), ("small", 3)):
            for _ in range(self.random.randint(0, most)):
                acts.append(getattr(self, kind)(seconds))
        if self.random.random() < 0.1:
            acts.append(self.disk(seconds, at=-1.0))
        return Life(self.number, seconds, end, self.settings(),
                    sorted(acts, key=lambda act: (act.at, str(act))))

    def settings(self):
        pick = self.random.choice
        return {"upload_limit": pick([100000, 100000, 100000, 5]),
                "max_bytes": pick(["64MiB", "64MiB", "64MiB", "1MiB"]),
                "sync_interval": pick(["50ms", "50ms", "50ms", "500ms", "5s"]),
                "internal": pick(["true", "false", "false"]),
                "level": pick(["info", "info", "default"])}

    def at(self, life_seconds):
        return self.random.uniform(0.5, life_seconds - 2)

    def attack(self, life_seconds):
        name = self.random.choice(sorted(ATTACKS))
        return Act(self.at(life_seconds), "attack", name,
                   round(ATTACKS[name] * self.random.uniform(0.2, 1), 4))

    def disk(self, life_seconds, at=None):
        name = self.random.choice(sorted(DISK))
        milliseconds, lasts = DISK[name]
        return Act(self.at(life_seconds) if at is None else at, "disk", name,
                   self.random.randint(*milliseconds), self.random.uniform(*lasts))

    def small(self, life_seconds):
        """What is neither an attack nor a fault, and may come at the same time as both."""
        at = self.at(life_seconds)
        kind = self.random.choices(["pause", "clock", "storm", "halyardctl", "reader", "lock",
                                    "remove_log", "move_store", "remove_store", "purge"],
                                   [4, 4, 4, 6, 4, 3, 2, 2, 1, 1])[0]
        return {
            "pause": lambda: Act(at, kind, seconds=self.random.uniform(0.1, 3)),
            "clock": lambda: Act(at, kind, amount=self.random.choice(JUMPS)),
            "storm": lambda: Act(at, kind, amount=self.random.randint(1, 1 << 30),
                                 seconds=self.random.uniform(1, 5)),
            "halyardctl": lambda: Act(at, kind, " ".join(self.random.choice(HALYARDCTL))),
            "reader": lambda: Act(at, kind, seconds=self.random.uniform(1, 8)),
            "lock": lambda: Act(at, kind, seconds=self.random.uniform(0.2, 6)),
            "remove_log": lambda: Act(at, kind, self.random.choice(["-wal", "-shm"])),
        }.get(kind, lambda: Act(at, kind))()


def life(seed, number):
    return Planner(seed, number).life()
