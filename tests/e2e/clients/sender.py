# SPDX-License-Identifier: Apache-2.0
"""The same as sender.cpp, with the client for Python."""
import json
import pathlib
import select
import sys
import time

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[3] / "python"))
import veltra  # noqa: E402

name, microseconds, kind = sys.argv[1:]
answered = (lambda answer: None) if kind == "reply" else None
session = veltra.Session(client_type=7, client_name=name, service_name="ringer", require_user_info=True,
                         batch_events=True, connect_later=True, queue_bytes=1 << 17)
session.start()
sent = number = 0
longest = 0.0
while number % 16 or not select.select([sys.stdin], [], [], 0)[0]:
    begin = time.monotonic()
    sent += session.send(5, 1, {"sender": name, "number": sent}, answered=answered)
    longest = max(longest, time.monotonic() - begin)
    number += 1
    if number == 16:
        print("sending", flush=True)
    if number % 16 == 0:
        time.sleep(16e-6 * int(microseconds))
figures = session.statistics()
print(json.dumps({"sender": name, "sent": sent, "refused": number - sent, "lost": figures.lost, "closed": session.close(),
                  "connections": figures.connections, "longest": longest * 1e6}))
