"""The plug-in as a module: what its file offers, and sessions that are run with it."""

import os
import pathlib
import re
import shutil
import subprocess

import pytest

import packages
from conftest import Device

A, B, C = "com.example.a", "com.example.b", "com.example.c"


@pytest.fixture
def module(appsync):
    return pathlib.Path(appsync.program).resolve().parent / "appsync-plugin.so"


def test_the_module_exports_one_function(module):
    listed = subprocess.run(["nm", "--dynamic", "--defined-only", module], capture_output=True, text=True, check=True)
    assert [line.split()[1:] for line in listed.stdout.splitlines()] == [["T", "appsyncPlugInTable"]]


def test_the_version_tells_that_of_the_module_interface(appsync):
    assert re.fullmatch(r"appsync \d+\.\d+\.\d+, module interface \d+\.\d+\n", appsync("--version").stdout)


def without_time(summary):
    return {key: value for key, value in summary.items() if key != "seconds"}


def story_of(appsync, folder, coordination, *options):
    """What a few sessions print, and what they leave."""
    folder.mkdir()
    library = folder / "library"
    library.mkdir()
    for identifier in (A, B):
        packages.write_zip(library / (identifier + ".zip"), packages.entries(identifier))
    extra = folder / "extra.zip"
    packages.write_zip(extra, packages.entries(C))
    device = Device(appsync, folder / "device", coordination)
    story = [without_time(appsync.json("sync", device.path, library, *options))]
    packages.write_zip(library / (A + ".zip"), packages.entries(A, "2.0"))
    story.append(without_time(appsync.json("sync", device.path, library, "--remove", B, *options, expect=None)))
    story.append(without_time(appsync.json("send", device.path, C, extra, *options)))
    appsync("backup", device.path, folder / "backup")
    restored = Device(appsync, folder / "restored", coordination)
    story.append(without_time(appsync.json("restore", restored.path, folder / "backup", *options)))
    for each in (device, restored):
        story.append([{key: value for key, value in app.items() if key != "container"}
                      for app in appsync.json("apps", each.path)])
        story.append(appsync.json("inventory", each.path))
        messages = [re.sub(r"[0-9A-F-]{36}", "UUID", line.split(" ", 5)[-1])
                    for line in appsync("log", each.path).stdout.splitlines()]
        # How many placeholders are still to come at a moment is a matter of moments.
        messages = [re.sub(r"Count \d+", "Count", each) for each in messages if "Will wait for" not in each]
        story.append(sorted(set(messages)))
    return story


def test_sessions_with_the_module_are_as_those_without(appsync, tmp_path, coordination, module):
    plain = story_of(appsync, tmp_path / "plain", coordination)
    with_module = story_of(appsync, tmp_path / "module", coordination, "--plug-in", module)
    assert with_module == plain
    assert plain[0]["installed"] == [A, B]


def another_machine(data):
    data[18:20] = (b"\x28\x00")


def cut_short(data):
    del data[len(data) // 64:]


def no_object(data):
    data[:4] = b"text"


def another_symbol(data):
    data[:] = data.replace(b"appsyncPlugInTable\0", b"appsyncPlugInCable\0")


@pytest.mark.parametrize("spoil, told", [
    (another_machine, r"is built for ARM with 64 bits, and this command for .*: name a build for this machine"),
    (cut_short, r"is cut short: it has \d+ bytes of at least \d+: copy it anew"),
    (no_object, r"is no shared object: name a build of appsync-plugin\.so"),
    # What counts branches for fuzzing refers to the function by its name, so that nothing is loaded without it.
    pytest.param(another_symbol, r"has no appsyncPlugInTable, so it is no build of the plug-in: name a build of",
                 marks=pytest.mark.plain_build),
])
@pytest.mark.parametrize("command", ["sync", "send", "restore"])
def test_a_module_that_is_no_good_leaves_nothing_behind(appsync, tmp_path, module, command, spoil, told):
    bad = tmp_path / "bad.so"
    data = bytearray(module.read_bytes())
    spoil(data)
    bad.write_bytes(data)
    library = tmp_path / "library"
    packages.make_library(str(library), 1)
    device = Device(appsync, tmp_path / "device")
    before = device.tree(), sorted(os.listdir(device.path))
    arguments = {"sync": [library], "send": [A, next(library.glob("*.zip"))], "restore": [tmp_path / "backup"]}[command]
    refused = appsync(command, device.path, *arguments, "--plug-in", bad, expect=3)
    assert refused.stdout == ""
    assert re.fullmatch(r"appsync: /.*/bad\.so %s.*\n" % told, refused.stderr)
    assert (device.tree(), sorted(os.listdir(device.path))) == before


@pytest.mark.parametrize("name, told", [
    ("NoTable", r"has no appsyncPlugInTable, so it is no build of the plug-in: name a build of appsync-plugin\.so"),
    ("NullTable", r"gives no table: name a build of appsync-plugin\.so"),
    ("NoFunctions", r"lacks a function in its table: name a build of appsync-plugin\.so"),
    ("OtherMajorVersion", r"has version 42\.3 of the module interface, and this command wants 1\.x: name a build with"),
    ("NeedsMore", r"cannot be loaded: .*undefined symbol: appsyncTableOfAnotherLibrary: name a build of"),
    ("ThrowsWhenAsked", r"threw an exception while it was loaded: it does not say why: name a build that can be loaded"),
    ("ThrowsWhileLoaded", r"threw an exception while it was loaded: no licence: name a build that can be loaded"),
    ("AbortsWhileLoaded", r"ends the process that loads it, with signal 6: name a build of appsync-plugin\.so"),
    ("ExitsWhileLoaded", r"ends the process that loads it, with status 3: name a build of appsync-plugin\.so"),
])
def test_another_library_is_no_module_and_leaves_nothing_behind(appsync, tmp_path, module, name, told):
    other = module.parent / "tests" / "modules" / (name + ".so")
    library = tmp_path / "library"
    packages.make_library(str(library), 1)
    device = Device(appsync, tmp_path / "device")
    before = device.tree(), sorted(os.listdir(device.path))
    refused = appsync("sync", device.path, library, "--plug-in", other, expect=3)
    assert refused.stdout == ""
    assert re.fullmatch(r"appsync: /.*/%s\.so %s.*\n" % (name, told), refused.stderr)
    assert (device.tree(), sorted(os.listdir(device.path))) == before


def test_a_module_is_found_from_where_the_command_runs(appsync, tmp_path, module):
    shutil.copy(module, tmp_path / "mine.so")
    library = tmp_path / "library"
    packages.make_library(str(library), 1)
    Device(appsync, tmp_path / "device")
    done = subprocess.run([appsync.program, "sync", "device", "library", "--plug-in", "mine.so"], cwd=tmp_path,
                          capture_output=True, text=True)
    assert done.returncode == 0, done.stderr


def test_without_a_name_for_the_module_the_usage_is_wrong(appsync, tmp_path):
    assert "--plug-in needs a value" in appsync("sync", "device", "library", "--plug-in", expect=2).stderr
    assert "--plug-in" in appsync("sync", "device", "library", "--plug-in=", "x", expect=2).stderr
