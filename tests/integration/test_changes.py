"""Fonts change: every kind of client is told exactly its own share, in and outside of sandboxes."""

import contextlib
import json
import os
import signal
import subprocess
import sys
import unittest

from gi.repository import Gio, GLib

import foreign_client
from scratch_system import BIN, FONT_FILES, PATIENCE, ScratchSystem, entry

MANAGED = "/var/mobile/Library/Fonts/Managed"
OBJECT = "/com/vorlan/typhond"
WAITING = b"waiting for changes"


def url(path):
    return "file://" + path


class Monitor:
    """A running `typhonctl monitor`."""

    def __init__(self, system, program, sandboxed=False, options=("--json",), stdout=subprocess.PIPE):
        launcher = [BIN / "typhonctl", "--root", system.root, "run", "--"] if sandboxed else []
        command = [*launcher, program, "--root", system.root, "monitor", *options]
        self.process = subprocess.Popen([str(part) for part in command], stdin=subprocess.DEVNULL,
                                        stdout=stdout, stderr=subprocess.PIPE)
        self.said = b""
        while WAITING not in self.said:
            line = self.process.stderr.readline()
            if not line:
                raise AssertionError(f"{command} ended: {self.said}")
            self.said += line

    def change(self):
        """The next change; its lines are complete and come at once."""
        return json.loads(self.process.stdout.readline())

    def end(self, number=signal.SIGINT):
        """What it printed since, and its exit code, after a signal."""
        self.process.send_signal(number)
        return self.rest()

    def rest(self):
        output, errors = self.process.communicate(timeout=PATIENCE)
        self.said += errors
        return output, self.process.returncode

    def close(self):
        if self.process.poll() is None:
            self.process.kill()
        with contextlib.suppress(ValueError):
            self.process.communicate(timeout=PATIENCE)


class ChangingSystem(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.own = self.system.font_file("org.example.foundry", "a.ttf")
        self.other = self.system.font_file("org.example.newfoundry", "b c.ttf")
        self.registry = {self.own: entry("A", "Alpha"), self.other: entry("B", "Beta")}
        self.system.write_registry(self.registry)
        self.system.start()
        self.reporter = foreign_client.Client(str(self.system.root))
        self.addCleanup(self.reporter.close)

    def report(self, urls, added, kind=0):
        change = GLib.Variant("a{sv}", {"urls": GLib.Variant("as", urls), "added": GLib.Variant("b", added),
                                        "kind": GLib.Variant("i", kind)})
        self.reporter.call("TyphonProtocol", "fontChanged_reply", GLib.Variant.new_tuple(change))

    def settle(self):
        """All broadcasts are out: the reporter's next message is handled after its last one."""
        self.reporter.call("TyphonProtocol", "updatingUserFonts")

    def monitor(self, capabilities, identifier="org.example.viewer", **options):
        program = self.system.program(identifier, capabilities)
        monitor = Monitor(self.system, program, **options)
        self.addCleanup(monitor.close)
        return monitor


class Changes(ChangingSystem):
    def test_each_kind_of_client_hears_exactly_its_share(self):
        for sandboxed in (False, True):
            with self.subTest(sandboxed=sandboxed):
                enumerating = self.monitor(["font-enumeration"], sandboxed=sandboxed)
                foundry = self.monitor(["system-installation"], "org.example.foundry", sandboxed=sandboxed)
                stranger = self.monitor(["system-installation"], "org.example.stranger", sandboxed=sandboxed)
                user = self.monitor(["app-usage"], "org.example.writer", sandboxed=sandboxed)
                plain = self.monitor([], "org.example.plain", sandboxed=sandboxed)
                unsigned = Monitor(self.system, self.system.program(), sandboxed)
                self.addCleanup(unsigned.close)
                everybody = (enumerating, foundry, stranger, user, plain, unsigned)
                self.report([url(self.own), "file://" + self.other.replace(" ", "%20")], True)
                self.report([url(self.own)], False)
                self.report([url(f"{MANAGED}/p.ttf")], False, kind=1)

                both = [url(self.own), "file://" + self.other.replace(" ", "%20")]
                entries = {path: {"familyName": value["familyName"]} for path, value in self.registry.items()}
                self.assertEqual(enumerating.change(), {
                    "info": {"fontsInfo": entries}, "addedURLStrings": both, "removedURLStrings": None})
                told = foundry.change()
                extension = told["info"].pop("extension.provider", None)
                self.assertEqual(extension is not None, sandboxed)
                self.assertEqual(told, {"info": {"fontsInfo": {self.own: entries[self.own]}},
                                        "addedURLStrings": [url(self.own)], "removedURLStrings": None})
                gone = {"info": {}, "addedURLStrings": None, "removedURLStrings": [url(self.own)]}
                for monitor in (enumerating, foundry, stranger):
                    self.assertEqual(monitor.change(), gone)
                for monitor in everybody:
                    self.assertEqual(monitor.change(), {"info": None, "addedURLStrings": None,
                                                        "removedURLStrings": [url(f"{MANAGED}/p.ttf")]})
                for monitor in everybody:
                    self.assertEqual(monitor.end(), (b"", 0), monitor.said)

    def test_the_new_font_is_in_the_share_and_can_be_read(self):
        enumerating = self.monitor(["font-enumeration"])
        new = self.system.font_file("org.example.foundry", "new.ttf", b"new font")
        self.system.write_registry({**self.registry, new: entry("N", "Nu")})
        self.report([url(new)], True)
        self.assertEqual(enumerating.change()["info"], {"fontsInfo": {new: {"familyName": {"N": "Nu"}}}})
        reader = self.system.program("org.example.reader", ["font-enumeration"])
        self.assertEqual(self.system.ctl("open", new, program=reader).stdout, b"new font")

    def test_a_large_change_arrives_whole(self):
        enumerating = self.monitor(["font-enumeration"])
        many = {f"{FONT_FILES}/org.example.foundry/{number:05}.ttf": entry(f"P{number}", f"Family {number}")
                for number in range(5000)}
        self.system.write_registry(many)
        self.report([url(path) for path in many], True)
        told = enumerating.change()
        self.assertEqual(set(told["info"]["fontsInfo"]), set(many))
        self.assertEqual(told["addedURLStrings"], [url(path) for path in many])

    def test_the_reporting_client_hears_its_own_change(self):
        self.system.sign(os.path.realpath(sys.executable), "org.example.foreign", ["font-enumeration"])
        heard = []
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        node = Gio.DBusNodeInfo.new_for_xml(
            '<node><interface name="com.vorlan.typhond.TyphonClientProtocol">'
            '<method name="fontAddedInfo_addedURLStrings_removedURLStrings">'
            '<arg type="aa{sv}" direction="in"/><arg type="aas" direction="in"/>'
            '<arg type="aas" direction="in"/></method></interface></node>')
        client.connection.register_object(OBJECT, node.interfaces[0], lambda *call: heard.append(call[5].unpack()))
        self.assertIn(self.own, client.checkin()["fontsInfo"])
        change = GLib.Variant("a{sv}", {"urls": GLib.Variant("as", [url(self.own)]),
                                        "added": GLib.Variant("b", True)})
        client.call("TyphonProtocol", "fontChanged_reply", GLib.Variant.new_tuple(change))
        client.call("TyphonProtocol", "updatingUserFonts")
        while not heard:
            GLib.MainContext.default().iteration(True)
        info, added, removed = heard[0]
        self.assertEqual(list(info[0]["fontsInfo"]), [self.own])
        self.assertEqual((added, removed), ([[url(self.own)]], []))

    def test_hostile_reports_are_answered_and_harm_nobody(self):
        enumerating = self.monitor(["font-enumeration"])
        plain = GLib.Variant
        for change in ({}, {"urls": plain("s", url(self.own))}, {"urls": plain("av", [plain("i", 1)])},
                       {"urls": plain("as", ["no url", "file:///%00", "http://x/y"]), "added": plain("b", True)},
                       {"urls": plain("as", [url("/elsewhere.ttf")]), "added": plain("b", True)},
                       {"urls": plain("a{sv}", {}), "added": plain("s", "yes"), "kind": plain("s", "1")}):
            with self.subTest(change=change):
                self.reporter.call("TyphonProtocol", "fontChanged_reply",
                                   plain.new_tuple(plain("a{sv}", change)))
        self.settle()
        self.system.daemon.wait_for_line("got invalid font path: /elsewhere.ttf")
        self.assert_nothing_was_told(enumerating)

    def test_the_font_picker_is_not_told(self):
        path = self.system.program("com.vorlan.Panekit.FontPicker", [])
        picker = Monitor(self.system, path)
        self.addCleanup(picker.close)
        self.report([url(self.own)], True)
        self.settle()
        self.assert_nothing_was_told(picker)

    def assert_nothing_was_told(self, monitor):
        # It prints all that it was sent before it sees that the daemon is gone.
        self.system.stop()
        self.assertEqual(monitor.rest(), (b"", 1))


class MonitorCommand(ChangingSystem):
    """How `typhonctl monitor` prints and ends."""

    def test_it_prints_a_line_for_people(self):
        monitor = self.monitor(["font-enumeration"], options=("--count", "2"))
        self.report([url(self.own)], True)
        self.report([url(self.own)], False)
        output, code = monitor.rest()
        self.assertEqual(output.decode().splitlines(), [
            f"added 1 font file: {self.own} (Alpha / A)", f"removed 1 font file: {self.own}"])
        self.assertEqual(code, 0)

    def test_it_ends_with_its_signals(self):
        for number in (signal.SIGINT, signal.SIGTERM, signal.SIGHUP):
            self.assertEqual(self.monitor([]).end(number), (b"", 0))

    def test_it_ends_when_its_reader_is_gone(self):
        reading, writing = os.pipe()
        monitor = self.monitor(["font-enumeration"], stdout=writing)
        os.close(writing)
        os.close(reading)
        self.assertEqual(monitor.process.wait(PATIENCE), 0)

    def test_it_says_that_the_daemon_is_gone(self):
        monitor = self.monitor(["font-enumeration"])
        self.system.stop()
        self.assertEqual(monitor.rest(), (b"", 1))
        self.assertIn(b"connection", monitor.said)
        self.assertIn(b"check in again", monitor.said)

    def test_a_vanished_client_harms_nobody(self):
        gone = self.monitor(["font-enumeration"])
        stays = self.monitor(["font-enumeration"])
        gone.process.kill()
        gone.process.wait(PATIENCE)
        self.report([url(self.own)], True)
        self.assertEqual(stays.change()["addedURLStrings"], [url(self.own)])


if __name__ == "__main__":
    unittest.main()
