"""Assets from archives: in every usual compression, and from archives made to do harm, which change nothing."""

import gzip
import io
import lzma
import pathlib
import subprocess
import tarfile
import unittest

from catalogue_system import FONTS, CatalogueSystem
from scratch_system import ASSET_STORE

SANS = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf")
BOLD = pathlib.Path("/usr/share/fonts/truetype/dejavu/DejaVuSans-Bold.ttf")
ASSET = "sans.asset"
FORMATS = {"USTAR": tarfile.USTAR_FORMAT, "GNU": tarfile.GNU_FORMAT, "PAX": tarfile.PAX_FORMAT}


class AssetArchives(unittest.TestCase):
    def setUp(self):
        self.system = CatalogueSystem()
        self.addCleanup(self.system.close)
        self.folder = self.system.asset(ASSET, SANS, BOLD)
        self.publish(1)
        self.archive = self.system.folder / "archive"

    def publish(self, version):
        self.system.configure(kind=FONTS)
        self.system.serve(version, kind=FONTS)
        self.system.fetch(FONTS)

    def installed(self):
        data = self.system.real(f"{ASSET_STORE}/{ASSET}/AssetData")
        return {path.name: path.read_bytes() for path in data.iterdir()} if data.exists() else None

    def install(self, check=True):
        return self.system.ctl("assets", "install", ASSET, self.archive, check=check)

    def make(self, *members, format=tarfile.PAX_FORMAT, mode="w"):
        """An archive of (name, content or a changed TarInfo's attributes)."""
        with tarfile.open(self.archive, mode, format=format) as tar:
            for name, content in members:
                info = tarfile.TarInfo(name)
                if isinstance(content, bytes):
                    info.size = len(content)
                    tar.addfile(info, io.BytesIO(content))
                else:
                    for key, value in content.items():
                        setattr(info, key, value)
                    tar.addfile(info)

    def whole(self, prefix=""):
        return [(prefix + path.name, path.read_bytes()) for path in (SANS, BOLD)]

    def assert_installs(self):
        self.install()
        self.assertEqual(self.installed(), {path.name: path.read_bytes() for path in (SANS, BOLD)})
        self.system.ctl("assets", "purge", ASSET)

    def assert_refused(self, reason):
        refused = self.install(check=False)
        said = refused.stderr.decode()
        self.assertEqual(refused.returncode, 1, said)
        self.assertIn(reason, said)
        self.assertIsNone(self.installed())
        left = [path.name for path in self.system.real(ASSET_STORE).iterdir() if not path.name.endswith(".lock")]
        self.assertEqual(left, [])

    # -- archives that are what they ought to be

    def test_every_usual_compression_and_format(self):
        for format in FORMATS.values():
            for mode in ("w", "w:gz", "w:bz2", "w:xz"):
                with self.subTest(format=format, mode=mode):
                    self.make(*self.whole(), format=format, mode=mode)
                    self.assert_installs()

    def test_the_files_may_lie_in_a_folder_of_the_assets_name(self):
        for prefix, folders in (("./", ["."]), (f"{ASSET}/", [ASSET]), (f"./{ASSET}/", ["./", f"./{ASSET}/"])):
            with self.subTest(prefix):
                self.make(*((name, {"type": tarfile.DIRTYPE}) for name in folders), *self.whole(prefix))
                self.assert_installs()

    def test_what_tar_makes_of_a_folder(self):
        for where, what in ((self.folder, "."), (self.folder.parent, ASSET)):
            subprocess.run(["tar", "-czf", self.archive, "-C", where, what], check=True)
            self.assert_installs()

    def test_names_in_any_language(self):
        name = "Schriftgröße 字体.ttf"
        (self.folder / name).write_bytes(b"a font")
        self.publish(2)
        for format in (tarfile.PAX_FORMAT, tarfile.GNU_FORMAT):
            self.make((name, b"a font"), *self.whole(), format=format)
            self.install()
            self.assertEqual(self.installed()[name], b"a font")

    def test_an_installed_asset_is_exchanged(self):
        self.make(*self.whole())
        self.install()
        (self.folder / BOLD.name).unlink()
        self.publish(2)
        self.make(*self.whole()[:1])
        self.install()
        self.assertEqual(list(self.installed()), [SANS.name])

    # -- archives that are not

    def test_names_that_lead_elsewhere_are_refused(self):
        outside = self.system.folder / "outside"
        for name in (f"../{SANS.name}", f"a/../{SANS.name}", f"{ASSET}/../{SANS.name}", f"{ASSET}/..", "..",
                     str(outside), f"/{SANS.name}", f"other/{SANS.name}", f"{ASSET}/{ASSET}/{SANS.name}",
                     f"{ASSET}//{SANS.name}", f"./../{SANS.name}"):
            with self.subTest(name):
                self.make((name, SANS.read_bytes()), *self.whole())
                self.assert_refused("which is in another folder")
        self.assertFalse(outside.exists())

    def test_links_devices_and_folders_are_refused(self):
        for kind, more in ((tarfile.SYMTYPE, {"linkname": "/etc/passwd"}), (tarfile.LNKTYPE, {"linkname": BOLD.name}),
                           (tarfile.LNKTYPE, {"linkname": "/etc/passwd"}), (tarfile.CHRTYPE, {"devmajor": 1}),
                           (tarfile.BLKTYPE, {"devmajor": 1}), (tarfile.FIFOTYPE, {}), (tarfile.DIRTYPE, {})):
            with self.subTest(kind):
                self.make(self.whole()[1], (SANS.name, {"type": kind, **more}))
                self.assert_refused("which is no plain file")

    def test_a_link_that_later_entries_would_follow_is_refused(self):
        outside = self.system.folder / "outside"
        outside.mkdir()
        self.make((ASSET, {"type": tarfile.SYMTYPE, "linkname": str(outside)}), *self.whole(f"{ASSET}/"))
        self.assert_refused("no plain file")
        self.assertEqual(list(outside.iterdir()), [])

    def test_files_that_the_catalogue_does_not_list_or_lists_otherwise_are_refused(self):
        self.make(*self.whole(), ("more.ttf", b"more"))
        self.assert_refused("it holds more.ttf, which the catalogue does not list")
        self.make(*self.whole(), (SANS.name, BOLD.read_bytes()))
        self.assert_refused(f"it holds {SANS.name} twice")
        self.make((SANS.name, BOLD.read_bytes()), self.whole()[1])
        self.assert_refused(f"{SANS.name} is not the file that the catalogue lists")
        self.make(self.whole()[0])
        self.assert_refused(f"{BOLD.name}: No such file")
        self.make()
        self.assert_refused("No such file")

    def test_names_cannot_draw_on_the_terminal(self):
        self.make(("\x1b[31mred\n", b"x"))
        self.assert_refused("\\x1B[31mred\\n")

    def test_bombs_are_refused_before_they_go_off(self):
        # A tebibyte, as its head claims.
        self.make((SANS.name, {"size": 1 << 40}), format=tarfile.PAX_FORMAT)
        self.assert_refused("which is too large")
        # Zeros that are no archive at all, and zeros that a head claims to be part of one.
        with gzip.open(self.archive, "wb", compresslevel=1) as file:
            for _ in range(200):
                file.write(bytes(1 << 20))
        self.assert_refused("")
        # A file that is within the limit of each file, and not the listed one.
        with lzma.open(self.archive, "wb", preset=0) as file:
            info = tarfile.TarInfo(SANS.name)
            info.size = 64 << 20
            file.write(info.tobuf())
            for _ in range(64):
                file.write(bytes(1 << 20))
            file.write(bytes(1024))
        self.assert_refused("No such file")
        # A name of half a gibibyte.
        with lzma.open(self.archive, "wb", preset=0) as file:
            info = tarfile.TarInfo("././@LongLink")
            info.type = tarfile.GNUTYPE_LONGNAME
            info.size = 512 << 20
            file.write(info.tobuf())
            for _ in range(128):
                file.write(b"a" * (1 << 20))
        self.assert_refused("")

    def test_broken_archives_are_refused(self):
        self.make(*self.whole(), mode="w:gz")
        whole = self.archive.read_bytes()
        for name, content in {"empty": b"", "text": b"no archive" * 1000, "cut": whole[:len(whole) // 2],
                              "tampered": whole[:5000] + b"tampered" + whole[5008:],
                              "zip": b"PK\3\4" + bytes(1000)}.items():
            with self.subTest(name):
                self.archive.write_bytes(content)
                self.assert_refused("")

    def test_an_archive_that_is_no_file_is_refused(self):
        for source, reason in (("/dev/zero", "not a regular file"), ("/nowhere", "No such file")):
            refused = self.system.ctl("assets", "install", ASSET, source, check=False)
            self.assertEqual(refused.returncode, 1)
            self.assertIn(reason, refused.stderr.decode())


if __name__ == "__main__":
    unittest.main()
