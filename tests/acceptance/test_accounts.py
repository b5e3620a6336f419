"""Who may use a device: its owner, root, and those who may only read it."""

import contextlib
import json
import os
import pathlib
import re
import shutil
import sqlite3
import stat
import subprocess
import tempfile
import urllib.request

import pytest

import packages
from conftest import Device

NOBODY = 65534
IDS = ["com.example.app%02d" % number for number in range(5)]


class Place:
    """A folder that every account may enter, and the command as it is run by others."""

    def __init__(self, appsync, folder):
        self.folder = folder
        self.appsync = appsync
        self.program = os.path.join(folder, "appsync")
        shutil.copy(appsync.program, self.program)
        self.temporary = self.path("temporary")
        os.mkdir(self.temporary)
        os.chown(self.temporary, NOBODY, NOBODY)

    def path(self, name):
        return os.path.join(self.folder, name)

    def device(self, coordination="off", owner=0):
        device = Device(self.appsync, self.path("device"), coordination)
        give(device.path, owner)
        return device

    def library(self, version="1.0"):
        folder = self.path("library")
        packages.make_library(folder, 5, version)
        return folder

    def as_nobody(self, *arguments, expect=0):
        done = subprocess.run(
            ["setpriv", "--reuid=%d" % NOBODY, "--regid=%d" % NOBODY, "--clear-groups", self.program,
             *map(str, arguments)],
            capture_output=True, text=True, timeout=100, env={**os.environ, "TMPDIR": self.temporary})
        assert expect is None or done.returncode == expect, (arguments, done.returncode, done.stdout, done.stderr)
        assert os.listdir(self.temporary) == []
        return done


@pytest.fixture
def place(appsync):
    if os.geteuid() != 0:
        pytest.skip("only root can be somebody else")
    folder = tempfile.mkdtemp(prefix="accounts-")
    try:
        os.chmod(folder, 0o755)
        made = Place(appsync, folder)
        if subprocess.run(["setpriv", "--reuid=%d" % NOBODY, made.program, "--version"],
                          capture_output=True).returncode not in (0, 2):
            pytest.skip("this machine does not let a process be somebody else")
        yield made
    finally:
        shutil.rmtree(folder)


def give(path, owner):
    subprocess.run(["chown", "-R", "%d:%d" % (owner, owner), path], check=True)


def everything_in(folder):
    for base, folders, files in os.walk(folder):
        for name in folders + files:
            yield os.path.join(base, name)


def owners(folder):
    """Who owns what, of those that are not nobody's."""
    states = {path: os.lstat(path) for path in [folder, *everything_in(folder)]}
    return {path: (state.st_uid, state.st_gid) for path, state in states.items()
            if (state.st_uid, state.st_gid) != (NOBODY, NOBODY)}


def appearance(folder):
    seen = {}
    for path in everything_in(folder):
        state = os.lstat(path)
        content = open(path, "rb").read() if stat.S_ISREG(state.st_mode) else None
        seen[path] = (state.st_mode, state.st_uid, state.st_mtime_ns, content)
    return seen


@pytest.mark.plain_build  # who has taken on another account is not looked into for leaks
def test_what_root_makes_belongs_to_the_owner_of_the_device(place, coordination):
    appsync, device, library = place.appsync, place.device(coordination, NOBODY), place.library()
    os.chmod(library, 0o700)  # root alone may read it
    steps = (["inventory", device.path], ["sync", device.path, library], ["run", device.path, IDS[0]],
             ["quit", device.path, IDS[0]], ["demote", device.path, IDS[1]], ["uninstall", device.path, IDS[2]],
             ["set", device.path, "removal=yes"], ["backup", device.path, place.path("backup")],
             ["screen", device.path, place.path("screen.png")], ["reset", device.path],
             ["restore", device.path, place.path("backup")], ["sync", device.path, library, "--remove", IDS[3]])
    for step in steps:
        appsync(*step, expect=None if step[0] == "sync" else 0)
        assert owners(device.path) == {}, step
    assert owners(place.path("backup")) == {} and os.stat(place.path("screen.png")).st_uid == NOBODY
    os.chmod(library, 0o755)
    give(library, NOBODY)
    packages.make_library(library, 1, "2.0")
    told = json.loads(place.as_nobody("sync", device.path, library, "--json", expect=None).stdout)
    assert told["updated"] == [IDS[0]]
    assert place.as_nobody("inventory", device.path).stderr == ""


def cards_when_all_are_idle(address):
    """One that takes long to be read is shown as locked until it has been."""
    for _ in range(20):
        with urllib.request.urlopen(address + "api/devices") as answer:
            cards = json.load(answer)["devices"]
        if all(card["state"] == "idle" for card in cards):
            break
    return cards


def accounts_of_threads(process):
    accounts = set()
    for each in pathlib.Path("/proc/%d/task" % process).glob("*/status"):
        with contextlib.suppress(OSError):  # a thread that has ended meanwhile
            accounts.add(re.search(r"\nUid:\s\d+\s(\d+)", each.read_text())[1])
    return accounts


@pytest.mark.plain_build  # who has taken on another account is not looked into for leaks
def test_root_looks_at_each_device_of_a_folder_as_its_owner(place):
    another, library = NOBODY - 1, place.library()
    folder = place.path("many")
    os.mkdir(folder)
    for name, owner in (("first", NOBODY), ("second", another), ("third", 0)):
        device = Device(place.appsync, os.path.join(folder, name))
        give(device.path, owner)
        device.sync(library)
    process = place.appsync.start("serve", folder, "--port", "0")
    try:
        address = re.search(r"http://[^/]*/", process.stdout.readline())[0]
        cards = cards_when_all_are_idle(address)
        accounts = accounts_of_threads(process.pid)
    finally:
        process.terminate()
        assert process.wait() == 0
    assert [(card["state"], card["applications"]) for card in cards] == [("idle", 5)] * 3
    assert accounts == {"0", str(NOBODY), str(another)}
    assert owners(os.path.join(folder, "first")) == {}


@pytest.mark.plain_build  # who has taken on another account is not looked into for leaks
def test_what_root_keeps_the_owner_rolls_back(place):
    device, library = place.device("off", NOBODY), place.library()
    device.sync(library)
    packages.make_library(library, 2, "2.0")
    device.sync(library)
    place.appsync("rollback", device.path, IDS[0])
    assert owners(device.path) == {}
    place.as_nobody("rollback", device.path, IDS[0])
    place.as_nobody("rollback", device.path, IDS[1])
    assert device.versions()[IDS[0]] == "2.0" and device.versions()[IDS[1]] == "1.0"


@pytest.mark.plain_build  # who has taken on another account is not looked into for leaks
def test_root_reads_and_replaces_what_only_root_may(place):
    device, library = place.device("off", NOBODY), place.library()
    device.sync(library)
    for name in ("device.db", "log/system.log"):
        os.chown(os.path.join(device.path, name), 0, 0)
        os.chmod(os.path.join(device.path, name), 0o600)
    packages.make_library(library, 1, "2.0")
    assert device.sync(library)["updated"] == [IDS[0]]
    assert place.appsync("inventory", device.path).stderr == ""


LOOKS = (["apps"], ["apps", "--json"], ["why", IDS[0]], ["history"], ["log"], ["coordinator", "list"], ["status"],
         ["inventory"])


def test_who_may_only_read_can_look_and_leaves_nothing(place, coordination):
    device, library = place.device(coordination), place.library()
    device.sync(library)
    before = appearance(device.path)
    for look in LOOKS:
        done = place.as_nobody(look[0], device.path, *look[1:])
        assert done.stdout, look
        # What the plug-in has to say then cannot be kept.
        said = "could not be written to the device's log" if look[0] == "inventory" else ""
        assert said in done.stderr and bool(said) == bool(done.stderr), (look, done.stderr)
    place.as_nobody("plan", device.path, library)
    os.mkdir(place.path("pictures"))
    give(place.path("pictures"), NOBODY)
    place.as_nobody("screen", device.path, place.path("pictures/screen.png"))
    assert os.path.getsize(place.path("pictures/screen.png")) > 1000
    assert appearance(device.path) == before
    assert len(json.loads(place.as_nobody("apps", device.path, "--json").stdout)) == 5
    assert "5 installed" in place.as_nobody("status", device.path).stdout
    device.sync(place.library("2.0"))


def test_who_may_only_read_sees_what_is_in_the_log_of_the_database_alone(place):
    device, library = place.device(), place.library()
    device.sync(library)
    with_log = sqlite3.connect(os.path.join(device.path, "device.db"))
    try:
        with_log.execute("PRAGMA wal_autocheckpoint = 0")
        with with_log:
            with_log.execute("INSERT INTO running VALUES (?)", [IDS[3]])
        assert os.path.getsize(os.path.join(device.path, "device.db-wal")) > 0
        before = appearance(device.path)
        assert json.loads(place.as_nobody("status", device.path, "--json").stdout)["running"] == [IDS[3]]
        assert appearance(device.path) == before
    finally:
        with_log.close()


def test_index_that_somebody_else_has_left_does_not_keep_the_owner_from_looking(place):
    device = place.device("off", NOBODY)
    with open(os.path.join(device.path, "device.db-shm"), "wb"):
        pass
    os.chmod(os.path.join(device.path, "device.db-shm"), 0o400)
    assert "0 installed" in place.as_nobody("status", device.path).stdout
    assert "device.db-shm: Permission denied" in place.as_nobody("set", device.path, "removal=no", expect=3).stderr


def test_who_may_only_read_is_refused_every_change(place, coordination):
    device, library = place.device(coordination), place.library()
    device.sync(library)
    before = appearance(device.path)
    for command in (["run", IDS[0]], ["quit", IDS[0]], ["set", "removal=no"], ["uninstall", IDS[0]],
                    ["sync", library], ["demote", IDS[0]], ["rollback", IDS[0]], ["reset"]):
        done = place.as_nobody(command[0], device.path, *command[1:], expect=3)
        assert "cannot be written" in done.stderr and done.stderr.count("\n") == 1, (command, done.stderr)
    assert appearance(device.path) == before
    if device.is_coordinated:
        done = place.as_nobody("coordinator", device.path, "create", "com.example.new", expect=3)
        assert "cannot be written" in done.stderr
    assert appearance(device.path) == before


def test_who_may_only_read_is_refused_a_session_whoever_holds_the_device(place):
    appsync, device, library = place.appsync, place.device(), place.library()
    device.sync(library)
    packages.make_package(library, IDS[0], "2.0")
    appsync("run", device.path, IDS[0])
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if json.loads(line).get("nextTry"):
            break
    assert "cannot be written" in place.as_nobody("sync", device.path, library, expect=3).stderr


def test_who_may_not_read_is_told(place):
    device = place.device()
    os.chmod(os.path.join(device.path, "device.db"), 0o600)
    done = place.as_nobody("apps", device.path, expect=3)
    assert "device.db: Permission denied" in done.stderr and done.stderr.count("\n") == 1
    device.sync(place.library())
    os.chmod(os.path.join(device.path, "device.db"), 0o644)
    os.chmod(os.path.join(device.path, "log", "system.log"), 0o600)
    done = place.as_nobody("log", device.path, expect=3)
    assert "system.log: Permission denied" in done.stderr and done.stderr.count("\n") == 1


def test_data_that_may_not_be_read_is_named_and_left_out(place):
    device = place.device()
    device.sync(place.library())
    new, out, identifier = place.path("new"), place.path("temporary-out"), IDS[0]
    for folder, names in ((new, ("a", "locked")), (out, ())):
        os.mkdir(folder)
        for name in names:
            with open(os.path.join(folder, name), "w") as file:
                file.write(name)
    os.chmod(os.path.join(new, "locked"), 0)
    for path in (device.path, new, out):
        give(path, NOBODY)
    pushed = place.as_nobody("data", "push", device.path, identifier, new, "--yes", expect=1)
    assert "locked" in pushed.stderr and pushed.stderr.count("\n") == 1
    data = os.path.join(device.path, "root/var/mobile/Containers/Data", identifier)
    assert os.listdir(data) == ["a"]
    shutil.copy(os.path.join(data, "a"), os.path.join(data, "b"))
    os.chmod(os.path.join(data, "a"), 0)
    give(data, NOBODY)
    pulled = place.as_nobody("data", "pull", device.path, identifier, os.path.join(out, "data"), "--json", expect=1)
    assert [each["file"] for each in json.loads(pulled.stdout)["leftOut"]] == ["a"]
    assert os.listdir(os.path.join(out, "data")) == ["b"]


def test_a_device_that_may_not_be_read_names_who_may(place):
    device = place.device()
    os.chmod(device.path, 0o700)
    for command in ("apps", "status", "log", "reset"):
        told = place.as_nobody(command, device.path, expect=3).stderr
        assert "Permission denied" in told and told.count("\n") == 1
        assert told.endswith("; run the command as the account that owns the device\n")
