"""What orvpatch(8) says under "Before you patch": each danger, tried out."""

import os
import signal

import pytest

from support import Patch, ProductHome, remove_tree, stubs
from support.catalogue import text

from productsite import Running, Site


# --- the path of the home -----------------------------------------------------------------------------------


@pytest.fixture
def site_at(program, patch_dir, scratch):
    """A function that makes a site whose home has this path below a scratch folder."""
    made = []

    def make(name):
        made.append(ProductHome(scratch / name))
        for code in ("ox", "yn", "zt"):
            made[-1].component(code)
        return Site(made[-1], program, patch_dir)

    yield make
    for home in made:
        home.close()


def test_a_relative_home_leaves_a_tree_that_fails_the_next_runs(site_at):
    site = site_at("home")
    site.home.start("yn")
    path = site.target(Patch("yn").file("bin/tool"))
    result = site.program.run("-h", "home", "-i", path, cwd=site.home.path.parent)
    assert result.status in (25, 26)  # by the order of the listing
    assert site.home.calls() == ["QuillAgent stop yn"]
    assert not site.home.exists("bin/tool") and site.home.level("yn") == "06100000"
    assert site.program.install(site.home, path).status == 26
    remove_tree(site.home.path / "tmp/kyn")
    assert site.program.install(site.home, path).status == 0


def test_a_point_as_home_loses_the_new_files(site_at):
    site = site_at("home")
    path = site.target(Patch("yn").file("bin/tool"))
    assert site.run("-h", ".", "-i", path, cwd=site.home.path).status == 25
    assert [path for path in site.home.tree() if path.endswith("tool")] == []


def test_a_relative_home_ends_at_the_first_command(site_at):
    site = site_at("home")
    path = site.target(Patch("yn").file("bin/tool").script("a.sh", "pre_patch"))
    assert site.run("-h", "home", "-i", path, cwd=site.home.path.parent).status == 22
    assert site.home.calls() == []


@pytest.mark.parametrize("name, status", [("home", 37), ("a b", 0), ("grep", 0), ("a$b", 0), ("a;b", 0)])
def test_a_running_console_is_seen_in_a_plain_home_only(site_at, name, status):
    site = site_at(name)
    site.home.start_console()
    assert site.install(Patch("zt", target="vecm").file("bin/tool")).status == status


@pytest.mark.parametrize("name, status", [("h0me_a-b.c", 0), ("a b", 12), ("a$b", 12), ("a;b", 12), ("a'b", 12)])
def test_an_agent_is_started_again_in_a_plain_home_only(site_at, name, status):
    site = site_at(name)
    site.home.start("yn")
    assert site.install(Patch("yn").file("bin/tool")).status == status
    assert site.home.instances() == ([("yn", "")] if status == 0 else [])


@pytest.mark.needs_root
@pytest.mark.parametrize("name", ["home", "grep"])
def test_a_home_called_grep_hides_the_owner_of_an_agent(site_at, other_owner, name):
    site = site_at(name)
    site.home.start("yn", user=other_owner.uid)
    assert site.install(Patch("yn").file("bin/tool"), wrapper=other_owner.wrapper) == site.done()
    started = site.home.journal()[-1]
    assert (str(started), started.user) == ("QuillAgent start yn", "root" if name == "grep" else other_owner.name)


def test_a_colon_in_the_home_hides_the_commands_of_a_patch(site_at):
    site = site_at("a:b")
    assert site.install(Patch("yn").script("a.sh", "pre")) == site.failed(21, text("PROC_BAD_RC", "a.sh", 2))


# --- the patches --------------------------------------------------------------------------------------------


@pytest.fixture
def site(site):
    for code in ("ox", "ul", "yn"):
        site.home.component(code)
    return site


NAMES = [{"product": "KYN", "code": "kyn"}, {"product": "kul", "code": "kyn"}, {"product": "KYN", "code": "KYN"}]


@pytest.mark.parametrize("names", NAMES, ids=str)
def test_a_file_name_of_another_product_than_the_descriptors_installs_no_file(site, names):
    patch = Patch(**names).file("bin/tool")
    assert site.install(patch) == site.done()
    assert not site.home.exists("bin/tool")
    assert site.home.level("yn") == "06100100"
    assert [line.result for line in site.home.history()] == ["PASS"]


@pytest.mark.parametrize("names", NAMES, ids=str)
def test_or_those_that_an_earlier_patch_left_in_tmp(site, names):
    assert site.install(Patch("yn").file("bin/tool", "first").script("a.sh", "pre", status=1)).status == 21
    assert (
        site.install(Patch(**names, fixpack="fp0002").file("bin/tool", "second").write(site.patch_dir)) == site.done()
    )
    assert site.home.read("bin/tool") == b"first"
    assert [line.result for line in site.home.history()] == ["FAIL", "PASS"]


@pytest.mark.parametrize("action", ["-i", "-t"])
def test_a_patch_file_below_tmp_is_removed(site, action):
    path = Patch("yn").file("bin/tool").write(site.home.mkdir("tmp/kyn"))
    result = site.run("-h", site.home, action, path)
    assert not path.exists()
    assert result.status == 3


def test_what_else_lies_below_tmp_of_the_product_is_removed(site):
    site.home.write("tmp/kyn/notes")
    assert site.report(Patch("yn").directory()).status == 0
    assert not site.home.exists("tmp/kyn")


def test_the_archive_is_read_twice(site):
    first = Patch("yn").file("bin/tool", "checked").write(site.patch_dir)
    other = Patch("yn", level="06100200").file("bin/tool", "exchanged").write(site.home.mkdir("tmp/other"))
    swap = f'PATH=${{PATH#*:}}; tar "$@"; status=$?; [ $# = 2 ] || cp {other} {first}; exit $status'
    site.env["PATH"] = stubs(site.patch_dir.parent / "stubs", tar=swap)
    assert site.install(first) == site.done()
    assert site.home.read("bin/tool") == b"exchanged"
    assert site.home.level("yn") == "06100100"


def two_fix_packs(site, **second):
    """Two of one product in a directory; returns those of the older and the newer level."""
    patches = [
        Patch("yn", fixpack="fp0001", level="06100001").file("bin/tool", "older"),
        Patch("yn", fixpack="fp0002", level="06100002", **second).file("bin/tool", "newer"),
    ]
    site.target(*patches)
    return patches


def test_two_fix_packs_of_one_product_end_on_the_one_that_is_listed_last(site):
    patches = two_fix_packs(site)
    last = [patch for name in site.listed() for patch in patches if patch.filename == name][-1]
    assert site.install(site.patch_dir) == site.done()
    assert site.home.level("yn") == last.level
    assert [line.result for line in site.home.history()] == ["PASS", "PASS"]


def test_a_directory_with_a_superseded_patch_is_refused_for_ever(site):
    older, newer = two_fix_packs(site)
    assert site.install(site.patch_dir / newer.filename) == site.done()
    result = site.install(site.patch_dir)
    first = site.listed()[0]
    assert result.status == (32 if first == older.filename else 11)
    (site.patch_dir / older.filename).unlink()
    assert site.install(site.patch_dir) == site.done()


def test_a_prerequisite_in_the_same_directory_does_not_count(site):
    site.target(
        Patch("ul", level="06100001").file("bin/ul"), Patch("yn", prereqs={"ul": "06.10.00.01"}).file("bin/tool")
    )
    result = site.install(site.patch_dir)
    assert result.status in (10, 32)  # by the order of the listing
    assert site.home.level("ul") == "06100000"
    assert site.install(site.patch_dir / "kul_lpp266_vema_fp0001.tar") == site.done()
    assert site.install(site.patch_dir) == site.done()


# --- the run ------------------------------------------------------------------------------------------------


def test_an_agent_that_ps_hides_is_not_stopped(site):
    site.home.start("yn")
    site.env["PATH"] = stubs(site.patch_dir.parent / "stubs", ps="exit 1")
    assert site.install(Patch("yn").file("bin/tool")) == site.done()
    assert site.home.calls() == []
    assert site.home.instances() == [("yn", "")]


@pytest.mark.needs_root
def test_an_agent_whose_line_is_missing_is_started_as_root(site, other_owner):
    site.home.start("yn", user=other_owner.uid)
    site.env["PATH"] = stubs(site.patch_dir.parent / "stubs", ps='[ "$1" = -p ] && echo "$2"')
    assert site.install(Patch("yn").file("bin/tool"), wrapper=other_owner.wrapper) == site.done()
    assert site.home.journal()[-1].user == "root"


def test_a_killed_tar_counts_as_a_whole_archive(site):
    killed = 'PATH=${PATH#*:}; [ $# = 2 ] || exec tar "$@"; tar "$@" updated_files/bin/first; kill -9 $$'
    site.env["PATH"] = stubs(site.patch_dir.parent / "stubs", tar=killed)
    assert site.install(Patch("yn").file("bin/first").file("bin/second")) == site.done()
    assert site.home.exists("bin/first") and not site.home.exists("bin/second")
    assert site.home.level("yn") == "06100100"
    assert [line.result for line in site.home.history()] == ["PASS"]


@pytest.mark.needs_root
def test_a_user_who_may_run_the_program_as_root_is_root(site, scratch):
    home = ProductHome(scratch / "own")
    home.component("yn")
    home.write("bin/QuillAgent", '#!/bin/sh\nid -u >"${0%/bin/*}/who"\n', 0o755)
    home.add_row("yn", os.getpid())
    home.give_to("nobody")
    assert site.run("-h", home, "-i", site.target(Patch("yn").file("bin/tool"))).status == 0
    assert home.read("who") == b"0\n"
    home.close()


def test_of_two_runs_with_a_common_dependent_one_starts_it_while_the_other_patches(site):
    site.home.start("ul")
    first = Running(site, "yn", dependents=["ul"])
    second = Running(site, "ox", dependents=["ul"])
    assert first.finish() == 0
    assert site.home.instances() == [("ul", "")]  # and the files of the second are yet to be moved
    assert not site.home.exists("bin/ox")
    assert second.finish() == 0
    assert site.home.exists("bin/ox")


@pytest.mark.parametrize("sign", [signal.SIGINT, signal.SIGHUP])
def test_a_run_that_is_interrupted_leaves_the_agents_stopped(site, sign):
    site.home.start("yn")
    assert Running(site, "yn").interrupt(sign) == -sign
    assert site.home.instances() == [] and not site.home.exists("bin/yn")
    assert site.home.history() == []
