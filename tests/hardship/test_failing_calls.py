"""System calls of the command fail, once or from then on; what it says is true, and the device recovers."""

import errno
import itertools
import os
import random
import re

import pytest

from conftest import IS_LONG, SEED, long_form
from devices import SCENARIOS, check_intact, check_same, leave_out, look_at, without_session

# Which calls fail, and with what.
FAULTS = {
    "sync-EIO": ("fsync,fdatasync,syncfs", "EIO"),
    "rename-EIO": ("rename,renameat,renameat2", "EIO"),
    "rename-ENOSPC": ("rename,renameat,renameat2", "ENOSPC"),
    "write-EIO": ("write,pwrite64,writev,pwritev", "EIO"),
    "write-ENOSPC": ("write,pwrite64,writev,pwritev", "ENOSPC"),
    "write-EDQUOT": ("write,pwrite64,writev,pwritev", "EDQUOT"),
    "mkdir-ENOSPC": ("mkdir,mkdirat", "ENOSPC"),
    "unlink-EIO": ("unlink,unlinkat,rmdir", "EIO"),
    "open-EMFILE": ("open,openat,openat2", "EMFILE"),
    "open-ENFILE": ("open,openat,openat2", "ENFILE"),
    "open-EACCES": ("open,openat,openat2", "EACCES"),
}
NOT_SEEN = "the device did not see that it was offloaded"
# Where the plug-in goes on after a failure it logs it, and what is told is what that leads to.
SEE_THE_LOG = ("see appsync log", "appsync log tells why", NOT_SEEN)
# What it logs then, where it does not log the error: to a file that cannot be opened it is as if there were none.
LOGGED = ("failed to", "err=Error", "no vessik restore plist found")
# The database tells only of what kind an error is.
CANNOT_OPEN = ("unable to open database file", "cannot be written", "may write")
OF_THE_DATABASE = {
    "EIO": ("disk I/O error",),
    "ENOSPC": ("device.db cannot grow: the disk that it is on is full",),
    "EDQUOT": ("device.db cannot grow: the disk that it is on is full",),
    "EMFILE": CANNOT_OPEN,
    "ENFILE": CANNOT_OPEN,
    "EACCES": CANNOT_OPEN,
}
NEVER_CALLED = {("rollback", "mkdir-ENOSPC")}  # the directory of what is kept was made by the update
SHARE = 40  # of the combinations of scenario and fault, one call each, in the short form


def chosen(count, label):
    if IS_LONG:
        return long_form(count)
    return [random.Random("%d %s" % (SEED, label)).randint(1, count)]


def combinations():
    every = [each for each in itertools.product(SCENARIOS, FAULTS, [False, True]) if each[:2] not in NEVER_CALLED]
    return every if IS_LONG else random.Random(SEED).sample(every, SHARE)


def injected(scenario, options, number):
    """What comes of that call's failure; of the last one's where this run makes fewer, as its threads meet in
    other ways.
    """
    for _ in range(5):
        outcome = scenario.meddled(*options, "--at", number)
        if outcome.hit is not None:
            return outcome
        number = outcome.count
    raise AssertionError("nothing has failed")


def check_said(scenario, outcome, fault, ever):
    """A clear end: a status that the command has, and with a failure the text of the error."""
    if outcome.status not in (0, 1, 3):
        raise AssertionError("status %s" % outcome.status)
    if outcome.status != 0 and not any(text in outcome.said for text in texts_of(outcome, fault, ever)):
        check_logged(scenario, outcome, fault, ever)


def texts_of(outcome, fault, ever):
    error = FAULTS[fault][1]
    texts = [os.strerror(getattr(errno, error))]
    if fault == "unlink-EIO":
        texts.append(os.strerror(errno.EEXIST))  # for what comes next in that place
    if ever or "/device.db" in outcome.hit["path"]:
        texts += OF_THE_DATABASE[error]
    return texts


def check_logged(scenario, outcome, fault, ever):
    """The plug-in's messages say what has failed, not always why: the log must hold such a one, if it could be
    written.
    """
    if not any(words in outcome.said for words in SEE_THE_LOG):
        raise AssertionError("the reason is not told")
    words = [*texts_of(outcome, fault, ever), *LOGGED]
    if not (ever and fault.startswith("write")) and not any(each in scenario.logged() for each in words):
        raise AssertionError("the log does not tell the reason either")


def check_truth(scenario, expected, outcome):
    """The device is intact, and success means that everything is on it that was to come."""
    check_intact(scenario.appsync, scenario.device)
    if outcome.status == 0:
        check_same(what_success_promises(expected), what_success_promises(look_at(scenario.device)))


def what_success_promises(seen):
    """Applications, placeholders and their files. The plug-in logs that it could not read the icon layout, and
    goes on; the next sync brings it. What is left lying about is the next session's to clear, or to put where it
    is kept."""
    kept = forgivingly(seen)
    tables = {name: rows for name, rows in kept["tables"].items()
              if name in ("applications", "placeholders", "restore_data")}
    tree = {path: what for path, what in kept["tree"].items()
            if re.search("/Application/<(?!kept of)", path) or path.startswith("root/var/mobile/Containers/")}
    return {"tables": tables, "tree": tree}


def forgivingly(seen):
    """Where its icon cannot be written a placeholder stands without one; where there is no placeholder the
    application has no install type; and the last failure of an application is told until it is installed.
    """
    return leave_out(without_session(seen), tables=["failures"], paths="<placeholders of .*/Icon.png$",
                     columns={"placeholders": ["bytes"], "applications": ["install_type"]})


@pytest.mark.parametrize("name, fault, ever", combinations())
def test_a_failing_call_is_told_and_survived(meddling, prepared, name, fault, ever):
    scenario, expected = prepared(name)
    calls, error = FAULTS[fault]
    count = scenario.meddled("--calls", calls).count
    assert count > 0, "no such call is made"
    options = ["--calls", calls, "--fail", error] + (["--ever"] if ever else [])
    tried, problems = 0, []
    for number in chosen(count, "%s %s %s" % (name, fault, ever)):
        tried += 1
        outcome = injected(scenario, options, number)
        try:
            check_said(scenario, outcome, fault, ever)
            check_truth(scenario, expected, outcome)
            scenario.check(expected, lambda seen: scenario.what_an_end_leaves(forgivingly(seen)))
            scenario.follow_up()
        except AssertionError as problem:
            problems.append("%s --at %d: %s -> %s\n%s\n%s" % (
                " ".join(options), number, outcome.hit, outcome.status, outcome.said, problem))
    print("%s: %d failing calls of %d" % (name, tried, count))
    assert not problems, "\n\n".join(problems)


def test_an_offloaded_application_does_not_come_back_as_another(meddling, prepared):
    """The plug-in restores what it can when it cannot look at the list of offloaded applications."""
    scenario, expected = prepared("coordinated-restore")
    opens = scenario.meddled("--calls", "openat2", "--list").calls
    looks = [number for number, (_, path) in enumerate(opens, 1) if path.endswith("DemotedApps.plist")]
    outcome = scenario.meddled("--calls", "openat2", "--fail", "EMFILE", "--at", looks[-1])
    assert outcome.hit["path"].endswith("DemotedApps.plist")
    assert outcome.status == 1 and NOT_SEEN in outcome.said, outcome.said
    scenario.check(expected)
    scenario.follow_up()
