"""Every call of the program that can fail, failing: each error at each call, alone and with all that follow.

The program meets the fault, its children do not. What must come of it is worked out from the step in which
the call was made; see rules.py for the calls and prediction.py for the road.
"""

import pytest

from .check import Run, replayed
from .rules import RULES
from .scenario import SCENARIOS

pytestmark = pytest.mark.faults

PARTS = 20
SAMPLE = {"install": 100, "report": 40, "failure": 60}


@pytest.mark.parametrize("part", range(PARTS))
@pytest.mark.parametrize("name", SCENARIOS)
def test_a_failing_call_has_the_specified_end(benches, choice, name, part):
    bench = benches(name)
    taken = choice.of(bench.injections, SAMPLE[name])[part::PARTS]
    problems = [problem for injection in taken for problem in _problems(bench, injection)]
    assert not problems, f"{len(problems)} of {len(taken)} ({choice.described()}):\n" + "\n".join(problems)


def _problems(bench, injection):
    run = Run(bench, injection)
    try:
        run.judge()
    except (AssertionError, LookupError) as error:
        yield f"{injection}: {error}"
    finally:
        run.close()


@pytest.mark.parametrize("name", SCENARIOS)
def test_every_call_has_a_rule(benches, name):
    bench = benches(name)
    assert bench.injections
    for _ in replayed(bench):
        pass  # a call without a rule is reported by the look-up itself


def test_every_rule_is_about_a_call(benches):
    used = {rule for name in SCENARIOS for rule in replayed(benches(name))}
    assert [rule for rule in RULES if rule not in used] == []
