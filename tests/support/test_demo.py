"""The demo: its announcements, the shell at its end, and that nothing is left of it."""

import os
import re
import subprocess
from pathlib import Path

import pytest

DEMO = Path(__file__).resolve().parents[2] / "scripts/demo"


@pytest.fixture
def demo(program, scratch):
    """A function that runs the demo with the program under test, in a folder of its own for temporary files."""
    if program.runner:
        pytest.skip("the demo runs its program by name")

    def run(*options, commands=""):
        environment = {**os.environ, "TMPDIR": str(scratch), "SHELL": "/bin/sh"}
        return subprocess.run(
            [DEMO, *options, program.binary],
            input=commands,
            env=environment,
            text=True,
            capture_output=True,
            timeout=300,
            check=False,
        )

    return run


def test_the_demo_ends_as_announced_and_leaves_nothing(demo, scratch):
    done = demo()
    assert (done.returncode, done.stderr) == (0, "")
    assert done.stdout.endswith("\n== Everything went as announced\n")
    statuses = re.findall(r"^    \(exit status (\d+)\)$", done.stdout, re.M)
    assert {"0", "11", "21", "35"} <= set(statuses)
    assert done.stdout.count("06100000 -> 06100002\n") == 6
    assert list(scratch.iterdir()) == []


def test_the_part_of_orvpatchctl_ends_as_announced_and_leaves_nothing(demo, scratch):
    done = demo("--ctl")
    assert (done.returncode, done.stderr) == (0, "")
    assert done.stdout.endswith("\n== Everything went as announced\n")
    statuses = re.findall(r"^    \(exit status (\d+)\)$", done.stdout, re.M)
    assert {"0", "1", "3"} <= set(statuses)
    assert list(scratch.iterdir()) == []


def test_the_shell_finds_program_home_and_patches(demo, scratch):
    commands = "orvpatch -h $home -t fixpack2/kyn_lpp266_vema_fp0002.tar; ls single; touch $home/played\n"
    done = demo("--shell", commands=commands)
    assert (done.returncode, done.stderr) == (0, "")
    played = done.stdout.partition("== A shell in ")[2]
    assert "Processing patch file: fixpack2/kyn_lpp266_vema_fp0002.tar" in played
    assert played.endswith("kum_lpp266_vema_fp0003.tar\nkyn_lpp266_vema_fp0001.tar\n")
    assert list(scratch.iterdir()) == []


def test_a_step_that_does_not_go_as_announced_ends_the_demo(scratch):
    other = scratch / "bin"
    other.mkdir()
    (other / "orvpatch").write_text("#!/bin/sh\nexit 0\n")
    (other / "orvpatch").chmod(0o755)
    done = subprocess.run(
        [DEMO, other / "orvpatch"],
        env={**os.environ, "TMPDIR": str(scratch)},
        text=True,
        capture_output=True,
        timeout=300,
        check=False,
    )
    assert done.returncode == 1
    assert "NOT AS ANNOUNCED" in done.stderr
    assert [path.name for path in scratch.iterdir()] == ["bin"]
