"""What a campaign can be of: how each kind's work is divided into units, run, and read."""

import base64
import dataclasses
import functools
import itertools
import json
import os
import pathlib
import re
import subprocess
import typing

from campaigns.tree import ROOT, Refusal
from campaigns.units import TAIL, Finding, Record, Unit, by_hand, finish

TESTS = ROOT / "build" / "release" / "tests"
RELIABILITY = TESTS / "test_reliability"
RECORDINGS = TESTS / "test_recordings"
COMMAND = ROOT / "build" / "release" / "appsync"
FUZZ = ROOT / "build" / "fuzz" / "fuzz"
PREPARED = ROOT / "build" / "mutate" / "prepared.json"
CORPUS = ROOT / "build" / "campaign" / "corpus"

GTEST_REPLAY = re.compile(r"(?:APPSYNC_\w+=\S+ )+build/release/tests/\S+(?: --gtest_filter=\S+)?")
FUZZ_RUNS, FUZZ_SECONDS = 50_000, 20  # of a unit at most


@dataclasses.dataclass
class Kind:
    """A kind of campaign."""

    name: str
    says: str  # what a unit is
    build: str  # which of tree.BUILDS it needs
    program: pathlib.Path
    parts: typing.Callable  # what its units are divided by; each has the same ranges
    command: typing.Callable  # unit -> (words, environment)
    read: typing.Callable  # (unit, how it ended) -> record
    size: int = 1  # of a unit's range
    rounds: typing.Callable = lambda: None  # how many ranges each part has; nothing: there is no end
    smaller: typing.Callable = lambda finding, _made: finding  # the least of it that still fails

    def missing(self):
        """Why it cannot be run; nothing when it can."""
        return "" if self.program.exists() else f"there is no {os.path.relpath(self.program, ROOT)}"

    def total(self):
        """How many units there are; nothing when there is no end."""
        rounds = self.rounds()
        return None if rounds is None else rounds * len(self.parts())

    def units(self, first=0):
        """All of them. Where there is no end they begin at the range that holds `first`, so that the same work has
        the same name in every campaign.
        """
        parts, rounds = self.parts(), self.rounds()
        if not parts:
            raise Refusal(f"{self.name}: {os.path.relpath(self.program, ROOT)} has nothing of this kind")
        begin = first // self.size if rounds is None else 0
        for step in itertools.count(begin) if rounds is None else range(rounds):
            for part in parts:
                yield Unit(self.name, part, step * self.size, self.size)


def sums(output, counts):
    """name -> all numbers that its pattern finds, added up."""
    found = {name: sum(map(int, re.findall(pattern, output))) for name, pattern in counts.items()}
    return {name: number for name, number in found.items() if number}


def reader(tried, covered, replays, command, may_be_empty=False):
    """Reads what a program said. `tried` is the pattern of the number that it tried; `replays` gives the lines that repeat
    what failed; without any the whole unit is repeated.
    """

    def read(unit, ended):
        record = Record(covered=sums(ended.output, covered), tried=sum(map(int, re.findall(tried, ended.output))))
        lines = list(dict.fromkeys(replays(unit, ended.output)))
        if ended.status == 0 and (record.tried or may_be_empty and " skipped" not in ended.output):
            return record
        what = complaint(ended) if ended.status else "nothing was tried"
        lines = lines or [by_hand(*command(unit))]
        record.failed = len(lines)
        record.tried = max(record.tried, record.failed)
        record.findings = [Finding(what, line, ended.output[-TAIL:]) for line in lines]
        return record

    return read


def complaint(ended):
    """How it ended, and the first thing that it complained of."""
    how = f"exit status {ended.status}" if ended.status > 0 else f"ended by signal {-ended.status}"
    if ended.status == 1:
        how = "failed"
    first = re.search(r"Failure\n((?:.+\n){1,3})|^E +(.+)$|^(==\d+==.*ERROR.*)$", ended.output, re.MULTILINE)
    return f"{how}: {' '.join(next(filter(None, first.groups())).split())[:300]}" if first else how


# --- GoogleTest ----------------------------------------------------------------------------------


@functools.cache
def names_in(suite, test=r"\w+/\w+", program=RELIABILITY):
    """The tests of a suite; the parameterized ones, `Test/Instance`, if nothing else is said."""
    if not program.exists():
        return []
    listing = subprocess.run(
        [str(program), "--gtest_list_tests", f"--gtest_filter=*{suite}.*"], capture_output=True, text=True, check=False
    )
    return re.findall(rf"^ +({test})", listing.stdout, re.MULTILINE)


def gtest(name, says, suite, environment, tried, covered, size=1, rounds=lambda: None, parts=None, smaller=Kind.smaller,
          program=RELIABILITY):
    """A kind that is a suite of a test program; its parts are the suite's tests if nothing else is said."""

    def command(unit):
        words = [str(program), "--gtest_brief=1", f"--gtest_filter=*{suite}.{unit.part or '*'}"]
        return words, environment(unit)

    def replays(_unit, output):
        return GTEST_REPLAY.findall(output)

    read = reader(tried, covered, replays, command)
    return Kind(name, says, "release", program, parts or (lambda: names_in(suite)), command, read, size, rounds,
                smaller)


SMALL_LIMIT = 300  # seconds that it may take to make a finding small


def small_session(finding, made):
    """A session that a seed decides, with as much of it at rest as can be."""
    seed = re.search(r"\bAPPSYNC_SEED=(\d+)", finding.replay)
    if not seed:
        return finding
    words = [str(RELIABILITY), "--gtest_brief=1", "--gtest_filter=Seeds.One"]
    variables = {"APPSYNC_SEED": seed[1], "APPSYNC_SMALL": 1}
    changes = re.search(r"\bAPPSYNC_CHANGES='([^']*)'", finding.replay)
    if changes:
        variables["APPSYNC_CHANGES"] = changes[1]
    ended = finish(words, variables, SMALL_LIMIT, made)
    small = re.search(r"^small: (.*)$", ended.output, re.MULTILINE)
    again = re.search(r"^again: (.*)$", ended.output, re.MULTILINE)
    if not small or not again:  # it has ended the program, or does not fail alone
        return finding
    return Finding(small[1], again[1], f"of: {finding.replay}\n{finding.what}\n{finding.output}")


# --- pytest --------------------------------------------------------------------------------------

CALLS_APART = {"kills": 64, "failing-calls": 8}  # a unit has every so manieth call of a command


def pytest_words(test):
    return ["/usr/bin/python3", "-m", "pytest", "-q", "-s", "-p", "no:cacheprovider", test]


@functools.cache
def tests_in(path):
    """The tests of a file, in their long form."""
    listing = subprocess.run(
        [*pytest_words(path), "--collect-only"], cwd=ROOT, capture_output=True, text=True, check=False,
        env={**os.environ, "APPSYNC": str(COMMAND), "APPSYNC_HARDSHIP": "long"},
    )
    return [f"{path}::{test}" for test in re.findall(r"::(\S+\])$", listing.stdout, re.MULTILINE)]


def hardship(name, says, path, tried, number):
    """A kind that meddles with the calls of the built command."""
    apart = CALLS_APART[name]

    def variables(calls):
        return {"APPSYNC": COMMAND, "APPSYNC_HARDSHIP": "long", "APPSYNC_CALLS": calls}

    def command(unit):
        return pytest_words(unit.part), variables(f"{unit.first + 1}/{apart}")

    def replays(unit, output):
        return [by_hand(pytest_words(unit.part), variables(each)) for each in re.findall(number, output)]

    read = reader(tried, {name.replace("-", " "): tried}, replays, command, may_be_empty=True)
    return Kind(name, says, "release", COMMAND, lambda: tests_in(path), command, read, 1, lambda: apart)


WALKS = "tests/acceptance/test_walk.py"
WALKS_OF_UNIT = 1  # on each path


def walks():
    def variables(first, count):
        return {"APPSYNC": COMMAND, "APPSYNC_FIRST_WALK": first, "APPSYNC_WALKS": count}

    def command(unit):
        return pytest_words(WALKS), variables(unit.first, unit.count)

    def replays(_unit, output):
        failed = re.findall(r"^(?:FAILED|ERROR) \S+::(\S+\[(?:[a-z]+-)?(\d+)(?:-[a-z]+)?\])", output, re.MULTILINE)
        return [by_hand(pytest_words(f"{WALKS}::{test}"), variables(seed, 1)) for test, seed in failed]

    read = reader(r"(\d+) (?:passed|failed|error)", {}, replays, command)
    return Kind("walks", "a day of random use of the command on each path, held against what must always be so", "release", COMMAND,
                lambda: [""], command, read, WALKS_OF_UNIT)


# --- others --------------------------------------------------------------------------------------


def fuzz():
    """What is found new is kept for the machine's next units."""

    def command(unit):
        corpus = CORPUS / unit.part
        corpus.mkdir(parents=True, exist_ok=True)
        words = [str(FUZZ / f"{unit.part}Fuzz"), f"-runs={unit.count}", f"-max_total_time={FUZZ_SECONDS}"]
        words += [f"-seed={unit.first // unit.count % 2**31 + 1}", "-print_final_stats=1", "-verbosity=0", "-timeout=20"]
        words += ["-malloc_limit_mb=64", "-artifact_prefix=./", str(corpus)]
        given = ROOT / "fuzz" / "corpus" / unit.part
        return in_made(words + ([str(given)] if given.is_dir() else [])), {}

    def in_made(words):
        return ["sh", "-c", 'cd "$TMPDIR" && exec "$@"', "fuzz", *words]

    def plain_read(unit, ended):
        return reader(r"stat::number_of_executed_units:\s*(\d+)", {}, lambda *_: [], command)(unit, ended)

    def read(unit, ended):
        record = plain_read(unit, ended)
        inputs = [path for path in pathlib.Path(ended.made).glob("*-*") if re.match(r"(crash|oom|timeout|leak)-", path.name)]
        for finding, path in zip(record.findings, inputs):
            text = base64.b64encode(path.read_bytes()).decode()
            finding.replay = f"echo {text} | base64 -d >found && build/fuzz/fuzz/{unit.part}Fuzz found"
        return record

    return Kind("fuzz", f"{FUZZ_RUNS:,} inputs of a fuzz target, or {FUZZ_SECONDS} seconds of it", "fuzz", FUZZ,
                lambda: [path.name.removesuffix("Fuzz") for path in sorted(FUZZ.glob("*Fuzz"))], command, read, FUZZ_RUNS)


MUTANTS_OF_UNIT = 8


def mutants():
    def command(unit):
        words = ["/usr/bin/python3", "scripts/mutate", "--numbers", f"{unit.first + 1}-{unit.first + unit.count}"]
        return words, {}

    def read(unit, ended):
        record = reader(r"(\d+) mutants, \d+ caught", {}, lambda *_: [], command)(unit, ended)
        if ended.status == 0:
            survivors = re.findall(r"^(\d+) survived: (.*)$", ended.output, re.MULTILINE)
            record.findings = [
                Finding(f"survived: {what}", f"scripts/mutate --numbers {number}-{number}") for number, what in survivors
            ]
            record.failed = len(survivors)
        return record

    def rounds():
        return -(-json.loads(PREPARED.read_text())["mutants"] // MUTANTS_OF_UNIT)

    return Kind("mutants", f"{MUTANTS_OF_UNIT} changes of the plug-in, each of which a test must notice", "mutate", PREPARED,
                lambda: [""], command, read, MUTANTS_OF_UNIT, rounds)


KINDS = {
    kind.name: kind
    for kind in (
        gtest("seeds", "250 sessions that seeds decide, of both paths", "ManySeeds",
              lambda unit: {"APPSYNC_FIRST_SEED": unit.first, "APPSYNC_SEEDS": unit.count},
              r'"seeds": "(\d+)"', {"faults": r'"faults": "(\d+)"'}, 250, parts=lambda: [""], smaller=small_session),
        gtest("guided", "1,000 such sessions, half of them variations of those that have reached more than others",
              "GuidedSearch", lambda unit: {"APPSYNC_FIRST_SEED": unit.first, "APPSYNC_SEEDS": unit.count},
              r'"seeds": "(\d+)"', {"faults": r'"faults": "(\d+)"'}, 1000,
              parts=lambda: ["OfManySessionsKeepsTheInvariants"], smaller=small_session),
        gtest("faults", "each call of a scenario fails, in one of the ways of the sweep", "EveryFault", lambda _unit: {},
              r'"runs": "(\d+)"', {"faults": r'"faults": "(\d+)"'}, rounds=lambda: 1,
              parts=lambda: names_in("EveryFault", r"\w+IsSurvived/\w+")),
        gtest("crashes", "a crash at every instant of a scenario, with 16 seeds", "EveryInstant",
              lambda unit: {"APPSYNC_CRASH_BASE": unit.first, "APPSYNC_CRASH_SEEDS": unit.count},
              r", (\d+) crashes with", {"crashes": r", (\d+) crashes with"}, 16),
        gtest("crash-pairs", "a crash at every instant of every recovery of a scenario, with 3 seeds each",
              "EveryPairOfInstants",
              lambda unit: {"APPSYNC_CRASH_BASE": unit.first, "APPSYNC_CRASH_SEEDS": unit.count},
              r": (\d+) pairs of crashes", {"pairs of crashes": r": (\d+) pairs of crashes"}, 3),
        hardship("kills", "the command is killed at one in 64 of a scenario's calls", "tests/hardship/test_kills.py",
                 r"(\d+) kills in", r"--kill (\d+): "),
        hardship("failing-calls", "one in 8 of a scenario's calls fails, with one of the errors",
                 "tests/hardship/test_failing_calls.py", r"(\d+) failing calls of", r"--at (\d+): "),
        gtest("recordings", "250 sessions that seeds decide, each recorded, and replayed twice", "Replay",
              lambda unit: {"APPSYNC_FIRST_SEED": unit.first, "APPSYNC_SEEDS": unit.count}, r'"seeds": "(\d+)"', {}, 250,
              parts=lambda: names_in("Replay", r"RepeatsSessions\w+", RECORDINGS), program=RECORDINGS),
        mutants(),
        fuzz(),
        walks(),
    )
}
