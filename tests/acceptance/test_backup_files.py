"""What a backup says of the files that it leaves out, and what it keeps of those that it holds."""

import json
import os
import pathlib
import shutil
import subprocess
import tempfile
import zipfile

import pytest

from conftest import ON_ONE_PATH, Device

A, B = "com.example.app00", "com.example.app01"
DATA = "/var/mobile/Containers/Data/"


def write(device, identifier, name, text="text", when=None):
    path = os.path.join(device.inside(DATA + identifier), name)
    os.makedirs(os.path.dirname(path), exist_ok=True)
    with open(path, "w") as file:
        file.write(text)
    if when is not None:
        os.utime(path, (when, when))
    return path


def test_files_keep_the_time_of_their_last_change(appsync, device, library, tmp_path):
    device.sync(library)
    times = {"letter": 1_234_567_891, "Documents/deep/note": 1_700_000_001, "ancient": -86401}
    for name, when in times.items():
        write(device, A, name, when=when)
    appsync("backup", device.path, tmp_path / "backup")
    appsync("backup", "--check", tmp_path / "backup")
    other = Device(appsync, tmp_path / "other", device.coordination)
    appsync("restore", other.path, tmp_path / "backup")
    if device.is_coordinated:
        appsync("store", other.path, library)
    else:
        appsync("send", other.path, A, os.path.join(library, A + ".zip"), "--restore", "--parts", "1")
        appsync("send", other.path, A, tmp_path / "backup" / "data" / (A + ".zip"), "--restore", "--parts", "2")
    for name, when in times.items():
        assert os.stat(os.path.join(other.inside(DATA + A), name)).st_mtime == when, name


@ON_ONE_PATH
def test_other_archivers_see_the_times_too(appsync, device, library, tmp_path):
    device.sync(library)
    write(device, A, "letter", when=1_234_567_891)
    appsync("backup", device.path, tmp_path / "backup")
    with zipfile.ZipFile(tmp_path / "backup" / "data" / (A + ".zip")) as archive:
        extra = archive.getinfo("letter").extra
    assert extra == b"UT\5\0\1" + (1_234_567_891).to_bytes(4, "little")


@ON_ONE_PATH
def test_each_file_that_is_left_out_is_named(appsync, device, library, tmp_path):
    device.sync(library)
    write(device, A, "kept")
    for number in range(13):
        os.symlink("/etc", os.path.join(device.inside(DATA + A), "link%02d" % number))
    write(device, B, "kept")
    os.mkfifo(os.path.join(device.inside(DATA + B), "a pipe"))
    done = appsync("backup", device.path, tmp_path / "backup", "--json", expect=1)
    left = json.loads(done.stdout)["leftOut"]
    assert sorted((each["identifier"], each["file"]) for each in left) == [
        (A, "link%02d" % number) for number in range(13)] + [(B, "a pipe")]
    assert "a pipe' is a pipe" in done.stderr
    told = [line for line in done.stderr.splitlines() if A in line]
    assert len(told) == 11 and "3 more" in told[-1]
    assert "package" not in done.stderr


@pytest.fixture
def open_folder():
    """A folder that everybody may use."""
    folder = tempfile.mkdtemp(dir="/tmp")
    os.chmod(folder, 0o777)
    yield pathlib.Path(folder)
    shutil.rmtree(folder)


def as_nobody(*words):
    return subprocess.run(["setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", *map(str, words)],
                          capture_output=True, text=True)


@pytest.mark.skipif(os.geteuid() != 0, reason="needs somebody else to be")
def test_one_file_that_may_not_be_read_is_named_and_the_others_kept(appsync, library, open_folder):
    program = shutil.copy(appsync.program, open_folder)
    device = Device(appsync, open_folder / "device")
    device.sync(library)
    write(device, A, "kept")
    os.chmod(write(device, A, "secret"), 0)
    os.chmod(os.path.dirname(write(device, A, "closed/inside")), 0)
    subprocess.run(["chown", "-R", "65534:65534", device.path], check=True)
    done = as_nobody(program, "backup", device.path, open_folder / "backup", "--json")
    result = json.loads(done.stdout)
    assert done.returncode == 1 and result["data"] == [A]
    assert sorted(each["file"] for each in result["leftOut"]) == ["closed/", "secret"]
    assert "secret: Permission denied" in done.stderr
    with zipfile.ZipFile(open_folder / "backup" / "data" / (A + ".zip")) as archive:
        assert sorted(archive.namelist()) == ["closed/", "kept"]


@ON_ONE_PATH
def test_a_folder_that_is_no_backup_has_one_status(appsync, device, tmp_path):
    (tmp_path / "folder").mkdir()
    for command in (["backup", "--check", tmp_path / "folder"], ["restore", device.path, tmp_path / "folder"],
                    ["backup", "--check", tmp_path / "missing"], ["restore", device.path, tmp_path / "missing"],
                    ["backup", "--check", device.path], ["restore", device.path, device.path]):
        done = appsync(*command, "--json", expect=3)
        assert done.stderr.count("\n") == 1 and done.stdout == ""


@ON_ONE_PATH
def test_data_whose_application_is_gone_is_named(appsync, device, library, tmp_path):
    device.sync(library)
    write(device, A, "letter")
    appsync("demote", device.path, A)
    appsync("reset", device.path)
    done = appsync("backup", device.path, tmp_path / "backup", "--json", expect=1)
    (left,) = json.loads(done.stdout)["leftOut"]
    assert left["identifier"] == A and left["file"] is None and "appsync data pull" in left["error"]
    appsync("data", "pull", device.path, A, tmp_path / "kept.zip")
    assert zipfile.ZipFile(tmp_path / "kept.zip").namelist() == ["letter"]


def test_data_that_is_sent_replaces_that_of_an_application_only_when_it_is_said(appsync, library, tmp_path):
    device = Device(appsync, tmp_path / "direct", "off")
    device.sync(library)
    write(device, A, "precious")
    with zipfile.ZipFile(tmp_path / "data.zip", "w") as archive:
        archive.writestr("new", "text")
    package = os.path.join(library, A + ".zip")
    appsync("send", device.path, A, package, "--restore", "--parts", "1")
    sending = ("send", device.path, A, tmp_path / "data.zip", "--restore", "--parts", "2")
    refused = appsync(*sending, expect=1)
    assert "--yes" in refused.stderr and "has data" in refused.stderr
    assert os.listdir(device.inside(DATA + A)) == ["precious"]
    appsync(*sending, "--yes")
    assert os.listdir(device.inside(DATA + A)) == ["new"]
