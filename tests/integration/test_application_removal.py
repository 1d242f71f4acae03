"""Removed applications leave nothing behind: with the real relay on a real bus, and after a time without the daemon."""

import unittest

from gi.repository import GLib

from removal_system import UNREGISTERED, ApplicationsThatGo
from scratch_bus import RELAY, Peer


def removal(identifiers):
    return GLib.Variant("(sa{sv})", (UNREGISTERED, {"bundleIDs": GLib.Variant("as", identifiers)}))


class ApplicationRemoval(ApplicationsThatGo):
    def test_a_removed_application_leaves_nothing_behind(self):
        self.start_with_relay()
        self.install("org.example.going")
        self.install("org.example.staying")
        self.system.remove_application("org.example.going")
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.staying")

    def test_an_upgraded_application_keeps_everything(self):
        # Long enough for the entry to be away within it, however busy the machine is.
        self.start_with_relay(window=5)
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

    def test_signals_of_somebody_else_harm_nothing(self):
        self.start_with_relay()
        self.install("org.example.staying")
        self.install("org.example.going")
        impostor = Peer(self.bus)
        self.addCleanup(impostor.close)
        spoofed = removal(["org.example.staying"])
        for other in impostor.driver("ListNames").unpack()[0]:
            if other.startswith(":"):
                impostor.emit(RELAY, spoofed, destination=other)
        impostor.emit(RELAY, spoofed)
        self.announce({"bundleIDs": ["org.example.going"]})
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.staying")

    def test_malformed_signals_of_the_relay_itself_harm_nothing(self):
        self.start_bus()
        relay = Peer(self.bus)
        self.addCleanup(relay.close)
        relay.own(RELAY)
        self.system.start()
        self.wait_until_heard(lambda info: relay.emit(RELAY, GLib.Variant("(sa{sv})", (UNREGISTERED, info))))
        self.install("org.example.staying")
        self.install("org.example.going")
        staying = "org.example.staying"
        for signature, arguments in (("(s)", (UNREGISTERED,)), ("(sas)", (UNREGISTERED, [staying])),
                                     ("(sa{ss})", (UNREGISTERED, {"bundleIDs": staying})),
                                     ("(a{sv}s)", ({"bundleIDs": GLib.Variant("as", [staying])}, UNREGISTERED)),
                                     ("(sa{sv}s)", (UNREGISTERED, {"bundleIDs": GLib.Variant("as", [staying])}, ""))):
            relay.emit(RELAY, GLib.Variant(signature, arguments))
        nested = GLib.Variant("as", [staying])
        for _ in range(12):
            nested = GLib.Variant("av", [nested])
        for unsound in (GLib.Variant("s", staying), nested, GLib.Variant("ay", staying.encode()),
                        GLib.Variant("a{sv}", {staying: nested})):
            relay.emit(RELAY, GLib.Variant("(sa{sv})", (UNREGISTERED, {"bundleIDs": unsound})))
        relay.emit(RELAY, removal(["org.example.going"]))
        self.wait_until_gone("org.example.going")
        self.assert_kept(staying)

    def test_a_bus_that_restarts_announces_removals_again(self):
        self.start_with_relay()
        self.install("org.example.staying")
        for identifier in ("org.example.first", "org.example.second"):
            self.install(identifier)
            self.bus.stop()
            self.start_bus()
            self.wait_until_heard(lambda info: self.announce(info, check=False))
            self.system.remove_application(identifier)
            self.wait_until_gone(identifier)
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
        self.install("org.example.going")
        # The daemon that runs may still have to look for what was removed before it started.
        self.system.stop()
        self.system.remove_application("org.example.own")
        self.system.remove_application("org.example.going")
        self.system.ctl("keep-provider", "org.example.own")
        self.system.start()
        self.wait_until_gone("org.example.going")
        self.assert_kept("org.example.own")
        self.system.ctl("keep-provider", "--undo", "org.example.own")
        self.system.restart()
        self.wait_until_gone("org.example.own")


if __name__ == "__main__":
    unittest.main()
