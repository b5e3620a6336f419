"""Sessions that are recorded, what a recording shows, and replays of it."""

import json
import shutil
import signal
import time

import pytest

import packages
from conftest import Device


@pytest.fixture
def library(tmp_path):
    folder = tmp_path / "library"
    packages.make_library(folder, 4)
    return folder


def replayed(appsync, recording, *options):
    outcome = appsync.json("replay", recording, *options)
    assert outcome["divergence"] is None
    assert outcome["lines"] == outcome["of"]
    return outcome


def test_a_sync_replays(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library, "--record", tmp_path / "first")
    assert not replayed(appsync, tmp_path / "first", "--strict")["cutOff"]
    packages.make_package(library, "com.example.app01", "2.0")
    device.sync(library, "--remove", "com.example.app00", "--record", tmp_path / "second")
    replayed(appsync, tmp_path / "second", "--strict")


def test_a_recorded_session_does_what_any_does(appsync, tmp_path, library, coordination):
    plain, recorded = (Device(appsync, tmp_path / name, coordination) for name in ("plain", "recorded"))
    plain.sync(library)
    recorded.sync(library, "--record", tmp_path / "recording")
    assert plain.versions() == recorded.versions()


def test_a_recording_takes_little_room_for_each_application(appsync, tmp_path, coordination):
    packages.make_library(tmp_path / "many", 40)
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(tmp_path / "many", "--record", tmp_path / "recording")
    assert (tmp_path / "recording").stat().st_size < 40 * 20 * 1024


def test_a_restore_replays(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    appsync("backup", device.path, tmp_path / "backup")
    restored = Device(appsync, tmp_path / "restored", coordination)
    appsync("restore", restored.path, tmp_path / "backup", "--record", tmp_path / "recording")
    replayed(appsync, tmp_path / "recording")


def test_one_package_replays(appsync, tmp_path, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    package = packages.make_package(tmp_path, "com.example.one")
    appsync("send", device.path, "com.example.one", package, "--record", tmp_path / "recording")
    replayed(appsync, tmp_path / "recording")


def test_a_session_that_fails_replays_from_the_file_alone(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    (library / "com.example.app02.zip").write_bytes(b"rubbish")
    appsync("run", device.path, "com.example.app01", expect=None)
    device.sync(library, "--record", tmp_path / "recording", expect=1)
    elsewhere = tmp_path / "elsewhere" / "recording"
    elsewhere.parent.mkdir()
    shutil.move(tmp_path / "recording", elsewhere)
    shutil.rmtree(device.path)
    shutil.rmtree(library)
    replayed(appsync, elsewhere)


def test_a_session_that_is_killed_replays_to_where_it_was(appsync, tmp_path, library, coordination):
    device = Device(appsync, tmp_path / "device", coordination)
    device.sync(library)
    appsync("run", device.path, "com.example.app00")
    packages.make_package(library, "com.example.app00", "2.0")
    recording = tmp_path / "recording"
    process = appsync.start("sync", device.path, library, "--record", recording)
    deadline = time.monotonic() + 60
    while "TerminationAssertion" not in (recording.read_text() if recording.exists() else "") \
            and time.monotonic() < deadline and process.poll() is None and not device.is_coordinated:
        time.sleep(0.02)
    while device.is_coordinated and time.monotonic() < deadline and \
            "assetTransferEndedWithSuccess" not in (recording.read_text() if recording.exists() else ""):
        time.sleep(0.02)
    process.send_signal(signal.SIGKILL)
    process.communicate()
    assert replayed(appsync, recording)["cutOff"]
    shown = appsync("replay", recording).stdout
    assert "cut off" in shown


def test_the_module_replays_what_the_command_recorded(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device")
    device.sync(library, "--record", tmp_path / "recording")
    module = str(appsync.program).rpartition("/")[0] + "/appsync-plugin.so"
    replayed(appsync, tmp_path / "recording", "--plug-in", module)


def test_a_divergence_is_shown(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device")
    recording = tmp_path / "recording"
    device.sync(library, "--record", recording)
    lines = recording.read_text().splitlines(keepends=True)
    place = next(number for number, line in enumerate(lines) if '"AppRegistry.installPackage"' in line)
    lines[place] = lines[place].replace("com.example.app", "com.example.other", 1)
    recording.write_text("".join(lines))
    shown = appsync("replay", recording, expect=1).stdout
    assert "expected: AppRegistry.installPackage(" in shown and "com.example.other" in shown
    assert "came:     AppRegistry.installPackage(" in shown
    divergence = appsync.json("replay", recording, expect=1)["divergence"]
    assert "takeTerminationAssertion" in "".join(divergence["before"]) and len(divergence["before"]) <= 10
    assert divergence["thread"] > 1


def test_a_recording_is_shown(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device")
    recording = tmp_path / "recording"
    device.sync(library, "--record", recording)
    everything = appsync.json("recording", "show", recording)
    assert not everything["anonymous"] and not everything["cutOff"]
    lines = everything["lines"]
    assert [line["name"] for line in lines[:1]] == ["makeClient"]

    def shown(*options):
        return appsync.json("recording", "show", recording, *options)["lines"]

    about = shown("--app", "com.example.app02")
    assert 0 < len(about) < len(lines) and all("com.example.app02" in json.dumps(line) for line in about)
    assert all(line["name"].startswith("FileSystem.") for line in shown("--service", "FileSystem"))
    assert {line["thread"] for line in shown("--thread", 1)} == {1}
    middle = lines[len(lines) // 2]["seconds"]
    assert len(shown("--from", middle)) + len(shown("--to", middle)) >= len(lines)
    assert all(line["seconds"] >= middle for line in shown("--from", middle))
    for options in (("--app", "com.example.none"), ("--thread", "99")):
        assert appsync("recording", "show", recording, *options).stdout == "no line fits, of %d lines\n" % len(lines)
    told = appsync("recording", "show", recording, "--service", "FileSystems").stdout
    assert "FileSystem, " in told and "AppRegistry, " in told
    table = appsync("recording", "show", recording).stdout.splitlines()
    assert table[0].split() == ["SECONDS", "THREAD", "WHAT"] and len(table) == len(lines) + 1


def test_an_anonymous_recording_holds_nothing_of_the_original(appsync, tmp_path, coordination):
    library = tmp_path / "library"
    for name in ("orchid", "walrus"):
        packages.make_package(library, "net.zephyr." + name)
    device = Device(appsync, tmp_path / "device", coordination)
    recording = tmp_path / "recording"
    device.sync(library, "--record", recording, "--anonymous")
    text = recording.read_text().lower()
    for original in ("zephyr", "orchid", "walrus", "account-1", "payload"):
        assert original not in text
    assert appsync.json("recording", "show", recording)["anonymous"]
    assert "anonymous" in appsync("replay", recording, expect=3).stderr


def test_a_recording_is_not_written_over_another_file(appsync, tmp_path, library):
    device = Device(appsync, tmp_path / "device")
    kept = tmp_path / "kept"
    kept.write_text("kept")
    refused = appsync("sync", device.path, library, "--record", kept, expect=2)
    assert str(kept) in refused.stderr and kept.read_text() == "kept"
    appsync("sync", device.path, library, "--anonymous", expect=2)
    appsync("sync", device.path, library, "--dry-run", "--record", tmp_path / "new", expect=2)
    assert device.apps() == {}


def test_a_session_that_never_began_leaves_no_recording(appsync, tmp_path, library):
    appsync("sync", tmp_path / "nothing", library, "--record", tmp_path / "recording", expect=3)
    assert not (tmp_path / "recording").exists()


@pytest.mark.parametrize("damage", ["empty", "rubbish", "version", "reordered", "long", "zeros", "missing"])
def test_a_hostile_recording_gets_a_sentence(appsync, tmp_path, damage):
    header = '{"recording":1,"plug-in":"1","process":"p","bundle":"b","anonymous":false}\n'
    call = '{"t":5,"w":1,"host":"makeClient"}\n'
    text = {
        "empty": "",
        "rubbish": "rubbish\n" * 100,
        "version": header.replace("1", "3", 1),
        "reordered": header + call + '{"t":4,"w":1,"end":true}\n',
        "long": header + "x" * (17 << 20) + "\n",
        "zeros": "\0" * 4096,
        "missing": None,
    }[damage]
    recording = tmp_path / "recording"
    if text is not None:
        recording.write_text(text)
    for command in (("recording", "show"), ("replay",)):
        refused = appsync(*command, recording, expect=3)
        assert len(refused.stderr.splitlines()) == 1 and refused.stdout == ""


def test_a_gigabyte_in_one_line_gets_a_sentence(appsync, tmp_path):
    recording = tmp_path / "recording"
    with open(recording, "wb") as file:
        file.truncate(1 << 30)
    assert len(appsync("replay", recording, expect=3).stderr.splitlines()) == 1
