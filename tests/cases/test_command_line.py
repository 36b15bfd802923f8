"""Which command lines are taken, what becomes of the home, and how each action ends."""

import pytest

from support import Patch
from support.catalogue import text

from productsite import SUCCESS, bad_home, usage

VALID = Patch("ox").descriptor_text()


@pytest.mark.parametrize(
    "words",
    [
        [],
        ["-h"],
        ["--help"],
        ["-h", "HOME"],
        ["-h", "HOME", "-i"],  # no path
        ["-i", "FILE", "-t", "FILE"],  # two actions
        ["-vi", "FILE", "-i", "FILE"],
        ["-i", "FILE", "-i", "FILE"],
        ["-h", "HOME", "-h", "HOME"],  # two homes
        ["-h", "HOME", "-i", "FILE", "-t"],  # too many words
        ["-h", "HOME", "-i", "FILE", "-t", "FILE"],
        ["-h", "HOME", "-x", "FILE"],  # unknown words
        ["-h", "HOME", "-I", "FILE"],
        ["-H", "HOME", "-i", "FILE"],
        ["-h", "HOME", "-utest", "FILE"],
        ["-h", "HOME", "", "FILE"],
        ["HOME", "-h", "-i", "FILE"],
        ["-h", "HOME", "FILE", "-i"],
        ["-hHOME", "x", "-i", "FILE"],  # no clustering, no "="
        ["-h=HOME", "x", "-i", "FILE"],
        ["-utest", "-h", "HOME"],  # the self-check's word in another place
        ["-h", "-utest", "HOME"],
        ["-h", "HOME", "-utest "],
    ],
    ids=" ".join,
)
def test_any_other_command_line_prints_the_usage(site, words):
    places = {"HOME": site.home.path, "FILE": site.target(Patch("ox"))}
    assert site.run(*[places.get(word, word) for word in words]) == usage()
    assert site.changes() == []
    assert not site.home.exists("patchlogs/orvpatch.log")


def test_the_words_are_checked_before_the_home(site):
    assert site.run("-h", "/nonexistent", "-x", "y") == usage()


def test_the_pairs_may_come_in_either_order(site):
    path = site.descriptor(VALID)
    assert site.run("-vi", path, "-h", site.home) == site.done(f"\n{path} is valid\n\n")


@pytest.mark.parametrize("word", ["-h", "-i", "-t", "-vi", "-utest"])
def test_the_value_of_an_option_may_look_like_an_option(site, word):
    expected = site.failed(30, text("ERROR_DCFPP_PATH", word))
    assert site.run("-i", word, "-h", site.home, cwd=site.patch_dir) == expected


@pytest.mark.parametrize("given", ["/nonexistent", "/nonexistent/"])
def test_a_home_that_is_not_there_ends_with_status_2(site, given):
    assert site.run("-h", given, "-t", site.patch_dir) == bad_home("/nonexistent/")


def test_a_file_is_no_home(site):
    given = site.descriptor(VALID)
    assert site.run("-h", given, "-vi", given) == bad_home(f"{given}/")
    assert site.listed() == ["patch.ini"]


@pytest.mark.parametrize("mode", [0o300, 0o111])
def test_a_home_that_may_not_be_read_is_one_all_the_same(site, mode):
    path = site.descriptor(VALID)
    site.as_ordinary_user()
    site.home.path.chmod(mode)
    result = site.program.validate(site.home, path, user=site.user)
    site.home.path.chmod(0o755)
    assert result == site.done(f"\n{path} is valid\n\n")


def test_a_bad_home_of_the_self_check_ends_with_status_2(site):
    assert site.run("-h", "/nonexistent", "-utest") == bad_home("/nonexistent/")


@pytest.mark.parametrize("slash", ["", "/", "//"])
def test_the_home_is_exported_with_one_slash_at_its_end_unless_it_has_one(site, slash):
    site.home.component("ox")
    target = site.target(Patch("ox").script("go.sh", when="pre"))
    assert site.run("-h", f"{site.home.path}{slash}", "-i", target, env={"QUILLHOME": "/elsewhere/"}).status == 0
    (call,) = site.home.journal()
    assert call.quillhome == f"{site.home.path}{slash or '/'}"


def test_a_descriptor_is_validated_without_touching_the_home(site):
    assert site.validate(VALID) == site.done(f"\n{site.patch_dir}/patch.ini is valid\n\n")
    assert site.changes() == []


def test_a_path_is_shown_as_it_was_given(site):
    site.descriptor(VALID)
    assert site.validate("./../patches/patch.ini", cwd=site.patch_dir) == site.done(
        "\n./../patches/patch.ini is valid\n\n"
    )


def test_the_verdict_is_logged_as_information(site):
    # KEEP(verdict-at-info): that of a failure too.
    site.validate(VALID)
    assert site.log()[-2:] == [("INFO", "main", text("MAIN_SUCCESSFUL")), ("TRACE", "main", "main = 0")]
    folder = f"{site.home.prefix}patchlogs/"
    result = site.validate("absent")
    assert result.out.decode() == f"\n{text('MAIN_NOT_SUCCESSFUL', folder)}\n\n"
    assert site.log()[-2:] == [("INFO", "main", text("MAIN_NOT_SUCCESSFUL", folder)), ("TRACE", "main", "main = 5")]


@pytest.mark.parametrize("first", ["-h", "x", "-t", ""])
def test_the_self_check_always_succeeds(site, first):
    # KEEP(utest-success): what it finds goes to the error output alone.
    result = site.run(first, site.home, "-utest")
    rule = "-" * 40
    banner = f"{rule}\n- Testing patchProcesser API's\n{rule}\n"
    assert (result.status, result.out) == (0, (banner + SUCCESS).encode())
    assert result.err.startswith(b"Can't initialize patch processor, Error: ")
    argv = [*site.program.argv[-1:], first, site.home.path, "-utest"]
    assert site.log()[:5] == [
        ("TRACE", "main", message)
        for message in ["main entry", *[f"arg[{at}]: {word}" for at, word in enumerate(argv)]]
    ]
    assert site.log()[-2:] == [("INFO", "main", text("MAIN_SUCCESSFUL")), ("TRACE", "main", "main = 0")]
