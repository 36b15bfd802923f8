"""A place where the examples of the manual pages can be run."""

import os
import re
import shlex
import subprocess

import pytest

from man.pages import read_page
from support import ProductHome, remove_tree, scratch_folder

_MARK = "\x01"


class Example:
    """The home /opt/orv, the host vega and the folders below /root of the pages, under other names.

    Commands run in the folder `here`, where orvpatch is on the search path."""

    def __init__(self, program, folder):
        self.home = ProductHome(folder / "home")
        self.here = folder / "here"
        self.patches = folder / "patches"
        bin_folder = folder / "bin"
        for path in (self.here, self.patches, bin_folder):
            path.mkdir()
        (bin_folder / "orvpatch").write_text(f'#!/bin/sh\nexec {shlex.join(program.argv)} "$@"\n')
        (bin_folder / "orvpatch").chmod(0o755)
        self.environment = {**os.environ, "PATH": f"{bin_folder}:{os.environ['PATH']}", "LC_ALL": "C"}
        self.names = {
            "/opt/orv": str(self.home.path),
            "/root/patches": str(self.patches),
            "/root/check": str(folder / "check"),
            "PATH=/usr/sbin": f"PATH={bin_folder}:/usr/sbin",
            "vega": os.uname().nodename.partition(".")[0],
        }

    def real(self, text):
        for name, value in self.names.items():
            text = re.sub(rf"\b{name}\b" if name.isalnum() else re.escape(name), lambda _: value, text)
        return text

    def shown(self, text):
        """Output as a page shows it: under the page's names, and with one moment for all."""
        for name, value in self.names.items():
            text = text.replace(value, name)
        text = re.sub(r"\d\d/\d\d/\d{4} \d\d:\d\d:\d\d", "11/21/2026 14:02:33", text)
        text = re.sub(r"^(ERROR|INFO |TRACE) [\d:]{8} \((\w+),\d+\)", r"\1 14:02:33 (\2,0)", text, flags=re.M)
        text = re.sub(r"\| \w+ +\| 11/21", "| root            | 11/21", text)
        return "\n".join(line.rstrip() for line in text.rstrip("\n").split("\n"))

    def write(self, files):
        """Puts file examples where the page says, those without a folder into `here`."""
        for path, content in files.items():
            target = self.here / self.real(path)
            target.parent.mkdir(parents=True, exist_ok=True)
            target.write_text(self.real(content))
            target.chmod(0o755 if path.endswith(".sh") else 0o644)

    def install_products(self):
        """The two products of the registry's page; nothing runs yet."""
        self.write({path: text for path, text in read_page("orv-registry.5").files.items() if "/registry/" in path})

    def run(self, steps):
        """Runs a session in one shell. Every command must succeed, and where the session shows output, each
        must print what is shown, nothing included. Returns what was printed."""
        script = "".join(f"{self.real(step.command)}\nprintf '{_MARK}%d{_MARK}' $?\n" for step in steps)
        done = subprocess.run(
            ["bash", "-c", script],
            cwd=self.here,
            env=self.environment,
            text=True,
            stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE,
            stderr=subprocess.STDOUT,
            timeout=60,
        )
        pieces = done.stdout.split(_MARK)
        outputs, statuses = pieces[:-1:2], pieces[1::2]
        assert statuses == ["0"] * len(steps), done.stdout
        if any(step.output for step in steps):
            assert [self.shown(output) for output in outputs] == [self.shown(step.output) for step in steps]
        return outputs


@pytest.fixture
def example(program):
    folder = scratch_folder()
    made = Example(program, folder)
    yield made
    made.home.close()
    remove_tree(folder)
