"""The daemon can be killed at any moment; what it had promised is there afterwards."""

import signal
import unittest

from scratch_system import Daemon, ScratchSystem, entry, eventually


class Restart(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_registry({self.path: entry("A", "A")})
        self.writer = self.system.program("org.example.writer", ["app-usage"])
        self.system.write_preferences({"issues": {"org.example.writer": ["U/org.example.foundry/a.ttf"]}})

    def test_the_ledger_survives_kill_and_restart(self):
        for _ in range(3):
            self.system.restart()
            self.assertEqual(set(self.system.checkin(self.writer)["fontsInfo"]), {self.path})
            self.system.daemon.kill(signal.SIGKILL)

    def test_the_layout_version_is_raised_once_and_kept(self):
        self.system.start()
        eventually(lambda: self.system.preferences().get("version") == 3)
        self.system.stop()
        self.system.write_preferences({"version": 7})
        self.system.start()
        self.assertIsNotNone(self.system.checkin(self.writer))
        self.system.stop()
        self.assertEqual(self.system.preferences(), {"version": 7})

    def test_a_second_daemon_does_not_take_the_service_over(self):
        self.system.start()
        second = Daemon(self.system)
        self.addCleanup(second.kill)
        second.wait_for_line("error [")
        self.assertIsNotNone(self.system.checkin(self.writer))

    def test_fonts_changed_while_it_was_down_are_seen(self):
        self.system.start()
        self.system.stop()
        other = self.system.font_file("org.example.foundry", "b.ttf")
        self.system.write_registry({other: entry("B", "B")})
        viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.system.start()
        self.assertEqual(set(self.system.checkin(viewer)["fontsInfo"]), {other})


if __name__ == "__main__":
    unittest.main()
