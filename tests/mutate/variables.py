"""Which variables of a source line have others of their type: found by their declarations, as these are written."""

import re
from collections import defaultdict

_TYPES = (
    r"std::string|std::vector<std::string>|int|bool|long|mode_t|uid_t|gid_t|pid_t|size_t|std::size_t|"
    r"std::string_view|struct stat|char|File|FileDescriptor|Version|ProcessResult"
)
_DECLARED = re.compile(rf"(?:const )?\b({_TYPES})\b(?: const)? ?([*&]?)(?:const )?(\w+)(?=[,;)=\[{{]| = |\))")


def variables_at(lines, number, path):
    """Name -> others of its type that may stand in the line of this number, sorted. `path`: of the source, where
    the line may use members."""
    by_type = defaultdict(set)
    for line in [*_function_before(lines, number), *_members(path)]:
        for kind, pointer, name in _DECLARED.findall(line):
            by_type[kind, pointer == "*"].add(name)
    return {name: sorted(names - {name}) for names in by_type.values() for name in names if len(names) > 1}


def _function_before(lines, number):
    """The lines of a function down to this one; its signature stands at the first column."""
    first = number - 1
    while first > 0 and not (lines[first][:1].strip() and not lines[first].startswith(("}", "//", "#"))):
        first -= 1
    while first > 0 and lines[first - 1][:1].strip() and not lines[first - 1].startswith(("}", "//", "#")):
        first -= 1
    return lines[first : number - 1] if first < number - 1 else []


def _members(path):
    if path is None:
        return []
    header = path.with_suffix(".h")
    if not header.exists():
        header = path.parent / f"{path.parent.name}.h"
    lines = header.read_text().splitlines() if header.exists() else []
    return [line for line in lines if re.search(r"\w_(?: = [^;]*|\{[^;]*\})?;", line)]
