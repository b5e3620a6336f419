"""Drives the built command, named by the environment variable APPSYNC, as a user does."""

import json
import os
import subprocess
import zlib

import pytest

import packages
from processes import leave_out_what_measures, with_default_signals

TIMEOUT = float(os.environ.get("APPSYNC_TEST_TIMEOUT", "120"))


def pytest_collection_modifyitems(config, items):
    leave_out_what_measures(config, items)
    if os.environ.get("APPSYNC_SHORT"):
        leave_out_most(config, items)


def leave_out_most(config, items):
    """Of a scenario that runs on both paths, one; of the rest, a quarter. Which, the names decide."""
    one_path = [item for item in items if not has_twin(item) or path_of(item) == choice(item)]
    chosen = [item for item in one_path if zlib.crc32(item.name.encode()) % 4 == 0]
    config.hook.pytest_deselected(items=[item for item in items if item not in chosen])
    items[:] = chosen


def has_twin(item):
    return path_of(item) is not None and not any(
        "coordination" in mark.args[0] for mark in item.iter_markers("parametrize"))


def path_of(item):
    return item.callspec.params.get("coordination") if hasattr(item, "callspec") else None


def choice(item):
    return ("off", "on")[zlib.crc32(item.originalname.encode()) % 2]


class Command:
    def __init__(self, program):
        self.program = program
        self.started = []

    def __call__(self, *arguments, expect=0, timeout=TIMEOUT, text=True):
        """Runs the command to its end; `expect` is the exit status that must come (None: any)."""
        done = subprocess.run(
            [self.program, *map(str, arguments)],
            stdin=subprocess.DEVNULL,
            capture_output=True,
            text=text,
            timeout=timeout,
            preexec_fn=with_default_signals,
        )
        if expect is not None:
            assert done.returncode == expect, "%s -> %s\n%s\n%s" % (
                arguments, done.returncode, done.stdout, done.stderr)
        return done

    def json(self, *arguments, expect=0, **more):
        return json.loads(self(*arguments, "--json", expect=expect, **more).stdout)

    def start(self, *arguments, stdout=subprocess.PIPE):
        process = subprocess.Popen(
            [self.program, *map(str, arguments)], stdin=subprocess.DEVNULL, stdout=stdout,
            stderr=subprocess.PIPE, text=True, preexec_fn=with_default_signals)
        self.started.append(process)
        return process

    def end_all(self):
        """What a test that failed has left running."""
        for process in self.started:
            process.kill()
            process.wait()
        self.started.clear()


class Device:
    """A device directory and what the command says of it."""

    def __init__(self, appsync, path, coordination="off"):
        self.appsync = appsync
        self.path = str(path)
        self.coordination = coordination
        self.is_coordinated = coordination == "on"
        appsync("create", self.path, "--coordination", coordination)

    def apps(self):
        return {app["identifier"]: app for app in self.appsync.json("apps", self.path)
                if app["state"] == "installed"}

    def versions(self):
        return {name: app["version"] for name, app in self.apps().items()}

    def placeholders(self):
        return sorted(app["identifier"] for app in self.appsync.json("apps", self.path)
                      if app["state"] == "placeholder")

    def sync(self, library, *options, expect=0):
        return self.appsync.json("sync", self.path, library, *options, expect=expect)

    def inside(self, path):
        return os.path.join(self.path, "root", path.lstrip("/"))

    def container_of(self, identifier):
        return self.inside(self.apps()[identifier]["container"])

    def tree(self):
        """Every path below the device's root, without the log and the database."""
        found = []
        for base, folders, files in os.walk(os.path.join(self.path, "root")):
            found += [os.path.relpath(os.path.join(base, name), self.path)
                      for name in folders + files]
        return sorted(found)


@pytest.fixture(scope="session")
def appsync(tmp_path_factory):
    program = os.environ.get("APPSYNC")
    if not program:
        pytest.exit("set APPSYNC to the command to test", returncode=2)
    # Of the libraries that tests make, the user's own cache is to have nothing.
    os.environ["XDG_CACHE_HOME"] = str(tmp_path_factory.mktemp("cache"))
    return Command(os.path.abspath(program))


@pytest.fixture(autouse=True)
def nothing_runs_on(appsync):
    yield
    appsync.end_all()


@pytest.fixture(params=["off", "on"])
def coordination(request):
    """Every scenario runs on both paths: direct, and through coordinators."""
    return request.param


# For what is the same on both paths, and takes long.
ON_ONE_PATH = pytest.mark.parametrize("coordination", ["off"], indirect=True)
# For what one of the paths alone has.
DIRECTLY = ON_ONE_PATH
COORDINATED = pytest.mark.parametrize("coordination", ["on"], indirect=True)


@pytest.fixture
def device(appsync, tmp_path, coordination):
    return Device(appsync, tmp_path / "device", coordination)


@pytest.fixture
def library(tmp_path):
    folder = str(tmp_path / "library")
    packages.make_library(folder, 5)
    return folder


def names_of(results):
    """Identifiers of a result list, whether it holds strings or objects."""
    return sorted(item if isinstance(item, str) else item["identifier"] for item in results)
