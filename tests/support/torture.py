"""What the torture drivers share: their command line, kernels to damage, runs of the tool, and the account of them."""
import argparse
import collections
import os
import pathlib
import random
import subprocess
import sys
import tempfile

Result = collections.namedtuple("Result", "out err status")


class Kernel:
    """A kernel made of files."""

    def __init__(self, root):
        self.root = pathlib.Path(root)
        self.environment = {**os.environ, "TARVEL_ROOT": str(root)}

    def path(self, table):
        return self.root / "proc/sys/kern/tarvel" / table

    def table(self, name):
        return self.path(name).read_bytes()

    def put(self, name, contents):
        self.path(name).write_bytes(contents)


class Torture:
    def __init__(self, name, description, **extra):
        parser = argparse.ArgumentParser(description=description, formatter_class=argparse.RawDescriptionHelpFormatter)
        parser.add_argument("tarvelctl", type=os.path.abspath)
        parser.add_argument("tarvellab", type=os.path.abspath)
        parser.add_argument("--long", action="store_true", help="take minutes rather than seconds")
        parser.add_argument("--seed", type=int, default=random.randrange(2**32))
        for option, default in extra.items():
            parser.add_argument("--" + option, type=type(default), default=default)
        self.name, self.options = name, parser.parse_args()
        self.long, self.random = self.options.long, random.Random(self.options.seed)
        self.runs = self.faults = self.findings = 0
        self.directory = tempfile.TemporaryDirectory(prefix="torture")
        print(f"seed {self.options.seed}")

    def make_kernel(self, *sizes):
        root = tempfile.mkdtemp(dir=self.directory.name)
        subprocess.run([self.options.tarvellab, "generate", root, *map(str, sizes)], check=True)
        return Kernel(root)

    def run(self, kernel, line, **options):
        self.runs += 1
        done = subprocess.run([self.options.tarvelctl, *line.split()], env=kernel.environment, stdin=subprocess.DEVNULL,
                              stderr=subprocess.PIPE, timeout=60, **{"stdout": subprocess.PIPE, **options})
        return Result(done.stdout, done.stderr, done.returncode)

    def expect(self, command, fault, seen, expected):
        """Reports what was seen where it is not what was expected."""
        if seen == expected:
            return
        self.findings += 1
        if self.findings <= 20:
            print(f"{command}: {fault}\n  expected {shortened(expected)}\n  seen     {shortened(seen)}", flush=True)

    def end(self):
        self.directory.cleanup()
        print(f"{self.name}: {self.runs} runs, {self.faults} faults injected, {self.findings} findings")
        sys.exit(self.findings > 0)


def shortened(value):
    text = repr(value)
    return text if len(text) <= 3000 else f"{text[:1400]} ... {text[-1400:]}"
