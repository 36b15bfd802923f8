"""The manual pages: their form, their promises, and every example in them."""

import re
import subprocess

import pytest

from man.pages import FOLDER, read_page, source
from support import Patch

PAGES = ["orvpatch.8", "orvpatchctl.8", "patch.ini.5", "orvpatch-archive.5", "orv-registry.5", "patches.hist.5"]
ROOT = FOLDER.parent


def statuses_of_the_sources():
    """Every status that the program can end with: the codes of the error record, and what is an ExitStatus."""
    sources = "".join(path.read_text() for path in sorted((ROOT / "src").glob("*.*")))
    bodies = re.findall(r"enum (?:Code|ExitStatus)\b[^{]*\{(.*?)\}", sources, re.S)
    return sorted({int(value) for body in bodies for value in re.findall(r"= (-?\d+)", body)} - {-1})


STATUSES = statuses_of_the_sources()


@pytest.fixture(scope="module")
def manual(tmp_path_factory):
    """A folder of our pages and of those that they refer to, which a small system may lack; mandoc looks for a
    page in the folder that it runs in, and in the system's."""
    folder = tmp_path_factory.mktemp("manual")
    for name in [*PAGES, "grep.1", "ps.1", "screen.1", "su.1", "sudo.8", "tar.1"]:
        (folder / name).write_text(source(name) if name in PAGES else "")
    return folder


def rendered(name):
    done = subprocess.run(["mandoc", "-T", "ascii", "-O", "width=200", FOLDER / name], check=True, capture_output=True)
    return re.sub(".\b", "", done.stdout.decode())


def section(text, title):
    return re.split(r"\n(?=[A-Z])", text.split(f"\n{title}\n", 1)[1])[0]


def test_all_pages_are_known():
    assert sorted(path.name for path in FOLDER.iterdir()) == sorted(PAGES)


@pytest.mark.parametrize("name", PAGES)
def test_mandoc_finds_nothing(name, manual):
    done = subprocess.run(["mandoc", "-W", "all", "-T", "lint", name], cwd=manual, text=True, capture_output=True)
    # The pages of a base system leave the version to mandoc; those of any other program state it.
    found = [line for line in done.stdout.splitlines() if "operating system explicitly specified" not in line]
    assert found == []


@pytest.mark.parametrize("name", PAGES)
def test_the_page_states_the_version(name):
    version = re.search(r"project\(orvpatch VERSION ([\d.]+)", (ROOT / "CMakeLists.txt").read_text())[1]
    assert f"\n.Os orvpatch {version}\n" in source(name)


@pytest.mark.parametrize("name", PAGES)
def test_every_example_is_marked(name):
    page = read_page(name)
    assert page.unmarked == []
    assert source(name).count(".Bd ") == len(page.sessions) + len(page.files)
    assert not re.search(r"^\.Dl ", source(name), re.M)


def test_synopsis_is_that_of_the_usage_text(program):
    usage = [line.strip() for line in program.run().out.decode().splitlines() if line.startswith("   orvpatch ")]
    forms = [re.sub(r"<([^>]*)>", lambda word: word[1].replace(" ", "_"), line) for line in usage]
    forms = [form.replace("{ ", "{").replace(" }", "}") for form in forms]
    synopsis = [line.strip() for line in section(rendered("orvpatch.8"), "SYNOPSIS").splitlines() if line]
    assert len(forms) == 2
    assert synopsis == [*forms, "orvpatch -h ORV_home -vi descriptor"]


def status_items():
    text = source("orvpatch.8").split(".Sh EXIT STATUS", 1)[1].split(".El", 1)[0]
    return {int(status): cause for status, cause in re.findall(r"^\.It (\d+)\n(.*?)(?=^\.It|\Z)", text, re.M | re.S)}


def test_every_exit_status_is_listed_once():
    assert list(status_items()) == STATUSES


@pytest.mark.parametrize("status", STATUSES[1:])
def test_exit_status_has_cause_and_remedy(status):
    cause, marker, remedy = status_items()[status].partition(".Em Remedy :\n")
    assert cause.strip() and marker and remedy.strip()


def fix_pack(level, fixpack):
    return Patch("xe", level=level, fixpack=fixpack, name=f"6.1.0-KXE-{fixpack.upper()}")


def test_examples_of_the_program(example):
    apply_all, compare, watch, script = read_page("orvpatch.8").sessions
    example.install_products()
    example.home.start("xe", "prod")
    fix_pack("06100002", "fp0002").file("lpp266/xe/bin/kxeagent").write(example.patches)

    running = [("xe", f"{example.names['vega']}_prod")]
    example.environment.update(PS_FORMAT="comm", PS_PERSONALITY="old", TAR_OPTIONS="--no-such-option")
    last_line = example.run(apply_all)[-1]
    assert last_line.startswith("kxe | lpp266 | vema | 6.1.0-KXE-FP0002     | PASS | ")
    assert example.home.level("xe") == "06100002"
    assert example.home.instances() == running

    for name in ("PS_FORMAT", "PS_PERSONALITY", "TAR_OPTIONS"):
        del example.environment[name]

    assert example.run(compare) == ["", "", ""]
    subprocess.run(["rm", "-rf", example.names["/root/check"]], check=True)
    example.home.write("lpp266/xe/bin/kxeagent", "other")
    assert "kxeagent differ" in example.run(compare)[-1]

    log = example.home.read("patchlogs/orvpatch.log")
    assert f"Processing patch files in directory: {example.patches.name}" in example.run(watch)[0]
    assert example.home.read("patchlogs/orvpatch.log") == log

    example.environment["patch"] = str(fix_pack("06100001", "fp0001").write(example.here))
    example.run(script)


def test_examples_of_the_descriptor(example):
    validate, short, traps = read_page("patch.ini.5").sessions
    example.install_products()
    example.write(read_page("patch.ini.5").files)
    for session in (validate, short, traps):
        example.run(session)


def test_command_with_arguments_by_a_script_of_its_own(example):
    wrapper = read_page("patch.ini.5").files["20-second.sh"]
    example.install_products()
    patch = fix_pack("06100002", "fp0002").script("second.sh").member("20-second.sh", wrapper, 0o755)
    patch.command("pre", "20-second.sh").write(example.here)
    status = subprocess.run(
        ["orvpatch", "-h", example.home.path, "-i", patch.filename],
        cwd=example.here,
        env=example.environment,
        stdout=subprocess.DEVNULL,
    ).returncode
    assert (status, example.home.calls()) == (0, ["second.sh --level=2"])


def test_examples_of_the_archive(example):
    prepare, pack, report, dotted = read_page("orvpatch-archive.5").sessions
    example.install_products()
    example.write({"patch.ini": read_page("patch.ini.5").files["patch.ini"]})
    example.write({name: "#!/bin/sh\n" for name in ("10-adapt.sh", "10-room.sh", "10-save.sh", "20-convert.sh")})
    example.write({"kxeagent": "new\n"})
    for session in (prepare, pack, report, dotted):
        example.run(session)


def test_examples_of_the_registry(example):
    levels, running = read_page("orv-registry.5").sessions
    example.names["4711"] = str(example.home.process("lpp266/xe/bin/kxeagent"))
    example.write(read_page("orv-registry.5").files)
    fix_pack("06100002", "fp0002").directory().write(example.here)
    example.run(levels)
    example.run(running)


def test_examples_of_history_and_log(example):
    fail, history, errors, failed, stopped = read_page("patches.hist.5").sessions
    example.install_products()
    example.home.start("xe", "prod")
    check = {"when": "pre", "status": 3, "out": "the table space is too small\n"}
    fix_pack("06100004", "fp0004").script("10-check.sh", **check).write(example.here)
    for session in (fail, history, errors, failed, stopped):
        example.run(session)
