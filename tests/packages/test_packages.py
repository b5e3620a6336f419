"""The Debian packages: what is in them, and what they are good for in an empty prefix."""

import os
import pathlib
import shutil
import subprocess

import pytest

TREE = pathlib.Path(__file__).resolve().parent.parent.parent
NAMES = ["appsync", "libappsync-dev", "libappsync-doc"]


def run(*command, environment=None):
    done = subprocess.run([str(word) for word in command], capture_output=True, text=True, stdin=subprocess.DEVNULL,
                          env={**os.environ, **(environment or {})})
    assert done.returncode == 0, "%s\n%s\n%s" % (command, done.stdout, done.stderr)
    return done.stdout


@pytest.fixture(scope="module")
def made(tmp_path_factory):
    folder = tmp_path_factory.mktemp("packages")
    run(TREE / "scripts" / "package", folder)
    return sorted(folder.iterdir())


@pytest.fixture(scope="module")
def prefix(made, tmp_path_factory):
    """All of them, unpacked where nothing else is."""
    place = tmp_path_factory.mktemp("unpacked")
    for package in made:
        run("dpkg-deb", "--extract", package, place)
    return place / "usr"


def test_there_are_three_packages_and_nothing_else(made):
    assert [path.name.split("_")[0] for path in made] == NAMES
    assert all(path.suffix == ".deb" for path in made)


def test_lintian_finds_no_error(made):
    if shutil.which("lintian") is None:
        pytest.skip("lintian is not installed")
    # Who publishes the packages puts an address of theirs in (APPSYNC_MAINTAINER); a build has none.
    address = "bogus-mail-host,bogus-mail-host-in-debian-changelog"
    found = subprocess.run(["lintian", "--no-cfg", "--allow-root", "--fail-on", "error", "--suppress-tags", address,
                            *made], capture_output=True, text=True)
    assert found.returncode == 0, found.stdout + found.stderr


def test_the_command_and_its_module_run_from_there(prefix, tmp_path):
    command = prefix / "bin" / "appsync"
    (tmp_path / "library").mkdir()
    run(command, "create", tmp_path / "device")
    run(command, "sync", tmp_path / "device", tmp_path / "library",
        "--plug-in", prefix / "lib" / "appsync" / "appsync-plugin.so")


def test_what_shells_and_man_look_for_is_where_they_look(prefix):
    for name in ("bash-completion/completions/appsync", "zsh/vendor-completions/_appsync",
                 "fish/vendor_completions.d/appsync.fish", "man/man1/appsync.1.gz", "man/man5/appsync-device.5.gz",
                 "man/man5/appsync-backup.5.gz", "doc/appsync/docs/module.md", "doc/appsync/reference/index.html"):
        assert (prefix / "share" / name).is_file(), name


def test_a_project_is_built_with_what_is_there_alone(prefix, tmp_path):
    run("cmake", "-G", "Ninja", "-S", TREE / "tests" / "consumer", "-B", tmp_path, "-DCMAKE_PREFIX_PATH=%s" % prefix)
    run("cmake", "--build", tmp_path)
    assert "AppRegistry.installPackage" in run(tmp_path / "consumer")
