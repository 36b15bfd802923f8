"""What every command has in common: output that cannot be written, and what is installed of the program."""

import subprocess

import pytest


@pytest.mark.parametrize("words", (("status",), ("history",), ("log",), ("log", "1"), ("--help",)), ids=" ".join)
@pytest.mark.parametrize("form", ((), ("--json",)), ids=("text", "json"))
def test_output_that_cannot_be_written_is_no_success(ctl, home, words, form):
    rule = "=" * 78
    home.write(
        "patchlogs/orvpatch.log",
        f"{rule}\n ORV Patch Log File\n   System Name: host1\n   User Name:   root\n"
        f"   Process ID:  1\n   Build Date:  3/5/07 21:48:44\n{rule}\n",
    )
    if words == ("--help",):
        command = [str(ctl.program.binary), *words]
    else:
        command = [str(ctl.program.binary), words[0], str(home.path), *words[1:], *form]
    with open("/dev/full", "wb") as full:
        done = subprocess.run(command, stdout=full, stderr=subprocess.PIPE, check=False)
    assert done.returncode == 2
    assert b"cannot write to standard output" in done.stderr


def test_what_is_installed(ctl, scratch):
    build = ctl.program.binary.parent
    for component in ("ctl", "ctl-site", "ctl-debian"):
        subprocess.run(
            ["cmake", "--install", build, "--component", component, "--prefix", scratch],
            check=True,
            stdout=subprocess.DEVNULL,
        )
    expected = {
        "sbin/orvpatchctl",
        "share/bash-completion/completions/orvpatchctl",
        "share/man/man8/orvpatchctl.8.gz",
        "share/fish/vendor_completions.d/orvpatchctl.fish",
        "share/zsh/site-functions/_orvpatchctl",
        "share/zsh/vendor-completions/_orvpatchctl",
        "share/doc/orvpatchctl/schema/status.json",
        "share/doc/orvpatchctl/copyright",
    }
    installed = {str(path.relative_to(scratch)) for path in scratch.rglob("*") if path.is_file()}
    assert expected <= installed
    assert not [path for path in installed if path.endswith("/orvpatch")]
    version = subprocess.run([scratch / "sbin/orvpatchctl", "--version"], check=True, capture_output=True, text=True)
    assert version.stdout.startswith("orvpatchctl ")
