"""The fixture of all cases."""

import pytest

from productsite import Site


@pytest.fixture
def site(home, program, patch_dir):
    """A product home with nothing installed, an empty folder of patches, and the program."""
    return Site(home, program, patch_dir)
