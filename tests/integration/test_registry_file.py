"""The daemon meets a registry file that it did not write: whatever is wrong with it is said, the rest serves."""

import plistlib
import unittest

from scratch_system import FONT_FILES, REGISTRY, ScratchSystem, entry

GOOD = f"{FONT_FILES}/org.example.foundry/good.ttf"
BAD = f"{FONT_FILES}/org.example.foundry/bad.ttf"


def nested(levels):
    value = "bottom"
    for _ in range(levels):
        value = {"deeper": value}
    return value


class RegistryFile(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.viewer = self.system.program("org.example.viewer", ["font-enumeration"])

    def fonts(self, registry):
        if registry is not None:
            self.system.write_registry(registry)
        self.daemon = self.system.start()
        return self.system.checkin(self.viewer)["fontsInfo"]

    def error_lines(self):
        # The font-registry library has its own word about a registry that it cannot change.
        return [line for line in self.daemon.lines_with("error [daemon]") if "not synchronised" not in line]

    def test_a_missing_file_is_an_empty_registry_without_a_message(self):
        self.assertEqual(self.fonts(None), {})
        self.assertEqual(self.error_lines(), [])

    def test_both_encodings_serve(self):
        for encoding in (plistlib.FMT_XML, plistlib.FMT_BINARY):
            self.system.write_registry({GOOD: entry("Good", "Good Family")}, encoding)
            self.system.restart()
            self.assertEqual(set(self.system.checkin(self.viewer)["fontsInfo"]), {GOOD})

    def test_a_truncated_file_is_an_empty_registry_and_is_logged_once(self):
        whole = plistlib.dumps({GOOD: entry("Good", "Good Family")}, fmt=plistlib.FMT_XML)
        self.assertEqual(self.fonts(whole[:len(whole) // 2]), {})
        self.assertEqual(self.error_lines(), [f"error [daemon] error reading {REGISTRY}"])
        self.system.checkin(self.viewer)
        self.assertEqual(len(self.error_lines()), 1)

    def test_a_wrong_root_type_is_an_empty_registry(self):
        self.assertEqual(self.fonts(plistlib.dumps([GOOD])), {})
        self.assertEqual(self.error_lines(), [f"error [daemon] error reading {REGISTRY}"])

    def test_a_malformed_entry_is_left_out_with_one_line_and_the_rest_serves(self):
        cases = {
            "entry that is not a dictionary": {BAD: "not a dictionary"},
            "family names that are not a dictionary": {BAD: {"familyName": "Bad"}},
            "disabled that is a string": {BAD: {"familyName": {"Bad": "Bad"}, "disabled": "false"}},
            "disabled that is a number": {BAD: {"familyName": {"Bad": "Bad"}, "disabled": 0}},
            "path that is not absolute": {"bad.ttf": entry("Bad", "Bad")},
        }
        for name, bad in cases.items():
            with self.subTest(name):
                self.assertEqual(set(self.fonts({GOOD: entry("Good", "Good"), **bad})), {GOOD})
                self.assertEqual(len(self.error_lines()), 1, self.error_lines())
                self.assertIn(next(iter(bad)), self.error_lines()[0])
                self.system.stop()

    def test_many_malformed_entries_are_one_line(self):
        registry = {f"{BAD}{number}": number for number in range(5000)}
        self.assertEqual(set(self.fonts({GOOD: entry("Good", "Good"), **registry})), {GOOD})
        self.assertEqual(len(self.error_lines()), 1)
        self.assertIn("5000", self.error_lines()[0])

    def test_a_hundred_thousand_entries_serve(self):
        registry = {f"{FONT_FILES}/org.example.foundry/{number}.ttf": entry(f"F{number}", f"Family {number}")
                    for number in range(100_000)}
        self.assertEqual(len(self.fonts(registry)), 100_000)

    def test_sixty_four_levels_are_carried_through(self):
        registry = {GOOD: entry("Good", "Good", extra=nested(62))}
        self.assertEqual(self.fonts(registry)[GOOD]["extra"], nested(62))

    def test_endless_nesting_is_refused(self):
        self.assertEqual(self.fonts({GOOD: entry("Good", "Good", extra=nested(300))}), {})
        self.assertEqual(self.error_lines(), [f"error [daemon] error reading {REGISTRY}"])


if __name__ == "__main__":
    unittest.main()
