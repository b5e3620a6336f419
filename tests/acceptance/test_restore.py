"""Backing up, restoring, and bringing the packages afterwards, as a user does."""

import hashlib
import json
import os
import pathlib
import plistlib
import random
import re
import shutil
import sqlite3
import tempfile
import time
import zipfile

import pytest

import packages
from conftest import COORDINATED, DIRECTLY, ON_ONE_PATH, Device, names_of
from test_device import in_own_mounts

DATA = "/var/mobile/Containers/Data"
RESTORE_INFO = "/var/mobile/Media/VessikRestore/RestoreApplications.plist"
PROCESSED_INFO = "/var/mobile/Library/Logs/MediaServices/RestoreApplications.plist"
IDS = ["com.example.app%02d" % number for number in range(6)]
ORDER = [IDS[4], IDS[0], IDS[3], IDS[1], IDS[5], IDS[2]]


@pytest.fixture
def tmp_path():
    """In memory, where the machine has room there: no test here is about the disk."""
    place = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
    if place and shutil.disk_usage(place).free < 200 << 20:
        place = None
    with tempfile.TemporaryDirectory(dir=place) as path:
        yield pathlib.Path(path)


def write_data(device, identifier, files):
    for name, content in files.items():
        path = os.path.join(device.inside(DATA), identifier, name)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        with open(path, "wb") as file:
            file.write(content)


def data_of(device, identifier):
    top = os.path.join(device.inside(DATA), identifier)
    found = {}
    for base, _, files in os.walk(top):
        for name in files:
            path = os.path.join(base, name)
            with open(path, "rb") as file:
                found[os.path.relpath(path, top)] = file.read()
    return found


def icon_of(device, app):
    """The icon file of an application or a placeholder, byte for byte."""
    container = device.inside(app["container"])
    for bundle in os.listdir(container):
        path = os.path.join(container, bundle, "Icon.png")
        if os.path.exists(path):
            with open(path, "rb") as file:
                return file.read()
    return None


def screen_of(device):
    """What stands on the home screen: identifier, name, version and icon, by identifier."""
    return {app["identifier"]: (app["name"], app["version"], icon_of(device, app))
            for app in device.appsync.json("apps", device.path)}


@pytest.fixture
def store(tmp_path):
    """Six packages, each with an icon of its own, one without a store's metadata."""
    folder = str(tmp_path / "library")
    os.makedirs(folder)
    for number, identifier in enumerate(IDS):
        entries = packages.entries(identifier, "1.%d" % number, name="Name & Nr. %d é" % number)
        entries[1] = (entries[1][0], packages.png(colour=(40 * number, 10, 200)))
        if number == 5:
            entries = [each for each in entries if each[0] != "VessikMetadata.plist"]
        packages.write_zip(os.path.join(folder, identifier + ".zip"), entries)
    with open(os.path.join(folder, "IconOrder.plist"), "wb") as file:
        plistlib.dump(ORDER, file)
    return folder


@pytest.fixture
def used(device, store):
    """A device with six applications, two of them with data, two offloaded."""
    device.sync(store)
    write_data(device, IDS[1], {"Documents/letter.txt": b"Dear", "Library/deep/er/cache": bytes(70_000)})
    write_data(device, IDS[2], {"notes": b"of an offloaded one"})
    device.appsync("demote", device.path, IDS[2])
    device.appsync("demote", device.path, IDS[3], "--by", "system")
    return device


@pytest.fixture
def backup(used, tmp_path):
    path = str(tmp_path / "backup")
    result = used.appsync.json("backup", used.path, path)
    assert sorted(result["applications"]) == IDS
    assert sorted(result["demoted"]) == [IDS[2], IDS[3]]
    assert sorted(result["data"]) == [IDS[1], IDS[2]]
    return path


@pytest.fixture
def fresh(appsync, tmp_path, coordination):
    return Device(appsync, tmp_path / "fresh", coordination)


def restore(device, backup, *options, expect=0):
    return device.appsync.json("restore", device.path, backup, *options, expect=expect)


def resign(backup):
    """Makes the manifest true again after somebody has changed the files."""
    path = os.path.join(backup, "manifest.json")
    with open(path) as file:
        manifest = json.load(file)
    for name in list(manifest["files"]):
        full = os.path.join(backup, name)
        if not os.path.exists(full):
            del manifest["files"][name]
            continue
        with open(full, "rb") as file:
            content = file.read()
        manifest["files"][name] = {"size": len(content), "sha256": hashlib.sha256(content).hexdigest()}
    with open(path, "w") as file:
        json.dump(manifest, file)


def bring_packages(device, store, backup):
    """The payloads, in the way of the device's path."""
    appsync = device.appsync
    if device.is_coordinated:
        assert appsync.json("store", device.path, store)["failed"] == []
        device.sync(store)  # those that were offloaded
        return
    for identifier in IDS:
        package = os.path.join(store, identifier + ".zip")
        data = os.path.join(backup, "data", identifier + ".zip")
        if os.path.exists(data):
            appsync("send", device.path, identifier, package, "--restore", "--parts", "1")
            assert identifier not in device.apps()
            appsync("send", device.path, identifier, data, "--restore", "--parts", "2")
        else:
            appsync("send", device.path, identifier, package, "--restore", "--parts", "3")


# The round trip.


def test_round_trip_brings_screen_applications_and_data_back(appsync, used, store, backup, fresh, tmp_path):
    assert appsync.json("backup", "--check", backup) == {"whole": True, "faults": []}
    result = restore(fresh, backup)
    assert sorted(result["restored"]) == IDS and result["failed"] == [] and result["kept"] == []
    assert [each["identifier"] for each in result["screen"]] == ORDER
    assert fresh.placeholders() == IDS
    assert screen_of(fresh) == screen_of(used)
    assert not os.path.exists(fresh.inside(RESTORE_INFO))
    assert os.path.exists(fresh.inside(PROCESSED_INFO))

    bring_packages(fresh, store, backup)
    assert sorted(fresh.apps()) == IDS and fresh.placeholders() == []
    for identifier in IDS:
        assert data_of(fresh, identifier) == data_of(used, identifier)
    assert os.listdir(fresh.inside("/var/mobile/Media/VessikRestore/Data")) == []

    used.appsync("send", used.path, IDS[2], os.path.join(store, IDS[2] + ".zip"))
    used.appsync("send", used.path, IDS[3], os.path.join(store, IDS[3] + ".zip"))
    for device in (used, fresh):
        appsync("screen", device.path, os.path.join(device.path, "screen.png"))
    pictures = []
    for device in (used, fresh):
        with open(os.path.join(device.path, "screen.png"), "rb") as file:
            pictures.append(file.read())
    assert pictures[0] == pictures[1]


def test_what_a_backup_holds(used, backup):
    with open(os.path.join(backup, "RestoreApplications.plist"), "rb") as file:
        info = plistlib.load(file)
    assert sorted(info) == IDS
    metadata = plistlib.loads(info[IDS[1]]["VessikMetadata"])
    assert metadata["korvuId"] == "account-1"
    assert metadata["title"] == "Name & Nr. 1 é" and metadata["bundleVersion"] == "1.1"
    assert info[IDS[1]]["PlaceholderIcon"] == packages.png(colour=(40, 10, 200))
    with open(os.path.join(backup, "DemotedApps.plist"), "rb") as file:
        assert plistlib.load(file) == {"AutomaticDowngrades": [IDS[3]], "IntentionalDowngrades": [IDS[2]]}
    with open(os.path.join(backup, "IconOrder.plist"), "rb") as file:
        assert plistlib.load(file) == ORDER
    with zipfile.ZipFile(os.path.join(backup, "data", IDS[1] + ".zip")) as archive:
        assert archive.read("Documents/letter.txt") == b"Dear"


def test_automatic_download_marks_do_not_reach_a_backup(appsync, device, store, tmp_path):
    device.sync(store)
    path = os.path.join(device.container_of(IDS[0]), "VessikMetadata.plist")
    with open(path, "wb") as file:
        plistlib.dump({"is-auto-download": True, "korvuId": "kept"}, file)
    appsync("backup", device.path, tmp_path / "backup")
    with open(tmp_path / "backup" / "RestoreApplications.plist", "rb") as file:
        metadata = plistlib.loads(plistlib.load(file)[IDS[0]]["VessikMetadata"])
    assert "is-auto-download" not in metadata and metadata["korvuId"] == "kept"


def test_backup_of_a_restored_device_holds_the_same(appsync, backup, fresh, tmp_path):
    """Also the data that still waits for its application, and who had been offloaded."""
    restore(fresh, backup)
    again = appsync.json("backup", fresh.path, tmp_path / "again")
    assert sorted(again["applications"]) == IDS and sorted(again["data"]) == [IDS[1], IDS[2]]
    for identifier in (IDS[1], IDS[2]):
        name = os.path.join("data", identifier + ".zip")
        with open(os.path.join(backup, name), "rb") as old, open(tmp_path / "again" / name, "rb") as new:
            assert old.read() == new.read()
    if fresh.is_coordinated:
        assert sorted(again["demoted"]) == [IDS[2], IDS[3]]


def test_links_in_data_are_left_out_and_named(appsync, device, store, tmp_path):
    device.sync(store)
    write_data(device, IDS[0], {"file": b"x"})
    os.symlink("/etc/passwd", os.path.join(device.inside(DATA), IDS[0], "link"))
    result = appsync.json("backup", device.path, tmp_path / "backup", expect=1)
    assert names_of(result["leftOut"]) == [IDS[0]]
    appsync("backup", "--check", tmp_path / "backup")
    with zipfile.ZipFile(tmp_path / "backup" / "data" / (IDS[0] + ".zip")) as archive:
        assert archive.namelist() == ["file"]


def test_data_directory_that_leads_outside_is_not_backed_up(appsync, device, store, tmp_path):
    device.sync(store)
    (tmp_path / "secret").mkdir()
    (tmp_path / "secret" / "key").write_text("secret")
    os.makedirs(device.inside(DATA), exist_ok=True)
    os.symlink(tmp_path / "secret", os.path.join(device.inside(DATA), IDS[0]))
    appsync("backup", device.path, tmp_path / "backup", expect=None)
    assert not (tmp_path / "backup" / "data" / (IDS[0] + ".zip")).exists()


def test_backup_folder_must_be_new_or_empty(appsync, device, tmp_path):
    (tmp_path / "full").mkdir()
    (tmp_path / "full" / "mine").write_text("mine")
    done = appsync("backup", device.path, tmp_path / "full", expect=3)
    assert "not an empty folder" in done.stderr and done.stderr.count("\n") == 1
    assert os.listdir(tmp_path / "full") == ["mine"]
    (tmp_path / "empty").mkdir()
    appsync("backup", device.path, tmp_path / "empty")
    appsync("backup", "--check", tmp_path / "empty")
    assert "cannot make the folder" in appsync("backup", device.path, tmp_path / "no" / "way", expect=3).stderr


def test_wrong_usage(appsync, device, tmp_path):
    appsync("backup", device.path, expect=2)
    appsync("backup", device.path, tmp_path / "b", "--check", tmp_path / "b", expect=2)
    appsync("restore", device.path, expect=2)


# Offloaded applications.


def test_offloaded_applications_come_back_as_their_path_has_it(appsync, backup, fresh, store):
    restore(fresh, backup)
    types = {app["identifier"]: app["installType"] for app in appsync.json("apps", fresh.path)}
    assert types[IDS[0]] == 2
    assert (types[IDS[2]], types[IDS[3]]) == ((8, 7) if fresh.is_coordinated else (2, 2))
    done = fresh.sync(store, expect=None)
    if fresh.is_coordinated:
        assert sorted(done["installed"]) == [IDS[2], IDS[3]]
        assert data_of(fresh, IDS[2]) == {"notes": b"of an offloaded one"}
    else:
        assert done["requested"] == [] and names_of(done["skipped"]) == IDS


def test_offloaded_application_keeps_data_and_comes_back_by_send(appsync, used, store):
    assert used.placeholders() == [IDS[2], IDS[3]]
    plan = used.appsync.json("plan", used.path, store, expect=None)
    if used.is_coordinated:
        assert names_of(plan["install"]) == [IDS[2], IDS[3]]
    else:
        told = {each["identifier"]: each["why"] for each in plan["skipped"]}
        assert "appsync send DEVICE %s FILE brings it back" % IDS[2] in told[IDS[2]]
    appsync("send", used.path, IDS[2], os.path.join(store, IDS[2] + ".zip"))
    assert IDS[2] in used.apps() and data_of(used, IDS[2]) == {"notes": b"of an offloaded one"}


# What is there stays.


def test_restoring_over_applications_keeps_them(appsync, backup, fresh, store, tmp_path):
    newer = str(tmp_path / "newer")
    packages.make_package(newer, IDS[1], "9.0")
    packages.make_package(newer, "com.example.other")
    fresh.sync(newer)
    write_data(fresh, IDS[1], {"mine": b"mine"})
    result = restore(fresh, backup)
    assert result["kept"] == [IDS[1]] and result["failed"] == []
    assert fresh.versions() == {IDS[1]: "9.0", "com.example.other": "1.0"}
    assert fresh.placeholders() == [each for each in IDS if each != IDS[1]]
    assert data_of(fresh, IDS[1]) == {"mine": b"mine"}
    shown = [each["identifier"] for each in result["screen"]]
    assert shown[:2] == [IDS[1], "com.example.other"]
    assert shown[2:] == [each for each in ORDER if each != IDS[1]]


def test_other_types_of_restore_bring_nothing_back(appsync, backup, fresh):
    result = restore(fresh, backup, "--type", "1")
    assert result["restored"] == [] and result["screen"] == []
    assert fresh.placeholders() == []
    assert sorted(restore(fresh, backup, "--type", "3")["restored"]) == IDS


# Packages and data afterwards.


@DIRECTLY
def test_parked_package_survives_a_kill_and_its_data_installs_it(appsync, backup, fresh, store):
    restore(fresh, backup)
    package = os.path.join(store, IDS[1] + ".zip")
    appsync("send", fresh.path, IDS[1], package, "--restore")
    assert IDS[1] not in fresh.apps()
    for _ in range(3):
        process = appsync.start("send", fresh.path, IDS[0], os.path.join(store, IDS[0] + ".zip"), "--restore")
        time.sleep(0.005)
        process.kill()
        process.communicate()
    assert appsync.json("why", fresh.path, IDS[1])["waitsFor"]["what"] == "restore data"
    appsync("send", fresh.path, IDS[1], os.path.join(backup, "data", IDS[1] + ".zip"), "--restore", "--parts", "2")
    assert IDS[1] in fresh.apps()
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


def next_commands(text, place):
    """What a text says to do, with everything put in."""
    found = re.findall(r"\((appsync send [^)]*)\)", text)
    return [[place.get(word, word) for word in command.split()[1:]] for command in found]


@DIRECTLY
def test_a_sync_names_the_whole_way_to_a_restored_application_with_data(appsync, backup, fresh, store):
    restore(fresh, backup)
    place = {"DEVICE": fresh.path, "FILE": os.path.join(store, IDS[1] + ".zip"),
             "DATA": os.path.join(backup, "data", IDS[1] + ".zip")}

    def why_skipped():
        return {each["identifier"]: each["why"] for each in fresh.sync(store, expect=1)["skipped"]}[IDS[1]]

    package, data, both = next_commands(why_skipped(), place)
    told = appsync(*package).stdout
    assert "its package waits for its data" in told
    assert next_commands(told, place) == next_commands(why_skipped(), place) == [data, both]
    appsync(*data)
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


@DIRECTLY
def test_a_package_that_waits_can_use_the_data_that_the_restore_has_left(appsync, backup, fresh, store):
    restore(fresh, backup)
    place = {"DEVICE": fresh.path, "FILE": os.path.join(store, IDS[1] + ".zip")}
    told = appsync("send", fresh.path, IDS[1], place["FILE"], "--restore").stdout
    appsync(*next_commands(told, place)[-1])
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


@DIRECTLY
def test_data_is_not_sent_for_a_package_that_is_gone(appsync, backup, fresh, store):
    """A loss of power can take the package, and leave what says that it waits."""
    restore(fresh, backup)
    package = os.path.join(store, IDS[1] + ".zip")
    data = os.path.join(backup, "data", IDS[1] + ".zip")
    appsync("send", fresh.path, IDS[1], package, "--restore")
    os.remove(fresh.inside("/var/mobile/Media/PublicStaging/" + IDS[1] + ".zip"))
    result = appsync("send", fresh.path, IDS[1], data, "--restore", "--parts", "2", expect=1)
    assert "no package of " + IDS[1] + " waits for its data: send the package first" in result.stderr
    appsync("send", fresh.path, IDS[1], package, "--restore")
    appsync("send", fresh.path, IDS[1], data, "--restore", "--parts", "2")
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


@DIRECTLY
def test_damaged_data_is_not_sent(appsync, backup, fresh, store):
    restore(fresh, backup)
    appsync("send", fresh.path, IDS[1], os.path.join(store, IDS[1] + ".zip"), "--restore")
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    with open(archive, "r+b") as file:
        file.truncate(os.path.getsize(archive) // 2)
    appsync("send", fresh.path, IDS[1], archive, "--restore", "--parts", "2", expect=1)
    assert IDS[1] not in fresh.apps()


@DIRECTLY
def test_package_and_data_at_once(appsync, backup, fresh, store):
    restore(fresh, backup)
    appsync("send", fresh.path, IDS[1], os.path.join(store, IDS[1] + ".zip"), "--restore", "--parts", "3")
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


def test_without_parts_the_device_says_whether_a_package_waits(appsync, backup, fresh, store):
    """The backup holds data of one of the two."""
    restore(fresh, backup)
    for identifier in (IDS[0], IDS[1]):
        done = appsync("send", fresh.path, identifier, os.path.join(store, identifier + ".zip"), "--restore",
                       "--json", expect=None)
        assert done.returncode == (1 if fresh.is_coordinated else 0)
        if fresh.is_coordinated:
            assert "appsync store" in done.stderr
    if fresh.is_coordinated:
        assert sorted(appsync.json("store", fresh.path, store)["kept"]) == [IDS[0], IDS[1], IDS[4], IDS[5]]
        return
    assert list(fresh.apps()) == [IDS[0]]
    assert appsync.json("why", fresh.path, IDS[1])["waitsFor"]["what"] == "restore data"


def test_store_says_which_promises_it_cannot_keep(appsync, backup, fresh, store):
    if not fresh.is_coordinated:
        assert appsync.json("store", fresh.path, store) == {"kept": [], "failed": []}
        return
    restore(fresh, backup)
    os.remove(os.path.join(store, IDS[0] + ".zip"))
    packages.write_zip(os.path.join(store, IDS[1] + ".zip"), packages.entries("com.example.else"))
    result = appsync.json("store", fresh.path, store, expect=1)
    assert sorted(result["kept"]) == [IDS[4], IDS[5]]
    assert names_of(result["failed"]) == [IDS[0], IDS[1]]
    assert IDS[0] in fresh.placeholders()
    packages.make_package(store, IDS[0])
    assert appsync.json("store", fresh.path, store, expect=1)["kept"] == [IDS[0]]


def test_removing_a_restored_application_removes_the_data_that_waits(appsync, backup, fresh):
    restore(fresh, backup)
    waiting = fresh.inside("/var/mobile/Media/VessikRestore/Data")
    assert sorted(os.listdir(waiting)) == [IDS[1] + ".zip", IDS[2] + ".zip"]
    appsync("uninstall", fresh.path, IDS[1])
    assert os.listdir(waiting) == [IDS[2] + ".zip"]


# Backups that are not as they should be.


def test_check_names_every_fault(appsync, backup):
    with open(os.path.join(backup, "data", IDS[1] + ".zip"), "r+b") as file:
        file.seek(40)
        file.write(b"!")
    os.remove(os.path.join(backup, "data", IDS[2] + ".zip"))
    with open(os.path.join(backup, "IconOrder.plist"), "ab") as file:
        file.write(b"more")
    with open(os.path.join(backup, "stray"), "wb") as file:
        file.write(b"?")
    result = appsync.json("backup", "--check", backup, expect=1)
    assert [each["file"] for each in result["faults"]] == [
        "IconOrder.plist", "data/%s.zip" % IDS[1], "data/%s.zip" % IDS[2], "stray"]
    assert "bytes instead of" in result["faults"][0]["error"]
    assert result["faults"][1]["error"] == "its contents are altered"
    assert result["faults"][2]["error"] == "it is missing"


def test_altered_and_missing_archives_are_named_and_the_rest_is_restored(appsync, backup, fresh):
    with open(os.path.join(backup, "data", IDS[1] + ".zip"), "ab") as file:
        file.write(b"x")
    os.remove(os.path.join(backup, "data", IDS[2] + ".zip"))
    os.remove(os.path.join(backup, "DemotedApps.plist"))
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == ["DemotedApps.plist", IDS[1], IDS[2]]
    assert sorted(result["restored"]) == IDS and fresh.placeholders() == IDS
    assert not os.path.exists(fresh.inside("/var/mobile/Media/VessikRestore/Data"))


def test_backup_without_a_good_manifest_is_refused(appsync, backup, fresh):
    path = os.path.join(backup, "manifest.json")
    with open(path) as file:
        good = file.read()
    broken = [good[:-3], "", "[]", "{}", good.replace('"format": 1', '"format": 2'),
              good.replace("RestoreApplications.plist", "../../etc/passwd"),
              good.replace(IDS[1], "../evil"), "[" * 100_000, good.replace('"size": ', '"size": -')]
    for text in broken:
        with open(path, "w") as file:
            file.write(text)
        done = appsync("restore", fresh.path, backup, expect=3)
        assert done.stderr.startswith("appsync: ") and done.stderr.count("\n") == 1
        assert appsync("backup", "--check", backup, expect=1).stderr.count("\n") == 1
    os.remove(path)
    assert "cut off" in appsync("restore", fresh.path, backup, expect=3).stderr
    assert appsync.json("backup", "--check", backup, expect=1)["faults"][0]["file"] == "manifest.json"
    appsync("restore", fresh.path, backup + "-none", expect=3)
    appsync("backup", "--check", backup + "-none", expect=3)
    assert appsync.json("apps", fresh.path) == []


def test_altered_restore_information_is_refused(appsync, backup, fresh):
    with open(os.path.join(backup, "RestoreApplications.plist"), "ab") as file:
        file.write(b"x")
    done = appsync("restore", fresh.path, backup, expect=3)
    assert "RestoreApplications.plist is altered" in done.stderr
    assert appsync.json("apps", fresh.path) == []


@pytest.mark.parametrize("label", ["empty", "truncated", "not a list", "an array", "a deep array"])
def test_device_survives_restore_information_that_is_none(appsync, backup, fresh, label):
    path = os.path.join(backup, "RestoreApplications.plist")
    with open(path, "rb") as file:
        good = file.read()
    content = {"empty": b"", "truncated": good[: len(good) // 2], "not a list": b"\0" * 500,
               "an array": plistlib.dumps(IDS),
               "a deep array": b"<plist>" + b"<array>" * 5000 + b"</array>" * 5000 + b"</plist>"}[label]
    with open(path, "wb") as file:
        file.write(content)
    resign(backup)
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == IDS and result["restored"] == []
    with open(fresh.inside(PROCESSED_INFO), "rb") as file:
        assert file.read() == content
    assert appsync.json("apps", fresh.path) == []


def test_damaged_entries_fail_alone(appsync, backup, fresh):
    path = os.path.join(backup, "RestoreApplications.plist")
    with open(path, "rb") as file:
        info = plistlib.load(file)
    info[IDS[0]]["VessikMetadata"] = b"no property list"
    info[IDS[1]] = "no map"
    del info[IDS[2]]["VessikMetadata"]
    info[IDS[3]]["PlaceholderIcon"] = b"no picture"
    info[IDS[4]]["ApplicationSINF"] = b"\0\1\2"
    info["../evil"] = dict(info[IDS[5]])
    info["a" * 300] = dict(info[IDS[5]])
    with open(path, "wb") as file:
        plistlib.dump(info, file)
    resign(backup)
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == sorted(["../evil", "a" * 300, IDS[0], IDS[1], IDS[2]])
    assert fresh.placeholders() == [IDS[3], IDS[4], IDS[5]]
    appsync("screen", fresh.path, os.path.join(fresh.path, "screen.png"))
    again = os.path.join(os.path.dirname(backup), "again")
    appsync("backup", fresh.path, again)
    with open(os.path.join(again, "RestoreApplications.plist"), "rb") as file:
        assert plistlib.load(file)[IDS[4]]["ApplicationSINF"] == b"\0\1\2"


@ON_ONE_PATH
def test_backup_that_is_cut_off_is_never_taken_for_a_whole_one(appsync, used, fresh, tmp_path):
    write_data(used, IDS[0], {"big": random.Random(4).randbytes(4_000_000)})
    start = time.monotonic()
    appsync("backup", used.path, tmp_path / "whole")
    duration = time.monotonic() - start
    whole = cut = 0
    for attempt in range(8):
        folder = tmp_path / ("cut%d" % attempt)
        process = appsync.start("backup", used.path, folder)
        time.sleep(duration * attempt / 7)
        process.kill()
        process.communicate()
        if not folder.exists():
            continue
        if (folder / "manifest.json").exists():
            whole += 1
            appsync("backup", "--check", folder)
        else:
            cut += 1
            appsync("backup", "--check", folder, expect=1)
            appsync("restore", fresh.path, folder, expect=3)
    assert cut > 0
    assert appsync.json("apps", fresh.path) == []


@ON_ONE_PATH
def test_backup_that_fails_says_that_it_is_not_whole(appsync, used, tmp_path):
    """The disk of the backup is full before the end."""
    write_data(used, IDS[0], {"big": random.Random(4).randbytes(3_000_000)})
    os.mkdir(tmp_path / "disk")
    script = ("mount -t tmpfs -o size=1m tmpfs {0}/disk && {1} backup {2} {0}/disk/b; echo $?; "
              "{1} backup --check {0}/disk/b; echo $?").format(tmp_path, appsync.program, used.path)
    done = in_own_mounts(script)
    assert done.stdout.split() == ["1", "1"], done.stderr
    assert "is not whole" in done.stderr


# Many, and interrupted.


def make_backup(folder, count):
    """The backup of a device with so many applications, written without one. Their order."""
    (folder / "data").mkdir(parents=True)
    info, applications, files = {}, [], {}
    order = ["com.example.many%03d" % number for number in range(count)]
    random.Random(1).shuffle(order)
    for number, identifier in enumerate(order):
        metadata = {"title": "App %d" % number, "bundleVersion": "%d.0" % number}
        info[identifier] = {"VessikMetadata": plistlib.dumps(metadata),
                            "PlaceholderIcon": packages.png(8, 8, (number, 0, 0))}
        applications.append({"identifier": identifier, "version": "%d.0" % number,
                             "name": "App %d" % number, "data": number % 10 == 0})
        if number % 10 == 0:
            packages.write_zip(str(folder / "data" / (identifier + ".zip")), [("a", b"%d" % number)])
            files["data/%s.zip" % identifier] = {}
    for name, value in (("RestoreApplications.plist", info), ("IconOrder.plist", order),
                        ("DemotedApps.plist", {"AutomaticDowngrades": order[:3],
                                               "IntentionalDowngrades": order[3:5]})):
        with open(folder / name, "wb") as file:
            plistlib.dump(value, file, fmt=plistlib.FMT_BINARY)
        files[name] = {}
    with open(folder / "manifest.json", "w") as file:
        json.dump({"format": 1, "made": "2026-01-01T00:00:00Z", "applications": applications,
                   "files": files}, file)
    resign(str(folder))
    return order


def test_two_hundred_applications(fresh, tmp_path):
    order = make_backup(tmp_path / "many", 220)
    result = restore(fresh, tmp_path / "many")
    assert [each["identifier"] for each in result["screen"]] == order
    assert [each["name"] for each in result["screen"]] == ["App %d" % number for number in range(220)]
    assert len(fresh.placeholders()) == 220


def test_no_time_limit_is_waited_out(fresh, tmp_path):
    """A report that got lost would cost five seconds for each placeholder that is still awaited."""
    make_backup(tmp_path / "many", 10)
    restore(fresh, tmp_path / "many")
    with open(os.path.join(fresh.path, "log", "system.log")) as file:
        messages = [json.loads(line)["message"] for line in file]
    assert any(message.endswith("Finished waiting for placeholder installs") for message in messages)
    assert not any("Ignoring notification from TS" in message for message in messages)


def test_restore_killed_at_random_moments_and_run_again(appsync, tmp_path, coordination):
    folder = tmp_path / "several"
    make_backup(folder, 20)
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    start = time.monotonic()
    wanted = restore(fresh, folder)["screen"]
    duration = time.monotonic() - start
    types = {app["identifier"]: app["installType"] for app in appsync.json("apps", fresh.path)}
    choose = random.Random(11)
    interrupted = 0
    for attempt in range(20):
        device = Device(appsync, tmp_path / ("device%d" % attempt), coordination)
        process = appsync.start("restore", device.path, folder)
        time.sleep(choose.uniform(0, duration))
        process.kill()
        process.communicate()
        if process.returncode == 0:
            duration *= 0.8  # the machine is less busy than it was
        else:
            interrupted += 1
        assert restore(device, folder)["screen"] == wanted
        found = appsync.json("apps", device.path)
        assert {app["identifier"]: app["installType"] for app in found} == types
        assert os.listdir(device.inside(os.path.dirname(PROCESSED_INFO))) == ["RestoreApplications.plist"]
        assert not os.path.exists(device.inside(RESTORE_INFO))
        archives = "/var/mobile/Media/VessikRestore/Data"
        assert sorted(os.listdir(device.inside(archives))) == sorted(os.listdir(folder / "data"))
        shutil.rmtree(device.path)
    assert interrupted > 5


@ON_ONE_PATH
def test_install_of_a_restore_that_fails_leaves_its_placeholder_to_the_store(appsync, store, backup, tmp_path):
    device = Device(appsync, tmp_path / "coordinated", "on")
    restore(device, backup)
    before = device.placeholders()
    archive = pathlib.Path(device.inside("/var/mobile/Media/VessikRestore/Data")) / (IDS[1] + ".zip")
    whole = archive.read_bytes()
    archive.write_bytes(b"no archive")
    result = appsync.json("store", device.path, store, expect=1)
    assert [each["identifier"] for each in result["failed"]] == [IDS[1]]
    assert IDS[1] in device.placeholders() and IDS[1] not in device.apps()
    why = appsync.json("why", device.path, IDS[1])
    assert why["state"] == "placeholder" and why["waitsFor"]["what"] == "store" and why["lastError"]
    archive.write_bytes(whole)
    assert appsync.json("store", device.path, store) == {"kept": [IDS[1]], "failed": []}
    assert IDS[1] in device.apps() and set(device.placeholders()) < set(before)
    assert appsync.json("why", device.path, IDS[1])["lastError"] is None


def offload_system_application(appsync, device, store):
    """IDS[0], with data, of which the placeholder is left."""
    device.sync(store)
    write_data(device, IDS[0], {"notes": b"kept"})
    with sqlite3.connect(os.path.join(device.path, "device.db")) as database:
        database.execute("UPDATE applications SET type = 'System' WHERE identifier = ?", (IDS[0],))
    database.close()
    appsync("demote", device.path, IDS[0])
    assert IDS[0] in device.placeholders()


@pytest.mark.parametrize("coordination, way", [("off", "send"), ("on", "send"), ("on", "store")], indirect=["coordination"])
def test_offloaded_application_of_the_system_is_brought_back(appsync, device, store, way):
    offload_system_application(appsync, device, store)
    waits = appsync.json("why", device.path, IDS[0])["waitsFor"]
    assert waits["what"] == ("store" if device.is_coordinated else "transfer")
    appsync("sync", device.path, store, expect=None)
    assert IDS[0] in device.placeholders()  # the plug-in never asks for it
    if way == "send":
        sent = appsync.json("send", device.path, IDS[0], os.path.join(store, IDS[0] + ".zip"))
        assert sent["installed"] == [IDS[0]] and sent["failed"] == [] and sent["bytes"] > 0
    else:
        assert appsync.json("store", device.path, store) == {"kept": [IDS[0]], "failed": []}
    assert device.apps()[IDS[0]]["type"] == "System" and IDS[0] not in device.placeholders()
    assert appsync.json("why", device.path, IDS[0])["waitsFor"] is None
    assert pathlib.Path(device.inside(DATA), IDS[0], "notes").read_bytes() == b"kept"
    appsync("store", device.path, store)
    if device.is_coordinated:
        assert appsync.json("coordinator", device.path, "list") == []


@COORDINATED
@pytest.mark.parametrize("way", ["send", "store"])
def test_offloaded_application_of_the_system_is_left_to_another_client(appsync, device, store, way):
    offload_system_application(appsync, device, store)
    appsync("coordinator", device.path, "create", IDS[0], "--client", "2")
    before = appsync.json("coordinator", device.path, "list")
    if way == "send":
        package = os.path.join(store, IDS[0] + ".zip")
        sent = appsync.json("send", device.path, IDS[0], package, expect=1)
        assert [each["identifier"] for each in sent["skipped"]] == [IDS[0]] and "client 2" in sent["skipped"][0]["why"]
        assert sent["installed"] == [] and sent["bytes"] == 0
    else:
        served = appsync.json("store", device.path, store, expect=1)
        assert [each["identifier"] for each in served["failed"]] == [IDS[0]] and served["kept"] == []
        assert "client 2" in served["failed"][0]["error"]
    assert appsync.json("coordinator", device.path, "list") == before
    assert IDS[0] not in device.apps()


@COORDINATED
def test_store_leaves_offloaded_applications_of_the_system_where_policy_forbids_installing(appsync, device, store):
    offload_system_application(appsync, device, store)
    appsync("set", device.path, "installation=no")
    served = appsync.json("store", device.path, store, expect=1)
    assert [each["identifier"] for each in served["failed"]] == [IDS[0]] and served["kept"] == []
    assert "policy does not allow" in served["failed"][0]["error"]
    assert IDS[0] in device.placeholders() and appsync.json("coordinator", device.path, "list") == []
