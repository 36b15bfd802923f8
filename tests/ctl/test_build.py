"""new and build: a tree that is good from the start, and an archive that depends on nothing but the tree."""

import hashlib
import os
import shutil
import stat
import subprocess
import tarfile

import pytest

from support import Result

EPOCH = "1500000000"


@pytest.fixture
def tree(ctl, scratch):
    """A source tree with commands, what they need, and files."""
    folder = scratch / "tree"
    assert ctl.run("new", folder, "--product", "ox", "--level", "06.10.01.00").status == 0
    for path in (
        "updated_files/bin/tool",
        "updated_files/b",
        "updated_files/b.d/x",
        "data/table",
        "20-more.sh",
        ".git",
    ):
        (folder / path).parent.mkdir(parents=True, exist_ok=True)
        (folder / path).write_text(f"{path}\n")
    (folder / "updated_files/bin/tool").chmod(0o755)
    return folder


@pytest.fixture
def out(scratch):
    folder = scratch / "out"
    folder.mkdir()
    return folder


def build(ctl, tree, out, *words, status=0, **options):
    return ctl.document("build", tree, "-o", out, *words, status=status, **options)


def contents(folder):
    return {path.name: path.read_bytes() for path in folder.iterdir()}


# --- new -----------------------------------------------------------------------------------------------------------


@pytest.mark.parametrize("words", [[], ["--name", "second", "--description", "A second 100 % try"]])
@pytest.mark.parametrize(
    "product, target",
    [("kyn", "vema"), ("yn", "vema"), ("kqa", "vems"), ("kpt", "veps"), ("kdk", "vepd"), ("zt", "vecm")],
)
def test_what_new_makes_is_built_without_a_finding(ctl, scratch, out, product, target, words):
    made = ctl.document("new", scratch / "tree", "--product", product, "--level", "06.10.00.02", *words)
    assert sorted(made["files"]) == sorted(os.listdir(scratch / "tree"))
    document = build(ctl, scratch / "tree", out)
    code = product if len(product) == 3 else f"k{product}"
    assert document["archive"] == f"{out}/{code}_lpp266_{target}_fp0002.tar"
    assert document["findings"] == []
    assert ctl.document("lint", "--strict", out)["findings"] == []
    shown = ctl.document("show", document["archive"])
    assert (shown["product"], shown["level"]) == (code, "06.10.00.02")
    assert shown["name"] == (words[1] if words else f"{code}_fp0002")
    assert shown["commands"] == {"prePatch": [], "pre": ["10-prepare.sh"], "post": []}


def test_what_new_makes_can_be_installed(ctl, program, home, scratch, out):
    ctl.run("new", scratch / "tree", "--product", "ox", "--level", "06100002")
    (scratch / "tree/updated_files/tool").write_text("new\n")
    home.component("ox")
    assert program.install(home, build(ctl, scratch / "tree", out)["archive"]).status == 0
    assert home.read("tool") == b"new\n"
    assert home.level("ox") == "06100002"


@pytest.mark.parametrize("make", [lambda path: path.mkdir(), lambda path: path.write_text("")], ids=["folder", "file"])
def test_new_refuses_what_exists(ctl, scratch, make):
    make(scratch / "tree")
    before = os.lstat(scratch / "tree").st_mtime_ns
    result = ctl.run("new", scratch / "tree", "--product", "ox", "--level", "06.10.00.02")
    assert result == Result(2, b"", f"orvpatchctl: cannot make {scratch}/tree: File exists\n".encode())
    assert os.lstat(scratch / "tree").st_mtime_ns == before


@pytest.mark.parametrize(
    "product, level, more",
    [
        ("k", "06.10.00.02", []),
        ("k/n", "06.10.00.02", []),
        ("kyn", "6.1", []),
        ("kyn", "06.1000.02", []),
        ("kyn", "06.10.00.0x", []),
        ("kyn", "06.10.00.02", ["--name", "a\nb"]),
    ],
)
def test_new_makes_nothing_of_what_is_no_product_and_no_level(ctl, scratch, product, level, more):
    result = ctl.run("new", scratch / "tree", "--product", product, "--level", level, *more)
    assert (result.status, result.out) == (2, b"")
    assert not (scratch / "tree").exists()


# --- build ---------------------------------------------------------------------------------------------------------


def test_members_come_in_their_order_and_plain(ctl, tree, out):
    (tree / "updated_files/bin/tool").chmod(0o6711)
    archive = build(ctl, tree, out)["archive"]
    listing = subprocess.run(["tar", "-tf", archive], stdout=subprocess.PIPE, stderr=subprocess.PIPE, check=True)
    assert listing.stderr == b""
    assert listing.stdout.decode().splitlines() == [
        "patch.ini",
        "10-prepare.sh",
        "20-more.sh",
        "data/",
        "data/table",
        "updated_files/",
        "updated_files/b",
        "updated_files/b.d/",
        "updated_files/b.d/x",
        "updated_files/bin/",
        "updated_files/bin/tool",
    ]
    with tarfile.open(archive) as opened:
        members = {member.name: member for member in opened}
    assert {(member.uid, member.gid, member.uname, member.gname) for member in members.values()} == {(0, 0, "", "")}
    modes = {name: member.mode for name, member in members.items()}
    assert {name for name, mode in modes.items() if mode == 0o755} == {
        "10-prepare.sh",
        "data",
        "updated_files",
        "updated_files/b.d",
        "updated_files/bin",
        "updated_files/bin/tool",
    }
    assert set(modes.values()) == {0o755, 0o644}


def test_the_archive_holds_what_the_tree_holds(ctl, tree, out, scratch):
    (tree / "updated_files/long").mkdir()
    long_name = "updated_files/long/" + "n" * 200
    (tree / long_name).write_bytes(os.urandom(200_000))
    (tree / os.fsdecode(b"updated_files/long/\xff\xfe")).write_bytes(b"")
    unpacked = scratch / "unpacked"
    unpacked.mkdir()
    done = subprocess.run(
        ["tar", "-xf", build(ctl, tree, out)["archive"], "-C", unpacked], stderr=subprocess.PIPE, check=True
    )
    assert done.stderr == b""
    assert subprocess.run(["diff", "-r", "-x", ".git", tree, unpacked], check=False).returncode == 0


def test_it_is_the_same_bit_for_bit_wherever_it_is_built(ctl, tree, scratch):
    one, two, copy = scratch / "one", scratch / "two", scratch / "elsewhere/copy"
    for folder in (one, two):
        folder.mkdir()
        folder.chmod(0o777)
    copy.parent.mkdir()
    shutil.copytree(tree, copy)
    for path in [copy, *copy.rglob("*")]:
        path.chmod(0o777 if stat.S_IMODE(path.stat().st_mode) & 0o100 else 0o664)
        os.utime(path, (1700000000, 1700000000))
    first = build(ctl, tree, one, env={"SOURCE_DATE_EPOCH": EPOCH, "TZ": "UTC"})
    old = os.umask(0o007)
    try:
        user = "nobody" if os.geteuid() == 0 else None
        second = build(
            ctl,
            copy,
            two,
            user=user,
            env={"SOURCE_DATE_EPOCH": EPOCH, "TZ": "Pacific/Auckland", "LC_ALL": "C.UTF-8", "LANG": "de_DE.UTF-8"},
        )
    finally:
        os.umask(old)
    assert first["sha256"] == second["sha256"]
    assert [content for _, content in sorted(contents(one).items())] == [
        content for _, content in sorted(contents(two).items())
    ]
    assert hashlib.sha256((one / "kox_lpp266_vema_fp0100.tar").read_bytes()).hexdigest() == first["sha256"]


def test_times_are_clamped(ctl, tree, out):
    os.utime(tree / "updated_files/b", (1400000000, 1400000000))
    with tarfile.open(build(ctl, tree, out, env={"SOURCE_DATE_EPOCH": EPOCH})["archive"]) as opened:
        times = {member.name: member.mtime for member in opened}
    assert times.pop("updated_files/b") == 1400000000
    assert set(times.values()) == {int(EPOCH)}


def test_the_list_keeps_its_other_lines_and_one_for_the_archive(ctl, tree, out):
    other = "0" * 64 + "  other.tar\n"
    (out / "SHA256SUMS").write_text(other)
    build(ctl, tree, out, env={"SOURCE_DATE_EPOCH": EPOCH})
    (tree / "updated_files/b").write_text("changed\n")
    document = build(ctl, tree, out, env={"SOURCE_DATE_EPOCH": EPOCH})
    name = "kox_lpp266_vema_fp0100.tar"
    assert (out / "SHA256SUMS").read_text() == f"{other}{document['sha256']}  {name}\n"
    assert sorted(contents(out)) == ["SHA256SUMS", name]
    assert (
        subprocess.run(
            ["sha256sum", "--ignore-missing", "--status", "-c", "SHA256SUMS"], cwd=out, check=False
        ).returncode
        == 0
    )
    assert stat.S_IMODE((out / name).stat().st_mode) == 0o644


def test_the_name_follows_the_options(ctl, tree, out):
    document = build(ctl, tree, out, "--platform", "unix", "--target", "vema", "--fixpack", "0007")
    assert document["archive"] == f"{out}/kox_unix_vema_0007.tar"


BROKEN = {
    "an error of lint": lambda tree: (tree / "10-prepare.sh").unlink(),
    "a link": lambda tree: (tree / "updated_files/link").symlink_to("b"),
    "a pipe": lambda tree: os.mkfifo(tree / "updated_files/pipe"),
}


@pytest.mark.parametrize("existing", [False, True], ids=["fresh", "rebuilt"])
@pytest.mark.parametrize("kind", BROKEN)
def test_a_tree_that_lint_refuses_leaves_nothing_behind(ctl, tree, out, kind, existing):
    if existing:
        build(ctl, tree, out)
        (out / "SHA256SUMS.asc").write_text("a signature\n")
    before = contents(out)
    BROKEN[kind](tree)
    document = build(ctl, tree, out, status=1)
    assert (document["archive"], document["sha256"], document["signature"]) == (None, None, None)
    assert document["errors"] >= 1
    assert contents(out) == before


@pytest.mark.parametrize(
    "words, said",
    [
        (["{tree}", "-o", "{scratch}/none"], b"No such file"),
        (["{scratch}/none"], b"no directory"),
        (["{tree}", "--fixpack", "a/b"], b"no name of a file"),
        (["{tree}", "--sign", "no-such-key"], b"cannot sign"),
    ],
)
def test_what_cannot_be_built_is_status_2_and_leaves_nothing(ctl, tree, out, scratch, words, said):
    words = [word.format(tree=tree, scratch=scratch) for word in words]
    result = ctl.run("build", *words, cwd=out, env={"GNUPGHOME": str(scratch)})
    assert (result.status, result.out) == (2, b"")
    assert said in result.err
    assert contents(out) == {}


def test_a_descriptor_that_is_none_is_status_2(ctl, tree, out):
    (tree / "patch.ini").write_text("[ProductInfo]\n")
    result = ctl.run("build", tree, "-o", out)
    assert (result.status, result.out, result.err) == (2, b"", b"orvpatchctl: Missing required property: productEXE\n")


# --- signatures ----------------------------------------------------------------------------------------------------


@pytest.fixture
def key(tmp_path):
    """The folder of a key without a passphrase; its agent ends with the test. A short path: it holds sockets."""
    folder = tmp_path / "g"
    folder.mkdir(mode=0o700)
    environment = {**os.environ, "GNUPGHOME": str(folder)}
    subprocess.run(
        ["gpg", "--batch", "--passphrase", "", "--quick-gen-key", "builder@example.com", "ed25519", "sign"],
        env=environment,
        check=True,
        capture_output=True,
    )
    with open(folder / "public.gpg", "wb") as public:
        subprocess.run(["gpg", "--export"], env=environment, stdout=public, check=True)
    yield folder
    subprocess.run(["gpgconf", "--kill", "all"], env=environment, check=True)


def is_signed(out, key):
    done = subprocess.run(
        ["gpgv", "--keyring", key / "public.gpg", out / "SHA256SUMS.asc", out / "SHA256SUMS"],
        capture_output=True,
        check=False,
    )
    return done.returncode == 0


def test_gpgv_accepts_the_signature(ctl, tree, out, key):
    document = build(ctl, tree, out, "--sign", "builder@example.com", env={"GNUPGHOME": str(key)})
    assert document["signature"] == f"{out}/SHA256SUMS.asc"
    assert is_signed(out, key)
    with open(out / "SHA256SUMS", "a", encoding="ascii") as sums:
        sums.write("0" * 64 + "  other.tar\n")
    assert not is_signed(out, key)


def test_a_signature_of_another_list_does_not_stay(ctl, tree, out, key):
    build(ctl, tree, out, "--sign", "builder@example.com", env={"GNUPGHOME": str(key)})
    assert build(ctl, tree, out)["signature"] is None
    assert is_signed(out, key)  # nothing has changed
    (tree / "updated_files/b").write_text("changed\n")
    result = ctl.run("build", tree, "-o", out)
    assert result.status == 0
    assert b"removed" in result.err
    assert not (out / "SHA256SUMS.asc").exists()
