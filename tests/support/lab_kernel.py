"""Reads the tables of a kernel directory by the offsets of their formats, and runs the lab."""
import os
import pathlib
import resource
import shutil
import struct
import subprocess
import sys
import tempfile
import time
import unittest

lab = sys.argv.pop(1)  # the program to test
node_dir = "proc/sys/kern/tarvel/"
none = 0xFFFFFFFF  # in place of an index


def run(*words, **options):
    options.setdefault("env", {k: v for k, v in os.environ.items() if k != "TARVEL_ROOT"})
    return subprocess.run([lab, *map(str, words)], capture_output=True, text=True, timeout=100, **options)


def limit_files(size):
    """For a process that is about to start: no file grows beyond a size."""
    resource.setrlimit(resource.RLIMIT_FSIZE, (size, resource.RLIM_INFINITY))


def u32(record, at):
    return struct.unpack_from("<I", record, at)[0]


def u64(record, at):
    return struct.unpack_from("<Q", record, at)[0]


def text(record, at, width):
    return record[at:at + width].split(b"\0")[0].decode()


def files(root):
    return {str(p.relative_to(root)): p.read_bytes() for p in sorted(pathlib.Path(root).rglob("*")) if p.is_file()}


class Kernel:
    def __init__(self, root):
        self.root = pathlib.Path(root)

    def table(self, name):
        return (self.root / node_dir / name).read_bytes()

    def records(self, name, size):
        table = self.table(name)
        assert len(table) % size == 0, f"{name}: {len(table)} bytes"
        return [table[i:i + size] for i in range(0, len(table), size)]

    def chains(self, name, head_size, count_at, item_size):
        """Records with so many items behind each, as (head, items)."""
        table, at = self.table(name), 0
        while at < len(table):
            head, at = table[at:at + head_size], at + head_size
            end = at + item_size * (head[count_at] if name == "stats/netns" else u32(head, count_at))
            yield head, [table[i:i + item_size] for i in range(at, end, item_size)]
            at = end
        assert at == len(table)

    def providers(self):
        return list(self.chains("nexus_provider_list", 264, 256, 16))

    def channels(self):
        """(nexus, entry, rings) of each channel; a nexus without any is (nexus, None, [])."""
        table, at = self.table("nexus_channel_list"), 0
        while at < len(table):
            nexus, count, at = table[at:at + 16], u32(table, at + 16), at + 24
            if not count:
                yield nexus, None, []
            for _ in range(count):
                entry, at = table[at:at + 48], at + 48
                end = at + 184 * (u32(entry, 32) + u32(entry, 36))
                yield nexus, entry, [table[i:i + 184] for i in range(at, end, 184)]
                at = end
        assert at == len(table)

    def flows(self):
        return self.records("stats/flow", 320)

    def pids(self):
        yield from (u32(entry, 20) for _, entry, _ in self.channels() if entry)
        for name, size, at, count in (("flow", 320, 68, 1), ("flow_owner", 128, 68, 1), ("userstack", 2496, 32, 1),
                                      ("arena", 2608, 2576, 8)):
            for record in self.records("stats/" + name, size):
                yield from struct.unpack_from(f"<{count}I", record, at)


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
