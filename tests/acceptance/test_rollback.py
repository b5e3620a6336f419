"""What the last update of an application has replaced comes back."""

import json
import os
import re
import shutil

import pytest

import packages
from conftest import COORDINATED, ON_ONE_PATH, Device
from test_device import in_own_mounts

A, B = "com.example.orbit", "com.example.atlas"
BUNDLE = "Orbit.app"


@pytest.fixture
def libraries(tmp_path):
    """A library with the versions before, and one with those of today."""
    old, new = str(tmp_path / "old"), str(tmp_path / "new")
    for folder, version in ((old, "1.9"), (new, "2.0")):
        packages.make_package(folder, A, version, payload=b"program of " + version.encode())
        packages.make_package(folder, B, "1.0")
    return old, new


@pytest.fixture
def updated(device, libraries):
    for library in libraries:
        device.sync(library)
    return device


def program(device):
    with open(os.path.join(device.container_of(A), BUNDLE, "Resources/data.bin"), "rb") as file:
        return file.read()


def kept(device, identifier=A):
    return device.apps()[identifier]["kept"]


def kept_folders(device):
    folder = os.path.join(device.path, "kept")
    return os.listdir(folder) if os.path.isdir(folder) else []


def containers(device):
    return os.listdir(device.inside("/var/containers/Bundle/Application"))


def test_an_update_is_undone_and_done_again(appsync, updated, libraries):
    said = appsync("rollback", updated.path, A).stdout
    assert said == (A + " is rolled back from 2.0 to 1.9; its data stays as it is, and a sync of a library with 2.0 "
                    "updates it again\n")
    assert updated.versions() == {A: "1.9", B: "1.0"} and program(updated) == b"program of 1.9"
    assert kept(updated)["version"] == "2.0"
    plan = appsync.json("plan", updated.path, libraries[1])
    assert [(each["identifier"], each["oldVersion"], each["newVersion"]) for each in plan["update"]] == [(A, "1.9", "2.0")]
    assert updated.sync(libraries[1])["updated"] == [A]
    assert program(updated) == b"program of 2.0" and kept(updated)["version"] == "1.9"


def test_a_rollback_is_undone_by_a_second_one(appsync, updated):
    assert appsync.json("rollback", updated.path, A) == {
        "identifier": A, "state": "rolled back", "changed": True, "oldVersion": "2.0", "newVersion": "1.9"}
    assert appsync.json("rollback", updated.path, A)["newVersion"] == "2.0"
    assert program(updated) == b"program of 2.0"
    assert len(containers(updated)) == 2 and len(kept_folders(updated)) == 1


def test_what_is_kept_is_told(appsync, updated):
    apps = updated.apps()
    assert apps[B]["kept"] is None
    assert apps[A]["kept"]["version"] == "1.9" and apps[A]["kept"]["bytes"] > 0
    lines = appsync("apps", updated.path).stdout.splitlines()
    assert lines[0].endswith("KEPT") and any(line.startswith(A) and line.endswith("1.9") for line in lines)
    status = appsync.json("status", updated.path)
    assert (status["kept"], status["keptBytes"]) == (1, apps[A]["kept"]["bytes"])
    assert "kept versions: 1, " in appsync("status", updated.path).stdout


def test_nothing_is_said_where_nothing_is_kept(appsync, device, libraries):
    device.sync(libraries[0])
    assert "KEPT" not in appsync("apps", device.path).stdout
    assert "kept versions" not in appsync("status", device.path).stdout
    done = appsync("rollback", device.path, A, expect=1)
    assert done.stdout == "" and "no earlier version of " + A + " is kept" in done.stderr
    assert "is not installed" in appsync("rollback", device.path, "com.example.nobody", expect=1).stderr
    appsync("rollback", device.path, "../up", expect=2)


def test_the_data_stays_and_the_rest_tells_the_truth(appsync, updated, tmp_path):
    data = updated.inside("/var/mobile/Containers/Data/" + A)
    os.makedirs(data, exist_ok=True)
    with open(os.path.join(data, "notes"), "w") as file:
        file.write("written with 2.0")
    before = appsync.json("inventory", updated.path)
    appsync("rollback", updated.path, A)
    with open(os.path.join(data, "notes")) as file:
        assert file.read() == "written with 2.0"
    assert appsync.json("inventory", updated.path) == before  # both versions are as large
    assert appsync.json("why", updated.path, A)["state"] == "installed"
    last = appsync.json("history", updated.path, "--app", A)[-1]
    assert (last["scenario"], last["success"], last["description"]) == ("Rollback", True, "Rolled back from 2.0 to 1.9")
    appsync("screen", updated.path, tmp_path / "screen.png")


def test_an_application_that_runs_is_not_rolled_back(appsync, updated):
    appsync("run", updated.path, A)
    assert "is running; quit it" in appsync("rollback", updated.path, A, expect=1).stderr
    assert updated.versions()[A] == "2.0"
    appsync("quit", updated.path, A)
    appsync("rollback", updated.path, A)


def test_a_session_has_the_device_for_itself(appsync, updated, libraries):
    packages.make_package(libraries[1], B, "2.0")
    appsync("run", updated.path, B)
    process = appsync.start("sync", updated.path, libraries[1])
    for line in process.stdout:
        if "waiting" in line:
            break
    assert "in use" in appsync("rollback", updated.path, A, expect=3).stderr
    appsync("quit", updated.path, B)
    assert process.wait(60) == 0


@pytest.mark.parametrize("words", [["uninstall"], ["demote"]])
def test_what_is_kept_goes_with_the_application(appsync, updated, words):
    appsync(*words, updated.path, A)
    assert kept_folders(updated) == []
    assert appsync.json("status", updated.path)["kept"] == 0


def test_a_sync_that_removes_the_application_takes_what_is_kept(updated, libraries):
    updated.sync(libraries[1], "--remove", A)
    assert kept_folders(updated) == [] and len(containers(updated)) == 1


def test_an_interrupted_update_is_finished_before_another_is_undone(appsync, updated, libraries):
    packages.make_package(libraries[1], A, "3.0")
    appsync("run", updated.path, A)
    process = appsync.start("sync", updated.path, libraries[1])
    for line in process.stdout:
        if "waiting" in line:
            break
    process.kill()
    process.wait()
    appsync("quit", updated.path, A)
    done = appsync("rollback", updated.path, A, expect=None)
    if done.returncode != 0:
        assert "an update of " + A + " is under way" in done.stderr
    updated.sync(libraries[1])
    assert updated.versions()[A] == "3.0"
    appsync("rollback", updated.path, A)


@ON_ONE_PATH
def test_junk_beside_what_is_kept_is_cleared_and_links_lead_nowhere(appsync, updated, libraries, tmp_path):
    outside = tmp_path / "outside"
    outside.mkdir()
    (outside / "file").write_text("not the device's")
    folder = os.path.join(updated.path, "kept")
    os.symlink(outside, os.path.join(folder, "LINK"))
    os.makedirs(os.path.join(folder, "JUNK", "deep"))
    os.symlink(outside, os.path.join(folder, "JUNK", "deep", "link"))
    updated.sync(libraries[1])
    assert len(kept_folders(updated)) == 1 and (outside / "file").exists()
    appsync("rollback", updated.path, A)
    # The directory itself is a link.
    shutil.rmtree(folder)
    os.symlink(outside, folder)
    updated.sync(libraries[1])
    assert "no earlier version" in appsync("rollback", updated.path, A, expect=1).stderr
    assert os.listdir(outside) == ["file"] and updated.versions()[A] == "2.0"


@ON_ONE_PATH
def test_a_backup_has_nothing_of_it(appsync, updated, tmp_path, coordination):
    appsync("backup", updated.path, tmp_path / "with")
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    appsync("restore", fresh.path, tmp_path / "with")
    assert kept_folders(fresh) == [] and appsync.json("status", fresh.path)["kept"] == 0


def test_on_a_full_disk_what_is_kept_goes_for_what_comes(appsync, tmp_path):
    """And for nothing else: a sync that has nothing to do takes nothing."""
    for version, size in (("1.0", 300_000), ("2.0", 300_000), ("3.0", 100_000)):
        for identifier in (A, B):
            packages.make_package(str(tmp_path / version), identifier, version, payload=os.urandom(size))
    disk = tmp_path / "disk"
    disk.mkdir()
    script = """
mount -t tmpfs -o size=5m tmpfs {disk} && {appsync} create {disk}/d >/dev/null || exit 1
for version in 1.0 2.0; do {appsync} sync {disk}/d {libraries}/$version >/dev/null; done
head -c 700000 /dev/zero >{disk}/spare
cat /dev/zero >{disk}/filler 2>/dev/null
rm {disk}/spare
{appsync} sync {disk}/d {libraries}/2.0 2>/dev/null; echo status $?
{appsync} sync {disk}/d {libraries}/3.0 --only com.example.nosuch >/dev/null 2>&1
{appsync} apps {disk}/d
cat /dev/zero >>{disk}/filler 2>/dev/null
{appsync} sync {disk}/d {libraries}/3.0 --only {b} >/dev/null; echo status $?
{appsync} apps {disk}/d
""".format(disk=disk, appsync=appsync.program, libraries=tmp_path, b=B)
    done = in_own_mounts(script)
    said = done.stdout.splitlines()
    assert [line for line in said if line.startswith("status")] == ["status 0"] * 2, done.stdout + done.stderr
    second = said.index("status 0", said.index("status 0") + 1)
    before, after = said[:second], said[second:]
    assert [line.split()[-1] for line in before if line.startswith("com.example.")] == ["1.0", "1.0"], done.stdout
    assert [line.split()[1] for line in after if line.startswith(B)] == ["3.0"], done.stdout


def damaged_program(bundle):
    path = os.path.join(bundle, "Resources/data.bin")
    with open(path, "r+b") as file:
        first = file.read(1)
        file.seek(0)
        file.write(bytes([first[0] ^ 1]))


DAMAGES = {"a flipped bit": damaged_program,
           "an emptied program": lambda bundle: os.truncate(os.path.join(bundle, "Resources/data.bin"), 0),
           "a lost program": lambda bundle: os.remove(os.path.join(bundle, "Resources/data.bin")),
           "a lost bundle": shutil.rmtree}


@pytest.mark.parametrize("damage", DAMAGES)
def test_what_is_damaged_is_not_installed_and_is_said_to_be_gone(appsync, updated, damage):
    (container,) = kept_folders(updated)
    DAMAGES[damage](os.path.join(updated.path, "kept", container, BUNDLE))
    done = appsync("rollback", updated.path, A, expect=1)
    assert "that was kept is " + ("gone" if damage == "a lost bundle" else "damaged") in done.stderr
    assert updated.versions()[A] == "2.0" and program(updated) == b"program of 2.0"
    assert kept(updated) is None and kept_folders(updated) == []
    assert appsync.json("status", updated.path)["kept"] == 0
    assert "no earlier version" in appsync("rollback", updated.path, A, expect=1).stderr


def on_a_full_disk(appsync, tmp_path, coordination, steps):
    """What a shell says of the steps, after two updates of 300 KB each, where no byte is free; of each step its status."""
    for version in ("1.0", "2.0"):
        for identifier in (A, B):
            packages.make_package(str(tmp_path / version), identifier, version, payload=os.urandom(300_000))
    disk = tmp_path / "disk"
    disk.mkdir()
    head = """
mount -t tmpfs -o size=6m tmpfs {disk} && {appsync} create {disk}/d --coordination {coordination} >/dev/null || exit 1
for version in 1.0 2.0; do {appsync} sync {disk}/d {libraries}/$version >/dev/null; done
"""
    tail = "".join("cat /dev/zero >>{disk}/filler 2>/dev/null; %s; echo status $?\n" % step for step in steps)
    done = in_own_mounts((head + tail + "{appsync} apps {disk}/d --json").format(
        disk=disk, appsync=appsync.program, libraries=tmp_path, coordination=coordination, a=A, b=B))
    said, _, apps = done.stdout.partition("[\n")
    statuses = [int(line.split()[1]) for line in said.splitlines() if line.startswith("status ")]
    listed = {app["identifier"]: (app["version"], app["kept"] and app["kept"]["version"])
              for app in json.loads("[\n" + apps)}
    return statuses, listed, said + done.stderr


def test_a_rollback_works_on_a_full_disk_and_gives_nothing_up(appsync, tmp_path, coordination):
    statuses, apps, said = on_a_full_disk(appsync, tmp_path, coordination, [
        "{appsync} rollback {disk}/d com.example.nobody", "{appsync} rollback {disk}/d {a}",
        "{appsync} rollback {disk}/d {a}", "{appsync} rollback {disk}/d {a}"])
    assert statuses == [1, 0, 0, 0], said
    assert apps == {A: ("1.0", "2.0"), B: ("2.0", "1.0")}


def test_without_space_that_is_kept_back_a_rollback_is_refused_and_gives_nothing_up(appsync, tmp_path, coordination):
    statuses, apps, said = on_a_full_disk(appsync, tmp_path, coordination, [
        "rm {disk}/d/space.reserve", "{appsync} rollback {disk}/d {a}"])
    assert statuses == [0, 3], said
    assert apps == {A: ("2.0", "1.0"), B: ("2.0", "1.0")}


def test_on_a_full_disk_nothing_is_given_up_for_what_is_refused_or_needs_no_room(appsync, tmp_path, coordination):
    statuses, apps, said = on_a_full_disk(appsync, tmp_path, coordination, [
        "{appsync} demote {disk}/d com.example.nobody", "{appsync} data push {disk}/d com.example.nobody {libraries} --yes",
        "{appsync} sync {disk}/d {libraries}/2.0", "{appsync} sync {disk}/d {libraries}/nowhere",
        "{appsync} backup {disk}/d {libraries}/backup",
        "test $(stat -c %s {disk}/d/space.reserve) -ge 98304"])
    assert statuses == [1, 1, 0, 3, 0, 0], said
    assert apps == {A: ("2.0", "1.0"), B: ("2.0", "1.0")}


def test_a_person_runs_quits_and_sets_on_a_full_disk_again_and_again(appsync, tmp_path, coordination):
    """Also where a sync has failed for want of room; and an application can be removed all the same."""
    round_of_commands = ["{appsync} run {disk}/d {a}", "{appsync} set {disk}/d removal=no", "{appsync} quit {disk}/d {a}",
                         "{appsync} set {disk}/d removal=unset"]
    packages.make_package(str(tmp_path / "large"), "com.example.large", payload=os.urandom(2_000_000))
    statuses, apps, said = on_a_full_disk(appsync, tmp_path, coordination, [
        "{appsync} sync {disk}/d {libraries}/large", *(round_of_commands * 5),
        "test $(stat -c %s {disk}/d/space.reserve) -ge 200000", "{appsync} uninstall {disk}/d {b}"])
    assert statuses == [1, *[0] * 20, 0, 0], said
    assert list(apps) == [A]


def command_of(advice):
    found, = re.findall(r"\((appsync coordinator [^)]*)\)", advice)
    return found.split()[1:]


@COORDINATED
@pytest.mark.parametrize("command", ["rollback", "demote"])
def test_what_another_client_has_begun_is_cancelled_and_not_waited_for(appsync, updated, command):
    appsync("coordinator", updated.path, "create", A, "--client", "7")
    told = appsync(command, updated.path, A, expect=1).stderr
    assert "sync" not in told.replace("appsync", "") and "client 7" in told
    appsync(*[updated.path if word == "DEVICE" else word for word in command_of(told)])
    appsync(command, updated.path, A)
