"""Changes the rooms in small ways, one at a time, and looks whether a unit test fails.

    mutate.py TREE BUILD [--count N] [--sample N [--seed TEXT]]

TREE is a copy of the sources, which is changed; BUILD belongs to this program alone, and its results.json is what is known from earlier
runs. Without --sample, N more mutants are tried in one fixed order, and the summary is of all that are known; with it, N at random, and the
summary is of these.

A mutant of a room is tried with the tests of that room and then with those of the rooms above it, and is killed by the first that fails,
crashes or does not end. One that does not compile does not count. A mutant that survives must stand in equivalent_mutants.txt with the
reason why no test can tell it from the original. A result holds as long as the file that was changed is the same; what survived is tried
again when the tests have changed.
"""

import argparse
import collections
import hashlib
import json
import os
import pathlib
import random
import re
import shutil
import signal
import sys
import time

HERE = pathlib.Path(__file__).resolve().parent
sys.path += [str(HERE), str(HERE.parent / "check")]

import mutations  # noqa: E402
import suites  # noqa: E402

ROOMS = ("common", "acl", "providers", "service", "daemon")  # bottom to top
NAMES_FROM = ("platform", *ROOMS)
ENTRY_POINTS = ("daemon/main.cpp",)
EQUIVALENT = "tests/mutate/equivalent_mutants.txt"
SECONDS_OF_A_BUILD = 1800
SECONDS_OF_A_TEST = 20
SLOWER_THAN_USUAL = 10  # times, by which a test may be before it is taken to hang

KILLED, SURVIVED, INVALID = "killed", "survived", "does not compile"


def read_equivalent(text):
    """{(path, kind, before, after): reason}, written as a survivor is printed, without its line number and with the reason below."""
    entries, place, before, after = {}, None, None, None
    for number, line in enumerate(text.splitlines(), 1):
        if not line.strip() or line.startswith("#"):
            continue
        heading = re.fullmatch(r"(\S+): (\w+)", line)
        if heading and place is None:
            place = heading.groups()
        elif line.startswith("- ") and place and before is None:
            before = line[2:]
        elif line.startswith("+ ") and before is not None and after is None:
            after = line[2:]
        elif line.startswith("  ") and after is not None:
            entries[(*place, before, after)] = line.strip()
            place = before = after = None
        else:
            raise ValueError(f"{EQUIVALENT}:{number}: not in its place")
    if place:
        raise ValueError(f"{EQUIVALENT}: the last entry has no reason")
    return entries


def all_mutants(tree):
    names = mutations.Names(path.read_text() for room in NAMES_FROM for path in sorted((tree / room).glob("*.[hc]*")))
    for room in ROOMS:
        for path in sorted((tree / room).glob("*.[hc]*")):
            name = str(path.relative_to(tree))
            if name not in ENTRY_POINTS and path.suffix in (".h", ".cpp"):
                yield from mutations.mutants_of(name, path.read_text(), names)


class Workshop:
    """The copy of the tree and its build."""

    def __init__(self, tree, build):
        self.tree, self.build = tree, build
        self.seconds = {}  # of each test, when nothing is changed

    def program(self, room):
        return str(self.build / "bin" / f"{room}_tests")

    def make(self, rooms):
        targets = [f"{room}_tests" for room in rooms]
        return suites.run_limited(["cmake", "--build", str(self.build), "--parallel", str(os.cpu_count()), "--target", *targets],
                                  SECONDS_OF_A_BUILD)

    def prepare(self):
        """Builds and runs everything unchanged: what fails then says nothing about a mutant."""
        launcher = ["-DCMAKE_CXX_COMPILER_LAUNCHER=ccache"] if shutil.which("ccache") else []
        failure, output = suites.run_limited(["cmake", "-S", str(self.tree), "-B", str(self.build), "--preset", "mutate", *launcher],
                                             SECONDS_OF_A_BUILD)
        if not failure:
            failure, output = self.make(ROOMS)
        if failure:
            raise RuntimeError(f"the tests could not be built: {failure}\n{output[-5000:]}")
        for room in ROOMS:
            tests = suites.tests_of(self.program(room))
            for outcome in suites.run([(self.program(room), test) for test in tests]):
                if outcome.failure:
                    raise RuntimeError(f"{outcome.name} fails without any change: {outcome.failure}\n{outcome.output}")
                self.seconds[room, outcome.test] = outcome.seconds

    def tests_of(self, room, path):
        """Those first that are named after the changed file: they are the likeliest to fail."""
        stem = pathlib.Path(path).stem.lstrip("_").split("_")[0]
        tests = [test for known, test in self.seconds if known == room]
        return sorted(tests, key=lambda test: (not test.startswith(stem), test))

    def try_mutant(self, mutant):
        """(result, what it was killed by)"""
        file = self.tree / mutant.path
        original = file.read_text()
        file.write_text(mutant.applied_to(original))
        try:
            return self._try_rooms(mutant.path)
        finally:
            file.write_text(original)

    def _try_rooms(self, path):
        for room in ROOMS[ROOMS.index(path.split("/")[0]):]:
            failure, output = self.make([room])
            if failure:
                return INVALID, None
            program = self.program(room)
            tests = self.tests_of(room, path)
            slowest = max(self.seconds[room, test] for test in tests)
            seconds = max(SECONDS_OF_A_TEST, SLOWER_THAN_USUAL * slowest)
            for outcome in suites.run([(program, test) for test in tests], seconds, stop_at_first_failure=True):
                if outcome.failure:
                    return KILLED, f"{outcome.name}: {outcome.failure}"
        return SURVIVED, None


class Results:
    """What is known, in a file that is written after each result."""

    def __init__(self, path, tests):
        self.path, self.tests = path, tests
        self.known = json.loads(path.read_text()) if path.exists() else {}

    def of(self, key):
        entry = self.known.get(key)
        if entry is None or (entry["result"] == SURVIVED and entry["tests"] != self.tests):
            return None
        return entry["result"]

    def record(self, key, result, killer):
        self.known[key] = {"result": result, "by": killer, "tests": self.tests}
        written = self.path.with_suffix(".new")
        written.write_text(json.dumps(self.known, indent=1))
        os.replace(written, self.path)


def digest_of_tests(tree):
    digest = hashlib.sha256()
    for directory in (*(tree / "tests" / room for room in ROOMS), tree / "tests" / "support", tree / "platform" / "fake"):
        for path in sorted(directory.rglob("*")):
            if path.is_file():
                digest.update(f"{path.relative_to(tree)}\0".encode() + path.read_bytes())
    return digest.hexdigest()


class Report:
    def __init__(self, equivalent):
        self.equivalent = equivalent
        self.results = collections.defaultdict(list)  # identity: results
        self.counts = collections.Counter()
        self.unsettled = 0

    def add(self, mutant, result):
        if result == INVALID:
            return
        self.results[mutant.identity].append(result)
        self.counts["tried"] += 1
        if result == KILLED:
            self.counts["killed"] += 1
        elif mutant.identity in self.equivalent:
            self.counts["equivalent"] += 1
        else:
            self.unsettled += 1
            print(f"survived: {mutant}", flush=True)

    def finish(self, mutants):
        """The summary, and whether all is well."""
        wrong = self.unsettled
        for identity in self.equivalent.keys() - {mutant.identity for mutant in mutants}:
            wrong += 1
            print(f"mutate: {EQUIVALENT} names a mutant that there is not: {identity[0]}: {identity[1]}\n+ {identity[3]}")
        for identity in self.equivalent.keys() & self.results.keys():
            if SURVIVED not in self.results[identity]:
                wrong += 1
                print(f"mutate: {EQUIVALENT} names a mutant that a test kills: {identity[0]}: {identity[1]}\n+ {identity[3]}")
        print("mutants tried {tried}, killed {killed}, equivalent {equivalent}".format_map(
            {name: self.counts[name] for name in ("tried", "killed", "equivalent")}))
        return wrong == 0


def try_more(workshop, mutants, results, report, texts, count):
    """In the fixed order; what is known already is only reported."""
    for mutant in mutants:
        key = mutant.key(texts[mutant.path])
        result = results.of(key)
        if result is None:
            if count is not None and count <= 0:
                continue
            result = tried(workshop, mutant, results, key)
            if count is not None and result != INVALID:
                count -= 1
        report.add(mutant, result)


def try_sample(workshop, mutants, results, report, texts, count):
    for mutant in mutants:
        if report.counts["tried"] == count:
            break
        report.add(mutant, tried(workshop, mutant, results, mutant.key(texts[mutant.path])))


def tried(workshop, mutant, results, key):
    start = time.monotonic()
    result, killer = workshop.try_mutant(mutant)
    results.record(key, result, killer)
    print(f"{result} in {time.monotonic() - start:.0f} s: {mutant.path}:{mutant.line}: {mutant.kind}"
          + (f" (by {killer})" if killer else ""), flush=True)
    return result


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("tree", type=pathlib.Path)
    parser.add_argument("build", type=pathlib.Path)
    parser.add_argument("--count", type=int)
    parser.add_argument("--sample", type=int)
    parser.add_argument("--seed")
    arguments = parser.parse_args()
    tree, build = arguments.tree.resolve(), arguments.build.resolve()

    equivalent = read_equivalent((tree / EQUIVALENT).read_text())
    mutants = list(all_mutants(tree))
    texts = {path: (tree / path).read_text() for path in {mutant.path for mutant in mutants}}
    workshop = Workshop(tree, build)
    print(f"mutate: {len(mutants)} mutants; building and running the tests without any", flush=True)
    workshop.prepare()
    results = Results(build / "results.json", digest_of_tests(tree))
    report = Report(equivalent)
    if arguments.sample is None:
        try_more(workshop, mutations.shuffled(mutants), results, report, texts, arguments.count)
    else:
        seed = arguments.seed or str(random.SystemRandom().randrange(1_000_000))
        print(f"mutate: {arguments.sample} at random, seed {seed}", flush=True)
        try_sample(workshop, mutations.shuffled(mutants, seed), results, report, texts, arguments.sample)
    return 0 if report.finish(mutants) else 1


if __name__ == "__main__":
    # What is being tried is put back, and what was started is ended, before this program ends.
    for number in (signal.SIGINT, signal.SIGTERM):
        signal.signal(number, lambda *_: sys.exit("mutate: stopped; what is known so far is kept"))
    try:
        sys.exit(main())
    except (RuntimeError, ValueError) as error:
        sys.exit(f"mutate: {error}")
