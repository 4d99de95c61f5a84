#!/usr/bin/env python3
"""Runs two builds of the tool over the same random kernels, whole and damaged: output, messages and status must agree.

--other is the second build, as a command line: scripts/torture gives the one for arm64, run by qemu-user.
"""
import re
import resource
import shlex

from driver import Driver
from moments import COMMANDS
from records import TABLES

LINES = {name: [line for line, tables in COMMANDS.items() if name in tables] for name in TABLES}
OTHERS = ("", "tree 0", "netns -i 10.0.1.2", "netns -i global -p udp", "channel -x", "netstat -p x", "-w x flow",
          "netstat -an --pid 94", "netstat -sp tcp --global --show-zeros", "netstat --netif --global")
SIZES = ("providers", "channels", "flows", "arenas", "namespaces", "processes")


def damage(random, table):
    """Cut anywhere, or with words of extreme and random values anywhere."""
    if random.random() < 0.5 or not table:
        return table[:random.randrange(len(table) + 1)]
    damaged = bytearray(table)
    for _ in range(random.choice((1, 10, len(table) // 50 + 1))):
        width = random.choice((1, 4, 8))
        at = random.randrange(len(table)) // width * width
        word = random.choice((bytes(width), b"\xff" * width, random.randbytes(random.choice((width, width // 2 or 1)))))
        damaged[at:at + len(word)] = word
    return bytes(damaged[:len(table)])


def compare(driver, kernel, line, fault):
    expected = driver.run(kernel, line)
    emulator, *words = driver.options.other.split()
    seen = driver.run(kernel, shlex.join([*words, *line.split()]), emulator)
    # The emulator adds a line of its own where the program aborts.
    seen = seen._replace(err=re.sub(r"qemu: uncaught target signal 6 .*\n", "", seen.err))
    driver.expect(line, fault, seen, expected)


def main():
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
    driver = Driver(__doc__, other="")
    assert driver.options.other
    for _ in range(300 if driver.long else 2):
        seed = driver.random.randrange(2**64)
        sizes = [word for size in SIZES for word in ("--" + size, driver.random.choice((0, 1, 5, 30, 100)))]
        kernel = driver.make_kernel("--seed", seed, *sizes[:2 * driver.random.randrange(len(SIZES) + 1)])
        for line in {line for lines in LINES.values() for line in lines}.union(OTHERS):
            compare(driver, kernel, line, f"seed {seed}")
        for name, lines in LINES.items():
            whole = kernel.table(name)
            kernel.put(name, damage(driver.random, whole))
            driver.faults += 1
            for line in lines:
                compare(driver, kernel, line, f"seed {seed}, {name} damaged")
            kernel.put(name, whole)
    driver.end()


if __name__ == "__main__":
    main()
