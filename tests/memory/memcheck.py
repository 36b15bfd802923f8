"""Runs a command under valgrind and reads what it found."""

import re
from pathlib import Path
from typing import NamedTuple

_SUPPRESSIONS = Path(__file__).with_name("valgrind.supp")
_LOSSES = "definite,indirect,possible"  # what is reachable at the end is not lost
ERROR_STATUS = 99  # no status of the program


class Report(NamedTuple):
    """What valgrind says of one process at its end."""

    errors: int
    lost: int  # bytes
    descriptors: list  # those open at the end beside 0, 1, 2
    text: str


class Memcheck:
    """Memcheck(folder).words goes in front of a command; .report() tells of its process, once that has ended, and
    .child_errors() of the children that ended before they became another program."""

    def __init__(self, folder):
        self._folder = Path(folder)
        self.words = [
            "valgrind",
            "--track-fds=yes",
            "--leak-check=full",
            f"--show-leak-kinds={_LOSSES}",
            f"--errors-for-leak-kinds={_LOSSES}",
            f"--error-exitcode={ERROR_STATUS}",
            "--trace-children=no",
            f"--suppressions={_SUPPRESSIONS}",
            f"--log-file={self._folder}/memcheck.%p",
        ]

    def report(self):
        reports = self._reports()
        (main,) = [text for text in reports.values() if _number(r"Parent PID: (\d+)", text) not in reports]
        assert "ERROR SUMMARY" in main, main
        lost = sum(
            _number(rf"{kind} lost: ([\d,]+) bytes", main) or 0 for kind in ("definitely", "indirectly", "possibly")
        )
        return Report(_number(r"ERROR SUMMARY: ([\d,]+)", main), lost, self._descriptors(main), main)

    def child_errors(self):
        return sum(_number(r"ERROR SUMMARY: ([\d,]+)", text) or 0 for text in self._reports().values())

    def _descriptors(self, text):
        # Valgrind's own log is one of them; what a caller left open is none of the program's.
        opened = re.findall(r"Open (?:file descriptor|\S+ socket) (\d+): ?(.*)\n==\d+==    (.*)", text)
        return [f"{number} {path} {where}" for number, path, where in opened if where != "<inherited from parent>"]

    def _reports(self):
        files = self._folder.glob("memcheck.*")
        return {int(path.suffix[1:]): path.read_text(errors="replace") for path in files}


def _number(pattern, text):
    found = re.search(pattern, text)
    return int(found[1].replace(",", "")) if found else None
