"""The system bus of a scratch system, the relay on it, and foreign processes."""

import os
import pathlib
import signal
import subprocess
import threading

from gi.repository import Gio, GLib

from scratch_system import BIN, PATIENCE, eventually

SCRATCH_BUS = pathlib.Path(__file__).resolve().parents[2] / "packaging" / "scratch-bus"
SOCKET = "/run/dbus/system_bus_socket"
PING = "com.vorlan.pingd"
RELAY = "com.vorlan.relayd"


def path_of(service):
    return "/" + service.replace(".", "/")


class Bus:
    """A running bus; `user` plays the services' user."""

    def __init__(self, system, user=None):
        system.root.mkdir(exist_ok=True)
        self.address = f"unix:path={system.real(SOCKET)}"
        self._process = subprocess.Popen([str(SCRATCH_BUS), str(system.root), *([user] if user else [])],
                                         stdin=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        eventually(self._answers)

    def _answers(self):
        if self._process.poll() is not None:
            raise AssertionError("the bus ended")
        try:
            Peer(self).close()
        except GLib.Error:
            return False
        return True

    def stop(self):
        self._process.send_signal(signal.SIGTERM)
        self._process.wait(PATIENCE)


class Relay:
    """A running typhon-relayd and what it logs."""

    def __init__(self, system, window=0.5):
        self._process = subprocess.Popen(
            [str(BIN / "typhon-relayd"), "--root", str(system.root), "--log-level", "debug", "--removal-window",
             str(window)], stdin=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True)
        self.lines = []
        self._reader = threading.Thread(target=self._read, daemon=True)
        self._reader.start()

    def _read(self):
        for line in self._process.stderr:
            self.lines.append(line.rstrip("\n"))

    def wait_for_line(self, text, count=1):
        eventually(lambda: sum(text in line for line in self.lines) >= count)

    def pause(self):
        self._process.send_signal(signal.SIGSTOP)

    def resume(self):
        self._process.send_signal(signal.SIGCONT)

    def stop(self):
        self._process.kill()
        self._process.wait(PATIENCE)
        self._reader.join(PATIENCE)
        self._process.stderr.close()


class Peer:
    """A process on the bus that knows nothing of typhon."""

    def __init__(self, bus):
        flags = Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION
        self.connection = Gio.DBusConnection.new_for_address_sync(bus.address, flags, None, None)
        self.connection.set_exit_on_close(False)
        self.name = self.connection.get_unique_name()
        self.signals = []

    def close(self):
        if not self.connection.is_closed():
            self.connection.close_sync(None)

    def call(self, service, path, interface, member, arguments=None, answer=None):
        return self.connection.call_sync(service, path, interface, member, arguments,
                                         GLib.VariantType(answer) if answer else None,
                                         Gio.DBusCallFlags.NO_AUTO_START, PATIENCE * 1000, None)

    def driver(self, member, arguments=None):
        return self.call("org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus", member, arguments)

    def own(self, name):
        return self.driver("RequestName", GLib.Variant("(su)", (name, 4))).unpack()[0]

    def release(self, name):
        self.driver("ReleaseName", GLib.Variant("(s)", (name,)))

    def owner_of(self, name):
        try:
            return self.driver("GetNameOwner", GLib.Variant("(s)", (name,))).unpack()[0]
        except GLib.Error:
            return None

    def post(self, service, arguments):
        self.call(service, path_of(service), service, "Post", arguments)

    def emit(self, service, arguments, destination=None):
        """Sends a signal as the announcing service would; returns when the bus has passed it on."""
        self.connection.emit_signal(destination, path_of(service), service, "Notification", arguments)
        self.driver("GetId")

    def listen(self, of_anybody=False):
        """Keeps every notification of the two services, or of whoever calls itself so, as (service, arguments)."""
        for service in (PING, RELAY):
            self.connection.signal_subscribe(None if of_anybody else service, service, "Notification",
                                             path_of(service), None, Gio.DBusSignalFlags.NONE, self._heard)
        # The bus is told so later, by another thread; what it answers after that, it knows.
        self.driver("GetId")

    def _heard(self, _connection, _sender, _path, interface, _member, arguments):
        self.signals.append((interface, arguments.unpack()))

    def heard(self):
        """All notifications that the bus has passed on until now."""
        self.driver("GetId")
        while GLib.MainContext.default().iteration(False):
            pass
        return self.signals

    def wait_for_signals(self, count):
        def arrived():
            GLib.MainContext.default().iteration(False)
            return len(self.signals) >= count
        eventually(arrived)
        return self.signals


def wait_for_relay(bus):
    peer = Peer(bus)
    eventually(lambda: peer.owner_of(PING) and peer.owner_of(RELAY))
    peer.close()


def error_name(error):
    return Gio.DBusError.get_remote_error(error)


def refusal_of(action):
    """The D-Bus error that the action fails with."""
    try:
        action()
    except GLib.Error as error:
        return error_name(error)
    raise AssertionError("it was not refused")


def another_user():
    """A user that this process does not run as."""
    return "daemon" if os.geteuid() == 0 else "root"
