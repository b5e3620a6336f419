"""A unit of work, what comes of it, and how it is run: a program of the tree, in a process of its own."""

import dataclasses
import os
import pathlib
import resource
import shlex
import signal
import subprocess
import tempfile
import time

from campaigns.tree import ROOT

LIMIT = 600  # seconds that a unit may take; all take a few
MOST_MADE_SMALL = 3  # findings of a unit: more of them are most often one and the same
TAIL = 6000  # characters of the output of what failed that are kept


@dataclasses.dataclass(frozen=True)
class Unit:
    """A range of a kind's work, which can be done again without harm."""

    kind: str
    part: str  # a scenario, a target ...; empty where the kind has no parts
    first: int
    count: int

    @property
    def key(self):
        """Names it, in whichever campaign."""
        return f"{self.part}:{self.first}:{self.count}"

    @classmethod
    def of_key(cls, kind, key):
        part, first, count = key.rsplit(":", 2)
        return cls(kind, part, int(first), int(count))


@dataclasses.dataclass
class Finding:
    """Something that failed, and the line that repeats it from the root of the tree."""

    what: str
    replay: str
    output: str = ""


@dataclasses.dataclass
class Record:
    """What came of a unit."""

    tried: int = 0
    failed: int = 0
    covered: dict = dataclasses.field(default_factory=dict)  # name -> how many
    findings: list = dataclasses.field(default_factory=list)
    seconds: float = 0.0  # by the clock
    processor: float = 0.0  # seconds that the programs had it
    hangs: bool = False

    @property
    def passed(self):
        return self.tried - self.failed


@dataclasses.dataclass
class Ended:
    """How a program ended, and all that it said: its output, and GoogleTest's report."""

    status: int = 0
    output: str = ""
    hangs: bool = False
    made: str = ""  # a directory for what it writes, as long as the unit is read


def by_hand(command, environment):
    """The line that runs it again, from the root of the tree."""
    variables = [f"{name}={shlex.quote(str(value))}" for name, value in environment.items()]
    return " ".join([*variables, shlex.join(command)]).replace(f"{ROOT}/", "")


def finish(command, environment, limit, made):
    """Runs it to its end, or its limit; it ends with the worker, too."""
    report = pathlib.Path(made, "report.json")
    reporting = {"GTEST_OUTPUT": f"json:{report}"} if pathlib.Path(command[0]).parent.name == "tests" else {}
    # What a killed worker leaves behind would take the processor from its successor.
    process = subprocess.Popen(
        ["setpriv", "--pdeathsig", "KILL", "--", *command], cwd=ROOT, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
        stderr=subprocess.STDOUT, text=True, errors="replace", start_new_session=True,
        env={**os.environ, **{name: str(value) for name, value in environment.items()}, **reporting, "TMPDIR": made},
    )
    hangs = False
    try:
        output = process.communicate(timeout=limit)[0]
    except subprocess.TimeoutExpired:
        hangs = True
        kill(process)
        output = what_it_said(process)
    if report.exists():
        output += report.read_text(errors="replace")
    return Ended(process.returncode, output, hangs, made)


def what_it_said(process):
    """Of a program that was ended. What it has started apart from itself may hold its output open."""
    try:
        return process.communicate(timeout=10)[0]
    except subprocess.TimeoutExpired:
        process.stdout.close()
        return ""


def kill(process):
    """And all that it has started."""
    try:
        os.killpg(process.pid, signal.SIGKILL)
    except ProcessLookupError:
        pass


def processor_seconds():
    """Of all programs that have ended for this process."""
    usage = resource.getrusage(resource.RUSAGE_CHILDREN)
    return usage.ru_utime + usage.ru_stime


def run(unit, limit=LIMIT):
    """Does a unit, on a worker. What goes wrong with it is a finding, never an exception."""
    from campaigns.kinds import KINDS  # which needs this module

    kind = KINDS[unit.kind]
    command, environment = kind.command(unit)
    start, processor = time.monotonic(), processor_seconds()
    with tempfile.TemporaryDirectory(prefix="campaign-") as made:
        try:
            ended = finish(command, environment, limit, made)
        except OSError as error:
            ended = Ended(-1, f"cannot be run: {error}", made=made)
        record = kind.read(unit, ended)
        if not ended.hangs:
            few, others = record.findings[:MOST_MADE_SMALL], record.findings[MOST_MADE_SMALL:]
            record.findings = [kind.smaller(each, made) for each in few] + others
    record.seconds = time.monotonic() - start
    record.processor = processor_seconds() - processor
    if ended.hangs:
        record.hangs = True
        record.findings = [Finding(f"no end after {limit:g} s", by_hand(command, environment), ended.output[-TAIL:])]
        record.tried = record.failed = 1
    return record
