"""The machine fails the daemon: each time it serves what it still can, and says in its log what to do. docs/faults.md
has the whole list."""

import concurrent.futures
import contextlib
import fcntl
import os
import pathlib
import resource
import shutil
import signal
import socket
import subprocess
import sys
import unittest

from gi.repository import Gio, GLib

import foreign_client
from scratch_system import BIN, PREFERENCES, REGISTRY, SERVICE, ScratchSystem, entry, eventually

HERE = pathlib.Path(__file__).parent
MANY_FONTS = 2000


class Faults(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.path = self.system.font_file("org.example.foundry", "a.ttf", b"contents of a")
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])

    def write_registry(self, fonts=1):
        names = ["a.ttf", *(f"{number}.ttf" for number in range(1, fonts))]
        self.system.write_registry({self.path.replace("a.ttf", name): entry(name, name) for name in names})

    def start_on(self, lesser):
        """Starts the daemon on a system that lacks something."""
        return self.system.start(launcher=[BIN / "lesser-system", lesser])

    def fonts(self, sandboxed=False):
        return set(self.system.checkin(self.viewer, sandboxed)["fontsInfo"])

    def opened(self):
        """The font file, as its sandboxed holder of a token gets it."""
        return subprocess.run(
            [BIN / "typhonctl", "--root", self.system.root, "run", "--", self.viewer, "--root", self.system.root,
             "open", self.path], capture_output=True, timeout=60, stdin=subprocess.DEVNULL)

    def client(self):
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        return client

    # -- disks and files

    def test_a_full_or_read_only_disk_keeps_the_preferences_whole(self):
        done = subprocess.run(
            ["unshare", "--user", "--map-root-user", "--mount", sys.executable, "-B", "-m", "unittest", "-v",
             "limited_disk"], cwd=HERE, capture_output=True, text=True, timeout=300)
        self.assertEqual(done.returncode, 0, done.stderr)
        self.assertIn("Ran 3 tests", done.stderr)

    def test_a_registry_that_is_a_pipe_is_an_empty_one(self):
        os.mkfifo(self.system.real(REGISTRY))
        daemon = self.system.start()
        self.assertEqual(self.fonts(), set())
        said = daemon.lines_with("error [daemon]")
        # Whether the assets were to be synchronised meanwhile, and the registry read anew, is a matter of time.
        others = [line for line in said if "font assets were not synchronised" not in line]
        self.assertEqual(set(others), {f"error [daemon] error reading {REGISTRY}"})
        self.assertLessEqual(len(others), 2)
        self.system.real(REGISTRY).unlink()
        self.write_registry()
        self.system.restart()
        self.assertEqual(self.fonts(), {self.path})

    def stalled(self, path):
        """Whoever opens the file waits in the kernel until the result is called, or for a while."""
        signal.signal(signal.SIGIO, signal.SIG_IGN)
        # A new file: whoever has the old one open would be in the way.
        copy = shutil.copy(self.system.real(path), self.system.folder / "stalled")
        file = os.open(copy, os.O_RDWR)
        fcntl.fcntl(file, fcntl.F_SETLEASE, fcntl.F_WRLCK)
        os.rename(copy, self.system.real(path))
        return lambda: os.close(file)

    def test_a_registry_that_stalls_holds_up_only_those_who_need_it(self):
        self.write_registry()
        daemon = self.system.start()
        self.assertEqual(self.fonts(), {self.path})
        early = self.client()
        go_on = self.stalled(REGISTRY)
        # It is to be read anew, as is known when the second report is taken.
        for _ in range(2):
            early.call("TyphonProtocol", "fontChanged_reply", GLib.Variant("(a{sv})", ({},)))
        with concurrent.futures.ThreadPoolExecutor() as executor:
            waiting = executor.submit(self.fonts)
            self.assertIn("local disk", daemon.wait_for_line(f"reading {REGISTRY} takes longer than 5 s"))
            # It is there, and answers what needs no registry.
            early.connection.call_sync(None, "/", "org.freedesktop.DBus.Peer", "Ping", None, None,
                                       Gio.DBusCallFlags.NONE, 60000, None)
            self.client()
            self.assertFalse(waiting.done())
            go_on()
            self.assertEqual(waiting.result(60), {self.path})
        self.assertEqual(len(daemon.lines_with("takes longer than")), 1)

    def test_preferences_that_are_a_pipe_read_as_empty(self):
        self.write_registry()
        os.mkfifo(self.system.real(PREFERENCES))
        daemon = self.system.start()
        self.assertIn("repair", daemon.wait_for_line("are malformed and read as empty: not a regular file"))
        self.assertEqual(self.fonts(), {self.path})
        eventually(lambda: self.system.preferences().get("version") == 3)

    # -- descriptors

    def limit_descriptors(self, more):
        """Lets the daemon open so many more."""
        pid = self.system.daemon.process.pid
        soft = len(os.listdir(f"/proc/{pid}/fd")) + more
        _, hard = resource.prlimit(pid, resource.RLIMIT_NOFILE)
        resource.prlimit(pid, resource.RLIMIT_NOFILE, (soft, hard))
        return lambda: resource.prlimit(pid, resource.RLIMIT_NOFILE, (hard, hard))

    def test_no_descriptors_left_refuses_newcomers_until_there_are_some(self):
        self.system.sign(os.path.realpath(sys.executable), "org.example.foreign", ["font-enumeration"])
        self.write_registry()
        daemon = self.system.start()
        self.assertEqual(self.fonts(), {self.path})
        early = self.client()
        unlimited = self.limit_descriptors(20)
        with contextlib.ExitStack() as crowd:
            for _ in range(60):
                newcomer = crowd.enter_context(socket.socket(socket.AF_UNIX))
                newcomer.connect(str(self.system.socket_path(SERVICE)))
            line = daemon.wait_for_line("are refused: Too many open files")
            self.assertIn("LimitNOFILE", line)
            # Who was there before is served, also with what takes descriptors.
            early.call("TyphonProtocol", "updatingUserFonts")
            self.assertEqual(set(early.checkin()["fontsInfo"]), {self.path})
        unlimited()
        self.assertEqual(self.fonts(), {self.path})
        self.assertLessEqual(len(daemon.lines_with("are refused: Too many open files")), 3)

    # -- a lesser system

    def test_without_memory_files_large_views_travel_inside_messages(self):
        self.system.sign(os.path.realpath(sys.executable), "org.example.foreign", ["font-enumeration"])
        self.write_registry(MANY_FONTS)
        daemon = self.start_on("memory-files")
        view = self.client().checkin()
        self.assertNotIn("(memory files)", view)
        self.assertEqual(len(view["fontsInfo"]), MANY_FONTS)
        self.assertIn("memfd_create", daemon.wait_for_line("no memory files on this system"))

    def test_with_memory_files_nothing_is_said(self):
        self.write_registry(MANY_FONTS)
        daemon = self.system.start()
        self.assertEqual(len(self.fonts()), MANY_FONTS)
        self.assertEqual(daemon.lines_with("error ["), [])

    def test_without_user_namespaces_font_files_are_copies(self):
        self.write_registry()
        daemon = self.start_on("user-namespaces")
        self.assertEqual(self.opened().stdout, b"contents of a")
        self.assertIn("user.max_user_namespaces", daemon.wait_for_line("no private read-only mounts"))

    def test_without_both_no_font_file_is_handed_out(self):
        self.write_registry()
        daemon = self.start_on("copies")
        self.assertEqual(self.fonts(), {self.path})
        self.assertNotEqual(self.opened().returncode, 0)
        self.assertNotEqual(self.opened().returncode, 0)
        self.assertEqual(len(daemon.lines_with("font files cannot be handed out")), 1)

    def test_an_older_kernel_tells_processes_apart_by_their_start_time(self):
        self.write_registry()
        daemon = self.start_on("old-kernel")
        self.assertIn("Linux 6.9", daemon.wait_for_line("told apart by their start time only"))
        self.assertEqual(self.fonts(), {self.path})
        self.assertEqual(self.opened().stdout, b"contents of a")


if __name__ == "__main__":
    unittest.main()
