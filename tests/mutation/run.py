#!/usr/bin/python3
"""Runs the tests against each mutant, and compares the survivors with the list of those that may survive.

usage: run.py BUILD MUTANTS SURVIVORS [-j JOBS] [-k PATTERN] [-n N]
BUILD is the build of the mutated sources, MUTANTS the list that instrument.py wrote. SURVIVORS explains the mutants
that no test can tell from the original, or none is meant to: lines with their names, in which "..." stands for any
text, and behind each group of them an indented reason. -k leaves all mutants alone whose names do not contain
PATTERN. -n takes one in N of the others, drawn at random from the seed VEMO_TEST_SEED.

A test is one of GoogleTest, one case of bats or one class of Python. A first run of each notes which mutants make a
difference where it passes; only these can it notice. So against each mutant run only the tests that reach it, until one
fails: those first that killed mutants of the same function, then the quickest.

A mutant is killed when a test fails, crashes, or takes ten times as long as it should and ten seconds more.
"""

import argparse
import collections
import concurrent.futures
import json
import os
import pathlib
import random
import re
import resource
import signal
import subprocess
import sys
import tempfile
import time

DEMAND = 95  # of 100 mutants are killed
QUICK = 0.2  # seconds that a test may take to be run on explained mutants too
LONGEST = 60  # seconds that a test may take at all
MEMORY = 4 << 30  # bytes that a test may take, so that an endless loop does not take all


def kill_all_in(place):
    """Kills the processes that a test has left behind: the place is in their environment."""
    for process in pathlib.Path("/proc").glob("[0-9]*"):
        try:
            if f"TMPDIR={place}".encode() in (process / "environ").read_bytes().split(b"\0"):
                os.kill(int(process.name), signal.SIGKILL)
        except OSError:
            pass  # it has ended, or is another user's


class Test:
    def __init__(self, entry, name, command):
        properties = {each["name"]: each["value"] for each in entry.get("properties", [])}
        self.name = name
        self.command = command
        self.directory = properties["WORKING_DIRECTORY"]
        self.settings = dict(each.split("=", 1) for each in properties.get("ENVIRONMENT", []))
        # What needs the machine for itself cannot run beside others; a case of bats has it in a namespace of its own.
        self.is_usable = "RESOURCE_LOCK" not in properties or os.path.basename(command[0]) == "bats"
        self.seconds = 0.0
        self.reached = b""

    def passes(self, limit, **settings):
        """Runs it in its own directory, for the files that it may leave behind when it is killed."""
        with tempfile.TemporaryDirectory(ignore_cleanup_errors=True) as place:
            os.chmod(place, 0o755)  # some tests become another user
            environment = {**os.environ, **self.settings, **settings, "TMPDIR": place}
            process = subprocess.Popen(self.command, cwd=self.directory, env=environment, start_new_session=True,
                                       stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                                       stderr=subprocess.DEVNULL)
            try:
                passed = process.wait(limit) == 0
            except subprocess.TimeoutExpired:
                passed = False
            if not passed:
                kill_all_in(place)
                process.wait()
            return passed

    def profile(self, n_mutants):
        """Notes the time it takes, and the mutants that make a difference where it passes."""
        with tempfile.NamedTemporaryFile() as file:
            file.truncate(n_mutants)
            os.chmod(file.name, 0o666)  # the same
            start = time.monotonic()
            self.is_usable = self.passes(LONGEST, VEMO_MUTANTS_REACHED=file.name)
            self.seconds = time.monotonic() - start
            self.reached = file.read()

    def kills(self, mutant):
        return not self.passes(10 * self.seconds + 10, VEMO_MUTANT=str(mutant))


def all_tests(build):
    listing = subprocess.run(["ctest", "--show-only=json-v1"], cwd=build, check=True, stdout=subprocess.PIPE)
    for entry in json.loads(listing.stdout)["tests"]:
        command = entry.get("command", [])
        if any(argument.startswith("--gtest_filter=") for argument in command):
            yield Test(entry, entry["name"], command)
        elif command and os.path.basename(command[0]) == "bats":
            for case in re.findall('^@test "(.*)" {$', pathlib.Path(command[1]).read_text("utf-8"), re.MULTILINE):
                pattern = re.sub(r"([][\\.^$*+?(){}|])", r"\\\1", case)
                yield Test(entry, f"{entry['name']}: {case}", [command[0], "-f", f"^{pattern}$", command[1]])
        elif command and command[0].endswith(".py"):
            yield Test(entry, entry["name"], command)


def profile(build, n_mutants, pool):
    tests = list(all_tests(build))
    usable = [test for test in tests if test.is_usable]
    list(pool.map(lambda test: test.profile(n_mutants), usable))
    for test in tests:
        if not test.is_usable:
            print(f"not used, since it fails here, takes too long or needs the machine for itself: {test.name}")
    usable = [test for test in usable if test.is_usable]
    print(f"{len(usable)} tests, {sum(test.seconds for test in usable):.0f} s")
    return sorted(usable, key=lambda test: test.seconds)


def killer(mutant, name, tests, explained, killers):
    """The test that kills the mutant, or None. Those that take long are not spent on what is explained.

    killers: the tests that killed mutants before, by their functions."""
    function = killers[name.split(": ")[0]]
    for test in sorted(tests, key=lambda test: -function[test]):
        if test.reached[mutant] and (test.seconds < QUICK or name not in explained) and test.kills(mutant):
            function[test] += 1
            return test.name
    if name not in explained:
        print(f"survives: {name}", flush=True)
    return None


def read_survivors(path, names):
    """The mutants that each line explains. A reason explains the lines above it, up to the reason before."""
    explained, waiting = {}, []
    for line in path.read_text(encoding="ascii").splitlines():
        if line.startswith(" "):
            waiting = []
        elif line and not line.startswith("#"):
            waiting.append(line)
            pattern = re.compile(".*".join(re.escape(part) for part in line.split("...")))
            explained[line] = {name for name in names if pattern.fullmatch(name)}
            if not explained[line]:
                print(f"explained, but no mutant: {line}")
    for line in waiting:
        print(f"without a reason: {line}")
    return explained


def report(killers, lines):
    """killers: the test that killed a mutant, or None, by the mutant's name. lines: what explains which mutants."""
    for line, mutants in lines.items():
        if mutants & killers.keys() and all(killers[name] for name in mutants & killers.keys()):
            print(f"explained, but killed: {line}")
    explained = set().union(*lines.values())
    good = True
    for part in sorted({name.split("/")[0] for name in killers}):
        names = [name for name in killers if name.startswith(part + "/")]
        survivors = {name for name in names if not killers[name]}
        n_killed = len(names) - len(survivors)
        n_unexplained = len(survivors - explained)
        share = 100 * n_killed / len(names)
        print(f"{part}: mutants {len(names)}, killed {n_killed} ({share:.1f} %), survivors {len(survivors)}, "
              + (f"{n_unexplained} not explained" if n_unexplained else "all explained"))
        good = good and share >= DEMAND and n_unexplained == 0
    return good


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("build")
    parser.add_argument("mutants", type=pathlib.Path)
    parser.add_argument("survivors", type=pathlib.Path)
    parser.add_argument("-j", type=int, default=2)
    parser.add_argument("-k", default="")
    parser.add_argument("-n", type=int, default=1)
    arguments = parser.parse_args()

    resource.setrlimit(resource.RLIMIT_AS, (MEMORY, MEMORY))
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
    names = arguments.mutants.read_text(encoding="ascii").splitlines()
    chosen = [(mutant, name) for mutant, name in enumerate(names) if arguments.k in name]
    if not chosen:
        sys.exit("no such mutant")
    if arguments.n > 1:
        seed = os.environ.get("VEMO_TEST_SEED") or str(random.randrange(1 << 32))
        chosen = random.Random(seed).sample(chosen, -(-len(chosen) // arguments.n))
        print(f"{len(chosen)} of them, VEMO_TEST_SEED={seed}")
    lines = read_survivors(arguments.survivors, names)
    explained = set().union(*lines.values())
    killers = collections.defaultdict(collections.Counter)
    with concurrent.futures.ThreadPoolExecutor(arguments.j) as pool:
        tests = profile(arguments.build, len(names), pool)
        results = dict(pool.map(lambda each: (each[1], killer(*each, tests, explained, killers)), chosen))
    sys.exit(0 if report(results, lines) else 1)


main()
