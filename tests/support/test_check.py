"""Which tests scripts/check chooses; nothing is really built or run here."""

import os
import re
import shutil
import subprocess
from pathlib import Path

import pytest

from support import stubs

_CHECK = Path(__file__).resolve().parents[2] / "scripts/check"
HEAVY = {"sanitize", "target", "fuzz", "packages"}
LABELS = {"unit", "cases", "fleet", "house", "clang", "bigendian", *HEAVY}


@pytest.fixture
def chosen(scratch):
    """chosen(word...) is the set of labels that a call has run."""
    (scratch / "scripts").mkdir()
    shutil.copy(_CHECK, scratch / "scripts/check")
    for name in ("setup", "totals"):
        (scratch / "scripts" / name).write_text("#!/bin/sh\n")
        (scratch / "scripts" / name).chmod(0o755)
    (scratch / "build/dev").mkdir(parents=True)
    calls = scratch / "calls"
    path = stubs(scratch / "bin", cmake=":", ctest=f'printf "%s\\n" "$@" >{calls}; echo done')

    def call(*words, **variables):
        kept = {name: value for name, value in os.environ.items() if not name.startswith("ORVPATCH_")}
        environment = {**kept, "PATH": path, **variables}
        done = subprocess.run(
            [scratch / "scripts/check", *words], env=environment, capture_output=True, text=True, check=False
        )
        assert done.returncode == 0, done.stdout + done.stderr
        given = calls.read_text().splitlines()
        assert len({"-L", "-LE"} & set(given)) == 1
        option = "-L" if "-L" in given else "-LE"
        pattern = given[given.index(option) + 1]
        return {label for label in LABELS if bool(re.search(pattern, label)) == (option == "-L")}

    return call


def test_without_options_the_heavy_labels_are_left_out(chosen):
    assert chosen() == LABELS - HEAVY - {"bigendian"}


def test_all_labels_run_where_that_is_wanted(chosen):
    assert chosen("--all") == LABELS - {"clang", "bigendian"}


def test_only_some_labels_run_where_that_is_wanted(chosen):
    assert chosen("--only", "unit,clang") == {"unit", "clang"}
    assert chosen("--target", "ppc64") == {"bigendian"}


@pytest.mark.parametrize("words", [[], ["--all"]])
@pytest.mark.parametrize("variables", [{}, {"ORVPATCH_NO_SANITIZE": "1"}])
def test_one_build_by_clang_is_in_every_run(chosen, words, variables):
    assert len(chosen(*words, **variables) & {"clang", "sanitize"}) == 1


def test_the_sanitized_runs_can_be_left_out(chosen):
    assert chosen("--all", ORVPATCH_NO_SANITIZE="1") == LABELS - {"sanitize", "bigendian"}
