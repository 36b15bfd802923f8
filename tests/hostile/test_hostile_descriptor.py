"""patch.ini with any bytes, of any size."""

import pytest

from support import Patch, Result
from textmodel import entry_names
from verdicts import INSTALLED, SUCCESS, product_tree, refused

GOOD = Patch("ox").descriptor_text().encode()
MEGABYTE = 1 << 20
NO_SECTION = (6, "Missing required section: ProductInfo")


@pytest.fixture
def validate(program, product, scratch):
    """Validates a text; returns the result with the path taken out."""
    path = scratch / "patch.ini"

    def run(content):
        path.write_bytes(content)
        result = program.validate(product, path)
        return result._replace(out=result.out.replace(bytes(path), b"PATH"))

    return run


VALID = Result(0, b"\nPATH is valid\n\n" + SUCCESS, b"")


def test_a_descriptor_of_one_byte_has_no_section(validate, product):
    results = {value: validate(bytes([value])) for value in range(256)}
    assert results == dict.fromkeys(range(256), refused(product, *NO_SECTION))


@pytest.mark.parametrize(
    "content, refusal",
    [
        (GOOD + b"\0[ProductInfo]\n", None),
        (GOOD.replace(b"productBinArch", b"\0"), None),
        (GOOD.replace(b"productLvl", b"\0"), (7, "Missing required property: productEXE")),
        (b"\0" + GOOD, NO_SECTION),
        (GOOD.replace(b"\n", b"\r\n"), None),
        (GOOD.replace(b"\n", b"\r"), NO_SECTION),
        (GOOD.replace(b"\n", b"\n\n \t\r\n"), None),
        (GOOD.rstrip(b"\n"), None),
        (b"\xef\xbb\xbf" + GOOD, NO_SECTION),
        (GOOD.decode().encode("utf-16"), NO_SECTION),
        (GOOD.replace(b"[ProductInfo]", b"[ProductInfo"), NO_SECTION),
        (GOOD.replace(b"[ProductInfo]", b"[ProductInfo]]"), NO_SECTION),
        (GOOD.replace(b"[ProductInfo]", b"[\t ProductInfo \t}"), None),
        (GOOD + b"[ProductInfo]\n", (7, "Missing required property: productEXE")),
        (b"[[[[\n]]]]\n[]\n[\n]\n=\n==\n" + GOOD + b"[\n=\n", None),
    ],
    ids=[
        "NUL behind",
        "NUL in optional",
        "NUL in required",
        "NUL before",
        "CRLF",
        "CR alone",
        "blank lines",
        "no end",
        "byte order mark",
        "UTF-16",
        "no bracket",
        "two brackets",
        "blanks",
        "section again",
        "brackets",
    ],
)
def test_odd_texts(validate, product, content, refusal):
    assert validate(content) == (refused(product, *refusal) if refusal else VALID)


@pytest.mark.parametrize(
    "content",
    [
        b"#" * MEGABYTE + b"\n" + GOOD,
        GOOD + b"[PreCommands]\n" + b"k" * MEGABYTE,
        GOOD + b"[" + b"s" * MEGABYTE + b"\n",
        GOOD + b"[PreReqs]\nox = " + b"9" * MEGABYTE,
        GOOD + b" " * MEGABYTE + b"\n",
        GOOD + b"[Dependents]\n" + b"=" * MEGABYTE,
        b"stray" * (MEGABYTE // 5) + b"\n" + GOOD,
    ],
    ids=["comment", "key", "header", "value", "blanks", "equals", "stray"],
)
def test_a_line_of_a_megabyte(validate, content):
    assert validate(content) == VALID


@pytest.mark.parametrize(
    "content",
    [
        b"\n" * 1000000 + GOOD,
        b"#\n" * 1000000 + GOOD,
        GOOD + b"[PreCommands]\n" + b"".join(b"%d\n" % number for number in range(1000000)),
        GOOD + b"[PreCommands]\n" + b"same\n" * 1000000,
        GOOD + b"[s]\n" * 1000000,
        b"stray\n" * 1000000 + GOOD,
    ],
    ids=["empty", "comments", "entries", "one entry", "headers", "stray"],
)
def test_a_million_lines(validate, content):
    assert validate(content) == VALID


def test_a_million_commands_are_reported_in_order(program, product, patch_dir):  # KEEP(sorted-names)
    commands = sorted(str(number) for number in range(1000000))
    report = program.report(product, Patch("ox", pre=reversed(commands)).directory().write(patch_dir))
    assert (report.status, report.err) == (0, b"")
    printed = [line[4:] for line in report.out.decode().splitlines() if line.startswith("    ")]
    assert printed[1:] == commands  # the first is the title


def patch_of(content, scratch):
    return Patch("ox", descriptor=content.decode("utf-8", "surrogateescape")).directory().write(scratch)


def test_any_byte_in_a_command(program, product, patch_dir):
    section = b"".join(b"a" + bytes([value]) + b"z\n" + bytes([value]) + b"\n" for value in range(1, 256))
    content = GOOD + b"[PostCommands]\n" + section
    report = program.report(product, patch_of(content, patch_dir))
    listed = b"".join(b"    " + name + b"\n" for name in entry_names(content, b"PostCommands"))
    assert report == Result(0, report.out, b"")
    assert report.out.endswith(b"before restarting any previously stopped agents:\n" + listed + b"\n" + SUCCESS)


def test_any_byte_in_name_and_title(program, product, patch_dir):
    every = bytes(value for value in range(1, 256) if value != ord("\n"))
    content = GOOD.replace(b"= kox_fp0001", b"= <" + every + b">").replace(
        b"= Fix pack", b"= <" + every + b"> Fix pack"
    )
    archive = patch_of(content, patch_dir)
    assert b"    <" + every + b"> Fix pack fp0001 for kox\n\n" in program.report(product, archive).out
    assert program.install(product, archive) == INSTALLED
    record = product.read("patchlogs/patches.hist").split(b"#" * 80 + b"\n")[2]
    assert record.startswith(b"kox | lpp266 | vema | <" + every + b"> | PASS | ")


def test_a_name_and_a_title_of_a_megabyte(program, product, patch_dir):
    archive = Patch("ox", name="n" * MEGABYTE, title="t" * MEGABYTE).directory().write(patch_dir)
    assert b"\n    " + b"t" * MEGABYTE + b"\n\n" in program.report(product, archive).out
    assert program.install(product, archive) == INSTALLED
    assert product.history()[0].name == "n" * MEGABYTE


@pytest.mark.parametrize(
    "old, new, code, text",
    [
        (
            b"productVer = 06",
            b"productVer = " + b"9" * MEGABYTE,
            10,
            "Incorrect prerequisite version for kox. Installed = 06.10.00.00, required = 99.10.00.00.",
        ),
        (
            b"productVer = 06",
            b"productVer =",
            10,
            "Incorrect prerequisite version for kox. Installed = 06.10.00.00, required = .10.00.00.",
        ),
        (
            b"productCode = kox",
            b"productCode = " + b"X" * MEGABYTE,
            9,
            "The following product code " + "x" * (1023 - 27),
        ),
        (
            b"productCode = kox",
            b"productCode =",
            9,
            "The following product code  for the product being updated cannot be located in the .ver files and therefore, "
            "may not be installed at this time.  Verify the product you are attempting to update is actually installed on "
            "this system.",
        ),
        (
            b"productCode = kox",
            b"productCode = ../../etc",
            9,
            "The following product code ../../etc for the product being updated cannot be located in the .ver files and "
            "therefore, may not be installed at this time.  Verify the product you are attempting to update is actually "
            "installed on this system.",
        ),
    ],
    ids=["long level", "empty level", "long code", "empty code", "code with a path"],
)
def test_values_that_no_installation_matches(program, product, patch_dir, old, new, code, text):
    before = product_tree(product)
    assert program.install(product, patch_of(GOOD.replace(old, new), patch_dir)) == refused(product, code, text)
    assert product_tree(product) == before


@pytest.mark.parametrize(
    "prereq, shown",
    [
        (b"=061000", " 06.10.00.00"),
        (b"x", "x 06.10.00.00"),
        (b"%n=99", "k%n 06.10.00.00"),
        (b"p" * MEGABYTE, "p" * (1023 - 28)),
    ],
    ids=["empty", "one letter", "conversion", "megabyte"],
)
def test_a_prerequisite_that_nothing_can_meet(program, product, patch_dir, prereq, shown):
    product.component("ox", prereqs=["y"])  # shorter than a product code and architecture
    archive = patch_of(GOOD + b"[PreReqs]\n" + prereq + b"\n", patch_dir)
    assert program.install(product, archive) == refused(product, 9, "Missing patch prerequisite: " + shown)


@pytest.mark.parametrize(
    "command, status",
    [("n" * 300, 36), ("/" + "n/" * 3000, 36), ("", 2), ("/", 13), (".", 13), ("./nothing", 2), ("--help", 2)],
)
def test_a_command_that_is_no_program(program, product, patch_dir, command, status):
    archive = patch_of(GOOD + b"[PrePatchCommands]\n" + command.encode() + b"=\n", patch_dir)
    text = f"Bad return code from {command}: {status}"[:1023]
    assert program.install(product, archive) == refused(product, 22, text)
