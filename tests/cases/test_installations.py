"""Installations that succeed: the order of their steps, what they change and what they leave alone."""

import os
import pwd
import re

import pytest

from support import Patch
from support.catalogue import text

HISTORY_HEADER = (
    "#" * 80 + "\n"
    "# Norvik Veyra Monitoring Patch History File\n"
    "#\n"
    "# Format: <Product Code> | <Architecture> | <Comp> | <Patch Name> | PASS/FAIL | <user> | <date>\n"
    + "#" * 80
    + "\n"
)
RESULT_FILE = "vmaorv6/agentdepot/rc.txt"
VERSION_FILE = "registry/ynlpp266.ver"
HISTORY_FILE = "patchlogs/patches.hist"


def version_file(code, level):
    """What `home.component` has written, after a patch of this level: it ends in one empty line."""
    return f"desc = Sample product {code}\nVRMF = {level}\n\n".encode()


def test_the_steps_come_in_their_order(site):
    home = site.home
    for code in ("ox", "ul", "yn"):
        home.component(code)
    for code, name in [("yn", "two"), ("ox", ""), ("ul", ""), ("yn", "one")]:
        home.start(code, name)
    home.write("bin/tool", "old\n")
    home.watch("bin/tool", VERSION_FILE, RESULT_FILE, HISTORY_FILE)
    patch = (
        Patch("yn", level="06100203", dependents=["ul", "ox"])
        .file("bin/tool", "new\n")
        .script("1_first.sh", when="pre_patch")
        .script("2_second.sh", when="pre_patch")
        .script("3_stopped.sh", when="pre")
        .script("4_moved.sh", when="post")
    )
    assert site.install(patch) == site.done()

    before = {"bin/tool": b"old\n", VERSION_FILE: b"desc = Sample product yn\nVRMF = 06100000\n"}
    moved = {**before, "bin/tool": b"new\n"}
    recorded = {**moved, VERSION_FILE: version_file("yn", "06100203")}
    assert [(str(call), call.seen) for call in home.journal()] == [
        ("1_first.sh", before),
        ("2_second.sh", before),
        ("QuillAgent stop ox", before),  # in the order of the descriptor, its own product last
        ("QuillAgent stop ul", before),
        ("QuillAgent -o two stop yn", before),  # instances in the order of the run information
        ("QuillAgent -o one stop yn", before),
        ("3_stopped.sh", before),
        ("4_moved.sh", moved),
        ("QuillAgent start ul", recorded),  # in the order of product codes
        ("QuillAgent -o two start yn", recorded),
        ("QuillAgent -o one start yn", recorded),
        ("QuillAgent start ox", {**recorded, RESULT_FILE: b"0"}),  # the OS agent last, told the outcome
    ]
    assert home.instances() == [("ox", ""), ("ul", ""), ("yn", "one"), ("yn", "two")]
    assert [entry.result for entry in home.history()] == ["PASS"]
    assert site.changes() == ["* bin/tool", f"+ {HISTORY_FILE}", f"* {VERSION_FILE}", f"+ {RESULT_FILE}"]


def test_where_and_with_what_environment_each_call_runs(site):
    site.home.component("ox")
    site.home.start("ox")
    patch = Patch("ox").script("1.sh", when="pre_patch").script("2.sh", when="pre").script("3.sh", when="post")
    site.install(patch, cwd=site.patch_dir, env={"PATH": "/usr/bin:/bin"})
    temp, own = f"{site.home.prefix}tmp/kox", str(site.patch_dir)
    in_temp, outside = (temp, f"{temp}:/usr/bin:/bin"), (own, "/usr/bin:/bin")
    assert [(call.program, call.cwd, call.path) for call in site.home.journal()] == [
        ("1.sh", *in_temp),
        ("QuillAgent", *outside),
        ("2.sh", *in_temp),
        ("3.sh", *in_temp),
        ("QuillAgent", *outside),
    ]
    assert {call.quillhome for call in site.home.journal()} == {site.home.prefix}


def test_a_command_may_call_what_was_shipped_beside_it(site):
    site.home.component("ox")
    patch = Patch("ox").script("main.sh", when="post", body="helper.sh").script("helper.sh", out="help")
    assert site.install(patch) == site.done()
    assert site.home.calls() == ["main.sh", "helper.sh"]
    assert "stdOut: help" in site.logged("TRACE")


def test_identical_commands_are_one_and_run_in_sorted_order(site):
    site.home.component("ox")
    patch = Patch("ox", pre=["b", "B", "b", "a"])
    for name in ("a", "b", "B"):
        patch.script(name)
    assert site.install(patch) == site.done()
    assert site.home.calls() == ["B", "a", "b"]
    assert site.logged("INFO")[:-1] == [
        text("PP_SCRIPT_COUNT", 3),
        *[line for name in "Bab" for line in (text("PP_PROCESS_SCRIPT", name), text("PP_SCRIPT_COMPLETE", name))],
        text("PP_NO_FILES"),
    ]


# --- files ---------------------------------------------------------------------------------------------


def test_files_arrive_with_their_directories(site):
    site.home.component("ox")
    patch = Patch("ox").file("new/deep/er/file", "content", mode=0o600).file("bin/tool", mode=0o4711).directory("empty")
    assert site.install(patch) == site.done()
    assert site.changes() == [
        "+ bin/tool",
        "+ empty",
        "+ new",
        "+ new/deep",
        "+ new/deep/er",
        "+ new/deep/er/file",
        f"+ {HISTORY_FILE}",
        "* registry/oxlpp266.ver",
    ]
    tree = site.home.tree()
    assert tree["new/deep/er/file"] == ("file", 0o755, os.getuid(), os.getgid(), b"content", 1)
    assert tree["bin/tool"].mode == 0o755
    assert {tree[path].mode for path in ("empty", "new", "new/deep", "new/deep/er")} == {0o777}
    made = {f"{site.home.prefix}./{path}/" for path in ("empty", "new", "new/deep", "new/deep/er")}
    assert {line for line in site.logged("INFO") if line.startswith(text("PP_MAKE_DIR", ""))} == {
        text("PP_MAKE_DIR", path) for path in made
    }


@pytest.mark.parametrize("mode", [0o640, 0o400, 0o4755, 0o1777])
def test_a_replaced_file_keeps_its_mode(site, mode):
    site.home.component("ox")
    site.home.write("bin/tool", "old", mode)
    assert site.install(Patch("ox").file("bin/tool", "new")) == site.done()
    entry = site.home.tree()["bin/tool"]
    assert (entry.mode, entry.content, entry.links) == (mode, b"new", 1)


@pytest.mark.needs_root
def test_a_replaced_file_keeps_its_owner_and_group(site):
    site.home.component("ox")
    os.chown(site.home.write("bin/tool", "old", 0o750), 1234, 4321)
    assert site.install(Patch("ox").file("bin/tool", "new").file("bin/new")) == site.done()
    tree = site.home.tree()
    assert tree["bin/tool"][1:5] == (0o750, 1234, 4321, b"new")
    assert tree["bin/new"][1:5] == (0o755, 0, 0, b"new\n")


def test_a_link_in_the_way_is_replaced_not_followed(site):
    site.home.component("ox")
    site.home.write("bin/real", "kept")
    (site.home.path / "bin/tool").symlink_to("real")
    assert site.install(Patch("ox").file("bin/tool", "new")) == site.done()
    tree = site.home.tree()
    assert (tree["bin/tool"].kind, tree["bin/tool"].content, tree["bin/real"].content) == ("file", b"new", b"kept")


def test_each_moved_file_is_logged_as_information(site):
    site.home.component("ox")
    site.home.write("bin/tool", "old")
    site.install(Patch("ox").file("bin/new/file").file("bin/tool"))
    home, sources = site.home.prefix, f"{site.home.prefix}tmp/kox/updated_files"
    assert site.logged("INFO")[:-1] == [
        text("PP_MOVE_FILES", sources, home),
        text("PP_MAKE_DIR", f"{home}./bin/new/"),
        text("PP_MOVE_FILE", f"{sources}/./bin/new/file", f"{home}./bin/new/file"),
        text("PP_MOVE_FILE", f"{sources}/./bin/tool", f"{home}./bin/tool"),
    ]


def test_a_patch_may_be_applied_again(site):
    site.home.component("ox")
    path = site.target(Patch("ox", level="06100000").file("bin/tool"))
    assert site.install(path) == site.install(path) == site.done()
    assert site.changes() == ["* patchlogs/patches.hist"]
    assert site.home.read("registry/oxlpp266.ver") == version_file("ox", "06100000")


def test_a_patch_without_files_is_applied(site):
    site.home.component("ox")
    assert site.install(Patch("ox")) == site.done()
    assert text("PP_NO_FILES") in site.logged("INFO")
    assert site.changes() == [f"+ {HISTORY_FILE}", "* registry/oxlpp266.ver"]


def test_an_archive_may_name_its_members_with_a_dot(site):
    # tar takes "patch.ini" for the name of a member, and "./patch.ini" is another name.
    site.home.component("ox")
    path = Patch("ox").file("bin/tool").write(site.patch_dir, dotted=True)
    assert site.install(path) == site.failed(3, text("PROC_BAD_RC", "tar -xf", 2))


# --- records -------------------------------------------------------------------------------------------


def test_the_history_begins_with_a_header(site):
    site.home.component("ox")
    site.install(Patch("ox", name="OX 1"))
    site.install(Patch("ox", name="a name of more than twenty characters"))
    user = pwd.getpwuid(os.getuid()).pw_name
    text_of_history = site.home.read(HISTORY_FILE).decode()
    assert re.sub(r"\d\d/\d\d/\d{4} \d\d:\d\d:\d\d\n", "DATE\n", text_of_history) == (
        HISTORY_HEADER
        + f"kox | lpp266 | vema | {'OX 1':20} | PASS | {user:15} | DATE\n"
        + f"kox | lpp266 | vema | a name of more than twenty characters | PASS | {user:15} | DATE\n"
    )


def test_a_history_that_has_something_gets_no_header(site):
    site.home.component("ox")
    site.home.write(HISTORY_FILE, "x")
    site.install(Patch("ox"))
    assert re.fullmatch(
        rb"xkox \| lpp266 \| vema \| kox_fp0001           \| PASS \| \w+ +\| .{19}\n", site.home.read(HISTORY_FILE)
    )


def test_a_history_that_cannot_be_written_is_only_logged(site):
    site.home.component("ox")
    site.home.mkdir(HISTORY_FILE)
    assert site.install(Patch("ox")) == site.done()
    assert site.logged("ERROR") == [text("ERROR_PP_UPDATE_HIST", f"{site.home.prefix}{HISTORY_FILE}", "Is a directory")]


def test_each_level_line_of_the_version_file_is_replaced(site):
    site.home.write(
        "registry/oxlpp266.ver", "a\r\nVRMF = 06100000\n\nVRMF_old\nthe VRMF = 1\n VRMF = 2\ndesc=d\nVRMF=06100000\nb"
    )
    site.home.start("ox")
    assert site.install(Patch("ox", level="06109999")) == site.done()
    assert site.home.read("registry/oxlpp266.ver") == (
        b"a\nVRMF = 06109999\nVRMF = 06109999\nthe VRMF = 1\n VRMF = 2\ndesc=d\nVRMF = 06109999\nb\n"
    )


def test_the_version_file_of_another_user_keeps_its_owner_and_mode(site):
    site.home.component("ox").chmod(0o664)
    before = site.home.tree()["registry/oxlpp266.ver"]
    site.install(Patch("ox"))
    assert site.home.tree()["registry/oxlpp266.ver"][1:4] == before[1:4]


@pytest.mark.parametrize(
    "code, target, filename",
    [
        ("qa", "vems", "qalpp266.ver"),
        ("pt", "veps", "ptlpp266.ver"),
        ("dk", "vepd", "dklpp266.ver"),
        ("zt", "vecm", "ztlpp266.ver"),
        ("ox", "vema", "oxlpp266.ver"),
    ],
)
def test_which_version_file_is_written(site, code, target, filename):
    site.home.component(code)
    assert site.install(Patch(code, target=target)) == site.done()
    assert site.changes() == [f"+ {HISTORY_FILE}", f"* registry/{filename}"]
    assert [entry[:6] for entry in site.home.history()] == [
        (f"k{code}", "lpp266", target, f"k{code}_fp0001", "PASS", pwd.getpwuid(os.getuid()).pw_name)
    ]


def test_the_command_line_component_is_recorded_under_its_own_name(site):
    # KEEP(vecm-zt-file): whatever product the patch is for, the level is written to the "zt" file.
    site.home.component("zt")
    site.home.component("ox")
    patch = Patch("ox", target="vecm", code="zt")
    assert site.install(patch) == site.done()
    assert site.home.level("zt") == "06100100" and site.home.level("ox") == "06100000"
    assert [entry.product for entry in site.home.history()] == ["kzt"]


def test_a_unix_patch_applies_everywhere(site):
    site.home.component("ox", arch="unix")
    assert site.install(Patch("ox", platform="unix").file("bin/tool")) == site.done()
    assert site.changes() == ["+ bin/tool", f"+ {HISTORY_FILE}", "* registry/oxunix.ver"]


def test_a_named_product_executable_is_not_copied(site):
    site.home.component("ox")
    site.home.write("vmaorv6/KOX_copy.EXE", "old")
    assert site.install(Patch("ox", exe="kox.exe").file("vmaorv6/kox.exe")) == site.done()
    assert site.home.read("vmaorv6/KOX_copy.EXE") == b"old"
