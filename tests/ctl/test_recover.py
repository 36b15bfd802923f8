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
                found |= {
                    (state, place)
                    for place in facts.directories
                    if home.exists(place) and mode_of(home, place) != 0o777
                }
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
    found = Counter(
        attributes_of(home, path.relative_to(home.path))
        for path in folder.iterdir()
        if path.is_file() and path.name != os.path.basename(place)
    )
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
                assert attributes_of(home, path) == (
                    (REPLACED_MODE, *owner) if known else (0o755, *attributes_of(home, path)[1:])
                )
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
    installer.write_text(
        f'#!/bin/sh\ncase $3 in -t) exec "{bench.program.binary}" "$@";; esac\nkill -9 $PPID\n'
        f'strace -o /dev/null -e {kill.expression} "{bench.program.binary}" "$@"\n: >"{end}"\n'
    )
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
    wanted = {("level-old", "registry/ynlpp266.ver"), ("instances-stopped", "kyn north"), ("temporary-left", "tmp/kyn")}
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
        ("registry/oxlpp266.ver", True),
        ("registry/ynlpp266.ver", False),
    ]
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
        f"{path.name}: the patch file cannot be read: its files and its level are not judged"
    ]


def test_the_terminal_gets_a_table(ctl, ready):
    ready.write("vmaorv6/agentdepot/rc.txt", "")
    assert ctl.run("recover", ready).out.decode().splitlines()[1:] == [
        "STATE              PATH                       REMEDY",
        "result-file-empty  vmaorv6/agentdepot/rc.txt  recover --fix",
    ]


@pytest.mark.parametrize("level", ["06.10.00.02", "06.10.00", "061000", "06100002"])
def test_a_level_comes_back_as_it_was_written(ctl, home, program, write, level):
    home.component("yn", level)
    assert program.run("-h", home, "-t", write(Patch("yn").file("lib/a", "new\n"))).status == 0
    home.write("registry/ynlpp266.ver", "")
    assert unfixed(ctl.document("recover", home, "--fix")) == set()
    assert home.read("registry/ynlpp266.ver") == f"desc = kyn\nVRMF = {level}\n".encode()


@pytest.fixture(name="half_done")
def half_done_fixture(ready, program, patch_dir):
    """The first patch of a directory has passed, the second has failed."""
    ready.component("qa", OLD_LEVEL)
    Patch("qa", level=NEW_LEVEL, target="vems").file("lib/server", "new\n").write(patch_dir)
    Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n").script("no.sh", when="post", status=1).write(patch_dir)
    assert program.run("-h", ready, "-i", patch_dir).status != 0
    assert [line.result for line in ready.history()] == ["PASS", "FAIL"]
    return ready


def of_server(document):
    return {state for state, path in told(document) if path in ("registry/qalpp266.ver", "patchlogs/patches.hist")}


def test_a_report_on_a_later_day_makes_no_line_of_history_an_old_one(ctl, half_done, program, patch_dir):
    two_days_ago = time.strftime("%m/%d/%Y", time.localtime(time.time() - 2 * 86400))
    history = half_done.read("patchlogs/patches.hist").decode()
    for line in half_done.history():
        history = history.replace(line.date, f"{two_days_ago} {line.date.split()[1]}")
    half_done.write("patchlogs/patches.hist", history)
    assert program.run("-h", half_done, "-t", patch_dir).status == 0
    assert of_server(ctl.document("recover", half_done, status=1)) == {"applied"}


def test_a_line_of_history_that_was_lost_is_missing(ctl, half_done):
    half_done.write("patchlogs/patches.hist", "")
    assert of_server(ctl.document("recover", half_done, status=1)) == {"history-missing"}


def killed_at(program, home, patch, call, place=None, number=1):
    """An installation that is killed before the call, for this file of the home where one is named."""
    injection = ["-e", f"trace={call}", "-e", f"inject={call}:signal=SIGKILL:when={number}"]
    if place:
        injection += ["-P", home.path / place]
    result = program.run("-h", home, "-i", patch, wrapper=["strace", "-o", "/dev/null", *injection])
    assert result.status == -signal.SIGKILL, result


def test_a_line_of_an_earlier_installation_is_not_this_ones(ctl, ready, program, write):
    path = write(Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n"))
    assert program.run("-h", ready, "-i", path).status == 0
    earlier = time.strftime("%m/%d/%Y %H:%M:%S", time.localtime(time.time() - 2 * 3600))
    history = ready.read("patchlogs/patches.hist").decode()
    ready.write("patchlogs/patches.hist", history.replace(ready.history()[0].date, earlier))
    ready.component("yn", OLD_LEVEL)
    killed_at(program, ready, path, "openat", "patchlogs/patches.hist")
    assert ready.level("yn") == NEW_LEVEL
    assert told(ctl.document("recover", ready, status=1)) >= {("history-missing", "patchlogs/patches.hist")}


def test_a_run_that_was_killed_behind_its_line_has_it(ctl, ready, program, write):
    killed_at(
        program, ready, write(Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n")), "fsync", "patchlogs/patches.hist"
    )
    assert [line.result for line in ready.history()] == ["PASS"]
    assert b"updatePatchRegistry() exit" not in ready.read("patchlogs/orvpatch.log")
    assert told(ctl.document("recover", ready, status=1)) == {
        ("applied", "registry/ynlpp266.ver"),
        ("temporary-left", "tmp/kyn"),
    }


def test_a_patch_makes_the_level_of_its_own_version_file_alone_unknown(ctl, ready, program, write):
    ready.component("yn", "05200000", filename="ynvms.ver")
    assert program.run("-h", ready, "-i", write(Patch("yn", level=NEW_LEVEL).file("lib/a", "new\n"))).status == 0
    ready.write("registry/ynvms.ver", "")
    assert unfixed(ctl.document("recover", ready, "--fix")) == set()
    assert ready.level("yn", filename="ynvms.ver") == "05200000"


def test_a_file_of_two_patches_comes_from_the_one_that_was_at_work(ctl, ready, program, patch_dir):
    ready.component("qa", OLD_LEVEL)
    Patch("qa", level=NEW_LEVEL, target="vems").file("lib/a", "of the server\n").write(patch_dir)
    Patch("yn", level=NEW_LEVEL).file("lib/a", "of the agent\n").write(patch_dir)
    killed_at(program, ready, patch_dir, "link", number=2)
    assert not ready.exists("lib/a")
    document = ctl.document("recover", ready, "--fix", status=1)
    assert {"state": "file-missing", "path": "lib/a", "fixed": True} in document["states"]
    assert ready.read("lib/a") == b"of the agent\n"


def faulty(*options):
    return ["strace", "-o", "/dev/null", *options]


def test_a_version_file_that_cannot_be_put_on_disk_stays_empty(ctl, ready, program, write):
    assert program.run("-h", ready, "-t", write(Patch("yn").file("lib/a", "new\n"))).status == 0
    ready.write("registry/ynlpp266.ver", "")
    document = ctl.document(
        "recover",
        ready,
        "--fix",
        status=1,
        wrapper=faulty("-P", ready.path / "registry/ynlpp266.ver", "-e", "inject=fsync:error=EIO"),
    )
    assert unfixed(document) == {"level-empty"}
    assert ready.read("registry/ynlpp266.ver") == b""
    assert ("level-empty", "registry/ynlpp266.ver") in told(ctl.document("recover", ready, status=1))


def test_neighbours_that_cannot_be_listed_are_not_taken_for_none(ctl, ready, program, write):
    ready.write("lib/b", "old\n", 0o710)
    killed_at(program, ready, write(Patch("yn").file("lib/a", "new\n")), "link")
    result = ctl.run(
        "recover", ready, "--fix", wrapper=faulty("-P", ready.path / "lib", "-e", "inject=getdents64:error=EIO")
    )
    assert (result.status, ready.exists("lib/a")) == (2, False)
    assert b"cannot read" in result.err
    assert ("file-missing", "lib/a") in told(ctl.document("recover", ready, "--fix", status=1))
    assert mode_of(ready, "lib/a") == 0o710


@pytest.mark.parametrize("number", ["SIGINT", "SIGTERM", "SIGHUP"])
def test_no_interruption_ends_the_fixing(ctl, ready, number):
    ready.write("vmaorv6/agentdepot/rc.txt", "")
    document = ctl.document(
        "recover",
        ready,
        "--fix",
        wrapper=[
            "env",
            "--default-signal",
            *faulty("-P", ready.path / "vmaorv6/agentdepot/rc.txt", "-e", f"inject=fsync:signal={number}:when=1"),
        ],
    )
    assert (document["states"], ready.read("vmaorv6/agentdepot/rc.txt")) == (
        [{"state": "result-file-empty", "path": "vmaorv6/agentdepot/rc.txt", "fixed": True}],
        b"0",
    )


def test_directories_that_cannot_be_opened_are_told_once_each(ctl, bench, scratch):
    home = bench.scenario.make_home()
    try:
        (home.path / "tmp").chmod(0o700)
        kill_both(ctl, bench, home, kills.example(kills.kills_of(bench), "directory-closed"), scratch)
        closed = [path for state, path in told(ctl.document("recover", home, status=1)) if state == "directory-closed"]
        assert len(closed) > 1
        document = ctl.document("recover", home, "--fix", status=1, wrapper=faulty("-e", "inject=fchmod:error=EIO"))
        messages = Counter(document["messages"])
        for path in closed:
            assert messages[f"{path}: owner and mode cannot be set: Input/output error"] == 1
        assert "directory-closed" in unfixed(document)
    finally:
        home.close()


def test_what_could_not_be_fixed_is_not_given_the_same_remedy(ctl, ready):
    ready.write("registry/ynlpp266.ver", "")
    assert ctl.run("recover", ready, "--fix").out.decode().splitlines()[2:] == [
        "level-empty  registry/ynlpp266.ver  see the messages",
        "registry/ynlpp266.ver: neither record nor log tell what it held",
    ]
