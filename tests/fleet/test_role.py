"""The role in a play of one's own, by a local connection."""

import json
import os
import re
import shutil
import subprocess

import pytest

from support import Patch

PLAY = """\
- name: Bring the home to the fix pack
  hosts: all
  gather_facts: false
  roles:
    - role: orv.patch.fixpack
"""


@pytest.fixture
def play(controller, home, patch_dir, ctl_binary):
    """play(word...) runs the role on a home with one product; returns status, output, and how many tasks changed.
    A variable that is None is left out."""
    home.component("yn")
    (home.path / "tmp").chmod(0o700)
    Patch("yn").file("lib/new", "new\n").write(patch_dir)
    variables = {
        "ansible_connection": "local",
        "fixpack_home": str(home.path),
        "fixpack_source": str(patch_dir),
        "fixpack_orvpatchctl": str(ctl_binary),
    }
    (controller.folder / "plays").mkdir()  # not where the engine is started: it searches beside a playbook, too
    (controller.folder / "plays/play.yml").write_text(PLAY)

    def run(*words, playbook="plays/play.yml", **other):
        given = {name: value for name, value in {**variables, **other}.items() if value is not None}
        hosts = {"all": {"hosts": {"here": given}}}
        (controller.folder / "hosts.json").write_text(json.dumps(hosts))
        status, printed = controller.run("ansible-playbook", "-i", "hosts.json", playbook, *words)
        return status, printed, int(re.search(r"changed=(\d+)", printed).group(1))

    return run


def test_the_role_brings_a_home_to_a_patch_once(play, home):
    status, printed, _ = play("--check", "--diff")
    assert (status, home.level("yn")) == (0, "06100000")
    assert "+kyn 06.10.01.00" in printed and "+lib/new (new)" in printed
    assert (play()[0], home.level("yn"), home.read("lib/new")) == (0, "06100100", b"new\n")
    before = home.tree()
    assert play()[::2] == (0, 0)
    assert home.tree() == before


def test_the_role_fails_before_a_change_where_the_check_does(play, home):
    (home.path / "tmp").chmod(0o777)
    status, printed, _ = play()
    assert status == 2
    assert "refused: home-tmp" in printed
    assert home.history() == []


def test_the_role_fails_where_the_home_differs_in_the_end(play, home, patch_dir):
    patch = Patch("yn").file("lib/new").script("go.sh", when="pre", body="rm updated_files/lib/new")
    patch.write(patch_dir)
    status, printed, _ = play()
    assert status == 2
    assert "incomplete: lib/new" in printed


def test_a_patch_that_its_checksums_do_not_list_so_does_not_leave_the_controller(play, home, patch_dir, controller):
    (patch_dir / "SHA256SUMS").write_text(f"{'0' * 64}  {Patch('yn').filename}\n")
    status, printed, changed = play()
    assert (status, changed) == (2, 0)
    assert "is not the file that" in printed
    assert not (controller.folder / "home/.orv_patch").exists()


def test_a_variable_of_another_type_is_told(play):
    status, printed, _ = play(fixpack_keep="many")
    assert status == 2 and "fixpack_keep" in printed


def test_a_role_without_a_home_is_told_what_is_missing(play, home):
    status, printed, _ = play(fixpack_home=None)
    assert status == 2 and "missing required arguments: fixpack_home" in printed
    assert home.history() == []


def test_a_source_is_looked_for_where_the_engine_was_started(play, home, patch_dir, controller):
    shutil.copytree(patch_dir, controller.folder / "fixpack2")
    assert play(fixpack_source="fixpack2")[0] == 0
    assert home.read("lib/new") == b"new\n"
    assert play(fixpack_source=f"fixpack2/{Patch('yn').filename}")[::2] == (0, 0)


@pytest.mark.parametrize("copy", [True, False])
def test_only_a_last_transaction_of_the_same_patches_is_undone(play, home, scratch, copy):
    """Copied or read on the host, another fix pack is not taken back in the place of the one that is meant."""
    assert play(fixpack_copy=copy)[0] == 0
    other = scratch / "other"
    other.mkdir()
    Patch("yn", level="06100200", fixpack="fp0002").file("lib/other").write(other)
    undo = {"playbook": "orv.patch.undo", "fixpack_copy": copy}
    assert play(fixpack_source=str(other), **undo)[::2] == (0, 0)
    assert home.level("yn") == "06100100"
    assert play(**undo)[::2] == (0, 1)
    assert home.level("yn") == "06100000"


def test_a_home_that_this_rollout_has_not_changed_is_not_taken_back(play, home, scratch):
    """Its batch is, but its transaction is an older one: what differs in it came from elsewhere."""
    assert play()[0] == 0
    home.write("lib/new", "other\n")
    before = home.tree()
    rollout = {"playbook": "orv.patch.rollout", "fixpack_undo_batch": True}
    status, printed, changed = play(fixpack_report=str(scratch / "reports"), **rollout)
    assert (status, changed) == (2, 0), printed
    (told,) = json.loads((scratch / "reports/fleet.json").read_text())["fleet"]
    assert (told["verdict"], told["batch"]) == ("incomplete", 1)
    assert told["reason"].startswith("lib/new: ")
    assert home.tree() == before


@pytest.fixture
def sign(scratch, patch_dir):
    """sign() lists the patches in SHA256SUMS and signs that; `sign.keyring` has the key."""
    folder = scratch / "gnupg"
    folder.mkdir(mode=0o700)
    environment = {**os.environ, "GNUPGHOME": str(folder)}

    def gpg(*words):
        command = ["gpg", "--batch", "-q", *words]
        return subprocess.run(command, env=environment, cwd=patch_dir, check=True, stdout=subprocess.PIPE).stdout

    def make():
        (patch_dir / "SHA256SUMS.asc").unlink(missing_ok=True)
        subprocess.run("sha256sum *.tar >SHA256SUMS", shell=True, cwd=patch_dir, check=True)
        gpg("--armor", "--detach-sign", "SHA256SUMS")

    gpg("--passphrase", "", "--quick-gen-key", "maker@example", "ed25519", "sign")
    make.keyring = scratch / "keyring.gpg"
    make.keyring.write_bytes(gpg("--export"))
    yield make
    subprocess.run(["gpgconf", "--kill", "all"], env=environment, check=False)


def test_only_a_signed_patch_gets_in_where_a_keyring_is_set(play, home, patch_dir, sign):
    sign()
    signature = (patch_dir / "SHA256SUMS.asc").read_bytes()
    Patch("yn", level="06100200").file("lib/new", "foreign\n").write(patch_dir)
    sign()
    (patch_dir / "SHA256SUMS.asc").write_bytes(signature)  # of the patch that was there before
    status, printed, _ = play(fixpack_keyring=str(sign.keyring), fixpack_require_sums=True)
    assert status == 2 and "refused: signature-bad" in printed
    assert home.history() == []
    sign()
    assert play(fixpack_keyring=str(sign.keyring), fixpack_require_sums=True)[0] == 0
    assert home.read("lib/new") == b"foreign\n"
