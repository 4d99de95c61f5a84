"""What tests of the lab share: running it, and the kernels that it makes."""
import os
import pathlib
import resource
import shutil
import subprocess
import sys
import tempfile
import time
import unittest

from records import Kernel, load

lab = sys.argv.pop(1)  # the program to test
load(pathlib.Path(lab).with_name("tests") / "describe")
node_dir = "proc/sys/kern/tarvel/"
none = 0xFFFFFFFF  # in place of an index


def run(*words, **options):
    options.setdefault("env", {k: v for k, v in os.environ.items() if k != "TARVEL_ROOT"})
    return subprocess.run([lab, *map(str, words)], capture_output=True, text=True, timeout=100, **options)


def limit_files(size):
    """For a process that is about to start: no file grows beyond a size."""
    resource.setrlimit(resource.RLIMIT_FSIZE, (size, resource.RLIM_INFINITY))


def files(root):
    return {str(p.relative_to(root)): p.read_bytes() for p in sorted(pathlib.Path(root).rglob("*")) if p.is_file()}


class LabTest(unittest.TestCase):
    def setUp(self):
        self.directory = pathlib.Path(tempfile.mkdtemp(prefix="lab_test"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)

    def generate(self, *options, name="made"):
        made = run("generate", self.directory / name, *options)
        self.assertEqual((made.returncode, made.stderr), (0, ""))
        return Kernel(self.directory / name)

    def start(self, *words, **options):
        """Returns the lab, running, and the first line that it prints."""
        process = subprocess.Popen([lab, *words], stdout=subprocess.PIPE, text=True, **options)
        for clean_up in process.stdout.close, process.wait, process.kill:
            self.addCleanup(clean_up)
        return process, process.stdout.readline().strip()

    def wait_for(self, condition, seconds=10):
        end = time.monotonic() + seconds
        while not (found := condition()) and time.monotonic() < end:
            time.sleep(0.01)
        self.assertTrue(found)
        return found
