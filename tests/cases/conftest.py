"""The fixture of all cases."""

import pytest

pytest.register_assert_rewrite("loglines")  # its assertions then show what differs, like those of the cases

from productsite import Site  # noqa: E402  (after the line above, which must come first)


@pytest.fixture
def site(home, program, patch_dir):
    """A product home with nothing installed, an empty folder of patches, and the program."""
    return Site(home, program, patch_dir)
