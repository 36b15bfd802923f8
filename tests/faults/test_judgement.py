"""The judgement of a run is worth something: a run that is not as it should be does not pass."""

import pytest

from .check import Bench, Run

pytestmark = pytest.mark.faults


@pytest.fixture(scope="module")
def bench(program):
    made = Bench(program, "failure")
    yield made
    made.close()


def _append(path, content):
    return lambda run: run.home.write(path, run.home.read(path) + content)


TAMPERINGS = {
    "status": lambda run: setattr(run, "result", run.result._replace(status=0)),
    "text": lambda run: setattr(run, "result", run.result._replace(err=b"\n\n\n")),
    "verdict": lambda run: setattr(run, "result", run.result._replace(out=b"")),
    "lost file": lambda run: run.home.remove("bin/yn"),
    "mode": lambda run: (run.home.path / "bin/yn").chmod(0o640),
    "content": _append("lib/yn/deep/data", b"x"),
    "open directory": lambda run: (run.home.path / "lib/yn").chmod(0o755),
    "level": _append("registry/ynlpp266.ver", b"x"),
    "history": lambda run: run.home.write("patchlogs/patches.hist", run.home.read("patchlogs/patches.hist")
                                          .replace(b"FAIL", b"PASS")),
    "result file": _append("vmaorv6/agentdepot/rc.txt", b"0"),
    "foreign file": _append("bin/QuillAgent", b"\n"),
    "new file": lambda run: run.home.write("stray"),
    "stopped agent": lambda run: run.home.stop("ox"),
    "journal": _append("journal", b"QuillAgent\x1froot\x1f/\x1f/bin\x1f/\x1fstart\x1fyn\n"),
    "directory of a script": lambda run: run.home.write("journal", run.home.read("journal").replace(
        b"/tmp/kyn\x1f", b"/tmp\x1f", 1)),
    "PATH of a script": lambda run: run.home.write("journal", run.home.read("journal").replace(
        b"/tmp/kyn:", b"/tmp:", 1)),
}


@pytest.mark.parametrize("what", TAMPERINGS)
def test_a_difference_is_noticed(bench, what):
    run = Run(bench)
    try:
        TAMPERINGS[what](run)
        with pytest.raises(AssertionError, match="expected"):
            run.judge()
    finally:
        run.close()
