"""Any D-Bus library can be a client: Python's GObject bindings and the gdbus command."""

import json
import os
import pathlib
import socket
import subprocess
import sys
import unittest

from gi.repository import GLib

import foreign_client
from scratch_system import SERVICE, ScratchSystem, entry

HERE = pathlib.Path(__file__).parent


class ForeignClient(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.system.sign(os.path.realpath(sys.executable), "org.example.foreign", ["font-enumeration"])

    def client(self, *arguments, **options):
        client = foreign_client.Client(str(self.system.root), *arguments, **options)
        self.addCleanup(client.close)
        return client

    def registry(self, count):
        path = self.system.font_file("org.example.foundry", "a.ttf")
        return {path.replace("a.ttf", f"{number}.ttf"): entry(f"Face{number}", f"Family {number}")
                for number in range(count)}

    def views_equal_registry(self, view, registry):
        self.assertEqual(view["fontsInfo"],
                         {path: {"familyName": value["familyName"]} for path, value in registry.items()})

    def test_a_small_view_comes_inline(self):
        registry = self.registry(5)
        self.system.write_registry(registry)
        self.system.start()
        view = self.client().checkin()
        self.views_equal_registry(view, registry)
        self.assertNotIn("(memory files)", view)
        self.assertEqual(view["extension"][-1:], b"\0")

    def test_a_large_view_comes_as_a_sealed_memory_file(self):
        registry = self.registry(5000)
        self.system.write_registry(registry)
        self.system.start()
        view = self.client().checkin()
        self.assertEqual(view["(memory files)"], ["fontsInfo"])
        self.views_equal_registry(view, registry)

    def test_a_received_memory_file_cannot_be_changed(self):
        self.system.write_registry(self.registry(5000))
        self.system.start()
        _, files = self.client().call("TyphonProtocol", "checkin")
        for attempt in (lambda: os.write(files[0], b"x"), lambda: os.ftruncate(files[0], 0),
                        lambda: os.write(os.open(f"/proc/self/fd/{files[0]}", os.O_RDWR), b"x")):
            self.assertRaises(OSError, attempt)

    def test_errors_have_names(self):
        self.system.start()
        client = self.client()
        cases = [
            ("UnknownMethod", "TyphonProtocol", "noSuchMember", None),
            ("InvalidArgs", "TyphonProtocol", "checkin", GLib.Variant("(s)", ("x",))),
            ("InvalidArgs", "TyphonProtocol", "resetIssuedFontsFor_reply", GLib.Variant("(x)", (1,))),
            ("AccessDenied", "TyphonProtocol", "requestFonts_forClient_reply",
             GLib.Variant("(sh)", ("Face", 0))),
        ]
        for expected, protocol, member, arguments in cases:
            with self.subTest(member=member), self.assertRaises(GLib.Error) as caught:
                files = [os.open("/dev/null", os.O_RDONLY)] if expected == "AccessDenied" else []
                client.call(protocol, member, arguments, files)
            self.assertEqual(foreign_client.error_name(caught.exception),
                             f"org.freedesktop.DBus.Error.{expected}")

    def test_update_acknowledgement_and_reset_answer(self):
        self.system.write_preferences({"issues": {"org.example.writer": ["U/x/a.ttf"]}})
        self.system.start()
        client = self.client()
        self.assertEqual(client.call("TyphonProtocol", "updatingUserFonts")[0].unpack(), ())
        reset = GLib.Variant("(s)", ("org.example.writer",))
        self.assertEqual(client.call("TyphonProtocol", "resetIssuedFontsFor_reply", reset)[0].unpack(), ())
        self.assertEqual(self.system.preferences()["issues"], {"org.example.writer": ["U/x/a.ttf"]})

    def test_an_entitled_tool_resets_what_was_issued(self):
        allow = "com.vorlan.Typhon.allow-reset-issued-fonts"
        self.system.sign(os.path.realpath(sys.executable), "com.vorlan.tool", entitlements={allow: True})
        self.system.write_preferences({"issues": {"org.example.a": ["U/x/a.ttf"], "org.example.b": []},
                                       "administrator": "kept"})
        self.system.start()
        reset = GLib.Variant("(s)", ("org.example.a",))
        self.client().call("TyphonProtocol", "resetIssuedFontsFor_reply", reset)
        left = self.system.preferences()
        self.assertEqual(left["issues"], {"org.example.b": []})
        self.assertEqual(left["administrator"], "kept")

    def test_send_fonts_is_never_answered(self):
        self.system.start()
        client = self.client()
        with self.assertRaises(GLib.Error) as caught:
            client.call("TyphonSilkpageSupportProtocol", "sendFonts_reply",
                        GLib.Variant("(aa{sv})", ([],)), timeout=500)
        self.assertTrue(caught.exception.matches(GLib.quark_from_string("g-io-error-quark"), 24))
        self.assertIsNotNone(client.checkin())

    def test_uid_0_of_a_user_namespace_can_connect(self):
        self.system.write_registry(self.registry(3))
        self.system.start()
        done = subprocess.run(
            ["unshare", "--user", "--map-root-user", sys.executable, HERE / "foreign_client.py",
             str(self.system.root), "checkin"], capture_output=True, text=True, timeout=60)
        self.assertEqual(done.returncode, 0, done.stderr)
        self.assertIsNone(json.loads(done.stdout))

    def gdbus(self, *arguments):
        address = f"unix:path={self.system.socket_path(SERVICE)}"
        return subprocess.run(["gdbus", arguments[0], "--address", address, "--dest", SERVICE,
                               "--object-path", "/com/vorlan/typhond", *arguments[1:]],
                              capture_output=True, text=True, timeout=60, check=True).stdout

    def test_gdbus_introspects_and_calls(self):
        self.system.start()
        description = self.gdbus("introspect")
        for name in ("interface com.vorlan.typhond.TyphonProtocol", "checkinForFontPicker",
                     "interface com.vorlan.typhond.TyphonSilkpageSupportProtocol", "sendFonts_reply",
                     "interface org.freedesktop.DBus.Peer", "interface org.freedesktop.DBus.Properties"):
            self.assertIn(name, description)
        self.assertEqual(self.gdbus("call", "--method", "com.vorlan.typhond.TyphonProtocol.checkin"),
                         "(@aa{sv} [],)\n")
        self.assertEqual(self.gdbus("call", "--method", "org.freedesktop.DBus.Peer.Ping"), "()\n")

    def test_the_service_is_activated_by_its_sockets(self):
        self.system.write_registry(self.registry(3))
        daemon = ActivatedDaemon(self.system)
        self.addCleanup(daemon.close)
        self.assertEqual(len(self.client().checkin()["fontsInfo"]), 3)


class ActivatedDaemon:
    """Does what a service manager does: binds the sockets first and hands them over by name."""

    def __init__(self, system):
        names = [SERVICE, f"{SERVICE}.file-access", f"{SERVICE}.sandboxes"]
        self.sockets = []
        for name in names:
            path = system.socket_path(name)
            path.parent.mkdir(parents=True, exist_ok=True)
            listening = socket.socket(socket.AF_UNIX)
            listening.bind(str(path))
            listening.listen(16)
            self.sockets.append(listening)
        descriptors = [listening.fileno() for listening in self.sockets]
        starter = (
            "import os, sys\n"
            f"given = {descriptors}\n"
            "high = [os.dup2(fd, 100 + i) for i, fd in enumerate(given)]\n"
            "[os.dup2(fd, 3 + i) for i, fd in enumerate(high)]\n"
            "os.environ['LISTEN_PID'] = str(os.getpid())\n"
            "os.execv(sys.argv[1], sys.argv[1:])\n")
        binary = pathlib.Path(os.environ["TYPHON_BIN_DIR"]) / "typhond"
        self.process = subprocess.Popen(
            [sys.executable, "-c", starter, str(binary), "--root", str(system.root)],
            pass_fds=descriptors, stderr=subprocess.DEVNULL,
            env={**os.environ, "LISTEN_FDS": str(len(names)), "LISTEN_FDNAMES": ":".join(names)})

    def close(self):
        self.process.kill()
        self.process.wait()
        for listening in self.sockets:
            listening.close()


if __name__ == "__main__":
    unittest.main()
