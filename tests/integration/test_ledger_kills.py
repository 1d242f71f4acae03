"""kill -9 of the daemon at any moment while its ledger is written: the preferences file is always whole, what was
answered had been flushed and is there afterwards, nothing else is touched, and what an administrator changes meanwhile
survives. TYPHON_LEDGER_ROUNDS sets how often, TYPHON_LEDGER_SEED which moments."""

import json
import os
import random
import socket
import sys
import threading
import time
import unittest

import gi

gi.require_version("Gio", "2.0")
from gi.repository import GLib  # noqa: E402

from foreign_client import Client  # noqa: E402
from scratch_system import FONT_FILES, Daemon, ScratchSystem, entry, eventually  # noqa: E402

ROUNDS = int(os.environ.get("TYPHON_LEDGER_ROUNDS", "8"))
SEED = os.environ.get("TYPHON_LEDGER_SEED", "1")
APPLICATIONS = 400
LATEST_KILL = 0.5
FONT = f"{FONT_FILES}/org.example.foundry/alpha.ttf"
KEPT = {"administrator": {"note": "kept"}, "deleteDelay": 5000}


class Forgetter(threading.Thread):
    """A tool that has one record after another forgotten, and notes which the daemon said it had."""

    def __init__(self, system, identifiers):
        super().__init__()
        self.system = system
        self.identifiers = identifiers
        self.answered = []

    def run(self):
        try:
            client = Client(self.system.root)
            for identifier in self.identifiers:
                client.call("TyphonProtocol", "resetIssuedFontsFor_reply", GLib.Variant("(s)", (identifier,)))
                self.answered.append(identifier)
        except (OSError, GLib.Error):
            pass  # The daemon is gone.


class Administrator(threading.Thread):
    """Changes preferences of his own, time and again, and reads the file after every change."""

    def __init__(self, system):
        super().__init__()
        self.system = system
        self.is_over = threading.Event()
        self.set = {}
        self.failures = []
        self.seen_recorded = False

    def run(self):
        number = 0
        while not self.is_over.is_set():
            number += 1
            key = f"own{number % 3}"
            done = self.system.ctl("preferences", "set", key, str(number), check=False)
            self.set[key] = number
            try:
                preferences = self.system.preferences()
                self.seen_recorded |= "org.example.writer" in preferences["issues"]
                found = preferences.get(key)
                if done.returncode != 0 or found != number:
                    self.failures.append((key, number, found, done.stderr))
            except Exception as error:  # A torn file may raise anything.
                self.failures.append((key, number, repr(error)))


class Kills(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.random = random.Random(SEED)
        self.counts = {"forgotten": 0, "recorded": 0, "changes of the administrator": 0, "in the midst": 0}
        self.system.sign(os.path.realpath(sys.executable), "com.vorlan.tool",
                         entitlements={"com.vorlan.Typhon.allow-reset-issued-fonts": True})
        self.writer = self.system.program("org.example.writer", ["app-usage"])
        self.system.write_registry({FONT: entry("Alpha-Regular", "Alpha")})
        self.system.font_file("org.example.foundry", "alpha.ttf")
        self.identifiers = [f"org.example.a{number}" for number in range(APPLICATIONS)]
        self.system.install_application("org.example.writer")

    def test_kills(self):
        for number in range(ROUNDS):
            with self.subTest(round=number, seed=SEED):
                self.one_round()
        print(f"{ROUNDS} kills: {self.counts}", file=sys.stderr)
        if ROUNDS >= 50:
            self.assertGreater(self.counts["in the midst"], ROUNDS // 4, "most kills came before or after the writing")

    def one_round(self):
        records = {identifier: [f"U/org.example.foundry/{number}.ttf" for number in range(20)]
                   for identifier in self.identifiers}
        self.system.write_preferences({**KEPT, "issues": records})
        forgetter, administrator = self.kill_at_some_moment()
        preferences = self.system.preferences()
        issues = preferences["issues"]
        self.judge_forgotten(issues, forgetter.answered, records)
        self.assertEqual(set(issues) - set(records), {"org.example.writer"} & set(issues))
        if administrator.seen_recorded or "org.example.writer" in issues:
            self.assertEqual(issues.get("org.example.writer"), ["U/org.example.foundry/alpha.ttf"])
            self.counts["recorded"] += 1
        self.assertEqual(administrator.failures, [])
        for key, value in {**KEPT, **administrator.set}.items():
            self.assertEqual(preferences.get(key), value, key)
        self.counts["changes of the administrator"] += len(administrator.set)
        self.restart(issues)

    def judge_forgotten(self, issues, answered, records):
        """They are forgotten in order: at most one more than those that were answered."""
        self.assertFalse(set(answered) & set(issues), "what was answered had been flushed")
        left = {identifier: record for identifier, record in issues.items() if identifier in records}
        self.assertIn(len(left), (APPLICATIONS - len(answered), APPLICATIONS - len(answered) - 1))
        for identifier, record in left.items():
            self.assertEqual(record, records[identifier])
        self.counts["forgotten"] += len(answered)
        self.counts["in the midst"] += 0 < len(answered) < APPLICATIONS

    def kill_at_some_moment(self):
        self.system.daemon = Daemon(self.system)
        self.system.wait_for_socket(self.system.socket_path())
        forgetter = Forgetter(self.system, self.identifiers)
        administrator = Administrator(self.system)
        application = threading.Thread(target=self.ask)
        for thread in (administrator, application, forgetter):
            thread.start()
        time.sleep(self.random.random() * LATEST_KILL)
        self.system.daemon.kill()
        forgetter.join()
        application.join()
        administrator.is_over.set()
        administrator.join()
        self.system.stop()
        return forgetter, administrator

    def ask(self):
        """An application that asks for a font that is there, which is then recorded. Fails when the daemon goes."""
        self.system.ctl("--json", "request", "--family", "Alpha", program=self.writer, check=False)

    def restart(self, issues):
        """The next daemon reads the ledger as it was left."""
        eventually(self.nobody_listens)
        self.system.start()
        seen = json.loads(self.system.ctl("--json", "ledger").stdout)
        self.assertEqual(set(seen), set(issues))
        self.system.stop()

    def nobody_listens(self):
        """A child that the killed daemon was just starting may hold its sockets for a moment."""
        with socket.socket(socket.AF_UNIX) as probe:
            try:
                probe.connect(str(self.system.socket_path()))
            except OSError:
                return True
        return False


if __name__ == "__main__":
    unittest.main()
