"""Assets from a signed catalogue: installed, synchronised, seen and read by an application, and purged; and the list
of application versions that may not enumerate."""

import json
import os
import pathlib
import plistlib
import shutil
import subprocess
import unittest

from scratch_system import ASSET_STORE, BIN, FONT_ASSETS, PATIENCE, ScratchSystem, eventually

FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf"
OTHER_FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSans-Bold.ttf"
LETTERFORM = "com.vorlan.Cargon.LetterformAssets"
METADATA = "/usr/share/metainfo/org.example.viewer.metainfo.xml"


class Assets(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.source = self.system.folder / "source"
        self.key = self.system.folder / "source.key"
        self.system.ctl("keygen", "--key", self.key)
        self.system.ctl("assets", "trust", f"{self.key}.pub")
        self.serial = 0

    def asset(self, name, *fonts):
        folder = self.source / name
        folder.mkdir(parents=True, exist_ok=True)
        for font in fonts:
            shutil.copy(font, folder)
        return folder

    def publish(self, *kind, check=True):
        self.serial += 1
        catalogue = self.system.folder / f"catalogue{self.serial}.plist"
        self.system.ctl("assets", "make-catalogue", *kind, "--key", self.key, "--version", str(self.serial),
                        "--output", catalogue, self.source)
        return self.system.ctl("assets", "set-catalogue", *kind, catalogue, check=check)

    def fonts_of(self, program):
        return set(self.system.checkin(program)["fontsInfo"])

    def test_an_installed_asset_reaches_an_application_and_goes_again(self):
        viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.system.start()
        self.system.await_asset_watch()
        folder = self.asset("sans.asset", FONT)
        (folder / "bad.ttf").write_text("no font")
        self.publish()
        self.system.ctl("assets", "install", "sans.asset", folder)
        path = f"{FONT_ASSETS}/sans.asset/DejaVuSans.ttf"
        eventually(lambda: path in self.fonts_of(viewer))
        self.assertEqual(self.fonts_of(viewer), {path})
        self.system.ctl("assets", "purge", "sans.asset")
        eventually(lambda: self.fonts_of(viewer) == set())
        self.assertFalse(self.system.real(f"{FONT_ASSETS}/sans.asset").exists())

    def test_a_sandboxed_application_opens_and_reads_an_assets_font(self):
        viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        plain = self.system.program("org.example.plain")
        self.system.start()
        self.system.await_asset_watch()
        folder = self.asset("sans.asset", FONT)
        self.publish()
        archive = self.system.folder / "sans.tar.xz"
        subprocess.run(["tar", "-cJf", archive, "-C", folder, "."], check=True)
        self.system.ctl("assets", "install", "sans.asset", archive)
        path = f"{FONT_ASSETS}/sans.asset/DejaVuSans.ttf"
        eventually(lambda: path in self.fonts_of(viewer))
        self.assertEqual(set(self.system.checkin(viewer, sandboxed=True)["fontsInfo"]), {path})
        opened = self.opened(viewer, path)
        self.assertEqual(opened.stdout, pathlib.Path(FONT).read_bytes(), opened.stderr)
        # Its own share of nothing is all that another one gets.
        refused = self.opened(plain, path)
        self.assertNotEqual(refused.returncode, 0)
        self.assertEqual(refused.stdout, b"")

    def opened(self, program, path):
        """What the program, in a sandbox, gets of that file."""
        command = [BIN / "typhonctl", "--root", self.system.root, "run", "--", program, "--root", self.system.root,
                   "open", path]
        return subprocess.run([str(word) for word in command], capture_output=True, timeout=PATIENCE,
                              stdin=subprocess.DEVNULL)

    def test_the_list_shows_states_and_sizes(self):
        folder = self.asset("sans.asset", FONT, OTHER_FONT)
        self.asset("bold.asset", OTHER_FONT)
        self.publish()
        self.system.ctl("assets", "install", "sans.asset", folder)
        size = sum(os.path.getsize(font) for font in (FONT, OTHER_FONT))
        text = self.system.ctl("assets", "list").stdout.decode()
        self.assertEqual([line.split() for line in text.splitlines()],
                         [["ASSET", "STATE", "SIZE"], ["bold.asset", "listed", "-"],
                          ["sans.asset", "installed", str(size)]])
        known = json.loads(self.system.ctl("--json", "assets", "list").stdout)
        self.assertEqual([(asset["assetId"], asset["state"], asset.get("size")) for asset in known],
                         [("bold.asset", 1, None), ("sans.asset", 2, size)])

    def test_files_that_the_catalogue_does_not_list_are_refused(self):
        folder = self.asset("sans.asset", FONT)
        self.publish()
        shutil.copy(OTHER_FONT, folder / "DejaVuSans.ttf")
        refused = self.system.ctl("assets", "install", "sans.asset", folder, check=False)
        self.assertNotEqual(refused.returncode, 0)
        self.assertIn("is not the file that the catalogue lists", refused.stderr.decode())
        self.assertFalse(self.system.real(f"{ASSET_STORE}/sans.asset").exists())

    def test_a_privacy_asset_bars_a_version_and_not_the_next(self):
        self.system.start_bus()
        self.system.install_application("org.example.viewer")
        self.set_version("2.1")
        font = self.asset("sans.asset", FONT)
        self.publish()
        self.system.ctl("assets", "install", "sans.asset", font)
        viewer = self.system.program("org.example.viewer", ["font-enumeration"])
        self.system.start()
        path = f"{FONT_ASSETS}/sans.asset/DejaVuSans.ttf"
        eventually(lambda: path in self.fonts_of(viewer))
        shutil.rmtree(self.source)
        self.asset("privacy")
        (self.source / "privacy.plist").write_bytes(plistlib.dumps(
            {"_CompatibilityVersion": "1", "type": "FontAccess",
             "FontAccess": {"org.example.viewer": ["2.0", "2.1"]}}))

        def is_barred():
            # Again and again: the daemon may not hear yet what is announced on the bus.
            self.publish("--type", LETTERFORM)
            return not self.sees_fonts(viewer)
        eventually(is_barred)
        self.set_version("2.2")
        eventually(lambda: self.sees_fonts(viewer))

    def sees_fonts(self, program):
        answer = self.system.checkin(program)
        return bool(answer and answer.get("fontsInfo"))

    def set_version(self, version):
        path = self.system.real(METADATA)
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text(f"""<component type="desktop-application"><id>org.example.viewer</id>
            <launchable type="desktop-id">org.example.viewer.desktop</launchable>
            <releases><release version="{version}" date="2026-01-01"/></releases></component>""")


if __name__ == "__main__":
    unittest.main()
