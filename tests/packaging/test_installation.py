"""Packages installed into an empty root, and the program in it run on a home of the sample product."""

import re
import shlex
import subprocess

import pytest

from shipped import AMD64, CHECKOUT, PPC64LE
from support import Patch, Program

pytestmark = pytest.mark.packages


def run(*command):
    done = subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, check=False)
    assert done.returncode == 0, done.stdout
    return done.stdout


def by_dpkg(build, root):
    """The root has neither the packages that are asked for nor, for the target, the architecture."""
    for folder in ("info", "updates", "triggers"):
        (root / "var/lib/dpkg" / folder).mkdir(parents=True)
    for record in ("status", "available"):
        (root / "var/lib/dpkg" / record).touch()
    run("dpkg", f"--root={root}", "--force-depends", "--force-architecture", "--log=/dev/null", "-i",
        build.package(".deb"))
    assert "\nStatus: install ok installed\n" in run("dpkg", f"--root={root}", "-s", "orvpatch")
    return root / "usr"


def by_rpm(build, root):
    options = ["--root", root, "--dbpath", "/var/lib/rpm"]
    run("rpm", *options, "--nodeps", "--ignorearch", "-i", build.package(".rpm"))
    assert run("rpm", *options, "-q", "orvpatch").strip() + ".rpm" == build.package(".rpm").name
    assert run("rpm", *options, "-V", "--nodeps", "orvpatch") == ""
    return root / "usr"


def by_tar(build, root):
    run("tar", "-C", root, "--strip-components=1", "-xzf", build.package(".tar.gz"))
    return root


WAYS = [(AMD64, by_dpkg), (AMD64, by_tar), (PPC64LE, by_dpkg), (PPC64LE, by_tar), (PPC64LE, by_rpm)]


@pytest.fixture
def prefix(request, build, tmp_path):
    """Where sbin and share are after the installation."""
    return request.param(build, tmp_path)


in_every_way = pytest.mark.parametrize(
    "architecture, prefix", WAYS, indirect=True, ids=[f"{arch.preset}-{way.__name__}" for arch, way in WAYS])


@in_every_way
def test_installed_program_runs_the_demo(prefix, build, tmp_path):
    """Report, install, history, refusal and failure on live agents; the demo checks each of them."""
    program = prefix / "sbin/orvpatch"
    if build.architecture.runner:
        program = tmp_path / "emulated/orvpatch"
        program.parent.mkdir()
        program.write_text(f'#!/bin/sh\nexec {shlex.join(build.architecture.runner)} {prefix}/sbin/orvpatch "$@"\n')
        program.chmod(0o755)
    said = run(CHECKOUT / "scripts/demo", program)
    assert f"== Using {program}\n" in said
    assert said.endswith("\n== Everything went as announced\n")


@in_every_way
def test_installed_pages_can_be_read(prefix):
    for page in sorted((prefix / "share/man").rglob("*.gz")):
        done = subprocess.run(["mandoc", "-T", "ascii", page.relative_to(prefix / "share/man")], check=True,
                              cwd=prefix / "share/man", capture_output=True, text=True)
        assert "ORV" in done.stdout, page


@in_every_way
def test_installed_pages_hold_no_dead_link(prefix):
    top = prefix / "share/doc/orvpatch"
    targets = [(page, target) for page in sorted(top.rglob("*.md")) for target in links_of(page)]
    assert (top / "README.md", "docs/recovery.md") in targets
    assert [(page.name, target) for page, target in targets if not leads_somewhere(page, target)] == []


def links_of(page):
    found = re.findall(r"\]\(([^()\s]+)\)|(?:src|srcset|href)=\"([^\"]+)\"", page.read_text())
    return [target for pair in found for target in pair if target and "://" not in target]


def leads_somewhere(page, target):
    name, _, anchor = target.partition("#")
    linked = page.parent / name if name else page
    if not anchor or linked.suffix != ".md":
        return linked.exists()
    titles = re.findall(r"^#+ (.*)$", linked.read_text(), re.M)
    return anchor in [re.sub(r"[^\w -]", "", title.lower()).replace(" ", "-") for title in titles]


@pytest.mark.parametrize("architecture, prefix", [(AMD64, by_tar)], indirect=True, ids=["x86_64"])
def test_example_rotates_the_log_and_spares_the_history(prefix, build, home, patch_dir, tmp_path):
    """Two installations with a rotation between them: the second begins a new log and goes on in the history."""
    program = Program(prefix / "sbin/orvpatch", build.architecture.runner)
    home.component("xe")
    made = Patch("xe", level="06100001").file("bin/kxeagent").write(patch_dir)
    assert program.install(home, made).status == 0
    log, history = home.path / "patchlogs/orvpatch.log", home.path / "patchlogs/patches.hist"
    first_log, first_history = log.read_bytes(), history.read_bytes()

    example = (prefix / "share/doc/orvpatch/examples/orvpatch.logrotate").read_text()
    assert re.findall(r"^/\S+", example, re.M) == ["/opt/orv/patchlogs/orvpatch.log"]
    rotation = tmp_path / "rotation"
    rotation.write_text(example.replace("/opt/orv", str(home.path)))
    rotation.chmod(0o644)
    run("logrotate", "--force", "--state", tmp_path / "state", rotation)
    assert not log.exists()
    assert (home.path / "patchlogs/orvpatch.log.1").read_bytes() == first_log
    assert history.read_bytes() == first_history

    assert program.install(home, made).status == 0
    assert log.exists()
    assert history.read_bytes().startswith(first_history)


def test_installed_by_cmake_below_a_prefix(build, tmp_path):
    run("cmake", "--install", build.folder, "--prefix", tmp_path)
    assert (tmp_path / "sbin/orvpatch").stat().st_mode & 0o7777 == 0o755
    assert (tmp_path / "share/zsh/site-functions/_orvpatch").is_file()
    assert (tmp_path / "share/man/man8/orvpatch.8.gz").is_file()
    assert not (tmp_path / "share/lintian").exists()
