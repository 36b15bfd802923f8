"""verify: what the installer calls a success is held against the archive, file by file."""

import os
import subprocess
import tarfile

import pytest

from support import Patch, stubs
from support.sample import Sample


@pytest.fixture
def install(program, home):
    """Installs a patch, which must end with this status, and returns the patch's path."""

    def run(path, status=0, **options):
        result = program.install(home, path, **options)
        assert result.status == status, result
        return path

    return run


def differences(ctl, home, path):
    """(path, kind) of each difference; the exit status goes with them."""
    result = ctl.run("verify", home, path)
    found = ctl.document("verify", home, path, status=result.status)["differences"]
    assert result.status == (1 if found else 0)
    for difference in found:
        assert difference["path"].encode() in result.out
    return [(difference["path"], difference["kind"]) for difference in found]


def patch_of_five():
    patch = Patch("yn")
    for name in "abcde":
        patch.file(f"lib/{name}", f"new {name}\n" * 300)
    return patch


def test_a_good_installation_has_no_difference(ctl, home, install, write):
    home.component("yn")
    home.write("lib/a", "old\n", 0o600)
    patch = patch_of_five().directory("empty").symlink("updated_files/lib/link", "a")
    path = install(write(patch))
    assert differences(ctl, home, path) == []
    assert ctl.document("verify", home, path)["files"] == 6


@pytest.mark.parametrize(
    "target, code", [("vema", "ox"), ("vems", "qa"), ("veps", "pt"), ("vepd", "dk"), ("vecm", "zt")]
)
def test_each_target_verifies_after_its_installation(ctl, home, install, write, target, code):
    home.component(code)
    path = install(write(Patch(code, target=target).file(f"bin/{code}")))
    assert differences(ctl, home, path) == []


def test_the_sample_patches_verify_as_a_directory(ctl, scratch, program):
    sample = Sample(scratch)
    sample.make()
    with sample.home as home:
        for code in ("qa",):
            home.stop(code)
        assert program.install(home, scratch / "fixpack2").status == 0
        assert differences(ctl, home, scratch / "fixpack2") == []


@pytest.mark.parametrize("cut", range(8))
def test_an_archive_cut_between_members_names_every_file_that_is_missing(ctl, home, install, write, cut):
    """tar takes an archive that ends between two members for whole."""
    home.component("yn")
    whole = write(patch_of_five())
    data = whole.read_bytes()
    with tarfile.open(whole) as archive:
        members = archive.getmembers()
    # patch.ini, updated_files, lib and the five files: the descriptor must be there for the run to begin.
    assert len(members) == 8
    boundary = members[cut].offset
    whole.write_bytes(data[:boundary])
    install(whole, status=0 if cut else 3)
    kept = {member.name for member in members[:cut]}
    whole.write_bytes(data)
    missing = [f"lib/{name}" for name in "abcde" if f"updated_files/lib/{name}" not in kept]
    found = differences(ctl, home, whole)
    assert [path for path, kind in found if kind == "missing" and path != "lib"] == missing
    assert [kind for _, kind in found if kind in ("level", "history")] == ([] if cut else ["level", "history"])


def test_a_cut_archive_itself_cannot_be_judged(ctl, home, install, write):
    home.component("yn")
    path = write(patch_of_five())
    with tarfile.open(path) as archive:
        boundary = archive.getmembers()[-1].offset
    path.write_bytes(path.read_bytes()[:boundary])
    install(path)
    result = ctl.run("verify", home, path, "--json")
    assert (result.status, result.out) == (2, b"")
    assert b"incomplete" in result.err


def test_a_tar_that_is_killed_half_way_is_found(ctl, home, install, write, scratch):
    """A child that a signal ends counts as a success."""
    home.component("yn")
    half = '/usr/bin/tar "$@"; case $# in 2) rm updated_files/lib/d updated_files/lib/e; kill -9 $$;; esac'
    path = stubs(scratch / "stubs", tar=half)
    patch = install(write(patch_of_five()), env={"PATH": path})
    assert differences(ctl, home, patch) == [("lib/d", "missing"), ("lib/e", "missing")]


def test_a_dangling_link_counts_as_moved_and_is_missing(ctl, home, install, write):
    home.component("yn")
    path = install(write(patch_of_five().symlink("updated_files/lib/link", "nowhere")))
    assert differences(ctl, home, path) == [("lib/link", "missing")]


def test_a_source_that_goes_before_the_move_is_found(ctl, home, install, write):
    home.component("yn")
    patch = patch_of_five().script("go.sh", when="pre", body="rm updated_files/lib/b")
    path = install(write(patch))
    assert differences(ctl, home, path) == [("lib/b", "missing")]


def test_an_old_file_in_place_of_the_new_one_differs_in_content(ctl, home, install, write):
    home.component("yn")
    home.write("lib/b", "old\n")
    path = install(write(patch_of_five().script("go.sh", when="pre", body="rm updated_files/lib/b")))
    assert differences(ctl, home, path) == [("lib/b", "content")]


def test_a_product_in_upper_case_installs_nothing(ctl, home, install, write):
    home.component("yn")
    patch = Patch("KYN", code="yn").file("lib/a")
    path = install(write(patch))
    assert differences(ctl, home, path) == [("lib", "missing"), ("lib/a", "missing")]


def test_a_leftover_of_another_patch_is_installed_in_place_of_the_files(ctl, home, install, write):
    home.component("yn")
    home.component("um")
    home.write("tmp/kyn/updated_files/lib/a", "left over\n")
    path = install(write(Patch("um", code="yn", level="06100100").file("lib/a", "new\n")), status=0)
    assert ("lib/a", "content") in differences(ctl, home, path)


@pytest.mark.parametrize("found, kind", [("directory", "type"), ("link", "type"), ("pipe", "type")])
def test_another_type_is_a_difference(ctl, home, install, write, found, kind):
    home.component("yn")
    path = install(write(patch_of_five()))
    target = home.path / "lib/c"
    target.unlink()
    {"directory": target.mkdir, "link": lambda: target.symlink_to("a"), "pipe": lambda: os.mkfifo(target)}[found]()
    assert differences(ctl, home, path) == [("lib/c", kind)]


def test_one_byte_is_a_difference(ctl, home, install, write):
    home.component("yn")
    patch = Patch("yn").file("lib/large", bytes(range(256)) * 1000)
    path = install(write(patch))
    target = home.path / "lib/large"
    for place in (0, 65535, 65536, 255999):
        content = bytearray(bytes(range(256)) * 1000)
        content[place] ^= 1
        target.write_bytes(content)
        assert differences(ctl, home, path) == [("lib/large", "content")], place
    target.write_bytes(bytes(range(256)) * 1000 + b"x")
    assert differences(ctl, home, path) == [("lib/large", "content")]


def test_hard_links_of_the_archive_are_compared_with_what_they_name(ctl, home, install, write, scratch):
    home.component("yn")
    (scratch / "tree/updated_files/lib").mkdir(parents=True)
    (scratch / "tree/updated_files/lib/a").write_text("content\n")
    os.link(scratch / "tree/updated_files/lib/a", scratch / "tree/updated_files/lib/b")
    Patch("yn").write_descriptor(scratch / "tree/patch.ini")
    path = scratch / "patches" / Patch("yn").filename
    subprocess.run(["tar", "-C", scratch / "tree", "-cf", path, "patch.ini", "updated_files"], check=True)
    install(path)
    assert differences(ctl, home, path) == []
    for name in "ab":
        (home.path / "lib" / name).unlink()
    home.write("lib/a", "content\n")
    home.write("lib/b", "other!!\n")
    assert differences(ctl, home, path) == [("lib/b", "content")]


def test_a_later_member_of_the_same_name_is_the_one_that_counts(ctl, home, install, write, scratch):
    home.component("yn")
    path = write(Patch("yn").file("lib/a", "first\n"))
    (scratch / "updated_files/lib").mkdir(parents=True)
    (scratch / "updated_files/lib/a").write_text("second\n")
    subprocess.run(["tar", "-C", scratch, "-rf", path, "updated_files/lib/a"], check=True)
    install(path)
    assert home.read("lib/a") == b"second\n"
    assert differences(ctl, home, path) == []


def test_level_and_history_are_compared(ctl, home, install, write):
    home.component("yn")
    path = install(write(Patch("yn").file("lib/a")))
    home.component("yn", "06100000")
    home.write("patchlogs/patches.hist", b"")
    assert differences(ctl, home, path) == [("registry/ynlpp266.ver", "level"), ("patchlogs/patches.hist", "history")]
    home.write("registry/ynlpp266.ver", "desc = x\n")
    assert ("registry/ynlpp266.ver", "level") in differences(ctl, home, path)


def test_the_last_line_of_the_history_decides(ctl, home, install, write):
    home.component("yn")
    path = install(write(Patch("yn").file("lib/a")))
    install(write(Patch("yn").file("lib/a").script("no.sh", when="post", status=1)), status=23)
    assert ("patchlogs/patches.hist", "history") in differences(ctl, home, path)


def test_of_two_patches_in_a_directory_the_later_one_decides(ctl, home, program, write, patch_dir):
    home.component("yn")
    home.component("um")
    home.component("zt")
    write(Patch("zt", target="vecm").file("lib/shared", "first\n"))
    write(Patch("um").file("lib/shared", "second\n"))
    assert program.install(home, patch_dir).status == 0
    assert differences(ctl, home, patch_dir) == []


@pytest.mark.parametrize(
    "what, reason", [("home", b"ORV home"), ("patch", b"cannot read"), ("garbage", b".tar"), ("foreign", b"applies")]
)
def test_what_cannot_be_judged_is_status_2(ctl, home, write, scratch, what, reason):
    home.component("yn")
    path = write(Patch("yn").file("lib/a"))
    where = home.path
    if what == "home":
        where = scratch / "gone"
    elif what == "patch":
        path = scratch / "gone.tar"
    elif what == "garbage":
        path.write_bytes(b"no archive at all" * 100)
    else:
        path = write(Patch("yn", platform="li6243").file("lib/a"))
    result = ctl.run("verify", where, path)
    assert (result.status, result.out) == (2, b""), result
    assert reason in result.err


def test_nothing_is_changed(ctl, home, install, write):
    home.component("yn")
    path = install(write(patch_of_five()))
    before = home.tree()
    assert differences(ctl, home, path) == []
    assert home.tree() == before
