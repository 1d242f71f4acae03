"""Two thousand applications that wait for their turn at the gate of font requests."""

import json
import os
import pathlib
import signal
import subprocess
import sys
import unittest

from gate_crowd import family_of, file_of
from hostile_clients import TYPHON, Hostile, message
from scratch_system import SERVICE, ScratchSystem, entry, eventually

HERE = pathlib.Path(__file__).parent
PROCESSES = 8
OF_A_PROCESS = 250
IN_ORDER = 20
CHECK_INS = 8
# As docs/ipc.md and docs/font-requests.md state them.
MOST_THREADS = 24
# Sanitizers take more.
MEMORY_OF_A_WAITING_CLIENT = int(os.environ.get("TYPHON_MEMORY_FACTOR", "1")) * 32 << 10


class Crowd:
    """A running process of the crowd, with the applications from `first` on."""

    def __init__(self, socket, first):
        self.process = subprocess.Popen(
            [sys.executable, HERE / "gate_crowd.py", str(socket), str(first), str(OF_A_PROCESS)],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        self.answers = []

    def tells(self):
        line = self.process.stdout.readline()
        if not line:
            raise AssertionError(f"the crowd ended with {self.process.wait()}")
        return json.loads(line)

    def wait_for(self, **expected):
        """Until it says that, noting answers meanwhile."""
        while (told := self.tells()) != expected:
            self.note(told)

    def wait_for_answers(self, count):
        while len(self.answers) < count:
            self.note(self.tells())

    def note(self, told):
        if not told.get("right"):
            raise AssertionError(f"unexpected: {told}")
        self.answers.append(told["answered"])

    def ask(self, count):
        self.process.stdin.write(f"{count}\n")
        self.process.stdin.flush()
        self.wait_for(asked=count)

    def discard(self):
        if self.process.poll() is None:
            self.process.send_signal(signal.SIGKILL)
        self.process.stdin.close()
        self.process.stdout.close()
        self.process.wait()


class Gate(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_registry({path.replace("a.ttf", file_of(number)): entry(f"Face{number}", family_of(number))
                                    for number in range(PROCESSES * OF_A_PROCESS)})
        self.system.install_application("org.example.crowd")
        self.system.sign(os.path.realpath(sys.executable), "org.example.crowd", ["app-usage"])
        self.daemon = self.system.start()
        self.other = Hostile(str(self.system.socket_path(SERVICE)))
        self.addCleanup(self.other.socket.close)

    def status(self, key):
        for line in pathlib.Path(f"/proc/{self.daemon.process.pid}/status").read_text().splitlines():
            if line.startswith(key + ":"):
                return int(line.split()[1])
        raise AssertionError(f"no {key}")

    def crowd(self):
        crowd = [Crowd(self.system.socket_path(SERVICE), number * OF_A_PROCESS) for number in range(PROCESSES)]
        for process in crowd:
            self.addCleanup(process.discard)
        for process in crowd:
            process.wait_for(connected=OF_A_PROCESS)
        return crowd

    # -- what the daemon says of the gate

    def waiting(self):
        """How many requests had to wait."""
        return len(self.daemon.lines_with("is blocked until the previous call is acknowledged by the user"))

    def turns(self):
        """How many requests passed the gate."""
        return len(self.daemon.lines_with("requestFonts -  ("))

    def is_at_rest(self):
        """Whether no thread of the daemon runs or is about to."""
        threads = pathlib.Path(f"/proc/{self.daemon.process.pid}/task")
        try:
            states = [thread.joinpath("stat").read_text().rpartition(")")[2].split()[0] for thread in threads.iterdir()]
        except (FileNotFoundError, ProcessLookupError):
            return False
        return set(states) == {"S"}

    def arrive(self, process, number):
        """Lets the next application ask, and waits until it has its place at the gate; gives how many had to wait."""
        before = self.waiting()
        passed = f'requestFonts -  ({{ LFFontFamilyNameAttribute = "{family_of(number)}"; '
        process.ask(1)
        eventually(lambda: self.waiting() > before or self.daemon.lines_with(passed))
        # That line is written before the place is taken.
        eventually(self.is_at_rest)
        return self.waiting() - before

    def check_in(self):
        """Somebody else's check-in; gives how many requests passed the gate meanwhile."""
        before, replies = self.turns(), self.other.replies
        self.other.send(message(TYPHON, "checkin"))
        self.other.await_replies(replies.count + 1)
        self.assertEqual(replies.errors, 0)
        return self.turns() - before

    def test_two_thousand_wait_in_order_and_cost_little_while_others_are_served(self):
        self.check_in()
        before = self.status("VmRSS")
        first, *others = self.crowd()
        hindered = sum(self.arrive(first, number) for number in range(IN_ORDER))
        for process in others:
            process.ask(OF_A_PROCESS)
        first.ask(OF_A_PROCESS - IN_ORDER)
        eventually(lambda: self.waiting() - hindered == PROCESSES * OF_A_PROCESS - IN_ORDER)

        passed = [self.check_in() for _ in range(CHECK_INS)]
        # Between requests: each check-in comes before the next turn, or, when that has begun, after it.
        self.assertLessEqual(sum(passed), 2 * CHECK_INS, passed)

        first.wait_for_answers(IN_ORDER)
        self.assertEqual(first.answers[:IN_ORDER], list(range(IN_ORDER)))
        self.assertLessEqual(self.status("Threads"), MOST_THREADS)
        grown = (self.status("VmHWM") - before) << 10
        if os.environ.get("TYPHON_HOSTILE_REPORT"):
            print(f"threads {self.status('Threads')}, grown by {grown >> 10} KiB, turns during check-ins {passed}",
                  file=sys.stderr)
        self.assertLessEqual(grown, PROCESSES * OF_A_PROCESS * MEMORY_OF_A_WAITING_CLIENT)


if __name__ == "__main__":
    unittest.main()
