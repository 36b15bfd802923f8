"""The completions, asked in the shells themselves."""

import os
import shlex
import subprocess
from pathlib import Path

import pytest

CHECKOUT = Path(__file__).resolve().parents[2]
COMPLETIONS = CHECKOUT / "completions"

OPTIONS = {"-h", "-i", "-t", "-vi"}
ACTIONS = {"-i", "-t", "-vi"}
FOLDERS = {"ho me", "home", "patches"}
PATCHES = {"kqa_lpp266_vems_fp0001.tar", "kxe_lpp266_vema_fp0001.tar"}
OTHER_FILES = {"hofile", "notes.txt", "other.tar", "kxe_lpp266_vemx_fp0001.tar"}

# The line before the cursor, and the names that are offered for it.
CASES = {
    "options": ("orvpatch -", OPTIONS),
    "home: directories": ("orvpatch -h ", FOLDERS),
    "home: begun": ("orvpatch -h ho", {"ho me", "home"}),
    "install: patches and directories": ("orvpatch -i ", PATCHES | FOLDERS),
    "report: patches and directories": ("orvpatch -h home -t ", PATCHES | FOLDERS),
    "report: begun": ("orvpatch -t kq", {"kqa_lpp266_vems_fp0001.tar"}),
    "report: in a directory": ("orvpatch -t patches/", {"kzt_unix_vecm_fp01.tar"}),
    "validation: descriptors": ("orvpatch -vi ", {"patch.ini"} | FOLDERS),
    "no second home": ("orvpatch -h home -", ACTIONS),
    "no second action after an install": ("orvpatch -i x -", {"-h"}),
    "no second action after a report": ("orvpatch -t x -", {"-h"}),
    "no second action after a validation": ("orvpatch -vi x -", {"-h"}),
    "report: below the own home": ("orvpatch -t ~/", PATCHES | FOLDERS),
    "report: begun below the own home": ("orvpatch -t ~/kq", {"kqa_lpp266_vems_fp0001.tar"}),
    "report: deep below the own home": ("orvpatch -t ~/patches/", {"kzt_unix_vecm_fp01.tar"}),
    "home: below the own home": ("orvpatch -h ~/ho", {"ho me", "home"}),
    "validation: below the own home": ("orvpatch -vi ~/", {"patch.ini"} | FOLDERS),
    "nothing after both": ("orvpatch -h home -i x -", set()),
}


@pytest.fixture(scope="module")
def folder(tmp_path_factory):
    made = tmp_path_factory.mktemp("completion")
    for name in FOLDERS:
        (made / name).mkdir()
    for name in {"patch.ini", "patches/kzt_unix_vecm_fp01.tar"} | PATCHES | OTHER_FILES:
        (made / name).touch()
    return made


def ask(words, folder):
    # fish makes folders of its own, which would be offered: not in the home.
    settings = {name: str(folder.parent / "settings") for name in ("XDG_CONFIG_HOME", "XDG_DATA_HOME")}
    done = subprocess.run(
        words,
        cwd=folder,
        env={**os.environ, "HOME": str(folder), **settings},
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        timeout=150,
    )
    assert done.stderr == ""
    return done.stdout.splitlines()


def bash(line, folder):
    words = shlex.split(line) + ([""] if line.endswith(" ") else [])
    script = (
        'source "$1"; shift; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); '
        "$(complete -p orvpatch | sed 's/.*-F \\([^ ]*\\).*/\\1/') "
        'orvpatch "${COMP_WORDS[COMP_CWORD]}" "${COMP_WORDS[COMP_CWORD-1]}"; '
        '((${#COMPREPLY[@]} == 0)) || printf "%s\\n" "${COMPREPLY[@]}"'
    )
    return ask(["bash", "--norc", "-c", script, "bash", COMPLETIONS / "orvpatch.bash", *words], folder)


def zsh(line, folder):
    offered = ask(["zsh", "-f", CHECKOUT / "tests/completions/complete.zsh", COMPLETIONS, line], folder)
    return [name.replace("\\ ", " ") for name in offered]


def fish(line, folder):
    script = f"source {shlex.quote(str(COMPLETIONS / 'orvpatch.fish'))}; complete -C {shlex.quote(line)}"
    return [offer.split("\t")[0] for offer in ask(["fish", "--no-config", "-c", script], folder)]


@pytest.mark.parametrize("case", CASES)
@pytest.mark.parametrize("shell", [bash, zsh, fish], ids=lambda shell: shell.__name__)
def test_offers_what_fits(shell, case, folder):
    line, names = CASES[case]
    offered = shell(line, folder)
    assert sorted({offer.rstrip("/").rpartition("/")[2] for offer in offered}) == sorted(names)


@pytest.mark.parametrize("shell", [bash, fish], ids=lambda shell: shell.__name__)
def test_the_own_home_stays_as_it_was_typed(shell, folder):
    assert shell("orvpatch -t ~/kq", folder) == ["~/kqa_lpp266_vems_fp0001.tar"]


@pytest.mark.parametrize("home", ["$HOME", "${HOME}"])
def test_bash_replaces_the_variable_of_the_home(home, folder):
    assert bash(f"orvpatch -t {home}/kq", folder) == [f"{folder}/kqa_lpp266_vems_fp0001.tar"]
    assert set(bash(f"orvpatch -h {home}/ho", folder)) == {f"{folder}/home", f"{folder}/ho me"}


@pytest.mark.parametrize("shell", [bash, fish], ids=lambda shell: shell.__name__)
def test_value_that_looks_like_an_option_is_a_value(shell, folder):
    assert set(shell("orvpatch -h -i -", folder)) == ACTIONS


def test_bash_and_zsh_offer_options_before_a_dash_is_typed(folder):
    assert set(bash("orvpatch ", folder)) == OPTIONS
    assert set(zsh("orvpatch ", folder)) == OPTIONS
