"""What must be on disk before something else happens, read from the calls of an undisturbed installation."""

import pytest

from .calls import opens_for_writing
from .run import Bench

pytestmark = pytest.mark.faults


@pytest.fixture(scope="module")
def calls(program):
    """(step, patch, call) of everything that the installation of two patches does, but for the log's lines."""
    bench = Bench(program, "install")
    run = bench.undisturbed[0]
    context, found = run.new_context(), []
    for call in run.calls:
        if not call.is_log:
            found.append((context.step, context.facts, call))
        context.after(call)
    yield found
    bench.close()


def kinds(calls, step, end, among):
    """By product code, what the calls of a step on a path that ends so are for, in order; `end` is asked for each
    patch."""
    found = {}
    for in_step, facts, call in calls:
        if in_step == step and call.kind in among and call.path.endswith(end(facts)) and not call.error:
            found.setdefault(facts.code, []).append("open to write" if opens_for_writing(call) else call.kind)
    return found


def test_the_extracted_files_are_flushed_before_the_first_old_one_goes(calls):
    order = kinds(calls, "move", lambda _: "", ("flush", "remove", "link"))
    assert {code: made[0] for code, made in order.items()} == {"kqa": "flush", "kyn": "flush"}
    flushed = [
        call.path
        for step, facts, call in calls
        if (step, call.kind) == ("move", "flush") and call.path.endswith(f"{facts.temp}/updated_files")
    ]
    assert len(flushed) == 2


def test_the_version_file_is_written_in_one_piece_and_flushed(calls):
    order = kinds(calls, "level", lambda facts: facts.version_file, ("open", "write", "flush", "close"))
    for code in ("kqa", "kyn"):
        assert order[code][order[code].index("open to write") :] == ["open to write", "write", "flush", "close"]


def test_the_history_line_is_flushed(calls):
    order = kinds(calls, "history", lambda _: "patches.hist", ("open", "write", "flush", "close"))
    assert order == dict.fromkeys(("kqa", "kyn"), ["open to write", "write", "flush", "close"])
