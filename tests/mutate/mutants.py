"""First-order mutants of the sources: one small change at one place each."""

import random
import re
from pathlib import Path
from typing import NamedTuple

SURVIVORS = Path(__file__).with_name("survivors.txt")


class Mutant(NamedTuple):
    file: str
    line: int       # counted from 1
    kind: str
    before: str     # text of the line, or of the lines
    after: str

    @property
    def name(self):
        """Without the line's number, which changes with every line above it."""
        before, after = (" / ".join(map(str.strip, text.split("\n"))) for text in (self.before, self.after))
        return f"{self.file} [{self.kind}] {before} -> {after}"


OPERATORS = [("==", "!="), ("!=", "=="), ("<=", "<"), (">=", ">"), (" < ", " <= "), (" > ", " >= "),
             (" && ", " || "), (" || ", " && "), (" + ", " - "), (" - ", " + "), ("+= ", "= "), ("++i", "--i"),
             (" ? ", " ?!! "), ("!", "")]
CONSTANTS = [(r"\btrue\b", "false"), (r"\bfalse\b", "true"), (r"\bnullptr\b", None)]
STRING = re.compile(r'"(?:[^"\\]|\\.)*"')
NUMBER = re.compile(r"(?<![\w.\"])(\d+)(?![\w.\"])")
CALL = re.compile(r"^\s*(?:static_cast<void>\()?[\w:.>\-\[\]*]+\(.*\);$|^\s*[\w.>\-\[\]*]+ (?:\+|-|)= .*;$")


def is_code(line):
    text = line.strip()
    return bool(text) and not text.startswith(("//", "///", "#", "*", "template", "using ", "namespace"))


def outside_strings(line, position):
    return not any(match.start() <= position < match.end() for match in STRING.finditer(line))


def code_part(line):
    """The line without a comment at its end."""
    for match in re.finditer(r"//", line):
        if outside_strings(line, match.start()):
            return line[:match.start()].rstrip()
    return line


def replaced(line, start, end, text):
    return line[:start] + text + line[end:]


def operator_mutants(line):
    for old, new in OPERATORS:
        for match in re.finditer(re.escape(old), line):
            start, end = match.span()
            if not outside_strings(line, start):
                continue
            if old == "!" and (line[end:end + 1] == "=" or not line[end:end + 1].strip()):
                continue
            if old == " ? ":  # the other way round: negate what stands before
                yield "condition", re.sub(r"^(\s*(?:return |.*?= |.*?\())(.*?) \? ", r"\1!(\2) ? ", line, count=1)
                continue
            yield "operator", replaced(line, start, end, new)


def constant_mutants(line):
    for pattern, new in CONSTANTS:
        for match in re.finditer(pattern, line) if new else ():
            if outside_strings(line, match.start()):
                yield "constant", replaced(line, *match.span(), new)
    for match in NUMBER.finditer(line):
        if outside_strings(line, match.start()):
            yield "constant", replaced(line, *match.span(), str(int(match.group(1)) + 1))


def string_mutants(line):
    for match in STRING.finditer(line):
        if line.startswith("#"):
            continue
        text = match.group()
        yield "string", replaced(line, *match.span(), text[:-1] + '~"')


def condition_mutants(line):
    match = re.match(r"^(\s*(?:\} else )?(?:if|while) \()(.*)(\)(?: \{)?)$", line)
    if match and " const " not in match.group(2) and "*const" not in match.group(2):
        yield "condition", f"{match.group(1)}!({match.group(2)}){match.group(3)}"


def line_mutants(file, number, line):
    code = code_part(line)
    for make in (operator_mutants, constant_mutants, string_mutants, condition_mutants):
        for kind, after in make(code):
            if after != code:
                yield Mutant(file, number, kind, line, after)
    if CALL.match(code) and not re.match(r"^\s*(return|const|auto|static|else)\b", code):
        yield Mutant(file, number, "deletion", line, re.match(r"^\s*", code).group() + ";")


def swap_mutants(file, lines):
    for number in range(1, len(lines)):
        first, second = code_part(lines[number - 1]), code_part(lines[number])
        same_depth = re.match(r"^\s*", first).group() == re.match(r"^\s*", second).group()
        if same_depth and CALL.match(first) and CALL.match(second):
            yield Mutant(file, number, "swap", first + "\n" + second, second + "\n" + first)


def all_mutants(root):
    for path in sorted([*root.glob("src/*.cpp"), *root.glob("src/patchprocessor/*.cpp")]):
        file = str(path.relative_to(root))
        lines = path.read_text().splitlines()
        for number, line in enumerate(lines, 1):
            if is_code(line):
                yield from line_mutants(file, number, line)
        yield from swap_mutants(file, lines)


def sample(root, count, seed):
    mutants = list(dict.fromkeys(all_mutants(root)))
    random.Random(seed).shuffle(mutants)
    return mutants[:count]


def apply(mutant, text):
    lines = text.splitlines()
    height = mutant.before.count("\n") + 1
    lines[mutant.line - 1:mutant.line - 1 + height] = mutant.after.split("\n")
    return "\n".join(lines) + "\n"


def listed_survivors():
    """Names of the mutants whose survival has its reason."""
    lines = SURVIVORS.read_text().splitlines()
    return {line.rsplit(" | ", 1)[0] for line in lines if line and not line.startswith("#")}
