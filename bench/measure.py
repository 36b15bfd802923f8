"""Runs one command and measures its cost."""

import subprocess
from pathlib import Path
from typing import NamedTuple

SOURCES = Path(__file__).resolve().parent


class Cost(NamedTuple):
    """What one run used. CPU time and peak memory include the children that the command waited for."""

    wall: float  # seconds
    cpu: float  # seconds, user and system
    peak: float  # MiB


class Meter:
    """Measures commands in a working folder, in which its helper programs are built."""

    def __init__(self, folder):
        self._folder = Path(folder)
        self._usage = self.build("usage")

    def build(self, name):
        """Builds bench/NAME.c and returns the path of the program."""
        program = self._folder / name
        subprocess.run(["cc", "-std=c11", "-O2", "-o", program, SOURCES / f"{name}.c"], check=True)
        return program

    def cost(self, command):
        result = self._folder / "usage.result"
        _succeed([self._usage, result, *command])
        wall, user, system, peak = result.read_text().split()
        return Cost(float(wall), float(user) + float(system), int(peak) / 1024)

    def system_calls(self, command):
        """Name -> number of the system calls of the command's own process, without its children."""
        table = self._folder / "strace.result"
        _succeed(["strace", "-c", "-U", "calls,name", "-o", table, *command])
        rows = [line.split() for line in table.read_text().splitlines()]
        return {row[1]: int(row[0]) for row in rows if len(row) == 2 and row[0].isdigit() and row[1] != "total"}


def _succeed(command):
    done = subprocess.run(
        command, check=False, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, cwd="/"
    )
    if done.returncode != 0:
        raise RuntimeError(f"{command} ended with {done.returncode}: {done.stderr.decode(errors='replace')}")
