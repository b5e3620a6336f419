"""The command where it is denied what every process has: streams, files, room in a file, memory."""

import os
import resource
import subprocess
import time

import packages
import pytest
from conftest import APPS
from entry import Place, both_are_there


@pytest.fixture
def place(templates, scratch):
    place = Place(scratch / "means", templates, "used-direct")
    packages.make_library(str(place.hostile), 4, "2.0")
    return place


def test_no_file_takes_the_number_of_a_closed_stream(appsync, place):
    appsync.good("run", place.device, APPS[0])  # so that the sync waits
    process = subprocess.Popen([appsync.program, "sync", str(place.device), str(place.hostile)],
                               preexec_fn=lambda: os.closerange(0, 3))
    try:
        streams = "/proc/%d/fd" % process.pid
        late = time.monotonic() + 30
        while len(os.listdir(streams)) < 8 and time.monotonic() < late:
            time.sleep(0.01)
        assert [os.readlink("%s/%d" % (streams, number)) for number in range(3)] == ["/dev/null"] * 3
    finally:
        process.kill()
        process.wait()


def sync_with(appsync, place, limit, value):
    return subprocess.run(
        [appsync.program, "sync", str(place.device), str(place.hostile), "--json"], capture_output=True, text=True,
        stdin=subprocess.DEVNULL, preexec_fn=lambda: resource.setrlimit(limit, (value, value)), check=False)


def is_told_and_made_good(appsync, place, done, says):
    """Which is: an exit status of the command's own, a reason, and nothing lost."""
    assert done.returncode in (0, 1, 3), done.stderr
    assert all(line.startswith("appsync: ") for line in done.stderr.splitlines()), done.stderr
    assert done.returncode == 0 or says in done.stderr + done.stdout
    both_are_there(place, None)
    appsync.good("sync", place.device, place.hostile)
    assert [each["version"] for each in appsync.good("apps", place.device, "--json").json()] == ["2.0"] * 4


# A sanitizer looks at objects through a pipe, and without one takes them for bad.
@pytest.mark.plain_build
@pytest.mark.parametrize("files", (4, 6, 8, 10, 11, 12, 13, 14, 16, 18, 20, 24, 30, 40))
def test_few_open_files(appsync, place, files):
    done = sync_with(appsync, place, resource.RLIMIT_NOFILE, files)
    is_told_and_made_good(appsync, place, done, "")


@pytest.mark.plain_build
@pytest.mark.parametrize("files", (6, 11, 13))
def test_that_files_are_few_is_told_with_what_helps(appsync, place, files):
    done = sync_with(appsync, place, resource.RLIMIT_NOFILE, files)
    assert done.returncode == 3 and "ulimit -n" in done.stderr and "openat2" not in done.stderr


@pytest.mark.parametrize("size", (0, 1000, 10_000, 100_000, 1_000_000))
def test_small_files_only(appsync, place, size):
    done = sync_with(appsync, place, resource.RLIMIT_FSIZE, size)
    is_told_and_made_good(appsync, place, done, "device.db")


@pytest.mark.plain_build  # a sanitizer takes more by itself
@pytest.mark.parametrize("mebibytes", (36, 44, 48, 56, 64))
def test_little_memory(appsync, place, mebibytes):
    done = sync_with(appsync, place, resource.RLIMIT_AS, mebibytes << 20)
    is_told_and_made_good(appsync, place, done, "out of means")
