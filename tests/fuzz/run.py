#!/usr/bin/env python3
"""Runs the fuzz targets, each from seeds that the lab makes and from every input that once was a finding.

In the short form each target runs for a few seconds. In the long form all of them share 100 million executions. The
inputs that widen the coverage are kept in the folder `corpus` beside the targets, where the next run begins.
"""

import argparse
import concurrent.futures
import pathlib
import re
import struct
import subprocess
import sys
import tempfile

# The tables of each target: the one that is fuzzed and those that go with it.
TABLES = {
    "provider": ("nexus_provider_list", "nexus_channel_list", "stats/flow"),
    "channel": ("nexus_channel_list", "nexus_channel_list", "nexus_provider_list"),
    "flow": ("stats/flow", "nexus_provider_list", "nexus_channel_list"),
    **{name: ("stats/" + name,) for name in
       ("flow_adv", "flow_owner", "flow_route", "userstack", "net_if", "flow_switch", "arena", "netns")},
}
SIZES = [dict(providers=2, nexuses=1, channels=1, rings=1, flows=1, stacks=1, arenas=1, namespaces=1, processes=1),
         dict(providers=4, nexuses=3, channels=3, rings=2, flows=4, stacks=1, arenas=1, namespaces=3, processes=2)]
COMMAND_LINES = ["provider -D", "tree 00000000-0000-0000-0000-000000000000", "netstat -ansp tcp --show-zeros",
                 "netns -i global -p udp", "netns --ip=10.0.0.1 --proto tcp", "-w 1 channel", "-f out memory",
                 "flow -n -- -w", "NETSTAT --uuid x --pid 3 --wait 1", "show -w", "list-providers --details -f",
                 "flow-adv", "flow-owner", "flow-route -n", "interface", "flow-switch", "channel-stats extra", "-w x"]
# Executions of each target in the long form: fewer where a record fills pages.
LONG = {"print": 40_000_000, "arguments": 12_000_000, "capture": 1_000_000,
        **{name: 3_000_000 if name in ("provider", "channel", "flow", "userstack", "arena") else 6_000_000
           for name in TABLES}}
CHUNK = 500_000  # executions of a process, which keeps what it has seen of memory regions and code


def table_seeds(lab, name):
    for seed, sizes in enumerate(SIZES):
        with tempfile.TemporaryDirectory() as root:
            options = [word for what, count in sizes.items() for word in (f"--{what}", str(count))]
            subprocess.run([lab, "generate", root, "--seed", str(seed), *options], check=True)
            first, *more = [(pathlib.Path(root) / "proc/sys/kern/tarvel" / node).read_bytes() for node in TABLES[name]]
        more += [b""] * (2 - len(more))
        for command in range(8):
            yield struct.pack("<BBBBHH", command, command % 8, 1, command, *map(len, more)) + b"".join(more) + first
            yield struct.pack("<BBBBHH", command, 0, 1, 0, 0, 0) + first[:-1]


def capture_seeds():
    """A capture with a second moment, as steps: what, where, name, how; then the same with each step changed."""
    tree = [(1, 0, 7, 0), *((0, i, i, 1) for i in range(5)), (1, 5, 5, 0), (0, 0, 8, 1), (0, 6, 9, 1), (5, 7, 0, 0)]
    for changed in range(len(tree) + 1):
        for what in 2, 3, 4:
            steps = [(what, *step[1:3], 33) if i == changed else step for i, step in enumerate(tree)]
            yield bytes(sum(steps + [(2, 0, 7, 2)] * (32 - len(steps)), ())) + b"format: 1\nhost: a\ntime: b\nredacted: yes\n"


def seeds(lab, name):
    if name == "capture":
        yield from capture_seeds()
    elif name == "arguments":
        yield from (b"\0" + "\0".join(["tarvelctl", *line.split()]).encode() for line in COMMAND_LINES)
    elif name == "print":
        yield from (struct.pack("<Bq", kind, value) for kind in range(64) for value in (0, 1, -1, 1 << 62))
    else:
        yield from table_seeds(lab, name)


def execute(target, limits):
    """Returns the executions done, those per second, and what was found."""
    corpus = target.parent / "corpus" / target.name
    kept = pathlib.Path(__file__).parent / "findings" / target.name
    options = ["-max_len=6000", "-timeout=5", "-rss_limit_mb=1024", "-malloc_limit_mb=64", "-entropic=0", "-print_final_stats=1",
               f"-artifact_prefix={target.parent}/finding-{target.name}-"]
    done = subprocess.run([target, *options, *limits, corpus, *([kept] if kept.is_dir() else [])],
                          stderr=subprocess.PIPE, stdout=subprocess.DEVNULL, text=True, errors="replace")
    count = re.search(r"number_of_executed_units: (\d+)", done.stderr)
    speed = re.search(r"average_exec_per_sec: *(\d+)", done.stderr)
    return int(count[1]) if count else 0, int(speed[1]) if speed else 0, done.stderr if done.returncode else ""


def fuzz(lab, folder, name, seconds):
    target = folder / f"fuzz_{name}"
    corpus = folder / "corpus" / target.name
    corpus.mkdir(parents=True, exist_ok=True)
    for number, seed in enumerate(seeds(lab, name)):
        (corpus / f"seed-{number}").write_bytes(seed)
    wanted, runs, slowest, findings = LONG[name], 0, None, 0
    while not findings and runs < (1 if seconds else wanted):
        limits = [f"-max_total_time={seconds}"] if seconds else [f"-runs={min(CHUNK, wanted - runs)}"]
        executed, speed, found = execute(target, limits)
        runs += executed
        slowest = min(slowest or speed, speed)
        if found:
            findings += 1
            print(f"{name}: {found[-4000:]}", flush=True)
        if not seconds and runs < wanted:
            print(f"{name}: {runs} runs so far", flush=True)
    print(f"{name}: {runs} runs, {slowest} a second at the slowest, {findings} findings", flush=True)
    return runs, findings


def main():
    parser = argparse.ArgumentParser(description=__doc__)
    parser.add_argument("lab")
    parser.add_argument("folder", help="where the targets are", type=pathlib.Path)
    parser.add_argument("--long", action="store_true")
    parser.add_argument("--seconds", type=int, default=2, help="of each target, in the short form")
    parser.add_argument("--jobs", type=int, default=1)
    parser.add_argument("--only", nargs="*", default=[*TABLES, "arguments", "print", "capture"])
    options = parser.parse_args()
    with concurrent.futures.ThreadPoolExecutor(options.jobs) as pool:
        results = list(pool.map(lambda name: fuzz(options.lab, options.folder.resolve(), name,
                                                  None if options.long else options.seconds), options.only))
    runs, findings = map(sum, zip(*results))
    print(f"fuzz: {runs} runs, 0 faults injected, {findings} findings")
    sys.exit(findings > 0)


if __name__ == "__main__":
    main()
