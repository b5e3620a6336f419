"""A disk that is really full: a tmpfs in a mount namespace."""

import os
import subprocess
import sys

import pytest

from conftest import HERE, IS_LONG

SIZES = "each" if IS_LONG else "last"  # of the disk, that are tried by single pages


@pytest.fixture(scope="session")
def own_mounts(tmp_path_factory):
    """The command that gives a process mounts of its own; skips where there is none."""
    where = str(tmp_path_factory.mktemp("mounts"))
    said = []
    for command in (["unshare", "-m"], ["unshare", "-rm"]):
        done = subprocess.run([*command, "mount", "-t", "tmpfs", "tmpfs", where], capture_output=True, text=True)
        if done.returncode == 0:
            return command
        said.append(done.stderr.strip())
    pytest.skip("this machine allows no mounts of one's own: " + "; ".join(said))


@pytest.mark.parametrize("coordination", ["off", "on"])
@pytest.mark.parametrize("what", ["grow", "look", "remove", "small", "kept", "former"])
def test_full_disk(appsync, own_mounts, tmp_path, what, coordination):
    disk = tmp_path / "disk"
    disk.mkdir()
    done = subprocess.run(
        [*own_mounts, sys.executable, os.path.join(HERE, "full_disk.py"), what, appsync.program, str(disk),
         str(tmp_path), coordination, SIZES], capture_output=True, text=True)
    print(done.stdout)
    assert done.returncode == 0, done.stderr
