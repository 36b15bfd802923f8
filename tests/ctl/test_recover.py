"""recover: the states of docs/recovery.md, told and fixed. Each is made by a real run that is killed, and judged
independently by the tests of the page itself."""

import os
import signal
import stat
import subprocess
import time
from collections import Counter

import pytest

from faults import kills
from faults.judgement import RESULT_FILE
from faults.run import Bench, Run
from faults.scenario import EXTRACTED_MODE, NEW_LEVEL, OLD_LEVEL, REPLACED_MODE, REPLACED_OWNER
from faults.states import documented_states, states_of, stopped
from oracle import listing
from support import Patch

LEFT_TO_A_REPETITION = {"nothing-applied", "files-mixed", "level-old", "history-missing", "applied"}
# What a command of a patch does until the file `go` is in the home.
WAIT = 'while [ ! -e "$quill_home/go" ]; do sleep 0.05; done'
IN_FILES = ("files-mixed", "file-missing", "file-twice", "file-attributes", "directory-closed")


@pytest.fixture(scope="module", name="bench")
def bench_fixture(program):
    made = Bench(program, "install")
    yield made
    made.close()


def told(document):
    return {(state["state"], state["path"]) for state in document["states"]}


def unfixed(document):
    return {state["state"] for state in document["states"] if not state["fixed"]}


def expected(home, patches):
    """(state, path) as the page's own tests see them; the paths of single files are checked for what they are."""
    found = set()
    for facts in patches:
        for state in states_of(home, facts):
            if state == "instances-stopped":
                found |= {(state, f"{code} {name}".strip()) for code, name in stopped(home, facts)}
            elif state == "temporary-left":
                found.add((state, facts.temp))
            elif state == "result-file-empty":
                found.add((state, RESULT_FILE))
            elif state == "history-missing":
                found.add((state, "patchlogs/patches.hist"))
            elif state == "directory-closed":
                found |= {(state, place) for place in facts.directories
                          if home.exists(place) and mode_of(home, place) != 0o777}
            elif state.startswith("file-"):
                found |= {(state, place) for place in files_in(home, facts, state)}
            else:
                found.add((state, facts.version_file))
    return found


def files_in(home, facts, state):
    for place in facts.replaced + facts.added:
        waiting = home.exists(f"{facts.temp}/updated_files/{place}")
        if state == "file-missing":
            is_so = not home.exists(place) and place in facts.replaced
        elif not home.exists(place) or home.read(place) != facts.new_content(place):
            is_so = False
        elif state == "file-twice":
            is_so = waiting and (home.path / place).stat().st_nlink > 1
        else:
            is_so = not waiting and mode_of(home, place) == EXTRACTED_MODE
        if is_so:
            yield place


def mode_of(home, place):
    return stat.S_IMODE((home.path / place).lstat().st_mode)


def attributes_of(home, place):
    status = (home.path / place).lstat()
    return stat.S_IMODE(status.st_mode), status.st_uid, status.st_gid


def neighbours(home, place):
    """Mode, owner and group that most of the files beside it have, of several the least; nothing without any."""
    folder = (home.path / place).parent
    found = Counter(attributes_of(home, path.relative_to(home.path)) for path in folder.iterdir()
                    if path.is_file() and path.name != os.path.basename(place))
    return min(found, key=lambda attributes: (-found[attributes], attributes)) if found else None


def check_no_record(document):
    assert [document[field] for field in ("id", "started", "ended", "verdict", "phase")] == [None] * 5


@pytest.mark.parametrize("state", kills.EXAMPLES)
def test_a_killed_run_is_told_fixed_and_repeated(bench, ctl, state):
    run = Run(bench, [kills.example(kills.kills_of(bench), state)])
    home = run.home
    try:
        assert run.result.status == -signal.SIGKILL
        kills.settle(home)
        wanted = expected(home, bench.scenario.patches)
        assert state in {name for name, _ in wanted}
        before = listing(home)
        sound = {name for name, _ in wanted} <= {"nothing-applied", "applied"}
        document = ctl.document("recover", home, status=0 if sound else 1)
        check_no_record(document)
        assert told(document) == wanted
        assert not any(entry["fixed"] for entry in document["states"])
        assert listing(home) == before
        broken = {path for name, path in wanted if name in ("file-missing", "file-twice", "file-attributes")}
        right = {path: neighbours(home, path) for path in broken}
        replaced = {place for facts in bench.scenario.patches for place in facts.replaced}
        left = {name for name, _ in wanted} & LEFT_TO_A_REPETITION
        document = ctl.document("recover", home, "--fix", status=0 if left <= {"nothing-applied", "applied"} else 1)
        assert told(document) == wanted and unfixed(document) == left
        for path in broken:
            attributes = attributes_of(home, path)
            assert attributes == (right[path] if path in replaced and right[path] else (0o755, *attributes[1:])), path
        assert {name for name, _ in expected(home, bench.scenario.patches)} <= LEFT_TO_A_REPETITION
        assert home.instances() == [("ox", ""), ("yn", "one"), ("yn", "two")]
        again = bench.program.run("-h", home, "-i", bench.path, cwd=bench.start)
        assert again.status == 0
        assert {name for name, _ in expected(home, bench.scenario.patches)} == {"applied"}
        assert ctl.document("recover", home)["states"] == []
    finally:
        run.close()


@pytest.mark.parametrize("state", IN_FILES)
def test_a_killed_transaction_is_told_and_fixed_by_its_record(bench, ctl, state, scratch):
    kill = kills.example(kills.kills_of(bench), state)
    home = bench.scenario.make_home()
    try:
        (home.path / "tmp").chmod(0o700)
        before = listing(home)
        running = home.instances()
        kill_both(ctl, bench, home, kill, scratch)
        wanted = expected(home, bench.scenario.patches)
        assert state in {name for name, _ in wanted}
        document = ctl.document("recover", home, status=1)
        assert told(document) == wanted
        assert document["id"] == os.listdir(home.path / "patchlogs/transactions")[0]
        assert (document["verdict"], document["phase"]) == (None, "installing")
        document = ctl.document("recover", home, "--fix", status=1)
        assert unfixed(document) <= LEFT_TO_A_REPETITION
        for name, path in wanted:
            if name in ("file-missing", "file-twice", "file-attributes"):
                owner = REPLACED_OWNER if os.geteuid() == 0 else (os.geteuid(), os.getegid())
                known = any(path in facts.replaced for facts in bench.scenario.patches)
                assert attributes_of(home, path) == ((REPLACED_MODE, *owner) if known else
                                                     (0o755, *attributes_of(home, path)[1:]))
            elif name == "directory-closed":
                assert mode_of(home, path) == mode_of(home, ".")
        assert home.instances() == running
        assert not home.exists("tmp/kyn")
        undone = ctl.document("undo", home)
        assert undone["verdict"] == "undone"
        assert (listing(home), home.instances()) == (before, running)
        assert ctl.document("recover", home)["id"] is None
    finally:
        home.close()


def kill_both(ctl, bench, home, kill, scratch):
    """orvpatchctl is killed as soon as it runs the installer, and the installer before the call."""
    installer, end = scratch / "installer", scratch / "end"
    installer.write_text(f'#!/bin/sh\ncase $3 in -t) exec "{bench.program.binary}" "$@";; esac\nkill -9 $PPID\n'
                         f'strace -o /dev/null -e {kill.expression} "{bench.program.binary}" "$@"\n: >"{end}"\n')
    installer.chmod(0o755)
    result = ctl.run("apply", home, bench.path, "--yes", "--installer", installer)
    assert result.status == -signal.SIGKILL, result
    limit = time.monotonic() + 120
    while not end.exists():
        assert time.monotonic() < limit
        time.sleep(0.05)
    kills.settle(home)


@pytest.fixture(name="ready")
def ready_fixture(home):
    home.component("yn", OLD_LEVEL, "Sample Agent", prereqs=["oxlpp266"])
    home.component("ox", OLD_LEVEL)
    home.write("lib/a", "old\n", 0o750)
    return home


def test_the_names_are_those_of_the_page(ctl, ready):
    schema = ctl.schema("recover")["properties"]["states"]["items"]["properties"]["state"]["enum"]
    assert set(schema) == documented_states() | {"level-empty"}


def test_a_home_without_any_run_and_one_where_all_ended_well(ctl, ready, program, write):
    assert ctl.document("recover", ready)["states"] == []
    assert program.run("-h", ready, "-i", write(Patch("yn").file("lib/a", "new\n"))).status == 0
    document = ctl.document("recover", ready)
    assert document["states"] == []
    assert b"every installation has ended well" in ctl.run("recover", ready).out


def test_a_run_that_ended_with_an_error(ctl, ready, program, write):
    ready.start("yn", "north")
    patch = Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n").script("no.sh", when="post", status=1)
    assert program.run("-h", ready, "-i", write(patch)).status == 23
    document = ctl.document("recover", ready, status=1)
    wanted = {("level-old", "registry/ynlpp266.ver"), ("instances-stopped", "kyn north"),
              ("temporary-left", "tmp/kyn")}
    assert told(document) == wanted
    assert document["installer"]["status"] == 23
    assert unfixed(ctl.document("recover", ready, "--fix", status=1)) == {"level-old"}
    assert ready.instances() == [("yn", "north")]


def test_an_instance_that_cannot_be_started_stays_in_its_state(ctl, ready, program, write):
    ready.start("yn", "north")
    patch = Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n").script("no.sh", when="post", status=1)
    assert program.run("-h", ready, "-i", write(patch)).status == 23
    ready.fail("start", "yn", "north")
    document = ctl.document("recover", ready, "--fix", status=1)
    assert unfixed(document) == {"level-old", "instances-stopped"}
    assert any(message.startswith("kyn north: not started") for message in document["messages"])


def test_an_empty_version_file_gets_its_level_from_the_log(ctl, ready, program, write):
    assert program.run("-h", ready, "-t", write(Patch("yn").file("lib/a", "new\n"))).status == 0
    assert program.run("-h", ready, "-i", write(Patch("yn", level="05100000").file("lib/a", "new\n"))).status != 0
    ready.write("registry/ynlpp266.ver", "")
    assert ("level-empty", "registry/ynlpp266.ver") in told(ctl.document("recover", ready, status=1))
    ctl.run("recover", ready, "--fix")
    assert ready.read("registry/ynlpp266.ver") == f"desc = kyn\nVRMF = {OLD_LEVEL}\npreReqALL = oxlpp266\n".encode()


def test_a_level_that_was_read_before_a_patch_is_not_its_level(ctl, ready, program, write):
    assert program.run("-h", ready, "-i", write(Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n"))).status == 0
    ready.write("registry/ynlpp266.ver", "")
    ready.write("registry/oxlpp266.ver", "")
    document = ctl.document("recover", ready, "--fix", status=1)
    assert [(state["path"], state["fixed"]) for state in document["states"]] == [
        ("registry/oxlpp266.ver", True), ("registry/ynlpp266.ver", False)]
    assert ready.level("ox") == OLD_LEVEL


def test_an_empty_version_file_of_which_nothing_is_known_is_left(ctl, ready):
    ready.write("registry/ynlpp266.ver", "")
    document = ctl.document("recover", ready, "--fix", status=1)
    assert [(state["state"], state["fixed"]) for state in document["states"]] == [("level-empty", False)]
    assert document["messages"] == ["registry/ynlpp266.ver: neither record nor log tell what it held"]
    assert ready.read("registry/ynlpp266.ver") == b""


def test_an_empty_result_file(ctl, ready):
    ready.write("vmaorv6/agentdepot/rc.txt", "")
    assert told(ctl.document("recover", ready, status=1)) == {("result-file-empty", "vmaorv6/agentdepot/rc.txt")}
    assert unfixed(ctl.document("recover", ready, "--fix")) == set()
    assert ready.read("vmaorv6/agentdepot/rc.txt") == b"0"


def test_a_directory_left_by_a_report_goes(ctl, ready):
    ready.write("tmp/kyn/updated_files/lib/a", "new\n")
    assert told(ctl.document("recover", ready, status=1)) == {("temporary-left", "tmp/kyn")}
    assert unfixed(ctl.document("recover", ready, "--fix")) == set()
    assert not ready.exists("tmp/kyn")


def test_a_directory_that_may_hold_the_only_copy_of_a_file_stays(ctl, ready):
    ready.write("tmp/kyn/updated_files/lib/lost", "new\n")
    document = ctl.document("recover", ready, "--fix", status=1)
    assert unfixed(document) == {"temporary-left"}
    assert document["messages"] == ["tmp/kyn: kept, it may hold the only copy of lib/lost"]
    assert ready.read("tmp/kyn/updated_files/lib/lost") == b"new\n"


def test_nothing_is_told_while_a_run_is_at_work(ctl, ready, program, write):
    path = write(Patch("yn").file("lib/a", "new\n").script("slow.sh", when="pre", body=WAIT))
    run = subprocess.Popen([*program.argv, "-h", str(ready.path), "-i", str(path)], stdout=subprocess.DEVNULL)
    try:
        limit = time.monotonic() + 60
        while not ready.calls():
            assert time.monotonic() < limit
            time.sleep(0.05)
        result = ctl.run("recover", ready, "--fix")
    finally:
        ready.write("go")
        assert run.wait(120) == 0
    assert (result.status, result.out) == (1, b"")
    assert b"an installation is at work" in result.err


def test_what_cannot_be_read_is_not_judged(ctl, ready):
    ready.mkdir("patchlogs/orvpatch.log")
    assert ctl.run("recover", ready).status == 2
    ready.remove("patchlogs/orvpatch.log")
    folder = ready.mkdir("patchlogs/transactions", 0o700) / "20260309T140500Z-77"
    folder.mkdir()
    assert ctl.run("recover", ready).status == 0  # killed before it had a record: nothing was changed
    (folder / "record.json").write_text("{")
    assert ctl.run("recover", ready).status == 2


def test_a_patch_file_that_has_gone_is_told(ctl, ready, program, write):
    path = write(Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n").script("no.sh", when="post", status=1))
    assert program.run("-h", ready, "-i", path).status == 23
    path.unlink()
    assert ctl.run("recover", ready, "--fix").status == 1  # what is not judged is not sound
    document = ctl.document("recover", ready, status=1)
    assert document["states"] == []
    assert document["messages"] == [
        f"{path.name}: the patch file cannot be read: its files and its level are not judged"]


def test_the_terminal_gets_a_table(ctl, ready):
    ready.write("vmaorv6/agentdepot/rc.txt", "")
    assert ctl.run("recover", ready).out.decode().splitlines()[1:] == [
        "STATE              PATH                       REMEDY",
        "result-file-empty  vmaorv6/agentdepot/rc.txt  recover --fix"]
