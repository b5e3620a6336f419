"""Whole syncs of good libraries."""

import json
import os
import plistlib
import shutil

import packages
from conftest import names_of

IDS = ["com.example.app%02d" % number for number in range(5)]


def test_first_sync_installs_everything(device, library):
    result = device.sync(library)
    assert names_of(result["requested"]) == IDS
    assert names_of(result["installed"]) == IDS
    assert result["updated"] == [] and result["removed"] == []
    assert result["failed"] == [] and result["skipped"] == []
    assert result["bytes"] == sum(os.path.getsize(os.path.join(library, name)) for name in os.listdir(library))
    assert result["seconds"] >= 0
    assert device.versions() == dict.fromkeys(IDS, "1.0")
    assert device.placeholders() == []


def test_installed_bundle_holds_what_the_package_held(device, library):
    device.sync(library)
    container = device.container_of(IDS[0])
    for name, data in packages.entries(IDS[0]):
        with open(os.path.join(container, name), "rb") as file:
            assert file.read() == data


def test_second_sync_asks_for_nothing(device, library):
    device.sync(library)
    result = device.sync(library)
    assert result["requested"] == [] and result["installed"] == []
    assert result["bytes"] == 0


def test_update_replaces_the_old_version(device, library):
    device.sync(library)
    old = device.container_of(IDS[1])
    packages.make_package(library, IDS[1], "2.0")
    result = device.sync(library)
    assert names_of(result["updated"]) == [IDS[1]]
    assert result["installed"] == []
    assert device.versions()[IDS[1]] == "2.0"
    assert not os.path.exists(old)


def test_removal_by_name(device, library):
    device.sync(library)
    os.remove(os.path.join(library, IDS[2] + ".zip"))
    result = device.sync(library, "--remove", IDS[2])
    assert names_of(result["removed"]) == [IDS[2]]
    assert IDS[2] not in device.apps()


def test_without_mirror_what_the_library_lacks_stays(device, library):
    device.sync(library)
    os.remove(os.path.join(library, IDS[2] + ".zip"))
    assert device.sync(library)["removed"] == []
    assert IDS[2] in device.apps()


def test_mirror_removes_what_the_library_lacks(device, library):
    device.sync(library)
    os.remove(os.path.join(library, IDS[2] + ".zip"))
    os.remove(os.path.join(library, IDS[4] + ".zip"))
    assert names_of(device.sync(library, "--mirror")["removed"]) == [IDS[2], IDS[4]]
    assert sorted(device.apps()) == [IDS[0], IDS[1], IDS[3]]


def test_packages_travel_in_home_screen_order(device, library):
    order = [IDS[3], IDS[0], IDS[4], IDS[1], IDS[2]]
    with open(os.path.join(library, "IconOrder.plist"), "wb") as file:
        plistlib.dump(order, file)
    assert [item if isinstance(item, str) else item["identifier"]
            for item in device.sync(library)["requested"]] == order


def test_apps_json_says_all_there_is_to_know(appsync, device, library):
    device.sync(library)
    app = next(a for a in appsync.json("apps", device.path) if a["identifier"] == IDS[0])
    assert app["version"] == "1.0"
    assert app["name"] == "App00"
    assert app["state"] == "installed" and app["type"] == "User"
    assert app["bytes"] >= 512
    assert app["container"].startswith("/var/containers/Bundle/Application/")


def test_plan_says_what_a_sync_would_do_and_changes_nothing(appsync, device, library):
    device.sync(library)
    packages.make_package(library, IDS[0], "3.1")
    packages.make_package(library, "com.example.new", "1.0")
    before = device.tree()
    plan = appsync.json("plan", device.path, library, "--remove", "com.example.gone")
    assert names_of(plan["install"]) == ["com.example.new"]
    (update,) = plan["update"]
    assert (update["identifier"], update["oldVersion"], update["newVersion"]) == (IDS[0], "1.0", "3.1")
    assert plan["fits"] is True
    assert 0 < plan["bytes"] <= plan["needed"] <= plan["free"]
    assert device.tree() == before


def test_dry_run_prints_the_plan(appsync, device, library):
    plan = appsync.json("plan", device.path, library)
    dry = appsync.json("sync", device.path, library, "--dry-run")
    assert {key: dry[key] for key in ("install", "update", "remove", "bytes", "fits")} == {
        key: plan[key] for key in ("install", "update", "remove", "bytes", "fits")}
    assert device.apps() == {}


def test_json_lines_progress_never_goes_back(appsync, device, library):
    packages.make_package(library, "com.example.large", payload=os.urandom(6 << 20))
    lines = [json.loads(line) for line in
             appsync("sync", device.path, library, "--json-lines").stdout.splitlines()]
    seen = {}
    for event in lines[:-1]:
        assert "event" in event
        if "done" in event and event["done"] is not None:
            key = (event.get("identifier"), event.get("phase"))
            assert event["done"] >= seen.get(key, 0)
            assert event["done"] <= event["total"]
            seen[key] = event["done"]
    assert len([key for key in seen if key[0] == "com.example.large"]) >= 1
    assert names_of(lines[-1]["installed"]) == sorted(IDS + ["com.example.large"])


def test_sync_without_json_prints_lines_for_people(appsync, device, library):
    output = appsync("sync", device.path, library).stdout
    assert all(identifier in output for identifier in IDS)
    assert "\x1b" not in output and "\r" not in output


def test_empty_library_is_a_session_with_nothing_to_do(device, tmp_path):
    os.mkdir(tmp_path / "none")
    assert device.sync(tmp_path / "none")["requested"] == []


def test_library_that_is_not_there_cannot_be_used(appsync, device, tmp_path):
    done = appsync("sync", device.path, tmp_path / "absent", expect=3)
    assert len(done.stderr.strip().splitlines()) == 1 and "absent" in done.stderr


def test_unreadable_package_fails_and_the_others_are_installed(device, library):
    with open(os.path.join(library, "broken.zip"), "wb") as file:
        file.write(b"rubbish")
    result = device.sync(library, expect=1)
    assert len(result["failed"]) == 1 and "broken" in json.dumps(result["failed"])
    assert sorted(device.apps()) == IDS



def test_no_package_file_is_left_behind(device, library):
    device.sync(library)
    staging = device.inside("/var/mobile/Media/PublicStaging")
    assert [name for name in os.listdir(staging) if name.endswith(".zip")] == []


def test_last_sync_state_lists_the_user_applications(device, library):
    device.sync(library)
    path = device.inside("/var/mobile/Library/ApplicationSync/LastSyncAppState.plist")
    with open(path, "rb") as file:
        assert sorted(plistlib.load(file)) == IDS


def test_setuid_and_group_write_are_dropped(device, tmp_path):
    items = packages.entries("com.example.modes")
    items = [(packages.entry(name, 0o106777), data) for name, data in items]
    os.mkdir(tmp_path / "lib")
    packages.write_zip(str(tmp_path / "lib" / "modes.zip"), items)
    device.sync(tmp_path / "lib")
    for base, folders, files in os.walk(device.container_of("com.example.modes")):
        for name in folders + files:
            assert os.stat(os.path.join(base, name)).st_mode & 0o6022 == 0


def test_moved_device_works_as_before(appsync, device, library, tmp_path):
    device.sync(library)
    shutil.move(device.path, tmp_path / "elsewhere")
    device.path = str(tmp_path / "elsewhere")
    assert device.sync(library)["requested"] == []


def test_package_with_a_capital_suffix_counts(device, library):
    device.sync(library)
    os.rename(os.path.join(library, IDS[0] + ".zip"), os.path.join(library, "A.ZIP"))
    assert device.sync(library, "--mirror")["removed"] == []


def test_link_in_the_place_of_the_staging_area_is_cleared(device, library):
    staging = device.inside("/var/mobile/Media/PublicStaging")
    os.makedirs(staging, exist_ok=True)
    os.symlink("/nonexistent", os.path.join(staging, "ApplicationSync"))
    assert names_of(device.sync(library)["installed"]) == IDS


def test_application_named_like_a_file_of_the_staging_area_fails_alone(device, tmp_path):
    library = tmp_path / "named"
    library.mkdir()
    for identifier in ("com.example.good", "ApplicationsSync.plist", "DeskoraIconState.plist"):
        packages.make_package(str(library), identifier)
    (library / "IconOrder.plist").write_bytes(plistlib.dumps(["com.example.good"]))
    result = device.sync(str(library), expect=1)
    assert names_of(result["installed"]) == ["com.example.good"]
    assert len(result["failed"]) == 2
    assert all("another identifier" in failed["error"] for failed in result["failed"])
