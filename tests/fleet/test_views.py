# SPDX-License-Identifier: Apache-2.0
"""The results of the views for known rows."""
import itertools
import json
import os
import pathlib
import shutil
import subprocess
import tempfile
import unittest

import side
from devices import FleetTest

PLACES = itertools.count(1)
START = 1772366400  # 2026-03-01 12:00 UTC, after the first day that is kept begins
STOP = {"category": 0, "type": 1}
COLUMN_STORE = """<yandex><tcp_port>{1}</tcp_port><listen_host>127.0.0.1</listen_host><path>{0}/</path><tmp_path>{0}/tmp/</tmp_path>
<logger><level>none</level><log>{0}/log</log><errorlog>{0}/log</errorlog></logger><users_config>/etc/clickhouse-server/users.xml</users_config>
<default_profile>default</default_profile><default_database>default</default_database><mark_cache_size>16777216</mark_cache_size></yandex>"""


def row(received, client="c", session=None, **columns):
    """A row of veltra.events: columns by their names, other names are fields of the event."""
    fields = {name: columns.pop(name) for name in list(columns) if name.startswith("_") or name[0].isupper()}
    path = session.split(".") if session else None
    return {"received": received + "+00", "seq": next(PLACES), "index": 0, "client_id": client, "session_id": session, "session_path": path,
            "fields": fields, **columns}


def numbered(client, session, *numbers, began=START, **columns):
    return [row("2026-03-02 10:00", client, session, event_number=number, _startTS=began, **columns) for number in numbers]


class Views(FleetTest):
    parts = ["postgres"]

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.fleet.query((side.HERE / "schema.sql").read_text())
        cls.fleet.query("ALTER DATABASE veltra SET timezone = 'Asia/Kolkata'")  # half an hour beside those of UTC
        cls.fleet.query("SELECT veltra.partition_for(day::date) FROM generate_series('2026-03-01'::date, '2026-03-03', '1 day') AS day")

    def setUp(self):
        self.fleet.query("TRUNCATE veltra.events")

    def answer(self, view, columns, rows, order="1, 2, 3"):
        text = json.dumps(rows).replace("'", "''")
        self.fleet.query(f"INSERT INTO veltra.events SELECT * FROM jsonb_populate_recordset(NULL::veltra.events, '{text}')")
        return [" ".join(found) for found in self.fleet.query(f"SELECT {columns} FROM veltra.{view} ORDER BY {order}")]

    def test_events_by_hour(self):
        rows = [row("2026-03-01 23:30", "a", "42", sender="FU"), row("2026-03-01 23:59:59.9", "b", "42", sender="FU"),
                row("2026-03-02 00:00", "a", "42", sender="FU"), row("2026-03-02 00:29", "a", sender="FU"), row("2026-03-02 00:31", "a")]
        hour = "to_char(hour AT TIME ZONE 'UTC', 'DD HH24:MI'), coalesce(sender, '-'), events, sessions, clients"
        self.assertEqual(self.answer("events_by_hour", hour, rows),
                         ["01 23:00 FU 2 2 2", "02 00:00 - 1 0 1", "02 00:00 FU 2 1 1"])

    def test_sessions(self):
        rows = [row("2026-03-01 12:00", "a", "A", category=0, type=0), row("2026-03-01 12:01", "a", "A.B", category=0, type=1),
                row("2026-03-01 12:02", "a", "A.B.C"), row("2026-03-01 12:03", "a", "A", category=5, type=1),
                row("2026-03-01 12:00", "a", "42"), row("2026-03-01 12:00", "b", "42"), row("2026-03-01 12:00", "a")]
        columns = ("path, client_id, tree, coalesce(parent, '-'), depth, events, extract(epoch FROM last_received - first_received)::int, "
                   "started, stopped")
        self.assertEqual(self.answer("sessions", columns, rows), [
            "{42} a 42 - 0 1 0 f f", "{42} b 42 - 0 1 0 f f", "{A} a A - 0 2 180 t f",
            "{A,B} a A A 1 1 0 f t", "{A,B,C} a A A.B 2 1 0 f f"])

    def test_sampled(self):
        def stops(sender, *thresholds, received="2026-03-02 12:00"):
            return [row(received, "c", f"S{at}", sender=sender, **STOP, **({} if threshold is None else {"SamplingThreshold": threshold}))
                    for at, threshold in enumerate(thresholds)]
        rows = [*stops("mixed", 1, 1, 1, 1, 0.1, 0.1), *stops("all", -1, -1, 1), *stops("silent", 0.5, None), *stops("text", "x"),
                *stops("zero", 0, 0.25), *stops("above", 7), *stops("days", 0.5, received="2026-03-01 23:59:59"),
                *stops("days", 0.2, received="2026-03-02 00:00"),
                row("2026-03-02 12:00", sender="other", category=5, type=1, SamplingThreshold=1)]
        columns = "sender, to_char(day AT TIME ZONE 'UTC', 'DD'), sessions, coalesce(share::text, '-'), coalesce(expected::text, '-')"
        self.assertEqual(self.answer("sampled", columns, rows), [
            "above 02 1 1.0000 1.0", "all 02 3 1.0000 3.0", "days 01 1 0.5000 2.0", "days 02 1 0.2000 5.0",
            "mixed 02 6 0.2500 24.0", "silent 02 2 0.5000 -", "text 02 1 - -", "zero 02 2 0.2500 -"])

    def test_gaps(self):
        before = START - 86400 * 7
        cases = [  # what it is, the events in the order of their arrival; back end, highest, arrived, missing
            ("whole", numbered("whole", "S", 1, 2, 3), []),
            ("one lost", numbered("one lost", "S", 1, 2, 4), ["- 4 3 1"]),
            ("the first lost", numbered("the first lost", "S", 3, 5), ["- 5 2 3"]),
            ("late", numbered("late", "S", 3, 5, 1, 2, 4), []),
            ("late and lost", numbered("late and lost", "S", 3, 5, 1), ["- 5 3 2"]),
            ("twice", numbered("twice", "S", 1, 2, 2, 4), ["- 4 3 1"]),
            ("round", numbered("round", "S", 65533, 65535, 0, 2, 65534, began=before), ["- 65538 5 1"]),
            ("begun before", numbered("begun before", "S", 51, 53, began=before), ["- 53 2 1"]),
            ("unknown start", numbered("unknown start", "S", 51, 53, began="x"), ["- 53 2 1"]),
            ("new storebag", numbered("new storebag", "S", 1, 2, via="main-v42") + numbered("new storebag", "S", 3, 5, via="main-v43"),
             ["main 5 4 1"]),
            ("version alone", numbered("version alone", "S", 1, 2, via="v42") + numbered("version alone", "S", 3, via="v43"), []),
            ("two back ends", numbered("two back ends", "S", 1, 2, via="main") + numbered("two back ends", "S", 1, 3, via="a-b"),
             ["a-b 3 2 1"]),
            ("a number again", numbered("a number again", "42", 1, 2, 3) + numbered("a number again", "42", 1, 3, began=START + 60),
             ["- 3 2 1"]),
            ("its neighbour", numbered("its neighbour", "42", 2), ["- 2 1 1"]),
            ("no number", numbered("no number", "S", None, 1) + numbered("no number", None, 7), []),
        ]
        rows = [one for _, events, _ in cases for one in events]
        found = self.answer("gaps", "client_id || ': ' || coalesce(via, '-'), highest, arrived, missing", rows)
        self.assertEqual(found, sorted(f"{name}: {line}" for name, _, lines in cases for line in lines))

    def test_storebag_versions(self):
        def uses(hour, version, *clients):
            return [row(f"2026-03-02 {hour}:{minute}", client, f"S{client}", via=version, sender="FU", _reportVers="8.0")
                    for client in clients for minute in (10, 50)]
        rows = [*uses(10, "main-v42", "a", "b", "c"), *uses(11, "main-v42", "b", "c"), *uses(11, "main-v43", "a", "b"),
                *uses(12, "main-v43", "a", "b", "c"), row("2026-03-02 12:00", "d")]
        columns = "to_char(hour AT TIME ZONE 'UTC', 'HH24'), coalesce(via, '-'), coalesce(library, '-'), clients, sessions, events"
        self.assertEqual(self.answer("storebag_versions", columns, rows), [
            "10 main-v42 8.0 3 3 6", "11 main-v42 8.0 2 2 4", "11 main-v43 8.0 2 2 4", "12 - - 1 0 1", "12 main-v43 8.0 3 3 6"])

    def test_a_condition_on_hour_or_day_reads_no_other_day(self):
        self.fleet.query("INSERT INTO veltra.events (received, seq, index, client_id, category, type, fields) "
                         "SELECT '2026-03-01 00:00+00'::timestamptz + at * interval '7.2 s', at, 0, 'c', 0, 1, '{}' FROM generate_series(0, 35999) AS at")
        for day in (1, 2, 3):
            self.fleet.query(f"VACUUM ANALYZE veltra.events_2026030{day}")

        def scans(plan):
            yield from [plan] if "Relation Name" in plan else []
            for part in plan.get("Plans", []):
                yield from scans(part)
        # A time that is written, and one that is known only when the query runs.
        times = ["'2026-03-03 00:00+00'", "now() - (now() - timestamptz '2026-03-03 00:00+00')"]
        for (view, column), begin in itertools.product({"events_by_hour": "hour", "storebag_versions": "hour", "sampled": "day"}.items(), times):
            with self.subTest(view=view, begin=begin):
                sql = f"EXPLAIN (ANALYZE, FORMAT JSON) SELECT * FROM veltra.{view} WHERE {column} >= {begin}"
                [found] = json.loads("\n".join(line for line, in self.fleet.query(sql)))
                read = {}
                for scan in scans(found["Plan"]):
                    removed = sum(scan.get("Rows Removed by " + why, 0) for why in ("Filter", "Index Recheck"))
                    read[scan["Relation Name"]] = (scan["Actual Rows"] + removed) * scan["Actual Loops"]
                # Of other days the last 128 pages, which are summarized when more follow.
                self.assertTrue(max(read["events_20260301"], read["events_20260302"]) < 6400 and read["events_20260303"] > 11900, read)

    @unittest.skipUnless(shutil.which("clickhouse-server"), "clickhouse-server is not installed")
    def test_column_store(self):
        folder = tempfile.TemporaryDirectory()
        self.addCleanup(folder.cleanup)
        [port] = side.free_ports(1)
        configuration = pathlib.Path(folder.name) / "config.xml"
        configuration.write_text(COLUMN_STORE.format(folder.name, port))
        server = subprocess.Popen(["clickhouse-server", f"--config-file={configuration}"], stdout=subprocess.DEVNULL,
                                  stderr=subprocess.DEVNULL, env={**os.environ, "TZ": "Asia/Kolkata"})
        self.addCleanup(server.wait)
        self.addCleanup(server.kill)
        side.wait_until(lambda: side.connects(port), "the column store")
        text = (side.HERE / "column_store.sql").read_text()
        client = f"clickhouse-client --host 127.0.0.1 --port {port}"
        side.run(*client.split(), "--multiquery", "--query", "".join(f"{line}\n" for line in text.splitlines() if not line.startswith("--")))
        carry = "\n".join(line[4:] for line in text.splitlines() if line.startswith("--   "))
        carry = carry.replace("clickhouse-client", client).replace("psql ", f"psql -d '{self.fleet.dsn}' ")

        def carried(rows):
            self.answer("events_by_hour", "1", rows, "1")
            side.run("bash", "-e", "-o", "pipefail", "-c", carry)
            return side.run(*client.split(), "--query", "SELECT client_id, received, happened, type, fields FROM veltra.events FINAL "
                            "ORDER BY received FORMAT CSV").splitlines()
        first = row("2026-03-01 23:59:59.5", "a", type=1, happened="2026-03-01 23:00+00", Text="it's, \n")
        anew = {**row("2026-03-02 00:30", "b"), "seq": 0}  # of a stream that was made anew
        lines = ['"a","2026-03-01 23:59:59","2026-03-01 23:00:00",1,"{""Text"": ""it\'s, \\n""}"', '"b","2026-03-02 00:30:00",\\N,-1,"{}"']
        self.assertEqual([carried([first]), carried([anew]), carried([])], [lines[:1], lines, lines])
