"""Sample product, patches and the program under test: shared by cases, fault tests, demo and benchmarks."""

from .account import Account, second_account
from .archive import Patch
from .logfile import Log, LogLine, parse_log
from .product import Call, HistoryLine, ProductHome
from .program import Program, Result, stubs
from .scratch import remove_tree, scratch_folder
from .snapshot import Entry

__all__ = [
    "Account",
    "Call",
    "Entry",
    "HistoryLine",
    "Log",
    "LogLine",
    "Patch",
    "ProductHome",
    "Program",
    "Result",
    "parse_log",
    "remove_tree",
    "scratch_folder",
    "second_account",
    "stubs",
]
