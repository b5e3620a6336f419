"""The built command, named by APPSYNC, against kills, failing calls, a full disk and hostile neighbours.

APPSYNC_HARDSHIP=long tries everything; without it a share of that is tried, which APPSYNC_SEED chooses
(a number; printed with each run, 1 if it is not set). APPSYNC_CALLS=5/64 tries every 64th call of a command from the 5th on
in the long form, APPSYNC_CALLS=217 that one.
"""

import importlib.util
import os
import pathlib
import subprocess
import sys

import pytest

HERE = pathlib.Path(__file__).resolve().parent
ACCEPTANCE = HERE.parent / "acceptance"
sys.path.insert(0, str(ACCEPTANCE))

_spec = importlib.util.spec_from_file_location("acceptance_conftest", ACCEPTANCE / "conftest.py")
acceptance = importlib.util.module_from_spec(_spec)
_spec.loader.exec_module(acceptance)
appsync = acceptance.appsync

IS_LONG = os.environ.get("APPSYNC_HARDSHIP") == "long"
SEED = int(os.environ.get("APPSYNC_SEED", "1"))
CALLS = os.environ.get("APPSYNC_CALLS", "")


def long_form(count):
    """The numbers of the calls that the long form meddles with, of so many."""
    first, _, apart = CALLS.partition("/")
    if not first:
        return range(1, count + 1)
    return range(int(first), count + 1 if apart else int(first) + 1, int(apart or 1))


def pytest_report_header():
    form = "long" if IS_LONG else "short"
    return "hardship: the %s form, APPSYNC_SEED=%d" % (form, SEED)


def pytest_collection_modifyitems(items):
    if IS_LONG:  # one test makes thousands of runs
        for item in items:
            item.add_marker(pytest.mark.timeout(8 * 3600))


@pytest.fixture(scope="session")
def meddling():
    """Skips where the machine does not let a process be traced."""
    done = subprocess.run([sys.executable, str(HERE / "meddle.py"), "--", "true"], capture_output=True, text=True)
    if done.returncode != 0:
        pytest.skip("no process can be traced here: " + (done.stderr.strip().splitlines() or ["?"])[-1])


@pytest.fixture(scope="session")
def prepared(appsync, tmp_path_factory):
    """Makes each scenario once, and what a run of it that nothing disturbs leads to."""
    made = {}

    def make(name):
        import devices  # needs this file

        if name not in made:
            scenario = devices.SCENARIOS[name](appsync, tmp_path_factory.mktemp(name))
            made[name] = scenario, scenario.expected()
        return made[name]

    return make
