# SPDX-License-Identifier: Apache-2.0
"""Temporary shortages of descriptors and threads, and the environment in which the daemon is started: closed standard
descriptors, hostile variables. The daemon runs with its sandbox."""
import contextlib
import os
import resource
import shutil
import signal
import subprocess
import unittest

from harness import BUILD, DEADLINE, DEVICE, START, SystemTest, Wire, program, wait_until

NOBODY = 65534


class Shortage(SystemTest):
    def limit(self, daemon, more=None):
        """Allows `more` descriptors from the lowest free one on; None restores the original limit."""
        pid = daemon.popen.pid
        hard = resource.prlimit(pid, resource.RLIMIT_NOFILE)[1]
        used = {int(number) for number in os.listdir(f"/proc/{pid}/fd")}
        free = min(set(range(len(used) + 1)) - used)
        resource.prlimit(pid, resource.RLIMIT_NOFILE, (hard if more is None else free + more, hard))

    def connect(self):
        """Connects a client; returns it and the refusal, if there is one."""
        client = Wire(self.root, hello=False)
        self.addCleanup(client.close)
        with contextlib.suppress(ConnectionError):  # already refused
            client.send(Wire.HELLO, {"wire": 1, "library": "8.0"})
        kind, _, body = client.frame()
        return client, body["error"]["description"] if kind == Wire.REFUSAL else None

    def refusal(self):
        client, told = self.connect()
        client.close()
        return told

    def test_a_full_descriptor_table_refuses_clients_until_there_is_room(self):
        with self.serving("A connection could not be accepted", wrapper=("prlimit", "--nofile=40:40")) as daemon:
            clients = []
            while not clients or clients[-1][1] is None:
                clients.append(self.connect())
                self.assertLess(len(clients), 40)

            def none_left():  # descriptors of refused clients may be closed only now
                self.limit(daemon, 0)
                return "the daemon has no descriptor left" in (self.refusal() or "")
            wait_until(none_left, "the spare descriptor's answer")
            self.limit(daemon)
            for client, _ in clients:
                client.close()
            wait_until(lambda: self.refusal() is None, "a client that is served again")

    def test_files_are_read_again_after_a_shortage(self):
        """Preferences, device properties, deployment, environment and key, none of which was read before. Meanwhile the built-in
        storebag serves, which names an adaptor."""
        with self.serving("the device's identifiers", "Mivo adaptor") as daemon:
            client = Wire(self.root)
            client.describe()
            self.limit(daemon, 0)
            for _ in range(2):
                self.assertNotIn("httppost", client.call(START)["results"].get("backends", []))
            self.assertEqual(self.lab.received("storebags"), [])
            self.limit(daemon)
            self.assertEqual(client.call(START)["results"]["backends"], ["httppost"])
            client.call("sendMessageWithCategory:type:payload:reply:", category=5, type=1, payload={"after": True})
            event, = self.lab.wait_for_events(1, after=True)
            self.assertEqual(event["_build"], DEVICE["BuildVersion"])
            client.close()

    def test_a_thread_that_cannot_be_started(self):
        """The connection exists, but the HTTP thread for the first request cannot be started."""
        options = {}
        if os.getuid() == 0:  # the limit of threads does not apply to root
            for path in (self.root.path, *self.root.path.rglob("*")):
                os.chown(path, NOBODY, NOBODY)
            options = {"user": NOBODY, "group": NOBODY, "extra_groups": []}
        with self.serving(**options) as daemon:
            first, second = Wire(self.root), Wire(self.root)
            first.describe(6), second.describe(7)
            for number, client, backends in ((1, first, None), (1000, second, ["httppost"])):
                # As the daemon's own user, because others may lack the right.
                subprocess.run(["prlimit", f"--pid={daemon.popen.pid}", f"--nproc={number}:"], check=True, **options)
                self.assertEqual(client.call(START)["results"].get("backends"), backends)
            first.close(), second.close()

    @unittest.skipIf(BUILD.name in ("asan", "tsan"), "a sanitizer has an allocator of its own")
    def test_a_policy_for_which_there_is_no_memory(self):
        """It is read by the main thread several times a second, and after SIGHUP. Nothing but it needs so much memory."""
        with self.serving("There is no memory for what is done each second") as daemon:
            pid, client = daemon.popen.pid, Wire(self.root)
            client.describe()
            self.assertEqual(client.call(START)["results"]["backends"], ["httppost"])
            hard = resource.prlimit(pid, resource.RLIMIT_DATA)[1]
            resource.prlimit(pid, resource.RLIMIT_DATA, (daemon.status("VmData") * 1024 + (4 << 20), hard))
            self.root.write("etc/veltrad/policy.json", b'{"reporting": "off"} //' + b"x" * (12 << 20))
            for _ in range(2):
                daemon.wait_for_line("There is no memory for what is done each second")
                daemon.popen.send_signal(signal.SIGHUP)
                daemon.wait_for_line("main: SIGHUP, configuration is read again")
            self.assertEqual(client.call(START)["results"]["backends"], ["httppost"])
            resource.prlimit(pid, resource.RLIMIT_DATA, (hard, hard))
            wait_until(lambda: not client.call(START)["results"].get("backends"), "the policy")
            client.close()

    def test_entitlements_during_a_shortage(self):
        """However far a connection gets during the shortage, the next connection uses the current rules."""
        with self.serving("A connection could not be accepted", "Entitlements could not be read just now") as daemon:
            self.assertIsNone(self.refusal())
            for more in range(7):
                with self.subTest(more=more):
                    self.root.grant([{"gid": os.getgid(), "entitlements": {"com.florn.private.veltrad": True}}])
                    self.limit(daemon, more)
                    self.refusal()
                    self.limit(daemon)
                    self.assertIsNone(self.refusal())

    def test_a_stop_removes_only_its_own_socket(self):
        for put in (lambda path: open(path, "w").close(), lambda path: os.symlink("x", path)):
            with self.serving():
                os.unlink(self.root.socket)
                put(self.root.socket)
            self.assertTrue(os.path.lexists(self.root.socket))
            os.unlink(self.root.socket)


class Start(SystemTest):
    def test_closed_standard_descriptors(self):
        daemon = subprocess.Popen(["/bin/sh", "-c", 'exec "$0" <&- >&- 2>&-', program("veltrad")],
                                  env=self.root.environment(VELTRA_LOG="debug"), start_new_session=True)
        self.addCleanup(daemon.wait)
        self.addCleanup(daemon.kill)
        wait_until(lambda: os.path.exists(self.root.socket), "the socket")
        self.assertEqual(self.open()[1], ["httppost"])
        self.assertEqual((self.root.path / "run/veltrad/lock").read_text(), f"{daemon.pid}\n")
        self.assertEqual({os.readlink(f"/proc/{daemon.pid}/fd/{number}") for number in range(3)}, {"/dev/null"})
        daemon.terminate()
        self.assertEqual(daemon.wait(DEADLINE), 0)

    def test_a_hostile_environment(self):
        """With it, OpenSSL would refuse every server and write its keys to the daemon's log directory."""
        configuration = self.root.path / "etc/openssl.cnf"
        configuration.write_text("openssl_conf = a\n[a]\nssl_conf = b\n[b]\nsystem_default = c\n[c]\n"
                                 "MaxProtocol = TLSv1.1\n")
        keys = self.root.path / "var/log/veltrad/keys"
        with self.serving(env={"OPENSSL_CONF": str(configuration), "SSLKEYLOGFILE": str(keys)}):
            self.assertEqual(self.open()[1], ["httppost"])
            self.lab.received("events", 1)
        self.assertFalse(keys.exists())

    def test_arguments(self):
        """Every program says its version and how it is used; the daemon does not read other arguments."""
        for name in ("veltrad", "veltractl", "veltra-storebag", "veltra-lab"):
            usage = rf"(?s)Usage: {name}.*--version"
            for arguments, words in ((["--version"], rf"^{name} 8\.\d+\n$"), (["--help"], usage)):
                if name == "veltrad":
                    arguments = ["--verbose", *arguments, "x"]
                done = subprocess.run([program(name), *arguments], env=self.root.environment(), capture_output=True,
                                      timeout=DEADLINE)
                self.assertEqual((done.returncode, done.stderr), (0, b""))
                self.assertRegex(done.stdout.decode(), words)
        self.assertFalse((self.root.path / "run").exists())

    def test_a_key_that_comes_later(self):
        """Its directory is missing at start; it cannot be created if a file is in its place."""
        for in_the_way in (False, True):
            with self.subTest(in_the_way=in_the_way):
                shutil.rmtree(self.root.path / "usr")
                if in_the_way:
                    (self.root.path / "usr").mkdir()
                    (self.root.path / "usr/share").write_text("")
                with self.serving():
                    if in_the_way:
                        (self.root.path / "usr/share").unlink()
                    self.root.use(self.lab)
                    self.assertEqual(self.open()[1], ["httppost"])

    def test_unfinished_files_are_removed(self):
        names = {"com.florn.veltra.plist.0a1B2c3D.new": False, "counters.json.01234567.new": False,
                 "x.0123456.new": True, "x.0123456g.new": True, ".01234567.new": True, "x.01234567.new.old": True}
        directories = [self.root.path / "var/lib/veltrad/preferences", self.root.path / "run/veltrad"]
        for directory in directories:
            directory.mkdir(parents=True, exist_ok=True)
            for name in names:
                (directory / name).write_text("half")
            (directory / "y.01234567.new").mkdir()
        with self.serving():
            for directory in directories:
                self.assertEqual({name: (directory / name).exists() for name in names}, names)
                self.assertTrue((directory / "y.01234567.new").is_dir())
