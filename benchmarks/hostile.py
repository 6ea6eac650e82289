#!/usr/bin/env python3
"""What one client process can do to the daemon, and to the other clients.

usage: benchmarks/hostile.py HALYARDD [ATTACK...]

For each attack, against a daemon of its own: the daemon's largest resident memory,
what is left of it after the client's end, how long another client's requests took
meanwhile, and how much was logged.
"""

import multiprocessing
import os
import shutil
import sys
import tempfile
import time

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path += [os.path.join(HERE, "..", "scripts"), os.path.join(HERE, "..", "tests", "daemon")]
import attacks  # noqa: E402
import launcher  # noqa: E402

PERIOD = 0.005   # between the other client's requests
SETTLE = 5       # seconds after the client's end at which memory is looked at again


def memory(pid, field):
    """In MiB."""
    with open(f"/proc/{pid}/status", encoding="utf-8") as file:
        return next(int(line.split()[1]) for line in file if line.startswith(field)) / 1024


def probe(path, stop, latencies):
    """Another client: asks all the time how long an answer takes."""
    peer = attacks.Peer(path)
    peer.session(77)
    peer.ask("reporterIDValid", 77)
    took = []
    while not stop.is_set():
        began = time.monotonic()
        peer.ask("sendMessage", {"n": len(took)}, 4, 1, [77])
        took.append(time.monotonic() - began)
        time.sleep(PERIOD)
    latencies.send(sorted(took))


def measure(program, attack):
    root = tempfile.mkdtemp(prefix="halyard-hostile-")
    daemon = launcher.Launcher(program, root)
    try:
        daemon.start()
        daemon.wait_until_it_accepts(30)
        return run(daemon, attack)
    finally:
        daemon.kill()
        shutil.rmtree(root, ignore_errors=True)


def run(daemon, attack):
    context = multiprocessing.get_context("fork")
    stop = context.Event()
    receiver, sender = context.Pipe(False)
    prober = context.Process(target=probe, args=(daemon.socket_path, stop, sender))
    prober.start()
    time.sleep(0.3)
    began = time.monotonic()
    client = attacks.start(attack, daemon.socket_path)
    client.join(100)
    seconds = time.monotonic() - began
    if client.is_alive():
        client.kill()
        client.join()
    time.sleep(SETTLE)
    after = memory(daemon.process.pid, "VmRSS")
    peak = memory(daemon.process.pid, "VmHWM")
    stop.set()
    took = receiver.recv() if receiver.poll(60) else [60.0]
    if prober.is_alive():
        prober.join(1)
        prober.kill()
    log = os.path.getsize(daemon.log_path) / 1e6
    return (seconds, peak, after, took[int(len(took) * 0.99)] * 1000, took[-1] * 1000, log)


def main():
    program, *names = sys.argv[1:]
    chosen = [each for each in attacks.ALL if not names or each.__name__ in names]
    print(f"{'attack':26}{'seconds':>9}{'peak MiB':>10}{'after':>8}{'p99 ms':>9}{'longest':>9}"
          f"{'log MB':>8}")
    for attack in chosen:
        seconds, peak, after, p99, longest, log = measure(program, attack)
        print(f"{attack.__name__:26}{seconds:9.1f}{peak:10.0f}{after:8.0f}{p99:9.1f}"
              f"{longest:9.0f}{log:8.1f}", flush=True)


if __name__ == "__main__":
    main()
