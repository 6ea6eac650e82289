"""halyardctl against a real daemon and its store, a copy of it, and what is no store at
all. HALYARDCTL names the program."""

import json
import os
import pty
import re
import select
import shutil
import sqlite3
import subprocess
import time
import unittest

from harness import PATIENCE, Daemon, DaemonTest

HALYARDCTL = os.environ.get("HALYARDCTL", "build/release/halyardctl")


def ctl(*arguments, daemon=None, state=None, **options):
    """Runs it where `daemon` is, or for the store in `state`."""
    places = []
    if daemon is not None:
        places = ["--state", os.path.dirname(daemon.store_path), "--socket", daemon.socket_path]
    elif state is not None:
        places = ["--state", state, "--socket", os.path.join(state, "no-socket")]
    return subprocess.run([HALYARDCTL, *places, *arguments], text=True, capture_output=True,
                          timeout=PATIENCE, check=False, **options)


class CtlTest(DaemonTest):
    def ctl(self, *arguments, **options):
        return ctl(*arguments, daemon=self.daemon, **options)

    def listed(self, *arguments, **options):
        done = self.ctl(*arguments, "--json", **options)
        self.assertEqual(done.returncode, 0, done.stderr)
        return json.loads(done.stdout)

    def play(self, client, reporter_id=1, application="player"):
        """A session that has played for two seconds."""
        start = client.session(reporter_id, 7, application)
        def send(seconds, state):
            client.result("sendMessage", {
                "VQSessionVolumePlayingState": state, "VQSessionVolume": 0.5,
                "hyreporting_timestamp": 1000.0 + seconds, "active_devices": ["speaker"],
            }, 14, 3, [reporter_id])
        client.result("sendMessage", {"active_devices": ["speaker"]}, 4, 1, [reporter_id])
        send(0, 1)
        send(2, 0)
        client.result("stopReportingSessionForID", reporter_id)
        client.answer(start)


class Reading(CtlTest):
    def test_sessions_are_told_with_what_their_messages_come_to(self):
        self.play(self.connect())
        self.flush()
        [session] = self.listed("sessions")
        opened, closed = session.pop("opened"), session.pop("closed")
        self.assertLessEqual(opened, closed)
        ended = session.pop("ended")
        self.assertIn(ended, (None, "stopped"))
        self.assertEqual(session, {
            "id": 1, "session_id": 1, "application": "player", "service": "longformaudio",
            "direction": "playback", "messages": session["messages"], "glitches": 0,
            "played_seconds": 2.0, "devices": ["speaker"]})
        self.assertEqual(session["messages"],
                         self.rows("SELECT count(*) FROM upload_message")[0][0])

    def test_messages_are_told_as_they_are_stored(self):
        client = self.connect()
        client.session(7, 4, "clock")
        client.result("sendMessage", {"n": 2**63, "text": "\u202e\x1b[2J"}, 0x10000007, 7, [7])
        self.flush()
        [message] = self.listed("messages")
        time = message.pop("time")
        self.assertEqual([(time,)], self.rows("SELECT time FROM upload_message"))
        self.assertEqual(message, {
            "id": 1, "session": 1, "application": "clock", "service": "alarms", "category": "IO",
            "type": "IssueDetector",
            "payload": {"n": 2**63, "text": "\u202e\x1b[2J", "audiotag": message["payload"]["audiotag"]}})

    def test_a_single_message_has_no_session(self):
        client = self.connect()
        client.result("createReportingSession", 3)
        client.result("setConfiguration", {"HostApplicationDisplayID": "x"}, 3)
        client.result("sendMessage", {"a": 1}, 4, 1, [3])
        self.flush()
        [message] = self.listed("messages")
        self.assertIsNone(message["session"])

    def test_nothing_from_the_store_reaches_the_output_raw(self):
        client = self.connect()
        client.session(1, 4, "\x1b]0;title\x07\u202ename\u009b")
        client.result("sendMessage", {"\x1b[2J": "\x9b\u2066\x7f"}, 4, 1, [1])
        self.flush()
        for command in ("sessions", "messages"):
            for arguments in ((command,), (command, "--json")):
                shown = self.ctl(*arguments)
                self.assertEqual(shown.returncode, 0)
                for letter in "\x1b\x07\u202e\u009b\u2066\x7f":
                    self.assertNotIn(letter, shown.stdout)

    def test_ranges_and_applications_narrow_what_is_told(self):
        client = self.connect()
        self.play(client, 1, "firefox")
        self.play(client, 2, "fire alarm")
        self.play(client, 3, "clock")
        self.flush()
        names = [s["application"] for s in self.listed("sessions", "--app", "fire*")]
        self.assertCountEqual(names, ["firefox", "fire alarm"])  # Opened beside each other.
        self.assertEqual(len(self.listed("sessions", "--since", "1h")), 3)
        self.assertEqual(self.listed("sessions", "--until", "1h"), [])
        self.assertEqual(self.listed("messages", "--until", "yesterday"), [])
        self.assertEqual({m["application"] for m in self.listed("messages", "--app", "c?ock")},
                         {"clock"})

    def test_what_is_no_time_is_wrong_use(self):
        for arguments in (("sessions", "--since", "soon"), ("messages", "--until", "5w"),
                          ("sessions", "--bogus"), ("bogus",)):
            done = self.ctl(*arguments)
            self.assertEqual(done.returncode, 2, done)
            self.assertEqual(done.stdout, "")

    def test_a_reader_that_waits_does_not_hold_up_the_daemon(self):
        client = self.connect()
        client.session(1)
        for number in range(2000):
            client.notify("sendMessage", {"n": number, "text": "x" * 500}, 4, 1, [1])
        client.result("getAllReporters")
        self.flush()
        with subprocess.Popen([HALYARDCTL, "--state", os.path.dirname(self.daemon.store_path),
                               "messages", "--json"], stdout=subprocess.PIPE) as reader:
            first = reader.stdout.read(10)  # The rest fills the pipe, and waits.
            connection = sqlite3.connect(self.daemon.store_path)
            busy, logged, moved = connection.execute("PRAGMA wal_checkpoint(TRUNCATE)").fetchone()
            self.assertEqual((busy, logged, moved), (0, 0, 0))
            connection.close()
            self.assertEqual(len(json.loads(first + reader.stdout.read())), 2000)

    def test_a_reader_that_goes_away_ends_the_listing_quietly(self):
        client = self.connect()
        client.session(1)
        for number in range(3000):
            client.notify("sendMessage", {"n": number, "text": "x" * 200}, 4, 1, [1])
        self.flush()
        with subprocess.Popen([HALYARDCTL, "--state", os.path.dirname(self.daemon.store_path),
                               "messages"], stdout=subprocess.PIPE,
                              stderr=subprocess.PIPE) as reader:
            reader.stdout.read(1)
            reader.stdout.close()
            self.assertEqual(reader.stderr.read(), b"")
            self.assertEqual(reader.wait(PATIENCE), 0)


class Tables(CtlTest):
    def glitch(self, client, start, seconds, **more):
        client.result("sendMessage", {
            "issue_type": "process_stopped", "rtaid_client": "firefox", "node": "player",
            "any_channel_silence_seconds": seconds, "glitch_start": start, "glitch_cycles": 15,
            "glitch_device": "out.speaker", "glitch_quantum_seconds": 0.02,
            "glitch_evidence": {"process_state": "T"}, **more}, 4, 7, [1])

    def test_a_glitch_is_told_once_and_with_its_final_length(self):
        client = self.connect()
        client.session(1, 7, "player")
        self.glitch(client, 1000.5, 10.0)
        self.glitch(client, 2000.0, 0.32, glitch_inferred=1)
        self.glitch(client, 1000.5, 12.5)
        self.flush()
        second, first = self.listed("glitches")
        self.assertEqual(first, {
            "session": 1, "application": "firefox", "direction": "playback", "node": "player",
            "device": "out.speaker", "start": 1000.5, "seconds": 12.5, "cycles": 15,
            "cause": "process_stopped", "evidence": {"process_state": "T"}, "inferred": False})
        self.assertEqual((second["start"], second["seconds"], second["inferred"]),
                         (2000.0, 0.32, True))
        self.assertEqual(self.listed("sessions")[0]["glitches"], 2)
        shown = self.ctl("glitches", env={**os.environ, "TZ": "UTC0"}).stdout.splitlines()
        self.assertEqual(shown[0], "1970-01-01 00:33:20.0  firefox, 320 ms silent on out.speaker: "
                                   "the process was stopped (inferred)")

    def test_glitches_are_summed_up(self):
        client = self.connect()
        client.session(1, 7, "player")
        self.glitch(client, 1000.0, 1.0)
        self.glitch(client, 1001.0, 2.0)
        self.glitch(client, 8000.0, 4.0, rtaid_client="vlc", issue_type="memory",
                    glitch_device="hdmi")
        self.flush()
        for by, key, first, last in (("app", "application", "firefox", "vlc"),
                                     ("device", "device", "out.speaker", "hdmi"),
                                     ("cause", "cause", "process_stopped", "memory"),
                                     ("hour", "hour", 0, 7200)):
            self.assertEqual(self.listed("glitches", "--by", by), [
                {key: first, "glitches": 2, "seconds": 3.0, "longest": 2.0},
                {key: last, "glitches": 1, "seconds": 4.0, "longest": 4.0}])
        self.assertEqual(self.listed("glitches", "--by", "app", "--app", "v*")[0]["glitches"], 1)
        self.assertEqual(self.ctl("glitches", "--by", "moon").returncode, 2)

    def test_the_other_tables_are_told_as_they_are_stored(self):
        client = self.connect()
        client.session(1, 7, "player")
        self.glitch(client, 1000.0, 3.0)
        client.result("sendMessage", {"Some_Time_Seconds": 3}, 1, 8, [1])
        self.flush()
        for command, table in (("events", "analytics_event"), ("energy", "energy_event"),
                               ("incidents", "incident")):
            names = [row[1] for row in self.daemon.rows(f"PRAGMA table_info({table})")]
            expected = [dict(zip(names, row)) for row in self.daemon.rows(f"SELECT * FROM {table}")]
            for row in expected:
                for name in ("payload", "signature"):
                    if name in row:
                        row[name] = json.loads(row[name])
            self.assertEqual(self.listed(command), expected)
        self.assertGreater(len(self.listed("events")), 0)
        [metric] = self.listed("metrics")
        self.assertEqual(metric.pop("time"), self.daemon.rows("SELECT time FROM metric")[0][0])
        self.assertEqual(metric, {"id": 1, "metric_id": 0x5B0003, "message": {
            "duration": 3, "issuetype": "process_stopped", "node": "player",
            "rtaidclient": "firefox"}})
        for command in ("events", "energy", "incidents", "metrics"):
            self.assertEqual(self.ctl(command).returncode, 0)

    def test_incidents_and_broken_rows_are_told_as_far_as_they_are_known(self):
        self.flush()
        store = sqlite3.connect(self.daemon.store_path)
        store.execute("""INSERT INTO incident VALUES(1, '{"domain": "a"}', '/var/report', 5)""")
        store.execute("INSERT INTO incident VALUES(2, '{', NULL, 'x')")
        store.execute("INSERT INTO metric VALUES(1, 5963779, x'ff', 5), (2, 7, x'0800', 6)")
        store.commit()
        store.close()
        self.assertEqual(self.listed("incidents"), [
            {"id": 1, "signature": {"domain": "a"}, "report": "/var/report", "time": 5.0},
            {"id": 2, "signature": None, "report": None, "time": None}])
        self.assertEqual([m["message"] for m in self.listed("metrics")], [None, None])

    def test_a_results_file_of_a_trace_is_summed_up(self):
        path = self.daemon.path("tracing_results.pbj")
        values = [{"name": "decode", "real_time": value, "cpu_time": value, "time_unit": "ns",
                   "iterations": 1} for value in (4.0, 1.0, 3.0)]
        with open(path, "w", encoding="utf-8") as file:
            json.dump({"context": {"name": "HYReporting"}, "benchmarks": values}, file)
        self.assertEqual(self.listed("trace", path), [
            {"name": "decode", "count": 3, "min": 1.0, "median": 3.0, "p90": 4.0, "p99": 4.0,
             "max": 4.0, "total": 8.0}])
        self.assertIn("decode", self.ctl("trace", path).stdout)
        self.assertEqual(self.ctl("trace", self.daemon.log_path).returncode, 1)
        self.assertEqual(self.ctl("trace").returncode, 2)


class Asking(CtlTest):
    def test_status_is_what_the_daemon_answers(self):
        client = self.connect()
        told = self.listed("status")
        self.assertEqual(told.keys(), client.result("admin.status").keys())
        self.assertEqual(told["pid"], self.daemon.process.pid)
        shown = self.ctl("status")
        self.assertIn(f"pid  {self.daemon.process.pid}\n",
                      "\n".join(" ".join(line.split()).replace(" ", "  ", 1)
                                for line in shown.stdout.splitlines()) + "\n")

    def test_status_begins_with_what_became_of_the_messages(self):
        client = self.connect()
        client.session(1)
        client.result("sendMessage", {"n": 1}, 4, 1, [1])
        client.result("sendMessage", {"n": 1}, 4, 1, [1])
        self.flush()
        self.assertEqual(self.ctl("status").stdout.splitlines()[:3], [
            "Messages since the daemon started",
            "  offered 2 of 2 requests, made by the daemon 0",
            "  stored 1, repeats 1, waiting 0"])


class OnATerminal(CtlTest):
    def shown(self, *arguments, **variables):
        """What a terminal of 60 columns gets to see."""
        master, slave = pty.openpty()
        with subprocess.Popen(
                [HALYARDCTL, "--state", os.path.dirname(self.daemon.store_path), *arguments],
                stdout=slave, stdin=slave, close_fds=True,
                env={**os.environ, "COLUMNS": "60", "TERM": "xterm", **variables}) as process:
            os.close(slave)
            text = b""
            try:
                while chunk := os.read(master, 65536):
                    text += chunk
            except OSError:  # the end, of a terminal
                pass
            self.assertEqual(process.wait(PATIENCE), 0)
        os.close(master)
        return text.decode().replace("\r\n", "\n")

    def test_tables_fit_and_have_colours(self):
        self.play(self.connect(), 1, "an application with a name that goes on for too long")
        self.flush()
        for pager in ({"PAGER": "cat"}, {"PAGER": ""}, {}):
            for command in ("sessions", "messages", "events"):
                shown = self.shown(command, **pager)
                self.assertIn("\x1b[1m", shown)
                self.assertIn("…", shown)
                lines = re.sub("\x1b\\[[0-9;?]*[a-zA-Z=>]|\x1b[=>]", "", shown).splitlines()
                self.assertLessEqual(max(len(line) for line in lines), 60, lines)

    def test_who_wants_no_colours_gets_none(self):
        self.play(self.connect())
        self.flush()
        self.assertNotIn("\x1b", self.shown("sessions", NO_COLOR="1", PAGER="cat"))
        self.assertNotIn("\x1b", self.shown("sessions", TERM="dumb", PAGER="cat"))

    def test_the_pager_is_what_was_asked_for(self):
        self.play(self.connect())
        self.flush()
        self.assertTrue(self.shown("sessions", PAGER="sed s/^/paged:/").startswith("paged:"))
        self.assertEqual(self.shown("sessions", PAGER="true"), "")
        self.assertNotIn("paged:", self.ctl("sessions", env={
            **os.environ, "PAGER": "sed s/^/paged:/"}).stdout)


class Watching(CtlTest):
    def watch(self, *arguments):
        watching = subprocess.Popen(
            [HALYARDCTL, "--state", os.path.dirname(self.daemon.store_path), "watch", *arguments],
            stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True)
        self.addCleanup(watching.stderr.close)
        self.addCleanup(watching.stdout.close)
        self.addCleanup(watching.wait)
        self.addCleanup(watching.kill)
        return watching

    def test_messages_come_as_they_are_committed(self):
        client = self.connect()
        client.session(1, 4, "clock")
        client.result("sendMessage", {"n": 0}, 4, 1, [1])
        self.flush()
        watching = self.watch("--json")
        first = None
        number = 0
        while first is None:  # What comes before it has begun is not new.
            number += 1
            client.result("sendMessage", {"n": number}, 4, 1, [1])
            self.flush()
            if select.select([watching.stdout], [], [], 0.2)[0]:
                first = json.loads(watching.stdout.readline())
        self.assertGreater(first["payload"]["n"], 0)
        for number in range(number + 1, number + 20):
            client.result("sendMessage", {"n": number}, 4, 1, [1])
            told = first
            while told["payload"]["n"] != number:
                told = json.loads(watching.stdout.readline())
            self.assertEqual((told["application"], told["session"]), ("clock", 1))
            self.assertLess(time.time() - told["time"], PATIENCE)

    def test_each_kind_is_followed_by_itself(self):
        client = self.connect()
        client.session(1, 4, "clock")
        self.flush()
        watching = {kind: self.watch(kind, "--json") for kind in ("glitches", "events")}
        def report():
            client.result("sendMessage", {"n": time.time()}, 4, 1, [1])
            client.result("sendMessage", {"glitch_start": time.time(), "issue_type": "memory",
                                          "rtaid_client": "x"}, 4, 7, [1])
            self.flush()
            return all(select.select([one.stdout], [], [], 0.2)[0] for one in watching.values())
        self.daemon.wait_for(report)
        self.assertEqual(json.loads(watching["glitches"].stdout.readline())["cause"], "memory")
        self.assertIn("com.kestrel.halyard.",
                      json.loads(watching["events"].stdout.readline())["name"])

    def test_it_ends_when_nobody_reads_any_more(self):
        self.flush()
        watching = self.watch()
        watching.stdout.close()
        self.assertEqual(watching.wait(PATIENCE), 0)

    def test_a_restart_of_the_daemon_is_followed(self):
        self.flush()
        watching = self.watch("--json")
        for number in range(2):
            client = self.connect()
            client.session(1, 4, "clock")
            def told():
                client.result("sendMessage", {"n": number, "at": time.time()}, 4, 1, [1])
                client.result("admin.flush")
                return select.select([watching.stdout], [], [], 0.2)[0]
            self.daemon.wait_for(told)
            shown = json.loads(watching.stdout.readline())
            while shown["payload"].get("n") != number:
                shown = json.loads(watching.stdout.readline())
            self.assertEqual(self.daemon.terminate(), 0)
            self.daemon.run()


class Sending(CtlTest):
    def test_lines_become_messages_and_bad_ones_are_told(self):
        client = self.connect()
        client.session(1)
        client.session(2)
        client.session(3)
        done = self.ctl("send", "--session", "1", "--session", "2", "--category", "playback",
                        "--type", "1", "--json",
                        input='{"a": 1}\nnonsense\n\n[1]\n{"a": 9223372036854775808}\n')
        self.assertEqual(json.loads(done.stdout), {"sent": 2})
        self.assertEqual(done.returncode, 1)
        self.assertIn("line 2: no dictionary", done.stderr)
        self.assertIn("line 4: no dictionary", done.stderr)
        rows = self.rows("SELECT s.session_id, m.category, m.type, m.payload FROM upload_message m "
                         "JOIN upload_session s ON s.id = m.upload_session "
                         "ORDER BY s.session_id, m.id")
        self.assertEqual([row[:3] for row in rows],
                         [(1, 4, 1), (1, 4, 1), (2, 4, 1), (2, 4, 1)])
        self.assertEqual([json.loads(row[3])["a"] for row in rows], [1, 2**63, 1, 2**63])
        self.assertIn("hyreporting_timestamp", json.loads(rows[0][3]))

    def test_without_a_session_all_that_run_get_it(self):
        client = self.connect()
        client.session(1)
        client.session(2)
        path = self.daemon.path("lines")
        with open(path, "w", encoding="utf-8") as file:
            file.write('{"a": 1}')
        done = self.ctl("send", "--category", "0x10000007", "--type", "Stop", "--json-file", path)
        self.assertEqual((done.returncode, done.stdout), (0, "1 message sent\n"))
        self.assertEqual(len(self.rows("SELECT 1 FROM upload_message WHERE category = 7")), 2)

    def test_what_the_daemon_would_not_take_is_told_and_the_rest_goes_on(self):
        self.connect().session(1)
        deep = '{"a":' + "[" * 31 + "]" * 31 + "}"
        large = json.dumps({"a": "x" * (1 << 20)})
        done = self.ctl("send", "--category", "4", "--type", "1", "--json",
                        input=f'{deep}\n{large}\n{{"a": 1}}\n')
        self.assertEqual((done.returncode, json.loads(done.stdout)), (1, {"sent": 1}))
        self.assertIn("line 1: ", done.stderr)
        self.assertIn("line 2: ", done.stderr)

    def test_what_is_no_category_or_type_is_wrong_use(self):
        for category, kind in (("Moon", "1"), ("4", "65536"), ("-1", "1"), ("4", "")):
            done = self.ctl("send", "--category", category, "--type", kind)
            self.assertEqual(done.returncode, 2, done)
        self.assertEqual(self.ctl("send", "--type", "1").returncode, 2)

    def test_a_session_lasts_as_long_as_its_input(self):
        done = self.ctl("session", "--service", "alarms", "--app", "clock", "--json", input="""
            {"category": "Playback", "type": "Start", "message": {"a": 1}}
            {"category": 14, "type": 3, "message": {"VQSessionVolumePlayingState": 1}}
            {"category": "Moon", "type": 3, "message": {}}
            {"category": 4, "type": 3}
            """)
        told = json.loads(done.stdout)
        self.assertEqual((done.returncode, told["sent"]), (1, 2))
        self.assertIn("line 4: ", done.stderr)
        self.assertIn("line 5: ", done.stderr)
        self.flush()
        [session] = self.listed("sessions")
        self.assertEqual(session["session_id"], told["session_id"])
        self.assertEqual((session["application"], session["service"]), ("clock", "alarms"))
        self.assertIsNotNone(session["closed"])
        self.assertEqual(self.connect().result("getAllReporters"), [])


class Caring(CtlTest):
    configuration = '[device_properties]\nInternalBuild = true\n'

    def collected(self):
        """All bytes in the daemon's state and logs directories."""
        found = b""
        for top in ("state", "log"):
            for folder, _, names in os.walk(self.daemon.path(top)):
                for name in names:
                    with open(os.path.join(folder, name), "rb") as file:
                        found += name.encode() + file.read()
        return found

    def collect(self):
        """Rows, a summary, an incident and a file that was set aside, all with a secret."""
        client = self.connect()
        start = client.session(1, 3, "secret-application")
        client.session(2, 3, "secret-too")
        for number in range(3):
            client.result("sendMessage", {"Haptic_Active_Hardware_Time_Seconds": number,
                                          "text": "secret"}, 4, 8, [1])
        client.result("stopReportingSessionForID", 1)
        client.answer(start)
        for path in ("state/telemetry.db.damaged-x", "log/Traces/trace"):
            os.makedirs(os.path.dirname(self.daemon.path(path)), exist_ok=True)
            with open(self.daemon.path(path), "w", encoding="utf-8") as file:
                file.write("secret")
        self.daemon.wait_for(lambda: self.rows("SELECT 1 FROM incident"))
        self.flush()
        for text in (b"secret-application", b"secret-too", b".json"):
            self.assertIn(text, self.collected())

    def test_a_purge_through_the_daemon_leaves_not_a_byte(self):
        self.collect()
        tables = [row[0] for row in self.daemon.rows(
            "SELECT name FROM sqlite_master WHERE type = 'table' AND "
            "name NOT IN ('consent', 'identity')")]
        rows = sum(self.daemon.rows(f"SELECT count(*) FROM {table}")[0][0] for table in tables)
        # Clients that have just gone leave a row each.
        self.assertGreaterEqual(self.listed("purge")["rows"], rows - 1)
        self.assertNotIn(b"secret", self.collected())
        [session] = self.listed("sessions")
        self.assertEqual((session["session_id"], session["application"]), (2, None))
        self.assertEqual((self.listed("messages"), self.listed("energy")), ([], []))
        self.connect().result("sendMessage", {"n": 1}, 4, 1, [2])
        self.flush()
        self.assertEqual(len(self.listed("messages")), 1)

    def test_a_purge_without_a_daemon_does_the_same(self):
        self.collect()
        self.assertEqual(self.daemon.terminate(), 0)
        done = self.ctl("purge", "--json", env={**os.environ,
                                                "LOGS_DIRECTORY": self.daemon.path("log")})
        self.assertEqual(done.returncode, 0, done.stderr)
        self.assertGreater(json.loads(done.stdout)["rows"], 3)
        self.assertNotIn(b"secret", self.collected())
        self.assertEqual(self.listed("sessions"), [])

    def test_a_purge_of_another_store_leaves_the_daemons_alone(self):
        self.collect()
        copy = self.daemon.path("copy")
        shutil.copytree(os.path.dirname(self.daemon.store_path), copy)
        done = subprocess.run([HALYARDCTL, "--state", copy, "--socket", self.daemon.socket_path,
                               "purge"], timeout=PATIENCE, check=False, capture_output=True)
        self.assertEqual(done.returncode, 0, done.stderr)
        self.assertEqual(ctl("sessions", "--json", state=copy).stdout, "[\n]\n")
        self.assertEqual(len(self.listed("sessions")), 2)

    def test_a_store_that_another_daemon_has_open_is_not_purged(self):
        self.collect()
        other = Daemon()
        self.addCleanup(other.remove)
        other.run()
        done = subprocess.run([HALYARDCTL, "--state", os.path.dirname(self.daemon.store_path),
                               "--socket", other.socket_path, "purge"],
                              timeout=PATIENCE, check=False, capture_output=True, text=True)
        self.assertEqual(done.returncode, 1, done.stderr)
        self.assertIn(f"process {self.daemon.process.pid} has", done.stderr)
        self.assertEqual(len(self.listed("sessions")), 2)

    def test_a_purge_is_for_administrators(self):
        if os.geteuid() != 0:
            self.skipTest("only root becomes somebody else")
        self.daemon.configure('[access]\nusers = [65534]\n')
        os.chmod(self.daemon.root, 0o755)
        os.chmod(os.path.dirname(self.daemon.store_path), 0o755)
        os.chmod(self.daemon.store_path, 0o644)
        self.daemon.wait_for(lambda: self.ctl("send", "--category", "4", "--type", "1", input="",
                                              **as_nobody()).returncode == 0)
        done = self.ctl("purge", **as_nobody())
        self.assertEqual(done.returncode, 4, done.stderr)

    def test_a_sound_store_is_said_to_be_sound(self):
        self.collect()
        told = self.listed("check")
        self.assertEqual((told["ok"], told["integrity"]), (True, []))
        self.assertEqual(told["schema"], self.daemon.rows("PRAGMA user_version")[0][0])
        self.assertEqual(told["rows"]["upload_session"], 2)
        self.assertEqual(told["unclosed_sessions"], 1)
        self.assertGreater(told["bytes"], 4096)
        self.assertIn("is sound", self.ctl("check").stdout)
        self.assertEqual(self.ctl("check", "--repair").returncode, 0)

    def damage(self):
        with open(self.daemon.store_path, "r+b") as file:
            size = os.path.getsize(self.daemon.store_path)
            file.seek(size // 2 // 8192 * 8192)
            file.write(b"Z" * 8192 * 2)

    def test_damage_is_told_and_repaired_without_the_daemon(self):
        client = self.connect()
        client.session(1)
        for number in range(2000):
            client.notify("sendMessage", {"n": number, "text": "x" * 300}, 4, 1, [1])
        self.flush()
        self.daemon.kill()
        # The log is moved into the file, where it can be damaged.
        store = sqlite3.connect(self.daemon.store_path)
        store.execute("PRAGMA wal_checkpoint(TRUNCATE)")
        store.close()
        self.damage()
        done = self.ctl("check", "--json")
        self.assertEqual(done.returncode, 1)
        told = json.loads(done.stdout)
        self.assertFalse(told["ok"])
        self.assertGreater(len(told["integrity"]), 0)
        self.assertEqual(self.ctl("check").returncode, 1)

        reader = sqlite3.connect(self.daemon.store_path)
        reader.execute("SELECT count(*) FROM upload_session").fetchone()
        refused = self.ctl("check", "--repair")
        self.assertEqual((refused.returncode, refused.stdout), (1, ""))
        self.assertIn(f"process {os.getpid()} has", refused.stderr)
        reader.close()

        done = self.ctl("check", "--repair", "--json")
        self.assertEqual(done.returncode, 0, done.stderr)
        told = json.loads(done.stdout)
        self.assertTrue(told["ok"])
        self.assertTrue(os.path.exists(os.path.join(os.path.dirname(self.daemon.store_path),
                                                    told["set_aside"])))
        self.assertGreater(told["rows"]["upload_message"], 1000)
        self.assertEqual(self.listed("check")["ok"], True)


class Overview(CtlTest):
    def test_five_lines_say_how_the_device_is_doing(self):
        client = self.connect()
        client.session(1, 7, "firefox")
        now = time.time()
        for number in range(3):
            client.result("sendMessage", {
                "glitch_start": now + number, "any_channel_silence_seconds": 0.5,
                "rtaid_client": "firefox" if number else "vlc", "issue_type": "memory"}, 4, 7, [1])
        self.flush()
        told = self.listed()
        self.assertEqual(
            {key: told[key] for key in ("sessions", "open_sessions", "glitches", "silent_seconds",
                                        "daemon_runs", "store_ok", "worst_application")},
            {"sessions": 1, "open_sessions": 1, "glitches": 3, "silent_seconds": 1.5,
             "daemon_runs": True, "store_ok": True,
             "worst_application": {"name": "firefox", "glitches": 2, "seconds": 1.0}})
        shown = self.ctl()
        lines = shown.stdout.splitlines()
        self.assertEqual(shown.returncode, 0)
        self.assertEqual([line.split()[0] for line in lines[:6]],
                         ["Today,", "Sessions", "Played", "Glitches", "Daemon", "Store"])
        self.assertIn("3, 1.5 s without sound; worst is firefox with 2; mostly it waited for "
                      "memory", lines[3])
        self.assertIn("runs for", lines[4])
        self.assertIn("sound, ", lines[5])
        self.assertIn("halyardctl sessions", shown.stdout)

    def test_it_says_what_is_not_there(self):
        self.daemon.terminate()
        shown = self.ctl()
        self.assertEqual(shown.returncode, 0)
        self.assertIn("does not run: start it with systemctl start halyardd.socket", shown.stdout)
        os.remove(self.daemon.store_path)
        shown = self.ctl()
        self.assertEqual(shown.returncode, 3)
        self.assertIn("no store at", shown.stdout)

    def test_a_time_line_has_sessions_glitches_and_volumes(self):
        client = self.connect()
        self.play(client, 1, "one \u202e")
        client.session(2, 7, "two")
        client.result("sendMessage", {"glitch_start": 1500.5, "issue_type": "memory",
                                      "glitch_evidence": {"major_faults": 2}}, 4, 7, [2])
        self.flush()
        path = self.daemon.path("line.json")
        self.assertEqual(self.listed("timeline", "--output", path),
                         {"sessions": 2, "glitches": 1, "volumes": 2})
        with open(path, encoding="utf-8") as file:
            events = json.load(file)["traceEvents"]
        slices = [e for e in events if e["ph"] == "X"]
        self.assertEqual([(e["name"], e["tid"]) for e in slices],
                         [("longformaudio", 1), ("longformaudio", 2)])
        self.assertEqual({e["args"]["name"] for e in events if e["name"] == "process_name"},
                         {"one \u202e", "two"})
        [glitch] = [e for e in events if e["ph"] == "i"]
        self.assertEqual((glitch["name"], glitch["ts"], glitch["tid"], glitch["args"]["evidence"]),
                         ("memory", 1500500000, 2, {"major_faults": 2}))
        self.assertEqual([(e["ts"], e["args"]["volume"]) for e in events if e["ph"] == "C"],
                         [(1000000000, 0.5), (1002000000, 0)])
        self.assertEqual(self.ctl("timeline", "--output", "/nonexistent/x").returncode, 1)
        self.assertEqual(self.ctl("timeline").returncode, 2)


class LeftBehind(unittest.TestCase):
    """What a daemon that was killed leaves: its last rows are in the write-ahead log."""

    def setUp(self):
        self.daemon = Daemon()
        self.addCleanup(self.daemon.remove)
        self.state = os.path.dirname(self.daemon.store_path)
        self.daemon.run()
        client = self.daemon.client()
        client.session(1, 4, "clock")
        for number in range(500):
            client.notify("sendMessage", {"n": number, "text": "x" * 300}, 4, 1, [1])
        client.result("admin.flush")
        self.daemon.kill()
        client.close()

    def messages(self, **options):
        done = ctl("messages", "--json", state=self.state, **options)
        self.assertEqual((done.returncode, done.stderr), (0, ""))
        return json.loads(done.stdout)

    def test_its_log_is_a_part_of_its_size(self):
        size = sum(os.path.getsize(self.daemon.store_path + end) for end in ("", "-wal"))
        for command, key in ([], "store_bytes"), (["check"], "bytes"):
            told = json.loads(ctl(*command, "--json", state=self.state).stdout)
            self.assertEqual(told[key], size)

    def test_its_rows_are_read_and_its_files_stay_as_they_are(self):
        def contents():
            found = {}
            for name in ("telemetry.db", "telemetry.db-wal"):
                with open(os.path.join(self.state, name), "rb") as file:
                    found[name] = file.read()
            return found

        before = contents()
        self.assertEqual(len(self.messages()), 500)
        self.assertEqual(contents(), before)

    def test_they_are_read_where_nothing_may_be_written(self):
        for name in os.listdir(self.state):
            os.chmod(os.path.join(self.state, name), 0o444)
        os.chmod(self.state, 0o555)
        os.chmod(self.daemon.root, 0o755)
        self.addCleanup(os.chmod, self.state, 0o755)
        self.assertEqual(len(self.messages(**as_nobody())), 500)

    def test_damage_on_the_way_ends_a_list_that_is_one(self):
        store = sqlite3.connect(self.daemon.store_path)
        store.execute("PRAGMA wal_checkpoint(TRUNCATE)")
        store.close()
        with open(self.daemon.store_path, "r+b") as file:
            message = re.search(rb'"n":300,"text":"x+","audiotag"', file.read())
            file.seek(message.start() // 8192 * 8192)
            file.write(b"Z" * 8192)
        done = ctl("messages", "--json", state=self.state)
        self.assertEqual(done.returncode, 1)
        self.assertIn("damaged", done.stderr)
        self.assertGreater(len(json.loads(done.stdout)), 50)


class NotThere(unittest.TestCase):
    def setUp(self):
        self.daemon = Daemon()
        self.addCleanup(self.daemon.remove)
        self.state = os.path.dirname(self.daemon.store_path)

    def filled(self):
        """A store that its daemon has left."""
        self.daemon.run()
        client = self.daemon.client()
        client.session(1, 4, "clock")
        client.result("sendMessage", {"a": 1}, 4, 1, [1])
        client.close()
        self.assertEqual(self.daemon.terminate(), 0)

    def test_without_a_daemon_status_says_how_to_start_it(self):
        for command in (("status",), ("send", "--category", "4", "--type", "1"), ("session",)):
            done = ctl(*command, daemon=self.daemon, input="")
            self.assertEqual(done.returncode, 3)
            self.assertIn("systemctl start halyardd.socket", done.stderr)

    def test_without_a_store_there_is_none_to_read(self):
        for command in ("sessions", "messages", "glitches", "events", "energy", "incidents",
                        "metrics", "watch", "check", "purge"):
            done = ctl(command, "--json", state=self.state)
            self.assertEqual((done.returncode, done.stdout), (3, ""))

    def test_a_store_is_read_without_its_daemon_and_left_alone(self):
        self.filled()
        before = sorted(os.listdir(self.state))
        done = ctl("sessions", "--json", state=self.state)
        self.assertEqual(len(json.loads(done.stdout)), 1)
        self.assertEqual(sorted(os.listdir(self.state)), before)

    def test_a_copy_is_read_like_the_original(self):
        self.daemon.run()
        client = self.daemon.client()
        self.addCleanup(client.close)
        client.session(1, 4, "clock")
        client.result("admin.flush")
        copy = self.daemon.path("copy")
        shutil.copytree(self.state, copy)
        original = ctl("sessions", "--json", state=self.state)
        self.assertEqual(ctl("sessions", "--json", state=copy).stdout, original.stdout)

    def test_a_directory_that_may_not_be_written_to_is_no_hindrance(self):
        self.filled()
        os.chmod(self.daemon.store_path, 0o444)
        os.chmod(self.state, 0o555)
        os.chmod(self.daemon.root, 0o755)
        self.addCleanup(os.chmod, self.state, 0o755)
        done = ctl("sessions", "--json", state=self.state, **as_nobody())
        self.assertEqual((done.returncode, len(json.loads(done.stdout))), (0, 1))

    def test_a_store_that_may_not_be_read_is_not_allowed(self):
        if os.geteuid() != 0:
            self.skipTest("only root becomes somebody else")
        self.filled()
        os.chmod(self.daemon.root, 0o755)
        os.chmod(self.state, 0o700)
        done = ctl("sessions", state=self.state, **as_nobody())
        self.assertEqual((done.returncode, done.stdout), (4, ""))

    def test_a_daemon_that_does_not_let_one_in_is_not_allowed(self):
        if os.geteuid() != 0:
            self.skipTest("only root becomes somebody else")
        self.daemon.run()
        os.chmod(self.daemon.root, 0o755)
        done = ctl("status", daemon=self.daemon, **as_nobody())
        self.assertEqual(done.returncode, 4, done.stderr)

    def test_a_damaged_store_says_what_to_do(self):
        with open(self.daemon.store_path, "wb") as file:
            file.write(b"this is no database" * 1000)
        done = ctl("sessions", "--json", state=self.state)
        self.assertEqual((done.returncode, done.stdout), (1, ""))
        self.assertIn("check --repair", done.stderr)

    def test_output_that_cannot_be_written_is_told(self):
        self.filled()
        with open("/dev/full", "wb") as full:
            done = subprocess.run([HALYARDCTL, "--state", self.state, "sessions"], stdout=full,
                                  stderr=subprocess.PIPE, timeout=PATIENCE, check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn(b"cannot write", done.stderr)


def as_nobody():
    """Options that run a program as somebody without rights; none when we are."""
    return {"user": 65534, "group": 65534, "extra_groups": []} if os.geteuid() == 0 else {}


if __name__ == "__main__":
    unittest.main()
