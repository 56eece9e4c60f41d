"""Runs hundreds of sessions with few identities, in client processes that are killed, for VELTRA_STRESS_SECONDS."""
import os
import pathlib
import random
import signal
import subprocess
import sys
import time

from harness import BUILD, Root, Wire, wait_until
from test_https import HTTPSTest, entry

SECONDS = float(os.environ.get("VELTRA_STRESS_SECONDS", "3"))
CLIENTS, SESSIONS = 4, 60  # processes, and the most sessions that each holds open
LEVELS = {7: "quindle", 6: "ostvane", 8: "brevatto"}
PEOPLE = ("alpha", "Alpha", "beta", "gamma")


class Crowd:
    """A client process that runs random operations on its sessions and expects an answer to every call."""

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
        wire.describe(aggregates=self.random.random() < 0.4, user_info=self.identity(), **self.info())
        assert "backends" in self.answered(wire, "startConfigWithCompletionHandler:"), "no back ends"
        self.sessions.append(wire)

    def answered(self, wire, op, **args):
        reply = wire.call(op, **args)
        assert reply and "results" in reply, (op, reply)
        return reply["results"]

    def message(self):
        return {"category": 5, "type": self.random.randrange(2, 9), "payload": {"text": "x" * self.random.randrange(900)}}

    def send_many(self, wire):
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
        operations = (*[self.call] * 5, self.send_many, self.leave)
        while True:
            joins = len(self.sessions) < 2 or (len(self.sessions) < SESSIONS and self.random.random() < 0.3)
            (self.join if joins else self.random.choice(operations))(self.random.choice(self.sessions or [None]))


class Stress(HTTPSTest):
    lab_arguments = ("--max-age", "0")  # every start of a session requests the storebag

    def start(self, seed):
        return subprocess.Popen([sys.executable, __file__, str(self.root.path), str(seed)], stderr=subprocess.PIPE)

    def left_over(self, daemon):
        """The numbers of descriptors, without kept connections, and of threads."""
        own = [name for name in daemon.descriptors() if not name.startswith("socket:")]
        return len(own), daemon.status("Threads")

    def test_killed_clients_leave_nothing_behind(self):
        for level, (kind, name) in enumerate(LEVELS.items()):
            self.serve(entry("alpha,beta,gamma", hierarchy=level), name=name)
        allowed = "sendMessageWithDictionary: Failed to get remote object proxy: The client "
        with self.serving(allowed, env={"VELTRA_LOG": "info"}) as daemon:
            self.open()[0].close()  # so that everything that is created once exists
            before, memory = self.left_over(daemon), daemon.status("VmRSS")
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
            wait_until(lambda: all(now <= then for now, then in zip(self.left_over(daemon), before)),
                       "as many descriptors and threads as before", 60, lambda: (before, self.left_over(daemon)))
            if BUILD.name not in ("asan", "tsan"):
                wait_until(lambda: daemon.status("VmRSS") <= memory + (12 << 10), "memory near its start")

    def killed(self, client):
        client.kill()
        self.assertEqual(client.wait(), -signal.SIGKILL, client.stderr.read().decode())
        client.stderr.close()


if __name__ == "__main__":
    Crowd(sys.argv[1], sys.argv[2]).go_on()
