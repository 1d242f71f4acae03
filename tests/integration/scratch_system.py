"""A whole typhond system in a scratch folder: keys, signatures, fonts, preferences and the running daemon."""

import contextlib
import ctypes
import datetime
import json
import os
import pathlib
import plistlib
import select
import shutil
import signal
import socket
import subprocess
import tempfile
import threading
import time

BIN = pathlib.Path(os.environ["TYPHON_BIN_DIR"])
ENTITLEMENT = "com.vorlan.developer.user-fonts"
FONT_FILES = "/var/mobile/Library/UserFonts/FontFiles"
FONT_ASSETS = "/var/mobile/Library/UserFonts/FontAssets"
ASSET_STORE = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7"
REGISTRY = "/var/mobile/Library/UserFonts/UserFonts.plist"
PREFERENCES = "/var/mobile/Library/Preferences/com.vorlan.typhond.plist"
SERVICE = "com.vorlan.typhond"
HELPER_SERVICE = "com.vorlan.Typhon.UserFontManager"
HELPER_PID = "/run/typhon/typhon-fontmanagerd.pid"
PATIENCE = 60
MOST_IN_A_PIPE = 1 << 20


# The helper is nobody's child; so it becomes ours when it ends, to be waited for.
PR_SET_CHILD_SUBREAPER = 36
ctypes.CDLL(None).prctl(PR_SET_CHILD_SUBREAPER, 1, 0, 0, 0)


class Daemon:
    """A running typhond and what it logs."""

    def __init__(self, system, arguments=(), popen_options=None, launcher=()):
        command = [*launcher, BIN / "typhond", "--root", system.root, "--log-level", "debug", *arguments]
        self.process = subprocess.Popen(
            [str(part) for part in command], stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
            stderr=subprocess.PIPE, **(popen_options or {}))
        os.set_blocking(self.process.stderr.fileno(), False)
        self.lines = []
        self._unfinished = b""
        self._is_over = False
        self._changed = threading.Condition()
        self._reader = threading.Thread(target=self._read, daemon=True)
        self._reader.start()

    def _read(self):
        while not self._is_over:
            select.select([self.process.stderr], [], [])
            with self._changed:
                self._take()

    def _take(self):
        """Takes over all that has been logged until now. The caller locks."""
        if self._is_over:
            return
        try:
            logged = os.read(self.process.stderr.fileno(), MOST_IN_A_PIPE)
        except BlockingIOError:
            return
        self._is_over = not logged
        *lines, self._unfinished = (self._unfinished + logged).split(b"\n")
        self.lines += [line.decode(errors="replace") for line in lines]
        self._changed.notify_all()

    def wait_for_line(self, text):
        """The first log line that contains `text`; fails when it does not come."""
        def found():
            return next((line for line in self.lines if text in line), None)
        with self._changed:
            self._changed.wait_for(found, PATIENCE)
            line = found()
        if line is None:
            raise AssertionError(f"not logged: {text!r}; logged: {self.lines[-20:]}")
        return line

    def lines_with(self, text):
        """All log lines until now that contain `text`."""
        with self._changed:
            # The thread that reads may not have come to the last ones yet.
            self._take()
            return [line for line in self.lines if text in line]

    def open_files(self):
        """What its descriptors are of."""
        files = []
        for link in pathlib.Path(f"/proc/{self.process.pid}/fd").iterdir():
            with contextlib.suppress(FileNotFoundError):
                files.append(os.readlink(link))
        return files

    def kill(self, number=signal.SIGKILL):
        if self.process.poll() is None:
            self.process.send_signal(number)
        self.process.wait(PATIENCE)
        self._reader.join(PATIENCE)
        self.process.stderr.close()


class ScratchSystem:
    """Everything lies under `root`, a scratch folder that `close` removes, daemon and all."""

    def __init__(self):
        self.folder = pathlib.Path(tempfile.mkdtemp(prefix="typhon-test-"))
        self.root = self.folder / "root"
        self.daemon = None
        for directory in (FONT_FILES, FONT_ASSETS, ASSET_STORE, "/var/mobile/Library/Preferences"):
            self.real(directory).mkdir(parents=True)
        self._serial = 0
        self._keys = {}
        self._helpers = []

    def close(self):
        self.stop()
        while self._helpers:
            self._helpers.pop().stop()
        shutil.rmtree(self.folder, ignore_errors=True)

    def __enter__(self):
        return self

    def __exit__(self, *exception):
        self.close()

    def real(self, logical):
        return pathlib.Path(f"{self.root}{logical}")

    # -- commands

    def ctl(self, *arguments, check=True, program=None, **options):
        """Runs typhonctl (or a copy of it) against this system."""
        command = [program or BIN / "typhonctl", "--root", self.root, *arguments]
        options.setdefault("timeout", PATIENCE)
        options.setdefault("stdin", subprocess.DEVNULL)
        done = subprocess.run([str(part) for part in command], capture_output=True, **options)
        if check and done.returncode != 0:
            raise AssertionError(f"{command}: exit {done.returncode}: {done.stderr.decode(errors='replace')}")
        return done

    def checkin(self, program, sandboxed=False, **options):
        """What a copy of typhonctl sees when it checks in: a dictionary, or None."""
        launcher = []
        if sandboxed:
            launcher = [BIN / "typhonctl", "--root", self.root, "run", "--"]
        command = [*launcher, program, "--root", self.root, "--json", "checkin"]
        done = subprocess.run([str(part) for part in command], capture_output=True, timeout=PATIENCE,
                              stdin=subprocess.DEVNULL, **options)
        if done.returncode != 0:
            raise AssertionError(f"{command}: exit {done.returncode}: {done.stderr.decode(errors='replace')}")
        return json.loads(done.stdout)

    # -- keys and programs

    def key(self, name="vendor", trust=()):
        """A key pair, trusted with the given options of `typhonctl trust` (None: not trusted)."""
        if name not in self._keys:
            path = self.folder / f"{name}.key"
            self.ctl("keygen", "--key", path)
            if trust is not None:
                self.ctl("trust", *trust, f"{path}.pub")
            self._keys[name] = path
        return self._keys[name]

    def program(self, identifier=None, capabilities=None, key=None, entitlements=None):
        """A copy of typhonctl of its own content, signed for `identifier` (None: not signed)."""
        self._serial += 1
        path = self.folder / f"program{self._serial}"
        shutil.copy(BIN / "typhonctl", path)
        with path.open("ab") as file:
            file.write(f"\nprogram {self._serial} of {self.folder}".encode())
        if identifier is not None:
            self.sign(path, identifier, capabilities, key, entitlements)
        return path

    def sign(self, path, identifier, capabilities=None, key=None, entitlements=None, check=True):
        if entitlements is None:
            entitlements = {} if capabilities is None else {ENTITLEMENT: capabilities}
        document = self.folder / "entitlements.plist"
        document.write_bytes(plistlib.dumps(entitlements))
        if key is None:
            platform = identifier.startswith("com.vorlan.")
            key = self.key("platform", ["--platform"]) if platform else self.key()
        return self.ctl("sign", "--key", key, "--identifier", identifier, "--entitlements", document, path,
                        check=check)

    # -- applications

    def install_application(self, identifier):
        """Makes the identifier an installed application's; whoever is none loses what the daemon keeps for it."""
        path = self.real(f"/usr/share/applications/{identifier}.desktop")
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_text("[Desktop Entry]\nType=Application\nName=Sample\n")

    def remove_application(self, identifier):
        self.real(f"/usr/share/applications/{identifier}.desktop").unlink()

    # -- registry and preferences

    def write_registry(self, registry, format=plistlib.FMT_BINARY):
        """Writes the registry; the providers it names are installed."""
        path = self.real(REGISTRY)
        fonts = registry if isinstance(registry, dict) else ()
        relative = [font[len(FONT_FILES) + 1:] for font in fonts if font.startswith(f"{FONT_FILES}/")]
        for provider in {font.split("/")[0] for font in relative if "/" in font}:
            self.install_application(provider)
        if isinstance(registry, bytes):
            path.write_bytes(registry)
        else:
            path.write_bytes(plistlib.dumps(registry, fmt=format))

    def font_file(self, directory, name, content=None, tree=FONT_FILES):
        """Puts a file into a font tree; gives its logical path."""
        logical = f"{tree}/{directory}/{name}"
        path = self.real(logical)
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(content if content is not None else f"font {name} of {directory}".encode())
        if tree == FONT_ASSETS:
            # What is in no asset of the store would be unregistered when the daemon starts.
            stored = self.real(f"{ASSET_STORE}/{directory}/AssetData/{name}")
            stored.parent.mkdir(parents=True, exist_ok=True)
            os.link(path, stored)
        return logical

    def write_preferences(self, preferences):
        """Writes the preferences; the clients that have a record in them are installed."""
        for identifier in preferences.get("issues", ()):
            self.install_application(identifier)
        self.real(PREFERENCES).write_bytes(plistlib.dumps(preferences, fmt=plistlib.FMT_BINARY))

    def preferences(self):
        path = self.real(PREFERENCES)
        return plistlib.loads(path.read_bytes()) if path.exists() else {}

    # -- the daemon

    def socket_path(self, service=SERVICE):
        return self.real(f"/run/typhon/{service}")

    def start(self, *arguments, launcher=(), **popen_options):
        """Starts the daemon, by `launcher` if there is one, and waits for its services."""
        self.daemon = Daemon(self, arguments, popen_options, launcher)
        for service in (SERVICE, f"{SERVICE}.file-access", f"{SERVICE}.sandboxes", f"{SERVICE}.identities",
                        HELPER_SERVICE):
            self.wait_for_socket(self.socket_path(service))
        return self.daemon

    def wait_until_started(self):
        """Waits for the last that the daemon opens in its start and keeps, where there were no preferences before."""
        eventually(lambda: "version" in self.preferences())
        eventually(lambda: "anon_inode:inotify" in self.daemon.open_files())

    def wait_for_socket(self, path):
        deadline = time.monotonic() + PATIENCE
        while time.monotonic() < deadline:
            if self.daemon.process.poll() is not None:
                raise AssertionError(f"typhond ended: {self.daemon.lines}")
            with contextlib.closing(socket.socket(socket.AF_UNIX)) as probe:
                try:
                    probe.connect(str(path))
                    return
                except OSError:
                    time.sleep(0.01)
        raise AssertionError(f"no socket {path}: {self.daemon.lines}")

    def await_asset_watch(self):
        """The store is watched some time after the first synchronisation: touches it until that is noticed."""
        touched = self.real(ASSET_STORE) / "touched"

        def is_noticed():
            touched.touch()
            touched.unlink()
            return self.daemon.lines_with("FontAssetsEventStreamCallback - ")
        eventually(is_noticed)

    def stop(self):
        if self.daemon is not None:
            self.daemon.kill()
            self.daemon = None
        self.kill_helper()

    def helper_pid(self):
        """The process identifier of the font registry's helper, or None when it does not run."""
        try:
            pid = int(self.real(HELPER_PID).read_text())
            os.kill(pid, 0)
        except (OSError, ValueError):
            return None
        return pid

    def kill_helper(self):
        """Kills the helper, if it runs, and waits until it is gone."""
        pid = self.helper_pid()
        if pid is not None:
            pidfd = os.pidfd_open(pid)
            # While this one lives, that is nobody else's file: the next one may write its own at once.
            self.real(HELPER_PID).unlink(missing_ok=True)
            signal.pidfd_send_signal(pidfd, signal.SIGKILL)
            select.select([pidfd], [], [], PATIENCE)
            os.close(pidfd)
            with contextlib.suppress(ChildProcessError):
                os.waitpid(pid, 0)

    def start_bus(self, window=0.5):
        """Runs a system bus with the notification relay on it until `close`; gives the bus (see scratch_bus)."""
        import scratch_bus
        bus = scratch_bus.Bus(self)
        self._helpers.append(bus)
        self._helpers.append(scratch_bus.Relay(self, window))
        scratch_bus.wait_for_relay(bus)
        return bus

    def restart(self, *arguments):
        self.stop()
        return self.start(*arguments)


def eventually(condition):
    """Waits until the condition holds; fails when it never does."""
    deadline = time.monotonic() + PATIENCE
    while not condition():
        if time.monotonic() > deadline:
            raise AssertionError("it never came to pass")
        time.sleep(0.01)


def in_seconds(seconds):
    """A date in a property list: so many seconds from now."""
    now = datetime.datetime.now(datetime.timezone.utc).replace(tzinfo=None)
    return now + datetime.timedelta(seconds=seconds)


def entry(postscript, family, disabled=False, **more):
    """A registry entry of a file with one face."""
    return {"familyName": {postscript: family}, "disabled": disabled, **more}
