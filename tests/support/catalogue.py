"""The texts that the program shows and logs, as its documentation gives them. The unit tests read the same data."""

import json
from pathlib import Path

TEXTS = json.loads(Path(__file__).with_suffix(".json").read_text(encoding="utf-8"))


def text(key, *arguments):
    """The text of this key with its conversions filled."""
    return TEXTS[key] % arguments
