"""The font-registry library with real processes: who may install fonts, and what others see of it."""

import concurrent.futures
import os
import pathlib
import plistlib
import select
import shutil
import signal
import subprocess
import unittest

from scratch_system import BIN, FONT_FILES, HELPER_SERVICE, PATIENCE, REGISTRY, ScratchSystem, eventually

DEJAVU = pathlib.Path("/usr/share/fonts/truetype/dejavu")
SANS = DEJAVU / "DejaVuSans.ttf"
BOLD = DEJAVU / "DejaVuSans-Bold.ttf"
PROVIDER = "system-installation"
PROVIDERS = ("foundry", "other", "a", *range(6))


def registry_of(system):
    path = system.real(REGISTRY)
    return plistlib.loads(path.read_bytes()) if path.exists() else {}


def state_of(pid):
    """The letter that the kernel gives a process's state."""
    return pathlib.Path(f"/proc/{pid}/stat").read_text().rpartition(")")[2].split()[0]


class FontRegistry(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        for provider in PROVIDERS:
            # Else the daemon would take them for removed applications, if it comes to look for those late.
            self.system.install_application(f"org.example.{provider}")
        self.system.start()

    def sandboxed(self, program, *words, check=True):
        return self.system.ctl("run", "--", program, *words, check=check)

    def test_a_provider_in_a_sandbox_installs_a_font_that_others_see(self):
        sample = self.system.folder / "foundry"
        sample.write_bytes((BIN / "samples/org.example.foundry").read_bytes())
        sample.chmod(0o755)
        self.system.sign(sample, "org.example.foundry", [PROVIDER])
        viewer = self.system.program("org.example.viewer", ["font-enumeration"])

        done = self.sandboxed(sample, "install", SANS)
        path = f"{FONT_FILES}/org.example.foundry/DejaVuSans.ttf"
        self.assertIn(path, done.stdout.decode())
        self.assertEqual(registry_of(self.system)[path],
                         {"familyName": {"DejaVuSans": "DejaVu Sans"}, "disabled": False})
        self.assertIn(path, self.system.checkin(viewer, sandboxed=True)["fontsInfo"])
        contents = self.sandboxed(viewer, "--root", self.system.root, "open", path).stdout
        self.assertEqual(contents, SANS.read_bytes())

        self.assertIn("removed 1", self.sandboxed(sample, "remove").stdout.decode())
        self.assertEqual(registry_of(self.system), {})
        self.assertEqual(list(self.system.real(FONT_FILES).iterdir()), [])

    def test_a_provider_touches_its_own_fonts_only(self):
        self.system.ctl("fonts", "install", "--identifier", "org.example.other", SANS)
        before = registry_of(self.system)
        path = next(iter(before))
        program = self.system.program("org.example.foundry", [PROVIDER])
        for words in (["install", "--identifier", "org.example.other", BOLD], ["remove", path],
                      ["remove", "--identifier", "org.example.other", "--all"], ["disable", path],
                      ["remove", f"{FONT_FILES}/org.example.foundry/../org.example.other/DejaVuSans.ttf"],
                      ["remove", f"file://{FONT_FILES}/org.example.foundry/../org.example.other/DejaVuSans.ttf"]):
            done = self.sandboxed(program, "--root", self.system.root, "fonts", *words, check=False)
            self.assertEqual(done.returncode, 1, words)
            self.assertIn("AccessDenied", done.stderr.decode(), words)
        self.assertEqual(registry_of(self.system), before)

    def test_programs_that_are_no_providers_are_refused(self):
        programs = [self.system.program("org.example.viewer", ["font-enumeration"]),
                    self.system.program("org.example.plain", []), self.system.program()]
        for program in programs:
            for words in (["install", SANS], ["install", "--identifier", "org.example.viewer", SANS]):
                done = self.sandboxed(program, "--root", self.system.root, "fonts", *words, check=False)
                self.assertEqual(done.returncode, 1)
                self.assertIn("AccessDenied", done.stderr.decode())
        # Signed as an application it is no administrator outside of a sandbox either.
        done = self.system.ctl("fonts", "install", "--identifier", "org.example.a", SANS, program=programs[0],
                               check=False)
        self.assertIn("AccessDenied", done.stderr.decode())
        self.assertEqual(registry_of(self.system), {})

    def test_without_the_daemon_nobody_is_known_and_so_refused(self):
        self.system.daemon.kill()
        done = self.system.ctl("fonts", "install", "--identifier", "org.example.a", SANS, check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn("see to it that typhond runs", done.stderr.decode())

    def test_one_bad_file_keeps_all_of_them_out(self):
        bad = self.system.folder / "bad.ttf"
        bad.write_bytes(os.urandom(5000))
        done = self.system.ctl("fonts", "install", "--identifier", "org.example.a", SANS, bad, check=False)
        self.assertEqual(done.returncode, 1)
        self.assertIn("bad.ttf: ", done.stderr.decode())
        self.assertEqual(registry_of(self.system), {})
        self.assertEqual(list(self.system.real(FONT_FILES).iterdir()), [])

    def test_several_writers_at_once_never_lose_each_others_fonts(self):
        fonts = sorted(DEJAVU.glob("*.ttf"))
        with concurrent.futures.ThreadPoolExecutor(4) as pool:
            calls = [pool.submit(self.system.ctl, "fonts", "install", "--identifier", f"org.example.{writer}", font)
                     for font in fonts for writer in range(4)]
            for call in calls:
                call.result()
        self.assertEqual(len(registry_of(self.system)), 4 * len(fonts))

    def test_programs_that_need_the_helper_at_the_same_time_start_it_once(self):
        self.system.kill_helper()
        with concurrent.futures.ThreadPoolExecutor(6) as pool:
            list(pool.map(lambda number: self.system.ctl(
                "fonts", "install", "--identifier", f"org.example.{number}", SANS), range(6)))
        self.assertEqual(len(registry_of(self.system)), 6)
        log = self.system.real("/run/typhon/typhon-fontmanagerd.log").read_text()
        self.assertNotIn("another process", log)

    def test_a_call_fails_when_the_helper_is_killed_during_it(self):
        pid = self.system.helper_pid()
        # The daemon has calls of its own for the helper, and must not be taken for the one below.
        eventually(lambda: self.stops_the_daemon_between_calls_of(pid))
        os.kill(pid, signal.SIGSTOP)
        call = subprocess.Popen(
            [str(BIN / "typhonctl"), "--root", str(self.system.root), "fonts", "install", "--identifier", "org.example.a",
             str(SANS)], stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE)
        self.addCleanup(call.kill)
        # It connects to the stopped helper's socket and waits; killed earlier it would start another one.
        eventually(lambda: self.is_waiting_for(pid) or call.poll() is not None)
        # Connected it has yet to call.
        eventually(lambda: state_of(call.pid) in "SZ")
        self.system.kill_helper()
        self.system.daemon.process.send_signal(signal.SIGCONT)
        _, said = call.communicate(timeout=PATIENCE)
        self.assertEqual(call.returncode, 1)
        self.assertIn("ended during the call", said.decode())
        self.assertEqual(registry_of(self.system), {})

    def stops_the_daemon_between_calls_of(self, helper):
        daemon = self.system.daemon.process
        daemon.send_signal(signal.SIGSTOP)
        # A thread that is in the kernel stops on its way out of it.
        os.waitid(os.P_PID, daemon.pid, os.WSTOPPED)
        is_between = not self.is_waiting_for(helper)
        if not is_between:
            daemon.send_signal(signal.SIGCONT)
        return is_between

    def is_waiting_for(self, helper):
        """True when a connection waits to be accepted, or to be answered, by the stopped helper."""
        path = str(self.system.socket_path(HELPER_SERVICE))
        listing = pathlib.Path(f"/proc/{helper}/net/unix").read_text().splitlines()
        # One line for the listening socket, one more for each connection to it.
        return len([line for line in listing if line.endswith(path)]) > 1

    def test_the_helper_goes_with_its_scratch_folder(self):
        pidfd = os.pidfd_open(self.system.helper_pid())
        self.system.daemon.kill()
        shutil.rmtree(self.system.root)
        readable, _, _ = select.select([pidfd], [], [], PATIENCE)
        os.close(pidfd)
        self.assertTrue(readable)
        self.assertFalse(self.system.root.exists())

    def test_profile_fonts_are_recorded_when_the_daemon_starts(self):
        self.system.stop()
        managed = self.system.real("/var/mobile/Library/Fonts/Managed")
        managed.mkdir(parents=True)
        (managed / "a.ttf").write_bytes(SANS.read_bytes())
        (managed / "bad.ttf").write_bytes(b"garbage")
        self.system.start()
        record = self.system.real("/var/mobile/Library/UserFonts/ProfileFonts.plist")
        eventually(record.exists)
        self.assertEqual(plistlib.loads(record.read_bytes()),
                         {"/var/mobile/Library/Fonts/Managed/a.ttf": {"familyName": {"DejaVuSans": "DejaVu Sans"}}})


if __name__ == "__main__":
    unittest.main()
