"""Who may sign what: anything else leaves a program without identity and entitlements."""

import plistlib
import unittest

from scratch_system import ENTITLEMENT, FONT_FILES, ScratchSystem, entry

PATH = f"{FONT_FILES}/org.example.foundry/a.ttf"


class Signatures(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.system.write_registry({PATH: entry("A", "A")})
        self.system.start()

    def signed(self, identifier, key_name, trust, capabilities=("font-enumeration",)):
        program = self.system.program()
        self.system.sign(program, identifier, list(capabilities), key=self.system.key(key_name, trust), check=False)
        return program

    def sees_fonts(self, program):
        return self.system.checkin(program) is not None

    def test_a_trusted_key_counts(self):
        self.assertTrue(self.sees_fonts(self.signed("org.example.viewer", "vendor", [])))

    def test_an_untrusted_key_does_not(self):
        self.assertFalse(self.sees_fonts(self.signed("org.example.viewer", "stranger", None)))

    def test_an_identifier_outside_the_scope_of_the_key_does_not(self):
        scope = ["--identifiers", "org.example."]
        self.assertTrue(self.sees_fonts(self.signed("org.example.viewer", "narrow", scope)))
        self.assertFalse(self.sees_fonts(self.signed("org.elsewhere.viewer", "narrow", scope)))

    def test_the_systems_own_identifiers_need_a_key_that_says_so(self):
        self.assertFalse(self.sees_fonts(self.signed("com.vorlan.viewer", "vendor", [])))
        self.assertTrue(self.sees_fonts(self.signed("com.vorlan.viewer", "platform", ["--platform"])))

    def test_an_entitlement_outside_the_scope_of_the_key_spoils_the_signature(self):
        scope = ["--entitlements", "org.example.something"]
        self.assertFalse(self.sees_fonts(self.signed("org.example.viewer", "limited", scope)))
        scope = ["--entitlements", ENTITLEMENT]
        self.assertTrue(self.sees_fonts(self.signed("org.example.viewer", "fonts", scope)))

    def test_a_signature_for_another_executable_does_not_count(self):
        signed = self.signed("org.example.viewer", "vendor", [])
        folder = self.system.real("/var/lib/typhon/signatures")
        (signature,) = folder.glob("*.plist")
        other = self.signed("org.example.plain", "vendor", [], capabilities=())
        (others,) = [path for path in folder.glob("*.plist") if path != signature]
        others.write_bytes(signature.read_bytes())
        self.assertTrue(self.sees_fonts(signed))
        self.assertFalse(self.sees_fonts(other))

    def test_a_changed_signature_does_not_count(self):
        program = self.signed("org.example.viewer", "vendor", [])
        (signature,) = self.system.real("/var/lib/typhon/signatures").glob("*.plist")
        whole = signature.read_bytes()
        for position in range(0, len(whole), 7):
            changed = bytearray(whole)
            changed[position] ^= 1
            signature.write_bytes(bytes(changed))
            if plistlib_reads(bytes(changed)) == plistlib_reads(whole):
                continue
            self.assertFalse(self.sees_fonts(program), position)
        signature.write_bytes(whole)
        self.assertTrue(self.sees_fonts(program))

    def test_a_key_that_is_removed_counts_no_longer(self):
        program = self.signed("org.example.viewer", "vendor", [])
        self.assertTrue(self.sees_fonts(program))
        for key in self.system.real("/etc/typhon/trusted-keys.d").iterdir():
            key.unlink()
        self.assertFalse(self.sees_fonts(program))

    def test_an_entitlement_that_is_a_string_grants_nothing(self):
        program = self.system.program()
        self.system.sign(program, "org.example.viewer", entitlements={ENTITLEMENT: "font-enumeration"})
        self.assertIsNone(self.system.checkin(program))


def plistlib_reads(content):
    try:
        return plistlib.loads(content)
    except Exception:  # whatever the reader makes of a flipped bit
        return None


if __name__ == "__main__":
    unittest.main()
