"""`diff`: devices, backups and libraries compared."""

import os
import plistlib
import shutil

import packages
from conftest import ON_ONE_PATH, Device, names_of
from test_restore import IDS, backup, resign, store, tmp_path, used, write_data

NOTHING = {"same": True, "onlyLeft": [], "onlyRight": [], "different": [], "failed": []}


def diff(appsync, left, right, expect):
    result = appsync.json("diff", left, right, expect=expect)
    assert result["same"] == (expect == 0)
    return result


def what(result):
    return {each["identifier"]: each["what"] for each in result["different"]}


def is_nothing(result):
    return {key: result[key] for key in NOTHING} == NOTHING


def test_a_device_is_the_same_as_its_backup_and_its_library(appsync, used, backup, store, tmp_path):
    result = diff(appsync, used.path, backup, 0)
    assert is_nothing(result) and result["iconOrder"] == "same"
    assert (result["left"]["kind"], result["right"]["kind"]) == ("device", "backup")
    assert is_nothing(diff(appsync, used.path, used.path, 0))
    assert is_nothing(diff(appsync, backup, backup, 0))
    assert is_nothing(diff(appsync, store, store, 0))
    result = diff(appsync, used.path, store, 1)
    assert what(result) == {IDS[2]: ["state"], IDS[3]: ["state"]} and result["iconOrder"] == "same"
    assert result["different"][0]["left"]["state"] == "offloaded"
    assert result["different"][0]["right"] == {"version": "1.2", "state": "package"}
    done = appsync("diff", used.path, backup)
    assert done.stdout == "No difference.\n"
    assert done.stderr == "appsync: left: %s is a device; right: %s is a backup\n" % (used.path, backup)


def test_what_only_one_side_has_and_other_versions(appsync, used, store, tmp_path):
    packages.make_package(store, IDS[0], "9.9")
    packages.make_package(store, "com.example.new", "3.0")
    os.remove(os.path.join(store, IDS[4] + ".zip"))
    result = diff(appsync, used.path, store, 1)
    assert names_of(result["onlyLeft"]) == [IDS[4]]
    assert result["onlyRight"] == [{"identifier": "com.example.new", "version": "3.0", "state": "package"}]
    assert what(result)[IDS[0]] == ["version"]
    text = appsync("diff", store, used.path, expect=1).stdout
    assert "only left   com.example.new 3.0 (package)\n" in text
    assert "only right  " + IDS[4] in text
    assert "version     %s: 9.9 | 1.0\n" % IDS[0] in text


def test_data_is_compared_with_that_of_a_backup(appsync, used, backup):
    write_data(used, IDS[1], {"Documents/letter.txt": b"Deer"})
    assert what(diff(appsync, used.path, backup, 1)) == {IDS[1]: ["data"]}
    write_data(used, IDS[1], {"Documents/letter.txt": b"Dear"})  # at another time
    assert is_nothing(diff(appsync, used.path, backup, 0))
    os.rename(os.path.join(used.inside("/var/mobile/Containers/Data"), IDS[1], "Documents/letter.txt"),
              os.path.join(used.inside("/var/mobile/Containers/Data"), IDS[1], "Documents/other.txt"))
    assert what(diff(appsync, used.path, backup, 1)) == {IDS[1]: ["data"]}
    assert appsync("diff", backup, used.path, expect=1).stdout == "data        %s\n" % IDS[1]


def test_a_restored_device_differs_in_nothing_that_its_backup_tells(appsync, used, backup, tmp_path, coordination):
    fresh = Device(appsync, tmp_path / "fresh", coordination)
    assert len(diff(appsync, fresh.path, backup, 1)["onlyRight"]) == len(IDS)
    appsync("restore", fresh.path, backup)
    assert what(diff(appsync, fresh.path, backup, 0)) == {}
    states = what(diff(appsync, used.path, fresh.path, 1))
    # Where installs are not coordinated, what was offloaded is restored like any other.
    same = (IDS[2], IDS[3]) if fresh.is_coordinated else ()
    assert states == {name: ["state"] for name in IDS if name not in same}


@ON_ONE_PATH
def test_the_order_of_icons(appsync, used, backup, store):
    order = os.path.join(store, "IconOrder.plist")
    with open(order, "wb") as file:
        plistlib.dump(["com.example.unknown", IDS[1], IDS[0]], file)
    result = appsync.json("diff", used.path, store, expect=1)
    assert result["iconOrder"] == "different"
    assert "icon order\n" in appsync("diff", used.path, store, expect=1).stdout
    os.remove(order)
    assert appsync.json("diff", used.path, store, expect=1)["iconOrder"] is None


def test_a_session_goes_on_while_devices_are_compared(appsync, used, store, tmp_path, backup):
    appsync("run", used.path, IDS[0])
    newer = str(tmp_path / "newer")
    packages.make_package(newer, IDS[0], "8.0")
    waiting = appsync.start("sync", used.path, newer)
    line = ""
    while "waiting" not in line:
        line = waiting.stdout.readline()
        assert line, "the sync ended"
    assert what(appsync.json("diff", used.path, newer, expect=1)) == {IDS[0]: ["version"]}
    assert waiting.poll() is None
    waiting.terminate()
    waiting.communicate()


@ON_ONE_PATH
def test_what_can_be_nothing_of_all_is_status_3(appsync, used, store, tmp_path):
    (tmp_path / "empty").mkdir()
    (tmp_path / "file").write_text("x")
    (tmp_path / "half" / "root").mkdir(parents=True)
    (tmp_path / "cut").mkdir()
    (tmp_path / "cut" / "manifest.json.part").touch()
    (tmp_path / "rubbish").mkdir()
    (tmp_path / "rubbish" / "manifest.json").write_text("[" * 100_000)
    (tmp_path / "broken").mkdir()
    (tmp_path / "broken" / "device.db").write_text("rubbish")
    for name in ("missing", "empty", "file", "half", "cut", "rubbish", "broken"):
        for arguments in ((tmp_path / name, store), (used.path, tmp_path / name)):
            done = appsync("diff", *arguments, expect=3)
            assert done.stderr.count("\n") == 1 and done.stdout == ""
    appsync("diff", "", store, expect=3)
    appsync("diff", store, expect=2)


@ON_ONE_PATH
def test_what_cannot_be_read_is_named_and_nothing_passes_for_the_same(appsync, used, backup, store, tmp_path):
    with open(os.path.join(store, "bad.zip"), "w") as file:
        file.write("rubbish")
    copy = str(tmp_path / "copy")
    shutil.copytree(store, copy)
    result = appsync.json("diff", store, copy, expect=1)
    assert [os.path.basename(each["what"]) for each in result["failed"]] == ["bad.zip", "bad.zip"]
    assert result["same"]
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    with open(archive, "w") as file:
        file.write("rubbish")
    result = appsync.json("diff", used.path, backup, expect=1)
    assert [each["what"] for each in result["failed"]] == [IDS[1]] and archive in result["failed"][0]["error"]
    for content in (b"rubbish", plistlib.dumps({"a": 1})):
        with open(os.path.join(backup, "IconOrder.plist"), "wb") as file:
            file.write(content)
        assert len(appsync.json("diff", used.path, backup, expect=1)["failed"]) == 2
    os.remove(os.path.join(backup, "DemotedApps.plist"))
    assert len(appsync.json("diff", used.path, backup, expect=1)["failed"]) == 3


@ON_ONE_PATH
def test_hostile_archives_and_links_of_a_backup(appsync, used, backup, tmp_path):
    archive = os.path.join(backup, "data", IDS[1] + ".zip")
    packages.write_zip(archive, [("../evil", b"x")])
    assert len(appsync.json("diff", used.path, backup, expect=1)["failed"]) == 1
    os.remove(archive)
    os.mkfifo(archive)
    assert len(appsync.json("diff", used.path, backup, expect=1)["failed"]) == 1
    os.remove(archive)
    assert len(appsync.json("diff", used.path, backup, expect=1)["failed"]) == 1
    place = os.path.join(used.inside("/var/mobile/Containers/Data"), IDS[2])
    shutil.rmtree(place)
    os.symlink(tmp_path, place)
    result = appsync.json("diff", used.path, used.path, expect=None)
    assert result["onlyLeft"] == result["onlyRight"] == result["different"] == []
