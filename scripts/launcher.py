"""Runs a halyardd in directories of its own, beside the system's: for the tests
and the demonstration. benchmarks/load/Daemon.h is the same for C++.
"""

import os
import signal
import socket
import subprocess
import time

# What the daemon is told, and where below the root.
FOLDERS = {"CONFIGURATION_DIRECTORY": "etc", "STATE_DIRECTORY": "state",
           "RUNTIME_DIRECTORY": "run", "LOGS_DIRECTORY": "log"}
# What a service manager around us says is not meant for it.
NOT_FOR_IT = ("NOTIFY_SOCKET", "WATCHDOG_USEC", "JOURNAL_STREAM", "LISTEN_FDS", "LISTEN_PID")


class Ended(Exception):
    """The daemon ended, or does not come up; the text says why."""


class Launcher:
    """One daemon, its directories in `root`, and its log."""

    def __init__(self, program, root, log_path=None):
        self.program = str(program)
        self.root = str(root)
        self.log_path = str(log_path or self.path("stderr"))
        self.socket_path = self.path("run", "reporting.sock")
        self.store_path = self.path("state", "telemetry.db")
        self.process = None
        for name in FOLDERS.values():
            os.makedirs(self.path(name), mode=0o755, exist_ok=True)

    def path(self, *names):
        return os.path.join(self.root, *names)

    def configure(self, text):
        """Replaces the configuration whole, as careful editors do."""
        path = self.path("etc", "halyard.toml")
        with open(path + ".new", "w", encoding="utf-8") as file:
            file.write(text)
        os.rename(path + ".new", path)

    def start(self, arguments=(), extra=None, **options):
        """Starts it, with what is `extra` in its environment; `options` are subprocess.Popen's."""
        environment = {name: value for name, value in os.environ.items() if name not in NOT_FOR_IT}
        environment |= {name: self.path(folder) for name, folder in FOLDERS.items()}
        environment |= extra or {}
        with open(self.log_path, "ab") as log:
            self.process = subprocess.Popen([self.program, *arguments], env=environment, stderr=log,
                                            stdin=subprocess.DEVNULL, **options)

    def wait_until_it_accepts(self, seconds):
        deadline = time.monotonic() + seconds
        while not self.accepts():
            if self.process.poll() is not None:
                raise Ended(f"halyardd ended with status {self.process.returncode}: {self.log()}")
            if time.monotonic() > deadline:
                raise Ended(f"halyardd takes no connections after {seconds:.0f} s: {self.log()}")
            time.sleep(0.01)

    def accepts(self):
        with socket.socket(socket.AF_UNIX) as probe:
            try:
                probe.connect(self.socket_path)
                return True
            except OSError:
                return False

    def terminate(self, seconds):
        """Ends it as a service manager does; its exit status."""
        self.process.send_signal(signal.SIGTERM)
        return self.process.wait(seconds)

    def kill(self):
        self.process.kill()
        self.process.wait()

    def log(self):
        with open(self.log_path, encoding="utf-8", errors="replace") as file:
            return file.read()
