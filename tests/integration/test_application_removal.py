"""Removed applications leave nothing behind: with the real relay on a real bus, and after a time without the daemon."""

import json
import pathlib
import plistlib
import unittest

from scratch_bus import Bus, Relay, wait_for_relay
from scratch_system import FONT_FILES, REGISTRY, ScratchSystem, eventually

SANS = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")
UNREGISTERED = "com.vorlan.Startwell.applicationUnregistered"
SYNCHRONISED = "synchroning FontProviders"


class ApplicationRemoval(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.relay = None

    def start_with_relay(self):
        bus = Bus(self.system)
        self.addCleanup(bus.stop)
        self.relay = Relay(self.system)
        self.addCleanup(self.relay.stop)
        wait_for_relay(bus)
        self.system.start()
        # Until the daemon hears what is announced.
        eventually(lambda: self.announce({}) or self.synchronisations() > 0)

    def announce(self, info, name=UNREGISTERED):
        self.system.ctl("post-notification", name, "--user-info", json.dumps(info))

    def synchronisations(self):
        return len(self.system.daemon.lines_with(SYNCHRONISED))

    def install(self, identifier):
        """An application with a font and a record."""
        self.system.install_application(identifier)
        if self.relay is not None:
            # What came and went between two looks was never there.
            self.relay.wait_for_line(f'application "{identifier}" is installed')
        self.system.ctl("fonts", "install", "--identifier", identifier, SANS)
        issues = self.system.preferences().get("issues", {})
        issues[identifier] = [f"U/{identifier}/DejaVuSans.ttf"]
        self.system.ctl("preferences", "set", "issues", json.dumps(issues))

    def traces(self, identifier):
        """What is left of an application: its font's registration, its files, its record."""
        path = self.system.real(REGISTRY)
        registry = plistlib.loads(path.read_bytes()) if path.exists() else {}
        return (any(f"/{identifier}/" in font for font in registry),
                self.system.real(f"{FONT_FILES}/{identifier}").exists(),
                identifier in self.system.preferences().get("issues", {}))

    def assert_kept(self, identifier):
        self.assertEqual(self.traces(identifier), (True, True, True), identifier)

    def wait_until_gone(self, *identifiers):
        for identifier in identifiers:
            eventually(lambda: self.traces(identifier) == (False, False, False))

    def test_a_removed_application_leaves_nothing_behind(self):
        self.start_with_relay()
        self.install("org.example.going")
        self.install("org.example.staying")
        self.system.remove_application("org.example.going")
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.staying")

    def test_an_upgraded_application_keeps_everything(self):
        self.start_with_relay()
        self.install("org.example.upgraded")
        self.install("org.example.going")
        self.system.remove_application("org.example.upgraded")
        self.system.install_application("org.example.upgraded")
        self.system.remove_application("org.example.going")
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.upgraded")

    def test_malformed_announcements_harm_nothing(self):
        self.start_with_relay()
        self.install("org.example.staying")
        self.install("org.example.going")
        self.announce({"bundleIDs": ["org.example.staying"]}, name="com.vorlan.Startwell.applicationRegistered")
        self.system.ctl("post-notification", UNREGISTERED)
        for unsound in ("org.example.staying", 7, True, {"org.example.staying": 1}, [7, ["org.example.staying"]], []):
            self.announce({"bundleIDs": unsound})
        self.announce({"bundleIDs": [1, "org.example.going", "", "../org.example.staying", "org.example.nobody"]})
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.staying")

    def test_what_was_removed_while_no_daemon_ran_goes_at_the_next_start(self):
        self.system.start()
        self.install("org.example.going")
        self.install("org.example.staying")
        self.system.stop()
        self.system.remove_application("org.example.going")
        daemon = self.system.start()
        daemon.wait_for_line('stray provider "org.example.going" detected')
        daemon.wait_for_line('stray client "org.example.going" detected')
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.staying")

    def test_a_provider_without_a_program_is_kept_when_told_so(self):
        self.system.start()
        self.install("org.example.own")
        self.system.remove_application("org.example.own")
        self.install("org.example.going")
        self.system.remove_application("org.example.going")
        self.system.ctl("keep-provider", "org.example.own")
        self.system.restart()
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.own")
        self.system.ctl("keep-provider", "--undo", "org.example.own")
        self.system.restart()
        self.wait_until_gone("org.example.own")


if __name__ == "__main__":
    unittest.main()
