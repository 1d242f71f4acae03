"""Catalogues on a disk of their own that is full, or read-only. Mounts file systems: to be run in namespaces of its own, as
test_catalogues does."""

import subprocess
import unittest

from catalogue_system import CATALOGUES, FONTS, CatalogueSystem

FONT = "/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf"
MANY = 400


class LimitedStore(unittest.TestCase):
    def setUp(self):
        self.system = CatalogueSystem()
        self.addCleanup(self.system.close)
        self.disk = self.system.real(CATALOGUES)
        self.disk.mkdir(parents=True)
        self.mount("-t", "tmpfs", "-o", "size=64k", "tmpfs", self.disk)
        self.addCleanup(subprocess.run, ["umount", "--lazy", str(self.disk)], check=True)
        self.system.asset("sans.asset", FONT)
        self.system.configure(kind=FONTS)
        self.system.serve(1, kind=FONTS)
        self.system.fetch(FONTS)
        self.assertEqual(self.system.present(FONTS), (1, ["sans.asset"]))

    @staticmethod
    def mount(*arguments):
        subprocess.run(["mount", *map(str, arguments)], check=True)

    def assert_not_replaced(self, reason):
        said = self.system.fetch_fails(FONTS)
        self.assertIn(reason, said)
        self.assertEqual(said.count("\n"), 1, said)
        self.assertEqual(self.system.present(FONTS), (1, ["sans.asset"]))
        self.assertIn("sans.asset", self.system.ctl("assets", "list").stdout.decode())

    def test_a_full_disk(self):
        for number in range(MANY):
            self.system.asset(f"{number}.asset")
            (self.system.source / f"{number}.asset.plist").write_bytes(
                f"<plist><dict><key>text</key><string>{number:0400}</string></dict></plist>".encode())
        self.system.serve(2, kind=FONTS)
        self.assert_not_replaced("No space left on device")
        self.mount("-o", "remount,size=4m", self.disk)
        self.system.fetch(FONTS)
        self.assertEqual(self.system.present(FONTS)[0], 2)

    def test_a_read_only_disk(self):
        self.system.serve(2, kind=FONTS)
        self.mount("-o", "remount,ro", self.disk)
        self.assert_not_replaced("Read-only file system")
        self.mount("-o", "remount,rw", self.disk)
        self.system.fetch(FONTS)
        self.assertEqual(self.system.present(FONTS)[0], 2)


if __name__ == "__main__":
    unittest.main()
