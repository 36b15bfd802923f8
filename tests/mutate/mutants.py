"""First-order mutants of the sources: one small change at one place each."""

import itertools
import random
import re
from collections import Counter, defaultdict
from pathlib import Path
from typing import NamedTuple

from variables import variables_at

SURVIVORS = Path(__file__).with_name("survivors.txt")


class Mutant(NamedTuple):
    file: str
    line: int  # counted from 1
    function: str  # in which it stands, or the file's own name
    kind: str
    change: str  # in short, without the line
    nth: int  # among those of the function that read the same
    before: str  # text of the line, or of the lines
    after: str

    @property
    def name(self):
        """Neither line nor number of the line: both change with what stands around."""
        return f"{self.file} {self.function} [{self.kind}] {self.change}{f' #{self.nth}' if self.nth > 1 else ''}"


OPERATORS = [
    ("==", "!="),
    ("!=", "=="),
    ("<=", "<"),
    (">=", ">"),
    (" < ", " <= "),
    (" > ", " >= "),
    (" && ", " || "),
    (" || ", " && "),
    (" + ", " - "),
    (" - ", " + "),
    ("+= ", "= "),
    ("++i", "--i"),
    ("!", ""),
]
# Operations that take the place of each other.
NEIGHBOURS = [
    ("find", "rfind"),
    ("find_first_of", "find_last_of"),
    ("find_first_not_of", "find_last_not_of"),
    ("front", "back"),
    ("stat", "lstat"),
    ("min", "max"),
    ("lower_bound", "upper_bound"),
    ("first", "second"),
    ("append", "assign"),
    ("any_of", "all_of"),
    ("O_APPEND", "O_TRUNC"),
]
NEIGHBOUR = {name: other for pair in NEIGHBOURS for name, other in (pair, pair[::-1])}
CONSTANTS = {"true": "false", "false": "true"}
WORD = re.compile(r"(?<![\w.\"])[A-Za-z_]\w*|(?<=[.>])[A-Za-z_]\w*")
STRING = re.compile(r'"(?:[^"\\]|\\.)*"')
NUMBER = re.compile(r"(?<![\w.\"])(\d+)(?![\w.\"])")
FLAGS = re.compile(r"\b[A-Z][A-Z0-9_]*[A-Z0-9](?: \| [A-Z][A-Z0-9_]*[A-Z0-9])+")
ARGUMENTS = re.compile(r"\b(\w+)\(((?:[\w.\->]+(?:\(\))?|\"[^\"]*\")(?:, (?:[\w.\->]+(?:\(\))?|\"[^\"]*\"))+)\)")
CALL = re.compile(r"^\s*(?:static_cast<void>\()?[\w:.>\-\[\]*]+\(.*\);$|^\s*[\w.>\-\[\]*]+ (?:\+|-|)= .*;$")
STARTS = re.compile(r"^(?!namespace|using|#|//|\}|template|extern)(?! ).*?([\w:~]+)\(|^(?:class|struct) (\w+)")
# A text that is altered shows little: one of so many is.
SHARE_OF_STRINGS = 4


def is_code(line):
    text = line.strip()
    return bool(text) and not text.startswith(("//", "///", "#", "*", "template", "using ", "namespace"))


def outside_strings(line, position):
    return not any(match.start() <= position < match.end() for match in STRING.finditer(line))


def code_part(line):
    """The line without a comment at its end."""
    for match in re.finditer(r"//", line):
        if outside_strings(line, match.start()):
            return line[: match.start()].rstrip()
    return line


def replaced(line, span, text):
    return line[: span[0]] + text + line[span[1] :]


def operator_mutants(line):
    for old, new in OPERATORS:
        for match in re.finditer(re.escape(old), line):
            end = match.end()
            if not outside_strings(line, match.start()):
                continue
            if old == "!" and (line[end : end + 1] == "=" or not line[end : end + 1].strip()):
                continue
            yield "operator", f"{old.strip()} -> {new.strip()}", replaced(line, match.span(), new)
    if " ? " in line:
        after = re.sub(r"^(\s*(?:return |.*?= |.*?\())(.*?) \? ", r"\1!(\2) ? ", line, count=1)
        yield "condition", "? the other way round", after


def word_mutants(line):
    for match in WORD.finditer(line):
        word = match.group()
        new = CONSTANTS.get(word) or NEIGHBOUR.get(word)
        if (
            new
            and outside_strings(line, match.start())
            and (word in CONSTANTS or word.isupper() or line[match.end() : match.end() + 1] in ("(", ".", ""))
        ):
            yield ("constant" if word in CONSTANTS else "neighbour"), f"{word} -> {new}", replaced(
                line, match.span(), new
            )
    for match in NUMBER.finditer(line):
        if outside_strings(line, match.start()):
            new = str(int(match.group(1)) + 1)
            yield "constant", f"{match.group()} -> {new}", replaced(line, match.span(), new)


def flag_mutants(line):
    """Each bit left out, one at a time."""
    for match in FLAGS.finditer(line):
        bits = match.group().split(" | ")
        for bit in bits:
            rest = [other for other in bits if other != bit]
            yield "flag", f"without {bit}", replaced(line, match.span(), " | ".join(rest))


def argument_mutants(line):
    """Neighbouring arguments in each other's place."""
    for match in ARGUMENTS.finditer(line):
        if not outside_strings(line, match.start()):
            continue
        words = match.group(2).split(", ")
        for at in range(1 if match.group(1).startswith("LOG_") else 0, len(words) - 1):
            swapped = [*words[:at], words[at + 1], words[at], *words[at + 2 :]]
            if swapped != words:
                yield "argument", f"{match.group(1)}: {at + 1} and {at + 2} swapped", replaced(
                    line, match.span(2), ", ".join(swapped)
                )


def variable_mutants(line, variables):
    """One variable for another of its type; `variables`: name -> the others."""
    for match in WORD.finditer(line):
        if outside_strings(line, match.start()) and not re.match(r"\s*(=|\{) ", line[match.end() :]):
            for other in variables.get(match.group(), ()):
                yield "variable", f"{match.group()} -> {other}", replaced(line, match.span(), other)


def string_mutants(line):
    for match in STRING.finditer(line):
        text = match.group()
        if "LOG_" not in line:
            yield "string", f"text {text[1:13]}", replaced(line, match.span(), text[:-1] + '~"')


def condition_mutants(line):
    match = re.match(r"^(\s*(?:\} else )?(?:if|while) \()(.*)(\)(?: \{)?)$", line)
    if match and " const " not in match.group(2) and "*const" not in match.group(2):
        yield "condition", "negated", f"{match.group(1)}!({match.group(2)}){match.group(3)}"


def statement(code):
    """What a statement is about: the call, or the variable that it sets."""
    return re.match(r"\s*([\w:.>\-\[\]*]+)", code).group(1)


def line_mutants(code, variables):
    for make in (operator_mutants, word_mutants, flag_mutants, argument_mutants, string_mutants, condition_mutants):
        yield from make(code)
    yield from variable_mutants(code, variables)
    if CALL.match(code) and not re.match(r"^\s*(return|const|auto|static|else)\b", code):
        yield "deletion", f"of {statement(code)}", re.match(r"^\s*", code).group() + ";"


def swap_mutants(first, second):
    same_depth = re.match(r"^\s*", first).group() == re.match(r"^\s*", second).group()
    if same_depth and CALL.match(first) and CALL.match(second):
        yield "swap", f"{statement(first)} and {statement(second)}", second + "\n" + first


def file_mutants(root, path):
    file, lines = str(path.relative_to(root)), path.read_text().splitlines()
    function, seen, strings = path.stem, Counter(), 0
    for number, line in enumerate(lines, 1):
        start = STARTS.match(line)
        function = (start.group(1) or start.group(2)) if start and not line.endswith(";") else function
        if not is_code(line):
            continue
        code, following = code_part(line), code_part(lines[number]) if number < len(lines) else ""
        variables = variables_at(lines, number, path if "::" in function else None)
        changes = [(line, *change) for change in line_mutants(code, variables)]
        changes += [(f"{code}\n{following}", *change) for change in swap_mutants(code, following)]
        for before, kind, change, after in changes:
            strings += kind == "string"
            if after in (code, before) or kind == "string" and strings % SHARE_OF_STRINGS:
                continue
            seen[function, kind, change] += 1
            yield Mutant(file, number, function, kind, change, seen[function, kind, change], before, after)


def all_mutants(root):
    for pattern in ("src/*.cpp", "src/*.h", "src/patchprocessor/*.cpp", "src/patchprocessor/*.h"):
        for path in sorted(root.glob(pattern)):
            yield from file_mutants(root, path)


def sample(root, count, seed):
    """Every kind has its turn, so that the many of one kind do not crowd out the others."""
    by_kind = defaultdict(list)
    for mutant in dict.fromkeys(all_mutants(root)):
        by_kind[mutant.kind].append(mutant)
    for mutants in by_kind.values():
        random.Random(seed).shuffle(mutants)
    turns = itertools.chain.from_iterable(itertools.zip_longest(*by_kind.values()))
    return list(itertools.islice(filter(None, turns), count))


def apply(mutant, text):
    lines = text.splitlines()
    height = mutant.before.count("\n") + 1
    lines[mutant.line - 1 : mutant.line - 1 + height] = mutant.after.split("\n")
    return "\n".join(lines) + "\n"


def listed_survivors():
    """Names of the mutants whose survival has its reason."""
    lines = SURVIVORS.read_text().splitlines()
    return {line.rsplit(" | ", 1)[0] for line in lines if line and not line.startswith("#")}
