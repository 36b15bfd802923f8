"""What must be on disk before something else happens, read from the calls of an undisturbed installation."""

import pytest

from .check import Bench

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


def names(calls, step, end, among):
    """By product code, the calls of a step on a path that ends so, in order; `end` is asked for each patch."""
    found = {}
    for in_step, facts, call in calls:
        if in_step == step and call.name in among and call.path.endswith(end(facts)):
            found.setdefault(facts.code, []).append(call.name)
    return found


def test_the_extracted_files_are_flushed_before_the_first_old_one_goes(calls):
    order = names(calls, "move", lambda _: "", ("syncfs", "unlink", "link"))
    assert order["kqa"] == ["syncfs", "unlink", "link", "unlink"]
    assert (order["kyn"][0], order["kyn"].count("syncfs")) == ("syncfs", 1)
    flushed = [(facts.temp, call.path) for _, facts, call in calls if call.name == "syncfs"]
    assert [path.endswith(f"{temp}/updated_files") for temp, path in flushed] == [True, True]


def test_the_version_file_is_written_in_one_piece_and_flushed(calls):
    order = names(calls, "level", lambda facts: facts.version_file, ("openat", "write", "fsync", "close"))
    reading_and_writing = ["openat", "close", "openat", "write", "fsync", "close"]
    assert order == {"kqa": reading_and_writing, "kyn": reading_and_writing}


def test_the_history_line_is_flushed(calls):
    order = names(calls, "history", lambda _: "patches.hist", ("openat", "write", "fsync", "close"))
    assert order == dict.fromkeys(("kqa", "kyn"), ["openat", "write", "fsync", "close"])
