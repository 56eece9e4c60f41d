# SPDX-License-Identifier: Apache-2.0
"""The requests that gateways accept and refuse; accepted data is unchanged in the tables."""
import contextlib
import gzip
import hashlib
import http.client
import json
import os
import pathlib
import plistlib
import re
import select
import signal
import socket
import subprocess
import tempfile
import time
import unittest
import urllib.parse
import urllib.request

import side
from devices import GZIP, JSON, Dashboard, Door, FleetTest, datagram, envelope, packed, post_id


class Doors(FleetTest):
    def test_refusals_have_a_status_and_no_body(self):
        good, upload = envelope({"a": 1}), "/upload?uuid=u&sequence=1&filename=f.gz&raw=true"
        whole = packed(good)
        zipped = {**JSON, "Content-Encoding": "gzip"}
        rows = [  # method, path, body, headers, status
            ("POST", "/events", b"{", JSON, 400),
            ("POST", "/events", b"", JSON, 400),
            ("POST", "/events", b'{"clientId": 1, "events": []}', JSON, 400),
            ("POST", "/events", envelope({"a": {"b": 1}}), JSON, 400),
            ("POST", "/events", good.replace(b'"a"', b'"\xff"'), JSON, 400),
            ("POST", "/events", whole[:-1], zipped, 400),
            ("POST", "/events", whole + b"x", zipped, 400),
            ("POST", "/events", good, zipped, 400),
            ("POST", "/events", packed(b" " * (16 << 20) + good), zipped, 413),
            ("POST", "/events", b" " * (16 << 20) + good, JSON, 413),
            ("POST", "/nothing", good, JSON, 404),
            ("POST", "/events/A", good, JSON, 404),
            ("POST", "/live", good, JSON, 404),
            ("POST", "/events", good, {"Content-Type": "text/plain"}, 415),
            ("POST", "/events", good, {**JSON, "Content-Encoding": "br"}, 415),
            ("POST", upload, packed(b"x")[:-4], GZIP, 400),
            ("POST", upload.replace("=1", "=one"), packed(b"x"), GZIP, 400),
            ("POST", "/logdata", b"no list", {"Content-Type": "application/octet-stream"}, 400),
            ("POST", "/logdata", plistlib.dumps({}, fmt=plistlib.FMT_BINARY), {}, 400),
        ]
        for where, door in ("direct", self.direct()), ("through nginx", self.through()):
            for method, path, body, headers, status in rows:
                with self.subTest(where=where, path=path, body=body[:40], headers=headers):
                    answer = door.request(method, path, body, headers)
                    self.assertEqual((answer.status, answer.body), (status, b""), answer.headers)
                    if where == "direct":
                        self.assertTrue(answer.headers["X-VLT-Refused"])
            for path in ("/events", "/upload", "/logdata"):
                answer = door.request("GET", path)
                self.assertEqual((answer.status, answer.body, answer.headers["Allow"]), (405, b"", "POST"))
            door.close()
            large = door.request("POST", "/events", good, {**JSON, "X-Large": "x" * 65536})
            self.assertIn(large.status, (400, 431))
            self.assertEqual(large.body, b"")
        self.assertIn(self.through().request("GET", "/metrics").status, (403, 404))
        reasons = {row[0] for row in self.rows("SELECT DISTINCT split_part(reason, ':', 1) FROM veltra.refused", 3)}
        self.assertLessEqual({"events", "gzip", "log_data"}, reasons)
        metrics = urllib.request.urlopen(self.line["gateways"][0]["admin"] + "/metrics").read().decode()
        self.assertIn('veltra_gateway_refused_total{reason="gzip"}', metrics)
        self.assertTrue(metrics.endswith("# EOF\n"))

    def test_events_stand_in_the_table_as_they_came(self):
        event = {"_sender": "FU", "_sessionID": "A.B", "_method": 5, "_status": 10, "_eventNumber": 7, "eventTime": 1400000000.25,
                 "text": "tab\t \\ \"quoted\" \n é 😀", "flag": True, "large": 2**64 - 1, "real": 1.5e300}
        body = envelope(event, {"eventTime": 1e12, "nul": "\0", "_sessionID": 42}, client="it's")
        body = body.replace(b'"nul"', b'"half": "\\ud83d", "nul"')
        answer = self.through().post("/events/call", body)
        self.assertEqual((answer.status, answer.body), (200, b""))
        first, second = self.rows("SELECT client_id, sender, session_id, session_path, category, type, event_number, via, index, "
                                  "extract(epoch FROM happened), fields FROM veltra.events WHERE client_id = 'it''s' ORDER BY index", 2)
        self.assertEqual(first[:10], ["it's", "FU", "A.B", "{A,B}", "5", "10", "7", "call", "0", "1400000000.250000"])
        fields = json.loads(first[10])
        self.assertEqual({**fields, "real": float(fields["real"])}, event)  # the database writes such a number in full
        self.assertEqual(second[2:10], ["42", "{42}", "", "", "", "call", "1", ""])
        self.assertEqual(json.loads(second[10]), {"eventTime": 1e12, "nul": "�", "half": "�", "_sessionID": 42})

    def test_the_same_again_is_kept_once(self):
        identifier, body = post_id(), envelope({"n": 1}, client="again")
        doors = [self.direct(0), self.direct(1), self.through()]
        for door in doors * 2:
            self.assertEqual(door.post("/events", body, X_VLT_Post_ID=identifier).status, 200)
            self.assertEqual(door.post("/events", body).status, 200)
        self.assertEqual(doors[0].post("/events", envelope({"n": 2}, client="again")).status, 200)
        self.rows("SELECT 1 FROM veltra.events WHERE client_id = 'again' AND fields->>'n' = '2'", 1)
        # One with the ID, one that a digest names.
        self.assertEqual(len(self.fleet.query("SELECT 1 FROM veltra.events WHERE client_id = 'again' AND fields->>'n' = '1'")), 2)
        self.assertEqual(self.fleet.query("SELECT count(*) FROM veltra.posts"
                                          f" WHERE encode(id, 'hex') = '{identifier}'"), [["1"]])

    def test_files_are_kept_once_whatever_they_are_called(self):
        door, path = self.direct(), "/upload?uuid=names&sequence=1&raw=true&filename="
        names = ["Nats-Msg-Id", "Nats-Msg-Id:x", "Nats-Rollup:all", "\\Nats-"]
        rows = [(name, b"content") for name in names * 2] + [("a", b"bc"), ("ab", b"c"), ("last", b"")]
        for name, content in rows:
            answer = door.request("POST", path + urllib.parse.quote(name), packed(content), GZIP)
            self.assertEqual((answer.status, answer.body), (200, b'{"success":true}'), name)
        self.rows("SELECT 1 FROM veltra.files WHERE filename = 'last'", 1)
        self.assertEqual([name for name, in self.fleet.query("SELECT filename FROM veltra.files WHERE uuid = 'names' ORDER BY seq")],
                         [*names, "a", "ab", "last"])

    def test_bodies_larger_than_a_message(self):
        text = os.urandom(3 << 20).hex()
        self.assertEqual(self.direct().post("/events", packed(envelope({"t": text}, client="large")), Content_Encoding="gzip").status, 200)
        self.assertEqual(self.rows("SELECT md5(fields->>'t') FROM veltra.events WHERE client_id = 'large'", 1),
                         [[hashlib.md5(text.encode()).hexdigest()]])
        content = os.urandom(5 << 20) + b"end"
        body = packed(content)
        answer = self.through().request("POST", "/upload?uuid=ab&sequence=7&description=a%20log&filename=a%20b.gz&raw=true", body, GZIP)
        self.assertEqual((answer.status, answer.body), (200, b'{"success":true}'))
        [row] = self.rows("SELECT uuid, sequence, filename, description, encode(sha256, 'hex'), bytes, path FROM veltra.files WHERE uuid = 'ab'", 1)
        self.assertEqual(row[:6], ["ab", "7", "a b.gz", "a log", hashlib.sha256(content).hexdigest(), str(len(content))])
        self.assertEqual(gzip.decompress((pathlib.Path(self.line["files"]) / row[6]).read_bytes()), content)
        items = ["a line", {"level": 3, "nul": "\0"}, ["x" * 2_000_000]]
        answer = self.through().request("POST", "/logdata", plistlib.dumps(items, fmt=plistlib.FMT_BINARY),
                                        {"Content-Type": "application/octet-stream"})
        self.assertEqual(answer.status, 200)
        self.assertRegex(answer.body.decode(), "^/logdata/[0-9a-f]+$")
        [[found]] = self.rows(f"SELECT items FROM veltra.log_data WHERE location = '{answer.body.decode()}'", 1)
        self.assertEqual(json.loads(found), ["a line", {"level": 3, "nul": "�"}, ["x" * 2_000_000]])

    def test_datagrams(self):
        dashboard = Dashboard(self.line["dashboard"])
        for packet in (datagram(1)[:63], datagram(1, kind=2), datagram(1, length=70), datagram(1, b"x" * 1024), b""):
            self.assertIsNone(dashboard.ask(packet, 0.3), packet[:8])
        self.assertIsNone(dashboard.ask(datagram(2, flags=0), 0.3))
        for _ in range(2):
            answer = dashboard.ask(packet := datagram(3, b" a=1 b=x\\=y z c=\0", session=77))
            self.assertTrue(62 <= len(answer) <= 64 and answer[60:62] == packet[60:62], answer)
        [row] = self.rows("SELECT device_id, sender, session_id, client_version, category, type, event_number, fields "
                          "FROM veltra.datagrams WHERE session_id = 77", 1)
        self.assertEqual(row[:7], ["d" * 40, "FU", "77", "3", "5", "10", "3"])
        self.assertEqual(json.loads(row[7]), {"a": "1", "b": "x=y z", "c": "�"})
        self.assertEqual(len(self.fleet.query("SELECT 1 FROM veltra.datagrams WHERE event_number = 2")), 1)
        self.assertTrue(dashboard.ask(datagram(4, b" $date=5", session=78)))
        self.assertEqual(self.rows("SELECT fields FROM veltra.datagrams WHERE session_id = 78", 1), [['{"$date": "5"}']])

    def test_each_user_of_the_stream_may_do_what_it_needs_alone(self):
        def put(subject, body=b""):
            return b"PUB %s %d\r\n%s\r\n" % (subject, len(body), body)
        rows = [  # user, what it says, and whether the server lets it
            ("gateway", put(b"veltra.refused", b"x"), True),
            ("gateway", put(b"$JS.API.STREAM.PURGE.VELTRA"), False),
            ("gateway", put(b"$JS.API.STREAM.DELETE.VELTRA"), False),
            ("gateway", put(b"$JS.API.STREAM.MSG.GET.VELTRA", b'{"seq":1}'), False),
            ("gateway", b"SUB veltra.> 1\r\n", False),
            ("gateway", b"SUB _INBOX.veltra-drain.> 1\r\n", False),
            ("drain", put(b"veltra.events", b"x"), False),
            ("drain", put(b"$JS.API.STREAM.DELETE.VELTRA"), False),
            ("drain", put(b"$JS.API.STREAM.INFO.VELTRA"), True),
            (None, put(b"veltra.events", b"x"), False),
        ]
        for user, line, allowed in rows:
            with self.subTest(user=user, line=line):
                faults = [said for said in self.say(user, line) if said.startswith("-ERR")]
                self.assertEqual(faults == [], allowed, faults)
        for name in ("secrets", "files", *side.STREAMS):
            self.assertEqual((self.fleet.path / name).stat().st_mode & 0o077, 0, name)

    def test_storebags_go_back(self):
        door, bags = self.through(), [json.dumps({"version": version, "release": {}}) for version in ("1", "2")]
        self.fleet.publish("ostvane", bags[0])
        first = door.request("GET", "/bags/maple/ostvane")
        self.fleet.publish("ostvane", bags[1])
        second = door.request("GET", "/bags/maple/ostvane")
        self.fleet.storebag("rollback", "ostvane", "bags")
        back = door.request("GET", "/bags/maple/ostvane", headers={"If-Modified-Since": second.headers["Last-Modified"]})
        self.assertEqual((back.status, back.body), (200, first.body))

    def test_storebags_come_from_nginx_alone(self):
        bag = json.dumps({"version": "1", "release": {}})
        self.fleet.publish("quindle", bag)
        door = self.through()
        first = door.request("GET", "/bags/maple/quindle")
        self.assertEqual((first.status, first.headers["Cache-Control"]), (200, "max-age=3600"))
        again = {"If-Modified-Since": first.headers["Last-Modified"]}
        self.assertEqual(door.request("GET", "/bags/maple/quindle", headers=again).status, 304)
        self.fleet.publish("quindle", bag.replace('"1"', '"2"'))
        self.assertEqual(door.request("GET", "/bags/maple/quindle", headers=again).status, 200)
        for path in ("nothing", "", ".before/quindle/1", "quindle/x"):
            missing = door.request("GET", "/bags/maple/" + path)
            self.assertEqual((missing.status, missing.body), (404, b""), path)

    def test_too_much_from_one_sender_is_to_come_again(self):
        def limit(old, new):
            configuration = self.fleet.path / "nginx/nginx.conf"
            configuration.write_text(configuration.read_text().replace(f"rate={old}", f"rate={new}"))
            self.fleet.kill("nginx", signal.SIGHUP)
        self.addCleanup(limit, "1r/s", "100000r/s")
        limit("100000r/s", "1r/s")
        door, answers = self.through(), []

        def refused():
            with contextlib.suppress(OSError, http.client.HTTPException):  # the process before closes its connections
                answers.append(door.post("/events", b"{"))
            return answers[-1].status == 429 and answers[-1]
        answer = side.wait_until(refused, "a refusal")
        self.assertGreater(len(answers), 200, "which may come at once")
        self.assertEqual((answer.body, answer.headers["Retry-After"], answer.headers["X-VLT-Refused"]), (b"", "10", None))


class Alone(unittest.TestCase):
    """A gateway whose stream cannot be reached."""

    def test_listens_on_a_socket_that_others_may_use(self):
        with tempfile.TemporaryDirectory() as folder:
            path = pathlib.Path(folder) / "gateway.sock"
            with socket.socket(socket.AF_UNIX) as left:
                left.bind(str(path))  # as a gateway that was killed leaves it
            process, _, _ = self.gateway(listen=f"unix:{path}")
            self.assertEqual(path.stat().st_mode & 0o777, 0o666)
            with socket.socket(socket.AF_UNIX) as link:
                link.connect(str(path))
                link.sendall(b"GET /events HTTP/1.1\r\nHost: h\r\n\r\n")
                self.assertTrue(link.recv(1000).startswith(b"HTTP/1.1 405"))
            second = [side.program("veltra-gateway"), "--server", "nats://127.0.0.1:1", "--admin", "127.0.0.1:0", "--listen", f"unix:{path}"]
            refused = subprocess.run(second, capture_output=True, text=True, timeout=20)
            self.assertEqual(refused.returncode, 1)
            self.assertIn(f"process {process.pid} holds", refused.stderr)
            with socket.socket(socket.AF_UNIX) as link:
                link.connect(str(path))
            process.terminate()
            self.assertEqual(process.wait(15), 0)
            self.assertFalse(path.exists())
            path.write_text("not a socket")
            refused = subprocess.run(second, capture_output=True, text=True)
            self.assertEqual((refused.returncode, path.read_text()), (1, "not a socket"), refused.stderr)

    def test_connections_between_requests_keep_little(self):
        process, first, _ = self.gateway()

        def resident():
            return int(re.search(r"^VmRSS:\s+(\d+)", pathlib.Path(f"/proc/{process.pid}/status").read_text(), re.M)[1])
        self.assertEqual(first.post("/events", b"{}").status, 400)
        before, doors = resident(), [Door(first.address) for _ in range(600)]
        for door in doors:
            self.addCleanup(door.close)
        self.assertEqual({door.post("/events", b"{}").status for door in doors}, {400})
        self.assertLess((resident() - before) / len(doors), 9, "KiB; the room for a body is 16")

    def gateway(self, *arguments, hold="0.5", listen="127.0.0.1:0"):
        process = subprocess.Popen([side.program("veltra-gateway"), "--server", "nats://127.0.0.1:1", "--listen", listen,
                                    "--admin", "127.0.0.1:0", "--hold", hold, *arguments], stdout=subprocess.PIPE,
                                   stderr=subprocess.DEVNULL, text=True)
        self.addCleanup(process.stdout.close)
        self.addCleanup(process.wait)
        self.addCleanup(process.kill)
        line = json.loads(process.stdout.readline())
        door = Door(("127.0.0.1", int(line["listen"].rsplit(":", 1)[1]))) if line["listen"].startswith("http") else None
        if door:
            self.addCleanup(door.close)
        return process, door, line

    def test_what_is_held_too_long_is_to_come_again(self):
        for arguments, status in ((), 429), (("--shed", "503"), 503):
            process, door, line = self.gateway(*arguments)
            begin = time.monotonic()
            answer = door.post("/events", envelope({}))
            self.assertEqual((answer.status, answer.body), (status, b""))
            self.assertGreater(int(answer.headers["Retry-After"]), 0)
            self.assertTrue(0.4 < time.monotonic() - begin < 5)
            admin = Door(("127.0.0.1", int(line["admin"].rsplit(":", 1)[1])))
            self.assertEqual([admin.request("GET", path).status for path in ("/live", "/ready", "/x")], [200, 503, 404])
            admin.close()
            process.terminate()
            self.assertEqual(process.wait(15), 0)

    def test_beyond_the_bounds_it_says_so_at_once(self):
        _, door, line = self.gateway("--hold-messages", "128", "--dashboard", "127.0.0.1:0", hold="5")
        dashboard, admin = Dashboard(line["dashboard"]), line["admin"] + "/metrics"
        for number in range(100):
            dashboard.socket.send(datagram(number))
        side.wait_until(lambda: b'datagrams_total{result="no_room"} 36' in urllib.request.urlopen(admin).read(), "half of them is held")
        with contextlib.ExitStack() as stack:
            for number in range(64):
                waiting = stack.enter_context(socket.create_connection(door.address))
                body = envelope({"n": number})
                waiting.sendall(b"POST /events HTTP/1.1\r\nHost: h\r\nContent-Length: %d\r\n\r\n%s" % (len(body), body))
            side.wait_until(lambda: b"veltra_gateway_held 128" in urllib.request.urlopen(admin).read(), "all of them are held")
            begin = time.monotonic()
            answer = door.post("/events", envelope({"last": 1}))
            self.assertEqual((answer.status, answer.headers["X-VLT-Refused"]), (429, "no_room"))
            self.assertLess(time.monotonic() - begin, 2)

    def test_the_least_room_has_the_largest_body(self):
        _, door, _ = self.gateway("--hold-bytes", str(96 << 20), "--hold-messages", "128")
        # It is no list, which is found out when all of it is there.
        self.assertEqual(door.request("POST", "/logdata", bytes(32 << 20)).status, 400)
        for less in (["--hold-bytes", str((96 << 20) - 1)], ["--hold-messages", "127"]):
            self.assertEqual(subprocess.run([side.program("veltra-gateway"), *less], capture_output=True, timeout=20).returncode, 2)

    def test_others_are_answered_while_a_large_body_is_checked(self):
        _, door, _ = self.gateway()
        body = packed(plistlib.dumps(["x" * 60] * 200_000, fmt=plistlib.FMT_BINARY))  # a text of which the list has many
        with socket.create_connection(door.address) as large:
            begin, longest = time.monotonic(), 0
            large.sendall(b"POST /logdata HTTP/1.1\r\nHost: h\r\nContent-Encoding: gzip\r\nContent-Length: %d\r\n\r\n%s" % (len(body), body))
            while not select.select([large], [], [], 0.01)[0]:
                asked = time.monotonic()
                self.assertEqual(door.request("GET", "/events").status, 405)
                longest = max(longest, time.monotonic() - asked)
            self.assertIn(b"held_too_long", large.recv(1000))
        # Without the time for which it is held.
        self.assertLess(longest, (time.monotonic() - begin - 0.5) / 3)

    def test_what_has_begun_is_answered_at_the_end(self):
        process, door, line = self.gateway(hold="2")
        with socket.create_connection(door.address) as waiting:
            body = envelope({})
            waiting.sendall(b"POST /events HTTP/1.1\r\nHost: h\r\nContent-Length: %d\r\n\r\n%s" % (len(body), body))
            side.wait_until(lambda: b"veltra_gateway_held 1" in urllib.request.urlopen(line["admin"] + "/metrics").read(), "it is held")
            process.terminate()
            self.assertTrue(waiting.recv(100).startswith(b"HTTP/1.1 429"))
        self.assertEqual(process.wait(15), 0)

    def test_a_file_is_refused_as_soon_as_a_piece_was_not_taken(self):
        _, door, _ = self.gateway()
        with socket.create_connection(door.address, timeout=10) as sending:
            sending.sendall(b"POST /upload?sequence=1 HTTP/1.1\r\nHost: h\r\nContent-Encoding: gzip\r\nContent-Length: %d\r\n\r\n" % (1 << 30))
            sending.sendall(packed(os.urandom(2_500_000)))
            self.assertTrue(sending.recv(1000).startswith(b"HTTP/1.1 429"))

    def test_small_bodies_that_become_large_cost_little(self):
        process, door, _ = self.gateway("--hold-bytes", str(1 << 30))
        values = b'{"clientId":"c","events":[' + b"1," * ((8 << 20) - 20) + b"1]}"
        texts = plistlib.dumps(["\1" * (1 << 20)] * 8, fmt=plistlib.FMT_BINARY)
        zipped = {**JSON, "Content-Encoding": "gzip"}
        for path, body, headers, status in (("/events", packed(values), zipped, 400), ("/logdata", packed(texts), GZIP, 413),
                                            ("/upload?sequence=1", gzip.compress(bytes(40 << 20)), GZIP, 413)):
            with self.subTest(path=path):
                self.assertLess(len(body), 100_000)
                answer = door.request("POST", path, body, headers)
                self.assertEqual((answer.status, answer.body), (status, b""), answer.headers)
        status = pathlib.Path(f"/proc/{process.pid}/status").read_text()
        self.assertLess(int(re.search(r"VmHWM:\s+(\d+) kB", status)[1]), 250_000)

    def test_datagrams_that_the_kernel_dropped_are_counted(self):
        process, _, line = self.gateway("--dashboard", "127.0.0.1:0")
        dashboard = Dashboard(line["dashboard"])
        process.send_signal(signal.SIGSTOP)
        for number in range(20_000):
            dashboard.socket.send(datagram(1, b" a=" + b"x" * 1000))
        process.send_signal(signal.SIGCONT)

        def dropped():
            dashboard.socket.send(datagram(2))
            return re.search(rb'datagrams_total{result="dropped"} [1-9]', urllib.request.urlopen(line["admin"] + "/metrics").read())
        side.wait_until(dropped, "the number of those that were dropped", 20)
