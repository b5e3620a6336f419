"""The command is killed at each of its file-system calls, and run again."""

import random

import pytest

from conftest import CALLS, IS_LONG, SEED, long_form
from devices import SCENARIOS

KILLS = 12  # of each scenario in the short form


def chosen(count):
    """The numbers of the calls to be killed at: all, or a few that are evenly apart."""
    if IS_LONG:
        return long_form(count)
    stride = max(1, count // KILLS)
    return range(1 + random.Random(SEED).randrange(stride), count + 1, stride)


@pytest.mark.parametrize("name", SCENARIOS)
def test_a_kill_at_any_call_loses_nothing(meddling, prepared, name):
    scenario, expected = prepared(name)
    undisturbed = scenario.meddled()
    assert undisturbed.status == 0 and undisturbed.hit is None
    killed, problems = 0, []
    # From run to run the threads meet in other ways, so the last number is not the same each time.
    for number in chosen(undisturbed.count + (50 if IS_LONG else 0)):
        outcome = scenario.meddled("--kill", number)
        killed += outcome.hit is not None
        try:
            assert outcome.status == (0 if outcome.hit is None else -9), outcome.said
            scenario.check(expected, scenario.what_an_end_leaves)
            scenario.follow_up()
        except AssertionError as problem:
            problems.append("--kill %d: %s\n%s" % (number, outcome.hit, problem))
    print("%s: %d kills in %d calls" % (name, killed, undisturbed.count))
    assert not problems, "\n\n".join(problems)
    assert CALLS or killed >= min(KILLS, undisturbed.count) - 2
