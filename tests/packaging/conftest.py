"""Every architecture is built and packed twice: in two folders, under two masks, time zones and languages."""

import pytest

from shipped import ARCHITECTURES, PROGRAMS, first_build, second_build


def pytest_configure(config):
    config.addinivalue_line("markers", "packages: builds the packages first, which takes minutes")


@pytest.fixture(params=ARCHITECTURES, ids=lambda architecture: architecture.preset)
def architecture(request):
    return request.param


@pytest.fixture(params=PROGRAMS)
def name(request):
    """Of the program whose package is looked at."""
    return request.param


@pytest.fixture
def build(architecture):
    return first_build(architecture)


@pytest.fixture
def other_build(architecture):
    return second_build(architecture)
