"""Many files that come into the asset store at once: the daemon has each font among them registered, and synchronises
once in a window, however much changes."""

import os
import plistlib
import shutil
import time
import unittest

from scratch_system import ASSET_STORE, FONT_ASSETS, REGISTRY, ScratchSystem

FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSansMono.ttf"
WINDOW = 3
ASSETS = 200
# Most files are nothing to register, since every font is read by a process of its own.
FONTS_OF_AN_ASSET = 10
OTHERS_OF_AN_ASSET = 90
PATIENCE = 400


class AssetBursts(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.store = self.system.real(ASSET_STORE)
        self.font = self.system.folder / "font.ttf"
        shutil.copy(FONT, self.font)

    def test_a_burst_of_20000_files_in_new_directories_is_synchronised_once_a_window(self):
        self.system.start()
        self.await_watch()
        began = time.monotonic()
        batches_before = self.batches()
        expected = set()
        for asset in range(ASSETS):
            data = self.store / f"{asset}.asset" / "AssetData"
            (data / "nested" / "deeper").mkdir(parents=True)
            for other in range(OTHERS_OF_AN_ASSET):
                (data / "nested" / "deeper" / f"{other}.txt").touch()
            for font in range(FONTS_OF_AN_ASSET):
                os.link(self.font, data / f"{font}.ttf")
                expected.add(f"{FONT_ASSETS}/{asset}.asset/{font}.ttf")
        self.eventually(lambda: self.registered() == expected)
        self.eventually(lambda: self.batches() == self.synchronisations())
        self.assertGreater(self.batches(), batches_before)
        self.assert_one_batch_a_window(batches_before, began)

        began = time.monotonic()
        batches_before = self.batches()
        for asset in range(0, ASSETS, 2):
            shutil.rmtree(self.store / f"{asset}.asset")
            expected -= {f"{FONT_ASSETS}/{asset}.asset/{font}.ttf" for font in range(FONTS_OF_AN_ASSET)}
        self.eventually(lambda: self.registered() == expected)
        self.assert_one_batch_a_window(batches_before, began)
        self.assertEqual(self.system.daemon.lines_with("were not synchronised"), [])

    def assert_one_batch_a_window(self, before, began):
        batches = self.batches() - before
        # The time after the batches: more of them may come at any moment.
        self.assertLessEqual(batches, (time.monotonic() - began) / WINDOW + 1)

    def await_watch(self):
        self.system.await_asset_watch()
        self.eventually(lambda: self.batches() == self.synchronisations())

    def batches(self):
        return len(self.system.daemon.lines_with("FontAssetsEventStreamCallback - "))

    def synchronisations(self):
        """Those that followed a batch."""
        return len(self.system.daemon.lines_with("synchronizeFontAssets result - success"))

    def registered(self):
        path = self.system.real(REGISTRY)
        return set(plistlib.loads(path.read_bytes())) if path.exists() else set()

    def eventually(self, condition):
        deadline = time.monotonic() + PATIENCE
        while not condition():
            self.assertLess(time.monotonic(), deadline, "it never came to pass")
            time.sleep(0.1)


if __name__ == "__main__":
    unittest.main()
