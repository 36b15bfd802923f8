"""The log of whole runs, as logs/NAME.log gives it: level, component and message of every line, with the words in
braces for what differs from run to run. Each operation's own lines are held by its unit test."""

import re
from pathlib import Path

_LOGS = Path(__file__).with_name("logs")
_LINE = re.compile(r"(ERROR|INFO |TRACE) ([\w.]+): (.*)")
_BUFFER = re.compile(r"\(0x[0-9a-f]+\) exit$")
_BUILDING = "ORVComponentRegistry::buildComponent("
_BUILT = "ORVComponentRegistry::buildComponent exit"


def golden(name, **words):
    """(level, component, message) of every line."""
    lines = []
    for row in (_LOGS / f"{name}.log").read_text(encoding="utf-8").removesuffix("\n").split("\n"):
        for word, value in words.items():
            row = row.replace(f"{{{word}}}", str(value))
        match = _LINE.fullmatch(row)
        if match:
            lines.append((match[1].strip(), match[2], match[3]))
        else:  # a message of several lines
            lines[-1] = (*lines[-1][:2], f"{lines[-1][2]}\n{row}")
    return lines


def told(lines):
    """Logged lines without what no case can foretell: the addresses of buffers, and the order in which the
    system lists the registry."""
    lines = [(level, component, _BUFFER.sub("({BUFFER}) exit", message)) for level, component, message in lines]
    begins = [at for at, line in enumerate(lines) if line[2].startswith(_BUILDING)]
    ends = [at + 1 for at, line in enumerate(lines) if line[2] == _BUILT]
    if begins:
        blocks = sorted(lines[begin:end] for begin, end in zip(begins, ends))
        lines[begins[0] : ends[-1]] = [line for block in blocks for line in block]
    return lines


def words_of(site, **words):
    """What stands in every log: the program, the home, the search path, the folder of patches."""
    return {
        "PROGRAM": site.program.argv[-1],
        "HOME": site.home.path,
        "PATH": site.env["PATH"],
        "FOLDER": site.patch_dir,
        **words,
    }
