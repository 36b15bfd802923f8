"""Runs the real program as a process."""

import atexit
import os
import pwd
import shlex
import shutil
import signal
import subprocess
from pathlib import Path
from typing import NamedTuple

from .scratch import remove_tree, scratch_folder

_CHECKOUT = Path(__file__).resolve().parents[2]


class Result(NamedTuple):
    """How one run ended. A status below 0 is the signal that ended it."""

    status: int
    out: bytes
    err: bytes


class ProgramTimeout(AssertionError):
    """The program did not end in time; it and its children were killed."""


class Program:
    """The program under test: the environment variable ORVPATCH names the binary (default
    build/dev/orvpatch of this checkout), ORVPATCH_RUNNER a command to run it with, such as an emulator."""

    def __init__(self, binary=None, runner=None):
        named = binary or os.environ.get("ORVPATCH") or _CHECKOUT / "build/dev/orvpatch"
        self.binary = Path(named).absolute()
        self._copy = None
        self.runner = shlex.split(os.environ.get("ORVPATCH_RUNNER", "")) if runner is None else list(runner)
        # Found now: a test may give the program a search path without the runner.
        self.runner[:1] = [shutil.which(word) or word for word in self.runner[:1]]

    @property
    def argv(self):
        return [*self.runner, str(self.binary)]

    def argv_for(self, user):
        """A checkout may be closed to other users (below /root, say): they run a copy of the binary."""
        if user is None or all(folder.stat().st_mode & 0o001 for folder in self.binary.parents):
            return self.argv
        if self._copy is None:
            folder = scratch_folder()
            atexit.register(remove_tree, folder)
            self._copy = shutil.copy(self.binary, folder)
        return [*self.runner, self._copy]

    def run(
        self, *arguments, env=None, cwd=None, user=None, close=(), stdin=subprocess.DEVNULL, timeout=120, wrapper=()
    ):
        """Runs it with these arguments and waits for the end.

        env      variables to set, or to remove where the value is None
        user     login name to run as, with its primary group only (needs root)
        close    descriptors among 0, 1, 2 that the program shall find closed
        wrapper  command words put in front of everything, such as ["strace", "-f"]
        """
        process = subprocess.Popen(
            [*wrapper, *self.argv_for(user), *map(os.fsdecode, arguments)],
            stdin=stdin,
            stdout=subprocess.PIPE,
            stderr=subprocess.PIPE,
            cwd=cwd,
            env=_environment(env),
            start_new_session=True,
            preexec_fn=(lambda: [os.close(fd) for fd in close]) if close else None,
            **identity(user),
        )
        try:
            out, err = process.communicate(timeout=timeout)
        except subprocess.TimeoutExpired:
            os.killpg(process.pid, signal.SIGKILL)
            process.wait()
            raise ProgramTimeout(f"no end after {timeout} seconds: {shlex.join(process.args)}") from None
        return Result(process.returncode, out, err)

    def install(self, home, path, **options):
        return self.run("-h", home, "-i", path, **options)

    def report(self, home, path, **options):
        return self.run("-h", home, "-t", path, **options)

    def validate(self, home, path, **options):
        return self.run("-h", home, "-vi", path, **options)


def identity(user):
    """The options of subprocess that make a child run as this user, a login name or a number, with no
    further groups; none for the own user (None)."""
    if user is None:
        return {}
    group = user if isinstance(user, int) else pwd.getpwnam(user).pw_gid
    return {"user": user, "group": group, "extra_groups": []}


def stubs(directory, **scripts):
    """Makes programs of these names in `directory` (tar="exit 2": the text after #!/bin/sh) and returns a
    PATH value on which they come first: program.run(..., env={"PATH": stubs(folder, ps="exit 1")})."""
    folder = Path(directory)
    folder.mkdir(parents=True, exist_ok=True)
    folder.chmod(0o755)
    for name, text in scripts.items():
        (folder / name).write_text(f"#!/bin/sh\n{text}\n", encoding="utf-8")
        (folder / name).chmod(0o755)
    return f"{folder}:{os.environ['PATH']}"


def _environment(changes):
    variables = {name: value for name, value in os.environ.items() if name not in ("PATCH_DEBUG", "QUILLHOME")}
    variables.update({"LC_ALL": "C", **(changes or {})})
    return {name: value for name, value in variables.items() if value is not None}
