"""Conversions of printf in every value that reaches a message: none of them is ever taken for one."""


import pytest

from support import Patch, ProductHome, Result
from verdicts import SUCCESS, failure, refused

ODD = "%n%s%x%d"


@pytest.fixture
def product(scratch):
    """A home whose path, components and instances are full of conversions."""
    with ProductHome(scratch / ODD) as home:
        home.component("%n", arch="lpp%s", desc=ODD)
        home.component("qa", desc=ODD)
        yield home


@pytest.fixture
def folder(scratch):
    path = scratch / f"patches{ODD}"
    path.mkdir()
    return path


def odd_patch(**changes):
    fields = {"platform": "lpp%s", "fixpack": ODD, "name": ODD, "title": ODD, "arch": ODD, "exe": ODD}
    return Patch("%n", **{**fields, **changes}).file(f"bin/{ODD}")


def test_a_whole_report(program, product, folder):
    product.start("%n", ODD)
    archive = odd_patch().script(f"{ODD}.sh", "pre").write(folder)
    assert program.report(product, archive) == Result(
        0,
        (
            f"\n{'=' * 70}\nProcessing patch file: {archive}\n    {ODD}\n\n"
            "No commands to be executed before the agent instances are stopped.\n\n"
            "The following agent instances will be stopped during the patch application and restarted afterwards:\n"
            f"    {ODD} instance of {ODD}\n\n"
            f"The following commands will be executed after agent instances are stopped:\n    {ODD}.sh\n"
            "\nThe following files will be installed or replaced with new files:\n"
            f"    {product.prefix}bin/{ODD}\n"
            "\nNo commands to be executed before starting the agent instances.\n\n"
        ).encode()
        + SUCCESS,
        b"",
    )


def test_a_whole_installation(program, product, folder):
    product.start("%n", ODD)
    archive = odd_patch().file(f"{ODD}/{ODD}").script(f"{ODD}.sh", "pre", out=ODD, err=ODD).write(folder)
    assert program.install(product, archive) == Result(0, SUCCESS, b"")
    assert product.calls() == [f"QuillAgent -o {ODD} stop %n", f"{ODD}.sh", f"QuillAgent -o {ODD} start %n"]
    assert product.read(f"{ODD}/{ODD}") == b"new\n"
    assert product.level("%n", "lpp%s") == "06100100"
    assert [line[:5] for line in product.history()] == [("k%n", "lpp%s", "vema", ODD, "PASS")]
    source = f"{product.prefix}tmp/k%n/updated_files"
    infos = product.log().messages("INFO")
    assert infos[:4] == [
        "Processing 1 scripts.",
        f"Attempting to execute: {ODD}.sh",
        f"Successfully executed: {ODD}.sh",
        f"Will attempt to move files from {source} to {product.prefix}",
    ]
    new = [
        f"Creating new directory: {product.prefix}./{ODD}/",
        f"Successfully moved file from {source}/./{ODD}/{ODD} to {product.prefix}./{ODD}/{ODD}",
    ]
    old = [f"Successfully moved file from {source}/./bin/{ODD} to {product.prefix}./bin/{ODD}"]
    assert infos[4:7] in (new + old, old + new)  # as the two directories happen to be listed
    traces = product.log().messages("TRACE", "patchprocessor")
    assert traces.count(f"stdOut: {ODD}") == traces.count(f"stdErr: {ODD}") == 1


def test_a_home_that_is_not_there(program, scratch):
    result = program.validate(scratch / ODD, "x")
    assert result == Result(2, b"", f"Invalid path to ORV home: {scratch}/{ODD}/\n".encode())


def test_paths_that_hold_no_patch(program, product, folder):
    missing, other = folder / ODD, folder / f"k%n_lppx_vema_{ODD}.tar"
    assert program.install(product, missing) == refused(
        product, 30, f"Unable to locate path or file specified: {missing}"
    )
    assert program.install(product, folder) == refused(
        product, 31, f"Unable to locate patch files in directory specified: {folder}"
    )
    other.touch()
    assert program.install(product, folder) == refused(
        product,
        32,
        "Unable to locate or install patch files which are applicable to this\n"
        f"system in the directory specified: {folder}.",
    )
    assert program.install(product, other) == refused(
        product,
        34,
        f"The patch file {other} can not be installed.  Either the current platform architecture or the "
        "installed components do not meet the prerequisites of the patch.",
    )
    assert program.validate(product, missing) == refused(
        product, 5, f"Unable to read file [{missing}]: No such file or directory"
    )


DIFFERENT_USER = "may be running under a different userid and must be manually stopped before applying the patch."


@pytest.mark.parametrize(
    "patch, code, text",
    [
        (odd_patch().script(ODD, "pre_patch", status=3), 22, f"Bad return code from {ODD}: 3"),
        (
            odd_patch(code=ODD),
            9,
            f"The following product code {ODD} for the product being updated cannot be located in the .ver files and therefore, "
            "may not be installed at this time.  Verify the product you are attempting to update is actually installed on this "
            "system.",
        ),
        (odd_patch(prereqs={ODD: "%n%s%x"}), 9, f"Missing patch prerequisite: {ODD} %n.%s.%x.00"),
        (
            odd_patch(level=ODD),
            11,
            "Can't install backlevel patch version: %n.%s.%x.%d. Installed version is 06.10.00.00",
        ),
    ],
    ids=["command", "product", "prerequisite", "level"],
)
def test_a_patch_that_is_refused(program, product, folder, patch, code, text):
    assert program.install(product, patch.write(folder)) == refused(product, code, text)


@pytest.mark.parametrize(
    "code, verb, status, text",
    [
        ("%n", "stop", 15, "Unable to stop instance {0} of agent for product {0}.  The agent for product {0} "),
        ("%n", "start", 13, "Unable to start instance {0} of agent for product {0}."),
        ("qa", "stop", 19, "Unable to stop instance {0} of server for product {0}.  The server for product {0} "),
        ("qa", "start", 19, "Unable to start instance {0} of server for product {0}."),
    ],
)
def test_an_instance_that_does_not_obey(program, product, folder, code, verb, status, text):
    product.start(code, ODD)
    product.fail(verb, code, ODD, status=5, out=ODD, err=ODD)
    archive = odd_patch(dependents=["qa"]).write(folder)
    text = text.format(ODD) + (DIFFERENT_USER if verb == "stop" else "")
    assert program.install(product, archive) == refused(product, status, text)
    traces = product.log().messages("TRACE", "orvcomponent")
    assert traces.count(f"stdout: {ODD}") == traces.count(f"stderr: {ODD}") == 1


def test_a_server_that_runs(program, product, folder):
    product.component("qa")
    product.start("qa", ODD)
    archive = Patch("qa", target="vems", fixpack=ODD).file("x").write(folder)
    result = program.install(product, archive)
    text = (
        f"The {archive} file\nincludes updates for the Veyra Enterprise Monitoring Server. The server\n"
        "is currently running and must be stopped before the updates can be\napplied. The updates will not be applied at "
        "this time. Please stop the\nserver before attempting to install this patch again."
    )
    assert result == Result(35, failure(product), f"\n\n{text}\n\n\n\n".encode())
    assert product.log().messages("ERROR") == [text]


def test_files_and_directories_that_cannot_be_moved_or_made(program, product, folder):
    archive = odd_patch().write(folder)
    product.mkdir(f"bin/{ODD}")
    source = f"{product.prefix}tmp/k%n/updated_files/./bin/{ODD}"
    assert program.install(product, archive) == refused(
        product,
        25,
        f"Could not move file {source} to {product.prefix}./bin/{ODD}. Either the product being updated is "
        "still running or the file permissions are restricting access to the file. Verify the product has been "
        "stopped and the file permissions are not restricting access and then re-apply the patch.",
    )
    product.remove("tmp")
    product.write("tmp")
    assert program.install(product, archive) == refused(
        product, 3, f"Unable to create directory: {product.prefix}tmp/k%n"
    )


def test_a_log_that_cannot_be_written(program, product, folder):
    product.mkdir("patchlogs/orvpatch.log")
    result = program.report(product, folder / "missing")
    assert set(result.err.decode().splitlines()) == {
        f"Unable to write to log file: {product.prefix}patchlogs/orvpatch.log",
        f"Unable to locate path or file specified: {folder}/missing",
        "",
    }
