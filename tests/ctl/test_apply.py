"""apply and undo: an installation that can be taken back to the byte."""

import contextlib
import json
import os
import signal
import subprocess
import time

import pytest

from oracle import listing
from support import Patch
from support.sample import Sample


@pytest.fixture
def ready(home):
    """A home of the runner with two products and a tmp that is closed to others."""
    home.component("yn")
    home.component("um")
    (home.path / "tmp").chmod(0o700)
    return home


def a_patch(code="yn", **options):
    return (
        Patch(code, **options).file("lib/replaced", "new\n").file("lib/new", "new\n").file("fresh/deep/file", "new\n")
    )


def apply(ctl, home, path, *options, status=0):
    return ctl.document("apply", home, path, "--yes", *options, status=status)


def undo(ctl, home, *words, status=0):
    return ctl.document("undo", home, *words, status=status)


def change_of(document):
    return {file["path"]: file["change"] for file in document["files"]}


def test_a_patch_is_applied_and_taken_back(ctl, ready, write):
    home = ready
    home.write("lib/replaced", "old\n", 0o4750)
    before = listing(home)
    document = apply(ctl, home, write(a_patch()))
    assert document["verdict"] == "applied"
    assert change_of(document) == {"lib/replaced": "replaced", "lib/new": "new", "fresh/deep/file": "new"}
    assert document["patches"][0]["levelBefore"] == "06.10.00.00"
    assert document["patches"][0]["levelAfter"] == "06.10.01.00"
    assert document["patches"][0]["result"] == "PASS"
    assert document["installer"]["status"] == 0
    assert document["differences"] == []
    assert home.read("lib/replaced") == b"new\n"
    assert home.level("yn") == "06100100"
    taken = undo(ctl, home)
    assert (taken["verdict"], taken["messages"]) == ("undone", [])
    assert listing(home) == before
    assert [line.result for line in home.history()] == ["PASS"]


def test_new_directories_get_mode_and_owner_of_their_parents(ctl, ready, write):
    home = ready
    home.mkdir("opened", 0o2750)
    apply(ctl, home, write(Patch("yn").file("opened/a/b/file").file("other/file")))
    assert [oct((home.path / path).stat().st_mode & 0o7777) for path in ("opened/a", "opened/a/b", "other")] == [
        "0o2750",
        "0o2750",
        oct(home.path.stat().st_mode & 0o7777),
    ]


@pytest.mark.needs_root
def test_attributes_links_and_times_come_back(ctl, ready, write, scratch):
    home = ready
    for name in ("acl", "capability", "attribute", "owned", "linked"):
        home.write(f"lib/{name}", f"old {name}\n", 0o640)
        os.utime(home.path / "lib" / name, ns=(10**18, 10**18 + 123456789))
    subprocess.run(["setfacl", "-m", "u:nobody:r", home.path / "lib/acl"], check=True)
    subprocess.run(["setcap", "cap_net_raw+ep", home.path / "lib/capability"], check=True)
    os.setxattr(home.path / "lib/attribute", "user.note", b"kept")
    os.chown(home.path / "lib/owned", 65534, 65534)
    os.link(home.path / "lib/linked", home.path / "other-name")
    before = listing(home)
    patch = Patch("yn")
    for name in ("acl", "capability", "attribute", "owned", "linked"):
        patch.file(f"lib/{name}", "new\n")
    document = apply(ctl, home, write(patch))
    assert {finding["rule"] for finding in document["findings"]} >= {"attributes-lost", "other-names"}
    undo(ctl, home)
    assert listing(home) == before


@pytest.mark.parametrize(
    "target, code", [("vema", "ox"), ("vems", "qa"), ("veps", "pt"), ("vepd", "dk"), ("vecm", "zt")]
)
def test_each_target_is_taken_back(ctl, ready, write, target, code):
    home = ready
    home.component(code)
    home.write("lib/replaced", "old\n")
    before = listing(home)
    assert apply(ctl, home, write(a_patch(code, target=target)))["verdict"] == "applied"
    undo(ctl, home)
    assert listing(home) == before


def test_instances_run_again_after_apply_and_undo(ctl, ready, write):
    home = ready
    home.start("yn", "north")
    home.start("um")
    before = home.instances()
    document = apply(ctl, home, write(a_patch()))
    assert document["verdict"] == "applied"
    assert sorted((one["product"], one["name"]) for one in document["instances"]["before"]) == [
        ("kum", ""),
        ("kyn", "north"),
    ]
    assert home.instances() == before
    undo(ctl, home)
    assert home.instances() == before


def test_a_failure_in_the_middle_is_status_3_and_can_be_undone(ctl, ready, write):
    home = ready
    home.start("yn")
    home.write("lib/replaced", "old\n")
    before, running = listing(home), home.instances()
    document = apply(ctl, home, write(a_patch().script("no.sh", when="post", status=1)), status=3)
    assert (document["verdict"], document["installer"]["status"]) == ("failed", 23)
    assert document["patches"][0]["result"] == "FAIL"
    assert home.instances() == running  # what ran before was started again
    undo(ctl, home)
    assert listing(home) == before


def test_undo_on_failure_is_status_5(ctl, ready, write):
    home = ready
    home.write("lib/replaced", "old\n")
    before = listing(home)
    document = apply(ctl, home, write(a_patch().script("no.sh", when="post", status=1)), "--undo-on-failure", status=5)
    assert document["verdict"] == "undone"
    assert listing(home) == before


def test_a_silent_partial_installation_is_status_4(ctl, ready, write):
    home = ready
    document = apply(ctl, home, write(a_patch().script("go.sh", when="pre", body="rm updated_files/lib/new")), status=4)
    assert document["verdict"] == "incomplete"
    assert [(one["path"], one["kind"]) for one in document["differences"]] == [("lib/new", "missing")]


def test_what_a_command_changes_is_told_and_not_undone(ctl, ready, write):
    home = ready
    home.write("etc/conf", "old\n")
    home.write("etc/gone", "old\n")
    body = 'echo new >"$QUILLHOME/etc/conf"; rm "$QUILLHOME/etc/gone"; echo x >"$QUILLHOME/etc/made"'
    document = apply(ctl, home, write(a_patch().script("go.sh", when="post", body=body)))
    changed = [path for path in document["otherChanges"] if path.startswith("etc/")]
    assert changed == ["etc/conf", "etc/gone", "etc/made"]
    undo(ctl, home)
    assert home.read("etc/conf") == b"new\n"
    assert home.exists("etc/made") and not home.exists("etc/gone")


def test_findings_refuse_before_anything_changes(ctl, ready, write):
    home = ready
    before = home.tree()
    path = write(Patch("yn", level="05100000").file("lib/a"))
    document = apply(ctl, home, path, status=1)
    assert document["verdict"] == "refused"
    assert "installer-refuses" in [finding["rule"] for finding in document["findings"]]
    after = home.tree()
    for changed in (
        "patchlogs",
        "patchlogs/orvpatch.log",
        "patchlogs/transactions",
        "tmp",
        "tmp/kyn",
        "tmp/kyn/patch.ini",
    ):
        before.pop(changed, None)
        after.pop(changed, None)
    assert after == before
    assert os.listdir(home.path / "patchlogs/transactions") == []


def test_without_a_yes_nothing_happens(ctl, ready, write):
    home = ready
    before = listing(home)
    result = ctl.run("apply", home, write(a_patch()), "--json")
    assert result.status == 1
    assert json.loads(result.out)["verdict"] == "refused"
    assert b"--yes" in result.err
    assert listing(home) == before


def test_a_dry_run_tells_the_plan_and_changes_nothing(ctl, ready, write):
    home = ready
    home.write("lib/replaced", "old\n")
    before = listing(home)
    document = ctl.document("apply", home, write(a_patch()), "--dry-run")
    assert document["dryRun"] and document["verdict"] == "refused"
    assert change_of(document)["lib/replaced"] == "replaced"
    assert listing(home) == before


def test_a_file_that_was_changed_since_is_left_alone(ctl, ready, write):
    home = ready
    home.write("lib/replaced", "old\n")
    apply(ctl, home, write(a_patch()))
    home.write("lib/new", "mine\n")
    taken = undo(ctl, home, status=4)
    assert (taken["verdict"], taken["messages"]) == (
        "incomplete",
        ["lib/new: changed since the installation, left as it is"],
    )
    assert home.read("lib/new") == b"mine\n"
    assert home.read("lib/replaced") == b"old\n"


def test_a_file_that_was_made_since_in_the_place_of_a_missing_one_is_left_alone(ctl, ready, write):
    home = ready
    patch = a_patch().script("go.sh", when="pre", body="rm updated_files/lib/new")
    apply(ctl, home, write(patch), status=4)
    home.write("lib/new", "mine\n")
    taken = undo(ctl, home, status=4)
    assert "lib/new: changed since the installation, left as it is" in taken["messages"]
    assert home.read("lib/new") == b"mine\n"


def test_only_the_newest_transaction_of_a_file_is_undone(ctl, ready, write):
    home = ready
    home.write("lib/replaced", "old\n")
    before = listing(home)
    first = apply(ctl, home, write(a_patch()))
    time.sleep(1)
    apply(ctl, home, write(Patch("um").file("lib/replaced", "newer\n")))
    result = ctl.run("undo", home, first["id"])
    assert (result.status, b"later transaction" in result.err) == (1, True)
    assert home.read("lib/replaced") == b"newer\n"
    undo(ctl, home)
    assert home.read("lib/replaced") == b"new\n"
    undo(ctl, home, first["id"])
    assert listing(home) == before
    assert ctl.run("undo", home).status == 1


def test_thirty_patches_in_a_directory(ctl, ready, patch_dir):
    home = ready
    codes = [f"{first}{second}" for first in "abc" for second in "abcdefghij"]
    for code in codes:
        home.component(code)
        home.write(f"lib/{code}", "old\n")
        Patch(code).file(f"lib/{code}", "new\n").file(f"new/{code}").write(patch_dir)
    before = listing(home)
    document = apply(ctl, home, patch_dir)
    assert [patch["result"] for patch in document["patches"]] == ["PASS"] * 30
    undo(ctl, home)
    assert listing(home) == before


@pytest.mark.parametrize("planted", ["link", "file", "open", "foreign"])
def test_a_planted_folder_of_transactions_is_refused(ctl, ready, write, scratch, planted):
    home = ready
    place = home.path / "patchlogs/transactions"
    if planted == "link":
        place.symlink_to(scratch)
    elif planted == "file":
        place.write_text("")
    else:
        place.mkdir()
        place.chmod(0o777 if planted == "open" else 0o700)
        if planted == "foreign":
            if os.geteuid() != 0:
                pytest.skip("needs root")
            os.chown(place, 65534, 65534)
    before = listing(home)
    result = ctl.run("apply", home, write(a_patch()), "--yes")
    assert result.status == 1, result
    assert listing(home) == before


def test_the_newest_five_are_kept(ctl, ready, write):
    home = ready
    for number in range(7):
        apply(ctl, home, write(Patch("yn").file("lib/a", f"{number}\n")))
        time.sleep(1)
    kept = sorted(os.listdir(home.path / "patchlogs/transactions"))
    assert len(kept) == 5
    for _ in range(5):
        undo(ctl, home)
    assert home.read("lib/a") == b"1\n"


def test_a_second_transaction_and_a_plain_run_are_refused(ctl, ready, write, program):
    home = ready
    body = 'while [ ! -e "$quill_home/go" ]; do sleep 0.05; done'
    path = write(a_patch().script("slow.sh", when="pre", body=body))
    with at_work(home, [*ctl.program.argv, "apply", str(home.path), str(path), "--yes"]):
        result = ctl.run("apply", home, path, "--yes")
        assert (result.status, b"another transaction" in result.err) == (1, True)
        assert ctl.run("undo", home).status == 1
    with at_work(home, [*program.argv, "-h", str(home.path), "-i", str(path)]):
        document = apply(ctl, home, path, status=1)
        assert "other-run" in [finding["rule"] for finding in document["findings"]]


@contextlib.contextmanager
def at_work(home, words):
    """Meanwhile the command of the patch waits, which ends when the file `go` is in the home."""
    calls = len(home.calls())
    run = subprocess.Popen(words, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    try:
        deadline = time.monotonic() + 60
        while len(home.calls()) == calls:
            assert time.monotonic() < deadline
            time.sleep(0.05)
        yield
    finally:
        home.write("go")
        status = run.wait(120)
        home.remove("go")
    assert status == 0


def test_sample_home_with_live_agents(ctl, scratch):
    sample = Sample(scratch)
    sample.make()
    with sample.home as home:
        home.stop("qa")
        (home.path / "tmp").chmod(0o700)
        before, running = listing(home), home.instances()
        assert apply(ctl, home, scratch / "fixpack2")["verdict"] == "applied"
        assert home.instances() == running
        undo(ctl, home)
        assert home.instances() == running
        assert listing(home) == before


def test_what_others_did_before_the_installation_began_stays(ctl, ready, write):
    home = ready
    for path in ("lib/replaced", "lib/other"):
        home.write(path, "old\n")
    archive = write(a_patch().file("lib/other", "new\n"))
    result = ctl.run(
        "apply",
        home,
        archive,
        "--yes",  # killed as it puts on disk what it has saved
        wrapper=["strace", "-o", "/dev/null", "-e", "inject=syncfs:signal=SIGKILL:when=1"],
    )
    assert result.status == -signal.SIGKILL, result
    home.write("lib/new", "the administrator's\n")
    home.remove("lib/replaced")
    home.write("lib/replaced", "the administrator's\n")
    home.component("yn", "06100005")
    taken = undo(ctl, home)
    assert (taken["verdict"], taken["messages"]) == ("undone", [])
    for path in ("lib/new", "lib/replaced"):
        assert home.read(path) == b"the administrator's\n"
    assert (home.read("lib/other"), (home.path / "lib/other").stat().st_nlink) == (b"old\n", 1)
    assert home.level("yn") == "06100005"
    assert apply(ctl, home, archive)["verdict"] == "applied"
