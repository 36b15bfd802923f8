"""Fixtures of all tests that run the real program: cases, fault tests and the tests of the support library."""

import os
import shutil

import pytest

from support import ProductHome, Program, remove_tree, scratch_folder, second_account
from support.browser import Browser


os.umask(0o022)  # expected modes are written for it, and other users must get into the homes


def pytest_addoption(parser):
    parser.addoption("--part", default="1/1", metavar="I/N", help="run the I-th of N parts of the tests")


@pytest.hookimpl(tryfirst=True)  # before they are shuffled: all parts together are the whole
def pytest_collection_modifyitems(config, items):
    part, parts = map(int, config.getoption("part").split("/"))
    config.hook.pytest_deselected(items=[item for index, item in enumerate(items) if index % parts != part - 1])
    items[:] = items[part - 1 :: parts]
    if os.geteuid() == 0:
        return
    for item in items:
        if item.get_closest_marker("needs_root"):
            item.add_marker(pytest.mark.skip(reason="needs root"))


@pytest.fixture(scope="session")
def program():
    """The program under test; says what to do when it has not been built."""
    found = Program()
    if not found.binary.exists():
        pytest.exit(f"{found.binary} is missing: cmake --preset dev && cmake --build --preset dev", returncode=2)
    return found


@pytest.fixture
def home():
    """A product home with nothing installed and nothing running; its processes end with the test."""
    with ProductHome() as made:
        yield made


@pytest.fixture
def scratch():
    """A temporary folder that other users may enter, unlike pytest's own."""
    folder = scratch_folder()
    yield folder
    remove_tree(folder)


@pytest.fixture
def patch_dir(scratch):
    """An empty folder for patch files."""
    folder = scratch / "patches"
    folder.mkdir()
    return folder


@pytest.fixture
def other_owner(scratch):
    """An account beside root's that may log in (for tests that need root)."""
    with second_account(scratch) as account:
        yield account


@pytest.fixture
def browser(tmp_path):
    """A browser with a profile of its own."""
    if not shutil.which("chromium"):
        pytest.skip("chromium is missing: scripts/setup browser")
    started = Browser(tmp_path / "profile")
    yield started
    started.close()
