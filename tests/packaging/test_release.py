"""scripts/release, in a clone of the last commit."""

import json
import os
import re
import shutil
import subprocess
import tarfile
import time

import pytest

from shipped import ARCHITECTURES, CHECKOUT, SYSROOTS, checkout_files

pytestmark = pytest.mark.packages


def git(*words):
    return subprocess.run(["git", *words], check=True, capture_output=True, text=True).stdout.strip()


@pytest.fixture
def clone(tmp_path):
    """Of the last commit; a source archive becomes one."""
    folder = tmp_path / "clone"
    if (CHECKOUT / ".git").exists():
        git("clone", "--quiet", "--shared", str(CHECKOUT), str(folder))
        return folder
    for name in checkout_files(*(path.name for path in CHECKOUT.iterdir() if path.name not in ("build", "VERSION"))):
        (folder / name).parent.mkdir(parents=True, exist_ok=True)
        shutil.copy(CHECKOUT / name, folder / name)
    git("-C", str(folder), "init", "--quiet")
    git("-C", str(folder), "add", "--all")
    git(
        "-C",
        str(folder),
        "-c",
        "user.name=sources",
        "-c",
        "user.email=sources@norvik.example",
        "commit",
        "--quiet",
        "-m",
        "sources",
    )
    return folder


def release(clone):
    """The user's configuration and the mask must not matter."""
    configuration = clone.parent / "gitconfig"
    configuration.write_text("[tar]\n\tumask = 0077\n")
    return subprocess.run(
        [clone / "scripts/release"],
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        check=False,
        umask=0o027,
        env={
            **os.environ,
            "GIT_CONFIG_GLOBAL": str(configuration),
            "CXXFLAGS": "-O0",
            "ORVPATCH_SYSROOTS": str(SYSROOTS),
        },
    )


def test_all_artefacts_and_their_checksums(clone):
    done = release(clone)
    assert (done.returncode, done.stderr) == (0, "")
    version = version_between_releases(clone)
    packages = [name.format(v=version) for architecture in ARCHITECTURES for name in architecture.all_packages]
    collection = "orv-patch-" + re.sub(r"~git(\d+)\.", r"-git\1.c", version) + ".tar.gz"
    artefacts = sorted([f"orvpatch-{version}.tar.gz", collection, *packages])
    told = sorted([*artefacts, "VERSIONS", f"orvpatch-{version}.spdx.json"])
    assert sorted(path.name for path in (clone / "dist").iterdir()) == sorted(["SHA256SUMS", *told])

    sums = (clone / "dist/SHA256SUMS").read_text()
    assert done.stdout == sums
    assert [line.split()[1] for line in sums.splitlines()] == told
    subprocess.run(["sha256sum", "--quiet", "--strict", "-c", "SHA256SUMS"], cwd=clone / "dist", check=True)
    check_sources(clone, version)
    check_spdx(json.loads((clone / f"dist/orvpatch-{version}.spdx.json").read_text()), sums, artefacts)
    check_versions((clone / "dist/VERSIONS").read_text(), version)
    assert git("-C", str(clone), "status", "--porcelain") == ""


def version_between_releases(clone):
    day, commit = git("-C", str(clone), "log", "-1", "--format=%ct %H").split()
    return f"{announced(clone)}~git{time.strftime('%Y%m%d', time.gmtime(int(day)))}.{commit[:12]}"


def announced(clone):
    return re.search(r"^## ([\d.]+) ", (clone / "CHANGELOG.md").read_text(), re.M)[1]


def check_sources(clone, version):
    """All files of the commit and VERSION, with the commit's time; git was told tar.umask=0077 by its user."""
    top = f"orvpatch-{version}"
    with tarfile.open(clone / f"dist/{top}.tar.gz") as archive:
        members = archive.getmembers()
        assert archive.extractfile(f"{top}/VERSION").read().decode() == f"{version}\n"
    files = {member.name for member in members if member.isfile()}
    assert files == {f"{top}/{name}" for name in [*git("-C", str(clone), "ls-files").splitlines(), "VERSION"]}
    assert {member.mtime for member in members} == {int(git("-C", str(clone), "log", "-1", "--format=%ct"))}
    assert {member.mode for member in members} == {0o755, 0o644}


def check_spdx(document, sums, artefacts):
    """Every file of the release with its digest; for each program all that is in it or made it, and what made the
    collection."""
    assert (document["spdxVersion"], document["dataLicense"]) == ("SPDX-2.3", "CC0-1.0")
    packages = {package["SPDXID"]: package for package in document["packages"]}
    assert len(packages) == len(document["packages"])
    files = {package["packageFileName"]: package for package in packages.values() if "packageFileName" in package}
    assert sorted(files) == artefacts
    for name, package in files.items():
        assert f"{package['checksums'][0]['checksumValue']}  {name}\n" in sums

    related = [
        (row["spdxElementId"], row["relationshipType"], row["relatedSpdxElement"]) for row in document["relationships"]
    ]
    ends = {end for one, _, other in related for end in (one, other)}
    assert ends == {"SPDXRef-DOCUMENT", *packages}
    for name, package in files.items():
        tools = {
            packages[one]["name"]
            for one, kind, other in related
            if other == package["SPDXID"] and kind == "BUILD_TOOL_OF"
        }
        if name.startswith("orv-patch-"):
            assert tools == {"ansible-core", "gzip", "tar"}, name
        elif name.endswith((".deb", ".rpm")):
            assert {"cmake", "g++-12", "ninja-build"} <= tools and "ansible-core" not in tools, name
        linked = {
            packages[other]["name"]
            for one, kind, other in related
            if one == package["SPDXID"] and kind.endswith("_LINK")
        }
        if name.endswith((".deb", ".rpm")):
            kind = "amd64" if "amd64" in name else "ppc64el"
            libraries = {
                f"{library}-{kind}-cross" for library in ("libc6", "libc6-dev", "libgcc-10-dev", "libstdc++-10-dev")
            }
            if name.startswith("orvpatchctl"):
                libraries |= {"libarchive13", "libcli11-dev", "nlohmann-json3-dev"}
            assert linked == libraries, name


def check_versions(text, version):
    assert text.startswith(f"orvpatch {version}\n")
    compiler = subprocess.run(
        ["dpkg-query", "-W", "-f", "${Version}", "g++-12-powerpc64le-linux-gnu"],
        check=True,
        capture_output=True,
        text=True,
    ).stdout
    assert f"  g++-12-powerpc64le-linux-gnu {compiler}\n" in text
    for line in (CHECKOUT / "packaging/sysroot.packages").read_text().splitlines():
        if line.startswith(("x86_64 ", "ppc64le ")):
            _, name, number, _, _, digest = line.split()
            assert f"  {name} {number} {digest}\n" in text


def test_version_of_a_tagged_commit(clone):
    git("-C", str(clone), "tag", f"v{announced(clone)}")
    assert version_of(clone).stdout == f"{announced(clone)}\n"


def test_a_tag_of_another_version_is_refused(clone):
    git("-C", str(clone), "tag", "v9.9.9")
    done = version_of(clone)
    assert (done.returncode, done.stdout) == (1, "")
    assert "v9.9.9 does not fit version" in done.stderr


def linted(sources):
    """In every language of the tree, outside of a repository."""
    return subprocess.run(
        ["scripts/lint"],
        cwd=sources,
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        check=False,
        env={**os.environ, "GIT_CEILING_DIRECTORIES": str(sources.parent)},
    )


def version_of(clone):
    return subprocess.run([clone / "packaging/version"], capture_output=True, text=True, check=False)


@pytest.mark.parametrize("command", [["scripts/release"], ["packaging/pack", "x86_64"]], ids=["release", "pack"])
def test_a_path_with_a_blank_is_refused_at_once(command, clone, tmp_path):
    moved = clone.rename(tmp_path / "a clone")
    done = subprocess.run([moved / command[0], *command[1:]], capture_output=True, text=True, check=False)
    assert (done.returncode, done.stdout) == (1, "")
    assert done.stderr.count("\n") == 1 and "with a blank in its path" in done.stderr
    assert not (moved / "dist").exists() and not (moved / "build").exists()


def test_a_checkout_with_changes_is_refused(clone):
    (clone / "CHANGELOG.md").write_text("## 9.9.9\n")
    (clone / "src/new.cpp").touch()
    done = release(clone)
    assert done.returncode == 1
    assert done.stderr.splitlines() == [
        "release: the checkout has changes; commit them first",
        " M CHANGELOG.md",
        "?? src/new.cpp",
    ]
    assert not (clone / "dist").exists()


def test_a_version_that_the_changes_do_not_name_does_not_build(clone):
    changes = (clone / "CHANGELOG.md").read_text()
    (clone / "CHANGELOG.md").write_text(changes.replace("## 1.", "## 0.", 1))
    done = subprocess.run([clone / "packaging/pack", "release"], capture_output=True, text=True, check=False)
    assert done.returncode != 0
    assert "CHANGELOG.md begins with" in done.stderr


def test_sources_can_be_checked_without_version_control(clone, tmp_path):
    """As they are in the source archive: what looks at all files finds them, and they can be packed."""
    sources = tmp_path / "sources"
    sources.mkdir()
    subprocess.run(f"git -C {clone} archive HEAD | tar -x -C {sources}", shell=True, check=True)
    done = linted(sources)
    assert (done.returncode, done.stdout, done.stderr) == (0, "", "")
    odd = {"src/odd.cpp": "int  odd;\n", "tests/odd.py": "odd = [1,2]\n", "scripts/odd": "#!/bin/sh\n  :\n"}
    for name, content in odd.items():
        (sources / name).write_text(content)
    done = linted(sources)
    assert done.returncode == 1
    assert [name for name in odd if name not in done.stdout + done.stderr] == []
    assert version_of(sources).stdout == f"{announced(clone)}\n"
