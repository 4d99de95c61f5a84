"""Reads the tables of a kernel directory and runs the lab."""
import os
import pathlib
import resource
import shutil
import subprocess
import sys
import tempfile
import time
import unittest

import records

lab = sys.argv.pop(1)  # the program to test
records.load(lab)
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


class Kernel:
    def __init__(self, root):
        self.root = pathlib.Path(root)

    def table(self, name):
        return (self.root / node_dir / name).read_bytes()

    def records(self, name):
        return records.walk(name, self.table(name))

    def channels(self):
        return [channel for group in self.records("nexus_channel_list") for channel in group["channels"]]

    def pids(self):
        return {record.value(row, at) for name in records.TABLES for record in self.records(name) for row, at in record.find("kind", "pid")}


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
