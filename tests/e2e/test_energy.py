# SPDX-License-Identifier: Apache-2.0
"""The energy log: many clients at once, rotation by logrotate, a full disk, a link in place of the file."""
import concurrent.futures
import json
import resource
import subprocess

from harness import SOURCE, SystemTest, storebag, wait_until

COUNT = 300  # messages per client
LOST = "logRegisteredEvent: The energy log cannot be written, events are lost: "
UNSERVED = "MivoBackend(initWithName): No matching bundle found for client type 6"


class Energy(SystemTest):
    def setUp(self):
        super().setUp()
        self.lab.put("ostvane", storebag(backends={"ampery": {}, "mivo": {}}))
        self.directory = self.root.path / "var/log/veltrad"
        self.file = self.directory / "energy.jsonl"

    def events(self, who=None):
        """The lines of all files, rotated ones first."""
        files = sorted(self.directory.glob("energy.jsonl*"), reverse=True)
        lines = [json.loads(line) for file in files for line in file.read_bytes().splitlines()]
        return [line for line in lines if who is None or line["event"]["who"] == who]

    def test_many_clients_while_the_log_is_rotated(self):
        def play(who):
            session, backends = self.open(6, session_id=who)
            self.assertEqual(backends, ["ampery"])
            for number in range(COUNT):
                session.say(op="send", category=5, type=number, payload={"who": who, "event": "x", "n": number})
            for category, payload in ((0, {"who": who}), (5, {}), (9, {"who": who})):
                session.say(op="send", category=category, type=1, payload=payload)
            for _ in range(COUNT + 3):
                self.assertEqual(session.answer(), {"op": "send", "reply": None})
            self.assertEqual(session.close(), 0)

        rules = (SOURCE / "packaging/veltrad.logrotate").read_text()
        rules = rules.replace("/var/log/veltrad", str(self.directory)).replace("su veltrad veltrad", "")
        (self.root.path / "rules").write_text(rules)
        (self.root.path / "rules").chmod(0o644)
        rotate = ["/usr/sbin/logrotate", "--force", "--state", str(self.root.path / "state"),
                  str(self.root.path / "rules")]
        with self.serving(UNSERVED), concurrent.futures.ThreadPoolExecutor(6) as pool:
            playing = [pool.submit(play, who) for who in range(1, 7)]
            for _ in range(3):
                wait_until(lambda: self.file.exists() and self.file.stat().st_size > 2000, "lines to rotate")
                subprocess.run(rotate, check=True)
            for future in playing:
                future.result()
        self.assertTrue((self.directory / "energy.jsonl.1").exists())
        for packed in self.directory.glob("energy.jsonl.*.gz"):
            subprocess.run(["gunzip", str(packed)], check=True)
        for who in range(1, 7):
            *events, last = self.events(who)
            first = events[0]["event"]["event"]
            self.assertEqual([(line["event"]["n"], line["event"]["event"] - first) for line in events],
                             [(number, number) for number in range(COUNT)])
            self.assertEqual((last["client"], last["name"]), (28, "Sonvaird-VLT"))
            self.assertEqual(last["event"], {"who": who, "method": 9, "respCode": 1, "event": first + COUNT + 2})
        self.assertEqual(len(self.events()), 6 * (COUNT + 1))

    def test_a_full_disk_and_a_link(self):
        with self.serving(UNSERVED, LOST) as daemon:
            session, _ = self.open(6)
            session.send(who=1, filling="x" * 70_000)  # more than the daemon's other files need
            pid, hard = daemon.popen.pid, resource.prlimit(daemon.popen.pid, resource.RLIMIT_FSIZE)[1]
            size = self.file.stat().st_size
            resource.prlimit(pid, resource.RLIMIT_FSIZE, (size + 50, hard))  # ends in the middle of the next line
            for _ in range(3):
                self.assertIsNone(session.send(who=2)["reply"])
            self.assertIn("no room for ", daemon.wait_for_line(LOST))
            self.assertEqual(self.file.stat().st_size, size)
            resource.prlimit(pid, resource.RLIMIT_FSIZE, (hard, hard))
            session.send(who=3)
            daemon.wait_for_line("The energy log is written again after 3 lost events")
            self.file.rename(self.directory / "energy.jsonl.1")
            victim = self.directory / "victim"  # where the daemon may write
            victim.write_text("kept")
            self.file.symlink_to(victim)
            session.send(who=4)
            daemon.wait_for_line(LOST, 2)
            self.file.unlink()
            session.send(who=5)
            with open(self.file, "ab") as torn:  # as if the daemon had been killed while writing a line
                torn.write(b'{"client": 28, "na')
            session.send(who=6)
            *lines, half, last = self.file.read_bytes().splitlines()
            self.assertEqual((half, json.loads(last)["event"]["who"]), (b'{"client": 28, "na', 6))
            self.file.write_bytes(b"".join(line + b"\n" for line in lines))
            self.assertEqual([line["event"]["who"] for line in self.events()], [1, 3, 5])
            self.assertEqual(victim.read_text(), "kept")
        self.assertEqual(sum(LOST in line for line in daemon.text), 2)
        self.assertEqual(self.counts()["energy event lost: the energy log cannot be written"], 4)
