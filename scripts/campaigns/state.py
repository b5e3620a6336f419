"""The state of a campaign: an SQLite file that holds what was done. What is in it is done, whatever ends the program."""

import contextlib
import json
import sqlite3
import time

from campaigns.tree import Refusal
from campaigns.units import Finding, Record, Unit

FORMAT = "2"

TABLES = """
CREATE TABLE about (name TEXT PRIMARY KEY, value TEXT NOT NULL);
CREATE TABLE sittings (number INTEGER PRIMARY KEY, seconds REAL NOT NULL);
CREATE TABLE units (
    key TEXT PRIMARY KEY, tried INTEGER NOT NULL, failed INTEGER NOT NULL, covered TEXT NOT NULL,
    seconds REAL NOT NULL, processor REAL NOT NULL, sitting INTEGER NOT NULL, at REAL NOT NULL);
CREATE TABLE findings (
    key TEXT NOT NULL, what TEXT NOT NULL, replay TEXT NOT NULL, output TEXT NOT NULL, PRIMARY KEY (key, replay));
CREATE TABLE suspects (
    key TEXT PRIMARY KEY, part TEXT NOT NULL, first INTEGER NOT NULL, count INTEGER NOT NULL, why TEXT NOT NULL);
"""


@contextlib.contextmanager
def explained(path):
    """What SQLite complains of, as a sentence."""
    try:
        yield
    except sqlite3.DatabaseError as error:
        if "locked" in str(error):
            raise Refusal(f"{path} is used by another campaign that runs") from error
        raise Refusal(f"{path} is no state of a campaign: {error}") from error


class State:
    """Of a campaign of one kind, at one commit. A unit is recorded with all that came of it, or not at all."""

    def __init__(self, path):
        self.path = path
        with explained(path):
            self.base = sqlite3.connect(path, timeout=1, isolation_level=None)
            # Two that go on with the same state would do everything twice.
            self.base.execute("PRAGMA locking_mode = EXCLUSIVE")
            self.base.execute("BEGIN EXCLUSIVE")
            if not self.base.execute("SELECT count(*) FROM sqlite_master").fetchone()[0]:
                for statement in TABLES.split(";"):
                    self.base.execute(statement)
                self.set("format", FORMAT)
            self.base.execute("COMMIT")
            if self.get("format") != FORMAT:
                raise Refusal(f"{path} is the state of a campaign in another format")
        self.sitting = 0
        self.begun = 0.0

    def close(self):
        self.base.close()

    def get(self, name, otherwise=""):
        row = self.base.execute("SELECT value FROM about WHERE name = ?", (name,)).fetchone()
        return row[0] if row else otherwise

    def set(self, name, value):
        self.base.execute("INSERT OR REPLACE INTO about VALUES (?, ?)", (name, str(value)))

    def belong_to(self, kind, commit, first, otherwise=0):
        """Notes what it is of, or refuses where it is of something else. Gives where its units begin: at `otherwise` if it is
        new and nothing else is asked for.
        """
        for name, value, what in (("kind", kind, "of"), ("commit", commit, "at")):
            was = self.get(name, value)
            if was != value:
                raise Refusal(f"{self.path} is the state of a campaign {what} {was}, this one is {what} {value}: "
                              f"name another file with --state, and add them up with `campaign sum`")
            self.set(name, value)
        was = self.get("first", str(otherwise if first is None else first))
        if first is not None and was != str(first):
            raise Refusal(f"{self.path} is the state of a campaign that begins at {was}")
        self.set("first", was)
        return int(was)

    def begin_sitting(self, parts, rounds):
        """`parts` and `rounds` are how many parts the kind has in this tree, and ranges in each (none: no end)."""
        self.set("parts", parts)
        self.set("rounds", json.dumps(rounds))
        self.sitting = self.base.execute("SELECT count(*) FROM sittings").fetchone()[0] + 1
        self.begun = time.monotonic()
        self.base.execute("INSERT INTO sittings VALUES (?, 0)", (self.sitting,))

    def record(self, unit, record):
        """Adds what came of a unit; nothing if that is there already."""
        now = time.monotonic() - self.begun
        self.base.execute("BEGIN")
        added = self.base.execute(
            "INSERT OR IGNORE INTO units VALUES (?, ?, ?, ?, ?, ?, ?, ?)",
            (unit.key, record.tried, record.failed, json.dumps(record.covered), record.seconds, record.processor,
             self.sitting, now),
        ).rowcount
        if added:
            for each in record.findings:
                self.base.execute("INSERT OR IGNORE INTO findings VALUES (?, ?, ?, ?)",
                                  (unit.key, each.what, each.replay, each.output))
            self.base.execute("DELETE FROM suspects WHERE key = ?", (unit.key,))
        self.base.execute("UPDATE sittings SET seconds = ? WHERE number = ?", (now, self.sitting))
        self.base.execute("COMMIT")
        return bool(added)

    def suspect(self, unit, why):
        """A unit that hangs or has ended its worker: it is to be tried once more, alone."""
        self.base.execute("INSERT OR REPLACE INTO suspects VALUES (?, ?, ?, ?, ?)",
                          (unit.key, unit.part, unit.first, unit.count, why))

    def suspects(self):
        rows = self.base.execute("SELECT part, first, count FROM suspects ORDER BY key")
        return [Unit(self.get("kind"), *row) for row in rows]

    def done(self):
        """The keys of what is done."""
        return {key for (key,) in self.base.execute("SELECT key FROM units")}

    def results(self):
        return results_in(self.base)


class Result(Record):
    """A unit's record as a state has it, with when it was done: seconds since the campaign began, without the time between
    sittings.
    """

    at = 0.0


def results_in(base):
    """key -> result."""
    before, sitting_begins = 0.0, {}
    for number, seconds in base.execute("SELECT number, seconds FROM sittings ORDER BY number"):
        sitting_begins[number] = before
        before += seconds
    results = {}
    for key, tried, failed, covered, seconds, processor, sitting, at in base.execute("SELECT * FROM units ORDER BY sitting, at"):
        results[key] = Result(tried, failed, json.loads(covered), [], seconds, processor)
        results[key].at = sitting_begins.get(sitting, 0.0) + at
    for key, what, replay, output in base.execute("SELECT * FROM findings ORDER BY rowid"):
        if key in results:
            results[key].findings.append(Finding(what, replay, output))
    return results


def read(path):
    """What a state is of, and its results, without changing it."""
    if not path.exists():
        raise Refusal(f"there is no {path}")
    with explained(path):
        base = sqlite3.connect(f"{path.resolve().as_uri()}?mode=ro", uri=True, timeout=1)
        try:
            about = dict(base.execute("SELECT name, value FROM about"))
            if about.get("format") != FORMAT or not {"kind", "commit", "parts", "rounds"} <= about.keys():
                raise Refusal(f"{path} is no state of a campaign that has begun")
            return about, results_in(base)
        except ValueError as error:
            raise Refusal(f"{path} is no state of a campaign: {error}") from error
        finally:
            base.close()


def added_up(paths):
    """(kind, commit) -> key -> result, of all these states. What two of them hold is one result."""
    campaigns = {}
    for path in paths:
        about, results = read(path)
        campaign = campaigns.setdefault((about["kind"], about["commit"]), {})
        for key, result in results.items():
            campaign.setdefault(key, result)
    return campaigns
