"""A scratch system with a source of assets: a key, folders of assets, signed catalogues of them, and a server."""

import plistlib
import shutil

from catalogue_server import CatalogueServer, whole
from scratch_system import ScratchSystem

FONTS = "com.vorlan.Cargon.Font7"
LETTERFORM = "com.vorlan.Cargon.LetterformAssets"
CATALOGUES = "/private/var/Cargon/AssetsV2/Catalogues"
SOURCES = "/etc/typhon/catalogue-sources.d"
ACTIVITY = "com.vorlan.typhond.check-asset-update"


class CatalogueSystem(ScratchSystem):
    def __init__(self):
        super().__init__()
        self.source = self.folder / "source"
        self.source.mkdir()
        self.source_key = self.new_source_key("source")
        self.ctl("assets", "trust", f"{self.source_key}.pub")
        self.server = CatalogueServer()

    def close(self):
        super().close()
        self.server.close()

    def new_source_key(self, name):
        key = self.folder / f"{name}.key"
        self.ctl("keygen", "--key", key)
        return key

    # -- the source

    def asset(self, name, *files, attributes=None):
        """A folder of the source with copies of these files."""
        folder = self.source / name
        folder.mkdir(parents=True, exist_ok=True)
        for file in files:
            shutil.copy(file, folder)
        if attributes is not None:
            (self.source / f"{name}.plist").write_bytes(plistlib.dumps(attributes))
        return folder

    def catalogue(self, version, kind=LETTERFORM, key=None):
        """The bytes of a signed catalogue of the present assets."""
        path = self.folder / "made.plist"
        self.ctl("assets", "make-catalogue", "--type", kind, "--key", key or self.source_key, "--version",
                 str(version), "--output", path, self.source)
        return path.read_bytes()

    def serve(self, version, **options):
        self.server.answer = whole(self.catalogue(version, **options))

    # -- the system

    def configure(self, url=None, kind=LETTERFORM, **more):
        """Says where the catalogue comes from."""
        path = self.real(f"{SOURCES}/{kind}.plist")
        path.parent.mkdir(parents=True, exist_ok=True)
        entry = {"URL": url or self.server.url(), "StallSeconds": 30, "TotalSeconds": 50, **more}
        path.write_bytes(plistlib.dumps(entry))

    def let_update_often(self):
        """Lets the daemon's activity run about once a second."""
        path = self.real(f"/etc/typhon/activities.d/{ACTIVITY}.plist")
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(plistlib.dumps({"Interval": 1, "AllowBattery": True}))

    def present(self, kind=LETTERFORM):
        """The present catalogue's version, and its assets' names; None when there is no catalogue."""
        path = self.real(f"{CATALOGUES}/{kind.replace('.', '_')}.plist")
        if not path.exists():
            return None
        statement = plistlib.loads(plistlib.loads(path.read_bytes())["statement"])
        return statement["version"], sorted(statement["assets"])

    def fetch(self, kind=LETTERFORM, **options):
        return self.ctl("assets", "fetch-catalogue", "--type", kind, **options)

    def fetch_fails(self, kind=LETTERFORM):
        """What the command says when it cannot fetch."""
        done = self.fetch(kind, check=False)
        if done.returncode != 1:
            raise AssertionError(f"exit {done.returncode}: {done.stderr.decode()}")
        return done.stderr.decode()
