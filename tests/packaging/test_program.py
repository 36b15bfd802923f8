"""What can be read from the shipped program: its libraries, their level, and how it is hardened."""

import re
import subprocess

import pytest

from shipped import AMD64, CHECKOUT, PPC64LE, SYSROOTS

pytestmark = pytest.mark.packages


@pytest.fixture
def elf(build):
    """readelf's view of the program: header, program headers, dynamic section, dynamic symbols."""
    done = subprocess.run(["readelf", "-W", "-h", "-l", "-d", "--dyn-syms", build.program], check=True,
                          capture_output=True, text=True)
    return done.stdout


def undefined_symbols(elf):
    return set(re.findall(r" UND (\w+)@GLIBC_", elf))


def test_machine(elf, architecture):
    assert re.search(r"Machine: +(.*)", elf)[1] == architecture.machine
    assert "2's complement, little endian" in elf


def test_needs_the_c_library_only(elf, architecture):
    assert set(re.findall(r"\(NEEDED\).*\[(.*)\]", elf)) == architecture.libraries


def test_c_library_level(elf, build):
    levels = {tuple(map(int, level.split("."))) for level in re.findall(r"GLIBC_([\d.]+)", elf)}
    assert max(levels) == tuple(map(int, build.architecture.level.split(".")))
    assert (build.folder / "libc-level").read_text() == f"{build.architecture.level}\n"


@pytest.mark.parametrize("page", ["README.md", "man/orvpatch.8"])
def test_pages_tell_the_c_library_level(page):
    told = re.findall(r"glibc ([\d.]+) or later on POWER, ([\d.]+) or later on x86-64",
                      " ".join((CHECKOUT / page).read_text().split()))
    assert told == [(PPC64LE.level, AMD64.level)]


def test_runs_with_the_oldest_c_library_at_hand(architecture):
    """The demo's run in the installed package, too, is one with this library."""
    library = SYSROOTS / architecture.preset / f"usr/{architecture.triplet}/lib/libc.so.6"
    done = subprocess.run([*architecture.runner, library], check=True, capture_output=True, text=True)
    assert re.search(r"stable release version 2\.31\.", done.stdout)


def test_is_position_independent(elf):
    assert re.search(r"Type: +DYN \(Position-Independent Executable file\)", elf)
    assert re.search(r"\(FLAGS_1\).* PIE\b", elf)


def test_relocations_are_read_only_and_bound_at_start(elf):
    assert re.search(r"^ +GNU_RELRO ", elf, re.M)
    assert re.search(r"\(FLAGS\) +BIND_NOW", elf)
    assert re.search(r"\(FLAGS_1\).* NOW\b", elf)


def test_stack_is_protected_and_not_executable(elf):
    assert "__stack_chk_fail" in undefined_symbols(elf)
    assert re.search(r"^ +GNU_STACK +(?:0x\w+ +){5}RW ", elf, re.M)


def test_library_calls_are_fortified(elf):
    """Those that the sources make: formatting into a buffer and to a stream."""
    assert {"__vsnprintf_chk", "__printf_chk", "__fprintf_chk"} <= undefined_symbols(elf)


def test_debug_symbols_fit_the_shipped_program(build, tmp_path):
    """They lie where debuggers look for them, by the build id of the stripped program, and tell where main begins."""
    for archive in (build.symbols, build.package(".tar.gz")):
        subprocess.run(["tar", "-C", tmp_path, "--strip-components=1", "-xzf", archive], check=True)
    shipped = output_of("readelf", "-W", "-n", "-S", tmp_path / "sbin/orvpatch")
    assert ".symtab" not in shipped and ".debug_info" not in shipped
    build_id = re.search(r"Build ID: (\w+)", shipped)[1]
    symbols = tmp_path / f"lib/debug/.build-id/{build_id[:2]}/{build_id[2:]}.debug"
    address = re.search(r"^ *\d+: (\w+) .* main$", output_of("readelf", "-W", "-s", symbols), re.M)[1]
    assert re.search(r"\bsrc/main\.cpp:\d+", output_of("addr2line", "-e", symbols, address))


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def test_carries_no_search_path(elf):
    assert "(RPATH)" not in elf and "(RUNPATH)" not in elf
