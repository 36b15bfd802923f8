"""The program killed before every call that changes the home: the home is then in one of the states that
docs/recovery.md lists, and the same command again does what that page says of the state."""

import os
import signal

import pytest

from . import kills
from .scenario import NEW_LEVEL, NEW_MODE

pytestmark = pytest.mark.faults

PARTS = 10
SAMPLE = {"install": 20, "report": 6}


class KilledRun:
    """A run that was killed, what it left, and the same command again."""

    def __init__(self, bench, kill):
        self.bench, self.kill, self.home = bench, kill, bench.scenario.make_home()
        self.before = self.home.tree()
        killed = self._command(wrapper=["strace", "-o", "/dev/null", "-e", kill.expression])
        assert killed.status == -signal.SIGKILL
        kills.settle(self.home)

    def _command(self, **options):
        arguments = self.bench.scenario.arguments(self.home, self.bench.path)
        return self.bench.program.run(*arguments, cwd=self.bench.folder / "start", timeout=60, **options)

    def check(self):
        """Asserts all that the page says; returns the states by patch."""
        states = [kills.states_of(self.home, facts) for facts in self.bench.scenario.patches]
        self._check_states(states)
        self._check_log()
        if self.bench.scenario.action == "-i":
            self._check_repetition(states)
        else:
            self._check_repeated_report()
        return states

    def _check_states(self, states):
        undocumented = set().union(*states) - kills.documented_states()
        assert not undocumented, f"states that the page does not tell of: {undocumented}"
        for index, found in enumerate(states):
            stages = found - {"temporary-left"}
            if index < self.kill.patch and self.kill.step not in ("load", "initialize", "component"):
                assert stages == {"applied"}
            elif index > self.kill.patch:
                assert stages == {"nothing-applied"}
            else:
                assert stages and stages <= kills.POSSIBLE[self.kill.step], f"{stages} in step {self.kill.step}"
        self._check_nothing_is_lost()

    def _check_nothing_is_lost(self):
        """Every file is there, or its new content still waits under tmp."""
        for facts in self.bench.scenario.patches:
            for place, states in kills.file_states(self.home, facts).items():
                if "file-missing" in states:
                    assert self.home.read(f"{facts.temp}/updated_files/{place}") == facts.new_content(place)

    def _check_log(self):
        """The log names every instance that does not run."""
        stops = "".join(f"{text}\n" for text in self.home.log().messages())
        for code, name in self._stopped():
            words = [*(["-o", name] if name else []), "stop", code[1:]]
            assert "".join(f"cmdArray[{at}]: {word}\n" for at, word in enumerate(words, 1)) in stops

    def _stopped(self):
        return set().union(*(kills.stopped(self.home, facts) for facts in self.bench.scenario.patches))

    def _check_repetition(self, states):
        stopped, left = self._stopped(), self.home.tree()
        for facts, found in zip(self.bench.scenario.patches, states):
            if "level-empty" in found:
                refused = self._command()
                assert refused.status in (9, 32), refused
                kills.restore_level(self.home, facts)
        done = self._command()
        assert (done.status, done.err) == (0, b"")
        assert self._stopped() == stopped, "a rerun starts what it has stopped, and nothing else"
        for facts, found in zip(self.bench.scenario.patches, states):
            self._check_healed(facts, found, left)
        for code, name in stopped:
            self.home.start(code[1:], name)
        assert not self._stopped()

    def _check_healed(self, facts, found, left):
        tree = self.home.tree()
        assert self.home.level(facts.code[1:]) == NEW_LEVEL
        assert [line.result for line in self.home.history() if line.product == facts.code][-1] == "PASS"
        for place in facts.replaced + facts.added:
            assert (place, _shown(tree[place])) == (place, _as_repeated(left.get(place), facts.new_content(place)))
        stages = kills.states_of(self.home, facts) - {"instances-stopped"}
        assert stages == {"applied"} | found & LASTING | _spoiled(found)

    def _check_repeated_report(self):
        """A report changes nothing but tmp and the log, killed or not."""
        done = self._command()
        assert (done.status, done.err) == (0, b"")
        assert self._without_records(self.home.tree()) == self._without_records(self.before)

    @staticmethod
    def _without_records(tree):
        return {path: entry for path, entry in tree.items() if not path.startswith(("patchlogs/orvpatch.log"))}


# What the same command leaves as it is: it makes no directory that is there, and no agent is told of a result
# that it did not wait for.
LASTING = {"directory-closed", "result-file-empty"}


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


def _problem(bench, kill, state=None):
    """What is wrong with the killed run; the state, if one is given, must be among those that it leaves."""
    run = KilledRun(bench, kill)
    try:
        found = run.check()
        assert state is None or state in found[kill.patch], f"{state} is not in {found}"
    except AssertionError as error:
        return f"{kill} in {kill.step} of patch {kill.patch}: {error}"
    finally:
        run.home.close()
    return None


def test_the_page_tells_of_every_state():
    possible = set().union(*kills.POSSIBLE.values()) | {"temporary-left"}
    assert kills.documented_states() == possible == set(kills.EXAMPLES)


@pytest.mark.parametrize("state", kills.EXAMPLES)
def test_each_state_is_reached_and_healed(benches, state):
    bench = benches("install")
    assert _problem(bench, kills.example(kills.kills_of(bench), state), state) is None


@pytest.mark.parametrize("part", range(PARTS))
@pytest.mark.parametrize("name", SAMPLE)
def test_a_killed_run_is_healed_as_documented(benches, choice, name, part):
    bench = benches(name)
    taken = choice.of(kills.kills_of(bench), SAMPLE[name])[part::PARTS]
    problems = list(filter(None, (_problem(bench, kill) for kill in taken)))
    assert not problems, f"({choice.described()}):\n" + "\n".join(problems)
