"""Runs test programs of GoogleTest, each test as a process of its own and within limits.

As a program: suites.py PROGRAM... runs every test of these programs, prints what failed, and at the end one line for each figure that tests
print of themselves. A figure that none prints is a failure too.
"""

import concurrent.futures
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile
import time

MEMORY_BYTES = 4 << 30
OUTPUT_BYTES = 64 << 20
KEPT_OUTPUT_BYTES = 1 << 20
SECONDS_OF_A_TEST = 900
SECONDS_OF_A_LISTING = 60
SECONDS_TO_END = 5

# What tests print, a line for each share of it, and the check sums up.
FIGURES = ("messages asserted {} of {}", "sequences tried {}")


class Outcome:
    def __init__(self, program, test, failure, output, seconds):
        self.program, self.test, self.output, self.seconds = program, test, output, seconds
        self.failure = failure  # a few words; None when the test passed

    @property
    def name(self):
        return f"{pathlib.Path(self.program).name} {self.test}"


def run_limited(command, seconds):
    """(failure or None, output): what runs away in time, memory or output is ended, and so is what it has started."""
    limits = ["prlimit", f"--as={MEMORY_BYTES}", f"--fsize={OUTPUT_BYTES}", "--core=0", f"--cpu={int(seconds) + 1}", "--"]
    with tempfile.TemporaryFile() as output:
        process = subprocess.Popen(limits + command, stdin=subprocess.DEVNULL, stdout=output, stderr=output, start_new_session=True)
        try:
            status = process.wait(seconds)
            failure = None if status == 0 else f"signal {-status}" if status < 0 else f"status {status}"
        except subprocess.TimeoutExpired:
            failure = f"still running after {seconds} s"
        finally:
            # Also when this program itself is being ended. A build ends its own children when it is asked to, and only then.
            for number in (signal.SIGTERM, signal.SIGKILL):
                try:
                    os.killpg(process.pid, number)
                    process.wait(SECONDS_TO_END)
                except (ProcessLookupError, subprocess.TimeoutExpired):
                    pass
            process.wait()
        output.seek(0)
        return failure, output.read(KEPT_OUTPUT_BYTES).decode(errors="replace")


def tests_of(program):
    failure, listing = run_limited([program, "--gtest_list_tests"], SECONDS_OF_A_LISTING)
    if failure:
        raise RuntimeError(f"{program} does not list its tests: {failure}\n{listing}")
    tests, suite = [], ""
    for line in listing.splitlines():
        name = line.split("#")[0].rstrip()
        if name.endswith(".") and not name.startswith(" "):
            suite = name
        elif name.startswith("  ") and suite:
            tests.append(suite + name.strip())
    if not tests:
        raise RuntimeError(f"{program} has no tests")
    return tests


def run_test(program, test, seconds):
    start = time.monotonic()
    failure, output = run_limited([program, f"--gtest_filter={test}"], seconds)
    if failure is None and "[  SKIPPED ]" in output:
        failure = "skipped"
    return Outcome(program, test, failure, output, time.monotonic() - start)


def run(programs_and_tests, seconds=SECONDS_OF_A_TEST, stop_at_first_failure=False):
    """The outcomes in the order in which they come; as many at once as there are processors."""
    with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
        futures = [pool.submit(run_test, program, test, seconds) for program, test in programs_and_tests]
        for future in concurrent.futures.as_completed(futures):
            outcome = future.result()
            yield outcome
            if outcome.failure and stop_at_first_failure:
                pool.shutdown(cancel_futures=True)
                return


class Figures:
    """The sums of what tests print of themselves."""

    def __init__(self):
        self.sums = {}

    def read(self, output):
        for figure in FIGURES:
            pattern = "^" + figure.replace("{}", r"(\d+)") + "$"
            for found in re.finditer(pattern, output, re.MULTILINE):
                numbers = [int(number) for number in found.groups()]
                self.sums[figure] = [a + b for a, b in zip(self.sums.get(figure, [0] * len(numbers)), numbers)]

    def lines(self):
        return [figure.format(*self.sums[figure]) for figure in FIGURES if figure in self.sums]

    def missing(self):
        return [figure for figure in FIGURES if figure not in self.sums]


def main(programs):
    figures = Figures()
    count = failures = 0
    for outcome in run([(program, test) for program in programs for test in tests_of(program)]):
        count += 1
        figures.read(outcome.output)
        if outcome.failure:
            failures += 1
            print(f"{outcome.output}\ncheck: {outcome.name}: {outcome.failure}")
    print(f"check: {count - failures} of {count} tests passed")
    for line in figures.lines():
        print(line)
    for figure in figures.missing():
        print(f"check: no test has printed a line like: {figure}")
    return 1 if failures or figures.missing() else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
