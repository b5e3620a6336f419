"""The sums of campaigns that are kept in the tree, docs/campaigns/KIND.json, and the table that is made of them.

A state has every unit by itself, and stays on its machine. What is kept has, of each commit and each part, the ranges that
were done and what came of all of them together: enough to go on behind them, and to add a state without counting a
range twice; small enough to be read in a review.
"""

import collections
import dataclasses
import datetime
import json
import re

from campaigns.tree import ROOT, Refusal
from campaigns.units import Finding, Unit

FOLDER = ROOT / "docs" / "campaigns"
DOCUMENT = ROOT / "docs" / "reliability.md"
BEGIN = "<!-- This table is made by `scripts/campaign keep`. -->\n"
END = "<!-- Its end. -->\n"

# What is to be tried: so many in all, or of each part, on whichever commits; one range of each part, or all, on one commit.
GOALS = {"seeds": 2_000_000, "walks": 50_000}
GOALS_OF_PART = {"fuzz": 100_000_000}
ONE_RANGE_OF_PART = {"crash-pairs"}
ALL = {"failing-calls", "faults", "kills", "mutants"}

SHOWN = 0.001  # core-hours; what is measured in less says nothing of a rate


@dataclasses.dataclass
class Part:
    """What came of the ranges of one part."""

    ranges: set = dataclasses.field(default_factory=set)  # (first, count)
    tried: int = 0
    failed: int = 0
    seconds: float = 0.0
    processor: float = 0.0
    covered: collections.Counter = dataclasses.field(default_factory=collections.Counter)

    def add(self, found, result):
        self.ranges.add(found)
        self.tried += result.tried
        self.failed += result.failed
        self.seconds += result.seconds
        self.processor += result.processor
        self.covered.update(result.covered)

    def end(self):
        return max((first + count for first, count in self.ranges), default=0)


class Sums:
    """Of one kind at one commit."""

    def __init__(self, kind, commit):
        self.kind = kind
        self.commit = commit
        self.until = ""  # the day on which something was added last
        self.parts_in_all = 0  # that the tree has at this commit
        self.rounds = None  # ranges of each part; none where there is no end
        self.parts = collections.defaultdict(Part)
        self.findings = []  # (key of the unit, finding)

    def has(self, unit):
        return unit.part in self.parts and (unit.first, unit.count) in self.parts[unit.part].ranges

    def add(self, results):
        """Adds what is not there yet of key -> result. Gives how many units that were."""
        added = 0
        for key, result in results.items():
            unit = Unit.of_key(self.kind, key)
            if not self.has(unit):
                self.parts[unit.part].add((unit.first, unit.count), result)
                self.findings += [(key, each) for each in result.findings]
                added += 1
        return added

    def sum_of(self, name):
        return sum(getattr(part, name) for part in self.parts.values())

    @property
    def units(self):
        return sum(len(part.ranges) for part in self.parts.values())

    @property
    def covered(self):
        return sum((part.covered for part in self.parts.values()), collections.Counter())

    def end(self):
        """Behind it no part has been begun; 0 where one may have had no turn at all."""
        if not self.parts or len(self.parts) < self.parts_in_all:
            return 0
        return min(part.end() for part in self.parts.values())


def in_words(ranges):
    """`0-1000/250 2000-2250/250`: what lies between two numbers, in units of so many."""
    words = []
    for first, count in sorted(ranges):
        if words and words[-1][1:] == [first, count]:
            words[-1][1] += count
        else:
            words.append([first, first + count, count])
    return " ".join(f"{first}-{end}/{count}" for first, end, count in words)


def from_words(text):
    return {
        (each, int(count)) for first, end, count in re.findall(r"(\d+)-(\d+)/(\d+)", text)
        for each in range(int(first), int(end), int(count))
    }


def as_json(sums):
    return {
        "commit": sums.commit, "until": sums.until, "parts_in_all": sums.parts_in_all, "rounds": sums.rounds,
        "parts": {
            name: {"done": in_words(part.ranges), "tried": part.tried, "failed": part.failed,
                   "seconds": round(part.seconds, 1), "processor": round(part.processor, 1),
                   "covered": dict(sorted(part.covered.items()))}
            for name, part in sorted(sums.parts.items())
        },
        "findings": [{"unit": key, "what": each.what, "replay": each.replay} for key, each in sums.findings],
    }


def from_json(kind, value):
    sums = Sums(kind, value["commit"])
    sums.until, sums.parts_in_all, sums.rounds = value["until"], value["parts_in_all"], value["rounds"]
    for name, part in value["parts"].items():
        sums.parts[name] = Part(from_words(part["done"]), part["tried"], part["failed"], part["seconds"],
                                part["processor"], collections.Counter(part["covered"]))
    sums.findings = [(each["unit"], Finding(each["what"], each["replay"])) for each in value["findings"]]
    return sums


def read(path):
    """commit -> sums, in the order in which they were kept."""
    try:
        value = json.loads(path.read_text())
        return {each["commit"]: from_json(value["kind"], each) for each in value["sums"]}
    except (OSError, ValueError, KeyError, TypeError, AttributeError) as error:
        raise Refusal(f"{path} has no sums that were kept: {error!r}") from error


def together(paths, campaigns):
    """(kind, commit) -> sums: of these files, and of (kind, commit) -> key -> result. What two of them hold counts once."""
    sums = {(each.kind, each.commit): each for path in paths for each in read(path).values()}
    for of, results in campaigns.items():
        sums.setdefault(of, Sums(*of)).add(results)
    return sums


def of_kind(kind):
    """commit -> sums, of what the tree keeps of a kind."""
    path = FOLDER / f"{kind}.json"
    return read(path) if path.exists() else {}


def begin_of(kind):
    """Where a new campaign of a kind without an end begins: whatever the commit, every sitting tries what none has."""
    return max((sums.end() for sums in of_kind(kind).values()), default=0)


def keep(about, results):
    """Adds a state to what the tree keeps. Gives the sums of its commit, and how many units were new."""
    commits = of_kind(about["kind"])
    sums = commits.setdefault(about["commit"], Sums(about["kind"], about["commit"]))
    sums.parts_in_all, sums.rounds = int(about["parts"]), json.loads(about["rounds"])
    added = sums.add(results)
    if added:
        sums.until = datetime.datetime.now(datetime.timezone.utc).date().isoformat()
        FOLDER.mkdir(parents=True, exist_ok=True)
        text = json.dumps({"kind": sums.kind, "sums": [as_json(each) for each in commits.values()]}, indent=1)
        (FOLDER / f"{sums.kind}.json").write_text(text + "\n")
    return sums, added


# --- The table -----------------------------------------------------------------------------------


def left(kind, commits):
    """What is left to a kind's goal, in words; `commits` is never empty."""
    last = list(commits.values())[-1]
    if kind in GOALS:
        return of_goal(GOALS[kind], sum(sums.sum_of("tried") for sums in commits.values()))
    if kind in GOALS_OF_PART:
        goal, tried = GOALS_OF_PART[kind], collections.Counter()
        for sums in commits.values():
            tried.update({name: part.tried for name, part in sums.parts.items()})
        return of_goal(goal * last.parts_in_all, sum(min(goal, each) for each in tried.values()))
    if kind in ONE_RANGE_OF_PART:
        return of_goal(last.parts_in_all, len(last.parts), " scenarios")
    if kind in ALL:
        return of_goal(last.parts_in_all * last.rounds, last.units, " units")
    return "has no goal"


def of_goal(goal, done, what=""):
    return f"{goal - done:,} of {goal:,}{what}" if done < goal else f"none of {goal:,}{what}"


def row(sums, to_come):
    tried, failed, hours = sums.sum_of("tried"), sums.sum_of("failed"), sums.sum_of("processor") / 3600
    rate = f"{tried / hours:,.0f}" if hours >= SHOWN else ""
    cells = [sums.kind, f"{sums.commit[:7]}{sums.commit[40:]}", sums.until, f"{tried:,}", f"{failed:,}", f"{hours:.3f}", rate,
             to_come]
    return f"| {' | '.join(cells)} |\n"


def table():
    """Markdown: a line for each kind and commit, the last of a kind with what is left to its goal."""
    text = "| Kind | Commit | Until | Tried | Failed | Core-hours | In a core-hour | Left to the goal |\n"
    text += "| --- | --- | --- | --- | --- | --- | --- | --- |\n"
    begun = {path.stem for path in FOLDER.glob("*.json")}
    for kind in sorted(begun | GOALS.keys() | GOALS_OF_PART.keys() | ONE_RANGE_OF_PART | ALL):
        commits = of_kind(kind)
        if not commits:
            text += f"| {kind} | none | | 0 | 0 | | | all |\n"
            continue
        *earlier, last = commits.values()
        text += "".join(row(sums, "") for sums in earlier) + row(last, left(kind, commits))
    return text


def without_table(text):
    """What stands before the table, and after it."""
    before, begin, rest = text.partition(BEGIN)
    _, end, after = rest.partition(END)
    if not begin or not end:
        raise Refusal(f"{DOCUMENT} has no place for the table: the line {BEGIN.strip()} and, later, {END.strip()}")
    return before + begin, end + after


def write_table():
    before, after = without_table(DOCUMENT.read_text())
    DOCUMENT.write_text(f"{before}\n{table()}\n{after}")


def is_table_true():
    """Whether the document has the table as it is made of what is kept."""
    try:
        before, after = without_table(DOCUMENT.read_text())
    except Refusal:
        return False
    return DOCUMENT.read_text() == f"{before}\n{table()}\n{after}"
