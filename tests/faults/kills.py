"""The program killed before one of its calls, and the state in which the home is then.

The states are those of docs/recovery.md, by the names of its table.
"""

import os
import re
import time
from pathlib import Path
from typing import NamedTuple

from .scenario import EXTRACTED_MODE, NEW_LEVEL, OLD_LEVEL, RUNNING, old_content

PAGE = Path(__file__).resolve().parents[2] / "docs/recovery.md"

_RESULT_FILE = "vmaorv6/agentdepot/rc.txt"
_LEVEL = re.compile(r"Version string provided: (\w+)\.")
_PREREQ = re.compile(r"Added preReqALL value = (.*)")
_CHANGING = ("chmod", "chown", "link", "mkdir", "rmdir", "unlink", "write")

# States that a kill in a step may leave. "temporary-left" may come with each of them.
_FILES = {"files-mixed", "file-missing", "file-twice", "file-attributes", "directory-closed"}
POSSIBLE = {
    "start": {"nothing-applied"},
    "load": {"nothing-applied"},
    "initialize": {"nothing-applied"},
    "component": {"nothing-applied"},
    "clean-up": {"nothing-applied", "applied"},
    "extract": {"nothing-applied"},
    "pre_patch": {"nothing-applied"},
    "stop": {"nothing-applied", "instances-stopped"},
    "pre": {"nothing-applied", "instances-stopped"},
    "move": {"nothing-applied", "instances-stopped", "level-old", *_FILES},
    "post": {"instances-stopped", "level-old"},
    "level": {"instances-stopped", "level-old"},
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
    step: str
    patch: int
    path: str  # the call's last path, empty without one

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
            last = call.paths[-1] if call.paths else ""
            kills.append(Kill(bench.scenario.name, call.name, call.ordinal, context.step, context.patch, last))
        context.after(call)
    return kills


def _changes(call, context):
    if call.is_log or call.error:
        return False
    if call.name in ("clone", "wait4"):
        return context.command is not None and context.command[0] != "ps" and "ps -ef" not in context.command[-1]
    inside = call.path.startswith(context.home + "/") or not os.path.isabs(call.given[0] if call.given else "/")
    if call.name == "openat":
        return inside and "O_WRONLY" in call.flags
    return call.name in _CHANGING and inside and not call.path.startswith("pipe:")


def settle(home, seconds=30):
    """Waits until the children of a killed program have ended; the agents that they started live on."""
    limit = time.monotonic() + seconds
    while _children(home):
        if time.monotonic() > limit:
            raise TimeoutError(f"children of the killed program still run: {_children(home)}")
        time.sleep(0.01)


def _children(home):
    started = set(map(int, home.read("control/started").split()))
    mark = f"\0QUILLHOME={home.prefix}\0".encode()
    return [int(entry.name) for entry in os.scandir("/proc")
            if entry.name.isdigit() and int(entry.name) not in started and mark in _environment(entry.path)]


def _environment(process):
    try:
        return b"\0" + Path(process, "environ").read_bytes()
    except OSError:
        return b""


# --- states --------------------------------------------------------------------------------------------------


def states_of(home, facts):
    """The states, as the recovery page names them, that one patch has left the home in."""
    tree = home.tree()
    files = {place: _file_states(tree, facts, place) for place in facts.replaced + facts.added}
    states = set().union(*files.values()) - {"old", "new"}
    states |= {"directory-closed" for place in facts.directories if place in tree and tree[place].mode != 0o777}
    states |= _stages(home, facts, tree, files)
    if facts.temp in tree:
        states.add("temporary-left")
    return states


def _file_states(tree, facts, place):
    entry, waiting = tree.get(place), f"{facts.temp}/updated_files/{place}" in tree
    if entry is None:
        return {"old" if place in facts.added else "file-missing"}
    if entry.content == old_content(place):
        return {"old"}
    states = {"new"}
    if waiting:
        states.add("file-twice")
    elif entry.mode == EXTRACTED_MODE:
        states.add("file-attributes")
    return states


def _stages(home, facts, tree, files):
    found = set()
    level = tree[facts.version_file].content
    records = [line for line in home.history() if line.product == facts.code]
    if not level:
        found.add("level-empty")
    if stopped(home, facts):
        found.add("instances-stopped")
    if f"{NEW_LEVEL}\n".encode() in level:
        found |= {"applied"} if records else {"history-missing"}
    elif level and all("new" in states for states in files.values()):
        found.add("level-old")
    elif level and any("new" in states or "file-missing" in states for states in files.values()):
        found.add("files-mixed")
    elif level and not found:
        found.add("nothing-applied")
    if "ox" in facts.patch.dependents and _RESULT_FILE in tree and not tree[_RESULT_FILE].content:
        found.add("result-file-empty")
    return found


def stopped(home, facts):
    """Instances that the patch stops and that do not run."""
    codes = {f"k{code}" for code in facts.patch.dependents} | {facts.code}
    wanted = {(code, name) for code in codes for name in RUNNING.get(code, ())}
    return wanted - {(f"k{code}", name) for code, name in home.instances()}


def file_states(home, facts):
    tree = home.tree()
    return {place: _file_states(tree, facts, place) for place in facts.replaced + facts.added}


def restore_level(home, facts):
    """What the page tells to do about an empty version file: its old values stand in the log."""
    messages = home.log().messages()
    start = messages.index(f"ORVComponentRegistry::buildComponent({home.path}/{facts.version_file}) entry")
    built = messages[start:messages.index("ORVComponentRegistry::buildComponent exit", start)]
    levels = [found[1] for found in map(_LEVEL.fullmatch, built) if found]
    prereqs = [found[1] for found in map(_PREREQ.fullmatch, built) if found]
    assert levels == [OLD_LEVEL]
    lines = ["desc = restored", f"VRMF = {levels[0]}", *(f"preReqALL = {prereq}" for prereq in prereqs)]
    home.write(facts.version_file, "".join(f"{line}\n" for line in lines))


# For each state a kill that leads to it, in the agent's patch: the step, the call, the end of the call's last path.
EXAMPLES = {
    "nothing-applied": ("pre_patch", "clone", ""),
    "instances-stopped": ("pre", "clone", ""),
    "files-mixed": ("move", "link", ""),
    "file-missing": ("move", "link", "home/./bin/yn"),
    "file-twice": ("move", "unlink", "updated_files/./bin/yn"),
    "file-attributes": ("move", "chmod", "/bin/yn"),
    "directory-closed": ("move", "chmod", "/lib/yn/"),
    "level-old": ("level", "openat", ""),
    "result-file-empty": ("osagent", "write", ""),
    "history-missing": ("history", "openat", ""),
    "applied": ("clean-up", "rmdir", "tmp/kyn/"),
    "temporary-left": ("extract", "wait4", ""),
}


def example(every_kill, state):
    """The last of the kills that its description fits."""
    step, call, end = EXAMPLES[state]
    patch = max(kill.patch for kill in every_kill)
    return [kill for kill in every_kill
            if (kill.patch, kill.step, kill.call) == (patch, step, call) and kill.path.endswith(end)][-1]


def documented_states():
    """First column of the page's table."""
    rows = [line.split("|") for line in PAGE.read_text(encoding="utf-8").splitlines() if line.startswith("| `")]
    return {row[1].strip().strip("`") for row in rows}
