"""The build date that the header of the log shows: month and day without a leading zero, year and clock with it."""

import os
import subprocess
from datetime import datetime, timezone
from pathlib import Path

import pytest

SCRIPT = Path(__file__).resolve().parents[2] / "cmake/buildtime.cmake"

MOMENTS = {  # UTC -> how the header shows it
    (2007, 3, 5, 21, 48, 44): "3/5/07 21:48:44",
    (1999, 12, 31, 23, 59, 59): "12/31/99 23:59:59",
    (2000, 1, 1, 0, 0, 0): "1/1/00 00:00:00",
    (2010, 10, 10, 10, 10, 10): "10/10/10 10:10:10",
    (2001, 1, 20, 1, 2, 3): "1/20/01 01:02:03",
    (2008, 11, 9, 12, 0, 5): "11/9/08 12:00:05",
}


@pytest.mark.parametrize("zone", ["UTC", "Asia/Tokyo"])
@pytest.mark.parametrize("moment", MOMENTS, ids=str)
def test_it_is_that_of_source_date_epoch(tmp_path, moment, zone):
    shown = tmp_path / "show.cmake"
    shown.write_text(
        f'include("{SCRIPT}")\n' f'file(WRITE "{tmp_path}/shown" "${{ORVPATCH_BUILD_DATE}} ${{ORVPATCH_BUILD_TIME}}")\n'
    )
    epoch = str(int(datetime(*moment, tzinfo=timezone.utc).timestamp()))
    subprocess.run(["cmake", "-P", shown], check=True, env={**os.environ, "SOURCE_DATE_EPOCH": epoch, "TZ": zone})
    assert (tmp_path / "shown").read_text() == MOMENTS[moment]


def test_without_source_date_epoch_it_is_the_local_time_of_configuration(tmp_path):
    shown = tmp_path / "show.cmake"
    shown.write_text(f'include("{SCRIPT}")\nfile(WRITE "{tmp_path}/shown" "${{ORVPATCH_BUILD_DATE}}")\n')
    environment = {name: value for name, value in os.environ.items() if name != "SOURCE_DATE_EPOCH"}
    before = datetime.now(timezone.utc)
    subprocess.run(["cmake", "-P", shown], check=True, env={**environment, "TZ": ""})
    after = datetime.now(timezone.utc)
    month, day, year = (tmp_path / "shown").read_text().split("/")
    days = {(str(at.month), str(at.day), f"{at.year % 100:02}") for at in (before, after)}
    assert (month, day, year) in days
