"""Rules of lint and the harm that each speaks of: one patch for a rule, and what the installer does with it.

`make(folder)` writes a patch that breaks the rule and no other; it returns the path to give to both programs.
`harm(stage)` runs the installer on it and asserts what goes wrong.
"""

import os
import signal
import stat
import subprocess
import tarfile
import time
from typing import Callable, NamedTuple

from hostile.rawarchive import RawArchive
from support import Patch
from support.program import identity

HOUR = 3600
GOOD = b"\nCommand completed successfully.\n\n"
LEVEL = {"productVer": "06", "productRel": "10", "productMod": "01", "productLvl": "00"}


class Case(NamedTuple):
    rule: str
    make: Callable
    harm: Callable
    options: dict = {}


class Stage:
    """A home with the product `ox`, and the installer to run on the patch of a case."""

    def __init__(self, home, program, path):
        self.home, self.program, self.path = home, program, path

    def install(self, **options):
        return self.program.install(self.home, self.path, **options)

    def report(self):
        return self.program.report(self.home, self.path)

    def errors(self):
        return self.home.log().messages("ERROR")


def descriptor(extra="", *, code="kox", name="kox_fp0001", level=None):
    """The text of a descriptor, with more behind the section ProductInfo."""
    values = {"productCode": code, "patchName": name, "patchDescriptiveName": "A fix pack", **LEVEL, **(level or {})}
    return "[ProductInfo]\n" + "".join(f"{key} = {value}\n" for key, value in values.items()) + extra


def patch(text=None, product="ox", **fields):
    """An otherwise good patch with one file and this descriptor."""
    return Patch(product, descriptor=text, **fields).file("bin/tool")


def raw(text=None):
    return RawArchive(Patch("ox", descriptor=text)).file("updated_files/bin/tool")


def refused(status):
    def harm(stage):
        assert stage.install().status == status
        assert not stage.home.exists("bin/tool")

    return harm


def silently_without(path):
    """The run is a success, and this file is not there."""

    def harm(stage):
        result = stage.install()
        assert (result.status, result.out) == (0, GOOD)
        assert not stage.home.exists(path)

    return harm


def journal_lacks(call):
    def harm(stage):
        assert stage.install().status == 0
        assert call not in stage.home.calls()

    return harm


# --- the name, the product, the descriptor's values ------------------------------------------------------------


def refused_on_every_home(stage):
    """Also where everything is installed under every kind that exists."""
    for code in ("qa", "pt", "dk", "zt"):
        stage.home.component(code)
    for file in ("oxvms.ver", "oxvps.ver", "oxvpd.ver"):
        stage.home.component("ox", filename=file)
    assert stage.install().status == 9


def breaks_the_version_file(stage):
    assert stage.install().status == 0
    assert stage.home.level("ox") == "061010"


def takes_the_default_level(stage):
    stage.home.component("yn", "05100000")
    result = stage.install()
    assert result.status == 10  # 05.20 was meant, 06.10 is asked for
    assert b"06.10.00.00" in result.err


def leaves_an_agent_running(stage):
    stage.home.component("yn")
    stage.home.start("yn")
    assert stage.install().status == 0
    assert not any("yn" in call for call in stage.home.calls())


def copies_stay_old(stage):
    stage.home.write("vmaorv6/kox_copy.exe", "old\n")
    assert stage.install().status == 0
    assert stage.home.read("vmaorv6/kox_copy.exe") == b"old\n"


def columns_break(stage):
    assert stage.install().status == 0
    line = stage.home.read("patchlogs/patches.hist").decode().splitlines()[-1]
    assert line.split(" | ")[4].strip() not in ("PASS", "FAIL") or line.index("PASS") != 44


# --- the archive ---------------------------------------------------------------------------------------------


def cut_behind_the_first_file(folder):
    archive = RawArchive(Patch("ox")).file("updated_files/bin/first").file("updated_files/bin/second")
    return archive.write(folder, upto=archive.boundaries[2])


def damaged(folder):
    archive = raw().file("updated_files/bin/more")
    content = bytearray(archive.content)
    content[archive.boundaries[2] + 100] ^= 1  # a header's checksum; what follows is skipped
    path = folder / Patch("ox").filename
    path.write_bytes(content)
    return path


def no_archive(folder):
    path = folder / Patch("ox").filename
    path.write_bytes(b"no archive\n" * 100)
    return path


def many_members_that_tar_speaks_of(folder):
    """Each has a keyword that tar does not know, and says so."""
    archive = RawArchive(Patch("ox"), format=tarfile.PAX_FORMAT).file("updated_files/bin/tool")
    for number in range(16000):
        member = tarfile.TarInfo(f"updated_files/lib/{number}")
        member.pax_headers = {"SAMPLE.a-keyword-that-tar-does-not-know": "1"}
        archive.add(member)
    return archive.write(folder)


def waits_for_ever(stage):
    """As an ordinary user, whose pipes hold at most 1 MiB; root's hold more, and would only take longer to fill."""
    user = "nobody" if os.geteuid() == 0 else None
    if user:
        stage.home.give_to(user)
    process = subprocess.Popen(
        [*stage.program.argv_for(user), "-h", stage.home, "-i", stage.path],
        stdout=subprocess.DEVNULL,
        stderr=subprocess.DEVNULL,
        start_new_session=True,
        **identity(user),
    )
    try:
        while not any("pipe_write" in place for place in _waits_of(process.pid)):
            assert process.poll() is None, "the run has ended"
            time.sleep(0.1)
    finally:
        os.killpg(process.pid, signal.SIGKILL)
        process.wait()


def _waits_of(session):
    """Where in the kernel the processes of a session wait; a writer to a full pipe is in pipe_write."""
    for pid in filter(str.isdigit, os.listdir("/proc")):
        try:
            if os.getsid(int(pid)) == session:
                with open(f"/proc/{pid}/wchan", encoding="ascii") as wchan:
                    yield wchan.read()
        except OSError:
            pass


def listed_otherwise(folder):
    path = patch().write(folder)
    (folder / "SHA256SUMS").write_text("0" * 64 + f"  {path.name}\n")
    return path


def not_listed(folder):
    (folder / "SHA256SUMS").write_text("0" * 64 + "  another.tar\n")
    return patch().write(folder)


def installed_unseen(stage):
    assert stage.install().status == 0
    assert stage.home.exists("bin/tool")


# --- members -------------------------------------------------------------------------------------------------


def link_to_a_secret(folder):
    secret = folder.parent / "secret"
    secret.write_text("secret\n")
    secret.chmod(0o600)
    return raw().link("updated_files/bin/link", str(secret)).write(folder)


def secret_is_opened(stage):
    assert stage.install().status == 0
    assert stat.S_IMODE((stage.path.parent.parent / "secret").stat().st_mode) == 0o755


def loses_its_mode(stage):
    first = stage.home.write("bin/tool", "old\n", 0o600)
    stage.home.write("bin/second", "old\n", 0o755)
    assert stage.install().status == 0
    assert os.path.samefile(first, stage.home.path / "bin/second")
    assert len({stat.S_IMODE((stage.home.path / name).stat().st_mode) for name in ("bin/tool", "bin/second")}) == 1


def pipe_in_the_home(stage):
    assert stage.install().status == 0
    assert stat.S_ISFIFO((stage.home.path / "bin/pipe").stat().st_mode)


def closed_to_its_owner(folder):
    return raw().file("updated_files/lib/inside").directory("updated_files/lib", 0o055).write(folder)


def inside_is_missing(stage):
    user = None
    if os.geteuid() == 0:
        user = "nobody"
        stage.home.give_to(user)
    result = stage.install(user=user)
    assert (result.status, result.out) == (0, GOOD)
    assert not stage.home.exists("lib/inside")


def fails_after_the_first_commands(stage):
    assert stage.install().status == 24
    assert stage.home.calls() == ["10_first.sh"]


def of_tomorrow():
    return RawArchive(Patch("ox")).file("updated_files/bin/tool", mtime=int(time.time()) + 48 * HOUR)


def of_the_future(stage):
    assert stage.install().status == 0
    assert any("in the future" in line for line in stage.home.log().messages("TRACE"))
    assert (stage.home.path / "bin/tool").stat().st_mtime > time.time()


def report_ends_early(stage):
    assert b"before restarting" not in stage.report().out


def report_has_a_torn_line(stage):
    out = stage.report().out.split(b"\n")
    assert f"    {stage.home.prefix}bin/a".encode() in out and b"tool" in out


def bits_are_lost(stage):
    assert stage.install().status == 0
    assert stat.S_IMODE((stage.home.path / "bin/suid").stat().st_mode) == 0o755


def belongs_to_another(stage):
    assert stage.install().status == 0
    expected = 12345 if os.geteuid() == 0 else os.geteuid()
    assert (stage.home.path / "bin/owned").stat().st_uid == expected


# --- the descriptor's text and the commands ----------------------------------------------------------------------


def script(text, name="10_first.sh", **options):
    return patch(text).script(name, **options)


def ignored(call):
    """A success without this call."""
    return journal_lacks(call)


def installed_without_the_prerequisite(stage):
    stage.home.component("yn", "06100000")
    assert stage.install().status == 0
    assert stage.home.exists("bin/tool")


def error_in_the_log(stage):
    assert stage.install().status == 0
    assert "Properites start before section definition" in stage.errors()


def one_value_in_the_history(stage):
    assert "kox_fp0001" not in {line.name for line in stage.home.history()}


def quotes_in_the_history(stage):
    assert stage.install().status == 0
    assert stage.home.history()[-1].name == '"kox_fp0001"'


def return_in_the_history(stage):
    assert stage.install().status == 0
    assert b"kox\rfp0001" in stage.home.read("patchlogs/patches.hist")


def runs_once(stage):
    assert stage.install().status == 0
    assert stage.home.calls() == ["10_first.sh"]


def runs_in_the_order_of_bytes(stage):
    assert stage.install().status == 0
    assert stage.home.calls() == ["copy.sh", "stop.sh"]


def fails_half_way(stage):
    result = stage.install()
    assert result.status == 21
    assert not stage.home.exists("bin/tool")
    assert [line.result for line in stage.home.history()] == ["FAIL"]


def two_commands(folder):
    text = descriptor("[PreCommands]\nstop.sh\ncopy.sh\n")
    return patch(text).script("stop.sh").script("copy.sh").write(folder)


# --- directories ---------------------------------------------------------------------------------------------


def older_one_last(folder):
    """Names until the directory lists the lower level behind the higher one."""
    for number in range(200):
        patches = [patch(level="06100200", fixpack=f"new{number}"), patch(level="06100100", fixpack=f"old{number}")]
        # In both orders: some file systems list the last one first, whatever its name.
        written = {each.level: each.write(folder) for each in (patches if number % 2 else reversed(patches))}
        newer, older = written["06100200"], written["06100100"]
        listed = os.listdir(folder)
        if listed.index(newer.name) < listed.index(older.name):
            return folder
        newer.unlink()
        older.unlink()
    raise AssertionError("the directory always lists the older one first")


def ends_at_the_older_level(stage):
    assert stage.install().status == 0
    assert stage.home.level("ox") == "06100100"


def prerequisite_beside_it(folder):
    patch(level="06100200").write(folder)
    patch(product="yn", level="06100200", prereqs={"ox": "06.10.02"}).write(folder)
    return folder


def none_is_installed(stage):
    stage.home.component("yn")
    assert stage.install().status in (10, 32)  # by the order of the directory
    assert stage.home.level("ox") == "06100000"


def with_a_digest_beside_it(folder):
    path = patch().write(folder)
    (folder / f"{path.name}.sha256").write_text("0" * 64 + f"  {path.name}\n")
    return folder


def fails_for_the_digest(stage):
    assert stage.install().status in (3, 32)  # by the order of the directory
    assert not stage.home.exists("bin/tool")


def writes(archive):
    """make() of a patch that needs nothing else."""
    return lambda folder: archive().write(folder)


CASES = [
    Case("name-grammar", lambda folder: patch().write(folder, "kox_lpp266_vema.tar"), refused(34)),
    Case("name-product-differs", writes(lambda: patch(descriptor(), product="KOX")), silently_without("bin/tool")),
    Case("family-not-taken", writes(lambda: patch(platform="li6263")), refused(34)),
    Case(
        "support-patch",
        writes(lambda: patch(target="vems")),
        refused_on_every_home,
        {"files": ["config/.ConfigData/kqaenv"]},
    ),
    Case("vecm-product", writes(lambda: patch(target="vecm")), refused_on_every_home),
    Case("no-descriptor", lambda folder: patch().write(folder, dotted=True), refused(3)),
    Case("descriptor-invalid", writes(lambda: patch(descriptor().replace("patchName", "patchname"))), refused(7)),
    Case("incomplete-archive", cut_behind_the_first_file, silently_without("bin/second")),
    Case("tar-fails", no_archive, refused(3)),
    Case("tar-too-loud", many_members_that_tar_speaks_of, waits_for_ever),
    Case("checksum-differs", listed_otherwise, installed_unseen),
    Case("link-member", link_to_a_secret, secret_is_opened),
    Case(
        "hard-link-member",
        writes(lambda: raw().hard_link("updated_files/bin/second", "updated_files/bin/tool")),
        loses_its_mode,
    ),
    Case("special-member", writes(lambda: raw().fifo("updated_files/bin/pipe")), pipe_in_the_home),
    Case("unsafe-name", writes(lambda: raw().file("/updated_file/tool2")), silently_without("updated_file/tool2")),
    Case("unsafe-name", writes(lambda: raw().file("updated_files/../../outside")), refused(3)),
    Case("long-name", writes(lambda: raw().file("updated_files/" + "n" * 256)), refused(3)),
    Case(
        "updated-files-no-directory",
        writes(lambda: Patch("ox").member("updated_files", "x").script("10_first.sh", when="pre_patch")),
        fails_after_the_first_commands,
    ),
    Case("closed-directory", closed_to_its_owner, inside_is_missing),
    Case("nul-byte", writes(lambda: script(descriptor("\0\n[PreCommands]\n10_first.sh\n"))), ignored("10_first.sh")),
    Case(
        "section-twice",
        writes(lambda: script(descriptor("[PreCommands]\n10_first.sh\n[PreCommands]\n"))),
        ignored("10_first.sh"),
    ),
    Case(
        "key-twice",
        writes(lambda: patch(descriptor("[PreReqs]\nkyn = 06.20.00\nyn = 06.10.00\n"))),
        installed_without_the_prerequisite,
    ),
    Case(
        "key-twice",
        writes(lambda: patch(descriptor() + "patchName = second\n")),
        lambda stage: (installed_unseen(stage), one_value_in_the_history(stage)),
    ),
    Case("stray-line", writes(lambda: patch("remark\n" + descriptor())), error_in_the_log),
    Case(
        "looks-like-section", writes(lambda: script(descriptor("[Precommands]\n10_first.sh\n"))), ignored("10_first.sh")
    ),
    Case(
        "looks-like-section", writes(lambda: script(descriptor("[PreCommands\n10_first.sh\n"))), ignored("10_first.sh")
    ),
    Case(
        "looks-like-section",
        writes(lambda: script(descriptor("[PreCommands] before\n10_first.sh\n"))),
        ignored("10_first.sh"),
    ),
    Case(
        "level-digits",
        writes(lambda: patch(descriptor(level={"productMod": "1", "productLvl": "0"}))),
        breaks_the_version_file,
    ),
    Case("level-digits", writes(lambda: patch(descriptor(level={"productVer": "6"}))), refused(10)),
    Case("prereq-level", writes(lambda: patch(descriptor("[PreReqs]\nyn = 5.20\n"))), takes_the_default_level),
    Case("prereq-kind", writes(lambda: patch(descriptor("[PreReqs]\nqa = 06.10.00\n"))), refused_on_every_home),
    Case("all-is-hidden", writes(lambda: patch(descriptor("[Dependents]\nAX\nall\n"))), leaves_an_agent_running),
    Case(
        "command-cut",
        writes(
            lambda: script(descriptor("[PreCommands]\n10_first.sh=fast\n")).member(
                "10_first.sh", "#!/bin/sh\nexit 3\n", 0o755
            )
        ),
        fails_half_way,
    ),
    Case("command-has-blank", writes(lambda: script(descriptor("[PreCommands]\n10_first.sh fast\n"))), fails_half_way),
    Case("command-not-found", writes(lambda: patch(descriptor("[PreCommands]\n10_absent.sh\n"))), fails_half_way),
    Case(
        "command-not-executable",
        writes(lambda: script(descriptor("[PreCommands]\n10_first.sh\n"), mode=0o644)),
        fails_half_way,
    ),
    Case("command-twice", writes(lambda: script(descriptor("[PreCommands]\n10_first.sh\n10_first.sh\n"))), runs_once),
    Case("same-product-twice", older_one_last, ends_at_the_older_level),
    Case("prereq-in-same-set", prerequisite_beside_it, none_is_installed),
    Case("companion-is-patch", with_a_digest_beside_it, fails_for_the_digest),
    Case("no-checksum", not_listed, installed_unseen),
    Case("future-time", writes(of_tomorrow), of_the_future),
    Case("no-updated-files", writes(lambda: Patch("ox")), report_ends_early),
    Case("command-order", two_commands, runs_in_the_order_of_bytes),
    Case("foreign-syntax", writes(lambda: patch(descriptor(name='"kox_fp0001"'))), quotes_in_the_history),
    Case("odd-text", writes(lambda: patch(descriptor(name="kox\rfp0001"))), return_in_the_history),
    Case("odd-name", writes(lambda: raw().file("updated_files/bin/a\ntool")), report_has_a_torn_line),
    Case("product-exe-unused", writes(lambda: patch(descriptor() + "productEXE = kox.exe\n")), copies_stay_old),
    Case("set-id-member", writes(lambda: raw().file("updated_files/bin/suid", mode=0o4755)), bits_are_lost),
    Case(
        "foreign-owner", writes(lambda: raw().file("updated_files/bin/owned", uid=12345, gid=54321)), belongs_to_another
    ),
    Case("history-columns", writes(lambda: patch(descriptor(name="a name that is much too long"))), columns_break),
    Case("history-columns", writes(lambda: patch(descriptor(name="a | b"))), columns_break),
]
