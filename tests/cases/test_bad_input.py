"""Odd arguments and odd folders of patches; tests/hostile has archives, descriptors and records that are bad."""

import os

import pytest

from support import Patch
from support.catalogue import text

from productsite import SUCCESS

LIMIT = 1023  # no text of the catalogue is longer once it is filled
LONG = "x" * 5000

ODD_PATHS = {
    "empty": "",
    "blank": " ",
    "newline": "a\nb",
    "percent": "%s%n%d",
    "not UTF-8": "\udcff\udcfe",
    "long name": LONG,
    "long path": "/x" * 3000,
    "through a device": "/dev/null/x",
}


@pytest.mark.parametrize("path", ODD_PATHS.values(), ids=ODD_PATHS)
@pytest.mark.parametrize("action", ["-i", "-t"])
def test_an_odd_path_of_a_patch(site, action, path):
    expected = site.failed(30, text("ERROR_DCFPP_PATH", path)[:LIMIT])
    assert site.run("-h", site.home, action, path, cwd=site.patch_dir) == expected
    assert site.changes() == []


@pytest.mark.parametrize(
    "path, problem",
    [
        ("", "No such file or directory"),
        ("a\nb", "No such file or directory"),
        ("%s%n", "No such file or directory"),
        ("/dev/null/x", "Not a directory"),
        (LONG, "File name too long"),
    ],
    ids=["empty", "newline", "percent", "device", "long"],
)
def test_an_odd_path_of_a_descriptor(site, path, problem):
    expected = site.failed(5, text("ERROR_INIFILE_CANT_READ", path, problem)[:LIMIT])
    assert site.run("-vi", path, "-h", site.home, cwd=site.patch_dir) == expected


@pytest.mark.parametrize(
    "path", ["a\nb", "%s%n", "\udcff", LONG, "/dev/null"], ids=["newline", "percent", "byte", "long", "device"]
)
def test_an_odd_home(site, path):
    result = site.run("-h", path, "-i", "x", cwd=site.patch_dir)
    assert (result.status, result.out) == (2, b"")
    assert result.err == os.fsencode(text("ERROR_ORV_HOME", f"{path}/")[:LIMIT]) + b"\n"
    assert site.listed() == []


def test_an_empty_home_is_the_root_directory(site):
    """A folder without write permission: each line of the log is lost with a message, and the work is done."""
    site.user = "nobody" if os.geteuid() == 0 else None
    path = site.descriptor(Patch("ox").descriptor_text())
    result = site.run("-h", "", "-vi", path)
    assert (result.status, result.out) == (0, f"\n{path} is valid\n\n{SUCCESS}".encode())
    assert set(result.err.splitlines()) == {text("LOG_CANT_WRITE", "/patchlogs/orvpatch.log").encode()}


def test_a_folder_of_odd_names(site):
    site.home.component("yn")
    odd = [
        b"a\nb",
        b"%s_%n_vema_%d.tar",
        b"\xff\xfe_lpp266_vema_1.tar",
        b"___.tar",
        b"-rf",
        b"kyn_lpp266_vema_",
        b"." * 200,
        b"kyn_lpp266_vema_fp0001_2.tar",
    ]
    for name in odd:
        (site.patch_dir / os.fsdecode(name)).touch()
    Patch("yn").file("bin/tool").write(site.patch_dir)
    assert site.install(site.patch_dir) == site.done()
    ignored = [
        text("DCFPP_NOT_APPLICABLE", f"{site.patch_dir}/{name}") for name in site.listed() if os.fsencode(name) in odd
    ]
    assert len(ignored) == len(odd)
    assert [line for line in site.logged("INFO") if "will be ignored" in line] == ignored


def test_a_dangling_link_named_like_a_patch(site):
    site.home.component("yn")
    (site.patch_dir / "kyn_lpp266_vema_fp0001.tar").symlink_to("nowhere")
    assert site.install(site.patch_dir) == site.failed(32, text("ERROR_DCFPP_NO_APPLICABLE", site.patch_dir))
    assert site.logged("ERROR")[0] == text("PROC_BAD_RC", "tar -xf", 2)


def test_a_folder_that_cannot_be_listed(site):
    site.as_ordinary_user()
    site.home.component("yn")
    Patch("yn").write(site.patch_dir)
    site.patch_dir.chmod(0o311)
    if os.geteuid() == 0:
        os.chown(site.patch_dir, 0, 0)
    result = site.install(site.patch_dir)
    site.patch_dir.chmod(0o755)
    assert result == site.failed(31, text("ERROR_DCFPP_NO_FILES", site.patch_dir))


def test_standard_input_is_left_alone(site):
    site.home.component("yn")
    read_end, write_end = os.pipe()
    os.write(write_end, b"answer\n")
    assert site.install(Patch("yn").script("go.sh", "pre", body="read word; echo $word"), stdin=read_end) == site.done()
    os.close(read_end)
    os.close(write_end)
    assert "stdOut: answer\n" in site.logged("TRACE")  # a command may read it, the program does not
