"""The sample product and the patch builder work as other tests assume."""

import os
import pwd
import shutil
import subprocess
import time

import pytest

from support import Patch, Program, parse_log, remove_tree, scratch_folder, second_account, stubs


def alive(pid):
    return subprocess.run(["ps", "-p", str(pid)], stdout=subprocess.DEVNULL, check=False).returncode == 0


def agent(home, *words):
    return subprocess.run(
        [f"{home.path}/bin/QuillAgent", *words], stdin=subprocess.DEVNULL, capture_output=True, timeout=30, check=False
    )


def test_start_makes_a_live_process_and_a_row(home):
    home.start("ox")
    pid = home.pid("ox")
    assert alive(pid)
    assert home.run_info.splitlines() == [
        "FIELDSEP=|",
        f"{os.uname().nodename}|ox|{pid}|None|{pwd.getpwuid(os.geteuid()).pw_name}",
    ]
    assert home.instances() == [("ox", "")]


def test_stop_ends_the_process_and_removes_only_its_row(home):
    home.start("ox")
    home.start("yn", "one")
    home.start("yn", "two")
    pid, run_info = home.pid("yn", "one"), home.run_info
    home.stop("yn", "one")
    assert not alive(pid)
    assert home.instances() == [("ox", ""), ("yn", "two")]
    assert home.run_info == "".join(row for row in run_info.splitlines(True) if f"|{pid}|" not in row)


def test_each_start_form_of_the_scripts_is_understood(home):
    assert agent(home, "start", "ox").returncode == 0
    assert agent(home, "-o", "abc", "start", "yn").returncode == 0
    assert agent(home, "-p", "north", "start", "wn").returncode == 0
    server = subprocess.run([f"{home.path}/bin/QuillServer", "start", ""], check=False)
    assert server.returncode == 0
    assert home.instances() == [("ox", ""), ("qa", ""), ("wn", "north"), ("yn", "abc")]
    assert home.calls() == [
        "QuillAgent start ox",
        "QuillAgent -o abc start yn",
        "QuillAgent -p north start wn",
        "QuillServer start ''",
    ]


@pytest.mark.parametrize(
    "words",
    [
        (),
        ("start",),
        ("restart", "ox"),
        ("-o", "north", "start", "wn"),
        ("-p", "abc", "start", "yn"),
        ("-o", "", "start", "yn"),
        ("-x", "abc", "start", "yn"),
        ("start", "ox", ""),
    ],
)
def test_any_other_form_is_refused(home, words):
    assert agent(home, *words).returncode == 64
    assert home.rows() == []


def test_the_instance_of_an_xe_process_is_recorded_with_its_host(home):
    home.start("xe", "inst")
    host = os.uname().nodename.split(".")[0]
    assert [row.name for row in home.rows()] == [f"{host}_inst"]
    home.stop("xe", "inst")
    assert home.rows() == []


def test_a_started_process_keeps_no_descriptor_of_its_starter(home):
    # A caller that reads the script's output up to its end would otherwise wait for the agent.
    read_end, write_end = os.pipe()
    subprocess.run([f"{home.path}/bin/QuillAgent", "start", "ox"], pass_fds=[write_end], timeout=30, check=True)
    os.close(write_end)
    assert os.read(read_end, 1) == b""
    os.close(read_end)
    assert os.readlink(f"/proc/{home.pid('ox')}/cwd") == "/"


def test_a_killed_process_leaves_no_zombie(home):
    home.start("ox")
    pid = home.pid("ox")
    home.kill(pid)
    assert not alive(pid)
    assert home.instances() == []


def test_stop_of_a_process_that_is_gone_fails(home):
    home.start("ox")
    home.kill(home.pid("ox"))
    assert agent(home, "stop", "ox").returncode == 1


def test_a_process_that_has_only_got_the_id_is_let_alone(home):
    with subprocess.Popen(["sleep", "60"]) as other:
        try:
            home.add_row("yn", other.pid)
            assert agent(home, "stop", "yn").returncode == 1
            assert home.instances() == []
            with pytest.raises(AssertionError, match="is no process of"):
                home.kill(other.pid)
            time.sleep(0.05)
            assert other.poll() is None
        finally:
            other.kill()


def test_a_switch_makes_one_call_fail(home):
    home.start("yn", "one")
    home.start("yn", "two")
    home.fail("stop", "yn", "one", status=7, out="o", err="e")
    failed = agent(home, "-o", "one", "stop", "yn")
    assert (failed.returncode, failed.stdout, failed.stderr) == (7, b"o", b"e")
    assert agent(home, "-o", "two", "stop", "yn").returncode == 0
    assert home.instances() == [("yn", "one")]


def test_an_effective_switch_works_and_fails_all_the_same(home):
    home.start("ox")
    home.fail("stop", "ox", status=3, effective=True)
    assert agent(home, "stop", "ox").returncode == 3
    assert home.instances() == []


def test_stop_all_ends_everything_that_was_started(home):
    home.start("ox")
    home.start("qa")
    pids = [row.pid for row in home.rows()] + [home.start_console()]
    assert all(map(alive, pids))
    home.stop_all()
    assert not any(map(alive, pids))


def test_the_journal_keeps_watched_files_as_they_were(home):
    home.watch("bin/tool", "bin/absent")
    home.write("bin/tool", "old")
    agent(home, "start", "ox")
    home.write("bin/tool", "new")
    agent(home, "stop", "ox")
    assert [call.seen for call in home.journal()] == [{"bin/tool": b"old"}, {"bin/tool": b"new"}]


def test_tree_sees_a_change_of_content_and_mode_but_not_the_own_records(home):
    home.write("bin/tool", "one", 0o755)
    before = home.tree()
    agent(home, "stop", "ox")
    assert home.tree() == before
    home.write("bin/tool", "two", 0o700)
    assert before["bin/tool"][:2] == ("file", 0o755)
    assert home.tree()["bin/tool"] == before["bin/tool"]._replace(mode=0o700, content=b"two")


def test_rows_that_tell_nothing_are_passed_over(home):
    home.start("ox")
    home.run_info += "short|row\nhost|yn|no-pid|None|x\n\n"
    assert home.instances() == [("ox", "")]
    home.run_info = "no separator\nhost|yn|1|None|x\n"
    assert home.rows() == []


def test_closed_and_very_deep_directories_are_removed():
    folder = scratch_folder()
    (folder / "closed/inner").mkdir(parents=True)
    (folder / "closed/inner").chmod(0)
    (folder / "closed").chmod(0)
    dig = "import os\nfor _ in range(3000):\n    os.mkdir('d')\n    os.chdir('d')"
    subprocess.run(["/usr/bin/python3", "-c", dig], cwd=folder, check=True)
    remove_tree(folder)
    assert not folder.exists()


def members(archive):
    return subprocess.run(["tar", "-tf", archive], capture_output=True, check=True).stdout.decode().splitlines()


def test_an_archive_names_its_members_without_a_leading_dot(patch_dir):
    patch = Patch("ox").file("bin/a", "x").script("go.sh", when="post")
    archive = patch.write(patch_dir)
    assert archive.name == "kox_lpp266_vema_fp0001.tar"
    assert members(archive) == ["go.sh", "patch.ini", "updated_files/", "updated_files/bin/", "updated_files/bin/a"]
    assert "./patch.ini" in members(patch.write(patch_dir, "dotted.tar", dotted=True))


def test_the_descriptor_holds_what_was_asked_for():
    patch = Patch(
        "ox",
        level="06200305",
        name="N",
        title="T",
        exe="k.exe",
        prereqs={"gl": "06.10.00.00"},
        dependents=["all"],
        pre_patch=["a"],
        pre=["b"],
        post=["c"],
    )
    assert patch.descriptor_text() == (
        "[ProductInfo]\nproductCode = kox\npatchName = N\npatchDescriptiveName = T\n"
        "productVer = 06\nproductRel = 20\nproductMod = 03\nproductLvl = 05\n"
        "productBinArch = lpp266\nproductEXE = k.exe\n\n"
        "[PreReqs]\ngl = 06.10.00.00\n\n[Dependents]\nall\n\n"
        "[PrePatchCommands]\na\n\n[PreCommands]\nb\n\n[PostCommands]\nc\n"
    )


def test_a_patch_script_journals_its_call(home, patch_dir):
    archive = Patch("ox").script("go.sh", status=5, out="o'", err="e\n", body="echo body").write(patch_dir)
    subprocess.run(["tar", "-xf", archive], cwd=patch_dir, check=True)
    done = subprocess.run(
        [patch_dir / "go.sh", "x"],
        cwd="/",
        capture_output=True,
        check=False,
        env={"QUILLHOME": home.prefix, "PATH": os.environ["PATH"]},
    )
    assert (done.returncode, done.stdout, done.stderr) == (5, b"body\no'", b"e\n")
    (call,) = home.journal()
    assert (call.program, call.args, call.cwd, call.path, call.quillhome) == (
        "go.sh",
        ("x",),
        "/",
        os.environ["PATH"],
        home.prefix,
    )


RULE = "=" * 78
HEADER = (
    f"{RULE}\n ORV Patch Log File\n   System Name: vm\n   User Name:   root\n   Process ID:  12\n"
    f"   Build Date:  3/5/07 21:48:44\n{RULE}\n"
)


def test_the_log_parser_joins_lines_of_one_message():
    log = parse_log(
        HEADER
        + "TRACE 01:02:03 (main,7): main entry\nERROR 01:02:04 (file.cpp,8): a\n\nb\n"
        + HEADER
        + "INFO  01:02:05 (main,9): \n"
    )
    assert [header.pid for header in log.headers] == [12, 12]
    assert log.headers[0] == ("vm", "root", 12, "3/5/07", "21:48:44")
    assert log.entries() == [("TRACE", "main", "main entry"), ("ERROR", "file.cpp", "a\n\nb"), ("INFO", "main", "")]
    assert [line.line for line in log.lines] == [7, 8, 9]
    assert log.messages(level="ERROR") == ["a\n\nb"]
    assert log.preamble == ""


def test_program_reports_status_and_both_streams():
    shell = Program("/bin/sh", runner=[])
    assert shell.run("-c", "printf out; printf err >&2; exit 4") == (4, b"out", b"err")
    assert shell.run("-c", "echo $A$QUILLHOME", env={"A": "1"}) == (0, b"1\n", b"")
    assert shell.run("-c", "echo x", close=[1]).status != 0
    assert shell.run("-c", "kill -9 $$").status == -9


def test_program_that_does_not_end_is_killed_with_its_children(scratch):
    with pytest.raises(AssertionError, match="no end after"):
        Program("/bin/sh", runner=[]).run("-c", f"sleep 1000 & echo $! > {scratch}/pid; wait", timeout=3)
    assert not alive_within(int((scratch / "pid").read_text()), seconds=60)


def alive_within(pid, seconds):
    limit = time.monotonic() + seconds
    while alive(pid) and time.monotonic() < limit:
        time.sleep(0.02)
    return alive(pid)


@pytest.mark.needs_root
def test_program_runs_as_another_user(scratch):
    shell = Program("/bin/sh", runner=[])
    assert shell.run("-c", "id -un; id -Gn", user="nobody").out == b"nobody\nnogroup\n"


@pytest.mark.needs_root
def test_another_user_runs_a_program_that_it_could_not_reach(scratch):
    closed = scratch / "closed"
    closed.mkdir(mode=0o700)
    shutil.copy("/bin/true", closed / "true")
    assert Program(closed / "true", runner=[]).run(user="nobody").status == 0


@pytest.mark.needs_root
def test_another_account_owns_an_agent_and_can_be_switched_to(home, other_owner):
    home.start("ox", user=other_owner.uid)
    shell = Program("/bin/sh", runner=[])
    shown = shell.run(
        "-c", f"ps -o user= -p {home.pid('ox')}; su - {other_owner.name} -c 'id -un'", wrapper=other_owner.wrapper
    )
    assert shown == (0, f"{other_owner.name}\n{other_owner.name}\n".encode(), b"")


@pytest.mark.needs_root
def test_a_container_without_private_mounts_gets_a_real_account(scratch, monkeypatch):
    monkeypatch.setenv("PATH", stubs(scratch / "bin", unshare="exit 1"))
    with second_account(scratch) as account:
        assert account.wrapper == ()
        assert pwd.getpwnam(account.name).pw_uid == account.uid
    with pytest.raises(KeyError):
        pwd.getpwnam(account.name)
