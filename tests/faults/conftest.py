"""What fails on demand: system calls, kills, signals, full and foreign disks.

A run takes a sample of the faults that changes every day; its seed is printed. In the environment
    ORVPATCH_FAULTS=all           takes them all
    ORVPATCH_FAULTS_SEED=N        takes the sample of that seed
    ORVPATCH_FAULTS_ONLY=A,B      takes these, by the names that a failing test shows
"""

import datetime
import os
import random

import pytest

pytest.register_assert_rewrite("faults.states")  # its assertions then show what differs

from .run import Bench  # noqa: E402
from .scenario import SCENARIOS  # noqa: E402

_KINDS = {5: "calls", 3: "kills", 2: "combinations"}  # by how many fields a name has


def pytest_configure(config):
    config.addinivalue_line("markers", "faults: injects failures into the program, or kills it")
    for name in Choice().only:
        scenario = name.split(":")[0]
        if name.count(":") + 1 not in _KINDS or scenario not in (*SCENARIOS, "combination"):
            raise pytest.UsageError(f"ORVPATCH_FAULTS_ONLY: there is no fault of the name {name}")


def pytest_report_header():
    return f"faults: {Choice().described()}"


class Choice:
    """Which of all faults a run takes."""

    def __init__(self):
        self.all = os.environ.get("ORVPATCH_FAULTS") == "all"
        self.seed = int(os.environ.get("ORVPATCH_FAULTS_SEED") or datetime.date.today().toordinal())
        self.only = [name for name in os.environ.get("ORVPATCH_FAULTS_ONLY", "").split(",") if name]

    def described(self):
        if self.only:
            return ", ".join(self.only)
        return "all" if self.all else f"a sample, ORVPATCH_FAULTS_SEED={self.seed}"

    def of(self, kind, top, faults, count):
        """Those to take of `faults`, of which a sample has `count`; their names begin with `top`."""
        if self.only:
            asked = {name for name in self.only if _KINDS[name.count(":") + 1] == kind and name.split(":")[0] == top}
            known = {str(fault) for fault in faults}
            assert asked <= known, f"ORVPATCH_FAULTS_ONLY: there is no fault of the name {asked - known}"
            return [fault for fault in faults if str(fault) in asked]
        return list(faults) if self.all else random.Random(self.seed).sample(faults, min(count, len(faults)))


@pytest.fixture(scope="session")
def choice():
    return Choice()


@pytest.fixture(scope="module")
def benches(program):
    """The bench of each scenario by its name, made when it is first asked for."""
    made = {}
    yield lambda name: made.get(name) or made.setdefault(name, Bench(program, name))
    for bench in made.values():
        bench.close()
