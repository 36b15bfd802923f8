"""SIGKILL before the calls that change the home or the record: the home can always be taken back.

A rotating sample in every run; ORVPATCH_FAULTS=all kills before each call. ORVPATCH_SEED repeats a sample.
"""

import os
import random
import re
from collections import Counter
from functools import partial

import pytest

from callfaults import SEED, outlived
from oracle import assert_taken_back, listing
from support import Patch, ProductHome

CHANGING = (
    "link",
    "linkat",
    "rename",
    "unlink",
    "unlinkat",
    "mkdir",
    "rmdir",
    "openat",
    "write",
    "fchmod",
    "fchown",
    "fchmodat",
    "chmod",
    "chown",
    "ftruncate",
    "fsync",
    "syncfs",
    "utimensat",
)
SAMPLE = None if os.environ.get("ORVPATCH_FAULTS") == "all" else 6
_CALL = re.compile(r"^(\w+)\(")
pytestmark = pytest.mark.usefixtures("seed")


class Bench:
    """Fresh homes of one kind, and what the program says on them."""

    def __init__(self, ctl, patch):
        self.ctl, self.patch = ctl, patch

    def home(self):
        home = ProductHome()
        home.component("yn")
        (home.path / "tmp").chmod(0o700)
        home.write("lib/replaced", "old\n", 0o640)
        home.write("lib/second", "old\n", 0o755)
        home.start("yn")
        return home

    def run(self, *words, trace=(), env=None):
        strace = ["strace", "-y", "-o", os.fspath(self.patch.parent / "trace"), *trace] if trace else []
        return self.ctl.run(*words, wrapper=strace, env=env, timeout=300)

    def calls(self, home, *words):
        """(name, ordinal) of each call of the program itself that may change the home, from an undisturbed run."""
        assert self.run(*words, trace=["-e", f"trace={','.join(CHANGING)}"]).status == 0
        counted, calls = Counter(), []
        for line in (self.patch.parent / "trace").read_text(errors="replace").splitlines():
            match = _CALL.match(line)
            if not match:
                continue
            counted[match[1]] += 1
            if str(home.path) in line and ("O_RDONLY" not in line or match[1] != "openat"):
                calls.append((match[1], counted[match[1]]))
        assert calls
        return calls

    def kill(self, call, *words):
        name, ordinal = call
        self.run(*words, trace=["-e", f"trace={name}", "-e", f"inject={name}:signal=SIGKILL:when={ordinal}"])

    def take_back(self, home, expected):
        """Waits for an installer that outlived its caller, then undoes what there is."""
        result = outlived(lambda: self.ctl.run("undo", home))
        assert_taken_back(result, listing(home), expected)


@pytest.fixture
def bench(ctl, patch_dir):
    patch = Patch("yn").file("lib/replaced", "new\n").file("lib/second", "new\n").file("fresh/deep/file", "new\n")
    patch.script("10_go.sh", when="post")
    return Bench(ctl, patch.write(patch_dir))


def chosen(calls):
    picked = random.Random(SEED)
    return calls if SAMPLE is None else sorted(picked.sample(calls, min(SAMPLE, len(calls))))


def test_apply_is_killed(bench):
    with bench.home() as home:
        calls = bench.calls(home, "apply", home, bench.patch, "--yes")
    for call in chosen(calls):
        with bench.home() as home:
            before = listing(home)
            bench.kill(call, "apply", home, bench.patch, "--yes")
            bench.take_back(home, before)


def test_the_installer_is_killed(bench, program, scratch):
    """The installation ends in its middle, and its caller lives on."""
    installer = scratch / "killed"
    calls = [
        (name, ordinal)
        for name, most in (
            ("link", 3),
            ("unlink", 6),
            ("fchmod", 6),
            ("write", 120),
            ("mkdir", 4),
            ("rmdir", 3),
            ("ftruncate", 1),
        )
        for ordinal in range(1, most + 1)
    ]
    for name, ordinal in chosen(calls):
        with bench.home() as home:
            before = listing(home)
            installer.write_text(
                f'#!/bin/sh\ncase $3 in -t) exec "{program.binary}" "$@";; esac\n'
                f"exec strace -o /dev/null -e trace={name} "
                f'-e inject={name}:signal=SIGKILL:when={ordinal} "{program.binary}" "$@"\n'
            )
            installer.chmod(0o755)
            result = bench.run("apply", home, bench.patch, "--yes", "--installer", installer)
            assert result.status in (0, 3, 4), (name, ordinal, result)
            bench.take_back(home, before)


def test_undo_is_killed_and_repeated(bench):
    with bench.home() as home:
        assert bench.run("apply", home, bench.patch, "--yes").status == 0
        calls = bench.calls(home, "undo", home)
    for call in chosen(calls):
        with bench.home() as home:
            before = listing(home)
            assert bench.run("apply", home, bench.patch, "--yes").status == 0
            bench.kill(call, "undo", home)
            bench.take_back(home, before)


def test_apply_is_killed_and_given_again(bench):
    """The same command finishes the work, or says what must be done first."""
    with bench.home() as home:
        calls = bench.calls(home, "apply", home, bench.patch, "--yes")
        wanted = {path: entry["content"] for path, entry in listing(home).items()}
    for call in chosen(calls)[:3]:
        with bench.home() as home:
            bench.kill(call, "apply", home, bench.patch, "--yes")
            result = outlived(partial(bench.run, "apply", home, bench.patch, "--yes"))
            assert result.status == 0, (call, result)
            assert {path: entry["content"] for path, entry in listing(home).items()} == wanted, call
