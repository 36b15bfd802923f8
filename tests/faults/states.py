"""The states that docs/recovery.md lists, by the names of its table, and what the same command makes of each."""

import os
from pathlib import Path

from .judgement import RESULT_FILE
from .scenario import EXTRACTED_MODE, NEW_LEVEL, NEW_MODE, RUNNING, old_content

PAGE = Path(__file__).resolve().parents[2] / "docs/recovery.md"

# What the same command leaves as it is: it makes no directory that is there, and no agent is told of a result
# that it did not wait for.
LASTING = {"directory-closed", "result-file-empty"}


def documented_states():
    """First column of the page's table."""
    rows = [line.split("|") for line in PAGE.read_text(encoding="utf-8").splitlines() if line.startswith("| `")]
    return {row[1].strip().strip("`") for row in rows}


def states_of(home, facts):
    """The states that one patch has left the home in."""
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
    if waiting and entry.links > 1:  # the same file, not one that was extracted once more
        states.add("file-twice")
    elif entry.mode == EXTRACTED_MODE:
        states.add("file-attributes")
    return states


def _stages(home, facts, tree, files):
    found = set()
    level = tree[facts.version_file].content
    records = [line for line in home.history() if line.product == facts.code]
    if stopped(home, facts):
        found.add("instances-stopped")
    if f"{NEW_LEVEL}\n".encode() in level:
        found |= {"applied"} if records else {"history-missing"}
    elif all("new" in states for states in files.values()):
        found.add("level-old")
    elif any("new" in states or "file-missing" in states for states in files.values()):
        found.add("files-mixed")
    elif not found:
        found.add("nothing-applied")
    if "ox" in facts.patch.dependents and RESULT_FILE in tree and not tree[RESULT_FILE].content:
        found.add("result-file-empty")
    return found


def stopped(home, facts):
    """Instances that the patch stops and that do not run."""
    wanted = {(code, name) for code in facts.dependents for name in RUNNING.get(code, ())}
    return wanted - {(f"k{code}", name) for code, name in home.instances()}


def lost_files(home, facts, repeated):
    """Files of the product that are neither there, old or new, nor wait under tmp. A repetition empties that first:
    where it was killed, the archive alone may have the file."""
    tree = home.tree()
    for place in facts.replaced + facts.added:
        entry, waiting = tree.get(place), tree.get(f"{facts.temp}/updated_files/{place}")
        whole = (old_content(place), facts.new_content(place))
        if entry is not None and entry.content not in whole:
            yield f"{place}: expected an old or a new one, found {entry.content!r}"
        if (
            entry is None
            and place in facts.replaced
            and not repeated
            and (waiting is None or waiting.content != facts.new_content(place))
        ):
            yield f"{place}: expected to wait under tmp, found {waiting}"


class Aftermath:
    """What a run that did not end well has left of a bench's scenario, and the same command again."""

    def __init__(self, bench, home, before):
        self.bench, self.home, self.before = bench, home, before
        self.patches = bench.scenario.patches
        self.states = [states_of(home, facts) for facts in self.patches]

    def check(self, repeated=False):
        """Only states that the page tells of, and nothing lost. `repeated`: by a run that was a repetition."""
        undocumented = set().union(*self.states) - documented_states()
        assert not undocumented, f"states that the page does not tell of: {undocumented}"
        lost = [problem for facts in self.patches for problem in lost_files(self.home, facts, repeated)]
        assert not lost, "; ".join(lost)
        self._check_log()

    def _check_log(self):
        """The log names every instance that does not run."""
        there = self.home.exists("patchlogs/orvpatch.log")
        told = "".join(f"{text}\n" for text in (self.home.log().messages() if there else []))
        for code, name in self._stopped():
            words = [*(["-o", name] if name else []), "stop", code[1:]]
            assert "".join(f"cmdArray[{at}]: {word}\n" for at, word in enumerate(words, 1)) in told

    def _stopped(self):
        return set().union(*(stopped(self.home, facts) for facts in self.patches))

    def _again(self):
        return self.bench.program.run(
            *self.bench.scenario.arguments(self.home, self.bench.healing_path), cwd=self.bench.start, timeout=60
        )

    def check_repetition(self):
        """The same command again does what the page says of the states."""
        if self.bench.scenario.action == "-t":
            done = self._again()
            assert (done.status, done.err) == (0, b"")
            assert _without_log(self.home.tree()) == _without_log(self.before)
            return
        stopped_before, left = self._stopped(), self.home.tree()
        done = self._again()
        assert (done.status, done.err) == (0, b"")
        assert self._stopped() == stopped_before, "a rerun starts what it has stopped, and nothing else"
        for facts, found in zip(self.patches, self.states):
            self._check_healed(facts, found, left)
        for code, name in stopped_before:
            self.home.start(code[1:], name)
        assert not self._stopped()

    def _check_healed(self, facts, found, left):
        tree = self.home.tree()
        assert self.home.level(facts.code[1:]) == NEW_LEVEL
        assert [line.result for line in self.home.history() if line.product == facts.code][-1] == "PASS"
        for place in facts.replaced + facts.added:
            assert (place, _shown(tree[place])) == (place, _as_repeated(left.get(place), facts.new_content(place)))
        stages = states_of(self.home, facts) - {"instances-stopped"}
        assert stages == {"applied"} | found & LASTING | _spoiled(found)


def _without_log(tree):
    return {path: entry for path, entry in tree.items() if not path.startswith("patchlogs/orvpatch.log")}


def _spoiled(found):
    """A file that is in place already hands on the mode that it has got."""
    return {"file-attributes"} if found & {"file-twice", "file-attributes"} else set()


def _shown(entry):
    return entry.content, entry.mode, (entry.uid, entry.gid)


def _as_repeated(entry, content):
    """A file takes over mode and owner of the one in its place, and is 0755 and the extracted one's without."""
    if entry is None:
        return content, NEW_MODE, (os.geteuid(), os.getegid())
    return content, entry.mode, (entry.uid, entry.gid)
