"""Disks, file systems, quotas and links as administrators have them, without any injection."""

import os
import re
import threading

import pytest

from support.catalogue import text
from support import Patch, ProductHome

from .conditions import fill, immutable, other_file_system, read_only, small_disk

pytestmark = pytest.mark.faults

OLD, NEW = b"old\n", b"new\n"


def agent_patch(folder, code="yn", **options):
    return (
        Patch(code, **options)
        .file("bin/agent", NEW)
        .file(f"lib/{code}/data", NEW)
        .script("20_pre.sh", "pre")
        .write(folder)
    )


def with_agent(home, *codes):
    """A home with these agents installed, none of them running, and the file that the patch replaces."""
    for code in codes or ("yn",):
        home.component(code)
    home.write("bin/agent", OLD, 0o750)
    return home


@pytest.fixture
def agent_home(home):
    return with_agent(home)


def results(home):
    return [line.result for line in home.history()]


def outcome(home, code="yn"):
    """What became of the patch: content of the replaced and of the new file, level, history."""
    return (
        home.read("bin/agent"),
        home.exists(f"lib/{code}/data") and home.read(f"lib/{code}/data"),
        home.level(code),
        results(home),
    )


UNTOUCHED = (OLD, False, "06100000")
APPLIED = (NEW, NEW, "06100100")


def framed(message):
    return f"\n{message}\n\n".encode()


def move_failure(home, place):
    return framed(text("ERROR_PP_MOVE_FILE", f"{home.path}/tmp/kyn/updated_files/./{place}", f"{home.path}/./{place}"))


def assert_heals(program, home, patch, records):
    """The same command, once the condition is gone."""
    done = program.install(home, patch)
    assert (done.status, done.err) == (0, b"")
    assert outcome(home) == (*APPLIED, [*records, "PASS"])
    assert not home.exists("tmp/kyn")


# --- disks ---------------------------------------------------------------------------------------------------


@pytest.mark.needs_root
def test_full_disk_before_the_extraction(program, scratch, patch_dir):
    patch = agent_patch(patch_dir)
    with small_disk(scratch / "disk", 512) as disk, with_agent(ProductHome(disk / "home")) as home:
        filler = fill(disk)
        done = program.install(home, patch)
        assert (done.status, done.err) == (3, framed(text("PROC_BAD_RC", "tar -xf", 2)))
        assert outcome(home) == (*UNTOUCHED, [])
        filler.unlink()
        assert_heals(program, home, patch, [])


@pytest.mark.needs_root
def test_disk_that_fills_up_while_the_patch_is_applied(program, scratch, patch_dir):
    """The history line finds no room: that stops nothing, and nothing else is missing."""
    fill_once = '[ -e "$quill_home/filler" ] || cat /dev/zero >"$quill_home/filler" 2>/dev/null'
    patch = (
        Patch("yn")
        .file("bin/agent", NEW)
        .file("lib/yn/data", NEW)
        .script("30_post.sh", "post", body=fill_once)
        .write(patch_dir)
    )
    with small_disk(scratch / "disk", 512) as disk, with_agent(ProductHome(disk / "home")) as home:
        done = program.install(home, patch)
        assert (done.status, done.err) == (0, b"")
        assert outcome(home) == (*APPLIED, [])
        home.write("filler")
        assert_heals(program, home, patch, [])


@pytest.mark.needs_root
@pytest.mark.parametrize("action", ["install", "report"])
def test_read_only_home(program, agent_home, patch_dir, action):
    patch, before = agent_patch(patch_dir), agent_home.tree()
    with read_only(agent_home.path):
        done = getattr(program, action)(agent_home, patch)
    lost, _, rest = done.err.decode().rpartition(text("LOG_CANT_WRITE", f"{agent_home.path}/patchlogs/orvpatch.log"))
    assert done.status == 3
    assert text("ERROR_PP_MAKE_DIR", f"{agent_home.path}/tmp/kyn") in done.err.decode()
    assert set(filter(None, lost.splitlines())) >= {text("LOG_CANT_WRITE", f"{agent_home.path}/patchlogs/orvpatch.log")}
    assert rest == "\n"
    assert agent_home.tree() == before


@pytest.mark.needs_root
def test_read_only_directory_of_the_product(program, agent_home, patch_dir):
    patch = agent_patch(patch_dir)
    with read_only(agent_home.path / "bin"):
        done = program.install(agent_home, patch)
        assert (done.status, done.err) == (25, move_failure(agent_home, "bin/agent"))
        assert agent_home.read("bin/agent") == OLD
    assert_heals(program, agent_home, patch, ["FAIL"])


@pytest.mark.needs_root
def test_other_file_system_under_a_directory_of_the_home(program, agent_home, patch_dir):
    """A file cannot be linked to another file system: the old one is gone by then, the new one waits in tmp."""
    patch = Patch("yn").file("share/agent", NEW).write(patch_dir)
    with other_file_system(agent_home.path / "share"):
        agent_home.write("share/agent", OLD)
        done = program.install(agent_home, patch)
        assert (done.status, done.err) == (25, move_failure(agent_home, "share/agent"))
        assert not agent_home.exists("share/agent")
        assert agent_home.read("tmp/kyn/updated_files/share/agent") == NEW
        assert (agent_home.level("yn"), results(agent_home)) == ("06100000", ["FAIL"])


@pytest.mark.needs_root
def test_tmp_on_another_file_system(program, agent_home, patch_dir):
    patch = agent_patch(patch_dir)
    with other_file_system(agent_home.path / "tmp"):
        done = program.install(agent_home, patch)
        assert done.status == 25
        moved = {place: agent_home.exists(place) for place in ("bin/agent", "lib/yn/data")}
        waiting = {place: agent_home.exists(f"tmp/kyn/updated_files/{place}") for place in moved}
        assert waiting == dict.fromkeys(moved, True)
        assert (agent_home.level("yn"), results(agent_home)) == ("06100000", ["FAIL"])
    assert_heals(program, agent_home, patch, ["FAIL"])


@pytest.mark.needs_root
def test_immutable_file(program, agent_home, patch_dir):
    patch = agent_patch(patch_dir)
    with immutable(agent_home.path / "bin/agent"):
        done = program.install(agent_home, patch)
        assert (done.status, done.err) == (25, move_failure(agent_home, "bin/agent"))
        assert agent_home.read("bin/agent") == OLD
        assert agent_home.read("tmp/kyn/updated_files/bin/agent") == NEW
    assert_heals(program, agent_home, patch, ["FAIL"])


@pytest.mark.needs_root
def test_immutable_version_file(program, agent_home, patch_dir):
    patch, path = agent_patch(patch_dir), f"{agent_home.path}/registry/ynlpp266.ver"
    with immutable(path):
        done = program.install(agent_home, patch)
        assert (done.status, done.err) == (28, framed(text("ERROR_PP_UPDATE_VRMF", path, "Operation not permitted")))
        assert outcome(agent_home) == (NEW, NEW, "06100000", ["FAIL"])
    assert_heals(program, agent_home, patch, ["FAIL"])


# --- quotas --------------------------------------------------------------------------------------------------


@pytest.mark.parametrize("limit", range(4, 17))
def test_quota_of_descriptors(program, agent_home, patch_dir, limit):
    """The program itself has few open at a time; tar needs more of them, a shell more than ten."""
    patch = agent_patch(patch_dir)
    done = program.install(agent_home, patch, wrapper=["prlimit", f"--nofile={limit}"])
    allowed = {4: [3], 16: [0]}.get(limit, [0, 3, 21])
    assert done.status in allowed
    ends = {0: (*APPLIED, ["PASS"]), 3: (*UNTOUCHED, []), 21: (*UNTOUCHED, ["FAIL"])}
    assert outcome(agent_home) == ends[done.status]
    if done.status:
        assert_heals(program, agent_home, patch, ends[done.status][-1])


def test_memory_that_runs_out(program, agent_home, patch_dir):
    """The loader ends with a status of its own; once the program runs, it ends with a message and no signal."""
    patch, ends = agent_patch(patch_dir), {}
    for kilobytes in range(150, 400, 10):
        done = program.install(agent_home, patch, wrapper=["prlimit", f"--data={kilobytes * 1024}"])
        ends.setdefault(done.status, done.err)
    assert ends.keys() - {3, 21} == {127, 71, 0}, ends
    assert ends[71] == b"orvpatch: out of memory\n"
    assert_heals(program, agent_home, patch, results(agent_home))


# --- links ---------------------------------------------------------------------------------------------------


def test_tmp_is_a_link(program, agent_home, scratch, patch_dir):
    patch, elsewhere = agent_patch(patch_dir), scratch / "elsewhere"
    elsewhere.mkdir()
    (elsewhere / "foreign").write_bytes(OLD)
    agent_home.remove("tmp")
    (agent_home.path / "tmp").symlink_to(elsewhere)
    assert program.install(agent_home, patch).status == 0
    assert outcome(agent_home) == (*APPLIED, ["PASS"])
    assert os.readlink(agent_home.path / "tmp") == str(elsewhere)
    assert os.listdir(elsewhere) == ["foreign"]


def test_tmp_is_a_link_to_nothing(program, agent_home, scratch, patch_dir):
    patch = agent_patch(patch_dir)
    agent_home.remove("tmp")
    (agent_home.path / "tmp").symlink_to(scratch / "nothing")
    done = program.install(agent_home, patch)
    assert (done.status, done.err) == (3, framed(text("ERROR_PP_MAKE_DIR", f"{agent_home.path}/tmp/kyn")))
    assert outcome(agent_home) == (*UNTOUCHED, [])
    assert not (scratch / "nothing").exists()


@pytest.fixture
def foreign(scratch):
    """A directory that is none of the product's, with a planted link to it."""
    folder = scratch / "foreign"
    (folder / "sub").mkdir(parents=True)
    (folder / "file").write_bytes(OLD)
    (folder / "sub/file").write_bytes(OLD)
    return folder


def assert_foreign_files_are_there(foreign):
    assert [(foreign / name).read_bytes() for name in ("file", "sub/file")] == [OLD, OLD]


@pytest.mark.parametrize("place", ["tmp/kyn", "tmp/kyn/updated_files", "tmp/kyn/sub"])
@pytest.mark.parametrize("action", ["install", "report"])
def test_a_planted_link_does_not_empty_a_foreign_directory(program, agent_home, patch_dir, foreign, place, action):
    patch, link = agent_patch(patch_dir), agent_home.path / place
    link.parent.mkdir(parents=True, exist_ok=True)
    link.symlink_to(foreign)
    assert getattr(program, action)(agent_home, patch).status == 0
    assert text("ERROR_PP_RM_DIR", f"{agent_home.path}/tmp/kyn") in agent_home.log().messages("ERROR")
    assert_foreign_files_are_there(foreign)
    if action == "install":
        assert outcome(agent_home) == (*APPLIED, ["PASS"])


def test_a_planted_link_to_a_file_is_removed_itself(program, agent_home, patch_dir, foreign):
    patch = agent_patch(patch_dir)
    agent_home.mkdir("tmp/kyn")
    (agent_home.path / "tmp/kyn/patch.lnk").symlink_to(foreign / "file")
    assert program.install(agent_home, patch).status == 0
    assert not agent_home.exists("tmp/kyn")
    assert_foreign_files_are_there(foreign)


# --- the home's path -----------------------------------------------------------------------------------------


def test_home_on_a_path_with_blanks(program, scratch, patch_dir):
    with with_agent(ProductHome(scratch / "a home  of ours")) as home:
        assert program.install(home, agent_patch(patch_dir)).status == 0
        assert outcome(home) == (*APPLIED, ["PASS"])
        assert [call.cwd for call in home.journal()] == [f"{home.path}/tmp/kyn"]


def test_agents_of_a_home_with_blanks_are_stopped_but_not_started(program, scratch, patch_dir):
    """The start command is one line for a shell, which takes the path apart; the stop command is none."""
    with with_agent(ProductHome(scratch / "a home"), "yn") as home:
        home.start("yn", "one")
        done = program.install(home, agent_patch(patch_dir))
        assert (done.status, done.err) == (13, framed(text("ERROR_START_INST", "one", "Sample product yn")))
        assert outcome(home) == (*APPLIED, ["FAIL"])
        assert home.instances() == []


# --- two runs at once ----------------------------------------------------------------------------------------


def run_together(*runs):
    """Runs these functions in threads of their own; their results in order."""
    found = [None] * len(runs)

    def keep(index):
        found[index] = runs[index]()

    threads = [threading.Thread(target=keep, args=(index,)) for index in range(len(runs))]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()
    return found


def meeting_patch(folder, code, other):
    """A patch whose command goes on only when the other patch's command runs too."""
    wait = (
        f': >"$quill_home/{code}.here"\n'
        f'n=0; until [ -e "$quill_home/{other}.here" ] || [ $n = 200 ]; do sleep 0.05; n=$((n + 1)); done'
    )
    return Patch(code).file(f"bin/{code}", NEW).script("10_meet.sh", "pre_patch", body=wait).write(folder)


_LOG_LINE = re.compile(r"(ERROR|INFO |TRACE) \d\d:\d\d:\d\d \([^,()]*,\d+\): ")


def test_two_runs_at_once_on_different_products(program, home, patch_dir):
    for code in ("ox", "yn"):
        home.component(code)
    patches = [meeting_patch(patch_dir, "ox", "yn"), meeting_patch(patch_dir, "yn", "ox")]
    done = run_together(*[lambda patch=patch: program.install(home, patch) for patch in patches])
    assert [(result.status, result.err) for result in done] == [(0, b""), (0, b"")]
    assert sorted((line.product, line.result) for line in home.history()) == [("kox", "PASS"), ("kyn", "PASS")]
    assert [home.level(code) for code in ("ox", "yn")] == ["06100100", "06100100"]
    assert [home.read(f"bin/{code}") for code in ("ox", "yn")] == [NEW, NEW]
    assert os.listdir(home.path / "tmp") == []
    assert_log_is_whole(home, runs=2)


def assert_log_is_whole(home, runs):
    """Lines of several runs take turns, but each stays in one piece."""
    log = home.read("patchlogs/orvpatch.log").decode()
    assert len(re.findall(r"^={78}\n ORV Patch Log File\n(?:   .*\n){4}={78}$", log, re.MULTILINE)) == runs
    rest = re.sub(r"^={78}\n ORV Patch Log File\n(?:   .*\n){4}={78}\n", "", log, flags=re.MULTILINE)
    stray = [line for line in rest.splitlines() if not _LOG_LINE.match(line)]
    assert stray == []
    assert rest.count("main = 0\n") == runs


@pytest.mark.parametrize("attempt", range(3))
def test_two_runs_at_once_of_the_same_patch(program, agent_home, patch_dir, attempt):
    """They share the temporary directory, so either may fail; once both have ended, a rerun heals."""
    patch = agent_patch(patch_dir)
    done = run_together(*[lambda: program.install(agent_home, patch)] * 2)
    assert all(result.status in (0, 3, 5, 6, 7, 9, 21, 24, 25, 26, 28) for result in done), done
    records = results(agent_home)
    assert records.count("PASS") == [result.status for result in done].count(0)
    assert_heals(program, agent_home, patch, records)
