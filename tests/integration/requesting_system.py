"""A system in which applications ask for fonts that they lack, with a user at a terminal."""

import json
import pathlib
import plistlib
import shutil
import unittest

from scratch_system import BIN, FONT_FILES, REGISTRY, ScratchSystem, eventually
from terminals import TerminalProgram

DEJAVU = pathlib.Path("/usr/share/fonts/truetype/dejavu")
SANS, SERIF = DEJAVU / "DejaVuSans.ttf", DEJAVU / "DejaVuSerif.ttf"
FOUNDRY, OTHER = "org.example.foundry", "org.example.otherfoundry"
SANS_PATH = f"{FONT_FILES}/{FOUNDRY}/DejaVuSans.ttf"
SERIF_PATH = f"{FONT_FILES}/{FOUNDRY}/DejaVuSerif.ttf"
OTHER_SERIF_PATH = f"{FONT_FILES}/{OTHER}/DejaVuSerif.ttf"
AGENT_IDENTIFIER = "com.vorlan.FontInstallViewService"


class RequestingSystem(unittest.TestCase):
    """Two providers have installed the same family, which is switched off, and one of them another that is on."""

    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        for identifier in (FOUNDRY, OTHER, "org.example.writer"):
            self.system.install_application(identifier)
        self.writer = self.system.program("org.example.writer", ["app-usage"])
        self.system.start()
        self.system.ctl("fonts", "install", "--identifier", FOUNDRY, SANS, SERIF)
        self.system.ctl("fonts", "install", "--identifier", OTHER, SERIF)
        self.system.ctl("fonts", "disable", SERIF_PATH, OTHER_SERIF_PATH)

    # -- programs

    def agent_program(self, identifier=AGENT_IDENTIFIER):
        path = self.system.folder / f"agent-{identifier}"
        if not path.exists():
            shutil.copy(BIN / "typhon-agent", path)
            with path.open("ab") as file:
                file.write(f"\nof {self.system.folder} {identifier}".encode())
            if identifier:
                self.system.sign(path, identifier)
        return path

    def in_terminal(self, *command, **options):
        program = TerminalProgram(*command, **options)
        self.addCleanup(program.close)
        return program

    def start_agent(self, *options, **terminal):
        agent = self.in_terminal(self.agent_program(), "--root", self.system.root, *options, **terminal)
        agent.wait_for("waiting for applications")
        return agent

    def sandboxed(self, *words):
        return [BIN / "typhonctl", "--root", self.system.root, "run", "--", self.writer, "--root",
                self.system.root, *words]

    def ready_shell(self, script, *arguments):
        """A shell on a terminal of its own, which goes on at a line from the keyboard."""
        shell = self.in_terminal("/bin/bash", "-c", f"echo ready; read line; {script}", "shell", *arguments)
        shell.wait_for("ready")
        return shell

    def ask(self, *names, agent=True):
        """A sandboxed application in the foreground of a terminal that asks for fonts."""
        shell = self.ready_shell('exec "$@"', *self.sandboxed("--json", "request", *names))
        if agent:
            self.system.daemon.wait_for_line(f"shows terminal {shell.number}")
        shell.send(b"\n")
        return shell

    def given(self, application):
        """The fonts that it was given in the end, by path."""
        self.assertEqual(application.wait(), 0, application.text())
        eventually(lambda: self.fonts_in(application.plain_text()) is not None)
        return self.fonts_in(application.plain_text())

    @staticmethod
    def fonts_in(text):
        """What was written as JSON, or None while only a part of it has come."""
        try:
            return json.loads(text[text.index("{"):text.rindex("}") + 1])
        except ValueError:
            return None

    def registry(self):
        return plistlib.loads(self.system.real(REGISTRY).read_bytes())
