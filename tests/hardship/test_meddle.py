"""What the other tests rely on: a call that is to fail fails, and a kill comes before its call."""

import json
import subprocess
import sys

import pytest

from conftest import HERE

pytestmark = pytest.mark.usefixtures("meddling")


def meddled(folder, *words):
    done = subprocess.run([sys.executable, str(HERE / "meddle.py"), "--within", str(folder), *words],
                          capture_output=True, text=True)
    assert done.returncode == 0, done.stderr
    return json.loads(done.stderr.splitlines()[-1]), done


def test_the_call_that_is_named_fails_and_no_other(tmp_path):
    for name in ("one", "two", "three"):
        (tmp_path / name).write_text(name + "\n")
    files = [str(tmp_path / name) for name in ("one", "two", "three")]
    report, done = meddled(tmp_path, "--calls", "openat", "--fail", "EACCES", "--at", "2", "--", "cat", *files)
    assert report == {"status": 1, "count": 3, "hit": {"number": 2, "name": "openat", "path": files[1]}}
    assert done.stdout == "one\nthree\n" and "two: Permission denied" in done.stderr


def test_from_then_on_each_fails(tmp_path):
    files = [str(tmp_path / name) for name in ("one", "two", "three")]
    report, _ = meddled(tmp_path, "--calls", "openat", "--fail", "ENOSPC", "--at", "2", "--ever", "--", "touch", *files)
    assert report["count"] == 3 and report["hit"]["number"] == 2
    assert [path.name for path in tmp_path.iterdir()] == ["one"]


def test_a_kill_comes_before_the_call(tmp_path):
    files = [str(tmp_path / name) for name in ("one", "two", "three")]
    report, _ = meddled(tmp_path, "--calls", "openat", "--kill", "2", "--", "touch", *files)
    assert report["status"] == -9 and report["hit"]["path"] == files[1]
    assert [path.name for path in tmp_path.iterdir()] == ["one"]


def test_what_is_never_called_is_not_hit(tmp_path):
    report, _ = meddled(tmp_path, "--calls", "rename", "--fail", "EIO", "--", "touch", str(tmp_path / "one"))
    assert report == {"status": 0, "count": 0, "hit": None}
