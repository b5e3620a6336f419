"""Completion in the real shells, and the pages of the manual in the real reader."""

import json
import os
import pathlib
import plistlib
import re
import shutil
import sqlite3
import subprocess

import pytest

import packages
from conftest import Device

A, B = "com.example.atlas", "com.example.beacon"


def needs(program):
    if shutil.which(program) is None:
        pytest.skip("%s is not installed" % program)


@pytest.fixture
def place(appsync, tmp_path):
    """A directory with a device, two packages, and the command on the path."""
    library = tmp_path / "library"
    library.mkdir()
    for identifier in (A, B):
        packages.write_zip(library / (identifier + ".zip"), packages.entries(identifier))
    device = Device(appsync, tmp_path / "my phone")
    device.sync(library)
    (tmp_path / "note.txt").write_text("")
    (tmp_path / "bin").mkdir()
    (tmp_path / "bin" / "appsync").symlink_to(appsync.program)
    return tmp_path


def run(place, *command):
    environment = {**os.environ, "PATH": "%s:%s" % (place / "bin", os.environ["PATH"]), "HOME": str(place)}
    done = subprocess.run(command, capture_output=True, text=True, cwd=place, env=environment,
                          stdin=subprocess.DEVNULL, timeout=60)
    assert done.stderr == ""
    return done.stdout


def in_bash(place, *words):
    script = """
        source <(appsync completion bash)
        COMP_WORDS=(appsync "$@"); COMP_CWORD=$#
        _appsync
        printf '%s\\n' "${COMPREPLY[@]}"
    """
    return set(run(place, "bash", "--norc", "-c", script, "bash", *words).split("\n")) - {""}


def in_fish(place, *words):
    needs("fish")
    line = " ".join(["appsync", *words])
    printed = run(place, "fish", "--no-config", "-c",
                  "appsync completion fish | source; complete --do-complete $argv[1]", line)
    return {each.split("\t")[0] for each in printed.split("\n")} - {""}


def in_zsh(place, *words):
    """By a tab in a terminal, as zsh completes only there; what it is given to offer is printed."""
    needs("zsh")
    script = r"""
        zmodload zsh/zpty
        zpty shell zsh -f -i
        zpty -w shell 'PS1=; stty -echo; autoload -U compinit; compinit -u -D; unsetopt list_beep'
        zpty -w shell 'eval "$(appsync completion zsh)"'
        zpty -w shell 'compadd() {
            if [[ ${@[1,(i)(-|--)]} == *-(O|A|D)\ * ]]; then builtin compadd "$@"; return; fi
            local -a hits; builtin compadd -A hits "$@"
            local hit; for hit in $hits; do print -r -- "offer:$hit"; done
            builtin compadd "$@"
        }'
        zpty -w shell 'comppostfuncs=(tell-the-end); tell-the-end() { print the-end; }; print ready-"now"'
        zpty -m -r shell heard '*ready-now*'
        zpty -n -w shell "$1"$'\t'
        zpty -m -r shell heard '*the-end*'
        print -r -- "$heard"
        zpty -d shell
    """
    line = " ".join(["appsync", *words])
    return set(re.findall(r"offer:([^\r\n]+)", run(place, "zsh", "-f", "-c", script, "zsh", line)))


SHELLS = pytest.mark.parametrize("complete", [in_bash, in_fish, in_zsh])


@SHELLS
def test_a_shell_completes_commands_and_their_commands(place, complete):
    assert complete(place, "sta") == {"stage", "status"}
    assert complete(place, "package", "l") == {"list"}


@SHELLS
def test_a_shell_completes_options_and_their_values(place, complete):
    assert complete(place, "sync", "--js") == {"--json", "--json-lines"}
    assert complete(place, "demote", "--by", "p") == {"person"}


@SHELLS
def test_a_shell_completes_settings(place, complete):
    assert complete(place, "set", "my\\ phone", "removal=no", "coord") == {"coordination=on", "coordination=off"}


def test_bash_that_parts_words_at_equals_signs_completes_what_stands_behind(place):
    assert in_bash(place, "set", "my\\ phone", "removal", "=", "no", "coordination", "=", "of") == {"off"}
    assert in_bash(place, "set", "my\\ phone", "coordination", "=") == {"on", "off"}


@SHELLS
def test_a_shell_completes_what_is_on_the_device_that_is_named(place, complete):
    assert complete(place, "why", "my\\ phone", "com.example.") == {A, B}
    assert complete(place, "why", "my\\ phone", "com.example.b") == {B}


@SHELLS
def test_where_there_is_no_device_nothing_is_offered_and_nothing_said(place, complete):
    assert complete(place, "why", "nowhere", "c") == set()


@SHELLS
def test_the_identifiers_are_offered_to_options_too(place, complete):
    assert complete(place, "sync", "my\\ phone", "library", "--remove", "com.example.b") == {B}
    assert complete(place, "sync", "my\\ phone", "library", "--remove", "x") == set()


def directories(offered):
    return {each.rstrip("/").replace("\\", "") for each in offered}


@SHELLS
def test_a_shell_completes_directories_and_files(place, complete):
    assert directories(complete(place, "apps", "li")) == {"library"}
    assert complete(place, "apps", "no") == set()
    assert complete(place, "plist", "show", "no") == {"note.txt"}


@SHELLS
def test_where_there_are_devices_no_other_directory_is_offered(place, complete):
    for each in ("mine", "myriad"):
        (place / each).mkdir()
    assert directories(complete(place, "apps", "my")) == {"my phone"}
    assert directories(complete(place, "apps", "")) == {"my phone"}
    assert directories(complete(place, "apps", "mi")) == {"mine"}
    assert directories(complete(place, "create", "my")) == {"my phone", "myriad"}
    assert {"library", "mine", "my phone"} <= directories(complete(place, "sync", "my\\ phone", ""))


@SHELLS
def test_in_a_directory_without_devices_nothing_is_made_up(place, complete):
    (place / "none" / "inner").mkdir(parents=True)
    (place / "none" / "inner" / "file").write_text("")
    assert {each.rpartition("/")[2] for each in directories(complete(place, "apps", "none/"))} == {"inner"}
    assert complete(place, "apps", "none/inner/") == set()
    assert complete(place, "why", "none", "") == set()


@SHELLS
def test_devices_are_found_below_and_at_home(place, complete):
    (place / "shelf").mkdir()
    (place / "my phone").rename(place / "shelf" / "old phone")
    (place / "shelf" / "old").mkdir()
    assert directories(complete(place, "apps", "sh")) == {"shelf"}
    assert {each.rpartition("/")[2] for each in directories(complete(place, "apps", "shelf/ol"))} == {"old phone"}
    assert {each.rpartition("/")[2] for each in directories(complete(place, "apps", "~/shelf/ol"))} == {"old phone"}


def read_page(page):
    """What the reader shows of it, without a warning."""
    needs("man")
    shown = subprocess.run(["man", "--warnings", "-l", "-Tutf8", page], capture_output=True, text=True,
                           env={**os.environ, "MANWIDTH": "80"})
    assert shown.returncode == 0 and shown.stderr == "", page
    text = re.sub(".\b", "", shown.stdout)  # printed over itself, letters are bold
    assert [line for line in text.splitlines() if len(line) > 80] == []
    return text


def test_every_page_of_the_manual_is_read_without_a_warning(appsync, tmp_path):
    pages = appsync.json("manual", tmp_path / "man")["pages"]
    assert "appsync.1" in pages and "appsync-package-make.1" in pages
    for page in pages:
        text = read_page(tmp_path / "man" / page)
        assert "SYNOPSIS" in text and "--help" in text


@pytest.fixture
def format_pages(tmp_path):
    """The pages of formats, by name, as the build makes them of their document."""
    tree = pathlib.Path(__file__).resolve().parent.parent.parent
    subprocess.run([tree / "cmake" / "format_pages.py", tree / "docs" / "device-format.md", tmp_path / "man5", "1.2.3"],
                   check=True)
    return {path.stem: read_page(path) for path in (tmp_path / "man5").glob("*.5")}


def entries_of(page):
    """What the page has an entry for; of a path its last name."""
    names = re.findall(r"^ {7}(\S+)(?=\n {14}\S| {2,}\S)", page, re.MULTILINE)
    return {name.rstrip("/").rpartition("/")[2] for name in names}


def test_the_page_of_a_device_names_what_stands_in_one(appsync, place, format_pages):
    device = place / "my phone"
    database = sqlite3.connect(device / "device.db")
    tables = {name for name, in database.execute("SELECT name FROM sqlite_master WHERE type = 'table'")}
    database.close()
    files = {path.name for path in [*device.iterdir(), *(device / "log").iterdir()]} - {"log"}
    assert "applications" in tables and "system.log" in files
    assert (tables | files) - entries_of(format_pages["appsync-device"]) - {"sqlite_sequence"} == set()


def test_the_page_of_a_backup_names_what_stands_in_one(appsync, place, format_pages):
    backup = place / "backup"
    data = place / "my phone" / "root" / "var/mobile/Containers/Data" / A
    data.mkdir(parents=True)
    (data / "note").write_text("x")
    appsync("backup", place / "my phone", backup)
    names = {path.name.replace(A, "<identifier>") for path in backup.rglob("*") if path.is_file()}
    keys = {key for map in (json.loads((backup / "manifest.json").read_text()),
                            plistlib.loads((backup / "DemotedApps.plist").read_bytes())) for key in map}
    assert {"<identifier>.zip", "manifest.json"} <= names and "AutomaticDowngrades" in keys
    page = format_pages["appsync-backup"]
    assert names - entries_of(page) == set()
    assert {key for key in keys if '"%s"' % key not in page} == set()


def test_pages_of_formats_show_their_document_as_it_stands(format_pages):
    assert "appsync-device - a device directory" in format_pages["appsync-device"]
    assert "appsync-backup - a backup" in format_pages["appsync-backup"]
    for text in format_pages.values():
        assert "1.2.3" in text and "SEE ALSO" in text
        assert not re.search(r"`|\*\*|\\\\|^ *\||\]\(", text, re.MULTILINE)


def test_the_manual_tells_what_the_help_tells(appsync, tmp_path):
    appsync("manual", tmp_path / "man")
    for command in ("sync", "backup", "data push"):
        page = (tmp_path / "man" / ("appsync-%s.1" % command.replace(" ", "-"))).read_text().replace("\\-", "-")
        for word in appsync(*command.split(), "--help").stdout.split():
            if word.startswith("--") and word.isascii():
                assert word.split(",")[0] in page, word
