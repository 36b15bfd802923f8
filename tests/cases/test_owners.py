"""Agents of other users: as root the program switches to the owner, as any other user it refuses."""

import os
import pwd

import pytest

from support import Patch, stubs
from support.catalogue import text


@pytest.fixture
def site(site):
    site.home.component("yn", desc="Yellow Net")
    site.home.component("ox", desc="Linux OS")
    site.home.component("qa", desc="Server")
    return site


@pytest.mark.needs_root
def test_root_starts_an_agent_as_its_owner(site, other_owner):
    site.home.start("yn", "north", user=other_owner.uid)
    site.home.start("yn", "south")
    site.home.start("ox", user=other_owner.uid)
    patch = Patch("yn", dependents=["ox"])
    assert site.install(patch, wrapper=other_owner.wrapper) == site.done()
    assert [(str(call), call.user) for call in site.home.journal()] == [
        ("QuillAgent stop ox", "root"),  # a stop never switches
        ("QuillAgent -o north stop yn", "root"),
        ("QuillAgent -o south stop yn", "root"),
        ("QuillAgent -o north start yn", other_owner.name),
        ("QuillAgent -o south start yn", "root"),
        ("QuillAgent start ox", other_owner.name),
    ]
    started = site.home.journal()[3]
    assert (started.cwd, started.quillhome) == ("/", "")  # a login of that user, not this environment
    assert os.stat(f"/proc/{site.home.pid('yn', 'north')}").st_uid == other_owner.uid


@pytest.mark.needs_root
def test_root_starts_an_agent_as_its_owner_each_time(site, other_owner):
    site.home.start("yn", "north", user=other_owner.uid)
    patches = [Patch("yn", fixpack="fp0001"), Patch("yn", fixpack="fp0002")]
    assert site.install(*patches, wrapper=other_owner.wrapper) == site.done()
    assert [(str(call), call.user) for call in site.home.journal()] == 2 * [
        ("QuillAgent -o north stop yn", "root"),
        ("QuillAgent -o north start yn", other_owner.name),
    ]


@pytest.mark.needs_root
def test_the_command_goes_through_su(site, other_owner):
    site.home.start("yn", "north", user=other_owner.uid)
    site.install(Patch("yn"), wrapper=other_owner.wrapper)
    commands = [message for message in site.logged("TRACE") if message.startswith("cmdArray")]
    start = f"{site.home.prefix}bin/QuillAgent -o north start yn"
    assert commands[-5:] == [
        "cmdArray[0]: /bin/su",
        "cmdArray[1]: -",
        f"cmdArray[2]: {other_owner.name}",
        "cmdArray[3]: -c",
        f"cmdArray[4]: {start}",
    ]


@pytest.mark.needs_root
def test_an_owner_who_cannot_be_switched_to(site):
    # "nobody" has no shell to run the command in.
    site.home.start("yn", user="nobody")
    assert site.install(Patch("yn")) == site.failed(12, text("ERROR_START_AGENT", "Yellow Net"))


@pytest.mark.needs_root
def test_a_server_is_started_as_the_current_user(site, other_owner):
    site.home.start("qa", user=other_owner.uid)
    assert site.install(Patch("yn", dependents=["qa"]), wrapper=other_owner.wrapper) == site.done()
    assert [(str(call), call.user) for call in site.home.journal()] == [
        ("QuillServer stop ''", "root"),
        ("QuillServer start ''", "root"),
    ]


FOREIGN = 1  # the process id of the first process, which belongs to root


@pytest.fixture
def ordinary(site):
    """The program runs as another user than root."""
    if os.stat(f"/proc/{FOREIGN}").st_uid != 0:
        pytest.skip("process 1 does not belong to root here")
    site.as_ordinary_user()
    return site


def test_others_cannot_start_an_agent_of_another_user(ordinary):
    ordinary.home.add_row("yn", FOREIGN)
    ordinary.home.fail("stop", "yn", status=0)
    assert ordinary.install(Patch("yn").file("bin/tool")) == ordinary.failed(20, text("ERROR_START_CANT_SU", "root"))
    assert ordinary.home.calls() == ["QuillAgent stop yn"]
    assert [entry.result for entry in ordinary.home.history()] == ["FAIL"]
    assert ordinary.home.level("yn") == "06100100" and ordinary.home.exists("bin/tool")
    log = ordinary.log()
    begin = log.index(("TRACE", "orvcomponent", "startInstance() entry"))
    assert log[begin + 1 : begin + 3] == [
        ("ERROR", "orvcomponent", text("ERROR_START_CANT_SU", "root")),
        ("TRACE", "orvcomponent", "startInstance() exit"),
    ]


@pytest.mark.needs_root
def test_a_user_without_a_name_cannot_start_an_agent_of_another_user(site):
    site.home.add_row("yn", FOREIGN)
    site.home.fail("stop", "yn", status=0)
    patch = site.target(Patch("yn").file("bin/tool"))
    site.user = 3999999  # as many a container has its users
    for path in [site.home.path, *site.home.path.rglob("*")]:
        os.chown(path, site.user, site.user, follow_symlinks=False)
    assert site.install(patch) == site.failed(20, text("ERROR_START_CANT_SU", "root"))
    assert site.home.calls() == ["QuillAgent stop yn"]
    assert [entry.user for entry in site.home.history()] == [""]
    assert site.home.log().headers[0].user == ""


def test_others_cannot_start_the_os_agent_of_another_user(ordinary):
    ordinary.home.add_row("ox", FOREIGN)
    ordinary.home.fail("stop", "ox", status=0)
    assert ordinary.install(Patch("ox")) == ordinary.failed(20, text("ERROR_START_CANT_SU", "root"))
    assert ordinary.home.read("vmaorv6/agentdepot/rc.txt") == b"0"


def test_others_cannot_stop_an_agent_of_another_user(ordinary):
    ordinary.home.add_row("yn", FOREIGN, "north")
    expected = ordinary.failed(15, text("ERROR_STOP_INST", "north", "Yellow Net", "Yellow Net"))
    assert ordinary.install(Patch("yn")) == expected
    assert ordinary.home.calls() == ["QuillAgent -o north stop yn"]


def test_others_cannot_replace_what_they_may_not_write(ordinary):
    ordinary.home.write("bin/tool", "old")
    ordinary.home.mkdir("bin", 0o555)
    assert ordinary.install(Patch("yn").file("bin/tool", "new")).status == 25
    assert ordinary.home.read("bin/tool") == b"old"
    ordinary.home.mkdir("bin", 0o755)


@pytest.mark.needs_root
def test_others_who_replace_a_foreign_file_become_its_owner(ordinary):
    tool = ordinary.home.write("bin/tool", "old", 0o640)
    os.chown(tool, 0, 0)
    assert ordinary.install(Patch("yn").file("bin/tool", "new")).status == 25
    assert ordinary.home.read("bin/tool") == b"new"
    assert tool.stat().st_uid == pwd.getpwnam("nobody").pw_uid


def test_the_history_names_the_user(ordinary):
    assert ordinary.install(Patch("yn")) == ordinary.done()
    name = ordinary.user or pwd.getpwuid(os.getuid()).pw_name
    assert [entry.user for entry in ordinary.home.history()] == [name]
    assert ordinary.home.log().headers[0].user == name


def test_an_agent_whose_owner_is_not_found_is_started_as_the_current_user(site):
    site.home.start("yn")
    site.env["PATH"] = stubs(site.patch_dir / "stubs", ps='[ "$1" = -p ] && echo "$2"')
    assert site.install(Patch("yn")) == site.done()
    assert site.home.calls() == ["QuillAgent stop yn", "QuillAgent start yn"]
