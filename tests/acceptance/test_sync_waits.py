"""Syncs that wait for running applications for no longer than they are told to, and what a terminal shows."""

import fcntl
import json
import os
import pty
import re
import select
import signal
import struct
import subprocess
import termios

import pytest

import packages
from conftest import ON_ONE_PATH, TIMEOUT
from processes import with_default_signals
from staging import install, stage

A, B = "com.example.app00", "com.example.app01"


@pytest.fixture
def running(appsync, device, library):
    """New versions of two applications, one of which runs."""
    device.sync(library)
    packages.make_library(library, 2, "2.0")
    appsync("run", device.path, A)
    return library


def failures_of(result):
    return {each["identifier"]: each["error"] for each in result["failed"]}


@pytest.mark.parametrize("option", [["--no-wait"], ["--wait", "1"], ["--wait", "0m"]])
def test_what_runs_is_left_after_the_time_and_the_rest_is_done(appsync, device, running, option):
    result = device.sync(running, *option, expect=1)
    assert result["updated"] == [B] and list(failures_of(result)) == [A]
    assert "%s is running" % A in failures_of(result)[A]
    assert device.versions()[A] == "1.0" and device.versions()[B] == "2.0"
    again = device.sync(running, *option, expect=1)
    assert again["updated"] == [] and list(failures_of(again)) == [A]
    appsync("quit", device.path, A)
    last = device.sync(running, *option)
    assert last["updated"] == [A] and device.versions()[A] == "2.0"
    # What had been delivered stays with the coordination service, and travels once.
    assert last["requested"] == ([] if device.is_coordinated else [A])
    assert device.placeholders() == []


def test_status_tells_what_was_left_and_what_to_do(appsync, device, running):
    device.sync(running, "--no-wait", expect=1)
    told = ("session:       interrupted, with %s still to be installed: %srun the command again that was cut off\n")
    status = appsync.json("status", device.path)
    assert (status["session"], status["open"]) == ("interrupted", [A])
    assert told % (A, "quit %s, and " % A) in appsync("status", device.path).stdout
    appsync("quit", device.path, A)
    assert told % (A, "") in appsync("status", device.path).stdout
    device.sync(running)
    status = appsync.json("status", device.path)
    assert (status["session"], status["open"]) == ("none", [])


def test_events_and_summary_agree_on_what_was_left(appsync, device, running):
    done = appsync("sync", device.path, running, "--no-wait", "--json-lines", expect=1)
    events = [json.loads(line) for line in done.stdout.splitlines()]
    of_a = [event for event in events if event.get("identifier") == A and event["phase"] == "install"]
    assert of_a[-1]["event"] == "ended" and of_a[-1]["state"] == "failed"
    assert of_a[-1]["error"] == failures_of(events[-1])[A]
    (told,) = done.stderr.splitlines()
    assert "%s is running" % A in told


def test_a_staged_sync_that_did_not_wait_is_taken_up_by_the_same_command(appsync, device, running):
    stage(device, [install(A, "2.0"), install(B, "2.0")], side_files=[A, B])
    assert list(failures_of(device.sync(running, "--staged", "--no-wait", expect=1))) == [A]
    appsync("quit", device.path, A)
    assert device.sync(running, "--staged", "--no-wait")["updated"] == [A]
    assert device.versions()[A] == device.versions()[B] == "2.0"


def test_nothing_that_runs_is_nothing_to_wait_for(device, library):
    assert len(device.sync(library, "--no-wait")["installed"]) == 5


def test_what_quits_in_time_is_installed(appsync, device, running):
    sync = appsync.start("sync", device.path, running, "--wait", "10m", "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "waiting":
            break
    appsync("quit", device.path, A)
    out, _ = sync.communicate(timeout=TIMEOUT)  # the direct path tries again after half a minute
    assert sync.returncode == 0 and A in json.loads(out.splitlines()[-1])["updated"]


class Terminal:
    """A command on a terminal of its own, and the lines that a person sees."""

    WIDTH = 100

    def __init__(self, program, arguments):
        self.master, slave = pty.openpty()
        fcntl.ioctl(slave, termios.TIOCSWINSZ, struct.pack("HHHH", 40, self.WIDTH, 0, 0))
        self.process = subprocess.Popen(
            [program, *map(str, arguments)], stdin=slave, stdout=slave, stderr=slave,
            env={**os.environ, "TERM": "xterm"}, start_new_session=True, preexec_fn=self._take_terminal)
        os.close(slave)
        self.text = ""

    @staticmethod
    def _take_terminal():
        with_default_signals()
        fcntl.ioctl(0, termios.TIOCSCTTY, 0)

    def type(self, keys):
        os.write(self.master, keys)

    def read_until(self, wanted):
        """Reads until the text comes (None: until the command has ended)."""
        while wanted is None or wanted not in self.text:
            ready, _, _ = select.select([self.master], [], [], TIMEOUT)
            assert ready, self.text
            try:
                piece = os.read(self.master, 65536)
            except OSError:  # nobody has the other side open any more
                piece = b""
            if not piece:
                assert wanted is None, self.text
                return
            self.text += piece.decode()

    def screen(self):
        """The lines as the terminal shows them in the end, for the little that the command uses."""
        lines, row, column = [""], 0, 0
        for token in re.findall(r"\x1b\[(\d*)([A-Z])|(\r)|(\n)|([^\x1b\r\n]+)", self.text):
            count, code, carriage, feed, text = token
            if code == "A":
                row = max(0, row - int(count or 1))
            elif code == "J":
                lines = lines[:row] + [lines[row][:column]]
            elif carriage:
                column = 0
            elif feed:
                row += 1
                lines += [""] * (row + 1 - len(lines))
            elif text:
                line = lines[row].ljust(column)
                lines[row] = line[:column] + text + line[column + len(text):]
                column += len(text)
        return [line.rstrip() for line in lines]

    def end(self):
        self.process.kill()
        self.process.wait()
        os.close(self.master)


@pytest.fixture
def terminal(appsync):
    opened = []

    def start(*arguments):
        opened.append(Terminal(appsync.program, arguments))
        return opened[-1]

    yield start
    for each in opened:
        each.end()


def test_ctrl_c_during_the_wait_leaves_every_line_whole(device, running, terminal):
    shown = terminal("sync", device.path, running)
    shown.read_until("next try")
    shown.type(b"\x03")
    shown.read_until("stopping")
    shown.read_until(None)
    lines = shown.screen()
    (notice,) = (line for line in lines if "stopping" in line)
    assert notice.startswith("appsync: stopping: ")
    assert any("%s: interrupted" % A in line for line in lines)
    for line in lines:
        # Nothing but what the command has to say, and what the terminal echoes on a line of its own.
        assert re.match(r"(appsync: |install |transfer |Updated |Failed |\d.* sent in |\^C|$)", line), lines
    assert shown.process.wait(timeout=TIMEOUT) == 1


@ON_ONE_PATH
def test_a_terminal_shows_the_preparation_and_keeps_nothing_of_it(device, library, terminal):
    shown = terminal("sync", device.path, library)
    shown.read_until(None)
    assert shown.process.wait(timeout=TIMEOUT) == 0
    assert "prepare  reading packages" in shown.text
    assert not any("prepare" in line for line in shown.screen())


@ON_ONE_PATH
def test_a_plan_on_a_terminal_is_the_plan(appsync, device, library, terminal):
    shown = terminal("plan", device.path, library)
    shown.read_until(None)
    assert shown.process.wait(timeout=TIMEOUT) == 0
    expected = appsync("plan", device.path, library).stdout.splitlines()
    assert [line for line in shown.screen() if line][:-1] == expected[:-1]  # the last line tells what is free


def test_a_signal_ends_the_wait_before_its_time(appsync, device, running):
    sync = appsync.start("sync", device.path, running, "--wait", "1h", "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "waiting":
            break
    sync.send_signal(signal.SIGINT)
    out, err = sync.communicate(timeout=TIMEOUT)
    assert sync.returncode == 1 and "interrupted" in err
    assert "interrupted" in failures_of(json.loads(out.splitlines()[-1]))[A]
