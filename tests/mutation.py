#!/usr/bin/env python3
"""Makes small faults in the product, one at a time, and looks whether the tests notice.

The faults are the usual slips: a bound off by one, a comparison or sum turned round, a condition or a step forgotten.
They are drawn from all places where such a slip can stand, in a copy of the sources that is built without
optimization. A fault that does not compile is drawn anew. One that no test notices is listed as a survivor; some
change nothing that can be seen, such as a hint to the cache.
"""

import argparse
import os
import pathlib
import random
import re
import resource
import shutil
import signal
import subprocess
import sys
import time

# Decoders and bounds. What prints and writes has checks of its own: fuzzing against snprintf, writes that fail.
SOURCES = ["common/*.cpp", "common/channel*.h", "common/names/*.cpp", "common/tables/*.cpp", "common/tables/provider.h",
           "common/tables/record_walk.h", "common/tables/channel.h", "common/tables/flow.h", "common/tables/netns.h",
           "common/text/invariant.cpp", "common/text/memory.cpp", "tarvelctl/[!t]*.cpp", "tarvelctl/tree.cpp",
           "platform/linux/[!dm]*.cpp"]
OPERATORS = [(re.compile(pattern), replacement) for pattern, replacement in [
    (r" < ", " <= "), (r" <= ", " < "), (r" > ", " >= "), (r" >= ", " > "), (r" == ", " != "), (r" != ", " == "),
    (r" \+ ", " - "), (r" - ", " + "), (r" \* ", " / "), (r" % ", " / "), (r" && ", " || "), (r" \|\| ", " && "),
    (r" & ", " | "), (r" \| ", " & "), (r" << ", " >> "), (r" >> ", " << "), (r" \+= ", " -= "), (r"\(!", "("),
    (r"\bcontinue;", "break;"), (r"\bbreak;", "continue;"), (r"\btrue\b", "false"), (r"\bfalse\b", "true"),
    (r"(?<![\w.\"'\\])(\d+)(?![\w.\"'])", lambda found: str(int(found[1]) + 1)),
    (r"^(\s+)[\w.:>-]+\(.*\);$", r"\1;"), (r"^(\s+)\+\+[\w.]+;$", r"\1;"), (r"^(\s+)if \(.*\) (return|continue)\b.*;$", r"\1;"),
]]
# Where a fault says nothing of a decoder or a bound, or cannot be seen: a buffer larger than it needs to be, the ways up a
# tree that only save time.
LEFT_OUT = re.compile(r"^\s*(//|#|static_assert|template|using|char \w+\[)|prefetch|reserve\(|static_assert|print<|complain<|\"|"
                      r"netstat_options\.\S+ = 1|report\.flush|jump")
TESTS = ["unit_tests", "blocking_output_tests", "kernel_table_tests", "flow_naming_tests", "program_tests"]
SHARDS = 4
# What is asked where those notice nothing, because it takes longer.
DRIVERS = {"truncation": ["tarvelctl", "tarvellab"], "terminal": ["tarvelctl", "tarvellab", "--name-services",
                                                                  "tests/libname_services.so"],
           "kernel": ["tests/faulted_tarvelctl", "tarvellab"], "memory": ["tests/faulted_tarvelctl", "tarvellab"],
           "output": ["tests/faulted_tarvelctl", "tarvellab"]}


def places(root):
    """Every fault that can be made, as (file, line number, new line)."""
    for pattern in SOURCES:
        for path in sorted(root.glob(pattern)):
            for number, line in enumerate(path.read_text().splitlines()):
                code = line.split("  //")[0]
                if LEFT_OUT.search(code):
                    continue
                for operator, replacement in OPERATORS:
                    for found in operator.finditer(code):
                        changed = code[:found.start()] + found.expand(replacement) if isinstance(replacement, str) \
                            else code[:found.start()] + replacement(found)
                        yield path.relative_to(root), number, changed + code[found.end():]


def quietly(*words, **options):
    return subprocess.run(words, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, **options).returncode == 0


def is_noticed(build):
    """Whether a test fails. The shards of all test programs run at once: most of their time is waiting."""
    running = []
    for name in TESTS:
        for shard in range(SHARDS if name == "program_tests" else 1):
            sharding = {"GTEST_TOTAL_SHARDS": str(SHARDS), "GTEST_SHARD_INDEX": str(shard)} if name == "program_tests" else {}
            running.append(subprocess.Popen([build / "tests" / name, "--gtest_fail_fast", "--gtest_brief=1"],
                                            env={**os.environ, **sharding}, stdout=subprocess.DEVNULL,
                                            stderr=subprocess.DEVNULL, start_new_session=True))
    end = time.monotonic() + 40
    while any(each.poll() is None for each in running) and not any(each.poll() for each in running):
        if time.monotonic() > end:
            break
        time.sleep(0.02)
    noticed = any(each.poll() != 0 for each in running)
    for each in running:
        try:
            os.killpg(each.pid, signal.SIGKILL)
        except ProcessLookupError:
            pass
        each.wait()
    return noticed


def is_noticed_by_drivers(build, make):
    quietly(*make, "faulted_tarvelctl", "name_services")
    tests = pathlib.Path(__file__).parent
    return any(not quietly("timeout", "120", tests / f"{name}_torture.py",
                           *(word if word.startswith("-") else (build / word).resolve() for word in words))
               for name, words in DRIVERS.items())


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("copy", help="folder for the copy", type=pathlib.Path)
    parser.add_argument("--count", type=int, default=200)
    parser.add_argument("--seed", type=int, default=1)
    parser.add_argument("--skip", type=int, default=0, help="so many of the faults drawn, to go on where a run ended")
    parser.add_argument("--wanted", type=float, default=0.9, help="share to be noticed")
    options = parser.parse_args()
    resource.setrlimit(resource.RLIMIT_AS, (8 << 30, 8 << 30))  # a fault may ask for all memory there is
    shutil.rmtree(options.copy, ignore_errors=True)
    options.copy.mkdir(parents=True)
    top = pathlib.Path(__file__).parent.parent
    for name in subprocess.run(["git", "ls-files"], cwd=top, capture_output=True, text=True, check=True).stdout.split():
        (options.copy / name).parent.mkdir(parents=True, exist_ok=True)
        shutil.copy(top / name, options.copy / name)
    build = options.copy / "build"
    subprocess.run(["cmake", "-S", options.copy, "-B", build, "-G", "Ninja", "-DCMAKE_BUILD_TYPE=Debug",
                    "-DTARVELCTL_BENCH=OFF", "-DCMAKE_CXX_FLAGS=-O0 -g0"], check=True, stdout=subprocess.DEVNULL)
    make = ["cmake", "--build", build, "--target", "tarvelctl", *TESTS]
    subprocess.run([*make, "tarvellab", "describe"], check=True, stdout=subprocess.DEVNULL)
    if is_noticed(build) or is_noticed_by_drivers(build, make):
        sys.exit("the tests fail without any fault")

    drawn = list(places(options.copy))
    random.Random(options.seed).shuffle(drawn)
    made = noticed = 0
    for name, number, changed in drawn[options.skip:]:
        if made == options.count:
            break
        path = options.copy / name
        original = path.read_text()
        lines = original.splitlines(keepends=True)
        before, lines[number] = lines[number].strip(), changed + "\n"
        path.write_text("".join(lines))
        if quietly(*make):
            made += 1
            if is_noticed(build) or is_noticed_by_drivers(build, make):
                noticed += 1
            else:
                print(f"survivor: {name}:{number + 1}: {before}  ->  {changed.strip()}", flush=True)
        path.write_text(original)
        if made % 20 == 0:
            print(f"{noticed} of {made} so far", flush=True)
    print(f"{noticed} of {made} faults are noticed, drawn from {len(drawn)} places")
    missed = noticed < options.wanted * made
    print(f"mutation: {made} runs, {made} faults injected, {int(missed)} findings")
    sys.exit(missed)


if __name__ == "__main__":
    main()
