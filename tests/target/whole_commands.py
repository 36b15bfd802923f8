"""Whole commands that between them end in every way a command can end.

An arrangement gets a home and an empty folder for patches, prepares both, and returns the words of the command
that follow "orvpatch". Each is entered with the exit status that the command must have.
"""

import os

from support import Patch, stubs

COMMANDS = {}  # name -> (exit status, arrangement)


def command(status):
    def enter(arrange):
        COMMANDS[arrange.__name__] = (status, arrange)
        return arrange

    return enter


def product(home, *running, **options):
    """Installs kxe and starts these instances of it."""
    home.component("xe", desc="Database Agent", **options)
    for instance in running:
        home.start("xe", instance)
    home.write("bin/kxeagent", b"old\n", 0o750)


def patch(**options):
    return Patch("xe", level="06100001", **options).file("bin/kxeagent").file("lib/new/table", b"\x00\xff")


def act(action, home, path):
    return ["-h", home, action, path]


# --- command lines and paths ---------------------------------------------------------------------------------


@command(1)
def usage(home, patches):
    return ["-h", home, "-h", patches]


@command(2)
def no_home(home, patches):
    return ["-h", home.path / "absent", "-t", patches]


@command(30)
def no_such_path(home, patches):
    return act("-i", home, patches / "absent")


@command(31)
def empty_directory(home, patches):
    return act("-t", home, patches)


@command(32)
def nothing_applies(home, patches):
    Patch("xe", platform="aix536").write(patches)
    return act("-i", home, patches)


@command(34)
def file_does_not_apply(home, patches):
    return act("-t", home, patch().write(patches))


@command(0)
def report_of_a_device(home, patches):
    return act("-t", home, "/dev/null")


# --- descriptors ---------------------------------------------------------------------------------------------


@command(0)
def valid_descriptor(home, patches):
    return act("-vi", home, patch(prereqs={"AX": "061000"}).write_descriptor(patches / "patch.ini"))


@command(5)
def no_descriptor(home, patches):
    return act("-vi", home, patches / "patch.ini")


@command(6)
def descriptor_without_product(home, patches):
    return act("-vi", home, patch(descriptor="[PreReqs]\nax = 061000\n").write_descriptor(patches / "patch.ini"))


@command(7)
def descriptor_without_name(home, patches):
    text = patch().descriptor_text().replace("patchName", "patchname")
    return act("-vi", home, patch(descriptor=text).write_descriptor(patches / "patch.ini"))


# --- refusals ------------------------------------------------------------------------------------------------


@command(3)
def dotted_members(home, patches):
    product(home)
    return act("-i", home, patch().write(patches, dotted=True))


@command(9)
def missing_prerequisite(home, patches):
    product(home)
    return act("-i", home, patch(prereqs={"ax": "06.10.00"}).write(patches))


@command(10)
def old_prerequisite(home, patches):
    product(home, prereqs=["axlpp266"])
    home.component("ax")
    return act("-t", home, patch(prereqs={"ax": "06.10.00.01"}).write(patches))


@command(11)
def older_patch(home, patches):
    product(home, level="06100002")
    return act("-i", home, patch().write(patches))


@command(24)
def file_in_place_of_the_temporary_folder(home, patches):
    product(home)
    home.write("tmp/kxe")
    return act("-i", home, patch().write(patches))


@command(35)
def monitoring_server_runs(home, patches):
    home.component("qa")
    home.start("qa")
    return act("-i", home, Patch("qa", target="vems").write(patches))


@command(36)
def portal_server_runs(home, patches):
    home.component("pt")
    home.start("pt")
    return act("-t", home, Patch("pt", target="veps").write(patches))


@command(37)
def console_runs(home, patches):
    home.component("zt")
    home.start_console()
    return act("-i", home, Patch("zt", target="vecm").write(patches))


# --- reports -------------------------------------------------------------------------------------------------


@command(0)
def report_of_two_patches(home, patches):
    product(home, "prod", "")
    home.component("qa")
    patch(dependents=["all"]).script("2.sh", "pre").script("10.sh", "pre").script("1.sh", "pre_patch").write(patches)
    Patch("qa", target="vems").file("bin/server").script("1.sh", "post").write(patches)
    return act("-t", home, patches)


@command(4)
def report_that_ends_early(home, patches):
    product(home)
    text = "stray line\n" + Patch("xe", exe="kxeagent").descriptor_text()
    return act("-t", home, Patch("xe", descriptor=text).write(patches))


@command(27)
def report_over_a_planted_link(home, patches):
    product(home)
    os.symlink(home.mkdir("classes/kept"), home.path / "tmp/kxe")
    return act("-t", home, Patch("xe").write(patches))


# --- installs ------------------------------------------------------------------------------------------------


@command(0)
def install(home, patches):
    product(home, "prod", "test")
    for code in ("ox", "wn", "ax"):
        home.component(code)
    home.start("ox")
    home.start("wn", "http")
    home.start("wn", "kwnsnetd_1")
    made = patch(dependents=["kox", "wn", "kax"], prereqs={"xe": "061000", "ax": "06.10.00.00"})
    made.script("1.sh", "pre_patch", out="room\n").script("2.sh", "pre").script("3.sh", "post", err="done\n")
    return act("-i", home, made.symlink("updated_files/lib/link", "new/table").write(patches))


@command(0)
def install_of_every_kind(home, patches):
    product(home)
    for code in ("qa", "pt", "dk", "zt"):
        home.component(code)
    patch().write(patches)
    for code, target in [("qa", "vems"), ("pt", "veps"), ("dk", "vepd"), ("zt", "vecm")]:
        Patch(code, target=target).file(f"lib/{code}").write(patches)
    return act("-i", home, patches)


@command(0)
def install_without_files(home, patches):
    product(home)
    return act("-i", home, Patch("xe").write(patches))


@command(0)
def install_with_an_unwritable_log(home, patches):
    product(home)
    home.remove("patchlogs")
    home.write("patchlogs")
    return act("-i", home, patch().write(patches))


@command(3)
def second_archive_is_cut(home, patches):
    """The descriptor can be read, the rest cannot."""
    product(home)
    made = patch().member("zz", bytes(20000)).write(patches)
    os.truncate(made, os.path.getsize(made) // 2)
    return act("-i", home, made)


@command(12)
def agent_does_not_start(home, patches):
    product(home, "")
    home.fail("start", "xe", err="no licence\n")
    return act("-i", home, patch().write(patches))


@command(13)
def instance_does_not_start(home, patches):
    product(home, "prod")
    home.fail("start", "xe", status=255)
    return act("-i", home, patch().write(patches))


@command(14)
def agent_does_not_stop(home, patches):
    product(home, "")
    home.fail("stop", "xe")
    return act("-i", home, patch().write(patches))


@command(15)
def instance_does_not_stop(home, patches):
    product(home, "prod")
    home.fail("stop", "xe")
    return act("-i", home, patch().write(patches))


def server_fails(verb, instance, home, patches):
    """A patch of an agent on which the monitoring server depends."""
    product(home)
    home.component("qa")
    home.start("qa", instance)
    home.fail(verb, "qa")
    return act("-i", home, patch(dependents=["kqa"]).write(patches))


@command(16)
def server_does_not_start(home, patches):
    return server_fails("start", "", home, patches)


@command(18)
def server_does_not_stop(home, patches):
    return server_fails("stop", "", home, patches)


@command(19)
def server_instance_does_not_start(home, patches):
    return server_fails("start", "hub", home, patches)


@command(19)
def server_instance_does_not_stop(home, patches):
    return server_fails("stop", "hub", home, patches)


@command(21)
def pre_command_fails(home, patches):
    product(home, "prod")
    return act("-i", home, patch().script("1.sh", "pre", status=3, out="o", err="e").write(patches))


@command(22)
def pre_patch_command_is_missing(home, patches):
    product(home, "prod")
    return act("-i", home, patch().command("pre_patch", "run.sh fast").write(patches))


@command(23)
def post_command_fails(home, patches):
    product(home)
    home.component("ox")
    home.start("ox")
    made = patch(dependents=["ox"]).script("1.sh", "post", body="kill -9 $$").command("post", "false")
    return act("-i", home, made.write(patches))


@command(25)
def file_cannot_be_placed(home, patches):
    product(home)
    home.remove("bin/kxeagent")
    home.mkdir("bin/kxeagent")
    return act("-i", home, Patch("xe").file("bin/kxeagent").write(patches))


@command(26)
def folder_cannot_be_made(home, patches):
    product(home)
    os.symlink("nowhere/at/all", home.path / "lib")
    return act("-i", home, patch().write(patches))


@command(28)
def version_file_is_gone(home, patches):
    product(home)
    return act("-i", home, patch().script("1.sh", "post", body='rm "$quill_home/registry/xelpp266.ver"').write(patches))


# --- the environment -----------------------------------------------------------------------------------------

ENVIRONMENTS = {
    "log on standard output": lambda folder: {"PATCH_DEBUG": ""},
    "no ps": lambda folder: {"PATH": stubs(folder / "stubs", ps="exit 1")},
}
