"""What `cmake --install` leaves: a tree that can be moved, and that a project of one's own is built with."""

import os
import pathlib
import re
import shutil
import subprocess

import pytest

import packages

pytestmark = pytest.mark.plain_build  # who links with a sanitized library needs the same sanitizer

CONSUMER = pathlib.Path(__file__).resolve().parent.parent / "consumer"
TREE = CONSUMER.parent.parent
INSTALLS = "AppRegistry.installPackage(/var/mobile/Media/PublicStaging/com.example.a.zip, "


def run(*command, expect=0, environment=None):
    done = subprocess.run([str(word) for word in command], capture_output=True, text=True,
                          env={**os.environ, **(environment or {})}, stdin=subprocess.DEVNULL)
    assert done.returncode == expect, "%s\n%s\n%s" % (command, done.stdout, done.stderr)
    return done


@pytest.fixture(scope="module")
def prefix(appsync, tmp_path_factory):
    """The installed tree, at another place than where it was installed."""
    build = pathlib.Path(appsync.program).resolve().parent
    place = tmp_path_factory.mktemp("install")
    run("cmake", "--install", build, "--prefix", place / "first")
    moved = place / "with a blank" / "second"
    moved.parent.mkdir()
    shutil.move(place / "first", moved)
    return moved


def configure(prefix, folder, *options, expect=0):
    return run("cmake", "-G", "Ninja", "-S", CONSUMER, "-B", folder, "-DCMAKE_PREFIX_PATH=%s" % prefix, *options,
               expect=expect)


def test_everything_is_where_it_is_looked_for(prefix):
    for name in ("bin/appsync", "lib/appsync/appsync-plugin.so", "include/appsync/platform/PlugInTable.h",
                 "lib/libappsync_plugin.a", "share/doc/appsync/docs/porting.md", "share/man/man1/appsync-sync.1",
                 "share/bash-completion/completions/appsync", "share/zsh/site-functions/_appsync",
                 "share/fish/vendor_completions.d/appsync.fish"):
        assert (prefix / name).is_file(), name


def test_the_installed_command_takes_the_installed_module(prefix, tmp_path):
    command = prefix / "bin" / "appsync"
    packages.make_library(str(tmp_path / "library"), 1)
    run(command, "create", tmp_path / "device")
    run(command, "sync", tmp_path / "device", tmp_path / "library",
        "--plug-in", prefix / "lib" / "appsync" / "appsync-plugin.so")


def test_no_file_of_libraries_and_headers_names_where_it_was_installed_or_built(appsync, prefix):
    build = str(pathlib.Path(appsync.program).resolve().parent)
    named = [str(path) for folder in ("include", "lib/cmake", "lib/pkgconfig") for path in (prefix / folder).rglob("*")
             if path.is_file() and re.search("%s|%s|/install0/" % (re.escape(build), re.escape(str(TREE))),
                                             path.read_text())]
    assert named == []


def test_what_headers_include_is_installed_too(prefix):
    headers = prefix / "include" / "appsync"
    missing = [(path.name, name) for path in headers.rglob("*.h")
               for name in re.findall(r'^#include "(.*)"', path.read_text(), re.MULTILINE)
               if not (headers / name).is_file()]
    assert missing == []


@pytest.mark.parametrize("compiler", ["g++", "clang++"])
def test_the_headers_compile(prefix, compiler, tmp_path):
    """All of them; that each compiles alone is looked at in the tree, by scripts/check_headers."""
    top = prefix / "include" / "appsync"
    headers = sorted(path.relative_to(top) for path in top.rglob("*.h"))
    assert len(headers) > 60
    source = tmp_path / "all.cpp"
    source.write_text("".join('#include "%s"\n' % header for header in headers))
    run(compiler, "-std=c++20", "-fsyntax-only", "-Wall", "-Wextra", "-Werror", "-I", top, source)


def test_a_project_finds_the_package_and_runs(prefix, tmp_path):
    configure(prefix, tmp_path / "build")
    run("cmake", "--build", tmp_path / "build")
    assert INSTALLS in run(tmp_path / "build" / "consumer").stdout


def test_a_project_builds_with_pkg_config_and_runs(prefix, tmp_path):
    path = {"PKG_CONFIG_PATH": str(prefix / "lib" / "pkgconfig")}
    told = run("pkg-config", "--cflags", "--libs", "appsync-plugin", "appsync-simulation", "appsync-system",
               environment=path).stdout
    command = "g++ -std=c++20 '%s/main.cpp' %s -o '%s/consumer'" % (CONSUMER, told.strip(), tmp_path)
    run("sh", "-c", command)
    assert INSTALLS in run(tmp_path / "consumer").stdout


def test_a_component_that_nobody_knows_is_named(prefix, tmp_path):
    told = configure(prefix, tmp_path / "build", "-DMORE_COMPONENTS=magic", expect=1).stderr
    assert "appsync has no component magic; it has: plugin, system, simulation" in " ".join(told.split())


def test_a_component_that_is_not_installed_is_named(prefix, tmp_path):
    copy = tmp_path / "copy"
    shutil.copytree(prefix / "lib" / "cmake", copy / "lib" / "cmake")
    shutil.copytree(prefix / "include", copy / "include")
    for library in (prefix / "lib").glob("*.a"):
        (copy / "lib" / library.name).write_bytes(b"")
    (copy / "lib" / "cmake" / "appsync" / "appsync-simulation-targets.cmake").unlink()
    told = configure(copy, tmp_path / "build", expect=1).stderr
    assert "the component simulation of appsync is not installed in %s" % copy in " ".join(told.split())


def test_a_tree_within_another_offers_the_libraries_alone(tmp_path):
    """Without what only the command and the tests need: no SQLite, no cairo."""
    configure("", tmp_path / "build", "-DAPPSYNC_TREE=%s" % TREE, "-DCMAKE_DISABLE_FIND_PACKAGE_PkgConfig=ON")
    run("cmake", "--build", tmp_path / "build", "--target", "appsync_platform")
    targets = run("cmake", "--build", tmp_path / "build", "--target", "help").stdout
    assert "libappsync_plugin.a" in targets and "libappsync_device.a" not in targets
