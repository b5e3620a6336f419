"""Applications whose identifiers are as long as any may be, wherever an identifier goes.

Beside an identifier of 252 to 255 bytes no file name has room for ".zip" or ".app"."""

import os
import plistlib

import pytest

import packages
from conftest import DIRECTLY, Device, names_of
from staging import install, stage
from test_restore import DATA, data_of, tmp_path, write_data

LENGTHS = (250, 251, 252, 255)
LONG = sorted("x" * (length - 4) + ending for length in LENGTHS for ending in (".one", ".app", ".zip"))
EACH_LENGTH = LONG[2::3]  # those that end in ".zip"
TOO_LONG = "x" * 251 + ".more"


@pytest.fixture
def long_library(tmp_path):
    folder = str(tmp_path / "long")
    for number, identifier in enumerate(LONG):
        packages.make_package(folder, identifier, file_name="%d.zip" % number)
    return folder


def package_of(folder, identifier):
    return os.path.join(folder, "%d.zip" % LONG.index(identifier))


def icon_of(device, identifier):
    container = device.container_of(identifier)
    (bundle,) = [each for each in os.listdir(container) if each.endswith(".app")]
    with open(os.path.join(container, bundle, "Icon.png"), "rb") as file:
        return file.read()


def test_they_are_synced_updated_and_removed(appsync, device, long_library):
    assert sorted(device.sync(long_library)["installed"]) == LONG
    for number, identifier in enumerate(LONG):
        packages.make_package(long_library, identifier, "2.0", file_name="%d.zip" % number)
    assert sorted(device.sync(long_library)["updated"]) == LONG
    assert icon_of(device, LONG[-1]) == packages.png()
    removed = [option for identifier in LONG for option in ("--remove", identifier)]
    assert sorted(device.sync(long_library, *removed)["removed"]) == LONG
    assert appsync.json("apps", device.path) == []
    assert os.listdir(device.inside("/var/mobile/Media/PublicStaging")) == []


def test_they_are_staged(device, long_library):
    stage(device, [install(each) for each in LONG], side_files=LONG)
    assert sorted(device.sync(long_library, "--staged")["installed"]) == LONG
    assert device.placeholders() == []


def test_they_are_sent_run_and_uninstalled(appsync, device, long_library):
    for identifier in EACH_LENGTH:
        appsync("send", device.path, identifier, package_of(long_library, identifier))
    assert sorted(device.apps()) == EACH_LENGTH
    appsync("run", device.path, EACH_LENGTH[-1])
    appsync("quit", device.path, EACH_LENGTH[-1])
    for identifier in EACH_LENGTH:
        appsync("uninstall", device.path, identifier)
    assert appsync.json("apps", device.path) == []


def test_they_are_offloaded_and_come_back(appsync, device, long_library):
    device.sync(long_library)
    for identifier in LONG:
        appsync("demote", device.path, identifier)
    assert device.placeholders() == LONG
    for identifier in LONG:
        appsync("send", device.path, identifier, package_of(long_library, identifier))
    assert sorted(device.apps()) == LONG and device.placeholders() == []


def test_they_are_backed_up_and_restored_with_their_data(appsync, device, long_library, tmp_path, coordination):
    device.sync(long_library)
    for identifier in LONG:
        write_data(device, identifier, {"letter": identifier.encode()})
    backup = str(tmp_path / "backup")
    assert sorted(appsync.json("backup", device.path, backup)["data"]) == LONG
    assert appsync.json("backup", "--check", backup)["whole"]
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    result = appsync.json("restore", fresh.path, backup)
    assert sorted(result["restored"]) == LONG and result["failed"] == []
    assert fresh.placeholders() == LONG
    again = appsync.json("restore", fresh.path, backup)
    assert sorted(again["restored"]) == LONG and again["screen"] == result["screen"]
    if fresh.is_coordinated:
        assert sorted(appsync.json("store", fresh.path, long_library)["kept"]) == LONG
    else:
        for identifier in LONG:
            package = package_of(long_library, identifier)
            appsync("send", fresh.path, identifier, package, "--restore", "--parts", "3")
    assert sorted(fresh.apps()) == LONG and fresh.placeholders() == []
    for identifier in LONG:
        assert data_of(fresh, identifier) == {"letter": identifier.encode()}


@DIRECTLY  # where installs are coordinated the store brings restored packages
def test_restored_packages_wait_for_data_that_is_sent(appsync, device, long_library, tmp_path):
    (tmp_path / "mine").write_bytes(b"mine")
    for identifier in EACH_LENGTH:
        package = package_of(long_library, identifier)
        appsync("send", device.path, identifier, package, "--restore", "--parts", "1")
        assert identifier not in device.apps()
        appsync("send", device.path, identifier, tmp_path / "mine", "--restore", "--parts", "2")
        assert identifier in device.apps() and data_of(device, identifier) == {"mine": b"mine"}


def test_one_byte_more_is_refused_wherever_it_enters(appsync, device, tmp_path):
    limit = "1 to 255 letters, digits, '.', '-' and '_'"
    folder = str(tmp_path / "too long")
    package = packages.make_package(folder, TOO_LONG, file_name="p.zip")
    stderr = appsync("package", "show", package, expect=1).stderr
    assert limit in stderr and stderr.count("\n") == 1
    (failed,) = device.sync(folder, expect=1)["failed"]
    assert limit in failed["error"]
    stage(device, [install(TOO_LONG)])
    errors = [each["error"] for each in device.sync(folder, "--staged", expect=1)["failed"]
              if each["identifier"] == TOO_LONG]
    assert errors and all(limit in each for each in errors)
    assert limit in appsync("send", device.path, TOO_LONG, package, expect=2).stderr
    assert appsync.json("apps", device.path) == []


def test_a_restore_leaves_out_one_byte_more_and_says_why(appsync, device, long_library, tmp_path, coordination):
    from test_backup import change_info

    appsync("send", device.path, LONG[-1], package_of(long_library, LONG[-1]))
    backup = str(tmp_path / "backup")
    appsync("backup", device.path, backup)
    change_info(backup, lambda info: info.update({TOO_LONG: info[LONG[-1]]}))
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    result = appsync.json("restore", fresh.path, backup, expect=1)
    assert result["restored"] == [LONG[-1]] and names_of(result["failed"]) == [TOO_LONG]
    assert "1 to 255 letters" in result["failed"][0]["error"]
