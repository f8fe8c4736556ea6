"""coverage.py SOURCE BUILD COUNTS: which lines and branches of the rooms the tests have run through.

BUILD was compiled with --coverage; COUNTS is where its programs, started with GCOV_PREFIX=COUNTS, have left their counts. What is counted
is summed up over all translation units: a line of a header, or of a template, is covered when one of its copies is.

A branch is a way on from a decision of the source. The compiler makes others of its own, and they are not counted:

- A call that may throw goes on in two ways, and one of them leads to where the exception is caught or cleaned up after. gcov marks that one
  "throw", if the call was reached. It is no decision of the source, and so both are left out.
- What is only reached by an exception cleans up, and asks itself what there is to clean up. gcov marks such a block with "$$$$$", and a line
  that has nothing else with "=====".

gcov says this of blocks only in its format for people, which is why that one is read here.

A line that is not covered fails the check. So does a branch without a reason in uncovered_branches.txt, and a reason without its branch.
"""

import collections
import pathlib
import re
import subprocess
import sys

ROOMS = ("daemon", "acl", "service", "providers", "common")
# It connects the rooms with the platform and is in no program of unit tests.
ENTRY_POINTS = ("daemon/main.cpp",)
REASONS = pathlib.Path(__file__).with_name("uncovered_branches.txt")


def is_counted(path):
    return path.split("/")[0] in ROOMS and path not in ENTRY_POINTS


_SOURCE = re.compile(r" *-: *0:Source:(.*)")
_LINE = re.compile(r" *(-|#####|=====|\d+\*?): *(\d+):")
_BLOCK = re.compile(r" *(\$\$\$\$\$|%%%%%|\d+\*?): *\d+-block +\d+$")
_BRANCH = re.compile(r"branch +\d+ (?:taken (\d+)|never executed)(?: \(fallthrough\))?( \(throw\))?")


class Block:
    """Of a line: how often each branch of it was taken, and whether they are the compiler's own."""

    def __init__(self, is_own):
        self.counts, self.is_own = [], is_own

    def add(self, other):
        self.counts = [a + b for a, b in zip(self.counts, other.counts)]
        self.is_own |= other.is_own


class Line:
    """A line as one function has it: a template's lines are there once for each of its copies."""

    def __init__(self, path, number, count):
        self.path, self.number, self.count = path, number, count
        self.blocks = [Block(is_own=False)]


def read_report(text):
    """The lines that gcov speaks of."""
    path, line = None, None
    for row in text.splitlines():
        if source := _SOURCE.match(row):
            path = source[1]
        elif block := _BLOCK.match(row):
            if line:
                line.blocks.append(Block(is_own=block[1] == "$$$$$"))
        elif found := _LINE.match(row):
            if line:
                yield line
            line = None
            if found[1] not in ("-", "====="):
                line = Line(path, int(found[2]), 0 if found[1] == "#####" else int(found[1].rstrip("*")))
        elif (branch := _BRANCH.match(row)) and line:
            line.blocks[-1].counts.append(int(branch[1] or 0))
            line.blocks[-1].is_own |= branch[2] is not None
    if line:
        yield line


class Coverage:
    def __init__(self):
        self.lines = collections.defaultdict(int)  # (path, line): how often
        self.blocks = {}  # (path, line, number of branches of each block): the blocks

    def add(self, line):
        self.lines[line.path, line.number] += line.count
        known = self.blocks.setdefault((line.path, line.number, tuple(len(block.counts) for block in line.blocks)), line.blocks)
        if known is not line.blocks:
            for block, other in zip(known, line.blocks):
                block.add(other)

    def branches(self):
        """{(path, line): how often each was taken}"""
        branches = collections.defaultdict(list)
        for (path, line, _), blocks in self.blocks.items():
            for block in blocks:
                if block.counts and not block.is_own:
                    branches[path, line] += block.counts
        return branches


def lines_of_rooms(source, build, counts):
    """What gcov says about the files of the rooms, for each translation unit that has run."""
    for data in sorted(counts.rglob("*.gcda")):
        notes = pathlib.Path("/") / data.relative_to(counts).with_suffix(".gcno")
        if build not in notes.parents:
            continue
        # gcov wants both beside each other.
        beside = data.with_suffix(".gcno")
        if not beside.exists():
            beside.symlink_to(notes)
        report = subprocess.run(["gcov", "--stdout", "--all-blocks", "--branch-probabilities", "--branch-counts", "--relative-only",
                                 "--source-prefix", str(source), str(data)], capture_output=True, check=True, cwd=data.parent).stdout
        for line in read_report(report.decode()):
            if is_counted(line.path):
                yield line


def read_reasons(text):
    """{(path, source text of the line): (number of branches, reason)}: a line "PATH: SOURCE TEXT", and below it "  NUMBER: REASON"."""
    reasons, key = {}, None
    for number, line in enumerate(text.splitlines(), 1):
        if not line.strip() or line.startswith("#"):
            continue
        reason = re.fullmatch(r"  (\d+): (.+)", line)
        place = re.fullmatch(r"(\S+): (.+)", line)
        if reason and key:
            reasons[key] = (int(reason[1]), reason[2])
            key = None
        elif place and not key:
            key = (place[1], place[2])
            if key in reasons:
                raise ValueError(f"{REASONS.name}:{number}: there is a reason for this line already")
        else:
            raise ValueError(f"{REASONS.name}:{number}: neither a line of the source nor a reason")
    return reasons


def source_line(source, path, line):
    return (source / path).read_text().splitlines()[line - 1].strip()


def report(source, coverage, reasons):
    """Prints; the number of things that are wrong."""
    covered_lines = sum(1 for count in coverage.lines.values() if count)
    branches = coverage.branches()
    all_branches = sum(len(counts) for counts in branches.values())
    uncovered = {place: counts.count(0) for place, counts in branches.items() if 0 in counts}
    print(f"coverage lines {covered_lines} of {len(coverage.lines)}, branches {all_branches - sum(uncovered.values())} of {all_branches}")

    wrong = 0
    for (path, line), count in sorted(coverage.lines.items()):
        if not count:
            wrong += 1
            print(f"check: {path}:{line}: never run: {source_line(source, path, line)}")

    of_text = collections.defaultdict(list)
    for (path, line), missing in sorted(uncovered.items()):
        of_text[path, source_line(source, path, line)].append((line, missing))
    for key, places in of_text.items():
        path, text = key
        number, reason = reasons.get(key, (0, None))
        missing = sum(missing for _, missing in places)
        for line, _ in places:
            print(f"  {path}:{line}: {text}")
        if number == missing:
            print(f"    {missing} not taken: {reason}")
        else:
            wrong += 1
            print(f"check: {missing} branches are not taken there, and a reason stands for {number}")
    for path, text in reasons.keys() - of_text.keys():
        wrong += 1
        print(f"check: {REASONS.name} gives a reason for a branch that is taken, or is not there: {path}: {text}")
    print("  not counted: " + ", ".join(ENTRY_POINTS) + " (the entry point, in no unit test's program)")
    return wrong


def main(source, build, counts):
    source, build, counts = (pathlib.Path(path).resolve() for path in (source, build, counts))
    coverage, seen = Coverage(), set()
    for line in lines_of_rooms(source, build, counts):
        seen.add(line.path)
        coverage.add(line)
    wrong = 0
    for room in ROOMS:
        for path in sorted((source / room).glob("*.cpp")):
            name = str(path.relative_to(source))
            if is_counted(name) and name not in seen:
                wrong += 1
                print(f"check: {name}: in no program that has run")
    wrong += report(source, coverage, read_reasons(REASONS.read_text()))
    return 1 if wrong else 0


if __name__ == "__main__":
    sys.exit(main(*sys.argv[1:]))
