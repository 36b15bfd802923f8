"""Several faults at once: what has to hold of every run holds then too, nothing is lost, and the same command heals.

A run takes 40 combinations; ORVPATCH_FAULTS=all takes 500. Their numbers follow from the seed."""

import pytest

from .combinations import Combination
from .scenario import SCENARIOS

pytestmark = pytest.mark.faults

PARTS, SAMPLE, ALL = 20, 40, 500


def _chosen(choice):
    if choice.only:
        return [Combination(int(name.split(":")[1])) for name in choice.only if name.startswith("combination:")]
    return [Combination(choice.seed * ALL + at) for at in range(ALL if choice.all else SAMPLE)]


@pytest.mark.parametrize("part", range(PARTS))
def test_combined_faults_lose_nothing_and_are_healed(benches, choice, part):
    problems = list(filter(None, (_problem(benches, one) for one in _chosen(choice)[part::PARTS])))
    assert not problems, f"({choice.described()}):\n" + "\n".join(problems)


def _problem(benches, combination):
    try:
        combination.check(benches(combination.scenario))
    except (AssertionError, LookupError, TimeoutError) as error:
        return f"{combination.described()}: {error}"
    return None


@pytest.mark.parametrize("name", SCENARIOS)
def test_a_number_stands_for_one_combination(benches, name):
    bench, described = benches(name), []
    for _ in range(2):
        combination = Combination(7)
        combination.choose(bench)
        described.append(combination.described())
    assert described[0] == described[1]
