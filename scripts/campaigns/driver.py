"""Gives a campaign's units to the workers, and puts what comes of them into the state."""

import collections
import threading
import time

from campaigns import engine, kept
from campaigns.units import LIMIT, Finding, Record, Unit, by_hand, run

DIED = "its worker has died, more than once"


class Gone(Exception):
    """The scheduler is not there, or not the one that had our units."""


class Campaign:
    """One sitting of a campaign. Only what is in the state, or kept in the tree of the same commit, counts as done; all else
    is given out again.
    """

    def __init__(self, kind, state, commit, bar, address, most=None, seconds=None, limit=LIMIT):
        self.kind = kind
        self.state = state
        self.commit = commit
        self.bar = bar
        self.address = address
        self.most = most  # units that the state is to have
        self.deadline = time.monotonic() + seconds if seconds else None
        self.limit = limit
        self.wanted = engine.resource(kind.build, commit)
        self.done = state.done()
        self.kept = kept.of_kind(kind.name).get(commit, kept.Sums(kind.name, commit))
        self.kept_elsewhere = self.kept.units - sum(self.kept.has(Unit.of_key(kind.name, key)) for key in self.done)
        self.suspects = collections.deque(state.suspects())
        self.again = collections.deque()  # given out, and lost on the way
        self.fresh = self.fresh_units()
        self.running = {}  # future -> unit
        self.lonely = None  # the key of the suspect that is tried alone
        self.tries = 0
        self.is_stopped = False
        self.wake = threading.Event()

    def fresh_units(self):
        known = self.done | {unit.key for unit in self.suspects}
        for unit in self.kind.units(int(self.state.get("first", "0"))):
            if unit.key not in known and not self.kept.has(unit):
                yield unit

    def go(self):
        """Until nothing is left. Whatever ends it, nothing that is in the state is lost."""
        self.state.begin_sitting(len(self.kind.parts()), self.kind.rounds())
        while not self.is_over():
            try:
                with engine.connect(self.address) as client:
                    self.pump(client)
                    return
            except (Gone, *engine.AWAY, *engine.LOST):
                self.forget()
                self.bar.say("the scheduler is away; trying again")
                time.sleep(1)

    def forget(self):
        """What is under way is to be given out again."""
        for unit in self.running.values():
            (self.suspects if unit.key == self.lonely else self.again).appendleft(unit)
        self.running = {}
        self.lonely = None

    def stop(self):
        self.is_stopped = True
        self.wake.set()

    def is_over(self):
        return self.is_stopped or (self.deadline is not None and time.monotonic() >= self.deadline)

    def pump(self, client):
        engine.ask_for(client, self.kind.build, self.commit)
        looked, room = 0.0, 0
        while True:
            if client.status != "running":  # one that comes again knows nothing of us
                raise Gone
            self.collect()
            if time.monotonic() - looked > 1:
                looked = time.monotonic()
                room, others = engine.workers(client, self.wanted)
                self.bar.tell_others(others, self.wanted)
            if self.is_stopped:
                self.forget()
                return
            self.give_out(client, room)
            if not self.running and (not self.is_anything_left() or self.is_over() and not room):
                return
            self.bar.show(self.left(), room)
            self.wake.wait(0.5)
            self.wake.clear()

    def start(self, client, unit):
        self.tries += 1
        future = client.submit(run, unit, self.limit, key=f"unit {unit.key} {self.state.sitting} {self.tries}", pure=False,
                               resources={self.wanted: 1})
        future.add_done_callback(lambda _: self.wake.set())
        self.running[future] = unit

    def is_enough(self):
        given = len(self.done) + len(self.running) + len(self.again) + len(self.suspects)
        return self.is_over() or (self.most is not None and given >= self.most)

    def next_unit(self):
        if self.is_over():
            return None
        if self.again:
            return self.again.popleft()
        return None if self.is_enough() else next(self.fresh, None)

    def give_out(self, client, room):
        """A suspect comes when nothing else runs and is to come, and then nothing but it."""
        while room > len(self.running) and self.lonely is None and (unit := self.next_unit()) is not None:
            self.start(client, unit)
        if room and not self.running and self.suspects:
            unit = self.suspects.popleft()
            self.lonely = unit.key
            self.start(client, unit)

    def is_anything_left(self):
        if self.suspects or (self.again and not self.is_over()):
            return True
        if self.is_enough():
            return False
        unit = next(self.fresh, None)
        if unit is not None:
            self.again.append(unit)
        return unit is not None

    def collect(self):
        """Takes what has come of the units that run."""
        for future, unit in list(self.running.items()):
            if future.status == "pending":
                continue
            if future.status == "finished":
                try:
                    record = future.result(timeout=engine.CONNECT)
                except engine.AWAY:
                    continue  # lost with its worker, and made again
                self.take(unit, record)
            elif future.status == "error":
                self.take_failure(unit, future)
            else:
                raise Gone
            del self.running[future]
            if unit.key == self.lonely:
                self.lonely = None

    def take(self, unit, record):
        if record.hangs and unit.key != self.lonely:
            self.doubt(unit, record.findings[0].what)
        elif self.state.record(unit, record):
            self.done.add(unit.key)
            self.bar.add(unit, record)

    def take_failure(self, unit, future):
        """The unit itself never raises: its worker has died with it, or cannot run it."""
        error = future.exception(timeout=engine.CONNECT)
        what = DIED if isinstance(error, engine.distributed.scheduler.KilledWorker) else f"cannot be run: {error!r}"
        if unit.key != self.lonely:
            self.doubt(unit, what)
            return
        self.take(unit, Record(1, 1, findings=[Finding(what, by_hand(*self.kind.command(unit)))]))

    def doubt(self, unit, why):
        self.state.suspect(unit, why)
        self.suspects.append(unit)
        self.bar.say(f"{unit.kind} {unit.key}: {why}; it is tried once more, alone, at the end")

    def left(self):
        """How many units are to come; nothing when only the clock says."""
        totals = [] if self.most is None else [self.most - len(self.done)]
        if self.kind.total() is not None:
            totals.append(self.kind.total() - len(self.done) - self.kept_elsewhere)
        return max(0, min(totals)) if totals else None
