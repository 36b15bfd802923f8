"""The corpora of the fuzzers, replayed by ordinary programs: each input whole, and cut off after each byte."""

import subprocess
from pathlib import Path

import pytest

CORPUS = Path(__file__).parent / "corpus"
FUZZERS = sorted(source.name.removesuffix("_fuzz.cpp") for source in Path(__file__).parent.glob("*_fuzz.cpp"))

OF_ORVPATCHCTL = {"archive", "lint", "runlog"}  # which a build may leave out


def test_every_fuzzer_has_a_corpus():
    assert sorted(folder.name for folder in CORPUS.iterdir()) == FUZZERS


@pytest.mark.parametrize("name", FUZZERS)
def test_all_rules_hold(program, name):
    if name in OF_ORVPATCHCTL and not (program.binary.parent / "orvpatchctl").exists():
        pytest.skip("built without orvpatchctl")
    replay = program.binary.parent / f"tests/fuzz/replay_{name}"
    done = subprocess.run([*program.runner, replay, CORPUS / name], timeout=300, capture_output=True, check=False)
    inputs = sum(path.stat().st_size + 1 for path in (CORPUS / name).iterdir())
    assert (done.returncode, done.stderr.decode(errors="replace")) == (0, f"{inputs} inputs\n")
