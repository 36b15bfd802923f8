"""The program killed before every call that changes the home: the home is then in one of the states that
docs/recovery.md lists, and the same command again does what that page says of the state."""

import signal

import pytest

from . import kills
from .run import Run
from .states import Aftermath, documented_states

pytestmark = pytest.mark.faults

PARTS = 10
SAMPLE = {"install": 20, "report": 6}


def _check_stages(kill, states):
    """Patches before the one that was being applied are applied, those after it are not."""
    for index, found in enumerate(states):
        stages = found - {"temporary-left"}
        if index < kill.patch and kill.step not in ("load", "initialize", "registry"):
            assert stages == {"applied"}
        elif index > kill.patch:
            assert stages == {"nothing-applied"}
        else:
            assert stages and stages <= kills.POSSIBLE[kill.step], f"{stages} in step {kill.step}"


def _problem(bench, kill, state=None):
    """What is wrong with the killed run; the state, if one is given, must be among those that it leaves."""
    run = Run(bench, [kill])
    try:
        assert run.result.status == -signal.SIGKILL
        kills.settle(run.home)
        aftermath = Aftermath(bench, run.home, run.before)
        aftermath.check()
        _check_stages(kill, aftermath.states)
        assert state is None or state in aftermath.states[kill.patch], f"{state} is not in {aftermath.states}"
        aftermath.check_repetition()
    except AssertionError as error:
        return f"{kill} in {kill.step} of patch {kill.patch}: {error}"
    finally:
        run.close()
    return None


def test_the_page_tells_of_every_state():
    possible = set().union(*kills.POSSIBLE.values()) | {"temporary-left"}
    assert documented_states() == possible == set(kills.EXAMPLES)


@pytest.mark.parametrize("state", kills.EXAMPLES)
def test_each_state_is_reached_and_healed(benches, state):
    bench = benches("install")
    assert _problem(bench, kills.example(kills.kills_of(bench), state), state) is None


@pytest.mark.parametrize("part", range(PARTS))
@pytest.mark.parametrize("name", SAMPLE)
def test_a_killed_run_is_healed_as_documented(benches, choice, name, part):
    bench = benches(name)
    taken = choice.of("kills", name, kills.kills_of(bench), SAMPLE[name])[part::PARTS]
    problems = list(filter(None, (_problem(bench, kill) for kill in taken)))
    assert not problems, f"({choice.described()}):\n" + "\n".join(problems)
