"""The judgement of a run is worth something: a run that is not as it should be does not pass."""

import pytest

from .run import Bench, Run

pytestmark = pytest.mark.faults

HISTORY, LOG, RUN_INFO = "patchlogs/patches.hist", "patchlogs/orvpatch.log", "config/.ConfigData/RunInfo"


@pytest.fixture(scope="module")
def benches(program):
    made = {name: Bench(program, name) for name in ("install", "report", "failure")}
    yield made
    for bench in made.values():
        bench.close()


def append(path, content):
    return lambda run: run.home.write(path, run.home.read(path) + content)


def replace(path, old, new):
    def change(run):
        content = run.home.read(path)
        assert old in content
        run.home.write(path, content.replace(old, new, 1))

    return change


def result(**changes):
    return lambda run: setattr(run, "result", run.result._replace(**changes))


def reversed_report(run):
    lines = run.result.out.split(b"\n")
    run.result = run.result._replace(out=b"\n".join([*lines[:3], *reversed(lines[3:-4]), *lines[-4:]]))


TAMPERINGS = {
    "status": ("failure", result(status=0)),
    "text": ("failure", result(err=b"\n\n\n")),
    "another text of the same status": ("failure", result(err=b"\nUnable to run 30_post.sh\n\n")),
    "verdict": ("failure", result(out=b"")),
    "lost file": ("failure", lambda run: run.home.remove("bin/yn")),
    "mode": ("failure", lambda run: (run.home.path / "bin/yn").chmod(0o640)),
    "content": ("failure", append("lib/yn/deep/data", b"x")),
    "closed directory": ("failure", lambda run: (run.home.path / "lib/yn").chmod(0o755)),
    "level": ("failure", append("registry/ynlpp266.ver", b"x")),
    "history": ("failure", replace(HISTORY, b"FAIL", b"PASS")),
    "result file": ("failure", append("vmaorv6/agentdepot/rc.txt", b"0")),
    "foreign file": ("failure", append("bin/QuillAgent", b"\n")),
    "new file": ("failure", lambda run: run.home.write("stray")),
    "stopped agent": ("failure", lambda run: run.home.stop("ox")),
    "journal": ("failure", append("journal", b"QuillAgent\x1froot\x1f/\x1f/bin\x1f/\x1fstart\x1fyn\n")),
    "directory of a script": ("failure", replace("journal", b"/tmp/kyn\x1f", b"/tmp\x1f")),
    "PATH of a script": ("failure", replace("journal", b"/tmp/kyn:", b"/tmp:")),
    "temporary directory after success": ("install", lambda run: run.home.write("tmp/kyn/patch.ini")),
    "no temporary directory after a failure": ("failure", lambda run: run.home.remove("tmp/kyn")),
    "a file gone from the temporary directory": ("failure", lambda run: run.home.remove("tmp/kyn/20_save.sh")),
    "empty log": ("install", lambda run: run.home.write(LOG)),
    "no log": ("install", lambda run: run.home.remove(LOG)),
    "log without its end": ("install", replace(LOG, b": main = 0\n", b": main = \n")),
    "user in the history": ("install", replace(HISTORY, b" | PASS | ", b" | PASS | x")),
    "date in the history": ("install", replace(HISTORY, b"/20", b"/19")),
    "target in the history": ("install", replace(HISTORY, b" | vema | ", b" | vems | ")),
    "header of the history": ("install", replace(HISTORY, b"# Format", b"# format")),
    "order of the report": ("report", reversed_report),
    "junk in the run information": ("install", append(RUN_INFO, b"junk\n")),
    "row of another host": ("install", append(RUN_INFO, b"other|yn|1|three|root\n")),
    "stray file in patchlogs": ("install", lambda run: run.home.write("patchlogs/stray")),
    "temporary directory after a report": ("report", lambda run: run.home.write("tmp/kyn/patch.ini")),
    "mode of the version file": ("install", lambda run: (run.home.path / "registry/ynlpp266.ver").chmod(0o600)),
}


@pytest.mark.parametrize("what", TAMPERINGS)
def test_a_difference_is_noticed(benches, what):
    name, tamper = TAMPERINGS[what]
    run = Run(benches[name])
    try:
        run.judge()
        tamper(run)
        with pytest.raises(AssertionError, match="expected"):
            run.judge()
    finally:
        run.close()
