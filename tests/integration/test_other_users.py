"""Processes of several users. Only root can be several users: for anybody else this says so and counts as not run."""

import os
import pathlib
import shutil
import socket
import struct
import subprocess
import sys
import tempfile
import unittest

if os.geteuid() != 0:
    print("not run: it takes root to run processes of other users", file=sys.stderr)
    # As CMakeLists.txt says.
    sys.exit(77)

from hostile_clients import TYPHON, Hostile, aligned, message, text
from scratch_system import BIN, PATIENCE, SERVICE, ScratchSystem, entry

NOBODY = 65534
PERSON, OTHER_PERSON = 1234, 1235
AGENT_IDENTIFIER = "com.vorlan.FontInstallViewService"
REFUSAL = "the endpoint belongs to another user than its sender"


class AsUser:
    """A copy of this very process that belongs to somebody else, does something, and tells what came of it."""

    def __init__(self, user, work):
        self.ours, theirs = socket.socketpair()
        self.ours.settimeout(PATIENCE)
        self.pid = os.fork()
        if self.pid == 0:
            try:
                self.ours.close()
                os.setgroups([])
                os.setresgid(user, user, user)
                os.setresuid(user, user, user)
                theirs.settimeout(PATIENCE)
                with theirs:
                    work(theirs)
            finally:
                os._exit(0)
        theirs.close()

    def told(self):
        return self.ours.recv(64)

    def say(self):
        self.ours.send(b"\n")

    def end(self):
        self.ours.close()
        os.waitpid(self.pid, 0)


def listen(folder):
    """A listening socket and the endpoint through which it is reached."""
    directory = tempfile.mkdtemp(dir=folder)
    listening = socket.socket(socket.AF_UNIX)
    listening.bind(f"{directory}/s")
    os.chmod(f"{directory}/s", 0o666)
    endpoint = os.open(f"{directory}/s", os.O_PATH)
    listening.listen()
    listening.settimeout(PATIENCE)
    shutil.rmtree(directory)
    return listening, endpoint


def hand_over(path, endpoint):
    """The picker's call for that endpoint, and the boolean that answers it."""
    client = Hostile(path)
    body = aligned(text("Face"), 4) + struct.pack("<I", 0)
    client.send(message(TYPHON, "requestFonts_forClient_reply", "sh", body, descriptors=1), [endpoint])
    received = b""
    with client.socket:
        while len(received) < 16 or len(received) < 20 + (struct.unpack_from("<I", received, 12)[0] + 7) // 8 * 8:
            more = client.socket.recv(4096)
            if not more:
                return "the connection ended"
            received += more
    return struct.unpack("<I", received[-4:])[0] == 1 if received[1] == 2 else "an error"


class OtherUsers(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.system.folder.chmod(0o711)
        self.system.write_registry({self.system.font_file("org.example.foundry", "a.ttf"): entry("Face", "Family")})
        self.system.sign(os.path.realpath(sys.executable), "com.vorlan.Panekit.FontPicker")
        self.daemon = self.system.start()
        self.socket = str(self.system.socket_path(SERVICE))
        self.common = pathlib.Path(tempfile.mkdtemp(prefix="typhon-test-"))
        self.addCleanup(shutil.rmtree, self.common)
        self.common.chmod(0o1777)

    def as_user(self, user, work):
        process = AsUser(user, work)
        self.addCleanup(process.end)
        return process

    # -- endpoints

    def accept_and_tell(self, ours):
        """Listens, sends the endpoint, and tells how many bytes came of the first connection to it."""
        listening, endpoint = listen(self.common)
        socket.send_fds(ours, [b"\n"], [endpoint])
        with listening, listening.accept()[0] as connection:
            connection.settimeout(PATIENCE)
            ours.send(b"%d" % len(connection.recv(64)))

    def test_an_endpoint_of_another_user_is_not_spoken_to(self):
        listener = self.as_user(NOBODY, self.accept_and_tell)
        endpoint = socket.recv_fds(listener.ours, 1, 1)[1][0]
        self.addCleanup(os.close, endpoint)
        self.assertIs(hand_over(self.socket, endpoint), False)
        self.daemon.wait_for_line(REFUSAL)
        self.assertEqual(listener.told(), b"0")

    def test_an_endpoint_of_roots_is_not_spoken_to_for_somebody_else(self):
        listening, endpoint = listen(self.common)
        self.addCleanup(listening.close)
        self.addCleanup(os.close, endpoint)
        picker = self.as_user(NOBODY, lambda ours: ours.send(str(hand_over(self.socket, endpoint)).encode()))
        self.assertEqual(picker.told(), b"False")
        self.daemon.wait_for_line(REFUSAL)
        with listening.accept()[0] as connection:
            connection.settimeout(PATIENCE)
            self.assertEqual(connection.recv(64), b"")

    def test_an_endpoint_of_the_same_user_is_spoken_to_whoever_that_is(self):
        """So that the others are refused for their users, and for nothing else."""
        def both(ours):
            listening, endpoint = listen(self.common)
            if os.fork() == 0:
                try:
                    hand_over(self.socket, endpoint)
                finally:
                    os._exit(0)
            with listening, listening.accept()[0] as connection:
                connection.settimeout(PATIENCE)
                # The daemon plays the server: it speaks when it is spoken to.
                connection.sendall(b"\0AUTH ANONYMOUS 61\r\n")
                ours.send(connection.recv(64)[:2])
        self.assertEqual(self.as_user(NOBODY, both).told(), b"OK")
        self.assertEqual(self.daemon.lines_with(REFUSAL), [])

    # -- session agents

    def agent(self, user, *options):
        program = self.system.folder / "agent"
        if not program.exists():
            shutil.copy(BIN / "typhon-agent", program)
            self.system.sign(program, AGENT_IDENTIFIER)
        command = ["setpriv", f"--reuid={user}", f"--regid={user}", "--clear-groups", program, "--root",
                   self.system.root, "--answer", "none", *options]
        return subprocess.Popen([str(word) for word in command], stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                                stderr=subprocess.STDOUT, text=True)

    def test_a_user_who_is_no_person_has_no_agent(self):
        agent = self.agent(NOBODY)
        text, _ = agent.communicate(timeout=PATIENCE)
        self.assertEqual(agent.returncode, 1, text)
        self.assertIn("may not register as the session agent", self.daemon.wait_for_line("may not register"))

    def test_a_person_has_an_agent_and_keeps_it_from_others(self):
        first = self.agent(PERSON)
        self.addCleanup(first.stdout.close)
        self.addCleanup(first.wait)
        self.addCleanup(first.kill)
        self.assertIn("waiting for applications", first.stdout.readline())
        second = self.agent(OTHER_PERSON)
        text, _ = second.communicate(timeout=PATIENCE)
        self.assertEqual(second.returncode, 1, text)
        self.assertIn("is the session agent already", text)


if __name__ == "__main__":
    unittest.main()
