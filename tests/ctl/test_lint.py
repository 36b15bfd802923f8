"""lint: good patches, directories, statuses, what a terminal shows, and what it leaves behind."""

import gzip
import os
import shutil
import signal
import subprocess
import time

import pytest

from hostile.rawarchive import RawArchive
from support import Patch, sample
from lintcases import descriptor

NOTHING = {"findings": [], "errors": 0, "warnings": 0}


def rules(document):
    return [finding["rule"] for finding in document["findings"]]


@pytest.fixture(scope="module")
def samples(tmp_path_factory):
    folder = tmp_path_factory.mktemp("sample")
    made = sample.Sample(folder)
    made.make()
    yield folder
    made.home.stop_all()


@pytest.mark.parametrize("path", ["fixpack2", "single/kyn_lpp266_vema_fp0001.tar", "single/kum_lpp266_vema_fp0003.tar"])
def test_nothing_is_found_on_the_sample_patches(ctl, samples, path):
    assert ctl.document("lint", "--strict", samples / path) == NOTHING


def test_nothing_is_found_on_each_single_sample_patch(ctl, samples):
    patches = sorted((samples / "fixpack2").glob("*.tar"))
    assert len(patches) == 6
    assert ctl.document("lint", "--strict", *patches) == NOTHING


@pytest.mark.parametrize("pack", [gzip.compress], ids=["gzip"])
def test_a_compressed_archive_is_read_like_tar_reads_it(ctl, patch_dir, write, pack):
    path = write(Patch("ox").file("bin/tool"))
    path.write_bytes(pack(path.read_bytes()))
    assert ctl.document("lint", path) == NOTHING


def test_the_descriptor_that_counts_is_the_last_one(ctl, patch_dir):
    archive = RawArchive(Patch("ox", descriptor="no descriptor")).file("updated_files/bin/tool")
    assert ctl.document("lint", archive.file("patch.ini", descriptor()).write(patch_dir)) == NOTHING


@pytest.mark.parametrize(
    "text, where",
    [
        (descriptor("[PreCommands]\n10_a.sh=1\n"), "patch.ini:10"),
        ("# comment\n\nstray\n" + descriptor(), "patch.ini:3"),
    ],
)
def test_a_finding_names_the_line(ctl, write, text, where):
    document = ctl.document("lint", write(Patch("ox", descriptor=text).file("bin/tool")), status=1)
    assert [finding["where"] for finding in document["findings"]] == [where]


def test_the_installers_own_words_are_quoted(ctl, write, patch_dir):
    bad_name = Patch("ox").file("bin/tool").write(patch_dir, "kox_vms_vema_fp1.tar")
    assert "invalid platform architecture in patch file name: vms" in str(ctl.document("lint", bad_name, status=1))
    short = write(Patch("ox", descriptor="[ProductInfo]\nproductCode = kox\n").file("bin/tool"))
    assert "Missing required property: productEXE" in str(ctl.document("lint", short, status=1))
    level = write(Patch("ox", descriptor=descriptor("[PreReqs]\nyn = 6.1\n")).file("bin/tool"))
    assert "Unrecognized VVRRMMFF version string format provided: 6.1" in str(ctl.document("lint", level, status=1))


def test_many_findings_of_a_rule_are_counted(ctl, patch_dir):
    archive = RawArchive(Patch("ox"))
    for number in range(50):
        archive.file(f"updated_files/bin/{number} x")
    findings = ctl.document("lint", archive.write(patch_dir))["findings"]
    assert len(findings) == 21
    assert findings[-1]["text"] == "and 30 more of these"


def test_patches_of_other_systems_may_lie_in_a_directory(ctl, write, patch_dir):
    write(Patch("ox").file("bin/tool"))
    write(Patch("ox", platform="li6263").file("bin/tool"))
    (patch_dir / "readme.txt").write_text("Fix pack 1\n")
    assert ctl.document("lint", patch_dir) == NOTHING


def test_an_archive_with_no_patchs_name_is_found_in_a_directory(ctl, write, patch_dir):
    good = write(Patch("ox").file("bin/tool"))
    shutil.copy(good, patch_dir / "kox_vms_vema_fp0002.tar")
    document = ctl.document("lint", patch_dir, status=1)
    assert [(finding["rule"], finding["patch"]) for finding in document["findings"]] == [
        ("name-grammar", "kox_vms_vema_fp0002.tar")
    ]


@pytest.mark.parametrize("suffix", [".bak", "~", ".asc", ".sha256"])
def test_a_backup_is_a_companion_and_nothing_else(ctl, write, patch_dir, suffix):
    good = write(Patch("ox").file("bin/tool"))
    shutil.copy(good, f"{good}{suffix}")
    assert rules(ctl.document("lint", patch_dir, status=1)) == ["companion-is-patch"]


def test_a_checksum_list_that_fits_is_no_finding(ctl, write, patch_dir):
    good = write(Patch("ox").file("bin/tool"))
    with open(patch_dir / "SHA256SUMS", "wb") as sums:
        subprocess.run(["sha256sum", good.name], cwd=patch_dir, stdout=sums, check=True)
    assert ctl.document("lint", patch_dir) == NOTHING
    assert ctl.run("lint", good.name, cwd=patch_dir).status == 0


@pytest.mark.parametrize(
    "words, said",
    [
        ([], b"no patch was given"),
        (["--explain", "no-such-rule"], b"no such rule: no-such-rule"),
        (["/nonexistent/x.tar"], b"cannot read /nonexistent/x.tar"),
        (["/dev/null"], b"no regular file: /dev/null"),
        (["/proc/self/fd"], b"no patch in /proc/self/fd/"),
    ],
)
def test_what_cannot_be_judged_is_status_2(ctl, words, said):
    result = ctl.run("lint", *words)
    assert (result.status, result.out) == (2, b"")
    assert said in result.err


def test_a_tar_that_is_not_there_is_status_2(ctl, write, patch_dir):
    """A read error of any input must never become a verdict: here the list of checksums is a directory."""
    path = write(Patch("ox").file("bin/tool"))
    (patch_dir / "SHA256SUMS").mkdir()
    result = ctl.run("lint", path)
    assert (result.status, result.out) == (2, b"")


def test_a_terminal_gets_groups_and_a_count(ctl, write):
    path = write(Patch("ox", descriptor=descriptor("[PreCommands]\n10_a.sh\n", name="a\rb")).file("bin/tool"))
    out = ctl.run("lint", path).out.decode().splitlines()
    assert out[0] == path.name
    assert out[1].split() == ["error", "command-not-found"]
    assert out[-1] == "1 errors, 1 warnings"
    assert not any("\x1b" in line for line in out)
    assert b"\x1b[31merror" in ctl.run("lint", "--color", "always", path).out


def test_names_do_not_move_the_cursor(ctl, patch_dir):
    path = RawArchive(Patch("ox")).file("updated_files/\x1b[2J").write(patch_dir)
    assert b"\x1b" not in ctl.run("lint", path).out


def test_a_rule_is_explained_without_a_patch(ctl):
    result = ctl.run("lint", "--explain", "command-cut")
    assert result.status == 0
    assert result.out.startswith(b"command-cut (error)\n")
    assert [rule["rule"] for rule in ctl.document("lint", "--explain", "command-cut")["rules"]] == ["command-cut"]


def test_nothing_is_left_behind(ctl, scratch, patch_dir):
    """Neither beside the patch nor in the folder for temporary files, also of closed directories."""
    (scratch / "tmp").mkdir()
    archive = RawArchive(Patch("ox")).file("updated_files/shut/in/file").directory("updated_files/shut/in", 0)
    path = archive.directory("updated_files/shut", 0).write(patch_dir)
    before = path.stat().st_mtime_ns
    user = "nobody" if os.geteuid() == 0 else None
    (scratch / "tmp").chmod(0o777)
    assert ctl.run("lint", path, env={"TMPDIR": str(scratch / "tmp")}, user=user).status == 1
    assert os.listdir(scratch / "tmp") == []
    assert [entry.name for entry in patch_dir.iterdir()] == [path.name]
    assert path.stat().st_mtime_ns == before


ODD = {
    "a link": lambda archive: archive.link("updated_files/link", "file"),
    "a path twice": lambda archive: archive.file("./updated_files/file"),
    "a file as a directory": lambda archive: archive.file("updated_files/file/below"),
    "a directory as a file": lambda archive: archive.directory("updated_files/file"),
    "a closed directory": lambda archive: archive.directory("updated_files/shut", 0o500),
    "a time to come": lambda archive: archive.file("updated_files/late", mtime=int(time.time()) + 86400),
    "a long path": lambda archive: archive.file("updated_files/" + "/".join(["x" * 50] * 6)),
}


@pytest.mark.parametrize("odd", [None, *ODD])
def test_only_plain_archives_are_not_written_out(ctl, patch_dir, odd):
    """Files larger than a limit tell whether tar has written them."""
    archive = RawArchive(Patch("ox")).file("updated_files/file", bytes(8192)).directory("updated_files/open")
    path = (ODD[odd](archive) if odd else archive).write(patch_dir)
    document = ctl.document("lint", path, status=int(bool(odd)), wrapper=["prlimit", "--fsize=4096"])
    assert ("tar-fails" in rules(document)) is bool(odd)


@pytest.mark.parametrize("end", [700, 1536, 5000])
def test_a_plain_archive_that_was_cut_is_found(ctl, patch_dir, end):
    path = RawArchive(Patch("ox")).file("updated_files/file", bytes(8192)).write(patch_dir)
    path.write_bytes(path.read_bytes()[:end])
    assert {"incomplete-archive", "tar-fails"} & set(rules(ctl.document("lint", path, status=1)))


def test_an_archive_larger_than_the_disk_is_not_unpacked(ctl, patch_dir, scratch):
    with open(scratch / "huge", "wb") as huge:
        huge.truncate(1 << 43)
    subprocess.run(["tar", "-cSf", patch_dir / Patch("ox").filename, "-C", scratch, "huge"], check=True)
    result = ctl.run("lint", patch_dir / Patch("ox").filename)
    assert result.status == 2
    assert b"no room in" in result.err


@pytest.mark.parametrize("number", [signal.SIGINT, signal.SIGTERM, signal.SIGHUP])
def test_an_interruption_leaves_no_folder_behind(ctl, write, scratch, number):
    folder = scratch / "temporary"
    folder.mkdir()
    patch = Patch("ox")
    patch.symlink("updated_files/link", "data")  # without it nothing would be written
    for index in range(8000):  # tar is at work when the signal comes
        patch.file(f"data/{index}")
    path = write(patch)
    for _ in range(20):  # the command may end before the signal comes
        status, out = interrupted(ctl, path, folder, number)
        assert list(folder.iterdir()) == []
        if status != 0:
            break
    assert (status, out) == (-number, b"")


def interrupted(ctl, path, folder, number):
    """Status and output of the command that gets the signal once tar has unpacked a file."""
    command = subprocess.Popen(
        [*ctl.program.argv, "lint", path],
        env={"TMPDIR": str(folder)},
        stdout=subprocess.PIPE,
        preexec_fn=lambda: signal.signal(number, signal.SIG_DFL),  # ignored where the tests run in the background
    )
    while command.poll() is None:
        if any(folder.glob("*/updated_files/data/0")):
            command.send_signal(number)
            break
        time.sleep(0.001)
    out = command.communicate(timeout=120)[0]
    return command.returncode, out
