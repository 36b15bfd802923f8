"""Rollouts over eight hosts, by ssh: canary, batches, what stops them, and what a stop leaves."""

import pytest

from controller import Controller
from rollouts import AFTER, AGENTS, BEFORE, Fleet, break_command, hold, recap, release


@pytest.fixture
def fleet(network):
    return Fleet(network)


def numbered(numbers, word):
    return {f"host{number}": word for number in numbers}


ALL = range(1, 9)


def test_a_whole_rollout_and_a_second_one_that_changes_nothing(fleet):
    report = fleet.play("rollout")
    assert report["verdicts"] == numbered(ALL, "applied"), report["reasons"]
    assert report["summary"]["verdict"] == "applied"
    assert [batch["homes"] for batch in report["summary"]["batches"]] == [1, 1, 4, 2]  # serial: [1, 10%, 50%]
    times = [(batch["started"], batch["ended"]) for batch in report["summary"]["batches"]]
    assert all(before[1] <= after[0] for before, after in zip(times, times[1:])), times
    assert report["patches"] == [fleet.patch.name]
    for one in report["fleet"]:
        assert (one["levelsBefore"]["kyn"], one["levelsAfter"]["kyn"]) == (BEFORE, AFTER)
    assert fleet.levels() == numbered(ALL, AFTER)
    assert fleet.attempts() == numbered(ALL, ["PASS"])
    for host in fleet.hosts:
        assert host.home.read("lpp266/yn/bin/kyn") == f"level {AFTER}\n".encode()
        assert host.home.read("lpp266/yn/doc/new.txt") == b"What is new\n"
        assert host.home.instances() == AGENTS
    before = fleet.trees()
    again = fleet.play("rollout")
    assert again["verdicts"] == numbered(ALL, "unchanged"), again["reasons"]
    assert {host: line["changed"] for host, line in recap(again["printed"]).items()} == numbered(ALL, 0)
    assert fleet.trees() == before


def test_a_host_whose_check_fails_stops_all_before_the_first_change(fleet):
    (fleet.hosts[5].home.path / "tmp").chmod(0o777)  # others could exchange what is about to be installed
    before = fleet.listings()
    report = fleet.play("rollout", status=2)
    assert report["verdicts"] == {**numbered(ALL, "untouched"), "host6": "refused"}, report["reasons"]
    assert report["summary"]["verdict"] == "refused"
    assert report["fleet"][0]["host"] == "host6" and "home-tmp" in report["fleet"][0]["reason"]
    assert fleet.listings() == before
    assert fleet.attempts() == numbered(ALL, [])
    assert all(host.home.instances() == AGENTS for host in fleet.hosts)


@pytest.mark.full
def test_check_and_diff_mode_change_nothing(fleet):
    before = fleet.listings()
    processes = {host.name: host.home.rows() for host in fleet.hosts}
    for words in (("check", "--diff"), ("rollout", "--check", "--diff")):
        report = fleet.play(*words)
        assert report["verdicts"] == numbered(ALL, "checked"), report["reasons"]
        assert report["summary"]["verdict"] == "checked"
        assert report["printed"].count(f"-kyn {BEFORE}\n+kyn {AFTER}\n") == len(fleet.hosts)
        assert report["printed"].count("lpp266/yn/bin/kyn (replaced)") == len(fleet.hosts)
        assert report["printed"].count("lpp266/yn/doc/new.txt (new)") == len(fleet.hosts)
    assert fleet.listings() == before
    assert fleet.attempts() == numbered(ALL, [])
    assert {host.name: host.home.rows() for host in fleet.hosts} == processes
    assert all(host.home.instances() == AGENTS for host in fleet.hosts)


@pytest.mark.full
def test_a_host_that_fails_in_the_middle_stops_the_rollout(fleet):
    before = fleet.listings()
    break_command(fleet.hosts[3])  # of the third batch
    report = fleet.play("rollout", status=2)
    assert report["verdicts"] == {
        **numbered(ALL, "untouched"),
        **numbered([1, 2, 3, 5, 6], "applied"),
        "host4": "failed",
    }, report["reasons"]
    assert report["summary"]["verdict"] == "stopped"
    first = report["fleet"][0]
    assert (first["host"], first["batch"], first["record"]["installer"]["status"]) == ("host4", 3, 23)
    assert "10_convert.sh" in first["reason"]
    after = fleet.listings()
    assert {host: after[host] for host in ("host7", "host8")} == {host: before[host] for host in ("host7", "host8")}
    assert fleet.attempts() == {**numbered(ALL, ["PASS"]), **numbered([7, 8], []), "host4": ["FAIL"]}
    taken = fleet.controller.playbook("undo", "--limit", "host4", variables=fleet.variables(fixpack_report=""))
    assert recap(taken)["host4"]["failed"] == 0
    assert fleet.listings()["host4"] == before["host4"]
    assert fleet.hosts[3].home.instances() == AGENTS
    fleet.hosts[3].home.remove("control/broken")
    report = fleet.play("rollout")
    assert report["verdicts"] == {**numbered(ALL, "applied"), **numbered([1, 2, 3, 5, 6], "unchanged")}, report[
        "reasons"
    ]
    assert fleet.levels() == numbered(ALL, AFTER)


@pytest.mark.full
def test_the_failed_batch_is_taken_back_where_that_is_wanted(fleet):
    before = fleet.listings()
    break_command(fleet.hosts[3])
    report = fleet.play("rollout", status=2, fixpack_undo_batch=True)
    assert report["verdicts"] == {
        **numbered(ALL, "untouched"),
        **numbered([1, 2], "applied"),
        **numbered([3, 4, 5, 6], "undone"),
    }, report["reasons"]
    assert "10_convert.sh" in next(one["reason"] for one in report["fleet"] if one["host"] == "host4")
    after = fleet.listings()
    untouched = [f"host{number}" for number in range(3, 9)]
    assert {host: after[host] for host in untouched} == {host: before[host] for host in untouched}
    assert fleet.levels() == {**numbered(ALL, BEFORE), **numbered([1, 2], AFTER)}
    assert all(host.home.instances() == AGENTS for host in fleet.hosts)


def lose_sessions(host):
    assert host.cut_sessions() > 0


def lose_link(host):
    host.unplug()


def is_done(host):
    """The transaction has come to its end: its process is gone, and its line is in the history."""
    return host.home.history() and not [
        command for command in host.processes().values() if "orvpatchctl apply" in command
    ]


@pytest.mark.full
@pytest.mark.parametrize(
    "lose, verdict",
    [
        (lose_sessions, "applied"),
        # The host does not notice: the module that waits there takes the end for told, and its answer is lost.
        (lose_link, "unchanged"),
    ],
)
def test_a_connection_that_is_cut_ends_nothing(fleet, lose, verdict):
    host = fleet.hosts[3]
    hold(host)
    running = fleet.start("rollout")
    fleet.await_held(host)
    lose(host)
    printed, _ = running.communicate(timeout=900)
    assert running.returncode in (2, 4), printed  # the others of its batch end well, the rollout stops
    report = fleet.report(printed)
    assert report["verdicts"] == {
        **numbered(ALL, "untouched"),
        **numbered([1, 2, 3, 5, 6], "applied"),
        "host4": "unreachable",
    }, report["reasons"]
    assert not is_done(host)
    release(host)
    fleet.await_that(lambda: is_done(host), "the transaction does not end")
    assert fleet.attempts()["host4"] == ["PASS"]
    host.plug_in_again()
    report = fleet.play("rollout")
    assert report["verdicts"] == {
        **numbered([1, 2, 3, 5, 6], "unchanged"),
        **numbered([7, 8], "applied"),
        "host4": verdict,
    }, report["reasons"]
    found = next(one for one in report["fleet"] if one["host"] == "host4")
    assert found["record"]["verdict"] == "applied"
    if verdict == "applied":
        assert (found["levelsBefore"]["kyn"], found["levelsAfter"]["kyn"]) == (BEFORE, AFTER)
    assert fleet.attempts() == numbered(ALL, ["PASS"])
    assert all(host.home.instances() == AGENTS for host in fleet.hosts)


@pytest.mark.full
def test_the_next_run_waits_for_a_transaction_that_is_still_at_work(fleet):
    host = fleet.hosts[0]
    hold(host)
    running = fleet.start("rollout")
    fleet.await_held(host)
    lose_sessions(host)
    running.communicate(timeout=900)
    again = fleet.start("rollout")
    fleet.await_that(lambda: max(host.module_ages(), default=0) > 5, "no module waits")
    assert again.poll() is None and not is_done(host)
    release(host)
    printed, _ = again.communicate(timeout=900)
    assert again.returncode == 0, printed
    assert fleet.report(printed)["verdicts"] == numbered(ALL, "applied")
    assert fleet.attempts() == numbered(ALL, ["PASS"])


@pytest.mark.full
def test_two_controllers_at_once_patch_each_home_once(fleet):
    host = fleet.hosts[0]
    hold(host)
    first = fleet.start("rollout", fixpack_report_name="first")
    fleet.await_held(host)  # the first has the canary at work when the second begins
    second = fleet.start("rollout", controller=Controller.of(fleet.network, "d"), fixpack_report_name="second")
    fleet.await_that(lambda: len(host.sessions()) > 1, "the second controller does not come")
    release(host)
    printed = [one.communicate(timeout=900)[0] for one in (first, second)]
    reports = [fleet.report(fixpack_report_name=name) for name in ("first", "second")]
    assert (first.returncode, second.returncode) == (0, 0), [report["reasons"] for report in reports] + printed
    for name in numbered(ALL, ""):
        assert {report["verdicts"][name] for report in reports} <= {"applied", "unchanged"}
    assert fleet.attempts() == numbered(ALL, ["PASS"])
    assert fleet.levels() == numbered(ALL, AFTER)
    assert all(host.home.instances() == AGENTS for host in fleet.hosts)
