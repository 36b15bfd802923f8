"""Sample product, patches and the program under test: shared by cases, fault tests, demo and benchmarks."""

from .archive import Patch
from .logfile import Log, LogLine, parse_log
from .product import Call, HistoryLine, ProductHome, remove_tree, scratch_folder
from .program import Program, Result, stubs
from .snapshot import Entry

__all__ = [
    "Call", "Entry", "HistoryLine", "Log", "LogLine", "Patch", "ProductHome", "Program", "Result",
    "parse_log", "remove_tree", "scratch_folder", "stubs",
]
