"""The Debian packages: what is in them, and what they are good for in an empty prefix."""

import concurrent.futures
import os
import pathlib
import re
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


def complaint_of(compiler, source, include):
    # Quoted includes are looked for in the working directory first, which must not be the tree.
    done = subprocess.run([compiler, "-std=c++20", "-fsyntax-only", "-Wall", "-Wextra", "-Werror", "-I", include,
                           "-x", "c++", "-"], input=source, capture_output=True, text=True, cwd=include)
    return "" if done.returncode == 0 else done.stderr


def complaints_of(compiler, headers, include):
    """What a compiler says of each header that does not compile in a source file of its own."""

    def compiled(header):
        said = complaint_of(compiler, '#include "%s"\n' % header, include)
        return said and "%s: %s" % (header, said)

    with concurrent.futures.ThreadPoolExecutor(2) as pool:
        return [said for said in pool.map(compiled, headers) if said]


@pytest.fixture(scope="module")
def headers(prefix):
    include = prefix / "include" / "appsync"
    found = sorted(path.relative_to(include) for path in include.rglob("*.h"))
    rooms = {header.parts[0] for header in found}
    assert rooms == {"platform", "client", "system", "simulation", "checked", "recording", "contract"}
    return found


def test_every_header_compiles_alone(prefix, headers):
    """By g++; scripts/check_headers leaves them to this."""
    assert complaints_of("g++", headers, prefix / "include" / "appsync") == []


@pytest.mark.parametrize("compiler", ["g++", "clang++"])
def test_all_headers_compile_together(prefix, headers, compiler):
    everything = "".join('#include "%s"\n' % header for header in headers)
    assert complaint_of(compiler, everything, prefix / "include" / "appsync") == ""


@pytest.mark.parametrize("compiler", ["g++", "clang++"])
def test_a_header_that_needs_another_one_before_it_is_found(tmp_path, compiler):
    (tmp_path / "Alone.h").write_text("#pragma once\n#include <string>\nstd::string alone();\n")
    (tmp_path / "Leans.h").write_text("#pragma once\nstd::string leans();\n")
    complaints = complaints_of(compiler, ["Alone.h", "Leans.h"], tmp_path)
    assert len(complaints) == 1 and complaints[0].startswith("Leans.h: ")


def sought(prefix, place, components):
    """What CMake says where a project asks for these components."""
    place.mkdir()
    (place / "CMakeLists.txt").write_text(
        "cmake_minimum_required(VERSION 3.25)\nproject(seeker LANGUAGES CXX)\n"
        "find_package(appsync CONFIG REQUIRED %s)\n" % components)
    done = subprocess.run(["cmake", "-G", "Ninja", "-S", place, "-B", place / "build",
                           "-DCMAKE_PREFIX_PATH=%s" % prefix], capture_output=True, text=True)
    return done.returncode, re.sub(r"\s+", " ", done.stderr)


@pytest.fixture
def without_system(prefix, tmp_path):
    """A prefix of somebody who has left out the component system."""
    place = tmp_path / "without"
    shutil.copytree(prefix / "lib", place / "lib", symlinks=True)
    for path in [*(place / "lib" / "cmake" / "appsync").glob("appsync-system-targets*"),
                 place / "lib" / "pkgconfig" / "appsync-system.pc"]:
        path.unlink()
    return place


def test_a_component_that_is_not_installed_is_named(without_system, tmp_path):
    status, told = sought(without_system, tmp_path / "one", "COMPONENTS plugin system")
    assert status != 0
    assert "the component system of appsync is not installed in %s" % without_system in told
    assert sought(without_system, tmp_path / "other", "COMPONENTS plugin simulation OPTIONAL_COMPONENTS system")[0] == 0
    assert sought(without_system, tmp_path / "all", "")[0] == 0


def test_a_component_that_another_one_needs_is_named(without_system, tmp_path):
    for path in (without_system / "lib" / "cmake" / "appsync").glob("appsync-plugin-targets*"):
        path.unlink()
    status, told = sought(without_system, tmp_path / "one", "COMPONENTS contract")
    assert status != 0
    assert "the component plugin of appsync, which contract needs, is not installed in %s" % without_system in told


def test_a_component_that_appsync_has_not_is_named_with_those_that_it_has(prefix, tmp_path):
    status, told = sought(prefix, tmp_path / "project", "COMPONENTS plugin cloud")
    assert status != 0
    assert re.search(r"appsync has no component cloud; it has: plugin, system, simulation", told)


def test_a_prefix_without_what_all_components_need_says_so(without_system, tmp_path):
    for path in (without_system / "lib" / "cmake" / "appsync").glob("appsync-platform-targets*"):
        path.unlink()
    status, told = sought(without_system, tmp_path / "project", "COMPONENTS plugin")
    assert status != 0 and "appsync is not whole in %s" % without_system in told


def test_pkg_config_says_what_is_not_there(without_system):
    environment = {**os.environ, "PKG_CONFIG_LIBDIR": str(without_system / "lib" / "pkgconfig")}
    asked = subprocess.run(["pkg-config", "--exists", "--print-errors", "appsync-plugin", "appsync-system"],
                           capture_output=True, text=True, env=environment)
    assert asked.returncode != 0 and "appsync-system" in asked.stderr
    assert subprocess.run(["pkg-config", "--exists", "appsync-plugin"], env=environment).returncode == 0


LINES_OF_A_PORT = 300


@pytest.fixture(scope="module")
def port(prefix, tmp_path_factory):
    """The example of a port, built with the packages alone: its sources, and where it was built."""
    sources = tmp_path_factory.mktemp("port") / "sources"
    shutil.copytree(prefix / "share" / "doc" / "appsync" / "examples" / "port", sources)
    built = sources.parent / "built"
    run("cmake", "-G", "Ninja", "-S", sources, "-B", built, "-DCMAKE_PREFIX_PATH=%s" % prefix,
        "-DCMAKE_CXX_FLAGS=-Wall -Wextra -Werror")
    run("cmake", "--build", built)
    return sources, built


def test_the_example_of_a_port_is_small():
    texts = [(TREE / "examples" / "port" / name).read_text() for name in ("Device.h", "Registry.cpp", "install_one.cpp")]
    lines = [line.strip() for text in texts for line in text.splitlines()]
    assert len([line for line in lines if line and not line.startswith("//")]) <= LINES_OF_A_PORT


def test_the_example_of_a_port_installs_a_package_again_and_again(port, tmp_path):
    for _ in range(2):
        assert run(port[1] / "install_one", tmp_path / "device") == "com.example.hello 1.0\n"


def test_the_example_of_a_port_passes_the_kit(port):
    assert "0 broken" in run(port[1] / "prove")


def test_a_broken_contract_in_a_port_is_named_with_its_sentence(port):
    sources, built = port
    registry = sources / "Registry.cpp"
    kept = registry.read_text()
    broken = kept.replace("options.findFlag(UninstallPlaceholderOnlyKey)", 'options.findFlag("SomethingElse")')
    assert broken != kept
    registry.write_text(broken)
    run("cmake", "--build", built, "--target", "prove")
    proved = subprocess.run([built / "prove"], capture_output=True, text=True)
    assert proved.returncode == 1
    said = " ".join(proved.stdout.split())
    assert "platform/AppRegistry.h" in said
    assert "With `UninstallPlaceholderOnlyKey` true the application is never touched." in said
