"""Archives of an unusual shape: cut off, without a usable descriptor, with extreme names and depths."""

import gzip
import os
import stat
import subprocess

import pytest

from rawarchive import BLOCK, RawArchive
from support import Patch
from verdicts import INSTALLED, SUCCESS, added, product_tree, refused

PATCH = Patch("ox")
TAR_FAILED = "Bad return code from tar -xf: 2"


def sample_archive():
    return (
        RawArchive(PATCH)
        .file("updated_files/bin/first", b"1" * 700)
        .file("updated_files/bin/second", b"2" * 600)
        .directory("updated_files/lib")
        .file("updated_files/lib/third", b"3" * BLOCK)
    )


def cuts():
    """Every boundary between two members, and places within each: in its header, in its data, in a block."""
    archive = sample_archive()
    edges = [*archive.boundaries, archive.boundaries[-1] + BLOCK, len(archive.content)]
    return sorted(
        {
            at + offset
            for at in edges
            for offset in (0, 1, 256, BLOCK, BLOCK + 100)
            if at + offset <= len(archive.content)
        }
    )


def unpacked_by_tar(archive, folder):
    """What tar itself makes of the archive: its exit status and the extracted files."""
    folder.mkdir()
    done = subprocess.run(["tar", "-xf", archive], cwd=folder, stderr=subprocess.DEVNULL, check=False)
    files = [path for path in folder.rglob("*") if path.is_file()]
    return done.returncode, {str(path.relative_to(folder)): path.read_bytes() for path in files}


@pytest.mark.parametrize("length", cuts())
def test_a_truncated_archive_is_applied_only_as_far_as_tar_finds_no_fault(program, product, patch_dir, scratch, length):
    archive = sample_archive().write(patch_dir, upto=length)
    status, files = unpacked_by_tar(archive, scratch / "unpacked")
    new = {path.removeprefix("updated_files/"): content for path, content in files.items() if path != "patch.ini"}
    before = product_tree(product)
    result = program.install(product, archive)
    after = product_tree(product)
    if status != 0 or "patch.ini" not in files:
        assert result == refused(product, 3, f"Bad return code from tar -xf: {status or 2}")
        assert after == before
        assert product.history() == []  # the descriptor is read first, and tar reads to the end for it
    else:
        assert result == INSTALLED
        before.pop("registry/oxlpp266.ver"), after.pop("registry/oxlpp266.ver")
        assert {path: after[path].content for path in added(before, after) if after[path].kind == "file"} == new
    for path, digit in {"bin/first": b"1", "bin/second": b"2", "lib/third": b"3"}.items():
        assert not product.exists(path) or set(product.read(path)) == set(digit), "a file cut in two"


def test_the_cuts_meet_both_kinds_of_archive(scratch):
    statuses = {
        unpacked_by_tar(sample_archive().write(scratch, upto=length), scratch / str(length))[0] for length in cuts()
    }
    assert statuses == {0, 2}


@pytest.mark.parametrize(
    "content",
    [b"", b"\0", b"no archive\n", bytes(range(256)) * 8, b"\xff" * 4096],
    ids=["empty", "one NUL", "text", "all bytes", "all ones"],
)
@pytest.mark.parametrize("action", ["-i", "-t"])
def test_what_is_no_archive_is_refused(program, product, patch_dir, action, content):
    archive = patch_dir / PATCH.filename
    archive.write_bytes(content)
    before = product_tree(product)
    assert program.run("-h", product, action, archive) == refused(product, 3, TAR_FAILED)
    assert product_tree(product) == before


def test_an_archive_of_empty_blocks_has_no_descriptor(program, product, patch_dir):
    assert program.install(product, RawArchive().write(patch_dir)) == refused(product, 3, TAR_FAILED)


def test_a_compressed_archive_is_whatever_tar_makes_of_it(program, product, patch_dir):
    archive = patch_dir / PATCH.filename
    archive.write_bytes(gzip.compress(sample_archive().content))
    assert program.install(product, archive) == INSTALLED
    assert product.read("bin/second") == b"2" * 600


@pytest.mark.parametrize("action", ["-i", "-t"])
@pytest.mark.parametrize(
    "patch, dotted",
    [(Patch("ox").file("bin/tool"), True), (Patch("ox", descriptor=False).file("bin/tool"), False)],
    ids=["./patch.ini", "none"],
)
def test_without_a_member_patch_ini_there_is_no_patch(program, product, patch_dir, action, patch, dotted):
    archive = patch.write(patch_dir, dotted=dotted)
    before = product_tree(product)
    assert program.run("-h", product, action, archive) == refused(product, 3, TAR_FAILED)
    assert product_tree(product) == before


UNREADABLE = {
    "directory": lambda archive: archive.directory("patch.ini"),
    "full directory": lambda archive: archive.directory("patch.ini").file("patch.ini/patch.ini"),
    "fifo": lambda archive: archive.fifo("patch.ini"),
    "device": lambda archive: archive.device("patch.ini", 1, 5),
}


@pytest.mark.parametrize(
    "kind", ["directory", "full directory", "fifo", pytest.param("device", marks=pytest.mark.needs_root)]
)
@pytest.mark.parametrize("action", ["-i", "-t"])
def test_a_descriptor_that_is_no_file_cannot_be_read(program, product, patch_dir, action, kind):
    archive = UNREADABLE[kind](RawArchive()).file("updated_files/bin/tool").write(patch_dir)
    before = product_tree(product)
    text = f"Unable to read file [{product.prefix}tmp/kox/patch.ini]: Invalid argument"
    assert program.run("-h", product, action, archive) == refused(product, 5, text)
    assert product_tree(product) == before


def test_a_descriptor_of_many_gigabytes_is_not_read(program, product, patch_dir, scratch):
    with open(scratch / "patch.ini", "wb") as huge:
        huge.truncate(2**31 + 1)
    archive = patch_dir / PATCH.filename
    subprocess.run(["tar", "-cSf", archive, "-C", scratch, "patch.ini"], check=True)
    assert archive.stat().st_size < 1 << 20
    text = f"Unable to read file [{product.prefix}tmp/kox/patch.ini]: Invalid argument"
    assert program.install(product, archive) == refused(product, 5, text)


@pytest.mark.parametrize(
    "name",
    [
        b"n" * 255,
        b"-rf",
        b"--help",
        b" ",
        b"a\nb",
        b"\tx\t",
        b"%n%s%x",
        b"'\"`$(touch x)`;&|",
        b"\xff\xfe\x01\x7f",
        b"...",
        b"a\\b",
        b"*",
        "\N{SNOWMAN}".encode(),
    ],
    ids=repr,
)
def test_a_name_is_installed_as_it_stands(program, product, patch_dir, name):
    archive = RawArchive(PATCH).file("updated_files/bin/" + os.fsdecode(name)).write(patch_dir)
    before = product.tree("bin")
    report = program.report(product, archive)
    assert b"    " + product.prefix.encode() + b"bin/" + name + b"\n" in report.out
    assert program.install(product, archive) == INSTALLED
    assert added(before, product.tree("bin")) == ["bin/" + os.fsdecode(name)]


def test_a_name_longer_than_the_system_allows_ends_the_patch(program, product, patch_dir):
    archive = RawArchive(PATCH).file("updated_files/bin/" + "n" * 256).write(patch_dir)
    before = product_tree(product)
    assert program.install(product, archive) == refused(product, 3, TAR_FAILED)
    assert product_tree(product) == before


@pytest.fixture
def deep_product(product):
    """Removes by itself what is too deep for the clean-up of the fixtures, which recurse."""
    yield product
    subprocess.run(["find", product.path, "-delete"], check=True)


def test_a_thousand_nested_folders(program, deep_product, patch_dir):
    product = deep_product
    folders = "/".join(["d"] * 1000)
    archive = RawArchive(PATCH).file(f"updated_files/{folders}/tool").write(patch_dir)
    report = program.report(product, archive)
    assert report.status == 0
    assert f"    {product.prefix}{folders}/tool\n".encode() in report.out
    assert program.install(product, archive) == INSTALLED
    assert product.read(f"{folders}/tool") == b"new\n"
    for depth in (1, 500, 1000):
        assert stat.S_IMODE((product.path / "/".join(["d"] * depth)).stat().st_mode) == 0o777
    assert not product.exists("tmp/kox")


def deep_archive(length):
    """A folder whose path, from below the home, has this length; an archive with a file in it."""
    folder = "/".join(["f" * 199] * (length // 200) + ["g" * (length % 200)])
    return folder, RawArchive(PATCH).file(f"updated_files/{folder}/t")


def test_a_path_that_fits_the_home_but_not_the_temporary_directory(program, deep_product, patch_dir):
    # Below tmp/kox/updated_files/ the path is too long to be looked at, so it cannot be removed either.
    product = deep_product
    folder, archive = deep_archive(4090 - len(product.prefix))
    assert program.install(product, archive.write(patch_dir)) == INSTALLED
    assert os.listdir(product.path / folder) == ["t"]
    assert product.log().messages("ERROR")[-1] == f"Unable to remove temporary directory: {product.prefix}tmp/kox"


def test_a_path_that_fits_nowhere_ends_the_patch(program, deep_product, patch_dir):
    product = deep_product
    folder, archive = deep_archive(4078)  # tar itself still reaches it from tmp/kox
    made = product.prefix + "./" + folder[: 200 * 20] + "/"
    text = f"Unable to create directory: {made}"[:1023]  # what the catalogue's buffer holds
    assert program.install(product, archive.write(patch_dir)) == refused(product, 26, text)
    assert [line.result for line in product.history()] == ["FAIL"]
    assert os.listdir(product.path / folder[: 199 * 2 + 1]) == ["f" * 199]  # nothing is taken back


def test_a_directory_of_patches_stops_at_the_first_archive_that_is_none(program, product, patch_dir):
    product.component("yn")
    Patch("yn").file("bin/tool").write(patch_dir)
    (patch_dir / PATCH.filename).write_bytes(b"no archive\n")
    result = program.install(product, patch_dir)
    accepted = os.listdir(patch_dir)[0] == Patch("yn").filename
    code, text = (
        (3, TAR_FAILED)
        if accepted
        else (
            32,
            f"Unable to locate or install patch files which are applicable to this\nsystem in the directory "
            f"specified: {patch_dir}.",
        )
    )
    assert result == refused(product, code, text)
    assert not product.exists("bin/tool")
    assert SUCCESS not in result.out
