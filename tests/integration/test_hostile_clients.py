"""Clients that mean no good cost themselves: everybody else is served, the daemon stays within its bounds, and its log
says what happened once. Numbers that a small machine should not try in passing are options:
TYPHON_IDLE_CONNECTIONS=10000, TYPHON_NEVER_ANSWERED_CALLS=1000000, TYPHON_HOSTILE_REPORT=1 prints what was measured."""

import json
import os
import pathlib
import signal
import subprocess
import sys
import unittest

from scratch_system import SERVICE, ScratchSystem, entry, eventually

HERE = pathlib.Path(__file__).parent
CONNECTIONS_OF_A_PROCESS = 256
# As docs/ipc.md states them.
MOST_THREADS = 24
# What a sanitizer adds to every allocation, and keeps of freed ones, is not the daemon's.
INSTRUMENTED = int(os.environ.get("TYPHON_MEMORY_FACTOR", "1"))
MOST_GROWTH = INSTRUMENTED * 256 << 20
LEFT_BEHIND = 32 << 20 if INSTRUMENTED == 1 else MOST_GROWTH
IDLE_CONNECTIONS = int(os.environ.get("TYPHON_IDLE_CONNECTIONS", "500"))
IDLE_CONNECTION_MEMORY = INSTRUMENTED * 16 << 10
NEVER_ANSWERED_CALLS = int(os.environ.get("TYPHON_NEVER_ANSWERED_CALLS", "32000"))
CHECK_INS_AT_ONCE = 1000
# A daemon that is slow reads from those who take its time all the more seldom.
NEVER_READING = 8 if INSTRUMENTED == 1 else 2
FONTS = 2000


class Process:
    """A running hostile client."""

    def __init__(self, socket, behaviour, count):
        self.process = subprocess.Popen(
            [sys.executable, HERE / "hostile_clients.py", str(socket), behaviour, str(count)],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)

    def tells(self):
        """The next thing it says; fails when it has died."""
        line = self.process.stdout.readline()
        if not line:
            raise AssertionError(f"the hostile client ended with {self.process.wait()}")
        return json.loads(line)

    def say(self):
        self.process.stdin.write("\n")
        self.process.stdin.flush()

    def stop(self):
        """Ends it; what it says in the end, if anything."""
        self.process.stdin.close()
        rest = self.process.stdout.read()
        self.process.stdout.close()
        self.process.wait()
        return json.loads(rest) if rest else None

    def discard(self):
        if self.process.poll() is None:
            self.process.send_signal(signal.SIGKILL)
        if not self.process.stdin.closed:
            self.process.stdin.close()
        self.process.stdout.close()
        self.process.wait()


class HostileClients(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.fonts = {path.replace("a.ttf", f"{number}.ttf"): entry(f"Face{number}", f"Family {number}")
                      for number in range(FONTS)}
        self.system.write_registry(self.fonts)
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.daemon = self.system.start()
        # What its start takes, and what of that stays, is not the clients'.
        self.system.wait_until_started()
        self.assert_others_are_served(1)
        self.undisturbed = self.memory()

    def hostile(self, behaviour, count):
        process = Process(self.system.socket_path(SERVICE), behaviour, count)
        self.addCleanup(process.discard)
        return process

    # -- what must hold

    def assert_others_are_served(self, times=5):
        for _ in range(times):
            self.assertEqual(len(self.system.checkin(self.viewer)["fontsInfo"]), FONTS)

    def status(self, key):
        for line in pathlib.Path(f"/proc/{self.daemon.process.pid}/status").read_text().splitlines():
            if line.startswith(key + ":"):
                return int(line.split()[1])
        raise AssertionError(f"no {key}")

    def memory(self, key="VmRSS"):
        return self.status(key) * 1024

    def descriptors(self):
        return len(self.daemon.open_files())

    def assert_bounds_hold(self):
        self.report(self._testMethodName, most_memory_KiB=self.memory("VmHWM") // 1024,
                    memory_KiB=self.memory() // 1024, threads=self.status("Threads"),
                    descriptors=self.descriptors())
        self.assertLessEqual(self.status("Threads"), MOST_THREADS)
        # The most there ever was, not what is left.
        self.assertLessEqual(self.memory("VmHWM") - self.undisturbed, MOST_GROWTH)

    def assert_logged_once(self, what):
        self.daemon.wait_for_line(what)
        self.assertEqual(len(self.daemon.lines_with(what)), 1, self.daemon.lines_with(what)[:5])

    @staticmethod
    def report(what, **numbers):
        if os.environ.get("TYPHON_HOSTILE_REPORT"):
            print(what, json.dumps(numbers), file=sys.stderr)

    # -- the clients

    def test_one_that_floods(self):
        flooding = [self.hostile("flood", 100) for _ in range(3)]
        for process in flooding:
            process.tells()
        self.assert_others_are_served()
        for process in flooding:
            told = process.stop()
            self.report("flood", **told)
            self.assertGreater(told["sent"], 0)
            # Every call got its answer, if only that there were too many.
            self.assertEqual(told["returns"] + told["errors"], told["sent"])
        self.assertLessEqual(len(self.daemon.lines_with("unanswered calls")), len(flooding))
        self.assert_bounds_hold()

    def test_one_that_never_reads(self):
        before = self.descriptors()
        process = self.hostile("never_reads", NEVER_READING)
        self.assert_others_are_served()
        self.assertEqual(process.tells()["closed"], NEVER_READING)
        self.assert_logged_once("bytes unread")
        self.assert_others_are_served(1)
        self.assert_bounds_hold()
        eventually(lambda: self.descriptors() <= before)

    def test_one_that_leaves_a_little_unread_on_every_connection(self):
        process = self.hostile("leaves_unread", 200)
        told = process.tells()
        self.report("leaves unread", **told)
        self.assertGreater(told["closed"], 0)
        self.assert_logged_once("left too much unread")
        self.assert_others_are_served()
        self.assert_bounds_hold()
        process.stop()
        # Most of what it took is given back when its connections are closed.
        eventually(lambda: self.memory() - self.undisturbed < LEFT_BEHIND)

    def test_one_that_sends_half_a_message_and_waits(self):
        process = self.hostile("half_messages", 16)
        self.assertEqual(process.tells(), {"waiting": 16})
        self.assert_others_are_served()
        self.assertEqual(process.tells(), {"closed": 16})
        self.assert_logged_once("it did not finish a message in time")
        self.assert_bounds_hold()

    def test_one_that_makes_the_daemon_hold_large_messages(self):
        process = self.hostile("hold_messages", 16)
        told = process.tells()
        self.assertEqual(told, {"held": 8, "closed": 8})
        self.assert_logged_once("it left too many messages unfinished")
        self.assert_others_are_served()
        self.assert_bounds_hold()

    def test_one_that_opens_connections_in_a_loop(self):
        process = self.hostile("connects", 1000)
        self.assertEqual(process.tells(), {"kept": CONNECTIONS_OF_A_PROCESS,
                                           "refused": 1000 - CONNECTIONS_OF_A_PROCESS})
        self.assert_logged_once("connections; further ones are refused")
        self.assert_others_are_served()
        self.assert_bounds_hold()

    def test_one_that_connects_and_leaves(self):
        before = self.descriptors()
        process = self.hostile("connects_and_leaves", 1500)
        self.assert_others_are_served()
        self.assertEqual(process.tells(), {"opened": 1500})
        self.assert_others_are_served(1)
        self.assert_bounds_hold()
        eventually(lambda: self.descriptors() <= before)

    def test_one_that_passes_253_descriptors_with_every_message(self):
        before = self.descriptors()
        process = self.hostile("many_descriptors", 100)
        self.assert_others_are_served()
        self.assertEqual(process.tells(), {"closed": 100})
        self.assert_logged_once("its message has too many descriptors")
        self.assert_bounds_hold()
        eventually(lambda: self.descriptors() <= before)

    def test_one_that_hides_descriptors_behind_an_invalid_message(self):
        before = self.descriptors()
        process = self.hostile("hidden_descriptors", 100)
        self.assert_others_are_served()
        self.assertEqual(process.tells(), {"closed": 100})
        self.assert_logged_once("it sent something that is no message")
        self.assert_bounds_hold()
        eventually(lambda: self.descriptors() <= before)

    def test_one_that_calls_what_is_never_answered(self):
        before = self.memory()
        process = self.hostile("never_answered", NEVER_ANSWERED_CALLS)
        self.assert_others_are_served()
        told = process.tells()
        self.report("never answered", grown_KiB=(self.memory() - before) // 1024, **told)
        self.assertEqual(told["sent"], NEVER_ANSWERED_CALLS)
        # Those that are answered in between all were.
        self.assertEqual(told["returns"], told["sent"] // 32)
        self.assertEqual(told["errors"], 0)
        self.assertEqual(self.daemon.lines_with("unanswered calls"), [])
        self.assert_others_are_served(1)
        self.assert_bounds_hold()

    # -- many at once

    def test_a_thousand_clients_check_in_at_once(self):
        self.system.sign(os.path.realpath(sys.executable), "org.example.crowd", ["font-enumeration"])
        self.system.restart()
        self.daemon = self.system.daemon
        self.assert_others_are_served(1)
        self.undisturbed = self.memory()
        crowd = [self.hostile("check_ins", CHECK_INS_AT_ONCE // 4) for _ in range(4)]
        for process in crowd:
            self.assertEqual(process.tells(), {"connected": CHECK_INS_AT_ONCE // 4})
        for process in crowd:
            process.say()
        for process in crowd:
            # Each with its view, in a memory file.
            self.assertEqual(process.tells(), {"returns": CHECK_INS_AT_ONCE // 4, "errors": 0,
                                               "descriptors": CHECK_INS_AT_ONCE // 4})
        self.assert_others_are_served(1)
        self.assert_bounds_hold()

    def test_idle_connections_cost_little_and_disturb_nobody(self):
        memory, descriptors = self.memory(), self.descriptors()
        idle = []
        while len(idle) * 250 < IDLE_CONNECTIONS:
            idle.append(self.hostile("connects", 250))
            self.assertEqual(idle[-1].tells(), {"kept": 250, "refused": 0})
        grown = self.memory() - memory
        self.report("idle", connections=len(idle) * 250, bytes_each=grown // (len(idle) * 250))
        self.assertLessEqual(grown, len(idle) * 250 * IDLE_CONNECTION_MEMORY)
        self.assert_others_are_served()
        self.assert_bounds_hold()
        for process in idle:
            process.stop()
        eventually(lambda: self.descriptors() <= descriptors)
        self.report("idle connections closed", left_KiB=(self.memory() - memory) // 1024)
        self.assert_others_are_served(1)


if __name__ == "__main__":
    unittest.main()
