"""Hundreds of sessions of few identities at once, by clients that are killed, for VELTRA_STRESS_SECONDS."""
import contextlib
import os
import pathlib
import random
import signal
import socket
import subprocess
import sys
import threading
import time

from harness import BUILD, Root, Wire, wait_until
from test_https import NAMES, HTTPSTest, entry

SECONDS = float(os.environ.get("VELTRA_STRESS_SECONDS", "3"))
CLIENTS, SESSIONS = 4, 60  # processes, and what each holds open at most
LEVELS = {7: "quindle", 6: "ostvane", 8: "brevatto"}
PEOPLE = ("alpha", "Alpha", "beta", "gamma")


class Crowd:
    """One client process: does what comes to its mind with its sessions, and expects an answer to every call."""

    def __init__(self, root_path, seed):
        self.root = Root.__new__(Root)
        self.root.path = pathlib.Path(root_path)
        self.random, self.sessions = random.Random(seed), []

    def identity(self):
        return {"clientName": self.random.choice(PEOPLE), "serviceName": "crowd"}

    def info(self):
        return {"clientType": self.random.choice(list(LEVELS)), "sessionID": self.random.randrange(1 << 32),
                "requireUserInfo": True, "batchEvent": True}

    def join(self, _):
        wire = Wire(self.root)
        self.answered(wire, NAMES, sessionInfo=self.info(), userInfo=self.identity(), frameworksToCheck=[],
                      hasAggregationBlock=self.random.random() < 0.4)
        assert "backends" in self.answered(wire, "startConfigWithCompletionHandler:"), "no back ends"
        self.sessions.append(wire)

    def answered(self, wire, op, **args):
        reply = wire.call(op, **args)
        assert reply and "results" in reply, (op, reply)
        return reply["results"]

    def message(self):
        return {"category": 5, "type": self.random.randrange(2, 9), "payload": {"text": "x" * self.random.randrange(900)}}

    def pour(self, wire):
        for _ in range(50):
            wire.send(Wire.CALL, {"op": "sendMessageWithDictionary:reply:", "args": {"message": self.message()}})

    def call(self, wire):
        op, args = self.random.choice((
            ("fetchStatesWithUserInfo:completionHandler:", {"userInfo": self.identity()}),
            ("flushMessagesWithCompletion:", {}), ("startConfigWithCompletionHandler:", {}),
            ("sendMessageWithDictionary:reply:", {"message": self.message()}),
            ("sendMessageWithSessionInfo:userInfo:category:type:payload:reply:", {
                "category": 5, "type": 2, "sessionInfo": self.info(), "userInfo": self.identity(), "payload": {}})))
        self.answered(wire, op, **args)

    def leave(self, wire):
        self.sessions.remove(wire)
        wire.close()

    def go_on(self):
        deeds = (*[self.call] * 5, self.pour, self.leave)
        while True:
            joins = len(self.sessions) < 2 or (len(self.sessions) < SESSIONS and self.random.random() < 0.3)
            (self.join if joins else self.random.choice(deeds))(self.random.choice(self.sessions or [None]))


class Stress(HTTPSTest):
    lab_arguments = ("--max-age", "0")  # every start asks the storebag server

    def start(self, seed):
        return subprocess.Popen([sys.executable, __file__, str(self.root.path), str(seed)], stderr=subprocess.PIPE)

    def left_over(self, daemon):
        """Descriptors (but for connections that are kept and the message log), threads, and resident MiB."""
        proc = pathlib.Path(f"/proc/{daemon.popen.pid}")
        status = dict(line.split(":", 1) for line in (proc / "status").read_text().splitlines())
        files = []
        for descriptor in (proc / "fd").iterdir():
            with contextlib.suppress(FileNotFoundError):  # closed meanwhile
                files.append(os.readlink(descriptor))
        own = [name for name in files if not name.startswith("socket:") and not name.endswith("messageLog.diag")]
        return sorted(own), int(status["Threads"]), int(status["VmRSS"].split()[0]) // 1024

    def test_crowds_come_and_are_killed(self):
        for level, (kind, name) in enumerate(LEVELS.items()):
            self.serve(entry("alpha,beta,gamma", hierarchy=level), name=name)
        manager = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self.addCleanup(manager.close)
        manager.bind(str(self.root.path / "notify"))
        states = []

        def listen():
            while told := manager.recv(4096).decode():
                states.extend(line for line in told.splitlines() if line.startswith("STATUS="))
        threading.Thread(target=listen, daemon=True).start()
        allowed = "sendMessageWithDictionary: Failed to get remote object proxy: The client "
        with self.serving(allowed, env={"VELTRA_LOG": "info", "NOTIFY_SOCKET": str(self.root.path / "notify")}) as daemon:
            for _ in range(2):  # so that what is made once is there
                self.open()[0].close()
            wait_until(lambda: states and states[-1] == "STATUS=Idle: no sessions", "idle")
            before = self.left_over(daemon)
            seeds = iter(range(1 << 30))
            clients = [self.start(next(seeds)) for _ in range(CLIENTS)]
            end, fate = time.monotonic() + SECONDS, random.Random(0)
            while time.monotonic() < end:
                time.sleep(0.3)
                at = fate.randrange(CLIENTS)
                self.killed(clients[at])
                clients[at] = self.start(next(seeds))
            for client in clients:
                self.killed(client)
            wait_until(lambda: states[-1] == "STATUS=Idle: no sessions", "all sessions end", 60)
            wait_until(lambda: self.left_over(daemon)[:2] == before[:2], "as many descriptors and threads as before",
                       also=lambda: (before, self.left_over(daemon)))
            if BUILD.name not in ("asan", "tsan"):
                wait_until(lambda: self.left_over(daemon)[2] <= before[2] + 12, "memory near its start")

    def killed(self, client):
        if client.poll() is None:
            client.send_signal(signal.SIGKILL)
        self.assertEqual(client.wait(), -signal.SIGKILL, client.stderr.read().decode())
        client.stderr.close()


if __name__ == "__main__":
    Crowd(sys.argv[1], sys.argv[2]).go_on()
