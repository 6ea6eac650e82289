"""Stores that the tests of the report's page are made of: the daemon makes an empty
one, and rows of a test's own go into it.
"""

import json
import random
import sqlite3
import sys
import tempfile
from pathlib import Path

sys.path.insert(0, str(Path(__file__).resolve().parents[2] / "scripts"))

import launcher  # noqa: E402

START = 1_795_000_000.0
CAUSES = ["process_stopped", "driver_late", "processor_wait", "memory", "client_slow"]
HISTOGRAM = ("count=43,lower=0,upper=1000000000,min=10,max=10000,unit=us::"
             "10-15:1;15-20:170;20-30:878;30-50:3533;50-70:3073;100-150:217;7000-10000:3")
STATES = ("name:C1,transition:300,residency:28240,duty_cycle:0.250000;"
          "name:C6,transition:20,residency:70000,duty_cycle:0.620000;")


class Store:
    """Rows by hand. `close` before anybody reads it."""

    def __init__(self, halyardd, folder):
        daemon = launcher.Launcher(halyardd, folder)
        daemon.start()
        daemon.wait_until_it_accepts(30)
        daemon.terminate(30)
        self.folder = Path(daemon.store_path).parent
        self.database = sqlite3.connect(daemon.store_path)
        # Asking whether it accepts was a client, whose end it may have told of.
        self.database.execute("DELETE FROM analytics_event")

    def close(self):
        self.database.commit()
        self.database.execute("PRAGMA wal_checkpoint(TRUNCATE)")
        self.database.close()

    def session(self, application, opened, closed, direction="playback"):
        user = {"HostApplicationDisplayID": application, "stream_direction": direction,
                "kRelayReportingUserInfoServiceName": "longformaudio_session"}
        return self.database.execute(
            "INSERT INTO upload_session(session_id, session_info, user_info, opened, closed) "
            "VALUES(1, '{}', ?, ?, ?)",
            (json.dumps(user), START + opened, None if closed is None else START + closed)).lastrowid

    def message(self, session, category, type_, at, **payload):
        self.database.execute(
            "INSERT INTO upload_message(upload_session, category, type, payload, time) "
            "VALUES(?, ?, ?, ?, ?)", (session, category, type_, json.dumps(payload), START + at))

    def volume(self, session, at, playing, volume, device="out.speaker"):
        self.message(session, 14, 3, at, VQSessionVolume=volume,
                     VQSessionVolumePlayingState=playing, active_devices=[device])

    def glitch(self, session, at, seconds, cause, device="out.speaker", **more):
        self.message(session, 4, 7, at, issue_type=cause, glitch_start=START + at,
                     any_channel_silence_seconds=seconds, glitch_cycles=int(seconds * 50) + 1,
                     glitch_device=device, **more)

    def statistics(self, session, at):
        self.message(session, 12, 16, at, out_Speaker_Simple_Cycles=8852)
        self.message(session, 12, 17, at, out_Speaker_Histogram_Wait=HISTOGRAM,
                     out_Speaker_Histogram_Cycletime=HISTOGRAM)
        self.message(session, 12, 18, at, cpu0_CPUIdle_QLX_State_cpu0=STATES)


def one_session(store):
    row = store.session("music", 0, 60)
    store.volume(row, 1, 1, 0.6)
    store.message(row, 10, 3, 20, active_devices=["out.headphones"])
    store.glitch(row, 30, 0.32, "process_stopped", node="music",
                 glitch_evidence={"process_state": "T", "run_delay_seconds": 0.002})
    store.glitch(row, 45, 0.04, "processor_wait", glitch_evidence={"run_delay_seconds": 0.041})
    store.volume(row, 50, 0, 0.6)
    store.statistics(row, 60)


def large(store, messages=100_000, glitches=2_000, sessions=400):
    """A day of ten applications."""
    chance = random.Random(7)
    rows = []
    for i in range(sessions):
        opened = i * 86_400 / sessions
        row = store.session(f"application {i % 10}", opened, opened + 900,
                            "capture" if i % 9 == 0 else "playback")
        rows.append((row, opened))
    each, bad = (messages - glitches) // sessions, glitches // sessions
    for row, opened in rows:
        for i in range(each - 5):
            at = opened + 890 * i / each
            if i % 10 == 0:
                store.volume(row, at, int(i % 20 == 0), chance.random())
            else:
                store.message(row, 5, 16, at, buffer=i, free_frames=chance.randrange(4096),
                              note="frames were counted", hyreporting_timestamp=START + at,
                              systemuptime_sec=int(at), audiotag="OutputSimple")
        for _ in range(bad):
            store.glitch(row, opened + chance.random() * 880, chance.random() / 5,
                         chance.choice(CAUSES), f"device {chance.randrange(4)}",
                         glitch_evidence={"run_delay_seconds": chance.random() / 10})
        store.statistics(row, opened + 900)
        for i in range(2):
            store.message(row, 4, 2, opened + 900, stream_run=i)


HOSTILE = [
    "</script><img src=x onerror=\"document.title='taken'\">",
    "<!--<script>document.title='taken'</script>",
    "\u202egnp.exe\u2066\u200b\x1b[31m\x07\x00",
    "'\"`${alert(1)}&lt;b&gt;",
    "n" * 100_000,
    "__proto__", "constructor", "",
    "\u05e9\u05dc\u05d5\u05dd \u0645\u0631\u062d\u0628\u0627",
]


def hostile(store):
    for i, name in enumerate(HOSTILE):
        row = store.session(name, i * 100, i * 100 + 80)
        store.volume(row, i * 100 + 1, 1, 0.5, name)
        store.message(row, 10, 3, i * 100 + 20, active_devices=[name, name])
        store.glitch(row, i * 100 + 30, 0.1, name, name, node=name,
                     glitch_evidence={name: name, "process_state": name, "busiest": [{"name": name}],
                                      "cpu_seconds": "much"})
        store.message(row, 12, 17, i * 100 + 70, **{f"{name}_Speaker_Histogram_{name}": HISTOGRAM})
        store.message(row, 12, 18, i * 100 + 70, **{
            f"{name}_x_State_{name}": f"name:{name},transition:1,residency:2,duty_cycle:0.5;"})
    store.database.execute("INSERT INTO analytics_event(name, payload, time) VALUES(?, ?, ?)",
                           (HOSTILE[0], json.dumps({HOSTILE[1]: HOSTILE[0]}), START))


def make(halyardd, fill):
    """The state directory of a store that `fill` filled; removed with the object returned."""
    folder = tempfile.TemporaryDirectory(prefix="halyard-report-")
    store = Store(halyardd, folder.name)
    fill(store)
    store.close()
    return folder, store.folder
