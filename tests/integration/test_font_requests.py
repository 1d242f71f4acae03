"""Applications that ask for fonts that they lack, with the user at a terminal."""

import json
import shutil
import signal
import subprocess
import unittest

from requesting_system import FOUNDRY, OTHER, OTHER_SERIF_PATH, SANS_PATH, SERIF, SERIF_PATH, RequestingSystem
from scratch_system import BIN, eventually
from terminals import DOWN, ENTER, ESCAPE, RIGHT

ASKED = ["--family", "DejaVu Sans", "--family", "DejaVu Serif", "--family", "Nowhere Sans"]
BACKGROUND = "tried to show missing fonts dialog in the background"


class Requests(RequestingSystem):
    # -- the whole request

    def test_a_document_gets_a_font_that_the_user_switches_on_and_keeps_it(self):
        counts = {"org.example.writer": {"requests": 1, "misses": 1, "suggestions": 1, "resolved": 1}}
        agent = self.start_agent()
        application = self.ask(*ASKED)
        agent.wait_for("Enter: done")
        shown = agent.plain_text()
        self.assertIn("2 missing fonts", shown)
        self.assertIn("Nowhere Sans", shown)
        self.assertIn("not available", shown)
        self.assertIn("> DejaVu Serif", shown)
        self.assertNotIn("DejaVu Sans ", shown)
        # Off, then the providers by name: the second one.
        agent.send(RIGHT)
        seen = agent.wait_for(f"< {FOUNDRY} ")
        agent.send(RIGHT)
        agent.wait_for(f"< {OTHER} ", seen)
        agent.send(ENTER)
        agent.wait_for("answered, 1 to switch on")
        self.assertTrue(agent.is_as_before())

        fonts = self.given(application)
        self.assertEqual(set(fonts), {SANS_PATH, OTHER_SERIF_PATH})
        self.assertTrue(all("data" in font for font in fonts.values()))
        # Switched on and recorded once the application has its answer.
        eventually(lambda: OTHER_SERIF_PATH in self.system.checkin(self.writer, sandboxed=True)["fontsInfo"])
        self.assertFalse(self.registry()[OTHER_SERIF_PATH]["disabled"])
        self.assertTrue(self.registry()[SERIF_PATH]["disabled"])
        eventually(lambda: self.counts() == counts)

        for _ in range(2):
            read = subprocess.run([str(word) for word in self.sandboxed("open", OTHER_SERIF_PATH)],
                                  capture_output=True, timeout=60, stdin=subprocess.DEVNULL)
            self.assertEqual(read.stdout, SERIF.read_bytes(), read.stderr)
            self.system.restart()

        self.assertEqual(self.counts(), counts)
        preferences = self.system.preferences()
        self.assertEqual((preferences["missed"], preferences["resolved"]), (1, 1))

    def counts(self):
        return json.loads(self.system.ctl("--json", "analytics").stdout)

    def test_the_same_process_reads_what_it_was_given_through_its_tokens(self):
        sample = self.system.folder / "sample"
        shutil.copy(BIN / "samples/org.example.writer", sample)
        self.system.sign(sample, "org.example.writer", ["app-usage"])
        self.start_agent("--answer", "first")
        shell = self.ready_shell('TYPHON_ROOT="$1" exec "${@:2}"', self.system.root, BIN / "typhonctl", "run",
                                 "--", sample, "request", *ASKED)
        self.system.daemon.wait_for_line(f"shows terminal {shell.number}")
        shell.send(b"\n")
        shell.wait_for("read 2 of them")
        self.assertEqual(shell.wait(), 0)

    # -- the dialog

    def test_escape_leaves_all_fonts_off(self):
        agent = self.start_agent()
        application = self.ask(*ASKED)
        agent.wait_for("Enter: done")
        agent.send(RIGHT)
        agent.wait_for(f"< {FOUNDRY}")
        agent.send(ESCAPE)
        self.assertEqual(set(self.given(application)), {SANS_PATH})
        self.assertTrue(self.registry()[SERIF_PATH]["disabled"])

    def test_hostile_names_do_not_reach_the_terminal(self):
        agent = self.start_agent(columns=60, lines=12)
        application = self.ask("--family", "\x1b[31mred\x07", "--family", "x" * 100_000)
        agent.wait_for("Enter: done")
        self.assertIn("\\x1B[31mred\\x07", agent.text())
        self.assertNotIn("\x1b[31m", agent.text())
        self.assertIn("xxx...", agent.text())
        agent.send(ENTER)
        self.assertEqual(self.given(application), {})

    def test_the_terminal_is_given_back_when_the_agent_is_told_to_end(self):
        for number, status in ((signal.SIGTERM, 128 + signal.SIGTERM), (signal.SIGABRT, -signal.SIGABRT)):
            with self.subTest(signal=number):
                agent = self.start_agent()
                application = self.ask("--family", "DejaVu Serif")
                agent.wait_for("Enter: done")
                self.assertFalse(agent.is_as_before())
                agent.signal(number)
                self.assertEqual(agent.wait(), status)
                self.assertTrue(agent.is_as_before())
                eventually(lambda: "\x1b[?1049l" in agent.text())
                # The next one is refused until the daemon knows that this one is gone.
                self.system.daemon.wait_for_line(f"the session agent, process {agent.process.pid}, is gone")
                if number == signal.SIGTERM:
                    # It has declined; a crash leaves the dialog to the next agent.
                    self.assertEqual(self.given(application), {})

    def test_the_dialog_of_an_agent_that_was_killed_is_shown_by_the_next(self):
        agent = self.start_agent()
        application = self.ask("--family", "DejaVu Serif")
        agent.wait_for("Enter: done")
        agent.signal(signal.SIGKILL)
        self.system.daemon.wait_for_line("the session agent is gone while a dialog was up")
        self.assertIsNone(application.process.poll())
        agent = self.start_agent()
        agent.wait_for("> DejaVu Serif")
        agent.send(RIGHT + ENTER)
        self.assertEqual(set(self.given(application)), {SERIF_PATH})

    def test_requests_are_shown_one_after_another(self):
        agent = self.start_agent()
        first = self.ask("--family", "First Unknown")
        seen = agent.wait_for("First Unknown")
        second = self.ask("--family", "Second Unknown")
        self.system.daemon.wait_for_line("is blocked until the previous call is acknowledged by the user")
        self.assertNotIn("Second Unknown", agent.text())
        agent.send(ENTER)
        self.assertEqual(self.given(first), {})
        agent.wait_for("Second Unknown", seen)
        agent.send(ENTER)
        self.assertEqual(self.given(second), {})

    # -- who is asked, and about whom

    def test_without_an_agent_an_application_gets_what_is_switched_on(self):
        self.assertEqual(set(self.given(self.ask(*ASKED, agent=False))), {SANS_PATH})
        self.system.daemon.wait_for_line(BACKGROUND)

    def test_an_application_in_the_background_shows_no_dialog(self):
        agent = self.start_agent()
        shell = self.ready_shell('set -m; "$@" & wait', *self.sandboxed("--json", "request", *ASKED))
        self.system.daemon.wait_for_line(f"shows terminal {shell.number}")
        shell.send(b"\n")
        self.assertEqual(set(self.given(shell)), {SANS_PATH})
        self.system.daemon.wait_for_line(BACKGROUND)
        self.assertNotIn("Enter: done", agent.text())

    def test_only_a_signed_program_outside_of_sandboxes_becomes_the_agent(self):
        refused = {
            "sandboxed": [BIN / "typhonctl", "--root", self.system.root, "run", "--", self.agent_program()],
            "of another identifier": [self.agent_program("org.example.writer")],
            "not signed": [self.agent_program("")],
        }
        for what, command in refused.items():
            with self.subTest(what):
                done = subprocess.run([str(word) for word in [*command, "--root", self.system.root, "--answer",
                                                              "none"]],
                                      capture_output=True, text=True, timeout=60, stdin=subprocess.DEVNULL)
                self.assertEqual(done.returncode, 1)
                self.assertIn("a session agent", done.stderr)
        self.assertEqual(len(self.system.daemon.lines_with("may not register as the session agent")), 3)

    def test_there_is_one_agent_at_a_time(self):
        self.start_agent()
        done = subprocess.run([str(self.agent_program()), "--root", str(self.system.root), "--answer", "none"],
                              capture_output=True, text=True, timeout=60, stdin=subprocess.DEVNULL)
        self.assertEqual(done.returncode, 1)
        self.assertIn("is the session agent already", done.stderr)

    def test_the_agent_finds_a_daemon_that_was_restarted(self):
        agent = self.start_agent()
        self.system.restart()
        agent.wait_for("typhond is back")
        application = self.ask("--family", "DejaVu Serif")
        agent.wait_for("> DejaVu Serif")
        agent.send(DOWN + RIGHT + ENTER)
        self.assertEqual(set(self.given(application)), {SERIF_PATH})

    def test_typhonctl_agent_becomes_the_agent_beside_it(self):
        folder = self.system.folder / "bin"
        folder.mkdir()
        shutil.copy(self.agent_program(), folder / "typhon-agent")
        shutil.copy(BIN / "typhonctl", folder / "typhonctl")
        agent = self.in_terminal(folder / "typhonctl", "--root", self.system.root, "agent")
        agent.wait_for("waiting for applications")

    def test_an_agent_needs_a_terminal_to_ask(self):
        done = subprocess.run([str(self.agent_program()), "--root", str(self.system.root)], capture_output=True,
                              text=True, timeout=60, stdin=subprocess.DEVNULL)
        self.assertEqual(done.returncode, 2)
        self.assertIn("not a terminal", done.stderr)


if __name__ == "__main__":
    unittest.main()
