"""The commands of typhonctl that need no daemon, and what they say when there is none."""

import base64
import datetime
import json
import os
import pathlib
import plistlib
import stat
import subprocess
import unittest

from scratch_system import BIN, FONT_FILES, ScratchSystem, entry

COMMANDS = ("keygen", "trust", "sign", "run", "checkin", "open", "monitor", "ledger", "deletions", "schedule-deletion",
            "keep-provider", "preferences", "plist", "fonts", "request", "agent", "assets", "analytics",
            "applications", "post-notification")
PATH = f"{FONT_FILES}/org.example.foundry/a.ttf"


class Commands(unittest.TestCase):
    def setUp(self):
        self.system = ScratchSystem()
        self.addCleanup(self.system.close)
        self.ctl = self.system.ctl

    def assert_fails(self, status, *arguments, **options):
        done = self.ctl(*arguments, check=False, **options)
        self.assertEqual((done.returncode, done.stdout), (status, b""), done.stderr)
        self.assertGreaterEqual(len(done.stderr.splitlines()), 2, "an error says what to do")
        return done.stderr.decode()

    def json(self, *arguments, **options):
        return json.loads(self.ctl("--json", *arguments, **options).stdout)

    # -- usage

    def test_every_command_has_help(self):
        for command in COMMANDS:
            self.assertIn(b"Usage: typhonctl", self.ctl(command, "--help").stdout)

    def test_help_lists_exactly_the_commands_there_are(self):
        lines = self.ctl("--help").stdout.decode().split("Subcommands:\n")[1].splitlines()
        self.assertEqual([line.split()[0] for line in lines if line], list(COMMANDS))

    def test_wrong_usage_is_told_from_failure(self):
        self.assert_fails(2)
        self.assertIn("nonsense", self.assert_fails(2, "nonsense"))
        self.assert_fails(2, "checkin", "--nonsense")
        self.assert_fails(2, "run")
        self.assert_fails(2, "run", "--nonsense", "true")
        self.assert_fails(2, "fonts")
        self.assert_fails(2, "preferences", "set", "key")
        self.assert_fails(2, "preferences", "set", "key", "[1")
        self.assert_fails(2, "preferences", "set", "key", "x", "--type", "nonsense")

    def test_without_a_daemon_they_say_how_to_start_it(self):
        for arguments in (["checkin"], ["open", PATH], ["monitor"], ["schedule-deletion", PATH],
                          ["run", "--", "true"]):
            self.assertIn("Start typhond", self.assert_fails(1, *arguments))

    # -- keys and signatures

    def test_keygen_makes_a_secret_and_a_public_key(self):
        key = self.system.folder / "key"
        self.ctl("keygen", "--key", key)
        self.assertEqual(stat.S_IMODE(key.stat().st_mode), 0o600)
        public = pathlib.Path(f"{key}.pub")
        self.assertNotEqual(key.read_bytes(), public.read_bytes())

    def test_keygen_replaces_no_file(self):
        for existing in ("key", "key.pub"):
            path = self.system.folder / existing
            path.write_text("mine")
            self.assert_fails(1, "keygen", "--key", self.system.folder / "key")
            self.assertEqual(path.read_text(), "mine")
            self.assertEqual([name for name in ("key", "key.pub") if (self.system.folder / name).exists()],
                             [existing])
            path.unlink()

    def test_trust_takes_a_public_key_only(self):
        key = self.system.key(trust=None)
        self.assert_fails(1, "trust", key)
        self.assert_fails(1, "trust", self.system.folder / "missing.pub")
        self.assertIn("/etc/typhon/trusted-keys.d/", self.json("trust", f"{key}.pub")["trusted"])

    def test_the_options_of_trust_can_be_repeated(self):
        key = self.system.key(trust=None)
        stored = self.json("trust", "--identifiers", "org.a.", "--entitlements", "x", "--identifiers", "org.b.",
                           f"{key}.pub")["trusted"]
        scope = plistlib.loads(self.system.real(stored).read_bytes())
        self.assertEqual((scope["identifiers"], scope["entitlements"]), (["org.a.", "org.b."], ["x"]))

    def test_sign_refuses_what_it_cannot_sign_with(self):
        key = self.system.key()
        program = self.system.program()
        document = self.system.folder / "list.plist"
        document.write_bytes(plistlib.dumps(["not", "a", "dictionary"]))
        sign = ["sign", "--key", key, "--identifier", "org.example.a"]
        self.assert_fails(1, *sign, self.system.folder / "missing")
        self.assert_fails(1, *sign, self.system.folder)
        self.assert_fails(1, *sign, "--entitlements", document, program)
        self.assert_fails(1, *sign, "--entitlements", self.system.folder / "missing", program)
        self.assert_fails(1, "sign", "--key", f"{key}.pub", "--identifier", "org.example.a", program)
        self.assert_fails(1, "sign", "--key", key, "--identifier", "", program)
        self.assertFalse(any(self.system.real("/var/lib/typhon/signatures").glob("*.plist"))
                         if self.system.real("/var/lib/typhon/signatures").exists() else False)

    def test_sign_stores_one_signature_for_each_content(self):
        program = self.system.program()
        first = self.json("sign", "--key", self.system.key(), "--identifier", "org.example.a", program)
        again = self.json("sign", "--key", self.system.key(), "--identifier", "org.example.b", program)
        self.assertEqual(first, again)
        self.assertTrue(self.system.real(first["signature"]).exists())

    # -- preferences and ledger

    def test_preferences_come_back_as_they_were_set(self):
        values = {"version": 3, "deleteDelay": 1.5, "on": True, "text": "some text",
                  "issues": {"org.example.writer": ["U/x/a.ttf"]}}
        for key, value in values.items():
            self.ctl("preferences", "set", key, value if key == "text" else json.dumps(value))
        self.assertEqual(self.json("preferences", "get"), values)
        self.assertEqual(self.system.preferences(), values)
        self.assertEqual(self.json("preferences", "get", "version"), 3)

    def test_a_preference_has_the_type_that_was_given(self):
        for text, kind, value in (("5", "real", 5.0), ("5", "string", "5"), ("AP8=", "data", b"\0\xff"),
                                  ("2026-01-31T12:00:00Z", "date", datetime.datetime(2026, 1, 31, 12))):
            self.ctl("preferences", "set", "key", text, "--type", kind)
            self.assertEqual(self.system.preferences()["key"], value)
            self.assertIs(type(self.system.preferences()["key"]), type(value))

    def test_a_change_of_one_preference_keeps_the_others(self):
        self.system.write_preferences({"other": [1, 2], "key": 1})
        self.ctl("preferences", "set", "key", "2")
        self.assertEqual(self.system.preferences(), {"other": [1, 2], "key": 2})
        self.ctl("preferences", "set", "key", "--remove")
        self.assertEqual(self.system.preferences(), {"other": [1, 2]})

    def test_a_missing_preference_is_an_error(self):
        self.assertIn("nothing", self.assert_fails(1, "preferences", "get", "nothing"))

    def test_preferences_that_cannot_be_read_are_an_error(self):
        self.system.write_preferences({})
        self.system.real("/var/mobile/Library/Preferences/com.vorlan.typhond.plist").write_bytes(b"garbage")
        self.assert_fails(1, "preferences", "get")
        self.assert_fails(1, "ledger")
        self.assert_fails(1, "deletions")

    def test_the_ledger_gives_whole_paths(self):
        self.system.write_preferences({"issues": {"org.example.writer": ["U/x/a.ttf", "A/y/b.ttf", "/c.ttf"]}})
        self.assertEqual(self.json("ledger"), {"org.example.writer": [
            f"{FONT_FILES}/x/a.ttf", "/var/mobile/Library/UserFonts/FontAssets/y/b.ttf", "/c.ttf"]})
        self.assertIn(f"{FONT_FILES}/x/a.ttf", self.ctl("ledger").stdout.decode())

    # -- deletions and providers

    def test_deletions_shows_the_schedule_in_the_order_of_its_dates(self):
        self.assertEqual(self.json("deletions"), {})
        self.assertEqual(self.ctl("deletions").stdout, b"Nothing is scheduled for deletion.\n")
        self.system.write_preferences({"delete": {
            f"{PATH}1": datetime.datetime(2100, 1, 2), PATH: datetime.datetime(2000, 1, 1), f"{PATH}3": "never"}})
        self.assertEqual(set(self.json("deletions")), {PATH, f"{PATH}1"})
        lines = self.ctl("deletions").stdout.decode().splitlines()
        self.assertEqual(lines[1].split(), ["2000-01-01T00:00:00Z", "overdue", PATH])
        self.assertEqual(lines[2].split()[0], "2100-01-02T00:00:00Z")

    def test_a_kept_provider_gets_a_desktop_entry_that_can_be_taken_away(self):
        entry_file = self.system.real("/usr/local/share/applications/org.example.own.desktop")
        self.ctl("keep-provider", "org.example.own")
        self.ctl("keep-provider", "org.example.own")
        text = entry_file.read_text()
        self.assertIn("Type=Application\n", text)
        self.assertIn("NoDisplay=true\n", text)
        self.ctl("keep-provider", "--undo", "org.example.own")
        self.assertFalse(entry_file.exists())
        self.assert_fails(1, "keep-provider", "--undo", "org.example.own")

    def test_a_programs_own_desktop_entry_is_left_alone(self):
        entry_file = self.system.real("/usr/local/share/applications/org.example.own.desktop")
        entry_file.parent.mkdir(parents=True)
        entry_file.write_text("[Desktop Entry]\nType=Application\n")
        self.assert_fails(1, "keep-provider", "org.example.own")
        self.assert_fails(1, "keep-provider", "--undo", "org.example.own")
        self.assertEqual(entry_file.read_text(), "[Desktop Entry]\nType=Application\n")

    def test_an_identifier_that_is_no_file_name_cannot_be_kept(self):
        for identifier in ("", "../org.example.own", ".hidden", "a/b", "new\nline", "x" * 300):
            self.assert_fails(1, "keep-provider", "--", identifier)

    # -- registry and property lists

    def test_fonts_list_shows_the_registry(self):
        self.assertEqual(self.json("fonts", "list"), {})
        registry = {PATH: entry("A", "Family A"), f"{PATH}2": entry("B", "Not \x1b[2J", disabled=True)}
        self.system.write_registry(registry)
        self.assertEqual(self.json("fonts", "list"), registry)
        lines = self.ctl("fonts", "list").stdout.decode().splitlines()
        self.assertEqual(lines[1].split(), ["Family", "A", "A", "on", PATH])
        self.assertIn("\\x1B[2J", lines[2])
        self.assertIn("off", lines[2])

    def test_fonts_list_refuses_a_malformed_registry(self):
        self.system.write_registry(b"garbage")
        self.assert_fails(1, "fonts", "list")
        self.system.write_registry(plistlib.dumps([PATH]))
        self.assert_fails(1, "fonts", "list")

    def test_plist_prints_and_converts_both_forms(self):
        value = {"data": b"\0\xff", "list": [1, 2.5, True, "text"], "date": datetime.datetime(2026, 1, 31, 12)}
        shown = {"data": base64.b64encode(b"\0\xff").decode(), "list": [1, 2.5, True, "text"],
                 "date": "2026-01-31T12:00:00Z"}
        for encoding in (plistlib.FMT_XML, plistlib.FMT_BINARY):
            document = plistlib.dumps(value, fmt=encoding)
            path = self.system.folder / "any.plist"
            path.write_bytes(document)
            self.assertEqual(self.json("plist", path), shown)
            self.assertIn("<2 bytes: 00 ff>", self.ctl("plist", path).stdout.decode())
            for option in ("--xml", "--binary"):
                self.assertEqual(plistlib.loads(self.ctl("plist", option, path).stdout), value)
            self.assertEqual(json.loads(self.ctl("--json", "plist", "-", stdin=None, input=document).stdout), shown)

    def test_plist_refuses_what_is_none(self):
        path = self.system.folder / "none.plist"
        path.write_bytes(b"<plist><dict>")
        self.assert_fails(1, "plist", path)
        self.assert_fails(1, "plist", self.system.folder / "missing")
        self.assert_fails(1, "plist", self.system.folder)
        pipe = self.system.folder / "pipe"
        os.mkfifo(pipe)
        self.assert_fails(1, "plist", pipe)

    def test_output_that_cannot_be_written_is_an_error(self):
        self.system.write_preferences({"key": 1})
        with open("/dev/full", "wb") as full:
            done = subprocess.run([str(BIN / "typhonctl"), "--root", str(self.system.root), "preferences", "get"],
                                  stdout=full, stderr=subprocess.PIPE, timeout=60)
        self.assertEqual(done.returncode, 1)


if __name__ == "__main__":
    unittest.main()
