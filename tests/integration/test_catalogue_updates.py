"""The daemon itself keeps the catalogue of the text engine's assets up to date: what comes is announced and takes effect, and
neither a server nor a downloading process makes it wait, lose what it has, or leave anything behind."""

import contextlib
import os
import pathlib
import signal
import time
import unittest

import catalogue_server as serving
from catalogue_system import LETTERFORM, CatalogueSystem
from scratch_system import PREFERENCES, eventually, entry

NOT_FETCHED = f"the catalogue of {LETTERFORM} is not fetched: "
REFUSED = f"a new catalogue of {LETTERFORM} is refused: "
FETCHED = f"the catalogue of {LETTERFORM} was fetched"
UPDATED = "asset catalog updated. "
METADATA = "/usr/share/metainfo/org.example.viewer.metainfo.xml"


def children(pid, name):
    """The child processes of that name that run."""
    found = []
    for directory in pathlib.Path("/proc").glob("[0-9]*"):
        try:
            status = dict(line.split(":\t", 1) for line in (directory / "status").read_text().splitlines()
                          if ":\t" in line)
        except OSError:
            continue
        if (status["PPid"].strip() == str(pid) and name.startswith(status["Name"].strip())
                and not status["State"].startswith("Z")):
            found.append((int(directory.name), status))
    return found


class CatalogueUpdates(unittest.TestCase):
    def setUp(self):
        self.system = CatalogueSystem()
        self.addCleanup(self.system.close)
        self.server = self.system.server
        self.path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_registry({self.path: entry("A", "A")})
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.system.configure()
        self.system.let_update_often()

    def downloader(self):
        """The one downloading process of the daemon, and its status."""
        found = []

        def is_there():
            found[:] = children(self.system.daemon.process.pid, "typhon-asset-downloader")
            return len(found) == 1
        eventually(is_there)
        return found[0]

    def start_stalling(self, answer=None):
        """Starts the daemon, and lets it run into a server that stalls."""
        self.system.configure(StallSeconds=600, TotalSeconds=600)
        self.server.answer = answer or serving.stalling(serving.head(1000) + b"a beginning")
        self.system.start()
        self.server.wait_until(lambda: self.server.open == 1)

    def fonts(self):
        answer = self.system.checkin(self.viewer)
        return set((answer or {}).get("fontsInfo", ()))

    def last_run(self):
        return self.system.real(f"{os.path.dirname(PREFERENCES)}/com.vorlan.typhond.activity."
                                "com.vorlan.typhond.check-asset-update.plist")

    # -- what is fetched takes effect

    def test_a_fetched_privacy_list_bars_a_version_and_a_later_one_lets_it_be(self):
        self.system.start_bus()
        self.set_version("2.1")
        self.privacy({"org.example.viewer": ["2.0", "2.1"]})
        self.system.serve(1)
        self.system.start()
        eventually(lambda: self.fonts() == set())
        self.assertEqual(self.system.present(), (1, ["privacy"]))
        self.privacy({"org.example.viewer": ["2.0"]})
        self.system.serve(2)
        eventually(lambda: self.fonts() == {self.path})
        self.assertEqual(self.system.present(), (2, ["privacy"]))

    def test_the_list_is_there_again_after_a_restart_though_the_catalogue_is_the_same(self):
        self.system.start_bus()
        self.set_version("2.1")
        self.privacy({"org.example.viewer": ["2.1"]})
        self.system.serve(1)
        self.system.start()
        eventually(lambda: self.fonts() == set())
        self.system.restart()
        eventually(lambda: self.fonts() == set())

    def privacy(self, prohibited):
        self.system.asset("privacy", attributes={"_CompatibilityVersion": "1", "type": "FontAccess",
                                                 "FontAccess": prohibited})

    def set_version(self, version):
        self.system.install_application("org.example.viewer")
        path = self.system.real(METADATA)
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(f"""<component type="desktop-application"><id>org.example.viewer</id>
            <launchable type="desktop-id">org.example.viewer.desktop</launchable>
            <releases><release version="{version}" date="2026-01-01"/></releases></component>""")

    def test_without_user_fonts_nothing_is_fetched(self):
        self.system.write_registry({})
        self.system.serve(1)
        self.system.start()
        eventually(self.last_run().exists)
        first = self.last_run().read_bytes()
        eventually(lambda: self.last_run().read_bytes() != first)
        self.assertEqual(self.server.asked, [])
        self.assertIsNone(self.system.present())

    # -- what goes wrong is one line a time, and what was there stays

    def test_each_failure_is_one_line_and_the_present_catalogue_stays(self):
        self.system.serve(5)
        daemon = self.system.start()
        daemon.wait_for_line(FETCHED)
        daemon.wait_for_line(UPDATED + "(0)")
        older = self.system.catalogue(4)
        self.system.configure(StallSeconds=2)
        for answer, line in (
                (serving.stalling(), NOT_FETCHED + "nothing arrived for 2 s"),
                (serving.claiming(len(older) * 2, older), NOT_FETCHED + "transfer closed with"),
                (serving.redirecting("http://192.0.2.1/"), NOT_FETCHED + "redirected to what is refused"),
                # Before the other one that is refused, whose line would do for this one.
                (serving.whole(older[:-9] + b"tampered!"), REFUSED),
                (serving.whole(older), REFUSED + "it is older than the present one")):
            before = len(daemon.lines_with(UPDATED))
            known = len(daemon.lines_with("error ["))
            self.server.answer = answer
            daemon.wait_for_line(line)
            self.assertEqual(self.system.present(), (5, []))
            # One line for each that has ended, and one may be under way.
            eventually(lambda: len(daemon.lines_with(UPDATED)) > before)
            # These are counted first: more of them may end at any moment.
            errors = len(daemon.lines_with("error [")) - known
            self.assertLessEqual(errors, len(daemon.lines_with(UPDATED)) - before + 1)
        self.system.configure()
        self.system.serve(6)
        eventually(lambda: self.system.present() == (6, []))

    def test_a_source_that_is_missing_is_said_without_alarm(self):
        self.system.real(f"/etc/typhon/catalogue-sources.d/{LETTERFORM}.plist").unlink()
        daemon = self.system.start()
        line = daemon.wait_for_line(NOT_FETCHED)
        self.assertIn("default [daemon]", line)
        daemon.wait_for_line(UPDATED + "(1)")

    # -- nobody waits, and nothing is left behind

    def test_the_daemon_serves_while_a_server_stalls(self):
        self.start_stalling()
        for _ in range(3):
            self.assertEqual(self.fonts(), {self.path})
        self.assertEqual(self.server.open, 1)

    def test_the_downloading_process_has_next_to_no_rights(self):
        self.start_stalling()
        pid, status = self.downloader()
        self.assertEqual(status["NoNewPrivs"].strip(), "1")
        self.assertEqual(status["Seccomp"].strip(), "2")
        for kind in ("CapInh", "CapPrm", "CapEff", "CapAmb"):
            self.assertEqual(int(status[kind], 16), 0, kind)
        if os.getuid() == 0:
            self.assertNotIn("0", status["Uid"].split())
            self.assertNotIn("0", status["Gid"].split())
            self.assertEqual(status["Groups"].strip(), "")
            descriptors = {os.readlink(path).split(":")[0] for path in pathlib.Path(f"/proc/{pid}/fd").iterdir()}
            self.assertLessEqual(descriptors, {"socket", "/dev/null", "/memfd", "pipe", "anon_inode"})
        limits = pathlib.Path(f"/proc/{pid}/limits").read_text()
        self.assertRegex(limits, r"Max file size +67108864 ")
        self.assertRegex(limits, r"Max cpu time +120 ")
        self.assertEqual(pathlib.Path(f"/proc/{pid}/environ").read_bytes() if os.getuid() == 0 else b"", b"")

    def test_a_discretionary_download_leaves_the_network_and_the_processor_to_others(self):
        size = 1 << 20
        begun = []

        def answer(connection, path):
            begun.append(time.monotonic())
            serving.claiming(size, bytes(size))(connection, path)
        self.server.answer = answer
        daemon = self.system.start()
        daemon.wait_for_line(REFUSED)
        # At 256 KiB/s it takes some 4 s, at full speed no time at all.
        self.assertGreater(time.monotonic() - begun[0], 2)
        self.system.stop()
        self.start_stalling()
        pid, _ = self.downloader()
        self.assertEqual(os.getpriority(os.PRIO_PROCESS, pid), 19)

    def test_a_killed_downloading_process_is_one_line_and_the_next_one_works(self):
        self.start_stalling()
        pid, _ = self.downloader()
        self.system.serve(1)
        os.kill(pid, signal.SIGKILL)
        self.system.daemon.wait_for_line(NOT_FETCHED + "the downloader ended without an answer")
        eventually(lambda: self.system.present() == (1, []))

    def test_a_downloading_process_that_hangs_is_ended(self):
        self.start_stalling()
        self.system.stop()
        self.system.configure(StallSeconds=600, TotalSeconds=3)
        daemon = self.system.start()
        stopped = set()

        def is_ended():
            for pid, _ in children(daemon.process.pid, "typhon-asset-downloader"):
                # One may end by itself before it is stopped; then the next one is.
                with contextlib.suppress(ProcessLookupError):
                    os.kill(pid, signal.SIGSTOP)
                    stopped.add(pid)
            return daemon.lines_with(NOT_FETCHED + "the downloader does not answer within 8 s")
        eventually(is_ended)
        eventually(lambda: not any(pathlib.Path(f"/proc/{pid}").exists() for pid in stopped))

    def test_a_killed_daemon_leaves_no_process_and_its_successor_goes_on(self):
        self.system.serve(1)
        self.system.start()
        eventually(lambda: self.system.present() == (1, []))
        self.system.stop()
        self.start_stalling()
        pid, _ = self.downloader()
        self.system.daemon.kill()
        # It looks about once a second whether anybody still wants it.
        self.server.wait_until(lambda: self.server.open == 0)
        # Its parent is gone: it came to this process.
        os.waitpid(pid, 0)
        self.assertEqual(self.system.present(), (1, []))
        self.system.serve(2)
        self.system.configure()
        self.system.restart()
        eventually(lambda: self.system.present() == (2, []))

    def test_a_daemon_that_is_killed_again_and_again_never_breaks_the_catalogue(self):
        catalogues = {version: self.system.catalogue(version) for version in range(1, 9)}
        last = 0
        for version, catalogue in catalogues.items():
            self.server.answer = serving.whole(catalogue)
            asked = len(self.server.asked)
            self.system.start()
            self.server.wait_until(lambda: len(self.server.asked) > asked)
            # From here on it is a matter of luck how far it gets.
            self.system.stop()
            present = self.system.present()
            self.assertIn(present, ((last, []), (version, [])) if last else (None, (version, [])))
            last = present[0] if present else 0
            self.assertEqual(self.system.ctl("assets", "list", "--type", LETTERFORM).returncode, 0)
            eventually(lambda: self.server.open == 0)


if __name__ == "__main__":
    unittest.main()
