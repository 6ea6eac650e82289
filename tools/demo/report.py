"""What telemetry.db says, for people."""

import collections
import json
import sqlite3

CATEGORIES = {1: "Generic", 2: "Record", 3: "Input", 4: "Playback", 5: "Output",
              6: "PlaybackAndRecord", 7: "IO", 8: "Setup", 9: "ClientRequest", 10: "RouteChange",
              11: "Error", 12: "HWReporting", 13: "Performance", 14: "Volume",
              15: "HearingHealth"}
TYPES = {1: "Start", 2: "Stop", 3: "Activate", 4: "Deactivate", 5: "Setup", 6: "Error",
         7: "IssueDetector", 8: "EnergyLedger", 9: "AudioUnitUsage", 10: "MIDIDriver",
         11: "Summary", 12: "HeadphoneAudioExposure", 13: "AudioExposure",
         14: "Listeningenhancement", 15: "Gaugewell", 16: "Simple", 17: "Histogram",
         18: "State", 65535: "Unknown"}
VOLUME_SUMMARY = (14, 11)
SESSION_SUMMARY = (0xFFFF, 0xFFFF)


def kind(category, type_):
    if (category & 0xFFFF, type_) == SESSION_SUMMARY:
        return "session summary"
    return f"{CATEGORIES.get(category & 0xFFFF, 'Undefined')}_{TYPES.get(type_, 'Generic')}"


def text(value):
    return ", ".join(map(str, value)) if isinstance(value, list) else str(value)


def connect(path):
    return sqlite3.connect(f"file:{path}?mode=ro", uri=True)


def closed_sessions(path):
    connection = connect(path)
    try:
        return connection.execute(
            "SELECT count(*) FROM upload_session WHERE closed IS NOT NULL").fetchone()[0]
    finally:
        connection.close()


def show(path, status):
    connection = connect(path)
    try:
        sessions = connection.execute(
            "SELECT id, user_info, opened, closed FROM upload_session ORDER BY id").fetchall()
        for session in sessions:
            show_session(connection, *session)
        show_totals(connection, len(sessions), status)
    finally:
        connection.close()


def show_session(connection, row, user_info, opened, closed):
    who = json.loads(user_info or "{}")
    service = who.get("kRelayReportingUserInfoServiceName", "unknown").removesuffix("_session")
    lasted = f"{closed - opened:.1f} s" if closed else "still open"
    print(f"\n  {who.get('HostApplicationDisplayID', 'Unknown')}: {service}, {lasted}")
    messages = connection.execute(
        "SELECT category, type, payload FROM upload_message WHERE upload_session = ? ORDER BY id",
        (row,)).fetchall()
    kinds = collections.Counter(kind(category, type_) for category, type_, _ in messages)
    print("    messages  " + ", ".join(f"{name} {count}" for name, count in kinds.items()))
    stretches = [json.loads(payload) for category, type_, payload in messages
                 if (category & 0xFFFF, type_) == VOLUME_SUMMARY]
    for number, stretch in enumerate(stretches):
        print(f"    {'played' if number == 0 else '':8}  {stretch['play_seconds']:5.1f} s at "
              f"{stretch['VQSessionVolume']:4.0%} on {text(stretch['active_devices'])}, "
              f"{stretch['session_selected_format']}")


def show_totals(connection, sessions, status):
    def count(table):
        return connection.execute(f"SELECT count(*) FROM {table}").fetchone()[0]

    print(f"\n  in all    {sessions} sessions, {count('upload_message')} messages, "
          f"{count('analytics_event')} analytics events")
    repeats = find_repeats(status)
    if repeats is not None:
        print(f"  repeats   {repeats} dropped as redundant")


def find_repeats(status):
    """The counter of redundant messages, wherever the status keeps it."""
    if not isinstance(status, dict):
        return None
    for key, value in status.items():
        if isinstance(value, dict):
            inner = find_repeats(value)
            if inner is not None:
                return inner
        elif any(word in str(key) for word in ("redundant", "repeat")):
            return value
    return None
