"""What one client process can do to a daemon, each as a function of the socket's
path and of how hard it tries (1: what benchmarks/hostile.py measures).

Run in a process of their own: a client's budget is its process's.
"""

import multiprocessing
import resource
import socket
import time

import msgpack

# How long an attack goes on when the daemon takes its time.
LIMIT = 20


def connect(path):
    peer = socket.socket(socket.AF_UNIX)
    peer.settimeout(120)
    peer.connect(path)
    return peer


def request(number, method, *params):
    return msgpack.packb([0, number, method, list(params)])


def notification(method, *params):
    return msgpack.packb([2, method, list(params)])


class Peer:
    """Sends without looking; answers are read when somebody asks."""

    def __init__(self, path):
        self.socket = connect(path)
        self.unpacker = msgpack.Unpacker(raw=True, strict_map_key=False)
        self.number = 0
        self.errors = []
        self.until = time.monotonic() + LIMIT

    def send(self, frames):
        self.socket.sendall(frames)

    def ask(self, method, *params):
        """Waits for the answer; its error's code, or 0."""
        self.number += 1
        self.send(request(self.number, method, *params))
        return self.wait_for(self.number)

    def wait_for(self, number):
        while True:
            for _, answered, error, _ in self.unpacker:
                if error is not None:
                    self.errors.append(error)
                if answered == number:
                    return error[b"code"] if error else 0
            chunk = self.socket.recv(1 << 20)
            if not chunk:
                raise ConnectionError("closed")
            self.unpacker.feed(chunk)

    def in_time(self):
        return time.monotonic() < self.until

    def session(self, reporter_id, start=True):
        self.send(notification("createReportingSession", reporter_id) +
                  notification("setServiceType", 0, reporter_id))
        if start:
            self.send(notification("startReportingSessionForID", reporter_id))


def one_id_many_times(path, scale):
    peer = Peer(path)
    peer.session(5)
    wide = {f"key{i:04}": i for i in range(2000)}
    for i in range(max(1, int(4 * scale))):
        wide["n"] = i
        peer.ask("sendMessage", wide, 4, 1, [5] * 25000)


def long_text_many_times(path, scale):
    peer = Peer(path)
    peer.session(5)
    for i in range(max(1, int(2 * scale))):
        peer.ask("sendMessage", {"text": "x" * 100_000, "n": i}, 11, 1, [5] * 40000)


def configuration_keys(path, scale):
    peer = Peer(path)
    peer.session(5, start=False)
    for i in range(int(2600 * scale)):
        if not peer.in_time():
            break
        key = f"{i:08}" + "k" * 1_000_000
        peer.ask("setConfiguration", {key: 1}, 5)


def unfinished_frames(path, scale):
    soft, hard = resource.getrlimit(resource.RLIMIT_NOFILE)
    resource.setrlimit(resource.RLIMIT_NOFILE, (hard, hard))
    frame = request(1, "sendMessage", {"text": "x" * 1_040_000}, 4, 1, [5])[:-10]
    peers = []
    until = time.monotonic() + LIMIT
    for _ in range(int(3000 * scale)):
        if time.monotonic() > until:
            break
        peer = connect(path)
        peer.settimeout(0.5)
        try:
            peer.sendall(frame)
        except OSError:
            pass  # Not read from any more, or closed.
        peers.append(peer)
    time.sleep(1)


def kinds_of_message(path, scale):
    peer = Peer(path)
    peer.session(5)
    groups = [0, 0x04000000, 0x08000000, 0x10000000, 0x20000000, 0x40000000, 0x80000000]
    kinds = [(group + category, kind) for group in groups for category in range(1, 16)
             for kind in [*range(1, 19), 20, 65535]]
    text = "x" * 65_000
    for i, (category, kind) in enumerate((kinds * 2)[:int(3200 * scale)]):
        if not peer.in_time():
            break
        peer.ask("sendMessage", {"text": text, "n": i}, category, kind, [5])


def small_messages(path, scale):
    peer = Peer(path)
    peer.session(5)
    sent = 0
    while sent < int(5_000_000 * scale) and time.monotonic() < peer.until + 60:
        peer.send(b"".join(notification("sendMessage", {"n": sent + i, "text": "a" * 20, "x": 0.5},
                                        4, 1, [5]) for i in range(1000)))
        sent += 1000
    peer.ask("stopReportingSessionForID", 5)


def many_sessions(path, scale):
    peer = Peer(path)
    for first in range(1, int(1_000_000 * scale), 1000):
        if not peer.in_time():
            break
        peer.send(b"".join(notification("createReportingSession", first + i)
                           for i in range(1000)))
    peer.ask("reporterIDValid", 1)


def all_reporters(path, scale):
    peer = Peer(path)
    for first in range(1, int(300_000 * scale), 1000):
        peer.send(b"".join(notification("createReportingSession", first + i)
                           for i in range(1000)))
    peer.ask("reporterIDValid", 1)
    peer.until = time.monotonic() + LIMIT
    for first in range(0, int(1000 * scale), 4):
        if not peer.in_time():
            break
        peer.send(b"".join(request(1000 + first + i, "getAllReporters") for i in range(4)))
        peer.wait_for(1000 + first + 3)


def all_reporters_untold(path, scale):
    """The same by notifications: nothing is answered, all of it is worked out."""
    peer = Peer(path)
    for first in range(1, int(300_000 * scale), 1000):
        peer.send(b"".join(notification("createReportingSession", first + i)
                           for i in range(1000)))
    peer.ask("reporterIDValid", 1)
    peer.send(notification("getAllReporters") * int(1000 * scale))
    peer.ask("reporterIDValid", 1)


def configuration_many_keys(path, scale):
    peer = Peer(path)
    peer.session(5, start=False)
    for i in range(int(59 * scale) or 1):
        if not peer.in_time():
            break
        peer.ask("setConfiguration", {f"{i}-{k}-key": k for k in range(30000)}, 5)


def long_application_name(path, scale):
    peer = Peer(path)
    peer.session(5, start=False)
    peer.ask("setConfiguration", {"HostApplicationDisplayID": "n" * 1_000_000}, 5)
    for _ in range(int(300 * scale) or 1):
        if not peer.in_time():
            break
        peer.send(notification("startReportingSessionForID", 5))
        peer.ask("stopReportingSessionForID", 5)


def started_sessions(path, scale):
    peer = Peer(path)
    count = int(6000 * scale)
    for first in range(1, count, 100):
        if not peer.in_time():
            break
        peer.send(b"".join(notification("createReportingSession", first + i) +
                           notification("startReportingSessionForID", first + i)
                           for i in range(100)))
        peer.ask("reporterIDValid", 1)


def broadcasts(path, scale):
    """To sessions of its own, as fast as they are taken."""
    started_sessions(path, scale / 3)
    peer = Peer(path)
    count = int(2000 * scale)
    for first in range(1, count, 100):
        peer.send(b"".join(notification("createReportingSession", first + i) +
                           notification("startReportingSessionForID", first + i)
                           for i in range(100)))
    i = 0
    peer.until = time.monotonic() + LIMIT / 2
    while peer.in_time():
        i += 1
        peer.ask("sendMessage", {"n": i, "text": "b" * 200}, 4, 1, None)


def unknown_ids(path, scale):
    peer = Peer(path)
    for i in range(int(20 * scale) or 1):
        if not peer.in_time():
            break
        peer.ask("sendMessage", {"n": i}, 4, 1, list(range(1000, 61000)))


def large_rows(path, scale):
    peer = Peer(path)
    peer.session(5)
    text = "x" * 900_000
    for i in range(int(330 * scale)):
        if not peer.in_time():
            break
        peer.ask("sendMessage", {"text": text, "n": i}, 4, 1, [5])


def answers_left_lying(path, scale):
    soft, hard = resource.getrlimit(resource.RLIMIT_NOFILE)
    resource.setrlimit(resource.RLIMIT_NOFILE, (hard, hard))
    first = Peer(path)
    for start in range(1, 20001, 1000):
        first.send(b"".join(notification("createReportingSession", start + i)
                            for i in range(1000)))
    first.ask("reporterIDValid", 1)
    peers = []
    for _ in range(int(1500 * scale)):
        if not first.in_time():
            break
        peer = connect(path)
        peer.sendall(request(1, "getAllReporters") * 16)
        peers.append(peer)
    time.sleep(2)


def nested_values(path, scale):
    """Frames that are small on the wire and large in memory."""
    peers = [connect(path) for _ in range(int(200 * scale) or 1)]
    frame = notification("sendMessage", {"l": [[1]] * 32000}, 4, 1, [5])
    until = time.monotonic() + LIMIT / 2
    while time.monotonic() < until:
        for peer in peers:
            peer.sendall(frame * 4)


def single_messages(path, scale):
    """None of them has a session, so each waits for its second."""
    peer = Peer(path)
    peer.session(5, start=False)
    text = "x" * int(20_000)
    frames = b"".join(notification("sendMessage", {"n": i, "text": text}, 4, 1, [5])
                      for i in range(50))
    until = time.monotonic() + LIMIT * scale
    while time.monotonic() < until:
        peer.send(frames)


def flood(path, scale):
    """Many small messages on many connections."""
    peers = [Peer(path) for _ in range(int(50 * scale) or 1)]
    for i, peer in enumerate(peers):
        peer.session(5 + i)
    frames = [b"".join(notification("sendMessage", {"n": n, "text": "y" * 100}, 4, 1, [5 + i])
                       for n in range(100)) for i in range(len(peers))]
    until = time.monotonic() + LIMIT / 2
    while time.monotonic() < until:
        for peer, frame in zip(peers, frames):
            peer.send(frame)


def bad_frames(path, scale):
    """Requests that are refused where they are read."""
    peers = [connect(path) for _ in range(int(200 * scale) or 1)]
    frames = notification("sendMessage", {"n": 1}, 4, "no type", [5]) * 2000
    until = time.monotonic() + LIMIT / 2
    while time.monotonic() < until:
        for peer in peers:
            peer.sendall(frames)


ALL = [one_id_many_times, long_text_many_times, configuration_keys, unfinished_frames,
       kinds_of_message, small_messages, many_sessions, all_reporters, all_reporters_untold,
       configuration_many_keys, long_application_name, started_sessions, broadcasts, unknown_ids,
       large_rows, answers_left_lying, nested_values, single_messages, flood, bad_frames]


def attempt(attack, path, scale):
    try:
        attack(path, scale)
    except OSError:
        pass  # Refused or cut off.


def start(attack, path, scale=1.0):
    """Runs one in a process of its own; join() waits for its end."""
    process = multiprocessing.get_context("fork").Process(target=attempt,
                                                          args=(attack, path, scale))
    process.start()
    return process
