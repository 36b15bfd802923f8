"""System calls of the commands that read which fail: status 2 with its reason, or the same answer as without the
fault, never another one."""

import pytest

from callfaults import chosen, document_of, faults_of, is_met, is_mute, strace, try_each
from support import Patch

SAMPLE = 10
pytestmark = pytest.mark.usefixtures("seed")


@pytest.fixture
def subject(ctl, home, patch_dir):
    """A home with an installation, a patch with a fault of each severity, and one that is installed."""
    home.component("yn")
    home.component("um")
    (home.path / "tmp").chmod(0o700)
    home.write("lib/replaced", "old\n", 0o640)
    home.start("yn", "north")
    patch = Patch("yn").file("lib/replaced", "new\n").file("lib/new", "new\n").script("10_go.sh", when="post")
    document = ctl.document("apply", home, patch.write(patch_dir), "--yes")
    assert document["verdict"] == "applied"
    (patch_dir / "next").mkdir()
    odd = Patch("um", level="06100200").file("lib/replaced", "third\n").symlink("updated_files/lib/link", "new")
    odd.write(patch_dir / "next")
    Patch("yn", level="06100200").file("lib/a b", "third\n").write(patch_dir / "next")
    home.write("lib/new", "spoilt\n")
    return home, patch_dir, document["id"]


COMMANDS = {
    "lint": lambda home, patches, _: ["lint", patches / "next"],
    "show": lambda home, patches, _: ["show", patches / "next"],
    "status": lambda home, patches, _: ["status", home],
    "history": lambda home, patches, _: ["history", home],
    "log": lambda home, patches, _: ["log", home],
    "one run of the log": lambda home, patches, _: ["log", home, "1"],
    "check": lambda home, patches, _: ["check", home, patches / "next", "--no-report"],
    "verify": lambda home, patches, _: ["verify", home, next(patches.glob("*.tar"))],
    "verify a transaction": lambda home, patches, transaction: ["verify", home, "--transaction", transaction],
}


def findings_of(document):
    """Without the texts: an owner whose name cannot be looked up is told by number."""
    return [{key: value for key, value in finding.items() if key != "text"} for finding in document["findings"]]


def judge(result, usual, fault):
    """A probe of check that fails is a finding more; whatever else is found stays."""
    assert result.status in (0, 1, 2), result
    if result.status == 2:
        assert result.err or is_mute(fault), result
        return
    document, expected = document_of(result), document_of(usual)
    assert document is not None, result
    if document == expected:
        assert result.status == usual.status
        return
    assert "findings" in document and "report" in document, (document, expected)
    assert all(finding in findings_of(document) for finding in findings_of(expected)), (document, expected)
    assert document["errors"] > 0 and result.status == 1


@pytest.mark.parametrize("command", COMMANDS)
def test_calls_fail(ctl, subject, command):
    home, patches, transaction = subject
    words = [*COMMANDS[command](home, patches, transaction), "--json"]
    trace = home.path.parent / "trace"
    usual = ctl.run(*words, wrapper=strace(trace))
    assert usual.status in (0, 1), usual

    def judge_one(fault):
        judge(ctl.run(*words, wrapper=strace(trace, fault.words), timeout=120), usual, fault)
        return is_met(trace)

    try_each(command, chosen(faults_of(trace), SAMPLE), judge_one)
