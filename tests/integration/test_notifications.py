"""The system's notifications over a real bus: the relay, the listeners, and those who would like to pass for it."""

import ctypes
import itertools
import json
import os
import shutil
import subprocess
import sys
import threading
import unittest

from gi.repository import GLib

import foreign_client
from scratch_bus import PING, RELAY, Bus, Peer, Relay, another_user, refusal_of, wait_for_relay
from scratch_system import BIN, PATIENCE, ScratchSystem, eventually

ACCESS_DENIED = "org.freedesktop.DBus.Error.AccessDenied"
INVALID_ARGS = "org.freedesktop.DBus.Error.InvalidArgs"
NAME = "(s)"
NAME_AND_INFO = "(sa{sv})"
PROBE = "probe"
NUMBERS = itertools.count()


def named(name):
    return GLib.Variant(NAME, (name,))


def with_info(name, **info):
    return GLib.Variant(NAME_AND_INFO, (name, info))


def swap(one, other):
    """In one step: a user without a home, if only for a moment, is gone."""
    at_working_directory, exchange = -100, 2
    outcome = ctypes.CDLL(None).renameat2(at_working_directory, bytes(one), at_working_directory, bytes(other),
                                          exchange)
    assert outcome == 0, f"cannot swap {one} and {other}"


class Echo:
    """A service of typhon that prints what reaches it."""

    def __init__(self, system):
        self._process = subprocess.Popen([str(BIN / "notification-echo"), str(system.root)], text=True,
                                         stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        self.events = []
        self.log = []
        self._readers = [threading.Thread(target=self._read_events, daemon=True),
                         threading.Thread(target=self._read_log, daemon=True)]
        for reader in self._readers:
            reader.start()

    def _read_events(self):
        for line in self._process.stdout:
            self.events.append(json.loads(line))

    def _read_log(self):
        for line in self._process.stderr:
            self.log.append(line.rstrip("\n"))

    def heard(self):
        """All events but the probes."""
        return [event for event in self.events if not event["EventName"].startswith(PROBE)]

    def names(self):
        return [event["EventName"] for event in self.heard()]

    def post(self, name):
        self._process.stdin.write(name + "\n")
        self._process.stdin.flush()

    def close(self):
        self._process.stdin.close()
        self._process.wait(PATIENCE)
        for reader in self._readers:
            reader.join(PATIENCE)
        self._process.stdout.close()
        self._process.stderr.close()


class OnABus(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)

    def bus(self, user=None):
        bus = Bus(self.system, user)
        self.addCleanup(bus.stop)
        return bus

    def relay(self, bus, **options):
        relay = Relay(self.system, **options)
        self.addCleanup(relay.stop)
        if bus:
            wait_for_relay(bus)
        return relay

    def peer(self, bus):
        peer = Peer(bus)
        self.addCleanup(peer.close)
        return peer

    def listener(self, bus):
        peer = self.peer(bus)
        peer.listen()
        return peer

    def echo(self):
        echo = Echo(self.system)
        self.addCleanup(echo.close)
        return echo

    def wait_until_heard(self, echo, announce):
        """Announces until the echo surely hears what that announces, and not only what was announced before."""
        probes = []

        def heard():
            probes.append(f"{PROBE} {next(NUMBERS)}")
            announce(named(probes[-1]))
            return any(event["EventName"] in probes for event in echo.events)
        eventually(heard)


class Announcing(OnABus):
    def test_a_foreign_listener_hears_what_was_posted(self):
        bus = self.bus()
        self.relay(bus)
        listener = self.listener(bus)
        poster = self.peer(bus)
        poster.post(PING, named("com.vorlan.example"))
        poster.post(RELAY, with_info("com.vorlan.example", ids=GLib.Variant("as", ["a", "b"])))
        self.assertEqual(listener.wait_for_signals(2),
                         [(PING, ("com.vorlan.example",)), (RELAY, ("com.vorlan.example", {"ids": ["a", "b"]}))])

    def test_only_the_services_user_and_root_may_post_or_announce(self):
        bus = self.bus(user=another_user())
        stranger = self.peer(bus)
        if os.geteuid() != 0:
            self.assertEqual(refusal_of(lambda: stranger.post(PING, named("x"))), ACCESS_DENIED)
        self.assertEqual(refusal_of(lambda: stranger.own(PING)), ACCESS_DENIED)
        self.assertEqual(refusal_of(lambda: stranger.own(RELAY)), ACCESS_DENIED)
        listener = self.peer(bus)
        listener.listen(of_anybody=True)
        stranger.emit(PING, named("x"))
        stranger.emit(PING, named("x"), destination=listener.name)
        self.assertEqual(listener.heard(), [])

    def test_malformed_posts_are_refused(self):
        bus = self.bus()
        self.relay(bus)
        poster = self.peer(bus)
        self.assertEqual(refusal_of(lambda: poster.post(PING, named(""))), INVALID_ARGS)
        self.assertEqual(refusal_of(lambda: poster.post(PING, named("x" * 1025))), INVALID_ARGS)
        self.assertEqual(refusal_of(lambda: poster.post(PING, with_info("x"))), INVALID_ARGS)
        self.assertEqual(refusal_of(lambda: poster.post(RELAY, named("x"))), INVALID_ARGS)
        huge = GLib.Variant("s", "x" * (1 << 20))
        self.assertEqual(refusal_of(lambda: poster.post(RELAY, with_info("x", huge=huge))), INVALID_ARGS)
        listener = self.listener(bus)
        poster.post(PING, named("last"))
        self.assertEqual(listener.wait_for_signals(1), [(PING, ("last",))])

    def test_the_relay_comes_back_with_the_bus(self):
        relay = self.relay(None)
        relay.wait_for_line("no system bus at")
        bus = Bus(self.system)
        wait_for_relay(bus)
        bus.stop()
        relay.wait_for_line("lost the system bus at")
        bus = self.bus()
        wait_for_relay(bus)
        listener = self.listener(bus)
        self.peer(bus).post(PING, named("again"))
        self.assertEqual(listener.wait_for_signals(1), [(PING, ("again",))])

    def test_an_administrator_posts_with_typhonctl(self):
        bus = self.bus()
        self.relay(bus)
        listener = self.listener(bus)
        self.system.ctl("post-notification", "plain")
        self.system.ctl("post-notification", "rich", "--user-info", '{"bundleIDs": ["org.example.a"], "n": 3}')
        self.assertEqual(listener.wait_for_signals(2),
                         [(PING, ("plain",)), (RELAY, ("rich", {"bundleIDs": ["org.example.a"], "n": 3}))])

    def test_typhonctl_says_why_a_notification_was_not_posted(self):
        done = self.system.ctl("post-notification", "x", check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn(b"no system bus at", done.stderr)
        self.bus()
        done = self.system.ctl("post-notification", "x", check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn(b"Start typhon-relayd", done.stderr)
        for unsound in ("[1]", "{1}", "/nowhere"):
            done = self.system.ctl("post-notification", "x", "--user-info", unsound, check=False)
            self.assertEqual(done.returncode, 2)


class Listening(OnABus):
    def test_events_of_the_relay_arrive(self):
        bus = self.bus()
        self.relay(bus)
        echo = self.echo()
        poster = self.peer(bus)
        self.wait_until_heard(echo, lambda probe: poster.post(PING, probe))
        poster.post(PING, named("one"))
        poster.post(RELAY, with_info("two", answer=GLib.Variant("i", 42)))
        eventually(lambda: len(echo.names()) == 2)
        self.assertEqual(echo.heard(),
                         [{"stream": "com.vorlan.pingd.matching", "EventName": "one"},
                          {"stream": "com.vorlan.relayd.matching", "EventName": "two",
                           "UserInfo": {"answer": 42}}])

    def test_signals_of_anybody_else_are_ignored(self):
        bus = self.bus()
        self.relay(bus)
        echo = self.echo()
        poster = self.peer(bus)
        self.wait_until_heard(echo, lambda probe: poster.post(PING, probe))
        impostor = self.peer(bus)
        for other in self.peer(bus).driver("ListNames").unpack()[0]:
            if other.startswith(":"):
                impostor.emit(PING, named("spoofed"), destination=other)
                impostor.emit(RELAY, with_info("spoofed"), destination=other)
        impostor.emit(PING, named("spoofed"))
        impostor.emit(RELAY, with_info("spoofed"))
        poster.post(PING, named("last"))
        eventually(lambda: echo.names())
        self.assertEqual(echo.names(), ["last"])

    def test_signals_of_one_who_owned_the_name_before_are_ignored(self):
        bus = self.bus()
        first, second = self.peer(bus), self.peer(bus)
        echo = self.echo()
        first.own(PING)
        self.wait_until_heard(echo, lambda probe: first.emit(PING, probe))
        first.emit(PING, named("of the first"))
        first.release(PING)
        second.own(PING)
        for other in second.driver("ListNames").unpack()[0]:
            if other.startswith(":"):
                first.emit(PING, named("too late"), destination=other)
        first.emit(PING, named("too late"))
        self.wait_until_heard(echo, lambda probe: second.emit(PING, probe))
        second.emit(PING, named("of the second"))
        eventually(lambda: len(echo.names()) >= 2)
        self.assertEqual(echo.names(), ["of the first", "of the second"])

    def test_malformed_signals_of_the_owner_are_ignored(self):
        bus = self.bus()
        owner = self.peer(bus)
        owner.own(PING)
        owner.own(RELAY)
        echo = self.echo()
        self.wait_until_heard(echo, lambda probe: owner.emit(PING, probe))
        owner.emit(PING, GLib.Variant("(i)", (1,)))
        owner.emit(PING, None)
        owner.emit(PING, with_info("more than a name"))
        owner.emit(RELAY, GLib.Variant("(a{sv})", ({},)))
        owner.connection.emit_signal(None, "/elsewhere", PING, "Notification", named("from elsewhere"))
        owner.connection.emit_signal(None, "/com/vorlan/pingd", PING, "Another", named("another signal"))
        owner.emit(PING, named("sound"))
        eventually(lambda: echo.names())
        self.assertEqual(echo.names(), ["sound"])

    def test_a_bus_that_comes_later_and_is_restarted_is_used(self):
        echo = self.echo()
        eventually(lambda: any("no system bus at" in line for line in echo.log))
        for round_ in range(2):
            bus = Bus(self.system)
            relay = Relay(self.system)
            wait_for_relay(bus)
            poster = self.peer(bus)
            self.wait_until_heard(echo, lambda probe: poster.post(PING, probe))
            relay.stop()
            bus.stop()
            eventually(lambda: sum("lost the system bus at" in line for line in echo.log) == round_ + 1)
        self.assertEqual(sum("no system bus at" in line for line in echo.log), 1)

    def test_a_restarted_relay_is_heard(self):
        bus = self.bus()
        relay = self.relay(bus)
        echo = self.echo()
        poster = self.peer(bus)
        self.wait_until_heard(echo, lambda probe: poster.post(PING, probe))
        relay.stop()
        eventually(lambda: poster.owner_of(PING) is None)
        self.relay(bus)
        self.wait_until_heard(echo, lambda probe: poster.post(PING, probe))

    def test_what_a_service_posts_is_heard_by_everybody(self):
        bus = self.bus()
        self.relay(bus)
        listener = self.listener(bus)
        echo = self.echo()
        self.wait_until_heard(echo, lambda probe: self.peer(bus).post(PING, probe))
        echo.post("from a service")
        eventually(lambda: "from a service" in echo.names())
        eventually(lambda: (PING, ("from a service",)) in listener.heard())


UNREGISTERED = "com.vorlan.Startwell.applicationUnregistered"
APPLICATIONS = "/usr/share/applications"
ALICES = "/home/alice/.local/share/applications"
ALICES_FLATPAKS = "/home/alice/.local/share/flatpak/exports/share/applications"


class Applications(OnABus):
    """A removal is told apart from an upgrade by time alone; here half a second."""

    def install(self, identifier, folder=APPLICATIONS, more=""):
        path = self.system.real(f"{folder}/{identifier}.desktop")
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(f"[Desktop Entry]\nType=Application\nName=x\n{more}")
        return path

    def watch(self, window=0.5):
        bus = self.bus()
        self.watcher = self.relay(bus, window=window)
        self.watcher.wait_for_line("watching for the removal of applications")
        return self.listener(bus)

    def is_seen(self, identifier, count=1):
        self.watcher.wait_for_line(f'application "{identifier}" is installed', count)

    def is_missed(self, identifier):
        self.watcher.wait_for_line(f'application "{identifier}" is not installed any more')

    def removed(self, *identifiers):
        return (RELAY, (UNREGISTERED, {"bundleIDs": list(identifiers)}))

    def assert_announced(self, listener, *identifiers):
        """Those, one after another, and nothing else before one more that is removed after them."""
        listener.wait_for_signals(len(identifiers))
        last = self.install("org.example.last")
        self.is_seen("org.example.last")
        last.unlink()
        self.assertEqual(listener.wait_for_signals(len(identifiers) + 1),
                         [self.removed(identifier) for identifier in (*identifiers, "org.example.last")])

    def test_a_removed_application_is_announced_once(self):
        path = self.install("org.example.a")
        self.install("org.example.b")
        listener = self.watch()
        path.unlink()
        self.assert_announced(listener, "org.example.a")

    def test_an_upgrade_is_not_announced(self):
        path = self.install("org.example.a")
        listener = self.watch(window=3)
        path.unlink()
        self.is_missed("org.example.a")
        self.install("org.example.a")
        self.is_seen("org.example.a", count=2)
        path.with_suffix(".new").write_text(path.read_text())
        path.with_suffix(".new").rename(path)
        self.assert_announced(listener)

    def test_an_entry_that_says_it_is_deleted_is_a_removal(self):
        self.install("org.example.a")
        listener = self.watch()
        self.install("org.example.a", more="Hidden=true\n")
        self.assert_announced(listener, "org.example.a")

    def test_an_application_that_became_a_placeholder_is_not_removed(self):
        self.install("org.example.a")
        listener = self.watch()
        self.install("org.example.a", more="X-Typhon-Placeholder=true\n")
        self.assert_announced(listener)

    def test_an_application_left_in_another_directory_is_not_removed(self):
        paths = [self.install("org.example.a"), self.install("org.example.a", ALICES)]
        listener = self.watch()
        paths[0].unlink()
        self.install("org.example.b")
        self.is_seen("org.example.b")
        paths[1].unlink()
        self.assert_announced(listener, "org.example.a")

    def test_directories_that_appear_later_are_watched(self):
        listener = self.watch()
        for identifier, folder in (("org.example.flatpak", "/var/lib/flatpak/exports/share/applications"),
                                   ("org.example.local", "/usr/local/share/applications"),
                                   ("org.example.alices", ALICES),
                                   ("org.example.alicesflatpak", ALICES_FLATPAKS),
                                   ("kde-org.example.nested", "/usr/share/applications/kde")):
            path = self.install(identifier.removeprefix("kde-"), folder)
            self.is_seen(identifier)
            path.unlink()
            listener.wait_for_signals(len(listener.signals) + 1)
        self.assert_announced(listener, "org.example.flatpak", "org.example.local", "org.example.alices",
                              "org.example.alicesflatpak", "kde-org.example.nested")

    def test_the_applications_of_a_home_that_is_away_are_not_removed(self):
        self.install("org.example.a", ALICES)
        listener = self.watch()
        away = self.system.folder / "away"
        away.mkdir()
        swap(self.system.real("/home/alice"), away)
        self.assert_announced(listener)

    def test_a_users_flatpak_that_is_uninstalled_is_removed(self):
        deployed = self.install("org.example.a", "/home/alice/.local/share/flatpak/app/org.example.a/export")
        exported = self.system.real(f"{ALICES_FLATPAKS}/org.example.a.desktop")
        exported.parent.mkdir(parents=True)
        exported.symlink_to(os.path.relpath(deployed, exported.parent))
        listener = self.watch()
        self.is_seen("org.example.a")
        shutil.rmtree(self.system.real("/home/alice/.local/share/flatpak/app"))
        exported.unlink()
        self.assert_announced(listener, "org.example.a")

    def test_the_applications_of_a_user_who_is_gone_are_removed(self):
        self.install("org.example.a", ALICES)
        listener = self.watch()
        shutil.rmtree(self.system.real("/home/alice"))
        self.assert_announced(listener, "org.example.a")

    def test_a_removal_without_a_bus_is_announced_when_there_is_one(self):
        path = self.install("org.example.a")
        relay = self.relay(None)
        relay.wait_for_line("watching for the removal of applications")
        path.unlink()
        relay.wait_for_line('application "org.example.a" was removed')
        # It announces as soon as it owns its name; whoever wants to hear that has to be there before.
        relay.pause()
        listener = self.listener(self.bus())
        relay.resume()
        self.assertEqual(listener.wait_for_signals(1), [self.removed("org.example.a")])

    def test_typhonctl_shows_what_the_registry_knows(self):
        self.install("org.example.a")
        self.install("org.example.a", ALICES)
        self.install("org.example.b", ALICES, "X-Typhon-Placeholder=true\n")
        known = json.loads(self.system.ctl("--json", "applications").stdout)
        alices = str(self.system.real("/home/alice/.local/share"))
        self.assertEqual(known, {
            "org.example.a": {"placeholder": False, "directory": str(self.system.real("/usr/share"))},
            "org.example.b": {"placeholder": True, "directory": alices}})
        table = self.system.ctl("applications").stdout.decode().splitlines()
        self.assertEqual([line.split()[:3] for line in table[1:]],
                         [["org.example.a", "-", "installed"], ["org.example.b", "-", "placeholder"]])


class TheDaemon(OnABus):
    def test_without_a_bus_it_runs_and_says_so_once(self):
        self.system.start()
        self.system.daemon.wait_for_line("no system bus at")
        self.assertEqual(len(self.system.daemon.lines_with("system bus")), 1)
        self.assertIsNotNone(self.system.ctl("checkin"))

    def test_a_reported_change_is_announced_to_the_whole_system(self):
        bus = self.system.start_bus()
        listener = self.listener(bus)
        self.system.sign(os.path.realpath(sys.executable), "org.example.foundry", ["system-installation"])
        self.system.start()
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        client.checkin()
        client.call("TyphonProtocol", "fontChanged_reply", GLib.Variant("(a{sv})", ({},)))
        self.assertEqual(listener.wait_for_signals(1), [(PING, ("FontProviderDidChangeDistributedNotification",))])


if __name__ == "__main__":
    unittest.main()
