"""The rules of the house that a script can check: layers, self-contained headers, sizes, deliberate oddities."""

import re
import subprocess
import sys
from pathlib import Path

import pytest

ROOT = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(ROOT / "tests/mutate"))

import mutants  # noqa: E402

SOURCES = sorted([*ROOT.glob("src/**/*.cpp"), *ROOT.glob("src/**/*.h")])
HEADERS = [path for path in SOURCES if path.suffix == ".h"]

# Units on one level do not include one another, unless it is said here. The look-ups of home, host and user
# depend on nothing; the log takes them from utilities.
LEVELS = [
    {"nls", "filedescriptor", "ownedlist", "signalguard"},
    {"logger"},
    {"failure"},
    {"version", "process", "utilities", "heldfile"},
    {"newdirectories", "symboliclinks"},
    {"file", "inifile"},
    {"orvcomponent"},
    {"target"},
    {"orvcomponentregistry", "patchfilename", "patchdescriptor"},
    {"patchprocessor"},
    {"dcfpackageprocessor"},
    {"main"},
]
ALLOWED = {("logger", "utilities"), ("utilities", "process")}


def unit_of(path):
    return "patchprocessor" if path.parent.name == "patchprocessor" else path.stem


def level_of(unit):
    return next(number for number, units in enumerate(LEVELS) if unit in units)


def relative(path):
    return str(path.relative_to(ROOT))


@pytest.mark.parametrize("path", SOURCES, ids=relative)
def test_includes_point_downwards(path):
    unit = unit_of(path)
    for header in re.findall(r'#include "(.*)\.h"', path.read_text()):
        included = unit_of(Path(header))
        if included == unit or (unit, included) in ALLOWED:
            continue
        assert level_of(included) < level_of(unit), f"{unit} includes {header}, which is not below it"


@pytest.mark.parametrize("header", HEADERS, ids=relative)
def test_a_header_compiles_alone(header):
    compiled = subprocess.run(
        [
            "g++",
            "-std=c++17",
            "-Wall",
            "-Wextra",
            "-Wpedantic",
            "-Wconversion",
            "-Wshadow",
            "-Werror",
            "-fsyntax-only",
            "-I",
            ROOT / "src",
            "-include",
            header,
            "-x",
            "c++",
            "/dev/null",
        ],
        capture_output=True,
        text=True,
        check=False,
    )
    assert compiled.returncode == 0, compiled.stderr


@pytest.mark.parametrize("path", SOURCES, ids=relative)
def test_a_file_stays_readable(path):
    limit = 150 if path.suffix == ".h" else 450
    assert len(path.read_text().splitlines()) <= limit


@pytest.mark.parametrize("path", [path for path in SOURCES if path.suffix == ".cpp"], ids=relative)
def test_sources_log_through_the_macros_only(path):
    if unit_of(path) in ("logger", "failure"):
        return
    text = path.read_text()
    calls = re.findall(r"\b(?:setLine|logError|logInfo|logTrace|logMsg)\(", text)
    assert not calls, f"{relative(path)} logs past the macros: {calls}"
    if re.search(r"\b(?:LOG_(?:ERROR|INFO|TRACE)\w*|FAILURE)\(", text):
        assert len(re.findall(r"^#define LOG_COMPONENT ", text, re.M)) == 1


def slugs_in(paths):
    return {slug for path in paths for slug in re.findall(r"KEEP\(([a-z0-9-]+)\)", path.read_text(errors="replace"))}


def test_every_oddity_is_documented_and_held_by_a_test():
    in_code = slugs_in(SOURCES)
    in_document = slugs_in([ROOT / "docs/decisions.md"])
    tests = [
        path
        for suffix in ("cpp", "py")
        for path in ROOT.glob(f"tests/**/*.{suffix}")
        if path != Path(__file__).resolve()
    ]
    in_tests = slugs_in(tests)
    assert in_code, "no oddity found: the pattern is broken"
    assert in_document == in_code, "docs/decisions.md and the sources name different oddities"
    assert in_tests == in_code, "the tests and the sources name different oddities"


def test_a_mutant_that_may_live_can_still_be_made():
    possible = {mutant.name for mutant in mutants.all_mutants(ROOT)}
    gone = mutants.listed_survivors() - possible
    assert not gone, "listed in tests/mutate/survivors.txt, but its line is no longer in the sources"


def test_scripts_can_be_run():
    for script in ROOT.glob("scripts/*"):
        if script.is_file() and script.suffix == "":
            assert script.stat().st_mode & 0o111, f"{relative(script)} is not executable"
