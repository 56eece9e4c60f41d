# SPDX-License-Identifier: Apache-2.0
"""The same as sender.cpp, with the client for Python."""
import json
import pathlib
import select
import sys
import time

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[3] / "python"))
import veltra  # noqa: E402

BURST = 16


def main(name, microseconds, kind):
    answers = []
    session = veltra.Session(client_type=7, client_name=name, service_name="ringer", require_user_info=True,
                             batch_events=True, connect_later=True)
    session.start()
    counts, number, longest = {True: 0, False: 0}, 0, 0.0
    while number % BURST or not select.select([sys.stdin], [], [], 0)[0]:
        begin = time.monotonic()
        taken = session.send(5, 1, {"sender": name, "number": counts[True]},
                             answered=answers.append if kind == "reply" else None)
        longest = max(longest, time.monotonic() - begin)
        counts[taken] += 1
        number += 1
        if number == BURST:
            print("sending", flush=True)
        if number % BURST == 0:
            answers.clear()
            time.sleep(BURST * microseconds / 1e6)
    figures = session.statistics()
    closed = session.close()
    print(json.dumps({"sender": name, "sent": counts[True], "refused": counts[False], "lost": figures.lost,
                      "closed": closed, "connections": figures.connections, "longest": longest * 1e6}))


main(sys.argv[1], int(sys.argv[2]), sys.argv[3])
