"""Every claim of SECURITY.md, tried out: what other users can make of a run, and what prevents it."""

import os
import struct
import subprocess
import threading
import time
from pathlib import Path

import pytest

from rawarchive import RawArchive
from support import Patch, stubs
from verdicts import INSTALLED, refused

NOBODY = 65534


def as_nobody(script, *arguments, **options):
    return subprocess.Popen(
        ["/bin/sh", "-c", script, "sh", *map(str, arguments)],
        cwd="/",
        user="nobody",
        group=NOBODY,
        extra_groups=[],
        stdin=subprocess.DEVNULL,
        stdout=subprocess.DEVNULL,
        stderr=subprocess.DEVNULL,
        **options,
    )


def await_file(path, seconds=30):
    limit = time.monotonic() + seconds
    while not path.exists():
        assert time.monotonic() < limit, f"{path} does not come"
        time.sleep(0.01)


# --- write access that gives the rights of the user who patches ---------------------------------------------------------


@pytest.mark.needs_root
@pytest.mark.parametrize("when", ["pre_patch", "pre", "post"])
def test_the_commands_of_an_archive_run_as_the_user_who_patches(program, product, patch_dir, when):
    archive = Patch("ox").script("who.sh", when, body='id -u >"$QUILLHOME/who"').write(patch_dir)
    assert program.install(product, archive) == INSTALLED
    assert product.read("who") == b"0\n"


def test_a_report_runs_no_command_of_the_archive(program, product, patch_dir):
    patch = Patch("ox").file("bin/tool")
    for when in ("pre_patch", "pre", "post"):
        patch.script(f"{when}.sh", when, body='touch "$QUILLHOME/ran"')
    assert program.report(product, patch.write(patch_dir)).status == 0
    assert not product.exists("ran")
    assert product.calls() == []


@pytest.mark.needs_root
def test_the_control_scripts_stop_as_the_user_who_patches_even_the_agents_of_others(program, product, patch_dir):
    product.give_to("nobody")
    product.start("ox", user="nobody")
    product.write("bin/QuillAgent", '#!/bin/sh\nid -u >"${0%/bin/*}/who"\n', 0o755)
    os.chown(product.path / "bin/QuillAgent", NOBODY, NOBODY)
    program.install(product, Patch("ox").file("bin/tool").write(patch_dir))
    assert product.read("who").split()[0] == b"0"


@pytest.mark.parametrize("name", ["orvpatch.log", "patches.hist"])
def test_log_and_history_are_written_through_links(program, product, patch_dir, scratch, name):
    (scratch / "foreign").write_text("first\n")
    os.symlink(scratch / "foreign", product.path / "patchlogs" / name)
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    assert (scratch / "foreign").read_bytes().startswith(b"first\n")
    assert (scratch / "foreign").stat().st_size > len("first\n")


@pytest.mark.needs_root
def test_a_report_makes_set_id_files_for_its_duration(program, product, patch_dir, scratch):
    archive = RawArchive(Patch("ox")).file("updated_files/tool", mode=0o6755, uid=NOBODY).write(patch_dir)
    look = 'PATH=${PATH#*:}; tar "$@"; status=$?; stat -c "%a %u" updated_files/tool; exit $status'
    path = stubs(scratch / "bin", tar=look)
    assert program.report(product, archive, env={"PATH": path}).status == 0
    assert f"stdout: 6755 {NOBODY}\n" in product.log().messages("TRACE", "patchprocessor")
    assert not product.exists("tmp/kox")


def test_descriptors_of_the_caller_are_open_in_every_child_unless_closed(program, product, patch_dir):
    product.start("ox")
    archive = (
        Patch("ox").script("a.sh", "pre", body='[ ! -e /proc/self/fd/9 ] || touch "$QUILLHOME/open"').write(patch_dir)
    )
    assert program.install(product, archive, wrapper=["sh", "-c", 'exec "$@" 9</dev/null', "sh"]) == INSTALLED
    assert product.exists("open")
    product.remove("open")
    closed = ["sh", "-c", 'exec 9</dev/null; exec "$@" 9<&-', "sh"]
    assert program.install(product, archive, wrapper=closed) == INSTALLED
    assert not product.exists("open")


# --- the temporary directory -------------------------------------------------------------------------------

REPLACE = """
while [ ! -e "$1/waiting" ]; do sleep 0.02; done
printf '#!/bin/sh\\nid -u >"$QUILLHOME/mark"\\n' >"$1/tmp/kox/mine" && chmod 755 "$1/tmp/kox/mine" &&
  mv -f "$1/tmp/kox/mine" "$1/tmp/kox/2_next.sh"
"""


@pytest.mark.needs_root
@pytest.mark.parametrize("mode, taken_over", [(0o755, True), (0o777, True), (0o1777, True), (0o700, False)])
def test_a_user_who_may_enter_tmp_can_replace_a_command_that_runs_next(program, product, patch_dir, mode, taken_over):
    product.mkdir("tmp", mode)
    archive = (
        Patch("ox")
        .script(
            "1_wait.sh",
            "pre_patch",
            body='touch "$QUILLHOME/waiting"; while [ ! -e "$QUILLHOME/go" ]; do sleep 0.02; done',
        )
        .script("2_next.sh", "pre_patch", body='echo harmless >"$QUILLHOME/mark"')
        .write(patch_dir)
    )
    results = []
    running = threading.Thread(target=lambda: results.append(program.install(product, archive)))
    running.start()
    attacker = as_nobody(REPLACE, product.path)
    await_file(product.path / "waiting")
    attacker.wait(timeout=30)
    product.write("go")
    running.join()
    assert results == [INSTALLED]
    assert product.read("mark") == (b"0\n" if taken_over else b"harmless\n")


@pytest.mark.needs_root
def test_a_directory_that_the_tool_makes_is_open_to_all(program, product, patch_dir):
    assert program.install(product, Patch("ox").file("new/tool").write(patch_dir)) == INSTALLED
    assert as_nobody('mv "$1/new/tool" "$1/new/gone" && touch "$1/new/mine"', product.path).wait(timeout=30) == 0
    assert sorted(os.listdir(product.path / "new")) == ["gone", "mine"]


def set_attribute(path, name, value):
    try:
        os.setxattr(path, name, value)
    except OSError:
        pytest.skip(f"no attribute {name} on this file system")


# a capability set of version 2 that holds net_bind_service; a list of two more entries than the mode has
CAPABILITY = struct.pack("<5I", 0x02000001, 1 << 10, 0, 0, 0)
ACCESS_LIST = struct.pack(
    "<I" + "HHI" * 5, 2, 1, 6, 0xFFFFFFFF, 2, 7, 1, 4, 4, 0xFFFFFFFF, 16, 7, 0xFFFFFFFF, 32, 4, 0xFFFFFFFF
)


@pytest.mark.needs_root
@pytest.mark.parametrize(
    "name, value", [("security.capability", CAPABILITY), ("system.posix_acl_access", ACCESS_LIST), ("user.label", b"x")]
)
def test_a_replaced_file_loses_its_further_attributes(program, product, patch_dir, name, value):
    tool = product.write("bin/tool", "old", 0o755)
    set_attribute(tool, name, value)
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    assert name not in os.listxattr(tool)


def test_further_links_to_a_replaced_file_keep_the_old_content(program, product, patch_dir):
    os.link(product.write("bin/tool", "old"), product.path / "bin/same")
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    assert (product.read("bin/tool"), product.read("bin/same")) == (b"new\n", b"old")


# --- other processes on the host ---------------------------------------------------------------------------


def await_command_line(process, text):
    limit = time.monotonic() + 30
    while os.fsencode(text) not in Path(f"/proc/{process.pid}/cmdline").read_bytes():
        assert time.monotonic() < limit
        time.sleep(0.01)


@pytest.mark.needs_root
def test_any_user_can_become_the_owner_of_a_process_in_the_tools_eyes(program, product, patch_dir, scratch):
    # The owner is read from the first line of ps -ef that holds the process id, wherever in the line.
    product.component("yn")
    late_name = 'while [ ! -e "$1" ]; do sleep 0.02; done; exec tail -f /dev/null --sleep-interval="$(cat "$1")"'
    bait = as_nobody(late_name, scratch / "pid")  # begun before the agent, it stands before it in the list
    try:
        product.start("yn")
        while product.pid("yn") < bait.pid:  # process ids have begun anew in between
            bait.kill()
            bait.wait()
            bait = as_nobody(late_name, scratch / "pid")
            product.stop("yn")
            product.start("yn")
        (scratch / "pid").write_text(str(product.pid("yn")))
        await_command_line(bait, "sleep-interval")
        result = program.install(product, Patch("yn").file("bin/tool").write(patch_dir))
    finally:
        bait.kill()
        bait.wait()
    words = [
        message.split(": ", 1)[1]
        for message in product.log().messages("TRACE", "process.cpp")
        if message.startswith("cmdArray[")
    ]
    assert words[-5:] == ["/bin/su", "-", "nobody", "-c", f"{product.prefix}bin/QuillAgent  start yn"]
    assert result.status == 12  # the account has no shell to start it with


@pytest.mark.needs_root
def test_any_user_can_pass_for_the_management_console(program, product, patch_dir):
    product.component("zt")
    bait = as_nobody('exec tail -f /dev/null "$1"', product.path / "classes/wbt.jar")
    try:
        await_command_line(bait, "tail")
        archive = Patch("zt", target="vecm").file("bin/tool").write(patch_dir)
        assert program.install(product, archive).status == 37
    finally:
        bait.kill()
        bait.wait()


# --- the environment ---------------------------------------------------------------------------------------


def test_path_chooses_the_programs(program, product, patch_dir, scratch):
    path = stubs(scratch / "bin", tar=f'touch {scratch}/ran; exec /bin/tar "$@"')
    assert program.install(product, Patch("ox").write(patch_dir), env={"PATH": path}) == INSTALLED
    assert (scratch / "ran").exists()


def test_tar_options_can_leave_files_out_and_run_commands(program, product, patch_dir, scratch):
    archive = Patch("ox").file("bin/tool").file("bin/other").write(patch_dir)
    options = f"--exclude=tool --checkpoint=1 --checkpoint-action=exec=touch\\ {scratch}/ran"
    assert program.install(product, archive, env={"TAR_OPTIONS": options}) == INSTALLED
    assert product.exists("bin/other") and not product.exists("bin/tool")
    assert (scratch / "ran").exists()


def test_ps_format_hides_running_instances(program, product, patch_dir):
    product.start("ox")
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    assert program.install(product, archive, env={"PS_FORMAT": "comm"}) == INSTALLED
    assert product.calls() == []


@pytest.mark.parametrize(
    "variable", [{"COLUMNS": "60"}, {"PS_PERSONALITY": "old"}, {"CMD_ENV": "old"}, {"I_WANT_A_BROKEN_PS": "1"}], ids=str
)
def test_what_hides_a_running_console(program, product, patch_dir, variable):
    product.component("zt")
    product.start_console()
    archive = Patch("zt", target="vecm").file("bin/tool").write(patch_dir)
    usual = program.install(product, archive)
    listed = subprocess.run(["ps", "-ef"], capture_output=True, check=False)
    assert usual.status == 37, (usual, listed, product.log().messages("TRACE", "process.cpp"))
    assert program.install(product, archive, env=variable) == INSTALLED


@pytest.mark.needs_root
@pytest.mark.parametrize("variable", ["PS_PERSONALITY", "CMD_ENV"])
def test_a_listing_that_shows_user_numbers_keeps_an_agent_from_being_started(program, product, patch_dir, variable):
    product.start("ox")
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    assert program.install(product, archive, env={variable: "gnu"}).status == 12
    assert product.instances() == []


def test_shellopts_makes_control_scripts_of_bash_do_nothing(program, product, patch_dir):
    product.start("ox")
    product.write("bin/QuillAgent", product.read("bin/QuillAgent").replace(b"#!/bin/sh", b"#!/bin/bash"), 0o755)
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    assert program.install(product, archive, env={"SHELLOPTS": "noexec"}) == INSTALLED
    assert product.calls() == [] and product.instances() == [("ox", "")]


def test_without_a_path_the_second_patch_of_a_directory_fails(program, product, patch_dir):
    # What the first one sets back after its commands is an empty path, not a missing one.
    for fixpack in ("fp0001", "fp0002"):
        Patch("ox", fixpack=fixpack).file("bin/tool").script("a.sh", "pre").write(patch_dir)
    without = {"PATH": None}
    assert program.install(product, patch_dir, env=without) == refused(product, 3, "Bad return code from tar -xf: 2")
    assert [line.result for line in product.history()] == ["PASS", "FAIL"]
    kept = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin"}
    assert program.install(product, patch_dir, env=kept) == INSTALLED


@pytest.mark.skipif(not os.path.exists("/usr/share/locale/de/LC_MESSAGES/tar.mo"), reason="no other language installed")
def test_the_language_is_that_of_the_children_only(program, product, patch_dir):
    archive = Patch("ox", descriptor=False).write(patch_dir)
    german = {"LC_ALL": "C.UTF-8", "LANGUAGE": "de"}
    assert program.install(product, archive, env=german).err == b"\nBad return code from tar -xf: 2\n\n"
    assert "Nicht im Archiv gefunden" in "".join(product.log().messages("TRACE", "patchprocessor"))


@pytest.mark.parametrize(
    "variable",
    [
        {"POSIXLY_CORRECT": "1"},
        {"LC_ALL": "C.UTF-8"},
        {"LC_ALL": "xx_YY"},
        {"IFS": "p"},
        {"QUILLHOME": "/nonexistent/"},
        {"ENV": "/nonexistent", "BASH_ENV": "/nonexistent"},
        {"UNIX95": "1"},
        {"TMPDIR": "/nonexistent"},
    ],
    ids=str,
)
def test_variables_that_change_nothing(program, product, patch_dir, variable):
    product.start("ox")
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir), env=variable) == INSTALLED
    assert product.calls() == ["QuillAgent stop ox", "QuillAgent start ox"]
    assert product.read("bin/tool") == b"new\n"


@pytest.mark.parametrize("kept", [{}, {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin"}], ids=["nothing", "a path"])
def test_an_empty_environment_is_enough(program, product, patch_dir, kept):
    product.start("ox")
    empty = {**dict.fromkeys(os.environ), "LC_ALL": None, **kept}
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir), env=empty) == INSTALLED
    assert product.calls() == ["QuillAgent stop ox", "QuillAgent start ox"]
