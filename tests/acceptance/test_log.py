"""Looking at the log: which lines, as they come, and where it cannot be read."""

import json
import os

import pytest

LINE = '{"time":"T","category":8,"level":"%s","message":"%s","format":""}\n'


def path_of(device, suffix=""):
    return os.path.join(device.path, "log", "system.log" + suffix)


def write(path, *messages, mode="w", level="info"):
    os.makedirs(os.path.dirname(path), exist_ok=True)
    with open(path, mode) as file:
        for message in messages:
            file.write(LINE % (level, message))


def shown(done):
    return [line.split(" 8  ", 1)[1] for line in done.stdout.splitlines()]


@pytest.fixture
def log(appsync, device):
    def run(*options):
        return shown(appsync("log", device.path, *options))

    return run


def test_the_last_lines_of_what_is_wanted(appsync, device, log):
    write(path_of(device, ".1"), "one", "two")
    write(path_of(device), "three")
    write(path_of(device), "four", mode="a", level="error")
    assert log("--last", "2") == ["three", "four"]
    assert log("--last", "3") == ["two", "three", "four"]
    assert log("--last", "100") == ["one", "two", "three", "four"]
    assert log("--last", "1", "--level", "error") == ["four"]
    lines = appsync("log", device.path, "--last", "1", "--json").stdout.splitlines()
    assert [json.loads(line)["message"] for line in lines] == ["four"]
    for wrong in ("0", "-1", "x", ""):
        assert "--last" in appsync("log", device.path, "--last=" + wrong, expect=2).stderr


def test_the_lines_that_name_an_application(appsync, device, log):
    write(path_of(device), "me|com.a", "me|com.a.b is another", "me|com.a is here.", "it was com.a.",
          "/x/com.a.zip", "/x/com.a.zipped", "/tmp/com.a.app/Info.plist", "xcom.a", "nothing")
    wanted = ["me|com.a", "me|com.a is here.", "it was com.a.", "/x/com.a.zip", "/tmp/com.a.app/Info.plist"]
    assert log("--app", "com.a") == wanted
    assert log("--app", "com.a", "--last", "1") == wanted[-1:]
    assert log("--app", "com.none") == []
    assert "--app a/b is not an identifier" in appsync("log", device.path, "--app", "a/b", expect=2).stderr


class Following:
    def __init__(self, appsync, device, *options):
        self.process = appsync.start("log", device.path, "--follow", *options)

    def next(self):
        return self.process.stdout.readline().rstrip("\n").split(" 8  ", 1)[1]


def test_following_begins_with_the_last_lines(appsync, device):
    write(path_of(device), "one com.a", "two com.a", "three")
    following = Following(appsync, device, "--last", "1", "--app", "com.a")
    assert following.next() == "two com.a"
    write(path_of(device), "four", "five com.a", "six com.a", mode="a")
    assert [following.next(), following.next()] == ["five com.a", "six com.a"]


def test_following_goes_on_in_a_log_that_is_deleted_and_made_again(appsync, device):
    write(path_of(device, ".1"), "older")
    write(path_of(device), "one")
    following = Following(appsync, device)
    assert [following.next(), following.next()] == ["older", "one"]
    os.remove(path_of(device))
    write(path_of(device), "two")
    assert following.next() == "two"
    os.rename(path_of(device), path_of(device, ".1"))
    write(path_of(device), "three")
    assert following.next() == "three"


def test_following_goes_on_in_a_log_that_is_emptied(appsync, device):
    write(path_of(device), "a line that is rather long", "and another")
    following = Following(appsync, device)
    assert [following.next(), following.next()] == ["a line that is rather long", "and another"]
    write(path_of(device), "new")
    assert following.next() == "new"


def test_following_waits_for_a_log_that_is_not_there_yet(appsync, device):
    following = Following(appsync, device)
    write(path_of(device), "first")
    assert following.next() == "first"


@pytest.mark.parametrize("part", ["", ".1"])
@pytest.mark.parametrize("what", ["directory", "pipe"])
def test_a_log_that_cannot_be_read_is_an_error(appsync, device, part, what):
    write(path_of(device, "" if part else ".1"), "one")
    (os.mkdir if what == "directory" else os.mkfifo)(path_of(device, part))
    done = appsync("log", device.path, expect=3)
    assert "it is no regular file" in done.stderr and done.stderr.count("\n") == 1
    assert path_of(device, part) + ":" in done.stderr


def test_a_log_that_goes_out_of_reach_ends_the_following(appsync, device):
    write(path_of(device), "one")
    following = Following(appsync, device)
    assert following.next() == "one"
    os.remove(path_of(device))
    os.mkdir(path_of(device))
    _, said = following.process.communicate(timeout=60)
    assert following.process.returncode == 3 and "no regular file" in said


def test_a_device_that_has_logged_nothing_has_nothing_to_show(appsync, device):
    assert appsync("log", device.path).stdout == ""
