"""The packages: what they hold, what they ask for, what the checkers of the distributions say."""

import re
import subprocess
import tarfile

import pytest

from shipped import CHECKOUT, EPOCH, PPC64LE, VERSION

pytestmark = pytest.mark.packages

PAGES = [
    "man5/orv-registry.5.gz",
    "man5/orvpatch-archive.5.gz",
    "man5/orvpatch.log.5.gz",
    "man5/patch.ini.5.gz",
    "man5/patches.hist.5.gz",
    "man8/orvpatch.8.gz",
]


def everywhere(name):
    """The program, its man pages and completions, and what else of it every kind of package holds."""
    return {
        f"sbin/{name}",
        f"share/bash-completion/completions/{name}",
        f"share/fish/vendor_completions.d/{name}.fish",
        *OF_ONE[name](),
    }


def of_orvpatch():
    """README and the like, and docs but for what only those who release need."""
    top = [name for name in ("README.md", "SECURITY.md") if (CHECKOUT / name).exists()]
    docs = [f"docs/{path.name}" for path in CHECKOUT.glob("docs/*.*") if path.name != "release.md"]
    return {
        *(f"share/doc/orvpatch/{name}" for name in [*top, *docs, "examples/orvpatch.logrotate"]),
        *(f"share/man/{page}" for page in PAGES),
    }


def of_orvpatchctl():
    """A schema for each JSON document, and the notices of the libraries whose code the program holds."""
    schemas = [f"schema/{path.name}" for path in CHECKOUT.glob("docs/schema/*.json")]
    assert "schema/lint.json" in schemas
    doc = [*schemas, "notices/libcli11-dev", "notices/nlohmann-json3-dev"]
    return {"share/man/man8/orvpatchctl.8.gz", *(f"share/doc/orvpatchctl/{name}" for name in doc)}


OF_ONE = {"orvpatch": of_orvpatch, "orvpatchctl": of_orvpatchctl}


def site(name):
    return {f"share/zsh/site-functions/_{name}", f"share/doc/{name}/CHANGELOG.md", f"share/doc/{name}/copyright"}


def debian(name):
    return {
        f"share/zsh/vendor-completions/_{name}",
        f"share/doc/{name}/changelog.gz",
        f"share/doc/{name}/changelog.Debian.gz",
        f"share/doc/{name}/copyright",
        f"share/lintian/overrides/{name}",
    }


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True).stdout


@pytest.fixture
def deb_members(build, name, tmp_path):
    """The data of the .deb, as tarfile sees it."""
    data = tmp_path / "data.tar"
    data.write_bytes(output_of("dpkg-deb", "--fsys-tarfile", build.package(".deb", name)))
    with tarfile.open(data) as archive:
        return archive.getmembers()


@pytest.fixture
def tar_members(build, name):
    with tarfile.open(build.package(".tar.gz", name)) as archive:
        return archive.getmembers()


def for_power(test):
    """There is an .rpm for POWER only."""
    return pytest.mark.parametrize("architecture", [PPC64LE], ids=["ppc64le"], indirect=True)(test)


@pytest.fixture
def rpm(build, name):
    return build.package(".rpm", name)


def files_below(members, top):
    return {member.name.removeprefix(top) for member in members if not member.isdir()}


def check_form(members):
    """Sorted, owned by root, of one time, readable by all and writable by no other user."""
    names = [member.name.removeprefix("./") for member in members]
    assert names == sorted(names)
    assert {(member.uid, member.gid, member.mtime) for member in members} == {(0, 0, EPOCH)}
    for member in members:
        executable = member.isdir() or "/sbin/" in member.name
        assert member.mode == (0o755 if executable else 0o644), member.name


def check_folders(members):
    """None is empty."""
    names = [member.name.rstrip("/") for member in members]
    for folder in (member.name.rstrip("/") for member in members if member.isdir()):
        assert any(name.startswith(f"{folder}/") for name in names), folder


def test_deb_holds_exactly_what_is_shipped(deb_members, name):
    assert files_below(deb_members, "./usr/") == everywhere(name) | debian(name)
    check_form(deb_members)
    check_folders(deb_members)


def test_tarball_holds_exactly_what_is_shipped(build, tar_members, name):
    top = build.package(".tar.gz", name).name.removesuffix(".tar.gz") + "/"
    assert files_below(tar_members, top) == everywhere(name) | site(name)
    check_form(tar_members)
    check_folders(tar_members)


@for_power
def test_rpm_holds_exactly_what_is_shipped(rpm, name):
    rows = (
        output_of(
            "rpm",
            "-qp",
            "--qf",
            "[%{FILEMODES:perms} %{FILEUSERNAME} %{FILEGROUPNAME} %{FILEMTIMES} " "%{FILENAMES}\n]",
            rpm,
        )
        .decode()
        .splitlines()
    )
    entries = [row.split(" ", 4) for row in rows]
    files = {path for mode, *_, path in entries if not mode.startswith("d")}
    assert files == {f"/usr/{path}" for path in everywhere(name) | site(name)}
    folders = {"orvpatch": ["", "/docs", "/examples"], "orvpatchctl": ["", "/notices", "/schema"]}[name]
    assert {path for mode, *_, path in entries if mode.startswith("d")} == {
        f"/usr/share/doc/{name}{folder}" for folder in folders
    }
    assert {(user, group, time) for _, user, group, time, _ in entries} == {("root", "root", str(EPOCH))}
    for mode, *_, path in entries:
        executable = mode.startswith("d") or path == f"/usr/sbin/{name}"
        assert mode[1:] == ("rwxr-xr-x" if executable else "rw-r--r--"), path


def test_deb_control(build, name):
    """orvpatchctl is that of the same release: both have units in common."""
    printed = output_of("dpkg-deb", "-f", build.package(".deb", name)).decode()
    fields = dict(re.findall(r"^([\w-]+): (.*)$", printed, re.M))
    more = {"orvpatch": "", "orvpatchctl": f" libarchive13 (>= 3.3.3), orvpatch (= {VERSION}-1),"}[name]
    assert (fields["Package"], fields["Architecture"], fields["Version"]) == (
        name,
        build.architecture.deb,
        f"{VERSION}-1",
    )
    assert fields["Depends"] == f"libc6 (>= {build.architecture.levels[name]}),{more} procps"
    assert fields.get("Recommends") == {"orvpatch": None, "orvpatchctl": "gpgv"}[name]


@for_power
def test_rpm_requirements(rpm, name):
    """What the program needs, and no shell or library besides."""
    required = set(output_of("rpm", "-qp", "--requires", rpm).decode().splitlines())
    by_loader = {row for row in required if re.match(r"(lib[cm]|libpthread|ld64)\.so|rtld|rpmlib", row)}
    more = {"orvpatch": set(), "orvpatchctl": {f"orvpatch = {VERSION}", "libarchive.so.13()(64bit)"}}[name]
    assert required - by_loader == {"(procps-ng or procps)", "tar", "grep", "util-linux"} | more
    recommended = output_of("rpm", "-qp", "--recommends", rpm).decode()
    assert recommended == {"orvpatch": "", "orvpatchctl": "(gnupg2 or gpg2)\n"}[name]
    levels = {level for row in by_loader for level in re.findall(r"GLIBC_([\d.]+)", row)}
    assert levels == {PPC64LE.levels[name]}
    fields = output_of("rpm", "-qp", "--qf", "%{ARCH} %{BUILDHOST} %{VERSION}", rpm).decode()
    assert fields == f"ppc64le localhost {VERSION}"


@for_power
def test_rpm_goes_below_usr_only(rpm):
    """Pages and completions name their paths."""
    assert output_of("rpm", "-qp", "--qf", "[%{PREFIXES}]", rpm) in (b"", b"(none)")


def test_lintian_is_silent(build, name):
    done = subprocess.run(
        ["lintian", "--allow-root", "-I", "--pedantic", build.package(".deb", name)],
        capture_output=True,
        text=True,
        check=False,
    )
    assert (done.returncode, done.stdout) == (0, "")


@for_power
def test_rpmlint_is_silent(rpm):
    done = subprocess.run(
        ["rpmlint", "-c", CHECKOUT / "packaging/rpmlint.toml", rpm], capture_output=True, text=True, check=False
    )
    assert re.search(r"1 packages and 0 specfiles checked; 0 errors, 0 warnings", done.stdout), done.stdout
    assert done.returncode == 0
