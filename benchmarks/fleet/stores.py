"""Stores as halyardd would leave them, without a halyardd: for one that has to make a
hundred of them in seconds, or one of a quarter of a gigabyte.

Everything is drawn from the given random numbers, so that a seed gives the same store.
"""

import json
import sqlite3
import struct
import uuid

SCHEMA = """
CREATE TABLE upload_session(id INTEGER PRIMARY KEY, session_id INTEGER, session_info TEXT,
    user_info TEXT, opened REAL, closed REAL, ended TEXT);
CREATE TABLE upload_message(id INTEGER PRIMARY KEY, upload_session INTEGER, session_info TEXT,
    user_info TEXT, category INTEGER, type INTEGER, payload TEXT, time REAL);
CREATE TABLE analytics_event(id INTEGER PRIMARY KEY, name TEXT, payload TEXT, time REAL);
CREATE TABLE energy_event(id INTEGER PRIMARY KEY, client INTEGER, name TEXT, payload TEXT,
    time REAL);
CREATE TABLE metric(id INTEGER PRIMARY KEY, metric_id INTEGER, message BLOB, time REAL);
CREATE TABLE incident(id INTEGER PRIMARY KEY, signature TEXT, report TEXT, time REAL);
CREATE TABLE repeat(id INTEGER PRIMARY KEY, upload_session INTEGER, category INTEGER,
    type INTEGER, count INTEGER, first REAL, last REAL);
CREATE TABLE identity(device TEXT);
CREATE TABLE consent(id INTEGER PRIMARY KEY, given INTEGER, time REAL);
PRAGMA user_version = 2;
"""
FIRST = 1795000000.0   # when the first session opened
APPLICATIONS = ("radio", "music", "browser", "call", "alarm")
CAUSES = ("process_stopped", "driver_late", "processor_wait", "client_slow", "memory", "unknown")
FORMATS = ("S32LE 2ch 48000Hz", "S16LE 2ch 44100Hz", "F32LE 2ch 48000Hz")
DEVICES = ("out.speaker", "out.headphones")

# Of all names that an exporter gives.
NAMES = uuid.UUID("6b1e0f52-3c0a-4d8e-9a77-21c4d55eb093")


def bits(time):
    return f"{struct.unpack('<Q', struct.pack('<d', time))[0]:x}"


def mixed(time):
    return struct.unpack("<Q", struct.pack("<d", time))[0] * 0x9E3779B97F4A7C15 % 2**64 >> 48


def named(*parts):
    return uuid.uuid5(NAMES, "/".join(str(part) for part in parts))


class Store:
    """One device's store, held open like by its daemon, and what is to leave it."""

    def __init__(self, path, device, random):
        self.path, self.device, self.random = path, device, random
        self.connection = sqlite3.connect(path, isolation_level=None)
        self.connection.execute("PRAGMA journal_mode = WAL")
        self.connection.execute("PRAGMA synchronous = NORMAL")
        self.connection.executescript(SCHEMA)
        self.connection.execute("INSERT INTO identity VALUES(?)", (device,))
        self.connection.execute("INSERT INTO consent(given, time) VALUES(1, 1.0)")
        self.time = FIRST
        self.rows = self.sessions = 0
        self.logs, self.spans = set(), set()   # names of what is to leave
        self.session_spans = set()             # of them, those that stand for a session
        self.glitches = 0
        self.open = None

    def begin(self):
        self.connection.execute("BEGIN IMMEDIATE")

    def commit(self):
        self.connection.execute("COMMIT")

    def tick(self, least=0.01, most=3.0):
        self.time += self.random.uniform(least, most)
        return self.time

    def message(self, category, kind, payload, tag, session):
        time = self.tick()
        stamps = {"hyreporting_timestamp": round(time - 0.004, 7),
                  "systemuptime_sec": int(time - FIRST) + 24465,
                  "processuptime_ms": int((time - FIRST) * 1000) % 9_000_000}
        text = json.dumps({**payload, **stamps, "audiotag": tag}, separators=(",", ":"))
        self.connection.execute(
            "INSERT INTO upload_message(upload_session, category, type, payload, time)"
            " VALUES(?, ?, ?, ?, ?)", (session, category, kind, text, time))
        self.rows += 1
        self.logs.add(f"{self.device}/upload_message/{mixed(self.open[1]):04x}/{self.rows}")

    def open_session(self):
        self.sessions += 1
        opened = self.tick(1, 60)
        application = self.random.choice(APPLICATIONS)
        token = f"{self.random.getrandbits(128):032x}"
        number = 1882528614174425088 + self.sessions
        info = {"kRelayReportingSessionInfoClientType": 19,
                "kRelayReportingSessionInfoClientVersion": 2.1,
                "kRelayReportingSessionInfoSessionID": number,
                "kRelayReportingSessionInfoBatchEvent": True,
                "kRelayReportingSessionInfoHierarchyToken": token,
                "kRelayReportingSessionInfoClientBundleID": application}
        user = {"kRelayReportingUserInfoClientName": "com.kestrel.halyard",
                "kRelayReportingUserInfoServiceName": "longformaudio_session",
                "HostApplicationDisplayID": application,
                "application_pid": self.random.randrange(900, 32000),
                "application_binary": application, "application_version":
                    f"{self.random.randrange(1, 4)}.{self.random.randrange(9)}",
                "media_role": "Music", "node_name": application, "stream_direction": "playback"}
        self.connection.execute(
            "INSERT INTO upload_session(session_id, session_info, user_info, opened)"
            " VALUES(?, ?, ?, ?)", (number, json.dumps(info, separators=(",", ":")),
                                    json.dumps(user, separators=(",", ":")), opened))
        self.open = (self.sessions, opened, application, self.random.choice(FORMATS))
        base = (self.device, "session", self.sessions, bits(opened))
        self.session_spans.add(named(*base, "span").bytes[:8])
        self.spans.add(named(*base, "span").bytes[:8])
        self.message(4, 1, {"stream_run": 1, "session_selected_format": self.open[3],
                            "active_devices": [DEVICES[0]]}, "PlaybackStart", self.sessions)

    def something(self):
        """What happens during a session: volumes mostly, routes, a glitch now and then."""
        session, _, application, selected = self.open
        what = self.random.random()
        device = self.random.choice(DEVICES)
        if what < 0.70:
            self.message(14, 3, {"VQSessionVolume": round(self.random.random(), 2),
                                 "VQSessionVolumePlayingState": self.random.randrange(2),
                                 "VQSessionVolumeOperationProcess": application,
                                 "session_selected_format": selected, "active_devices": [device],
                                 "stream_muted": 0, "device_muted": 0}, "VolumeActivate", session)
        elif what < 0.88:
            self.message(10, 3, {"previous_devices": [DEVICES[0]],
                                 "session_selected_format": selected,
                                 "active_devices": [device]}, "RouteChangeActivate", session)
        else:
            self.glitch(session, application, device)

    def glitch(self, session, application, device):
        start = self.time + 0.002
        seconds = round(self.random.uniform(0.02, 4), 9)
        payload = {"issue_type": self.random.choice(CAUSES), "rtaid_client": application,
                   "node": application, "any_channel_silence_seconds": seconds,
                   "glitch_start": start, "glitch_cycles": self.random.randrange(1, 90),
                   "glitch_device": device, "glitch_quantum_seconds": 0.021333333,
                   "glitch_evidence": {"process_state": "S",
                                       "cpu_seconds": round(self.random.random() / 900, 9),
                                       "pressure_cpu_seconds": round(self.random.random(), 6)}}
        # A long one is told while it lasts, and again at its end.
        for _ in range(2 if seconds > 3.6 else 1):
            self.message(4, 7, payload, "PlaybackIssueDetector", session)
        self.glitches += 1
        opened = self.open[1]
        self.spans.add(named(self.device, "session", session, bits(opened), "glitch",
                             bits(start), application).bytes[:8])

    def close_session(self):
        session, _, application, selected = self.open
        self.message(4, 2, {"stream_run": 1, "stream_program": "ended"}, "PlaybackStop", session)
        cycles = self.random.randrange(90, 400000)
        self.message(12, 16, {"out.speaker_Speaker_Simple_Cycles": cycles,
                              "out.speaker_Speaker_Simple_Missedcycles": cycles // 999,
                              "Pressure_HWAudio2_Simple_cpusome": cycles * 317}, "HWReportingSimple",
                     session)
        histogram = (f"count=43,lower=0,upper=1000000000,min=30,max=300,unit=us::30-50:{cycles % 97};"
                     f"50-70:{cycles % 89};70-100:{cycles % 983};200-300:{cycles % 7}")
        self.message(12, 17, {f"out.{where}_Speaker_Histogram_{what}": histogram
                              for where in ("speaker", "headphones")
                              for what in ("Wait", "Busy", "Cycletime")}, "HWReportingHistogram",
                     session)
        self.message(14, 11, {"session_selected_format": selected, "active_devices": [DEVICES[0]],
                              "VQSessionVolumeOperationProcess": application,
                              "VQSessionVolume": 0.4, "VQSessionVolumeBucketed": "0.375",
                              "play_seconds": round(self.random.uniform(1, 4000), 7),
                              "play_secondsBucketed": "1000"}, "VolumeSummary", session)
        self.message(65535, 65535, self.summary(session), "UndefinedUnknown", session)
        self.connection.execute("UPDATE upload_session SET closed = ?, ended = 'stopped'"
                                " WHERE id = ?", (self.tick(), session))
        self.open = None

    def summary(self, session):
        """Each key of the session's messages, with all its values."""
        values = {}
        for (payload,) in self.connection.execute(
                "SELECT payload FROM upload_message WHERE upload_session = ?"
                " AND id > ? ORDER BY id", (session, self.rows - 200)):
            for key, value in json.loads(payload).items():
                text = value if isinstance(value, str) else json.dumps(value)
                values.setdefault(key, []).append(text)
        return {"HY_Session_Summary_Event": str(session),
                **{key: ",".join(texts) for key, texts in values.items()
                   if key not in ("audiotag", "glitch_evidence")}}

    def whole_session(self, events):
        self.open_session()
        for _ in range(events):
            self.something()
        self.close_session()

    def forget(self, share):
        """What retention does: the oldest rows go, and the sessions that were over by then."""
        last = int(self.rows * share)
        (time,) = self.connection.execute("SELECT time FROM upload_message WHERE id = ?",
                                          (last,)).fetchone() or (0,)
        self.connection.execute("DELETE FROM upload_message WHERE id <= ?", (last,))
        self.connection.execute("DELETE FROM upload_session WHERE closed < ?", (time,))

    def close(self):
        self.connection.close()
