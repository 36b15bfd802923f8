"""The completions and the manual page, held against the command line's own description."""

import json
import re
import shlex
import subprocess
from pathlib import Path

import pytest

from man.pages import read_page, source

CHECKOUT = Path(__file__).resolve().parents[2]
COMPLETIONS = CHECKOUT / "completions"
FILES = {"bash": "orvpatchctl.bash", "zsh": "_orvpatchctl", "fish": "orvpatchctl.fish"}


@pytest.fixture
def description(ctl):
    """Command -> its description; the program itself is ""."""
    return {command["name"]: command for command in json.loads(ctl.run("completion", "json").out)}


@pytest.mark.parametrize("shell", FILES)
def test_the_files_are_those_that_the_program_makes(ctl, shell):
    made = ctl.run("completion", shell)
    assert made.status == 0
    remedy = "run: cmake --build --preset dev --target completions"
    assert (COMPLETIONS / FILES[shell]).read_bytes() == made.out, remedy


def test_the_help_lists_the_commands_that_are_described(ctl, description):
    text = ctl.run("--help").out.decode()
    listed = re.findall(r"^  (\w+) ", text.split("Subcommands:\n", 1)[1], re.M)
    assert listed == [name for name in description if name]
    assert "completion" not in listed


def test_every_option_is_in_the_help(ctl, description):
    for name, command in description.items():
        text = ctl.run(*filter(None, [name]), "--help").out.decode()
        listed = set(re.findall(r"^  (?:-\w,)?(--[\w-]+)", text, re.M))
        assert {option["name"] for option in command["options"]} == listed


# --- the manual page -----------------------------------------------------------------------------------


def manual_sections():
    """Command -> the text of its section."""
    commands = source("orvpatchctl.8").split(".Sh COMMANDS\n", 1)[1].split("\n.Sh ", 1)[0]
    return {section.split()[0]: section for section in re.split(r"^\.Ss ", commands, flags=re.M)[1:]}


def options_of(text):
    return set(re.findall(r"^\.It Fl -([\w-]+)", text, re.M))


def test_the_manual_has_a_section_for_each_command(description):
    assert sorted(manual_sections()) == sorted(name for name in description if name)


def test_the_manual_has_the_options_of_each_command(description):
    common = {"json", "color", "help"}
    for name, section in manual_sections().items():
        options = {option["name"].removeprefix("--") for option in description[name]["options"]}
        assert options_of(section) == options - common, name
        assert common <= options, name
    assert common <= options_of(source("orvpatchctl.8").split(".Sh COMMANDS", 1)[0])


def test_the_manual_names_the_arguments(description):
    for name, section in manual_sections().items():
        heading = section.split("\n", 1)[0]
        for argument in description[name]["arguments"]:
            assert argument["value"].strip("[]") in heading.replace("Op ", ""), (name, argument)


def test_the_examples_of_the_manual(ctl, home):
    home.write("patchlogs/orvpatch.log", "TRACE 14:00:00 (main,1): main = 0\n")
    steps = [step for session in read_page("orvpatchctl.8").sessions for step in session]
    assert steps
    for step in steps:
        program, *words = shlex.split(step.command.replace("/opt/orv", str(home.path)))
        assert program == "orvpatchctl"
        assert ctl.run(*words).status == 0, step.command


# --- in the shells -------------------------------------------------------------------------------------


@pytest.fixture(scope="module")
def folder(tmp_path_factory):
    made = tmp_path_factory.mktemp("completion")
    (made / "home").mkdir()
    (made / "patch.tar").touch()
    return made


def ask(words, folder):
    done = subprocess.run(
        words, cwd=folder, stdin=subprocess.DEVNULL, capture_output=True, text=True, timeout=30, check=False
    )
    assert done.stderr == ""
    return done.stdout.splitlines()


def bash(line, folder):
    words = shlex.split(line) + ([""] if line.endswith(" ") else [])
    script = (
        'source "$1"; shift; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); '
        '_orvpatchctl orvpatchctl "${COMP_WORDS[COMP_CWORD]}" "${COMP_WORDS[COMP_CWORD-1]}"; '
        '((${#COMPREPLY[@]} == 0)) || printf "%s\\n" "${COMPREPLY[@]}"'
    )
    return ask(["bash", "--norc", "-c", script, "bash", COMPLETIONS / FILES["bash"], *words], folder)


def zsh(line, folder):
    return ask(["zsh", "-f", CHECKOUT / "tests/completions/complete.zsh", COMPLETIONS, line], folder)


def fish(line, folder):
    script = f"source {shlex.quote(str(COMPLETIONS / FILES['fish']))}; complete -C {shlex.quote(line)}"
    return [offer.split("\t")[0] for offer in ask(["fish", "--no-config", "-c", script], folder)]


SHELLS = pytest.mark.parametrize("shell", (bash, zsh, fish), ids=lambda shell: shell.__name__)


def names(offers):
    return {offer.rstrip("/ ").removesuffix("=") for offer in offers} - {""}


@SHELLS
def test_commands_are_offered(shell, folder, description):
    assert names(shell("orvpatchctl ", folder)) == {name for name in description if name}
    assert names(shell("orvpatchctl hi", folder)) == {"history"}


@SHELLS
@pytest.mark.parametrize("command", ("show", "status", "history", "log", "verify"))
def test_options_of_a_command_are_offered(shell, command, folder, description):
    assert names(shell(f"orvpatchctl {command} --", folder)) == {
        option["name"] for option in description[command]["options"]
    }


@SHELLS
@pytest.mark.parametrize(
    "line, expected",
    (
        ("orvpatchctl status ", {"home"}),
        ("orvpatchctl status --json ho", {"home"}),
        ("orvpatchctl log --color ", {"auto", "always", "never"}),
        ("orvpatchctl log --color al", {"always"}),
        ("orvpatchctl show pa", {"patch.tar"}),
        ("orvpatchctl verify home pa", {"patch.tar"}),
        ("orvpatchctl history --since ", set()),
    ),
)
def test_values_are_offered_by_their_kind(shell, line, expected, folder):
    assert names(shell(line, folder)) == expected
