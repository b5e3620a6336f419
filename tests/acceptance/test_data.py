"""`data`: an application's data listed, copied out and replaced."""

import os
import plistlib
import pty
import shutil
import subprocess
import time
import zipfile

import pytest

import packages
from conftest import COORDINATED, DIRECTLY, ON_ONE_PATH, Device
from processes import with_default_signals
from test_device import in_own_mounts
from test_restore import DATA, data_of, write_data

ID = "com.example.app00"
FILES = {"Documents/letter.txt": b"Dear", "Library/deep/cache": bytes(70_000), "empty": b""}


@pytest.fixture
def used(device, library):
    device.sync(library)
    write_data(device, ID, FILES)
    return device


def complaint(done):
    assert done.stderr.startswith("appsync: ") and done.stderr.count("\n") == 1, done.stderr
    return done.stderr


def files_below(top):
    found = {}
    for base, _, names in os.walk(top):
        for name in names:
            with open(os.path.join(base, name), "rb") as file:
                found[os.path.relpath(os.path.join(base, name), top)] = file.read()
    return found


def with_files(folder, files):
    for name, content in files.items():
        path = folder / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(content)
    return folder


def nothing_is_left_beside(device):
    assert os.listdir(device.inside(DATA)) == [ID]
    assert not any("RestoredData/" in path for path in device.tree())


def test_ls_tells_names_sizes_and_times(appsync, used):
    os.utime(os.path.join(used.inside(DATA), ID, "empty"), (1_700_000_000, 1_700_000_000))
    listed = appsync.json("data", "ls", used.path, ID)
    assert (listed["identifier"], listed["files"], listed["bytes"]) == (ID, 3, 70_004)
    entries = {each["name"]: each for each in listed["entries"]}
    assert sorted(entries) == ["Documents", "Documents/letter.txt", "Library", "Library/deep", "Library/deep/cache",
                               "empty"]
    assert entries["Library"]["directory"] and not entries["empty"]["directory"]
    assert entries["Library/deep/cache"]["bytes"] == 70_000
    assert entries["empty"]["modified"] == "2023-11-14T22:13:20Z"
    text = appsync("data", "ls", used.path, ID).stdout
    assert "Documents/letter.txt" in text and "68.4 KiB" in text


@pytest.mark.parametrize("name", ["out", "out.zip", "out.ZIP"])
def test_what_was_pulled_is_pushed_back_whole(appsync, used, tmp_path, name):
    place = tmp_path / name
    os.utime(os.path.join(used.inside(DATA), ID, "empty"), (1_700_000_000, 1_700_000_000))
    pulled = appsync.json("data", "pull", used.path, ID, place)
    assert (pulled["files"], pulled["bytes"], pulled["leftOut"]) == (3, 70_004, [])
    if place.is_dir():
        assert files_below(place) == FILES
        assert (place / "empty").stat().st_mtime == 1_700_000_000
    assert sorted(os.listdir(tmp_path)) == ["device", "library", name]
    shutil.rmtree(os.path.join(used.inside(DATA), ID))
    write_data(used, ID, {"other": b"newer"})
    pushed = appsync.json("data", "push", used.path, ID, place, "--yes")
    assert (pushed["files"], pushed["bytes"], pushed["leftOut"]) == (3, 70_004, [])
    assert data_of(used, ID) == FILES
    assert os.path.getmtime(os.path.join(used.inside(DATA), ID, "empty")) == 1_700_000_000
    nothing_is_left_beside(used)
    assert used.apps()[ID]["version"] == "1.0"


@ON_ONE_PATH
def test_an_archive_that_was_pulled_is_one_of_a_backup(appsync, used, tmp_path):
    appsync("data", "pull", used.path, ID, tmp_path / "out.zip")
    appsync("backup", used.path, tmp_path / "backup")
    assert (tmp_path / "out.zip").read_bytes() == (tmp_path / "backup" / "data" / (ID + ".zip")).read_bytes()


@ON_ONE_PATH
def test_push_asks_before_data_is_lost(appsync, used, tmp_path):
    folder = with_files(tmp_path / "new", {"a": b"1"})
    told = complaint(appsync("data", "push", used.path, ID, folder, expect=1))
    assert "3 files" in told and "--yes" in told
    assert data_of(used, ID) == FILES
    shutil.rmtree(os.path.join(used.inside(DATA), ID))
    assert appsync("data", "push", used.path, ID, folder).stdout == ID + " has new data: 1 file, 1 byte\n"
    assert data_of(used, ID) == {"a": b"1"}


def answered(appsync, answer, *arguments):
    """Runs the command on a terminal and types an answer. Gives its status and what it showed."""
    leader, follower = pty.openpty()
    process = subprocess.Popen([appsync.program, *map(str, arguments)], stdin=follower, stdout=follower,
                               stderr=follower, preexec_fn=with_default_signals)
    os.close(follower)
    os.write(leader, answer)
    shown = b""
    while True:
        try:
            piece = os.read(leader, 4096)
        except OSError:
            break
        if not piece:
            break
        shown += piece
    os.close(leader)
    return process.wait(), shown.decode()


@ON_ONE_PATH
def test_push_takes_the_answer_of_a_person(appsync, used, tmp_path):
    folder = with_files(tmp_path / "new", {"a": b"1"})
    for answer in (b"n\n", b"\n", b"\x04"):
        status, shown = answered(appsync, answer, "data", "push", used.path, ID, folder)
        assert status == 1 and "Replace the data of " + ID in shown
        assert data_of(used, ID) == FILES
    status, shown = answered(appsync, b"y\n", "data", "push", used.path, ID, folder)
    assert status == 0 and data_of(used, ID) == {"a": b"1"}


def test_push_needs_the_application_at_rest_and_the_device_for_itself(appsync, used, tmp_path):
    folder = with_files(tmp_path / "new", {"a": b"1"})
    appsync("run", used.path, ID)
    assert "quit" in complaint(appsync("data", "push", used.path, ID, folder, "--yes", expect=1))
    newer = str(tmp_path / "newer")
    packages.make_library(newer, 5, "2.0")
    waiting = appsync.start("sync", used.path, newer)
    line = ""
    while "waiting" not in line:
        line = waiting.stdout.readline()
        assert line, "the sync ended"
    complaint(appsync("data", "push", used.path, "com.example.app01", folder, "--yes", expect=3))
    assert appsync.json("data", "ls", used.path, ID)["files"] == 3
    appsync("data", "pull", used.path, ID, tmp_path / "out")
    waiting.terminate()
    waiting.communicate()
    assert data_of(used, ID) == FILES


@ON_ONE_PATH
def test_data_of_what_the_device_does_not_know(appsync, used, tmp_path):
    folder = with_files(tmp_path / "new", {"a": b"1"})
    for command in (("ls",), ("pull", tmp_path / "out"), ("push", folder)):
        done = appsync("data", command[0], used.path, "com.example.nobody", *command[1:], expect=1)
        assert "com.example.nobody is not on the device" in complaint(done)
        complaint(appsync("data", command[0], tmp_path / "missing", ID, *command[1:], expect=3))
    assert not (tmp_path / "out").exists()
    assert os.listdir(used.inside(DATA)) == [ID]


@ON_ONE_PATH
def test_an_application_without_data(appsync, used, tmp_path):
    other = "com.example.app01"
    assert appsync("data", "ls", used.path, other).stdout == "No data.\n"
    assert not appsync.json("data", "ls", used.path, other)["waiting"]
    complaint(appsync("data", "pull", used.path, other, tmp_path / "out", expect=1))
    assert not (tmp_path / "out").exists()


@ON_ONE_PATH
def test_pull_takes_no_place_that_is_taken(appsync, used, tmp_path):
    (tmp_path / "file.zip").write_text("mine")
    (tmp_path / "folder").mkdir()
    os.symlink("nowhere", tmp_path / "link")
    (tmp_path / "cut.part").mkdir()
    (tmp_path / "cut.part" / "half").write_text("mine")
    places = [tmp_path / "file.zip", tmp_path / "folder", tmp_path / "link", tmp_path / "file.zip" / "x",
              tmp_path / "no" / "way", tmp_path / "cut", used.inside("/var/mobile/out"), os.path.join(used.path, "out.zip"), "", "/"]
    before = sorted(os.listdir(tmp_path)), used.tree()
    for place in places:
        complaint(appsync("data", "pull", used.path, ID, place, expect=1))
    assert (sorted(os.listdir(tmp_path)), used.tree()) == before
    assert (tmp_path / "file.zip").read_text() == (tmp_path / "cut.part" / "half").read_text() == "mine"


@ON_ONE_PATH
def test_nothing_is_written_into_the_device_from_inside_of_it(appsync, used, tmp_path):
    before = sorted(os.listdir(used.path))
    for arguments in (("data", "pull", ".", ID, "out"), ("data", "pull", ".", ID, "out.zip"), ("backup", ".", "out")):
        done = subprocess.run([appsync.program, *arguments], cwd=used.path, capture_output=True, text=True)
        assert done.returncode in (1, 3) and "lies in the device" in done.stderr
    assert sorted(os.listdir(used.path)) == before


@ON_ONE_PATH
def test_links_and_pipes_are_named_and_left_out(appsync, used, tmp_path):
    secret = tmp_path / "secret"
    secret.write_text("secret")
    foreign = with_files(tmp_path / "foreign", {"kept": b"1", "inner/kept": b"2"})
    os.symlink(secret, foreign / "link")
    os.symlink(tmp_path, foreign / "inner" / "linked")
    os.mkfifo(foreign / "pipe")
    done = appsync("data", "push", used.path, ID, foreign, "--yes", expect=1)
    assert done.stderr.count("\n") == 3
    for name in ("link", "inner/linked", "pipe"):
        assert name in done.stderr
    assert data_of(used, ID) == {"kept": b"1", "inner/kept": b"2"}
    inside = os.path.join(used.inside(DATA), ID)
    os.symlink(secret, os.path.join(inside, "link"))
    pulled = appsync.json("data", "pull", used.path, ID, tmp_path / "out", expect=1)
    assert [each["file"] for each in pulled["leftOut"]] == ["link"]
    assert files_below(tmp_path / "out") == {"kept": b"1", "inner/kept": b"2"}
    assert len(appsync.json("data", "ls", used.path, ID)["leftOut"]) == 1


@ON_ONE_PATH
def test_a_link_in_the_place_of_the_data_leads_nowhere_outside(appsync, used, tmp_path):
    outside = with_files(tmp_path / "outside", {"secret": b"x"})
    place = os.path.join(used.inside(DATA), ID)
    shutil.rmtree(place)
    os.symlink(outside, place)
    appsync("data", "pull", used.path, ID, tmp_path / "out", expect=1)
    assert not (tmp_path / "out").exists()
    folder = with_files(tmp_path / "new", {"a": b"1"})
    appsync("data", "push", used.path, ID, folder, "--yes")
    assert files_below(outside) == {"secret": b"x"}
    assert not os.path.islink(place) and data_of(used, ID) == {"a": b"1"}


def rubbish_archives(folder):
    folder.mkdir()
    yield "rubbish", b"this is no archive at all" * 10
    yield "empty", b""
    for label, items in {"parent": [("good", b"1"), ("../evil", b"x")],
                         "absolute": [("good", b"1"), ("/tmp/evil", b"x")],
                         "link": [("good", b"1"), (packages.entry("link", 0o120777), b"/etc/passwd")],
                         "file-as-directory": [("a", b"x"), ("a/b", b"y")]}.items():
        path = folder / label
        packages.write_zip(path, items)
        yield label, path.read_bytes()
    path = packages.write_zip(folder / "crc", [("a", b"first"), ("z", b"last" * 1000)])
    yield "crc", open(packages.damage_contents(path, "z"), "rb").read()
    yield "cut", path.read_bytes()[:-40]


@ON_ONE_PATH
def test_a_rubbish_archive_changes_nothing(appsync, used, tmp_path):
    for label, content in rubbish_archives(tmp_path / "rubbish"):
        archive = tmp_path / (label + ".zip")
        archive.write_bytes(content)
        assert label in complaint(appsync("data", "push", used.path, ID, archive, "--yes", expect=1))
        assert data_of(used, ID) == FILES
        nothing_is_left_beside(used)
    for place in (tmp_path / "missing", tmp_path / "missing.zip", "", "/dev/null"):
        complaint(appsync("data", "push", used.path, ID, place, "--yes", expect=1))
    assert data_of(used, ID) == FILES


def test_push_to_a_full_disk_keeps_what_is_there(appsync, tmp_path):
    """A disk of 8 MiB that the device lies on."""
    script = '''
set -e
cd %(here)s
mkdir disk new
mount -t tmpfs -o size=8m tmpfs disk
"$APPSYNC" create disk/device >/dev/null
"$APPSYNC" sync disk/device lib >/dev/null
mkdir -p disk/device/root%(data)s/%(id)s
echo old > disk/device/root%(data)s/%(id)s/kept
head -c 12000000 /dev/zero > new/large
set +e
"$APPSYNC" data push disk/device %(id)s new --yes
echo "status $?"
python3 -c "import zipfile; zipfile.ZipFile('new.zip', 'w', zipfile.ZIP_DEFLATED).write('new/large', 'large')"
"$APPSYNC" data push disk/device %(id)s new.zip --yes
echo "status $?"
cat disk/device/root%(data)s/%(id)s/kept
ls disk/device/root%(data)s/%(id)s disk/device/root/var/mobile/tmp/RestoredData
''' % {"data": DATA, "id": ID, "here": tmp_path}
    packages.make_library(str(tmp_path / "lib"), 1)
    done = in_own_mounts(script.replace('"$APPSYNC"', appsync.program))
    assert done.stdout.split() == ["status", "1", "status", "1", "old", "disk/device/root" + DATA + "/" + ID + ":",
                                   "kept", "disk/device/root/var/mobile/tmp/RestoredData:"], done
    assert done.stderr.count("free") == 2 and "new: cannot copy" in done.stderr


def test_what_does_not_fit_elsewhere_is_named_with_what_to_do(appsync, used, tmp_path):
    bundle = with_files(tmp_path / "source" / "Large.app", {"payload": os.urandom(3_000_000)})
    with open(used.inside(DATA + "/" + ID + "/large"), "wb") as file:
        file.write(os.urandom(3_000_000))
    info = plistlib.dumps({"BundleIdentifier": "com.example.large", "BundleVersion": "1"})
    (bundle / "Info.plist").write_bytes(info)
    script = """
cd %s && mkdir disk && mount -t tmpfs -o size=1m tmpfs disk
for words in "data pull %s %s disk/out.zip" "package make source disk/out.zip"; do
  "%s" $words; echo "status $?"; ls disk
done
""" % (tmp_path, used.path, ID, appsync.program)
    done = in_own_mounts(script)
    assert done.stdout.split() == ["status", "1", "status", "1"], done
    assert done.stderr.count("free space there, and run it again") == 2 and ".part" not in done.stderr, done.stderr


def test_a_restored_application_keeps_the_data_that_waits_for_it(appsync, used, tmp_path, coordination):
    appsync("backup", used.path, tmp_path / "backup")
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    appsync("restore", fresh.path, tmp_path / "backup")
    folder = with_files(tmp_path / "new", {"a": b"1"})
    told = complaint(appsync("data", "push", fresh.path, ID, folder, "--yes", expect=1))
    assert "install the application first" in told
    assert data_of(fresh, ID) == {}
    assert appsync.json("data", "ls", fresh.path, ID)["waiting"]
    assert "waits" in appsync("data", "ls", fresh.path, ID).stdout
    assert "comes with the install" in complaint(appsync("data", "pull", fresh.path, ID, tmp_path / "out", expect=1))


def test_an_offloaded_application_gets_new_data(appsync, used, library, tmp_path):
    appsync("demote", used.path, ID)
    folder = with_files(tmp_path / "new", {"a": b"1"})
    appsync("data", "push", used.path, ID, folder, "--yes")
    appsync("send", used.path, ID, os.path.join(library, ID + ".zip"))
    assert ID in used.apps() and data_of(used, ID) == {"a": b"1"}


@COORDINATED
def test_an_update_that_waits_does_not_mind_new_data(appsync, used, tmp_path):
    appsync("coordinator", used.path, "create", ID)
    folder = with_files(tmp_path / "new", {"a": b"1"})
    appsync("data", "push", used.path, ID, folder, "--yes")
    appsync("coordinator", used.path, "cancel", ID)
    assert data_of(used, ID) == {"a": b"1"} and used.apps()[ID]["version"] == "1.0"


@ON_ONE_PATH
def test_a_push_that_is_killed_leaves_the_old_data_or_the_new(appsync, used, tmp_path):
    new = {"file%03d" % number: bytes([number % 251]) * 20_000 for number in range(150)}
    folder = with_files(tmp_path / "new", new)
    start = time.monotonic()
    appsync("data", "push", used.path, ID, folder, "--yes")
    duration = time.monotonic() - start
    for attempt in range(8):
        appsync("data", "push", used.path, ID, with_files(tmp_path / "old", FILES), "--yes")
        process = appsync.start("data", "push", used.path, ID, folder, "--yes")
        time.sleep(duration * attempt / 7)
        process.kill()
        process.communicate()
        assert data_of(used, ID) in (FILES, new)
    appsync("data", "push", used.path, ID, folder, "--yes")
    assert data_of(used, ID) == new
    nothing_is_left_beside(used)
