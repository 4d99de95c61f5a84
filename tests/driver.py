"""What the drivers share: their options, kernels to damage, runs of the tool, and the account of what they found."""
import argparse
import os
import pathlib
import random
import shutil
import sys
import tempfile

from runs import Run, generate, tarvelctl


class Driver:
    """A driver in its short form, of a fixed seed, or with --long. `extra` are further options with their defaults."""

    def __init__(self, description, **extra):
        parser = argparse.ArgumentParser(description=description, formatter_class=argparse.RawDescriptionHelpFormatter,
                                         usage="%(prog)s BUILD [options]")
        parser.add_argument("--long", action="store_true", help="take minutes rather than seconds")
        parser.add_argument("--seed", type=int, default=1)
        for option, default in extra.items():
            parser.add_argument("--" + option, type=type(default), default=default)
        self.options = parser.parse_args()
        self.long, self.random = self.options.long, random.Random(self.options.seed)
        self.runs = self.faults = self.findings = 0
        self.directory = tempfile.mkdtemp(prefix="driver")

    def make_kernel(self, *sizes):
        return generate(tempfile.mkdtemp(dir=self.directory), *sizes)

    def run(self, kernel, line, program=tarvelctl, **options):
        """What the tool, or another program in its place, leaves behind at its end. Options are those of a Run."""
        self.runs += 1
        return Run([program, *line.split()], kernel, **options).end()

    def expect(self, command, fault, seen, expected):
        """Reports what was seen where it is not what was expected."""
        if seen == expected:
            return
        self.findings += 1
        texts = repr(expected), repr(seen)
        at = max(len(os.path.commonprefix(texts)) - 300, 0)
        if self.findings <= 20:
            expected, seen = (text[at:at + 1500] for text in texts)
            print(f"{command}: {fault}\n  expected {expected}\n  seen     {seen}", flush=True)

    def end(self):
        """Tells the account and ends the process."""
        shutil.rmtree(self.directory, ignore_errors=True)
        print("seed", self.options.seed)
        name = pathlib.Path(sys.argv[0]).stem
        print(f"{name}: {self.runs} runs, {self.faults} faults injected, {self.findings} findings")
        sys.exit(self.findings > 0)
