"""What the engine's own tools say of the collection: linter, sanity tests, documentation, installation."""

import json
import os
import re
import shutil
import subprocess
import tarfile
from pathlib import Path

import pytest

from modules import COLLECTION

CHECKOUT = COLLECTION.parents[2]
SANITY = Path(__file__).resolve().parent / "sanity.py"
PYTHON = "3.11"  # Debian 12's


@pytest.fixture
def place(scratch):
    """A HOME, and a copy of the collection in a tree that the engine knows; the checkout is not written to."""
    tree = scratch / "collections/ansible_collections/orv/patch"
    shutil.copytree(COLLECTION, tree, ignore=shutil.ignore_patterns("__pycache__", "*.pyc", ".*"))
    (scratch / "home").mkdir()
    return tree


def run(place, *words, status=0, cwd=None, **variables):
    scratch = next(one for one in place.parents if one.name == "collections").parent
    kept = {name: value for name, value in os.environ.items() if not name.startswith("ANSIBLE_")}
    environment = {
        **kept,
        "HOME": str(scratch / "home"),
        "LC_ALL": "C.UTF-8",
        "ANSIBLE_COLLECTIONS_PATH": str(scratch / "collections"),
        "PYTHONDONTWRITEBYTECODE": "1",
        **variables,
    }
    done = subprocess.run(
        [str(word) for word in words],
        cwd=cwd or place,
        env=environment,
        stdin=subprocess.DEVNULL,
        capture_output=True,
        text=True,
        check=False,
    )
    assert done.returncode == status, (done.returncode, done.stdout, done.stderr)
    return done.stdout


def lint(place, status=0):
    return run(place, "ansible-lint", "--offline", "--nocolor", "--profile", "production", status=status)


def test_the_linter_finds_nothing_by_its_strictest_profile(place):
    lint(place)


def test_the_linter_finds_what_is_put_in(place):
    with open(place / "roles/fixpack/tasks/stop.yml", "a", encoding="utf-8") as tasks:
        tasks.write("\n- shell: ls\n")
    assert "no-changed-when" in lint(place, status=2)


@pytest.mark.parametrize(
    "tests",
    [
        ["validate-modules", "ansible-doc"],
        ["import", "compile", "pep8", "yamllint", "shebang", "line-endings", "runtime-metadata", "action-plugin-docs"],
        [
            "empty-init",
            "ignores",
            "no-assert",
            "no-illegal-filenames",
            "no-main-display",
            "no-smart-quotes",
            "symlinks",
        ],
        ["future-import-boilerplate", "metaclass-boilerplate", "no-unicode-literals", "use-argspec-type-path"],
        ["pylint"],
    ],
    ids=lambda tests: tests[0],
)
def test_sanity(place, tests):
    words = [word for test in tests for word in ("--test", test)]
    printed = run(place, "/usr/bin/python3", SANITY, *words, "--python", PYTHON)
    assert "skip" not in printed.lower()


def test_sanity_finds_what_is_put_in(place):
    module = place / "plugins/modules/undone.py"
    module.write_text(module.read_text().replace("short_description:", "short_descripion:", 1))
    run(place, "/usr/bin/python3", SANITY, "--test", "validate-modules", "--python", PYTHON, status=1)


# --- the archive ---


def archive(folder, checkout=CHECKOUT, umask=0o022, **variables):
    """Builds the archive in a new folder."""
    folder.mkdir()
    environment = {**os.environ, "SOURCE_DATE_EPOCH": "1773075852", **variables}
    subprocess.run([checkout / "packaging/collection", folder], env=environment, check=True, umask=umask)
    (made,) = folder.iterdir()
    return made


def test_the_archive_depends_on_nothing_but_the_tree(scratch):
    first = archive(scratch / "one")
    other = scratch / "another place"
    for name in ("fleet", "packaging/collection", "packaging/version", "CMakeLists.txt"):
        source, target = CHECKOUT / name, other / name
        target.parent.mkdir(parents=True, exist_ok=True)
        if source.is_dir():
            shutil.copytree(source, target, copy_function=shutil.copy, ignore=shutil.ignore_patterns("__pycache__"))
        else:
            shutil.copy(source, target)
    (other / "VERSION").write_text(
        subprocess.run([CHECKOUT / "packaging/version"], check=True, capture_output=True, text=True).stdout
    )
    second = archive(scratch / "two", other, umask=0o077, TZ="Asia/Tokyo", LC_ALL="tr_TR.UTF-8")
    assert first.name == second.name
    assert first.read_bytes() == second.read_bytes()
    with tarfile.open(first) as opened:
        members = opened.getmembers()
    assert {(one.uid, one.gid, one.uname, one.gname, one.mtime) for one in members} == {(0, 0, "", "", 1773075852)}
    assert {one.mode for one in members} <= {0o644, 0o755}
    names = [one.name for one in members]
    assert names[:2] == ["MANIFEST.json", "FILES.json"] and names[2:] == sorted(names[2:])
    assert not [name for name in names if name.endswith((".pyc", ".gz")) or "/." in name]


def test_the_version_is_the_one_of_all_packages():
    announced = re.search(r"project\(orvpatch VERSION ([\d.]+)", (CHECKOUT / "CMakeLists.txt").read_text()).group(1)
    assert f"\nversion: {announced}\n" in (COLLECTION / "galaxy.yml").read_text()
    assert f"\n## {announced}\n" in (COLLECTION / "CHANGELOG.md").read_text()
    for page in (CHECKOUT / "README.md", COLLECTION / "README.md"):
        assert f"ansible-galaxy collection install orv-patch-{announced}.tar.gz\n" in page.read_text()


def test_the_example_of_an_inventory_gives_every_host_a_home(place):
    example = CHECKOUT / "fleet/inventory.example.yml"
    run(place, "yamllint", "--strict", "-d", "relaxed", example)
    hosts = json.loads(run(place, "ansible-inventory", "-i", example, "--list"))["_meta"]["hostvars"]
    assert {name: one["fixpack_home"] for name, one in hosts.items()} == {
        "monitor1.example.com": "/opt/orv",
        "monitor2.example.com": "/srv/orv",
    }


DOCUMENTED = {
    "module": ["applied", "home_info", "report", "undone"],
    "filter": ["document", "entry", "is_bad"],
    "lookup": ["source"],
    "role": ["fixpack"],
}


def test_the_archive_is_installed_and_documented_offline(place, scratch):
    shutil.rmtree(place)
    made = archive(scratch / "made")
    collections = scratch / "collections"
    run(place, "ansible-galaxy", "collection", "install", "--offline", made, "-p", collections, cwd=scratch)
    run(place, "ansible-galaxy", "collection", "verify", "--offline", "orv.patch", "-p", collections, cwd=scratch)
    for kind, names in DOCUMENTED.items():
        listed = json.loads(run(place, "ansible-doc", "--json", "-t", kind, "--list", "orv.patch", cwd=scratch))
        assert sorted(listed) == [f"orv.patch.{name}" for name in names]
        for name in names:
            shown = run(place, "ansible-doc", "-t", kind, f"orv.patch.{name}", cwd=scratch)
            assert len(shown.splitlines()) > 10
    playbooks = sorted(path.stem for path in (place / "playbooks").iterdir())
    assert playbooks == ["check", "report", "rollout", "undo"]
    for name in playbooks:
        run(place, "ansible-playbook", "--syntax-check", "-i", "localhost,", f"orv.patch.{name}", cwd=scratch)


def test_the_roles_documented_variables_are_those_that_have_defaults(place):
    """For modules, validate-modules compares documentation and code."""
    read = "import sys, json, yaml; print(json.dumps(yaml.safe_load(open(sys.argv[1]))))"
    specs, defaults = (
        json.loads(run(place, "/usr/bin/python3", "-c", read, place / "roles/fixpack" / name))
        for name in ("meta/argument_specs.yml", "defaults/main.yml")
    )
    options = specs["argument_specs"]["main"]["options"]
    required = {name for name, option in options.items() if option.get("required")}
    assert set(options) == set(defaults) | required
    assert {name: option["default"] for name, option in options.items() if name not in required} == defaults
    entries = {path.stem for path in (place / "roles/fixpack/tasks").iterdir()}
    assert set(specs["argument_specs"]) < entries
