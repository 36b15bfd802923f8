"""Every rule of lint, by a patch that breaks it alone, and by the installer that comes to harm."""

import json

import pytest

from lintcases import CASES, Stage

cases = pytest.mark.parametrize("case", CASES, ids=[f"{case.rule}-{number}" for number, case in enumerate(CASES)])


@pytest.fixture(scope="module")
def rules(program):
    """The table of the program: name of a rule -> what --explain tells of it."""
    from conftest import Ctl  # pylint: disable=import-outside-toplevel

    table = json.loads(Ctl(program).run("lint", "--explain", "all", "--json").out)["rules"]
    return {rule["rule"]: rule for rule in table}


def test_every_rule_has_a_case(rules):
    assert set(rules) == {case.rule for case in CASES}


@cases
def test_it_is_found_by_its_rule_and_by_no_other(ctl, patch_dir, rules, case):
    path = case.make(patch_dir)
    severity = rules[case.rule]["severity"]
    document = ctl.document("lint", path, status=1 if severity == "error" else 0)
    assert {finding["rule"] for finding in document["findings"]} == {case.rule}, document["findings"]
    assert {finding["severity"] for finding in document["findings"]} == {severity}
    assert all(finding["remedy"] == rules[case.rule]["remedy"] for finding in document["findings"])
    assert ctl.document("lint", "--strict", path, status=1) == document


@cases
def test_the_installer_comes_to_that_harm(home, program, patch_dir, case):
    home.component("ox")
    for file in case.options.get("files", ()):
        home.write(file)
    case.harm(Stage(home, program, case.make(patch_dir)))
