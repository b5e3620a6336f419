"""What a person sees on the screen while a session goes on, and what stays there afterwards."""

import os
import re
import shlex
import subprocess
import time

import pytest

import packages
from conftest import DIRECTLY, ON_ONE_PATH, Device
from terminal import TIMEOUT, Terminal

A = "com.example.app00"
MANY = 300
CTRL_S, CTRL_Q = b"\x13", b"\x11"

pytestmark = pytest.mark.plain_build  # what it waits for comes with the time


@pytest.fixture
def terminal(appsync):
    opened = []

    def start(*arguments, program=appsync.program, **more):
        opened.append(Terminal(program, arguments, **more))
        return opened[-1]

    yield start
    for each in opened:
        each.end()


@pytest.fixture(scope="module")
def many(tmp_path_factory):
    folder = str(tmp_path_factory.mktemp("many") / "library")
    packages.make_library(folder, MANY)
    return folder


@pytest.fixture
def waiting(appsync, device, library):
    """A library of which one application waits, as it runs, and four others do not."""
    device.sync(library)
    packages.make_library(library, 5, "2.0")
    appsync("run", device.path, A)
    return library


def has_come_to_wait(lines):
    """A line for the whole, where the four others have ended, and one for the one that runs: when its next try is."""
    return len(lines) == 2 and "4 of 5" in lines[0] and re.search(r"\d\d:\d\d:\d\d", lines[1])


# The whole and its parts.


def test_one_line_is_of_the_whole_and_the_others_of_what_is_active(device, waiting, terminal):
    shown = terminal("sync", device.path, waiting)
    shown.read_until(has_come_to_wait)
    whole, install = shown.shown()
    assert re.match(r"\[#+\.+\] +\d+ %  4 of 5  \S+ \w+ of \S+ \w+  ", whole), whole
    assert install.startswith("install ") and A in install and "next try" in install
    assert "left" not in whole, "nobody knows when the application ends"
    # It tells that it goes on.
    shown.read_until(lambda lines: lines and lines[0] != whole)


def test_what_has_ended_well_goes_away(device, library, terminal):
    shown = terminal("sync", device.path, library)
    assert shown.read_to_end() == 0
    lines = shown.everything()
    assert len(lines) >= 2 and lines[0].startswith("Installed 5: ") and " sent in " in lines[-1]
    assert not any("[" in line for line in lines)
    for seen in ("prepare  reading packages", "transfer ", "install ", " of 5"):
        assert seen in shown.written


@ON_ONE_PATH
def test_it_is_said_from_the_beginning_what_is_being_done(device, many, terminal):
    shown = terminal("sync", device.path, many)
    shown.read_until(lambda lines: lines)
    assert shown.written.startswith("opening the device  0:00\r\n")
    shown.read_until(lambda lines: any(re.match(r"prepare  .*, \d+ of %d  " % MANY, line) for line in lines))
    counts, percents = set(), [0]
    while shown.read_some():
        match = re.match(r"\[[#.]+\] +(\d+) %%  (\d+) of %d  " % MANY, (shown.shown() or [""])[0])
        if match:
            percents.append(int(match[1]))
            counts.add(int(match[2]))
    assert shown.process.wait() == 0
    assert percents == sorted(percents), "it went back"
    assert len(counts) > 3, counts
    assert len(shown.everything()) < 10


@DIRECTLY
def test_what_fails_stays_but_not_all_of_many(device, tmp_path, terminal):
    bad = str(tmp_path / "bad")
    for name in packages.make_library(bad, 30):
        bundle = name.rsplit(".", 1)[-1].title() + ".app"
        packages.damage_contents(os.path.join(bad, name + ".zip"), bundle + "/Resources/data.bin")
    shown = terminal("sync", device.path, bad)
    assert shown.read_to_end() == 1
    lines = shown.everything()
    assert sum(line.endswith(" failed") for line in lines) == 10
    assert any(line.startswith("Failed 30: ") for line in lines)


# Like reasons.


@DIRECTLY
def test_like_reasons_are_told_once(appsync, device, tmp_path, terminal):
    folder = str(tmp_path / "library")
    names = packages.make_library(folder, 30)
    device.sync(folder)
    for name in names:
        appsync("demote", device.path, name)

    def skipped(*options):
        shown = terminal("sync", device.path, folder, *options, columns=300)
        assert shown.read_to_end() == 1
        return [line for line in shown.everything() if line.startswith("Skipped ")]

    told, = skipped()
    assert told == ("Skipped 30: it is offloaded on the device: appsync send DEVICE ID FILE brings it back (%s and 25 "
                    "more, which --verbose names)" % ", ".join(names[:5]))
    assert len(skipped("--verbose")) == 30
    assert appsync("sync", device.path, folder, expect=1).stdout.count("Skipped com.example.") == 30


@DIRECTLY
def test_an_interruption_of_many_is_told_once(appsync, device, many, tmp_path, terminal):
    appsync("sync", device.path, many)
    newer = str(tmp_path / "newer")
    packages.make_library(newer, MANY, "2.0")
    appsync("run", device.path, A)
    shown = terminal("sync", device.path, newer, columns=200)
    shown.read_until("next try")
    shown.type(b"\x03")
    assert shown.read_to_end() == 1
    lines = shown.everything()
    assert len(lines) < 20, lines
    assert any(line.startswith("appsync: ") and "interrupted: run the same command again" in line for line in lines)


def test_ctrl_c_during_the_wait_leaves_every_line_whole(device, waiting, terminal):
    shown = terminal("sync", device.path, waiting, columns=100)
    shown.read_until(has_come_to_wait)
    shown.type(b"\x03")
    assert shown.read_to_end() == 1
    lines = shown.everything()
    (notice,) = (line for line in lines if "stopping" in line)
    assert notice.startswith("appsync: stopping: ")
    assert any("%s: interrupted" % A in line for line in lines)
    for line in lines:
        # Nothing but what the command has to say, and what the terminal echoes on a line of its own.
        assert re.match(r"(appsync: |install |transfer |Updated |Failed |\d.* sent in |\^C$)", line), lines


# Terminals of all kinds.


@pytest.mark.parametrize("columns", [20, 40, 200])
@pytest.mark.parametrize("locale", ["C", "C.UTF-8"])
def test_no_line_is_broken_whatever_the_width(device, waiting, terminal, columns, locale):
    shown = terminal("sync", device.path, waiting, columns=columns, locale=locale)
    shown.read_until(has_come_to_wait)
    assert " %" in shown.shown()[0]
    assert locale != "C" or shown.written.isascii()


def test_a_terminal_that_becomes_narrower_gets_lines_that_fit(device, waiting, terminal):
    shown = terminal("sync", device.path, waiting, columns=120)
    shown.read_until(has_come_to_wait)
    shown.resize(30)
    erased = shown.written.count("\x1b[J")
    # What a line that was just being drawn has left above is the terminal's.
    shown.read_until(lambda lines: shown.written.count("\x1b[J") > erased + 1 and has_come_to_wait(lines[-2:]))
    drawn = shown.written.split("\x1b[J")[-1].splitlines()
    assert drawn and max(map(len, drawn)) < 30


def test_a_terminal_that_was_stopped_does_not_hold_the_sync(device, library, terminal):
    shown = terminal("sync", device.path, library, typed=CTRL_S)
    end = time.monotonic() + TIMEOUT
    while len(device.versions()) < 5:
        assert time.monotonic() < end, "it waits for the terminal"
        time.sleep(0.05)
    shown.type(CTRL_Q)
    assert shown.read_to_end() == 0
    assert shown.everything()[0].startswith("Installed 5: ")


def test_a_slow_line_gets_whole_lines_and_not_all_of_them(device, many, terminal):
    shown = terminal("sync", device.path, many)
    while shown.read_some(most=256):
        time.sleep(0.02)
    assert shown.process.wait(timeout=TIMEOUT) == 0
    assert shown.everything()[0].startswith("Installed %d: " % MANY)
    assert " sent in " in shown.everything()[-1]
    assert not any("[#" in line for line in shown.everything())


def test_under_script_it_is_as_without(appsync, device, library, tmp_path, terminal):
    line = shlex.join([appsync.program, "sync", device.path, library])
    shown = terminal("-qec", line, tmp_path / "typescript", program="script")
    assert shown.read_to_end() == 0
    assert shown.everything()[0].startswith("Installed 5: ")
    assert not any("[#" in line for line in shown.everything())


def test_in_tmux_it_is_as_without(appsync, device, waiting, tmp_path):
    tmux = ["tmux", "-S", str(tmp_path / "socket"), "-f", "/dev/null"]
    line = shlex.join([appsync.program, "sync", device.path, waiting]) + "; echo status $?; cat"
    subprocess.run([*tmux, "new-session", "-d", "-x", "70", "-y", "20", line], check=True)

    def lines_when(condition):
        end = time.monotonic() + TIMEOUT
        while True:
            done = subprocess.run([*tmux, "capture-pane", "-p"], check=True, capture_output=True, text=True)
            lines = [each.rstrip() for each in done.stdout.splitlines() if each.strip()]
            if condition(lines):
                return lines
            assert time.monotonic() < end, lines
            time.sleep(0.05)

    try:
        lines_when(has_come_to_wait)
        subprocess.run([*tmux, "send-keys", "C-c"], check=True)
        lines = lines_when(lambda lines: lines and lines[-1] == "status 1")
        assert any("%s: interrupted" % A in "".join(lines) for line in lines)
        assert not any("[#" in line for line in lines)
    finally:
        subprocess.run([*tmux, "kill-server"], check=False)


@pytest.mark.parametrize("more", [{}, {"NO_COLOR": "1"}])
def test_nothing_is_coloured(device, library, terminal, more):
    shown = terminal("sync", device.path, library, environment=more)
    assert shown.read_to_end() == 0
    assert not re.search(r"\x1b\[[0-9;]*m", shown.written)


def test_wide_characters_take_the_columns_that_they_take(appsync, device, tmp_path, terminal):
    folder = str(tmp_path / "wide")
    names = ["Notes", "\u65e5\u8a18", "\U0001F680", "Cafe\u0301"]
    for index, name in enumerate(names):
        packages.make_package(folder, "com.example.wide%d" % index, name=name)
    device.sync(folder)
    shown = terminal("apps", device.path, columns=100)
    assert shown.read_to_end() == 0
    column = next(line for line in shown.screen.display if "NAME" in line).index("STATE")
    rows = [shown.screen.buffer[row] for row, line in enumerate(shown.screen.display) if "com.example.wide" in line]
    assert len(rows) == len(names)
    for row in rows:
        assert row[column].data == "i" and row[column - 1].data == " "


def test_a_terminal_that_cannot_redraw_gets_lines(device, library, terminal):
    shown = terminal("sync", device.path, library, term="dumb")
    assert shown.read_to_end() == 0
    assert "\x1b" not in shown.written and shown.written.count("100 %") + shown.written.count("done") >= 5


@ON_ONE_PATH
def test_a_plan_on_a_terminal_is_the_plan(appsync, device, library, terminal):
    shown = terminal("plan", device.path, library, columns=100)
    assert shown.read_to_end() == 0
    expected = appsync("plan", device.path, library).stdout.splitlines()
    assert shown.everything()[:-1] == expected[:-1]  # the last line tells what is free


def test_a_restore_a_staging_and_the_store_say_what_they_are_at(appsync, device, library, tmp_path, terminal):
    device.sync(library)
    appsync("backup", device.path, tmp_path / "backup")
    fresh = Device(appsync, tmp_path / "fresh", device.coordination)

    def lines_of(*arguments):
        shown = terminal(*arguments, columns=100)
        assert shown.read_to_end() == 0
        return shown.written.split("\r")[1], shown.everything()

    first, lines = lines_of("restore", fresh.path, tmp_path / "backup")
    assert first.startswith("checking the backup  0:00") and lines[0].startswith("IDENTIFIER ")
    first, lines = lines_of("store", fresh.path, library)
    assert first.startswith("reading packages, 0 of 5  0:00") and "reading" not in " ".join(lines)
    packages.make_package(library, A, "2.0")
    first, lines = lines_of("stage", device.path, library)
    assert first.startswith("reading packages, 0 of 5  0:00") and lines[0].startswith("staged on ")


@ON_ONE_PATH
def test_an_error_stands_alone(device, tmp_path, terminal):
    shown = terminal("sync", device.path, tmp_path / "missing", columns=200)
    assert shown.read_to_end() == 3
    line, = shown.everything()
    assert line.startswith("appsync: ") and "missing" in line


@ON_ONE_PATH
def test_one_package_that_is_sent_is_shown_too(device, library, terminal):
    shown = terminal("send", device.path, A, os.path.join(library, A + ".zip"))
    assert shown.read_to_end() == 0
    assert shown.everything()[0] == "Installed 1: " + A
    assert "install  " + A in shown.written and "  0 of 1  " in shown.written
