"""The program built for the target does what the native one does, command by command.

ORVPATCH_NATIVE and ORVPATCH_TARGET name the two programs (default: those of the presets release and ppc64le),
ORVPATCH_RUNNER what the latter is run with.
"""

import os
import re
import shlex
from pathlib import Path
from typing import NamedTuple

import pytest

from support import ProductHome, Program, remove_tree
from whole_commands import COMMANDS, ENVIRONMENTS

BUILDS = Path(__file__).resolve().parents[2] / "build"
STATUSES = {*range(8), *range(9, 17), *range(18, 29), 30, 31, 32, 34, 35, 36, 37} - {20}


class Outcome(NamedTuple):
    """All that a command leaves behind, without what differs from one run to the next."""

    status: int
    out: str
    err: str
    log: str
    history: str
    run_info: str
    running: list
    journal: list
    tree: dict


def program(variable, preset, runner):
    found = Program(os.environ.get(variable, BUILDS / preset / "orvpatch"), runner)
    if not found.binary.exists():
        pytest.fail(f"{found.binary} is missing: cmake --preset {preset} && cmake --build --preset {preset}")
    return found


def native():
    return program("ORVPATCH_NATIVE", "release", [])


def target():
    emulator = os.environ.get("ORVPATCH_RUNNER", "qemu-ppc64le -L /usr/powerpc64le-linux-gnu")
    return program("ORVPATCH_TARGET", "ppc64le", shlex.split(emulator))


class Mask:
    """Replaces process ids, times, addresses and the names of the two programs."""

    def __init__(self, program, home):
        self.replacements = [
            (re.escape(str(program.binary)), "PROGRAM"),
            (r"\b\d\d:\d\d:\d\d\b", "TIME"),
            (r"\b\d\d/\d\d/\d{4}\b", "DATE"),
            (r"(?m)^   Process ID:  \d+$", "   Process ID:  PID"),
            (r"(?m)^   Build Date:  .*$", "   Build Date:  DATE"),
            (r"\(0x[0-9a-f]+\)", "(ADDRESS)"),
        ]
        self.hide_processes_of(home)

    def hide_processes_of(self, home):
        """Process ids become the names of the instances."""
        for row in home.rows():
            self.replacements.append((rf"\b{row.pid}\b", f"PID-{row.code}-{row.name}"))

    def __call__(self, text):
        text = text.decode("utf-8", "backslashreplace")
        for pattern, replacement in self.replacements:
            text = re.sub(pattern, replacement, text)
        return text


def outcome(program, arrange, folder, environment):
    """Arranges and runs one command in `folder`, which is empty before and after."""
    with ProductHome(folder / "home") as home:
        patches = folder / "patches"
        patches.mkdir()
        words = arrange(home, patches)
        mask = Mask(program, home)
        done = program.run(*words, env=environment(folder), cwd=folder)
        mask.hide_processes_of(home)
        tree = home.tree()

        def take(path):
            return mask(home.read(path)) if tree.pop(path, None) else None

        found = Outcome(
            done.status,
            mask(done.out),
            mask(done.err),
            take("patchlogs/orvpatch.log"),
            take("patchlogs/patches.hist"),
            take("config/.ConfigData/RunInfo"),
            home.instances(),
            home.journal(),
            tree,
        )
    for entry in folder.iterdir():
        remove_tree(entry)
    return found


def compare(name, folder, environment):
    status, arrange = COMMANDS[name]
    expected = outcome(native(), arrange, folder, environment)
    assert expected.status == status
    found = outcome(target(), arrange, folder, environment)
    for field in Outcome._fields:
        assert getattr(found, field) == getattr(expected, field), field


@pytest.mark.parametrize("name", COMMANDS)
def test_target_does_what_native_does(name, scratch):
    compare(name, scratch, lambda folder: {})


@pytest.mark.parametrize("name", ["install", "report_of_two_patches"])
@pytest.mark.parametrize("environment", ENVIRONMENTS)
def test_in_another_environment(name, environment, scratch):
    compare(name, scratch, ENVIRONMENTS[environment])


def test_commands_end_in_every_way():
    """But in 20, which needs two users; the cases of the target's own run have it."""
    assert {status for status, _ in COMMANDS.values()} == STATUSES


def test_programs_are_two(tmp_path):
    assert native().binary != target().binary
    machines = [program.binary.read_bytes()[18:20] for program in (native(), target())]
    assert machines == [b"\x3e\x00", b"\x15\x00"]  # x86-64, 64-bit PowerPC, both little endian
