"""A command on a real terminal, and what a person sees there: a terminal emulator renders it."""

import codecs
import fcntl
import os
import pty
import select
import struct
import subprocess
import termios
import time

import pyte

from processes import with_default_signals

TIMEOUT = float(os.environ.get("APPSYNC_TEST_TIMEOUT", "120"))


class Terminal:
    def __init__(self, program, arguments, columns=80, lines=24, locale="C.UTF-8", term="xterm",
                 typed=b"", environment=None):
        self.master, slave = pty.openpty()
        self.columns = columns
        self._set_size(slave, columns, lines)
        self.screen = pyte.HistoryScreen(columns, lines, history=10_000)
        self.stream = pyte.Stream(self.screen)
        self.decoder = codecs.getincrementaldecoder("utf-8")("replace")
        self.written = ""
        self.type(typed)
        self.process = subprocess.Popen(
            [program, *map(str, arguments)], stdin=slave, stdout=slave, stderr=slave,
            env={**os.environ, "TERM": term, "LC_ALL": locale, **(environment or {})}, start_new_session=True,
            preexec_fn=self._take_terminal)
        os.close(slave)

    @staticmethod
    def _set_size(descriptor, columns, lines):
        fcntl.ioctl(descriptor, termios.TIOCSWINSZ, struct.pack("HHHH", lines, columns, 0, 0))

    @staticmethod
    def _take_terminal():
        with_default_signals()
        fcntl.ioctl(0, termios.TIOCSCTTY, 0)

    def type(self, keys):
        os.write(self.master, keys)

    def resize(self, columns, lines=24):
        self._set_size(self.master, columns, lines)
        self.screen.resize(lines, columns)

    def read_some(self, limit=TIMEOUT, most=65536):
        """Whether something came within that time."""
        ready, _, _ = select.select([self.master], [], [], limit)
        if not ready:
            return False
        try:
            piece = os.read(self.master, most)
        except OSError:  # nobody has the other side open any more
            return False
        text = self.decoder.decode(piece)
        self.written += text
        self.stream.feed(text)
        return bool(piece)

    def read_until(self, wanted):
        """Reads until the screen is as it is wanted: a text that it shows, or what its lines are to fulfil."""
        end = time.monotonic() + TIMEOUT
        condition = wanted if callable(wanted) else lambda lines: any(wanted in line for line in lines)
        while not condition(self.shown()):
            assert self.read_some(max(0, end - time.monotonic())), self.shown()

    def read_to_end(self):
        """Reads until the command has ended. Gives its status."""
        while self.read_some():
            pass
        return self.process.wait(timeout=TIMEOUT)

    def shown(self):
        """The lines on the screen that are not empty."""
        return [line.rstrip() for line in self.screen.display if line.strip()]

    def everything(self):
        """These, and those that have scrolled away."""
        above = ["".join(line[column].data for column in range(self.columns)).rstrip()
                 for line in self.screen.history.top]
        return [line for line in above if line] + self.shown()

    def end(self):
        self.process.kill()
        self.process.wait()
        os.close(self.master)
