"""What the catalogue is run with: devices, a backup, and a measured command."""

import json
import os
import pathlib
import plistlib
import shutil
import subprocess
import sys
import tempfile

import pytest

HERE = pathlib.Path(__file__).resolve().parent
sys.path[:0] = [str(HERE), str(HERE.parent / "acceptance")]

import packages  # noqa: E402
from processes import is_sanitized, leave_out_what_measures  # noqa: E402

APPS = ["com.example.app00", "com.example.app01"]
TIMEOUT = 30  # seconds by the wall clock, for a command that hangs
# The device lies so deep that what would climb out of it stays where it is looked for.
DEEP = "1/2/3/4/5/6"


def pytest_collection_modifyitems(config, items):
    leave_out_what_measures(config, items)


class Done:
    def __init__(self, told, out, err):
        self.status, self.late = told["status"], told["late"]
        self.seconds, self.kilobytes = told["seconds"], told["kilobytes"]
        self.out, self.err = out, err

    def json(self):
        return json.loads(self.out)


class Command:
    """The built command, which each run of is measured."""

    def __init__(self, program, directory):
        self.program = program
        self.out, self.err = os.path.join(directory, "out"), os.path.join(directory, "err")
        self.environment = dict(os.environ, XDG_CACHE_HOME=str(directory))
        # What was freed stays in the sanitizer's quarantine: that is not the command's need.
        self.environment["ASAN_OPTIONS"] = ":".join(
            filter(None, [os.environ.get("ASAN_OPTIONS"), "quarantine_size_mb=4"]))
        self.process = subprocess.Popen(
            ["/usr/bin/python3", "-S", "-E", str(HERE / "measure.py")],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)

    @property
    def is_sanitized(self):
        return is_sanitized(self.program)

    def __call__(self, *arguments, directory="/"):
        order = {"command": [self.program, *map(str, arguments)], "timeout": TIMEOUT,
                 "environment": self.environment, "out": self.out, "err": self.err,
                 "directory": str(directory)}
        self.process.stdin.write(json.dumps(order) + "\n")
        self.process.stdin.flush()
        told = json.loads(self.process.stdout.readline())
        with open(self.out, errors="replace") as out, open(self.err, errors="replace") as err:
            return Done(told, out.read(), err.read())

    def good(self, *arguments):
        done = self(*arguments)
        assert done.status == 0, done.err
        return done

    def close(self):
        self.process.stdin.close()
        self.process.wait()


@pytest.fixture(scope="session")
def scratch():
    """In memory, where the machine has room there: nothing here is about the disk."""
    place = "/dev/shm" if os.access("/dev/shm", os.W_OK) else None
    if place and shutil.disk_usage(place).free < 200 << 20:
        place = None
    with tempfile.TemporaryDirectory(dir=place, prefix="appsync-rubbish-") as path:
        yield pathlib.Path(path)


@pytest.fixture(scope="session")
def appsync(scratch):
    program = os.environ.get("APPSYNC")
    if not program:
        pytest.exit("set APPSYNC to the command to test", returncode=2)
    command = Command(os.path.abspath(program), scratch)
    yield command
    command.close()


@pytest.fixture(scope="session")
def templates(appsync, scratch):
    """What the entries get copies of: devices, empty and used, on both paths; a library; a backup."""
    top = scratch / "templates"
    top.mkdir()
    packages.make_library(str(top / "library"), 2)
    for name, coordination in (("direct", "off"), ("coordinated", "on")):
        appsync.good("create", top / ("empty-" + name), "--coordination", coordination)
        shutil.copytree(top / ("empty-" + name), top / ("used-" + name), symlinks=True)
        appsync.good("sync", top / ("used-" + name), top / "library")
    used = top / "used-direct"
    for identifier in APPS:
        data = used / "root/var/mobile/Containers/Data" / identifier
        data.mkdir(parents=True)
        (data / "letter").write_bytes(b"Dear")
    appsync.good("demote", used, APPS[1])
    appsync.good("backup", used, top / "backup")
    appsync.good("send", used, APPS[1], top / "library" / (APPS[1] + ".zip"))
    shutil.copytree(used, top / "without-icon", symlinks=True)
    for icon in (top / "without-icon").rglob("App00.app/Icon.png"):
        icon.unlink()
    appsync.good("screen", top / "without-icon", top / "letter.png")
    with open(top / "library" / "IconOrder.plist", "wb") as file:
        plistlib.dump(APPS, file)
    return top


@pytest.fixture(scope="session")
def base(appsync, templates):
    """What the process takes before it has read anything foreign, in kilobytes."""
    return appsync.good("apps", templates / "used-direct").kilobytes
