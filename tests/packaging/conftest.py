"""Every architecture is built and packed twice: in two folders, under two masks, time zones and languages."""

import pytest

from shipped import ARCHITECTURES, ship


def pytest_configure(config):
    config.addinivalue_line("markers", "packages: builds the packages first, which takes half a minute")


@pytest.fixture(params=ARCHITECTURES, ids=lambda architecture: architecture.preset)
def architecture(request):
    return request.param


@pytest.fixture
def build(architecture):
    return ship(architecture, "a", 0o022, TZ="UTC", LC_ALL="C")


@pytest.fixture
def other_build(architecture):
    return ship(architecture, "another-folder/with/a-longer-name", 0o027, TZ="Asia/Tokyo", LC_ALL="C.UTF-8")
