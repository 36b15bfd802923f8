"""scripts/setup installs what is missing and says what it cannot install; nothing is really installed here."""

import subprocess
from pathlib import Path

import pytest

from support import stubs

_SETUP = Path(__file__).resolve().parents[2] / "scripts/setup"


class Machine:
    """A machine for the script: all packages are installed but those named in the file `lacking`."""

    def __init__(self, folder, apt_get, user=0, sudo='exec "$@"'):
        self.lacking, self.calls = folder / "lacking", folder / "calls"
        self.lacking.write_text("")
        self.calls.write_text("")
        query = f"""shift 3
            for name; do grep -q -x -F -e "$name" {self.lacking} || printf 'ii  %s\\n' "$name"; done"""
        log = f'echo "$(basename "$0") $*" >>{self.calls}'
        self.path = stubs(
            folder / "bin",
            **{
                "dpkg-query": query,
                "apt-get": f"{log}\n{apt_get}".format(lacking=self.lacking),
                "id": f"echo {user}",
                "sudo": f"{log}\n{sudo}",
            },
        )

    def setup(self, *groups):
        return subprocess.run(
            [_SETUP, *groups], env={"PATH": self.path}, capture_output=True, text=True, timeout=60, check=False
        )


_INSTALLS = 'case "$*" in *install*) : >{lacking} ;; esac'
_FAILS = "echo 'E: no network' >&2; exit 100"
_APT = "-qq -o DPkg::Lock::Timeout=300"


def outcome(done):
    return done.returncode, done.stdout, done.stderr


def test_nothing_missing_is_silent_and_calls_nothing(scratch):
    machine = Machine(scratch, _FAILS)
    assert outcome(machine.setup()) == (0, "", "")
    assert machine.calls.read_text() == ""


def test_only_what_is_missing_is_installed_after_an_update(scratch):
    machine = Machine(scratch, _INSTALLS)
    machine.lacking.write_text("ninja-build\ncmake\n")
    assert outcome(machine.setup("build")) == (0, "", "setup: installing cmake ninja-build\n")
    assert machine.calls.read_text().splitlines() == [
        f"apt-get {_APT} update",
        f"apt-get {_APT} install -y --no-install-recommends cmake ninja-build",
    ]


def test_a_group_that_was_not_asked_for_is_left_alone(scratch):
    machine = Machine(scratch, _INSTALLS)
    machine.lacking.write_text("valgrind\nrsync\nlintian\nqemu-user\n")
    assert outcome(machine.setup("build", "demo")) == (0, "", "")
    assert outcome(machine.setup()) == (0, "", "setup: installing valgrind\n")


def test_an_ordinary_user_installs_through_sudo(scratch):
    machine = Machine(scratch, _INSTALLS, user=1000)
    machine.lacking.write_text("cmake\n")
    assert machine.setup("build").returncode == 0
    assert machine.calls.read_text().splitlines()[0] == (
        f"sudo env DEBIAN_FRONTEND=noninteractive LC_ALL=C apt-get {_APT} update"
    )


@pytest.mark.parametrize("user, cause", [(0, "E: no network"), (1000, "sudo: not allowed")])
def test_what_cannot_be_installed_is_named(scratch, user, cause):
    machine = Machine(scratch, _FAILS, user=user, sudo="echo 'sudo: not allowed' >&2; exit 1")
    machine.lacking.write_text("rsync\n")
    assert outcome(machine.setup("bench")) == (
        1,
        "",
        f"setup: installing rsync\n{cause}\n" "setup: these packages are missing and cannot be installed here: rsync\n",
    )


def test_an_unknown_group_is_refused(scratch):
    done = Machine(scratch, _FAILS).setup("build", "nosuch")
    assert done.returncode == 2
    assert done.stderr.startswith("setup: no such group: nosuch (there are: ")
