"""A web-content process that shares no code with typhond: foreign_content.py ROOT SOCKET MODE FONT.

Makes an endpoint, sends it over the inherited SOCKET, and serves the daemon there. MODE: "answer"; "silent" answers
nothing; "deaf" answers the ping only; "die" ends at the ping. Says what happens as JSON lines on standard output."""

import json
import os
import socket
import sys
import tempfile

import gi

gi.require_version("Gio", "2.0")
from gi.repository import Gio, GLib  # noqa: E402

import foreign_client  # noqa: E402

INTERFACE = Gio.DBusNodeInfo.new_for_xml(
    '<node><interface name="com.vorlan.typhond.TyphonSilkpageSupportServerProtocol"><method name="ping"/>'
    '<method name="userInstalledFontsInfo_reply"><arg type="aa{sv}" direction="in"/></method>'
    '</interface></node>').interfaces[0]


def say(**what):
    print(json.dumps(what, default=foreign_client.encoded), flush=True)


def listen():
    """A listening socket that nobody finds, and the endpoint through which it is reached."""
    directory = tempfile.mkdtemp()
    path = f"{directory}/s"
    listening = socket.socket(socket.AF_UNIX)
    listening.bind(path)
    os.chmod(path, 0o666)
    endpoint = os.open(path, os.O_PATH)
    listening.listen()
    os.unlink(path)
    os.rmdir(directory)
    return listening, endpoint


class Content:
    def __init__(self, root, mode, font):
        self.root, self.mode, self.font = root, mode, font
        self.loop = GLib.MainLoop()

    def serve(self, connected):
        stream = Gio.Socket.new_from_fd(connected.detach()).connection_factory_create_connection()
        flags = Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT | Gio.DBusConnectionFlags.DELAY_MESSAGE_PROCESSING
        connection = Gio.DBusConnection.new_sync(stream, None, flags, None, None)
        connection.register_object(foreign_client.PATH, INTERFACE, self.called)
        connection.set_exit_on_close(False)
        connection.connect("closed", lambda *_: self.loop.quit())
        connection.start_message_processing()
        self.loop.run()
        say(closed=True)

    def called(self, connection, sender, path, interface, member, arguments, call):
        if member == "ping":
            say(pinged=True)
            if self.mode == "die":
                os._exit(0)
            if self.mode != "silent":
                call.return_value(None)
            return
        views = foreign_client.plain(arguments.get_child_value(0))
        say(info=views[0] if views else None)
        if views and self.font:
            self.read(views[0])
        if self.mode == "answer":
            call.return_value(None)

    def read(self, info):
        broker = foreign_client.Client(self.root, foreign_client.SERVICE + ".file-access")
        descriptor = broker.open(info["extension"], self.font)
        say(read=os.read(descriptor, 1000).decode())


def main(root, descriptor, mode, font):
    listening, endpoint = listen()
    with socket.socket(fileno=int(descriptor)) as host:
        socket.send_fds(host, [b"\0"], [endpoint])
    Content(root, mode, font).serve(listening.accept()[0])


if __name__ == "__main__":
    main(*sys.argv[1:])
