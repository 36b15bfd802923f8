"""Symbolic links in an archive: followed when files are moved, never when the temporary directory is removed, which
they never survive."""

import os
import stat

import pytest

from rawarchive import RawArchive
from support import Patch, Result
from verdicts import INSTALLED, product_tree, refused

PATCH = Patch("ox")


@pytest.fixture
def foreign(scratch):
    """A directory outside the home with one file that no other user may read."""
    folder = scratch / "foreign"
    folder.mkdir()
    (folder / "secret").write_text("secret\n")
    (folder / "secret").chmod(0o600)
    return folder


def errors(home):
    return home.log().messages("ERROR")


def links_left(home):
    return [path for path in (home.path / "tmp").rglob("*") if path.is_symlink()]


def not_removed(home):
    return [f"Unable to remove temporary directory: {home.prefix}tmp/kox"]


def test_a_link_to_a_file_is_moved_and_the_file_behind_it_opened_to_all(program, product, patch_dir, foreign):
    # link(2) moves the link itself; the change of mode that follows reaches what it leads to.
    archive = RawArchive(PATCH).link("updated_files/bin/tool", str(foreign / "secret")).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert os.readlink(product.path / "bin/tool") == str(foreign / "secret")
    assert (foreign / "secret").read_text() == "secret\n"
    assert stat.S_IMODE((foreign / "secret").stat().st_mode) == 0o755
    assert not product.exists("tmp/kox")


def test_a_link_to_a_directory_gives_its_files_to_the_home(program, product, patch_dir, foreign):
    archive = RawArchive(PATCH).link("updated_files/lib", str(foreign)).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert product.tree("lib")["lib/secret"][:2] == ("file", 0o755)
    assert product.tree()["lib"][:2] == ("directory", 0o777)
    assert os.listdir(foreign) == []
    # The link itself is not followed by the clean-up, which therefore fails, and that stops nothing.
    assert errors(product) == not_removed(product)
    assert links_left(product) == []


@pytest.mark.parametrize("link, destination, status", [("m/in/link", "../tool", 25), ("link", "m/tool", 0)])
def test_a_link_to_a_file_that_comes_later_ends_the_run(program, product, patch_dir, link, destination, status):
    # It arrives before its file, and there is nothing yet to give an owner to. Deeper directories come first.
    archive = RawArchive(PATCH).file("updated_files/m/tool").link(f"updated_files/{link}", destination)
    assert program.install(product, archive.write(patch_dir)).status == status
    assert product.exists("m/tool") == (status == 0)


def test_a_report_lists_the_files_behind_a_link_and_leaves_them(program, product, patch_dir, foreign):
    archive = RawArchive(PATCH).link("updated_files/lib", str(foreign)).write(patch_dir)
    before = product_tree(product)
    report = program.report(product, archive)
    assert report == Result(0, report.out, b"")
    listed = f"\nThe following files will be installed or replaced with new files:\n    {product.prefix}lib/secret\n\n"
    assert listed.encode() in report.out
    assert (foreign / "secret").stat().st_mode & 0o7777 == 0o600
    assert product_tree(product) == before


def test_the_clean_up_does_not_empty_a_directory_behind_a_link(program, product, patch_dir, foreign):
    archive = RawArchive(PATCH).link("lib", str(foreign)).file("updated_files/bin/tool").write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert os.listdir(foreign) == ["secret"]
    assert errors(product) == not_removed(product)


def test_the_tree_of_files_itself_may_be_a_link(program, product, patch_dir, foreign):
    archive = RawArchive(PATCH).link("updated_files", str(foreign)).write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert product.read("secret") == b"secret\n"
    assert os.listdir(foreign) == []
    assert errors(product) == not_removed(product)


def test_a_dangling_link_counts_as_moved(program, product, patch_dir):
    # KEEP(move-missing-source), KEEP(cleanup-unchecked)
    archive = (
        RawArchive(PATCH)
        .link("updated_files/bin/gone", "/nonexistent/file")
        .file("updated_files/bin/tool")
        .write(patch_dir)
    )
    assert program.install(product, archive) == INSTALLED
    assert product.exists("bin/tool") and not product.exists("bin/gone")
    assert errors(product) == not_removed(product)
    assert product.exists("tmp/kox/updated_files/bin") and links_left(product) == []


def test_a_clean_up_that_failed_does_not_stop_the_next_patch(program, product, patch_dir):
    first = RawArchive(PATCH).link("updated_files/bin/gone", "/nonexistent/file").write(patch_dir)
    assert program.install(product, first) == INSTALLED
    second = Patch("ox", fixpack="fp0002").file("bin/tool").write(patch_dir)
    assert program.install(product, second) == INSTALLED
    assert [line.result for line in product.history()] == ["PASS", "PASS"]
    assert product.read("bin/tool") == b"new\n"


def test_a_link_of_one_patch_takes_no_part_in_the_next(program, product, patch_dir, foreign):
    first = RawArchive(PATCH).link("updated_files/lib", str(foreign)).write(patch_dir)
    assert program.install(product, first) == INSTALLED
    (foreign / "later").write_text("later\n")
    second = Patch("ox", fixpack="fp0002").file("bin/tool").write(patch_dir)
    assert program.install(product, second) == INSTALLED
    assert not product.exists("lib/later")
    assert os.listdir(foreign) == ["later"]


# Where the first archive puts links to a foreign directory, what else it holds to keep them there, and the names
# under which the second would come through them.
NESTS = {
    "beside one another": ({"updated_files/l1": None, "l2": None}, ["l1/job", "updated_files/l1/job", "l2/job"]),
    "below a dangling one": ({"gone": "/nonexistent", "a/b/c/l": None}, ["a/b/c/l/job"]),
    "below two dangling ones": (
        {"gone": "/nonexistent", "a/gone": "/nonexistent", "a/b/l": None, "a/l": None},
        ["a/b/l/job", "a/l/job"],
    ),
    "relative": ({"a/l": "../../../../foreign", "loop": "loop"}, ["a/l/job"]),
}


@pytest.mark.parametrize("nest", NESTS)
def test_reports_write_nothing_through_a_link_of_another_archive(program, product, patch_dir, scratch, nest):
    # Two patches of one product share a temporary directory, and a report of both extracts one after the other.
    folder = product.path.parent / f"{product.path.name}-foreign" if nest == "relative" else scratch / "foreign"
    folder.mkdir()
    links, members = NESTS[nest]
    archives = [RawArchive(PATCH), RawArchive(Patch("ox", fixpack="fp0002"))]
    for link, destination in links.items():
        archives[0].link(
            link,
            os.path.relpath(folder, (product.path / "tmp/kox" / link).parent)
            if destination and destination.startswith("..")
            else destination or str(folder),
        )
    for member in members:
        archives[1].file(member)
    for archive in archives:
        archive.file("updated_files/bin/tool")
    first, second = (archive.write(patch_dir) for archive in archives)
    for path in (first, second, first, patch_dir):
        program.report(product, path)
        assert os.listdir(folder) == []
        assert links_left(product) == []
    folder.rmdir()


def test_a_target_that_is_a_dangling_link_is_not_written_through(program, product, patch_dir, scratch):
    # Its name is taken, so the new file cannot be linked to it; nothing comes to where it leads.
    os.symlink(scratch / "outside", product.path / "bin/tool")
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    text = (
        f"Could not move file {product.prefix}tmp/kox/updated_files/./bin/tool to {product.prefix}./bin/tool. "
        "Either the product being updated is still running or the file permissions are restricting access to "
        "the file. Verify the product has been stopped and the file permissions are not restricting access and "
        "then re-apply the patch."
    )
    assert program.install(product, archive) == refused(product, 25, text)
    assert not (scratch / "outside").exists()


def test_a_target_that_is_a_link_is_replaced_not_written_through(program, product, patch_dir, foreign):
    os.symlink(foreign / "secret", product.path / "bin/tool")
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert (foreign / "secret").read_text() == "secret\n"
    entry = product.tree("bin")["bin/tool"]
    assert (entry.kind, entry.mode, entry.content) == ("file", 0o600, b"new\n")  # the old target's mode


def test_a_target_directory_that_is_a_link_is_followed(program, product, patch_dir, foreign):
    os.symlink(foreign, product.path / "lib")
    archive = Patch("ox").file("lib/tool").write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert (foreign / "tool").read_bytes() == b"new\n"


@pytest.mark.parametrize(
    "folders, links",
    [
        ([], {"a": ".", "b": "."}),
        (["a"], {"a/b": "..", "a/c": ".."}),
        (["a", "a/b"], {"a/b/c": "../..", "d": "a"}),
        (["a", "b"], {"a/x": "../b", "b/x": "../a", "b/y": "../a"}),
    ],
)
def test_links_that_lead_back_up_are_not_entered(program, product, patch_dir, folders, links):
    # Followed as far as the system follows links, forty deep, two of them make 2 to the power of 40 paths.
    archive = RawArchive(PATCH).file("updated_files/tool")
    for name in folders:
        archive.directory(f"updated_files/{name}")
    for name, destination in links.items():
        archive.link(f"updated_files/{name}", destination)
    path = archive.write(patch_dir)
    report = program.report(product, path)
    assert report == Result(0, report.out, b"")
    assert report.out.count(f"    {product.prefix}tool\n".encode()) == 1
    assert program.install(product, path) == INSTALLED
    assert product.read("tool") == b"new\n"
    for name in links:
        assert product.tree()[name].kind == "directory"


@pytest.mark.parametrize(
    "destination, text",
    [
        ("/nonexistent", "Unable to read file [{ini}]: No such file or directory"),
        (".", "Unable to read file [{ini}]: Invalid argument"),
        ("patch.ini", "Unable to read file [{ini}]: Too many levels of symbolic links"),
        ("/etc/passwd", "Missing required section: ProductInfo"),
    ],
)
def test_a_descriptor_that_is_a_link_is_read_through_it(program, product, patch_dir, destination, text):
    archive = RawArchive().link("patch.ini", destination).file("updated_files/tool").write(patch_dir)
    before = product_tree(product)
    code = 6 if destination == "/etc/passwd" else 5
    expected = refused(product, code, text.format(ini=f"{product.prefix}tmp/kox/patch.ini"))
    assert program.install(product, archive) == expected
    assert product_tree(product) == before
    assert product.history() == []
