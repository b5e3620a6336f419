"""System calls of the command fail, once or from then on; what it says is true, and the device recovers."""

import itertools
import random

import pytest

from conftest import IS_LONG, SEED
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
# Where the plug-in goes on after a failure it logs it, and what is told is that it leads to.
SEE_THE_LOG = ("see appsync log", "appsync log tells why", "File exists", NOT_SEEN)
# What an error gives as its reason: the system's words, or those of whoever explains them.
REASONS = {
    "EIO": ("Input/output error", "I/O error"),
    "ENOSPC": ("No space left", "is full"),
    "EDQUOT": ("quota", "is full"),
    "EMFILE": ("Too many open files", "unable to open", "cannot be written"),
    "ENFILE": ("Too many open files", "unable to open", "cannot be written"),
    "EACCES": ("Permission denied", "unable to open", "cannot be written", "may write"),
}
SHARE = 40  # of the combinations of scenario and fault, one call each, in the short form


def chosen(count, label):
    if IS_LONG:
        return range(1, count + 1)
    return [random.Random("%d %s" % (SEED, label)).randint(1, count)]


def combinations():
    every = list(itertools.product(SCENARIOS, FAULTS, [False, True]))
    return every if IS_LONG else random.Random(SEED).sample(every, SHARE)


def check_said(outcome, error):
    """A clear end: a status that the command has, and with a failure a reason."""
    if outcome.status not in (0, 1, 3):
        raise AssertionError("status %s" % outcome.status)
    if outcome.status != 0 and not any(reason in outcome.said for reason in REASONS[error] + SEE_THE_LOG):
        raise AssertionError("no reason")


def check_truth(scenario, expected, outcome):
    """The device is intact, and success means that everything is on it that was to come."""
    check_intact(scenario.appsync, scenario.device)
    if outcome.status == 0:
        check_same(what_success_promises(expected), what_success_promises(look_at(scenario.device)))


def what_success_promises(seen):
    """Applications, placeholders and their files. The plug-in logs that it could not read the icon layout, and
    goes on; the next sync brings it. What is left lying about is the next session's to clear."""
    kept = forgivingly(seen)
    tables = {name: rows for name, rows in kept["tables"].items()
              if name in ("applications", "placeholders", "restore_data")}
    tree = {path: what for path, what in kept["tree"].items()
            if "/Application/<" in path or path.startswith("root/var/mobile/Containers/")}
    return {"tables": tables, "tree": tree}


def forgivingly(seen):
    """Where its icon cannot be written a placeholder stands without one; where there is no placeholder the
    application has no install type; the last failure of an application is told until it is installed; and what a
    coordinator has of restored data is found with the data itself.
    """
    return leave_out(without_session(seen), tables=["failures", "coordinators", "promises"], paths="<placeholders of .*/Icon.png$",
                     columns={"placeholders": ["bytes"], "applications": ["install_type"]})


@pytest.mark.parametrize("name, fault, ever", combinations())
def test_a_failing_call_is_told_and_survived(meddling, prepared, name, fault, ever):
    scenario, expected = prepared(name)
    calls, error = FAULTS[fault]
    count = scenario.meddled("--calls", calls).count
    options = ["--calls", calls, "--fail", error] + (["--ever"] if ever else [])
    problems = []
    for number in chosen(count, "%s %s %s" % (name, fault, ever)):
        outcome = scenario.meddled(*options, "--at", number)
        try:
            check_said(outcome, error)
            check_truth(scenario, expected, outcome)
            scenario.check(expected, forgivingly)
            scenario.follow_up()
        except AssertionError as problem:
            problems.append("%s --at %d: %s -> %s\n%s\n%s" % (
                " ".join(options), number, outcome.hit, outcome.status, outcome.said, problem))
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
