"""Reads what strace wrote about one run of the program: its calls, and the log lines among them."""

import codecs
import os
import re
from typing import NamedTuple

from .calls import kind_of

# The program's first own call; what precedes it is the dynamic loader's.
_FIRST_OWN_CALL = re.compile(r'open\w*\(.*"/dev/null", O_RDWR')
_CALL = re.compile(r"^(\w+)\((.*)\)\s+= (\?|-?\w+)(.*)$")
# A string, and the directory that it is relative to where the call names one.
_QUOTED = re.compile(r'(?:(?:\d+|AT_FDCWD)<([^>]*)>, )?"((?:[^"\\]|\\.)*)"')
_DESCRIPTOR = re.compile(r"^(\d+)<([^>]*)>")
_ERROR = re.compile(r"^ (E[A-Z0-9]+) ")
_LOG_LINE = re.compile(r"^(?:ERROR|INFO |TRACE) \d\d:\d\d:\d\d \([^,()]*,\d+\): (.*)", re.MULTILINE)
_LOG_FILE = "/patchlogs/orvpatch.log"


class Call(NamedTuple):
    """One system call of the program. Its paths are absolute; an open descriptor's path is the only one of
    a call that takes a descriptor."""

    kind: str  # what the call is for, see calls.py
    name: str
    ordinal: int  # among the calls of this name, the loader's included: what strace counts by
    paths: tuple
    given: tuple  # the paths as the program gave them
    flags: str  # all arguments, to look for a flag
    descriptor: int  # None for a call that takes no descriptor
    text: str  # of a write: what is written
    result: int  # None when the call did not return
    error: str  # name of the error, empty on success
    injected: bool
    messages: tuple  # log messages that this call writes
    cwd: str  # the working directory at the call

    @property
    def path(self):
        return self.paths[0] if self.paths else ""

    @property
    def is_log(self):
        """Whether this call serves the log alone. Without a log file, lines go to standard output."""
        if self.path.endswith(_LOG_FILE):
            return True
        return self.kind == "write" and self.descriptor == 1 and bool(self.messages)


def read_trace(path, cwd):
    """The calls that the program itself made, in order. `cwd` is its working directory at the start."""
    with open(path, encoding="utf-8", errors="surrogateescape") as trace:
        lines = trace.read().splitlines()
    counts, calls, own = {}, [], False
    for line in lines:
        match = _CALL.match(line)
        if not match:
            continue
        own = own or bool(_FIRST_OWN_CALL.match(line))
        name = match[1]
        counts[name] = counts.get(name, 0) + 1
        call = _call(match, counts[name], cwd)
        if call.kind == "enter" and not call.error:
            cwd = call.path
        if own:
            calls.append(call)
    return calls


def _call(match, ordinal, cwd):
    name, arguments, result, rest = match.groups()
    kind, descriptor = kind_of(name), _DESCRIPTOR.match(arguments)
    quoted = [(top or cwd, _plain(text)) for top, text in _QUOTED.findall(arguments)]
    text = quoted[0][1] if kind == "write" and quoted else ""
    if kind in ("read", "write"):
        quoted = []
    given = tuple(text for _, text in quoted) or ((descriptor[2],) if descriptor else ())
    paths = tuple(os.path.join(top, text) for top, text in quoted) or given
    error = _ERROR.match(rest)
    return Call(
        kind,
        name,
        ordinal,
        paths,
        given,
        arguments,
        int(descriptor[1]) if descriptor else None,
        text,
        _number(result),
        error[1] if error else "",
        rest.endswith("(INJECTED)"),
        tuple(_LOG_LINE.findall(text)),
        cwd,
    )


def _number(result):
    return None if result == "?" else int(result, 0)


def _plain(text):
    """A string as strace shows it, without its escapes."""
    return codecs.decode(text.encode("latin-1", "backslashreplace"), "unicode_escape")
