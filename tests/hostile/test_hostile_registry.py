"""Version files with any name and any content."""

import os
import socket

import pytest

from support import Patch
from textmodel import rewritten
from verdicts import INSTALLED, refused

MEGABYTE = 1 << 20


@pytest.fixture
def components(program, product, patch_dir):
    """The installed components as the program sees them: sorted "code: description" of all but the OS agent."""
    archive = Patch("ox", dependents=["all"]).directory().write(patch_dir)
    intro = "Processing instances for product: "

    def seen():
        assert program.report(product, archive).status == 0
        found = [
            message.removeprefix(intro)
            for message in product.log().messages("TRACE", "patchprocessor")
            if message.startswith(intro)
        ]
        return sorted(entry for entry in found if not entry.startswith("kox"))

    return seen


NAMES = {
    ".ver": "k.v",
    "x.ver": "kx.",
    "xy.ver": "kxy",
    "XY.ver": "kxy",
    "xy.ver.ver": "kxy",
    "%n%s.ver": "k%n",
    "a\nb.ver": "ka\n",
    "-rf.ver": "k-r",
    " .ver": "k .",
    "\udcff\udcfe.ver": "k\udcff\udcfe",
    "$(.ver": "k$(",
    "o" * 251 + ".ver": "koo",
    "*?.ver": "k*?",
    "xyvms.ver": "kxy",
    "zt.ver": "kzt",
    "xy.ver.bak": None,
    "ver": None,
    "xy.VER": None,
    "xy.ver ": None,
    "xyvpw.ver": None,
    "vpw.ver.ver": None,
}


@pytest.mark.parametrize("name", NAMES, ids=ascii)
def test_a_name_is_taken_by_its_ends(product, components, name):
    product.component("", desc="found", filename=name)
    assert components() == ([f"{NAMES[name]}: found"] if NAMES[name] else [])


def test_all_names_at_once(product, components):
    for name in NAMES:
        product.component("", desc=f"D{len(name)}", filename=name)
    assert components() == sorted(f"{code}: D{len(name)}" for name, code in NAMES.items() if code)


KINDS = {
    "fifo": os.mkfifo,
    "directory": os.mkdir,
    "dangling link": lambda path: os.symlink("/nonexistent", path),
    "link to itself": lambda path: os.symlink(path.name, path),
    "link to a device": lambda path: os.symlink("/dev/zero", path),
    "socket": lambda path: socket.socket(socket.AF_UNIX).bind(os.fsencode(path)),
    "many gigabytes": lambda path: (path.touch(), os.truncate(path, 1 << 42)),
}


@pytest.mark.parametrize("kind", KINDS)
def test_what_is_no_readable_file_is_no_component(product, components, kind):
    KINDS[kind](product.path / "registry/xy.ver")
    assert components() == []


@pytest.mark.parametrize(
    "content, desc",
    [
        (b"VRMF = 06100000\ndesc = \0x\n", ""),
        (b"desc = x\nVRMF\0 = 06100000\n", "x"),  # the key alone is its own value
        (b"desc = x\n\0VRMF = 06100000\n", None),
        (b"desc = " + b"x" * MEGABYTE + b"\nVRMF = 06100000", "x" * MEGABYTE),
        (b"VRMF = 06100000\n" + b"desc = y\n" * 999999 + b"descent=last", "last"),
        (b"VRMF = 06100000\n" + b"preReqALL = |\npreReqALL\npreReqALL=|a\n" * 1000 + b"desc = x", "x"),
        (b"VRMF=" + b"0" * MEGABYTE + b"\ndesc=x", "x"),
        (b"VRMF = 06100000\rdesc = x\r", ""),
        (b" VRMF = 06100000\n", None),
        (b"VRMF = \nVRMF = \t\r\n", None),
        (b"\xef\xbb\xbfVRMF = 06100000\n", None),
    ],
    ids=[
        "NUL in value",
        "NUL in key",
        "NUL before level",
        "megabyte",
        "million lines",
        "prerequisites",
        "long level",
        "CR",
        "leading blank",
        "empty level",
        "byte order mark",
    ],
)
def test_odd_contents(product, components, content, desc):
    product.write("registry/xy.ver", content)
    assert components() == ([] if desc is None else [f"kxy: {desc}"])


def test_a_file_of_one_byte_is_no_component(product, components):
    for value in range(256):
        product.write(f"registry/x{value}.ver", bytes([value]))
    assert components() == []


def test_any_byte_in_a_description(product, components):
    every = bytes(value for value in range(1, 256) if value != ord("\n"))
    product.write("registry/xy.ver", b"VRMF = 06100000\ndesc = <" + every + b">")
    assert components() == ["kxy: <" + every.decode("utf-8", "surrogateescape") + ">"]


EVERY_LINE = b"".join(b"a" + bytes([value]) + b"z\n" for value in range(1, 256))


@pytest.mark.parametrize(
    "content",
    [
        b"VRMF = 06100000\n" + EVERY_LINE,
        EVERY_LINE.replace(b"\n", b"\r\n") + b"\r\r\n\n\n\r\nVRMF = 06100000\r\n",
        b"VRMF = 06100000\nkept\n\0lost\n",
        b"VRMF = 06100000",
        b"VRMFx\nVRMF = 06100000\n VRMF = kept\nnot VRMF\n\n\n",
        b"VRMF = 06100000\n" + b"x" * MEGABYTE,
        b"line\n" * 1000000 + b"VRMF = 06100000\n",
    ],
    ids=["every byte", "CRLF", "NUL", "no end", "many keys", "megabyte", "million lines"],
)
def test_the_level_is_rewritten_and_all_other_lines_stay(program, product, patch_dir, content):
    # KEEP(final-empty-line)
    product.write("registry/oxlpp266.ver", content)
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    assert product.read("registry/oxlpp266.ver") == rewritten(content, b"06100100")


@pytest.mark.parametrize(
    "level, code, text",
    [
        ("zz.zz.zz.zz", 11, "Can't install backlevel patch version: 06.10.01.00. Installed version is zz.zz.zz.zz"),
        (
            "\udcff" * 8,
            11,
            "Can't install backlevel patch version: 06.10.01.00. Installed version is "
            "\udcff\udcff.\udcff\udcff.\udcff\udcff.\udcff\udcff",
        ),
        ("%n%n%n%n", 10, "Incorrect prerequisite version for kox. Installed = %n.%n.%n.%n, required = 06.10.00.00."),
        ("%s%n%s", 10, "Incorrect prerequisite version for kox. Installed = %s.%n.%s.00, required = 06.10.00.00."),
    ],
)
def test_a_level_that_is_no_number_is_compared_byte_by_byte(program, product, patch_dir, level, code, text):
    product.write("registry/oxlpp266.ver", f"VRMF = {level}\n".encode("utf-8", "surrogateescape"))
    result = program.install(product, Patch("ox").file("bin/tool").write(patch_dir))
    expected = refused(product, code, text.encode("utf-8", "surrogateescape").decode("latin-1"))
    assert result == expected._replace(err=expected.err.decode().encode("latin-1"))
    assert not product.exists("bin/tool")


def test_a_version_file_of_the_patch_that_is_a_link_is_rewritten_where_it_leads(program, product, patch_dir, scratch):
    (scratch / "foreign").write_bytes(b"first\n\nVRMF = 06100000\n")
    product.remove("registry/oxlpp266.ver")
    os.symlink(scratch / "foreign", product.path / "registry/oxlpp266.ver")
    assert program.install(product, Patch("ox").file("bin/tool").write(patch_dir)) == INSTALLED
    assert (scratch / "foreign").read_bytes() == b"first\nVRMF = 06100100\n\n"
    assert os.path.islink(product.path / "registry/oxlpp266.ver")
