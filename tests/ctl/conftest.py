"""What the tests of orvpatchctl work with: the program, a home with its patches, and its JSON documents."""

import json
import os
from pathlib import Path

import jsonschema
import pytest

from callfaults import SEED
from support import Patch, Program

CHECKOUT = Path(__file__).resolve().parents[2]
SCHEMAS = CHECKOUT / "docs/schema"


class Ctl:
    """orvpatchctl: ORVPATCHCTL names the binary, by default the one beside the installer under test."""

    def __init__(self, installer):
        beside = installer.binary.parent / "orvpatchctl"
        self.program = Program(binary=os.environ.get("ORVPATCHCTL") or beside)

    def run(self, *words, **options):
        return self.program.run(*words, **options)

    def document(self, *words, status=0, **options):
        """The document that `words --json` prints, held against the schema of its command."""
        result = self.run(*words, "--json", **options)
        assert result.status == status, (result.status, result.out, result.err)
        document = json.loads(result.out)
        jsonschema.Draft7Validator(self.schema(words[0])).validate(document)
        return document

    @staticmethod
    def schema(command):
        schema = SCHEMAS / f"{command}.json"
        assert schema.exists(), f"no schema for {command}"
        return json.loads(schema.read_text())


@pytest.fixture(scope="module")
def seed():
    """Says how the choice of a test can be repeated."""
    print(f"ORVPATCH_SEED={SEED}")


@pytest.fixture
def ctl(program):
    return Ctl(program)


@pytest.fixture
def write(patch_dir):
    """write(patch) makes the archive of a patch in the folder of patches and returns its path."""

    def make(patch, **options):
        assert isinstance(patch, Patch)
        return patch.write(patch_dir, **options)

    return make
