"""The commands of docs/recovery.md, and the statuses that it names."""

import os
import re
import signal
import subprocess
import time
from pathlib import Path

import pytest

from support import Patch, stubs

from productsite import Running

ROOT = Path(__file__).resolve().parents[2]
PAGE = (ROOT / "docs/recovery.md").read_text(encoding="utf-8")


def command(word):
    """The command of the page, in one line or more, that begins with this word."""
    return re.search(rf"(?:^ {{4,}}(?={word}).*\n(?: {{4,}}.*\n)*)", PAGE, re.M)[0]


def printed(site, word):
    script = command(word).replace("HOME", str(site.home.path))
    done = subprocess.run(["bash"], input=script, cwd="/", stdout=subprocess.PIPE, text=True, check=False)
    return done.stdout.splitlines()


@pytest.fixture
def site(site):
    if site.program.runner:
        pytest.skip("the program has another name in the list of processes")
    site.home.component("yn")
    return site


def test_statuses_are_those_of_the_program():
    codes = re.search(r"enum Code [^{]*\{(.*?)\}", (ROOT / "src/nls.h").read_text(), re.S)[1]
    named = set(re.findall(r"\d+", " ".join(re.findall(r"^\| ([\d, ]+) \|", PAGE, re.M))))
    assert named and named <= set(re.findall(r"= (\d+)", codes))


def test_a_run_and_the_command_that_a_killed_one_leaves_are_shown(site):
    shown = lambda: [line for line in printed(site, "pgrep") if str(site.home.path) in line]  # noqa: E731
    assert shown() == []
    run = Running(site, "yn")
    assert sum("orvpatch -h" in line for line in shown()) == 1
    run.kill()
    left = shown()
    assert left and all("/cwd -> " in line for line in left)
    site.home.write("go-yn")
    limit = time.monotonic() + 30
    while shown():
        assert time.monotonic() < limit
        time.sleep(0.02)


def test_the_child_that_a_run_waits_for_is_shown(site):
    run = Running(site, "yn")
    ps = re.search(r"`(ps -o .*?)`", PAGE)[1].replace("PID", str(run.process.pid))
    lines = subprocess.run(ps.split(), stdout=subprocess.PIPE, text=True, check=True).stdout.splitlines()
    assert len(lines) == 2 and lines[1].endswith("a.sh")
    assert run.finish() == 0


def test_the_child_that_fills_a_pipe_is_shown_in_pipe_write(site):
    site.env["PATH"] = stubs(site.patch_dir.parent / "stubs", tar="exec tail -c 40000000 /dev/zero")
    words = [*site.program.argv, "-h", site.home, "-i", Patch("yn").write(site.patch_dir)]
    run = subprocess.Popen(
        words,
        env={**os.environ, **site.env},
        start_new_session=True,
        stdin=subprocess.DEVNULL,
        stdout=subprocess.DEVNULL,
        stderr=subprocess.DEVNULL,
    )
    try:
        limit, lines = time.monotonic() + 30, []
        while not any("pipe_write" in line for line in lines):
            assert time.monotonic() < limit, lines
            time.sleep(0.05)
            ps = re.search(r"`(ps -o .*?)`", PAGE)[1].replace("PID", str(run.pid))
            lines = subprocess.run(ps.split(), stdout=subprocess.PIPE, text=True, check=False).stdout.splitlines()[1:]
    finally:
        os.killpg(run.pid, signal.SIGKILL)
        run.wait()


def test_files_that_were_not_moved_are_found_in_the_log(site):
    assert site.install(Patch("yn").file("bin/tool")) == site.done()
    assert printed(site, "sed") == []
    patch = Patch("yn").file("bin/tool").symlink("updated_files/bin/gone", "/nonexistent/file")
    assert site.install(patch) == site.done()
    found = printed(site, "sed")
    assert len(found) == 1 and found[0].endswith(" to ./bin/gone")


def test_an_empty_version_file_is_put_back_from_the_log(site):
    site.home.component("yn", "06100000", prereqs=["oxlpp266", "ullpp266"])
    site.report(Patch("yn").directory())
    site.home.write("registry/ynlpp266.ver")
    assert site.install(Patch("yn").file("bin/tool")).status == 9
    messages = [line.message for line in site.home.log().runs[0].lines]
    start = messages.index(f"ORVComponentRegistry::buildComponent({site.home.path}/registry/ynlpp266.ver) entry")
    text = "\n".join(messages[start : messages.index("ORVComponentRegistry::buildComponent exit", start)])
    level = re.search(r"^Version string provided: (\w+)", text, re.M)[1]
    prereqs = re.findall(r"^Added preReqALL value = (\w+)", text, re.M)
    assert (level, prereqs) == ("06100000", ["oxlpp266", "ullpp266"])
    site.home.component("yn", level, prereqs=prereqs)
    assert site.install(Patch("yn").file("bin/tool")) == site.done()
