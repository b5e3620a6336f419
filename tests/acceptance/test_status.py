"""A device at a glance."""

import json
import os
import plistlib
import re
import signal

import packages

TODO = "/var/mobile/Media/PublicStaging/ApplicationSync"
IDS = ["com.example.app%02d" % number for number in range(5)]


def test_an_empty_device(appsync, device):
    status = appsync.json("status", device.path)
    free, reserve = status.pop("free"), status.pop("reserve")
    assert free > 0 and reserve == 256 * 1024
    assert status == {
        "installation": "unset", "removal": "unset", "coordination": device.coordination, "installed": 0,
        "offloaded": 0, "restored": 0, "arriving": 0, "running": [], "session": "none", "process": None,
         "open": [], "staged": "none", "kept": 0, "keptBytes": 0}
    shown = appsync("status", device.path).stdout
    assert len(shown.splitlines()) <= 15 and "256.0 KiB kept back" in shown
    os.remove(os.path.join(device.path, "space.reserve"))
    assert "nothing kept back" in appsync("status", device.path).stdout


def test_what_stands_on_the_device_is_counted(appsync, device, library, tmp_path):
    device.sync(library)
    appsync("backup", device.path, tmp_path / "backup")
    appsync("uninstall", device.path, IDS[4])
    appsync("restore", device.path, tmp_path / "backup")
    appsync("demote", device.path, IDS[0])
    appsync("demote", device.path, IDS[1], "--by", "system")
    appsync("run", device.path, IDS[2])
    appsync("set", device.path, "installation=no", "removal=yes")
    status = appsync.json("status", device.path)
    assert [status[key] for key in ("installed", "offloaded", "restored", "arriving")] == [2, 2, 1, 0]
    assert (status["running"], status["installation"], status["removal"]) == ([IDS[2]], "no", "yes")
    shown = appsync("status", device.path).stdout
    assert "2 installed, 2 offloaded, 1 restored, 0 arriving" in shown and IDS[2] in shown


def test_a_session_is_seen_and_that_it_was_cut_off(appsync, device, library):
    device.sync(library)
    packages.make_package(library, IDS[0], "2.0")
    packages.make_package(library, "com.example.new")
    appsync("run", device.path, IDS[0])
    sync = appsync.start("sync", device.path, library, "--json-lines")
    for line in sync.stdout:
        if json.loads(line).get("nextTry"):
            break
    status = appsync.json("status", device.path)
    assert (status["session"], status["process"]) == ("under way", sync.pid)
    assert re.search("session: +under way, process %d" % sync.pid, appsync("status", device.path).stdout)
    sync.send_signal(signal.SIGKILL)
    sync.communicate()
    status = appsync.json("status", device.path)
    assert (status["session"], status["process"], status["staged"]) == ("interrupted", None, "none")
    assert "run the command again" in appsync("status", device.path).stdout
    appsync("quit", device.path, IDS[0])
    device.sync(library)
    assert appsync.json("status", device.path)["session"] == "none"


def test_a_staging_area_that_waits_is_seen(appsync, device, library):
    os.makedirs(device.inside(TODO))
    with open(device.inside(TODO + "/ApplicationsSync.plist"), "wb") as file:
        plistlib.dump([{"identifier": IDS[0], "operation": "install", "version": "1.0", "name": "A"}], file)
    assert appsync.json("status", device.path)["staged"] == "waiting"
    assert "appsync sync DEVICE LIBRARY --staged sends" in appsync("status", device.path).stdout
    appsync("sync", device.path, library, "--staged", expect=None)
    assert appsync.json("status", device.path)["staged"] == "none"


def test_history_of_one_application(appsync, device, library):
    device.sync(library)
    everything = appsync.json("history", device.path)
    of_one = appsync.json("history", device.path, "--app", IDS[1])
    assert of_one == [each for each in everything if each["identifier"] == IDS[1]]
    assert 0 < len(of_one) < len(everything)
    assert IDS[0] not in appsync("history", device.path, "--app", IDS[1]).stdout
    assert appsync("history", device.path, "--app", "com.example.none").stdout == "No history.\n"
    assert "--app a/b is not an identifier" in appsync("history", device.path, "--app", "a/b", expect=2).stderr


def test_no_device_is_made_inside_another(appsync, device, tmp_path):
    for inside in ("root/new", "new", "root/var/mobile/new"):
        done = appsync("create", os.path.join(device.path, inside), expect=3)
        assert "inside the device" in done.stderr and done.stderr.count("\n") == 1
        assert not os.path.exists(os.path.join(device.path, inside))
    os.symlink(os.path.join(device.path, "root"), tmp_path / "link")
    appsync("create", tmp_path / "link" / "new", expect=3)
    appsync("create", tmp_path / "beside")


def test_an_empty_path_can_be_seen(appsync, tmp_path):
    for command in (["apps"], ["status"], ["reset"], ["sync"], ["why", "com.a"], ["log"], ["backup"]):
        more = {"sync": [tmp_path], "backup": [tmp_path / "b"]}.get(command[0], command[1:])
        assert "there is no device at ''" in appsync(command[0], "", *more, expect=3).stderr
