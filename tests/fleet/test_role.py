"""The role in a play of one's own, by a local connection."""

import json
import re

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
    """play(word...) runs the role on a home with one product; returns status, output, and how many tasks changed."""
    home.component("yn")
    (home.path / "tmp").chmod(0o700)
    Patch("yn").file("lib/new", "new\n").write(patch_dir)
    variables = {
        "ansible_connection": "local",
        "fixpack_home": str(home.path),
        "fixpack_source": str(patch_dir),
        "fixpack_orvpatchctl": str(ctl_binary),
    }
    (controller.folder / "play.yml").write_text(PLAY)

    def run(*words, **other):
        hosts = {"all": {"hosts": {"here": {**variables, **other}}}}
        (controller.folder / "hosts.json").write_text(json.dumps(hosts))
        status, printed = controller.run("ansible-playbook", "-i", "hosts.json", "play.yml", *words)
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


def test_a_patch_that_its_checksums_do_not_list_so_does_not_leave_the_controller(
    play, home, patch_dir, controller
):
    (patch_dir / "SHA256SUMS").write_text(f"{'0' * 64}  {Patch('yn').filename}\n")
    status, printed, changed = play()
    assert (status, changed) == (2, 0)
    assert "is not the file that" in printed
    assert not (controller.folder / "home/.orv_patch").exists()


def test_a_role_without_a_home_is_told_what_is_missing(play):
    status, printed, _ = play(fixpack_keep="many")
    assert status == 2 and "fixpack_keep" in printed
