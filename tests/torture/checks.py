"""What has to hold, as functions of what was seen. Each returns texts, one for each fault.

The promises are those of docs/store.md and docs/wire.md; test_checks.py breaks each of them.
"""

# What the daemon stays below whatever happens, and comes back below at rest, in MiB.
PEAK = 600
AT_REST = 200
# Far above the aims (50 and 250 ms on a machine at rest): only a standstill is a fault here.
P99 = 2.0
LONGEST = 30.0


def sheet(messages, lost=None, store=None):
    """The sheet of messages closes; with `store`, also what the store made of them."""
    arrived = messages["offered"] + messages["own"]
    left = (messages["repeats"] + sum(messages["not_uploaded"].values())
            + messages["delivered"] + messages["waiting"])
    faults = []
    if arrived != left:
        faults.append(f"offered and own are {arrived}, what became of them {left}: {messages}")
    if messages["waiting"] < 0:
        faults.append(f"waiting is negative: {messages}")
    if store is not None:
        lost = sum(store["lost"]["upload_message"].values())
        kept = store["rows"]["upload_message"]
        if messages["delivered"] != kept + lost:
            faults.append(f"delivered {messages['delivered']}, but {kept} rows and {lost} lost")
    if lost is not None and lost > messages["delivered"]:
        faults.append(f"{lost} lost of {messages['delivered']} delivered")
    return faults


def rows(before, store, after):
    """What the store says it wrote and removed is what is there: rows by table."""
    return [f"{table}: {before.get(table, 0)} rows, then {written} written and"
            f" {store['removed'][table]} removed, but {after.get(table, 0)} are there"
            for table, written in store["rows"].items()
            if before.get(table, 0) + written - store["removed"][table] != after.get(table, 0)]


def removed(count):
    """For a life in which nothing gave retention a reason."""
    return [f"{count} messages were removed without a reason"] if count else []


def order(who, numbers):
    """Those of one session, in the order of the rows' ids. Sessions are delivered side by side."""
    at = next((i for i, (a, b) in enumerate(zip(numbers, numbers[1:])) if a > b), None)
    return [] if at is None else [f"{who}: out of order: {numbers[max(0, at - 2):at + 4]}"]


class Present:
    """How the rows of one honest client stand beside what it was promised.

    `rows` are its numbers, `required` those that had to be there, in the order of sending. What retention, a purge or somebody's rm took lies before
    `first`, the lowest in the store of now (None: none is); what is missing behind is a hole.
    """

    def __init__(self, who, rows_, required, last_sent, first):
        self.who = who
        self.rows = rows_
        self.last_sent = last_sent
        there = set(rows_)
        missing = [n for n in required if n not in there]
        self.before = [n for n in missing if first is None or n < first]
        self.holes = [n for n in missing if first is not None and n > first]

    def faults(self):
        found = []
        if len(set(self.rows)) != len(self.rows):
            twice = sorted({n for n in self.rows if self.rows.count(n) > 1})[:5]
            found.append(f"{self.who}: stored twice: {twice}")
        if self.rows and max(self.rows) > self.last_sent:
            found.append(f"{self.who}: {max(self.rows)} is stored and was never sent")
        return found


def kept(presents, counted, may_lack_first, excused=lambda who, n: False):
    """What was promised is there, or counted.

    `counted` is how many messages the daemon says it could not keep. With
    `may_lack_first`, what is before the first row of a client was removed by rule;
    `excused` says so of a single one.
    """
    faults = [fault for present in presents for fault in present.faults()]
    missing = []
    for present in presents:
        first = [] if may_lack_first else present.before
        missing += [(present.who, n) for n in first + present.holes
                    if not excused(present.who, n)]
    if len(missing) > counted:
        faults.append(f"{len(missing)} promised messages are missing and {counted} counted;"
                      f" the first are {missing[:5]}, the last {missing[-3:]}")
    return faults


def files(state, log):
    """An orderly end leaves nothing over; both are names below the daemon's folders."""
    faults = []
    for name in state:
        plain = name.split("/")[-1]
        if name != "telemetry.db" and not name.startswith("incidents/") or plain.startswith("."):
            faults.append(f"left in the state directory: {name}")
    faults += [f"left in the logs directory: {name}" for name in log
               if name.split("/")[-1].startswith(".") or name.endswith((".new", ".tmp"))]
    return faults


def size(peak, at_rest=None):
    """Memory, in MiB."""
    faults = [f"memory was {peak:.0f} MiB"] if peak >= PEAK else []
    if at_rest is not None and at_rest >= AT_REST:
        faults.append(f"memory is {at_rest:.0f} MiB at rest")
    return faults


def threads(before, after):
    """As many at rest as at the start."""
    return [f"{before} threads at the start, {after} at rest"] if after > before else []


def descriptors(before, after, more):
    """Both say of what and how many; `more` have a reason."""
    if sum(after.values()) <= sum(before.values()) + more:
        return []
    return [f"descriptors that are left: {dict(after - before)}"]


def quantile(sorted_values, part):
    return sorted_values[min(len(sorted_values) - 1, int(len(sorted_values) * part))]


def waits(seconds):
    """How long honest clients waited while nothing was done to the disk."""
    if len(seconds) < 100:
        return []
    ordered = sorted(seconds)
    p99, longest = quantile(ordered, 0.99), ordered[-1]
    return [f"{name} wait of an honest client was {value:.2f} s"
            for name, value, bound in (("the p99", p99, P99), ("the longest", longest, LONGEST))
            if value > bound]
