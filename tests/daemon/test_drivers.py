"""Driver statistics, from files that change while a session runs to the rows
that a stop leaves in the store."""

import glob
import json
import os
import re
import tempfile
import unittest

from harness import DaemonTest

CHANNEL = """
[[drivers.channel]]
group = "{group}"
driver = "{driver}"
name = "{name}"
unit = "{unit}"
source = "{source}"
"""


def channel(name, source, group="Speaker", driver="", unit=""):
    return CHANNEL.format(name=name, source=source, group=group, driver=driver, unit=unit)


AS_ROOT = unittest.skipUnless(os.geteuid() == 0, "only root can leave files of others")
STRANGER = 12345


class DriversTest(DaemonTest):
    def setUp(self):
        self.files = tempfile.TemporaryDirectory(prefix="halyard-drivers-")
        self.addCleanup(self.files.cleanup)
        self.configuration = self.configure()
        super().setUp()

    @staticmethod
    def start(client, reporter_id):
        """A session that has its snapshot: the service works in order, so it had
        started when it answers what came after."""
        client.session(reporter_id)
        client.result("getAllReporters")

    def path(self, name):
        return os.path.join(self.files.name, name)

    def write(self, name, text):
        os.makedirs(os.path.dirname(self.path(name)), exist_ok=True)
        with open(self.path(name), "w", encoding="utf-8") as file:
            file.write(text)

    def replace(self, name, text):
        self.write(name + ".new", text)
        os.rename(self.path(name + ".new"), self.path(name))

    def reports(self, sink="upload_message"):
        """The statistics of the configured channels, by type, as they stand in
        the store."""
        if sink == "upload_message":
            rows = self.rows("SELECT type, payload FROM upload_message WHERE category = 12"
                             " ORDER BY id")
        else:
            rows = self.rows("SELECT name, payload FROM analytics_event WHERE name LIKE"
                             " 'com.kestrel.halyard.HWReporting.%' ORDER BY id")
        result = []
        for kind, payload in rows:
            own = {key: value for key, value in json.loads(payload).items()
                   if key.startswith("CodecOne_")}
            if own:
                result.append((kind, own))
        return result


class ConfiguredChannels(DriversTest):
    def configure(self):
        self.write("underruns", "10\n")
        self.write("table", "name hits drops\nplay: 100 5\n")
        self.write("latency", "0 10 5\n10 20 1\n20 30 0\n30 40 0\n")
        self.write("power/runtime_active_time", "1000\n")
        self.write("power/runtime_suspended_time", "5000\n")
        driver = "Codec_One<instance 3>"
        return (channel("Under runs", "file:" + self.path("underruns"), driver=driver)
                + channel("Drops", f"field:{self.path('table')}:play:3", "Rx", driver)
                + channel("Quiet", "file:" + self.path("quiet"), driver=driver)
                + channel("Latency", "histogram:" + self.path("latency"), driver=driver, unit="ms")
                + channel("Power", "runtime_pm:" + self.files.name, "KestrelZR4QLX", driver))

    def change(self):
        self.replace("underruns", "13\n")
        self.write("table", "name hits drops\nplay: 250 9\n")
        self.write("latency", "0 10 7\n10 20 1\n20 30 0\n30 40 3\n")
        self.write("power/runtime_active_time", "3601000\n")

    EXPECTED = [
        (16, {"CodecOne_Speaker_Simple_Underruns": 3, "CodecOne_Rx_Simple_Drops": 4}),
        (17, {"CodecOne_Speaker_Histogram_Latency":
              "count=4,lower=0,upper=40,min=0,max=40,unit=ms::0-10:2;30-40:3"}),
        (18, {"CodecOne_KestrelZR4QLX_State_Power":
              "name:active,transition:0,residency:3600000,duty_cycle:1.000000;"}),
    ]

    def test_a_stop_reports_what_changed_since_the_start(self):
        client = self.connect()
        self.start(client, 7)
        self.change()
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.reports(), self.EXPECTED)

    def test_analytics_get_the_same(self):
        client = self.connect()
        self.start(client, 7)
        self.change()
        client.result("stopReportingSessionForID", 7)
        names = ["com.kestrel.halyard.HWReporting." + kind
                 for kind in ("Simple", "Histogram", "State")]
        self.assertEqual(self.reports("analytics_event"),
                         list(zip(names, [values for _, values in self.EXPECTED])))

    def test_a_session_that_runs_later_reports_its_own_time_only(self):
        client = self.connect()
        self.start(client, 7)
        self.change()
        self.start(client, 8)
        self.replace("underruns", "14\n")
        client.result("stopReportingSessionForID", 8)
        self.assertEqual(self.reports()[0], (16, {"CodecOne_Speaker_Simple_Underruns": 1}))

    def test_a_counter_that_went_back_began_anew(self):
        client = self.connect()
        self.start(client, 7)
        self.write("underruns", "2\n")
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.reports()[0], (16, {"CodecOne_Speaker_Simple_Underruns": 2}))

    def test_files_that_go_break_or_block_cost_their_channel_only(self):
        client = self.connect()
        self.start(client, 7)
        self.change()
        os.remove(self.path("underruns"))
        os.mkfifo(self.path("underruns"))
        self.write("latency", "no buckets\n")
        os.remove(self.path("power/runtime_active_time"))
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.reports(), [(16, {"CodecOne_Rx_Simple_Drops": 4})])
        self.assertIn('driver channel Speaker-(null) "Under runs" cannot be read: ',
                      self.daemon.log())

    def test_a_file_that_comes_meanwhile_counts_from_zero(self):
        client = self.connect()
        self.start(client, 7)
        self.write("quiet", "6\n")
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.reports()[0], (16, {"CodecOne_Speaker_Simple_Quiet": 6}))

    def test_destroying_a_session_reports_nothing(self):
        client = self.connect()
        self.start(client, 7)
        self.change()
        client.result("destroyReportingSession", 7)
        self.assertEqual(self.reports(), [])


class BrokenChannels(DriversTest):
    def configure(self):
        self.write("good", "1\n")
        return (channel("Good", "file:" + self.path("good"), driver="CodecOne")
                + channel("Bad", "pie:/x"))

    def test_a_source_that_makes_no_sense_is_told_and_the_rest_works(self):
        client = self.connect()
        self.start(client, 7)
        self.write("good", "3\n")
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.reports(), [(16, {"CodecOne_Speaker_Simple_Good": 2})])
        log = self.daemon.log()
        self.assertIn('driver channel Speaker-(null) "Bad" is left out: its source "pie:/x" '
                      '"pie" is no kind of source', log)
        self.assertIn("error 22 getting channels for driver Speaker-(null)", log)
        self.assertIn("subscribed to group group Speaker-(null)", log)


class CyclesTest(DriversTest):
    """What a program of the user's session counts of the cycles of audio devices."""

    BOUNDS = (0, 10, 100, 1000, 10000)

    def configure(self):
        return ""

    def folder(self, name=""):
        return self.daemon.path("run", "cycles", name)

    def put(self, name, text):
        temporary = self.folder(f".{name}.tmp-1")
        with open(temporary, "w", encoding="utf-8") as file:
            file.write(text)
        os.rename(temporary, self.folder(name))

    def put_device(self, stem, missed, wait, busy, cycle):
        """Each of the last three: the hits of the buckets."""
        self.put(stem + ".counts", f"direction sink\ncycles {sum(wait)}\nmissed {missed}\n")
        for part, hits in (("wait", wait), ("busy", busy), ("cycle", cycle)):
            lines = zip(self.BOUNDS, self.BOUNDS[1:], hits)
            self.put(f"{stem}.{part}", "".join("%d %d %d\n" % line for line in lines))

    def expected(self, before, after):
        hits = [(lower, upper, new - old) for lower, upper, old, new
                in zip(self.BOUNDS, self.BOUNDS[1:], before, after) if new != old]
        return (f"count={len(before)},lower=0,upper={self.BOUNDS[-1]},min={hits[0][0]},"
                f"max={hits[-1][1]},unit=us::" + ";".join("%d-%d:%d" % hit for hit in hits))

    def report(self, *devices):
        """All that was reported of these devices."""
        rows = self.rows("SELECT payload FROM upload_message WHERE category = 12 ORDER BY id")
        return {key: value for (payload,) in rows for key, value in json.loads(payload).items()
                if key.startswith(tuple(device + "_" for device in devices))}

    def stranger_counts(self):
        """The cycles that are reported when somebody else leaves the files."""
        client = self.connect()
        self.start(client, 7)
        self.put_device("out-a", 1, (5, 0, 0, 0), (5, 0, 0, 0), (5, 0, 0, 0))
        for name in os.listdir(self.folder()):
            os.chown(self.folder(name), STRANGER, STRANGER)
        client.result("stopReportingSessionForID", 7)
        return self.report("a").get("a_Speaker_Simple_Cycles")


class Cycles(CyclesTest):
    def test_a_stop_reports_the_cycles_since_the_start(self):
        client = self.connect()
        self.put_device("out-big%20speaker", 3, (50, 50, 0, 0), (0, 90, 10, 0), (0, 0, 100, 0))
        self.start(client, 7)
        self.put_device("out-big%20speaker", 5, (50, 80, 20, 0), (0, 90, 50, 10), (0, 0, 150, 0))
        self.put_device("in-microphone", 0, (8, 0, 0, 0), (0, 8, 0, 0), (0, 0, 8, 0))
        client.result("stopReportingSessionForID", 7)
        none = (0, 0, 0, 0)
        self.assertEqual(self.report("bigspeaker", "microphone"), {
            "bigspeaker_Speaker_Simple_Cycles": 50,
            "bigspeaker_Speaker_Simple_Missedcycles": 2,
            "bigspeaker_Speaker_Histogram_Wait": self.expected((50, 50, 0, 0), (50, 80, 20, 0)),
            "bigspeaker_Speaker_Histogram_Busy": self.expected((0, 90, 10, 0), (0, 90, 50, 10)),
            "bigspeaker_Speaker_Histogram_Cycletime": self.expected((0, 0, 100, 0), (0, 0, 150, 0)),
            "microphone_Rx_Simple_Cycles": 8,  # It came meanwhile, and no cycle was missed.
            "microphone_Rx_Histogram_Wait": self.expected(none, (8, 0, 0, 0)),
            "microphone_Rx_Histogram_Busy": self.expected(none, (0, 8, 0, 0)),
            "microphone_Rx_Histogram_Cycletime": self.expected(none, (0, 0, 8, 0))})

    def test_everybody_may_leave_files_there(self):
        self.assertEqual(os.stat(self.folder()).st_mode & 0o7777, 0o1777)

    def test_a_program_that_begins_anew_is_counted_from_there(self):
        client = self.connect()
        self.put_device("out-a", 3, (50, 50, 0, 0), (0, 90, 10, 0), (0, 0, 100, 0))
        self.start(client, 7)
        self.put_device("out-a", 1, (4, 0, 0, 0), (0, 4, 0, 0), (0, 0, 4, 0))
        client.result("stopReportingSessionForID", 7)
        report = self.report("a")
        self.assertEqual(report["a_Speaker_Simple_Cycles"], 4)
        self.assertEqual(report["a_Speaker_Simple_Missedcycles"], 1)

    def test_what_else_lies_there_costs_nothing(self):
        client = self.connect()
        self.put_device("out-a", 0, (1, 0, 0, 0), (1, 0, 0, 0), (1, 0, 0, 0))
        self.start(client, 7)
        os.mkfifo(self.folder("out-pipe.counts"))
        os.mkdir(self.folder("out-folder.counts"))
        self.put("secret", "cycles 77\nmissed 77\n")
        os.symlink(self.folder("secret"), self.folder("out-link.counts"))
        self.put("out-huge.counts", "cycles " + "9" * 30 + "\nmissed -5\n")
        self.put("out-long.counts", "cycles 1\n" * 100000)
        self.put("out-nonsense.counts", "\0\n%s\n")
        for number in range(500):
            os.symlink("nowhere", self.folder(f"out-flood{number}.counts"))
        self.put_device("out-a", 2, (3, 0, 0, 0), (3, 0, 0, 0), (3, 0, 0, 0))
        client.result("stopReportingSessionForID", 7)
        self.assertEqual(self.report("a", "pipe", "folder", "link", "huge", "long", "nonsense"), {
            "a_Speaker_Simple_Cycles": 2, "a_Speaker_Simple_Missedcycles": 2,
            "a_Speaker_Histogram_Wait": self.expected((1, 0, 0, 0), (3, 0, 0, 0)),
            "a_Speaker_Histogram_Busy": self.expected((1, 0, 0, 0), (3, 0, 0, 0)),
            "a_Speaker_Histogram_Cycletime": self.expected((1, 0, 0, 0), (3, 0, 0, 0))})

    @AS_ROOT
    def test_who_may_not_connect_counts_nothing(self):
        self.assertIsNone(self.stranger_counts())


@AS_ROOT
class CyclesOfOthers(CyclesTest):
    def configure(self):
        return f'[access]\nusers = ["{STRANGER}"]\n'

    def test_who_may_connect_counts(self):
        self.assertEqual(self.stranger_counts(), 5)


@unittest.skipUnless(glob.glob("/sys/devices/system/cpu/cpu0/cpuidle/state0"),
                     "this machine has no idle states")
class ThisMachine(DriversTest):
    def configure(self):
        return channel("cpu0 idle", "cpuidle:/sys/devices/system/cpu/cpu0/cpuidle",
                       driver="CodecOne")

    def test_idle_states_are_reported(self):
        client = self.connect()
        self.start(client, 7)
        try:
            self.daemon.wait_for(self.idle_has_grown(self.idle_time()), seconds=10)
        except AssertionError:
            self.skipTest("the processor is never idle")
        client.result("stopReportingSessionForID", 7)
        [(kind, values)] = self.reports()
        self.assertEqual(kind, 18)
        self.assertEqual(list(values), ["CodecOne_Speaker_State_cpu0idle"])
        self.assertRegex(values["CodecOne_Speaker_State_cpu0idle"],
                         r"^(name:[^,;]+,transition:\d+,residency:[1-9]\d*,"
                         r"duty_cycle:[01]\.\d{6};)+$")

    def test_the_built_in_channels_are_reported_as_well(self):
        client = self.connect()
        self.start(client, 7)
        client.result("stopReportingSessionForID", 7)
        [(payload,)] = self.rows("SELECT payload FROM upload_message WHERE category = 12"
                                 " AND type = 18")
        keys = [key for key in json.loads(payload) if re.search("CPUIdle_QLX_State_cpu0$", key)]
        self.assertEqual(len(keys), 1)

    @staticmethod
    def idle_time():
        total = 0
        for path in glob.glob("/sys/devices/system/cpu/cpu0/cpuidle/state*/time"):
            with open(path, encoding="utf-8") as file:
                total += int(file.read())
        return total

    def idle_has_grown(self, before):
        return lambda: self.idle_time() > before


if __name__ == "__main__":
    unittest.main()
