"""The same sources and the same SOURCE_DATE_EPOCH give the same bytes."""

import hashlib
import subprocess

import pytest

from shipped import VERSION

pytestmark = pytest.mark.packages


def checksums(build):
    files = [*build.programs, *(path for path in build.packages.iterdir() if path.suffix in (".deb", ".rpm", ".gz"))]
    return {path.name: hashlib.sha256(path.read_bytes()).hexdigest() for path in files}


def test_two_builds_are_the_same(build, other_build):
    assert build.folder != other_build.folder
    assert checksums(build) == checksums(other_build)


def test_every_package_is_made(build):
    made = sorted(path.name for path in build.packages.iterdir() if path.suffix in (".deb", ".rpm", ".gz"))
    assert made == sorted(name.format(v=VERSION) for name in build.architecture.all_packages)


def test_nothing_warns(build, other_build):
    assert "warning" not in (build.output + other_build.output).lower()


def test_programs_hold_no_path_of_the_build(build):
    for program in build.programs:
        assert str(build.folder.parents[1]).encode() not in program.read_bytes()


def test_header_of_the_log_has_the_date_of_the_release(build, home):
    """1795219200 is 2026-11-21 00:00:00 UTC."""
    words = [*build.architecture.runner, build.program, "-h", home.path, "-vi", "none"]
    subprocess.run(words, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, check=False)
    (header,) = home.log().headers
    assert (header.date, header.time) == ("11/21/26", "00:00:00")
