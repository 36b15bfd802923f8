"""Child processes that print too much, print NULs, die, leave a process behind, or are not the tool's own."""

import contextlib
import fcntl
import os
import signal
import subprocess
import time

import pytest

from rawarchive import RawArchive
from support import Patch, stubs
from verdicts import INSTALLED, refused

KEPT = 4096  # bytes of each stream of a child
PRINT = "head -c {size} /dev/zero | tr '\\0' x"


def messages(product, prefix, component="patchprocessor"):
    return [
        message.removeprefix(prefix)
        for message in product.log().messages(component=component)
        if message.startswith(prefix)
    ]


@pytest.fixture
def run_script(program, product, patch_dir):
    """Installs a patch with one post command of this body."""

    def run(body, status=0, **options):
        archive = Patch("ox").file("bin/tool").script("work.sh", "post", body=body, status=status).write(patch_dir)
        return program.install(product, archive, **options)

    return run


@pytest.mark.parametrize("size", [0, 1, 4095, 4096, 4097, 60000])
@pytest.mark.parametrize("status", [0, 7])
def test_the_first_4096_bytes_of_each_stream_are_kept(run_script, product, size, status):
    result = run_script(f"{PRINT}; {PRINT} | tr x y >&2".format(size=size), status)
    assert result == (refused(product, 23, "Bad return code from work.sh: 7") if status else INSTALLED)
    assert messages(product, "stdOut: ") == ["x" * min(size, KEPT)]
    assert messages(product, "stdErr: ") == ["y" * min(size, KEPT)]


@pytest.mark.parametrize(
    "text, kept",
    [
        (r"abc\0def", "abc"),
        (r"\0abc", ""),
        (r"\0\0\0", ""),
        (r"%%n%%s\0", "%n%s"),
        (r"\377\376\001", "\udcff\udcfe\x01"),
        (r"line\nline\n\n", "line\nline\n\n"),
    ],
)
def test_of_a_childs_output_nothing_behind_a_nul_counts(run_script, product, text, kept):
    assert run_script(f"printf '{text}'; printf '{text}' >&2") == INSTALLED
    assert messages(product, "stdOut: ") == messages(product, "stdErr: ") == [kept]


def test_output_in_many_pieces_is_kept_whole(run_script, product):
    assert run_script("for i in 1 2 3 4 5 6 7 8 9; do printf $i; printf $i >&2; done") == INSTALLED
    assert messages(product, "stdOut: ") == messages(product, "stdErr: ") == ["123456789"]


@pytest.mark.parametrize("sign", ["KILL", "SEGV", "TERM", "PIPE", "ABRT", "HUP", "INT"])
def test_a_command_that_a_signal_ends_counts_as_good(run_script, product, sign):  # KEEP(signal-is-zero)
    assert run_script(f"printf before; ulimit -c 0; kill -{sign} $$") == INSTALLED
    assert messages(product, "stdOut: ") == ["before"]
    assert product.log().messages("INFO").count("Successfully executed: work.sh") == 1


@pytest.mark.parametrize(
    "stub, status, text",
    [
        ("kill -9 $$", 5, "Unable to read file [{home}tmp/kox/patch.ini]: No such file or directory"),
        ("exit 255", 3, "Bad return code from tar -xf: 255"),
        ("head -c 60000 /dev/zero; head -c 60000 /dev/zero >&2; exit 1", 3, "Bad return code from tar -xf: 1"),
        ("sleep 300 & exit 4", 3, "Bad return code from tar -xf: 4"),
    ],
    ids=["killed", "255", "60,000 bytes", "background"],
)
def test_a_tar_that_misbehaves(program, product, patch_dir, scratch, stub, status, text):
    path = stubs(scratch / "bin", tar=stub)
    result = program.install(product, Patch("ox").file("bin/tool").write(patch_dir), env={"PATH": path})
    assert result == refused(product, status, text.format(home=product.prefix))
    assert not product.exists("bin/tool")


def test_a_tar_that_cannot_be_found(program, product, patch_dir, scratch):
    path = str(scratch)  # an empty one
    result = program.install(product, Patch("ox").write(patch_dir), env={"PATH": path})
    assert result == refused(product, 3, "Bad return code from tar -xf: 2")
    assert product.log().messages("ERROR", "process.cpp") == ["error calling execvp = 2: No such file or directory"]


@pytest.mark.parametrize(
    "stub",
    [
        "kill -9 $$",
        "exit 0",
        "exec >&-",
        PRINT.format(size=60000),
        "head -c 5000 /dev/zero; echo {pid}",
        PRINT.format(size=4096) + "; echo {pid}",
        "echo {pid} >&2",
    ],
    ids=["killed", "silent", "closed", "60,000 bytes", "NULs", "too late", "on standard error"],
)
def test_a_process_that_ps_does_not_show_within_4096_bytes_does_not_run(program, product, patch_dir, scratch, stub):
    product.start("ox")
    path = stubs(scratch / "bin", ps=stub.format(pid=product.pid("ox")))
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir), env={"PATH": path}) == INSTALLED
    assert product.calls() == []


@pytest.mark.parametrize("verb, code", [("stop", 14), ("start", 12)])
@pytest.mark.parametrize("size", [0, 4097, 60000])
def test_the_output_of_the_control_script_is_kept_like_any_other(program, product, patch_dir, verb, code, size):
    product.component("yn", desc="D")
    product.start("yn")
    product.fail(verb, "yn", status=9, out="x" * size, err="y" * size)
    text = {
        "stop": "Unable to stop agent for product D.  The agent for product D may be running under a different userid "
        "and must be manually stopped before applying the patch.",
        "start": "Unable to start agent for product D.",
    }
    result = program.install(product, Patch("yn").file("bin/tool").write(patch_dir))
    assert result == refused(product, code, text[verb])
    assert messages(product, "stdout: ", "orvcomponent")[-1] == "x" * min(size, KEPT)
    assert messages(product, "stderr: ", "orvcomponent")[-1] == "y" * min(size, KEPT)


def test_a_control_script_that_a_signal_ends_counts_as_good(program, product, patch_dir):
    product.component("yn")
    product.start("yn")
    product.write("bin/QuillAgent", '#!/bin/sh\n[ "$1" = start ] || kill -9 $$\n', 0o755)
    assert program.install(product, Patch("yn").file("bin/tool").write(patch_dir)) == INSTALLED
    assert messages(product, "return code: ", "orvcomponent") == ["0", "0"]


@pytest.fixture
def left_behind(product):
    """Process ids that a script notes in the home; they end with the test, unless they have ended before and the
    system has given their ids to others."""
    yield lambda: [int(word) for word in product.read("left").split()]
    for pid in product.read("left").split() if product.exists("left") else []:
        with contextlib.suppress(OSError), open(f"/proc/{pid}/environ", "rb") as variables:
            if f"QUILLHOME={product.prefix}".encode() in variables.read().split(b"\0"):
                os.kill(int(pid), signal.SIGKILL)


@pytest.mark.parametrize("output, kept", [("", ""), ("printf text; printf text >&2", "text")])
def test_a_program_left_behind_with_the_pipes_is_not_waited_for(run_script, product, left_behind, output, kept):
    start = time.monotonic()
    assert run_script(f'{output}\nsleep 300 & echo $! >"$QUILLHOME/left"') == INSTALLED
    assert time.monotonic() - start < 30
    assert messages(product, "stdOut: ") == messages(product, "stdErr: ") == [kept]
    (pid,) = left_behind()
    assert os.path.isdir(f"/proc/{pid}")


def test_a_program_left_behind_that_goes_on_printing_is_not_waited_for(run_script, product, left_behind):
    body = (
        'while :; do printf more; : >"$QUILLHOME/printed"; sleep 0.01; done & echo $! >"$QUILLHOME/left"\n'
        'while [ ! -e "$QUILLHOME/printed" ]; do sleep 0.01; done'
    )
    assert run_script(body) == INSTALLED
    (kept,) = messages(product, "stdOut: ")
    assert kept == "more" * (len(kept) // 4) and kept


def test_a_script_without_output_or_input(run_script, product):
    assert run_script("exec <&- >&- 2>&-") == INSTALLED
    assert run_script("read line; echo got=$line", stdin=None) == INSTALLED


@pytest.mark.parametrize(
    "content, mode, status",
    [
        # What the system cannot execute is handed to the shell, by the rule of execvp.
        ("echo plain", 0o755, 0),
        ("", 0o755, 0),
        ("#!" + "/" * 5000, 0o755, 0),
        ("\x7fELF\n", 0o755, 127),
        ("#!/nonexistent\n", 0o755, 2),
        ("#!/bin/sh\n", 0o644, 13),
    ],
    ids=["no shebang", "empty", "long interpreter", "broken binary", "no interpreter", "not executable"],
)
def test_a_file_that_can_hardly_be_executed(program, product, patch_dir, content, mode, status):
    archive = Patch("ox").member("work", content, mode).command("pre", "work").file("bin/tool").write(patch_dir)
    result = program.install(product, archive)
    assert result == (refused(product, 21, f"Bad return code from work: {status}") if status else INSTALLED)
    assert product.exists("bin/tool") == (status == 0)


def test_a_command_ends_the_tool_but_not_the_history(run_script, product):
    # A command runs as who patches: it can kill the tool, and what it has done so far stays.
    result = run_script("kill -9 $PPID")
    assert result.status == -9
    assert product.history() == []
    assert product.read("bin/tool") == b"new\n"
    assert product.level("ox") == "06100000"


LARGEST_PIPE = 16 * 1024 * 1024


def pipe_of_the_own_user():
    """How many bytes a child may print: what the system gives the user of the tests."""
    ends = os.pipe()
    try:
        fcntl.fcntl(ends[0], fcntl.F_SETPIPE_SZ, LARGEST_PIPE)
    except PermissionError:
        pass
    size = fcntl.fcntl(ends[0], fcntl.F_GETPIPE_SZ)
    for end in ends:
        os.close(end)
    return size


def archive_of_the_future(folder, members):
    """tar(1) has a line for every member of it, of some 90 bytes."""
    archive, hour_ahead = RawArchive(Patch("ox")), time.time() + 3600
    for number in range(members):
        archive.file(f"updated_files/bin/{number}", b"", mtime=hour_ahead)
    return archive.write(folder)


def installed(product):
    return len(list((product.path / "bin").glob("[0-9]*")))


def test_a_tar_that_warns_as_much_as_a_pipe_takes_ends(program, product, patch_dir):
    """20,000 members say 1.8 MB; without CAP_SYS_RESOURCE a pipe holds 1 MiB at most."""
    members = 20000 if pipe_of_the_own_user() >= LARGEST_PIPE else 8000
    assert program.install(product, archive_of_the_future(patch_dir, members)) == INSTALLED
    assert installed(product) == members


def test_a_tar_that_warns_within_a_mebibyte_ends_for_an_ordinary_user(program, product, patch_dir):
    user = "nobody" if os.geteuid() == 0 else None
    if user:
        product.give_to(user)
    assert program.install(product, archive_of_the_future(patch_dir, 8000), user=user) == INSTALLED
    assert installed(product) == 8000


def test_a_process_whose_command_line_repeats_an_agents_id_hangs_nothing(program, product, patch_dir):
    product.start("ox")
    pid = str(product.pid("ox"))
    named = " ".join([pid] * (110000 // (len(pid) + 1)))
    talker = subprocess.Popen(["/bin/sh", "-c", "sleep 300; :", named], start_new_session=True)
    try:
        assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    finally:
        os.killpg(talker.pid, signal.SIGKILL)
        talker.wait()
    assert product.calls() == ["QuillAgent stop ox", "QuillAgent start ox"]


def left_by_the_caller(line):
    """The tool takes the place of a shell that has started this in the background: its child now."""
    return ["/bin/sh", "-c", f'({line}) & exec "$@"', "sh"]


@pytest.mark.parametrize("status", [0, 1])
def test_a_child_of_the_caller_is_not_taken_for_a_command(program, product, patch_dir, status):
    archive = (
        Patch("ox")
        .file("bin/tool")
        .script("work.sh", "pre", body='>"$QUILLHOME/tmp/go"; sleep 1', status=7)
        .write(patch_dir)
    )
    other = f"until [ -e '{product.path}/tmp/go' ]; do sleep 0.05; done; exit {status}"
    result = program.install(product, archive, wrapper=left_by_the_caller(other))
    assert result == refused(product, 21, "Bad return code from work.sh: 7")
    assert not product.exists("bin/tool")


def test_children_of_the_caller_that_end_at_any_time_cut_nothing_short(program, product, patch_dir):
    archive = RawArchive(Patch("ox"))
    for number in range(4000):
        archive.file(f"updated_files/bin/{number}")
    many = left_by_the_caller("for i in 0 1 2 3; do for j in 0 2 4 6 8; do sleep 0.$i$j & done; done; wait")
    direct = ["/bin/sh", "-c", "".join(f"sleep 0.{n:02} & " for n in range(0, 60, 3)) + 'exec "$@"', "sh"]
    assert program.install(product, archive.write(patch_dir), wrapper=[*many, *direct]) == INSTALLED
    assert installed(product) == 4000


@pytest.mark.needs_root
def test_what_is_left_to_the_first_process_of_a_container_is_not_taken_for_a_command(program, product, patch_dir):
    container = ["unshare", "--pid", "--fork", "--kill-child"]
    if subprocess.run([*container, "true"], capture_output=True, check=False).returncode != 0:
        pytest.skip("needs a system that lets root make process namespaces")
    archive = (
        Patch("ox")
        .file("bin/tool")
        .script("1.sh", "pre", body="(sleep 0.5) >/dev/null 2>&1 &")
        .script("2.sh", "pre", body="sleep 1.5", status=7)
        .write(patch_dir)
    )
    result = program.install(product, archive, wrapper=container)
    assert result == refused(product, 21, "Bad return code from 2.sh: 7")
    assert not product.exists("bin/tool")
