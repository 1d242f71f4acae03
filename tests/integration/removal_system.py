"""A scratch system on which applications come and go, with the real relay on a real bus."""

import json
import pathlib
import plistlib
import unittest

from scratch_bus import Bus, Relay, wait_for_relay
from scratch_system import FONT_FILES, REGISTRY, ScratchSystem, eventually

SANS = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")
UNREGISTERED = "com.vorlan.Startwell.applicationUnregistered"
SYNCHRONISED = "synchroning FontProviders"


class ApplicationsThatGo(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.bus = None
        self.relay = None

    def start_bus(self):
        self.bus = Bus(self.system)
        self.addCleanup(self.bus.stop)

    def start_relay(self, window=0.5):
        self.relay = Relay(self.system, window)
        self.addCleanup(self.relay.stop)
        wait_for_relay(self.bus)

    def start_with_relay(self, window=0.5):
        self.start_bus()
        self.start_relay(window)
        self.system.start()
        self.wait_until_heard(self.announce)

    def wait_until_heard(self, announce):
        """Announces until the daemon surely hears what is announced."""
        before = self.synchronisations()
        eventually(lambda: announce({}) or self.synchronisations() > before)

    def announce(self, info, name=UNREGISTERED, check=True):
        self.system.ctl("post-notification", name, "--user-info", json.dumps(info), check=check)

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

    def registry(self):
        path = self.system.real(REGISTRY)
        return plistlib.loads(path.read_bytes()) if path.exists() else {}

    def traces(self, identifier):
        """What is left of an application: its font's registration, its files, its record."""
        return (any(f"/{identifier}/" in font for font in self.registry()),
                self.system.real(f"{FONT_FILES}/{identifier}").exists(),
                identifier in self.system.preferences().get("issues", {}))

    def assert_kept(self, identifier):
        self.assertEqual(self.traces(identifier), (True, True, True), identifier)

    def wait_until_gone(self, *identifiers):
        for identifier in identifiers:
            eventually(lambda: self.traces(identifier) == (False, False, False))
