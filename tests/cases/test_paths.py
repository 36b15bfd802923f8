"""Relative paths and working directories."""

import pytest

from support import Patch
from support.catalogue import text

from productsite import SUCCESS


@pytest.mark.parametrize("folder", [".", "./", "../patches", "../patches/"])
def test_a_relative_directory(site, folder):
    site.home.component("ox")
    site.target(Patch("ox").file("bin/tool"))
    assert site.install(folder, cwd=site.patch_dir) == site.done()
    assert site.home.read("bin/tool") == b"new\n"


def test_a_relative_file_without_any_directory(site):
    site.home.component("ox")
    name = site.target(Patch("ox").directory()).name
    result = site.report(name, cwd=site.patch_dir)
    assert result.out.startswith(f"\n{'=' * 70}\nProcessing patch file: {name}\n".encode())
    assert (result.status, result.err) == (0, b"")


def test_a_relative_path_is_reported_as_given(site):
    assert site.install("nowhere", cwd=site.patch_dir) == site.failed(30, text("ERROR_DCFPP_PATH", "nowhere"))
    (site.patch_dir / "readme").touch()
    assert site.install(".", cwd=site.patch_dir) == site.failed(32, text("ERROR_DCFPP_NO_APPLICABLE", "."))


def test_a_path_through_a_file_is_not_there(site):
    path = f"{site.target(Patch('ox'))}/"
    assert site.install(path) == site.failed(30, text("ERROR_DCFPP_PATH", path))


def test_agents_are_started_where_the_program_was(site):
    site.home.component("yn")
    site.home.start("yn")
    patch = Patch("yn").file("bin/tool").script("a.sh", when="pre")
    assert site.install(patch, cwd="/usr") == site.done()
    assert [call.cwd for call in site.home.journal() if call.program == "QuillAgent"] == ["/usr", "/usr"]


def test_blanks_and_percent_signs_in_every_path(site):
    site.home.component("ox")
    folder = site.patch_dir / "100%s of %n"
    folder.mkdir()
    path = Patch("ox").file("a dir/%d file").script("%x go.sh", when="post").write(folder)
    assert site.install(path) == site.done()
    assert site.home.read("a dir/%d file") == b"new\n"
    assert text("PP_SCRIPT_COMPLETE", "%x go.sh") in site.logged("INFO")


def test_a_relative_home_cannot_be_logged_to_from_elsewhere(site):
    # The home is taken as it is: while the program stands in the temporary directory, the log is not there.
    site.home.component("ox")
    path = site.target(Patch("ox"))
    complaint = text("LOG_CANT_WRITE", "./patchlogs/orvpatch.log") + "\n"
    result = site.run("-h", ".", "-t", path, cwd=site.home)
    extract_descriptor = 6 + 3  # the lines of the child process and of its outcome
    extract_all = 5 + 3
    assert result.err.decode() == complaint * (extract_descriptor + extract_all) + "\n"
    assert result.status == 0 and result.out.endswith(SUCCESS.encode())
