"""Campaigns, on stand-ins for the programs of the tree and, a little, on the real ones."""

import json
import os
import re
import shutil
import signal
import socket
import sqlite3
import subprocess
import sys

import pytest

from scripts import FOLDER

sys.path.insert(0, str(FOLDER))
ROOT = FOLDER.parent
LIMIT = 120

# What its seeds do stands in files of does/, each named by the first seed of a unit.
PROGRAM = """#!/bin/sh
seed=$APPSYNC_FIRST_SEED
place=${PLACE:-$(cd "$(dirname "$0")/../.." && pwd)}
if [ -n "$APPSYNC_SMALL" ]; then . "$place/does/small"; exit 1; fi
echo "$seed" >>"$place/ran"
if [ -e "$place/does/$seed" ]; then . "$place/does/$seed"; fi
echo '"seeds": "250", "faults": "3"'
"""
LISTS = """cmake_minimum_required(VERSION 3.20)
project(standin NONE)
add_custom_target(appsync COMMAND cmake -E touch ${CMAKE_BINARY_DIR}/appsync)
add_custom_target(test_recordings
    COMMAND cmake -E make_directory ${CMAKE_BINARY_DIR}/tests
    COMMAND cmake -E touch ${CMAKE_BINARY_DIR}/tests/test_recordings)
add_custom_target(test_reliability
    COMMAND cmake -E copy ${CMAKE_SOURCE_DIR}/program ${CMAKE_BINARY_DIR}/tests/test_reliability)
"""
PRESETS = {
    "version": 3,
    "configurePresets": [{"name": "release", "generator": "Ninja", "binaryDir": "${sourceDir}/build/release"}],
    "buildPresets": [{"name": "release", "configurePreset": "release"}],
}
ENVIRONMENT = {
    **os.environ,
    **{f"GIT_{who}_{what}": "nobody" for who in ("AUTHOR", "COMMITTER") for what in ("NAME", "EMAIL")},
}


class Tree:
    """A clone with a stand-in for test_reliability, built."""

    def __init__(self, path):
        self.path = path

    @classmethod
    def made(cls, path, program=PROGRAM):
        tree = cls(path)
        (path / "scripts").mkdir(parents=True)
        shutil.copy(FOLDER / "campaign", path / "scripts")
        shutil.copytree(FOLDER / "campaigns", path / "scripts" / "campaigns", ignore=shutil.ignore_patterns("__pycache__"))
        (path / "program").write_text(program)
        (path / "program").chmod(0o755)
        (path / "CMakeLists.txt").write_text(LISTS)
        (path / "CMakePresets.json").write_text(json.dumps(PRESETS))
        (path / ".gitignore").write_text("/build/\n__pycache__/\n")
        tree.git("init", "-q")
        tree.commit()
        tree.build()
        return tree

    def git(self, *words):
        done = subprocess.run(["git", *words], cwd=self.path, env=ENVIRONMENT, check=True, capture_output=True, text=True)
        return done.stdout.strip()

    def commit(self):
        self.git("add", "-A")
        self.git("commit", "-q", "-m", "Change it")

    def build(self):
        (self.path / "build" / "release" / "tests").mkdir(parents=True)
        (self.path / "build" / "does").mkdir()
        shutil.copy(self.path / "program", self.path / "build" / "release" / "tests" / "test_reliability")
        (self.path / "build" / "release" / "appsync").touch()

    def does(self, seed, script):
        (self.path / "build" / "does" / str(seed)).write_text(script + "\n")

    def ran(self):
        """How often each unit was begun."""
        seeds = (self.path / "build" / "ran").read_text().split()
        return {int(seed): seeds.count(seed) for seed in seeds}

    def start(self, *words, **variables):
        return subprocess.Popen(
            ["/usr/bin/python3", str(self.path / "scripts" / "campaign"), *map(str, words)], stdout=subprocess.PIPE,
            stderr=subprocess.STDOUT, text=True, stdin=subprocess.DEVNULL, env={**os.environ, **variables},
        )

    def campaign(self, *words, status=0):
        process = self.start(*words)
        out = process.communicate(timeout=LIMIT)[0]
        assert process.returncode == status, out
        return out

    def figures(self, kind="seeds"):
        return json.loads((self.path / "build" / "campaign" / f"{kind}.json").read_text())[0]


@pytest.fixture
def tree(tmp_path):
    return Tree.made(tmp_path / "tree")


def count_of(figures):
    return figures["units"], figures["tried"], figures["failed"]


# --- what a campaign does ------------------------------------------------------------------------


def test_a_campaign_counts_what_it_did_and_writes_a_page(tree):
    out = tree.campaign("seeds", "--local", 2, "--units", 6)
    assert "6 units, 1,500 tried, 0 failed, 18 faults" in out
    figures = tree.figures()
    assert count_of(figures) == (6, 1500, 0) and figures["covered"] == {"faults": 18}
    assert figures["commit"] == tree.git("rev-parse", "HEAD")
    page = (tree.path / "build" / "campaign" / "seeds.html").read_text()
    assert "<svg" in page and "<polyline" in page and figures["commit"] in page
    assert tree.ran() == {seed: 1 for seed in range(0, 1500, 250)}


FAILS = """for each in 1 2 3 4; do echo "APPSYNC_SEED=$each build/release/tests/test_reliability --gtest_filter=Seeds.One"; done
exit 1"""


def test_findings_are_made_small(tree):
    tree.does(0, FAILS)
    tree.does("small", """echo "small: 1 applications, 2 choices: lost"
echo "again: APPSYNC_SEED=$APPSYNC_SEED APPSYNC_CHANGES='choices:1,2' build/release/tests/test_reliability" """)
    tree.campaign("seeds", "--local", 1, "--units", 1, status=1)
    *small, last = tree.figures()["findings"]
    assert [each["what"] for each in small] == ["1 applications, 2 choices: lost"] * 3
    assert small[0]["replay"] == "APPSYNC_SEED=1 APPSYNC_CHANGES='choices:1,2' build/release/tests/test_reliability"
    assert "of: APPSYNC_SEED=1 build/release" in small[0]["output"]
    assert last["replay"].startswith("APPSYNC_SEED=4 ") and "APPSYNC_CHANGES" not in last["replay"]


def test_what_cannot_be_made_small_stays_as_it_was(tree):
    tree.does(0, FAILS)
    tree.does("small", "kill -ABRT $$")
    tree.campaign("seeds", "--local", 1, "--units", 1, status=1)
    findings = tree.figures()["findings"]
    assert [each["replay"].split()[0] for each in findings] == [f"APPSYNC_SEED={each}" for each in (1, 2, 3, 4)]


def test_a_campaign_that_was_killed_goes_on_where_it_was(tree):
    reached = tree.path / "build" / "reached"
    os.mkfifo(reached)
    tree.does(750, f"echo >{reached}; exec sleep 1000")
    first = tree.start("seeds", "--local", 1, "--units", 6)
    reached.read_text()  # comes when the fourth unit has begun
    first.kill()
    first.communicate()
    (tree.path / "build" / "does" / "750").unlink()
    assert "6 units, 1,500 tried" in tree.campaign("seeds", "--local", 1, "--units", 6)
    assert tree.ran() == {seed: 2 if seed == 750 else 1 for seed in range(0, 1500, 250)}


def test_a_campaign_that_is_stopped_tells_what_it_did(tree):
    reached = tree.path / "build" / "reached"
    os.mkfifo(reached)
    tree.does(250, f"echo >{reached}; exec sleep 1000")
    process = tree.start("seeds", "--local", 1, "--for", "1h")
    reached.read_text()
    process.send_signal(signal.SIGINT)
    assert "1 units, 250 tried" in process.communicate(timeout=LIMIT)[0] and process.returncode == 0


def test_a_failure_is_told_with_the_line_that_repeats_it(tree):
    line = "APPSYNC_SEED=251 build/release/tests/test_reliability --gtest_filter=Seeds.One"
    tree.does(250, f"echo '{line}'; echo '\"seeds\": \"250\"'; exit 1")
    out = tree.campaign("seeds", "--local", 2, "--units", 3, status=1)
    assert "FAILED seeds :250:250: failed" in out and line in out
    assert count_of(tree.figures()) == (3, 750, 1)
    assert [each["replay"] for each in tree.figures()["findings"]] == [line]


@pytest.mark.parametrize("script, what", [
    ("exec sleep 1000", "no end after 2 s"),
    ("kill -9 $PPID; exec sleep 1000", "its worker has died, more than once"),
], ids=["hangs", "kills its worker"])
def test_a_unit_that_ends_badly_is_a_finding_and_the_campaign_goes_on(tree, script, what):
    tree.does(250, script)
    out = tree.campaign("seeds", "--local", 2, "--units", 4, "--limit", "2s", status=1)
    assert f"seeds :250:250: {what}; it is tried once more, alone" in out
    assert count_of(tree.figures()) == (4, 751, 1)
    [finding] = tree.figures()["findings"]
    assert finding["what"] == what and "APPSYNC_FIRST_SEED=250 APPSYNC_SEEDS=250 build/release/tests/" in finding["replay"]


def test_a_unit_that_hangs_no_more_when_it_is_alone_is_no_finding(tree):
    once = tree.path / "build" / "once"
    tree.does(0, f"if mkdir {once}; then exec sleep 1000; fi")
    out = tree.campaign("seeds", "--local", 2, "--units", 3, "--limit", "2s")
    assert "no end after 2 s; it is tried once more" in out and tree.ran()[0] == 2
    assert count_of(tree.figures()) == (3, 750, 0)


# --- states --------------------------------------------------------------------------------------


def test_two_campaigns_are_added_up_and_nothing_counts_twice(tree):
    one, other = tree.path / "build" / "one.db", tree.path / "build" / "other.db"
    tree.campaign("seeds", "--local", 2, "--units", 4, "--state", one)
    tree.campaign("seeds", "--local", 2, "--units", 4, "--first", 700, "--state", other)  # from 500 on: two of the first
    assert "4 units, 1,000 tried" in tree.campaign("sum", other)
    page = tree.path / "build" / "both"
    assert "6 units, 1,500 tried" in tree.campaign("sum", one, other, "--page", page)
    assert json.loads(page.with_suffix(".json").read_text())[0]["units"] == 6


def test_rubbish_is_no_state(tree):
    state = tree.path / "build" / "rubbish.db"
    state.write_bytes(b"rubbish" * 1000)
    for words in (["seeds", "--state", state], ["sum", state]):
        assert "is no state of a campaign" in tree.campaign(*words, status=2)
    assert state.read_bytes() == b"rubbish" * 1000
    state.unlink()
    sqlite3.connect(state).execute("CREATE TABLE others (name TEXT)").connection.close()
    assert "is no state of a campaign" in tree.campaign("seeds", "--state", state, status=2)


def test_a_state_is_of_one_kind_and_one_commit(tree):
    state = tree.path / "build" / "state.db"
    tree.campaign("seeds", "--local", 1, "--units", 1, "--state", state)
    assert "is the state of a campaign of seeds, this one is of walks" in tree.campaign("walks", "--state", state, status=2)
    (tree.path / "program").write_text(PROGRAM + "# changed\n")
    assert "is the state of a campaign at " in tree.campaign("seeds", "--state", state, status=2)


def test_a_state_is_not_used_twice_at_once(tree):
    state = tree.path / "build" / "state.db"
    tree.campaign("seeds", "--local", 1, "--units", 1, "--state", state)
    held = sqlite3.connect(state, isolation_level=None)
    held.execute("BEGIN EXCLUSIVE")
    assert "is used by another campaign" in tree.campaign("seeds", "--state", state, status=2)


@pytest.mark.parametrize("words, what", [
    (["nothing"], "invalid choice"),
    (["seeds", "--for", "soon"], "is no duration"),
    (["seeds", "--units", "0"], "is no number"),
    (["sum"], "which states"),
    (["seeds", "some.db"], "only keep and sum take states"),
    (["keep", "gone.db"], "there is no gone.db"),
    (["worker"], "which --scheduler"),
    (["fuzz"], "fuzz cannot be run: there is no build/fuzz/fuzz"),
    (["sum", "gone.db"], "there is no gone.db"),
])
def test_wrong_usage_is_told(tree, words, what):
    assert what in tree.campaign(*words, status=2)


# --- what is kept in the tree --------------------------------------------------------------------


LINE = "APPSYNC_SEED=501 build/release/tests/test_reliability --gtest_filter=Seeds.One"
DOCUMENT = """Before.

<!-- This table is made by `scripts/campaign keep`. -->
<!-- Its end. -->

After.
"""


@pytest.fixture
def keeping(tree):
    """A tree whose documents have a place for the table."""
    (tree.path / "docs").mkdir()
    (tree.path / "docs" / "reliability.md").write_text(DOCUMENT)
    shutil.copy(FOLDER / "check_docs", tree.path / "scripts")
    tree.commit()
    tree.campaign("keep")
    return tree


def kept_of(tree, kind="seeds"):
    return json.loads((tree.path / "docs" / "campaigns" / f"{kind}.json").read_text())["sums"]


def made_state(tree, name, *firsts, failing=None):
    """A state of seeds at the tree's commit, with units that begin at these; one of them has a finding."""
    from campaigns.state import State
    from campaigns.units import Finding, Record, Unit

    state = State(tree.path / "build" / name)
    state.belong_to("seeds", tree.git("rev-parse", "HEAD"), None)
    state.begin_sitting(1, None)
    for first in firsts:
        findings = [Finding("failed", LINE, "said")] if first == failing else []
        state.record(Unit("seeds", "", first, 250), Record(250, len(findings), {"faults": 3}, findings, 2.0, 1.0))
    state.close()
    return tree.path / "build" / name


def row_of(tree, kind):
    [row] = re.findall(rf"^\| {kind} .*$", (tree.path / "docs" / "reliability.md").read_text(), re.MULTILINE)
    return row


def test_what_is_kept_counts_nothing_twice(keeping):
    one = made_state(keeping, "one.db", 0, 250, 500, failing=500)
    other = made_state(keeping, "other.db", 500, 750, 1000, 1250, failing=500)
    assert "4 units more" in keeping.campaign("keep", other)
    assert "2 units more" in keeping.campaign("keep", one) and "0 units more" in keeping.campaign("keep", one, other)
    [sums] = kept_of(keeping)
    assert sums["commit"] == keeping.git("log", "-1", "--format=%H", "--", "scripts")
    assert sums["parts"] == {"": {"done": "0-1500/250", "tried": 1500, "failed": 1, "seconds": 12.0, "processor": 6.0,
                                  "covered": {"faults": 18}}}
    assert sums["findings"] == [{"unit": ":500:250", "what": "failed", "replay": LINE}]
    for words in ([], [one, other], [keeping.path / "docs" / "campaigns" / "seeds.json", one]):
        out = keeping.campaign("sum", *words, status=1)
        assert out.startswith(f"seeds at {sums['commit'][:12]}: 6 units, 1,500 tried, 1 failed"), out


def test_a_later_sitting_goes_on_behind_what_is_kept(keeping):
    state = keeping.path / "build" / "campaign" / "seeds.db"
    keeping.campaign("seeds", "--local", 1, "--units", 2)
    keeping.campaign("keep", state)
    keeping.commit()  # of documents only: it is the same campaign
    state.unlink()
    assert "begins at 500" in keeping.campaign("seeds", "--local", 1, "--units", 2)
    keeping.campaign("keep", state)
    keeping.campaign("seeds", "--local", 1, "--units", 1, "--first", 0, "--state", keeping.path / "build" / "again.db")
    assert keeping.ran() == {seed: 1 for seed in range(0, 1250, 250)}
    keeping.commit()
    (keeping.path / "program").write_text(PROGRAM + "# changed\n")
    keeping.commit()
    state.unlink()
    assert "begins at 1000" in keeping.campaign("seeds", "--local", 1, "--units", 1)
    keeping.campaign("keep", state)
    assert [each["parts"][""]["done"] for each in kept_of(keeping)] == ["0-1000/250", "1000-1250/250"]
    assert "seeds at 2 commits: 5 units, 1,250 tried, 0 failed" in keeping.campaign("sum")


def test_the_table_is_that_of_what_is_kept(keeping):
    keeping.campaign("keep", made_state(keeping, "seeds.db", 0, 250, 500, 750))
    row = row_of(keeping, "seeds")
    commit = keeping.git("log", "-1", "--format=%h", "--abbrev=7", "--", "scripts")
    assert row_of(keeping, "fuzz") == "| fuzz | none | | 0 | 0 | | | all |"
    assert row.startswith(f"| seeds | {commit} | 20") and row.endswith(" | 1,000 | 0 | 0.001 | 900,000 | 1,999,000 of 2,000,000 |")
    document = keeping.path / "docs" / "reliability.md"
    text = document.read_text()
    assert text.startswith("Before.\n") and text.endswith("\nAfter.\n")

    def check():
        return subprocess.run(["/usr/bin/python3", str(keeping.path / "scripts" / "check_docs")], capture_output=True,
                              text=True, check=False).stdout

    assert check() == ""
    for wrong in (text.replace("1,999,000", "1,999,001"), text.replace("made by", "made for")):
        document.write_text(wrong)
        assert check().startswith("docs/reliability.md: the table of campaigns is not that of docs/campaigns/")


@pytest.mark.parametrize("rubbish", ["rubbish", "[]", '{"kind": "seeds", "sums": [{"commit": "a"}]}'])
def test_rubbish_is_nothing_that_was_kept(keeping, rubbish):
    (keeping.path / "docs" / "campaigns").mkdir()
    (keeping.path / "docs" / "campaigns" / "seeds.json").write_text(rubbish)
    for words in (["seeds", "--local", 1, "--units", 1], ["sum"], ["keep"]):
        assert "has no sums that were kept" in keeping.campaign(*words, status=2)


@pytest.mark.parametrize("kind, parts, rounds, done, left", [
    ("fuzz", 2, None, [("One", 0, 70_000_000), ("One", 1, 70_000_000), ("Two", 0, 5_000_000)], "95,000,000 of 200,000,000"),
    ("crash-pairs", 3, None, [("A", 0, 10), ("A", 3, 10), ("B", 0, 10)], "1 of 3 scenarios"),
    ("kills", 2, 64, [("A", 0, 10), ("B", 0, 10)], "126 of 128 units"),
    ("mutants", 1, 2, [("", 0, 8), ("", 8, 8)], "none of 2 units"),
    ("walks", 1, None, [("", 0, 49_998)], "2 of 50,000"),
    ("crashes", 1, None, [("A", 0, 10)], "has no goal"),
])
def test_what_is_left_to_a_goal(kind, parts, rounds, done, left):
    from campaigns import kept
    from campaigns.units import Record

    sums = kept.Sums(kind, "this")
    sums.parts_in_all, sums.rounds = parts, rounds
    sums.add({f"{part}:{first}:1": Record(tried) for part, first, tried in done})
    assert kept.left(kind, {"this": sums}) == left


# --- workers on other machines -------------------------------------------------------------------


def free_port():
    with socket.socket() as one:
        one.bind(("127.0.0.1", 0))
        return one.getsockname()[1]


class Scheduler:
    """The engine's own, at an address that it keeps."""

    def __init__(self, folder):
        self.folder = folder
        self.port = free_port()
        self.address = f"tcp://127.0.0.1:{self.port}"
        self.start()

    def start(self):
        command = ["/usr/bin/python3", "-m", "distributed.cli.dask_scheduler", "--host", "127.0.0.1", "--no-dashboard"]
        command += ["--dashboard-address", "127.0.0.1:0"]
        self.process = subprocess.Popen(
            [*command, "--port", str(self.port)], cwd=self.folder, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL, env={**os.environ, "DASK_CONFIG": str(self.folder)},
        )

    def end(self):
        self.process.kill()
        self.process.wait()


@pytest.fixture
def scheduler(tmp_path):
    one = Scheduler(tmp_path)
    yield one
    one.end()


def test_a_worker_builds_the_commit_that_is_asked_for_and_survives_the_scheduler(tree, tmp_path, scheduler):
    other = Tree(tmp_path / "other")
    subprocess.run(["git", "clone", "-q", str(tree.path), str(other.path)], check=True)
    (other.path / "program").write_text("#!/bin/sh\nexit 1\n")
    other.commit()
    reached = tmp_path / "reached"
    os.mkfifo(reached)
    (tmp_path / "does").mkdir()
    (tmp_path / "does" / "500").write_text(f"if mkdir {tmp_path}/once; then echo >{reached}; exec sleep 1000; fi\n")
    worker = other.start("worker", "--scheduler", scheduler.address, "--processes", 1, PLACE=str(tmp_path))
    try:
        campaign = tree.start("seeds", "--scheduler", scheduler.address, "--units", 4)
        reached.read_text()
        scheduler.end()
        scheduler.start()
        out = campaign.communicate(timeout=LIMIT)[0]
        assert campaign.returncode == 0 and "4 units, 1,000 tried, 0 failed" in out, out
        assert (tmp_path / "ran").read_text().split() == ["0", "250", "500", "500", "750"]
    finally:
        worker.terminate()
        worker.communicate()


def test_a_worker_of_another_commit_is_refused(tree, tmp_path, scheduler):
    other = Tree.made(tmp_path / "other", PROGRAM + "# another\n")
    campaign = tree.start("seeds", "--scheduler", scheduler.address, "--for", "1h")
    try:
        refused = other.campaign("worker", "--scheduler", scheduler.address, "--processes", 1, status=2)
        assert f"does not have the commit {tree.git('rev-parse', 'HEAD')}" in refused
        subprocess.run(["git", "fetch", "-q", str(tree.path)], cwd=other.path, check=True)
        refused = other.campaign("worker", "--scheduler", scheduler.address, "--processes", 1, "--built", status=2)
        assert "refused: the campaign asks for the commit" in refused
    finally:
        campaign.send_signal(signal.SIGINT)
        assert "0 units" in campaign.communicate(timeout=LIMIT)[0]


def test_a_worker_that_has_built_something_else_gets_nothing(tmp_path):
    from campaigns import driver, engine, kinds, report
    from campaigns.state import State

    class Stopping(report.Bar):
        said = ""

        def say(self, text):
            self.said += text
            campaign.stop()

    state = State(tmp_path / "state.db")
    state.belong_to("seeds", "this", None)
    bar = Stopping("seeds")
    with engine.local(1, [engine.resource("release", "another")]) as cluster:
        campaign = driver.Campaign(kinds.KINDS["seeds"], state, "this", bar, cluster.scheduler_address)
        campaign.go()
    assert "is refused: it offers release@another, and this campaign needs release@this" in bar.said
    assert state.done() == set() and campaign.tries == 0
    state.close()


# --- kinds ---------------------------------------------------------------------------------------


FUZZER = """#include <cstddef>
#include <cstdint>
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size > 0 && data[0] == '!') __builtin_trap();
    return 0;
}
"""


def test_what_a_fuzzer_finds_can_be_repeated(tree):
    folder = tree.path / "build" / "fuzz" / "fuzz"
    folder.mkdir(parents=True)
    (folder / "one.cpp").write_text(FUZZER)
    subprocess.run(["clang++", "-fsanitize=fuzzer", "-O1", "one.cpp", "-o", "OneFuzz"], cwd=folder, check=True)
    tree.campaign("fuzz", "--local", 2, "--units", 2, status=1)
    assert tree.figures("fuzz")["tried"] > 2
    for finding in tree.figures("fuzz")["findings"]:
        done = subprocess.run(["sh", "-c", finding["replay"]], cwd=tree.path, capture_output=True, text=True, check=False)
        assert done.returncode != 0 and "deadly signal" in done.stderr, finding
    (folder / "one.cpp").write_text(FUZZER.replace("size > 0", "size > 5000"))
    subprocess.run(["clang++", "-fsanitize=fuzzer", "-O1", "one.cpp", "-o", "OneFuzz"], cwd=folder, check=True)
    state = tree.path / "build" / "good.db"
    assert "2 units, 100,00" in tree.campaign("fuzz", "--local", 2, "--units", 2, "--state", state)


MUTATE = """import sys
first, last = map(int, sys.argv[2].split("-"))
numbers = range(first, min(last, 12) + 1)
for number in numbers:
    print(number, "survived" if number == 9 else "caught: test_client failed", end=": client/A.cpp:1: run: without a()\\n")
print(len(numbers), "mutants,", len(numbers) - (9 in numbers), "caught")
"""


def prepare_mutants(tree):
    (tree.path / "scripts" / "mutate").write_text(MUTATE)
    (tree.path / "build" / "mutate").mkdir()
    (tree.path / "build" / "mutate" / "prepared.json").write_text(json.dumps({"mutants": 12}))


def test_mutants_end_with_the_last_and_survivors_are_findings(tree):
    prepare_mutants(tree)
    tree.campaign("mutants", "--local", 2, status=1)
    assert count_of(tree.figures("mutants")) == (2, 12, 1)
    [finding] = tree.figures("mutants")["findings"]
    assert finding["replay"] == "scripts/mutate --numbers 9-9" and "client/A.cpp:1: run: without a()" in finding["what"]


def test_what_was_kept_of_a_kind_that_ends_is_not_done_again(keeping):
    prepare_mutants(keeping)
    keeping.commit()
    keeping.campaign("mutants", "--local", 1, "--units", 1)
    state = keeping.path / "build" / "campaign" / "mutants.db"
    keeping.campaign("keep", state)
    assert row_of(keeping, "mutants").endswith(" | 8 | 0 | 0.000 |  | 1 of 2 units |")
    state.unlink()
    keeping.campaign("mutants", "--local", 1, status=1)  # the ninth survives
    assert count_of(keeping.figures("mutants")) == (1, 4, 1)
    keeping.campaign("keep", state)
    assert row_of(keeping, "mutants").endswith(" | 12 | 1 | 0.000 |  | none of 2 units |")


REAL = {"seeds": 2, "faults": 2, "crashes": 2, "crash-pairs": 1, "kills": 2, "failing-calls": 2, "recordings": 3,
        "walks": 1}  # units


@pytest.fixture(scope="module")
def real(tmp_path_factory):
    """The campaigns of this tree itself, and two workers for all of its kinds."""
    for test in ("test_reliability", "test_recordings"):
        if not (ROOT / "build" / "release" / "tests" / test).exists():
            pytest.skip(f"{test} is not built")
    from campaigns import engine

    with engine.local(2, [engine.resource("release", "this")]) as cluster:
        yield cluster


@pytest.mark.parametrize("name", REAL)
def test_a_kind_loses_nothing_when_a_worker_is_killed(real, tmp_path, name):
    from campaigns import driver, kinds, report
    from campaigns.state import State

    class Killing(driver.Campaign):
        killed = 0

        def start(self, client, unit):
            super().start(client, unit)
            if not self.killed:
                nannies = [nanny for nanny in real.workers.values() if nanny.process and nanny.process.is_alive()]
                os.kill(nannies[0].pid, signal.SIGKILL)
                self.killed += 1

    kind = kinds.KINDS[name]
    assert not kind.missing()
    state = State(tmp_path / "state.db")
    state.belong_to(name, "this", None)
    campaign = Killing(kind, state, "this", report.Bar(name), real.scheduler_address, most=REAL[name])
    campaign.go()
    results = state.results()
    state.close()
    assert campaign.killed and len(results) == REAL[name]
    assert sum(result.tried for result in results.values()) > 0
    assert [finding for result in results.values() for finding in result.findings] == []


def unit_of(name):
    from campaigns import kinds

    kind = kinds.KINDS[name]
    return kind, next(kind.units())


@pytest.mark.parametrize("name, said, replay", [
    ("kills", "sync: 5 kills in 300 calls\nE   --kill 65: openat\n1 failed", "APPSYNC_CALLS=65 "),
    ("failing-calls", "sync: 7 failing calls of 60\nE   --calls x --fail EIO --at 9: write\n1 failed", "APPSYNC_CALLS=9 "),
    ("walks", "FAILED acceptance/test_walk.py::test_a_day_of_random_use[off-7] - x\n1 failed, 1 passed",
     "APPSYNC_FIRST_WALK=7 APPSYNC_WALKS=1 "),
    ("crashes", "APPSYNC_CRASH=A:1:2 build/release/tests/test_reliability --gtest_filter=Crash.One\nA: 2 operations, "
     "32 crashes with the seeds", "APPSYNC_CRASH=A:1:2 "),
    ("recordings", "at first, again:\nAPPSYNC_FIRST_SEED=7 APPSYNC_SEEDS=1 build/release/tests/test_recordings "
     '--gtest_filter=Replay.RepeatsSessionsOfEveryKind\n"seeds": "250"', "APPSYNC_FIRST_SEED=7 APPSYNC_SEEDS=1 "),
])
def test_what_a_kind_says_of_a_failure_becomes_the_line_that_repeats_it(name, said, replay):
    if not (ROOT / "build" / "release" / "tests" / "test_reliability").exists():
        pytest.skip("test_reliability is not built")
    from campaigns.units import Ended

    kind, unit = unit_of(name)
    record = kind.read(unit, Ended(1, said))
    assert record.failed == 1 and record.tried > 1 and replay in record.findings[0].replay


@pytest.mark.parametrize("said", ["1 skipped in 0.1s", ""])
def test_a_unit_that_tried_nothing_is_no_success(said):
    from campaigns import kinds
    from campaigns.units import Ended, Unit

    kind = kinds.KINDS["kills" if said else "seeds"]
    record = kind.read(Unit(kind.name, "a test", 0, 1), Ended(0, said))
    assert [finding.what for finding in record.findings] == ["nothing was tried"] and record.failed == 1
