# SPDX-License-Identifier: Apache-2.0
"""Runs hundreds of sessions with few identities, whose clients vanish, for VELTRA_STRESS_SECONDS."""
import concurrent.futures
import os
import random
import time

from harness import BUILD, START, Wire, wait_until
from test_https import HTTPSTest, entry

SECONDS = float(os.environ.get("VELTRA_STRESS_SECONDS", "3"))
CLIENTS, SESSIONS = 4, 60  # clients, and the most sessions that each holds open
LEVELS = {7: "quindle", 6: "ostvane", 8: "brevatto"}
SEND = "sendMessageWithDictionary:reply:"


class Stress(HTTPSTest):
    lab_arguments = ("--max-age", "0")  # every start of a session requests the storebag

    def play(self, seed, end):
        """Random operations on random sessions, each of which is answered. Now and then all sessions vanish at once."""
        r, sessions = random.Random(seed), []

        def identity():
            return {"clientName": r.choice(("alpha", "Alpha", "beta", "gamma")), "serviceName": "crowd"}

        def answered(wire, op, **args):
            reply = wire.call(op, **args)
            self.assertIn("results", reply or {}, (op, reply))
            return reply["results"]

        while time.monotonic() < end:
            info = {"clientType": r.choice(list(LEVELS)), "sessionID": r.randrange(1 << 32), "requireUserInfo": True,
                    "batchEvent": True}
            message = {"category": 5, "type": r.randrange(2, 9), "payload": {"text": "x" * r.randrange(900)}}
            what, gone = r.random(), []
            if len(sessions) < 2 or (len(sessions) < SESSIONS and r.random() < 0.3):
                sessions.append(wire := Wire(self.root))
                wire.describe(aggregates=r.random() < 0.4, user_info=identity(), **info)
                self.assertIn("backends", answered(wire, START))
            elif what < 0.15:
                for _ in range(50):
                    r.choice(sessions).send(Wire.CALL, {"op": SEND, "args": {"message": message}})
            elif what < 0.3:
                gone = sessions[:] if what < 0.16 else [r.choice(sessions)]
            else:
                op, args = r.choice((
                    ("fetchStatesWithUserInfo:completionHandler:", {"userInfo": identity()}),
                    ("flushMessagesWithCompletion:", {}), (START, {}), (SEND, {"message": message}),
                    ("sendMessageWithSessionInfo:userInfo:category:type:payload:reply:", {
                        "category": 5, "type": 2, "sessionInfo": info, "userInfo": identity(), "payload": {}})))
                answered(r.choice(sessions), op, **args)
            for wire in gone:
                sessions.remove(wire)
                wire.close()
        for wire in sessions:
            wire.close()

    def left_over(self, daemon):
        """The numbers of descriptors, without kept connections, and of threads."""
        own = [name for name in daemon.descriptors() if not name.startswith("socket:")]
        return len(own), daemon.status("Threads")

    def test_clients_that_vanish_leave_nothing_behind(self):
        for level, (kind, name) in enumerate(LEVELS.items()):
            self.serve(entry("alpha,beta,gamma", hierarchy=level), name=name)
        allowed = "sendMessageWithDictionary: Failed to get remote object proxy: The client "
        with self.serving(allowed, env={"VELTRA_LOG": "info"}) as daemon:
            self.open()[0].close()  # so that everything that is created once exists
            before, memory, end = self.left_over(daemon), daemon.status("VmRSS"), time.monotonic() + SECONDS
            with concurrent.futures.ThreadPoolExecutor(CLIENTS) as pool:
                list(pool.map(self.play, range(CLIENTS), [end] * CLIENTS))
            wait_until(lambda: all(now <= then for now, then in zip(self.left_over(daemon), before)),
                       "as many descriptors and threads as before", 60, lambda: (before, self.left_over(daemon)))
            if BUILD.name not in ("asan", "tsan"):
                wait_until(lambda: daemon.status("VmRSS") <= memory + (12 << 10), "memory near its start")
