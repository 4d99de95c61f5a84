"""What the drivers of fault injection share: runs of the tool with calls that fail, and the count of findings.

A fault is (letter, first, count, value), as tests/faults.cpp has them. A case is (line, faults, judge, options): the
judge is called with the run, and returns what it expected where the run did otherwise.
"""
import argparse
import collections
import concurrent.futures
import os
import pathlib
import pty
import random
import re
import socket
import subprocess
import sys
import tempfile
import threading
import tty

FOREVER = 1 << 40
SIGINT = 1002  # as a fault's value: arrives in front of the call
TIMES = re.compile(r"^(?:\033\[36m)?\d{4}-\d\d-\d\d \d\d:\d\d:\d\d(?:\033\[0m)?$", re.MULTILINE)
NODES = "proc/sys/kern/tarvel"

Run = collections.namedtuple("Run", "out err status calls", defaults=[""])


def drain(fd):
    """All that arrives. A terminal whose program has gone reports errors, the first one now and then too early."""
    data, ended = bytearray(), 0
    while ended < 2:
        try:
            got = os.read(fd, 1 << 16)
        except OSError:
            got = b""
        data += got
        ended = 0 if got else ended + 1
    os.close(fd)
    return bytes(data)


def ends(kind):
    """The two ends of what the program writes to: its own and the test's. The path of a file has no more to read."""
    if kind[0] == "/":
        return os.open(kind, os.O_WRONLY), os.open("/dev/null", os.O_RDONLY)
    if kind == "socket":
        return tuple(end.detach() for end in socket.socketpair())
    if kind == "terminal":
        test, program = pty.openpty()
        tty.setraw(program)
        return program, test
    return os.pipe()[::-1]


def brief(run, other):
    """A run, whose report starts shortly before it differs from the other one's."""
    if not isinstance(run, Run):
        return run
    start = len(os.path.commonprefix([run.out, other.out])) if isinstance(other, Run) else 0
    return run._replace(out=f"{start} bytes, {run.out[max(0, start - 40):start + 200]}", err=run.err[-400:])


def sample(cases, size, randomness):
    """So many cases, as many of one kind as of any other: what goes wrong at which turn does not tell kinds apart,
    but the text that a judge carries does."""
    known = collections.Counter()

    def rank(case):
        line, faults, judge, options = case
        kind = line, str(options), judge.__doc__, *((letter, count, value) for letter, _, count, value in faults)
        known[kind] += 1
        return known[kind]
    return sorted(randomness.sample(cases, len(cases)), key=rank)[:size]


class Torture:
    def __init__(self, name, text, sample, sizes):
        parser = argparse.ArgumentParser(description=text)
        parser.add_argument("program", help="the tool with calls that fail")
        parser.add_argument("lab")
        parser.add_argument("--long", action="store_true", help="all cases on several kernels, not a sample of them")
        parser.add_argument("--seed", type=int, default=random.randrange(1 << 31))
        self.options = parser.parse_args()
        self.name, self.sample, self.sizes = name, sample, sizes
        self.runs = self.injected = self.findings = 0
        self.directory = tempfile.TemporaryDirectory()
        self.path = pathlib.Path(self.directory.name)
        self.root, self.file = self.path / "kernel", self.path / "output"

    def make_kernel(self, seed):
        subprocess.run([self.options.lab, "generate", self.root, "--seed", str(seed), *self.sizes.split()], check=True)
        nodes = self.root / NODES
        self.tables = {str(p.relative_to(nodes)): p.read_bytes() for p in nodes.rglob("*") if p.is_file()}
        self.cleanly = {}

    def run(self, line, faults=(), to="pipe", prepare=None):
        """Runs a command line with its output to a pipe, socket or terminal, a device, a file, or a file by -f."""
        calls = self.path / "calls"
        calls.write_bytes(bytes(1 << 16))
        self.file.write_bytes(b"")
        words = ["tarvelctl", *line.split(), *(["-f", str(self.file)] if to == "-f" else [])]
        plan = ",".join("%s%d+%d=%d" % fault for fault in faults)
        environment = {**os.environ, "TARVEL_ROOT": str(self.root), "CALLS": str(calls), "FAULTS": plan,
                       "RES_OPTIONS": "attempts:0"}  # no name server is asked
        program, test = ends(str(self.file) if to == "file" else to)
        process = subprocess.Popen(words, executable=self.options.program, env=environment, stdin=subprocess.DEVNULL,
                                   stdout=program, stderr=subprocess.PIPE, preexec_fn=prepare)
        os.close(program)
        guard = threading.Timer(20, process.kill)
        guard.start()
        with concurrent.futures.ThreadPoolExecutor(1) as reader, process:
            received = reader.submit(drain, test)
            err = process.stderr.read()
        guard.cancel()
        out = received.result() + self.file.read_bytes()
        return Run(TIMES.sub("<time>", out.decode("latin-1")), err.decode("latin-1"), process.returncode,
                   calls.read_bytes().rstrip(b"\0").decode())

    def clean(self, line, tables=None, **options):
        """A run without faults, on a kernel with other contents of the named tables."""
        key = line, *sorted((tables or {}).items()), *options.items()
        if key not in self.cleanly:
            for node, data in (tables or {}).items():
                (self.root / NODES / node).write_bytes(data)
            self.cleanly[key] = self.run(line, [("z", 3, 1, SIGINT)], **options)
            for node in tables or ():
                (self.root / NODES / node).write_bytes(self.tables[node])
        return self.cleanly[key]

    def judge(self, line, faults, judge, options):
        seen = self.run(line, [*faults, ("z", 3, 1, SIGINT)], **options)
        self.runs += 1
        self.injected += sum(max(0, min(count if count < FOREVER else 1, seen.calls.count(letter) - first + 1))
                             for letter, first, count, _ in faults)
        expected = judge(seen)
        if expected is None:
            return
        self.findings += 1
        print(f"{line!r} {options or ''} with {faults}:\n  expected {brief(expected, seen)}\n  seen {brief(seen, expected)}")

    def finish(self, make_cases):
        """Runs a sample of the cases, or all of them on several kernels. Ends the process."""
        print("seed", self.options.seed)
        randomness = random.Random(self.options.seed)
        for _ in range(3 if self.options.long else 1):
            self.make_kernel(randomness.randrange(1 << 31))
            cases = list(make_cases(self))
            if not self.options.long:
                cases = sample(cases, self.sample, randomness)
            for case in cases:
                self.judge(*case)
        print(f"{self.name}: {self.runs} runs, {self.injected} faults injected, {self.findings} findings")
        sys.exit(self.findings > 0)


def exactly(out, err="", status=0):
    """A judge that wants just this."""
    wanted = Run(out, err, status)
    return lambda seen: None if seen[:3] == wanted[:3] else wanted


def that(text, holds):
    """A judge that wants what `holds` says; in words, `text`."""
    return lambda seen: None if holds(seen) else text
