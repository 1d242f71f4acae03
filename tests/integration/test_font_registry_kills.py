"""The font registry's helper, and the daemon, killed at random moments under concurrent installations. More rounds:

    TYPHON_BIN_DIR=build/debug/bin python3 tests/integration/test_font_registry_kills.py --rounds 200
"""

import argparse
import concurrent.futures
import pathlib
import plistlib
import random
import signal
import sys
import time
import unittest

from scratch_system import FONT_FILES, REGISTRY, ScratchSystem

ROUNDS = 6
FONTS = sorted(str(path) for path in pathlib.Path("/usr/share/fonts/truetype").glob("dejavu/*.ttf")) + sorted(
    str(path) for path in pathlib.Path("/usr/share/fonts/truetype").glob("liberation*/*.ttf"))
WRITERS = 3


class Kills(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        for writer in range(2):
            # Else a restarted daemon would take them for removed applications, and change what is being checked.
            self.system.install_application(f"org.example.writer{writer}")
        self.system.start()
        self.random = random.Random(20)

    def installation(self, writer):
        """The words of one change of fonts, most of them an installation."""
        identifier = f"org.example.writer{writer % 2}"
        if self.random.random() < 0.2:
            return ["remove", "--identifier", identifier, "--all"]
        fonts = self.random.sample(FONTS, self.random.randint(1, 5))
        return ["install", "--identifier", identifier, *fonts]

    def kill_at_a_random_moment(self):
        time.sleep(self.random.uniform(0, 0.12))
        self.system.kill_helper()
        if self.random.random() < 0.25:
            self.system.daemon.kill(signal.SIGKILL)
            self.system.start()

    def check_invariants(self):
        # Brings the helper up if it is not, and so has it complete and sweep what was left.
        self.system.ctl("fonts", "remove", "--identifier", "org.example.nobody", "--all")
        path = self.system.real(REGISTRY)
        registry = plistlib.loads(path.read_bytes()) if path.exists() else {}
        files = self.system.real(FONT_FILES)
        present = {f"{FONT_FILES}/{file.relative_to(files)}" for file in files.rglob("*") if not file.is_dir()}
        self.assertEqual(set(registry), present)
        self.assertEqual([folder for folder in files.iterdir() if not any(folder.iterdir())], [])
        self.assertEqual([name for name in path.parent.iterdir() if name.suffix in (".pending", ".new")], [])
        for logical, entry in registry.items():
            self.assertTrue(entry["familyName"])
            source = next(font for font in FONTS if font.endswith("/" + logical.rsplit("/", 1)[1]))
            self.assertEqual(self.system.real(logical).read_bytes(), pathlib.Path(source).read_bytes())

    def test_registry_files_and_directories_agree_after_every_kill(self):
        failed = 0
        with concurrent.futures.ThreadPoolExecutor(WRITERS) as pool:
            for _ in range(ROUNDS):
                calls = [pool.submit(self.system.ctl, "fonts", *self.installation(writer), check=False)
                         for writer in range(WRITERS)]
                self.kill_at_a_random_moment()
                for call in calls:
                    done = call.result()
                    self.assertIn(done.returncode, (0, 1), done)
                    failed += done.returncode
                self.check_invariants()
        print(f"{ROUNDS} rounds, {failed} of {ROUNDS * WRITERS} calls ended with an error", file=sys.stderr)
        if ROUNDS >= 20:
            self.assertGreater(failed, 0, "no kill came in the middle of a call")


if __name__ == "__main__":
    parser = argparse.ArgumentParser()
    parser.add_argument("--rounds", type=int, default=ROUNDS)
    options, rest = parser.parse_known_args()
    ROUNDS = options.rounds
    unittest.main(argv=[sys.argv[0], *rest])
