"""The contenders: the tool, the floor of its design, and common packagers."""

import os
import shutil
import subprocess
from dataclasses import dataclass
from typing import Callable

TOOL, FLOOR, FLOOR_AT = "orvpatch", "floor", "floor, short names"
_CONTROL = "Package: {name}\nVersion: 1\nArchitecture: all\nMaintainer: nobody <nobody@localhost>\nDescription: x\n"
_SPEC = """Name: {name}
Version: 1
Release: 1
Summary: Files
License: none
BuildArch: noarch
AutoReqProv: no
%description
Files.
%install
cp -a {tree}/. %{{buildroot}}
%files
/lib
"""


@dataclass(frozen=True)
class Peer:
    """A program beside the tool. `build` makes its package of one tree and returns its path, `command` returns the
    words that install a list of packages into a home, `prepare` makes what it needs in a fresh home."""

    name: str
    program: str
    build: Callable
    command: Callable
    prepare: Callable = lambda home: None
    needs_root: bool = False

    def obstacle(self):
        """The reason why it cannot take part here; empty when it can."""
        if shutil.which(self.program) is None:
            return f"{self.program} is not installed"
        return "needs root" if self.needs_root and os.geteuid() != 0 else ""


def _tree_itself(tree, _folder):
    return tree


def _tar_archive(tree, folder):
    archive = folder / f"{tree.name}.tar"
    subprocess.run(["tar", "-cf", archive, "-C", tree, *sorted(os.listdir(tree))], check=True)
    return archive


def _extract_each(home, archives):
    return ["sh", "-ec", 'home=$1; shift; for archive; do tar -xf "$archive" -C "$home"; done', "sh", home, *archives]


def _deb_package(tree, folder):
    package = folder / f"{tree.name}.deb"
    control = tree / "DEBIAN"
    control.mkdir()
    (control / "control").write_text(_CONTROL.format(name=f"payload{tree.name}"))
    # Not compressed, like the patch files: the comparison is of installing, not of unpacking xz.
    subprocess.run(["dpkg-deb", "-Znone", "--build", tree, package], check=True, stdout=subprocess.DEVNULL)
    shutil.rmtree(control)
    return package


def _prepare_dpkg(home):
    database = home / "var/lib/dpkg"
    for name in ("info", "updates", "triggers"):
        (database / name).mkdir(parents=True, exist_ok=True)
    for name in ("status", "available"):
        (database / name).touch()


def _dpkg(option):
    # The option is always given: the machine's configuration may set the opposite.
    return lambda home, packages: ["dpkg", option, f"--root={home}", f"--log={home}/var/lib/dpkg/log", "-i", *packages]


def _rpm_package(tree, folder):
    top, spec = folder / "rpmbuild", folder / "payload.spec"
    spec.write_text(_SPEC.format(name=f"payload{tree.name}", tree=tree))
    settings = {
        "_topdir": top,
        "_rpmdir": folder,
        "_rpmfilename": "%{NAME}.rpm",
        "_binary_payload": "w.ufdio",
        "__spec_install_post": "%{nil}",
    }
    defines = [word for name, value in settings.items() for word in ("--define", f"{name} {value}")]
    subprocess.run(["rpmbuild", "-bb", "--quiet", *defines, spec], check=True, stderr=subprocess.DEVNULL)
    shutil.rmtree(top)
    return folder / f"payload{tree.name}.rpm"


def _rpm(home, *words):
    return ["rpm", "--root", home, "--dbpath", "/var/lib/rpm", *words]


def _prepare_rpm(home):
    (home / "var/lib/rpm").mkdir(parents=True, exist_ok=True)
    subprocess.run(_rpm(home, "--initdb"), check=True)


PEERS = (
    Peer("tar -xf", "tar", _tar_archive, _extract_each),
    Peer("dpkg -i", "dpkg", _deb_package, _dpkg("--no-force-unsafe-io"), _prepare_dpkg, needs_root=True),
    Peer("dpkg -i --force-unsafe-io", "dpkg", _deb_package, _dpkg("--force-unsafe-io"), _prepare_dpkg, needs_root=True),
    Peer(
        "rpm -U", "rpm", _rpm_package, lambda home, packages: _rpm(home, "-U", *packages), _prepare_rpm, needs_root=True
    ),
    Peer(
        "rsync -a",
        "rsync",
        _tree_itself,
        lambda home, trees: ["rsync", "-a", *(f"{tree}/" for tree in trees), f"{home}/"],
    ),
)
