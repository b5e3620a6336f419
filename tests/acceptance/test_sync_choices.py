"""What a person chooses to sync, what a plan says of it, and what is told before the first transfer."""

import json
import os
import plistlib
import shutil

import pytest

import packages
from conftest import DIRECTLY, ON_ONE_PATH, names_of
from staging import install, remove, stage

A, B, C = "com.example.app00", "com.example.app01", "com.example.app02"


def events_of(appsync, *arguments, expect=0):
    lines = appsync("sync", *arguments, "--json-lines", expect=expect).stdout.splitlines()
    return [json.loads(line) for line in lines]


def test_only_the_chosen_applications_are_synced(device, library):
    assert device.sync(library, "--only", A, "--only", C)["installed"] == [A, C]
    packages.make_library(library, 5, "2.0")
    assert device.sync(library, "--only", C)["updated"] == [C]
    assert device.versions() == {A: "1.0", C: "2.0"}


def test_a_chosen_application_that_the_library_lacks_fails_by_name(appsync, device, library):
    plan = appsync.json("plan", device.path, library, "--only", "com.example.gone", "--only", A, expect=1)
    assert plan["install"] == [A] and names_of(plan["failed"]) == ["com.example.gone"]
    result = device.sync(library, "--only", "com.example.gone", "--only", A, expect=1)
    assert result["installed"] == [A] and names_of(result["failed"]) == ["com.example.gone"]
    assert list(device.apps()) == [A]


def test_what_is_not_chosen_keeps_its_place_on_the_home_screen(appsync, device, library):
    device.sync(library)

    def screen():
        device.sync(library)
        path = device.inside("/var/mobile/Library/ApplicationSync/AssetSortOrder.plist")
        with open(path, "rb") as file:
            return plistlib.load(file)

    before = screen()
    with open(os.path.join(library, "IconOrder.plist"), "wb") as file:
        plistlib.dump(before[::-1], file)
    packages.make_package(library, A, "2.0")
    device.sync(library, "--only", A)
    os.remove(os.path.join(library, "IconOrder.plist"))
    assert device.versions()[A] == "2.0" and screen() == before


def test_a_plan_marks_downgrades_and_describes_each_package(appsync, device, library):
    device.sync(library)
    old = packages.make_package(library, A, "0.9")
    new = packages.make_package(library, B, "1.10")
    packages.make_package(library, "com.example.new", "3.0")
    os.remove(os.path.join(library, C + ".zip"))
    plan = appsync.json("plan", device.path, library, "--mirror")
    assert {each["identifier"]: each["downgrade"] for each in plan["update"]} == {A: True, B: False}
    assert plan["install"] == ["com.example.new"]
    described = {each["identifier"]: each for each in plan["packages"]}
    assert {name: each["version"] for name, each in described.items()} == {
        A: "0.9", B: "1.10", "com.example.new": "3.0"}
    assert described[A]["file"] == old and described[B]["bytes"] == os.path.getsize(new)
    assert sum(each["bytes"] for each in plan["packages"]) == plan["bytes"]
    assert sum(each["bytes"] + each["unpackedBytes"] for each in plan["packages"]) == plan["needed"]
    text = appsync("plan", device.path, library, "--mirror").stdout
    assert "%s 1.0 -> 0.9" % A in text and text.count("a downgrade)") == 1
    assert "1 removal, 1 downgrade" in text


@pytest.mark.parametrize("option", ["--mirror", "--mirror=empty"])
def test_no_device_becomes_a_mirror_of_a_device_or_a_backup(appsync, device, library, tmp_path, option):
    device.sync(library)
    appsync("backup", device.path, tmp_path / "backup")
    for folder in (device.path, tmp_path / "backup"):
        for command in ("plan", "sync"):
            done = appsync(command, device.path, folder, option, expect=3)
            assert done.stdout == "" and len(done.stderr.splitlines()) == 1
    assert len(device.apps()) == 5


def test_a_mirror_of_an_empty_folder_is_asked_for_by_name(appsync, device, library, tmp_path):
    device.sync(library)
    (tmp_path / "none").mkdir()
    assert "--mirror=empty" in appsync("sync", "--mirror", device.path, tmp_path / "none", expect=3).stderr
    assert len(device.apps()) == 5
    assert len(device.sync(tmp_path / "none", "--mirror=empty")["removed"]) == 5
    assert device.apps() == {}


def test_what_comes_before_the_first_transfer_is_told(appsync, device, library):
    events = events_of(appsync, device.path, library)
    phases = [event.get("phase") for event in events]
    assert phases[0] == "prepare" and phases.count("prepare") == 2
    assert phases.index("transfer") > len(phases) - 1 - phases[::-1].index("prepare")
    begins, ends = (event for event in events if event.get("phase") == "prepare")
    assert (begins["event"], ends["event"], ends["state"]) == ("started", "ended", "finished")
    assert begins["identifier"] is None and begins["done"] == 0
    assert ends["done"] == ends["total"] == begins["total"] > 0


def test_a_large_library_is_told_of_while_it_is_prepared(appsync, device, tmp_path):
    library = str(tmp_path / "large")
    packages.make_library(library, 120)
    prepared = [event for event in events_of(appsync, device.path, library) if event.get("phase") == "prepare"]
    done = [event["done"] for event in prepared]
    assert len({event["total"] for event in prepared}) == 1
    assert done == sorted(done) and done[-1] == prepared[-1]["total"]
    assert 20 < len(prepared) <= 102
    # All three parts of it go on, not the reading alone.
    assert all(any(part / 3 < each / done[-1] < (part + 1) / 3 for each in done) for part in range(3))


@ON_ONE_PATH
def test_a_line_at_most_is_printed_of_the_preparation(appsync, device, library, tmp_path):
    assert "prepare" not in appsync("sync", device.path, library).stdout
    large = str(tmp_path / "large")
    packages.make_library(large, 120, prefix="com.example.large")
    assert "prepare" not in appsync("plan", device.path, large).stdout
    assert appsync("sync", device.path, large).stdout.count("prepare") == 1


@ON_ONE_PATH
def test_a_preparation_that_comes_to_nothing_has_failed(appsync, device, library, tmp_path):
    shutil.rmtree(library)
    os.mkdir(library)
    events = events_of(appsync, device.path, library, "--mirror", expect=3)
    assert [(event["phase"], event["state"]) for event in events] == [("prepare", "active"), ("prepare", "failed")]
    assert "holds no package" in events[-1]["error"]


def test_a_damaged_package_is_named_by_its_file(appsync, device, library):
    package = packages.make_package(library, "com.example.bad", file_name="some name.zip")
    packages.damage_contents(package, "Bad.app/Resources/data.bin")
    events = events_of(appsync, device.path, library, expect=1)
    (failed,) = events[-1]["failed"]
    assert failed["identifier"] == "com.example.bad"
    assert package in failed["error"] and "CRC" in failed["error"]
    assert "PublicStaging" not in json.dumps(events)
    (ended,) = (event for event in events if event.get("state") == "failed")
    assert ended["error"] == failed["error"]


def test_history_shows_the_installs_that_failed(appsync, device, library):
    package = packages.make_package(library, "com.example.bad")
    packages.damage_contents(package, "Bad.app/Resources/data.bin")
    device.sync(library, expect=1)
    (line,) = (line for line in appsync("history", device.path).stdout.splitlines() if "CRC" in line)
    assert "com.example.bad" in line and "its package: entry" in line
    # Where it lay on the device, nothing is any more.
    why = appsync("why", device.path, "com.example.bad").stdout
    assert "CRC" in why and "PublicStaging" not in why + line
    packages.make_package(library, "com.example.bad")
    device.sync(library)
    assert "CRC" not in appsync("history", device.path).stdout


def test_a_staged_removal_of_what_is_not_there_is_no_failure_anywhere(appsync, device, library):
    device.sync(library)
    stage(device, [remove("com.example.gone"), remove(A)])
    events = events_of(appsync, device.path, library, "--staged")
    assert names_of(events[-1]["skipped"]) == ["com.example.gone"] and events[-1]["failed"] == []
    assert [event for event in events if event.get("state") == "failed"] == []
    removals = [event for event in events if event.get("phase") == "remove"]
    assert [(event["identifier"], event["state"]) for event in removals] == [(A, "finished")]


@DIRECTLY
def test_an_install_after_a_removal_of_nothing_fails_for_its_own_reason(appsync, device, library):
    package = packages.make_package(library, "com.example.bad")
    packages.damage_contents(package, "Bad.app/Resources/data.bin")
    stage(device, [remove("com.example.bad"), install("com.example.bad")])
    (failed,) = device.sync(library, "--staged", expect=1)["failed"]
    assert "CRC" in failed["error"]
