#!/usr/bin/env python3
"""CPU of `tarvelctl flow` against the obvious C program for the same listing.

usage: flow_ratio.py TARVELCTL OBVIOUS TABLE_ROOT [ROUNDS]

Both read the flow table below TABLE_ROOT. Their outputs are compared byte for byte first. Then both run in turn,
ROUNDS times (7) into each of a null device, a file on tmpfs and a pipe that is drained, and the medians of user plus
system time are printed with their ratio.
"""
import filecmp
import os
import platform
import statistics
import subprocess
import sys
import tempfile


def cpu_seconds(command, environment, sink):
    """Runs `command` into `sink`, and returns the CPU time it took."""
    drain = None
    if sink == "pipe":
        read_end, target = os.pipe()
        drain = subprocess.Popen(["cat"], stdin=read_end, stdout=subprocess.DEVNULL)
        os.close(read_end)
    else:
        target = os.open(sink, os.O_WRONLY | os.O_CREAT | os.O_TRUNC, 0o600)
    process = subprocess.Popen(command, env=environment, stdout=target)
    os.close(target)
    _, status, usage = os.wait4(process.pid, 0)
    if drain:
        drain.wait()
    if status != 0:
        sys.exit(f"{command[0]} failed with status {status}")
    return usage.ru_utime + usage.ru_stime


def main():
    if len(sys.argv) < 4:
        sys.exit(__doc__)
    tool, obvious, root = sys.argv[1:4]
    rounds = int(sys.argv[4]) if len(sys.argv) > 4 else 7
    table = f"{root}/proc/sys/kern/tarvel/stats/flow"
    environment = dict(os.environ, TARVEL_ROOT=root)
    programs = {"obvious": [obvious, table], "tarvelctl": [tool, "flow"]}

    with tempfile.TemporaryDirectory(dir="/dev/shm") as tmpfs:
        files = {name: f"{tmpfs}/{name}" for name in programs}
        for name, command in programs.items():
            cpu_seconds(command, environment, files[name])
        if not filecmp.cmp(*files.values(), shallow=False):
            sys.exit("the two outputs differ")
        size = os.path.getsize(files["tarvelctl"])
        flows = os.path.getsize(table) // 320
        print(f"{flows} flows, {size} bytes of output, identical; {rounds} rounds; {platform.machine()}, "
              f"{os.cpu_count()} cores")
        print(f"{'sink':<12} {'obvious':>9} {'tarvelctl':>9} {'ratio':>6}")
        for label, sink in (("null device", "/dev/null"), ("tmpfs file", f"{tmpfs}/out"), ("pipe", "pipe")):
            times = {name: [] for name in programs}
            for _ in range(rounds):
                for name, command in programs.items():
                    times[name].append(cpu_seconds(command, environment, sink))
            medians = {name: statistics.median(values) for name, values in times.items()}
            print(f"{label:<12} {medians['obvious']:8.3f}s {medians['tarvelctl']:8.3f}s "
                  f"{medians['obvious'] / medians['tarvelctl']:6.2f}")


main()
