"""Devices that cannot be used, and what the other commands say of those that can."""

import json
import os
import plistlib
import re
import sqlite3
import subprocess
import time

import pytest

import packages

COMMANDS = [["apps"], ["history"], ["inventory"], ["log"], ["why", "com.example.app00"], ["reset"],
            ["set", "installation=no"], ["run", "com.example.app00"]]


def one_line(done):
    assert len(done.stderr.strip().splitlines()) == 1, done.stderr
    assert "Traceback" not in done.stderr
    return done.stderr


@pytest.mark.parametrize("command", COMMANDS, ids=lambda c: c[0])
def test_missing_device(appsync, tmp_path, command):
    one_line(appsync(command[0], tmp_path / "none", *command[1:], expect=3))


@pytest.mark.parametrize("command", COMMANDS, ids=lambda c: c[0])
def test_folder_that_is_no_device(appsync, tmp_path, command):
    one_line(appsync(command[0], tmp_path, *command[1:], expect=3))
    assert os.listdir(tmp_path) == []


def test_create_refuses_what_exists(appsync, device):
    one_line(appsync("create", device.path, expect=3))
    device.apps()


def test_create_in_a_missing_folder(appsync, tmp_path):
    one_line(appsync("create", tmp_path / "a" / "b", expect=3))


def test_damaged_database(appsync, device, library):
    device.sync(library)
    path = os.path.join(device.path, "device.db")
    with open(path, "r+b") as file:
        file.write(os.urandom(8192))
    for name in ("device.db-wal", "device.db-shm"):
        if os.path.exists(os.path.join(device.path, name)):
            os.remove(os.path.join(device.path, name))
    for command in (["apps", device.path], ["sync", device.path, library]):
        one_line(appsync(*command, expect=3))


def test_database_that_is_gone(appsync, device, library):
    device.sync(library)
    os.remove(os.path.join(device.path, "device.db"))
    one_line(appsync("sync", device.path, library, expect=3))
    assert not os.path.exists(os.path.join(device.path, "device.db"))


def test_newer_schema(appsync, device, library):
    with sqlite3.connect(os.path.join(device.path, "device.db")) as database:
        database.execute("PRAGMA user_version = 9999")
    database.close()
    one_line(appsync("apps", device.path, expect=3))
    one_line(appsync("sync", device.path, library, expect=3))


def test_second_session_is_told_that_the_device_is_in_use(appsync, device, library):
    device.sync(library)
    packages.make_package(library, "com.example.app00", "2.0")
    appsync("run", device.path, "com.example.app00")
    first = appsync.start("sync", device.path, library)
    try:
        wait_until(lambda: json.loads(appsync("why", device.path, "com.example.app00", "--json").stdout)
                   .get("waitsFor"))
        one_line(appsync("sync", device.path, library, expect=3))
        device.apps()
    finally:
        first.kill()
        first.communicate()


def wait_until(condition, limit=60):
    end = time.monotonic() + limit
    while not condition():
        assert time.monotonic() < end, "it never came"
        time.sleep(0.05)


def test_running_application_holds_up_its_install_until_it_quits(appsync, device, library):
    device.sync(library)
    packages.make_package(library, "com.example.app00", "2.0")
    appsync("run", device.path, "com.example.app00")
    sync = appsync.start("sync", device.path, library, "--json-lines")
    events = []
    for line in sync.stdout:
        events.append(json.loads(line))
        if events[-1].get("nextTry"):
            break
    assert events[-1]["identifier"] == "com.example.app00"
    why = appsync.json("why", device.path, "com.example.app00")
    assert why["identifier"] == "com.example.app00"
    assert "com.example.app00" in json.dumps(why["waitsFor"])
    assert device.versions()["com.example.app00"] == "1.0"
    appsync("quit", device.path, "com.example.app00")
    output, _ = sync.communicate(timeout=90)
    assert sync.returncode == 0
    assert json.loads(output.splitlines()[-1])["updated"] == ["com.example.app00"]
    assert device.versions()["com.example.app00"] == "2.0"


def test_policy_against_installing(appsync, device, library):
    appsync("set", device.path, "installation=no")
    result = device.sync(library, expect=1)
    assert result["installed"] == [] and device.apps() == {}
    assert len(result["skipped"]) + len(result["failed"]) == 5
    appsync("set", device.path, "installation=unset")
    assert len(device.sync(library)["installed"]) == 5


def test_policy_against_removing(appsync, device, library):
    device.sync(library)
    appsync("set", device.path, "removal=no")
    result = device.sync(library, "--remove", "com.example.app00", expect=1)
    assert result["removed"] == [] and "com.example.app00" in device.apps()


@pytest.mark.parametrize("setting", ["installation=maybe", "nonsense=yes", "installation", "=", ""])
def test_wrong_setting(appsync, device, setting):
    one_line(appsync("set", device.path, setting, expect=2))


def test_uninstall_on_the_device_is_told_to_the_host_once(appsync, device, library):
    device.sync(library)
    appsync("uninstall", device.path, "com.example.app03")
    assert "com.example.app03" not in device.apps()
    assert appsync.json("inventory", device.path)["deleted"] == ["com.example.app03"]


def test_inventory(appsync, device, library):
    device.sync(library)
    inventory = appsync.json("inventory", device.path)
    assert inventory["deleted"] == []
    assert inventory["count"] == 5
    assert inventory["physicalSize"] == sum(a["bytes"] for a in device.apps().values())
    assert inventory["purgeableSize"] == 0
    assert inventory["accountIDs"] == ["account-1"]
    assert inventory["accounts"] == [
        {"accountID": "account-1", "personID": 7, "alternatePersonID": "alt-account-1"}]


def test_history(appsync, device, library):
    device.sync(library)
    history = appsync.json("history", device.path)
    assert {"time", "kind", "success", "identifier", "description"} <= set(history[0])
    told = [(h["scenario"], h["identifier"], h["description"]) for h in history if h["kind"] == "scenario"]
    if device.is_coordinated:
        # The plug-in puts up no placeholder and asks for no assertion itself; it notes its steps.
        steps = [(h["step"], h["phase"], h["success"], h["description"]) for h in history
                 if h["kind"] == "step" and h["identifier"] == "com.example.app00"]
        assert (3, 2, True, "Finished creating coordinator") in steps
        assert (4, 2, True, "Finished creating placeholder") in steps
        assert (1, 2, True, "Install app") in steps
    else:
        assert ("Install placeholder", "com.example.app00", "Installed placeholder") in told
        assert ("Asset install", "com.example.app00", "assertion not found") in told


def test_log_file_is_one_object_a_line(appsync, device, library):
    device.sync(library)
    with open(os.path.join(device.path, "log", "system.log")) as file:
        lines = [json.loads(line) for line in file]
    assert all({"time", "category", "level", "message", "format"} <= set(line) for line in lines)
    assert any(line["format"] == "%s|starting to reconcile sync with new anchor %{public}@"
               for line in lines)
    assert not any("%s|" in line["message"] for line in lines)


def test_log_filters(appsync, device, library):
    device.sync(library)
    everything = appsync("log", device.path).stdout.splitlines()
    some = appsync("log", device.path, "--category", "14").stdout.splitlines()
    assert 0 < len(some) < len(everything)
    assert len(appsync("log", device.path, "--level", "error").stdout.splitlines()) < len(everything)


def test_screen_is_a_picture(appsync, device, library, tmp_path):
    device.sync(library)
    appsync("screen", device.path, tmp_path / "screen.png")
    data = (tmp_path / "screen.png").read_bytes()
    assert data.startswith(b"\x89PNG") and len(data) > 1000


def test_reset_clears_sync_data_and_keeps_applications(appsync, device, library):
    device.sync(library)
    appsync("uninstall", device.path, "com.example.app01")
    appsync("reset", device.path)
    assert len(device.apps()) == 4
    assert not os.path.exists(device.inside("/var/mobile/Library/ApplicationSync"))
    assert appsync.json("inventory", device.path)["deleted"] == []


def test_demote_keeps_placeholder_and_data(appsync, device, library):
    device.sync(library)
    data = device.inside("/var/mobile/Containers/Data/com.example.app02")
    os.makedirs(data, exist_ok=True)
    with open(os.path.join(data, "file"), "w") as file:
        file.write("mine")
    appsync("demote", device.path, "com.example.app02")
    assert "com.example.app02" not in device.apps()
    assert device.placeholders() == ["com.example.app02"]
    with open(os.path.join(data, "file")) as file:
        assert file.read() == "mine"
    (app,) = [a for a in appsync.json("apps", device.path) if a["state"] == "placeholder"]
    assert app["installType"] == 8
    appsync("demote", device.path, "com.example.app03", "--by", "system")
    assert {a["installType"] for a in appsync.json("apps", device.path) if a["state"] == "placeholder"} == {7, 8}


def test_demoted_application_comes_back_by_send(appsync, device, library):
    device.sync(library)
    appsync("demote", device.path, "com.example.app02")
    if not device.is_coordinated:  # there the sync itself would bring it back
        result = device.sync(library, expect=1)
        assert "com.example.app02" in json.dumps(result["skipped"] + result["failed"])
    appsync("send", device.path, "com.example.app02", os.path.join(library, "com.example.app02.zip"))
    assert "com.example.app02" in device.apps() and device.placeholders() == []


def test_coordination_is_turned_on_and_off(appsync, device, library):
    other = "off" if device.is_coordinated else "on"
    device.sync(library)
    appsync("set", device.path, "coordination=" + other)
    packages.make_library(library, 5, "2.0")
    assert len(device.sync(library)["updated"]) == 5
    steps = [h for h in appsync.json("history", device.path) if h["kind"] == "step" and h["step"] == 3]
    assert {h["phase"] for h in steps} == {1, 2}
    appsync("set", device.path, "coordination=" + device.coordination)
    assert device.sync(library)["requested"] == []
    one_line(appsync("set", device.path, "coordination=perhaps", expect=2))
    one_line(appsync("create", device.path + "2", "--coordination", "perhaps", expect=2))


@pytest.mark.parametrize("arguments", [[], ["nonsense"], ["sync"], ["apps"], ["create"],
                                       ["apps", "x", "--what"], ["plist", "convert", "x", "--to", "json"]])
def test_wrong_usage(appsync, arguments):
    done = appsync(*arguments, expect=2)
    assert done.stderr.strip()


@pytest.mark.parametrize("command", ["create", "sync", "plan", "apps", "screen", "why", "inventory", "set",
                                     "run", "quit", "uninstall", "reset", "log", "history", "status", "coordinator",
                                     "demote", "store", "send", "package", "plist", "recording", "replay"])
def test_every_command_has_help(appsync, command):
    assert "sage" in appsync(command, "--help").stdout


def test_output_into_a_closed_pipe(appsync, device, library):
    device.sync(library)
    done = subprocess.run("%s log %s | head -1" % (appsync.program, device.path), shell=True,
                          capture_output=True, text=True, timeout=30)
    assert len(done.stdout.splitlines()) == 1


def test_stray_container_is_removed_when_the_device_is_opened(device, library):
    device.sync(library)
    stray = device.inside("/var/containers/Bundle/Application/0E1F2A3B-0000-4000-8000-000000000000")
    os.makedirs(os.path.join(stray, "X.app"))
    device.sync(library)
    assert not os.path.exists(stray)


def test_application_whose_container_is_gone_is_installed_again(device, library):
    import shutil

    device.sync(library)
    shutil.rmtree(device.container_of("com.example.app00"))
    device.sync(library, expect=None)
    result = device.sync(library)
    assert "com.example.app00" in device.apps()
    assert os.path.isdir(device.container_of("com.example.app00"))
    assert result["failed"] == []


def test_plist_show_and_convert(appsync, tmp_path):
    value = {"a": [1, -2, 2.5, True, b"\1\2", "é"], "big": 2**64 - 1, "small": -(2**63)}
    source = tmp_path / "value.plist"
    source.write_bytes(plistlib.dumps(value))
    appsync("plist", "convert", source, "--to", "binary", "--out", tmp_path / "b.plist")
    assert (tmp_path / "b.plist").read_bytes().startswith(b"bplist00")
    assert plistlib.loads((tmp_path / "b.plist").read_bytes()) == value
    appsync("plist", "convert", tmp_path / "b.plist", "--to", "xml", "--out", tmp_path / "x.plist")
    assert plistlib.loads((tmp_path / "x.plist").read_bytes()) == value
    assert "small" in appsync("plist", "show", tmp_path / "b.plist").stdout


@pytest.mark.parametrize("data", [b"", b"<plist><array>", b"bplist00", b"<array>" * 200 + b"</array>" * 200,
                                  b"<plist>" + b"<array>" * 100000],
                         ids=["empty", "cut", "short", "deep", "very-deep"])
def test_plist_that_cannot_be_read(appsync, tmp_path, data):
    (tmp_path / "bad.plist").write_bytes(data)
    done = appsync("plist", "show", tmp_path / "bad.plist", expect=None)
    assert done.returncode in (1, 3)
    assert "bad.plist" in one_line(done)


def test_entities_are_not_expanded(appsync, tmp_path):
    (tmp_path / "e.plist").write_bytes(
        b'<?xml version="1.0"?><!DOCTYPE plist [<!ENTITY x SYSTEM "file:///etc/passwd">]>'
        b"<plist><string>&x;</string></plist>")
    done = appsync("plist", "show", tmp_path / "e.plist", expect=None)
    assert "root:" not in done.stdout + done.stderr


def test_send_to_a_device_that_was_never_synced(appsync, device, library):
    appsync("send", device.path, "com.example.app00", os.path.join(library, "com.example.app00.zip"))
    assert sorted(device.apps()) == ["com.example.app00"]


def test_restore_in_two_parts_on_a_device_that_was_never_synced(appsync, device, library, tmp_path):
    (tmp_path / "data.bin").write_bytes(b"mine")
    package = os.path.join(library, "com.example.app00.zip")
    if device.is_coordinated:
        # The plug-in takes no restored package where the store brings them.
        one_line(appsync("send", device.path, "com.example.app00", package, "--restore", "--parts", "1",
                         expect=1))
        assert device.apps() == {} and device.placeholders() == []
        return
    appsync("send", device.path, "com.example.app00", package, "--restore", "--parts", "1")
    assert device.apps() == {}
    appsync("send", device.path, "com.example.app00", tmp_path / "data.bin", "--restore", "--parts", "2")
    assert sorted(device.apps()) == ["com.example.app00"]


def test_restored_package_of_an_application_without_data_is_installed_at_once(appsync, device, library):
    package = os.path.join(library, "com.example.app00.zip")
    appsync("send", device.path, "com.example.app00", package, "--restore")
    assert sorted(device.apps()) == ["com.example.app00"]
    assert appsync.json("why", device.path, "com.example.app00")["waitsFor"] is None


def test_output_that_cannot_be_written_is_a_failure(appsync, device, library):
    device.sync(library)
    done = subprocess.run([appsync.program, "apps", device.path], stdout=open("/dev/full", "w"),
                          stderr=subprocess.PIPE, text=True, timeout=30)
    assert done.returncode == 1 and len(done.stderr.strip().splitlines()) == 1


def test_log_folder_that_is_gone_is_made_again(device, library):
    import shutil

    shutil.rmtree(os.path.join(device.path, "log"), ignore_errors=True)
    device.sync(library)
    assert os.path.exists(os.path.join(device.path, "log", "system.log"))


LOOKING = (["apps"], ["why", "com.example.app00"], ["inventory"], ["history"])


def in_own_mounts(script):
    """Runs a shell script that may mount what only it sees."""
    if subprocess.run(["unshare", "-m", "true"], capture_output=True).returncode != 0:
        pytest.skip("this machine allows no mount namespace")
    return subprocess.run(["unshare", "-m", "sh", "-c", script], capture_output=True, text=True, timeout=60)


def look_at(appsync, path):
    lines = ["%s %s %s %s" % (appsync.program, look[0], path, " ".join(look[1:])) for look in LOOKING]
    return "; ".join(line + " >/dev/null; echo $?" for line in lines)


def test_a_full_disk_can_be_looked_at(appsync, tmp_path):
    script = ("mount -t tmpfs -o size=1m tmpfs {0} && {1} create {0}/d >/dev/null && "
              "{{ cat /dev/zero >{0}/filler; {2}; }} 2>&1").format(tmp_path, appsync.program, look_at(appsync, "%s/d" % tmp_path))
    done = in_own_mounts(script)
    # Nothing is installed, which `why` says.
    assert [line for line in done.stdout.splitlines() if line.isdigit()] == ["0", "1", "0", "0"], done.stdout


def test_uninstall_works_again_and_again_on_a_full_disk(appsync, tmp_path):
    """What it frees is not enough for a whole reserve, and others take it before the next one."""
    identifiers = packages.make_library(str(tmp_path / "library"), 6, payload=b"x" * 40_000)
    disk = tmp_path / "disk"
    disk.mkdir()
    steps = "; ".join(
        "cat /dev/zero >>{0}/filler 2>/dev/null; {1} uninstall {0}/d {2} 2>&1 >/dev/null; echo $?; {1} status {0}/d".format(
            disk, appsync.program, identifier) for identifier in identifiers)
    done = in_own_mounts("mount -t tmpfs -o size=16m tmpfs {0} && {1} create {0}/d >/dev/null && "
                         "{1} sync {0}/d {2} >/dev/null && {3}".format(disk, appsync.program, tmp_path / "library", steps))
    assert [line for line in done.stdout.splitlines() if line.isdigit()] == ["0"] * 6, done.stdout
    assert len(re.findall(r"and (9[6-9]|1[0-2][0-9])\.0 KiB kept back", done.stdout)) == 6, done.stdout


def test_a_read_only_device_can_be_looked_at_and_nothing_else(appsync, device, library, tmp_path):
    device.sync(library)
    looks = "; ".join([look_at(appsync, device.path), *(
        "%s %s >/dev/null; echo $?" % (appsync.program, look) for look in (
            "status %s" % device.path, "log %s" % device.path, "coordinator %s list" % device.path,
            "plan %s %s" % (device.path, library), "screen %s %s/screen.png" % (device.path, tmp_path)))])
    changes = "; ".join("%s %s 2>&1 >/dev/null; echo $?" % (appsync.program, change) for change in (
        "run %s com.example.app00" % device.path, "sync %s %s" % (device.path, library), "reset %s" % device.path))
    script = "mount --bind {0} {0} && mount -o remount,ro,bind {0} && {{ {1}; echo changes; {2}; }} 2>&1".format(
        device.path, looks, changes)
    done = in_own_mounts(script)
    looked, changed = done.stdout.split("changes\n")
    # The plug-in's messages of `inventory` go nowhere.
    assert [line for line in looked.splitlines() if "could not be written to the device's log" not in line] == [
        "0"] * 9, done.stdout
    told = changed.splitlines()
    assert told[1::2] == ["3"] * 3, done.stdout
    assert all("cannot be written" in line and "use a copy" in line for line in told[::2])


@pytest.mark.parametrize("table", ["applications", "placeholders", "settings", "uninstalled"])
def test_a_database_that_lacks_a_table_is_damaged(appsync, device, library, table):
    with sqlite3.connect(os.path.join(device.path, "device.db")) as database:
        database.execute("DROP TABLE " + table)
    database.close()
    done = appsync("sync", device.path, library, expect=3)
    assert "is damaged" in done.stderr
    assert done.stderr.count("\n") == 1


def test_every_command_calls_a_damaged_database_unusable(appsync, device, library):
    device.sync(library)
    path = os.path.join(device.path, "device.db")
    with sqlite3.connect(path) as database:
        database.execute("PRAGMA wal_checkpoint(TRUNCATE)")
    database.close()
    with open(path, "r+b") as file:
        file.seek(8192)
        file.write(os.urandom(16384))
    for command in ("uninstall", "run", "quit", "why"):
        one_line(appsync(command, device.path, "com.example.app00", expect=3))


PART = 16 << 20  # bytes of one part of the log
LINE = '{"time":"T","category":8,"level":"info","message":"%s","format":""}\n'


def log_path(device, suffix=""):
    return os.path.join(device.path, "log", "system.log" + suffix)


def fill_log(device, first="the first"):
    """Ends the log of a device just short of its limit."""
    with open(log_path(device), "w") as file:
        file.write(LINE % first)
        while file.tell() < PART - 200_000:
            file.write(LINE % ("x" * 100_000))
        file.write(LINE % ("y" * (PART - file.tell() - 200)))


def test_log_goes_on_in_a_second_part_and_both_are_shown(appsync, device, library):
    os.makedirs(os.path.dirname(log_path(device)), exist_ok=True)
    fill_log(device)
    device.sync(library)
    assert os.path.getsize(log_path(device, ".1")) <= PART
    assert os.path.getsize(log_path(device)) < 1 << 20
    shown = appsync("log", device.path).stdout.splitlines()
    assert shown[0].endswith("the first") and "y" * 50 in shown[-len(open(log_path(device)).readlines()) - 1]
    assert len(shown) == sum(len(open(log_path(device, part)).readlines()) for part in ("", ".1"))


def test_log_keeps_one_older_part(appsync, device, library):
    device.sync(library)
    with open(log_path(device, ".1"), "w") as file:
        file.write(LINE % "too old")
    fill_log(device)
    device.sync(library)
    shown = appsync("log", device.path).stdout.splitlines()
    assert shown[0].endswith("the first")
    assert sorted(os.listdir(os.path.dirname(log_path(device)))) == ["system.log", "system.log.1"]


def test_log_follows_to_the_next_part(appsync, device, library):
    device.sync(library)
    with open(log_path(device), "w") as first:
        first.write(LINE % "one")
        first.flush()
        following = appsync.start("log", device.path, "--follow")
        try:
            assert following.stdout.readline().rstrip().endswith("one")
            os.rename(log_path(device), log_path(device, ".1"))
            first.write(LINE % "two")  # by a process that has not noticed yet
            first.flush()
            assert following.stdout.readline().rstrip().endswith("two")
            with open(log_path(device), "w") as second:
                second.write(LINE % "three")
            assert following.stdout.readline().rstrip().endswith("three")
        finally:
            following.kill()
            following.communicate()


def test_log_of_many_commands_at_once_is_whole_over_its_parts(appsync, device, library):
    device.sync(library)
    os.unlink(log_path(device))
    appsync("inventory", device.path)
    with open(log_path(device)) as file:
        of_one = len(file.readlines())
    fill_log(device)
    with open(log_path(device)) as file:
        before = len(file.readlines())
    commands = [appsync.start("inventory", device.path) for _ in range(8)]
    for command in commands:
        command.communicate()
        assert command.returncode == 0
    records = [json.loads(line) for part in (".1", "") for line in open(log_path(device, part))]
    assert os.path.getsize(log_path(device)) < 1 << 20
    assert records[0]["message"] == "the first"
    assert of_one > 0 and len(records) == before + 8 * of_one


def test_log_that_cannot_be_written_stops_no_session_and_says_so(appsync, device, library):
    device.sync(library)
    os.unlink(log_path(device))
    os.mkdir(log_path(device, ".1"))  # nothing can be put aside
    fill_log(device)
    done = device.sync(library) and appsync("inventory", device.path)
    lost = [line for line in done.stderr.splitlines() if "could not be written to the device's log" in line]
    assert len(lost) == 1 and re.match(r"appsync: \d+ messages could not be .*: Is a directory", lost[0])
    assert os.path.getsize(log_path(device)) <= PART
    os.rmdir(log_path(device, ".1"))
    appsync("inventory", device.path)
    assert os.path.getsize(log_path(device, ".1")) > 1 << 20
