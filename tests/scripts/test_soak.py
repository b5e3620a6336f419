import pathlib

import pytest

from scripts import load

soak = load("soak")


@pytest.fixture(autouse=True)
def place(tmp_path, monkeypatch):
    monkeypatch.setattr(soak, "WORK", tmp_path)


def kind(name, script, rate=0.0, is_repeated=False):
    return soak.Kind(name, pathlib.Path("/bin/sh"), lambda *_: (["sh", "-c", script], {}), {}, rate, is_repeated)


def failed(*kinds, seconds=1.5):
    run = soak.Soak(kinds, 1, seconds)
    run.go()
    return run, run.print_table()


def test_a_run_that_ends_well_is_no_failure():
    assert failed(kind("good", "true"))[1] == 0


def test_a_run_that_fails_is_told(capsys):
    assert failed(kind("bad", "exit 3"))[1] == 1
    assert "FAILED bad: exit status 3" in capsys.readouterr().out


@pytest.mark.parametrize("rate", [0.0, 1.0])
def test_a_run_that_hangs_fails(monkeypatch, capsys, rate):
    monkeypatch.setattr(soak, "OVERRUN", 1)
    monkeypatch.setattr(soak, "LONGEST", 1)
    assert failed(kind("hangs", "sleep 1000", rate))[1] == 1
    out = capsys.readouterr().out
    assert "FAILED hangs: no end after" in out and "sleep 1000" in out


def test_what_a_hanging_run_has_started_ends_with_it(monkeypatch):
    monkeypatch.setattr(soak, "LONGEST", 1)
    assert failed(kind("hangs", "sleep 1000 & wait"))[1] == 1


def test_a_run_that_is_as_long_as_it_is_is_cut_short_when_the_time_is_over(monkeypatch, capsys):
    monkeypatch.setattr(soak, "GRACE", 0)
    run, failures = failed(kind("long", "sleep 1000"))
    assert failures == 0 and run.done["long"].cut == 1
    assert "cut short long" in capsys.readouterr().out
