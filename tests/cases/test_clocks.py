"""The clock of the host: beyond 2038, in zones west and east of it, and set back while the program runs."""

import calendar
import re
import shutil

import pytest

from support import Patch

BEYOND = calendar.timegm((2039, 5, 6, 13, 4, 5))
HOUR = 3600


@pytest.fixture
def clock(site, scratch):
    """Sets the clock that the program sees: clock(seconds since the epoch)."""
    if site.program.runner:
        pytest.skip("the emulator would take the preloaded clock for its own")
    library = site.program.binary.parent / "tests/libclock.so"
    if not library.exists():
        pytest.skip("this build has no clock to preload")
    shutil.copy(library, scratch)
    time_file = scratch / "time"
    site.env.update(LD_PRELOAD=str(scratch / library.name), ORVPATCH_CLOCK=str(time_file))

    def set_to(seconds):
        time_file.write_text(f"{seconds}\n")
        return time_file

    return set_to


def clocks(site):
    """The times of the log's lines, in order, each once."""
    found = re.findall(r"^(?:ERROR|INFO |TRACE) (\S+) \(", site.home.read("patchlogs/orvpatch.log").decode(), re.M)
    return list(dict.fromkeys(found))


@pytest.mark.parametrize(
    "zone, time, date",
    [
        ("UTC0", "13:04:05", "05/06/2039 13:04:05"),
        ("EAST-9:30", "22:34:05", "05/06/2039 22:34:05"),
        ("NEXT-11", "00:04:05", "05/07/2039 00:04:05"),
        ("WEST13", "00:04:05", "05/06/2039 00:04:05"),
        ("SUMMER5SAVED,J100,J200", "09:04:05", "05/06/2039 09:04:05"),
    ],
)
def test_log_and_history_show_the_local_time_of_any_year(site, clock, zone, time, date):
    clock(BEYOND)
    site.home.component("ox")
    site.env["TZ"] = zone
    assert site.install(Patch("ox").file("bin/tool")) == site.done()
    assert clocks(site) == [time]
    assert [record.date for record in site.home.history()] == [date]


def test_a_clock_that_is_set_back_changes_the_times_alone(site, clock):
    file = clock(BEYOND)
    site.home.component("ox")
    site.env["TZ"] = "UTC0"
    patch = Patch("ox").file("bin/tool").script("back.sh", when="pre", body=f"echo {BEYOND - HOUR} >{file}")
    assert site.install(patch) == site.done()
    assert clocks(site) == ["13:04:05", "12:04:05"]
    assert [record.date for record in site.home.history()] == ["05/06/2039 12:04:05"]
    assert site.home.exists("bin/tool")
