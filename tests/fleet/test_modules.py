"""What the modules decide, with the real orvpatchctl on a sample home."""

import fcntl
import json
import os
import time

import pytest

from modules import Modules
from support import Patch

EVIDENCE = ("patchlogs", "patchlogs/orvpatch.log", "tmp")  # what the installer's report leaves


@pytest.fixture
def modules(scratch, ctl_binary, home):
    return Modules(scratch, orvpatchctl=str(ctl_binary), home=str(home.path))


@pytest.fixture
def ready(home):
    home.component("yn")
    home.component("um")
    home.write("lib/replaced", "old\n")
    (home.path / "tmp").chmod(0o700)
    return home


def a_patch(code="yn", **options):
    return Patch(code, **options).file("lib/replaced", "new\n").file("lib/new", "new\n")


def failing(**options):
    return a_patch(**options).script("no.sh", when="post", status=3, err="no space\n")


def product(home):
    """The home without what the installer writes for evidence."""
    return {
        path: entry
        for path, entry in home.tree().items()
        if path not in EVIDENCE and not path.startswith("patchlogs/transactions")
    }


def transactions(home):
    return sorted(os.listdir(home.path / "patchlogs/transactions"))


def test_home_info_tells_what_there_is(modules, ready, patch_dir):
    home = ready
    home.start("yn", "north")
    found = modules.run("home_info")
    assert found["changed"] is False
    assert found["levels"] == {"kum": "06.10.00.00", "kyn": "06.10.00.00"}
    assert found["instances"] == [
        {"product": "kyn", "name": "north", "pid": home.pid("yn", "north"), "user": found["instances"][0]["user"]}
    ]
    assert (found["history"], found["transactions"], found["open_transactions"]) == ([], [], [])
    assert "verification" not in found
    path = a_patch().write(patch_dir)
    modules.run("applied", patch=path)
    found = modules.run("home_info", patch=path)
    assert [(one["product"], one["result"]) for one in found["history"]] == [("kyn", "PASS")]
    assert [(one["action"], one["verdict"], one["phase"]) for one in found["transactions"]] == [
        ("apply", "applied", "closed")
    ]
    assert found["history"][0]["transaction"] == found["transactions"][0]["id"]
    assert found["verification"] == {"differences": [], "files": 2}
    home.write("lib/new", "other\n")
    differences = modules.run("home_info", patch=path)["verification"]["differences"]
    assert [(one["path"], one["kind"]) for one in differences] == [("lib/new", "content")]


def test_home_info_without_a_home_fails(modules, scratch):
    found = modules.fail("home_info", home=scratch / "none")
    assert str(scratch / "none") in found["msg"]


def test_a_patch_is_applied_once(modules, ready, patch_dir):
    home, path = ready, a_patch().write(patch_dir)
    first = modules.run("applied", patch=path)
    assert (first["changed"], first["verdict"], first["resumed"]) == (True, "applied", False)
    assert (first["levels_before"], first["levels_after"]) == ({"kyn": "06.10.00.00"}, {"kyn": "06.10.01.00"})
    assert first["record"]["counts"] == {"new": 1, "replaced": 1}
    assert [one["path"] for one in first["record"]["files"]] == ["lib/new", "lib/replaced"]
    assert first["transaction"] == first["record"]["id"] == transactions(home)[0]
    before = home.tree()
    second = modules.run("applied", patch=path)
    assert (second["changed"], second["verdict"]) == (False, "unchanged")
    assert second["transaction"] == first["transaction"]
    assert second["levels_after"] == {"kyn": "06.10.01.00"}
    assert home.tree() == before


def test_a_record_without_its_files_has_their_numbers(modules, ready, patch_dir):
    found = modules.run("applied", patch=a_patch().write(patch_dir), files=False)
    assert found["record"]["counts"] == {"new": 1, "replaced": 1}
    assert (found["record"]["files"], found["record"]["rewritten"]) == ([], [])
    assert found["record"]["patches"][0]["result"] == "PASS"


def test_of_a_directory_only_what_concerns_the_home_counts(modules, ready, patch_dir):
    for code in ("yn", "um", "zz"):  # zz is not installed
        Patch(code).file(f"lib/{code}").write(patch_dir)
    (patch_dir / "readme.txt").write_text("no patch\n")
    assert modules.run("applied", patch=patch_dir)["changed"]
    assert modules.run("applied", patch=patch_dir)["verdict"] == "unchanged"
    Patch("um", level="06100200").file("lib/um").write(patch_dir)
    found = modules.run("applied", patch=patch_dir)
    assert (found["changed"], found["levels_after"]["kum"]) == (True, "06.10.02.00")


def test_a_patch_of_the_same_level_and_another_name_is_applied(modules, ready, patch_dir):
    modules.run("applied", patch=a_patch(fixpack="fp0001").write(patch_dir))
    assert modules.run("applied", patch=a_patch(fixpack="fp0002").write(patch_dir))["changed"]


def test_a_pass_that_was_followed_by_a_failure_counts_no_more(modules, ready, patch_dir):
    home, path = ready, a_patch().write(patch_dir)
    modules.run("applied", patch=path)
    with open(home.path / "patchlogs/patches.hist", "rb+") as history:
        lines = history.read().splitlines(keepends=True)
        history.write(lines[-1].replace(b"PASS", b"FAIL"))
    assert modules.run("applied", patch=path)["changed"]


def test_a_patch_that_concerns_no_product_fails(modules, ready, patch_dir):
    found = modules.fail("applied", patch=Patch("zz").file("lib/a").write(patch_dir))
    assert found["verdict"] == "refused", found
    assert "status 34" in found["msg"]  # the installer: not applicable


def test_check_mode_changes_nothing(modules, ready, patch_dir):
    home, path = ready, a_patch().write(patch_dir)
    before = product(home)
    found = modules.run("applied", patch=path, check=True)
    assert (found["changed"], found["verdict"], found["transaction"]) == (True, "checked", None)
    assert (found["check"]["errors"], found["check"]["report"]["status"]) == (0, 0)
    assert "lib/new" in found["check"]["report"]["stdout"]
    assert "diff" not in found
    assert product(home) == before
    assert home.history() == []
    assert not list(modules.state.glob("*/*/run.json"))  # nothing but the lock: no run was started
    modules.run("applied", patch=path)
    assert modules.run("applied", patch=path, check=True)["changed"] is False


def test_a_patch_that_would_be_refused_fails_in_check_mode_too(modules, ready, patch_dir):
    home = ready
    path = a_patch(level="05100000").write(patch_dir)
    before = product(home)
    messages = [modules.fail("applied", patch=path, check=check) for check in (True, False)]
    for found in messages:
        assert found["verdict"] == "refused", found
        assert "installer-refuses" in found["msg"] and "backlevel" in found["msg"]
    assert {name for name in product(home) if name not in before} <= {"tmp/kyn", "tmp/kyn/patch.ini"}
    assert home.history() == []


def test_diff_mode_shows_levels_files_and_instances(modules, ready, patch_dir):
    ready.start("yn", "north")
    path = a_patch().write(patch_dir)
    expected = {
        "levels": ("kyn 06.10.00.00\n", "kyn 06.10.01.00\n"),
        "files": ("lib/replaced\n", "lib/replaced (replaced)\nlib/new (new)\n"),
        "running instances": ("kyn north\n", "kyn north (stopped and started again)\n"),
    }
    undone = {
        "levels": ("kyn 06.10.01.00\n", "kyn 06.10.00.00\n"),
        "files": ("lib/replaced\nlib/new\n", "lib/replaced (put back)\n"),
        "running instances": ("kyn north\n", "kyn north (stopped and started again)\n"),
    }
    for check in (True, False):
        found = modules.run("applied", patch=path, check=check, diff=True)
        shown = {one["before_header"]: (one["before"], one["after"]) for one in found["diff"]}
        assert shown == expected
    found = modules.run("undone", check=True, diff=True)
    assert {one["before_header"]: (one["before"], one["after"]) for one in found["diff"]} == undone


def test_a_failure_is_told_and_tried_again(modules, ready, patch_dir):
    path = failing().write(patch_dir)
    for _ in range(2):
        found = modules.fail("applied", patch=path)
        assert (found["verdict"], found["resumed"], found["record"]["verdict"]) == ("failed", False, "failed")
        assert "no.sh" in found["msg"]
        assert found["transaction"] == transactions(ready)[-1]
    assert len(ready.history()) == 2


def test_a_failure_can_be_taken_back_at_once(modules, ready, patch_dir):
    found = modules.fail("applied", patch=failing().write(patch_dir), undo_on_failure=True)
    assert found["verdict"] == "undone"
    assert ready.read("lib/replaced") == b"old\n"
    assert ready.level("yn") == "06100000"


def test_a_partial_installation_is_incomplete(modules, ready, patch_dir):
    patch = a_patch().script("go.sh", when="pre", body="rm updated_files/lib/new")
    found = modules.fail("applied", patch=patch.write(patch_dir))
    assert found["verdict"] == "incomplete"
    assert "lib/new" in found["msg"]


def test_other_digests_are_refused_before_anything_starts(modules, ready, patch_dir):
    home, path = ready, a_patch().write(patch_dir)
    good = modules.run("applied", patch=path, check=True, diff=True)["record"]["patches"][0]["sha256"]
    before = product(home)
    for digests in ({path.name: "0" * 64}, {}, {path.name: good, "missing.tar": good}):
        found = modules.fail("applied", patch=path, digests=digests)
        assert found["verdict"] == "refused", found
        assert found["msg"].startswith("not what it should be: ")
    assert product(home) == before
    assert not list(modules.state.glob("*/*/run.json"))
    assert modules.run("applied", patch=path, digests={path.name: good})["changed"]


def test_a_signature_is_asked_for(modules, ready, patch_dir, scratch):
    (scratch / "keyring.gpg").write_bytes(b"")
    found = modules.fail("applied", patch=a_patch().write(patch_dir), keyring=scratch / "keyring.gpg")
    assert found["verdict"] == "refused" and "signature-missing" in found["msg"]


def test_only_so_many_transactions_are_kept(modules, ready, patch_dir):
    for level in ("06100100", "06100200"):
        modules.run("applied", patch=a_patch(level=level).write(patch_dir), keep=1)
    assert len(transactions(ready)) == 1


def test_the_last_transaction_is_taken_back_and_no_other(modules, ready, patch_dir):
    home = ready
    first = modules.run("applied", patch=Patch("um").file("lib/um").write(patch_dir))
    second = modules.run("applied", patch=a_patch().write(patch_dir))
    assert modules.run("undone", check=True)["transaction"] == second["transaction"]
    assert home.level("yn") == "06100100"
    found = modules.run("undone")
    assert (found["changed"], found["verdict"], found["transaction"]) == (True, "undone", second["transaction"])
    assert (found["levels_before"], found["levels_after"]) == ({"kyn": "06.10.01.00"}, {"kyn": "06.10.00.00"})
    assert home.read("lib/replaced") == b"old\n"
    before = home.tree()
    again = modules.run("undone")
    assert (again["changed"], again["verdict"]) == (False, "unchanged")
    assert again["levels_after"] == {"kyn": "06.10.00.00"}
    assert home.tree() == before
    named = modules.run("undone", transaction=first["transaction"])
    assert (named["changed"], home.level("um")) == (True, "06100000")


def test_without_a_transaction_nothing_is_taken_back(modules, ready):
    found = modules.run("undone")
    assert (found["changed"], found["transaction"], found["record"]) == (False, None, None)
    assert modules.fail("undone", transaction="20260309T170412Z-4700")["verdict"] == "refused"


def test_a_last_transaction_of_other_patches_is_left_alone(modules, ready, patch_dir):
    found = modules.run("applied", patch=a_patch().write(patch_dir))
    digests = {one["file"]: one["sha256"] for one in found["record"]["patches"]}
    assert modules.run("undone", digests={"kum_lpp266_vema_fp0001.tar": "0" * 64})["changed"] is False
    assert modules.run("undone", digests={name: "0" * 64 for name in digests})["changed"] is False
    assert modules.run("undone", digests=digests)["changed"]


def test_of_a_patch_on_the_host_only_the_same_contents_are_taken_back(modules, ready, patch_dir, scratch):
    path = a_patch().write(patch_dir)
    modules.run("applied", patch=path)
    other = scratch / "other"
    other.mkdir()
    for named in (Patch("um").file("lib/um").write(other), Patch("yn").file("lib/changed").write(other), other):
        assert modules.run("undone", patch=named)["verdict"] == "unchanged"
    assert ready.level("yn") == "06100100"
    found = modules.fail("undone", patch=scratch / "none")
    assert found["verdict"] == "refused" and "none" in found["msg"]
    Patch("um").file("lib/um").write(patch_dir)
    assert modules.run("undone", patch=patch_dir, check=True)["changed"]  # a directory may hold more
    assert modules.run("undone", patch=path)["verdict"] == "undone"
    assert ready.level("yn") == "06100000"


def test_what_was_taken_back_is_applied_again(modules, ready, patch_dir):
    path = a_patch(level="06100000").write(patch_dir)  # the level that is there: the history must tell
    assert [modules.run("applied", patch=path)["changed"] for _ in range(2)] == [True, False]
    modules.run("undone")
    assert modules.run("applied", patch=path)["changed"]


def test_an_undo_that_leaves_something_is_incomplete(modules, ready, patch_dir):
    modules.run("applied", patch=a_patch().write(patch_dir))
    ready.write("lib/new", "mine\n")
    found = modules.fail("undone")
    assert found["verdict"] == "incomplete"
    assert "lib/new" in found["msg"]


def test_a_program_that_prints_no_document_is_told(modules, ready, scratch):
    stand_in = scratch / "orvpatchctl"
    stand_in.write_text("#!/bin/sh\necho 'orvpatchctl: out of memory' >&2\nexit 2\n")
    stand_in.chmod(0o755)
    assert modules.fail("home_info", orvpatchctl=stand_in)["msg"] == "out of memory"
    stand_in.write_text("#!/bin/sh\nexit 0\n")
    assert "no JSON document" in modules.fail("home_info", orvpatchctl=stand_in)["msg"]
    found = modules.fail("home_info", orvpatchctl=scratch / "none")
    assert "none" in found["msg"]


def test_a_run_without_a_record_has_failed_only_if_it_left_a_transaction_open(
    modules, ready, patch_dir, ctl_binary, scratch
):
    """A stand-in ends in the middle as a crash does, once before and once after the first change."""
    home, path = ready, a_patch().write(patch_dir)
    stand_in = scratch / "orvpatchctl"
    stand_in.write_text(
        f'#!/bin/sh\n[ "$1" != apply ] && exec {ctl_binary} "$@"\necho "orvpatchctl: broken" >&2\nexit 2\n'
    )
    stand_in.chmod(0o755)
    found = modules.fail("applied", patch=path, orvpatchctl=stand_in)
    assert (found["verdict"], found["msg"], found["record"]) == ("refused", "broken", None)
    modules.run("applied", patch=path)
    record = home.path / "patchlogs/transactions" / transactions(home)[0] / "record.json"
    record.write_text(json.dumps(dict(json.loads(record.read_bytes()), phase="installing", verdict=None)))
    path = a_patch(level="06100200").write(patch_dir)
    assert modules.fail("applied", patch=path, orvpatchctl=stand_in)["verdict"] == "failed"
    assert modules.run("home_info")["open_transactions"] == transactions(home)


def test_an_undo_without_a_record_has_failed_if_it_left_a_transaction_open(
    modules, ready, patch_dir, ctl_binary, scratch
):
    """A stand-in ends as a crash does: once before the undo's own transaction is there, and once in its middle."""
    modules.run("applied", patch=a_patch().write(patch_dir))
    root = ready.path / "patchlogs/transactions"
    stand_in = scratch / "orvpatchctl"
    ends = '\necho "orvpatchctl: broken" >&2\nexit 2\n'
    stand_in.write_text(f'#!/bin/sh\n[ "$1" != undo ] && exec {ctl_binary} "$@"{ends}')
    stand_in.chmod(0o755)
    found = modules.fail("undone", orvpatchctl=stand_in)
    assert (found["verdict"], found["msg"], found["record"]) == ("refused", "broken", None)
    begun = json.loads((root / transactions(ready)[0] / "record.json").read_bytes())
    begun.update(id=f"{begun['id']}-undo", action="undo", undoes=begun["id"], phase="undoing", verdict=None)
    (scratch / "begun.json").write_text(json.dumps(begun))
    copies = f'\nmkdir "{root}/{begun["id"]}" && cp {scratch}/begun.json "{root}/{begun["id"]}/record.json"'
    stand_in.write_text(f"#!/bin/sh{copies}{ends}")
    found = modules.fail("undone", orvpatchctl=stand_in)
    assert (found["verdict"], found["msg"], found["record"]) == ("failed", "broken", None)


@pytest.mark.parametrize("module", ["applied", "undone"])
@pytest.mark.parametrize("check", [True, False])
def test_where_nothing_could_begin_it_is_refused(modules, ready, patch_dir, scratch, module, check):
    """No program, no home, no patch, no folder for the run."""
    path = a_patch().write(patch_dir)
    (scratch / "file").write_text("")
    wrong = [{"orvpatchctl": "no-such-orvpatchctl"}, {"state_dir": scratch / "file"}]
    wrong += [{"patch": scratch / "none.tar"}]
    wrong += [{"home": scratch / "none"}] if module == "applied" else []
    for options in wrong:
        found = modules.fail(module, check=check, **{"patch": path, **options})
        assert (found["verdict"], found["resumed"], found["record"]) == ("refused", False, None), found
    assert ready.history() == [] and not list(modules.state.glob("*/*/run.json"))


def test_a_run_whose_folder_cannot_be_made_is_refused(modules, ready, patch_dir, scratch, ctl_binary):
    """The lock is there already; its folder becomes a file between the look at the home and the start."""
    path = a_patch().write(patch_dir)
    modules.run("applied", patch=path, check=True)
    (lock,) = modules.state.glob("*/lock")
    stand_in = scratch / "orvpatchctl"
    gone = f"mv {lock.parent} {scratch}/moved && : >{lock.parent}"
    stand_in.write_text(f'#!/bin/sh\n[ "$1" != history ] || {{ {gone}; }}\nexec {ctl_binary} "$@"\n')
    stand_in.chmod(0o755)
    found = modules.fail("applied", patch=path, orvpatchctl=stand_in)
    assert found["verdict"] == "refused" and str(lock.parent) in found["msg"]
    assert ready.history() == []


# --- runs that outlive a module ---


def held_up(**options):
    """A patch whose command waits for a file; it says when it does."""
    body = ': >"$QUILLHOME/reached"; while [ ! -e "$QUILLHOME/gate" ]; do sleep 0.05; done'
    return a_patch(**options).script("10_wait.sh", when="pre", body=body)


def await_file(path):
    limit = time.monotonic() + 60
    while not path.exists():
        assert time.monotonic() < limit, f"{path} does not come"
        time.sleep(0.02)


def open_gate(home):
    (home.path / "gate").write_text("")


def await_end(home):
    """Waits until the transaction has its record."""
    limit = time.monotonic() + 60
    while True:
        folders = transactions(home)
        record = home.path / "patchlogs/transactions" / folders[-1] / "record.json" if folders else None
        if record and record.exists() and json.loads(record.read_bytes())["phase"] == "closed":
            return
        assert time.monotonic() < limit, "the transaction does not end"
        time.sleep(0.02)


def cut_off(modules, home, path, **options):
    """Starts `applied`, and kills it as a lost connection does, while the transaction is in the middle."""
    process = modules.start("applied", patch=path, **options)
    await_file(home.path / "reached")
    os.killpg(process.pid, 9)
    process.communicate()


def test_a_lost_connection_ends_nothing(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    cut_off(modules, home, path)
    open_gate(home)
    await_end(home)
    assert home.level("yn") == "06100100"
    checked = modules.run("applied", patch=path, check=True)
    assert (checked["changed"], checked["verdict"]) == (False, "unchanged")
    found = modules.run("applied", patch=path)
    assert (found["changed"], found["verdict"], found["resumed"]) == (True, "applied", True)
    assert found["levels_before"] == {"kyn": "06.10.00.00"}
    assert found["transaction"] == transactions(home)[0]
    found = modules.run("applied", patch=path)
    assert (found["changed"], found["verdict"], found["resumed"]) == (False, "unchanged", False)
    assert len(home.history()) == 1


@pytest.mark.parametrize("check", [True, False])
def test_a_transaction_at_work_is_waited_for(modules, ready, patch_dir, check):
    home, path = ready, held_up().write(patch_dir)
    cut_off(modules, home, path)
    second = modules.start("applied", patch=path, check=check)
    time.sleep(1)
    assert second.poll() is None
    open_gate(home)
    found = modules.answer(second)
    assert (found["changed"], found["resumed"]) == (not check, True)
    assert len(home.history()) == 1


def test_two_at_once_make_one_transaction(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    both = [modules.start("applied", patch=path) for _ in range(2)]
    await_file(home.path / "reached")
    open_gate(home)
    verdicts = {modules.answer(one)["verdict"] for one in both}
    assert "applied" in verdicts and verdicts <= {"applied", "unchanged"}
    assert len(home.history()) == len(transactions(home)) == 1


@pytest.mark.parametrize("check", [True, False])
def test_a_failure_behind_a_lost_connection_is_told_once(modules, ready, patch_dir, check):
    home = ready
    path = held_up().script("no.sh", when="post", status=3).write(patch_dir)
    cut_off(modules, home, path)
    open_gate(home)
    await_end(home)
    found = modules.fail("applied", patch=path, check=check)
    assert (found["verdict"], found["resumed"]) == ("failed", True)
    assert len(home.history()) == 1
    found = modules.fail("applied", patch=path)
    assert (found["verdict"], found["resumed"]) == ("failed", False)
    assert len(home.history()) == 2


def test_what_was_taken_back_by_hand_meanwhile_is_applied_anew(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    cut_off(modules, home, path)
    open_gate(home)
    await_end(home)
    Modules(modules.folder / "other", **modules.options).run("undone")
    found = modules.run("applied", patch=path)
    assert (found["changed"], found["resumed"]) == (True, False)
    assert len(home.history()) == 2


def test_a_module_that_nothing_listens_to_ends(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    process = modules.start("applied", patch=path)
    await_file(home.path / "reached")
    process.stdout.close()
    process.wait(timeout=30)
    process.stderr.close()
    open_gate(home)
    await_end(home)
    assert modules.run("applied", patch=path)["resumed"]


@pytest.fixture
def held_lock(modules, ready, patch_dir):
    """The lock of the home's runs, held by this process."""
    modules.run("applied", patch=a_patch().write(patch_dir), check=True)
    (path,) = modules.state.glob("*/lock")
    with open(path, "a", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        yield lock


@pytest.mark.parametrize("module", ["applied", "undone"])
def test_no_more_is_waited_for_the_lock_than_was_said(modules, patch_dir, held_lock, module):
    found = modules.fail(module, patch=patch_dir, timeout=1)
    assert found["verdict"] == "running" and "nothing was begun" in found["msg"]
    assert not list(modules.state.glob("*/*/run.json"))
    fcntl.flock(held_lock, fcntl.LOCK_UN)
    modules.run(module, patch=patch_dir, timeout=60)


def test_what_waits_for_the_lock_ends_when_nothing_listens(modules, patch_dir, held_lock):
    assert held_lock
    process = modules.start("applied", patch=patch_dir)
    process.stdout.close()
    process.wait(timeout=60)
    process.stderr.close()
    assert not list(modules.state.glob("*/*/run.json"))


def test_what_nothing_listens_to_begins_nothing(modules, ready, patch_dir, ctl_binary, scratch):
    """The connection is lost while the module looks at the home, before it starts anything."""
    stand_in, gate = scratch / "orvpatchctl", scratch / "gate"
    waits = f": >{scratch}/reached; while [ ! -e {gate} ]; do sleep 0.05; done"
    stand_in.write_text(f'#!/bin/sh\n[ "$1" != history ] || {{ {waits}; }}\nexec {ctl_binary} "$@"\n')
    stand_in.chmod(0o755)
    process = modules.start("applied", patch=a_patch().write(patch_dir), orvpatchctl=stand_in)
    await_file(scratch / "reached")
    process.stdout.close()
    gate.write_text("")
    process.wait(timeout=60)
    process.stderr.close()
    assert not list(modules.state.glob("*/*/run.json"))
    assert ready.history() == []


def test_a_module_that_does_not_wait_ends_nothing(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    found = modules.fail("applied", patch=path, timeout=1)
    assert found["verdict"] == "running"
    open_gate(home)
    found = modules.run("applied", patch=path, timeout=60)
    assert (found["verdict"], found["resumed"]) == ("applied", True)


def test_a_killed_transaction_is_taken_back_and_started_anew(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    cut_off(modules, home, path)
    kill_processes_of(home, patch_dir)
    open_gate(home)
    found = modules.run("applied", patch=path)
    assert (found["verdict"], found["resumed"]) == ("applied", False)
    assert "was taken back first" in found["record"]["messages"][0]


def kill_processes_of(home, patch_dir):
    """Everything whose command line names the home or the patches: the shell, orvpatchctl, the installer, the command."""
    for entry in os.listdir("/proc"):
        if entry.isdigit() and int(entry) != os.getpid():
            try:
                with open(f"/proc/{entry}/cmdline", "rb") as stream:
                    words = stream.read()
                if os.fsencode(patch_dir) in words or os.fsencode(home.path) in words:
                    os.kill(int(entry), 9)
            except (FileNotFoundError, ProcessLookupError):
                continue


def test_a_run_for_other_patches_is_waited_for(modules, ready, patch_dir):
    home, path = ready, held_up().write(patch_dir)
    other = Patch("um").file("lib/um").write(patch_dir)
    cut_off(modules, home, path)
    second = modules.start("applied", patch=other)
    time.sleep(1)
    assert second.poll() is None
    open_gate(home)
    found = modules.answer(second)
    assert (found["verdict"], found["levels_after"]) == ("applied", {"kum": "06.10.01.00"})
    assert any("applied" in warning for warning in found["warnings"])
    assert home.level("yn") == "06100100"


def test_an_undo_behind_a_lost_connection_is_told(modules, ready, patch_dir):
    home = ready
    home.start("yn")
    modules.run("applied", patch=a_patch().write(patch_dir))
    home.fail("stop", "yn", status=0)  # claims success and stops nothing: the undo waits for the process
    process = modules.start("undone")
    limit = time.monotonic() + 60
    while not any(json.loads(one.read_bytes())["action"] == "undo" for one in modules.state.glob("*/*/run.json")):
        assert time.monotonic() < limit
        time.sleep(0.02)
    os.killpg(process.pid, 9)
    process.communicate()
    found = modules.run("undone")
    assert (found["changed"], found["verdict"], found["resumed"]) == (True, "undone", True)
    assert modules.run("undone")["changed"] is False


def test_a_folder_of_runs_that_others_can_change_is_refused(modules, ready, patch_dir, scratch):
    path = a_patch().write(patch_dir)
    for state in (scratch / "open", scratch / "link", scratch / "file"):
        if state.name == "open":
            state.mkdir(mode=0o700)
            state.chmod(0o777)
        elif state.name == "link":
            (scratch / "aim").mkdir(mode=0o700)
            state.symlink_to(scratch / "aim")
        else:
            state.write_text("")
        found = modules.fail("applied", patch=path, state_dir=state)
        assert "no directory that is closed to other users" in found["msg"]
        assert found["verdict"] == "refused"
    assert ready.history() == []
