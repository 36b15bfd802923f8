"""What the tests of the fleet work with: a controller, and hosts with a real sshd each."""

import datetime
import importlib
import os
import sys
import zlib

import pytest

from controller import COLLECTION, Controller
from network import Network, why_not
from support import remove_tree, scratch_folder


TURNS = 7
LEFT_OUT = pytest.StashKey()


def pytest_configure(config):
    config.addinivalue_line("markers", "full: takes long; each day one of seven, all with ORVPATCH_FULL=1")


def is_chosen(item):
    if os.environ.get("ORVPATCH_FULL") or not item.get_closest_marker("full"):
        return True
    return (zlib.crc32(item.nodeid.encode()) + datetime.date.today().toordinal()) % TURNS == 0


def pytest_collection_modifyitems(config, items):
    left_out = [item for item in items if not is_chosen(item)]
    if left_out:
        config.hook.pytest_deselected(items=left_out)
    config.stash[LEFT_OUT] = bool(left_out)
    items[:] = [item for item in items if is_chosen(item)]


def pytest_sessionfinish(session, exitstatus):
    """A file whose tests all wait for their turn is no failure."""
    if exitstatus == pytest.ExitCode.NO_TESTS_COLLECTED and session.config.stash.get(LEFT_OUT, False):
        session.exitstatus = pytest.ExitCode.OK


@pytest.fixture(scope="module")
def part():
    """part("filter.fleet") is that plugin, found as the engine finds it."""
    folder = scratch_folder()
    (folder / "ansible_collections/orv").mkdir(parents=True)
    (folder / "ansible_collections/orv/patch").symlink_to(COLLECTION)
    sys.path.insert(0, str(folder))
    sys.dont_write_bytecode, kept = True, sys.dont_write_bytecode
    yield lambda name: importlib.import_module(f"ansible_collections.orv.patch.plugins.{name}")
    sys.dont_write_bytecode = kept
    sys.path.remove(str(folder))
    remove_tree(folder)


@pytest.fixture
def controller():
    """A controller of this machine alone."""
    folder = scratch_folder()
    yield Controller(folder / "controller")
    remove_tree(folder)


@pytest.fixture
def ctl_binary(program):
    found = os.environ.get("ORVPATCHCTL") or program.binary.parent / "orvpatchctl"
    assert os.access(found, os.X_OK), f"{found} has not been built"
    return found


@pytest.fixture
def network(program, ctl_binary):
    """Eight hosts with live agents; `network.controller` reaches them by ssh."""
    reason = why_not()
    if reason:
        pytest.skip(reason)
    made = Network([program.binary, ctl_binary])
    try:
        made.controller = Controller.of(made, "c")
        yield made
    finally:
        made.close()
