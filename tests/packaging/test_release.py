"""scripts/release, in a clone of the last commit."""

import subprocess
import tarfile

import pytest

from shipped import ARCHITECTURES, CHECKOUT

pytestmark = pytest.mark.packages


def git(*words):
    return subprocess.run(["git", *words], check=True, capture_output=True, text=True).stdout.strip()


@pytest.fixture
def clone(tmp_path):
    git("clone", "--quiet", "--shared", str(CHECKOUT), str(tmp_path / "clone"))
    return tmp_path / "clone"


def release(clone):
    return subprocess.run([clone / "scripts/release"], stdin=subprocess.DEVNULL, capture_output=True, text=True,
                          check=False)


def test_all_artefacts_and_their_checksums(clone):
    done = release(clone)
    assert (done.returncode, done.stderr) == (0, "")
    sources, = clone.glob("dist/orvpatch-*.[0-9].tar.gz")
    version = sources.name.removeprefix("orvpatch-").removesuffix(".tar.gz")
    packages = [name.format(v=version) for architecture in ARCHITECTURES for name in architecture.packages]
    artefacts = sorted([sources.name, *packages])
    assert sorted(path.name for path in (clone / "dist").iterdir()) == sorted(["SHA256SUMS", *artefacts])

    sums = (clone / "dist/SHA256SUMS").read_text()
    assert done.stdout == sums
    assert [line.split()[1] for line in sums.splitlines()] == artefacts
    subprocess.run(["sha256sum", "--quiet", "--strict", "-c", "SHA256SUMS"], cwd=clone / "dist", check=True)

    with tarfile.open(sources) as archive:
        files = {member.name.partition("/")[2] for member in archive.getmembers() if member.isfile()}
        times = {member.mtime for member in archive.getmembers()}
    assert files == set(git("-C", str(clone), "ls-files").splitlines())
    assert times == {int(git("-C", str(clone), "log", "-1", "--format=%ct"))}
    assert git("-C", str(clone), "status", "--porcelain") == ""


def test_a_checkout_with_changes_is_refused(clone):
    (clone / "CHANGELOG.md").write_text("## 9.9.9\n")
    (clone / "src/new.cpp").touch()
    done = release(clone)
    assert done.returncode == 1
    assert done.stderr.splitlines() == [
        "release: the checkout has changes; commit them first", " M CHANGELOG.md", "?? src/new.cpp"]
    assert not (clone / "dist").exists()


def test_a_version_that_the_changes_do_not_name_does_not_build(clone):
    changes = (clone / "CHANGELOG.md").read_text()
    (clone / "CHANGELOG.md").write_text(changes.replace("## 1.", "## 0.", 1))
    done = subprocess.run([clone / "packaging/pack", "release"], capture_output=True, text=True, check=False)
    assert done.returncode != 0
    assert "CHANGELOG.md begins with" in done.stderr
