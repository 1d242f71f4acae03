"""An application that comes as a Debian package: installed, used, upgraded, and removed without a trace."""

import json
import os
import pathlib
import subprocess
import unittest

from removal_system import SANS, ApplicationsThatGo
from sample_package import PackageDatabase, SamplePackage, finish
from scratch_system import BIN, FONT_FILES, PATIENCE, eventually

SERIF = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSerif.ttf")
IDENTIFIER = "org.example.newfoundry"
OWN = f"{FONT_FILES}/{IDENTIFIER}/DejaVuSans.ttf"
GRANTED = f"{FONT_FILES}/org.example.foundry/DejaVuSerif.ttf"


class DebianPackage(ApplicationsThatGo):
    def setUp(self):
        super().setUp()
        self.dpkg = PackageDatabase(self.system)
        self.package = SamplePackage(self.system, IDENTIFIER, ["system-installation", "app-usage"])
        # What comes back within it was upgraded, what does not was removed.
        self.start_with_relay(window=10)
        self.system.install_application("org.example.foundry")
        self.system.ctl("fonts", "install", "--identifier", "org.example.foundry", SERIF)

    def application(self, *words):
        """What the installed program prints, in a sandbox."""
        command = [BIN / "typhonctl", "--root", self.system.root, "run", "--",
                   self.system.real(self.package.program), *words]
        done = subprocess.run([str(word) for word in command], capture_output=True, text=True, timeout=PATIENCE,
                              stdin=subprocess.DEVNULL, env={**os.environ, "TYPHON_ROOT": str(self.system.root)})
        self.assertEqual(done.returncode, 0, done.stderr)
        return done.stdout

    def version(self):
        known = json.loads(self.system.ctl("--json", "applications").stdout)
        return known.get(IDENTIFIER, {}).get("version")

    def ledger(self):
        return json.loads(self.system.ctl("--json", "ledger").stdout).get(IDENTIFIER)

    def install_and_use(self):
        """The application installs a font of its own, and is granted one of another's."""
        self.dpkg.do("--install", self.package.build("1.0"))
        self.relay.wait_for_line(f'application "{IDENTIFIER}" is installed')
        self.assertEqual(self.version(), "1.0")
        self.assertIn(OWN, self.application("install", SANS))
        self.assertIn(GRANTED, self.application("request", "--family", "DejaVu Serif"))
        eventually(lambda: self.ledger() is not None)

    def assert_works(self):
        text = self.application("checkin")
        self.assertIn(OWN, text)
        self.assertIn(GRANTED, text)
        self.assertIn("read 2 of 2", self.application("read"))
        self.assert_kept(IDENTIFIER)

    def remove(self):
        self.dpkg.do("--remove", self.package.name)
        self.assertFalse(self.system.real(self.package.program).exists())
        self.wait_until_gone(IDENTIFIER)
        self.assertIsNone(self.ledger())
        self.assertIsNone(self.version())
        # Others keep theirs.
        self.assertTrue(self.system.real(GRANTED).exists())
        self.assertEqual(list(self.registry()), [GRANTED])

    def test_it_is_installed_used_upgraded_and_forgotten_when_it_is_removed(self):
        self.install_and_use()
        self.assert_works()
        self.dpkg.do("--install", self.package.build("2.0"))
        self.assertEqual(self.version(), "2.0")
        self.assert_works()
        self.remove()

    def test_an_upgrade_that_takes_the_desktop_entry_away_for_a_while_forgets_nothing(self):
        gap = self.system.folder / "gap"
        os.mkfifo(gap)
        entry = f"/usr/share/applications/{IDENTIFIER}.desktop"
        self.package.before_upgrade = f'rm "$DPKG_ROOT{entry}"; read -r line <"{gap}"'
        self.install_and_use()
        upgrade = self.dpkg.start("--install", self.package.build("2.0"))
        self.addCleanup(upgrade.kill)
        self.relay.wait_for_line(f'application "{IDENTIFIER}" is not installed any more')
        gap.write_text("go on\n")
        finish(upgrade)
        self.relay.wait_for_line(f'application "{IDENTIFIER}" is installed', 2)
        self.assertEqual(self.version(), "2.0")
        self.assert_works()
        self.remove()
        self.relay.wait_for_line("was removed")
        self.assertEqual(sum("was removed" in line for line in self.relay.lines), 1)


if __name__ == "__main__":
    unittest.main()
