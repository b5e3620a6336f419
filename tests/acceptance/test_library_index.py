"""What is kept of a library's packages, so that they are not opened at each look."""

import hashlib
import os
import pathlib
import stat

import pytest

from conftest import ON_ONE_PATH

pytestmark = ON_ONE_PATH

# What was changed a moment ago is not kept, as it could change again unnoticed: this was not.
OLD_PACKAGE = pathlib.Path(__file__).resolve().parents[2] / "fuzz" / "corpus" / "Package" / "deflated.zip"
HEAD = b"appsync library index 2\n"


@pytest.fixture
def cache(tmp_path, monkeypatch):
    folder = tmp_path / "cache"
    folder.mkdir()
    monkeypatch.setenv("XDG_CACHE_HOME", str(folder))
    return folder


@pytest.fixture
def many(tmp_path):
    """A library that is large enough: sixty-four names of one package."""
    folder = tmp_path / "many"
    folder.mkdir()
    for number in range(64):
        (folder / f"{number:02}.zip").symlink_to(OLD_PACKAGE)
    return folder


def index_in(cache):
    (index,) = (cache / "appsync").iterdir()
    return index


def planned(appsync, device, library):
    return appsync("plan", device.path, library).stdout


def test_a_plan_is_the_same_with_an_index_and_without(appsync, device, many, cache):
    first = planned(appsync, device, many)
    index = index_in(cache)
    assert stat.S_IMODE(index.stat().st_mode) == 0o600
    assert stat.S_IMODE(index.parent.stat().st_mode) == 0o700
    assert planned(appsync, device, many) == first
    index.write_bytes(index.read_bytes()[:-1])
    assert planned(appsync, device, many) == first
    index.unlink()
    assert planned(appsync, device, many) == first
    assert index_in(cache).exists()


def test_what_the_index_knows_is_not_opened(appsync, device, many, cache):
    truth = planned(appsync, device, many)
    index = index_in(cache)
    altered = index.read_bytes()[len(HEAD) + 64:].replace(b"com.example.a", b"com.example.z")
    index.write_bytes(HEAD + hashlib.sha256(altered).hexdigest().encode() + altered)
    assert planned(appsync, device, many) == truth.replace("com.example.a", "com.example.z") != truth
    # Nobody else's is believed.
    index.chmod(0o644)
    assert planned(appsync, device, many) == truth


def test_a_small_library_has_none(appsync, device, library, cache):
    planned(appsync, device, library)
    assert os.listdir(cache) == []


def test_without_a_place_for_it_everything_works(appsync, device, many, cache):
    (cache / "appsync").write_text("in the way")
    assert planned(appsync, device, many) == planned(appsync, device, many)
    assert device.sync(many)["installed"]
