"""The unit tests under valgrind; the large program in halves that run side by side."""

import subprocess

import pytest

from memcheck import Memcheck


@pytest.mark.memory
@pytest.mark.parametrize("name, part, parts", [("unit_tests", 0, 2), ("unit_tests", 1, 2), ("wrapped_tests", 0, 1)])
def test_unit_tests(program, scratch, name, part, parts):
    memcheck = Memcheck(scratch)
    shard = {"GTEST_TOTAL_SHARDS": str(parts), "GTEST_SHARD_INDEX": str(part)}
    done = subprocess.run(
        [*memcheck.words, program.binary.parent / "tests" / name, "--gtest_brief=1"],
        env={"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", **shard},
        capture_output=True,
        timeout=600,
        check=False,
    )
    report = memcheck.report()
    assert (report.errors, report.lost, report.descriptors) == (0, 0, []), report.text
    assert memcheck.child_errors() == 0
    assert done.returncode == 0, done.stdout.decode(errors="replace")
