"""Hostile input must never make the program hang: every run here has a time limit of its own."""

import pytest

from support import Program

LIMIT = 60  # seconds; the slowest run, a million lines under AddressSanitizer, takes a third of that


class LimitedProgram(Program):
    def run(self, *arguments, timeout=LIMIT, **options):
        return super().run(*arguments, timeout=timeout, **options)


@pytest.fixture(scope="session")
def program(program):
    return LimitedProgram(program.binary, program.runner)


@pytest.fixture
def product(home):
    """A home with the OS agent installed, which all patches here are for."""
    home.component("ox")
    return home
