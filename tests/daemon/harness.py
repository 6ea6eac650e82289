"""Runs the real halyardd in private directories, for tests that use it as a
stranger would: over its socket, its store and its log.

HALYARDD names the program.
"""

import os
import shutil
import socket
import sqlite3
import sys
import tempfile
import time
import unittest

import msgpack

sys.path.append(os.path.join(os.path.dirname(__file__), "..", "..", "scripts"))
import launcher  # noqa: E402

HALYARDD = os.environ.get("HALYARDD", "build/release/halyardd")
# How long anything may take on a loaded machine before a test gives up.
PATIENCE = 60


class Client:
    """A MessagePack-RPC peer made of python3-msgpack and a socket."""

    def __init__(self, path):
        self.socket = socket.socket(socket.AF_UNIX)
        self.socket.settimeout(PATIENCE)
        try:
            self.socket.connect(path)
        except OSError:
            self.socket.close()
            raise
        self.unpacker = msgpack.Unpacker(raw=False, timestamp=0)
        self.answers = {}
        self.last_id = 0

    def start(self, method, *params):
        """Sends a request; its answer may come much later."""
        self.last_id += 1
        self.socket.sendall(msgpack.packb([0, self.last_id, method, list(params)]))
        return self.last_id

    def answer(self, message_id):
        """[error, result]"""
        while message_id not in self.answers:
            if not self.receive():
                raise ConnectionError("the daemon closed the connection")
        return self.answers.pop(message_id)

    def receive(self):
        chunk = self.socket.recv(1 << 20)
        self.unpacker.feed(chunk)
        for _, message_id, error, result in self.unpacker:
            self.answers[message_id] = [error, result]
        return bool(chunk)

    def call(self, method, *params):
        return self.answer(self.start(method, *params))

    def result(self, method, *params):
        error, result = self.call(method, *params)
        assert error is None, error
        return result

    def notify(self, method, *params):
        self.socket.sendall(msgpack.packb([2, method, list(params)]))

    def raw(self, data):
        self.socket.sendall(data)

    def closed(self):
        """Waits for the daemon to close; False when it answers instead."""
        try:
            while True:
                before = len(self.answers)
                if not self.receive():
                    return True
                if len(self.answers) > before:
                    return False
        except ConnectionResetError:
            return True

    def close(self):
        self.socket.close()

    # What most tests begin with.
    def session(self, reporter_id, service_type=0, application=None, start=True):
        self.result("createReportingSession", reporter_id)
        self.result("setServiceType", service_type, reporter_id)
        if application is not None:
            self.result("setConfiguration", {"HostApplicationDisplayID": application}, reporter_id)
        return self.start("startReportingSessionForID", reporter_id) if start else None


class Daemon(launcher.Launcher):
    """One halyardd in a temporary directory."""

    def __init__(self, configuration=""):
        super().__init__(HALYARDD, tempfile.mkdtemp(prefix="halyardd-test-"))
        self.configure(configuration)

    def run(self):
        self.start()
        try:
            self.wait_until_it_accepts(PATIENCE)
        except launcher.Ended as error:
            raise AssertionError(str(error)) from error
        return self

    @staticmethod
    def wait_for(condition, seconds=PATIENCE):
        deadline = time.monotonic() + seconds
        while not condition():
            if time.monotonic() > deadline:
                raise AssertionError("this did not come about")
            time.sleep(0.01)

    def client(self):
        return Client(self.socket_path)

    def terminate(self, seconds=PATIENCE):
        return super().terminate(seconds)

    def has_open(self, path):
        folder = f"/proc/{self.process.pid}/fd"
        try:
            return any(os.readlink(os.path.join(folder, name)) == path
                       for name in os.listdir(folder))
        except OSError:  # It ended, or closed one just now.
            return False

    def remove(self):
        if self.process is not None and self.process.poll() is None:
            self.kill()
        shutil.rmtree(self.root, ignore_errors=True)

    def rows(self, query, *arguments):
        connection = sqlite3.connect(f"file:{self.store_path}?mode=ro", uri=True, timeout=PATIENCE)
        try:
            return connection.execute(query, arguments).fetchall()
        finally:
            connection.close()


class DaemonTest(unittest.TestCase):
    """A test with a daemon of its own."""

    configuration = ""

    def setUp(self):
        self.daemon = Daemon(self.configuration)
        self.addCleanup(self.daemon.remove)
        self.daemon.run()
        self.clients = []

    def tearDown(self):
        for client in self.clients:
            client.close()

    def connect(self):
        client = self.daemon.client()
        self.clients.append(client)
        return client

    def flush(self):
        client = self.connect()
        self.assertIs(client.result("admin.flush"), True)
        client.close()

    def rows(self, query, *arguments):
        """What the store holds once all that was accepted is in it."""
        self.flush()
        return self.daemon.rows(query, *arguments)


if __name__ == "__main__":
    raise SystemExit("a module of the tests beside it")
