"""What an extension token opens, for whom and for how long; everything else is refused."""

import base64
import json
import os
import pathlib
import subprocess
import sys
import unittest

from gi.repository import GLib

import foreign_client
from scratch_system import ASSET_STORE, FONT_FILES, SERVICE, ScratchSystem, entry

HERE = pathlib.Path(__file__).parent
DENIED = "org.freedesktop.DBus.Error.AccessDenied"
EXPIRED = "com.vorlan.typhond.Error.Expired"


class Grants(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.path = self.system.font_file("org.example.foundry", "a.ttf", b"contents of a")
        self.outside = "/var/mobile/Library/secret.txt"
        self.system.real(self.outside).write_bytes(b"secret")
        self.system.write_registry({self.path: entry("A", "Family A")})
        self.system.sign(os.path.realpath(sys.executable), "org.example.foreign", ["font-enumeration"])
        self.system.start()
        self.token = self.client().checkin()["extension"]

    def client(self, service=SERVICE):
        client = foreign_client.Client(str(self.system.root), service)
        self.addCleanup(client.close)
        return client

    def broker(self):
        return self.client(f"{SERVICE}.file-access")

    def open(self, token, path):
        descriptor = self.broker().open(token, path)
        self.addCleanup(os.close, descriptor)
        return descriptor

    def assert_refused(self, token, path, error=DENIED):
        with self.assertRaises(GLib.Error) as caught:
            self.broker().open(token, path)
        self.assertEqual(foreign_client.error_name(caught.exception), error)

    def test_a_token_opens_its_files_with_and_without_the_final_zero_byte(self):
        for token in (self.token, self.token.rstrip(b"\0")):
            self.assertEqual(os.read(self.open(token, self.path), 100), b"contents of a")

    def test_the_descriptor_cannot_write(self):
        descriptor = self.open(self.token, self.path)
        self.assertRaises(OSError, os.write, descriptor, b"x")
        self.assertRaises(OSError, os.open, f"/proc/self/fd/{descriptor}", os.O_RDWR)
        self.assertRaises(OSError, os.fchmod, descriptor, 0o777)
        self.assertEqual(self.system.real(self.path).read_bytes(), b"contents of a")

    def test_another_process_cannot_use_it(self):
        done = subprocess.run(
            [sys.executable, HERE / "foreign_client.py", str(self.system.root), "open",
             base64.b64encode(self.token).decode(), self.path], capture_output=True, text=True, timeout=60)
        self.assertEqual(json.loads(done.stdout), {"error": DENIED}, done.stderr)

    def test_it_dies_with_exec(self):
        script = (
            "import base64, os, sys; sys.path.insert(0, sys.argv[1]); import foreign_client\n"
            "token = foreign_client.Client(sys.argv[2]).checkin()['extension']\n"
            "here = sys.argv[1] + '/foreign_client.py'\n"
            "os.execv(sys.executable, [sys.executable, here, sys.argv[2], 'open',\n"
            "         base64.b64encode(token).decode(), sys.argv[3]])\n")
        done = subprocess.run(
            [sys.executable, "-c", script, str(HERE), str(self.system.root), self.path],
            capture_output=True, text=True, timeout=60)
        self.assertEqual(json.loads(done.stdout), {"error": DENIED}, done.stderr)

    def test_it_opens_nothing_else(self):
        other = self.system.font_file("org.example.foundry", "b.ttf", b"b", tree="/var/mobile/Library/Fonts/Managed2")
        for path in (self.outside, other, FONT_FILES, f"{FONT_FILES}/", f"{FONT_FILES}/org.example.foundry",
                     "/etc/passwd", "", "relative", self.path[1:], f"{FONT_FILES}Elsewhere/a.ttf"):
            with self.subTest(path=path):
                self.assert_refused(self.token, path)

    def test_a_path_cannot_climb_out(self):
        for path in (f"{FONT_FILES}/../../secret.txt", f"{FONT_FILES}/org.example.foundry/../../../secret.txt",
                     f"{FONT_FILES}/./org.example.foundry/a.ttf", f"{FONT_FILES}//org.example.foundry/a.ttf",
                     f"{FONT_FILES}/org.example.foundry/../org.example.foundry/a.ttf"):
            with self.subTest(path=path):
                self.assert_refused(self.token, path)

    def test_links_are_not_followed(self):
        folder = self.system.real(f"{FONT_FILES}/org.example.foundry")
        (folder / "link.ttf").symlink_to(self.system.real(self.outside))
        (folder / "linked").symlink_to(self.system.real("/var/mobile/Library"))
        self.assert_refused(self.token, f"{FONT_FILES}/org.example.foundry/link.ttf")
        self.assert_refused(self.token, f"{FONT_FILES}/org.example.foundry/linked/secret.txt")

    def test_no_bit_of_it_can_be_changed(self):
        broker = self.broker()
        for bit in range((len(self.token) - 1) * 8):
            changed = bytearray(self.token)
            changed[bit // 8] ^= 1 << bit % 8
            with self.subTest(bit=bit), self.assertRaises(GLib.Error) as caught:
                broker.open(bytes(changed), self.path)
            self.assertEqual(foreign_client.error_name(caught.exception), DENIED)

    def test_it_dies_with_the_daemon(self):
        self.system.restart()
        self.assert_refused(self.token, self.path, EXPIRED)
        self.assertEqual(os.read(self.open(self.client().checkin()["extension"], self.path), 100),
                         b"contents of a")

    def test_nonsense_is_no_token(self):
        for token in (b"", b"\0", b"x", b"x" * 100_000, bytes(range(256))):
            with self.subTest(token=token[:10]):
                self.assert_refused(token, self.path)

    def test_the_asset_store_opens_without_a_token_for_an_identified_process(self):
        store = self.system.font_file("abc.asset/AssetData", "s.ttf", b"store", tree=ASSET_STORE)
        self.assertEqual(os.read(self.open(b"", store), 100), b"store")
        self.assertEqual(os.read(self.open(b"\0", store), 100), b"store")

    def test_the_asset_store_stays_closed_to_a_process_without_identity(self):
        store = self.system.font_file("abc.asset/AssetData", "s.ttf", b"store", tree=ASSET_STORE)
        for signature in self.system.real("/var/lib/typhon/signatures").iterdir():
            signature.unlink()
        self.assert_refused(b"", store)

    def test_a_file_that_is_no_regular_file_is_refused(self):
        os.mkfifo(self.system.real(f"{FONT_FILES}/org.example.foundry/pipe.ttf"))
        self.assert_refused(self.token, f"{FONT_FILES}/org.example.foundry/pipe.ttf")


class IssuedFiles(unittest.TestCase):
    """A sandboxed application with "app-usage" reads exactly what was issued to it."""

    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.issued = self.system.font_file("org.example.foundry", "issued.ttf", b"issued")
        self.other = self.system.font_file("org.example.foundry", "other.ttf", b"other")
        self.system.write_registry({self.issued: entry("I", "I"), self.other: entry("O", "O")})
        self.system.write_preferences({"issues": {"org.example.writer": ["U/org.example.foundry/issued.ttf"]}})
        self.writer = self.system.program("org.example.writer", ["app-usage"])
        self.system.start()

    def sandboxed(self, *arguments, check=True):
        return self.system.ctl("run", "--", self.writer, "--root", self.system.root, *arguments, check=check)

    def test_it_reads_the_issued_file_through_its_token(self):
        self.assertEqual(self.sandboxed("open", self.issued).stdout, b"issued")

    def test_it_reads_nothing_else(self):
        done = self.sandboxed("open", self.other, check=False)
        self.assertNotEqual(done.returncode, 0)
        self.assertEqual(done.stdout, b"")
        self.assertNotEqual(done.stderr, b"")

    def test_its_sandbox_does_not_show_the_font_trees(self):
        real = self.system.real(self.issued)
        done = self.system.ctl("run", "--", "/bin/cat", real, check=False)
        self.assertNotEqual(done.returncode, 0)
        self.assertEqual(done.stdout, b"")


if __name__ == "__main__":
    unittest.main()
