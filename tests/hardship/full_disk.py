"""What test_full_disk.py runs in a mount namespace of its own, where DISK is a small disk.

    full_disk.py grow|look|remove|small|kept|former APPSYNC DISK FOLDER COORDINATION each|last
"""

import json
import os
import re
import shutil
import sqlite3
import subprocess
import sys
import tempfile

HERE = os.path.dirname(os.path.abspath(__file__))
sys.path.insert(0, os.path.join(HERE, "..", "acceptance"))
import packages

PAGE = 4  # KiB
WIDE = 48
SAYS_FULL = re.compile("is full|KiB of free space|bytes and [0-9]+ are free|No space left|does not fit|do not fit|missing")


class Disk:
    """A tmpfs that can be made larger and be filled to the last byte."""

    def __init__(self, where, kib):
        self.where = where
        self.mount(kib)

    def mount(self, kib):
        subprocess.run(["mount", "-t", "tmpfs", "-o", "size=%dk" % kib, "tmpfs", self.where], check=True)

    def remake(self, kib):
        """An empty one of that size: tmpfs shrinks only once what was removed has gone."""
        subprocess.run(["umount", self.where], check=True)
        self.mount(kib)

    def resize(self, kib):
        subprocess.run(["mount", "-o", "remount,size=%dk" % kib, self.where], check=True)

    def used(self):
        space = os.statvfs(self.where)
        return (space.f_blocks - space.f_bfree) * space.f_frsize // 1024

    def free(self):
        space = os.statvfs(self.where)
        return space.f_bavail * space.f_frsize

    def fill(self):
        """Takes all that is left, as somebody else's file."""
        with open(os.path.join(self.where, "ballast"), "ab", buffering=0) as file:
            try:
                while True:
                    file.write(bytes(4096))
            except OSError:
                pass
        assert self.free() == 0


class Runner:
    def __init__(self, program, disk, folder, coordination):
        self.program = program
        self.disk = disk
        self.device = os.path.join(disk.where, "device")
        self.library = os.path.join(folder, "library")
        self.folder = folder
        packages.make_library(self.library, 3)
        self.ok("create", self.device, "--coordination", coordination)

    def run(self, *arguments):
        done = subprocess.run([self.program, *arguments], capture_output=True, text=True, timeout=100)
        assert done.returncode in (0, 1, 3), (arguments, done.returncode, done.stdout, done.stderr)
        return done

    def ok(self, *arguments):
        done = self.run(*arguments)
        assert done.returncode == 0, (arguments, done.returncode, done.stdout, done.stderr)
        return done.stdout

    def refused(self, *arguments):
        """It fails, and says that the space does not suffice."""
        done = self.run(*arguments)
        said = done.stdout + done.stderr
        assert done.returncode != 0, (arguments, said)
        assert SAYS_FULL.search(said), (arguments, said)
        return said

    def check_intact(self):
        """A copy of the database is whole: looking at it in its place takes space."""
        with tempfile.TemporaryDirectory() as folder:
            for name in os.listdir(self.device):
                if name in ("device.db", "device.db-wal"):
                    shutil.copy(os.path.join(self.device, name), folder)
            database = sqlite3.connect(os.path.join(folder, "device.db"))
            assert database.execute("PRAGMA integrity_check").fetchall() == [("ok",)]
            database.close()


def grow(runner, sizes):
    """The disk grows until a sync fits; at each size it fails in a clear way and leaves the device whole."""
    base = os.path.join(runner.folder, "base")
    shutil.copytree(runner.device, base, symlinks=True)
    start = runner.disk.used()
    fits = first_fit(runner, start, WIDE)  # the device of one who tries again and again: its log grows
    print("the same device fits with %d KiB left" % (fits - start))
    # By single pages, from the beginning or the last ones, and each time with the device as it was.
    fits = first_fit(runner, start if sizes == "each" else fits - WIDE, PAGE, base)
    runner.check_intact()
    assert len(runner.ok("apps", runner.device).splitlines()) == 4
    print("fits with %d KiB left" % (fits - start))


def first_fit(runner, kib, stride, base=None):
    for attempt in range(1000):
        if base:
            runner.disk.remake(kib)
            shutil.copytree(base, runner.device, symlinks=True)
        else:
            runner.disk.resize(kib)
        done = runner.run("sync", runner.device, runner.library)
        if done.returncode == 0:
            return kib
        said = done.stdout + done.stderr
        assert SAYS_FULL.search(said), (kib, said)
        runner.ok("apps", runner.device)
        runner.check_intact()
        kib += stride
    raise AssertionError("never fits")


def look(runner, _):
    """With nothing left, everything can be looked at, and what takes room says why it cannot be done."""
    identifier = "com.example.app00"
    runner.ok("sync", runner.device, runner.library)
    runner.disk.fill()
    check_looks(runner, identifier)
    for arguments in (["set", runner.device, "installation=no"], ["run", runner.device, identifier]):
        runner.ok(*arguments)  # a record, for which the device keeps space back
        runner.disk.fill()
    runner.ok("backup", runner.device, os.path.join(runner.folder, "backup"))
    runner.disk.fill()
    assert "uninstall" in runner.refused("sync", runner.device, runner.library)
    runner.check_intact()
    check_looks(runner, identifier)


def check_looks(runner, identifier):
    device = runner.device
    assert identifier in runner.ok("apps", device)
    assert "installed" in runner.ok("why", device, identifier)
    runner.ok("inventory", device, "--json")
    assert runner.ok("history", device).count("\n") > 3
    assert runner.ok("log", device).count("\n") > 3
    runner.ok("coordinator", device, "list")
    runner.ok("screen", device, os.path.join(runner.folder, "screen.png"))
    runner.ok("plan", device, runner.library)  # nothing to do


def remove(runner, _):
    """With nothing left, an application can be removed all the same, and the sync data."""
    runner.ok("sync", runner.device, runner.library)
    base = os.path.join(runner.folder, "base")
    shutil.copytree(runner.device, base, symlinks=True)
    for arguments in (["uninstall", runner.device, "com.example.app00"], ["reset", runner.device],
                      ["sync", runner.device, runner.library, "--remove", "com.example.app00"],
                      ["demote", runner.device, "com.example.app01"]):
        shutil.rmtree(runner.device)
        shutil.copytree(base, runner.device, symlinks=True)
        runner.disk.fill()
        runner.ok(*arguments)
        runner.check_intact()
        if arguments[0] in ("uninstall", "sync"):
            assert "com.example.app00" not in runner.ok("apps", runner.device)
        os.remove(os.path.join(runner.disk.where, "ballast"))
        runner.ok("reset", runner.device)  # the end of a session: the device keeps a reserve again
        runner.disk.fill()
        runner.ok("uninstall", runner.device, "com.example.app02")
        os.remove(os.path.join(runner.disk.where, "ballast"))
        runner.ok("sync", runner.device, runner.library)
        assert len(runner.ok("apps", runner.device).splitlines()) == 4


def small(runner, _):
    """A device that is made where little space is left can be emptied when there is none; without space it is not made."""
    disk, device = runner.disk, runner.device
    shutil.rmtree(device)
    with open(os.path.join(disk.where, "others"), "wb") as file:
        file.write(bytes(disk.free() - (2 << 20)))
    runner.ok("create", device)
    assert os.path.getsize(os.path.join(device, "space.reserve")) == 256 << 10
    runner.ok("sync", device, runner.library)
    disk.fill()
    runner.refused("sync", device, runner.library)
    runner.ok("set", device, "removal=yes")
    runner.ok("uninstall", device, "com.example.app00")
    assert "com.example.app00" not in runner.ok("apps", device)
    check_made_again(runner)
    # Who has nothing kept back is not sent in a circle.
    os.remove(os.path.join(device, "space.reserve"))
    disk.fill()
    assert "appsync uninstall" not in runner.refused("uninstall", device, "com.example.app01")
    runner.check_intact()
    check_not_made(runner)


def check_made_again(runner):
    """What was given up is kept back again as soon as there is room, whoever ends or begins then."""
    reserve = os.path.join(runner.device, "space.reserve")
    for arguments in (["uninstall", runner.device, "com.example.app02"], ["sync", runner.device, runner.library]):
        os.remove(os.path.join(runner.disk.where, "ballast"))
        if os.path.exists(reserve):
            os.remove(reserve)
        runner.ok(*arguments)
        assert os.path.getsize(reserve) == 256 << 10, arguments
        runner.disk.fill()
    os.remove(os.path.join(runner.disk.where, "ballast"))


def check_not_made(runner):
    """On a disk with less space than a device takes to begin with, none is made and nothing is left."""
    shutil.rmtree(runner.device)
    ballast = os.path.join(runner.disk.where, "ballast")
    for kib in (0, 100, 400):
        runner.disk.fill()
        with open(ballast, "r+b") as file:
            file.truncate(os.path.getsize(ballast) - (kib << 10))
        before = sorted(os.listdir(runner.disk.where))
        runner.refused("create", runner.device)
        assert sorted(os.listdir(runner.disk.where)) == before


MIB = 1 << 20


def kept(runner, _):
    """What updates have replaced counts as free, and is given up when the room is needed: the oldest first."""
    update_both(runner)
    assert versions_kept(runner) == {"com.example.app00": "1.0", "com.example.app01": "1.0"}
    told, really = json.loads(runner.ok("status", runner.device, "--json"))["free"], runner.disk.free()
    assert 2 * MIB - 100_000 < told - really < 2 * MIB + 100_000, (told, really)  # who looks takes a little
    # A session has a mebibyte left beside what its packages take.
    packages.make_package(runner.library, "com.example.new", payload=os.urandom((really - MIB) // 2 + 200_000))
    runner.ok("sync", runner.device, runner.library)
    assert versions_kept(runner) == {"com.example.app01": "1.0"}
    data = os.path.join(runner.folder, "data")
    os.mkdir(data)
    with open(os.path.join(data, "large"), "wb") as file:
        file.write(bytes(runner.disk.free() + 100_000))
    runner.ok("data", "push", runner.device, "com.example.app00", data)
    assert versions_kept(runner) == {}
    runner.check_intact()
    assert len(runner.ok("apps", runner.device).splitlines()) == 4


def update_both(runner):
    """One application after the other, with a mebibyte that no disk can hold in less."""
    for name in os.listdir(runner.library):
        os.remove(os.path.join(runner.library, name))
    for identifier, version in (("00", "1.0"), ("01", "1.0"), ("00", "2.0"), ("01", "2.0")):
        packages.make_package(runner.library, "com.example.app" + identifier, version, payload=os.urandom(MIB))
        runner.ok("sync", runner.device, runner.library)


def versions_kept(runner):
    apps = json.loads(runner.ok("apps", runner.device, "--json"))
    return {app["identifier"]: app["kept"]["version"] for app in apps if app["kept"]}


# More than what the device keeps back has room for a second time.
MUCH_HISTORY = """
WITH RECURSIVE numbers (number) AS (SELECT 1 UNION ALL SELECT number + 1 FROM numbers WHERE number < 3000)
INSERT INTO history (time, kind, scenario, step, party, phase, success, identifier, description)
SELECT number, 1, '', 1, 2, 0, 1, 'com.example.app00', 'a step like three thousand others, of an application' FROM numbers;
"""


def former(runner, _):
    """One of an earlier version serves a session where there is no room to make it one of this version, until there is."""
    runner.ok("sync", runner.device, runner.library)
    with open(os.path.join(HERE, "..", "device", "version4.sql")) as file:
        on_database(runner, file.read() + MUCH_HISTORY)
    assert schema(runner) == 4
    runner.disk.fill()
    runner.ok("sync", runner.device, runner.library, "--remove", "com.example.app00")
    assert schema(runner) == 4
    os.remove(os.path.join(runner.disk.where, "ballast"))
    leave(runner.disk, MIB // 2)
    packages.make_package(runner.library, "com.example.app01", "2.0")
    runner.ok("sync", runner.device, runner.library)
    assert versions_kept(runner) == {"com.example.app01": "1.0"}
    runner.ok("rollback", runner.device, "com.example.app01")
    runner.ok("demote", runner.device, "com.example.app02")
    assert len(runner.ok("apps", runner.device).splitlines()) == 4
    assert schema(runner) == 4
    os.remove(os.path.join(runner.disk.where, "ballast"))
    runner.ok("reset", runner.device)  # in a session
    assert schema(runner) == 5
    assert versions_kept(runner) == {"com.example.app01": "2.0"}
    runner.check_intact()


def leave(disk, free):
    """Somebody else's file takes all but so much."""
    with open(os.path.join(disk.where, "ballast"), "wb") as file:
        file.write(bytes(disk.free() - free))


def on_database(runner, script):
    database = sqlite3.connect(os.path.join(runner.device, "device.db"))
    database.executescript(script)
    database.close()


def schema(runner):
    """What the file's header says, as opening the database takes space."""
    with open(os.path.join(runner.device, "device.db"), "rb") as file:
        file.seek(60)
        return int.from_bytes(file.read(4), "big")


def main():
    what, program, where, folder, coordination, sizes = sys.argv[1:]
    disk = Disk(where, 2048 if what == "grow" else 8192)
    {"grow": grow, "look": look, "remove": remove, "small": small, "kept": kept,
     "former": former}[what](Runner(program, disk, folder, coordination), sizes)


main()
