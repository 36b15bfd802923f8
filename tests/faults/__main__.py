"""Prints how many faults and kills there are: cd tests && /usr/bin/python3 -m faults"""

from support import Program

from .kills import EXAMPLES, kills_of
from .run import Bench
from .scenario import SCENARIOS


def main():
    program = Program()
    faults = kills = 0
    for name in SCENARIOS:
        bench = Bench(program, name)
        calls = {(injection.call, injection.ordinal) for injection in bench.injections if injection.mode == "once"}
        killed = len(kills_of(bench)) if name != "failure" else 0
        print(f"{name}: {len(calls)} calls that can fail, {len(bench.injections)} injections, {killed} kills")
        faults, kills = faults + len(bench.injections), kills + killed
        bench.close()
    print(f"in all: {faults} injections, {kills} kills, {len(EXAMPLES)} states")


if __name__ == "__main__":
    main()
