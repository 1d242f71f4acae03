"""The preferences on a disk of their own that is full, or read-only. Mounts file systems: to be run in namespaces of its
own, as test_faults does."""

import subprocess
import unittest

from scratch_system import PREFERENCES, ScratchSystem, entry, eventually

NOT_WRITTEN = "the preferences were not written: "


class LimitedDisk(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_registry({self.path: entry("A", "A")})
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.disk = self.system.real(PREFERENCES).parent
        self.mount("-t", "tmpfs", "-o", "size=64k", "tmpfs", self.disk)
        self.addCleanup(subprocess.run, ["umount", "--lazy", str(self.disk)], check=True)

    @staticmethod
    def mount(*arguments):
        subprocess.run(["mount", *map(str, arguments)], check=True)

    def fill(self):
        filler = self.disk / "filler"
        with filler.open("wb", buffering=0) as file, self.assertRaises(OSError):
            while True:
                file.write(bytes(4096))
        return filler

    def assert_served(self):
        self.assertEqual(set(self.system.checkin(self.viewer)["fontsInfo"]), {self.path})

    def refused_write(self):
        """The line about the first write, that of the layout version at the start."""
        self.system.start()
        line = self.system.daemon.wait_for_line(NOT_WRITTEN)
        self.assertTrue(line.startswith("error [daemon] "), line)
        self.assertIn("make room, or make it writable", line)
        self.assert_served()
        return line

    def assert_written_by_the_next_daemon(self):
        self.system.restart()
        eventually(lambda: self.system.preferences().get("version") == 3)
        self.assertEqual(self.system.daemon.lines_with(NOT_WRITTEN), [])

    def test_a_full_disk(self):
        filler = self.fill()
        self.assertIn("No space left on device", self.refused_write())
        self.assertEqual(self.system.preferences(), {})
        self.assertEqual(len(self.system.daemon.lines_with(NOT_WRITTEN)), 1)
        filler.unlink()
        self.assert_written_by_the_next_daemon()

    def test_what_is_there_survives_a_full_disk(self):
        self.system.write_preferences({"administrator": "kept"})
        self.fill()
        self.refused_write()
        self.assertEqual(self.system.preferences(), {"administrator": "kept"})

    def test_a_read_only_disk(self):
        self.system.write_preferences({"administrator": "kept"})
        self.mount("-o", "remount,ro", self.disk)
        self.assertIn("Read-only file system", self.refused_write())
        self.mount("-o", "remount,rw", self.disk)
        self.assert_written_by_the_next_daemon()
        self.assertEqual(self.system.preferences()["administrator"], "kept")


if __name__ == "__main__":
    unittest.main()
