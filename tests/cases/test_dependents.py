"""Which running instances an installation stops and starts again, and in which order."""

import os

import pytest

from support import Patch
from support.catalogue import text

HOST = os.uname().nodename.split(".")[0]


def test_only_what_runs_is_stopped(site):
    for code in ("ox", "yn", "ul"):
        site.home.component(code)
    site.home.start("yn")
    site.home.start("ul")
    site.home.start("gl")  # not installed
    assert site.install(Patch("ox", dependents=["yn", "gl", "zz"])) == site.done()
    assert site.home.calls() == ["QuillAgent stop yn", "QuillAgent start yn"]
    assert {
        "Dependent product not found: kgl",
        "Dependent product not found: kzz",
        "No running instances of kox found",
    } <= set(site.logged("TRACE"))


def test_dependents_may_be_named_in_any_case_and_length(site):
    for code in ("ox", "yn", "ul"):
        site.home.component(code)
        site.home.start(code)
    assert site.install(Patch("ox", dependents=["KYN", "UL = ignored", "kox"])) == site.done()
    assert site.home.calls() == [
        # in the sorted order of what stands in the descriptor: KYN, UL, kox
        "QuillAgent stop yn",
        "QuillAgent stop ul",
        "QuillAgent stop ox",
        "QuillAgent start ul",
        "QuillAgent start yn",
        "QuillAgent start ox",
    ]


def test_the_own_product_is_stopped_once(site):
    site.home.component("yn")
    site.home.start("yn", "north")
    assert site.install(Patch("yn", dependents=["yn"])) == site.done()
    assert site.home.calls() == ["QuillAgent -o north stop yn", "QuillAgent -o north start yn"]


def test_all_stops_every_agent_in_the_order_of_the_registry(site):
    codes = ("ox", "yn", "ul", "pt", "dk", "zt", "qa")
    for code in codes:
        site.home.component(code)
    for code in ("ox", "yn", "ul", "qa", "pt"):
        site.home.start(code)
    assert site.install(Patch("ox", dependents=["All"])) == site.done()
    registry = [name[:2] for name in os.listdir(site.home.path / "registry")]
    stops = [f"QuillAgent stop {code}" for code in registry if code in ("ox", "yn", "ul")]
    assert site.home.calls() == [*stops, "QuillAgent start ul", "QuillAgent start yn", "QuillAgent start ox"]
    assert {
        f"Non-stoppable component, will not be added to the list of stopped agents: Sample product {code}"
        for code in ("pt", "dk", "zt", "qa")
    } <= set(site.logged("TRACE"))


@pytest.mark.parametrize("dependent", ["wn", "all"])
def test_the_universal_agent_has_its_own_option_and_inner_instances(site, dependent):
    site.home.component("ox")
    site.home.component("wn")
    for name in ("a", "b_kwnsnetd_b", "kwnstrap_1", "z"):
        site.home.start("wn", name)
    assert site.install(Patch("ox", dependents=[dependent])) == site.done()
    assert site.home.calls() == [
        "QuillAgent -p a stop wn",
        "QuillAgent -p z stop wn",
        "QuillAgent -p a start wn",
        "QuillAgent -p z start wn",
    ]
    assert {"Found kwn instance of b_kwnsnetd_b, skipping.", "Found kwn instance of kwnstrap_1, skipping."} <= set(
        site.logged("TRACE")
    )


def test_an_instance_of_xe_is_called_without_its_host(site):
    site.home.component("xe")
    site.home.component("yn")
    site.home.start("xe", "inst_1")  # recorded as <host>_inst_1
    site.home.start("yn", f"{HOST}_inst_1")
    site.install(Patch("yn", dependents=["xe"]))
    assert site.home.calls()[:2] == ["QuillAgent -o inst_1 stop xe", f"QuillAgent -o {HOST}_inst_1 stop yn"]
    assert "adjusted instance name to inst_1" in site.logged("TRACE")


def test_a_server_that_an_agent_patch_names_is_stopped_and_started(site):
    site.home.component("ox")
    site.home.component("qa")
    site.home.start("qa")
    site.home.start("qa", "hub")
    assert site.install(Patch("ox", dependents=["qa"])) == site.done()
    assert site.home.calls() == [
        "QuillServer stop ''",
        "QuillServer stop hub",
        "QuillServer start ''",
        "QuillServer start hub",
    ]


def test_a_server_patch_stops_its_dependents(site):
    site.home.component("qa")
    site.home.component("yn")
    site.home.start("yn")
    assert site.install(Patch("qa", target="vems", dependents=["yn"])) == site.done()
    assert site.home.calls() == ["QuillAgent stop yn", "QuillAgent start yn"]


@pytest.mark.parametrize("code, target", [("dk", "vepd")])
def test_a_client_patch_stops_nothing(site, code, target):
    site.home.component(code)
    site.home.component("yn")
    site.home.start("yn")
    assert site.install(Patch(code, target=target, dependents=["yn"])) == site.done()
    assert site.home.calls() == []
    assert "This patch is not target for a vema or vecm, no dependents will be stopped" in site.logged("TRACE")


def test_the_os_agent_is_started_once_as_its_default_instance(site):
    # KEEP(osagent-default-instance)
    site.home.component("ox")
    site.home.start("ox", "one")
    site.home.start("ox", "two")
    assert site.install(Patch("ox")) == site.done()
    assert site.home.calls() == ["QuillAgent -o one stop ox", "QuillAgent -o two stop ox", "QuillAgent start ox"]
    assert site.home.read("vmaorv6/agentdepot/rc.txt") == b"0"


def test_the_result_of_a_good_run_is_the_code_that_the_record_holds(site):
    # A stray line, and the clean-up that finds nothing to remove at the second patch of a product, leave theirs.
    site.home.component("ox")
    site.home.start("ox")
    stray = "stray\n" + Patch("ox", exe="kox").descriptor_text()  # no missing optional key takes its code back
    assert site.install(Patch("ox", descriptor=stray)) == site.done()
    assert site.home.read("vmaorv6/agentdepot/rc.txt") == b"4"
    folder = site.home.mkdir("patches")
    for fixpack in ("fp0001", "fp0002"):
        Patch("ox", fixpack=fixpack).file("bin/tool").write(folder)
    assert site.install(folder) == site.done()
    assert site.home.read("vmaorv6/agentdepot/rc.txt") == b"27"


def test_the_os_agent_of_which_one_instance_does_not_stop_is_not_started(site):
    site.home.component("ox", desc="Linux OS")
    for instance in ("one", "two"):
        site.home.start("ox", instance)
    site.home.fail("stop", "ox", "two")
    message = text("ERROR_STOP_INST", "two", "Linux OS", "Linux OS")
    assert site.install(Patch("ox")) == site.failed(15, message)
    assert site.home.calls() == ["QuillAgent -o one stop ox", "QuillAgent -o two stop ox"]


def test_without_the_depot_the_os_agent_is_started_all_the_same(site):
    site.home.component("ox")
    site.home.start("ox")
    site.home.remove("vmaorv6")
    assert site.install(Patch("ox")) == site.done()
    assert site.home.instances() == [("ox", "")]
    path = f"{site.home.prefix}vmaorv6/agentdepot/rc.txt"
    assert f"Unable to write file: {path}. No such file or directory" in site.logged("TRACE")


# --- the run information -------------------------------------------------------------------------------


def test_only_true_rows_of_this_host_count(site):
    site.home.component("yn")
    site.home.start("yn", "mine")
    pid = site.home.pid("yn", "mine")
    gone = site.home.process("gone")
    site.home.kill(gone)
    for row in [("yn", gone, "dead"), ("YN", pid, "other_case"), ("gl", pid, "other_product")]:
        site.home.add_row(*row)
    site.home.add_row("yn", pid, "elsewhere", host="another.host")
    site.home.run_info += f"\nfour|fields|{pid}|only\n"
    assert site.install(Patch("yn")) == site.done()
    assert site.home.calls() == ["QuillAgent -o mine stop yn", "QuillAgent -o mine start yn"]
    assert f"Invalid line format: four|fields|{pid}|only" in site.logged("TRACE")


@pytest.mark.parametrize("host", [HOST.upper(), f"{HOST}.example.org", f"{HOST}2"])
def test_the_host_of_a_row_begins_with_this_host(site, host):
    site.home.component("yn")
    site.home.fail("stop", "yn", status=0)
    site.home.fail("start", "yn", status=0)
    site.home.add_row("yn", site.home.process("agent"), "north", host=host)
    assert site.install(Patch("yn")) == site.done()
    assert site.home.calls() == ["QuillAgent -o north stop yn", "QuillAgent -o north start yn"]


@pytest.mark.parametrize("run_info", [None, "", "\n\n", "FIELDSEP\nx|yn|1|None|x\n", "FIELDSEP=\nx|yn|1|None|x\n"])
def test_without_usable_run_information_nothing_runs(site, run_info):
    site.home.component("yn")
    if run_info is None:
        site.home.remove("config/.ConfigData/RunInfo")
    else:
        site.home.run_info = run_info
    assert site.install(Patch("yn").file("bin/tool")) == site.done()
    assert site.home.calls() == []


def test_another_separator_may_be_declared(site):
    site.home.component("yn")
    site.home.run_info = "FIELDSEP=;\n"
    site.home.start("yn", "north")
    assert site.install(Patch("yn")) == site.done()
    assert site.home.calls() == ["QuillAgent -o north stop yn", "QuillAgent -o north start yn"]


# --- scripts that say what they do not do --------------------------------------------------------------


def test_a_failed_stop_of_a_process_that_has_gone_counts_as_a_stop(site):
    site.home.component("yn")
    site.home.start("yn")
    site.home.fail("stop", "yn", status=5, out="o", err="e", effective=True)
    assert site.install(Patch("yn")) == site.done()
    assert site.home.calls() == ["QuillAgent stop yn", "QuillAgent start yn"]
    assert site.home.instances() == [("yn", "")]
    assert {
        "return code: 5",
        "stdout: o",
        "stderr: e",
        "QuillAgent stop failed, but the Process ID is no longer " "active. Assuming agent is now not running",
    } <= set(site.logged("TRACE"))


def test_a_start_that_succeeds_is_not_looked_after(site):
    site.home.component("yn")
    site.home.start("yn")
    site.home.fail("start", "yn", status=0)
    assert site.install(Patch("yn")) == site.done()
    assert site.home.instances() == []


def test_what_a_control_script_prints_goes_to_the_log_alone(site):
    site.home.component("yn")
    site.home.start("yn")
    site.home.fail("stop", "yn", status=0, out="stopping\n", err="50%s done", effective=True)
    assert site.install(Patch("yn")) == site.done()
    assert {"stdout: stopping\n", "stderr: 50%s done"} <= set(site.logged("TRACE"))
    assert site.logged("ERROR") == []
    assert site.logged("INFO")[0] == text("PP_NO_FILES")
