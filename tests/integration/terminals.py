"""Programs that run in pseudo-terminals, as somebody at a keyboard would run them."""

import fcntl
import os
import re
import signal
import struct
import subprocess
import termios
import threading

from scratch_system import PATIENCE

UP, DOWN, RIGHT, LEFT, ENTER, ESCAPE = b"\x1b[A", b"\x1b[B", b"\x1b[C", b"\x1b[D", b"\r", b"\x1b"
SEQUENCES = re.compile(r"\x1b\[[0-9;?]*[A-Za-z]")


class TerminalProgram:
    """A program that leads a session on a terminal of its own."""

    def __init__(self, *command, columns=80, lines=24):
        self.ours, self.theirs = os.openpty()
        fcntl.ioctl(self.theirs, termios.TIOCSWINSZ, struct.pack("HHHH", lines, columns, 0, 0))
        self.settings = termios.tcgetattr(self.theirs)
        self.process = subprocess.Popen(
            [str(part) for part in command], stdin=self.theirs, stdout=self.theirs, stderr=self.theirs,
            start_new_session=True, preexec_fn=self._take_terminal)
        self._text = ""
        self._changed = threading.Condition()
        self._reader = threading.Thread(target=self._read, daemon=True)
        self._reader.start()

    @staticmethod
    def _take_terminal():
        fcntl.ioctl(0, termios.TIOCSCTTY, 0)

    def _read(self):
        while True:
            try:
                data = os.read(self.ours, 65536)
            except OSError:
                data = b""
            if not data:
                return
            with self._changed:
                self._text += data.decode(errors="replace")
                self._changed.notify_all()

    @property
    def number(self):
        """The terminal's device number as the kernel encodes it."""
        device = os.stat(self.theirs).st_rdev
        major, minor = os.major(device), os.minor(device)
        return (minor & 0xFF) | (major << 8) | ((minor & ~0xFF) << 12)

    def text(self):
        """All that it has written so far, escape sequences and all."""
        with self._changed:
            return self._text

    def plain_text(self):
        return SEQUENCES.sub("", self.text())

    def wait_for(self, text, since=0):
        """Waits until `text` stands in what it wrote after so many characters; gives where that ended."""
        with self._changed:
            self._changed.wait_for(lambda: text in self._text[since:], PATIENCE)
            if text not in self._text[since:]:
                raise AssertionError(f"{text!r} was not written: {self._text[since:]!r}")
            return len(self._text)

    def send(self, data):
        os.write(self.ours, data)

    def wait(self):
        """Waits for its end; gives its exit status."""
        return self.process.wait(PATIENCE)

    def signal(self, number):
        self.process.send_signal(number)

    def is_as_before(self):
        """Whether the terminal has the settings it had at first."""
        return termios.tcgetattr(self.theirs) == self.settings

    def close(self):
        if self.process.poll() is None:
            # What it started is in its session and gets the hang-up of its terminal.
            self.process.send_signal(signal.SIGKILL)
        self.process.wait(PATIENCE)
        os.close(self.theirs)
        self._reader.join(PATIENCE)
        os.close(self.ours)
