"""The books of the torture notice what they are there for, and the plan follows from its seed."""

import collections
import os
import sqlite3
import sys
import tempfile
import unittest

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path += [HERE, os.path.join(HERE, "..", "..", "scripts")]
import checks  # noqa: E402
import hands  # noqa: E402
import plan  # noqa: E402
from checks import Present  # noqa: E402
from life import Snapshot  # noqa: E402


def messages(**changes):
    return {"offered": 10, "own": 2, "repeats": 1, "not_uploaded": {"test": 3, "limit": 0},
            "delivered": 7, "waiting": 1} | changes


def store(rows=5, lost=2, removed=0):
    return {"rows": {"upload_message": rows}, "removed": {"upload_message": removed},
            "lost": {"upload_message": {"io_error": lost, "disk_full": 0}}}


class Sheets(unittest.TestCase):
    def test_one_that_closes_is_no_fault(self):
        self.assertEqual(checks.sheet(messages(), store=store()), [])

    def test_each_entry_counts(self):
        for changes in ({"offered": 11}, {"own": 1}, {"repeats": 0}, {"delivered": 8},
                        {"not_uploaded": {"test": 2, "limit": 0}}, {"waiting": 0}):
            self.assertTrue(checks.sheet(messages(**changes)), changes)

    def test_what_waits_is_never_less_than_nothing(self):
        self.assertTrue(checks.sheet(messages(waiting=-1, delivered=9)))

    def test_the_store_has_what_was_delivered_to_it(self):
        self.assertTrue(checks.sheet(messages(), store=store(rows=4)))
        self.assertTrue(checks.sheet(messages(), store=store(lost=1)))

    def test_no_more_is_lost_than_was_delivered(self):
        self.assertEqual(checks.sheet(messages(), lost=7), [])
        self.assertTrue(checks.sheet(messages(), lost=8))

    def test_rows_are_those_written_but_for_those_removed(self):
        there = {"upload_message": 3}
        self.assertEqual(checks.rows(there, store(rows=5, removed=2), {"upload_message": 6}), [])
        for after in (5, 7, 0):
            self.assertTrue(checks.rows(there, store(5, 0, 2), {"upload_message": after}))

    def test_removing_without_a_reason_is_a_fault(self):
        self.assertEqual(checks.removed(0), [])
        self.assertTrue(checks.removed(1))


class Promises(unittest.TestCase):
    def faults(self, rows, required, counted=0, may_lack_first=False, last_sent=9, **more):
        present = Present("a", rows, required, last_sent, min(rows, default=None))
        return checks.kept([present], counted, may_lack_first, **more)

    def test_all_that_was_promised_is_there(self):
        self.assertEqual(self.faults([0, 1, 2, 3], [0, 1, 2]), [])

    def test_a_hole_is_a_fault_unless_it_was_counted(self):
        self.assertTrue(self.faults([0, 2], [0, 1, 2]))
        self.assertEqual(self.faults([0, 2], [0, 1, 2], counted=1), [])

    def test_the_end_may_not_be_missing_either(self):
        self.assertTrue(self.faults([0, 1], [0, 1, 2], may_lack_first=True))

    def test_the_first_may_be_missing_only_where_they_were_removed(self):
        self.assertTrue(self.faults([2], [0, 1, 2]))
        self.assertEqual(self.faults([2], [0, 1, 2], may_lack_first=True), [])
        self.assertTrue(self.faults([1, 3], [0, 1, 2, 3], may_lack_first=True))

    def test_all_may_be_missing_only_where_they_were_removed(self):
        self.assertTrue(self.faults([], [0, 1]))
        self.assertEqual(self.faults([], [0, 1], may_lack_first=True), [])

    def test_the_first_of_the_store_of_now_count_when_another_was_moved_away(self):
        moved = Present("a", [0, 1, 5, 6], [0, 1, 2, 3, 5, 6], 9, first=5)
        self.assertEqual(checks.kept([moved], 0, True), [])
        self.assertTrue(checks.kept([moved], 0, False))

    def test_a_single_one_may_be_excused(self):
        self.assertEqual(self.faults([0, 2], [0, 1, 2], excused=lambda who, n: n == 1), [])
        self.assertTrue(self.faults([0, 3], [0, 1, 2, 3], excused=lambda who, n: n == 1))

    def test_none_is_there_twice_or_out_of_nowhere(self):
        self.assertTrue(self.faults([0, 1, 1, 2], [0, 1, 2], counted=9))
        self.assertTrue(self.faults([0, 1, 10], [0, 1], counted=9))

    def test_those_of_a_session_are_in_order(self):
        self.assertEqual(checks.order("a", [0, 1, 5, 6]), [])
        self.assertEqual(checks.order("a", []), [])
        self.assertEqual(checks.order("a", [0, 1, 5, 2]), ["a: out of order: [0, 1, 5, 2]"])


class Remains(unittest.TestCase):
    def test_an_orderly_end_leaves_one_file(self):
        self.assertEqual(checks.files(["telemetry.db", "incidents/x.json"], ["Reporting/s"]), [])
        for state in ("telemetry.db-wal", ".telemetry.db.1-2", "incidents/.x.json.1-2",
                      "telemetry.db.damaged-20261121T033306Z", "core"):
            self.assertTrue(checks.files(["telemetry.db", state], []), state)
        for log in ("Reporting/.s.1-2", "s.tmp"):
            self.assertTrue(checks.files([], [log]), log)

    def test_memory_threads_and_descriptors_come_back(self):
        self.assertEqual(checks.size(599, 199), [])
        self.assertTrue(checks.size(600))
        self.assertTrue(checks.size(10, 200))
        self.assertEqual(checks.threads(9, 9), [])
        self.assertTrue(checks.threads(9, 10))
        sockets = collections.Counter(["socket", "socket", "store"])
        self.assertEqual(checks.descriptors(sockets, sockets, 0), [])
        self.assertTrue(checks.descriptors(sockets, sockets + sockets, 2))

    def test_a_standstill_is_a_fault_and_a_busy_machine_is_none(self):
        self.assertEqual(checks.waits([0.001] * 995 + [1.9] * 5), [])
        self.assertTrue(checks.waits([0.001] * 980 + [2.1] * 20))
        self.assertTrue(checks.waits([0.001] * 999 + [31]))


class Snapshots(unittest.TestCase):
    def setUp(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        self.path = os.path.join(folder.name, "telemetry.db")
        self.copy = os.path.join(folder.name, "copy")
        database = sqlite3.connect(self.path)
        database.execute("CREATE TABLE upload_message(id INTEGER PRIMARY KEY,"
                         " upload_session INTEGER, payload TEXT)")
        database.executemany("INSERT INTO upload_message(upload_session, payload) VALUES(?, ?)", [
            (n // 50, '{"who":"a@1","n":%d,"text":"%s"}' % (n, "x" * 900)) for n in range(100)])
        database.commit()
        database.close()

    def test_one_knows_whose_rows_there_are(self):
        seen = Snapshot(self.path, self.copy)
        self.assertEqual(seen.faults, [])
        self.assertEqual(seen.messages, [("a@1", n, n // 50) for n in range(100)])
        self.assertEqual(seen.tables, {"upload_message": 100})

    def test_one_of_a_damaged_store_says_so(self):
        with open(self.path, "r+b") as file:
            file.seek(8 * 4096)
            file.write(b"no page" * 2000)
        self.assertTrue(Snapshot(self.path, self.copy).faults)

    def test_one_of_no_store_is_empty(self):
        os.remove(self.path)
        seen = Snapshot(self.path, self.copy)
        self.assertEqual((seen.faults, seen.tables), ([], {}))


class Plans(unittest.TestCase):
    def test_one_follows_from_seed_and_number(self):
        self.assertEqual(plan.life(7, 3), plan.life(7, 3))
        self.assertNotEqual(plan.life(7, 3), plan.life(8, 3))
        self.assertNotEqual(plan.life(7, 3), plan.life(7, 4))

    def test_all_that_is_planned_can_be_done(self):
        acts = [act for number in range(400) for act in plan.life(1, number).acts]
        for kind in {act.kind for act in acts}:
            self.assertTrue(callable(getattr(hands.Hands, kind)), kind)
        for kind, names in (("attack", plan.ATTACKS), ("disk", plan.DISK)):
            self.assertEqual({act.name for act in acts if act.kind == kind}, set(names))
        self.assertEqual({plan.life(1, number).end for number in range(100)}, set(plan.ENDS))


if __name__ == "__main__":
    unittest.main()
