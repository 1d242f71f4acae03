"""The font picker hands fonts to the application it works for; this very process is the picker."""

import json
import os
import pathlib
import shutil
import socket
import subprocess
import sys
import tempfile
import unittest

from gi.repository import GLib

import foreign_client
from scratch_system import BIN, FONT_FILES, PATIENCE, ScratchSystem, eventually

SANS = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")
SANS_PATH = f"{FONT_FILES}/org.example.foundry/DejaVuSans.ttf"


class FontPicker(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        for identifier in ("org.example.foundry", "org.example.writer"):
            self.system.install_application(identifier)
        self.system.start()
        self.system.ctl("fonts", "install", "--identifier", "org.example.foundry", SANS)

    def picker(self, identifier="com.vorlan.Panekit.FontPicker"):
        self.system.sign(os.path.realpath(sys.executable), identifier)
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        return client

    def hand_over(self, picker, endpoint, name="DejaVuSans"):
        reply, _ = picker.call("TyphonProtocol", "requestFonts_forClient_reply",
                               GLib.Variant("(sh)", (name, 0)), [endpoint])
        return reply.unpack()[0]

    def silent_endpoint(self):
        """A socket that listens and never says anything."""
        directory = tempfile.mkdtemp()
        self.addCleanup(shutil.rmtree, directory)
        listening = socket.socket(socket.AF_UNIX)
        self.addCleanup(listening.close)
        listening.bind(f"{directory}/s")
        listening.listen()
        endpoint = os.open(f"{directory}/s", os.O_PATH)
        self.addCleanup(os.close, endpoint)
        return endpoint

    def test_a_sandboxed_application_reads_what_was_picked_for_it(self):
        sample = self.system.folder / "sample"
        shutil.copy(BIN / "samples/org.example.writer", sample)
        self.system.sign(sample, "org.example.writer", ["app-usage"])
        ours, theirs = socket.socketpair()
        command = [BIN / "typhonctl", "--root", self.system.root, "run", "--", sample, "picked"]
        with theirs:
            application = subprocess.Popen([str(word) for word in command], stdin=theirs, stdout=subprocess.PIPE,
                                           text=True, env={**os.environ, "TYPHON_ROOT": str(self.system.root)})
        self.addCleanup(application.kill)
        with ours:
            endpoint = socket.recv_fds(ours, 1, 1)[1][0]
        self.addCleanup(os.close, endpoint)
        self.assertTrue(self.hand_over(self.picker(), endpoint))
        text, _ = application.communicate(timeout=PATIENCE)
        self.assertIn(SANS_PATH, text)
        self.assertIn("was handed 1 font files and read 1", text)
        # Recorded once the application has acknowledged, which is when it may already have ended.
        eventually(lambda: "org.example.writer" in json.loads(self.system.ctl("--json", "ledger").stdout))

    def test_only_the_picker_may_hand_fonts_over(self):
        with self.assertRaises(GLib.Error) as caught:
            self.hand_over(self.picker("org.example.writer"), self.silent_endpoint())
        self.assertEqual(foreign_client.error_name(caught.exception), "org.freedesktop.DBus.Error.AccessDenied")

    def test_an_endpoint_that_is_no_socket_gets_nothing(self):
        picker = self.picker()
        for path in ("/dev/null", "/etc", str(SANS)):
            endpoint = os.open(path, os.O_PATH)
            self.addCleanup(os.close, endpoint)
            self.assertIs(self.hand_over(picker, endpoint), False)

    def test_an_unknown_name_is_not_handed_over(self):
        self.assertIs(self.hand_over(self.picker(), self.silent_endpoint(), "Nowhere-Sans"), False)

    def test_a_client_that_never_answers_is_given_up(self):
        self.assertIs(self.hand_over(self.picker(), self.silent_endpoint()), False)
        self.system.daemon.wait_for_line("sluice error: requestFonts:forClient:reply: - ")


if __name__ == "__main__":
    unittest.main()
