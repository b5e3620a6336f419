import pytest

from scripts import load

mutate = load("mutate")


def edits(*changes):
    return [mutate.Edit("client/A.cpp", number, number, "", "", change) for number, change in enumerate(changes)]


def test_changes_that_do_not_compile_are_no_mutants_and_are_counted(monkeypatch):
    monkeypatch.setattr(mutate, "sources", lambda: ["client/Paths.cpp"])
    every, none = mutate.find_edits(set())
    assert len(every) > 3 and none == []
    most, one = mutate.find_edits({mutate.key_of(every[1]), "client/Gone.cpp@1-2:what is no longer there"})
    assert [edit.change for edit in one] == [every[1].change]
    assert [edit.number for edit in most] == list(range(1, len(every)))


def test_the_summary_tells_how_many(capsys):
    assert mutate.summary([(edit, "test_client failed", True) for edit in edits("a", "b")], 7)
    out = capsys.readouterr().out
    assert "2 mutants, 2 caught, 0 survived" in out and "7 changes more do not compile" in out


def test_what_recordings_notice_is_told_of_each_folder():
    results = list(zip(edits("a", "b", "c"), ("failed", "", "crashed")))
    assert mutate.share_of("client", results) == "client: 2 of 3 noticed"
    assert mutate.share_of("platform", results) == "platform: 0 of 0 noticed"


def test_what_was_prepared_is_met_by_number(tmp_path, monkeypatch, capsys):
    monkeypatch.setattr(mutate, "PREPARED", tmp_path / "prepared.json")
    monkeypatch.setattr(mutate, "remembered", set)
    monkeypatch.setattr(mutate, "sources", lambda: ["client/Paths.cpp"])
    every, _ = mutate.find_edits(set())
    sessions = mutate.Suite("test_reliability", "Seeds.", 2.0, {2})
    mutate.save_prepared(every, [mutate.Suite("test_client", "Paths.", 0.1, {1, 2})], sessions)
    monkeypatch.setattr(mutate, "run", lambda *_: ("failed", 0.1))
    monkeypatch.setattr(mutate, "run_sessions", lambda *_: ("", 0.1))
    mutate.meet_numbers(2, 3)
    out = capsys.readouterr().out
    assert out.startswith("2 caught: test_client failed: client/Paths.cpp:")
    assert "\n3 survived: client/Paths.cpp:" in out and out.endswith("2 mutants, 1 caught\n")


def test_what_was_prepared_of_other_sources_is_not_met(tmp_path, monkeypatch):
    monkeypatch.setattr(mutate, "PREPARED", tmp_path / "prepared.json")
    with pytest.raises(SystemExit, match="--prepare"):
        mutate.read_prepared()
    mutate.save_prepared([], [], mutate.Suite("test_reliability", "Seeds.", 2.0, set()))
    assert mutate.read_prepared()[0] == []
    monkeypatch.setattr(mutate, "digest", lambda: "another")
    with pytest.raises(SystemExit, match="--prepare"):
        mutate.read_prepared()
