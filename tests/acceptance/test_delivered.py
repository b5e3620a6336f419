"""What an interrupted sync had delivered, and what has become of everything meanwhile: whatever it is, the next
sync does what its plan says and no more, and where it says that all is well, the device is in step."""

import json
import os
import shutil
import signal
import time

import pytest

import packages
from conftest import COORDINATED, Device, names_of
from delivery import STAGING, deliver
from staging import install, remove, stage

A, B, LARGE, C = ("com.example.app%02d" % number for number in range(4))


def wait_until(condition, limit=60):
    end = time.monotonic() + limit
    while not condition():
        assert time.monotonic() < end, "it never came"
        time.sleep(0.02)


def waits_for(device, identifier):
    return (device.appsync.json("why", device.path, identifier)["waitsFor"] or {}).get("what")


@pytest.fixture
def library(tmp_path):
    folder = str(tmp_path / "library")
    packages.make_library(folder, 2)
    return folder


def interrupt(device, library, *signals):
    """A and B are installed in 1.0; a sync that has delivered A in 2.0 is interrupted, and A has quit since."""
    appsync = device.appsync
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, library)
    wait_until(lambda: waits_for(device, A) == "termination")
    for number in signals:
        sync.send_signal(number)
        time.sleep(0.1)
    sync.communicate(timeout=60)
    appsync("quit", device.path, A)
    assert device.versions() == {A: "1.0", B: "1.0"}
    return library


@pytest.fixture
def delivered(device, library):
    return interrupt(device, library, signal.SIGKILL)


def put(version):
    """The library holds A in another version, or no more."""
    def change(device, library):
        os.remove(os.path.join(library, A + ".zip"))
        if version is not None:
            packages.make_package(library, A, version)

    return change


def asks(*changes):
    def change(device, library):
        for each in changes:
            each(device, library)

    return change


def settings(*assignments):
    return lambda device, library: device.appsync("set", device.path, *assignments)


def uninstalled(device, library):
    device.appsync("uninstall", device.path, A)


def switched(device, library):
    settings("coordination=" + ("off" if device.is_coordinated else "on"))(device, library)


def opened(device, library):
    """Another session has been since, which asks for nothing."""
    device.appsync("inventory", device.path)


def staged(*entries):
    return lambda device, library: stage(device, list(entries), side_files=[A, B])


def bundle_lost(device, library):
    shutil.rmtree(device.container_of(A))


UNCHANGED = asks()
KEPT, GONE = {A: "1.0", B: "1.0"}, {B: "1.0"}
MEANWHILE = {
    # what: (what changes, options of the sync, what the device holds in the end, the sync's status)
    "nothing": (UNCHANGED, (), {A: "2.0", B: "1.0"}, 0),
    "removed from the library": (put(None), (), KEPT, 0),
    "back to what the device has": (put("1.0"), (), KEPT, 0),
    "downgraded": (put("0.9"), (), {A: "0.9", B: "1.0"}, 0),
    "replaced by a higher one": (put("3.0"), (), {A: "3.0", B: "1.0"}, 0),
    "replaced by another text of the same": (put("2"), (), {A: "2", B: "1.0"}, 0),
    "named to be removed": (UNCHANGED, ("--remove", A), GONE, 0),
    "named to be removed, and not in the library": (put(None), ("--remove", A), GONE, 0),
    "mirrored away": (put(None), ("--mirror",), GONE, 0),
    "mirrored": (UNCHANGED, ("--mirror",), {A: "2.0", B: "1.0"}, 0),
    "installing forbidden": (settings("installation=no"), (), KEPT, 1),
    "installing forbidden, back to what the device has":
        (asks(settings("installation=no"), put("1.0")), (), KEPT, 0),
    "installing forbidden and allowed again":
        (asks(settings("installation=no"), settings("installation=yes")), (), {A: "2.0", B: "1.0"}, 0),
    "removing forbidden, named to be removed": (settings("removal=no"), ("--remove", A), KEPT, 1),
    "removing forbidden, mirrored away": (asks(settings("removal=no"), put(None)), ("--mirror",), KEPT, 1),
    "removing forbidden": (settings("removal=no"), (), {A: "2.0", B: "1.0"}, 0),
    "the other path": (switched, (), {A: "2.0", B: "1.0"}, 0),
    "the other path, back to what the device has": (asks(switched, put("1.0")), (), KEPT, 0),
    "the other path, removed from the library": (asks(switched, put(None)), (), KEPT, 0),
    "the other path, mirrored away": (asks(switched, put(None)), ("--mirror",), GONE, 0),
    "another session": (asks(opened, put("1.0")), (), KEPT, 0),
    "uninstalled": (uninstalled, (), {A: "2.0", B: "1.0"}, 0),
    "uninstalled, removed from the library": (asks(uninstalled, put(None)), (), GONE, 0),
    "lost its bundle": (bundle_lost, (), {A: "2.0", B: "1.0"}, 0),
    "lost its bundle, removed from the library": (asks(bundle_lost, put(None)), (), GONE, 0),
    "a list of nothing": (staged(), ("--staged",), KEPT, 0),
    "a list of something else": (staged(install(B)), ("--staged",), KEPT, 0),
    "a list that removes it": (staged(remove(A)), ("--staged",), GONE, 0),
    "a list that asks for it": (staged(install(A, "2.0")), ("--staged",), {A: "2.0", B: "1.0"}, 0),
    "a list that asks for another version": (asks(put("3.0"), staged(install(A, "3.0"))), ("--staged",),
                                             {A: "3.0", B: "1.0"}, 0),
    "no list": (UNCHANGED, ("--staged",), KEPT, 0),
}


def after(plan, versions):
    """What the device holds when exactly the plan has been done."""
    held = {name: version for name, version in versions.items() if name not in plan["remove"]}
    held.update({each["identifier"]: each["newVersion"] for each in plan["update"]})
    return held


@pytest.mark.parametrize("what", MEANWHILE)
def test_the_next_sync_does_what_its_plan_says(appsync, device, delivered, what):
    change, options, wanted, status = MEANWHILE[what]
    change(device, delivered)
    before = {name: app["version"] for name, app in device.apps().items()
              if os.path.exists(device.inside(app["container"]))}
    plan = appsync.json("plan", device.path, delivered, *options, expect=None)
    result = device.sync(delivered, *options, expect=status)
    assert device.versions() == wanted
    held = after(plan, before)
    assert set(held) | set(names_of(plan["install"])) == set(wanted)
    assert all(wanted[name] == version for name, version in held.items() if name not in names_of(plan["install"]))
    for done in ("install", "update", "remove"):
        named = {"install": "installed", "update": "updated", "remove": "removed"}[done]
        assert names_of(result[named]) == names_of(plan[done])
    if "--staged" not in options:
        again = appsync.json("plan", device.path, delivered, *options, expect=None)
        assert again["install"] == again["update"] == [] and bool(again["skipped"]) >= (status != 0)
    assert device.placeholders() == [] and appsync.json("coordinator", device.path, "list") == []
    assert [name for name in os.listdir(device.inside(STAGING)) if name.endswith(".zip")] == []


@COORDINATED
def test_what_a_stopped_sync_had_delivered_does_not_come_either(device, library):
    interrupt(device, library, signal.SIGINT, signal.SIGINT)
    put("1.0")(device, library)
    assert device.sync(library)["updated"] == [] and device.versions() == KEPT
    assert device.placeholders() == []


# First installs do not wait for anything, so what had arrived is made here.


@pytest.fixture
def first_delivered(appsync, device, library):
    """A and B are installed; the package of C had come whole as the session was killed."""
    device.sync(library)
    packages.make_package(library, C)
    packages.make_package(library, LARGE, payload=os.urandom(64 << 20))
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if json.loads(line)["event"] == "progress":
            break
    sync.kill()
    sync.communicate()
    os.remove(os.path.join(library, LARGE + ".zip"))
    deliver(device, library, C)
    return library


FIRST = {
    "nothing": (UNCHANGED, (), "1.0"),
    "removed from the library": (lambda device, library: os.remove(os.path.join(library, C + ".zip")), (), None),
    "replaced": (lambda device, library: packages.make_package(library, C, "2.0"), (), "2.0"),
    "named to be removed": (UNCHANGED, ("--remove", C), None),
}


@COORDINATED
@pytest.mark.parametrize("what", FIRST)
def test_a_first_install_that_had_arrived_is_as_the_library_has_it(appsync, device, first_delivered, what):
    change, options, wanted = FIRST[what]
    change(device, first_delivered)
    plan = appsync.json("plan", device.path, first_delivered, *options)
    result = device.sync(first_delivered, *options)
    assert device.versions() == {A: "1.0", B: "1.0", **({C: wanted} if wanted else {})}
    assert names_of(plan["install"]) == names_of(result["installed"])
    assert device.placeholders() == [] and appsync.json("coordinator", device.path, "list") == []


# What a restore has left, and the store has delivered, another session installs.


@pytest.fixture
def restored(appsync, device, library, tmp_path):
    """A and B are placeholders of a restore; the package of A had come from the store as that was killed."""
    used = Device(appsync, tmp_path / "used", device.coordination)
    used.sync(library)
    appsync("backup", used.path, tmp_path / "backup")
    appsync("restore", device.path, tmp_path / "backup")
    deliver(device, library, A, promise=1)
    return library


@COORDINATED
@pytest.mark.parametrize("version, skipped", [("1.0", [B]), ("2.0", [A, B]), (None, [B])])
@pytest.mark.parametrize("policy", ["unset", "no"])
def test_what_the_store_had_delivered_is_installed_and_named(appsync, device, restored, version, skipped, policy):
    if version != "1.0":
        put(version)(device, restored)
    appsync("set", device.path, "installation=" + policy)
    plan = appsync.json("plan", device.path, restored, expect=None)
    assert plan["install"] == [A] and names_of(plan["skipped"]) == skipped
    result = device.sync(restored, expect=1)
    assert result["installed"] == [A] and names_of(result["skipped"]) == skipped and result["failed"] == []
    assert device.versions() == {A: "1.0"} and device.placeholders() == [B]
    os.remove(os.path.join(restored, B + ".zip"))
    assert device.sync(restored, expect=None)["installed"] == []


@COORDINATED
def test_what_the_store_had_delivered_and_is_to_be_removed_does_not_come(appsync, device, restored):
    assert appsync.json("plan", device.path, restored, "--remove", A)["install"] == []
    result = device.sync(restored, "--remove", A, expect=1)
    assert result["removed"] == [A] and result["installed"] == []
    assert device.versions() == {} and device.placeholders() == [B]


@COORDINATED
def test_the_plan_knows_which_placeholders_go_with_coordination(appsync, device, restored):
    settings("coordination=off")(device, restored)
    plan = appsync.json("plan", device.path, restored)
    assert names_of(plan["install"]) == [A, B] and plan["skipped"] == []
    assert names_of(device.sync(restored)["installed"]) == [A, B]
    assert device.placeholders() == []
