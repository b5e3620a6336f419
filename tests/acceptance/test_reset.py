"""Forgetting what is kept for syncing takes no data along that cannot be had again."""

import os
import shutil

import pytest

IDS = ["com.example.app%02d" % number for number in range(5)]


def data_of(device, identifier):
    return device.inside("/var/mobile/Containers/Data/" + identifier)


def write_data(device, identifier):
    os.makedirs(data_of(device, identifier), exist_ok=True)
    with open(os.path.join(data_of(device, identifier), "notes"), "w") as file:
        file.write("mine")


def has_data(device, identifier):
    return os.path.exists(os.path.join(data_of(device, identifier), "notes"))


@pytest.fixture
def offloaded(appsync, device, library):
    """A device with two offloaded applications, one with data, and an installed one with data."""
    device.sync(library)
    for identifier in (IDS[0], IDS[2]):
        write_data(device, identifier)
    for identifier in IDS[:2]:
        appsync("demote", device.path, identifier)
    return device


def test_data_of_an_offloaded_application_stays_and_is_found_again(appsync, offloaded, library):
    done = appsync("reset", offloaded.path)
    assert offloaded.placeholders() == [] and sorted(offloaded.apps()) == IDS[2:]
    assert has_data(offloaded, IDS[0]) and has_data(offloaded, IDS[2])
    assert "The data of %s stays" % IDS[0] in done.stdout and IDS[1] not in done.stdout
    assert sorted(offloaded.sync(library)["installed"]) == IDS[:2]
    assert has_data(offloaded, IDS[0])
    assert "stays" not in appsync("reset", offloaded.path).stdout


def test_data_that_is_left_alone_can_be_removed(appsync, offloaded):
    appsync("reset", offloaded.path)
    appsync("uninstall", offloaded.path, IDS[0])
    assert not os.path.exists(data_of(offloaded, IDS[0]))
    assert "is not installed" in appsync("uninstall", offloaded.path, IDS[0], expect=1).stderr
    assert "is not installed" in appsync("uninstall", offloaded.path, IDS[1], expect=1).stderr
    assert appsync.json("inventory", offloaded.path)["deleted"] == []


def test_what_is_removed_by_name_takes_its_data_along(appsync, offloaded, library):
    offloaded.sync(library, "--remove", IDS[0], expect=None)
    appsync("uninstall", offloaded.path, IDS[2])
    assert not has_data(offloaded, IDS[0]) and not has_data(offloaded, IDS[2])


def test_data_that_a_restore_has_left_is_in_the_backup_still(appsync, device, library, tmp_path):
    device.sync(library)
    write_data(device, IDS[0])
    appsync("backup", device.path, tmp_path / "backup")
    appsync("uninstall", device.path, IDS[0])
    appsync("restore", device.path, tmp_path / "backup")
    done = appsync("reset", device.path)
    assert "stays" not in done.stdout and device.placeholders() == []
    shutil.rmtree(device.inside("/var/mobile/Library/ApplicationSync"), ignore_errors=True)
    assert appsync.json("restore", device.path, tmp_path / "backup")["restored"] == [IDS[0]]
