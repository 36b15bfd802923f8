"""Parts of the collection that need no home: the filters, the lookup, and the runs that no connection ends."""

import ast
import hashlib
import os
import time

import pytest

from modules import COLLECTION


@pytest.mark.parametrize(
    "path", sorted(COLLECTION.glob("plugins/module*/*.py")), ids=lambda path: f"{path.parent.name}/{path.stem}"
)
def test_the_grammar_is_that_of_python_3_6(path):
    ast.parse(path.read_text(encoding="utf-8"), feature_version=(3, 6))


# --- entries and document ---

FACTS = {"home": "/opt/orv", "components": [{"code": "kyn"}], "levels": {"kyn": "06.10.00.00"}}
AFTER = dict(FACTS, levels={"kyn": "06.10.01.00"})
RECORD = {"id": "T1", "started": "2026-03-09T17:04:12Z", "ended": "2026-03-09T17:04:55Z"}
APPLIED = {"verdict": "applied", "transaction": "T1", "record": RECORD}
FAILED = {"failed": True, "verdict": "failed", "msg": "no space", "transaction": "T1", "record": RECORD}
BATCH = {"number": "2", "started": "2026-03-09T17:00:00Z"}
END = {"ended": "2026-03-09T17:10:00Z", "bad": False}


def entry_of(part, **registered):
    variables = {f"fixpack_{name}": value for name, value in registered.items()}
    return part("filter.fleet").entry({"inventory_hostname": "one", "fixpack_home": "/opt/orv", **variables})


def test_a_host_that_was_not_asked_is_untouched(part):
    assert entry_of(part) == {
        "host": "one",
        "home": "/opt/orv",
        "batch": 0,
        "verdict": "untouched",
        "reason": "",
        "started": None,
        "ended": None,
        "components": [],
        "levelsBefore": {},
        "levelsAfter": {},
        "transaction": None,
        "record": None,
    }


def test_a_host_that_was_applied_has_levels_times_and_record(part):
    made = entry_of(part, facts=FACTS, check={"verdict": "checked"}, result=APPLIED, verified=AFTER, batch=BATCH)
    assert (made["verdict"], made["batch"], made["transaction"]) == ("applied", 2, "T1")
    assert (made["levelsBefore"], made["levelsAfter"]) == ({"kyn": "06.10.00.00"}, {"kyn": "06.10.01.00"})
    assert (made["started"], made["ended"]) == (RECORD["started"], RECORD["ended"])
    assert made["record"] == RECORD


def test_a_host_that_was_unchanged_has_the_times_of_its_batch(part):
    result = dict(APPLIED, verdict="unchanged")
    made = entry_of(part, facts=AFTER, result=result, batch=BATCH, batch_end=END)
    assert (made["verdict"], made["started"], made["ended"]) == ("unchanged", BATCH["started"], END["ended"])


@pytest.mark.parametrize(
    "registered, verdict, reason",
    [
        ({"facts": {"failed": True, "msg": "no home"}}, "refused", "no home"),
        ({"made": {"failed": True, "msg": "no space"}}, "refused", "no space"),
        ({"check": {"failed": True, "msg": "crashed"}}, "refused", "crashed"),
        ({"result": {"failed": True, "msg": "crashed"}}, "failed", "crashed"),
        ({"result": APPLIED, "verified": {"failed": True, "msg": "crashed"}}, "incomplete", "crashed"),
        ({"facts": {"unreachable": True, "msg": "no route"}}, "unreachable", "no route"),
        (
            {"staged": {"failed": True, "msg": "one item", "results": [{"failed": True, "msg": "no space"}, {}]}},
            "refused",
            "no space",
        ),
        ({"check": {"failed": True, "verdict": "refused", "msg": "backlevel"}}, "refused", "backlevel"),
        ({"check": {"verdict": "checked"}}, "checked", ""),
        ({"result": {"failed": True, "verdict": "incomplete", "msg": "lib/a"}}, "incomplete", "lib/a"),
        ({"result": APPLIED, "verified": {"unreachable": True, "msg": "cut"}}, "unreachable", "cut"),
        ({"result": FAILED, "verified": {"unreachable": True, "msg": "cut"}}, "failed", "no space"),
        ({"result": FAILED, "verified": {"failed": True, "msg": "crashed"}}, "failed", "no space"),
        ({"result": FAILED, "verified": {"verdict": "checked"}}, "failed", "no space"),
        ({"check": {"failed": True, "verdict": "refused", "msg": "in use"}, "result": APPLIED}, "applied", ""),
        (
            {"result": FAILED, "undone": {"failed": True, "verdict": "refused", "msg": "in use"}},
            "incomplete",
            "no space; not taken back: in use",
        ),
        (
            {"result": FAILED, "undone": {"unreachable": True, "msg": "cut"}},
            "unreachable",
            "no space; not taken back: cut",
        ),
        ({"check": {"skipped": True, "verdict": "checked"}}, "untouched", ""),
        ({"result": APPLIED, "undone": {"verdict": "unchanged"}}, "applied", ""),
        ({"result": APPLIED, "undone": {"failed": True, "msg": "no"}}, "incomplete", "not taken back: no"),
        ({"result": APPLIED, "undone": {"unreachable": True, "msg": "no"}}, "unreachable", "not taken back: no"),
    ],
)
def test_the_last_task_that_decides_is_told(part, registered, verdict, reason):
    made = entry_of(part, **registered)
    assert (made["verdict"], made["reason"]) == (verdict, reason)


def test_a_home_that_differs_from_its_patch_is_incomplete(part):
    differences = [{"path": f"lib/{number}", "text": "missing"} for number in range(7)]
    verified = dict(AFTER, verification={"differences": differences, "files": 9})
    made = entry_of(part, result=APPLIED, verified=verified)
    assert made["verdict"] == "incomplete"
    assert made["reason"].startswith("lib/0: missing; ") and made["reason"].endswith("; and 2 more")
    failed = {"failed": True, "verdict": "failed", "msg": "no space"}
    assert entry_of(part, result=failed, verified=verified)["reason"] == "no space"


def test_a_home_that_failed_and_was_read_again_has_its_levels(part):
    made = entry_of(part, facts=FACTS, result=FAILED, verified=AFTER)
    assert (made["verdict"], made["levelsAfter"]) == ("failed", AFTER["levels"])


def test_a_host_that_was_taken_back_keeps_reason_and_record(part):
    undone = {
        "verdict": "undone",
        "transaction": "T1",
        "record": dict(RECORD, id="T2"),
        "levels_after": FACTS["levels"],
    }
    failed = {"failed": True, "verdict": "failed", "msg": "no space", "record": RECORD, "transaction": "T1"}
    made = entry_of(part, facts=FACTS, result=failed, verified=AFTER, undone=undone)
    assert (made["verdict"], made["reason"], made["record"]) == ("undone", "no space", RECORD)
    assert made["levelsAfter"] == FACTS["levels"]
    assert entry_of(part, undone=undone)["record"]["id"] == "T2"


def test_which_verdicts_stop_a_rollout(part):
    is_bad = part("filter.fleet").is_bad
    good = {"applied", "unchanged", "checked", "untouched"}
    for verdict in good | {"refused", "failed", "incomplete", "undone", "unreachable"}:
        assert is_bad({"verdict": verdict}) is (verdict not in good)
    assert not is_bad({"verdict": "undone"}, undoing=True)
    assert is_bad({"verdict": "incomplete"}, undoing=True)


def test_what_no_batch_has_reached_is_untouched_in_a_rollout(part):
    entries = [
        {"verdict": "checked", "reason": "", "batch": 0, "components": [{}]},
        {"verdict": "refused", "reason": "backlevel", "batch": 0, "components": [{}]},
        {"verdict": "applied", "reason": "", "batch": 1, "components": [{}]},
        {"verdict": "untouched", "reason": "", "batch": 0, "components": [{}]},
        {"verdict": "untouched", "reason": "", "batch": 0, "components": []},
    ]
    for rollout, verdicts in (
        (True, ["untouched", "refused", "applied", "untouched", "untouched"]),
        (False, ["checked", "refused", "applied", "unchanged", "untouched"]),
    ):
        made = part("filter.fleet").document(entries, ["a.tar"], "then", "now", rollout)
        assert [one["verdict"] for one in made["fleet"]] == verdicts
        assert (made["patches"], made["started"], made["ended"]) == (["a.tar"], "then", "now")
        assert made["rollout"] is rollout


# --- what goes to the hosts ---

NAME = "kyn_lpp266_vema_fp0002.tar"


def sums(*files):
    return "".join(f"{hashlib.sha256(one.read_bytes()).hexdigest()}  {one.name}\n" for one in files)


@pytest.fixture
def source(part, patch_dir):
    """source(path) with a folder of one patch, its sums, a signature and what is not copied."""
    (patch_dir / NAME).write_bytes(b"archive")
    (patch_dir / "readme.txt").write_text("Fix pack 2\n")
    (patch_dir / "SHA256SUMS").write_text(sums(patch_dir / NAME))
    (patch_dir / "SHA256SUMS.asc").write_text("signature\n")
    (patch_dir / ".hidden").write_text("")
    (patch_dir / "folder").mkdir()
    return lambda path=patch_dir, require_sums=False: part("lookup.source").source(str(path), require_sums)


def test_a_directory_goes_whole(source, patch_dir):
    made = source()
    assert [one["name"] for one in made["files"]] == sorted([NAME, "readme.txt", "SHA256SUMS", "SHA256SUMS.asc"])
    assert (made["patches"], made["is_directory"]) == ([NAME], True)
    assert made["digests"][NAME] == hashlib.sha256(b"archive").hexdigest()
    assert next(one["sha1"] for one in made["files"] if one["name"] == NAME) == hashlib.sha1(b"archive").hexdigest()
    again = source()["id"]
    (patch_dir / "readme.txt").write_text("Fix pack 3\n")
    assert made["id"] == again != source()["id"]


def test_a_patch_goes_with_its_sums_and_their_signature(source, patch_dir):
    made = source(patch_dir / NAME)
    assert [one["name"] for one in made["files"]] == [NAME, "SHA256SUMS", "SHA256SUMS.asc"]
    assert (made["patches"], made["is_directory"]) == ([NAME], False)


def test_a_file_that_is_not_the_listed_one_does_not_go(source, patch_dir):
    from ansible.errors import AnsibleLookupError

    (patch_dir / NAME).write_bytes(b"another")
    with pytest.raises(AnsibleLookupError, match="not the file that"):
        source()


def test_what_is_a_patch_is_told_by_the_name(part):
    is_patch = part("lookup.source").is_patch
    assert is_patch(NAME) and is_patch(f"{NAME}.sha256")
    for name in ("readme.txt", "SHA256SUMS", "how_to_install_it.txt", "kyn_lpp266_vemx_fp0002.tar", f"old_{NAME}"):
        assert not is_patch(name)


def test_sums_can_be_required(source, patch_dir):
    from ansible.errors import AnsibleLookupError

    assert source(require_sums=True)["patches"] == [NAME]
    (patch_dir / "SHA256SUMS").write_text(sums(patch_dir / "readme.txt"))
    assert source()["patches"] == [NAME]
    with pytest.raises(AnsibleLookupError, match="does not list"):
        source(require_sums=True)


def test_a_source_that_is_not_there_is_told(source, scratch):
    from ansible.errors import AnsibleLookupError

    with pytest.raises(AnsibleLookupError, match="cannot read .*none"):
        source(scratch / "none")


# --- runs ---


@pytest.fixture
def runs(part, scratch):
    return part("module_utils.runs").Runs(str(scratch / "runs"), str(scratch))


def started(runs, script, **job):
    with runs.locked():
        return runs.start(job, ["/bin/sh", "-c", script])


def test_a_run_has_status_and_both_outputs(runs):
    run = started(runs, "echo out; echo err >&2; exit 3", action="apply")
    assert run.wait(60, lambda: True)
    assert (run.status, run.out, run.err) == (3, "out\n", "err\n")
    assert run.job["action"] == "apply"
    found = runs.find()
    assert found.folder == run.folder and not found.is_told
    found.tell()
    assert runs.find() is None


def test_a_run_that_ends_has_its_status(runs):
    """At no moment it seems to be gone without one: fifty short runs are watched as closely as can be."""
    for _ in range(50):
        run = started(runs, "exit 7")
        while run.is_alive:
            pass
        assert run.status == 7
        run.process.wait()


def test_a_run_is_in_a_session_of_its_own(runs):
    run = started(runs, "ps -o sid= -o pgid= -p $$; umask; readlink /proc/self/fd/0; pwd")
    assert run.wait(60, lambda: True)
    session, group = run.out.split()[:2]
    assert session == group == str(run.process.pid) != str(os.getsid(0))
    assert run.out.split()[2:] == ["0022", "/dev/null", "/"]


def test_no_more_is_waited_than_was_said(part, runs):
    run = started(runs, "sleep 30")
    begun = time.monotonic()
    assert run.wait(1, lambda: True) is False
    assert time.monotonic() - begun < 20
    assert run.is_alive and runs.find().is_alive
    with pytest.raises(part("module_utils.runs").Lost):
        run.wait(0, lambda: False)
    os.killpg(run.process.pid, 9)
    run.process.wait()
    assert run.wait(0, lambda: True) and run.status is None
    assert not runs.find().is_alive


def test_a_process_of_the_same_number_is_not_the_run(part, runs):
    run = started(runs, "sleep 30")
    supervises = part("module_utils.runs").supervises
    assert supervises(str(run.process.pid), run.folder)
    assert not supervises(str(os.getpid()), run.folder)
    assert not supervises("", run.folder)
    os.killpg(run.process.pid, 9)
    run.process.wait()
    assert not supervises(str(run.process.pid), run.folder)


def test_few_ended_runs_are_kept_and_all_are_private(part, runs, scratch):
    for _ in range(8):
        run = started(runs, "exit 0")
        run.wait(60, lambda: True)
        run.process.wait()
    (folder,) = (scratch / "runs").iterdir()
    kept = sorted(one for one in folder.iterdir() if one.is_dir())
    assert len(kept) == part("module_utils.runs").KEPT
    assert str(kept[-1]) == run.folder
    for one in [scratch / "runs", folder, *kept]:
        assert one.stat().st_mode & 0o777 == 0o700


def test_it_is_known_whether_something_listens(part):
    is_listened = part("module_utils.runs").is_listened
    reading, writing = os.pipe()
    assert is_listened(writing)
    os.close(reading)
    assert not is_listened(writing)
    os.close(writing)
