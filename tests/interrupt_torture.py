#!/usr/bin/env python3
"""Interrupts the tool at random moments and looks at what it left behind.

Each run is `tarvelctl -w 1 provider -D` on a kernel with many providers, ended by SIGINT. It writes to a file by
-f, to a pipe that is read, or to a pipe whose reader stops after a random number of bytes. A run passes when its
status is 0, standard error is empty, it ended in time, and its output is a prefix of the true output that is cut
at the end of a line.
"""

import argparse
import collections
import os
import pathlib
import random
import re
import select
import signal
import struct
import subprocess
import sys
import tempfile
import threading
import time
import uuid

TIME = re.compile(rb"^\d{4}-\d\d-\d\d \d\d:\d\d:\d\d$", re.MULTILINE)


def make_providers(count, randomness):
    table, listing = [], []
    for index in range(count):
        name = f"provider-{index}"
        own, *instances = (uuid.UUID(int=randomness.getrandbits(128)) for _ in range(1 + randomness.randrange(4)))
        table.append(struct.pack("<16s48x64sII16xii96xI4x", own.bytes, name.encode(), len(name), 2, index, -index,
                                 len(instances)) + b"".join(instance.bytes for instance in instances))
        listing.append(f"net-if {name} {str(own).upper()}\n")
        listing.append(f"\trings: tx {index} rx {-index} slots: tx 0 rx 0 bufsize 0 metasize 0 mhints 0\n")
        listing.extend(f"\tinstance {str(instance).upper()}\n" for instance in instances)
    return b"".join(table), "".join(listing).encode()


def where_cut(output, listing):
    """Says where a run's output ends, or None where it is not a prefix of whole lines of the true output."""
    text, heading = TIME.sub(b"<time>", output), b"\n<time>\n"
    whole, rest = divmod(len(text), len(heading + listing))
    if text != (heading + listing) * whole + (heading + listing)[:rest] or not (b"\n" + output).endswith(b"\n"):
        return None
    return "before the first line" if not text else "inside a listing" if rest > len(heading) else "between two listings"


class Reader(threading.Thread):
    """Reads a pipe: to its end, or so many bytes until rest() is called."""

    def __init__(self, pipe, limit=None):
        super().__init__()
        self.pipe, self.limit, self.data = pipe, limit, bytearray()
        self.start()

    def run(self):
        while self.limit is None or len(self.data) < self.limit:
            got = os.read(self.pipe, 65536 if self.limit is None else min(65536, self.limit - len(self.data)))
            if not got:
                return
            self.data += got

    def rest(self):
        self.join()
        self.limit = None
        self.run()
        return bytes(self.data)


def wait_for_handler(pid):
    """Returns once the process catches SIGINT."""
    mask = 1 << (signal.SIGINT - 1)
    while True:
        caught = re.search(r"^SigCgt:\s*(\w+)", pathlib.Path(f"/proc/{pid}/status").read_text(), re.MULTILINE)
        if int(caught[1], 16) & mask:
            return


def fail_unless(condition, message):
    if not condition:
        raise AssertionError(message)


class Torture:
    def __init__(self, program, root, listing, limit, randomness):
        self.program, self.root, self.listing, self.limit = program, root, listing, limit
        self.random, self.environment = randomness, {**os.environ, "TARVEL_ROOT": root}
        started = time.monotonic()
        true_output = subprocess.run([program, "provider", "-D"], env=self.environment, capture_output=True)
        self.run_time = time.monotonic() - started
        fail_unless(true_output.stdout == listing, "the listing is wrong even without interrupts")

    def moment(self):
        """Mostly inside the first run, now and then in the sleep or the second run."""
        return self.random.uniform(0, 1.3 if self.random.random() < 0.05 else 0.5 * self.run_time)

    def interrupt_one(self, kind):
        """Returns where the output of one run ends and how long the process took to end, or raises."""
        path = os.path.join(self.root, "output")
        redirection = ["-f", path] if kind == "file" else []
        pathlib.Path(path).write_bytes(b"")
        process = subprocess.Popen(
            [self.program, "-w", "1", *redirection, "provider", "-D"], env=self.environment,
            stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        reader = Reader(process.stdout.fileno(), self.random.randrange(len(self.listing)) if kind == "stopped pipe" else None)
        wait_for_handler(process.pid)
        time.sleep(self.moment())
        interrupted = time.monotonic()
        process.send_signal(signal.SIGINT)
        end = os.pidfd_open(process.pid)
        ended = select.select([end], [], [], 20)[0]
        took = time.monotonic() - interrupted
        os.close(end)
        if not ended:
            process.kill()
        output, errors = reader.rest(), process.stderr.read()
        process.stdout.close()
        process.stderr.close()
        fail_unless(process.wait() == 0 and not errors, f"status {process.returncode}, standard error {errors!r}")
        fail_unless(took <= self.limit, f"ended only after {took:.3f} s")
        if kind == "file":
            fail_unless(not output, f"{len(output)} bytes on standard output")
            output = pathlib.Path(path).read_bytes()
        cut = where_cut(output, self.listing)
        fail_unless(cut, f"{len(output)} bytes of output are no prefix; they end in {output[-60:]!r}")
        return cut, took

    def interrupt_many(self, kind, count):
        """Returns the number of runs that failed."""
        failed, slowest, cuts = 0, 0.0, collections.Counter()
        for number in range(count):
            try:
                cut, took = self.interrupt_one(kind)
                cuts[cut] += 1
                slowest = max(slowest, took)
            except AssertionError as reason:
                failed += 1
                print(f"{kind}: run {number}: {reason}")
        ends = ", ".join(f"{cuts[cut]} {cut}" for cut in sorted(cuts))
        print(f"{kind}: {count} interrupts, {failed} failed; output ends {ends}; slowest end {slowest:.3f} s", flush=True)
        return failed


def main():
    parser = argparse.ArgumentParser(description=__doc__, formatter_class=argparse.RawDescriptionHelpFormatter)
    parser.add_argument("program")
    parser.add_argument("--count", type=int, default=1000, help="interrupts for each kind of output")
    parser.add_argument("--limit", type=float, default=0.2, help="seconds that a process may take to end")
    parser.add_argument("--providers", type=int, default=10_000)
    parser.add_argument("--seed", type=int, default=random.randrange(2**32))
    options = parser.parse_args()
    print(f"seed {options.seed}")
    randomness = random.Random(options.seed)
    table, listing = make_providers(options.providers, randomness)
    with tempfile.TemporaryDirectory() as root:
        node = pathlib.Path(root, "proc/sys/kern/tarvel/nexus_provider_list")
        node.parent.mkdir(parents=True)
        node.write_bytes(table)
        torture = Torture(options.program, root, listing, options.limit, randomness)
        sys.exit(any([torture.interrupt_many(kind, options.count) for kind in ("file", "pipe", "stopped pipe")]))


if __name__ == "__main__":
    main()
