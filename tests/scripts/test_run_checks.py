import json
import re
import subprocess
import sys

import pytest

from scripts import FOLDER, load

run_checks = load("run_checks")
Counts, Stage = run_checks.Counts, run_checks.Stage


def test_a_stage_that_finds_less_than_it_should_fails(capsys):
    counts = run_checks.run_stage("few", Stage(3, lambda: Counts(passed=2)))
    assert (counts.passed, counts.failed) == (2, 1)
    assert "few: 2 checks where there are 3 at the least" in capsys.readouterr().out


@pytest.mark.parametrize("found", [Counts(passed=3), Counts(passed=1, skipped=["a", "b"])])
def test_a_stage_that_finds_enough_does_not(found):
    assert run_checks.run_stage("enough", Stage(3, lambda: found)).failed == 0


def test_a_stage_that_has_failed_is_not_told_to_have_found_little():
    assert run_checks.run_stage("broken", Stage(3, lambda: Counts(failed=1))).failed == 1


def test_what_is_skipped_is_named_with_its_number(capsys):
    counts = run_checks.conclusion({"one": Counts(1, 0, ["a: no mounts"]), "two": Counts(2, 0, ["b"])}, False)
    assert str(counts) == "3 passed, 0 failed, 2 skipped"
    out = capsys.readouterr().out
    assert "cannot run 2 of the checks" in out and "one: a: no mounts" in out and "two: b" in out


def test_what_is_skipped_fails_in_ci():
    counts = run_checks.conclusion({"one": Counts(1, 0, ["a", "b"])}, True)
    assert str(counts) == "1 passed, 2 failed"


def test_nothing_skipped_is_not_mentioned(capsys):
    assert str(run_checks.conclusion({"one": Counts(1)}, True)) == "1 passed, 0 failed"
    assert capsys.readouterr().out == ""


def test_every_stage_expects_something():
    stages = {**run_checks.STAGES, **run_checks.LONG_STAGES}
    assert [name for name, stage in stages.items() if stage.least < 1] == []


def test_skipped_tests_are_read_from_googletests_report(tmp_path):
    tests = [{"name": "a", "result": "COMPLETED"}, {"name": "b", "result": "SKIPPED"}]
    report = tmp_path / "report.json"
    report.write_text(json.dumps({"tests": 2, "failures": 0, "disabled": 0, "testsuites": [
        {"name": "Suite", "testsuite": tests}]}))
    assert run_checks.gtest_counts(report, True) == Counts(1, 0, ["Suite.b"])
    assert run_checks.gtest_counts(report, False) == Counts(1, 1, ["Suite.b"])


def test_skipped_tests_are_read_from_pytests_report(tmp_path):
    (tmp_path / "test_it.py").write_text(
        "import pytest\ndef test_good(): pass\ndef test_bad(): assert False\n"
        "def test_not_here(): pytest.skip('no mounts')\n")
    report = tmp_path / "report.xml"
    subprocess.run([sys.executable, "-m", "pytest", "-p", "no:cacheprovider", f"--junitxml={report}", tmp_path],
                   capture_output=True, check=False, cwd=tmp_path)
    assert run_checks.pytest_counts(report, False) == Counts(1, 1, ["test_it.test_not_here: no mounts"])


def test_a_report_that_is_not_there_is_a_failure(tmp_path):
    assert run_checks.pytest_counts(tmp_path / "none", True) == Counts(failed=1)
    assert run_checks.gtest_counts(tmp_path / "none", True) == Counts(failed=1)


def test_a_test_that_does_not_end_is_named(capsys, tmp_path):
    said = tmp_path / "said"
    said.write_text("[ RUN      ] Suite.quick\n[       OK ] Suite.quick (0 ms)\n[ RUN      ] Suite.hangs\n")
    assert not run_checks.run(["sh", "-c", f"cat {said}; exec sleep 60"], timeout=1)
    out = capsys.readouterr().out
    assert "no end after 1 s, in Suite.hangs" in out and "quick" not in out


def test_the_last_line_is_the_counts_alone():
    done = subprocess.run([sys.executable, FOLDER / "run_checks", "layers"], capture_output=True, text=True, check=True)
    assert re.fullmatch(r"[1-9]\d* passed, 0 failed", done.stdout.splitlines()[-1])
