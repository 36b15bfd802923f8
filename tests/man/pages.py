"""Reads the examples out of the manual pages.

An example is a literal block under a comment that says what it is: `.\\" session` for commands, with or without
what they print, or `.\\" file PATH` for the content of a file.
"""

import re
from pathlib import Path
from typing import NamedTuple

FOLDER = Path(__file__).resolve().parents[2] / "man"
_BLOCK = re.compile(
    r'(?:^\.\\" (session|file (?P<path>\S+))\n)?^\.Bd -literal[^\n]*\n(?P<text>.*?)^\.Ed\n', re.M | re.S
)
_ESCAPES = {r"\e": "\\", r"\&": ""}


class Step(NamedTuple):
    """One command of a session and the lines that it prints."""

    command: str
    output: str


class Page(NamedTuple):
    sessions: list  # of lists of steps
    files: dict  # path as in the page -> content
    unmarked: list  # literal blocks that no test knows


def source(name):
    return (FOLDER / name).read_text(encoding="ascii")


def read_page(name):
    page = Page([], {}, [])
    for block in _BLOCK.finditer(source(name)):
        text = re.sub(r"\\[e&]", lambda found: _ESCAPES[found[0]], block["text"])
        if block[1] is None:
            page.unmarked.append(text)
        elif block["path"]:
            page.files[block["path"]] = text
        else:
            page.sessions.append(_steps(text))
    return page


def _steps(text):
    """A command follows a prompt, "$ " or "# ", and goes on in the next line after a backslash."""
    found = re.findall(r"^[$#] ((?:.*\\\n)*.*)\n((?:(?![$#] ).*\n)*)", text, re.M)
    return [Step(command, output) for command, output in found]
