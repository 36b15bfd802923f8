"""check: each rule for the host, on a home on which the installer really fails or harms in that way."""

import os
import shutil
import signal
import socket
import subprocess
import time
from pathlib import Path

import pytest

from support import Patch, stubs
from support.program import identity


# What a command of a patch does until the file `go` is in the home.
WAIT = 'while [ ! -e "$quill_home/go" ]; do sleep 0.05; done'


@pytest.fixture
def ready(home):
    home.component("yn")
    (home.path / "tmp").chmod(0o700)
    (home.path / "config/.ConfigData/RunInfo").chmod(0o644)
    return home


@pytest.fixture
def patch(write):
    return write(Patch("yn").file("lib/a", "new\n").file("lib/b", "new\n"))


def check(ctl, home, path, *options, status=None, **more):
    result = ctl.run("check", home, path, *options, **more)
    document = ctl.document("check", home, path, *options, status=result.status if status is None else status, **more)
    assert document["errors"] == sum(finding["severity"] == "error" for finding in document["findings"])
    return document


def found(document, rule):
    return [(finding["severity"], finding["where"]) for finding in document["findings"] if finding["rule"] == rule]


def host_rules(document):
    return {finding["rule"] for finding in document["findings"]} - {"no-checksum"}


def test_a_sound_home_has_no_finding(ctl, ready, patch):
    document = check(ctl, ready, patch, status=0)
    assert host_rules(document) == set()
    assert document["report"]["status"] == 0
    assert "kyn_lpp266" in document["report"]["stdout"]


def test_nothing_is_changed_without_the_report(ctl, ready, patch):
    before = ready.tree()
    document = check(ctl, ready, patch, "--no-report", status=0)
    assert document["report"] is None
    assert ready.tree() == before


def test_a_refused_report_leaves_nothing_in_tmp(ctl, ready, write):
    path = write(Patch("yn", level="05100000").file("lib/a"))
    for _ in range(2):
        assert found(check(ctl, ready, path, status=1), "installer-refuses")
    assert os.listdir(ready.path / "tmp") == []


@pytest.mark.parametrize("command", [("check",), ("apply", "--yes")])
@pytest.mark.parametrize("number", ["INT", "TERM"])
def test_an_interrupted_report_leaves_nothing_in_tmp(ctl, program, ready, patch, scratch, command, number):
    interrupted = scratch / "interrupted"
    interrupted.write_text(
        '#!/bin/sh\nmkdir "$2/tmp/kyn" && tar -xf "$4" -C "$2/tmp/kyn" || exit 99\n'
        f": >{scratch}/extracted\nkill -{number} $PPID\nexec sleep 60\n"
    )
    interrupted.chmod(0o755)
    result = ctl.run(
        command[0], ready, patch, *command[1:], "--installer", interrupted, wrapper=["env", "--default-signal"]
    )
    assert result.status == -signal.Signals[f"SIG{number}"], result
    assert (scratch / "extracted").exists()
    assert os.listdir(ready.path / "tmp") == []
    assert not ready.exists("patchlogs/transactions") or os.listdir(ready.path / "patchlogs/transactions") == []
    assert ctl.run("apply", ready, patch, "--yes", "--installer", program.binary).status == 0


def test_the_report_changes_log_and_tmp_alone(ctl, ready, patch):
    before = ready.tree()
    check(ctl, ready, patch, status=0)
    after = ready.tree()
    after.pop("patchlogs/orvpatch.log")
    assert after == before


@pytest.mark.parametrize("name, text", [("with blank", "characters"), ("a:b", "characters"), ("egrep", "grep")])
def test_home_path(ctl, scratch, write, name, text):
    from support import ProductHome

    home = ProductHome(scratch / name)
    try:
        home.component("yn")
        document = check(ctl, home, write(Patch("yn").file("lib/a")), "--no-report", status=1)
        assert found(document, "home-path")
        assert text in next(one["text"] for one in document["findings"] if one["rule"] == "home-path")
    finally:
        home.close()


def test_home_path_over_a_link(ctl, ready, patch, scratch):
    (scratch / "link").symlink_to(ready.path)
    assert found(check(ctl, scratch / "link", patch, "--no-report", status=1), "home-path")


@pytest.mark.parametrize("tmp", ["open", "link", "file", "foreign"])
def test_home_tmp(ctl, ready, patch, scratch, tmp):
    path = ready.path / "tmp"
    if tmp == "open":
        path.chmod(0o777)
    elif tmp == "foreign":
        if os.geteuid() != 0:
            pytest.skip("needs root")
        os.chown(path, 65534, -1)
    else:
        path.rmdir()
        path.symlink_to(scratch) if tmp == "link" else path.write_text("")
    assert found(check(ctl, ready, patch, "--no-report", status=1), "home-tmp") == [("error", "tmp")]


def test_a_missing_tmp_is_no_finding(ctl, ready, patch):
    (ready.path / "tmp").rmdir()
    assert host_rules(check(ctl, ready, patch, "--no-report", status=0)) == set()


def test_tmp_leftover_is_a_warning_unless_it_holds_the_only_copy(ctl, ready, patch):
    ready.write("tmp/kyn/updated_files/lib/kept", "x")
    ready.write("lib/kept", "x")
    document = check(ctl, ready, patch, status=0)
    assert found(document, "tmp-leftover") == [("warning", "tmp/kyn")]
    assert document["report"] is None
    (ready.path / "lib/kept").unlink()
    assert found(check(ctl, ready, patch, status=1), "tmp-leftover") == [("error", "tmp/kyn")]
    assert ready.exists("tmp/kyn/updated_files/lib/kept")


def test_patch_in_tmp_is_not_removed(ctl, ready, patch):
    inside = ready.mkdir("tmp/kyn") / patch.name
    shutil.copy(patch, inside)
    document = check(ctl, ready, inside, status=1)
    assert found(document, "patch-in-tmp")
    assert document["report"] is None
    assert inside.exists()


@pytest.mark.needs_root
def test_no_hard_link_and_space_on_another_file_system(ctl, ready, patch, write):
    lib = ready.mkdir("lib")
    subprocess.run(["mount", "-t", "tmpfs", "-o", "size=1m", "none", lib], check=True)
    try:
        assert found(check(ctl, ready, patch, status=1), "no-hard-link") == [("error", "lib")]
    finally:
        subprocess.run(["umount", lib], check=True)
    assert host_rules(check(ctl, ready, patch, status=0)) == set()


@pytest.mark.needs_root
@pytest.mark.parametrize("limit, rule", [("size=200k", "space"), ("nr_inodes=45", "inodes")])
def test_room(ctl, scratch, patch_dir, limit, rule):
    from support import ProductHome

    place = scratch / "small"
    place.mkdir()
    subprocess.run(["mount", "-t", "tmpfs", "-o", limit, "none", place], check=True)
    try:
        place.chmod(0o755)
        home = ProductHome(place)
        home.component("yn")
        (home.path / "tmp").chmod(0o700)
        large = Patch("yn").file("lib/a", b"x" * 300000) if rule == "space" else Patch("yn")
        for number in range(0 if rule == "space" else 45):
            large.file(f"lib/{number}")
        document = check(ctl, home, large.write(patch_dir), "--no-report", status=1)
        assert found(document, rule)
        home.close()
    finally:
        subprocess.run(["umount", place], check=True)


@pytest.mark.needs_root
@pytest.mark.parametrize("what, where", [("lib/a", "lib/a"), ("lib", "lib")])
def test_target_immutable(ctl, ready, patch, program, what, where):
    ready.write("lib/a", "old\n")
    if subprocess.run(["chattr", "+i", ready.path / what], check=False).returncode != 0:
        pytest.skip("the file system has no immutable files")
    try:
        assert ("error", where) in found(check(ctl, ready, patch, status=1), "target-immutable")
        assert program.install(ready, patch).status == 25
    finally:
        subprocess.run(["chattr", "-i", ready.path / what], check=True)


def test_target_is_link(ctl, ready, patch, program):
    ready.write("other/file", "old\n")
    ready.mkdir("lib")
    (ready.path / "lib/a").symlink_to("../other/file")
    assert found(check(ctl, ready, patch, status=0), "target-is-link") == [("warning", "lib/a")]
    assert program.install(ready, patch).status == 0
    assert ready.read("other/file") == b"old\n" and ready.read("lib/a") == b"new\n"


def test_target_is_directory(ctl, ready, patch, program):
    ready.mkdir("lib/a")
    assert found(check(ctl, ready, patch, status=1), "target-is-directory") == [("error", "lib/a")]
    assert program.install(ready, patch).status == 25


def test_other_names_keep_the_old_content(ctl, ready, patch, program):
    ready.write("lib/a", "old\n")
    os.link(ready.path / "lib/a", ready.path / "second")
    assert found(check(ctl, ready, patch, status=0), "other-names") == [("warning", "lib/a")]
    assert program.install(ready, patch).status == 0
    assert ready.read("second") == b"old\n"


@pytest.mark.needs_root
@pytest.mark.parametrize(
    "command",
    [["setfacl", "-m", "u:nobody:r"], ["setcap", "cap_net_raw+ep"], ["setfattr", "-n", "user.note", "-v", "kept"]],
)
def test_attributes_lost(ctl, ready, patch, program, command):
    target = ready.write("lib/a", "old\n")
    subprocess.run([*command, target], check=True)
    assert found(check(ctl, ready, patch, status=0), "attributes-lost") == [("warning", "lib/a")]
    assert program.install(ready, patch).status == 0
    assert os.listxattr(target) == []


def test_registry_and_run_information_of_others(ctl, ready, patch):
    (ready.path / "registry").chmod(0o777)
    (ready.path / "config/.ConfigData/RunInfo").chmod(0o666)
    document = check(ctl, ready, patch, status=0)
    assert found(document, "registry-writable") == [("warning", "registry")]
    assert found(document, "runinfo-writable") == [("warning", "config/.ConfigData/RunInfo")]


@pytest.mark.parametrize("row", ["short|row", "{host}|yn|12x4|one|x", "{host}|yn|1|a;b|x"])
def test_runinfo_syntax(ctl, ready, patch, row):
    ready.run_info += row.format(host=os.uname().nodename) + "\n"
    assert found(check(ctl, ready, patch, "--no-report", status=0), "runinfo-syntax") == [
        ("warning", "config/.ConfigData/RunInfo line 2")
    ]


def test_runinfo_without_a_separator(ctl, ready, patch):
    ready.run_info = "FIELDSEP\n"
    assert found(check(ctl, ready, patch, status=0), "runinfo-syntax")


def test_host_prefix(ctl, ready, patch):
    here = socket.gethostname().split(".")[0]
    ready.add_row("yn", os.getpid(), "one", host=f"{here}2")
    assert found(check(ctl, ready, patch, "--no-report"), "host-prefix") == [
        ("warning", "config/.ConfigData/RunInfo line 2")
    ]
    ready.run_info = "FIELDSEP=|\n"
    ready.add_row("yn", 1, "one", host=f"{here}.example")
    assert found(check(ctl, ready, patch, "--no-report"), "host-prefix") == []


@pytest.mark.needs_root
def test_an_owner_without_an_account(ctl, ready, patch):
    sleeper = subprocess.Popen(["sleep", "60"], **identity(54321))
    try:
        ready.add_row("yn", sleeper.pid, "one")
        assert found(check(ctl, ready, patch, "--no-report", status=1), "owner-unknown") == [("error", "kyn one")]
    finally:
        sleeper.kill()
        sleeper.wait()


@pytest.mark.needs_root
def test_an_owner_whose_name_ps_cuts(ctl, ready, patch):
    name = "orvlongname"
    subprocess.run(["useradd", "-M", name], check=True)
    try:
        sleeper = subprocess.Popen(["sleep", "60"], **identity(name))
        try:
            ready.add_row("yn", sleeper.pid, "one")
            assert found(check(ctl, ready, patch, "--no-report", status=1), "owner-truncated") == [("error", "kyn one")]
        finally:
            sleeper.kill()
            sleeper.wait()
    finally:
        subprocess.run(["userdel", name], check=True)


@pytest.mark.needs_root
def test_wrong_user(ctl, ready, patch):
    sleeper = subprocess.Popen(["sleep", "60"])
    try:
        ready.add_row("yn", sleeper.pid, "one")
        ready.give_to("nobody")
        document = check(ctl, ready, patch, "--no-report", user="nobody", status=1)
        assert found(document, "wrong-user") == [("error", "kyn one")]
    finally:
        sleeper.kill()
        sleeper.wait()


def test_tool_missing(ctl, ready, patch, scratch):
    tools = Path(stubs(scratch / "tools", tar="echo bsdtar").split(":")[0])
    for tool in ("ps", "grep", "sh", "cat"):
        (tools / tool).symlink_to(shutil.which(tool))
    document = check(ctl, ready, patch, "--no-report", "--path", str(tools), status=1)
    assert found(document, "tool-missing") == [("error", str(tools / "tar"))]
    (tools / "tar").unlink()
    (tools / "tar").symlink_to(shutil.which("tar"))
    assert found(check(ctl, ready, patch, "--no-report", "--path", str(tools)), "tool-missing") == []


def test_clock_behind(ctl, ready, write):
    path = write(Patch("yn").file("lib/a"))
    ready.write("patchlogs/orvpatch.log", "")
    future = time.time() + 7200
    os.utime(ready.path / "patchlogs/orvpatch.log", (future, future))
    assert found(check(ctl, ready, path, "--no-report", status=0), "clock-behind") == [
        ("warning", "patchlogs/orvpatch.log")
    ]


def test_other_run(ctl, ready, patch, write, program):
    waiting = Patch("yn").file("lib/a").script("slow.sh", when="pre", body=WAIT)
    slow = write(waiting, filename="kyn_unix_vema_a.tar")
    ready.component("yn", arch="unix")
    run = subprocess.Popen([*program.argv, "-h", str(ready.path), "-i", str(slow)], stdout=subprocess.DEVNULL)
    try:
        limit = time.monotonic() + 60
        while not ready.calls():
            assert time.monotonic() < limit
            time.sleep(0.05)
        document = check(ctl, ready, patch, status=1)
        assert found(document, "other-run")
        assert document["report"] is None
        assert ready.exists("tmp/kyn/slow.sh")
    finally:
        ready.write("go")
        assert run.wait(60) == 0


@pytest.fixture
def key(scratch):
    """A signing key: (environment for gpg, keyring of its public half)."""
    folder = scratch / "gnupg"
    folder.mkdir(mode=0o700)
    env = {**os.environ, "GNUPGHOME": str(folder)}
    subprocess.run(
        ["gpg", "--batch", "-q", "--passphrase", "", "--quick-gen-key", "maker@example", "ed25519", "sign"],
        env=env,
        check=True,
    )
    keyring = scratch / "keyring.gpg"
    keyring.write_bytes(subprocess.run(["gpg", "--export"], env=env, check=True, stdout=subprocess.PIPE).stdout)
    yield env, keyring
    subprocess.run(["gpgconf", "--kill", "all"], env=env, check=False)


def test_signatures(ctl, ready, patch, key):
    env, keyring = key

    def rules():
        document = check(ctl, ready, patch, "--no-report", "--keyring", keyring)
        return {finding["rule"] for finding in document["findings"]} & {"signature-missing", "signature-bad"}

    assert rules() == {"signature-missing"}
    sums = patch.parent / "SHA256SUMS"
    subprocess.run(f"sha256sum {patch.name} >SHA256SUMS", shell=True, cwd=patch.parent, check=True)
    assert rules() == {"signature-missing"}
    subprocess.run(["gpg", "--batch", "-q", "--armor", "--detach-sign", sums], env=env, check=True)
    assert rules() == set()
    good = sums.read_text()
    sums.write_text(good.replace(good[0], "0" if good[0] != "0" else "1", 1))
    assert rules() == {"signature-bad"}
    sums.write_text(good)
    patch.write_bytes(patch.read_bytes() + b"\0" * 512)
    assert rules() == {"signature-bad"}


def test_the_installer_refuses(ctl, ready, write):
    document = check(ctl, ready, write(Patch("yn", level="05100000").file("lib/a")), status=1)
    refused = next(one for one in document["findings"] if one["rule"] == "installer-refuses")
    assert (refused["where"], document["report"]["status"]) == ("status 11", 11)
    assert refused["text"].startswith("Can't install backlevel patch version")


@pytest.mark.parametrize("words", [("gone", None), (None, "gone.tar")])
def test_what_cannot_be_judged(ctl, ready, patch, scratch, words):
    home, path = (scratch / words[0] if words[0] else ready), (scratch / words[1] if words[1] else patch)
    result = ctl.run("check", home, path, "--json")
    assert (result.status, result.out) == (2, b"")
    assert result.err
