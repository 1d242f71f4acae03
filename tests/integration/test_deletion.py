"""Font files go when they are due, over restarts and kills, and nothing outside the font trees ever goes."""

import datetime
import os
import pathlib
import shutil
import signal
import unittest

from scratch_system import ASSET_STORE, FONT_ASSETS, FONT_FILES, ScratchSystem, eventually, in_seconds

FAILED = "scheduled deletion failed: "
ALL_DONE = "all files deleted."


class DeletionTest(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)

    def exists(self, logical):
        return os.path.lexists(self.system.real(logical))

    def schedule(self, *paths):
        self.system.ctl("schedule-deletion", *paths)

    def scheduled(self):
        return self.system.preferences().get("delete", {})


class Deletion(DeletionTest):
    def test_a_file_goes_when_it_is_due_and_its_folder_with_it(self):
        self.system.write_preferences({"deleteDelay": 0.5})
        self.system.start()
        path = self.system.font_file("org.example.foundry", "a.ttf")
        other = self.system.font_file("org.example.newfoundry", "b.ttf")
        self.schedule(path, "/etc/passwd")
        eventually(lambda: not self.exists(f"{FONT_FILES}/org.example.foundry"))
        self.assertTrue(self.exists(other))
        eventually(lambda: self.scheduled() == {})

    def test_a_file_that_is_not_due_stays(self):
        self.system.start()
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.schedule(path)
        eventually(lambda: path in self.scheduled())
        self.system.restart()
        self.system.daemon.wait_for_line("next deletion after ")
        self.assertTrue(self.exists(path))

    def test_a_daemon_killed_before_the_date_deletes_after_its_restart(self):
        self.system.write_preferences({"deleteDelay": 600})
        self.system.start()
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.schedule(path)
        eventually(lambda: path in self.scheduled())
        self.system.daemon.kill(signal.SIGKILL)
        self.assertTrue(self.exists(path))
        # The date comes while no daemon runs.
        self.system.write_preferences({"delete": {path: in_seconds(100)}})
        self.system.start()
        self.system.daemon.wait_for_line(ALL_DONE)
        self.assertFalse(self.exists(path))
        self.assertEqual(self.scheduled(), {})

    def test_an_internal_build_deletes_sooner(self):
        path = self.system.font_file("org.example.foundry", "a.ttf")
        for arguments, delay in ((["--internal-build"], 600), ([], 10800)):
            self.system.restart(*arguments)
            before = in_seconds(0)
            self.schedule(path)
            eventually(lambda: path in self.scheduled()
                       and abs((self.scheduled()[path] - before).total_seconds() - delay) < 120)

    def test_a_file_of_an_asset_that_the_store_holds_is_kept(self):
        # Without a sound font the asset would be left out when the daemon synchronises.
        font = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf").read_bytes()
        kept = self.system.font_file("abc.asset", "a.ttf", font, tree=FONT_ASSETS)
        gone = self.system.font_file("xyz.asset", "a.ttf", tree=FONT_ASSETS)
        shutil.rmtree(self.system.real(f"{ASSET_STORE}/xyz.asset"))
        self.system.write_preferences({"delete": {kept: in_seconds(0), gone: in_seconds(0)}})
        self.system.start()
        self.system.daemon.wait_for_line(ALL_DONE)
        self.assertTrue(self.exists(kept))
        self.assertFalse(self.exists(f"{FONT_ASSETS}/xyz.asset"))

    def test_malformed_entries_are_dropped(self):
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.system.write_preferences({"delete": {path: "now", "/etc/passwd": in_seconds(0)}})
        self.system.start()
        self.system.daemon.wait_for_line(ALL_DONE)
        self.assertTrue(self.exists(path))
        self.assertEqual(self.scheduled(), {})

    def test_the_schedule_is_shown(self):
        path = self.system.font_file("org.example.foundry", "a.ttf")
        self.assertIn("Nothing is scheduled", self.system.ctl("deletions").stdout.decode())
        self.system.write_preferences({"delete": {path: datetime.datetime(2031, 1, 2, 3, 4, 5)}})
        table = self.system.ctl("deletions").stdout.decode()
        self.assertIn("2031-01-02T03:04:05Z", table)
        self.assertIn(path, table)


class Escapes(DeletionTest):
    """What clients may try to reach through the wire, each with a sentinel that has to survive."""

    def setUp(self):
        super().setUp()
        self.system.write_preferences({"deleteDelay": 0.5})
        self.sentinel = self.system.real("/var/mobile/Library/sentinel")
        self.sentinel.write_text("alive")
        self.folder = self.system.real("/var/mobile/Library/folder")
        self.folder.mkdir()
        (self.folder / "sentinel").write_text("alive")
        self.own = self.system.font_file("org.example.foundry", "own.ttf")
        self.bystander = self.system.font_file("org.example.newfoundry", "bystander.ttf")
        self.system.start()

    def tearDown(self):
        self.assertEqual(self.sentinel.read_text(), "alive")
        self.assertEqual((self.folder / "sentinel").read_text(), "alive")
        self.assertTrue(self.exists(self.bystander))
        super().tearDown()

    def link(self, name, target):
        os.symlink(target, self.system.real(f"{FONT_FILES}/org.example.foundry/{name}"))

    def assert_refused(self, *paths):
        """Schedules them together with a file that may go, in one pass that tries them all."""
        self.schedule(*paths, self.own)
        self.system.daemon.wait_for_line(ALL_DONE)
        self.assertFalse(self.exists(self.own))
        self.assertEqual(len(self.system.daemon.lines_with(FAILED)), len(paths))

    def test_dots(self):
        foundry = f"{FONT_FILES}/org.example.foundry"
        self.assert_refused(
            f"{FONT_FILES}/../../sentinel", f"{foundry}/../../../folder/sentinel", f"{foundry}/../../../folder",
            f"{foundry}/../org.example.newfoundry/bystander.ttf", f"{FONT_FILES}/..", f"{foundry}/..",
            f"{FONT_ASSETS}/../FontFiles/org.example.newfoundry/bystander.ttf")

    def test_links_on_the_way(self):
        self.link("out", self.folder)
        self.link("up", "../../..")
        self.link("self", "/proc/self/root")
        foundry = f"{FONT_FILES}/org.example.foundry"
        self.assert_refused(f"{foundry}/out/sentinel", f"{foundry}/up/sentinel", f"{foundry}/up/folder",
                            f"{foundry}/self{self.sentinel}", f"{foundry}/self{self.folder}")

    def test_a_link_is_itself_removed_and_not_what_it_leads_to(self):
        self.link("file", self.sentinel)
        self.link("folder", self.folder)
        self.link("dangling", "nowhere")
        foundry = f"{FONT_FILES}/org.example.foundry"
        self.schedule(f"{foundry}/file", f"{foundry}/folder/", f"{foundry}/dangling", self.own)
        eventually(lambda: not self.exists(foundry))

    def test_a_folder_goes_with_the_links_in_it_and_not_with_what_they_lead_to(self):
        self.link("out", self.folder)
        self.schedule(f"{FONT_FILES}/org.example.foundry")
        eventually(lambda: not self.exists(f"{FONT_FILES}/org.example.foundry"))

    def test_the_tree_itself(self):
        self.assert_refused(f"{FONT_FILES}/", f"{FONT_FILES}//", f"{FONT_FILES}/.", f"{FONT_ASSETS}/")
        self.assertTrue(self.exists(FONT_ASSETS))

    def test_names_that_no_file_can_have(self):
        self.schedule(f"{FONT_FILES}/{'n' * 100_000}")
        eventually(lambda: len(self.system.daemon.lines_with(FAILED)) == 1)
        self.system.stop()
        self.system.write_preferences({"delete": {f"{self.own}\0x": in_seconds(0),
                                                  f"{self.own}\0": in_seconds(0)}})
        self.system.start()
        eventually(lambda: len(self.system.daemon.lines_with(FAILED)) == 2)
        self.assertTrue(self.exists(self.own))

    def test_paths_outside_the_trees_are_not_even_scheduled(self):
        self.schedule("/var/mobile/Library/sentinel", "/var/mobile/Library/folder", "/", "",
                      "/var/mobile/Library/UserFonts/FontFilesX/a", FONT_FILES, self.own)
        self.system.daemon.wait_for_line(ALL_DONE)
        self.assertFalse(self.exists(self.own))
        self.assertEqual(self.system.daemon.lines_with(FAILED), [])


if __name__ == "__main__":
    unittest.main()
