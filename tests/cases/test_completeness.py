"""Every text of the catalogue and every exit status has a case, or a reason why no run can show it.

What counts is what stands in the cases themselves, not in their helpers.
"""

import ast
from pathlib import Path

from support.catalogue import TEXTS

UNREACHABLE = {
    "PP_CAB_EXTRACT": "belongs to compressed archives, which this version does not unpack",
    "ERROR_PP_INITIALIZE": "belongs to a set-up that reports its causes instead",
    "ERROR_PP_COPY_PRODEXE": "belongs to the copies of product executables, which this version does not make",
    "PP_LIST_PRODEXES": "belongs to the copies of product executables, which this version does not list",
}
STATUSES = {*range(0, 8), *range(9, 17), *range(18, 29), *range(30, 33), *range(34, 38)}
_WHOLE_RESULTS = {"done": 0, "usage": 1, "bad_home": 2}  # what these functions of productsite stand for


def nodes(*kinds):
    for path in sorted(Path(__file__).parent.glob("test_*.py")):
        if path != Path(__file__):
            yield from (
                node for node in ast.walk(ast.parse(path.read_text(encoding="utf-8"))) if isinstance(node, kinds)
            )


def is_key(node):
    return isinstance(node, ast.Constant) and node.value in TEXTS


def called(call):
    """The bare name of the function or method."""
    return getattr(call.func, "id", getattr(call.func, "attr", ""))


def is_message(node):
    """Whether this makes the text of an end: a key, a call of `text` or of a helper that calls it."""
    return (
        is_key(node)
        or getattr(node, "id", "") == "message"
        or any(
            called(inner) == "text" or called(inner).endswith("_error")
            for inner in ast.walk(node)
            if isinstance(inner, ast.Call)
        )
    )


def asserted_keys():
    return {argument.value for call in nodes(ast.Call) for argument in call.args if is_key(argument)}


def asserted_statuses():
    """A status stands in a call or a row of a table, directly before its text."""
    found = {_WHOLE_RESULTS[called(call)] for call in nodes(ast.Call) if called(call) in _WHOLE_RESULTS}
    for node in nodes(ast.Call, ast.Tuple):
        values = node.args if isinstance(node, ast.Call) else node.elts
        found.update(
            value.value
            for value, after in zip(values, values[1:])
            if isinstance(value, ast.Constant) and type(value.value) is int and is_message(after)
        )
    return found


def test_the_catalogue_has_all_its_texts():
    assert len(TEXTS) == 62


def test_every_text_is_asserted_or_unreachable():
    assert TEXTS.keys() - asserted_keys() == UNREACHABLE.keys()


def test_every_status_is_asserted():
    assert asserted_statuses() == STATUSES
