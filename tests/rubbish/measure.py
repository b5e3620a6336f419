"""Runs commands, one for each JSON line that it reads, and tells what each has cost.

A process of its own, and a small one: what a child is said to have taken includes what it was before
it became the command, a copy of its parent.
"""

import json
import os
import signal
import sys


def run(order):
    child = os.fork()
    if child == 0:
        os.setsid()
        for number, path, flags in ((0, os.devnull, os.O_RDONLY), (1, order["out"], os.O_WRONLY),
                                    (2, order["err"], os.O_WRONLY)):
            os.dup2(os.open(path, flags | (os.O_CREAT | os.O_TRUNC if number else 0)), number)
        os.chdir(order["directory"])
        for each in (signal.SIGHUP, signal.SIGINT, signal.SIGQUIT, signal.SIGTERM, signal.SIGPIPE):
            signal.signal(each, signal.SIG_DFL)
        try:
            os.execve(order["command"][0], order["command"], order["environment"])
        finally:
            os._exit(127)
    signal.alarm(order["timeout"])
    late = False
    while True:
        try:
            _, status, usage = os.wait4(child, 0)
            break
        except TimeoutError:
            late = True
            os.kill(child, signal.SIGKILL)
    signal.alarm(0)
    return {"status": os.waitstatus_to_exitcode(status), "late": late,
            "seconds": usage.ru_utime + usage.ru_stime, "kilobytes": usage.ru_maxrss}


def on_alarm(*_):
    raise TimeoutError


signal.signal(signal.SIGALRM, on_alarm)
for line in sys.stdin:
    print(json.dumps(run(json.loads(line))), flush=True)
