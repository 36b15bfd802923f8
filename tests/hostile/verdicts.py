"""What a run that met hostile input leaves on the terminal, and what it leaves alone in the home."""

from support import Result

SUCCESS = b"\nCommand completed successfully.\n\n"
INSTALLED = Result(0, SUCCESS, b"")

# Written by every run, whatever becomes of the patch.
_WRITTEN_BY_ANY_RUN = ("patchlogs/orvpatch.log", "patchlogs/patches.hist", "tmp/kox")


def failure(home):
    return (
        b"\nCommand completed with errors. For more information, see the orvpatch.log file under:\n"
        + home.prefix.encode()
        + b"patchlogs/\n\n"
    )


def refused(home, status, text, out=b""):
    """A failed run whose text stands between empty lines: every failure but that of a report under way."""
    return Result(status, out + failure(home), b"\n" + text.encode() + b"\n\n")


def product_tree(home):
    """The home without what any run may write: unchanged when a patch was refused."""
    return {path: entry for path, entry in home.tree().items() if not path.startswith(_WRITTEN_BY_ANY_RUN)}


def added(before, after):
    """Paths that came to a tree; asserts that none went and none changed."""
    assert {path: after.get(path) for path in before} == before
    return sorted(after.keys() - before.keys())
