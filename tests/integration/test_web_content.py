"""An application passes its fonts on to its web-content processes, also to those in sandboxes of their own."""

import contextlib
import json
import os
import pathlib
import shutil
import socket
import subprocess
import sys
import unittest

from gi.repository import Gio, GLib

import foreign_client
from scratch_system import BIN, PATIENCE, ScratchSystem, entry, eventually

HERE = pathlib.Path(__file__).parent
SUPPORT = "TyphonSilkpageSupportProtocol"
INVALIDATED = "TYSilkpage checkinForSilkpageProcess connection invalidationHandler."


class Content:
    """A running content process of a foreign make."""

    def __init__(self, system, mode="answer", font="", sandbox=()):
        ours, theirs = socket.socketpair()
        command = [*sandbox, sys.executable, HERE / "foreign_content.py", system.root, theirs.fileno(), mode, font]
        self.process = subprocess.Popen([str(part) for part in command], stdin=subprocess.DEVNULL,
                                        stdout=subprocess.PIPE, pass_fds=[theirs.fileno()])
        theirs.close()
        with ours:
            _, descriptors, _, _ = socket.recv_fds(ours, 1, 1)
        self.endpoint = descriptors[0]

    def says(self):
        return json.loads(self.process.stdout.readline())

    def close(self):
        if self.process.poll() is None:
            self.process.kill()
        self.process.wait(PATIENCE)
        self.process.stdout.close()
        with contextlib.suppress(OSError):
            os.close(self.endpoint)


class WebContent(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.font = self.system.font_file("org.example.foundry", "a.ttf", b"contents of a")
        self.system.write_registry({self.font: entry("A", "Alpha")})
        self.daemon = self.system.start()

    def host(self, capabilities=("font-enumeration",)):
        """This very process, checked in with those capabilities."""
        self.system.sign(os.path.realpath(sys.executable), "org.example.host", list(capabilities))
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        client.checkin()
        return client

    def content(self, *arguments, **options):
        content = Content(self.system, *arguments, **options)
        self.addCleanup(content.close)
        return content

    def own_sandbox(self):
        # This folder may itself lie under /tmp.
        return [shutil.which("bwrap"), "--unshare-all", "--die-with-parent", "--ro-bind", "/", "/", "--proc", "/proc",
                "--dev", "/dev", "--tmpfs", "/tmp", "--bind", self.system.root, self.system.root, "--ro-bind", HERE, HERE, "--"]

    def check_in(self, host, endpoint):
        host.call(SUPPORT, "checkinForSilkpageProcess_reply", GLib.Variant("(h)", (0,)), [endpoint])

    def start_check_in(self, host, endpoint):
        """Without waiting; the list that comes back fills with the outcome."""
        outcomes = []
        files = Gio.UnixFDList()
        files.append(endpoint)

        def done(connection, result):
            try:
                connection.call_with_unix_fd_list_finish(result)
                outcomes.append("answered")
            except GLib.Error as error:
                outcomes.append(foreign_client.error_name(error) or error.message)
        host.connection.call_with_unix_fd_list(
            None, foreign_client.PATH, foreign_client.PREFIX + SUPPORT, "checkinForSilkpageProcess_reply",
            GLib.Variant("(h)", (0,)), None, Gio.DBusCallFlags.NONE, GLib.MAXINT, files, None, done)
        return outcomes

    def assert_unanswered(self, host, outcomes):
        """The daemon goes on, and what would have come before its answer has not come."""
        host.call("TyphonProtocol", "updatingUserFonts")
        while GLib.MainContext.default().iteration(False):
            pass
        self.assertEqual(outcomes, [])

    def open_files(self):
        return len(self.daemon.open_files())

    def test_a_content_process_reads_with_grants_of_its_own(self):
        for sandbox in ((), self.own_sandbox()):
            with self.subTest(sandboxed=bool(sandbox)):
                content = self.content(font=self.font, sandbox=sandbox)
                host = self.host()
                self.check_in(host, content.endpoint)
                self.assertEqual(content.says(), {"pinged": True})
                info = content.says()["info"]
                self.assertEqual(info["fontsInfo"], {self.font: {"familyName": {"A": "Alpha"}}})
                self.assertEqual(content.says(), {"read": "contents of a"})
                self.assertEqual(content.says(), {"closed": True})

    def test_the_content_processs_token_is_of_no_use_to_its_host(self):
        content = self.content()
        host = self.host()
        self.check_in(host, content.endpoint)
        content.says()
        token = foreign_client.base64.b64decode(content.says()["info"]["extension"])
        with self.assertRaises(GLib.Error) as caught:
            foreign_client.Client(str(self.system.root), f"{foreign_client.SERVICE}.file-access").open(token, self.font)
        self.assertEqual(foreign_client.error_name(caught.exception), "org.freedesktop.DBus.Error.AccessDenied")

    def test_a_host_without_capabilities_passes_on_null(self):
        content = self.content()
        self.check_in(self.host([]), content.endpoint)
        self.assertEqual([content.says(), content.says()], [{"pinged": True}, {"info": None}])

    def test_a_content_process_that_dies_leaves_its_host_unanswered_and_the_daemon_unharmed(self):
        host = self.host()
        # What its start takes, and what of that stays, is not the content processes'.
        self.system.wait_until_started()
        before = self.open_files()
        content = self.content("die")
        outcomes = self.start_check_in(host, content.endpoint)
        self.daemon.wait_for_line(INVALIDATED)
        self.daemon.wait_for_line("sluice error: checkinForSilkpageProcess:reply: - ")
        self.assert_unanswered(host, outcomes)
        content.close()
        eventually(lambda: self.open_files() <= before)

    def test_silent_and_deaf_content_processes_keep_nobody_else_waiting(self):
        host = self.host()
        # What its start takes, and what of that stays, is not the content processes'.
        self.system.wait_until_started()
        before = self.open_files()
        silent, deaf, good = self.content("silent"), self.content("deaf"), self.content()
        outcomes = self.start_check_in(host, silent.endpoint)
        outcomes_of_deaf = self.start_check_in(host, deaf.endpoint)
        self.check_in(host, good.endpoint)
        self.assertEqual(silent.says(), {"pinged": True})
        self.assertEqual(deaf.says(), {"pinged": True})
        self.assertIn("info", deaf.says())
        self.assert_unanswered(host, outcomes)
        self.assert_unanswered(host, outcomes_of_deaf)
        for content in (silent, deaf, good):
            content.close()
        eventually(lambda: self.open_files() <= before)
        self.assert_unanswered(host, outcomes)

    def test_what_is_no_endpoint_is_refused_without_an_answer(self):
        host = self.host()
        with open("/dev/null", "rb") as file:
            outcomes = self.start_check_in(host, file.fileno())
            self.daemon.wait_for_line(INVALIDATED)
            self.assert_unanswered(host, outcomes)

    def test_an_application_of_libtyphon_passes_fonts_on_in_and_outside_of_a_sandbox(self):
        real_font = next(pathlib.Path("/usr/share/fonts").rglob("*.ttf"))
        path = self.system.font_file("org.example.foundry", "real.ttf", real_font.read_bytes())
        self.system.write_registry({path: entry("R", "Real")})
        self.system.restart()
        sample = self.system.folder / "sample"
        shutil.copy(BIN / "samples" / "org.example.viewer", sample)
        self.system.sign(sample, "org.example.viewer", ["font-enumeration"])
        environment = {**os.environ, "TYPHON_ROOT": str(self.system.root)}
        for launcher in ((), (BIN / "typhonctl", "--root", self.system.root, "run", "--")):
            with self.subTest(sandboxed=bool(launcher)):
                done = subprocess.run([str(part) for part in (*launcher, sample, "content")], capture_output=True,
                                      timeout=PATIENCE, stdin=subprocess.DEVNULL, env=environment)
                self.assertEqual((done.returncode, done.stderr), (0, b""))
                self.assertIn(b"reads 1 of 1 font files, for grants of its own", done.stdout)


if __name__ == "__main__":
    unittest.main()
