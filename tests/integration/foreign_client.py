"""A client of typhond that shares no code with it: Python's GObject bindings. Also a program of its own, so that
tests can run it in other processes and namespaces: foreign_client.py ROOT COMMAND [ARGUMENT]..., one JSON answer."""

import base64
import json
import mmap
import os
import plistlib
import socket
import sys

import gi

gi.require_version("Gio", "2.0")
from gi.repository import Gio, GLib  # noqa: E402

PATH = "/com/vorlan/typhond"
SERVICE = "com.vorlan.typhond"
PREFIX = "com.vorlan.typhond."


class Client:
    def __init__(self, root, service=SERVICE):
        """Connects to a service of the system in `root`, over a socket path of any length."""
        self.connection = Gio.DBusConnection.new_sync(
            self._stream(f"{root}/run/typhon/{service}"), None,
            Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT, None, None)

    @staticmethod
    def _stream(path):
        plain = socket.socket(socket.AF_UNIX)
        directory = os.open(os.path.dirname(path), os.O_PATH)
        try:
            plain.connect(f"/proc/self/fd/{directory}/{os.path.basename(path)}")
        finally:
            os.close(directory)
        return Gio.Socket.new_from_fd(plain.detach()).connection_factory_create_connection()

    def close(self):
        if not self.connection.is_closed():
            self.connection.close_sync(None)

    def call(self, protocol, member, arguments=None, files=(), timeout=60000):
        """The reply's arguments as Python values, and its descriptors. Raises GLib.Error."""
        listed = Gio.UnixFDList()
        for file in files:
            listed.append(file)
        reply, received = self.connection.call_with_unix_fd_list_sync(
            None, PATH, PREFIX + protocol, member, arguments, None, Gio.DBusCallFlags.NONE, timeout,
            listed, None)
        return reply, received.steal_fds() if received is not None else []

    def checkin(self, member="checkin"):
        """The view as a dictionary (large values read from their memory files), or None."""
        reply, files = self.call("TyphonProtocol", member)
        views = reply.get_child_value(0)
        if views.n_children() == 0:
            return None
        view = views.get_child_value(0)
        result = {}
        for index in range(view.n_children()):
            pair = view.get_child_value(index)
            key = pair.get_child_value(0).get_string()
            value = pair.get_child_value(1).get_variant()
            if value.get_type_string() == "h":
                result[key] = read_memory_file(files[value.get_handle()])
                result.setdefault("(memory files)", []).append(key)
            else:
                result[key] = plain(value)
        for file in files:
            os.close(file)
        return result

    def open(self, token, path):
        """A descriptor of the file, through the file-access broker's connection."""
        arguments = GLib.Variant("(ays)", (list(token), path))
        _, files = self.call("FileAccess", "open", arguments)
        return files[0]


def plain(value):
    """A variant as Python values; byte arrays as bytes."""
    kind = value.get_type_string()
    if kind == "ay":
        return bytes(value.unpack())
    if kind == "v":
        return plain(value.get_variant())
    if kind.startswith("a{"):
        pairs = (value.get_child_value(index) for index in range(value.n_children()))
        return {pair.get_child_value(0).get_string(): plain(pair.get_child_value(1)) for pair in pairs}
    if kind.startswith("a"):
        return [plain(value.get_child_value(index)) for index in range(value.n_children())]
    return value.unpack()


def read_memory_file(descriptor):
    with mmap.mmap(descriptor, 0, prot=mmap.PROT_READ) as view:
        return plistlib.loads(view[:], fmt=plistlib.FMT_BINARY)


def error_name(error):
    """The D-Bus error name of a GLib.Error."""
    return Gio.DBusError.get_remote_error(error)


def answer_of(call):
    try:
        return call()
    except GLib.Error as error:
        return {"error": error_name(error) or error.message}


def run(root, command, *arguments):
    if command == "checkin":
        return Client(root).checkin(*arguments)
    if command == "open":
        token, path = arguments
        descriptor = Client(root, SERVICE + ".file-access").open(base64.b64decode(token), path)
        return {"content": os.read(descriptor, 1 << 20).decode("latin-1")}
    if command == "register-sandbox":
        sandbox = os.pidfd_open(int(arguments[0]))
        executable = os.open(arguments[1], os.O_RDONLY)
        Client(root, SERVICE + ".sandboxes").call(
            "Sandboxes", "register", GLib.Variant("(hh)", (0, 1)), [sandbox, executable])
        return {}
    raise SystemExit(f"no command {command}")


def encoded(value):
    return base64.b64encode(value).decode() if isinstance(value, bytes) else str(value)


if __name__ == "__main__":
    print(json.dumps(answer_of(lambda: run(*sys.argv[1:])), default=encoded))
