"""What an entry of the catalogue consists of, and the place that it is laid out in."""

import contextlib
import dataclasses
import hashlib
import json
import os
import pathlib
import shutil
import sqlite3
import stat
from typing import Callable, Optional, Union

from conftest import APPS, DEEP


@dataclasses.dataclass
class Entry:
    """Rubbish, who gets it, and what must come of it.

    `make(place)` lays it out; what it returns, if anything, is the content of the file `input`.
    """

    name: str
    make: Callable
    command: tuple  # words; "{input}" and the like are paths of the place
    status: Union[int, tuple]  # more than one only where docs/reliability.md says why
    says: str = ""  # a piece of what standard error, or the failure, says
    identifier: Optional[str] = None  # of the failure in the JSON object that is printed
    device: str = "used-direct"  # which template the device is a copy of
    also: Optional[Callable] = None  # also(place, done): what else must hold


class Place:
    """A directory for one entry; everything but the device in it must stay as it is."""

    def __init__(self, top, templates, device):
        self.top, self.templates = pathlib.Path(top), pathlib.Path(templates)
        self.deep = self.top / DEEP
        shutil.rmtree(self.top, ignore_errors=True)
        self.deep.mkdir(parents=True)
        self.outside = self.top / "outside"
        self.outside.mkdir()
        (self.outside / "secret").write_bytes(b"secret")
        self.input = self.deep / "input"
        self.device = self.deep / "device"
        self.library = self.templates / "library"
        self.hostile = self.deep / "hostile"  # a library of the entry's own
        self.backup = self.deep / "backup"
        self.out = self.deep / "device" / "out"
        self.before = {}  # the device's tree before the command
        if device:
            shutil.copytree(self.templates / device, self.device, symlinks=True)

    def inside(self, path):
        return self.device / "root" / path.lstrip("/")

    def write_inside(self, path, content):
        target = self.inside(path)
        target.parent.mkdir(parents=True, exist_ok=True)
        target.write_bytes(content)

    def container_of(self, identifier):
        with contextlib.closing(sqlite3.connect(self.device / "device.db")) as database:
            (name,) = database.execute("SELECT container FROM applications WHERE identifier = ?",
                                       (identifier,)).fetchone()
        return self.inside("/var/containers/Bundle/Application/" + name)

    def alter(self, *statements):
        """Changes the device's database."""
        database = sqlite3.connect(self.device / "device.db")
        for statement in statements:
            database.execute(*((statement,) if isinstance(statement, str) else statement))
        database.commit()
        database.close()

    def use_backup(self):
        shutil.copytree(self.templates / "backup", self.backup)

    def resign(self):
        """Makes the manifest of the backup true again."""
        path = self.backup / "manifest.json"
        manifest = json.loads(path.read_text())
        for file in self.backup.rglob("*"):
            name = str(file.relative_to(self.backup))
            if name != "manifest.json" and file.is_file():
                content = file.read_bytes()
                manifest["files"][name] = {"size": len(content),
                                           "sha256": hashlib.sha256(content).hexdigest()}
        path.write_text(json.dumps(manifest))

    def words(self, command):
        paths = {name: str(getattr(self, name))
                 for name in ("input", "device", "library", "hostile", "backup", "out", "outside")}
        return [word.format(**paths) if "{" in word else word for word in command]

    def outside_tree(self):
        """Everything outside the device: kind, mode, time of change and content of each path."""
        return {path: appearance(path) for path in self.paths_below(self.top)}

    def device_tree(self):
        """The kind and content of each file and directory that the device keeps."""
        found = {}
        for path in self.paths_below(self.device / "root"):
            mode, _, content = appearance(path)
            found[os.path.relpath(path, self.device / "root")] = (stat.S_IFMT(mode), content)
        return found

    def paths_below(self, folder):
        for base, folders, files in os.walk(folder):
            if pathlib.Path(base) == self.deep and "device" in folders:
                folders.remove("device")
            for name in folders + files:
                yield os.path.join(base, name)


def appearance(path):
    status = os.lstat(path)
    content = b""
    if os.path.islink(path):
        content = os.readlink(path).encode()
    elif os.path.isfile(path):
        with open(path, "rb") as file:
            content = hashlib.sha256(file.read()).digest()
    changed = 0 if os.path.isdir(path) else status.st_mtime_ns
    return status.st_mode, changed, content


def both_are_there(place, done):
    """The applications that were installed before are installed still."""
    for identifier in APPS:
        assert (place.container_of(identifier) / (identifier[12:].title() + ".app") / "main").exists()
