"""Reads patchlogs/orvpatch.log (or the same lines from standard output under PATCH_DEBUG)."""

import re
from typing import NamedTuple

_RULE = re.escape("=" * 78)
_HEADER = re.compile(
    rf"^{_RULE}\n ORV Patch Log File\n"
    r"   System Name: (?P<host>.*)\n"
    r"   User Name:   (?P<user>.*)\n"
    r"   Process ID:  (?P<pid>\d+)\n"
    r"   Build Date:  (?P<date>\S+) (?P<time>\S+)\n"
    rf"{_RULE}\n",
    re.MULTILINE,
)
_PREFIX = re.compile(r"^(ERROR|INFO |TRACE) (\d\d:\d\d:\d\d) \(([^,()]*),(\d+)\): ")


class Header(NamedTuple):
    host: str
    user: str
    pid: int
    date: str
    time: str


class LogLine(NamedTuple):
    """One log call; a message of several lines is one LogLine. The level is a bare word: "INFO"."""

    level: str
    component: str
    line: int
    message: str


class Run(NamedTuple):
    header: Header
    lines: list


class Log(NamedTuple):
    """The parsed log: one Run for each header block, and what stood before the first one."""

    runs: list
    preamble: str

    @property
    def headers(self):
        return [run.header for run in self.runs]

    @property
    def lines(self):
        return [line for run in self.runs for line in run.lines]

    def entries(self, level=None, component=None):
        """(level, component, message) of the lines in order, those of one level or component if asked."""
        return [
            (line.level, line.component, line.message)
            for line in self.lines
            if level in (None, line.level) and component in (None, line.component)
        ]

    def messages(self, level=None, component=None):
        return [message for _, _, message in self.entries(level, component)]


def parse_log(text):
    """Parses the log's text (str, or bytes that are taken as UTF-8 with escapes for stray bytes)."""
    if isinstance(text, bytes):
        text = text.decode("utf-8", "surrogateescape")
    starts = list(_HEADER.finditer(text))
    ends = [match.start() for match in starts[1:]] + [len(text)]
    runs = [Run(_header(match), _lines(text[match.end() : end])) for match, end in zip(starts, ends)]
    return Log(runs, text[: starts[0].start()] if starts else text)


def _header(match):
    return Header(match["host"], match["user"], int(match["pid"]), match["date"], match["time"])


def _lines(text):
    lines = []
    # A message that ends in a line feed leaves an empty line behind it: only the last "\n" is the log's.
    for row in text.removesuffix("\n").split("\n") if text else []:
        prefix = _PREFIX.match(row)
        if prefix:
            level, _, component, number = prefix.groups()
            lines.append(LogLine(level.strip(), component, int(number), row[prefix.end() :]))
        elif lines:
            lines[-1] = lines[-1]._replace(message=lines[-1].message + "\n" + row)
    return lines
