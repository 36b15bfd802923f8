"""The packages: what they hold, what they ask for, what the checkers of the distributions say."""

import re
import subprocess
import tarfile

import pytest

from shipped import CHECKOUT, EPOCH, PPC64LE, VERSION

pytestmark = pytest.mark.packages

PAGES = ["man5/orv-registry.5.gz", "man5/orvpatch-archive.5.gz", "man5/orvpatch.log.5.gz", "man5/patch.ini.5.gz",
         "man5/patches.hist.5.gz", "man8/orvpatch.8.gz"]
EVERYWHERE = {"sbin/orvpatch", "share/bash-completion/completions/orvpatch",
              "share/fish/vendor_completions.d/orvpatch.fish", "share/doc/orvpatch/examples/orvpatch.logrotate",
              *(f"share/man/{page}" for page in PAGES)}
SITE = {"share/zsh/site-functions/_orvpatch", "share/doc/orvpatch/CHANGELOG.md", "share/doc/orvpatch/copyright"}
DEBIAN = {"share/zsh/vendor-completions/_orvpatch", "share/doc/orvpatch/changelog.gz",
          "share/doc/orvpatch/changelog.Debian.gz", "share/doc/orvpatch/copyright",
          "share/lintian/overrides/orvpatch"}


def documents():
    """README and the like, and docs but for what only those who release need."""
    top = [name for name in ("README.md", "SECURITY.md") if (CHECKOUT / name).exists()]
    docs = [f"docs/{path.name}" for path in CHECKOUT.glob("docs/*.*") if path.name != "release.md"]
    return {f"share/doc/orvpatch/{name}" for name in top + docs}


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True).stdout


@pytest.fixture
def deb_members(build, tmp_path):
    """The data of the .deb, as tarfile sees it."""
    data = tmp_path / "data.tar"
    data.write_bytes(output_of("dpkg-deb", "--fsys-tarfile", build.package(".deb")))
    with tarfile.open(data) as archive:
        return archive.getmembers()


@pytest.fixture
def tar_members(build):
    with tarfile.open(build.package(".tar.gz")) as archive:
        return archive.getmembers()


def for_power(test):
    """There is an .rpm for POWER only."""
    return pytest.mark.parametrize("architecture", [PPC64LE], ids=["ppc64le"], indirect=True)(test)


@pytest.fixture
def rpm(build):
    return build.package(".rpm")


def files_below(members, top):
    return {member.name.removeprefix(top) for member in members if not member.isdir()}


def check_form(members):
    """Sorted, owned by root, of one time, readable by all and writable by no other user."""
    names = [member.name.removeprefix("./") for member in members]
    assert names == sorted(names)
    assert {(member.uid, member.gid, member.mtime) for member in members} == {(0, 0, EPOCH)}
    for member in members:
        executable = member.isdir() or member.name.endswith("sbin/orvpatch")
        assert member.mode == (0o755 if executable else 0o644), member.name


def test_deb_holds_exactly_what_is_shipped(deb_members):
    assert files_below(deb_members, "./usr/") == EVERYWHERE | DEBIAN | documents()
    check_form(deb_members)


def test_tarball_holds_exactly_what_is_shipped(build, tar_members):
    top = build.package(".tar.gz").name.removesuffix(".tar.gz") + "/"
    assert files_below(tar_members, top) == EVERYWHERE | SITE | documents()
    check_form(tar_members)


@for_power
def test_rpm_holds_exactly_what_is_shipped(rpm):
    rows = output_of("rpm", "-qp", "--qf", "[%{FILEMODES:perms} %{FILEUSERNAME} %{FILEGROUPNAME} %{FILEMTIMES} "
                     "%{FILENAMES}\n]", rpm).decode().splitlines()
    entries = [row.split(" ", 4) for row in rows]
    files = {name for mode, *_, name in entries if not mode.startswith("d")}
    assert files == {f"/usr/{name}" for name in EVERYWHERE | SITE | documents()}
    assert {name for mode, *_, name in entries if mode.startswith("d")} == {
        "/usr/share/doc/orvpatch", "/usr/share/doc/orvpatch/docs", "/usr/share/doc/orvpatch/examples"}
    assert {(user, group, time) for _, user, group, time, _ in entries} == {("root", "root", str(EPOCH))}
    for mode, *_, name in entries:
        executable = mode.startswith("d") or name == "/usr/sbin/orvpatch"
        assert mode[1:] == ("rwxr-xr-x" if executable else "rw-r--r--"), name


def test_deb_control(build):
    fields = output_of("dpkg-deb", "-f", build.package(".deb")).decode()
    assert re.search(r"^Architecture: (.*)$", fields, re.M)[1] == build.architecture.deb
    assert re.search(r"^Version: (.*)$", fields, re.M)[1] == f"{VERSION}-1"
    assert re.search(r"^Depends: (.*)$", fields, re.M)[1] == f"libc6 (>= {build.architecture.level}), procps"


@for_power
def test_rpm_requirements(rpm):
    """What the program needs, and no shell or library besides."""
    required = set(output_of("rpm", "-qp", "--requires", rpm).decode().splitlines())
    by_loader = {name for name in required if re.match(r"(libc|ld64)\.so|rtld|rpmlib", name)}
    assert required - by_loader == {"(procps-ng or procps)", "tar", "grep", "util-linux"}
    levels = {level for name in by_loader for level in re.findall(r"GLIBC_([\d.]+)", name)}
    assert levels == {PPC64LE.level}
    fields = output_of("rpm", "-qp", "--qf", "%{ARCH} %{BUILDHOST} %{VERSION}", rpm).decode()
    assert fields == f"ppc64le localhost {VERSION}"


@for_power
def test_rpm_goes_below_usr_only(rpm):
    """Pages and completions name their paths."""
    assert output_of("rpm", "-qp", "--qf", "[%{PREFIXES}]", rpm) in (b"", b"(none)")


def test_lintian_is_silent(build):
    done = subprocess.run(["lintian", "--allow-root", "-I", "--pedantic", build.package(".deb")],
                          capture_output=True, text=True, check=False)
    assert (done.returncode, done.stdout) == (0, "")


@for_power
def test_rpmlint_is_silent(rpm):
    done = subprocess.run(["rpmlint", "-c", CHECKOUT / "packaging/rpmlint.toml", rpm], capture_output=True,
                          text=True, check=False)
    assert re.search(r"1 packages and 0 specfiles checked; 0 errors, 0 warnings", done.stdout), done.stdout
    assert done.returncode == 0
