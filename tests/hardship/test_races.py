"""Hostile neighbours: links that come and go under a session, and commands that meet on one device."""

import itertools
import json
import os
import random
import shutil
import signal
import subprocess
import sys
import time

import pytest

import packages
from conftest import HERE, IS_LONG, SEED, acceptance
from devices import check_intact, check_kept
from processes import with_default_signals

SESSIONS = 200 if IS_LONG else 4
COLLISIONS = 20 if IS_LONG else 1
SECRET = "what nobody on the device may read"


# Links that come and go.


@pytest.fixture
def outside(tmp_path):
    """A directory that is none of the device's business, and what it looks like."""
    folder = tmp_path / "outside"
    (folder / "inner").mkdir(parents=True)
    (folder / "canary").write_text(SECRET)
    (folder / "inner" / "canary").write_text(SECRET)
    packages.make_package(str(folder), "com.example.foreign", "9.9", file_name="com.example.app00.zip")
    return folder


def appearance(folder):
    found = {}
    for base, folders, files in os.walk(folder):
        for name in folders + files:
            path = os.path.join(base, name)
            status = os.lstat(path)
            found[os.path.relpath(path, folder)] = (status.st_mode, status.st_uid, status.st_mtime_ns, content_of(path))
    return found


def content_of(path):
    if os.path.islink(path):
        return os.readlink(path)
    try:
        with open(path, "rb") as file:
            return file.read()
    except OSError:  # a directory, or what only others may read
        return None


def changed(before, after):
    return sorted(path for path in before.keys() | after.keys() if before.get(path) != after.get(path))


def everything_of(device):
    """The content of every file on the device."""
    for base, _, files in os.walk(device):
        for name in files:
            path = os.path.join(base, name)
            if not os.path.islink(path):
                with open(path, "rb") as file:
                    yield path, file.read()


def clear_away(device):
    """Takes the neighbour's links off the device, as whoever owns it would."""
    for base, folders, files in os.walk(os.path.join(device.path, "root", "var", "mobile")):
        for name in folders + files:
            path = os.path.join(base, name)
            if os.path.islink(path):
                os.unlink(path)
            elif name.endswith(".moved"):
                shutil.rmtree(path) if os.path.isdir(path) else os.unlink(path)


@pytest.mark.parametrize("coordination", ["off", "on"])
@pytest.mark.parametrize("to", ["/etc", "outside", ".."])
def test_links_that_come_and_go_lead_nowhere(appsync, tmp_path, outside, coordination, to):
    device = acceptance.Device(appsync, tmp_path / "device", coordination)
    library = str(tmp_path / "library")
    packages.make_library(library, 3)
    before, etc = appearance(outside), appearance("/etc")
    target = str(outside) if to == "outside" else to
    neighbour = subprocess.Popen([sys.executable, str(HERE / "neighbour.py"), device.path, target, str(SEED)],
                                 stdout=subprocess.PIPE, text=True)
    swaps, statuses = 0, []
    try:
        for attempt in range(SESSIONS):
            version = "1.%d" % attempt
            packages.make_library(library, 3, version)
            done = appsync("sync", device.path, library, expect=None)
            assert done.returncode in (0, 1, 3), (done.returncode, done.stdout, done.stderr)
            assert done.returncode == 0 or "Failed" in done.stdout or done.stderr.strip(), done.stdout
            statuses.append(done.returncode)
    finally:
        neighbour.terminate()
        swaps = int(neighbour.communicate()[0] or 0)
    assert swaps > 0
    assert changed(before, appearance(outside)) == []
    assert changed(etc, appearance("/etc")) == []
    foreign = [path for path, content in everything_of(device.path) if SECRET.encode() in content]
    assert foreign == []
    assert "com.example.foreign" not in device.apps()
    check_intact(appsync, device.path)
    clear_away(device)
    device.sync(library)
    assert set(device.versions().values()) == {version}
    print("to %s: %d swaps in %d sessions, statuses %s" % (to, swaps, SESSIONS, sorted(set(statuses))))


# Commands that meet.

SESSION_COMMANDS = ["sync", "restore", "send", "demote", "rollback", "reset", "stage"]
OTHER_COMMANDS = ["uninstall", "run-quit", "apps", "screen", "log", "set"]


@pytest.fixture(scope="module", params=["off", "on"])
def crowd(appsync, tmp_path_factory, request):
    folder = tmp_path_factory.mktemp("crowd")
    library = str(folder / "library")
    packages.make_library(library, 4)
    source = acceptance.Device(appsync, folder / "source", request.param)
    source.sync(library)
    packages.make_package(library, "com.example.app03", "1.1")
    source.sync(library)
    backup = str(folder / "backup")
    appsync("backup", source.path, backup)
    packages.make_package(str(folder / "sent"), "com.example.sent")
    return source, library, backup, str(folder)


def command_lines(name, device, library, backup, folder):
    lines = {
        "sync": [["sync", device, library]],
        "restore": [["restore", device, backup]],
        "send": [["send", device, "com.example.sent", os.path.join(folder, "sent", "com.example.sent.zip")]],
        "demote": [["demote", device, "com.example.app01"]],
        "rollback": [["rollback", device, "com.example.app03"]] * 3,
        "reset": [["reset", device]],
        "stage": [["stage", device, library, "--force"]],
        "uninstall": [["uninstall", device, "com.example.app00"]],
        "run-quit": [["run", device, "com.example.app02"], ["quit", device, "com.example.app02"]],
        "apps": [["apps", device]] * 5,
        "screen": [["screen", device, os.path.join(folder, "screen-%d.png" % random.getrandbits(60))]],
        "log": [["log", device, "--follow"]],
        "set": [["set", device, "installation=yes"]],
    }
    return lines[name]


def start(appsync, lines):
    """Runs the command lines one after the other, as a process of its own."""
    script = "; ".join('"$A" %s; echo "status $?"' % " ".join("'%s'" % word for word in line) for line in lines)
    return subprocess.Popen(["sh", "-c", script], env=dict(os.environ, A=appsync.program), text=True,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, start_new_session=True,
                            preexec_fn=with_default_signals)


def finish(process, name):
    try:
        out, err = process.communicate(timeout=2 if name == "log" else 100)
    except subprocess.TimeoutExpired:
        assert name == "log", name + " does not end"
        os.killpg(process.pid, signal.SIGTERM)
        process.communicate()
        return [0], ""
    return [int(line.split()[1]) for line in out.splitlines() if line.startswith("status ")], out + err


PAIRS = list(itertools.combinations_with_replacement(SESSION_COMMANDS + OTHER_COMMANDS, 2))
SHARE = PAIRS if IS_LONG else random.Random(SEED).sample(PAIRS, 14)


@pytest.mark.parametrize("pair", SHARE, ids=lambda pair: "+".join(pair))
def test_two_commands_on_one_device(appsync, crowd, tmp_path, pair):
    source, library, backup, folder = crowd
    choose = random.Random("%d %s" % (SEED, pair))
    for attempt in range(COLLISIONS):
        device = acceptance.Device.__new__(acceptance.Device)
        device.appsync, device.path = appsync, str(tmp_path / ("device%d" % attempt))
        shutil.copytree(source.path, device.path, symlinks=True)
        packages.make_library(library, 4, "%d.%d" % (attempt + 2, choose.randrange(1000)))
        processes = []
        for name in pair:
            processes.append((name, start(appsync, command_lines(name, device.path, library, backup, folder))))
            time.sleep(choose.uniform(0, 0.1))
        for name, process in processes:
            statuses, said = finish(process, name)
            assert set(statuses) <= {0, 1, 3}, (name, statuses, said)
            if 3 in statuses:
                assert "in use by another session" in said or "held by another process" in said, (name, said)
        check_intact(appsync, device.path)
        appsync("quit", device.path, "com.example.app02", expect=None)
        appsync("reset", device.path)
        device.sync(library)
        assert set(device.versions()) >= {"com.example.app%02d" % number for number in range(4)}
        check_kept(device.path)
        shutil.rmtree(device.path)
