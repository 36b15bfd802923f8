"""What can be read from the shipped program: its libraries, their level, and how it is hardened."""

import re
import subprocess

import pytest

from shipped import AMD64, CHECKOUT, PPC64LE, SYSROOTS

pytestmark = pytest.mark.packages


@pytest.fixture
def elf(build, name):
    """readelf's view of a program: header, program headers, dynamic section, dynamic symbols."""
    done = subprocess.run(
        ["readelf", "-W", "-h", "-l", "-d", "--dyn-syms", build.folder / name],
        check=True,
        capture_output=True,
        text=True,
    )
    return done.stdout


# What may be called: functions that libarchive 3.3.3 has. Most are older than 3.1; read_support_filter_zstd came with
# 3.3.3 itself. A new call is entered here when the release notes of libarchive say that it is no younger.
LIBARCHIVE_3_3_3 = {
    f"archive_{name}"
    for name in """
    entry_copy_pathname entry_copy_symlink entry_filetype entry_free entry_gid entry_hardlink entry_mtime entry_new
    entry_pathname entry_perm entry_set_mode entry_set_mtime entry_set_size entry_size entry_symlink entry_uid
    errno error_string filter_bytes read_data read_free read_header_position read_new read_next_header
    read_open_filename read_support_filter_bzip2 read_support_filter_compress read_support_filter_gzip
    read_support_filter_lzip read_support_filter_lzma read_support_filter_xz read_support_filter_zstd
    read_support_format_empty read_support_format_tar write_close write_data write_free write_header write_new
    write_open_filename write_set_format_gnutar""".split()
}


def undefined_symbols(elf):
    return set(re.findall(r" UND (\w+)@GLIBC_", elf))


def test_machine(elf, architecture):
    assert re.search(r"Machine: +(.*)", elf)[1] == architecture.machine
    assert "2's complement, little endian" in elf


def test_needs_the_c_library_only(elf, architecture, name):
    """And orvpatchctl libarchive; its C library is in more than one file."""
    needed = set(re.findall(r"\(NEEDED\).*\[(.*)\]", elf))
    if name == "orvpatchctl":
        assert "libarchive.so.13" in needed
        needed -= {"libarchive.so.13", "libm.so.6", "libpthread.so.0"}
    assert needed == architecture.libraries


@pytest.mark.parametrize("name", ["orvpatchctl"])
def test_calls_what_every_libarchive_in_use_has(elf):
    """libarchive 3.3.3 is the oldest one: the long-lived distributions have it or a later one."""
    called = set(re.findall(r" UND (archive_\w+)$", elf, re.M))
    assert {"archive_read_new", "archive_write_new"} <= called
    assert called - LIBARCHIVE_3_3_3 == set()


def test_c_library_level(elf, build, name):
    levels = {tuple(map(int, level.split("."))) for level in re.findall(r"GLIBC_([\d.]+)", elf)}
    assert max(levels) == tuple(map(int, build.architecture.levels[name].split(".")))
    assert (build.folder / f"{name}.libc-level").read_text() == f"{build.architecture.levels[name]}\n"


@pytest.mark.parametrize("page", ["README.md", "man/orvpatch.8"])
def test_pages_tell_the_c_library_level(page):
    told = re.findall(
        r"glibc ([\d.]+) or later on POWER, ([\d.]+) or later on x86-64",
        " ".join((CHECKOUT / page).read_text().split()),
    )
    assert told == [(PPC64LE.levels["orvpatch"], AMD64.levels["orvpatch"])]


def test_readme_tells_what_orvpatchctl_needs():
    text = " ".join((CHECKOUT / "README.md").read_text().split())
    (level,) = {architecture.levels["orvpatchctl"] for architecture in (AMD64, PPC64LE)}
    assert f"`orvpatchctl` needs glibc {level} or later and libarchive 3.3.3 or later" in text


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


@pytest.mark.parametrize("name", ["orvpatch"])
def test_library_calls_are_fortified(elf):
    """Those that the sources make: formatting into a buffer and to a stream."""
    assert {"__vsnprintf_chk", "__printf_chk", "__fprintf_chk"} <= undefined_symbols(elf)


def test_debug_symbols_fit_the_shipped_program(build, name, tmp_path):
    """They lie where debuggers look for them, by the build id of the stripped program, and tell where main begins."""
    for archive in (build.symbols(name), build.package(".tar.gz", name)):
        subprocess.run(["tar", "-C", tmp_path, "--strip-components=1", "-xzf", archive], check=True)
    shipped = output_of("readelf", "-W", "-n", "-S", tmp_path / "sbin" / name)
    assert ".symtab" not in shipped and ".debug_info" not in shipped
    build_id = re.search(r"Build ID: (\w+)", shipped)[1]
    symbols = tmp_path / f"lib/debug/.build-id/{build_id[:2]}/{build_id[2:]}.debug"
    address = re.search(r"^ *\d+: (\w+) .* main$", output_of("readelf", "-W", "-s", symbols), re.M)[1]
    source = {"orvpatch": "src", "orvpatchctl": "ctl"}[name]
    assert re.search(rf"\b{source}/main\.cpp:\d+", output_of("addr2line", "-e", symbols, address))


def output_of(*command):
    return subprocess.run(command, check=True, capture_output=True, text=True).stdout


def test_carries_no_search_path(elf):
    assert "(RPATH)" not in elf and "(RUNPATH)" not in elf
