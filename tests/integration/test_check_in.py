"""Each kind of client checks in with a real daemon and gets its own view."""

import base64
import os
import sys
import unittest

import foreign_client
from scratch_system import ASSET_STORE, FONT_ASSETS, FONT_FILES, ScratchSystem, entry


class CheckIn(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.system = ScratchSystem()
        cls.addClassCleanup(cls.system.close)
        cls.foundry = cls.system.font_file("org.example.foundry", "own.ttf")
        cls.other = cls.system.font_file("org.example.other", "other.ttf")
        cls.disabled = cls.system.font_file("org.example.other", "off.ttf")
        cls.asset = cls.system.font_file("abc.asset", "asset.ttf", tree=FONT_ASSETS)
        cls.store = cls.system.font_file("abc.asset/AssetData", "store.ttf", tree=ASSET_STORE)
        cls.system.write_registry({
            cls.foundry: entry("Own", "Own Family", note="kept"),
            cls.other: entry("Other", "Other Family"),
            cls.disabled: entry("Off", "Off Family", disabled=True),
            cls.asset: entry("Asset", "Asset Family"),
            cls.store: entry("Store", "Store Family"),
        })
        cls.system.write_preferences({"issues": {
            "org.example.writer": ["U/org.example.other/other.ttf"],
            "org.example.reader": ["U/org.example.other/other.ttf", cls.store]}})
        cls.daemon = cls.system.start()

    def checkin(self, identifier, capabilities, sandboxed=False):
        return self.system.checkin(self.system.program(identifier, capabilities), sandboxed)

    def test_an_enumerating_client_sees_every_enabled_font(self):
        for sandboxed in (False, True):
            view = self.checkin("org.example.viewer", ["font-enumeration"], sandboxed)
            self.assertEqual(set(view["fontsInfo"]), {self.foundry, self.other, self.asset, self.store})
            self.assertEqual(view["fontsInfo"][self.foundry],
                             {"familyName": {"Own": "Own Family"}, "note": "kept"})
            token = base64.b64decode(view["extension"])
            self.assertEqual(token[-1:], b"\0")
            self.assertIn(FONT_FILES.encode(), token)
            self.assertNotIn("hide-profilefonts", view)

    def test_the_asset_extension_is_issued_only_where_it_is_needed(self):
        self.assertNotIn("extension.fontasset", self.checkin("org.example.viewer", ["font-enumeration"]))
        self.assertIn("extension.fontasset", self.checkin("org.example.viewer", ["font-enumeration"], True))

    def test_a_provider_sees_its_own_fonts(self):
        view = self.checkin("org.example.foundry", ["system-installation"])
        self.assertEqual(set(view["fontsInfo"]), {self.foundry})
        self.assertIs(view["hide-profilefonts"], True)
        sandboxed = self.checkin("org.example.foundry", ["system-installation"], True)
        self.assertIn("extension.provider", sandboxed)
        self.assertNotIn("data", sandboxed["fontsInfo"][self.foundry])

    def test_a_provider_without_fonts_gets_no_extension(self):
        self.assertEqual(self.checkin("org.example.newfoundry", ["system-installation"], True),
                         {"fontsInfo": {}, "hide-profilefonts": True})

    def test_an_application_with_app_usage_sees_what_was_issued_to_it(self):
        view = self.checkin("org.example.writer", ["app-usage"])
        self.assertEqual(set(view["fontsInfo"]), {self.other})
        self.assertNotIn("data", view["fontsInfo"][self.other])
        self.assertNotIn("hide-profilefonts", view)
        sandboxed = self.checkin("org.example.writer", ["app-usage"], True)
        self.assertEqual(base64.b64decode(sandboxed["fontsInfo"][self.other]["data"])[-1:], b"\0")

    def test_a_file_of_the_asset_store_needs_no_token(self):
        view = self.checkin("org.example.reader", ["app-usage"], True)
        self.assertNotIn("data", view["fontsInfo"][self.store])
        self.assertIn("data", view["fontsInfo"][self.other])

    def test_no_entitlement_no_answer(self):
        self.assertIsNone(self.checkin("org.example.plain", None))
        self.assertIsNone(self.system.checkin(self.system.program()))
        self.daemon.wait_for_line("connected: org.example.plain")

    def test_the_font_registry_helper_is_no_client(self):
        identifier = "com.vorlan.Typhon.UserFontManager"
        self.assertIsNone(self.checkin(identifier, ["font-enumeration"]))
        self.system.sign(os.path.realpath(sys.executable), identifier, ["font-enumeration"])
        client = foreign_client.Client(str(self.system.root))
        self.addCleanup(client.close)
        self.assertIsNone(client.checkin())
        # Answered when all that belongs to the message before has been done.
        client.call("TyphonProtocol", "updatingUserFonts")
        self.assertEqual(self.daemon.lines_with("connected: com.vorlan.Typhon.UserFontManager"), [])

    def test_a_program_changed_after_signing_is_nobody(self):
        program = self.system.program("org.example.viewer", ["font-enumeration"])
        self.assertIsNotNone(self.system.checkin(program))
        with program.open("ab") as file:
            file.write(b"changed")
        self.assertIsNone(self.system.checkin(program))


if __name__ == "__main__":
    unittest.main()
