"""Run information with any bytes: read by every command, written by the agents themselves."""

import os

import pytest

from support import Patch, Result, stubs
from verdicts import INSTALLED, SUCCESS

RUN_INFO = "config/.ConfigData/RunInfo"
MEGABYTE = 1 << 20
HOST = os.uname().nodename
NONE_RUNNING = b"No instances of running dependent agents to stop or restart.\n\n"
HEADING = b"The following agent instances will be stopped during the patch application and restarted afterwards:\n"


@pytest.fixture
def live(product):
    """Process id of a process of the home that the run information does not know."""
    return product.process("control/processes/foreign")


@pytest.fixture
def listed(program, product, patch_dir):
    """The instances of the OS agent that a report lists for this run information; b"" for the default one."""
    archive = Patch("ox").directory().write(patch_dir)
    product.component("ox", desc="D")

    def report(content, **options):
        product.write(RUN_INFO, content)
        result = program.report(product, archive, **options)
        assert (result.status, result.err) == (0, b"")
        if NONE_RUNNING in result.out:
            return []
        names = result.out.split(HEADING)[1].split(b"\n\n")[0].split(b"\n")
        return [name.removeprefix(b"    ").removesuffix(b"D").removesuffix(b" instance of ") for name in names]

    return report


def row(pid, instance, separator=b"|", code=b"ox", host=HOST):
    return separator.join([host.encode(), code, str(pid).encode(), instance, b"x"]) + b"\n"


@pytest.mark.parametrize(
    "content", [b"", b"\n\n\n", b"\0", b"FIELDSEP", b"FIELDSEP=", b"FIELDSEP==", b"=|", b"|"], ids=repr
)
def test_without_a_separator_nothing_runs(listed, live, content):
    assert listed(content + b"\n" + row(live, b"one")) == []


@pytest.mark.parametrize("separator", [b"|", b"\t", b"\r", b";", b"%", b"\x01", b"\x7f", b"\xff", b"||", b"|;\xfe"])
def test_any_bytes_may_separate(listed, live, separator):
    assert listed(b"FIELDSEP=" + separator + b"\n" + row(live, b"one", separator)) == [b"one"]


@pytest.mark.parametrize("content", [b"\0", b"\n", b"\r", b"=", b"|", b"F", b"\xff"])
def test_a_file_of_one_byte(listed, content):
    assert listed(content) == []


def test_a_line_of_any_one_byte_is_no_row(listed, live):
    rows = b"".join(bytes([value]) + b"\n" for value in range(1, 256))
    assert listed(b"FIELDSEP=|\n" + rows + row(live, b"one")) == [b"one"]


def test_what_follows_a_nul_does_not_count(listed, live):
    assert listed(b"FIELDSEP=|\n" + row(live, b"one") + b"\0" + row(live, b"two")) == [b"one"]
    assert listed(b"FIELDSEP=|\n" + row(live, b"o\0ne") + row(live, b"two")) == []


def test_any_byte_in_the_name_of_an_instance(listed, live, scratch):
    names = [b"a" + bytes([value]) + b"z" for value in range(1, 256) if value not in b"|\n"]
    quick = stubs(scratch / "bin", ps=f"echo {live}")  # the real one takes its time, twice for each name
    assert listed(b"FIELDSEP=|\n" + b"".join(row(live, name) for name in names), env={"PATH": quick}) == names


def test_lines_of_a_megabyte(listed, live):
    long = b"x" * MEGABYTE
    content = (
        b"FIELDSEP=|\n"
        + long
        + b"\n"
        + row(live, b"one", host=HOST + "x" * MEGABYTE)
        + row(long.decode(), b"two")
        + row(live, b"three", code=long)
        + row(live, b"four").rstrip()
        + long
        + b"\n"
        + b"|" * MEGABYTE
    )
    assert listed(content) == [b"one", b"four"]


def test_an_instance_name_of_a_hundred_kilobytes(listed, live):
    assert listed(b"FIELDSEP=|\n" + row(live, b"n" * 100000)) == [b"n" * 100000]


def test_a_million_lines(listed, live):
    foreign = row(live, b"one", host="-" + HOST) * 500000 + row(live, b"one", code=b"yy") * 400000
    assert listed(b"FIELDSEP=|\n" + foreign + b"a|b|c|d\n" * 100000 + row(live, b"two")) == [b"two"]


HOSTILE_PIDS = [
    "$(touch {mark})",
    "`touch {mark}`",
    ";touch {mark}",
    "&touch {mark}",
    "1;touch {mark}",
    "{live};touch {mark}",
    "{live}>{mark}",
    "-1",
    "-e",
    "--help",
    "-p 1",
    "{live},1",
    "{live}x",
    "x{live}",
    "+{live}",
    "0x1",
    "0",
    "%n%s",
    "99999999999999999999",
    "' '",
    "*",
    "{live} ",
    "{live}\t",
    "PID",
]


@pytest.mark.parametrize("pid", HOSTILE_PIDS)
def test_a_process_id_that_is_none_never_reaches_a_shell(listed, product, live, pid):
    mark = product.path / "mark"
    pid = pid.format(mark=mark, live=live)
    assert listed(b"FIELDSEP=|\n" + row(pid, b"one")) == []
    assert not mark.exists()
    words = [
        message.split(": ", 1)[1]
        for message in product.log().messages("TRACE", "process.cpp")
        if message.startswith("cmdArray[")
    ]
    at = words.index("ps")
    assert words[at : at + 3] == ["ps", "-p", pid]
    assert "/bin/sh" not in words


@pytest.mark.parametrize("instance", ["$(touch {mark})", "`touch {mark}`", "x;touch {mark};", "x>{mark};true"])
def test_the_name_of_an_instance_reaches_the_shell_that_starts_it(program, product, patch_dir, live, instance):
    # Starting goes through a shell, stopping does not: who writes the run information commands who patches.
    mark = product.path / "mark"
    product.component("yn")
    name = instance.format(mark=mark)
    product.add_row("yn", live, name)
    product.fail("stop", "yn", status=0)
    archive = Patch("yn").file("bin/tool").script("look.sh", "pre", body=f"ls {mark}").write(patch_dir)
    program.install(product, archive)
    stop = product.journal()[0]
    assert stop.args == ("-o", name, "stop", "yn")
    started = [message for message in product.log().messages("TRACE", "process.cpp") if "QuillAgent -o" in message]
    assert started == [f"cmdArray[2]: {product.prefix}bin/QuillAgent -o {name} start yn"]
    assert mark.exists()
    assert product.log().messages("TRACE", "patchprocessor").count("stdOut: ") == 1  # not there before the start


def test_a_name_like_an_option_is_an_argument_of_the_control_script(program, product, patch_dir, live):
    product.component("yn")
    product.add_row("yn", live, "--version")
    product.fail("stop", "yn", status=0)
    product.fail("start", "yn", status=0)
    assert program.install(product, Patch("yn").file("bin/tool").write(patch_dir)) == INSTALLED
    assert product.calls() == ["QuillAgent -o --version stop yn", "QuillAgent -o --version start yn"]


@pytest.mark.parametrize(
    "make",
    [
        os.mkfifo,
        os.mkdir,
        lambda path: os.symlink("/dev/zero", path),
        lambda path: os.symlink("/nonexistent", path),
        lambda path: None,
        lambda path: (path.touch(), os.truncate(path, 1 << 40)),
    ],
    ids=["fifo", "directory", "device", "dangling link", "missing", "a terabyte"],
)
def test_run_information_that_is_no_readable_file_means_that_nothing_runs(program, product, patch_dir, make):
    product.remove(RUN_INFO)
    make(product.path / RUN_INFO)
    report = program.report(product, Patch("ox").directory().write(patch_dir))
    assert report == Result(0, report.out, b"")
    assert NONE_RUNNING in report.out and report.out.endswith(SUCCESS)
    assert product.log().messages("TRACE", "orvcomponentregistry").count("unable to read RunInfo file") == 1


def test_the_process_table_may_not_know_the_owner(program, product, patch_dir, live, scratch):
    # A process that ends between the two looks at it has no owner; it is started as the current user.
    path = stubs(scratch / "bin", ps=f'[ "$1" = -ef ] || echo {live}')
    product.component("yn")
    product.add_row("yn", live, "one")
    product.fail("stop", "yn", status=0)
    product.fail("start", "yn", status=0)
    assert program.install(product, Patch("yn").file("bin/tool").write(patch_dir), env={"PATH": path}) == INSTALLED
    assert product.calls() == ["QuillAgent -o one stop yn", "QuillAgent -o one start yn"]
