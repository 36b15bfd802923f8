"""Members of an archive that no honest patch has: places outside, other kinds of files, foreign owners."""

import os
import pwd
import stat

import pytest

from rawarchive import RawArchive
from support import Patch, Result
from verdicts import INSTALLED, added, failure, product_tree, refused

TAR_FAILED = "Bad return code from tar -xf: 2"
PATCH = Patch("ox")


def test_an_absolute_member_stays_below_the_temporary_directory(program, product, patch_dir, scratch):
    outside = scratch / "outside"
    archive = RawArchive(PATCH).file(str(outside)).file("updated_files/bin/tool").write(patch_dir)
    before = product.tree("bin")
    assert program.install(product, archive) == INSTALLED
    assert not outside.exists()
    assert added(before, product.tree("bin")) == ["bin/tool"]
    assert not product.exists("tmp/kox")


@pytest.mark.parametrize("member", ["../outside", "../../../outside", "updated_files/../../outside", ".."])
def test_a_member_that_climbs_out_ends_the_patch_before_anything_is_moved(program, product, patch_dir, member):
    archive = RawArchive(PATCH).file("updated_files/bin/tool").file(member).write(patch_dir)
    before, around = product_tree(product), sorted(os.listdir(product.path.parent))
    assert program.install(product, archive) == refused(product, 3, TAR_FAILED)
    assert product_tree(product) == before
    assert sorted(os.listdir(product.path.parent)) == around
    assert [line.result for line in product.history()] == ["FAIL"]


def test_a_report_of_a_member_that_climbs_out_fails_after_its_first_lists(program, product, patch_dir):
    archive = RawArchive(PATCH).file("updated_files/bin/tool").file("../outside").write(patch_dir)
    before = product_tree(product)
    report = program.report(product, archive)
    assert report == Result(3, report.out, TAR_FAILED.encode() + b"\n")
    assert report.out.endswith(b"No commands to be executed after stopping the agent instances.\n" + failure(product))
    assert product_tree(product) == before
    assert product.history() == []


def test_a_fifo_is_moved_like_a_file_and_never_opened(program, product, patch_dir):
    archive = RawArchive(PATCH).fifo("updated_files/bin/pipe", 0o600).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    moved = (product.path / "bin/pipe").lstat()
    assert stat.S_ISFIFO(moved.st_mode) and stat.S_IMODE(moved.st_mode) == 0o755


@pytest.mark.needs_root
def test_a_device_is_moved_like_a_file(program, product, patch_dir):
    archive = RawArchive(PATCH).device("updated_files/bin/null", 1, 3).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    moved = (product.path / "bin/null").lstat()
    assert stat.S_ISCHR(moved.st_mode) and moved.st_rdev == os.makedev(1, 3)
    assert stat.S_IMODE(moved.st_mode) == 0o755


@pytest.mark.parametrize("mode", [0o6777, 0o4755, 0o2755, 0o1777, 0o000])
def test_a_new_file_is_never_set_id(program, product, patch_dir, mode):
    archive = RawArchive(PATCH).file("updated_files/bin/tool", mode=mode).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert product.tree("bin")["bin/tool"].mode == 0o755


@pytest.mark.needs_root
def test_a_new_file_keeps_the_owner_that_the_archive_names(program, product, patch_dir):
    archive = RawArchive(PATCH).file("updated_files/bin/tool", mode=0o6755, uid=12345, gid=54321).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    entry = product.tree("bin")["bin/tool"]
    assert (entry.uid, entry.gid, entry.mode) == (12345, 54321, 0o755)


@pytest.mark.needs_root
def test_a_replaced_file_keeps_its_owner_and_its_set_id_bits(program, product, patch_dir):
    nobody = pwd.getpwnam("nobody")
    tool = product.write("bin/tool", "old\n")
    os.chown(tool, nobody.pw_uid, nobody.pw_gid)
    tool.chmod(0o6711)
    archive = RawArchive(PATCH).file("updated_files/bin/tool", mode=0o666, uid=12345, gid=54321).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    entry = product.tree("bin")["bin/tool"]
    assert entry == ("file", 0o6711, nobody.pw_uid, nobody.pw_gid, b"new\n", 1)


@pytest.mark.needs_root
def test_a_new_directory_is_the_tools_own_and_open_to_all(program, product, patch_dir):
    archive = (
        RawArchive(PATCH)
        .directory("updated_files/bin/sub", 0o2700, uid=12345, gid=54321)
        .file("updated_files/bin/sub/tool")
        .write(patch_dir)
    )
    assert program.install(product, archive) == INSTALLED
    entry = product.tree("bin")["bin/sub"]
    assert (entry.kind, entry.mode, entry.uid, entry.gid) == ("directory", 0o777, 0, 0)


@pytest.mark.needs_root
def test_a_closed_tree_of_files_stops_an_ordinary_user(program, product, scratch):
    product.give_to("nobody")
    archive = (RawArchive(PATCH).file("updated_files/bin/tool").directory("updated_files", 0)).write(scratch)
    before = product.tree("bin")
    refusal = refused(
        product, 24, f"Could not change current working directory to: {product.prefix}tmp/kox/updated_files"
    )
    assert program.install(product, archive, user="nobody") == refusal
    assert product.tree("bin") == before


def test_two_names_of_one_file_stay_one_file(program, product, patch_dir):
    archive = (
        RawArchive(PATCH)
        .file("updated_files/bin/first")
        .hard_link("updated_files/bin/second", "updated_files/bin/first")
        .write(patch_dir)
    )
    assert program.install(product, archive) == INSTALLED
    assert os.path.samefile(product.path / "bin/first", product.path / "bin/second")
    assert product.tree("bin")["bin/first"][:2] == ("file", 0o755)


def test_a_hard_link_cannot_reach_a_file_outside(program, product, patch_dir, scratch):
    (scratch / "secret").write_text("secret")
    archive = RawArchive(PATCH).hard_link("updated_files/bin/tool", str(scratch / "secret")).write(patch_dir)
    assert program.install(product, archive) == refused(product, 3, TAR_FAILED)
    assert not product.exists("bin/tool")


def test_of_two_members_of_one_name_the_last_one_counts(program, product, patch_dir):
    second = Patch("ox", name="second")
    archive = (
        RawArchive(PATCH)
        .file("updated_files/bin/tool", "first\n")
        .file("updated_files/bin/tool", "second\n")
        .file("patch.ini", second.descriptor_text())
    ).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert product.read("bin/tool") == b"second\n"
    assert [line.name for line in product.history()] == ["second"]
