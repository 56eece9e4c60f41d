# SPDX-License-Identifier: Apache-2.0
"""Measures the path of a message. Each class takes one value of each of its figures in every round, with the floor beside it, so
that figure and floor are measured under the same conditions."""
import statistics
import time

from figures import Figure
from place import (BATCHES_OF_1000, BATCHES_OF_50, COPIED, DATAGRAMS, REFUSED, SINGLE, Daemon, context_switches, cores,
                   cpu_microseconds, memory_kib, page_faults, pin, wait_until)


class Measure:
    """Collects the values of rounds by name. `quick`: fewer messages."""

    def __init__(self, place, quick):
        self.place, self.quick, self.taken = place, quick, {}

    def take(self, **values):
        for name, value in values.items():
            self.taken.setdefault(name, []).append(value)

    def scaled(self, count):
        return count // 10 if self.quick else count


class RoundTrip(Measure):
    """send with its reply awaited, through the library, the daemon and a back end that batches."""

    def round(self):
        for name, bare, daemons in (("one", 0, {0}), ("two", 1, {1}))[:cores()]:
            with self.place.daemon() as daemon:
                pin(daemon.popen.pid, daemons)
                got = self.place.load("trips", self.place.root.path, BATCHES_OF_1000, bare, self.scaled(300))
                self.take(**{name: got["sendNs"] / 1e3, name + "Bare": got["bareNs"] / 1e3})

    def figures(self):
        for name, most, where in (("one", 1.8, "both ends on one core"), ("two", 1.3, "ends on two cores")):
            if name in self.taken:
                yield Figure(f"send with reply, {where}", "µs", self.taken[name], "bare socket", self.taken[name + "Bare"],
                             most=most)


def flood(place, client_type, sessions, messages):
    """CPU microseconds, page faults and waits of the daemon for a message of the second of two floods, and how many messages it
    took in a second. The flush of each session at the end counts as a message."""
    with place.daemon() as daemon, place.client("flood", client_type, sessions, messages) as client:
        pid = daemon.popen.pid
        client.run()
        before = cpu_microseconds(pid), page_faults(pid), context_switches(pid)
        done = client.run()
        after = cpu_microseconds(pid), page_faults(pid), context_switches(pid)
        each = [(late - early) / (messages + sessions) for early, late in zip(before, after)]
    return *each, messages / done["seconds"]


class Intake(Measure):
    """Messages without replies, to a back end in state 1, from one session and from many."""
    MANY = (8, 64, 1000)

    def round(self):
        for sessions in (1, *self.MANY):
            cpu, _, _, rate = flood(self.place, REFUSED, sessions, self.scaled(200_000))
            self.take(**{f"cpu{sessions}": cpu, f"rate{sessions}": rate})
        floors = self.place.floors(50)
        self.take(floor=floors["frame"] + floors["list"])

    def figures(self):
        yield Figure("messages taken in from one client, no reply awaited", "a second", self.taken["rate1"], least=300_000)
        yield Figure("CPU of a message taken in", "µs", self.taken["cpu1"], "frame and property list", self.taken["floor"], most=1.3)
        for sessions in self.MANY:
            yield Figure(f"CPU of a message of {sessions:,} sessions at once", "µs", self.taken[f"cpu{sessions}"],
                         "one session's", self.taken["cpu1"], most=1.2)


PARTS = {"frame": "floor: an event's frame", "list": "floor: its property list", "json": "floor: its JSON",
         "zlib": "floor: its share of zlib", "post": "floor: its share of libcurl's post"}


class Batches(Measure):
    """Events posted in batches, compressed and plain."""
    CASES = ((50, 6), (50, 0), (1000, 6), (1000, 0))

    def round(self):
        for events, level in self.CASES:
            self.place.compress(level)
            client_type = BATCHES_OF_50 if events == 50 else BATCHES_OF_1000
            cpu, faults, switches, rate = flood(self.place, client_type, 1, self.scaled(100_000))
            parts = self.place.floors(events)
            case = f"{events}:{level}:"
            self.take(**{case + "cpu": cpu, case + "faults": faults, case + "switches": switches, case + "rate": rate,
                         case + "floor": sum(parts[part] for part in PARTS)})
        self.place.compress(6)
        self.take(copied=flood(self.place, COPIED, 1, self.scaled(100_000))[0])
        self.take(**{"part:" + name: parts for name, parts in self.place.floors(50).items()})

    def figures(self):
        for events, level in self.CASES:
            case = f"{events}:{level}:"
            how = f"posts of {events:,}, " + (f"gzip {level}" if level else "plain")
            yield Figure(f"CPU of an event, {how}", "µs", self.taken[case + "cpu"], "sum of the parts", self.taken[case + "floor"],
                         most=1.5 if (events, level) == (50, 6) else None)
            yield Figure(f"events, {how}", "a second", self.taken[case + "rate"])
            yield Figure(f"page faults of an event, {how}", "", self.taken[case + "faults"],
                         most=0.02 if (events, level) == (50, 6) else None)
        yield Figure("CPU of an event, posts of 50, gzip 6, with a readable copy", "µs", self.taken["copied"])
        for part, what in PARTS.items():
            yield Figure(f"{what}, posts of 50, gzip 6", "µs", self.taken["part:" + part])


class SinglePosts(Measure):
    """One post for each event, against libcurl alone with as many under way."""
    MESSAGES = 900  # the daemon takes 1,024 posts at once

    def _posts_a_second(self, sessions):
        with self.place.daemon(), self.place.client("flood", SINGLE, sessions, self.MESSAGES) as client:
            took = []
            for _ in range(2 if self.quick else 4):
                before, begin = self.place.sink.requests(), time.monotonic()
                client.run()
                wait_until(lambda: self.place.sink.requests() - before >= self.MESSAGES, "every post")
                took.append(time.monotonic() - begin)
            return self.MESSAGES / statistics.median(took)

    def round(self):
        for name, count in (("one", 1), ("eight", 8)):
            self.take(**{name: self._posts_a_second(count),
                         name + "Bare": self.place.floors(1, count, 0.5 if self.quick else 2)["postsASecond"]})

    def figures(self):
        for name, what, floor in (("one", "one session", "libcurl, one in flight"),
                                  ("eight", "eight sessions", "libcurl, eight in flight")):
            yield Figure(f"one post an event, {what}", "a second", self.taken[name], floor, self.taken[name + "Bare"], least=0.75)


class Datagrams(Measure):
    """Messages to a dashboard, beyond what the same message costs in state 1."""

    def round(self):
        messages = self.scaled(100_000)
        beyond = flood(self.place, DATAGRAMS, 1, messages)[0] - flood(self.place, REFUSED, 1, messages)[0]
        self.take(cpu=beyond, rate=1e6 / max(beyond, 0.01), floor=self.place.floors(50)["datagram"])

    def figures(self):
        yield Figure("datagrams for a second of the daemon's CPU", "", self.taken["rate"], least=250_000)
        yield Figure("CPU of a datagram beyond a message in state 1", "µs", self.taken["cpu"], "bare send", self.taken["floor"])


class Start(Measure):
    def round(self):
        for _ in range(2 if self.quick else 5):
            begin = time.monotonic()
            daemon = Daemon(self.place.root, env={"VELTRA_LOG": "error"}, serving=False)
            while not self.place.accepts():
                time.sleep(0.0002)
            self.take(accepting=(time.monotonic() - begin) * 1000, cpu=cpu_microseconds(daemon.popen.pid) / 1000)
            daemon.popen.terminate()
            daemon.end(20)

    def figures(self):
        yield Figure("start to accepting", "ms", self.taken["accepting"], most=10)
        yield Figure("CPU of a start", "ms", self.taken["cpu"])


class Memory(Measure):
    def round(self):
        sessions = 100 if self.quick else 1000
        with self.place.daemon() as daemon:
            pid = daemon.popen.pid
            self.take(rest=memory_kib(pid) / 1024, private=memory_kib(pid, "Private_Clean", "Private_Dirty") / 1024)
            with self.place.client("flood", SINGLE, 1, 1) as client:
                before = self.place.sink.requests()
                client.run()
                wait_until(lambda: self.place.sink.requests() > before, "a first post")
                self.take(posted=memory_kib(pid) / 1024)
                first = memory_kib(pid)
                with self.place.client("flood", BATCHES_OF_1000, sessions, 1):
                    self.take(session=(memory_kib(pid) - first) / sessions)

    def figures(self):
        yield Figure("resident memory at rest", "MiB", self.taken["rest"], most=12)
        yield Figure("private memory at rest", "MiB", self.taken["private"], most=2.5)
        yield Figure("resident memory after the first post", "MiB", self.taken["posted"], most=17)
        yield Figure("memory of each further session with one back end", "KiB", self.taken["session"], most=40)
