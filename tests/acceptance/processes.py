"""How the tests start commands, and which of them are for a plain build only."""

import os
import signal

SIGNALS = (signal.SIGHUP, signal.SIGINT, signal.SIGQUIT, signal.SIGTERM, signal.SIGPIPE)


def with_default_signals():
    """For a command that is about to begin. What runs in the background of a script, or under nohup, ignores
    some signals, and so would all that it starts: a command that is interrupted there rightly goes on.
    """
    for each in SIGNALS:
        signal.signal(each, signal.SIG_DFL)


def is_sanitized(program):
    """Whether a sanitizer is built in, which its build directory is named for."""
    return "san" in os.path.basename(os.path.dirname(program))


def leave_out_what_measures(config, items):
    """Deselects what is marked `plain_build` where a sanitizer is built in."""
    if not is_sanitized(os.path.abspath(os.environ.get("APPSYNC", ""))):
        return
    left_out = [item for item in items if item.get_closest_marker("plain_build")]
    config.hook.pytest_deselected(items=left_out)
    items[:] = [item for item in items if item not in left_out]
