"""Many applications in one process that each ask for a font of their own and wait: gate_crowd.py SOCKET FIRST COUNT.
Connects COUNT times. For each line of its standard input, "N", the next N of them ask; it prints one line of JSON when it
is connected, when they have asked, and for every answer."""

import os
import selectors
import struct
import sys

from hostile_clients import TYPHON, Hostile, Replies, aligned, message, tell, text

FAMILY = "LFFontFamilyNameAttribute"


def family_of(number):
    return f"Family {number}"


def file_of(number):
    return f"{number}.ttf"


def request(family):
    """A request for one family."""
    entry = aligned(text(FAMILY) + b"\1s\0", 4) + text(family)
    body = struct.pack("<II", 4 + len(entry), len(entry)) + entry
    return message(TYPHON, "requestFonts_reply", "aa{sv}", body)


class KeptReplies(Replies):
    """Replies that can be looked into."""

    def __init__(self):
        super().__init__()
        self.text = b""

    def feed(self, data):
        self.text += data
        super().feed(data)


class Application(Hostile):
    """One that asks for its font once."""

    def __init__(self, path, number):
        super().__init__(path)
        self.number = number
        self.replies = KeptReplies()

    def ask(self):
        self.send(request(family_of(self.number)))

    def is_right(self):
        """It was given its own font, and nothing else."""
        return (self.replies.returns, self.replies.errors, self.replies.text.count(b".ttf\0")) == (1, 0, 1) and \
            f"/{file_of(self.number)}\0".encode() in self.replies.text


def run(path, first, count):
    applications = [Application(path, first + number) for number in range(count)]
    tell(connected=count)
    waiting = iter(applications)
    selector = selectors.DefaultSelector()
    selector.register(sys.stdin, selectors.EVENT_READ)
    for application in applications:
        selector.register(application.socket, selectors.EVENT_READ, application)
    while True:
        for key, _ in sorted(selector.select(), key=lambda ready: ready[0].fd):
            application = key.data
            if application is not None:
                before = application.replies.count
                if not application.receive():
                    raise SystemExit("a connection was closed")
                if application.replies.count > before:
                    tell(answered=application.number, right=application.is_right())
                continue
            line = os.read(0, 64)
            if not line:
                return
            for _ in range(int(line)):
                next(waiting).ask()
            tell(asked=int(line))


if __name__ == "__main__":
    run(sys.argv[1], int(sys.argv[2]), int(sys.argv[3]))
