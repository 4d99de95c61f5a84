#!/usr/bin/env python3
"""Runs the fuzzer, from commands over tables of the lab and from every input that once was a finding.

The short form does the same each time. In the long one, processes share 60 million executions, and what widens the
coverage is kept in the folder `corpus` beside the fuzzer, where the next run begins.
"""
import concurrent.futures
import os
import pathlib
import re
import struct
import subprocess
import uuid

from driver import Driver
from records import TABLES

# Which commands read which tables, the last one above all; "@" stands for the UUID at its start.
COMMANDS = {
    "nexus_channel_list stats/flow nexus_provider_list": "provider;list-providers --details;tree;tree @;show",
    "nexus_provider_list nexus_channel_list nexus_channel_list": "-w 1 channel;channel;-w 7 channel;tree @;show -w",
    "nexus_provider_list nexus_channel_list stats/flow": "flow;flow -n -- -w;tree;channel-stats x;netstat -ap tcp",
    "stats/flow": "netstat -an --uuid @;netstat -a --pid 94;netstat -a --protocol",
    "stats/flow_adv": "-f out flow-adv;netstat --flow-adv;NETSTAT --flow-adv --uuid @ --pid 94",
    "stats/flow_owner": "flow-owner;-w 1 netstat --flow-owner;netstat --flow-owner --pid 94",
    "stats/flow_route": "flow-route;flow-route -n",
    "stats/userstack": "netstat -s;netstat -sp udp;netstat -s --show-zeros;netstat -s --global;netstat -s --pid 94",
    "stats/net_if": "interface;netstat --netif;netstat --netif --show-zeros;netstat --netif --global -f",
    "stats/flow_switch": "flow-switch;netstat --flowswitch --show-zeros;netstat --flowswitch --global",
    "stats/arena": "memory;-w 1 memory;-w x memory",
    "stats/netns": "netns;netns -a;netns -ap tcp;netns -i global -p tcp;netns --ip=fe80::1 --proto udp;netns -i 1.2.3",
}
KINDS = "--providers --nexuses --channels --rings --flows --stacks --arenas --namespaces --processes".split()
SIZES = (2, 1, 1, 1, 1, 1, 1, 1, 1), (4, 3, 3, 2, 4, 1, 1, 3, 2)


def inputs(tables):
    """As fuzz.cpp reads them: each command over whole tables and over a cut one, and each table at two moments."""
    for nodes, commands in COMMANDS.items():
        chosen = [[*TABLES].index(node) for node in nodes.split()]
        *others, last = (tables[node] for node in chosen)
        others = [b""] * (2 - len(others)) + others
        chosen = [0] * (3 - len(chosen)) + chosen
        first = str(uuid.UUID(bytes=last[:16].ljust(16)))
        for turn, command in enumerate(commands.split(";")):
            words = ["tarvelctl", *command.replace("@", first).split()]
            line = "".join(word + "\0" for word in words).encode()
            for surroundings, table in (2 * turn + 1, last), (2 * turn, last[:-1]):
                start = struct.pack("<3H4B", *map(len, (line, *others)), *chosen, surroundings)
                yield b"".join([start, line, *others, table])
    for node, table in enumerate(tables):  # at two moments, whole and cut
        for before, now in (table, table), (table[:-1], table), (table, table[8:]):
            start = struct.pack("<3H4B", 16, 0, len(before), 0, 0, node, 16)
            yield start + struct.pack("<2q", 1, 10**9) + before + now


def execute(seed, runs, first, *corpus):
    """Returns the executions done, and whether those were all."""
    options = [f"-seed={seed}", f"-runs={runs}", f"-seed_inputs={','.join(map(str, first))}", "-shuffle=0", "-reload=0",
               "-entropic=0", "-max_len=6000", "-timeout=5", "-rss_limit_mb=1024", "-malloc_limit_mb=64",
               "-print_final_stats=1", f"-artifact_prefix={fuzzer}-finding-"]
    done = subprocess.run([fuzzer, *options, *corpus], stdout=subprocess.DEVNULL, stderr=subprocess.PIPE, text=True,
                          errors="replace")
    executed, speed = re.findall(r"^stat::(?:number_of_executed|average_exec)\w+: +(\d+)", done.stderr, re.M)
    print(f"seed {seed}: {executed} runs, {speed} a second", done.stderr[-4000:] * bool(done.returncode), flush=True)
    return int(executed), done.returncode == 0


driver = Driver(__doc__, fuzzer=pathlib.Path())
fuzzer, processes, runs, corpus = driver.options.fuzzer, 1, 100_000, []
if driver.long:  # a process keeps what it has seen of code and memory, so there are many
    processes, runs, corpus = 120, 500_000, [fuzzer.with_name("corpus")]
    corpus[0].mkdir(exist_ok=True)
first = sorted((pathlib.Path(__file__).parent / "fuzz/findings").glob("*"))
for seed, sizes in enumerate(SIZES):
    made = driver.make_kernel("--seed", seed, *(word for kind in zip(KINDS, sizes) for word in kind))
    for content in inputs([made.table(name) for name in TABLES]):
        first.append(pathlib.Path(driver.directory, str(len(first))))
        first[-1].write_bytes(content)
with concurrent.futures.ThreadPoolExecutor(os.cpu_count()) as pool:
    for executed, whole in pool.map(lambda seed: execute(seed, runs, first, *corpus), range(1, processes + 1)):
        driver.runs += executed
        driver.findings += not whole
driver.end()
