"""Syncs that are killed, stopped or run out of disk, and run again."""

import fcntl
import json
import os
import random
import signal
import sqlite3
import struct
import subprocess
import sys
import termios
import time

import pytest

import packages
from conftest import ON_ONE_PATH, Device
from staging import install, stage


@pytest.fixture
def larger_library(tmp_path):
    folder = str(tmp_path / "library")
    packages.make_library(folder, 12, payload=random.Random(7).randbytes(400_000))
    return folder


def packages_arrived(device):
    """The applications whose package the device has whole and has yet to install."""
    return {each["identifier"] for each in device.appsync.json("coordinator", device.path, "list")
            if any(promise["name"].endswith("-Asset") and promise["complete"] for promise in each["promises"])}


def settle(device, library, expect=0):
    """Runs the same command again and checks the whole device."""
    result = device.sync(library, expect=expect)
    with sqlite3.connect(os.path.join(device.path, "device.db")) as database:
        assert database.execute("PRAGMA integrity_check").fetchall() == [("ok",)]
    database.close()
    assert device.placeholders() == []
    containers = os.listdir(device.inside("/var/containers/Bundle/Application"))
    assert sorted(containers) == sorted(os.path.basename(a["container"]) for a in device.apps().values())
    staging = os.listdir(device.inside("/var/mobile/Media/PublicStaging"))
    assert [name for name in staging if name.endswith(".zip")] == []
    return result


def duration_of(appsync, library, path, coordination):
    fresh = Device(appsync, path, coordination)
    start = time.monotonic()
    fresh.sync(library)
    return time.monotonic() - start


@pytest.mark.parametrize("number", [signal.SIGKILL, signal.SIGINT, signal.SIGTERM])
def test_stopped_at_random_moments_and_run_again(appsync, larger_library, tmp_path, number, coordination):
    """Twenty kills (fewer for each polite signal), at moments from a fixed seed over the whole run."""
    whole = duration_of(appsync, larger_library, tmp_path / "whole", coordination)
    choose = random.Random(int(number))
    polite = 5 if coordination == "on" else 10
    for attempt in range(20 if number == signal.SIGKILL else polite):
        device = Device(appsync, tmp_path / ("device%d" % attempt), coordination)
        sync = appsync.start("sync", device.path, larger_library)
        time.sleep(choose.uniform(0, whole))
        sync.send_signal(number)
        sync.communicate(timeout=60)
        arrived = packages_arrived(device)
        done = set(device.apps())
        again = settle(device, larger_library)
        assert arrived.isdisjoint(again["requested"]) and done.isdisjoint(again["requested"])
        assert len(device.apps()) == 12 and appsync.json("coordinator", device.path, "list") == []
        assert device.sync(larger_library)["requested"] == []


@pytest.mark.parametrize("number", [signal.SIGKILL, signal.SIGINT])
def test_an_interrupted_staged_sync_is_taken_up_by_the_same_command(appsync, larger_library, device, number):
    identifiers = ["com.example.app%02d" % n for n in range(12)]
    stage(device, [install(each) for each in identifiers], side_files=identifiers)
    sync = appsync.start("sync", device.path, larger_library, "--staged", "--json-lines")
    for line in sync.stdout:
        event = json.loads(line)
        if event["event"] == "ended" and event["phase"] == "install":
            break
    sync.send_signal(number)
    sync.communicate(timeout=60)
    done = set(device.apps())
    again = device.sync(larger_library, "--staged")
    assert set(again["requested"]).isdisjoint(done | packages_arrived(device))
    assert sorted(device.apps()) == identifiers
    assert device.placeholders() == []
    assert device.sync(larger_library, "--staged")["requested"] == []


@ON_ONE_PATH
def test_a_staged_sync_that_has_ended_is_not_to_be_run_again(appsync, device, tmp_path):
    """The signal comes when all was sent, and what fails then has not been interrupted."""
    library = str(tmp_path / "large")
    payload = random.Random(3).randbytes(48 << 20)
    package = packages.make_package(library, "com.example.large", payload=payload)
    packages.damage_contents(package, "Large.app/Resources/data.bin")
    stage(device, [install("com.example.large")])
    process = appsync.start("sync", device.path, library, "--staged", "--json-lines")
    for line in process.stdout:
        if json.loads(line).get("phase") == "install":
            process.send_signal(signal.SIGINT)
            break
    printed, complained = process.communicate(timeout=60)
    assert process.returncode == 1 and "CRC" in json.loads(printed.splitlines()[-1])["failed"][0]["error"]
    assert "run the same command again" not in complained
    assert device.sync(library, "--staged")["requested"] == []


def test_killed_update_keeps_one_version_or_the_other(appsync, larger_library, device):
    device.sync(larger_library)
    packages.make_library(larger_library, 12, "2.0", payload=random.Random(8).randbytes(400_000))
    choose = random.Random(3)
    for _ in range(5):
        sync = appsync.start("sync", device.path, larger_library)
        time.sleep(choose.uniform(0, 0.2))
        sync.kill()
        sync.communicate()
        assert set(device.versions().values()) <= {"1.0", "2.0"}
        assert len(device.apps()) == 12
    settle(device, larger_library)
    assert set(device.versions().values()) == {"2.0"}


@pytest.fixture
def ignored_interrupts():
    """As in the background of a shell script."""
    before = signal.signal(signal.SIGINT, signal.SIG_IGN)
    yield
    signal.signal(signal.SIGINT, before)


@ON_ONE_PATH
def test_commands_hear_of_signals_that_the_tests_ignore(ignored_interrupts, appsync, device, larger_library):
    sync = appsync.start("sync", device.path, larger_library, "--json-lines")
    sync.stdout.readline()
    with open("/proc/%d/status" % sync.pid) as file:
        ignored = next(int(line.split()[1], 16) for line in file if line.startswith("SigIgn:"))
    assert ignored >> (signal.SIGINT - 1) & 1 == 0
    assert ignored >> (signal.SIGTERM - 1) & 1 == 0


def test_interrupt_while_an_application_runs_ends_soon(appsync, device, library):
    device.sync(library)
    packages.make_package(library, "com.example.app00", "2.0")
    appsync("run", device.path, "com.example.app00")
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if '"nextTry":"' in line.replace(" ", ""):
            break
    sync.send_signal(signal.SIGINT)
    out, _ = sync.communicate(timeout=60)
    assert sync.returncode == 1
    assert "nextTry" not in out  # which comes after half a minute, and is not waited for
    assert device.versions()["com.example.app00"] == "1.0"
    appsync("quit", device.path, "com.example.app00")
    settle(device, library)
    assert device.versions()["com.example.app00"] == "2.0"


@pytest.fixture
def waiting_sync(appsync, device, library):
    """Starts a sync in which the update of a running application is all that is left to do."""
    device.sync(library)
    packages.make_package(library, "com.example.app00", "2.0")
    packages.make_package(library, "com.example.new", "1.0")
    appsync("run", device.path, "com.example.app00")
    started = []

    def start(*options):
        sync = appsync.start("sync", device.path, library, *options)
        started.append(sync)
        deadline = time.monotonic() + 30
        while time.monotonic() < deadline:
            why = appsync.json("why", device.path, "com.example.app00")
            if (why["waitsFor"] or {}).get("what") == "termination" and "com.example.new" in device.apps():
                return sync
            time.sleep(0.05)
        raise AssertionError("nothing waits")

    yield start
    for sync in started:
        sync.kill()
        sync.communicate()


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM])
@pytest.mark.parametrize("option", ["--json", "--json-lines"])
def test_interrupted_wait_still_prints_the_summary(waiting_sync, number, option):
    sync = waiting_sync(option)
    sync.send_signal(number)
    sync.send_signal(number)
    out, err = sync.communicate(timeout=60)
    assert sync.returncode == 1
    summary = json.loads(out if option == "--json" else out.splitlines()[-1])
    assert summary["installed"] == ["com.example.new"]
    assert [each["identifier"] for each in summary["failed"]] == ["com.example.app00"]
    assert "interrupted: run the same command again" in summary["failed"][0]["error"]
    assert "interrupted" in err


def test_a_stop_is_announced_at_once(waiting_sync):
    sync = waiting_sync()
    sync.send_signal(signal.SIGINT)
    line = sync.stderr.readline()
    assert "stopping" in line and "second Ctrl-C" in line
    assert sync.poll() is None
    out, err = sync.communicate(timeout=60)
    assert "Failed 1: com.example.app00" in out
    assert "appsync: com.example.app00: interrupted: run the same command again" in err
    assert err.count("interrupted") == 1
    assert sync.returncode == 1


def test_uninstalling_what_waits_wins_over_its_update(appsync, waiting_sync, device, library):
    sync = waiting_sync("--json")
    appsync("uninstall", device.path, "com.example.app00")
    assert "com.example.app00" not in device.placeholders()
    out, _ = sync.communicate(timeout=60)  # the next try comes after half a minute
    assert sync.returncode == 1
    failed = json.loads(out)["failed"]
    assert [each["identifier"] for each in failed] == ["com.example.app00"]
    # Its coordinator hears of it at once; the direct path at its next try.
    why = "removed from the device" if device.is_coordinated else "uninstalled on the device"
    assert why in failed[0]["error"]
    assert "com.example.app00" not in device.apps()
    device.sync(library)
    assert device.versions()["com.example.app00"] == "2.0"


def test_policy_that_changes_meanwhile_is_no_reason(appsync, waiting_sync, device):
    sync = waiting_sync("--json")
    appsync("set", device.path, "installation=no")
    appsync("uninstall", device.path, "com.example.new")
    sync.send_signal(signal.SIGINT)
    out, _ = sync.communicate(timeout=60)
    errors = {each["identifier"]: each["error"] for each in json.loads(out)["failed"]}
    assert "interrupted" in errors["com.example.app00"]
    assert json.loads(out)["skipped"] == []


@ON_ONE_PATH
def test_an_output_that_nobody_reads_does_not_hold_up_the_end(appsync, device, larger_library):
    reading, writing = os.pipe()
    fcntl.fcntl(writing, fcntl.F_SETPIPE_SZ, 4096)
    sync = appsync.start("sync", device.path, larger_library, "--json-lines", stdout=writing)
    os.close(writing)
    held, before = 0, -1
    while held == 0 or held != before:  # until it is full
        before = held
        time.sleep(1)
        held = struct.unpack("i", fcntl.ioctl(reading, termios.FIONREAD, bytes(4)))[0]
    assert sync.poll() is None
    sync.send_signal(signal.SIGINT)
    time.sleep(0.2)
    sync.send_signal(signal.SIGINT)
    try:
        _, err = sync.communicate(timeout=60)
    finally:
        sync.kill()
        os.close(reading)
    assert sync.returncode == 1
    assert "interrupted" in err
    settle(device, larger_library)


FULL = """
import subprocess, sys, os
program, library, where, coordination = sys.argv[1:]
run = lambda *a: subprocess.run([program, *a], capture_output=True, text=True, timeout=120)
subprocess.run(["mount", "-t", "tmpfs", "-o", "size=1m", "tmpfs", where], check=True)
done = run("create", where + "/device", "--coordination", coordination)
assert done.returncode == 0, done.stderr
fitted = False
for kib in range(1024, 16384, 256):
    subprocess.run(["mount", "-o", "remount,size=%dk" % kib, where], check=True)
    done = run("sync", where + "/device", library)
    assert done.returncode in (0, 1), (kib, done.returncode, done.stderr)
    if done.returncode == 1:
        assert done.stderr.strip() or "Failed " in done.stdout, kib
    again = run("apps", where + "/device")
    assert again.returncode == 0, again.stderr
    if done.returncode == 0:
        fitted = True
        break
assert fitted
print("fits at", kib, "KiB")
"""


def test_full_disk_at_every_size_leaves_the_device_usable(appsync, library, tmp_path, coordination):
    where = tmp_path / "small"
    where.mkdir()
    able = subprocess.run(["unshare", "-m", "true"], capture_output=True)
    if able.returncode != 0:
        pytest.skip("this machine allows no mount namespace")
    done = subprocess.run(["unshare", "-m", sys.executable, "-c", FULL, appsync.program, library, str(where),
                           coordination], capture_output=True, text=True, timeout=300)
    assert done.returncode == 0, done.stderr
    assert "fits at" in done.stdout


def test_plan_that_does_not_fit_says_how_much_is_missing(appsync, library, tmp_path):
    where = tmp_path / "small"
    where.mkdir()
    if subprocess.run(["unshare", "-m", "true"], capture_output=True).returncode != 0:
        pytest.skip("this machine allows no mount namespace")
    packages.make_package(library, "com.example.large", payload=os.urandom(8 << 20))
    script = ("mount -t tmpfs -o size=4m tmpfs {0} && {1} create {0}/d && {1} plan {0}/d {2} --json;"
              " {1} sync {0}/d {2}; echo status $?; {1} apps {0}/d --json").format(where, appsync.program, library)
    done = subprocess.run(["unshare", "-m", "sh", "-c", script], capture_output=True, text=True, timeout=60)
    assert '"fits": false' in done.stdout or '"fits":false' in done.stdout
    assert "status 1" in done.stdout
    assert "com.example.app00" not in done.stdout.split("status 1")[1]
    assert done.stderr.strip()


