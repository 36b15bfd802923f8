"""System calls of apply and undo that fail: the status says how it ended, and the home can be taken back."""

import pytest

from callfaults import chosen, document_of, faults_of, is_met, is_mute, outlived, strace, try_each
from oracle import assert_taken_back, listing
from support import Patch, ProductHome

SAMPLE = 12
pytestmark = pytest.mark.usefixtures("seed")


class Bench:
    def __init__(self, ctl, patch):
        self.ctl, self.patch, self.trace = ctl, patch, patch.parent / "trace"

    def home(self):
        home = ProductHome()
        home.component("yn")
        (home.path / "tmp").chmod(0o700)
        home.write("tmp/kyn/patch.ini", "[patch]\n")  # a left-over, which is set aside
        home.write("lib/replaced", "old\n", 0o640)
        home.write("lib/second", "old\n", 0o755)
        home.start("yn")
        return home

    def run(self, *words, fault=None, **options):
        wrapper = strace(self.trace, fault.words) if fault else []
        return self.ctl.run(*words, wrapper=wrapper, timeout=120, **options)

    def faults(self, *words):
        result = self.ctl.run(*words, wrapper=strace(self.trace), timeout=120)
        assert result.status == 0, result
        return faults_of(self.trace)

    def apply(self, home, fault=None):
        return self.run("apply", home, self.patch, "--yes", "--json", fault=fault)

    def undo(self, home, fault=None):
        return self.run("undo", home, "--json", fault=fault)


@pytest.fixture
def bench(ctl, patch_dir):
    patch = Patch("yn").file("lib/replaced", "new\n").file("lib/second", "new\n").file("fresh/deep/file", "new\n")
    return Bench(ctl, patch.script("10_go.sh", when="post").write(patch_dir))


def state(home):
    return listing(home), home.instances()


def judge_apply(result, before, home, wanted, fault):
    """The status of the design, and what it promises."""
    document = document_of(result, fault)
    assert result.status in (0, 1, 2, 3, 4), result
    assert document or result.err or is_mute(fault), result
    if result.status in (0, 3, 4):
        assert document is not None, result
    if result.status == 0:
        assert document["verdict"] == "applied"
        assert {path: entry["content"] for path, entry in listing(home).items()} == wanted
    elif result.status == 1:
        assert document is None or document["verdict"] == "refused"
        assert state(home) == before
    elif result.status == 2:
        assert document is None
    else:
        assert document["verdict"] == {3: "failed", 4: "incomplete"}[result.status]
        assert result.status != 3 or document["installer"]["status"] != 0
        assert result.status != 4 or document["differences"] or document["messages"]


def take_back(bench, home, before):
    result = outlived(lambda: bench.undo(home))
    assert_taken_back(result, state(home), before)


def test_calls_of_apply_fail(bench):
    with bench.home() as home:
        faults = chosen(bench.faults("apply", home, bench.patch, "--yes", "--json"), SAMPLE)
        wanted = {path: entry["content"] for path, entry in listing(home).items()}

    def judge(fault):
        with bench.home() as home:
            before = state(home)
            judge_apply(bench.apply(home, fault), before, home, wanted, fault)
            take_back(bench, home, before)
            return is_met(bench.trace)

    try_each("apply", faults, judge)


def test_calls_of_undo_fail(bench):
    with bench.home() as home:
        assert bench.apply(home).status == 0
        faults = chosen(bench.faults("undo", home, "--json"), SAMPLE)

    def judge(fault):
        with bench.home() as home:
            before = state(home)
            assert bench.apply(home).status == 0
            result = bench.undo(home, fault)
            assert result.status in (0, 1, 2, 4), result
            assert result.out or result.err or is_mute(fault), result
            assert result.status != 0 or state(home) == before
            take_back(bench, home, before)
            return is_met(bench.trace)

    try_each("undo", faults, judge)
