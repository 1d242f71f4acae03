"""A sandboxed program is who its launcher said it is, and nobody when no launcher said anything."""

import json
import os
import pathlib
import shutil
import subprocess
import sys
import unittest

from scratch_system import BIN, FONT_FILES, ScratchSystem, entry

HERE = pathlib.Path(__file__).parent
PATH = f"{FONT_FILES}/org.example.foundry/a.ttf"
BARE_SANDBOX = ["bwrap", "--ro-bind", "/", "/", "--dev", "/dev", "--proc", "/proc", "--unshare-user",
                "--unshare-pid", "--die-with-parent", "--"]


class Sandboxes(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.system.write_registry({PATH: entry("A", "A")})
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.system.start()

    def output(self, *command):
        done = subprocess.run([str(part) for part in command], capture_output=True, text=True, timeout=60,
                              stdin=subprocess.DEVNULL)
        self.assertEqual(done.returncode, 0, done.stderr)
        return json.loads(done.stdout)

    def checkin_command(self, program):
        return [program, "--root", self.system.root, "--json", "checkin"]

    def launcher(self, *options):
        return [BIN / "typhonctl", "--root", self.system.root, "run", *options, "--"]

    def test_a_registered_sandbox_has_the_identity_of_its_executable(self):
        view = self.output(*self.launcher(), *self.checkin_command(self.viewer))
        self.assertEqual(set(view["fontsInfo"]), {PATH})

    def test_a_sandbox_that_nobody_registered_is_nobody(self):
        self.assertIsNone(self.output(*BARE_SANDBOX, *self.checkin_command(self.viewer)))

    def test_a_process_namespace_below_a_registered_sandbox_inherits_its_identity(self):
        nested = ["unshare", "--user", "--pid", "--fork"]
        program = self.runner()
        view = self.output(*self.launcher("--bind", self.system.folder, self.system.folder),
                           program, *nested, *self.checkin_command(self.viewer))
        self.assertEqual(set(view["fontsInfo"]), {PATH})

    def test_what_a_sandbox_runs_later_keeps_the_identity_of_the_sandbox(self):
        program = self.runner()
        plain = self.system.program("org.example.plain")
        view = self.output(*self.launcher(), program, *self.checkin_command(plain))
        self.assertEqual(set(view["fontsInfo"]), {PATH})

    def runner(self):
        """A signed program that runs its arguments: env, under a content of its own."""
        path = self.system.folder / "runs-its-arguments"
        shutil.copy(os.path.realpath("/usr/bin/env"), path)
        with path.open("ab") as file:
            file.write(b"\nruns its arguments")
        self.system.sign(path, "org.example.viewer", ["font-enumeration"])
        return path

    def test_a_sandboxed_process_cannot_register_a_sandbox(self):
        program = self.runner()
        for launcher in (self.launcher(), BARE_SANDBOX):
            answer = self.output(*launcher, program, sys.executable, "-B", HERE / "foreign_client.py",
                                 self.system.root, "register-sandbox", "1", self.viewer)
            self.assertEqual(answer, {"error": "org.freedesktop.DBus.Error.AccessDenied"})

    def test_a_process_outside_any_sandbox_is_no_sandbox(self):
        answer = self.output(sys.executable, "-B", HERE / "foreign_client.py", self.system.root,
                             "register-sandbox", str(os.getpid()), self.viewer)
        self.assertIn("error", answer)

    def test_a_forged_link_to_the_executable_is_not_believed(self):
        forged = [BIN / "forged-checkin", self.system.root, self.viewer]
        for own_namespace in (["unshare", "--user", "--map-root-user"], [*BARE_SANDBOX[:-1], "--cap-add", "ALL", "--"]):
            done = subprocess.run([str(part) for part in [*own_namespace, *forged]], capture_output=True,
                                  text=True, timeout=60, env={**os.environ, "ASAN_OPTIONS": "detect_leaks=0"})
            self.assertEqual((done.returncode, done.stdout), (0, f"{self.viewer}\nno share\n"), done.stderr)

    def test_an_unsigned_program_runs_in_a_sandbox_without_identity(self):
        self.assertIsNone(self.output(*self.launcher(), *self.checkin_command(self.system.program())))

    def test_the_launcher_passes_streams_status_and_binds(self):
        source = self.system.folder / "source"
        source.mkdir()
        (source / "file").write_text("bound")
        done = subprocess.run(
            [str(part) for part in [*self.launcher("--bind", source, "/no/such/place"), "/bin/sh", "-c",
                                    "cat; cat /no/such/place/file; exit 7"]],
            input=b"from stdin ", capture_output=True, timeout=60)
        self.assertEqual((done.returncode, done.stdout), (7, b"from stdin bound"), done.stderr)

    def test_the_host_is_read_only_inside(self):
        target = self.system.folder / "written"
        done = subprocess.run([str(part) for part in [*self.launcher(), "/bin/touch", target]],
                              capture_output=True, timeout=60)
        self.assertNotEqual(done.returncode, 0)
        self.assertFalse(target.exists())


if __name__ == "__main__":
    unittest.main()
