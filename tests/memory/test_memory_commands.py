"""Whole commands under valgrind: no error, nothing lost, no descriptor left open, no zombie."""

import os
import subprocess

import pytest

from memcheck import Memcheck
from support import Patch

pytestmark = pytest.mark.memory

# Run by a patch's command: notes which descriptors the tool has open, and the states of its children. Not before the
# tool sleeps: until then it may have had no time to close the ends of the pipes that are the child's.
LOOK = """until grep -q '^State:.S' /proc/$PPID/status; do :; done
echo /proc/$PPID/fd/* >>"$QUILLHOME/descriptors"
ps --ppid $PPID -o stat= >>"$QUILLHOME/children\""""


@pytest.fixture
def run(program, scratch):
    """Runs the program under valgrind and asserts that there is nothing to find."""

    def checked(*arguments, status, **options):
        memcheck = Memcheck(scratch)
        result = program.run(*arguments, wrapper=memcheck.words, timeout=300, **options)
        report = memcheck.report()
        assert (report.errors, report.lost, report.descriptors) == (0, 0, []), report.text
        assert memcheck.child_errors() == 0
        assert result.status == status, result
        return result

    return checked


@pytest.fixture
def product(home):
    """A home with four components of different kinds, of which agents and the server run."""
    for code in ("ox", "yn", "wn", "qa"):
        home.component(code, prereqs=["oxlpp266|gl"])
    home.component("zt", filename="ztlpp266.ver")
    home.start("ox")
    home.start("yn", "one")
    home.start("yn", "two")
    home.start("wn", "kwnsnetd_x")
    return home


def whole_patch():
    return (
        Patch("yn", level="06100200", prereqs={"ox": "061000"}, dependents=["ox", "qa", "wn"], exe="agent.exe")
        .file("bin/agent")
        .file("new/sub/file")
        .file("bin/QuillHelp", "x")
        .directory("empty")
        .script("1.sh", "pre_patch", out="said")
        .script("2.sh", "pre", err="cried")
        .script("3.sh", "post")
    )


def test_usage(run):
    run(status=1)


def test_a_home_that_is_not_there(run, scratch):
    run("-h", scratch / "missing", "-i", "x", status=2)


def test_validation(run, product, scratch):
    good = whole_patch().write_descriptor(scratch / "good.ini")
    run("-h", product, "-vi", good, status=0)


@pytest.mark.parametrize(
    "text, status",
    [("", 6), ("x=1\n[ProductInfo]\nproductCode=ox\n", 7), (None, 5)],
    ids=["no section", "no key", "no file"],
)
def test_a_validation_that_fails(run, product, scratch, text, status):
    if text is not None:
        (scratch / "bad.ini").write_text(text)
    run("-h", product, "-vi", scratch / "bad.ini", status=status)


def test_the_self_check(run, product):
    run("x", product, "-utest", status=0)


def test_an_installation(run, product, patch_dir):
    run("-h", product, "-i", whole_patch().write(patch_dir), status=0)
    assert product.level("yn") == "06100200"


def test_a_report_on_a_directory(run, product, patch_dir):
    whole_patch().write(patch_dir)
    Patch("ox", dependents=["all"]).file("bin/x").write(patch_dir)
    Patch("zt", target="vecm").file("bin/x").write(patch_dir)
    (patch_dir / "readme.txt").write_text("no patch")
    result = run("-h", product, "-t", patch_dir, env={"PATCH_DEBUG": "1"}, status=0)
    assert result.out.count(b"\nProcessing patch file: ") == 3


FAILURES = {
    "not applicable": (34, lambda patch: Patch("xx")),
    "no descriptor": (3, lambda patch: Patch("yn", descriptor=False)),
    "broken descriptor": (6, lambda patch: Patch("yn", descriptor="[s]\n")),
    "old level": (11, lambda patch: Patch("yn", level="06000000")),
    "prerequisite": (9, lambda patch: Patch("yn", prereqs={"ab": "061000"})),
    "pre-patch command": (22, lambda patch: patch.command("pre_patch", "0")),
    "pre command": (21, lambda patch: patch.script("0.sh", "pre", status=1, out="x" * 5000)),
    "post command": (23, lambda patch: patch.script("0.sh", "post", status=1)),
    "move": (25, lambda patch: patch.file("registry/blocked")),
    "directory": (26, lambda patch: patch.file("registry/ynlpp266.ver/sub/file")),
}


@pytest.mark.parametrize("failure", FAILURES)
def test_an_installation_that_fails(run, product, patch_dir, failure):
    status, damaged = FAILURES[failure]
    product.mkdir("registry/blocked")
    run("-h", product, "-i", damaged(whole_patch()).write(patch_dir), status=status)


@pytest.mark.parametrize("verb, status", [("stop", 15), ("start", 13)])
def test_an_instance_that_does_not_obey(run, product, patch_dir, verb, status):
    product.fail(verb, "yn", "two")
    run("-h", product, "-i", whole_patch().write(patch_dir), status=status)


def test_a_server_that_runs(run, product, patch_dir):
    product.start("qa")
    run("-h", product, "-i", Patch("qa", target="vems").file("x").write(patch_dir), status=35)


def assert_one_child_at_a_time(product, times):
    descriptors, states = product.read("descriptors").splitlines(), product.read("children").split()
    assert len(descriptors) == len(states) == times
    assert len(set(descriptors)) == 1, "descriptors that stay open"
    assert {state[:1] for state in states} <= {b"S", b"R", b"D"}, "a zombie beside the command itself"


def test_a_patch_of_a_thousand_files(run, product, patch_dir):
    patch = Patch("ox").script("1.sh", "pre_patch", body=LOOK).script("2.sh", "post", body=LOOK)
    for number in range(1000):
        patch.file(f"lib/{number % 10}/{number}")
    run("-h", product, "-i", patch.write(patch_dir), status=0)
    assert sum(len(files) for _, _, files in os.walk(product.path / "lib")) == 1000
    assert_one_child_at_a_time(product, 2)


def test_a_directory_of_200_patches(run, product, patch_dir):
    first = Patch("ox").file("bin/tool").script("look.sh", "pre", body=LOOK).write(patch_dir)
    for number in range(2, 201):
        os.link(first, patch_dir / f"kox_lpp266_vema_fp{number:04}.tar")
    run("-h", product, "-i", patch_dir, status=0)
    assert [line.result for line in product.history()] == ["PASS"] * 200
    assert_one_child_at_a_time(product, 200)


def test_the_check_itself_sees_an_open_descriptor(scratch):
    memcheck = Memcheck(scratch)
    subprocess.run([*memcheck.words, "/bin/sh", "-c", "exec 5</dev/null"], timeout=60, check=True)
    assert [entry.split()[0] for entry in memcheck.report().descriptors] == ["5"]


def test_the_check_itself_sees_a_loss(scratch):
    source, lossy = scratch / "lossy.c", scratch / "lossy"
    source.write_text("#include <stdlib.h>\nint main(void) { return malloc(7) == 0; }\n")
    subprocess.run(["gcc", "-O0", "-o", lossy, source], timeout=60, check=True)
    memcheck = Memcheck(scratch)
    done = subprocess.run([*memcheck.words, lossy], timeout=60, check=False)
    assert (memcheck.report().errors, memcheck.report().lost, done.returncode) == (1, 7, 99)
