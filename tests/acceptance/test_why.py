"""Whatever `why` says to do is carried out, and leads on until there is nothing left to wait for."""

import json
import os
import re
import shutil
import signal
import sqlite3
import tempfile
import time

import pytest

import packages
from conftest import COORDINATED, DIRECTLY, Device
from delivery import deliver

A, B = "com.example.app00", "com.example.app01"
DATA = "/var/mobile/Containers/Data"


def wait_until(condition, limit=60):
    end = time.monotonic() + limit
    while not condition():
        assert time.monotonic() < end, "it never came"
        time.sleep(0.02)


def what_waits(device, identifier=A):
    answer = device.appsync("why", device.path, identifier, "--json", expect=None).stdout
    return answer and (json.loads(answer)["waitsFor"] or {}).get("what")


class Place:
    """A device, and everything that stands for the words in capitals of an advice."""

    def __init__(self, appsync, device, tmp_path):
        self.appsync, self.device, self.tmp_path = appsync, device, tmp_path
        self.library = str(tmp_path / "library")
        self.backup = str(tmp_path / "backup")
        packages.make_library(self.library, 2)

    @property
    def file(self):
        return os.path.join(self.library, A + ".zip")

    def alter(self, *statements):
        with sqlite3.connect(os.path.join(self.device.path, "device.db")) as database:
            for statement in statements:
                database.execute(statement)
        database.close()

    def has_coordinator(self):
        database = sqlite3.connect(os.path.join(self.device.path, "device.db"), timeout=10)
        count = database.execute("SELECT count(*) FROM coordinators").fetchone()[0]
        database.close()
        return count > 0

    def set(self, assignment):
        return self.appsync("set", self.device.path, assignment).stdout

    def copy(self):
        """The same, with a device of its own."""
        other = Place.__new__(Place)
        other.__dict__.update(self.__dict__)
        path = os.path.join(tempfile.mkdtemp(dir=self.tmp_path), "device")
        shutil.copytree(self.device.path, path, symlinks=True)
        other.device = Device.__new__(Device)
        other.device.__dict__.update(self.device.__dict__, path=path)
        return other

    def ways(self):
        """What `why` says that a person can do: each way a list of commands, one after the other."""
        answer = self.appsync("why", self.device.path, A, expect=None).stdout
        waits = [line for line in answer.splitlines() if line.startswith("It waits")]
        ways = waits[0].split(", or ") if waits else []
        found = [re.findall(r"\((appsync [^)]*)\)", way) for way in ways]
        assert sum(map(len, found)) == answer.count("appsync "), "a command that nobody can copy: " + answer
        return [way for way in found if way]

    def carry_out(self, command):
        """Its exit status must be 0."""
        stands_for = {"DEVICE": self.device.path, "LIBRARY": self.library, "FOLDER": self.library, "FILE": self.file,
                      "DATA": os.path.join(self.backup, "data", A + ".zip")}
        words = command.split()
        assert words[0] == "appsync"
        assert {word for word in words if word.isupper()} <= set(stands_for)
        self.appsync(*[stands_for.get(word, word) for word in words[1:]])

    def state(self):
        settings = sqlite3.connect(os.path.join(self.device.path, "device.db"))
        kept = settings.execute("SELECT * FROM settings ORDER BY name").fetchall()
        settings.close()
        return (self.appsync("why", self.device.path, A, expect=None).stdout,
                self.appsync.json("apps", self.device.path),
                self.appsync.json("coordinator", self.device.path, "list"), kept)


@pytest.fixture
def place(appsync, device, tmp_path):
    return Place(appsync, device, tmp_path)


# Situations.


def synced(place, *more):
    place.device.sync(place.library)


def interrupted(place, version="1.0"):
    """A sync that was killed amid the package of A."""
    packages.make_package(place.library, A, version, payload=os.urandom(48 << 20))
    sync = place.appsync.start("sync", place.device.path, place.library, "--json-lines")
    for line in sync.stdout:
        if '"progress"' in line and A in line:
            break
    sync.kill()
    sync.communicate()


def interrupted_update(place):
    synced(place)
    interrupted(place, "2.0")


def delivered(place):
    """An update has come whole, and was not installed."""
    synced(place)
    packages.make_package(place.library, A, "2.0")
    place.appsync("run", place.device.path, A)
    sync = place.appsync.start("sync", place.device.path, place.library)
    wait_until(lambda: what_waits(place.device) == "termination")
    sync.kill()
    sync.communicate()
    place.appsync("quit", place.device.path, A)


def offloaded(place):
    synced(place)
    place.appsync("demote", place.device.path, A)


def offloaded_by_system(place):
    synced(place)
    place.appsync("demote", place.device.path, A, "--by", "system")


def offloaded_of_system(place):
    synced(place)
    offload_of_system(place)


def offload_of_system(place):
    place.alter("UPDATE applications SET type = 'System' WHERE identifier = '%s'" % A)
    place.appsync("demote", place.device.path, A)


def send_of_system_killed(place):
    """Its coordinator stands, and the install has not come to its end."""
    offloaded_of_system(place)
    packages.make_package(place.library, A, payload=os.urandom(48 << 20))
    for _ in range(5):  # the package must take longer to unpack than it takes to look
        send = place.appsync.start("send", place.device.path, A, place.file)
        while send.poll() is None and not place.has_coordinator():
            pass
        send.kill()
        send.communicate()
        if A not in place.device.apps():
            return
        offload_of_system(place)
    pytest.fail("it was too quick")


def send_of_system_delivered(place):
    """The package has come whole, and the device has had no time to install it."""
    send_of_system_killed(place)
    deliver(place.device, place.library, A, promise=1)


def backed_up(place, with_data):
    used = Device(place.appsync, place.tmp_path / "used", place.device.coordination)
    used.sync(place.library)
    if with_data:
        folder = os.path.join(used.inside(DATA), A)
        os.makedirs(folder)
        with open(os.path.join(folder, "notes"), "wb") as file:
            file.write(b"Dear")
    place.appsync("backup", used.path, place.backup)


def restored(place):
    backed_up(place, False)
    place.appsync("restore", place.device.path, place.backup)


def restored_with_data(place):
    backed_up(place, True)
    place.appsync("restore", place.device.path, place.backup)


def restored_and_sent(place):
    restored_with_data(place)
    place.appsync("send", place.device.path, A, place.file, "--restore", "--parts", "1")


def restore_killed(place):
    """Its coordinator stands, and the placeholder has not come to."""
    restored(place)
    place.alter("UPDATE coordinators SET placeholder = 0 WHERE identifier = '%s'" % A, "PRAGMA foreign_keys = ON",
                "DELETE FROM placeholders WHERE identifier = '%s'" % A)
    os.remove(os.path.join(place.library, B + ".zip"))


def held_by(client):
    return lambda place: place.appsync("coordinator", place.device.path, "create", A, "--client", client)


def then(*situations):
    def all_of_them(place):
        for situation in situations:
            situation(place)

    return all_of_them


def setting(assignment):
    return lambda place: place.set(assignment)


def another_session(place):
    place.appsync("inventory", place.device.path)


forbidden = setting("installation=no")
OFF, ON = setting("coordination=off"), setting("coordination=on")

INSTALLED, UNKNOWN = "is installed", "knows nothing of"

BOTH = {
    # what: (situation, what `why` says that A waits for, what it says in the end)
    "absent, and forbidden": (forbidden, "policy", UNKNOWN),
    "a sync was interrupted": (interrupted, "sync", INSTALLED),
    "an update was interrupted": (interrupted_update, "sync", INSTALLED),
    "an update was interrupted, and is forbidden": (then(interrupted_update, forbidden), "policy", INSTALLED),
    "offloaded, and forbidden": (then(offloaded, forbidden), "policy", INSTALLED),
    "restored, and forbidden": (then(restored, forbidden), ("policy", "store"), INSTALLED),
    "offloaded by a person": (offloaded, ("transfer", "sync"), INSTALLED),
    "offloaded by the system": (offloaded_by_system, ("transfer", "sync"), INSTALLED),
    "an application of the system offloaded": (offloaded_of_system, ("transfer", "store"), INSTALLED),
    "restored": (restored, ("transfer", "store"), INSTALLED),
    "restored with data": (restored_with_data, ("restore data", "store"), INSTALLED),
}
DIRECT = {
    "its data is missing": (restored_and_sent, "restore data", INSTALLED),
    "its data is missing, and forbidden": (then(restored_and_sent, forbidden), "policy", INSTALLED),
    "coordinated since the restore": (then(restored, ON), "store", INSTALLED),
    "coordinated since the restore of data": (then(restored_with_data, ON), "store", INSTALLED),
    "coordinated since its data is missing": (then(restored_and_sent, ON), "store", INSTALLED),
    "coordinated for a session since the restore": (then(restored_with_data, ON, another_session), "store", INSTALLED),
    "coordinated since the restore, and forbidden": (then(restored, ON, forbidden), ("policy", "store"), INSTALLED),
    "coordinated since it was offloaded": (then(offloaded, ON), "sync", INSTALLED),
    "coordinated since a sync was interrupted": (then(interrupted, ON), "sync", INSTALLED),
}
THROUGH_COORDINATORS = {
    "delivered": (delivered, "sync", INSTALLED),
    "delivered, and forbidden": (then(delivered, forbidden), "policy", INSTALLED),
    "delivered, and the library has another version since":
        (then(delivered, lambda place: packages.make_package(place.library, A, "3.0")), "sync", INSTALLED),
    "another client has it": (held_by(2), "promise", UNKNOWN),
    "the store has it": (held_by(1), "promise", UNKNOWN),
    "another client has its update": (then(synced, held_by(7)), "promise", INSTALLED),
    "another client has it offloaded": (then(offloaded, held_by(2)), "promise", INSTALLED),
    "another client has it restored": (then(restored, lambda place: place.alter("DELETE FROM coordinators"), held_by(2)),
                                       "promise", INSTALLED),
    "another client has it, and forbidden": (then(held_by(2), forbidden), "policy", UNKNOWN),
    "a restore was killed": (restore_killed, "sync", INSTALLED),
    "a restore was killed, and forbidden": (then(restore_killed, forbidden), "policy", INSTALLED),
    "a send of one of the system was killed": (send_of_system_killed, "store", INSTALLED),
    "a send of one of the system was killed when all was there": (send_of_system_delivered, "store", INSTALLED),
    "given up with coordination: restored": (then(restored, OFF), "sync", INSTALLED),
    "given up with coordination: delivered": (then(delivered, OFF), "sync", INSTALLED),
    "given up with coordination: interrupted": (then(interrupted, OFF), "sync", INSTALLED),
    "given up with coordination: another client": (then(held_by(2), OFF), "sync", INSTALLED + "|" + UNKNOWN),
    "given up with coordination: another client's offloaded": (then(offloaded, held_by(2), OFF), "transfer", INSTALLED),
    "given up with coordination: a send": (then(send_of_system_killed, OFF), "transfer", INSTALLED),
}


def follow(place, ways, end, steps=0):
    """Each way first, then whatever `why` says next, until it says no more."""
    assert steps < 6, "it leads in a circle"
    for way in ways:
        there = place.copy()
        before = there.state()
        for command in way:
            there.carry_out(command)
        assert there.state() != before, (way, before[0])
        rest = there.ways()
        if rest:
            follow(there, rest[:1], end, steps + 1)
        else:
            answer = there.appsync("why", there.device.path, A, expect=None)
            assert re.search(end, answer.stdout + answer.stderr)


def check(place, situation, what, end):
    situation(place)
    assert what_waits(place.device) in ((what,) if isinstance(what, str) else what)
    ways = place.ways()
    assert ways
    follow(place, ways, end)


@pytest.mark.parametrize("situation", BOTH)
def test_what_why_says_is_carried_out(place, situation):
    check(place, *BOTH[situation])


@DIRECTLY
@pytest.mark.parametrize("situation", DIRECT)
def test_what_why_says_is_carried_out_on_the_direct_path(place, situation):
    check(place, *DIRECT[situation])


@COORDINATED
@pytest.mark.parametrize("situation", THROUGH_COORDINATORS)
def test_what_why_says_is_carried_out_where_installs_are_coordinated(place, situation):
    check(place, *THROUGH_COORDINATORS[situation])


def test_an_application_that_runs_is_quit_as_why_says(place, appsync, device):
    synced(place)
    packages.make_package(place.library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, place.library)
    wait_until(lambda: what_waits(device) == "termination")
    ((command,),) = place.ways()
    assert "is running" in appsync("why", device.path, A).stdout
    place.carry_out(command)
    assert "is running" not in appsync("why", device.path, A).stdout
    sync.communicate(timeout=90)  # on the direct path the next try, within half a minute, finds that it has ended
    assert sync.returncode == 0 and device.versions()[A] == "2.0" and place.ways() == []


def test_what_is_under_way_needs_nobody(place, appsync, device):
    packages.make_package(place.library, A, payload=os.urandom(48 << 20))
    sync = appsync.start("sync", device.path, place.library, "--json-lines")
    for line in sync.stdout:
        if '"progress"' in line and '"transfer"' in line and A in line:
            break
    sync.send_signal(signal.SIGSTOP)  # it stands still amid the package
    assert what_waits(device) == "transfer" and place.ways() == []
    sync.send_signal(signal.SIGCONT)
    sync.communicate(timeout=60)
    assert sync.returncode == 0 and what_waits(device) is None and place.ways() == []


@DIRECTLY
def test_turning_coordination_on_tells_who_brings_what_was_restored(place, appsync, device):
    restored_with_data(place)
    assert "comes from the store from now on: %s %s\n" % (A, B) in place.set("coordination=on")
    assert appsync("sync", device.path, place.library, expect=1).stdout.count("appsync store") == 2
    assert "comes from the store" not in place.set("coordination=on"), "it has one that waits for the store already"
    assert appsync.json("store", device.path, place.library)["kept"] == [A, B]
    with open(os.path.join(device.inside(DATA), A, "notes"), "rb") as file:
        assert file.read() == b"Dear"
    assert device.placeholders() == []
