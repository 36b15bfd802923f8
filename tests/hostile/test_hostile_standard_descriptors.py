"""Standard descriptors that are closed, full, or whose reader has gone: no file of the product takes their place."""

import itertools
import os
import resource
import subprocess

import pytest

from rawarchive import RawArchive
from support import Patch
from verdicts import INSTALLED, SUCCESS, failure, refused

ALL_COMBINATIONS = [closed for count in range(4) for closed in itertools.combinations((0, 1, 2), count)]
combination = pytest.mark.parametrize("closed", ALL_COMBINATIONS, ids=lambda closed: f"closed{closed}")


def seen(result, closed):
    """What the caller of a run with these descriptors closed can see of this result."""
    return result._replace(out=b"" if 1 in closed else result.out, err=b"" if 2 in closed else result.err)


@pytest.fixture
def patch(patch_dir):
    look = "readlink -v /proc/$$/fd/0 /proc/$PPID/fd/0 /proc/$PPID/fd/1 /proc/$PPID/fd/2; echo cried >&2"
    return Patch("ox").file("bin/tool").script("look.sh", "post", body=look).write(patch_dir)


@combination
def test_an_installation_does_the_same(program, product, patch, closed):
    product.start("ox")
    assert program.install(product, patch, close=closed) == seen(INSTALLED, closed)
    assert product.read("bin/tool") == b"new\n"
    assert product.level("ox") == "06100100"
    assert product.read("vmaorv6/agentdepot/rc.txt") == b"0"
    assert [line.result for line in product.history()] == ["PASS"]
    assert product.instances() == [("ox", "")]
    log = product.log()
    assert log.preamble == "" and len(log.runs) == 1
    messages = log.messages("TRACE", "patchprocessor")
    assert messages.count("stdErr: cried\n") == 1
    # What a command of the patch has seen of its standard input, and of the program's three descriptors.
    [said] = [message for message in messages if message.startswith("stdOut: ")]
    own_input, *programs = said.removeprefix("stdOut: ").splitlines()
    assert own_input == programs[0] and len(programs) == 3
    assert [programs[fd] for fd in closed] == ["/dev/null" for _ in closed]


@combination
def test_a_report_and_a_failure_say_what_can_be_said(program, product, patch, closed):
    whole = program.report(product, patch)
    assert whole.out.endswith(SUCCESS)
    assert program.report(product, patch, close=closed) == seen(whole, closed)
    refusal = program.report(product, "/nonexistent")
    assert (refusal.status, refusal.out) == (30, failure(product))
    assert program.report(product, "/nonexistent", close=closed) == seen(refusal, closed)


@combination
def test_the_log_on_standard_output_does_not_land_in_a_file(program, product, patch, closed):
    debug = {"PATCH_DEBUG": ""}
    result = program.install(product, patch, close=closed, env=debug)
    assert (result.status, result.err) == (0, b"")
    assert (b"ORV Patch Log File" in result.out) == (1 not in closed)
    assert product.read("bin/tool") == b"new\n"
    record = product.read("patchlogs/patches.hist")
    assert record.count(b"\n") == 6 and record.endswith(b"\n")
    assert product.read("registry/oxlpp266.ver") == b"desc = Sample product ox\nVRMF = 06100100\n\n"
    assert not product.exists("patchlogs/orvpatch.log")


def run_with(program, product, patch, env=None, **streams):
    return subprocess.run(
        [*program.argv, "-h", product.path, "-i", patch],
        timeout=60,
        check=False,
        env={**os.environ, **(env or {})},
        **streams,
    )


@pytest.mark.parametrize("env", [{}, {"PATCH_DEBUG": "1"}], ids=["log in its file", "log on standard output"])
@pytest.mark.parametrize("stream", ["stdout", "stderr"])
def test_a_reader_that_has_gone_stops_nothing(program, product, patch, stream, env):
    read_end, write_end = os.pipe()
    os.close(read_end)
    other = {"stdout": "stderr", "stderr": "stdout"}[stream]
    done = run_with(program, product, patch, env, **{stream: write_end, other: subprocess.DEVNULL})
    os.close(write_end)
    assert done.returncode == 0
    assert product.read("bin/tool") == b"new\n"
    assert [line.result for line in product.history()] == ["PASS"]


@pytest.mark.parametrize(
    "wrapper, status",
    [
        ((), b"141\n"),  # 128 + SIGPIPE: not ignored
        (("/bin/sh", "-c", 'trap "" PIPE; exec "$@"', "sh"), b"1\n"),
    ],  # it reads of the error instead
    ids=["default", "ignored"],
)
def test_a_command_of_a_patch_is_told_of_a_reader_that_has_gone_as_the_caller_would_be(
    program, product, patch_dir, wrapper, status
):
    archive = (
        Patch("ox")
        .file("bin/tool")
        .script("look.sh", "post", body='(yes 2>/dev/null; echo $? >"$QUILLHOME/status") | head -1')
        .write(patch_dir)
    )
    assert program.install(product, archive, wrapper=wrapper) == INSTALLED
    assert product.read("status") == status


@pytest.mark.parametrize("stream", ["stdout", "stderr"])
def test_a_full_device_stops_nothing(program, product, patch, stream):
    with open("/dev/full", "wb") as full:
        done = run_with(
            program,
            product,
            patch,
            {"PATCH_DEBUG": "1"},
            **{"stdout": subprocess.DEVNULL, "stderr": subprocess.DEVNULL, stream: full},
        )
    assert done.returncode == 0
    assert [line.result for line in product.history()] == ["PASS"]


def test_a_limit_on_the_size_of_files_costs_the_log_only(program, product, patch_dir):
    # The log is beyond the limit from the start; what the patch itself writes is not.
    product.write("patchlogs/orvpatch.log", b"x" * 100000)
    archive = Patch("ox").file("bin/tool").write(patch_dir)
    done = run_with(
        program,
        product,
        archive,
        stdout=subprocess.PIPE,
        preexec_fn=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (50000, 50000)),
    )
    assert (done.returncode, done.stdout) == (0, SUCCESS)
    assert product.read("bin/tool") == b"new\n"
    assert product.read("patchlogs/orvpatch.log") == b"x" * 100000
    assert [line.result for line in product.history()] == ["PASS"]


def test_an_archive_beyond_the_limit_on_the_size_of_files_installs_nothing(program, product, patch_dir):
    archive = Patch("ox").file("bin/a").file("bin/large", b"x" * 200000).file("bin/z").write(patch_dir)
    result = program.install(product, archive, wrapper=["prlimit", "--fsize=100000"])
    assert result == refused(product, 3, "Bad return code from tar -xf: 2")
    assert not product.exists("bin/a") and not product.exists("bin/z")
    assert product.level("ox") == "06100000"
    assert [line.result for line in product.history()] == ["FAIL"]


def test_many_inherited_descriptors_are_left_alone(program, product, patch):
    read_end, write_end = os.pipe()
    done = run_with(
        program,
        product,
        patch,
        stdout=subprocess.PIPE,
        stderr=subprocess.PIPE,
        pass_fds=[write_end],
        stdin=subprocess.DEVNULL,
    )
    os.close(write_end)
    assert (done.returncode, done.stdout, done.stderr) == INSTALLED
    assert os.read(read_end, 1) == b""
    os.close(read_end)


def test_a_caller_that_ignores_its_children_loses_no_status(program, product, patch_dir):
    archive = RawArchive(Patch("ox", pre=["fail.sh"])).script("fail.sh", "exit 3").write(patch_dir)
    words = [*program.argv, "-h", str(product.path), "-i", str(archive)]
    code = f"import os, signal; signal.signal(signal.SIGCHLD, signal.SIG_IGN); os.execv({words[0]!r}, {words!r})"
    done = subprocess.run(["/usr/bin/python3", "-c", code], timeout=60, capture_output=True, check=False)
    assert (done.returncode, done.stderr) == (21, b"\nBad return code from fail.sh: 3\n\n")
