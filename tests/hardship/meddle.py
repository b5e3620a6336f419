#!/usr/bin/python3
"""Runs a command and meddles with its file-system calls: at the N-th it is killed, or the call fails.

    meddle.py --within /tmp/device --kill 217 -- appsync sync /tmp/device library
    meddle.py --within /tmp/device --calls fsync,fdatasync --fail EIO --at 3 [--ever] -- ...

Calls are counted over all threads, in the order in which they begin, and only those on what stands below
one of the --within paths (all, without one). A kill comes before the call is made, so killing at every
number there is covers every state that the command leaves behind. strace counts each thread by itself: its
`when=` never reaches the late calls of a thread that makes few, which is where installs commit.

Prints one JSON object on the descriptor of --report: status (as subprocess gives it), count, and hit (number,
name, path of the call that was meddled with; null without one). With --list it holds every call.
"""

import argparse
import ctypes
import errno
import fcntl
import json
import os
import platform
import signal
import struct
import sys

# name: (number on x86-64, index of the directory's descriptor, index of the path). Without a path the
# descriptor is the file's.
CALLS = {
    "write": (1, 0, None),
    "writev": (20, 0, None),
    "pwrite64": (18, 0, None),
    "pwritev": (296, 0, None),
    "fsync": (74, 0, None),
    "fdatasync": (75, 0, None),
    "sync_file_range": (277, 0, None),
    "syncfs": (306, 0, None),
    "ftruncate": (77, 0, None),
    "fallocate": (285, 0, None),
    "sendfile": (40, 0, None),
    "copy_file_range": (326, 2, None),
    "fchmod": (91, 0, None),
    "fchown": (93, 0, None),
    "flock": (73, 0, None),
    "open": (2, None, 0),
    "creat": (85, None, 0),
    "truncate": (76, None, 0),
    "rename": (82, None, 0),
    "mkdir": (83, None, 0),
    "rmdir": (84, None, 0),
    "link": (86, None, 1),
    "unlink": (87, None, 0),
    "symlink": (88, None, 1),
    "chmod": (90, None, 0),
    "chown": (92, None, 0),
    "lchown": (94, None, 0),
    "openat": (257, 0, 1),
    "mkdirat": (258, 0, 1),
    "fchownat": (260, 0, 1),
    "unlinkat": (263, 0, 1),
    "renameat": (264, 0, 1),
    "linkat": (265, 2, 3),
    "symlinkat": (266, 1, 2),
    "fchmodat": (268, 0, 1),
    "utimensat": (280, 0, 1),
    "renameat2": (316, 0, 1),
    "openat2": (437, 0, 1),
    "fchmodat2": (452, 0, 1),
}
NAMES = {number: name for name, (number, _, _) in CALLS.items()}

PTRACE_CONT, PTRACE_POKEUSER, PTRACE_SEIZE, PTRACE_GET_SYSCALL_INFO = 7, 6, 0x4206, 0x420E
EVENT_SECCOMP = 7
# Follow forks, threads and exec; stop at what the filter names; kill the command when this program ends.
OPTIONS = 1 << 1 | 1 << 2 | 1 << 3 | 1 << 4 | 1 << EVENT_SECCOMP | 1 << 20
RAX, ORIG_RAX = 10 * 8, 15 * 8
WALL = 0x40000000

libc = ctypes.CDLL(None, use_errno=True)
libc.ptrace.argtypes = [ctypes.c_long, ctypes.c_long, ctypes.c_void_p, ctypes.c_void_p]
libc.ptrace.restype = ctypes.c_long


def ptrace(request, process, address=0, data=0):
    if libc.ptrace(request, process, address, data) == -1 and ctypes.get_errno() != errno.ESRCH:
        raise OSError(ctypes.get_errno(), "ptrace")


def filter_for(names):
    """A seccomp program that stops at the calls and lets all others through at full speed."""
    code = struct.pack("HBBI", 0x20, 0, 0, 0)  # load the call's number
    numbers = [CALLS[name][0] for name in names]
    for left, number in zip(range(len(numbers), 0, -1), numbers):
        code += struct.pack("HBBI", 0x15, left, 0, number)  # equal: to the last line
    code += struct.pack("HBBI", 0x06, 0, 0, 0x7FFF0000)  # allow
    return code + struct.pack("HBBI", 0x06, 0, 0, 0x7FF00000)  # tell the tracer


def start(command, names):
    """The command as a traced process that is about to begin."""
    code = ctypes.create_string_buffer(filter_for(names))
    program = ctypes.create_string_buffer(struct.pack("HxxxxxxP", (len(code) - 1) // 8, ctypes.addressof(code)))
    reading, writing = os.pipe()
    process = os.fork()
    if process == 0:
        os.close(writing)
        os.read(reading, 1)
        libc.prctl(38, 1, 0, 0, 0)  # PR_SET_NO_NEW_PRIVS
        if libc.prctl(22, 2, ctypes.byref(program), 0, 0) != 0:  # PR_SET_SECCOMP
            os._exit(126)
        try:
            os.execvp(command[0], command)
        finally:
            os._exit(127)
    ptrace(PTRACE_SEIZE, process, 0, OPTIONS)
    os.close(reading)
    os.close(writing)
    return process


class Meddler:
    def __init__(self, options, main):
        self.options = options
        self.main = main
        self.count = 0
        self.hit = None
        self.all = []
        self.info = ctypes.create_string_buffer(128)

    def call(self, thread):
        """One call is about to be made by the thread."""
        ptrace(PTRACE_GET_SYSCALL_INFO, thread, len(self.info), ctypes.addressof(self.info))
        number, *arguments = struct.unpack_from("7Q", self.info, 24)
        name = NAMES.get(number)
        if name is None:
            return
        path = self.path_of(thread, name, arguments)
        if not self.counts(path):
            return
        self.count += 1
        if self.options.list:
            self.all.append((name, path))
        if self.options.kill == self.count:
            self.note(name, path)
            os.kill(self.main, signal.SIGKILL)
        elif self.options.fail and (self.count == self.options.at or
                                    self.options.ever and self.count > self.options.at):
            self.note(name, path)
            code = getattr(errno, self.options.fail)
            ptrace(PTRACE_POKEUSER, thread, ORIG_RAX, 2**64 - 1)
            ptrace(PTRACE_POKEUSER, thread, RAX, 2**64 - code)

    def note(self, name, path):
        if self.hit is None:
            self.hit = {"number": self.count, "name": name, "path": path}

    def counts(self, path):
        within = self.options.within
        return path is not None and (
            not within or any(path == each or path.startswith(each.rstrip("/") + "/") for each in within))

    @staticmethod
    def path_of(thread, name, arguments):
        """Where the call does something; nothing for a pipe and the like."""
        _, directory, path = CALLS[name]
        try:
            base = "cwd"
            if directory is not None and arguments[directory] & 0xFFFFFFFF != 0xFFFFFF9C:  # AT_FDCWD
                base = "fd/%d" % (arguments[directory] & 0xFFFFFFFF)
            base = os.readlink("/proc/%d/%s" % (thread, base))
            if path is None:
                return base if base.startswith("/") else None
            with open("/proc/%d/mem" % thread, "rb", buffering=0) as memory:
                text = os.pread(memory.fileno(), 4096, arguments[path]).split(b"\0")[0]
            text = os.fsdecode(text)
            # openat2 takes absolute paths as ones inside the directory.
            return base + "/" + text.lstrip("/") if name == "openat2" else os.path.join(base, text)
        except OSError:
            return None

    def run(self):
        """Goes on until every process has ended; gives the status of the first."""
        result = None
        while True:
            try:
                process, status = os.waitpid(-1, WALL)
            except ChildProcessError:
                return result
            if not os.WIFSTOPPED(status):
                if process == self.main:
                    result = os.waitstatus_to_exitcode(status)
                continue
            event = status >> 16
            if event == EVENT_SECCOMP:
                self.call(process)
            number = 0 if event else os.WSTOPSIG(status)
            ptrace(PTRACE_CONT, process, 0, number)


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("--within", action="append", default=[])
    parser.add_argument("--calls", default=",".join(CALLS))
    parser.add_argument("--kill", type=int)
    parser.add_argument("--fail", help="name of an errno")
    parser.add_argument("--at", type=int, default=1)
    parser.add_argument("--ever", action="store_true")
    parser.add_argument("--list", action="store_true")
    parser.add_argument("--report", type=int, default=2)
    parser.add_argument("command", nargs="+")
    options = parser.parse_args()
    if platform.machine() != "x86_64":
        sys.exit("meddle: the numbers of the system calls are known for x86-64 only")
    fcntl.fcntl(options.report, fcntl.F_SETFD, 0 if options.report < 3 else fcntl.FD_CLOEXEC)
    main_process = start(options.command, options.calls.split(","))
    meddler = Meddler(options, main_process)
    status = meddler.run()
    report = {"status": status, "count": meddler.count, "hit": meddler.hit}
    if options.list:
        report["calls"] = meddler.all
    os.write(options.report, json.dumps(report).encode() + b"\n")


if __name__ == "__main__":
    main()
