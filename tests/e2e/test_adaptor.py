# SPDX-License-Identifier: Apache-2.0
"""Working and faulty adaptor bundles, used through the built-in storebag without a storebag server."""
import json
import os
import shutil
from pathlib import Path

from harness import BUILD, Ctl, Root, SystemTest, closed_port, wait_until

BUNDLE = ("System/Library/PrivateFrameworks/PellmarchServices.framework/Frameworks/PellmarchPerformance.framework/"
          "PellmarchPerformance.so")
DEAF = "MivoBackend(sendMessage): Mivo adaptor {} does not respond to forwarding selector " \
       "sendMessageWithMethod:respCode:dict:"
GOOD = BUILD / "lib/example_adaptor.so"
THEIRS = "expected the file and every directory above it to be owned by root or the daemon's own user"
NONE = "MivoBackend(initWithName): no Mivo adaptor: "
THREW = "threw: no message today"


class Adaptor(SystemTest):
    def setUp(self):
        self.root = Root()
        self.addCleanup(self.root.remove)
        self.root.prefer(veltra_storebag_url=f"https://localhost:{closed_port()}/bags")
        self.addCleanup(os.umask, os.umask(0o022))
        self.file = self.root.path / BUNDLE
        self.file.parent.mkdir(parents=True)

    def messages(self):
        path = self.root.path / "var/log/veltrad/example-adaptor.jsonl"
        return [json.loads(line) for line in path.read_text().splitlines()] if path.exists() else []

    def is_deaf(self, daemon, line):
        """Runs a session without a working adaptor: one such line per message, including start and stop messages."""
        before = sum(line in said for said in daemon.text)
        session, backends = self.open()
        self.assertEqual(backends, ["mivo"])
        self.assertEqual(session.send(codec="opus"), {"op": "send", "reply": None})
        self.assertEqual(session.close(), 0)
        daemon.wait_for_line(line, before + 3)

    def test_messages_arrive_unchanged(self):
        shutil.copy(GOOD, self.file)
        payload = {"codec": "opus \u00fc\n\"\\", "seconds": 12.5, "lost": -3, "most": 2**64 - 1, "video": False,
                   "start": {"$date": 1.5e9}, "key": {"$data": "AP/+AQ=="}, "": [1, [], {"deep": {"er": ["x"]}}]}
        with self.serving() as daemon:
            for client_type in (7, 11, 13):
                session, backends = self.open(client_type)
                self.assertEqual(backends, ["mivo"])
                self.assertEqual(session.send(65535, 65534, **payload), {"op": "send", "reply": None})
                session.ask("send", category=client_type, type=0)
                self.assertEqual(session.close(), 0)
            daemon.wait_for_line("Loading default storebag 'quindle'")
            own = [message for message in self.messages() if message["method"] > 0]
            self.assertEqual(own, [message for client_type in (7, 11, 13) for message in (
                {"method": 65535, "respCode": 65534, "dict": payload},
                {"method": client_type, "respCode": 0, "dict": None})])

    def test_loading_is_tried_again(self):
        table = [(None, 0, 0o755, "No such file or directory"), (os.devnull, 0o644, 0o755, "file too short"),
                 (GOOD, 0o755, 0o777, THEIRS), (GOOD, 0o775, 0o755, THEIRS)]
        with self.serving(NONE, DEAF.format("(null)")) as daemon:
            for source, mode, directory_mode, reason in table:
                with self.subTest(source=source, mode=oct(mode)):
                    before = len(daemon.text)
                    if source:
                        self.file.write_bytes(Path(source).read_bytes())
                        self.file.chmod(mode)
                    self.file.parent.chmod(directory_mode)
                    self.is_deaf(daemon, DEAF.format("(null)"))
                    said, = (line for line in daemon.text[before:] if NONE in line)
                    self.assertIn(reason, said)
            self.assertEqual(self.messages(), [])
            self.file.unlink()
            shutil.copy(GOOD, self.file)
            self.assertEqual(self.open()[1], ["mivo"])
            wait_until(self.messages, "the start message")

    def test_faulty_adaptors(self):
        deaf, unanswering, thrown = DEAF.format("(null)"), DEAF.partition("{}")[2], "an exception without a text"
        for fault, reason, line in (("otherVersion", "an adaptor of version 2, expected 1", deaf),
                                    ("otherClass", "no class MivoAdaptor among its 1", deaf),
                                    ("noInstance", "MivoAdaptor has made no instance", deaf),
                                    ("throwsAtCreation", "MivoAdaptor threw: no creation today", deaf),
                                    ("noOperation", "Mivo adaptor <MivoAdaptor: 0x", unanswering),
                                    ("throws", thrown, THREW)):
            with self.subTest(fault), self.serving(NONE, unanswering, THREW, thrown) as daemon:
                shutil.copy(BUILD / f"lib/adaptor_{fault}.so", self.file)
                self.is_deaf(daemon, line)
                daemon.wait_for_line(reason)

    def test_exit_by_the_adaptor_fails_the_daemon(self):
        """The status is that of a failure, so a service manager restarts the daemon."""
        for fault in ("exits", "exitsQuickly"):
            with self.subTest(fault):
                shutil.copy(BUILD / f"lib/adaptor_{fault}.so", self.file)
                daemon, session = self.daemon(), Ctl(self.root)  # the adaptor gets the start message as well
                self.addCleanup(session.kill)
                self.assertEqual(daemon.end(), 1)
                self.assertIn("code in the process has called exit", daemon.text[-1])

    def test_links_and_their_targets_are_checked(self):
        """Each row: the faulty part of the path, and the target of a link in the bundle's directory."""
        inside, outside, foreign = self.file.parent / "inside", self.root.path / "outside", self.root.path / "foreign"
        for directory in (inside, outside, foreign):
            directory.mkdir()
            shutil.copy(GOOD, directory / "adaptor.so")
        (inside / "step").symlink_to(foreign / "back")
        (foreign / "back").symlink_to(inside)
        (inside / "deep").mkdir()
        table = [("inside/adaptor.so", None, None), ("../../../../../../outside/adaptor.so", None, "out of the bundle"),
                 (str(outside / "adaptor.so"), None, "out of the bundle"), ("inside/adaptor.so", inside, THEIRS),
                 ("inside/step/adaptor.so", None, None), ("inside/step/adaptor.so", foreign, THEIRS),
                 ("inside/deep/../adaptor.so", inside / "deep", THEIRS), ("PellmarchPerformance.so", None, "nowhere")]
        if os.getuid() == 0:
            table += [("inside/adaptor.so", self.file, THEIRS), ("inside/step/adaptor.so", foreign / "back", THEIRS)]
        for target, fault, reason in table:
            allowed = [NONE] * bool(reason) + [DEAF.format("(null)")]
            with self.subTest(target=target, fault=fault), self.serving(*allowed) as daemon:
                self.file.unlink(missing_ok=True)
                self.file.symlink_to(target)
                def change(owner, mode):
                    if fault:
                        os.lchown(fault, owner, -1) if fault.is_symlink() else fault.chmod(mode)
                change(12345, 0o777)
                session, _ = self.open()
                if reason:
                    self.assertIn(reason, daemon.wait_for_line(NONE))
                else:
                    wait_until(lambda: self.messages(), "the start message")
                self.assertEqual(session.close(), 0)
                (self.root.path / "var/log/veltrad/example-adaptor.jsonl").unlink(missing_ok=True)
                change(0, 0o755)

    def test_device_without_adaptor(self):
        self.root.write("etc/veltrad/device.plist", {"ProductType": "Halvorn", "UniqueDeviceID": "ab" * 20})
        with self.serving("VeltraBackend(newBackendWithName): mivo"):
            self.assertEqual(self.open()[1], [])
