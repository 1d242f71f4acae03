"""kill -9 at any moment of recordings and passes: what had been flushed is still scheduled, or deleted, or, if it was due
and the kill fell between the flush of the shortened schedule and its deletion, still there and not scheduled. What was
never scheduled never goes. TYPHON_DELETION_ROUNDS sets how often, TYPHON_DELETION_SEED which moments."""

import os
import plistlib
import random
import threading
import time
import unittest

import gi

gi.require_version("Gio", "2.0")
from gi.repository import GLib  # noqa: E402

from foreign_client import Client  # noqa: E402
from scratch_system import FONT_FILES, PREFERENCES, Daemon, ScratchSystem, in_seconds  # noqa: E402

ROUNDS = int(os.environ.get("TYPHON_DELETION_ROUNDS", "8"))
SEED = os.environ.get("TYPHON_DELETION_SEED", "1")
LATEST_KILL = 0.25
LATEST_KILL_OF_A_PASS = 0.01


class Recorder(threading.Thread):
    """A client that schedules batch after batch, and notes what it found on the disk meanwhile."""

    def __init__(self, system, batches):
        super().__init__()
        self.system = system
        self.batches = batches
        self.flushed = set()

    def note_flushed(self):
        try:
            self.flushed |= set(plistlib.loads(self.system.real(PREFERENCES).read_bytes()).get("delete", {}))
        except FileNotFoundError:
            pass

    def run(self):
        try:
            self.system.wait_for_socket(self.system.socket_path())
            client = Client(self.system.root)
            for batch in self.batches:
                client.call("TyphonProtocol", "scheduleFontFilesDeletion", GLib.Variant("(as)", (batch,)))
                self.note_flushed()
        except (AssertionError, OSError, GLib.Error):
            pass  # The daemon is gone.


class Kills(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        # Brings up the helper, for all rounds: one that starts sweeps the folders that are being made for the next.
        self.system.start()
        self.system.daemon.kill()
        self.random = random.Random(SEED)
        self.counts = {"still scheduled": 0, "deleted": 0, "there and not scheduled": 0, "recorded": 0}

    def exists(self, logical):
        return os.path.lexists(self.system.real(logical))

    def files(self, folder, count):
        return [self.system.font_file(f"{folder}.{index % 10}", f"{index}.ttf") for index in range(count)]

    def test_kills(self):
        for number in range(ROUNDS):
            with self.subTest(round=number, seed=SEED):
                self.one_round(number)
        print(f"{ROUNDS} kills: {self.counts}")

    def one_round(self, number):
        due = self.files(f"due{number}", 600)
        waiting = self.files(f"waiting{number}", 100)
        bystanders = [self.system.font_file(f"due{number}.{index}", "bystander.ttf") for index in range(0, 10, 2)]
        bystanders += [self.system.font_file(f"never{number}", "bystander.ttf")]
        self.system.write_preferences({"deleteDelay": 5000, "delete": {path: in_seconds(0) for path in due}})
        recorder = self.kill_at_some_moment([waiting[start:start + 5] for start in range(0, 100, 5)])
        scheduled = set(self.system.preferences().get("delete", {}))
        self.judge(scheduled, due, set(waiting) & recorder.flushed, waiting)
        self.finish(scheduled & set(due))
        for path in waiting + bystanders:
            self.assertTrue(self.exists(path), path)

    def kill_at_some_moment(self, batches):
        self.system.daemon = Daemon(self.system)
        recorder = Recorder(self.system, batches)
        recorder.start()
        if self.random.random() < 0.5:
            self.system.daemon.wait_for_line("executeScheduledFontFilesDeletion")
            time.sleep(self.random.random() * LATEST_KILL_OF_A_PASS)
        else:
            time.sleep(self.random.random() * LATEST_KILL)
        self.system.daemon.kill()
        recorder.join()
        return recorder

    def judge(self, scheduled, due, flushed, waiting):
        self.assertLessEqual(flushed, scheduled, "what was flushed and is not due is still scheduled")
        self.assertLessEqual(scheduled, set(due) | set(waiting))
        still_due = scheduled & set(due)
        self.assertIn(len(still_due), (0, len(due)), "the shortened schedule is flushed as a whole")
        for path in still_due:
            self.assertTrue(self.exists(path), "an entry is forgotten before its file goes")
        left = [path for path in due if self.exists(path) and path not in scheduled]
        self.counts["still scheduled"] += len(still_due)
        self.counts["there and not scheduled"] += len(left)
        self.counts["deleted"] += len(due) - len(still_due) - len(left)
        self.counts["recorded"] += len(flushed)

    def finish(self, still_due):
        """The next daemon deletes what is still due."""
        before = self.system.preferences().get("delete", {})
        daemon = self.system.start()
        if before:
            waits = set(before) - still_due
            daemon.wait_for_line("next deletion after " if waits else "all files deleted.")
        daemon.kill()
        for path in still_due:
            self.assertFalse(self.exists(path), path)


if __name__ == "__main__":
    unittest.main()
