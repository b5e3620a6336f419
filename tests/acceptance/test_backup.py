"""Backups, restores, the store and offloading with input that is not as it should be."""

import fcntl
import json
import os
import plistlib
import random
import shutil
import stat
import subprocess
import time
import zipfile

import pytest

import packages
from conftest import COORDINATED, DIRECTLY, ON_ONE_PATH, Device, names_of
from test_device import in_own_mounts
from test_restore import (DATA, IDS, ORDER, PROCESSED_INFO, RESTORE_INFO, backup, data_of, fresh, resign,
                          restore, screen_of, store, tmp_path, used, write_data)

ARCHIVES = "/var/mobile/Media/VessikRestore/Data"


def stripped(text):
    """The one line of a complaint."""
    assert text.startswith("appsync: ") and text.count("\n") == 1, text
    return text


def paths_below(top):
    return sorted(os.path.join(base, name) for base, folders, files in os.walk(top)
                  for name in folders + files)


def manifest_of(folder):
    with open(os.path.join(folder, "manifest.json")) as file:
        return json.load(file)


def write_manifest(folder, value):
    with open(os.path.join(folder, "manifest.json"), "w") as file:
        file.write(value if isinstance(value, str) else json.dumps(value))


def change_info(folder, change):
    """Changes the restore information, and makes the manifest true again."""
    path = os.path.join(folder, "RestoreApplications.plist")
    with open(path, "rb") as file:
        info = plistlib.load(file)
    change(info)
    with open(path, "wb") as file:
        plistlib.dump(info, file, fmt=plistlib.FMT_BINARY)
    resign(folder)


def metadata(**values):
    return plistlib.dumps({key: value for key, value in values.items() if value is not None})


# Where a backup can be.


@ON_ONE_PATH
def test_backup_is_not_written_where_it_does_not_belong(appsync, used, tmp_path):
    (tmp_path / "file").write_text("mine")
    (tmp_path / "full").mkdir()
    (tmp_path / "full" / "mine").write_text("mine")
    os.symlink(used.path, tmp_path / "link")
    before = paths_below(tmp_path)
    places = [tmp_path / "file", tmp_path / "full", tmp_path / "file" / "b", tmp_path / "no" / "way", "/proc/b",
              used.path, os.path.join(used.path, "b"), used.inside(DATA + "/x"), tmp_path / "link" / "b"]
    for place in places:
        stripped(appsync("backup", used.path, place, expect=3).stderr)
    assert paths_below(tmp_path) == before
    stripped(appsync("backup", used.path, "", expect=2).stderr)
    appsync("backup", used.path, str(tmp_path / "good") + "/")
    appsync("backup", "--check", tmp_path / "good")


@ON_ONE_PATH
def test_backup_that_was_cut_off_is_taken_over_by_the_next(appsync, used, tmp_path):
    write_data(used, IDS[0], {"big": random.Random(4).randbytes(1_000_000)})
    start = time.monotonic()
    appsync("backup", used.path, tmp_path / "whole")
    duration = time.monotonic() - start
    choose = random.Random(5)
    cut = 0
    for attempt in range(8):
        folder = tmp_path / ("b%d" % attempt)
        process = appsync.start("backup", used.path, folder)
        time.sleep(choose.uniform(0, duration))
        process.kill()
        process.communicate()
        if (folder / "manifest.json").exists():
            duration *= 0.8  # the machine is less busy than it was
            appsync("backup", "--check", folder)
            continue
        cut += folder.exists()
        appsync("backup", used.path, folder)
        assert appsync.json("backup", "--check", folder)["whole"]
        assert manifest_of(folder)["files"] == manifest_of(tmp_path / "whole")["files"]
        shutil.rmtree(folder)
    assert cut > 0


@ON_ONE_PATH
def test_cut_off_backup_is_left_alone_with_what_is_not_its_own(appsync, used, tmp_path):
    folder = tmp_path / "b"
    (folder / "data").mkdir(parents=True)
    (folder / "manifest.json.part").touch()
    (folder / "data" / "mine").write_text("mine")
    stripped(appsync("backup", used.path, folder, expect=3).stderr)
    (folder / "data" / "mine").unlink()
    with open(folder / "manifest.json.part") as held:
        fcntl.flock(held, fcntl.LOCK_EX)
        assert "another backup" in stripped(appsync("backup", used.path, folder, expect=3).stderr)
    appsync("backup", used.path, folder)
    assert sorted(os.listdir(folder)) == ["DemotedApps.plist", "IconOrder.plist", "RestoreApplications.plist",
                                          "data", "manifest.json"]


@ON_ONE_PATH
def test_backup_goes_on_once_its_disk_has_room(appsync, used, tmp_path):
    write_data(used, IDS[0], {"big": random.Random(4).randbytes(3_000_000)})
    os.mkdir(tmp_path / "disk")
    script = ("mount -t tmpfs -o size=1m tmpfs {0}/disk && {1} backup {2} {0}/disk/b --json; echo $? >&2; "
              "mount -o remount,size=20m {0}/disk; {1} backup {2} {0}/disk/b >&2; echo $? >&2; "
              "{1} backup --check {0}/disk/b >&2; echo $? >&2").format(tmp_path, appsync.program, used.path)
    done = in_own_mounts(script)
    result = json.loads(done.stdout)
    assert names_of(result["failed"]) == ["backup"] and result["applications"] == []
    assert [line for line in done.stderr.splitlines() if line.isdigit()] == ["1", "0", "0"], done.stderr


def test_data_that_cannot_be_backed_up_does_not_keep_the_rest_out(appsync, device, store, tmp_path):
    device.sync(store)
    write_data(device, IDS[1], {"a": b"a"})
    with open(device.inside(DATA + "/" + IDS[0]), "w") as file:
        file.write("no directory")
    result = appsync.json("backup", device.path, tmp_path / "b", expect=1)
    assert names_of(result["leftOut"]) == [IDS[0]] and result["data"] == [IDS[1]]
    appsync("backup", "--check", tmp_path / "b")


@ON_ONE_PATH
def test_what_may_not_be_read_is_named(appsync, device, store, tmp_path):
    def as_nobody(*arguments):
        return subprocess.run(["setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", appsync.program,
                               *map(str, arguments)], capture_output=True, text=True)

    os.chmod(tmp_path, 0o777)
    if os.geteuid() != 0 or as_nobody("create", tmp_path / "new").returncode != 0:
        pytest.skip("needs somebody else to be")
    device.sync(store)
    for identifier in IDS[:2]:
        write_data(device, identifier, {"a": b"a"})
    secret = device.inside(DATA + "/" + IDS[0])
    subprocess.run(["chown", "-R", "65534:65534", device.path], check=True)
    os.chmod(secret, 0)
    folder = tmp_path / "b"
    done = as_nobody("backup", device.path, folder, "--json")
    assert done.returncode == 1 and names_of(json.loads(done.stdout)["leftOut"]) == [IDS[0]], done.stderr
    assert json.loads(done.stdout)["data"] == [IDS[1]]
    os.chmod(folder / "data", 0)
    done = as_nobody("restore", tmp_path / "new", folder, "--json")
    assert done.returncode == 1 and names_of(json.loads(done.stdout)["failed"]) == [IDS[1]]
    os.chmod(folder / "RestoreApplications.plist", 0)
    assert "Permission denied" in stripped(as_nobody("restore", tmp_path / "new", folder).stderr)
    os.chmod(folder, 0)
    for command in (["restore", tmp_path / "new", folder], ["backup", "--check", folder]):
        assert "Permission denied" in stripped(as_nobody(*command).stderr)


# What is checked.


@ON_ONE_PATH
def test_check_follows_no_links_and_names_what_disagrees(appsync, backup, tmp_path):
    os.rename(os.path.join(backup, "IconOrder.plist"), tmp_path / "order")
    os.symlink("../order", os.path.join(backup, "IconOrder.plist"))
    os.mkdir(os.path.join(backup, "extra"))
    os.symlink("/etc", os.path.join(backup, "etc"))
    manifest = manifest_of(backup)
    manifest["applications"][0]["data"] = True
    del manifest["files"]["data/%s.zip" % IDS[1]]
    for each in manifest["applications"]:
        each["data"] = each["data"] and each["identifier"] != IDS[2]
    write_manifest(backup, manifest)
    faults = {each["file"]: each["error"] for each in appsync.json("backup", "--check", backup, expect=1)["faults"]}
    assert faults == {
        "IconOrder.plist": "it is a link, not a file",
        "data/%s.zip" % IDS[0]: "the manifest has no sum of it",
        "data/%s.zip" % IDS[1]: "the manifest has no sum of it",
        "data/%s.zip" % IDS[2]: "no application of the manifest says that it has data",
        "etc": "the manifest does not name it",
        "extra": "the manifest does not name it"}


@ON_ONE_PATH
def test_folder_of_archives_that_is_a_link_is_not_followed(appsync, backup, fresh, tmp_path):
    os.rename(os.path.join(backup, "data"), tmp_path / "elsewhere")
    os.symlink(tmp_path / "elsewhere", os.path.join(backup, "data"))
    appsync("backup", "--check", backup, expect=1)
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == [IDS[1], IDS[2]] and sorted(result["restored"]) == IDS
    assert not os.path.exists(fresh.inside(ARCHIVES))


def damaged_manifests(good):
    """Texts of which nothing can be made."""
    def with_(change):
        value = json.loads(json.dumps(good))
        change(value)
        return json.dumps(value)

    name = "IconOrder.plist"
    text = json.dumps(good)
    yield from ("null", "5", '"x"', "\0\0", '{"format": 1, "made": "\\ud800"}', "[" * 50_000 + "]" * 50_000)
    for key in ("format", "applications", "files"):
        yield with_(lambda value: value.pop(key))
        for wrong in (None, "1", 1.5, -1, 2 ** 70, [[]], {"x": {}}, True):
            if key != "format" or wrong is not True:
                yield with_(lambda value: value.update({key: wrong}))
    yield with_(lambda value: value["applications"].append(value["applications"][0]))
    for wrong in ({}, None, "x", {"identifier": 5, "data": True}, {"identifier": "a.b"},
                  {"identifier": "../x", "data": False}, {"identifier": "a" * 256, "data": False}):
        yield with_(lambda value: value["applications"].append(wrong))
    for wrong in ("../x", "/etc/passwd", "data/../../x.zip", "data/a/b.zip", "data/.zip", "data", "manifest.json", ""):
        yield with_(lambda value: value["files"].update({wrong: good["files"][name]}))
    for key, values in (("size", (None, "1", -1, 1.5, 2 ** 70)), ("sha256", (None, 5, "ab", "G" * 64))):
        for wrong in values:
            yield with_(lambda value: value["files"][name].update({key: wrong}))
    yield with_(lambda value: value["files"].pop("RestoreApplications.plist"))
    yield text.replace('"format": 1', '"format": 2, "format": 1')
    yield text.replace('"%s": {' % name, '"%s": {}, "%s": {' % (name, name))


@ON_ONE_PATH
def test_rubbish_for_a_manifest_is_refused_in_one_line(appsync, backup, fresh):
    for text in damaged_manifests(manifest_of(backup)):
        write_manifest(backup, text)
        done = appsync("restore", fresh.path, backup, "--json", expect=3)
        assert "manifest.json is damaged" in stripped(done.stderr) and done.stdout == "", text[:300]
    done = appsync("backup", "--check", backup, "--json", expect=1)
    assert json.loads(done.stdout)["faults"][0]["file"] == "manifest.json"
    os.remove(os.path.join(backup, "manifest.json"))
    os.symlink("/etc/hostname", os.path.join(backup, "manifest.json"))
    assert "link" in stripped(appsync("restore", fresh.path, backup, expect=3).stderr)
    assert fresh.placeholders() == [] and not os.path.exists(fresh.inside(PROCESSED_INFO))


@ON_ONE_PATH
def test_lists_and_archives_without_a_sum_are_named(appsync, backup, fresh):
    manifest = manifest_of(backup)
    for name in ("DemotedApps.plist", "IconOrder.plist", "data/%s.zip" % IDS[1]):
        del manifest["files"][name]
    write_manifest(backup, manifest)
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == ["DemotedApps.plist", "IconOrder.plist", IDS[1]]
    assert sorted(result["restored"]) == IDS
    assert os.listdir(fresh.inside(ARCHIVES)) == [IDS[2] + ".zip"]


# What a restore makes of entries.

ILLEGAL = ["", ".", "..", "../x", "/abs", "a/b", "x/../../y", "../../Library/evil", "c" * 256, "d" * 300,
           "new\nline", "nul\0x", "sp ace", "ümlaut"]


def test_what_is_no_identifier_reaches_neither_device_nor_machine(appsync, backup, fresh, tmp_path):
    change_info(backup, lambda info: info.update({each: info[IDS[0]] for each in ILLEGAL}))
    before = paths_below(tmp_path)
    done = appsync("restore", fresh.path, backup, "--json", expect=1)
    result = json.loads(done.stdout)
    assert names_of(result["failed"]) == sorted(ILLEGAL) and sorted(result["restored"]) == IDS
    assert done.stderr.count("\n") == len(ILLEGAL)
    assert all("this is not an identifier" in each["error"] for each in result["failed"])
    # Nothing stands anywhere that a restore without them would not have made.
    new = [os.path.relpath(path, fresh.path) for path in paths_below(tmp_path) if path not in before]
    plain = Device(appsync, tmp_path / "plain", fresh.coordination)
    change_info(backup, lambda info: [info.pop(each) for each in ILLEGAL])
    restore(plain, backup)
    expected = [os.path.relpath(path, plain.path) for path in paths_below(plain.path)]
    containers = "root/var/containers"
    assert ({path for path in new if not path.startswith(containers)} <=
            {path for path in expected if not path.startswith(containers)})


def test_each_defect_of_an_entry_is_named_and_the_rest_restored(appsync, backup, fresh):
    good = metadata(title="T", bundleVersion="1")
    broken = {"e.array": [1], "e.text": "x", "e.nothing": {}, "e.number": {"VessikMetadata": 5},
              "e.map": {"VessikMetadata": {"title": "x"}}, "e.rubbish": {"VessikMetadata": b"xx"},
              "e.empty": {"VessikMetadata": b""}, "e.list": {"VessikMetadata": plistlib.dumps([1])}}
    nameless = {"n.title": {"VessikMetadata": metadata(bundleVersion="1")},
                "n.number": {"VessikMetadata": metadata(title=5, bundleVersion="1")},
                "n.version": {"VessikMetadata": metadata(title="T")}}
    fine = {"f.item": {"VessikMetadata": metadata(itemName="It", bundleVersion="1")},
            "a" * 252: {"VessikMetadata": good}, "b" * 255: {"VessikMetadata": good},
            "f.noicon": {"VessikMetadata": good}, "f.texticon": {"VessikMetadata": good, "PlaceholderIcon": "x"},
            "f.badicon": {"VessikMetadata": good, "PlaceholderIcon": b"\x89PNG\r\n\x1a\nno picture"},
            "f.emptyicon": {"VessikMetadata": good, "PlaceholderIcon": b""},
            "f.textsinf": {"VessikMetadata": good, "ApplicationSINF": "x"},
            "f.mapsinf": {"VessikMetadata": good, "ApplicationSINF": {"a": 1}}}
    change_info(backup, lambda info: info.update({**broken, **nameless, **fine}))
    # Coordinators name an application after its identifier, and need no version.
    failing = list(broken) + ([] if fresh.is_coordinated else list(nameless))
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == sorted(failing)
    assert all("its " in each["error"] and ";" in each["error"] for each in result["failed"])
    shown = names_of(result["screen"])
    assert shown == sorted(set(IDS) | set(fine) | set(nameless) - set(failing))
    assert not os.path.exists(fresh.inside(RESTORE_INFO)) and os.path.exists(fresh.inside(PROCESSED_INFO))
    appsync("screen", fresh.path, os.path.join(fresh.path, "screen.png"))
    assert restore(fresh, backup, expect=1)["screen"] == result["screen"]


@ON_ONE_PATH
def test_applications_that_only_the_manifest_knows_are_named(appsync, backup, fresh):
    change_info(backup, lambda info: [info.pop(each) for each in IDS[1:]])
    result = restore(fresh, backup, expect=1)
    assert result["restored"] == [IDS[0]] and names_of(result["failed"]) == IDS[1:]


def test_lists_of_offloaded_applications_that_are_none_are_named(appsync, backup, fresh, tmp_path):
    path = os.path.join(backup, "DemotedApps.plist")
    for number, (content, status) in enumerate([
            (b"", 1), (b"rubbish", 1), (plistlib.dumps([IDS[2]]), 1),
            (plistlib.dumps({"AutomaticDowngrades": IDS[2], "IntentionalDowngrades": 5}), 1),
            (plistlib.dumps({"AutomaticDowngrades": [5, {}, IDS[2]]}), 0)]):
        with open(path, "wb") as file:
            file.write(content)
        resign(backup)
        device = Device(appsync, tmp_path / ("d%d" % number), fresh.coordination)
        result = restore(device, backup, expect=status)
        assert names_of(result["failed"]) == ["DemotedApps.plist"] * status
        assert device.placeholders() == IDS
        types = {app["identifier"]: app["installType"] for app in appsync.json("apps", device.path)}
        assert types[IDS[2]] == (7 if status == 0 and device.is_coordinated else 2)


@ON_ONE_PATH
def test_types_of_restore(appsync, backup, fresh):
    for given in ("0", "1", "4", "9", "-1", "9223372036854775807"):
        result = restore(fresh, backup, "--type", given)
        assert result["type"] == int(given) and result["restored"] == result["screen"] == []
    for given in ("x", "", "2.5", "2x", "9223372036854775808"):
        stripped(appsync("restore", fresh.path, backup, "--type", given, expect=2).stderr)
    assert fresh.placeholders() == [] and os.path.exists(fresh.inside(RESTORE_INFO))
    restore(fresh, backup)
    assert fresh.placeholders() == IDS and not os.path.exists(fresh.inside(RESTORE_INFO))


# Archives of data.


def hostile_archives(folder):
    """Files under the name of an archive, by what is wrong with them."""
    def save(label, items):
        packages.write_zip(os.path.join(folder, label + ".zip"), items)
        return label

    yield save("parent", [("fine", b"1"), ("../evil", b"x")])
    yield save("absolute", [("/tmp/evil", b"x")])
    yield save("link", [(packages.entry("l", 0o120777), b"/etc"), ("l/x", b"x")])
    yield save("pipe", [(packages.entry("p", 0o010644), b"")])
    yield save("both", [("a", b"1"), ("a/b", b"2")])
    whole = packages.write_zip(os.path.join(folder, "cut.zip"), [("a", b"1")])
    os.truncate(whole, os.path.getsize(whole) - 10)
    yield "cut"
    packages.damage_contents(packages.write_zip(os.path.join(folder, "crc.zip"), [("a", b"text" * 99)]), "a")
    yield "crc"
    for label, content in (("empty", b""), ("rubbish", b"rubbish" * 50)):
        with open(os.path.join(folder, label + ".zip"), "wb") as file:
            file.write(content)
        yield label


def test_archives_that_no_device_would_unpack_are_named_and_their_applications_installed(
        appsync, backup, fresh, tmp_path):
    labels = sorted(hostile_archives(os.path.join(backup, "data")))
    manifest = manifest_of(backup)
    for label in labels:
        manifest["applications"].append({"identifier": label, "version": "1", "name": label, "data": True})
        manifest["files"]["data/%s.zip" % label] = {}
    write_manifest(backup, manifest)
    entry = {"VessikMetadata": metadata(title="T", bundleVersion="1")}
    change_info(backup, lambda info: info.update({label: entry for label in labels}))
    faults = appsync.json("backup", "--check", backup, expect=1)["faults"]
    assert [each["file"] for each in faults] == ["data/%s.zip" % label for label in labels]
    assert all("no device can unpack it" in each["error"] for each in faults)
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == labels
    assert all("comes back without its data" in each["error"] for each in result["failed"])
    assert sorted(result["restored"]) == sorted(labels + IDS)
    assert sorted(os.listdir(fresh.inside(ARCHIVES))) == [IDS[1] + ".zip", IDS[2] + ".zip"]
    library = str(tmp_path / "hostile")
    for label in labels:
        packages.make_package(library, label)
    if fresh.is_coordinated:
        assert set(appsync.json("store", fresh.path, library, expect=None)["kept"]) == set(labels)
    else:
        for label in labels:
            appsync("send", fresh.path, label, os.path.join(library, label + ".zip"), "--restore", "--parts", "3")
    assert sorted(fresh.apps()) == labels


def test_data_that_together_has_no_room_is_refused_before_anything_is_changed(appsync, device, store, tmp_path, coordination):
    """Each alone would fit; the last of their installs would fail."""
    device.sync(store)
    for number in (0, 1):  # 5 MiB, as an archive and unpacked
        write_data(device, IDS[number], {"noise": random.Random(number).randbytes(5 << 20)})
    appsync("backup", device.path, tmp_path / "b")
    os.mkdir(tmp_path / "disk")
    script = ("mount -t tmpfs -o size=16m tmpfs {0}/disk && {1} create {0}/disk/d --coordination {2} >&2 && "
              "{1} send {0}/disk/d {3} {4}/{3}.zip >&2 && {1} store {0}/disk/d {4} >&2 && cp -a {0}/disk/d/root {0}/before && "
              "{1} restore {0}/disk/d {0}/b --json; echo $? >&2; diff -r {0}/before {0}/disk/d/root >&2; echo $? >&2; "
              "mount -o remount,size=24m {0}/disk && {1} restore {0}/disk/d {0}/b >&2; echo $? >&2; "
              "{1} restore {0}/disk/d {0}/b >&2; echo $? >&2"
              ).format(tmp_path, appsync.program, coordination, IDS[5], store)
    done = in_own_mounts(script)
    result = json.loads(done.stdout)
    assert result["restored"] == [] and names_of(result["failed"]) == ["restore"], done.stderr
    assert names_of(result["screen"]) == [IDS[5]]
    error = result["failed"][0]["error"]
    assert "needs 20.0 MiB, the device has" in error and "free space on the device and restore again" in error
    # Nothing was changed; with room it works, also again while the archives wait there already.
    assert [line for line in done.stderr.splitlines() if line.isdigit()] == ["1", "0", "0", "0"], done.stderr
    assert done.stderr.count("needs 20.0 MiB") == 1


@ON_ONE_PATH
def test_data_that_is_no_good_is_not_sent(appsync, backup, fresh, store):
    restore(fresh, backup)
    appsync("send", fresh.path, IDS[1], os.path.join(store, IDS[1] + ".zip"), "--restore")
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    good = os.path.join(os.path.dirname(backup), "good.zip")
    shutil.copy(archive, good)
    packages.damage_contents(archive, "Documents/letter.txt")
    done = appsync("send", fresh.path, IDS[1], archive, "--restore", "--parts", "2", "--json", expect=1)
    assert "entry 'Documents/letter.txt'" in stripped(done.stderr) and json.loads(done.stdout)["bytes"] == 0
    appsync("send", fresh.path, IDS[1], good, "--restore", "--parts", "2")
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


@ON_ONE_PATH
def test_waiting_data_that_is_no_good_is_left_out_of_the_next_backup(appsync, backup, fresh, tmp_path):
    restore(fresh, backup)
    packages.damage_contents(fresh.inside(ARCHIVES + "/" + IDS[1] + ".zip"), "Documents/letter.txt")
    result = appsync.json("backup", fresh.path, tmp_path / "again", expect=1)
    assert names_of(result["leftOut"]) == [IDS[1]] and result["data"] == [IDS[2]]
    appsync("backup", "--check", tmp_path / "again")


def test_round_trip_keeps_the_modes_of_data(appsync, device, store, tmp_path, coordination):
    device.sync(store)
    write_data(device, IDS[0], {"secret": b"1", "run/me": b"2", "empty": b""})
    top = device.inside(DATA + "/" + IDS[0])
    os.mkdir(os.path.join(top, "nothing"))
    for name, mode in (("secret", 0o600), ("run/me", 0o755), ("run", 0o700), ("nothing", 0o755)):
        os.chmod(os.path.join(top, name), mode)
    appsync("backup", device.path, tmp_path / "b")
    other = Device(appsync, tmp_path / "other", coordination)
    restore(other, tmp_path / "b")
    package = os.path.join(store, IDS[0] + ".zip")
    if other.is_coordinated:
        appsync("store", other.path, store)
    else:
        appsync("send", other.path, IDS[0], package, "--restore")
        archive = tmp_path / "b" / "data" / (IDS[0] + ".zip")
        appsync("send", other.path, IDS[0], archive, "--restore", "--parts", "2")

    def modes(path):
        return {os.path.relpath(each, path): stat.S_IMODE(os.stat(each).st_mode) for each in paths_below(path)}

    found = other.inside(DATA + "/" + IDS[0])
    assert modes(found) == modes(top) and data_of(other, IDS[0]) == data_of(device, IDS[0])


# What stands in the way of a restore.


def test_restore_takes_over_what_an_interrupted_sync_was_about_to_bring(appsync, backup, fresh, tmp_path):
    big = str(tmp_path / "big")
    for identifier in IDS[1:3]:
        packages.make_package(big, identifier, "9.0")
    entries = packages.entries(IDS[0], "9.0")
    payload = packages.entry(entries[3][0], method=zipfile.ZIP_STORED)
    packages.write_zip(os.path.join(big, IDS[0] + ".zip"), entries[:3] + [(payload, bytes(40_000_000))])
    process = appsync.start("sync", fresh.path, big, "--json-lines")
    for line in process.stdout:
        if '"progress"' in line:
            break
    process.kill()
    process.communicate()
    left = [each for each in IDS if each not in fresh.apps()]
    assert fresh.placeholders(), "the sync was over too soon"
    restore(fresh, backup)
    other = str(tmp_path / "other")
    packages.make_package(other, "com.example.other")
    fresh.sync(other)  # which clears what an interrupted sync has left
    assert [each for each in IDS if each in fresh.placeholders() or each in fresh.apps()] == IDS
    restored = {each["identifier"]: each["version"] for each in appsync.json("apps", fresh.path)}
    assert all(restored[each] == "1.%d" % IDS.index(each) for each in left if restored[each] != "9.0")
    assert restored[left[-1]] != "9.0"


@COORDINATED
def test_application_that_another_client_installs_is_named(appsync, backup, fresh):
    appsync("coordinator", fresh.path, "create", IDS[0])
    result = restore(fresh, backup, expect=1)
    assert names_of(result["failed"]) == [IDS[0]] and "client 2" in result["failed"][0]["error"]
    assert sorted(result["restored"]) == IDS[1:]


def test_second_session_is_refused(appsync, backup, fresh, store):
    directory = os.open(fresh.path, os.O_RDONLY)
    fcntl.flock(directory, fcntl.LOCK_EX)
    for command in (["restore", fresh.path, backup], ["store", fresh.path, store],
                    ["backup", fresh.path, backup + "2"], ["demote", fresh.path, IDS[0]],
                    ["send", fresh.path, IDS[0], os.path.join(store, IDS[0] + ".zip")]):
        assert "in use" in stripped(appsync(*command, expect=3).stderr)
    os.close(directory)
    assert not os.path.exists(backup + "2")


# Sending, storing, offloading.


@ON_ONE_PATH
def test_files_that_cannot_be_sent_are_named_and_nothing_is_sent(appsync, backup, fresh, store):
    package = os.path.join(store, IDS[0] + ".zip")
    rubbish = os.path.join(store, "rubbish")
    with open(rubbish, "wb") as file:
        file.write(b"rubbish")
    for identifier, file, options in (
            (IDS[0], "/nope", []), (IDS[0], store, []), (IDS[0], rubbish, ["--restore"]),
            (IDS[1], package, ["--restore"]), (IDS[0], "/nope", ["--restore", "--parts", "3"])):
        done = appsync("send", fresh.path, identifier, file, *options, "--json", expect=1)
        stripped(done.stderr)
        assert names_of(json.loads(done.stdout)["failed"]) == [identifier]
        assert appsync.json("apps", fresh.path) == []
        assert appsync("why", fresh.path, identifier, expect=1).stderr.count("\n") == 1
    for options in (["--parts", "2"], ["--restore", "--parts", "0"], ["--restore", "--parts", "4"],
                    ["--restore", "--parts", "x"], ["--restore", "--parts", ""]):
        stripped(appsync("send", fresh.path, IDS[0], package, *options, expect=2).stderr)
    stripped(appsync("send", fresh.path, "", package, expect=2).stderr)


@COORDINATED
def test_what_is_the_stores_to_bring_is_not_sent(appsync, backup, fresh, store):
    restore(fresh, backup)
    package = os.path.join(store, IDS[0] + ".zip")
    for options in ([], ["--restore"], ["--restore", "--parts", "2"], ["--restore", "--parts", "3"]):
        done = appsync("send", fresh.path, IDS[0], package, *options, "--json", expect=1)
        assert "appsync store" in stripped(done.stderr)
        assert names_of(json.loads(done.stdout)["failed"]) == [IDS[0]]
    assert fresh.placeholders() == IDS


@ON_ONE_PATH
def test_data_without_a_package_that_waits_is_refused(appsync, backup, fresh):
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    done = appsync("send", fresh.path, IDS[1], archive, "--restore", "--parts", "2", "--json", expect=1)
    assert "--parts 1" in stripped(done.stderr)
    assert names_of(json.loads(done.stdout)["failed"]) == [IDS[1]]


@COORDINATED
def test_store_killed_at_random_moments_and_run_again(appsync, backup, store, tmp_path, coordination):
    wanted = sorted(each for each in IDS if each not in IDS[2:4])
    choose = random.Random(8)
    for attempt in range(5):
        device = Device(appsync, tmp_path / ("d%d" % attempt), coordination)
        restore(device, backup)
        process = appsync.start("store", device.path, store)
        time.sleep(choose.uniform(0, 0.06))
        process.kill()
        process.communicate()
        assert appsync.json("store", device.path, store)["failed"] == []
        assert sorted(device.apps()) == wanted
        assert data_of(device, IDS[1])["Documents/letter.txt"] == b"Dear"
        assert [each["identifier"] for each in restore(device, backup)["screen"]] == ORDER


@DIRECTLY
def test_send_of_a_restore_killed_at_random_moments_and_run_again(appsync, backup, store, tmp_path, coordination):
    package = os.path.join(store, IDS[1] + ".zip")
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    choose = random.Random(9)
    for attempt in range(5):
        device = Device(appsync, tmp_path / ("d%d" % attempt), coordination)
        restore(device, backup)
        for part, file in (("1", package), ("2", archive)):
            process = appsync.start("send", device.path, IDS[1], file, "--restore", "--parts", part)
            time.sleep(choose.uniform(0, 0.04))
            process.kill()
            process.communicate()
            if IDS[1] in device.apps():
                break
            appsync("send", device.path, IDS[1], file, "--restore", "--parts", part)
        assert IDS[1] in device.apps()
        assert data_of(device, IDS[1])["Documents/letter.txt"] == b"Dear"
        assert [each["identifier"] for each in restore(device, backup)["screen"]] == ORDER


def damaged_package(folder, identifier):
    """Its contents are not as its directory says, which only shows when they are read."""
    package = packages.make_package(str(folder), identifier, "9.0")
    return packages.damage_contents(package, "%s.app/main" % identifier.rsplit(".", 1)[-1].title())


def test_damaged_package_is_not_sent_and_costs_nothing(appsync, used, tmp_path):
    before = screen_of(used)
    for identifier in (IDS[0], IDS[2]):
        package = damaged_package(tmp_path / "damaged", identifier)
        done = appsync.json("send", used.path, identifier, package, expect=1)
        assert names_of(done["failed"]) == [identifier] and "CRC" in done["failed"][0]["error"]
        assert done["bytes"] == 0
    assert screen_of(used) == before and used.placeholders() == IDS[2:4]
    assert data_of(used, IDS[2]) == {"notes": b"of an offloaded one"}


def test_what_cannot_be_offloaded_is_refused_and_stays(appsync, used):
    appsync("run", used.path, IDS[0])
    assert "appsync quit DEVICE " + IDS[0] in stripped(appsync("demote", used.path, IDS[0], expect=1).stderr)
    assert IDS[0] in used.apps()
    appsync("quit", used.path, IDS[0])
    appsync("demote", used.path, IDS[0])
    assert "already" in appsync("demote", used.path, IDS[0]).stdout
    assert "appsync apps" in stripped(appsync("demote", used.path, "com.example.none", expect=1).stderr)
    for wrong in ([""], ["../x"], [IDS[1], "--by", "nobody"]):
        stripped(appsync("demote", used.path, *wrong, expect=2).stderr)


def test_why_names_what_brings_an_offloaded_application_back(appsync, used, store):
    waits = appsync.json("why", used.path, IDS[2])["waitsFor"]
    assert (waits["what"], waits["who"]) == (("sync" if used.is_coordinated else "transfer"), "host")
    if used.is_coordinated:
        used.sync(store)
    else:
        appsync("send", used.path, IDS[2], os.path.join(store, IDS[2] + ".zip"))
    assert appsync.json("why", used.path, IDS[2])["waitsFor"] is None
    assert data_of(used, IDS[2]) == {"notes": b"of an offloaded one"}


def test_store_names_packages_that_it_cannot_read(appsync, backup, fresh, store):
    with open(os.path.join(store, IDS[0] + ".zip"), "wb") as file:
        file.write(b"rubbish")
    if not fresh.is_coordinated:
        assert appsync.json("store", fresh.path, store)["failed"] == []
        return
    restore(fresh, backup)
    failed = names_of(appsync.json("store", fresh.path, store, expect=1)["failed"])
    assert failed == [IDS[0], IDS[0] + ".zip"]


@COORDINATED
def test_damaged_package_is_not_delivered_by_the_store(appsync, backup, fresh, store, tmp_path):
    restore(fresh, backup)
    damaged_package(tmp_path / "damaged", IDS[1])
    failed = appsync.json("store", fresh.path, tmp_path / "damaged", expect=1)["failed"]
    assert "CRC" in {each["identifier"]: each["error"] for each in failed}[IDS[1]]
    assert fresh.placeholders() == IDS
    assert appsync.json("store", fresh.path, store)["failed"] == []
    assert data_of(fresh, IDS[1])["Documents/letter.txt"] == b"Dear"


def test_update_that_turns_out_to_be_damaged_leaves_the_old_version(device, store, tmp_path):
    """A sync finds out with the install only."""
    device.sync(store)
    before = screen_of(device)
    damaged_package(tmp_path / "damaged", IDS[1])
    assert names_of(device.sync(tmp_path / "damaged", expect=1)["failed"]) == [IDS[1]]
    assert screen_of(device) == before


# Errors that say what to do.


@ON_ONE_PATH
def test_errors_about_files_say_what_to_do(appsync, used, backup):
    for command in (["screen", used.path, "/nonexistent/s.png"], ["plist", "show", "/nope"], ["package", "show", "/nope"],
                    ["plist", "convert", os.path.join(backup, "IconOrder.plist"), "--to", "xml", "--out", "/nope/x"]):
        assert "; name a file" in stripped(appsync(*command, expect=1).stderr)
    assert "path" in stripped(appsync("create", "", expect=2).stderr)


@ON_ONE_PATH
def test_what_stands_in_the_place_of_the_restore_information(appsync, backup, fresh):
    place = fresh.inside(RESTORE_INFO)
    os.makedirs(os.path.join(place, "a directory"))
    assert sorted(restore(fresh, backup)["restored"]) == IDS and not os.path.exists(place)


@ON_ONE_PATH
@pytest.mark.parametrize("path", [RESTORE_INFO, PROCESSED_INFO])
def test_a_file_where_restore_information_needs_a_directory_is_named(appsync, backup, fresh, path):
    folder = os.path.dirname(path)
    shutil.rmtree(fresh.inside(folder), ignore_errors=True)
    with open(fresh.inside(folder), "w"):
        pass
    if path == PROCESSED_INFO:  # else it is the archives of data, too, that have no place
        failed = {each["identifier"]: each["error"] for each in restore(fresh, backup, expect=1)["failed"]}
        assert sorted(failed) == sorted(IDS + ["RestoreApplications.plist"])
        assert failed[IDS[0]] == "the restore information did not reach the device"
    errors = [each["error"] for each in restore(fresh, backup, expect=1)["failed"]]
    assert any(folder in each and "remove what stands there in its place" in each for each in errors), errors
    os.remove(fresh.inside(folder))
    assert restore(fresh, backup)["failed"] == []


@ON_ONE_PATH
def test_nothing_is_restored_where_the_list_of_offloaded_ones_has_no_place(appsync, backup, fresh):
    preferences = fresh.inside("/var/mobile/Library/Preferences")
    shutil.rmtree(preferences)
    with open(preferences, "w"):
        pass
    assert preferences.rpartition("/root")[2] in stripped(appsync("restore", fresh.path, backup, expect=None).stderr)
    assert fresh.apps() == {}
    os.remove(preferences)
    assert restore(fresh, backup)["failed"] == []
