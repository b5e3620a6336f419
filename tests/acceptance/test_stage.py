"""What `stage` leaves on a device, and what docs/staging.md says of a staging area."""

import os
import pathlib
import plistlib
import re

import packages
from conftest import COORDINATED, ON_ONE_PATH, names_of
from staging import AREA, install, stage

A, B, C = "com.example.app00", "com.example.app01", "com.example.app02"
DOCUMENT = pathlib.Path(__file__).resolve().parents[2] / "docs" / "staging.md"


def listed(device):
    with open(os.path.join(device.inside(AREA), "ApplicationsSync.plist"), "rb") as file:
        return plistlib.load(file)


def test_a_staged_sync_does_what_was_staged(appsync, device, library):
    device.sync(library)
    packages.make_package(library, B, "2.0")
    packages.make_package(library, "com.example.new")
    with open(os.path.join(library, "IconOrder.plist"), "wb") as file:
        plistlib.dump([C, B], file)
    planned = appsync.json("plan", device.path, library, "--remove", A)
    staged = appsync.json("stage", device.path, library, "--remove", A)
    assert staged["area"] == AREA and not staged["replaced"]
    for key in ("install", "update", "remove", "skipped", "failed", "notes"):
        assert staged[key] == planned[key]
    assert [(entry["identifier"], entry["operation"]) for entry in listed(device)] == [
        (A, "remove"), ("com.example.new", "install"), (B, "install")]
    assert sorted(os.listdir(os.path.join(device.inside(AREA), B))) == [
        "Icon.png", "Info.plist", "VessikArtwork", "VessikMetadata.plist"]
    assert device.versions()[B] == "1.0" and A in device.apps()

    result = device.sync(library, "--staged")
    assert (names_of(result["installed"]), names_of(result["updated"]), result["removed"]) == (
        ["com.example.new"], [B], [A])
    assert not os.path.exists(device.inside(AREA))
    # A sync of the library alone would bring back what was removed, and has nothing else to do.
    assert device.sync(library)["requested"] == [A]


def test_a_mirror_is_staged(appsync, device, library, tmp_path):
    device.sync(library)
    packages.make_package(tmp_path / "less", A, "2.0")
    staged = appsync.json("stage", device.path, tmp_path / "less", "--mirror")
    assert sorted(staged["remove"]) == sorted(set(device.apps()) - {A})
    device.sync(tmp_path / "less", "--staged")
    assert device.versions() == {A: "2.0"}


def test_what_waits_is_replaced_only_by_force(appsync, device, library):
    stage(device, [install(A)], side_files=[A])
    before = listed(device)
    told = appsync("stage", device.path, library, expect=1).stderr
    assert "waits on the device already" in told and "--force" in told and told.count("\n") == 1
    assert listed(device) == before
    assert appsync.json("stage", device.path, library, "--force")["replaced"]
    assert len(listed(device)) == 5
    told = appsync("stage", device.path, library, expect=1).stderr
    assert "--force" in told
    told = appsync("sync", device.path, library).stderr
    assert "the staging area that waits on the device is given up" in told


def test_staging_takes_no_turn_while_a_session_is_under_way(appsync, device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if '"waiting"' in line:
            break
    appsync("stage", device.path, library, expect=3)
    appsync("stage", device.path, library, "--force", expect=3)
    assert not os.path.exists(device.inside(AREA))


def test_what_cannot_be_read_is_named_and_the_rest_is_staged(appsync, device, library):
    with open(os.path.join(library, "bad.zip"), "wb") as file:
        file.write(b"no archive")
    done = appsync("stage", device.path, library, expect=1)
    assert "bad.zip" in done.stderr and done.stderr.count("\n") == 1
    assert "staged on %s: 5 installs, 0 updates, 0 removals" % device.path in done.stdout
    assert len(listed(device)) == 5


@COORDINATED
def test_what_has_arrived_is_not_asked_for_again(appsync, device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if '"waiting"' in line:
            break
    sync.kill()
    sync.communicate()
    appsync("quit", device.path, A)
    assert names_of(appsync.json("stage", device.path, library)["update"]) == [A]
    result = device.sync(library, "--staged")
    assert result["bytes"] == 0 and device.versions()[A] == "2.0"


def documented_list():
    return re.search(r"```xml\n(.*?)```", DOCUMENT.read_text(), re.DOTALL)[1].encode()


def test_the_documented_list_works_as_it_stands(appsync, device, tmp_path):
    library = str(tmp_path / "library")
    packages.make_package(library, "com.example.diary")
    packages.make_package(library, "com.example.orbit", "1.0")
    device.sync(library)
    os.remove(os.path.join(library, "com.example.diary.zip"))
    packages.make_package(library, "com.example.orbit", "2.0")
    packages.make_package(library, "com.example.atlas")
    (tmp_path / "todo.plist").write_bytes(documented_list())
    os.makedirs(device.inside(AREA))
    appsync("plist", "convert", tmp_path / "todo.plist", "--to", "binary",
            "--out", os.path.join(device.inside(AREA), "ApplicationsSync.plist"))
    result = device.sync(library, "--staged")
    assert (result["installed"], result["updated"], result["removed"]) == (
        ["com.example.atlas"], ["com.example.orbit"], ["com.example.diary"])
    assert device.versions() == {"com.example.atlas": "1.0", "com.example.orbit": "2.0"}
    done = device.inside("/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist")
    with open(done, "rb") as file:
        operations = [entry["operation"] for entry in plistlib.load(file)]
    assert operations == ["remove", "INSTALLED", "INSTALLED"]


@ON_ONE_PATH
def test_the_names_of_the_area_are_those_that_are_documented(appsync, device, library):
    with open(os.path.join(library, "IconOrder.plist"), "wb") as file:
        plistlib.dump([A], file)
    appsync("stage", device.path, library)
    text = DOCUMENT.read_text()
    area = device.inside(AREA)
    for name in os.listdir(area):
        assert name in text or name.startswith("com.example."), name
    for name in set(os.listdir(os.path.join(area, A))) - {"Icon.png"}:
        assert name in text, name
    for key in {key for entry in listed(device) for key in entry}:
        assert "`%s`" % key in text


# What the area asks for, and what the library has when it is sent.


def sync_text(appsync, device, library, *options, expect=0):
    return appsync("sync", device.path, library, "--staged", *options, expect=expect)


def test_another_version_than_was_staged_is_told(appsync, device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    packages.make_package(library, B, "2.0")
    appsync("stage", device.path, library)
    packages.make_package(library, A, "3.0")
    note = "the library has other versions than the staging area asks for, which come: %s 3.0 instead of 2.0" % A
    assert note in appsync.json("plan", device.path, library, "--staged")["notes"]
    assert sync_text(appsync, device, library).stderr == "appsync: %s\n" % note
    assert (device.versions()[A], device.versions()[B]) == ("3.0", "2.0")


def test_a_staged_downgrade_whose_package_is_gone_has_failed(appsync, device, library, tmp_path):
    packages.make_package(library, A, "2.0")
    device.sync(library)
    older = str(tmp_path / "older")
    packages.make_package(older, A, "1.0")
    appsync("stage", device.path, older)
    planned = appsync.json("plan", device.path, library, "--staged", expect=1)
    result = device.sync(library, "--staged", expect=1)
    failed, = result["failed"]
    assert failed in planned["failed"] and planned["update"] == []
    assert failed["identifier"] == A and failed["error"].startswith(
        "the staging area asks for version 1.0, the library has 2.0, which is on the device already: ")
    assert result["updated"] == [] and result["bytes"] == 0 and device.versions()[A] == "2.0"
    appsync("stage", device.path, older)
    assert device.sync(older, "--staged")["updated"] == [A] and device.versions()[A] == "1.0"


def test_an_area_that_tells_no_version_takes_what_the_library_has(appsync, device, library):
    packages.make_package(library, A, "2.0")
    device.sync(library)
    area = stage(device, [install(A, "1.0"), install(B, "1.0")], side_files=[B])
    with open(os.path.join(area, B, "Info.plist"), "wb") as file:
        plistlib.dump({"BundleIdentifier": B}, file)
    assert sync_text(appsync, device, library).stderr == ""
    assert device.versions()[A] == "2.0"


def test_a_list_that_names_the_version_of_the_library_is_its_own_word(appsync, device, library):
    packages.make_package(library, A, "2.0")
    stage(device, [install(A, "2.0")], side_files=[A])  # its Info.plist is that of 1.0
    assert sync_text(appsync, device, library).stderr == ""
    assert device.versions()[A] == "2.0"


def test_a_staged_sync_without_an_area_says_that_there_is_none(appsync, device, library):
    for command in ("plan", "sync"):
        told = appsync(command, device.path, library, "--staged").stdout
        assert "no staging area waits on the device" in told and "Nothing to do." in told and "in step" not in told
    assert "no staging area waits" in sync_text(appsync, device, library, "--json").stderr
    stage(device, [])
    assert sync_text(appsync, device, library).stdout == "Nothing to do.\n"


# Policy.


def test_what_policy_forbids_stays_staged_and_is_told(appsync, device, library):
    appsync("set", device.path, "installation=no")
    told = appsync("stage", device.path, library).stderr
    assert told == ("appsync: as device policy is now, sync --staged skips 5 applications of these: allow that first "
                    "(appsync set DEVICE installation=yes)\n")
    before = listed(device)
    for _ in range(2):
        done = sync_text(appsync, device, library, expect=1)
        assert done.stdout.count("Skipped ") == 5
        assert "so it stays there: allow that (appsync set DEVICE installation=yes)" in done.stderr
        assert listed(device) == before
    appsync("set", device.path, "installation=yes")
    assert len(device.sync(library, "--staged")["installed"]) == 5


def test_a_session_that_uses_up_what_policy_forbids_says_so(appsync, device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("stage", device.path, library, "--remove", B)
    appsync("set", device.path, "installation=no")
    done = sync_text(appsync, device, library, expect=1)
    assert "device policy leaves 1 application of the staging area alone" in done.stderr
    assert "appsync set DEVICE installation=yes)" in done.stderr and "stage it again" in done.stderr
    assert B not in device.apps() and device.versions()[A] == "1.0"
    assert not os.path.exists(device.inside(AREA))
