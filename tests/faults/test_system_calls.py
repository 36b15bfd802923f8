"""Every call of the program that can fail, failing: each error at each call, alone and with all that follow.

The program meets the fault, its children do not. judgement.py says what has to hold of every run, allowance.py
what a fault in each step may change.
"""

import pytest

from .run import Run
from .scenario import SCENARIOS

pytestmark = pytest.mark.faults

PARTS = 20
SAMPLE = {"install": 100, "report": 40, "failure": 60}


@pytest.mark.parametrize("part", range(PARTS))
@pytest.mark.parametrize("name", SCENARIOS)
def test_a_failing_call_has_an_end_that_is_allowed(benches, choice, name, part):
    bench = benches(name)
    taken = choice.of("calls", name, bench.injections, SAMPLE[name])[part::PARTS]
    problems = list(filter(None, (_problem(bench, injection) for injection in taken)))
    assert not problems, f"{len(problems)} of {len(taken)} ({choice.described()}):\n" + "\n".join(problems)


def _problem(bench, injection):
    run = Run(bench, [injection])
    try:
        struck = run.struck()
        assert struck, "the call to fail was not made"
        run.judge(struck)
    except AssertionError as error:
        return f"{injection}: {error}"
    finally:
        run.close()
    return None
