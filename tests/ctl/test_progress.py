"""What apply shows while it is at work: one line that is written over on a terminal, elsewhere a line a step."""

import os
import pty
import re
import select
import signal
import struct
import subprocess
import tempfile
import termios
import time
from fcntl import ioctl

import pytest

from support import Patch

STEPS = ["take", "check", "save", "install", "verify", "start", "directories"]
FILES = 400


@pytest.fixture(name="ready")
def ready_fixture(home):
    home.component("yn")
    (home.path / "tmp").chmod(0o700)
    return home


@pytest.fixture(name="large")
def large_fixture(write):
    # In the home of a test that watches, the command waits until the test has seen that it runs.
    waits = (
        '[ ! -e "$quill_home/watched" ] || for _ in $(seq 3000); do [ ! -e "$quill_home/seen" ] || break; '
        "sleep 0.02; done"
    )
    patch = Patch("yn").script("slow.sh", when="post", body=waits)
    for number in range(FILES):
        patch.file(f"lib/file{number:04}", "new\n")
    return write(patch)


def on_terminal(ctl, *words, columns=100, until=None):
    """Runs it on a terminal of its own; (seconds since the start, bytes) of each piece that it showed. Makes the file
    of `until`, (text, file), when the text was shown."""
    ours, theirs = pty.openpty()
    ioctl(theirs, termios.TIOCSWINSZ, struct.pack("HHHH", 24, columns, 0, 0))
    began = time.monotonic()
    with tempfile.TemporaryFile() as printed, subprocess.Popen(
        [*ctl.program.argv, *map(os.fspath, words)], stdin=subprocess.DEVNULL, stdout=printed, stderr=theirs
    ) as process:
        os.close(theirs)
        shown = []
        while True:
            select.select([ours], [], [], 120)
            try:
                data = os.read(ours, 65536)
            except OSError:  # the terminal was closed by its last process
                break
            if not data:
                break
            shown.append((time.monotonic() - began, data))
            if until and until[0] in b"".join(piece for _, piece in shown):
                until[1].touch()
        status = process.wait(120)
        printed.seek(0)
        out = printed.read()
    os.close(ours)
    return status, shown, out


def lines_of(shown):
    return [line.rstrip() for line in b"".join(data for _, data in shown).decode().split("\r") if line.strip()]


def test_one_line_on_a_terminal(ctl, ready, large):
    ready.write("watched")
    seen = (b"install: runPostScripts", ready.path / "seen")
    status, shown, out = on_terminal(ctl, "apply", ready, large, "--yes", until=seen)
    assert status == 0 and b"\napplied\n" in out
    text = b"".join(data for _, data in shown)
    assert b"\n" not in text and b"\x1b" not in text
    lines = lines_of(shown)
    assert list(dict.fromkeys(line.split(":")[0].split(",")[0] for line in lines)) == STEPS
    counts = [int(found[1]) for found in (re.search(rf"(\d+) of {FILES} files", line) for line in lines) if found]
    assert counts == sorted(counts) and counts[-1] == FILES
    assert any(line.startswith("install: runPostScripts") for line in lines)
    last, blanks, end = text.split(b"\r")[-3:]
    assert len(blanks) >= len(last.rstrip()) > 0 and not blanks.strip() and end == b""  # the line has gone


def test_no_line_is_longer_than_the_terminal_is_wide(ctl, ready, large):
    _, shown, _ = on_terminal(ctl, "apply", ready, large, "--yes", columns=30)
    assert max(map(len, lines_of(shown))) <= 29


def test_a_line_a_step_elsewhere(ctl, ready, large):
    result = ctl.run("apply", ready, large, "--yes")
    lines = result.err.decode().splitlines()
    assert [line for line in lines if ":" not in line] == STEPS
    assert f"install: {large.name}: moveFiles" in lines
    inside = [line.rsplit(": ", 1)[1] for line in lines if line.startswith(f"install: {large.name}: ")]
    begin = inside.index("runPrePatchScripts")
    assert inside[begin : begin + 4] == ["runPrePatchScripts", "stopDependents", "runPreScripts", "moveFiles"]


def test_nothing_beside_a_document(ctl, ready, large):
    status, shown, out = on_terminal(ctl, "apply", ready, large, "--yes", "--json")
    assert (status, shown) == (0, []) and out.startswith(b"{")


def test_a_log_that_cannot_be_followed_ends_nothing(ctl, program, ready, large, scratch):
    installer = scratch / "installer"
    log = ready.path / "patchlogs/orvpatch.log"
    installer.write_text(
        f'#!/bin/sh\ncase $3 in -i) rm -f "{log}"; mkdir "{log}"; sleep 1;; esac\n' f'exec "{program.binary}" "$@"\n'
    )
    installer.chmod(0o755)
    result = ctl.run("apply", ready, large, "--yes", "--installer", installer)
    assert result.status == 0, result
    assert log.is_dir() and ready.exists(f"lib/file{FILES - 1:04}")


@pytest.mark.parametrize("answer, status", [(b"y\n", 0), (b"n\n", 1), (b"\n", 1), (b"\x03", -signal.SIGINT)])
def test_the_question(ctl, ready, write, answer, status):
    """What is answered on the terminal decides; Ctrl-C is no answer, and leaves nothing behind either."""
    before = ready.tree()
    archive = write(Patch("yn").file("bin/tool", "new\n"))
    command, ours = pty.fork()
    if command == 0:
        signal.signal(signal.SIGINT, signal.SIG_DFL)  # ignored where the tests run in the background
        os.execv(ctl.program.argv[0], [*ctl.program.argv, "apply", os.fspath(ready.path), os.fspath(archive)])
    shown = b""
    while b"Apply? [y/N] " not in shown:
        shown += os.read(ours, 65536)
    os.write(ours, answer)
    try:
        while os.read(ours, 65536):
            pass
    except OSError:  # the terminal was closed by its last process
        pass
    os.close(ours)
    assert os.waitstatus_to_exitcode(os.waitpid(command, 0)[1]) == status
    assert ready.exists("bin/tool") == (status == 0)
    if status != 0:
        assert ready.tree().keys() - before.keys() <= {"patchlogs/transactions", "patchlogs/orvpatch.log"}
        assert before.keys() <= ready.tree().keys()
