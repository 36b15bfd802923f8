"""Runs all checks of the project, two at a time, and sums up what they found.

scripts/check                    everything that CI runs
scripts/check --quick            no sanitizers, no second compiler, no target, no packages, no fault injection
scripts/check --only A,B         these stages and what they need (--list names them)
scripts/check --coverage         line and branch coverage of src/ over units and cases
scripts/check --target ppc64le   units and cases on the target's binary, under emulation (also: ppc64, units only)
scripts/check --packages         packages, reproducible builds, installation into an empty root
scripts/check --faults           every fault and every kill in place of a rotating sample
scripts/check --fuzz SECONDS     each fuzzer for so long
scripts/check --mutate N         N mutants of src/ against the suite

ORVPATCH_NO_SANITIZE=1 leaves the sanitized run out. The output of each stage is kept under build/check/.
"""

import argparse
import concurrent.futures
import os
import shlex
import shutil
import subprocess
import sys
import threading
import time
import xml.etree.ElementTree as ElementTree
from pathlib import Path

ROOT = Path(__file__).resolve().parents[1]
RESULTS = ROOT / "build/check"
PYTEST = ["/usr/bin/python3", "-m", "pytest", "-q", "-c", "tests/pytest.ini", "--rootdir", "tests"]


class Stage:
    """A few commands in a row. With `tests` it counts what its report files say, without it it counts as one."""

    def __init__(self, name, commands, needs=(), env=None, tests=False):
        self.name, self.commands, self.needs = name, commands, list(needs)
        self.env, self.tests = env or {}, tests
        self.passed = self.failed = self.skipped = 0
        self.seconds = 0.0

    @property
    def reports(self):
        return sorted(RESULTS.glob(f"{self.name}.*.xml"))

    @property
    def log(self):
        return RESULTS / f"{self.name}.log"

    def run(self):
        start = time.monotonic()
        for report in self.reports:
            report.unlink()
        with self.log.open("w") as log:
            good = all(self._succeeds(command, log) for command in self.commands)
        self._count(good)
        self.seconds = time.monotonic() - start

    def _succeeds(self, command, log):
        log.write("$ " + " ".join(map(str, command)) + "\n")
        log.flush()
        return subprocess.run(command, cwd=ROOT, env={**os.environ, **self.env}, stdout=log, stderr=log,
                              stdin=subprocess.DEVNULL, check=False).returncode == 0

    def _count(self, good):
        for report in self.reports if self.tests else ():
            for suite in ElementTree.parse(report).getroot().iter("testsuite"):
                bad = int(suite.get("failures", 0)) + int(suite.get("errors", 0))
                skipped = int(suite.get("skipped", 0))
                self.failed += bad
                self.skipped += skipped
                self.passed += int(suite.get("tests", 0)) - bad - skipped
        if self.tests and self.passed == 0:
            good = False  # a stage that ran no test has not shown anything
        if not self.tests and good:
            self.passed = 1
        if not good and self.failed == 0:
            self.failed = 1


def build(preset, targets=()):
    wanted = ["--target", *targets] if targets else []
    return Stage(f"build-{preset}", [["cmake", "--preset", preset],
                                     ["cmake", "--build", "--preset", preset, *wanted]])


def units(preset, program="unit_tests", env=None, runner=()):
    report = RESULTS / f"{program}-{preset}.1.xml"
    return Stage(f"{program}-{preset}", [[*runner, f"build/{preset}/tests/{program}", "--gtest_brief=1",
                                          f"--gtest_output=xml:{report}"]],
                 [f"build-{preset}"], env, tests=True)


def units_as_ordinary_user(preset):
    """What permissions forbid does not bind root: as root, the unit tests run once more as nobody."""
    name = f"units-as-nobody-{preset}"
    report = RESULTS / f"{name}.1.xml"
    script = ("folder=$(mktemp -d) && chmod 755 $folder && install -m 755 $0/unit_tests $folder && "
              "mkdir -m 777 $folder/scratch && cd / && status=0 && "
              "TMPDIR=$folder/scratch setpriv --reuid=65534 --regid=65534 --clear-groups $folder/unit_tests "
              "--gtest_brief=1 --gtest_output=xml:$folder/scratch/report.xml || status=$?; "
              "cp $folder/scratch/report.xml $1 && rm -rf $folder && exit $status")
    return Stage(name, [["bash", "-c", script, f"{ROOT}/build/{preset}/tests", report]], [f"build-{preset}"],
                 tests=True)


def cases(name, paths, preset="dev", env=None, options=(), jobs=2):
    report = RESULTS / f"{name}.1.xml"
    present = [path for path in paths if (ROOT / path).exists()]
    command = [*PYTEST, "-n", str(jobs), f"--junitxml={report}", *options, *present]
    program = {"ORVPATCH": str(ROOT / f"build/{preset}/orvpatch")}
    return Stage(name, [command], [f"build-{preset}"], {**program, **(env or {})}, tests=True)


def checked_sources(*suffixes):
    """A source archive is not under version control: there all files count but those that a build makes."""
    if (ROOT / ".git").exists():
        listed = subprocess.run(["git", "ls-files", *[f"*{suffix}" for suffix in suffixes]], cwd=ROOT,
                                capture_output=True, text=True, check=True).stdout.splitlines()
    else:
        found = [str(path.relative_to(ROOT)) for suffix in suffixes for path in sorted(ROOT.rglob(f"*{suffix}"))]
        listed = [name for name in found if not name.startswith(("build/", "dist/"))]
    return [path for path in listed if not path.startswith("tests/fuzz/corpus/")]


def static_stages():
    sources = [path for path in checked_sources(".cpp") if path.startswith("src/")]
    tidy = f"printf '%s\\n' {' '.join(sources)} | xargs -P2 -n2 clang-tidy -p build/dev --quiet"
    return [
        Stage("format", [["clang-format", "--dry-run", "--Werror", *checked_sources(".cpp", ".h", ".c")]]),
        Stage("tidy", [["bash", "-c", tidy]], ["build-dev"]),
        cases("house", ["tests/house", "tests/support", "tests/man", "tests/completions"]),
    ]


PROGRAM_TESTS = ["tests/cases", "tests/hostile", "tests/fuzz"]
SANITIZED = {"ASAN_OPTIONS": "abort_on_error=1", "UBSAN_OPTIONS": "print_stacktrace=1:abort_on_error=1"}
# The target's programs run with the C library that they are built with, glibc 2.31; the comparison with the native
# program has them run with the newest one.
OLD_LIBRARIES = f"{ROOT}/build/sysroot/ppc64le/usr/powerpc64le-linux-gnu"
NEW_LIBRARIES = "/usr/powerpc64le-linux-gnu"


def emulated(libraries):
    return {"ORVPATCH_RUNNER": shlex.join(["/usr/bin/qemu-ppc64le", "-L", libraries])}


def native_stages():
    as_nobody = [units_as_ordinary_user("dev")] if os.geteuid() == 0 else []
    return [build("dev"), build("release"), *static_stages(), units("dev"), units("dev", "wrapped_tests"),
            *as_nobody, cases("cases", PROGRAM_TESTS), Stage("demo", [["scripts/demo"]], ["build-release"])]


def sanitized_stages():
    if os.environ.get("ORVPATCH_NO_SANITIZE"):
        return []
    return [build("sanitize"), units("sanitize", env=SANITIZED),
            units("sanitize", "wrapped_tests", env=SANITIZED),
            cases("cases-sanitize", PROGRAM_TESTS, "sanitize", SANITIZED)]


def target_stages(target):
    libraries = OLD_LIBRARIES if target == "ppc64le" else "/usr/powerpc64-linux-gnu"
    runner = [f"qemu-{target}", "-L", libraries]
    stages = [build(target), units(target, runner=runner), units(target, "wrapped_tests", runner=runner)]
    if target == "ppc64le":
        both = {"ORVPATCH_NATIVE": str(ROOT / "build/release/orvpatch"),
                "ORVPATCH_TARGET": str(ROOT / "build/ppc64le/orvpatch")}
        same = cases("same-as-native", ["tests/target"], "ppc64le", {**emulated(NEW_LIBRARIES), **both})
        same.needs.append("build-release")
        stages += [build("release"), cases("cases-ppc64le", ["tests/cases"], "ppc64le", emulated(OLD_LIBRARIES)), same]
    return stages


def hard_stages(everything):
    env = {"ORVPATCH_FAULTS": "all"} if everything else {}
    return [build("dev"), cases("faults", ["tests/faults"], env=env), cases("memory", ["tests/memory"])]


def fuzz_stages(seconds):
    return [build("fuzz"), Stage("fuzz", [["tests/fuzz/run", str(seconds)]], ["build-fuzz"])]


def package_stages():
    packages = cases("packages", ["tests/packaging", "tests/bench"], "release", jobs=1)
    return [build("release"), packages]


def chosen_stages(options):
    stages = []
    if options.target:
        stages += target_stages(options.target)
    if options.packages:
        stages += package_stages()
    if options.faults:
        stages += hard_stages(True)
    if options.fuzz:
        stages += fuzz_stages(options.fuzz)
    if options.coverage:
        stages.append(Stage("coverage", [["tests/coverage/run"]]))
    if options.mutate:
        stages.append(Stage("mutate", [["tests/mutate/run", str(options.mutate)]]))
    if options.quick or not stages:
        stages += native_stages()
    if not options.quick and not any(vars(options).values()) or options.only:
        # The sanitized build is clang's: it is also the one that holds everything to clang's warnings.
        stages += [*(sanitized_stages() or [build("clang")]), *target_stages("ppc64le"), *hard_stages(False),
                   *fuzz_stages(5), *package_stages()]
    first = {}
    for stage in stages:
        first.setdefault(stage.name, stage)
    return list(first.values())


def with_needs(names, stages):
    by_name = {stage.name: stage for stage in stages}
    unknown = [name for name in names if name not in by_name]
    if unknown:
        sys.exit(f"no such stage: {', '.join(unknown)}")
    wanted = set()

    def want(name):
        if name not in wanted:
            wanted.add(name)
            for need in by_name[name].needs:
                want(need)

    for name in names:
        want(name)
    return [stage for stage in stages if stage.name in wanted]


class Runner:
    """Runs stages two at a time, each after the stages that it needs; what needs a failed stage fails with it."""

    def __init__(self, stages):
        self.stages = {stage.name: stage for stage in stages}
        self.done = {}
        self.lock = threading.Condition()

    def run(self):
        with concurrent.futures.ThreadPoolExecutor(2) as pool:
            list(pool.map(self._run_next, self.stages))

    def _run_next(self, _):
        with self.lock:
            stage = self._claim()
            while stage is None:
                self.lock.wait()
                stage = self._claim()
        if all(self.done[need] for need in stage.needs if need in self.stages):
            stage.run()
        else:
            stage.failed = 1
            stage.log.write_text("a stage that this one needs has failed\n")
        with self.lock:
            self.done[stage.name] = stage.failed == 0
            report(stage)
            self.lock.notify_all()

    def _claim(self):
        for name, stage in self.stages.items():
            if name not in self.done and all(self.done.get(need) is not None for need in stage.needs
                                             if need in self.stages):
                self.done[name] = None
                return stage
        return None


def report(stage):
    verdict = "ok" if stage.failed == 0 else "FAILED"
    skipped = f", {stage.skipped} skipped" if stage.skipped else ""
    print(f"{verdict:6} {stage.name:24} {stage.passed} passed, {stage.failed} failed{skipped}"
          f"  ({stage.seconds:.0f} s)", flush=True)
    if stage.failed:
        print("\n".join(stage.log.read_text(errors="replace").splitlines()[-60:]), flush=True)
    elif stage.skipped:
        reasons = [line for line in stage.log.read_text(errors="replace").splitlines() if "SKIPPED" in line]
        print("\n".join(reasons), flush=True)


def parse_options():
    parser = argparse.ArgumentParser(usage=__doc__)
    parser.add_argument("--quick", action="store_true")
    parser.add_argument("--only")
    parser.add_argument("--list", action="store_true")
    parser.add_argument("--coverage", action="store_true")
    parser.add_argument("--target", choices=["ppc64le", "ppc64"])
    parser.add_argument("--packages", action="store_true")
    parser.add_argument("--faults", action="store_true")
    parser.add_argument("--fuzz", type=int)
    parser.add_argument("--mutate", type=int)
    return parser.parse_args()


def main():
    options = parse_options()
    listed, options.list = options.list, False
    stages = chosen_stages(options)
    if options.only:
        stages = with_needs(options.only.split(","), stages)
    if listed:
        print("\n".join(stage.name for stage in stages))
        return 0
    shutil.rmtree(RESULTS, ignore_errors=True)
    RESULTS.mkdir(parents=True)
    start = time.monotonic()
    Runner(stages).run()
    passed, failed = sum(stage.passed for stage in stages), sum(stage.failed for stage in stages)
    print(f"all in {time.monotonic() - start:.0f} s")
    print(f"{passed} passed, {failed} failed")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
