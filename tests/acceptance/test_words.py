"""What commands say: JSON for each, one line for a change, one line for an error, whole lists."""

import json
import os
import pty
import re
import subprocess

import pytest

import packages
from conftest import COORDINATED, ON_ONE_PATH, Device
from processes import with_default_signals

A, B = "com.example.app00", "com.example.app01"


def one_line(text):
    assert text.count("\n") == 1 and text.endswith("\n"), text
    return text.rstrip("\n")


def on_a_terminal(appsync, *arguments, columns=80, locale="C.UTF-8"):
    """What the command writes to a terminal, and its status."""
    leader, follower = pty.openpty()
    environment = dict(os.environ, TERM="xterm", LC_ALL=locale)
    subprocess.run(["stty", "cols", str(columns), "rows", "40"], stdin=follower, check=True)
    process = subprocess.Popen([appsync.program, *map(str, arguments)], stdin=subprocess.DEVNULL, stdout=follower,
                               stderr=follower, env=environment, preexec_fn=with_default_signals)
    os.close(follower)
    written = b""
    try:
        while piece := os.read(leader, 65536):
            written += piece
    except OSError:  # nobody holds the other end any more
        pass
    os.close(leader)
    return written.decode().replace("\r\n", "\n"), process.wait()


# One object for every command that changes something.


@ON_ONE_PATH
def test_what_changes_a_device_says_so_in_one_line_or_one_object(appsync, device, library, tmp_path):
    device.sync(library)
    new = str(tmp_path / "new")
    assert appsync.json("create", new) == {"device": new, "coordination": "off"}
    assert appsync.json("create", new + "2", "--coordination", "on")["coordination"] == "on"
    for command, state, told, again in (("run", "running", "runs", "runs already"),
                                        ("quit", "not running", "does not run any more", "did not run")):
        assert appsync.json(command, device.path, A) == {"identifier": A, "state": state, "changed": True}
        assert appsync.json(command, device.path, A) == {"identifier": A, "state": state, "changed": False}
        assert one_line(appsync(command, device.path, A).stdout) == A + " " + again
        assert one_line(appsync(command, device.path, B).stdout) == B + " " + told
    assert appsync.json("demote", device.path, A) == {"identifier": A, "state": "offloaded", "changed": True}
    assert appsync.json("demote", device.path, A)["changed"] is False
    assert one_line(appsync("demote", device.path, A).stdout) == A + " is offloaded already"
    assert appsync.json("uninstall", device.path, B) == {"identifier": B, "state": "absent", "changed": True}
    appsync("uninstall", device.path, B, expect=1)
    assert appsync.json("reset", device.path)["device"] == device.path


@ON_ONE_PATH
def test_set_says_what_holds_now_and_whether_it_did_before(appsync, device):
    name = device.path
    assert one_line(appsync("set", name, "installation=no").stdout) == (
        name + " is set: installation=no removal=unset coordination=off")
    assert one_line(appsync("set", name, "installation=no").stdout) == (
        name + " was so already: installation=no removal=unset coordination=off")
    assert appsync.json("set", name, "removal=yes", "coordination=on") == {
        "installation": "no", "removal": "yes", "coordination": "on", "changed": True, "ends": [], "storeBrings": []}


@COORDINATED
def test_set_names_in_json_whose_coordinators_end(appsync, device):
    appsync("coordinator", device.path, "create", A)
    assert appsync.json("set", device.path, "coordination=off")["ends"] == [A]


@ON_ONE_PATH
def test_what_writes_a_file_says_whether_it_replaced_one(appsync, device, library, tmp_path):
    device.sync(library)
    plain = tmp_path / "in.plist"
    plain.write_text('<plist version="1.0"><array/></plist>')
    folder = tmp_path / "folder"
    for name, data in packages.entries("com.example.made"):
        (folder / name).parent.mkdir(parents=True, exist_ok=True)
        (folder / name).write_bytes(data)
    for number, words in enumerate((["screen", device.path, "{}"], ["plist", "convert", plain, "--to", "binary", "--out", "{}"],
                                    ["package", "make", folder, "{}"])):
        out = str(tmp_path / ("out%d" % number))
        words = [out if word == "{}" else word for word in words]
        assert one_line(appsync(*words).stdout).startswith(out + " is written: ")
        assert one_line(appsync(*words).stdout).startswith(out + " is replaced: ")
        assert appsync.json(*words)["replaced"] is True
        os.remove(out)
        told = appsync.json(*words)
        assert told["replaced"] is False and told["bytes"] == os.path.getsize(out)


def test_a_link_stays_and_what_it_leads_to_is_replaced(appsync, tmp_path):
    (tmp_path / "in.plist").write_text('<plist version="1.0"><array/></plist>')
    (tmp_path / "there").write_text("old")
    os.symlink("there", tmp_path / "link")
    convert = ["plist", "convert", tmp_path / "in.plist", "--to", "binary", "--out"]
    assert one_line(appsync(*convert, tmp_path / "link").stdout).startswith("%s is replaced" % (tmp_path / "link"))
    assert os.path.islink(tmp_path / "link") and (tmp_path / "there").read_bytes().startswith(b"bplist00")
    assert sorted(os.listdir(tmp_path)) == ["in.plist", "link", "there"]


# Errors.


@ON_ONE_PATH
@pytest.mark.parametrize("option", [[], ["--json"], ["--json-lines"]], ids=["text", "json", "lines"])
def test_each_failure_of_a_sync_is_one_line_on_standard_error(appsync, device, library, option):
    packages.damage_contents(os.path.join(library, A + ".zip"), "App00.app/Resources/data.bin")
    with open(os.path.join(library, "bad.zip"), "wb") as file:
        file.write(b"no archive")
    done = appsync("sync", device.path, library, *option, expect=1)
    lines = done.stderr.splitlines()
    assert sorted(line.split(": ")[1] for line in lines) == ["bad.zip", A], done.stderr
    if not option:
        assert "Failed 2: bad.zip %s\n" % A in done.stdout


@ON_ONE_PATH
def test_what_does_not_fit_is_told_once(appsync, device, tmp_path):
    path = tmp_path / "huge"
    path.write_bytes(b"")
    os.truncate(path, 1 << 42)
    for option in ([], ["--json"]):
        done = appsync("send", device.path, A, path, *option, expect=1)
        assert one_line(done.stderr).startswith("appsync: %s: it needs " % A)
        assert "it needs" not in done.stdout or option


@ON_ONE_PATH
def test_empty_values_can_be_seen(appsync, device, library, tmp_path):
    for words, status in ((["apps", ""], 3), (["sync", device.path, ""], 3), (["plist", "show", ""], 1),
                          (["package", "show", ""], 1), (["screen", device.path, ""], 1),
                          (["backup", "--check", ""], 2), (["restore", device.path, ""], 3),
                          (["store", device.path, ""], 3), (["send", device.path, A, ""], 1), (["help", ""], 2),
                          (["package", "make", "", tmp_path / "x"], 1)):
        told = one_line(appsync(*words, expect=status).stderr)
        assert "''" in told or "needs DEVICE and BACKUP" in told, (words, told)


@ON_ONE_PATH
def test_no_message_names_a_temporary_file(appsync, device, library, tmp_path):
    device.sync(library)
    folder = tmp_path / "folder"
    for name, data in packages.entries("com.example.made", payload=os.urandom(300_000)):
        (folder / name).parent.mkdir(parents=True, exist_ok=True)
        (folder / name).write_bytes(data)
    disk = tmp_path / "disk"
    disk.mkdir()
    script = 'mount -t tmpfs -o size=64k tmpfs "$1" && shift && exec "$@"'
    for words in (["package", "make", folder, disk / "out.zip"], ["screen", device.path, disk / "out.png"],
                  ["backup", device.path, disk / "backup"]):
        with open(device.inside("/var/mobile/tmp/filler"), "wb"):
            pass
        os.makedirs(device.inside("/var/mobile/Containers/Data/" + A), exist_ok=True)
        with open(device.inside("/var/mobile/Containers/Data/" + A) + "/big", "wb") as file:
            file.write(os.urandom(300_000))
        done = subprocess.run(["unshare", "-m", "sh", "-c", script, "sh", disk, appsync.program, *map(str, words)],
                              capture_output=True, text=True)
        if "unshare" in done.stderr or "mount" in done.stderr:
            pytest.skip("needs mounts of its own")
        if done.returncode == 0:
            continue  # a picture may be small
        told = one_line(done.stderr)
        assert str(disk / str(words[-1]).rsplit("/", 1)[-1]) in told, told
        assert not re.search(r"\.tmp\d|\.new\b|\.part\b|/proc/self", told), told


# Lists and tables.


def test_lists_are_whole_in_a_pipe_and_fit_a_terminal(appsync, tmp_path):
    device = Device(appsync, tmp_path / "device")
    library = str(tmp_path / "library")
    names = packages.make_library(library, 25, prefix="com.example.an-application-with-a-long-name")
    told = appsync("sync", device.path, library).stdout
    assert "Installed 25: %s\n" % " ".join(names) in told
    assert all(name in appsync("apps", device.path).stdout for name in names)
    for command in ("apps", "history"):
        shown, status = on_a_terminal(appsync, command, device.path)
        assert status == 0 and max(map(len, shown.splitlines())) <= 80, shown
        assert "\u2026" in shown
    appsync("reset", device.path)
    for name in names:
        appsync("uninstall", device.path, name)
    shown, _ = on_a_terminal(appsync, "sync", device.path, library)
    assert "Installed 25: " in shown and names[0] in shown and " ...\n" in shown


@COORDINATED
@pytest.mark.parametrize("columns", [20, 40])
@pytest.mark.parametrize("locale", ["C", "C.UTF-8"])
def test_tables_fit_a_narrow_terminal(appsync, device, library, columns, locale):
    packages.make_package(library, "com.example.an-application-with-a-long-name", name="A name that is long, too")
    device.sync(library)
    packages.make_package(library, A, "2.0")
    device.sync(library)
    appsync("run", device.path, A)
    appsync("coordinator", device.path, "create", B)
    os.makedirs(os.path.join(device.inside("/var/mobile/Containers/Data"), A, "a-folder-with-a-long-name"))
    cut = 0
    for command in (["apps", device.path], ["history", device.path], ["status", device.path],
                    ["coordinator", device.path, "list"], ["package", "list", library], ["data", "ls", device.path, A]):
        shown, status = on_a_terminal(appsync, *command, columns=columns, locale=locale)
        assert status == 0 and max(map(len, shown.splitlines())) <= columns, shown
        assert locale == "C.UTF-8" or shown.isascii()
        cut += shown.count("..." if locale == "C" else "\u2026")
    assert cut > 0
    # A name is told by its end.
    shown, _ = on_a_terminal(appsync, "apps", device.path, columns=columns, locale=locale)
    assert "IDE" in shown and "00  " in shown and "name  " in shown


@COORDINATED
def test_a_narrow_terminal_gets_all_of_the_status(appsync, device):
    whole = appsync("status", device.path).stdout
    for columns in (20, 40, 80):
        shown, _ = on_a_terminal(appsync, "status", device.path, columns=columns)
        assert shown.split() == whole.split()


@pytest.mark.parametrize("command", ["", "sync", "coordinator", "backup", "plist convert", "send", "stage"])
def test_help_fits_80_columns(appsync, command):
    assert max(map(len, appsync(*command.split(), "--help").stdout.splitlines())) < 80


@ON_ONE_PATH
def test_times_are_local_in_text_and_utc_in_json(appsync, device, library):
    device.sync(library)
    environment = dict(os.environ, TZ="XYZ-5:30")

    def said(*words):
        return subprocess.run([appsync.program, *words, device.path], env=environment, capture_output=True, text=True,
                              check=True).stdout

    for command in ("history", "log"):
        for line in said(command).splitlines()[1:]:
            assert re.match(r"\d{4}-\d\d-\d\d \d\d:\d\d:\d\d(\.\d+)? \+0530 ", line), line
    assert all(re.fullmatch(r"[\dT:-]{19}Z", each["time"]) for each in json.loads(said("history", "--json")))


def test_notes_name_the_version_of_each_package(appsync, device, tmp_path):
    library = str(tmp_path / "library")
    packages.make_package(library, A, "1.0", file_name="old.zip")
    packages.make_package(library, A, "2.0", file_name="new.zip")
    assert appsync.json("plan", device.path, library)["notes"] == [
        "%s/old.zip is left out: it holds %s 1.0, and %s/new.zip 2.0" % (library, A, library)]


# What a placeholder stands for, what a coordinator waits for.


def test_apps_tells_placeholders_apart(appsync, device, library, tmp_path):
    device.sync(library)
    assert {app["placeholder"] for app in appsync.json("apps", device.path)} == {None}
    appsync("demote", device.path, A)
    appsync("backup", device.path, tmp_path / "backup")
    kinds = {app["identifier"]: app["placeholder"] for app in appsync.json("apps", device.path)}
    assert kinds.pop(A) == "offloaded" and set(kinds.values()) == {None}
    assert re.search(r"^%s +1\.0 +App00 +offloaded " % re.escape(A), appsync("apps", device.path).stdout, re.MULTILINE)
    other = Device(appsync, tmp_path / "other", device.coordination)
    appsync("restore", other.path, tmp_path / "backup")
    kinds = {app["identifier"]: app["placeholder"] for app in appsync.json("apps", other.path)}
    assert kinds.pop(A) == ("offloaded" if device.is_coordinated else "restored")
    assert set(kinds.values()) == {"restored"}


def test_what_arrives_is_told_from_what_was_restored(appsync, device, library):
    device.sync(library)
    packages.make_package(library, A, "2.0")
    appsync("run", device.path, A)
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        event = json.loads(line)
        if event["event"] == "waiting":
            break
    assert event["waitsFor"] == {"what": "termination", "who": A, "nextTry": event["nextTry"], "promise": None}
    assert event["waitsFor"]["who"] == appsync.json("why", device.path, A)["waitsFor"]["who"]
    shown = {(app["state"], app["placeholder"]) for app in appsync.json("apps", device.path) if app["identifier"] == A}
    assert ("placeholder", "arriving") in shown


@COORDINATED
def test_a_coordinator_tells_its_state_in_json_too(appsync, device):
    created, = appsync.json("coordinator", device.path, "create", A)
    listed, = appsync.json("coordinator", device.path, "list")
    assert listed == created and "client 2" in listed["state"]
    assert listed["state"] in appsync("coordinator", device.path, "list").stdout


# Libraries.


@pytest.mark.parametrize("option", ["--json", "--json-lines"])
def test_programs_too_are_told_of_a_library_without_packages(appsync, device, tmp_path, option):
    (tmp_path / "none").mkdir()
    told = one_line(appsync("sync", device.path, tmp_path / "none", option).stderr)
    assert "none holds no package" in told and "none holds no package" in appsync("sync", device.path, tmp_path / "none").stdout


def test_a_package_counts_whatever_the_case_of_its_end(appsync, device, tmp_path):
    from staging import install, stage

    library = str(tmp_path / "library")
    packages.make_package(library, A, file_name="first.ZIP")
    assert device.sync(library)["installed"] == [A]
    # What the library cannot read, a staged sync sends under its name.
    with open(os.path.join(library, B + ".ZIP"), "wb") as file:
        file.write(b"no archive")
    stage(device, [install(B)], side_files=[B])
    failed, = [each for each in device.sync(library, "--staged", expect=1)["failed"] if each["identifier"] == B]
    assert "has no package" not in failed["error"]


def test_a_bundle_takes_its_neighbouring_metadata_along(appsync, tmp_path):
    folder = tmp_path / "folder"
    for name, data in packages.entries("com.example.made"):
        (folder / name).parent.mkdir(parents=True, exist_ok=True)
        (folder / name).write_bytes(data)
    (folder / "unrelated").write_text("stays here")
    assert appsync.json("package", "make", folder / "Made.app", tmp_path / "with.zip")["storeMetadata"] is True
    os.remove(folder / "VessikMetadata.plist")
    assert appsync.json("package", "make", folder / "Made.app", tmp_path / "without.zip")["storeMetadata"] is False
