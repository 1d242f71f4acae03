"""Font requests that mean no good, as they come over the wire: each gets its answer, and others are served."""

import os
import struct
import sys
import unittest

from hostile_clients import TYPHON, Hostile, message, text
from scratch_system import SERVICE, ScratchSystem, entry

FAMILY, FACE = "LFFontFamilyNameAttribute", "LFFontNameAttribute"
MANY = 100_000
# Variants that are no strings, each as signature and value: an integer, an array, data, a dictionary, a boolean.
NO_STRINGS = ((b"\1x\0", bytes(8)), (b"\2av\0", bytes(4)), (b"\2ay\0", struct.pack("<I", 3) + b"abc"),
              (b"\5a{sv}\0", bytes(4)), (b"\1b\0", struct.pack("<I", 1)))


class Body:
    """Builds an array of dictionaries of variants."""

    def __init__(self):
        self.data = bytearray(4)

    def align(self, to):
        self.data += bytes(-len(self.data) % to)

    def add(self, names):
        """A request of (key, name) pairs; a name is a string, or a variant of another type."""
        self.align(4)
        place = len(self.data)
        self.data += bytes(4)
        self.align(8)
        begin = len(self.data)
        for key, name in names:
            self.align(8)
            self.data += text(key)
            if isinstance(name, str):
                self.data += b"\1s\0"
                self.align(4)
                self.data += text(name)
            else:
                signature, value = name
                self.data += signature
                self.align(8 if signature == b"\1x\0" else 4)
                self.data += value
                if signature == b"\5a{sv}\0":
                    self.align(8)
        struct.pack_into("<I", self.data, place, len(self.data) - begin)
        return self

    def message(self):
        struct.pack_into("<I", self.data, 0, len(self.data) - 4)
        return message(TYPHON, "requestFonts_reply", "aa{sv}", bytes(self.data))


def reply_of(client, data):
    """What comes for a message: the whole reply."""
    client.socket.sendall(data)
    received = b""
    while len(received) < 16 or len(received) < size_of(received):
        part = client.socket.recv(65536)
        if not part:
            return b""
        received += part
    return received


def size_of(received):
    body, _, fields = struct.unpack_from("<III", received, 4)
    return 16 + (fields + 7) // 8 * 8 + body


class BadRequests(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_registry({path: entry("Face", "Family")})
        self.system.install_application("org.example.reader")
        self.system.sign(os.path.realpath(sys.executable), "org.example.reader", ["app-usage"])
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.daemon = self.system.start()

    def connect(self):
        client = Hostile(str(self.system.socket_path(SERVICE)))
        self.addCleanup(client.socket.close)
        return client

    def assert_answered(self, body, fonts):
        """The request is answered with so many fonts; then others are served, and so is its sender."""
        client = self.connect()
        reply = reply_of(client, body.message())
        self.assertEqual((reply[1:2], reply.count(b".ttf\0")), (b"\2", fonts))
        self.assertEqual(len(self.system.checkin(self.viewer)["fontsInfo"]), 1)
        reply = reply_of(client, Body().add([(FAMILY, "Family")]).message())
        self.assertEqual((reply[1:2], reply.count(b".ttf\0")), (b"\2", 1))

    def test_a_hundred_thousand_requests_in_one_call(self):
        body = Body()
        for number in range(MANY):
            body.add([(FAMILY, f"Unknown {number}")])
        self.assert_answered(body.add([(FAMILY, "Family")]), 1)

    def test_names_of_a_megabyte(self):
        self.assert_answered(Body().add([(FAMILY, "x" * (1 << 20)), (FACE, "y" * (1 << 20))])
                             .add([(FACE, "Face")]), 1)
        # None of it gets into the log.
        self.assertEqual(self.daemon.lines_with("x" * 2000), [])

    def test_names_of_the_wrong_type_count_as_absent(self):
        body = Body()
        for no_string in NO_STRINGS:
            body.add([(FAMILY, no_string)]).add([(FACE, no_string)])
        self.assert_answered(body, 0)
        self.assertEqual(self.daemon.lines_with("in the background"), [])

    def test_arguments_that_are_no_requests_are_refused(self):
        client = self.connect()
        for signature, arguments in (("as", struct.pack("<I", 0)), ("a{sv}", bytes(8)), ("s", text("Family")),
                                     ("", b"")):
            with self.subTest(signature):
                reply = reply_of(client, message(TYPHON, "requestFonts_reply", signature, arguments))
                self.assertEqual(reply[1:2], b"\3")
                self.assertIn(b"org.freedesktop.DBus.Error.InvalidArgs", reply)


if __name__ == "__main__":
    unittest.main()
