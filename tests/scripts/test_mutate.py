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
