"""log: the runs of orvpatch.log, one of them, a run at work, and logs that are broken, hostile or large."""

import json
import os
import random
import re
import shutil
import signal
import subprocess
import sys
import time

import pytest

from support import Patch, parse_log

LOG = "patchlogs/orvpatch.log"
RULE = "=" * 78 + "\n"
STEPS = [
    "initialize",
    "checkForActivePrograms",
    "checkPrereqs",
    "cleanUp",
    "extract",
    "runPrePatchScripts",
    "stopDependents",
    "runPreScripts",
    "moveFiles",
    "updateProductEXEFiles",
    "runPostScripts",
    "updatePatchVerFile",
    "startDependents",
    "startOSAgentIfNeeded",
    "updatePatchRegistry",
    "cleanUp",
]


def header(user="root", pid=4711):
    return (
        f"{RULE} ORV Patch Log File\n   System Name: host1\n   User Name:   {user}\n   Process ID:  {pid}\n"
        f"   Build Date:  3/5/07 21:48:44\n{RULE}"
    )


def line(text, clock="14:00:00", component="main", level="TRACE"):
    return f"{level:5} {clock} ({component},12): {text}\n"


def install_lines(path="/p/kyn_lpp266_vema_fp0002.tar"):
    return "".join(line(f"arg[{place}]: {word}") for place, word in enumerate(("orvpatch", "-h", "/home", "-i", path)))


def runs(ctl, home, *words):
    return ctl.document("log", home, *words)["runs"]


def agent_patch(number=1, **fields):
    return Patch("yn", fixpack=f"fp{number:04}", level=f"061000{number:02}", **fields).file("bin/tool")


# --- what the installer writes -------------------------------------------------------------------------


def test_every_run_of_a_real_log(ctl, home, program, write):
    home.component("yn")
    good, bad = write(agent_patch()), write(agent_patch(2).script("fail.sh", when="post", status=5))
    assert program.report(home, good).status == 0
    assert program.install(home, good).status == 0
    assert program.install(home, bad).status == 23
    assert program.install(home, "/nowhere").status == 30
    assert program.run("-i", good, "-h", home).status == 0
    log = home.log()
    found = runs(ctl, home)
    assert [run["number"] for run in found] == [1, 2, 3, 4, 5]
    assert [run["action"] for run in found] == ["report", "install", "install", "install", "install"]
    assert [run["status"] for run in found] == [0, 0, 23, 30, 0]
    assert [run["path"] for run in found] == [str(good), str(good), str(bad), "/nowhere", str(good)]
    assert [run["pid"] for run in found] == [head.pid for head in log.headers]
    assert [run["user"] for run in found] == [head.user for head in log.headers]
    assert [run["lines"] for run in found] == [len(run.lines) for run in log.runs]
    assert [run["errors"] for run in found] == [sum(entry.level == "ERROR" for entry in run.lines) for run in log.runs]
    assert not any(run["mixed"] for run in found)


def test_the_day_comes_from_the_history(ctl, home, program, write):
    home.component("yn")
    assert program.report(home, write(agent_patch())).status == 0
    assert program.install(home, write(agent_patch())).status == 0
    month, day, year = home.history()[0].date[:10].split("/")
    report, install = runs(ctl, home)
    assert (report["date"], report["dateFrom"]) == (None, None)
    assert install["date"] == f"{year}-{month}-{day}"
    assert install["dateFrom"] == "patchlogs/patches.hist, line 6"


def test_steps_of_an_installation(ctl, home, program, write):
    home.component("yn")
    patch = write(agent_patch().file("bin/other").script("wait.sh", when="pre"))
    assert program.install(home, patch).status == 0
    document = ctl.document("log", home, "1")
    assert [step["step"] for step in document["steps"]] == STEPS
    assert {step["result"] for step in document["steps"]} == {"passed"}
    assert {step["patch"] for step in document["steps"]} == {patch.name}
    assert [step["files"] for step in document["steps"] if step["files"]] == [2]
    commands = [child["command"] for child in document["children"]]
    assert ["tar", "-xf", str(patch)] in commands
    assert ["wait.sh"] in commands
    assert {child["status"] for child in document["children"] if child["command"][0] in ("tar", "wait.sh")} == {0}
    messages = home.log().runs[0].lines
    assert [
        (message["level"], message["component"], message["line"], message["text"]) for message in document["messages"]
    ] == [(entry.level.lower(), entry.component, entry.line, entry.message) for entry in messages]


def test_the_step_that_failed(ctl, home, program, write):
    home.component("yn")
    patch = agent_patch().script("fail.sh", when="pre", status=7, err="no space\nleft")
    assert program.install(home, write(patch)).status == 21
    document = ctl.document("log", home, "last")
    results = {step["step"]: step["result"] for step in document["steps"]}
    assert results["runPreScripts"] == "failed"
    assert results["stopDependents"] == "passed"
    assert "moveFiles" not in results
    assert [child["status"] for child in document["children"] if child["command"] == ["fail.sh"]] == [7]


def test_steps_of_several_patches(ctl, home, program, write, patch_dir):
    home.component("yn")
    home.component("pt")
    agent, portal = write(agent_patch()), write(Patch("pt", target="veps", level="06100001").file("bin/portal"))
    assert program.install(home, patch_dir).status == 0
    moves = [step["patch"] for step in ctl.document("log", home, "1")["steps"] if step["step"] == "moveFiles"]
    assert moves == [portal.name, agent.name]


def test_steps_of_a_report(ctl, home, program, write):
    home.component("yn")
    assert program.report(home, write(agent_patch())).status == 0
    document = ctl.document("log", home, "1")
    assert [step["step"] for step in document["steps"]] == [
        "initialize",
        "checkForActivePrograms",
        "checkPrereqs",
        "cleanUp",
        "printDependentsList",
        "extract",
        "listFiles",
        "listProductEXEFiles",
        "cleanUp",
    ]


def test_what_is_shown(ctl, home, program, write):
    home.component("yn")
    assert program.install(home, write(agent_patch())).status == 0
    assert program.install(home, write(agent_patch(2).script("fail.sh", when="pre", status=7))).status == 21
    assert [run["number"] for run in runs(ctl, home, "--errors")] == [2]
    steps = ctl.document("log", home, "2", "--steps")
    assert steps["messages"] == []
    errors = ctl.document("log", home, "2", "--errors")
    assert len(errors["messages"]) == errors["errors"] > 0
    assert {message["level"] for message in errors["messages"]} == {"error"}
    assert ctl.document("log", home, "--steps")["number"] == 2
    out = ctl.run("log", home, "2").out.decode()
    assert "runPreScripts" in out and "fail.sh" in out and "Errors" in out
    assert "Errors" not in ctl.run("log", home, "2", "--steps").out.decode()
    assert "moveFiles" not in ctl.run("log", home, "2", "--errors").out.decode()


def test_the_list_on_a_terminal(ctl, home):
    home.write(LOG, header() + install_lines() + line("main = 0", "23:00:01") + header(pid=5) + line("x"))
    lines = ctl.run("log", home).out.decode().splitlines()
    assert lines[0].split() == [
        "RUN",
        "DATE",
        "TIME",
        "USER",
        "PID",
        "ACTION",
        "STATUS",
        "ERRORS",
        "LINES",
        "REMARK",
        "PATH",
    ]
    assert lines[1].split() == [
        "1",
        "-",
        "14:00:00",
        "root",
        "4711",
        "install",
        "0",
        "0",
        "6",
        "/p/kyn_lpp266_vema_fp0002.tar",
    ]
    assert "did not end" in lines[2]


def test_it_changes_nothing(ctl, home, program, write):
    home.component("yn")
    assert program.install(home, write(agent_patch())).status == 0
    before = home.tree()
    for words in ((), ("1",), ("--steps",), ("--follow",), ("--errors", "--json")):
        assert ctl.run("log", home, *words).status == 0
    assert home.tree() == before


# --- durations -----------------------------------------------------------------------------------------


def test_seconds_over_midnight(ctl, home):
    home.write(
        LOG,
        header()
        + line("PatchProcessor::extract() entry", "23:59:50", "patchprocessor")
        + line("PatchProcessor::extract() = 1", "00:00:05", "patchprocessor")
        + line("main = 0", "00:00:06"),
    )
    document = ctl.document("log", home, "1")
    assert [step["seconds"] for step in document["steps"]] == [15]
    assert document["seconds"] == 16


# --- broken, cut, rotated ------------------------------------------------------------------------------


@pytest.fixture
def real_log(home, program, write):
    """The log of three runs, with a message of several lines."""
    home.component("yn")
    for number in (1, 2, 3):
        program.install(home, write(agent_patch(number).script("say.sh", when="pre", out="a\nb\n\n")))
    return home.read(LOG)


def test_a_log_that_is_cut_anywhere(ctl, home, real_log):
    chance = random.Random(20261121)
    for _ in range(25):
        first, last = sorted(chance.randrange(len(real_log) + 1) for _ in range(2))
        text = real_log[first:last]
        home.write(LOG, text)
        expected = parse_log(text)
        found = runs(ctl, home)
        assert [run["pid"] for run in found if run["number"] > 0] == [head.pid for head in expected.headers]
        assert [run["lines"] for run in found if run["number"] > 0] == [len(run.lines) for run in expected.runs]
        assert (found[0]["number"] == 0 if found else not text) or not expected.preamble


def test_what_precedes_the_first_header_is_run_nought(ctl, home):
    home.write(LOG, "end of a line\n" + line("x") + line("main = 0") + header() + line("y"))
    first, second = runs(ctl, home)
    assert (first["number"], first["user"], first["pid"], first["status"], first["strays"]) == (0, None, None, 0, 1)
    assert (second["number"], second["ended"]) == (1, False)
    assert ctl.document("log", home, "0")["lines"] == 2


def test_two_runs_at_the_same_time(ctl, home, program, patch_dir):
    for code in ("yn", "ox"):
        home.component(code)
    paths = [
        Patch(code, level="06100001").file(f"bin/{code}").script("wait.sh", when="pre").write(patch_dir)
        for code in ("yn", "ox")
    ]
    processes = [
        subprocess.Popen([*program.argv, "-h", str(home.path), "-i", str(path)], stdout=subprocess.DEVNULL)
        for path in paths
    ]
    assert [process.wait() for process in processes] == [0, 0]
    found = runs(ctl, home)
    assert sorted(run["pid"] for run in found) == sorted(process.pid for process in processes)
    assert sum(run["lines"] for run in found) == sum(len(run.lines) for run in home.log().runs)


def test_lines_of_another_run_are_told(ctl, home):
    home.write(LOG, header(pid=1) + line("a") + header(pid=2) + line("main = 0") + line("b") + line("main = 21"))
    first, second = runs(ctl, home)
    assert (first["ended"], first["mixed"], first["status"]) == (False, False, None)
    assert (second["ended"], second["mixed"], second["status"]) == (True, True, None)
    assert b"mixed with another run" in ctl.run("log", home).out


def test_an_empty_log(ctl, home):
    home.write(LOG, b"")
    assert runs(ctl, home) == []
    assert ctl.run("log", home).out == b"No runs.\n"


@pytest.mark.parametrize("words", (("1",), ("last",), ("--steps",), ("--follow",)))
def test_a_run_that_is_not_there(ctl, home, words):
    home.write(LOG, b"")
    result = ctl.run("log", home, *words, "--json")
    assert (result.status, result.out) == (2, b"")


def test_without_a_log(ctl, home):
    result = ctl.run("log", home, "--json")
    assert (result.status, result.out) == (2, b"")
    assert LOG.encode() in result.err


@pytest.mark.parametrize("words", (("x",), ("-1",), ("99999999999",), ("1", "--follow"), ("1", "2")))
def test_wrong_usage(ctl, home, words):
    home.write(LOG, header())
    result = ctl.run("log", home, *words)
    assert (result.status, result.out) == (2, b"")


def test_a_log_that_is_no_file_cannot_be_judged(ctl, home):
    home.mkdir(LOG)
    result = ctl.run("log", home)
    assert (result.status, result.out) == (2, b"")


# --- hostile -------------------------------------------------------------------------------------------


def test_control_characters_reach_no_terminal(ctl, home):
    evil = "\x1b]0;x\x07\x1b[2J\x00\r\x7f"
    home.write(
        LOG,
        header(user=evil)
        + install_lines(evil)
        + line(evil, level="ERROR")
        + line("PatchProcessor::extract() entry", component="patchprocessor")
        + line("runCommand entry", component="process.cpp")
        + line(f"cmdArray[0]: {evil}", component="process.cpp")
        + line("runCommand exit", component="process.cpp")
        + line("main = 1"),
    )
    for words in ((), ("1",), ("--follow",)):
        out = ctl.run("log", home, *words).out
        assert not set(out) & (set(range(32)) - {10}) and 0x7F not in out
    assert ctl.document("log", home, "1")["user"] == evil


def test_bytes_that_are_no_utf8(ctl, home):
    home.write(LOG, (header() + line("X")).encode().replace(b"X", b"caf\xe9\\"))
    assert ctl.document("log", home, "1")["messages"][0]["text"] == "caf\\xE9\\\\"


def test_a_line_of_a_megabyte(ctl, home):
    home.write(LOG, header() + line("x" * 2**20, level="ERROR") + line("main = 0"))
    document = ctl.document("log", home, "1")
    first = document["messages"][0]
    assert len(first["text"]) + first["omitted"] == 2**20
    assert document["status"] == 0


def test_random_bytes(ctl, home):
    chance = random.Random(12)
    pieces = [
        header().encode(),
        line("main = 0").encode(),
        RULE.encode(),
        b"\n",
        b"\0",
        b"TRACE ",
        b"): ",
        line("PatchProcessor::extract() entry", component="patchprocessor").encode(),
    ]
    for _ in range(15):
        home.write(LOG, b"".join(chance.choice([*pieces, chance.randbytes(40)]) for _ in range(60)))
        for run in runs(ctl, home):
            ctl.document("log", home, str(run["number"]))


# --- large ---------------------------------------------------------------------------------------------

# A child of a process that is small itself: a child's peak includes that of the process that started it.
PEAK = (
    "import os,sys\npid = os.posix_spawn(sys.argv[2], sys.argv[2:], os.environ)\n"
    "_, status, usage = os.wait4(pid, 0)\nopen(sys.argv[1], 'w').write(str(usage.ru_maxrss))\n"
    "sys.exit(os.waitstatus_to_exitcode(status))\n"
)
SMALL_RUN = header() + install_lines() + line("main = 30") * 1
LARGE_RUN = header() + install_lines() + line("PatchProcessor::moveFile() entry" + "x" * 60) * 4000 + line("main = 0")


@pytest.mark.parametrize("run", (SMALL_RUN, LARGE_RUN), ids=("small runs", "large runs"))
def test_memory_does_not_grow_with_the_log(ctl, home, scratch, run):
    if b"__asan_init" in ctl.program.binary.read_bytes():
        pytest.skip("the address sanitizer takes memory of its own")
    if ctl.program.runner:
        pytest.skip("the emulator takes memory of its own")
    size = 2**30 if os.environ.get("ORVPATCH_FULL") else 2**25
    block = run.encode() * max(1, 2**20 // len(run))
    with open(home.path / LOG, "wb") as log:
        for _ in range(size // len(block) + 1):
            log.write(block)
    count = (size // len(block) + 1) * max(1, 2**20 // len(run))
    for words in (["--json"], []):
        wrapper = [sys.executable, "-I", "-S", "-c", PEAK, str(scratch / "peak")]
        with open(scratch / "out", "wb") as out:
            done = subprocess.run([*wrapper, *ctl.program.argv, "log", str(home.path), *words], stdout=out, check=False)
        assert done.returncode == 0
        with open(scratch / "out", "rb") as out:
            assert sum(1 for _ in out) == count + (4 if words else 1)
        peak = int((scratch / "peak").read_text()) * 1024
        assert peak < 64 * 2**20, f"{peak / 2**20:.0f} MiB"


# --- a run at work -------------------------------------------------------------------------------------


@pytest.fixture
def at_work(home, program, write):
    """at_work(status) starts an installation with a command that waits for the file `go` in the home; returns
    its process."""
    started = []

    def start(status=0):
        home.component("yn")
        script = f"while [ ! -e {home.path}/go ]; do sleep 0.05; done\nexit {status}\n"
        patch = agent_patch().file("bin/other").script("wait.sh", when="pre_patch")
        path = write(patch)
        repack(path, "wait.sh", script)
        process = subprocess.Popen(
            [*program.argv, "-h", str(home.path), "-i", str(path)],
            stdout=subprocess.DEVNULL,
            stderr=subprocess.DEVNULL,
            start_new_session=True,
        )
        started.append(process)
        until(lambda: home.exists(LOG) and b"cmdArray[0]: wait.sh" in home.read(LOG))
        return process

    yield start
    for process in started:
        if process.poll() is None:
            os.killpg(process.pid, signal.SIGKILL)
        process.wait()


def repack(archive, name, text):
    """Replaces the content of a member that tar extracts last: a later member of the same name wins."""
    folder = archive.parent / "repack"
    folder.mkdir()
    (folder / name).write_text(f"#!/bin/sh\n{text}")
    (folder / name).chmod(0o755)
    subprocess.run(["tar", "-rf", archive, "-C", folder, name], check=True)
    shutil.rmtree(folder)


def until(condition, seconds=30):
    limit = time.monotonic() + seconds
    while not condition():
        assert time.monotonic() < limit, "it does not come"
        time.sleep(0.02)


@pytest.fixture
def follower(ctl, home, scratch):
    """follower(*words) starts `log HOME --follow`; its output goes to the file `follower.out`."""
    started = []

    def start(*words):
        with open(scratch / "follower.out", "wb") as out:
            process = subprocess.Popen([*ctl.program.argv, "log", str(home.path), "--follow", *words], stdout=out)
        process.out = scratch / "follower.out"
        started.append(process)
        return process

    yield start
    for process in started:
        process.kill()
        process.wait()


@pytest.mark.parametrize("status, expected", ((0, 0), (3, 1)))
def test_following_a_run_until_it_ends(home, at_work, follower, status, expected):
    run = at_work(status)
    process = follower()
    until(lambda: b"extract" in process.out.read_bytes())
    assert process.poll() is None
    assert b"runPrePatchScripts" not in process.out.read_bytes()
    home.write("go")
    assert process.wait(30) == expected
    assert run.wait() == (0 if status == 0 else 22)
    out = process.out.read_text()
    assert re.search(r"runPrePatchScripts +(passed|failed)", out)
    assert f"status {0 if status == 0 else 22}," in out


def test_following_prints_one_document(home, at_work, follower):
    at_work()
    process = follower("--json")
    home.write("go")
    assert process.wait(30) == 0
    document = json.loads(process.out.read_text())
    assert document["status"] == 0
    assert [step["step"] for step in document["steps"]] == STEPS


def test_following_ends_with_a_run_that_is_killed(at_work, follower):
    run = at_work()
    process = follower()
    until(lambda: b"extract" in process.out.read_bytes())
    os.killpg(run.pid, signal.SIGKILL)
    run.wait()
    assert process.wait(30) == 1
    assert "did not end" in process.out.read_text()


def test_following_a_run_that_was_killed_long_ago(ctl, home):
    home.write(LOG, header(pid=os.getpid()) + line("x"))
    os.utime(home.path / LOG, (10**9, 10**9))  # this process is younger
    assert ctl.run("log", home, "--follow", timeout=20).status == 1


def test_following_goes_on_in_a_new_log(home, at_work, follower):
    at_work()
    process = follower()
    until(lambda: b"extract" in process.out.read_bytes())
    (home.path / LOG).rename(home.path / f"{LOG}.1")
    home.write("go")
    assert process.wait(30) == 0
    assert "updatePatchVerFile" in process.out.read_text()


def test_following_what_has_ended_does_not_wait(ctl, home, program, write):
    home.component("yn")
    assert program.install(home, write(agent_patch())).status == 0
    assert ctl.run("log", home, "--follow", timeout=20).status == 0
