"""A daemon that ends by itself, on a socket that outlives it."""

import socket
import unittest

from harness import PATIENCE, Client, Daemon


class ActivatedDaemon(Daemon):
    """One whose socket a service manager holds."""

    def __init__(self, configuration):
        super().__init__(configuration)
        self.listening = socket.socket(socket.AF_UNIX)
        self.listening.bind(self.socket_path)
        self.listening.listen()

    def start(self, **options):
        program, self.program = self.program, "bash"
        environment = (f'LISTEN_PID=$$ LISTEN_FDS=1 LISTEN_FDNAMES=reporting exec "{program}"'
                       f" 3<&{self.listening.fileno()}")
        try:
            super().start(pass_fds=(self.listening.fileno(),), arguments=["-c", environment],
                          **options)
        finally:
            self.program = program

    def remove(self):
        self.listening.close()
        super().remove()


class IdleExit(unittest.TestCase):
    def setUp(self):
        self.daemon = ActivatedDaemon('[service]\nidle_exit = "1s"\n')
        self.addCleanup(self.daemon.remove)

    def report_and_leave(self, reporter_id):
        client = Client(self.daemon.socket_path)
        client.session(reporter_id)
        client.result("sendMessage", {"a": 1}, 4, 1, [reporter_id])
        client.close()

    def sessions(self):
        return self.daemon.rows("SELECT count(*) FROM upload_session WHERE closed IS NOT NULL")[0][0]

    def test_ends_cleanly_with_all_that_it_took(self):
        self.daemon.start()
        self.report_and_leave(1)
        self.assertEqual(self.daemon.process.wait(PATIENCE), 0)
        self.assertEqual(self.sessions(), 1)

    def test_who_comes_after_it_is_served_by_the_next(self):
        self.daemon.start()
        self.report_and_leave(1)
        self.daemon.process.wait(PATIENCE)
        client = Client(self.daemon.socket_path)
        client.start("createReportingSession", 2)
        self.daemon.start()
        self.assertEqual(client.answer(client.last_id)[0], None)
        client.close()


if __name__ == "__main__":
    unittest.main()
