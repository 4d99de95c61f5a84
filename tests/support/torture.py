"""What the torture drivers share: their command line, kernels to damage, runs of the tool, and the account of them."""
import argparse
import atexit
import collections
import os
import random
import subprocess
import sys
import tempfile

from records import Kernel, load

Result = collections.namedtuple("Result", "out err status")

class Torture:
    def __init__(self, name, description, **extra):
        parser = argparse.ArgumentParser(description=description, formatter_class=argparse.RawDescriptionHelpFormatter)
        parser.add_argument("tarvelctl", type=os.path.abspath)
        parser.add_argument("tarvellab", type=os.path.abspath)
        parser.add_argument("--name-services", type=os.path.abspath, help="library that takes the place of the system's")
        parser.add_argument("--long", action="store_true", help="take minutes rather than seconds")
        parser.add_argument("--seed", type=int, default=random.randrange(2**32))
        for option, default in extra.items():
            parser.add_argument("--" + option, type=type(default), default=default)
        self.name, self.options = name, parser.parse_args()
        load(os.path.join(os.path.dirname(self.options.tarvellab), "tests/describe"))
        self.long, self.random = self.options.long, random.Random(self.options.seed)
        self.runs = self.faults = self.findings = 0
        self.children = []
        atexit.register(self.end_children)
        self.directory = tempfile.TemporaryDirectory(prefix="torture")
        print(f"seed {self.options.seed}")

    def end_children(self):
        for child in self.children:
            if child.poll() is None:
                child.kill()
                child.wait()

    def start(self, command, **options):
        """Starts a program that does not outlive the test."""
        self.children.append(subprocess.Popen(command, **options))
        return self.children[-1]

    def make_kernel(self, *sizes):
        root = tempfile.mkdtemp(dir=self.directory.name)
        subprocess.run([self.options.tarvellab, "generate", root, *map(str, sizes)], check=True)
        return Kernel(root)

    def name_services(self, **answers):
        """The environment of a program that asks name services of ours."""
        sanitizer = os.environ.get("ASAN_OPTIONS", "") + ":verify_asan_link_order=0"
        return {"LD_PRELOAD": self.options.name_services, "ASAN_OPTIONS": sanitizer, **answers}

    def run(self, kernel, line, program=None):
        """Runs tarvelctl, or another program in its place, given as words."""
        self.runs += 1
        try:
            done = subprocess.run([*(program or [self.options.tarvelctl]), *line.split()], env=kernel.environment, stdin=subprocess.DEVNULL,
                                  capture_output=True, timeout=60)
        except subprocess.TimeoutExpired:
            return Result(b"", b"", "does not end")
        return Result(done.stdout, done.stderr, done.returncode)

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
        self.directory.cleanup()
        print(f"{self.name}: {self.runs} runs, {self.faults} faults injected, {self.findings} findings")
        sys.exit(self.findings > 0)
