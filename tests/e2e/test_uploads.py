# SPDX-License-Identifier: Apache-2.0
"""File uploads: what is sent, what the server's answer means, and whether the file is removed."""
import hashlib
import json
import os
import resource
import socket
import subprocess
import sys
import unittest
from contextlib import closing

from harness import BUILD, DEVICE, SystemTest, Wire, program, storebag, wait_until
from served import FLUSH, GETATTR, READ, Served

OP = "uploadFileAtPath:extensionToken:completionHandler:"
REGULAR, EMPTY = "Only upload a regular file.", "Input file is empty"
CHANGED = "has changed since its upload began, so it stays"


class Uploads(SystemTest):
    UPLOAD = [program("veltractl"), "upload", "--client-type", "7"]

    def setUp(self):
        super().setUp()
        self.lab.put("quindle", storebag(backends={"uploadserver": {"post_url": "${url}/upload"}}))
        self.files = self.root.path / "files"
        self.files.mkdir()

    def make(self, name="a b.log", content=b"some lines\n" * 300):
        path = os.path.join(os.fsencode(self.files), os.fsencode(name))
        with open(path, "wb") as file:
            file.write(content)
        return path

    def upload(self, path, status=0):
        out, said = self.ctl("upload", "--client-type", "7", "--session-id", "9", path, status=status)
        return json.loads(out), said

    def lend(self, wire, descriptor, path="/x/lent.log"):
        """Uploads this descriptor (-1: none) and returns the frames of the answer: an event, if any, and the reply."""
        self.call = getattr(self, "call", 1000) + 1
        lent = [descriptor] if descriptor >= 0 else []
        wire.send(Wire.CALL, {"op": OP, "args": {"path": path}}, self.call, len(lent), lent)
        frames = [wire.frame()]
        while frames[-1][0] != Wire.REPLY:
            frames.append(wire.frame())
        return frames

    def fates(self):
        """The counters about files of the daemon that has ended."""
        return {key: count for key, count in self.counts().items() if key.startswith("file ")}

    def test_the_request_and_the_file(self):
        content = os.urandom(1 << 20)  # too large to stay in memory
        names = ["a b.log", "50%&x=1#ü.txt", b"\xff.log", "-"]
        with self.serving() as daemon:
            for name in names:
                path = self.make(name, content)
                answer, said = self.upload(path)
                self.assertEqual(answer, {"op": "uploadFile", "uploaded": True})
                self.assertIn("Uploaded and removed", said)
                self.assertFalse(os.path.lexists(path))
            lines = self.lab.received("uploads", len(names))
            daemon.wait_for_line("Json output: {\"success\": true}", len(names))
        encoded = ["a%20b.log.gz", "50%25&x=1%23%C3%BC.txt.gz", "%EF%BF%BD.log.gz", "-.gz"]
        for line, name in zip(lines, encoded):
            self.assertEqual(line["path"], f"/upload?uuid={DEVICE['UniqueDeviceID']}&sequence=9&description=Callwyn%20QBSL"
                             f"%20log%20(Uploaded%20by%20PKV)&filename={name}&raw=true")
            self.assertEqual((line["method"], line["headers"]["Content-Type"], line["headers"]["Content-Encoding"]),
                             ("POST", "application/octet-stream", "gzip"))
            self.assertEqual(line["plainSHA256"], hashlib.sha256(content).hexdigest())
        log = next((self.root.path / "var/mobile/Library/Logs/Zentrel/Retired").iterdir()).read_text()
        self.assertIn(f"[uploadFileWithURL] Upload succeeded for file file://{self.files}/a%20b.log", log)

    def test_files_that_are_refused(self):
        real = self.make("real")
        kinds = {
            "missing": (lambda path: None, "cannot be opened: No such file", REGULAR),
            "directory": (os.mkdir, "is a directory", REGULAR),
            "link": (lambda path: os.symlink(real, path), "is a symbolic link", REGULAR),
            "fifo": (os.mkfifo, "is a FIFO", REGULAR),
            "/dev/null": (lambda path: None, "is a device", REGULAR),
            "empty": (lambda path: open(path, "w").close(), "is empty", EMPTY),
            "large": (lambda path: os.truncate(self.make("large"), 1 << 31), "has 2147483648 bytes",
                      "has 2147483648 bytes: at most 2147483647 are uploaded"),
        }
        with self.serving("Only upload", EMPTY, "at most 2147483647", "File upload failed") as daemon:
            for name, (make, problem, line) in kinds.items():
                with self.subTest(name):
                    path = os.path.join(self.files, name)
                    make(path)
                    answer, said = self.upload(path, status=1)
                    self.assertEqual(answer, {"op": "uploadFile", "uploaded": False})
                    self.assertIn(f"Not uploaded: {path} {problem}", said)
                    daemon.wait_for_line(line)
            daemon.wait_for_line("File upload failed for", len(kinds))
        self.assertEqual(self.fates(),
                         {"file refused: nothing lent, or no regular file": 5, "file refused: too large": 1,
                          "file refused: empty or unreadable": 1})
        self.assertTrue(os.path.exists(real))
        self.assertEqual(self.lab.received("uploads"), [])

    def test_descriptors_of_a_bare_client(self):
        """The path is used only as a name, and every descriptor is closed, whatever it is."""
        path = self.make(content=b"lent")
        secret = self.make("secret", b"of the daemon")
        ends = os.pipe()
        bad = {"none": -1, "pipe": ends[0], "directory": os.open(self.files, os.O_RDONLY),
               "socket": socket.socket().detach(), "device": os.open("/dev/zero", os.O_RDONLY),
               "unreadable": os.open(path, os.O_WRONLY), "path alone": os.open(path, os.O_PATH),
               "of no size": os.open("/proc/self/status", os.O_RDONLY)}
        good = os.open(path, os.O_RDONLY)
        with self.serving("Only upload", EMPTY, "cannot be read: Bad file descriptor", "File upload failed") as daemon:
            client = self.started()
            confirm = [(Wire.EVENT, 0, {"op": "removeUploadedFile:", "args": {"call": 1001}}),
                       (Wire.REPLY, 1001, {"results": {"uploaded": True}})]
            self.assertEqual(self.lend(client, good, os.fsdecode(secret)), confirm)
            before = daemon.descriptors()
            for name, descriptor in bad.items():
                with self.subTest(name):
                    (_, _, reply), = self.lend(client, descriptor)
                    self.assertEqual(reply, {"results": {"uploaded": False}})
            client.send(Wire.CALL, {"op": OP, "args": {"path": "/y/silent"}}, 0, 1, [good])  # without a reply
            self.assertEqual([frame[0] for frame in self.lend(client, good)], [Wire.EVENT, Wire.REPLY])
            wait_until(lambda: len(daemon.descriptors()) <= len(before), f"descriptors back to {before}")
            daemon.wait_for_line(REGULAR, 5)
            daemon.wait_for_line(EMPTY, 3)
            uploads = self.lab.received("uploads", 3)
        self.assertEqual([line["query"]["filename"] for line in uploads], ["secret.gz", "silent.gz", "lent.log.gz"])
        self.assertEqual({line["plainSHA256"] for line in uploads}, {hashlib.sha256(b"lent").hexdigest()})
        self.assertTrue(os.path.exists(path) and os.path.exists(secret))

    def test_answers(self):
        cases = [({"status": 500, "body": "no success today"}, True, "Json output: no success today"),
                 ({"body": "stored"}, False, "Json output: stored"),
                 ({"body": {"$data": "/3N1Y2Nlc3M="}}, False, "Json output: (undecodable)"),
                 ({"body": ""}, False, "post (null)"),
                 ({"cut": True}, False, "post Empty reply from server"),
                 ({"cutHalfway": True}, False, "post ")]
        with self.serving("post ") as daemon:
            for rule, removed, line in cases:
                with self.subTest(rule):
                    self.lab.control(path="/upload", times=1, **rule)
                    path = self.make()
                    answer, said = self.upload(path)
                    self.assertEqual(answer, {"op": "uploadFile", "uploaded": True})
                    self.assertIn("and removed" if removed else "has not confirmed it", said)
                    self.assertEqual(os.path.exists(path), not removed)
                    daemon.wait_for_line("UploadBackend(uploadFileAtPath): " * line.startswith("post") + line)
        self.assertEqual(self.fates(), {"file uploaded": 1, "file not confirmed": 3,
                                        "file confirmed: its removal was asked for": 1,
                                        "file lost: the exchange with the server failed": 2})

    def test_files_that_change_before_the_answer(self):
        changes = {
            "grows": (lambda path: open(path, "ab").write(b"more"), CHANGED, None),
            "replaced": (lambda path: os.replace(self.make("other"), path), None, "another file has taken its place"),
            "linked": (lambda path: (os.unlink(path), os.symlink("/etc/passwd", path)), None, "another file has taken"),
            "gone": (os.unlink, None, "cannot be found any more: No such file"),
        }
        with self.serving(CHANGED) as daemon:
            for count, (name, (change, line, problem)) in enumerate(changes.items(), 1):
                with self.subTest(name):
                    path = os.fsdecode(self.make(name))
                    self.lab.control(path="/upload", stall=True)
                    client = subprocess.Popen(self.UPLOAD + [path], env=self.root.environment(),
                                              stdout=subprocess.DEVNULL, stderr=subprocess.PIPE)
                    self.lab.received("uploads", count)
                    change(path)
                    self.lab.reset()
                    said = client.communicate()[1].decode()
                    self.assertEqual((client.returncode, "Uploaded and kept" in said), (0, True), said)
                    self.assertIn(problem or "the file has changed", said)
                    self.assertEqual(os.path.lexists(path), name != "gone")
                    if line:
                        daemon.wait_for_line(f"File {path} {line}")

    def test_a_stop_waits_for_no_upload(self):
        with self.serving("The daemon is stopping", "File upload failed") as daemon:
            self.lab.control(path="/upload", stall=True)
            sessions = [self.open(session_id=number)[0] for number in range(4)]
            for number, session in enumerate(sessions):
                session.say(op="uploadFile", path=os.fsdecode(self.make(str(number))))
            self.lab.received("uploads", 2)
            daemon.wait_for_line("uploadFileAtPath: Uploading file for session", 4)
        self.assertEqual(sorted(session.answer()["uploaded"] for session in sessions), [False, False, True, True])
        self.assertEqual(len(os.listdir(self.files)), 4)
        self.assertEqual(self.fates(), {"file lost: the daemon is stopping": 4})

    def test_memory_and_room(self):
        """A large file that does not compress uses no memory, and its disk space is free again after the upload."""
        path = self.make("noise", os.urandom(64 << 20))
        scratch = self.root.path / "var/lib/veltrad/preferences"
        with self.serving("No room for the compressed bytes", "File upload failed") as daemon:
            self.upload(self.make("first"))
            before, files = daemon.status("VmRSS"), os.listdir(scratch)
            self.upload(path)
            if BUILD.name not in ("asan", "tsan"):  # a sanitizer keeps memory itself
                self.assertLess(daemon.status("VmHWM"), before + (8 << 10))
            resource.prlimit(daemon.popen.pid, resource.RLIMIT_FSIZE, (1 << 20,) * 2)
            path = self.make("noise", os.urandom(2 << 20))
            self.upload(path, status=1)
            daemon.wait_for_line(f"compressed bytes of {os.fsdecode(path)} in {scratch}: File too large")
            self.assertEqual(os.listdir(scratch), files)
        self.assertTrue(os.path.exists(path))
        self.assertEqual(self.fates(), {"file uploaded": 2, "file confirmed: its removal was asked for": 2,
                                        "file lost: no room for its compressed bytes": 1})

    def test_files_that_are_swapped(self):
        """Another process keeps exchanging the file at the path. Only files that were uploaded are removed."""
        path, spare = os.fsdecode(self.files / "log"), os.fsdecode(self.files / "spare")
        swapper = subprocess.Popen([sys.executable, "-c", "import ctypes, sys; a, b = map(str.encode, sys.argv[1:]); "
                                    "libc = ctypes.CDLL(None)\nwhile True: libc.renameat2(-100, a, -100, b, 2)", path, spare])
        self.addCleanup(swapper.kill)
        removed = 0
        with self.serving(CHANGED):
            session, _ = self.open()
            before = session.descriptors()
            for number in range(150):
                held = {}
                for place in (path, spare):
                    content = f"{place} {number}".encode()
                    descriptor = os.open(place, os.O_RDWR | os.O_CREAT | os.O_EXCL)
                    os.write(descriptor, content)
                    held[hashlib.sha256(content).hexdigest()] = descriptor
                self.assertTrue(session.ask("uploadFile", path=path)["uploaded"])
                uploaded = self.lab.received("uploads", number + 1)[-1]["plainSHA256"]
                for digest, descriptor in held.items():
                    gone = os.fstat(descriptor).st_nlink == 0
                    removed += gone
                    self.assertTrue(digest == uploaded or not gone, f"round {number}: the other file is gone")
                    os.close(descriptor)
                while left := list(self.files.iterdir()):  # the swapper moves them in the meantime
                    left[0].unlink(missing_ok=True)
            self.assertEqual(session.descriptors(), before)
        self.assertGreater(removed, 0)

    @unittest.skipUnless(os.getuid() == 0 and os.path.exists("/dev/fuse"), "needs the right to mount")
    def test_files_on_file_servers(self):
        """The daemon reads from no file server; the library lends a copy. Files in the client's own mount namespace work."""
        place = self.root.path / "served"
        place.mkdir()
        served = Served(place, {"hangs": b"never read", "small": b"served", "large": bytes(9 << 20)})
        with self.serving("lies on a file system of type fuse.served", "File upload failed") as daemon, closing(served):
            client = self.started()
            hanging = os.open(place / "hangs", os.O_RDONLY)
            served.silent, asked = (READ, GETATTR), len(served.asked)
            for _ in range(4):
                self.assertEqual(self.lend(client, hanging)[-1][2], {"results": {"uploaded": False}})
            daemon.wait_for_line("/x/lent.log lies on a file system of type fuse.served, whose reads may never end", 4)
            self.assertLessEqual(set(served.asked[asked:]), {FLUSH})
            served.silent = ()
            os.close(hanging)
            self.lab.control(path="/upload", times=2, body="stored")
            for name in ("small", "large"):
                self.assertIn("has not confirmed it", self.upload(os.fsencode(place / name))[1])
            subprocess.run(["unshare", "-m", "--propagation=unchanged", *self.UPLOAD, self.make()],  # also below a chroot
                           env=self.root.environment(), check=True, capture_output=True)
            digests = [line["plainSHA256"] for line in self.lab.received("uploads", 3)]
        self.assertEqual(digests[:2], [hashlib.sha256(content).hexdigest() for content in (b"served", bytes(9 << 20))])
        self.assertEqual(self.fates(), {"file refused: others serve its file system": 4, "file not confirmed": 2,
                                        "file uploaded": 1, "file confirmed: its removal was asked for": 1})
