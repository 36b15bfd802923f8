"""The hosts of the tests themselves: apart from one another, and reached by real connections."""

import pytest

from network import HOME, PROGRAMS


def test_each_host_is_one_of_its_own(network):
    assert set(network.controller.modules("fleet", "ansible.builtin.ping")) == {host.name for host in network.hosts}
    assert len({host.known_host().split()[2] for host in network.hosts}) == len(network.hosts) == 8
    for host in network.hosts:
        agents = [command for command in host.processes().values() if command.startswith("tail -f")]
        assert sorted(agents) == sorted(
            f"tail -f {HOME}/control/processes/{agent}" for agent in ("ox.None", "um.None", "yn.east", "yn.west")
        )
        assert host.home.instances() == [("ox", ""), ("um", ""), ("yn", "east"), ("yn", "west")]
        assert host.run("uname", "-n").stdout == f"{host.name}\n"
    (network.hosts[0].folder / "tmp/own").write_text("x")
    shown = network.controller.modules("fleet", "ansible.builtin.command", "ls /tmp /root /var/tmp")
    assert [name for name, answer in shown.items() if "own" in answer["stdout"].split()] == ["host1"]


@pytest.mark.full
def test_the_programs_work_on_a_host(network):
    command = f"{PROGRAMS}/orvpatchctl status {HOME}"
    answers = network.controller.modules("host1:host8", "ansible.builtin.command", command)
    for answer in answers.values():
        assert answer["rc"] == 0
        assert "east" in answer["stdout"] and "06.10.00.00" in answer["stdout"]


@pytest.mark.full
def test_a_connection_can_be_cut(network):
    host = network.hosts[2]
    host.unplug()
    answers = network.controller.modules("fleet", "ansible.builtin.ping", status=4)
    assert [name for name, answer in answers.items() if answer.get("unreachable")] == [host.name]
    host.plug_in_again()
    assert network.controller.module(host.name, "ansible.builtin.ping")["ping"] == "pong"
    assert host.cut_sessions() > 0
    assert host.home.instances() == [("ox", ""), ("um", ""), ("yn", "east"), ("yn", "west")]
    assert network.controller.module(host.name, "ansible.builtin.ping")["ping"] == "pong"
