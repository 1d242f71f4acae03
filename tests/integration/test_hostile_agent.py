"""A session agent that means no good: it is signed as one, and answers what it likes. This very process is the agent."""

import os
import socket
import sys
import unittest

from gi.repository import Gio, GLib

import foreign_client
from requesting_system import (AGENT_IDENTIFIER, FOUNDRY, OTHER, OTHER_SERIF_PATH, SANS_PATH, SERIF_PATH,
                               RequestingSystem)
from scratch_system import eventually

INTERFACE = Gio.DBusNodeInfo.new_for_xml(
    '<node><interface name="com.vorlan.typhond.SessionAgent"><method name="showAlert">'
    '<arg type="s" direction="in"/><arg type="s" direction="in"/><arg type="a{sv}" direction="in"/>'
    '<arg type="h" direction="in"/></method></interface></node>').interfaces[0]
ANSWERS = "FontInstallViewServiceProtocol"


def text(value):
    return GLib.Variant("s", value)


def choice(family, provider):
    return {"uniqueID": text(family), "installProvider": text(provider)}


class Agent:
    """Registers, and keeps the alerts that it is to show."""

    def __init__(self, root):
        self.client = foreign_client.Client(str(root), "com.vorlan.typhond.session-agent")
        self.client.connection.register_object(foreign_client.PATH, INTERFACE, self.called)
        self.client.call("SessionAgents", "register")
        self.alerts = []

    def add_terminal(self, descriptor):
        self.client.call("SessionAgents", "addTerminal", GLib.Variant("(h)", (0,)), [descriptor])

    def called(self, connection, sender, path, interface, member, arguments, call):
        files = call.get_message().get_unix_fd_list()
        self.alerts.append((arguments.unpack()[2], files.get(arguments.unpack()[3]), call))

    def next_alert(self):
        while not self.alerts:
            GLib.MainContext.default().iteration(True)
        return self.alerts.pop(0)


class Dialog:
    """A connection to the endpoint of an alert."""

    def __init__(self, endpoint):
        plain = socket.socket(socket.AF_UNIX)
        plain.connect(f"/proc/self/fd/{endpoint}")
        stream = Gio.Socket.new_from_fd(plain.detach()).connection_factory_create_connection()
        self.connection = Gio.DBusConnection.new_sync(
            stream, None, Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT, None, None)

    def answer(self, answers, signature="aa{sv}"):
        self.connection.call_sync(None, foreign_client.PATH, foreign_client.PREFIX + ANSWERS, "doneWithMissingFonts",
                                  GLib.Variant(f"({signature})", (answers,)), None, Gio.DBusCallFlags.NONE, 60000,
                                  None)


class HostileAgent(RequestingSystem):
    def setUp(self):
        super().setUp()
        self.system.sign(os.path.realpath(sys.executable), AGENT_IDENTIFIER)
        self.agent = Agent(self.system.root)
        self.addCleanup(self.agent.client.close)

    def dialog_of(self, *names):
        """An application that asks for the names, and the dialog that it waits for."""
        shell = self.ready_shell('exec "$@"', *self.sandboxed("--json", "request", *names))
        self.agent.add_terminal(shell.theirs)
        shell.send(b"\n")
        _, endpoint, call = self.agent.next_alert()
        self.addCleanup(os.close, endpoint)
        dialog = Dialog(endpoint)
        self.addCleanup(lambda: dialog.connection.is_closed() or dialog.connection.close_sync(None))
        return shell, dialog, call

    def test_answers_that_fit_nothing_switch_nothing_on(self):
        application, dialog, call = self.dialog_of("--family", "DejaVu Sans", "--family", "DejaVu Serif")
        dialog.answer([choice("Nowhere", FOUNDRY), choice("DejaVu Serif", "org.example.writer"),
                       choice("DejaVu Serif", f"../{FOUNDRY}"), choice("dejavu serif", FOUNDRY),
                       {"uniqueID": text("DejaVu Serif")}, {"installProvider": text(FOUNDRY)}, {},
                       {"uniqueID": GLib.Variant("as", ["DejaVu Serif"]), "installProvider": text(FOUNDRY)},
                       {"uniqueID": GLib.Variant("x", 7), "installProvider": GLib.Variant("b", True)},
                       choice("x" * (1 << 20), "y" * (1 << 20))] + [choice("Nowhere", FOUNDRY)] * 10_000)
        call.return_value(None)
        self.assertEqual(set(self.given(application)), {SANS_PATH})
        registry = self.registry()
        self.assertTrue(registry[SERIF_PATH]["disabled"])
        self.assertTrue(registry[OTHER_SERIF_PATH]["disabled"])

    def test_of_repeated_answers_the_last_counts_and_a_second_call_replies_no_more(self):
        application, dialog, call = self.dialog_of("--family", "DejaVu Serif")
        dialog.answer([choice("DejaVu Serif", FOUNDRY), choice("DejaVu Serif", OTHER)])
        dialog.answer([choice("DejaVu Serif", OTHER)])
        call.return_value(None)
        self.assertEqual(set(self.given(application)), {OTHER_SERIF_PATH})
        eventually(lambda: not self.registry()[OTHER_SERIF_PATH]["disabled"])
        self.assertTrue(self.registry()[SERIF_PATH]["disabled"])

    def test_an_answer_of_another_type_is_refused_and_the_dialog_stays(self):
        application, dialog, call = self.dialog_of("--family", "DejaVu Serif")
        with self.assertRaises(GLib.Error) as caught:
            dialog.answer(["DejaVu Serif"], "as")
        self.assertEqual(foreign_client.error_name(caught.exception), "org.freedesktop.DBus.Error.InvalidArgs")
        self.assertIsNone(application.process.poll())
        dialog.answer([])
        call.return_value(None)
        self.assertEqual(self.given(application), {})


if __name__ == "__main__":
    unittest.main()
