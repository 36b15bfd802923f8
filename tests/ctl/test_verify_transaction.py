"""verify --transaction: the home against the record of an installation, which knows what was there before."""

import json
import os

import pytest

from oracle import listing
from support import Patch


@pytest.fixture
def ready(home):
    home.component("yn")
    home.component("um")
    (home.path / "tmp").chmod(0o700)
    home.write("lib/replaced", "old\n", 0o4750)
    home.start("yn", "north")
    home.start("um")
    return home


def a_patch():
    return Patch("yn").file("lib/replaced", "new\n").file("lib/new", "new\n").file("fresh/deep/file", "new\n")


@pytest.fixture
def applied(ctl, ready, write):
    """The id of a transaction that ended well."""
    document = ctl.document("apply", ready, write(a_patch()), "--yes")
    assert document["verdict"] == "applied"
    return document["id"]


def differences(ctl, home, transaction):
    result = ctl.run("verify", home, "--transaction", transaction)
    found = ctl.document("verify", home, "--transaction", transaction, status=result.status)["differences"]
    assert result.status == (1 if found else 0), result
    for difference in found:
        assert difference["path"].encode() in result.out
    return [(difference["path"], difference["kind"]) for difference in found]


def refusal(ctl, home, *words):
    result = ctl.run("verify", home, *words)
    assert (result.status, result.out) == (2, b"")
    return result.err.decode()


def test_after_a_good_installation_nothing_differs_and_nothing_is_written(ctl, ready, applied):
    before = listing(ready)
    assert differences(ctl, ready, applied) == []
    assert ctl.document("verify", ready, "--transaction", applied)["files"] == 3
    assert listing(ready) == before


def test_the_record_tells_of_a_home_that_was_started_anew(ctl, ready, applied):
    """Another start of the system may give the file system another device number."""
    path = ready.path / "patchlogs/transactions" / applied / "record.json"
    record = json.loads(path.read_text())
    for file in record["files"]:
        for state in ("before", "after"):
            if file[state]:
                file[state]["device"] += 1
    path.write_text(json.dumps(record))
    assert differences(ctl, ready, applied) == []
    assert ctl.document("undo", ready)["verdict"] == "undone"
    assert ready.read("lib/replaced") == b"old\n"


def remove(path):
    path.unlink()


def make_directory(path):
    path.unlink()
    path.mkdir()


def overwrite(path):
    path.write_text("other\n")


def same_content_in_another_file(path):
    path.with_name("copy").write_bytes(path.read_bytes())
    path.with_name("copy").chmod(0o755)
    os.replace(path.with_name("copy"), path)


def open_to_all(path):
    path.chmod(0o777)


@pytest.mark.parametrize(
    "change, path, kind",
    [
        (remove, "lib/new", "missing"),
        (remove, "lib/replaced", "missing"),
        (make_directory, "lib/new", "type"),
        (overwrite, "fresh/deep/file", "content"),
        (same_content_in_another_file, "lib/new", "content"),
        (open_to_all, "lib/new", "mode"),
        (open_to_all, "lib/replaced", "mode"),
    ],
    ids=lambda value: getattr(value, "__name__", None),
)
def test_a_change_of_a_file_is_named(ctl, ready, applied, change, path, kind):
    change(ready.path / path)
    assert differences(ctl, ready, applied) == [(path, kind)]


@pytest.mark.needs_root
@pytest.mark.parametrize("path", ["lib/new", "lib/replaced"])
def test_another_owner_is_named(ctl, ready, applied, path):
    mode = (ready.path / path).stat().st_mode
    os.chown(ready.path / path, 65534, -1)
    (ready.path / path).chmod(mode)
    assert differences(ctl, ready, applied) == [(path, "owner")]


def test_a_missing_directory_level_history_and_instance_are_named(ctl, ready, applied):
    (ready.path / "fresh/deep/file").unlink()
    (ready.path / "fresh/deep").rmdir()
    version = next(path for path in (ready.path / "registry").glob("yn*.ver"))
    version.write_text(version.read_text().replace("06100100", "06100000"))
    (ready.path / "patchlogs/patches.hist").write_text("")
    ready.stop("yn", "north")
    assert sorted(differences(ctl, ready, applied)) == [
        ("fresh/deep", "missing"),
        ("fresh/deep/file", "missing"),
        ("kyn north", "instance"),
        ("patchlogs/patches.hist", "history"),
        (f"registry/{version.name}", "level"),
    ]


def test_what_the_installation_did_not_bring_is_named(ctl, ready, write):
    patch = a_patch().script("go.sh", when="pre", body="rm updated_files/lib/new")
    transaction = ctl.document("apply", ready, write(patch), "--yes", status=4)["id"]
    assert differences(ctl, ready, transaction) == [("lib/new", "missing")]
    ready.write("lib/new", "mine\n", 0o755)
    assert differences(ctl, ready, transaction) == [("lib/new", "content")]


def test_a_wrong_content_that_was_installed_stays_told(ctl, ready, write):
    patch = a_patch().script("go.sh", when="pre", body="echo other >updated_files/lib/new")
    transaction = ctl.document("apply", ready, write(patch), "--yes", status=4)["id"]
    assert differences(ctl, ready, transaction) == [("lib/new", "content")]


def test_an_installation_that_failed_differs(ctl, ready, write):
    patch = a_patch().script("no.sh", when="post", status=1)
    transaction = ctl.document("apply", ready, write(patch), "--yes", status=3)["id"]
    kinds = [kind for _, kind in differences(ctl, ready, transaction)]
    assert sorted(kinds) == ["history", "level"]


def test_of_two_patches_of_one_product_the_later_level_counts(ctl, ready, patch_dir):
    first = Patch("yn", level="06100100").file("lib/a", "1\n").write(patch_dir)
    transaction = ctl.document("apply", ready, first, "--yes")["id"]
    assert differences(ctl, ready, transaction) == []
    second = Patch("yn", level="06100200", fixpack="fp0002").file("lib/b", "2\n").write(patch_dir)
    other = ctl.document("apply", ready, second, "--yes")["id"]
    assert differences(ctl, ready, other) == []
    assert [kind for _, kind in differences(ctl, ready, transaction)] == ["level"]


def test_what_cannot_be_compared_is_status_2(ctl, ready, applied):
    assert "no transaction" in refusal(ctl, ready, "--transaction", "20200101T000000Z-1")
    assert "no transaction" in refusal(ctl, ready, "--transaction", f"../transactions/{applied}")
    undo = ctl.document("undo", ready)["id"]
    assert "was taken back" in refusal(ctl, ready, "--transaction", applied)
    assert "is an undo" in refusal(ctl, ready, "--transaction", undo)


def test_a_transaction_without_an_end_is_status_2(ctl, ready, applied):
    path = ready.path / "patchlogs/transactions" / applied / "record.json"
    path.write_text(path.read_text().replace('"phase": "closed"', '"phase": "installing"'))
    assert "did not end" in refusal(ctl, ready, "--transaction", applied)
    path.write_text("{")
    assert "record.json" in refusal(ctl, ready, "--transaction", applied)


def test_either_a_patch_or_a_transaction(ctl, ready, applied, patch_dir):
    assert ctl.run("verify", ready).status == 2
    patch = next(patch_dir.iterdir())
    assert ctl.run("verify", ready, patch, "--transaction", applied).status == 2
    assert ctl.document("verify", ready, patch)["differences"] == []
