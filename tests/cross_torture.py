#!/usr/bin/env python3
"""Runs two builds of the tool over the same random kernels, whole and damaged: output, messages and status must agree.

--other is the second build, as a command line: scripts/torture gives the one for arm64, run by qemu-user.
"""
import pathlib
import re
import resource
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from records import TABLES  # noqa: E402
from torture import Torture  # noqa: E402

LINES = {"nexus_provider_list": ("provider -D", "tree", "show"), "nexus_channel_list": ("channel", "tree", "show"),
         "stats/flow": ("flow", "netstat -an --pid 94", "tree", "show"), "stats/flow_adv": ("flow-adv",),
         "stats/flow_owner": ("flow-owner",), "stats/flow_route": ("flow-route -n",),
         "stats/userstack": ("netstat -s", "netstat -sp tcp --global --show-zeros"),
         "stats/net_if": ("interface", "netstat --netif --global"), "stats/flow_switch": ("flow-switch",),
         "stats/arena": ("memory",), "stats/netns": ("netns -a", "netns -i global -p udp")}
OTHERS = ("", "tree 0", "netns -i 10.0.1.2", "channel -x", "netstat -p x", "-w x flow")
SIZES = ("providers", "channels", "flows", "arenas", "namespaces", "processes")


def damage(random, table):
    """Cut anywhere, or with words of extreme and random values anywhere."""
    if random.random() < 0.5 or not table:
        return table[:random.randrange(len(table) + 1)]
    damaged = bytearray(table)
    for _ in range(random.choice((1, 10, len(table) // 50 + 1))):
        width = random.choice((1, 4, 8))
        at = random.randrange(len(table)) // width * width
        word = random.choice((bytes(width), b"\xff" * width, random.randbytes(width), random.randbytes(width // 2 or 1)))
        damaged[at:at + len(word)] = word
    return bytes(damaged[:len(table)])


def compare(torture, kernel, line, fault):
    results = [torture.run(kernel, line, program) for program in (None, torture.options.other.split())]
    # The emulator adds a line of its own where the program aborts.
    err = re.sub(rb"qemu: uncaught target signal 6 .*\n", b"", results[1].err)
    torture.expect(line, fault, results[1]._replace(err=err), results[0])


def main():
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
    torture = Torture("cross", __doc__, other="")
    assert LINES.keys() == TABLES.keys() - {"ring_stat_enable"} and torture.options.other
    for _ in range(300 if torture.long else 2):
        seed = torture.random.randrange(2**64)
        sizes = [word for size in SIZES for word in ("--" + size, torture.random.choice((0, 1, 5, 30, 100)))]
        kernel = torture.make_kernel("--seed", seed, *sizes[:2 * torture.random.randrange(len(SIZES) + 1)])
        for line in {line for lines in LINES.values() for line in lines}.union(OTHERS):
            compare(torture, kernel, line, f"seed {seed}")
        for name, lines in LINES.items():
            whole = kernel.table(name)
            kernel.put(name, damage(torture.random, whole))
            torture.faults += 1
            for line in lines:
                compare(torture, kernel, line, f"seed {seed}, {name} damaged")
            kernel.put(name, whole)
    torture.end()


if __name__ == "__main__":
    main()
