"""status: what is installed, what of it runs, what the last patches came to."""

import os
import pwd

import pytest

from support import Patch, stubs

USER = pwd.getpwuid(os.getuid()).pw_name


def components(document):
    return {(found["code"], found["kind"], found["platform"]): found for found in document["components"]}


def component(ctl, home, code="kyn"):
    return next(found for found in ctl.document("status", home)["components"] if found["code"] == code)


def test_every_kind_of_component(ctl, home):
    for code in ("yn", "qa", "pt", "dk", "zt"):
        home.component(code, level="06100002", desc=f"Product {code}")
    home.component("yn", filename="ynvms.ver")
    document = ctl.document("status", home)
    assert document["home"] == home.prefix
    assert document["leftovers"] == []
    assert set(components(document)) == {
        ("kyn", "agent", "lpp266"),
        ("kyn", "monitoring-server", "vms"),
        ("kqa", "monitoring-server", "lpp266"),
        ("kpt", "portal-server", "lpp266"),
        ("kdk", "desktop-client", "lpp266"),
        ("kzt", "cli", "lpp266"),
    }
    agent = components(document)["kyn", "agent", "lpp266"]
    assert agent == {
        "code": "kyn",
        "name": "Product yn",
        "kind": "agent",
        "level": "06.10.00.02",
        "platform": "lpp266",
        "instances": [],
        "lastPatch": None,
    }


def test_two_architectures_of_a_product_are_two_components(ctl, home):
    home.component("yn", level="06100000", arch="lpp266")
    home.component("yn", level="06200000", arch="lpp268")
    found = components(ctl.document("status", home))
    assert found["kyn", "agent", "lpp266"]["level"] == "06.10.00.00"
    assert found["kyn", "agent", "lpp268"]["level"] == "06.20.00.00"


def test_instances_of_agent_and_server(ctl, home):
    for code in ("yn", "qa"):
        home.component(code)
    home.start("yn")
    home.start("yn", "east")
    home.start("qa")
    home.start("yn", "gone")
    home.kill(home.pid("yn", "gone"))
    found = component(ctl, home)
    assert sorted(found["instances"], key=lambda instance: instance["name"]) == [
        {"name": "", "pid": home.pid("yn"), "user": USER},
        {"name": "east", "pid": home.pid("yn", "east"), "user": USER},
    ]
    assert [instance["pid"] for instance in component(ctl, home, "kqa")["instances"]] == [home.pid("qa")]


@pytest.mark.needs_root
def test_instances_of_several_owners(ctl, home):
    home.component("yn")
    home.start("yn", "mine")
    home.start("yn", "theirs", user="nobody")
    users = {instance["name"]: instance["user"] for instance in component(ctl, home)["instances"]}
    assert users == {"mine": USER, "theirs": "nobody"}


@pytest.mark.parametrize("number", (1, 30, 300))
def test_many_components(ctl, home, number):
    letters = "abcdefghijklmnopqrstuvwxyz"
    codes = sorted(
        f"{first}{second}"
        for first in letters
        for second in letters
        if f"{first}{second}" not in ("qa", "pt", "dk", "zt")
    )[:number]
    for code in codes:
        home.component(code)
    home.start(codes[-1])
    document = ctl.document("status", home)
    assert [found["code"] for found in document["components"]] == [f"k{code}" for code in codes]
    assert [found["code"] for found in document["components"] if found["instances"]] == [f"k{codes[-1]}"]


def test_the_last_patch_is_that_of_the_component(ctl, home, program, write):
    for code in ("yn", "ox"):
        home.component(code)
    assert component(ctl, home)["lastPatch"] is None
    good = write(Patch("yn", fixpack="fp0001", level="06100001", name="first").file("bin/tool"))
    assert program.install(home, good).status == 0
    assert component(ctl, home)["lastPatch"]["result"] == "PASS"
    bad = write(
        Patch("yn", fixpack="fp0002", level="06100002", name="second")
        .file("bin/tool")
        .script("fail.sh", when="pre", status=3)
    )
    assert program.install(home, bad).status == 21
    last = component(ctl, home)["lastPatch"]
    assert last == {"name": "second", "result": "FAIL", "time": home.history()[-1].date}
    assert component(ctl, home, "kox")["lastPatch"] is None


def test_a_patch_of_another_kind_or_architecture_is_not_the_component_s(ctl, home):
    home.component("yn")
    home.component("zt")
    home.write(
        "patchlogs/patches.hist",
        "".join(
            f"{product} | {arch} | {target} | {name:20} | PASS | root            | 03/09/2026 14:05:00\n"
            for product, arch, target, name in (
                ("kyn", "lpp268", "vema", "other arch"),
                ("kyn", "lpp266", "vems", "server's"),
                ("kyn", "lpp266", "vecm", "command line"),
            )
        ),
    )
    assert component(ctl, home)["lastPatch"] is None
    assert component(ctl, home, "kzt")["lastPatch"]["name"] == "command line"


def test_leftovers(ctl, home):
    for name in ("kyn", "kox", "other"):
        home.mkdir(f"tmp/{name}")
    assert ctl.document("status", home)["leftovers"] == ["tmp/kox", "tmp/kyn"]
    assert b"tmp/kyn" in ctl.run("status", home).out


def test_it_changes_nothing(ctl, home):
    home.component("yn")
    home.start("yn")
    before = home.tree()
    ctl.document("status", home)
    ctl.run("status", home)
    assert home.tree() == before


def test_on_a_terminal(ctl, home):
    home.component("yn", desc="Application \x1b[31mservers")
    home.start("yn", "east")
    out = ctl.run("status", home).out.decode()
    assert "\x1b" not in out
    lines = out.splitlines()
    assert lines[0] == home.prefix
    assert lines[2].split() == ["CODE", "KIND", "PLATFORM", "LEVEL", "RUNNING", "LAST", "PATCH", "NAME"]
    assert lines[3].endswith("Application \\x1B[31mservers")
    assert lines[6].split() == ["kyn", "east", str(home.pid("yn", "east")), USER]


def test_a_description_that_is_no_utf8(ctl, home):
    home.write("registry/ynlpp266.ver", b"desc = caf\xe9\\\nVRMF = 06100000\n")
    assert component(ctl, home)["name"] == "caf\\xE9\\\\"


@pytest.mark.parametrize("words", (["status"], ["status", "/nowhere/at/all"]))
def test_without_a_home(ctl, words):
    result = ctl.run(*words)
    assert result.status == 2
    assert result.out == b""
    assert result.err != b""


def test_a_home_without_a_registry_cannot_be_judged(ctl, scratch):
    result = ctl.run("status", scratch, "--json")
    assert (result.status, result.out) == (2, b"")
    assert b"registry" in result.err


def test_a_ps_that_does_not_work_cannot_be_judged(ctl, home, scratch):
    home.component("yn")
    home.start("yn")
    result = ctl.run("status", home, env={"PATH": stubs(scratch / "bin", ps="exit 1")})
    assert (result.status, result.out) == (2, b"")
    assert b"ps" in result.err
