"""`package list` and `package verify`: a folder of packages, looked at without a device."""

import os
import subprocess

import pytest

import packages
from test_packages import LABELS, hostile


def lines_of(text):
    return text.strip().splitlines()


def test_list_tells_each_package_of_a_folder(appsync, tmp_path):
    folder = tmp_path / "lib"
    first = packages.make_package(str(folder), "com.example.a", "1.5", "one.zip", name="First")
    packages.make_package(str(folder), "com.example.a", "2.0", "TWO.ZIP", name="First")
    (folder / "readme.txt").write_text("no package")
    (folder / ".hidden.zip").write_text("no package")
    listed = appsync.json("package", "list", folder)
    assert listed["failed"] == []
    assert [(each["file"], each["identifier"], each["version"], each["name"]) for each in listed["packages"]] == [
        ("TWO.ZIP", "com.example.a", "2.0", "First"), ("one.zip", "com.example.a", "1.5", "First")]
    assert listed["packages"][1]["bytes"] == os.path.getsize(first)
    text = lines_of(appsync("package", "list", folder).stdout)
    assert len(text) == 3 and text[0].split() == ["FILE", "IDENTIFIER", "VERSION", "NAME", "SIZE"]
    assert "one.zip" in text[2] and "1.5" in text[2]


def test_list_names_what_cannot_be_read_and_goes_on(appsync, tmp_path):
    folder = tmp_path / "lib"
    packages.make_package(str(folder), "com.example.z", file_name="z.zip")
    (folder / "bad.zip").write_text("rubbish")
    (folder / "folder.zip").mkdir()
    os.mkfifo(folder / "pipe.zip")
    os.symlink("nowhere", folder / "link.zip")
    done = appsync("package", "list", folder, expect=1)
    assert len(lines_of(done.stdout)) == 2 and "z.zip" in done.stdout
    assert len(lines_of(done.stderr)) == 4
    listed = appsync.json("package", "list", folder, expect=1)
    assert [each["file"] for each in listed["failed"]] == ["bad.zip", "folder.zip", "link.zip", "pipe.zip"]
    assert all(each["error"] for each in listed["failed"])


def test_list_of_what_is_no_folder_is_status_3_and_an_empty_one_is_none(appsync, tmp_path):
    (tmp_path / "file").write_text("x")
    for path in (tmp_path / "missing", tmp_path / "file", ""):
        done = appsync("package", "list", path, expect=3)
        assert done.stdout == "" and len(lines_of(done.stderr)) == 1
    (tmp_path / "empty").mkdir()
    assert appsync("package", "list", tmp_path / "empty").stdout == "No packages.\n"


@pytest.mark.parametrize("label", LABELS)
def test_verify_refuses_what_an_install_would(appsync, hostile, label):
    done = appsync("package", "verify", hostile[label], expect=1)
    assert len(lines_of(done.stderr)) == 1 and label + ".zip" in done.stderr
    assert done.stdout == "0 packages are good\n"


def test_verify_reads_the_contents_of_every_entry(appsync, tmp_path):
    folder = tmp_path / "lib"
    good = packages.make_package(str(folder), "com.example.good")
    bad = packages.damage_contents(packages.make_package(str(folder), "com.example.bad"), "Bad.app/main")
    appsync("package", "show", bad)
    appsync("package", "list", folder)
    assert appsync("package", "verify", good).stdout == "1 package is good\n"
    done = appsync("package", "verify", folder, good, expect=1)
    assert done.stdout == "2 packages are good\n"
    assert len(lines_of(done.stderr)) == 1 and "com.example.bad.zip" in done.stderr and "main" in done.stderr
    checked = appsync.json("package", "verify", folder, expect=1)
    assert [each["file"] for each in checked["packages"]] == [good]
    assert [each["file"] for each in checked["failed"]] == [bad]


def test_verify_names_a_layout_that_no_sync_could_use(appsync, tmp_path):
    folder = tmp_path / "lib"
    packages.make_package(str(folder), "com.example.good")
    (folder / "IconOrder.plist").write_text("rubbish")
    checked = appsync.json("package", "verify", folder, expect=1)
    assert [each["file"] for each in checked["failed"]] == [str(folder / "IconOrder.plist")]


def test_verify_names_what_is_not_there_or_holds_nothing(appsync, tmp_path):
    (tmp_path / "empty").mkdir()
    checked = appsync.json("package", "verify", tmp_path / "missing.zip", tmp_path / "empty", expect=1)
    assert checked["packages"] == []
    assert [each["file"] for each in checked["failed"]] == [str(tmp_path / "missing.zip"), str(tmp_path / "empty")]
    appsync("package", "verify", expect=2)


def test_verify_refuses_the_name_that_the_device_needs(appsync, tmp_path):
    package = packages.make_package(str(tmp_path), "DeskoraIconState.plist")
    assert "another identifier" in appsync("package", "verify", package, expect=1).stderr
    assert "another identifier" in appsync("package", "list", tmp_path, expect=1).stderr


@pytest.mark.plain_build
def test_memory_of_verify_does_not_grow_with_the_package(appsync, tmp_path):
    path = packages.make_package(str(tmp_path), "com.example.large", payload=os.urandom(96 << 20))
    script = ("import resource,subprocess,sys\n"
              "r=subprocess.run(sys.argv[1:],stdout=subprocess.DEVNULL)\n"
              "print(r.returncode,resource.getrusage(resource.RUSAGE_CHILDREN).ru_maxrss)")
    out = subprocess.run(["/usr/bin/python3", "-c", script, appsync.program, "package", "verify", path],
                         capture_output=True, text=True, check=True).stdout
    status, kilobytes = map(int, out.split())
    assert status == 0
    assert kilobytes < 64 * 1024
