"""Whole runs in the log: level, component and message of every line, in order."""

from support import Patch

from golden import golden, told, words_of

# Short codes and an OS agent's descriptor with all that it may have.
DESCRIPTOR = (
    Patch("ox", exe="x", prereqs={"gl": "061000"}, dependents=["ul", "kyn"], post=["a"])
    .descriptor_text()
    .replace("= kox", "= OX", 1)
)


def expect(site, name, result, status, **words):
    assert told(site.log()) == golden(name, **words_of(site, **words))
    assert result.status == status


def test_a_validation(site):
    path = site.descriptor(DESCRIPTOR)
    expect(site, "validation", site.validate(path), 0, GIVEN=path)


def test_an_installation(site):
    """One patch with scripts of each kind, prerequisites, dependents, a replaced file, the OS agent."""
    home = site.home
    home.component("ox")
    home.component("yn", prereqs=["oxlpp266|none"])
    home.component("qa")
    home.start("ox")
    home.start("yn", "north")
    home.write("bin/tool", "old")
    pids = {"PID ox": home.pid("ox"), "PID yn north": home.pid("yn", "north")}
    patch = (
        Patch("yn", prereqs={"kox": "06.10.00", "kyn": "06100000"}, dependents=["kox", "kzz"])
        .file("bin/tool")
        .script("1.sh", "pre_patch", out="one")
        .script("2.sh", "pre")
        .script("3a.sh", "post", err="three")
        .script("3b.sh", "post")
    )
    expect(site, "installation", site.install(patch), 0, **pids)


def test_an_installation_that_fails(site):
    """The files are in place, one of them in a new directory, when a command fails."""
    site.home.component("yn")
    site.home.start("yn")
    pids = {"PID yn": site.home.pid("yn")}
    patch = Patch("yn").file("new/file").script("a.sh", "post", status=3, out="o", err="e")
    expect(site, "failure", site.install(patch), 23, **pids)


def test_a_report_on_a_directory(site):
    # KEEP(testpatch-entry): the first line has "entry" where the last one has the path.
    site.home.component("ox")
    site.home.start("ox")
    site.target(Patch("ox", pre=["x"]).file("bin/ox"))
    expect(site, "report", site.report(site.patch_dir), 0, **{"PID ox": site.home.pid("ox")})
