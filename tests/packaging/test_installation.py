"""Packages installed into an empty root, and the programs in it run on a home of the sample product."""

import gzip
import json
import re
import shlex
import subprocess

import pytest

from shipped import AMD64, CHECKOUT, PPC64LE, PROGRAMS
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
    run(
        "dpkg",
        f"--root={root}",
        "--force-depends",
        "--force-architecture",
        "--log=/dev/null",
        "-i",
        *(build.package(".deb", name) for name in PROGRAMS),
    )
    for name in PROGRAMS:
        assert "\nStatus: install ok installed\n" in run("dpkg", f"--root={root}", "-s", name)
    return root / "usr"


def by_rpm(build, root):
    options = ["--root", root, "--dbpath", "/var/lib/rpm"]
    run("rpm", *options, "--nodeps", "--ignorearch", "-i", *(build.package(".rpm", name) for name in PROGRAMS))
    for name in PROGRAMS:
        assert run("rpm", *options, "-q", name).strip() + ".rpm" == build.package(".rpm", name).name
        assert run("rpm", *options, "-V", "--nodeps", name) == ""
    return root / "usr"


def by_tar(build, root):
    for name in PROGRAMS:
        run("tar", "-C", root, "--strip-components=1", "-xzf", build.package(".tar.gz", name))
    return root


WAYS = [(AMD64, by_dpkg), (AMD64, by_tar), (PPC64LE, by_dpkg), (PPC64LE, by_tar), (PPC64LE, by_rpm)]


@pytest.fixture
def prefix(request, build, tmp_path):
    """Where sbin and share are after the installation."""
    return request.param(build, tmp_path)


in_every_way = pytest.mark.parametrize(
    "architecture, prefix", WAYS, indirect=True, ids=[f"{arch.preset}-{way.__name__}" for arch, way in WAYS]
)


def emulated(runner, program, folder):
    """A script that has the program run with the libraries of the runner."""
    script = folder / "emulated" / program.name
    script.parent.mkdir(exist_ok=True)
    script.write_text(f'#!/bin/sh\nexec {shlex.join([*runner, str(program)])} "$@"\n')
    script.chmod(0o755)
    return script


@in_every_way
def test_installed_program_runs_the_demo(prefix, build, tmp_path):
    """Report, install, history, refusal and failure on live agents; the demo checks each of them."""
    program = emulated(build.architecture.runner, prefix / "sbin/orvpatch", tmp_path)
    said = run(CHECKOUT / "scripts/demo", program)
    assert f"== Using {program}\n" in said
    assert said.endswith("\n== Everything went as announced\n")


@pytest.fixture
def ctl(prefix, build, tmp_path):
    """ctl(command, words...): runs the installed orvpatchctl and returns its status and its document."""
    runner = build.architecture.ctl_runner
    program = emulated(runner, prefix / "sbin/orvpatchctl", tmp_path)
    # What this machine cannot run as it is is named; elsewhere the installer is found beside orvpatchctl.
    installer = ["--installer", emulated(runner, prefix / "sbin/orvpatch", tmp_path)] if runner else []

    def call(command, *words):
        options = installer if command in ("check", "apply") else []
        done = subprocess.run(
            [program, command, *words, *options, "--json"],
            stdin=subprocess.DEVNULL,
            capture_output=True,
            text=True,
            check=False,
        )
        assert done.stdout, done.stderr
        return done.returncode, json.loads(done.stdout)

    call.program = program
    return call


@in_every_way
def test_installed_orvpatchctl_says_its_version(ctl):
    announced = re.search(r"^## ([\d.]+) ", (CHECKOUT / "CHANGELOG.md").read_text(), re.M)[1]
    assert run(ctl.program, "--version") == f"orvpatchctl {announced}\n"


@in_every_way
def test_installed_orvpatchctl_applies_a_patch_and_takes_it_back(ctl, home, patch_dir):
    """A patch is built, looked at, checked, applied and verified; then the home is as before."""
    home.component("xe", "06100000", desc="Database Agent")
    home.write("bin/kxeagent", "old\n", 0o750)
    (home.path / "tmp").chmod(0o700)
    made = Patch("xe", level="06100001").file("bin/kxeagent", "new\n").script("1.sh", "post").write(patch_dir)
    assert ctl("lint", made)[0] == 0
    status, shown = ctl("show", made)
    assert (status, shown["product"], shown["level"]) == (0, "kxe", "06.10.00.01")
    assert [file["path"] for file in shown["files"]] == ["bin/kxeagent"]
    assert ctl("check", home.path, made)[0] == 0
    status, record = ctl("apply", home.path, made, "--yes")
    assert (status, record["verdict"]) == (0, "applied"), record
    assert home.read("bin/kxeagent") == b"new\n"
    assert ctl("verify", home.path, made)[1]["differences"] == []
    assert levels_of(ctl, home) == {"kxe": "06.10.00.01"}
    assert [line["result"] for line in ctl("history", home.path)[1]["records"]] == ["PASS"]
    status, record = ctl("undo", home.path)
    assert (status, record["verdict"]) == (0, "undone"), record
    assert home.read("bin/kxeagent") == b"old\n"
    assert levels_of(ctl, home) == {"kxe": "06.10.00.00"}


def levels_of(ctl, home):
    return {component["code"]: component["level"] for component in ctl("status", home.path)[1]["components"]}


@in_every_way
def test_installed_pages_can_be_read(prefix):
    for page in sorted((prefix / "share/man").rglob("*.gz")):
        done = subprocess.run(
            ["mandoc", "-T", "ascii", page.relative_to(prefix / "share/man")],
            check=True,
            cwd=prefix / "share/man",
            capture_output=True,
            text=True,
        )
        assert "ORV" in done.stdout, page


@in_every_way
def test_installed_pages_hold_no_dead_link(prefix):
    top = prefix / "share/doc/orvpatch"
    targets = [(page, target) for page in sorted(top.rglob("*.md")) for target in links_of(page)]
    assert (top / "README.md", "docs/recovery.md") in targets
    assert [(page.name, target) for page, target in targets if not leads_somewhere(page, target)] == []
    assert "tests/README.md (in the sources)" in (top / "README.md").read_text()


# Pages of other packages that ours point to.
FOREIGN = {"grep(1)", "gpg(1)", "gpgv(1)", "ps(1)", "screen(1)", "su(1)", "sudo(8)", "tar(1)", "tmux(1)"}


@in_every_way
def test_what_installed_manual_pages_name_is_installed(prefix):
    """Other pages, and files of the documentation."""
    pages = {f"{path.name[:-5]}({path.name[-4]})": path for path in (prefix / "share/man").rglob("*.gz")}
    assert {"orvpatch(8)", "orvpatchctl(8)"} < set(pages)
    for page in pages.values():
        text = gzip.decompress(page.read_bytes()).decode()
        named = {f"{name}({section})" for name, section in re.findall(r"^\.Xr (\S+) (\d)", text, re.M)}
        assert named - set(pages) - FOREIGN == set(), page
        for name in re.findall(r"^\.Pa (share/\S+|\S+\.md)(?: |$)", text, re.M):
            found = prefix / name if name.startswith("share/") else prefix / "share/doc/orvpatch" / name
            assert found.exists(), (page, name)


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
    for name in PROGRAMS:
        assert (tmp_path / "sbin" / name).stat().st_mode & 0o7777 == 0o755
    assert (tmp_path / "share/zsh/site-functions/_orvpatch").is_file()
    assert (tmp_path / "share/man/man8/orvpatch.8.gz").is_file()
    assert not (tmp_path / "share/lintian").exists()
