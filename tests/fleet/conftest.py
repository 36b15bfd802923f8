"""What the tests of the fleet work with: a controller, and hosts with a real sshd each."""

import os

import pytest

from controller import Controller
from network import Network, why_not
from support import remove_tree, scratch_folder


def pytest_configure(config):
    config.addinivalue_line("markers", "full: takes long; only with ORVPATCH_FULL=1")


def pytest_collection_modifyitems(items):
    if os.environ.get("ORVPATCH_FULL"):
        return
    for item in items:
        if item.get_closest_marker("full"):
            item.add_marker(pytest.mark.skip(reason="takes long: ORVPATCH_FULL=1"))


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
    made.controller = Controller.of(made, "c")
    yield made
    made.close()
