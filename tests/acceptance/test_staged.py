"""Syncs from a staging area that somebody else left: --staged, with good and hostile todo lists."""

import os
import plistlib

import pytest

import packages
from conftest import ON_ONE_PATH, names_of
from staging import AREA, install, remove, stage

A, B = "com.example.app00", "com.example.app01"


def staged(device, library, expect=0):
    return device.sync(library, "--staged", expect=expect)


def test_no_staging_area_is_nothing_to_do(device, library):
    result = staged(device, library)
    assert result["requested"] == [] and result["failed"] == []


@pytest.mark.parametrize("fmt", [plistlib.FMT_XML, plistlib.FMT_BINARY])
def test_asked_for_is_sent_and_installed(device, library, fmt):
    stage(device, [install(A), install(B)], fmt, side_files=[A, B])
    assert names_of(staged(device, library)["installed"]) == [A, B]
    assert sorted(device.apps()) == [A, B]


def test_todo_list_ends_at_installed(device, library):
    stage(device, [install(A)], side_files=[A])
    staged(device, library)
    path = device.inside("/var/mobile/Library/ApplicationSync/VessikStuff/ApplicationsSync.plist")
    with open(path, "rb") as file:
        data = file.read()
    assert data.startswith(b"bplist00")
    assert [entry["operation"] for entry in plistlib.loads(data)] == ["INSTALLED"]


def test_removal_is_performed(device, library):
    device.sync(library)
    stage(device, [remove(A)])
    assert names_of(staged(device, library)["removed"]) == [A]
    assert A not in device.apps()


def test_package_missing_from_the_library_fails_by_name(device, library):
    stage(device, [install("com.example.absent"), install(A)], side_files=["com.example.absent", A])
    result = staged(device, library, expect=1)
    assert names_of(result["failed"]) == ["com.example.absent"]
    assert sorted(device.apps()) == [A]
    assert device.placeholders() == []


@pytest.mark.parametrize("todo", [b"", b"<plist", b"bplist00rubbish", b"\0" * 100,
                                  plistlib.dumps({"a": 1}), plistlib.dumps("text"),
                                  plistlib.dumps([install(A)], fmt=plistlib.FMT_BINARY)[:-9]],
                         ids=["empty", "cut", "rubbish", "zeros", "map", "string", "truncated"])
def test_unusable_todo_list_changes_nothing(device, library, todo):
    device.sync(library)
    before = device.versions()
    stage(device, todo)
    staged(device, library, expect=None)
    assert device.versions() == before


HOSTILE = ["", ".", "..", "/..", "a/../../b", "../../../../tmp/evil", "a/b", "a\nb", "x" * 300,
           "/etc", "a\\b", "\u00e9t\u00e9", "a b"]


@pytest.mark.parametrize("identifier", HOSTILE)
@pytest.mark.parametrize("operation", [install, remove])
def test_hostile_identifier_harms_nothing(device, library, identifier, operation):
    device.sync(library)
    before = device.versions()
    stage(device, [operation(identifier)])
    result = staged(device, library, expect=None)
    assert result["installed"] == [] and result["removed"] == []
    assert device.versions() == before


def test_hostile_identifiers_leave_the_good_entries_alone(device, library):
    stage(device, [install(name) for name in HOSTILE] + [install(A)], side_files=[A])
    staged(device, library, expect=1)
    assert sorted(device.apps()) == [A]


def test_identifier_with_nul(device, library):
    stage(device, plistlib.dumps([install(A + "\0x"), install(B)], fmt=plistlib.FMT_BINARY),
          side_files=[B])
    staged(device, library, expect=1)
    assert sorted(device.apps()) == [B]


@pytest.mark.parametrize("entry", ["text", 7, [], {}, {"identifier": 5, "operation": "install"},
                                   {"operation": "install"}, {"identifier": A}, True])
def test_entry_that_is_no_entry_is_passed_over(device, library, entry):
    stage(device, [entry, install(B)], side_files=[B])
    staged(device, library, expect=None)
    assert sorted(device.apps()) == [B]


def test_same_identifier_twice_is_installed_once(device, library):
    stage(device, [install(A), install(A)], side_files=[A])
    assert names_of(staged(device, library, expect=None)["installed"]) == [A]
    assert device.versions() == {A: "1.0"}


def test_remove_and_install_of_one_identifier(device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    stage(device, [remove(A), install(A, "2.0")], side_files=[A])
    staged(device, library, expect=None)
    assert device.versions()[A] == "2.0"


@ON_ONE_PATH
def test_two_hundred_thousand_entries_that_ask_for_nothing(device, library):
    todo = [{"identifier": "com.example.x%06d" % n, "operation": "INSTALLED"} for n in range(200_000)]
    stage(device, plistlib.dumps(todo + [install(A)], fmt=plistlib.FMT_BINARY), side_files=[A])
    staged(device, library)
    assert sorted(device.apps()) == [A]


@ON_ONE_PATH
def test_two_hundred_thousand_installs_are_refused_and_stay(device, library):
    device.sync(library)
    todo = [install("com.example.x%06d" % n) for n in range(200_000)]
    area = stage(device, plistlib.dumps(todo, fmt=plistlib.FMT_BINARY))
    result = staged(device, library, expect=1)
    assert "200000 installs" in result["failed"][0]["error"]
    assert os.path.exists(os.path.join(area, "ApplicationsSync.plist"))
    assert len(device.apps()) == 5 and device.placeholders() == []


def test_links_in_the_staging_area_lead_nowhere_outside(device, library, tmp_path):
    secret = tmp_path / "secret"
    secret.mkdir()
    (secret / "Info.plist").write_bytes(plistlib.dumps(packages.info(A, name="SECRET")))
    (secret / "keep").write_text("keep")
    area = stage(device, [install(A)])
    os.symlink(str(secret), os.path.join(area, A))
    staged(device, library, expect=None)
    assert sorted(os.listdir(secret)) == ["Info.plist", "keep"]
    with open(os.path.join(device.path, "log", "system.log")) as file:
        assert "SECRET" not in file.read()


def test_staging_area_that_is_a_link(device, library, tmp_path):
    outside = tmp_path / "outside"
    outside.mkdir()
    (outside / "ApplicationsSync.plist").write_bytes(plistlib.dumps([install(A)]))
    os.makedirs(os.path.dirname(device.inside(AREA)), exist_ok=True)
    os.symlink(str(outside), device.inside(AREA))
    staged(device, library, expect=None)
    assert os.listdir(outside) == ["ApplicationsSync.plist"]
    assert device.apps() == {}


def test_pipe_as_icon_does_not_block(device, library):
    area = stage(device, [install(A)])
    os.makedirs(os.path.join(area, A))
    for name in ("VessikArtwork", "Icon.png", "Info.plist", "VessikMetadata.plist"):
        os.mkfifo(os.path.join(area, A, name))
    staged(device, library)
    assert sorted(device.apps()) == [A]


def test_package_with_another_identifier_is_refused(device, tmp_path):
    folder = tmp_path / "lib"
    folder.mkdir()
    packages.write_zip(str(folder / (A + ".zip")), packages.entries("com.example.other"))
    stage(device, [install(A)], side_files=[A])
    staged(device, folder, expect=1)
    assert device.apps() == {}
