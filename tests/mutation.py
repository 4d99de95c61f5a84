#!/usr/bin/env python3
"""Makes small faults in the product, one at a time, and looks whether the tests notice.

The faults are the usual slips: a bound off by one, a comparison or sum turned round, a condition or a step forgotten,
a constant changed. Lines are drawn from the whole product, and for each a slip that can stand there; one that does not
compile is drawn anew. They are made in a copy of the tracked files, built without optimization. The tests are those of
ctest, the quick ones first, until one fails twice. Nine of ten faults must be noticed; some change nothing to be seen.

--record writes down which test noticed each fault. --replay makes those again that a test had noticed: one still must.
"""

import argparse
import ctypes
import json
import os
import pathlib
import random
import re
import shutil
import signal
import subprocess
import sys

TOP = pathlib.Path(__file__).parent.parent
PRODUCT = ["common", "platform", "tarvelctl", "lab", "completions"]
OPERATORS = [(re.compile(pattern), replacement) for pattern, replacement in [
    (r" < ", " <= "), (r" <= ", " < "), (r" > ", " >= "), (r" >= ", " > "), (r" == ", " != "), (r" != ", " == "),
    (r" \+ ", " - "), (r" - ", " + "), (r" \* ", " / "), (r" / ", " * "), (r" % ", " / "), (r" \+= ", " -= "),
    (r" && ", " || "), (r" \|\| ", " && "), (r" & ", " | "), (r" \| ", " & "), (r" << ", " >> "), (r" >> ", " << "),
    (r"\(!", "("), (r"\btrue\b", "false"), (r"\bfalse\b", "true"), (r"std::min\b", "std::max"),
    (r"std::max\b", "std::min"), (r"\bcontinue;", "break;"), (r"\bbreak;", "continue;"),
    (r"(?<![\w.\"'\\])(\d+|0x[0-9a-f]+)(?![\w.\"'])", r"(\1 + 1)"),
    (r"\bif \(.*\) (?=\S.*;$)", ""), (r"^(\s+)if \(.*\) (return|continue|break)\b.*;$", r"\1;"),
    (r"^(\s+)([\w.:>-]+\(.*\)|(\+\+|--)[\w.>-]+|[\w.:>\[\]-]+ [-+|&]?= .*);$", r"\1;"),
]]
# What nobody meets who runs the programs: comments, inclusions, what the compiler checks, hints, sizes of buffers.
LEFT_OUT = re.compile(r"^\s*(//|#|static_assert|char \w+\[)|prefetch|reserve\(")

# Tests of these names are asked first about a fault in the folder; the names of the others do not matter.
FIRST = {"lab": "lab", "completions": "completions"}
VERDICT = re.compile(r"Test +#(\d+): (\S+) \.* *(\S.*?) +([\d.]+) sec")


def places():
    """For each line where faults can be made all of them: the NTH line of FILE that is BEFORE becomes AFTER."""
    for path in sorted(path for folder in PRODUCT for path in (TOP / folder).rglob("*.[ch]*")):
        lines = path.read_text().splitlines()
        for number, line in enumerate(lines):
            code = line.split("  //")[0]
            faults = [{"file": str(path.relative_to(TOP)), "nth": lines[:number].count(line), "before": line,
                       "after": code[:found.start()] + found.expand(replacement) + code[found.end():]}
                      for operator, replacement in OPERATORS for found in operator.finditer(code)]
            if faults and not LEFT_OUT.search(code):
                yield faults


def run(log, *words, seconds=1200):
    """Whether a command succeeds within bounds that only a fault meets. Nothing that it started is left behind."""
    with open(log, "w") as file:
        words = ["prlimit", "--as=8000000000", "timeout", str(seconds), *words]
        status = subprocess.call(words, stdout=file, stderr=file)
    while left := pathlib.Path(f"/proc/self/task/{os.getpid()}/children").read_text().split():
        for child in map(int, left):
            os.kill(child, signal.SIGKILL)
            os.waitpid(child, 0)
    return status == 0


def run_tests(copy, *options, seconds=1200):
    """What the tests said, as (number, name, verdict, seconds), and one that failed in the end."""
    log = copy / "tests.log"
    passed = run(log, "ctest", "--test-dir", copy / "build", f"-j{os.cpu_count()}", *options, seconds=seconds)
    verdicts = VERDICT.findall(log.read_text(errors="replace"))
    failed = [f"{name} ({verdict})" for _, name, verdict, _ in verdicts if verdict not in ("Passed", "***Skipped")]
    return verdicts, None if passed else ["ctest", *failed][-1]


def groups(healthy, folder):
    """The tests to ask, half a dozen at a time: their numbers as ctest takes them, and the seconds that they get."""
    tests = sorted((not re.search(FIRST.get(folder, ""), name), float(seconds), number)
                   for number, name, _, seconds in healthy)
    for i in range(0, len(tests), 6):
        _, seconds, numbers = zip(*tests[i:i + 6])
        yield ",".join(["0,0,0", *numbers]), 30 + 4 * sum(seconds)


def noticed_by(copy, healthy, fault):
    """The test that notices a fault, None if there is none, False if the fault cannot be made."""
    path, make = copy / fault["file"], (copy / "build.log", "cmake", "--build", copy / "build")
    original = path.read_text()
    lines = original.split("\n")
    same = [number for number, line in enumerate(lines) if line == fault["before"]]
    if fault["nth"] >= len(same):
        return False
    lines[same[fault["nth"]]] = fault["after"]
    path.write_text("\n".join(lines))
    test = False
    if run(*make, "--target", "tarvelctl", "tarvellab", "generate_completions"):
        failures = (run_tests(copy, "--stop-on-failure", "--repeat", "until-pass:2", "-I", group, seconds=seconds)[1]
                    for group, seconds in groups(healthy, fault["file"].split("/")[0]))
        test = next(filter(None, failures), None) if run(*make) else "the build"
    path.write_text(original)
    return test


def make_copy(copy):
    """Copies and builds the tracked files. What each test says of the healthy programs."""
    refill = 'rm -rf "$0" && mkdir -p "$0" && git ls-files -z | xargs -0 cp --parents -t "$0"'
    subprocess.check_call(["sh", "-c", refill, copy], cwd=TOP)
    subprocess.check_call(["cmake", "-S", copy, "-B", copy / "build", "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Debug",
                           f"-DCMAKE_CXX_COMPILER_LAUNCHER={shutil.which('ccache') or ''}",
                           "-DTARVELCTL_BENCH=OFF", "-DCMAKE_UNITY_BUILD=ON",
                           "-DCMAKE_CXX_FLAGS_DEBUG=-O0"], stdout=subprocess.DEVNULL)
    subprocess.check_call(["cmake", "--build", copy / "build"], stdout=subprocess.DEVNULL)
    healthy, failed = run_tests(copy)
    if failed:
        sys.exit(f"a test fails without any fault, see {copy}/tests.log: {failed}")
    return healthy


def main():
    commit = subprocess.check_output(["git", "rev-parse", "HEAD"], cwd=TOP, text=True).strip()
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("copy", help="folder for the copy", type=lambda name: pathlib.Path(name).resolve())
    parser.add_argument("--count", type=int, default=100, help="of faults that are drawn")
    parser.add_argument("--seed", type=int, default=int(commit[:8], 16), help="by default taken from the commit")
    parser.add_argument("--record", type=pathlib.Path, default=os.devnull)
    parser.add_argument("--replay", type=lambda name: json.loads(pathlib.Path(name).read_text())["faults"])
    options = parser.parse_args()
    ctypes.CDLL(None).prctl(36, 1, 0, 0, 0)  # PR_SET_CHILD_SUBREAPER: what tests leave behind comes to this process
    healthy = make_copy(options.copy)

    chance, lines = random.Random(options.seed), list(places())
    faults = [chance.choice(line) for line in chance.sample(lines, len(lines))]
    if options.replay:
        faults = [fault for fault in options.replay if fault["noticed_by"]]
        options.count = len(faults)
    made, noticed = [], 0
    while faults and len(made) < options.count:
        fault = faults.pop(0)
        test = noticed_by(options.copy, healthy, fault)
        said = "cannot be made" if test is False else test or "missed"
        print(f"{said}: {fault['file']}: {fault['before'].strip()}  ->  {fault['after'].strip()}", flush=True)
        if test is not False:
            noticed += test is not None
            made.append({**fault, "noticed_by": test})
            options.record.write_text(json.dumps({"commit": commit, "seed": options.seed, "faults": made}, indent=1))
    print(f"{noticed} of {len(made)} faults are noticed, seed {options.seed}")
    findings = options.count - noticed if options.replay else int(noticed < 0.9 * len(made))
    print(f"mutation: {len(made)} runs, {len(made)} faults injected, {findings} findings")
    sys.exit(findings > 0)


if __name__ == "__main__":
    main()
