"""Debian packages of a sample application, and a package database of their own to install them into."""

import os
import pathlib
import plistlib
import shutil
import subprocess

from scratch_system import BIN, ENTITLEMENT, PATIENCE

PACKAGING = pathlib.Path(__file__).resolve().parents[2] / "packaging"
SIGNATURES = "var/lib/typhon/signatures"


class SamplePackage:
    """A vendor's package: the program with its signature, the desktop entry and the metadata."""

    def __init__(self, system, identifier, capabilities):
        self.name = identifier.lower()
        self.identifier = identifier
        self.program = f"/usr/lib/{identifier}/{identifier}"
        self._system = system
        self._capabilities = capabilities
        # Shell commands that run before an upgrade replaces the files.
        self.before_upgrade = None

    def build(self, version):
        """Builds that version; gives the package file."""
        tree = self._system.folder / f"{self.name}_{version}"
        self._put_program(tree, version)
        self._put_descriptions(tree, version)
        control = tree / "DEBIAN"
        control.mkdir()
        (control / "control").write_text(
            f"Package: {self.name}\nVersion: {version}\nArchitecture: all\nMaintainer: Nobody <nobody@example.org>\n"
            f"Description: {self.identifier}\n")
        if self.before_upgrade is not None:
            (control / "prerm").write_text(
                f'#!/bin/sh\nset -e\n[ "$1" = upgrade ] || exit 0\n{self.before_upgrade}\n')
            (control / "prerm").chmod(0o755)
        package = tree.with_suffix(".deb")
        run("dpkg-deb", "--root-owner-group", "-Znone", "--build", tree, package)
        return package

    def _put_program(self, tree, version):
        program = tree / self.program.lstrip("/")
        program.parent.mkdir(parents=True)
        shutil.copy(BIN / "samples" / self.identifier, program)
        with program.open("ab") as file:
            file.write(f"\nversion {version}".encode())
        # Signed where it is built: the signature belongs to the package.
        entitlements = tree.with_suffix(".entitlements")
        entitlements.write_bytes(plistlib.dumps({ENTITLEMENT: self._capabilities}))
        run(BIN / "typhonctl", "--root", tree, "sign", "--key", self._system.key(), "--identifier", self.identifier,
            "--entitlements", entitlements, program)

    def _put_descriptions(self, tree, version):
        for folder, suffix in (("applications", ".desktop"), ("metainfo", ".metainfo.xml")):
            target = tree / "usr/share" / folder
            target.mkdir(parents=True)
            text = (PACKAGING / folder / f"{self.identifier}{suffix}").read_text()
            before, found, after = text.partition('<release version="')
            if found:
                text = before + found + version + after[after.index('"'):]
            (target / f"{self.identifier}{suffix}").write_text(text)


class PackageDatabase:
    """dpkg, at work under the root of a scratch system and nowhere else."""

    def __init__(self, system):
        self._root = system.root
        database = self._root / "var/lib/dpkg"
        for folder in ("info", "updates", "triggers"):
            (database / folder).mkdir(parents=True)
        (database / "status").touch()

    def start(self, *arguments):
        command = ["dpkg", f"--root={self._root}", "--force-not-root", "--force-script-chrootless", "--log=/dev/null",
                   *map(str, arguments)]
        return subprocess.Popen(command, stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                                text=True, env=environment())

    def do(self, *arguments):
        finish(self.start(*arguments))


def environment():
    return {**os.environ, "PATH": f"{os.environ['PATH']}:/usr/sbin:/sbin", "LC_ALL": "C.UTF-8"}


def finish(process):
    output, _ = process.communicate(timeout=PATIENCE)
    if process.returncode != 0:
        raise AssertionError(f"{process.args}: exit {process.returncode}: {output}")


def run(*command):
    done = subprocess.run([str(word) for word in command], capture_output=True, text=True, timeout=PATIENCE,
                          stdin=subprocess.DEVNULL, env=environment())
    if done.returncode != 0:
        raise AssertionError(f"{command}: exit {done.returncode}: {done.stdout}{done.stderr}")
