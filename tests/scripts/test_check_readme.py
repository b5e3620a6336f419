import pathlib

import pytest

from scripts import load

check_readme = load("check_readme")

SHELL = """\
# something
## A first session
Text.

    $ export NAME=there
    $ echo hello; echo $NAME at 01:02:03; echo a b c
    hello
    there at 10:20:30
    a b ...
    $ seq 5
    1
    ...
    5
    $ echo waits; while [ ! -e done ]; do sleep 0.05; done; echo goes on
    waits
                            $ touch done; echo touched
                            touched
    goes on
    $ echo begins; sleep 60
    begins
    Killed
## Another
    $ false
"""


@pytest.fixture
def differences(tmp_path):
    program = tmp_path / "appsync"
    program.touch()

    def run(text):
        folder = tmp_path / "session"
        folder.mkdir()
        session = check_readme.Session(folder, program)
        for step in check_readme.steps_of(text.splitlines()):
            session.perform(step)
        return session.differences

    return run


def test_a_session_as_shown_has_no_differences(differences):
    assert differences(SHELL) == []


@pytest.mark.parametrize("shown, instead", [
    ("    hello\n", "    good-bye\n"),
    ("    hello\n", ""),
    ("    there at 10:20:30", "    here at 10:20:30"),
    ("    a b ...", "    a c ..."),
    ("    ...\n    5\n", "    5\n"),
    ("    5\n", "    6\n"),
    ("                            touched", "                            untouched"),
    ("    goes on\n", ""),
])
def test_what_comes_otherwise_is_found(differences, shown, instead):
    assert shown in SHELL
    assert differences(SHELL.replace(shown, instead)) != []


def test_a_command_that_fails_is_found(differences):
    assert "ends with 3" in "".join(differences("## A first session\n    $ exit 3\n"))


def test_readme_has_such_a_session():
    readme = pathlib.Path(check_readme.README).read_text().splitlines()
    assert len(check_readme.steps_of(readme)) > 20


MORE_PROGRESS = """\
## A first session
    $ printf '%s\\n' 'transfer a: 50 % (1 B of 2 B)' 'transfer a: 100 % (2 B of 2 B)' done 'install a: 50 % (1 B of 2 B)'
    transfer a: 100 % (2 B of 2 B)
    done
"""


def test_a_slow_machine_may_tell_more_of_progress(differences):
    assert differences(MORE_PROGRESS) == []


def test_other_lines_may_not_come_beside_progress(differences):
    assert differences(MORE_PROGRESS.replace(" done ", " done too ")) != []
