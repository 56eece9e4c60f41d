# SPDX-License-Identifier: Apache-2.0
"""The drain with messages that no gateway has published, and with faults of the database and the stream."""
import http.client
import os
import pathlib
import re
import resource
import signal
import subprocess
import time
import urllib.request

import side
from devices import GZIP, FleetTest, envelope, packed, post_id, together


class Drain(FleetTest):
    def metric(self, name):
        text = urllib.request.urlopen(self.line["drain"] + "/metrics", timeout=5).read().decode()
        return float(re.search(rf"^{name} (\S+)$", text, re.M)[1])

    def put(self, subject, body, **headers):
        head = "NATS/1.0\r\n" + "".join(f"{name.replace('_', '-')}: {text}\r\n" for name, text in headers.items()) + "\r\n"
        self.say("admin", f"HPUB veltra.{subject} {len(head)} {len(head) + len(body)}\r\n{head}".encode() + body + b"\r\n")

    def end(self, name, number=signal.SIGKILL):
        pid = self.fleet.facts["pids"][name]
        self.fleet.kill(name, number)
        side.wait_until(lambda: not side.alive(pid), f"the end of {name}")

    def holds(self, sql, relation):
        """A session of the database that stays within a transaction."""
        session = subprocess.Popen([side.program("psql"), "-qXAt", "-c", f"{sql}; SELECT pg_sleep(600)", self.fleet.dsn],
                                   stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        self.addCleanup(session.wait)
        self.addCleanup(session.kill)
        side.wait_until(lambda: self.fleet.query(f"SELECT 1 FROM pg_locks WHERE relation = '{relation}'::regclass AND granted"
                                                 " AND pid != pg_backend_pid()"), "its lock")
        return session

    def test_what_no_table_takes_is_kept_apart_and_holds_nothing_up(self):
        for subject, body, headers in (("events", b"{", {}), ("events", envelope({}), {"Veltra_Piece": "abc 100"}),
                                       ("files", b"x", {}), ("files", b"x", {"Veltra_File": "{}", "Veltra_Piece": "abc 1"}),
                                       ("logdata", b"[", {"Veltra_Location": "/logdata/1"}), ("datagrams", b"{}", {}),
                                       ("pieces", b"x", {"Veltra_Piece": "../x 0"}), ("other", b"x", {})):
            self.put(subject, body, **headers)
        self.assertEqual(self.direct().post("/events", envelope({}, client="behind")).status, 200)
        self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'behind'", 1)
        self.assertEqual(len(self.fleet.query("SELECT 1 FROM veltra.refused WHERE reason LIKE 'drain: %'")), 8)

    def test_a_post_is_written_once_however_late_it_comes_again(self):
        before, identifier = self.metric("veltra_drain_skipped_total"), post_id()
        for _ in range(2):  # without an ID that the stream knows, as after its two minutes
            self.put("events", envelope({}, client="late"), Veltra_Post_ID=identifier)
        side.wait_until(lambda: self.metric("veltra_drain_skipped_total") == before + 1, "the second is skipped")
        self.assertEqual(len(self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'late'", 1)), 1)

    def test_what_took_the_places_of_lost_messages_is_read(self):
        self.assertEqual(self.direct().post("/events", envelope({}, client="before")).status, 200)
        side.wait_until(self.fleet.is_carried, "it is in the table")
        self.end("drain")
        # As if the tables had three more, which the servers lost with their power.
        self.fleet.query("UPDATE veltra.position SET seq = seq + 3, time = (extract(epoch FROM clock_timestamp()) * 1e9)::bigint")
        for number in range(5):
            self.assertEqual(self.direct().post("/events", envelope({"n": number}, client="after")).status, 200)
        self.fleet.start(["drain"])
        self.assertEqual(len(self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'after'", 5)), 5)
        self.assertEqual(len(self.fleet.query("SELECT 1 FROM veltra.events WHERE client_id = 'before'")), 1)

    def test_what_waits_is_known_while_the_database_is_away(self):
        self.end("postgres")
        for number in range(3):
            self.assertEqual(self.direct().post("/events", envelope({"n": number}, client="waits")).status, 200)
        side.wait_until(lambda: self.metric("veltra_drain_lag_messages") >= 3 and self.metric("veltra_drain_lag_seconds") > 1, "the lag")
        self.fleet.start(["postgres"])
        self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'waits'", 3)
        side.wait_until(lambda: self.metric("veltra_drain_lag_messages") == 0, "no lag")

    def test_queries_of_views_do_not_keep_it_from_starting(self):
        self.holds("SELECT count(*) FROM veltra.sessions", "veltra.sessions")
        self.end("drain")
        self.fleet.start(["drain"])

    def test_a_database_that_hangs_is_left(self):
        self.end("drain")
        self.fleet.facts["options"]["drain"] = ["--statement-timeout", "2"]
        self.addCleanup(self.fleet.facts["options"].pop, "drain")
        self.fleet.start(["drain"])
        own = "SELECT pid FROM pg_stat_activity WHERE application_name = 'veltra-gateway drain'"
        side.wait_until(lambda: self.metric("veltra_drain_events_total") >= 0 and self.fleet.query(own), "its session")
        for client in ("hangs", "waits for a lock"):
            with self.subTest(client=client):
                before = self.metric("veltra_drain_restarts_total")
                if client == "hangs":
                    backend = int(self.fleet.query(own)[0][0])
                    os.kill(backend, signal.SIGSTOP)
                    self.addCleanup(lambda: pathlib.Path(f"/proc/{backend}").exists() and os.kill(backend, signal.SIGCONT))
                else:
                    session = self.holds("LOCK TABLE veltra.position", "veltra.position")
                self.assertEqual(self.direct().post("/events", envelope({}, client=client)).status, 200)
                side.wait_until(lambda: self.metric("veltra_drain_restarts_total") > before, "it gives the statement up", 20)
                side.wait_until(lambda: self.metric("veltra_drain_lag_messages") >= 1, "what waits is known")
                if client == "hangs":
                    os.kill(backend, signal.SIGCONT)
                else:
                    session.kill()
                    self.fleet.query("SELECT pg_terminate_backend(pid) FROM pg_locks WHERE relation = 'veltra.position'::regclass")
                self.assertEqual(len(self.rows(f"SELECT 1 FROM veltra.events WHERE client_id = '{client}'", 1)), 1)

    def test_it_ends_in_time_also_if_the_database_does_not_answer(self):
        session = self.holds("LOCK TABLE veltra.position", "veltra.position")
        self.assertEqual(self.direct().post("/events", envelope({}, client="locked")).status, 200)
        side.wait_until(lambda: self.fleet.query("SELECT 1 FROM pg_locks WHERE NOT granted"), "the drain waits")
        begin = time.monotonic()
        self.end("drain", signal.SIGTERM)
        self.assertLess(time.monotonic() - begin, 15)
        session.kill()
        self.fleet.query("SELECT pg_terminate_backend(pid) FROM pg_locks WHERE relation = 'veltra.position'::regclass")
        self.fleet.start(["drain"])
        self.assertEqual(len(self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'locked'", 1)), 1)

    def test_a_large_file_does_not_fill_the_memory(self):
        self.end("drain")
        body = packed(os.urandom(1 << 20) * 80)  # a gzip stream does not see so far back
        answer = self.direct().request("POST", "/upload?uuid=large&sequence=1&filename=f.gz&raw=true", body, GZIP)
        self.assertEqual(answer.status, 200, answer)
        self.fleet.start(["drain"])
        self.rows("SELECT 1 FROM veltra.files WHERE uuid = 'large'", 1)
        status = pathlib.Path(f"/proc/{self.fleet.facts['pids']['drain']}/status").read_text()
        self.assertLess(int(re.search(r"^VmHWM:\s+(\d+)", status, re.M)[1]), 128 << 10)
        self.assertEqual(self.metric("veltra_drain_restarts_total"), 0)

    def test_want_of_memory_costs_a_request_or_a_turn_and_nothing_else(self):
        numbers, restarts = range(8), self.metric("veltra_drain_restarts_total")
        bodies = [envelope({"n": number, "t": "x" * (12 << 20)}, client="short") for number in numbers]
        ids, pids = [post_id() for _ in numbers], {name: self.fleet.facts["pids"][name] for name in ("gateway1", "drain")}

        def post(number):
            try:
                return self.direct().post("/events", bodies[number], X_VLT_Post_ID=ids[number]).status
            except (OSError, http.client.HTTPException):
                return 0

        def limit(name, bytes_=None):
            size = int(re.search(r"^VmSize:\s+(\d+)", pathlib.Path(f"/proc/{pids[name]}/status").read_text(), re.M)[1]) << 10
            hard = resource.prlimit(pids[name], resource.RLIMIT_AS)[1]
            resource.prlimit(pids[name], resource.RLIMIT_AS, (hard if bytes_ is None else size + bytes_, hard))
        limit("gateway1", 1 << 20)
        statuses = together([lambda number=number: post(number) for number in numbers])
        self.assertTrue({200} != set(statuses) <= {200, 429, 0}, statuses)
        limit("gateway1")
        limit("drain", 1 << 20)
        self.assertEqual(together([lambda number=number: post(number) for number in numbers]), [200] * len(numbers))
        side.wait_until(lambda: self.metric("veltra_drain_restarts_total") > restarts, "a turn without memory")
        limit("drain")
        side.wait_until(self.fleet.is_carried, "all are in the table")
        self.assertEqual(self.fleet.query("SELECT count(*), count(DISTINCT fields->>'n') FROM veltra.events WHERE client_id = 'short'"),
                         [[str(len(bodies))] * 2])
        self.assertTrue(all(self.fleet.runs(name) and self.fleet.facts["pids"][name] == pid for name, pid in pids.items()))

    def test_users_that_were_refused_for_a_while_come_back(self):
        def replace(old, new):
            for name in side.STREAMS:
                configuration = self.fleet.path / name / "stream.conf"
                configuration.write_text(configuration.read_text().replace(old, new))
                self.fleet.kill(name, signal.SIGHUP)
        passwords = [self.fleet.secret(user).read_text().strip().split(":")[1] for user in ("gateway", "drain")]
        before = self.metric("veltra_drain_restarts_total")
        for password in passwords:
            replace(password, "not " + password)
        logs = [self.fleet.path / f"logs/{name}.log" for name in side.GATEWAYS]
        side.wait_until(lambda: all("refuse this connection for good" in log.read_text() for log in logs), "the gateways' end")
        side.wait_until(lambda: self.metric("veltra_drain_restarts_total") > before + 2, "the drain's end")
        for password in passwords:
            replace("not " + password, password)
        for gateway in (0, 1):
            side.wait_until(lambda: self.direct(gateway).post("/events", envelope({"n": gateway}, client="refused")).status == 200, "an answer")
        self.rows("SELECT DISTINCT fields FROM veltra.events WHERE client_id = 'refused'", 2)

    def test_a_stream_that_was_made_anew_is_read_from_its_start(self):
        self.say("admin", b"PUB $JS.API.STREAM.DELETE.VELTRA _INBOX.1 0\r\n\r\n")
        side.wait_until(lambda: self.direct().post("/events", envelope({}, client="anew")).status == 200, "a new stream")
        self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'anew'", 1)
