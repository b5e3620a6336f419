"""Small devices to do something to, and what can be seen of one afterwards."""

import contextlib
import hashlib
import json
import os
import plistlib
import re
import shutil
import sqlite3
import stat
import subprocess
import sys

import packages
from conftest import HERE, acceptance

LIMIT = 100  # seconds for one command: some wait half a minute for a second try
NEW, STAYS, GOES, UPDATED = ["com.example." + name for name in ("new", "stays", "goes", "updated")]
# Times, processes, and identities that are new each time.
PASSING = {"time", "created", "arrived", "next_try", "process", "started", "unsynced_boot", "id", "coordinator",
           "container"}
UUID = re.compile(r"[0-9A-F]{8}-[0-9A-F]{4}-[0-9A-F]{4}-[0-9A-F]{4}-[0-9A-F]{12}", re.IGNORECASE)


class Outcome:
    """How a command ended, and the call that was meddled with."""

    def __init__(self, done, report):
        self.status = report["status"]
        self.count = report["count"]
        self.hit = report["hit"]
        self.calls = report.get("calls")
        self.said = (done.stdout + done.stderr).strip()
        self.error = done.stderr.strip()


class Scenario:
    """A device as it is before a command, and the command."""

    def __init__(self, appsync, folder, coordination):
        self.appsync = appsync
        self.folder = str(folder)
        self.base = os.path.join(self.folder, "base")
        self.device = os.path.join(self.folder, "device")
        self.coordination = coordination
        self.prepare()

    def fresh(self):
        shutil.rmtree(self.device, ignore_errors=True)
        subprocess.run(["cp", "-a", self.base, self.device], check=True)

    def meddled(self, *options):
        """Runs the command on a fresh device with meddle.py's options."""
        self.fresh()
        reading, writing = os.pipe()
        command = [sys.executable, "-S", "-E", str(HERE / "meddle.py"), "--within", self.device, "--report",
                   str(writing), *map(str, options), "--", self.appsync.program, *self.command()]
        try:
            done = subprocess.run(command, stdin=subprocess.DEVNULL, capture_output=True, text=True,
                                  timeout=LIMIT, pass_fds=[writing])
        finally:
            os.close(writing)
        with open(reading) as report:
            text = report.read()
        assert done.returncode == 0 and text, done.stderr
        return Outcome(done, json.loads(text))

    def logged(self):
        """What the device has logged since it was fresh."""
        before, log = (os.path.join(each, "log", "system.log") for each in (self.base, self.device))
        with open(log, errors="replace") as file:
            file.seek(os.path.getsize(before) if os.path.exists(before) else 0)
            return file.read()

    def again(self):
        self.appsync(*self.command(), timeout=LIMIT)

    def expected(self):
        """What the device is after a run that nothing disturbs, and after a second one, which changes nothing
        but what is left of the first: its list, what it took over for it, and temporary files.
        """
        self.fresh()
        self.again()
        first = look_at(self.device)
        self.again()
        second = look_at(self.device)
        check_same(without_session(first), without_session(second))
        return second

    def check(self, expected, kept=lambda seen: seen):
        """The device is intact as it is, and the same command brings it where it belongs, in all that is `kept`."""
        check_intact(self.appsync, self.device)
        self.again()
        check_same(kept(without_session(expected)), kept(without_session(look_at(self.device))))
        self.again()
        check_same(kept(expected), kept(look_at(self.device)), "after one run more ")


    @staticmethod
    def what_an_end_leaves(seen):
        """What must be the same after a kill, or a failure, and a second run as after one run that nothing disturbs."""
        return seen

    def follow_up(self):
        """What the command is for can be done afterwards."""


class Sync(Scenario):
    """One application is installed, one is updated, one is removed, one stays."""

    def prepare(self):
        device = acceptance.Device(self.appsync, self.base, self.coordination)
        before = os.path.join(self.folder, "before")
        for identifier in (STAYS, GOES, UPDATED):
            packages.make_package(before, identifier)
        device.sync(before)
        self.library = os.path.join(self.folder, "library")
        packages.make_package(self.library, STAYS)
        packages.make_package(self.library, NEW)
        packages.make_package(self.library, UPDATED, "2.0")
        with open(os.path.join(self.library, "IconOrder.plist"), "wb") as file:
            plistlib.dump([UPDATED, NEW, STAYS], file)

    def command(self):
        return ["sync", self.device, self.library, "--remove", GOES]


class FormerSync(Sync):
    """The same on a device that an earlier version of the program has made."""

    def prepare(self):
        super().prepare()
        script = (HERE.parent / "device" / "version4.sql").read_text()
        with contextlib.closing(sqlite3.connect(os.path.join(self.base, "device.db"))) as database:
            database.executescript(script)


class Restore(Scenario):
    """A backup of an application with data and of an offloaded one comes onto an empty device."""

    def prepare(self):
        source = acceptance.Device(self.appsync, os.path.join(self.folder, "source"), self.coordination)
        self.library = library = os.path.join(self.folder, "library")
        for identifier in (STAYS, UPDATED):
            packages.make_package(library, identifier)
        source.sync(library)
        data = source.inside("/var/mobile/Containers/Data/" + STAYS)
        os.makedirs(data, exist_ok=True)
        with open(os.path.join(data, "notes"), "w") as file:
            file.write("to be kept\n")
        self.appsync("demote", source.path, UPDATED)
        self.backup = os.path.join(self.folder, "backup")
        self.appsync("backup", source.path, self.backup)
        acceptance.Device(self.appsync, self.base, self.coordination)

    def command(self):
        return ["restore", self.device, self.backup]

    @staticmethod
    def what_an_end_leaves(seen):
        # The coordinator of the offloaded application may stand yet, and what it was made from; the next sync goes on.
        seen = leave_out(seen, paths="^root/var/mobile/tmp/")
        for table in ("coordinators", "promises"):
            seen["tables"][table] = [row for row in seen["tables"][table] if row["identifier"] != UPDATED]
        return seen

    def follow_up(self):
        if self.coordination == "off":
            return
        self.appsync("store", self.device, self.library)
        self.appsync("sync", self.device, self.library)
        states = {app["identifier"]: app["state"] for app in self.appsync.json("apps", self.device)}
        assert states == {STAYS: "installed", UPDATED: "installed"}, states
        with open(os.path.join(self.device, "root/var/mobile/Containers/Data", STAYS, "notes")) as file:
            assert file.read() == "to be kept\n"


class Push(Scenario):
    """The data of an application is replaced."""

    OLD, CHANGED = {"notes": b"old\n", "gone": b"old\n"}, {"notes": b"new\n", "deep/er": bytes(300_000)}

    def prepare(self):
        device = acceptance.Device(self.appsync, self.base, self.coordination)
        library = os.path.join(self.folder, "library")
        packages.make_package(library, STAYS)
        device.sync(library)
        self.source = os.path.join(self.folder, "data")
        self.write(device.inside("/var/mobile/Containers/Data/" + STAYS), self.OLD)
        self.write(self.source, self.CHANGED)

    @staticmethod
    def write(folder, files):
        for name, content in files.items():
            path = os.path.join(folder, name)
            os.makedirs(os.path.dirname(path), exist_ok=True)
            with open(path, "wb") as file:
                file.write(content)

    def command(self):
        return ["data", "push", self.device, STAYS, self.source, "--yes"]

    def check(self, expected, kept=lambda seen: seen):
        top = os.path.join(self.device, "root/var/mobile/Containers/Data", STAYS)
        there = {}
        for base, _, names in os.walk(top):
            for name in names:
                with open(os.path.join(base, name), "rb") as file:
                    there[os.path.relpath(os.path.join(base, name), top)] = file.read()
        assert there in (self.OLD, self.CHANGED), there.keys()
        super().check(expected, kept)


class Rollback(Scenario):
    """An update is undone, of an application of which an earlier version is kept."""

    def prepare(self):
        device = acceptance.Device(self.appsync, self.base, self.coordination)
        library = os.path.join(self.folder, "library")
        for version in ("1.0", "2.0"):
            packages.make_package(library, UPDATED, version)
            packages.make_package(library, STAYS)
            device.sync(library)

    def command(self):
        return ["rollback", self.device, UPDATED]

    def versions(self):
        (app,) = [app for app in self.appsync.json("apps", self.device) if app["identifier"] == UPDATED]
        return app["version"], app["kept"] and app["kept"]["version"]

    def expected(self):
        self.fresh()
        self.again()
        return look_at(self.device)

    def check(self, expected, kept=lambda seen: seen):
        """One of the two is installed, whole, and the other is kept; each rollback exchanges them."""
        check_intact(self.appsync, self.device)
        before = self.versions()
        assert before in (("2.0", "1.0"), ("1.0", "2.0")), before
        self.again()
        assert self.versions() == before[::-1]
        check_kept(self.device)
        self.again()
        assert self.versions() == before
        check_kept(self.device)


def check_kept(device):
    """The containers that records name are there, each in its place with its program, and no others."""
    database = sqlite3.connect(os.path.join(device, "device.db"))
    try:
        for table, folder in (("applications", "root/var/containers/Bundle/Application"), ("kept", "kept")):
            rows = database.execute("SELECT container, bundle, version FROM " + table).fetchall()
            top = os.path.join(device, folder)
            assert sorted(os.listdir(top)) == sorted(container for container, _, _ in rows), table
            for container, bundle, version in rows:
                with open(os.path.join(top, container, bundle, "Info.plist"), "rb") as file:
                    assert plistlib.load(file)["BundleVersion"] == version
    finally:
        database.close()


SCENARIOS = {
    "sync": lambda appsync, folder: Sync(appsync, folder, "off"),
    "coordinated-sync": lambda appsync, folder: Sync(appsync, folder, "on"),
    "former-sync": lambda appsync, folder: FormerSync(appsync, folder, "off"),
    "restore": lambda appsync, folder: Restore(appsync, folder, "off"),
    "coordinated-restore": lambda appsync, folder: Restore(appsync, folder, "on"),
    "rollback": lambda appsync, folder: Rollback(appsync, folder, "off"),
    "data-push": lambda appsync, folder: Push(appsync, folder, "off"),
}


def check_intact(appsync, device):
    """The database is whole, with what a crash has left of it as it is, and the device can be looked at."""
    database = sqlite3.connect(os.path.join(device, "device.db"))
    try:
        assert database.execute("PRAGMA integrity_check").fetchall() == [("ok",)]
        assert database.execute("PRAGMA foreign_key_check").fetchall() == []
    finally:
        database.close()
    appsync("apps", device)


def look_at(device):
    """All that can be seen of a device, but for identities that are new each time, times, and the log."""
    database = sqlite3.connect(os.path.join(device, "device.db"))
    database.row_factory = sqlite3.Row
    try:
        owners = {}
        for table in ("applications", "placeholders", "kept"):
            for row in database.execute("SELECT identifier, container FROM " + table):
                owners[row["container"]] = "<%s of %s>" % (table, row["identifier"])
        return {"tables": rows_of(database), "tree": tree_of(device, owners)}
    finally:
        database.close()


def without_session(seen):
    """The same without the work area and the temporary files of the last session."""
    passing = ("root/var/mobile/Library/ApplicationSync/", "root/var/mobile/tmp/")
    kept = {path: what for path, what in seen["tree"].items() if not path.startswith(passing)}
    return {"tables": seen["tables"], "tree": kept}


def rows_of(database):
    tables = [row[0] for row in database.execute("SELECT name FROM sqlite_master WHERE type = 'table'")]
    whose = {row["id"]: row["identifier"] for row in database.execute("SELECT id, identifier FROM coordinators")}
    result = {}
    for table in tables:
        if table in ("history", "sqlite_sequence"):
            continue
        rows = [{name: value for name, value in dict(row).items() if name not in PASSING}
                for row in database.execute("SELECT * FROM " + table)]
        if table == "promises":
            rows = [{**row, "identifier": whose[coordinator]} for row, (coordinator,) in zip(
                rows, database.execute("SELECT coordinator FROM promises"))]
        result[table] = sorted(rows, key=repr)
    return result


def tree_of(device, owners):
    """Path, kind, permissions and content of everything below the root and beside the database."""
    result = {}
    for base, folders, files in os.walk(device):
        for name in folders + files:
            path = os.path.join(base, name)
            shown = UUID.sub(lambda found: owners.get(found.group(), found.group()), os.path.relpath(path, device))
            if not shown.startswith(("device.db", "log/")):
                result[shown] = appearance(path)
    return result


def appearance(path):
    status = os.lstat(path)
    content = None
    if stat.S_ISREG(status.st_mode):
        with open(path, "rb") as file:
            content = hashlib.sha256(file.read()).hexdigest()[:16]
    elif stat.S_ISLNK(status.st_mode):
        content = os.readlink(path)
    return oct(status.st_mode), status.st_uid, status.st_gid, content


def leave_out(seen, tables=(), paths=None, columns=None):
    """The same without these tables, the paths that match, and these columns of tables."""
    rows = {name: list(rows) for name, rows in seen["tables"].items() if name not in tables}
    for name, left_out in (columns or {}).items():
        rows[name] = [{key: value for key, value in row.items() if key not in left_out} for row in rows[name]]
    tree = {path: what for path, what in seen["tree"].items() if not (paths and re.search(paths, path))}
    return {"tables": rows, "tree": tree}


def check_same(expected, seen, when=""):
    lines = []
    for part in ("tables", "tree"):
        for key in sorted(expected[part].keys() | seen[part].keys()):
            one, other = expected[part].get(key), seen[part].get(key)
            if one != other:
                lines.append("%s: %sexpected %s, there is %s" % (key, when, one, other))
    if lines:
        raise AssertionError("\n".join(lines))
