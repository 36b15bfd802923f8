"""The collection's modules, run as the engine runs them on a host, but without an engine."""

import json
import os
import signal
import subprocess
import sys
from pathlib import Path

COLLECTION = Path(__file__).resolve().parents[2] / "fleet/orv/patch"


class Modules:
    """`run("applied", home=..., patch=...)` is the module's answer. `options` stand for every call."""

    def __init__(self, folder, **options):
        self.folder, self.options, self._count = Path(folder), options, 0
        tree = self.folder / "collections/ansible_collections/orv"
        tree.mkdir(parents=True)
        (tree / "patch").symlink_to(COLLECTION)
        self.state = self.folder / "runs"

    def start(self, name, check=False, diff=False, **options):
        """Starts a module; `answer` waits for its end."""
        given = {key: str(value) if isinstance(value, os.PathLike) else value for key, value in options.items()}
        if name in ("applied", "undone"):
            given.setdefault("state_dir", str(self.state))
        given = {**self.options, **given, "_ansible_check_mode": check, "_ansible_diff": diff}
        self._count += 1
        arguments = self.folder / f"arguments-{self._count}"
        arguments.write_text(json.dumps({"ANSIBLE_MODULE_ARGS": given}))
        return subprocess.Popen(
            [sys.executable, "-m", f"ansible_collections.orv.patch.plugins.modules.{name}", arguments],
            env={**os.environ, "PYTHONPATH": str(self.folder / "collections"), "PYTHONDONTWRITEBYTECODE": "1"},
            stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE,
            stderr=subprocess.PIPE,
            text=True,
            start_new_session=True,
        )

    @staticmethod
    def answer(process, timeout=120):
        try:
            out, err = process.communicate(timeout=timeout)
        except subprocess.TimeoutExpired:
            os.killpg(process.pid, signal.SIGKILL)
            raise AssertionError(f"no end after {timeout} s: {process.communicate()}") from None
        assert out, (process.returncode, err)
        found = json.loads(out)
        assert process.returncode == (1 if found.get("failed") else 0), (process.returncode, out, err)
        return found

    def run(self, name, **options):
        """The answer of a module that ends well."""
        found = self.answer(self.start(name, **options))
        assert not found.get("failed"), found
        return found

    def fail(self, name, **options):
        """The answer of a module that fails."""
        found = self.answer(self.start(name, **options))
        assert found.get("failed"), found
        return found
