"""Syncs that wait for running applications for no longer than they are told to."""

import json
import signal

import pytest

import packages
from conftest import TIMEOUT
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


def test_a_signal_ends_the_wait_before_its_time(appsync, device, running):
    sync = appsync.start("sync", device.path, running, "--wait", "1h", "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "waiting":
            break
    sync.send_signal(signal.SIGINT)
    out, err = sync.communicate(timeout=TIMEOUT)
    assert sync.returncode == 1 and "interrupted" in err
    assert "interrupted" in failures_of(json.loads(out.splitlines()[-1]))[A]
