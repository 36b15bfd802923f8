"""Builds what is shipped, in folders of its own under build/shipped, from copies of the sources.

Run as a program: all of it, for the tests to find."""

import contextlib
import dataclasses
import fcntl
import functools
import os
import shutil
import subprocess
from pathlib import Path
from typing import NamedTuple

CHECKOUT = Path(__file__).resolve().parents[2]
VERSION = "1.0.0~git20261121.0123456789ab"  # as of a commit between two releases
EPOCH = 1795219200  # any moment; not that of a checkout or a build
_SHIPPED = [
    "CMakeLists.txt",
    "CMakePresets.json",
    "cmake",
    "completions",
    "ctl",
    "docs",
    "man",
    "packaging",
    "src",
    "CHANGELOG.md",
    "README.md",
    "SECURITY.md",
]


# The libraries of the first build; other builds get copies of them, in folders of their own.
SYSROOTS = CHECKOUT / "build/sysroot"
_AMD64_LIBRARIES = f"{SYSROOTS}/x86_64/usr/x86_64-linux-gnu/lib"


@dataclasses.dataclass(frozen=True, eq=False)
class Architecture:
    preset: str
    deb: str
    triplet: str
    machine: str  # as readelf names it
    libraries: frozenset
    levels: dict  # the oldest glibc that each program starts on
    runner: tuple  # has the installer run with the C library that it was built with, glibc 2.31
    ctl_runner: tuple  # has orvpatchctl run
    packages: tuple  # of each program

    @property
    def all_packages(self):
        return [name.format(p=program, v="{v}") for program in PROGRAMS for name in self.packages]


PROGRAMS = ("orvpatch", "orvpatchctl")
# What orvpatchctl runs with under emulation: libarchive and its libraries, and a C library that they accept.
_RUN_SYSROOT = SYSROOTS / "ppc64le-run"
AMD64 = Architecture(
    "x86_64",
    "amd64",
    "x86_64-linux-gnu",
    "Advanced Micro Devices X86-64",
    frozenset({"libc.so.6", "ld-linux-x86-64.so.2"}),
    {"orvpatch": "2.14", "orvpatchctl": "2.17"},
    (f"{_AMD64_LIBRARIES}/ld-linux-x86-64.so.2", "--library-path", _AMD64_LIBRARIES),
    (),
    ("{p}-{v}-linux-x86_64-debug.tar.gz", "{p}-{v}-linux-x86_64.tar.gz", "{p}_{v}-1_amd64.deb"),
)
PPC64LE = Architecture(
    "ppc64le",
    "ppc64el",
    "powerpc64le-linux-gnu",
    "PowerPC64",
    frozenset({"libc.so.6", "ld64.so.2"}),
    {"orvpatch": "2.17", "orvpatchctl": "2.17"},
    ("qemu-ppc64le", "-L", f"{SYSROOTS}/ppc64le/usr/powerpc64le-linux-gnu"),
    ("qemu-ppc64le", "-L", str(_RUN_SYSROOT)),
    (
        "{p}-{v}-1.ppc64le.rpm",
        "{p}-{v}-linux-ppc64le-debug.tar.gz",
        "{p}-{v}-linux-ppc64le.tar.gz",
        "{p}_{v}-1_ppc64el.deb",
    ),
)
ARCHITECTURES = [AMD64, PPC64LE]


class Build(NamedTuple):
    """One build of one architecture."""

    architecture: Architecture
    folder: Path
    output: str  # what compilers, linkers and cmake printed

    @property
    def program(self):
        return self.folder / "orvpatch"

    @property
    def programs(self):
        return [self.folder / name for name in PROGRAMS]

    @property
    def packages(self):
        return self.folder / "packages"

    def package(self, suffix, program="orvpatch"):
        return next(path for path in self.packages.glob(f"{program}[-_]*{suffix}") if "-debug." not in path.name)

    def symbols(self, program):
        return next(self.packages.glob(f"{program}-*-debug.tar.gz"))


@functools.cache
def ship(architecture, folder, umask, **environment):
    """Builds and packs in `folder` below build/shipped, incrementally; tests that run at once wait in turn."""
    source = CHECKOUT / "build/shipped" / folder
    source.mkdir(parents=True, exist_ok=True)
    with _locked(source.parent / f"{source.name}.lock"):
        _copy_sources(source)
        if not (source / "VERSION").exists():
            (source / "VERSION").write_text(f"{VERSION}\n")
        sysroots = _sysroots(architecture.preset, source)
        done = subprocess.run(
            ["packaging/pack", architecture.preset],
            cwd=source,
            umask=umask,
            text=True,
            stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE,
            stderr=subprocess.STDOUT,
            check=False,
            env={**os.environ, "SOURCE_DATE_EPOCH": str(EPOCH), "ORVPATCH_SYSROOTS": str(sysroots), **environment},
        )
    assert done.returncode == 0, done.stdout
    return Build(architecture, source / "build" / architecture.preset, done.stdout)


def first_build(architecture):
    return ship(architecture, "a", 0o022, TZ="UTC", LC_ALL="C")


def second_build(architecture):
    """In another folder, under another mask, in another zone and language."""
    return ship(architecture, "another-folder/with/a-longer-name", 0o027, TZ="Asia/Tokyo", LC_ALL="C.UTF-8")


def _sysroots(preset, source):
    """Where the build in `source` finds its libraries."""
    for folder in [preset, _RUN_SYSROOT.name]:
        subprocess.run([CHECKOUT / "packaging/sysroot", folder], check=True, stdout=subprocess.DEVNULL)
    if source.name == "a":
        return SYSROOTS
    copies = source / "build/sysroot"
    copies.mkdir(parents=True, exist_ok=True)
    subprocess.run(["cp", "-al", "--update", SYSROOTS / preset, copies], check=True)
    return copies


@contextlib.contextmanager
def _locked(path):
    with open(path, "w", encoding="ascii") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        yield


def checkout_files(*paths):
    """Names of the files of the checkout below these paths, without what a build makes; a source archive is not under
    version control and has nothing else."""
    if (CHECKOUT / ".git").exists():
        return subprocess.run(
            ["git", "ls-files", "-co", "--exclude-standard", "--", *paths],
            cwd=CHECKOUT,
            check=True,
            capture_output=True,
            text=True,
        ).stdout.splitlines()
    found = [path for name in paths for path in [CHECKOUT / name, *(CHECKOUT / name).rglob("*")]]
    return [str(path.relative_to(CHECKOUT)) for path in found if path.is_file()]


def _copy_sources(target):
    """Files keep their time where the content has not changed, so that a second run builds nothing."""
    listed = checkout_files(*_SHIPPED)
    wanted = {Path(path) for path in listed if (CHECKOUT / path).is_file()} | {Path("VERSION")}
    for path in target.rglob("*"):
        relative = path.relative_to(target)
        if path.is_file() and relative.parts[0] != "build" and relative not in wanted:
            path.unlink()
    for path in wanted - {Path("VERSION")}:
        content = (CHECKOUT / path).read_bytes()
        if not (target / path).exists() or (target / path).read_bytes() != content:
            (target / path).parent.mkdir(parents=True, exist_ok=True)
            shutil.copy(CHECKOUT / path, target / path)


if __name__ == "__main__":
    for found in ARCHITECTURES:
        first_build(found)
        second_build(found)
