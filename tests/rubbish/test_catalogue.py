"""Every entry of the catalogue: its outcome, what it costs, and that it touches only the device."""

import importlib
import json
import os
import pathlib
import shutil

import pytest

from entry import Place

FOLDER = pathlib.Path(__file__).resolve().parent / "catalogue"
ENTRIES = [(path.stem, entry) for path in sorted(FOLDER.glob("*.py"))
           for entry in importlib.import_module("catalogue." + path.stem).ENTRIES]

SECONDS = 1  # of the processor
KILOBYTES = 64 * 1024


def test_names_are_unique_and_there_are_enough():
    names = [(kind, entry.name) for kind, entry in ENTRIES]
    assert sorted(set(names)) == sorted(names)
    assert len(names) >= 300


def failures_in(done):
    """The failures that the command printed as JSON, each identifier and error."""
    try:
        printed = json.loads(done.out)
    except ValueError:
        return []
    return [(each.get("identifier"), each["error"])
            for each in printed.get("failed", [])] if isinstance(printed, dict) else []


def note_costs(kind, entry, done):
    """One line for each entry, where somebody asks for them."""
    if file := os.environ.get("APPSYNC_RUBBISH_COSTS"):
        with open(file, "a") as costs:
            costs.write("%.3f s %7d KiB  status %d  %s: %s\n" % (
                done.seconds, done.kilobytes, done.status, kind, entry.name))


@pytest.mark.parametrize("kind, entry", ENTRIES,
                         ids=["%s: %s" % (kind, entry.name) for kind, entry in ENTRIES])
def test_outcome(kind, entry, appsync, templates, scratch, base):
    place = Place(scratch / "place", templates, entry.device)
    try:
        made = entry.make(place)
        if made is not None:
            place.input.write_bytes(made)
        outside, place.before = place.outside_tree(), place.device_tree()
        done = appsync(*place.words(entry.command), directory=place.deep)
        note_costs(kind, entry, done)
        assert not done.late, "it hangs"
        right = entry.status if isinstance(entry.status, tuple) else (entry.status,)
        assert done.status in right, (done.status, done.out[-2000:] + done.err[-2000:])
        assert place.outside_tree() == outside
        if entry.identifier is not None:
            told = [error for identifier, error in failures_in(done) if identifier == entry.identifier]
            assert told, done.out
            assert any(entry.says in error for error in told), told
        else:
            assert entry.says in done.err, done.err
        if done.status in (2, 3):
            assert done.err.count("\n") == 1, done.err
        if entry.also:
            entry.also(place, done)
        if not appsync.is_sanitized:  # there it is the sanitizer's time, and enough that it ends
            assert done.seconds <= SECONDS
        # A sanitizer's own memory is there before anything is read.
        limit = KILOBYTES + (base if appsync.is_sanitized else 0)
        assert done.kilobytes <= limit, done.kilobytes
    finally:
        shutil.rmtree(place.top, ignore_errors=True)
