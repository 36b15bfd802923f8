"""The program killed before one of its calls, and the states in which that may leave the home."""

import contextlib
import os
import signal
import time
from pathlib import Path
from typing import NamedTuple

from .calls import changes_something

# States that a kill in a step may leave. "temporary-left" may come with each of them.
_FILES = {"files-mixed", "file-missing", "file-twice", "file-attributes", "directory-closed"}
POSSIBLE = {
    "start": {"nothing-applied"},
    "load": {"nothing-applied"},
    "initialize": {"nothing-applied"},
    "registry": {"nothing-applied"},
    "clean-up": {"nothing-applied", "applied"},
    "extract": {"nothing-applied"},
    "pre_patch": {"nothing-applied"},
    "stop": {"nothing-applied", "instances-stopped"},
    "pre": {"nothing-applied", "instances-stopped"},
    "move": {"nothing-applied", "instances-stopped", "level-old", *_FILES},
    "post": {"instances-stopped", "level-old"},
    "level": {"instances-stopped", "level-old", "history-missing"},
    "restart": {"instances-stopped", "history-missing"},
    "osagent": {"instances-stopped", "history-missing", "result-file-empty"},
    "history": {"history-missing"},
    "between": {"applied"},
    "list": {"nothing-applied"},
}


class Kill(NamedTuple):
    """The program is killed when it is about to make this call, or while the child runs that it waits for."""

    scenario: str
    call: str
    ordinal: int
    kind: str
    step: str
    patch: int
    path: str  # the call's last path, normalised; empty without one

    spares_the_log = False

    def __str__(self):
        return f"{self.scenario}:{self.call}:{self.ordinal}"

    @property
    def expression(self):
        return f"inject={self.call}:signal=SIGKILL:when={self.ordinal}"


def kills_of(bench):
    """A kill before every call of the undisturbed run that changes the home, be it through a child."""
    run = bench.undisturbed[0]
    context = run.new_context()
    kills = []
    for call in run.calls:
        if _changes(call, context):
            path = os.path.normpath(call.paths[-1]) if call.paths else ""
            kills.append(
                Kill(bench.scenario.name, call.name, call.ordinal, call.kind, context.step, context.patch, path)
            )
        context.after(call)
    return kills


def _changes(call, context):
    if call.is_log or call.error or not changes_something(call):
        return False
    if call.kind in ("child", "wait"):
        return context.command is not None and context.command[0] != "ps" and "ps -ef" not in context.command[-1]
    return any(os.path.normpath(path).startswith(f"{context.home}/") for path in call.paths)


def settle(home, seconds=30):
    """Waits until the children of a killed program have ended; the agents that they started live on. An agent whose
    control script was killed before it had recorded it is ended: no record leads to it."""
    limit = time.monotonic() + seconds
    while children := _children(home):
        for pid in children:
            if f"{home.path}/control/processes/".encode() in _read(pid, "cmdline"):
                with contextlib.suppress(ProcessLookupError):
                    os.kill(pid, signal.SIGKILL)
        if time.monotonic() > limit:
            raise TimeoutError(f"children of the killed program still run: {children}")
        time.sleep(0.01)


def _children(home):
    started = set(map(int, home.read("control/started").split()))
    mark = f"\0QUILLHOME={home.prefix}\0".encode()
    return [
        int(name)
        for name in os.listdir("/proc")
        if name.isdigit() and int(name) not in started and mark in b"\0" + _read(name, "environ")
    ]


def _read(pid, file):
    try:
        return Path("/proc", str(pid), file).read_bytes()
    except OSError:
        return b""


# For each state a kill that leads to it, in the agent's patch: the step, what the call is for, the end of its path.
EXAMPLES = {
    "nothing-applied": ("pre_patch", "child", ""),
    "instances-stopped": ("pre", "child", ""),
    "files-mixed": ("move", "link", ""),
    "file-missing": ("move", "link", "home/bin/yn"),
    "file-twice": ("move", "remove", "updated_files/bin/yn"),
    "file-attributes": ("move", "attributes", "/bin/yn"),
    "directory-closed": ("move", "attributes", "/lib/yn"),
    "level-old": ("level", "open", ""),
    "result-file-empty": ("osagent", "write", ""),
    "history-missing": ("history", "open", ""),
    "applied": ("clean-up", "remove", "tmp/kyn"),
    "temporary-left": ("extract", "wait", ""),
}


def example(every_kill, state):
    """The last of the kills that its description fits."""
    step, kind, end = EXAMPLES[state]
    patch = max(kill.patch for kill in every_kill)
    return [
        kill
        for kill in every_kill
        if (kill.patch, kill.step, kill.kind) == (patch, step, kind) and kill.path.endswith(end)
    ][-1]
