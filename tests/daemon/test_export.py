"""halyard-export between a real daemon's store and a receiver that the test plays.

HALYARD_EXPORT names the program; OTLP_MODULES the folder of another decoder, if any.
"""

import gzip
import http.server
import json
import os
import shutil
import sqlite3
import ssl
import subprocess
import tempfile
import threading
import unittest

from harness import DaemonTest, PATIENCE

CTL = os.environ.get("HALYARDCTL", "build/release/halyardctl")
EXPORT = os.environ.get("HALYARD_EXPORT", "build/release/halyard-export")
MODULES = os.environ.get("OTLP_MODULES", "")
ORACLE = os.path.join(os.path.dirname(__file__), "../otlp/decode.js")
MS = 1000
PLAYBACK, START, VOLUME, ACTIVATE, ISSUE = 4, 1, 14, 3, 7


class Receiver(http.server.ThreadingHTTPServer):
    """Keeps what is posted, and answers what it is told to, else 200."""

    daemon_threads = True

    def __init__(self):
        super().__init__(("127.0.0.1", 0), Handler)
        self.requests = []
        self.answers = []
        self.arrived = threading.Condition()
        threading.Thread(target=self.serve_forever, daemon=True).start()

    @property
    def url(self):
        return f"http://127.0.0.1:{self.server_address[1]}"

    def handle_error(self, *_):
        pass  # it was left in the middle

    def take(self, request):
        with self.arrived:
            self.requests.append(request)
            self.arrived.notify_all()
            return self.answers.pop(0) if self.answers else (200, {}, b"")

    def wait_for(self, count):
        with self.arrived:
            if not self.arrived.wait_for(lambda: len(self.requests) >= count, PATIENCE):
                raise AssertionError(f"{len(self.requests)} of {count} requests came")


class Handler(http.server.BaseHTTPRequestHandler):
    protocol_version = "HTTP/1.1"

    def do_POST(self):
        body = self.rfile.read(int(self.headers["Content-Length"]))
        if self.headers.get("Content-Encoding") == "gzip":
            body = gzip.decompress(body)
        status, headers, answer = self.server.take((self.path, dict(self.headers), body))
        try:
            self.send_response(status)
            for name, value in headers.items():
                self.send_header(name, value)
            if "Content-Length" not in headers:
                self.send_header("Content-Length", str(len(answer)))
            self.end_headers()
            self.wfile.write(answer)
        except OSError:
            pass  # it has heard enough

    def log_message(self, *_):
        pass


class Export(DaemonTest):
    consent = True

    def setUp(self):
        self.receiver = Receiver()
        self.addCleanup(self.receiver.server_close)
        self.addCleanup(self.receiver.shutdown)
        self.configuration = self.text(self.consent)
        super().setUp()
        self.place = tempfile.mkdtemp(prefix="halyard-export-")
        self.addCleanup(shutil.rmtree, self.place)

    def text(self, consent, more=""):
        return (f'[export]\nconsent = {"true" if consent else "false"}\n'
                f'endpoint = "{self.receiver.url}"\n{more}')

    def environment(self, **more):
        kept = {name: value for name, value in os.environ.items() if not name.startswith("OTEL_")}
        return kept | {"CONFIGURATION_DIRECTORY": self.daemon.path("etc"),
                       "STATE_DIRECTORY": self.place} | more

    def command(self, *arguments):
        return [EXPORT, "--state", self.daemon.path("state"), *arguments]

    def run_export(self, *arguments, **more):
        return subprocess.run(self.command(*arguments), env=self.environment(**more), text=True,
                              capture_output=True, timeout=PATIENCE, check=False)

    def start_export(self, **more):
        process = subprocess.Popen(self.command(), stderr=subprocess.PIPE, text=True,
                                   env=self.environment(**more))
        self.addCleanup(process.stderr.close)
        self.addCleanup(process.wait)
        self.addCleanup(process.kill)
        return process

    def play(self):
        """A session with a change of volume and a glitch, stopped in order."""
        client = self.connect()
        client.session(7, application="player")
        for category, kind, message in (
                (PLAYBACK, START, {"active_devices": ["out.speaker"]}),
                (VOLUME, ACTIVATE, {"VQSessionVolume": 0.5}),
                (PLAYBACK, ISSUE, {"issue_type": "memory", "node": "n", "glitch_start": 1.5e9,
                                   "any_channel_silence_seconds": 0.25})):
            client.result("sendMessage", message, category, kind, [7])
        client.result("stopReportingSessionForID", 7)
        self.flush()

    def paths(self):
        return [path for path, _, _ in self.receiver.requests]


class Sending(Export):
    def test_a_session_leaves_as_logs_a_trace_and_metrics(self):
        self.play()
        self.assertEqual(self.run_export("--once").returncode, 0)
        self.assertEqual(self.paths(), ["/v1/logs", "/v1/traces", "/v1/metrics"])
        self.assertEqual(self.run_export("--once").returncode, 0)
        self.assertEqual(len(self.receiver.requests), 3)

    def test_what_is_printed_is_what_is_sent(self):
        if not os.path.isdir(MODULES):
            self.skipTest("no other decoder here")
        self.play()
        printed = self.run_export("--dry-run")
        self.assertEqual((printed.returncode, printed.stderr.count("no consent")), (0, 0))
        self.assertEqual(self.receiver.requests, [])
        self.assertEqual(self.run_export("--once").returncode, 0)
        files = []
        for i, (path, _, body) in enumerate(self.receiver.requests):
            name = os.path.join(self.place, f"{i}.pb")
            with open(name, "wb") as file:
                file.write(body)
            files += [path.rsplit("/", 1)[1], name]
        decoded = subprocess.run(["node", ORACLE, MODULES, *files], check=True, text=True,
                                 capture_output=True, timeout=PATIENCE).stdout
        ours = [json.loads(line) for line in printed.stdout.splitlines()]
        theirs = [without_nothing(json.loads(line)) for line in decoded.splitlines()]
        self.assertEqual([without_nothing(each) for each in ours], theirs)

    def test_what_is_new_leaves_by_itself(self):
        self.start_export(OTEL_BLRP_SCHEDULE_DELAY="50")
        self.play()
        self.receiver.wait_for(3)
        self.assertIn("/v1/traces", self.paths())

    def test_a_receiver_that_is_busy_gets_the_same_again(self):
        self.play()
        self.receiver.answers = [(503, {"Retry-After": "1"}, b"")]
        self.start_export()
        self.receiver.wait_for(4)
        logs = [body for path, _, body in self.receiver.requests if path == "/v1/logs"]
        self.assertEqual(logs[0], logs[1])

    def test_headers_are_sent_and_never_logged(self):
        self.play()
        headers = os.path.join(self.place, "headers")
        with open(headers, "w", encoding="ascii") as file:
            file.write("authorization: Bearer s3cret\n")
        self.daemon.configure(self.text(True, f'headers_file = "{headers}"\n'))
        os.chmod(headers, 0o640)
        refused = self.run_export("--once")
        self.assertEqual((refused.returncode, self.receiver.requests), (1, []))
        self.assertIn("may be read by others", refused.stderr)
        os.chmod(headers, 0o600)
        self.receiver.answers = [(401, {}, b"s3cret")]
        sent = self.run_export("--once")
        self.assertEqual(self.receiver.requests[0][1]["authorization"], "Bearer s3cret")
        self.assertNotIn("s3cret", refused.stderr + sent.stderr)


def without_nothing(value):
    """Without empty texts and lists, which one side writes and the other leaves out."""
    if isinstance(value, dict):
        kept = {key: without_nothing(each) for key, each in value.items()}
        return {key: each for key, each in kept.items() if each not in ("", [])}
    return [without_nothing(each) for each in value] if isinstance(value, list) else value


class Hostile(Export):
    def answer_with(self, *answer):
        self.play()
        self.receiver.answers = [answer]
        return self.run_export("--once")

    def test_a_redirect_is_not_followed(self):
        other = Receiver()
        self.addCleanup(other.server_close)
        self.addCleanup(other.shutdown)
        self.answer_with(307, {"Location": other.url + "/v1/logs"}, b"")
        self.assertEqual(other.requests, [])

    def test_a_huge_answer_is_cut_off(self):
        sent = self.answer_with(200, {}, b"x" * (32 << 20))
        self.assertEqual(sent.returncode, 0)

    def test_nonsense_is_an_answer(self):
        self.assertEqual(self.answer_with(200, {}, os.urandom(4096)).returncode, 0)

    def test_one_that_never_answers_is_left(self):
        self.play()
        hold = threading.Event()
        self.addCleanup(hold.set)
        self.receiver.take = lambda request: (hold.wait(PATIENCE), {}, b"")
        left = self.run_export("--once", OTEL_EXPORTER_OTLP_TIMEOUT="200")
        self.assertEqual(left.returncode, 1)


@unittest.skipUnless(shutil.which("openssl"), "no openssl to make a certificate with")
class Encrypting(Export):
    def ask_for_certificates(self, version):
        made = os.path.join(self.place, "certificate.pem")
        subprocess.run(["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-days", "2",
                        "-subj", "/CN=localhost", "-addext", "subjectAltName=IP:127.0.0.1",
                        "-keyout", made + ".key", "-out", made], capture_output=True, check=True)
        context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
        context.load_cert_chain(made, made + ".key")
        context.load_verify_locations(made)
        context.verify_mode = ssl.CERT_REQUIRED
        context.minimum_version = context.maximum_version = version
        self.receiver.socket = context.wrap_socket(self.receiver.socket, server_side=True)
        return {"OTEL_EXPORTER_OTLP_ENDPOINT": self.receiver.url.replace("http:", "https:"),
                "OTEL_EXPORTER_OTLP_CERTIFICATE": made}

    def test_a_receiver_that_asks_for_a_certificate_is_named_with_the_key_to_set(self):
        self.play()
        for version in (ssl.TLSVersion.TLSv1_2, ssl.TLSVersion.TLSv1_3):
            with self.subTest(version):
                sent = self.run_export("--once", **self.ask_for_certificates(version))
                self.assertEqual(sent.returncode, 1)
                told = [line for line in sent.stderr.splitlines() if "does not take" in line]
                self.assertEqual(len(told), 3, sent.stderr)
                for line in told:
                    self.assertIn("client_certificate and client_key in [export]", line)
                shutil.rmtree(self.place)
                os.mkdir(self.place)


class Looking(Export):
    def look(self, what):
        shown = subprocess.run(
            [CTL, "--state", self.daemon.path("state"), "--json", "export", what, "--config",
             self.daemon.path("etc")], env=self.environment(), text=True, capture_output=True,
            timeout=PATIENCE, check=True)
        return json.loads(shown.stdout)

    def test_the_preview_names_every_key_that_leaves_and_sends_nothing(self):
        self.play()
        shown = self.look("preview")
        self.assertEqual(self.receiver.requests, [])
        self.assertEqual((shown["consent"], shown["requests"]), (True, 3))
        named = {key["key"] for key in shown["keys"]}
        self.assertLessEqual({"device.id", "halyard.application", "halyard.VQSessionVolume",
                              "issue_type", "log.record.uid"}, named)
        self.run_export("--once")
        self.assertEqual(self.look("preview")["requests"], 0)

    def test_the_status_says_what_waits_and_what_was_lost(self):
        self.play()
        waiting = self.look("status")
        self.assertGreater(waiting["backlog"][0]["rows"], 2)
        self.assertIsNone(waiting["last_success"])
        self.receiver.answers = [(400, {}, b"")]
        self.run_export("--once")
        after = self.look("status")
        self.assertEqual([each["rows"] for each in after["backlog"]], [0] * 5)
        self.assertEqual(after["dropped"], {"refused": waiting["backlog"][0]["rows"]})
        self.assertGreater(after["bytes_today"], 0)


class Refusing(Export):
    consent = False

    def test_nothing_leaves_and_a_look_says_so(self):
        self.play()
        self.assertEqual(self.run_export("--once").returncode, 1)
        looked = self.run_export("--dry-run")
        self.assertEqual(looked.returncode, 0)
        self.assertIn("there is no consent", looked.stderr)
        self.assertEqual(len(looked.stdout.splitlines()), 3)
        self.assertEqual(self.receiver.requests, [])

    def test_what_was_collected_before_the_consent_never_leaves(self):
        self.play()
        self.daemon.configure(self.text(True))
        self.daemon.wait_for(self.is_noted)
        self.assertEqual(self.run_export("--once").returncode, 0)
        self.assertEqual(self.receiver.requests, [])
        self.play()
        self.assertEqual(self.run_export("--once").returncode, 0)
        self.assertEqual(len(self.receiver.requests), 3)

    def is_noted(self):
        try:
            return self.daemon.rows("SELECT count(*) FROM consent WHERE given") == [(1,)]
        except sqlite3.OperationalError:
            return False


class Withdrawing(Export):
    def test_withdrawal_stops_a_request_under_way(self):
        self.play()
        hold = threading.Event()
        self.addCleanup(hold.set)
        seen = threading.Event()

        def take(_):
            seen.set()
            hold.wait(PATIENCE)
            return 200, {}, b""

        self.receiver.take = take
        process = self.start_export()
        self.assertTrue(seen.wait(PATIENCE))
        self.daemon.configure(self.text(False))
        self.daemon.wait_for(lambda: not self.has_connection(process.pid))

    def has_connection(self, pid):
        with open(f"/proc/{pid}/net/tcp", encoding="ascii") as table:
            sockets = {line.split()[9] for line in list(table)[1:] if line.split()[3] == "01"}
        links = f"/proc/{pid}/fd"
        names = [os.readlink(os.path.join(links, name)) for name in os.listdir(links)
                 if os.path.lexists(os.path.join(links, name))]
        return any(name.startswith("socket:[") and name[8:-1] in sockets for name in names)


if __name__ == "__main__":
    unittest.main()
