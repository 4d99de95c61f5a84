#!/usr/bin/env python3
"""Tests of what the lab's tables hold.

usage: lab_table_test.py TARVELLAB [unittest options]
"""
import collections
import functools
import os
import pathlib
import shutil
import sys
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from lab_kernel import LabTest, files, limit_files, node_dir, none, run, text, u32, u64  # noqa: E402


class Generate(LabTest):
    def test_SameSeedSameBytesAnotherSeedOthers(self):
        made, again, other = (files(self.generate("--seed", seed, name=name).root) for seed, name in ((7, "a"), (7, "b"), (8, "c")))
        self.assertEqual(made, again)
        self.assertNotEqual(made, other)

    def test_ReferencesBetweenTablesHold(self):
        for options in ((), ("--flows", 3000), ("--channels", 400, "--nexuses", 60), ("--processes", 1)):
            self.check_references(self.generate(*options))
        for size in "providers", "nexuses", "channels", "processes":  # nothing stands on nothing
            kernel = self.generate("--" + size, 0)
            self.assertEqual(kernel.flows(), [], size)
            self.check_references(kernel)

    def check_references(self, kernel):
        instances = [i for _, items in kernel.providers() for i in items]
        ports = {(nexus, u32(e, 28)): e for nexus, e, _ in kernel.channels() if e}
        self.assertEqual(instances, list(dict.fromkeys(nexus for nexus, _, _ in kernel.channels())))
        lists = {head[:16]: items for head, items in kernel.chains("stats/flow_adv", 40, 36, 20)}
        taken, moved = set(), collections.Counter()
        for flow in kernel.flows():
            nexus, port, advisory = flow[:16], u32(flow, 76), u32(flow, 144)
            self.assertEqual(u32(ports[nexus, port], 20), u32(flow, 68))
            self.assertGreaterEqual(port, 2)
            moved[nexus, port] += u64(flow, 152)
            if advisory != none:
                self.assertNotIn((nexus, advisory), taken)
                self.assertEqual(u32(lists[nexus][advisory], 16) & 1, 1)
                taken.add((nexus, advisory))
        for nexus, entry, rings in kernel.channels():
            if entry:
                sent = sum(u64(ring, 16) for ring in rings[:u32(entry, 32)])
                self.assertGreaterEqual(sent, moved[nexus, u32(entry, 28)])
        for owner in kernel.records("stats/flow_owner", 128):
            self.assertEqual(u32(ports[owner[:16], u32(owner, 72)], 20), u32(owner, 68))
        for pid in kernel.pids():
            self.assertTrue(pid == 0 or (kernel.root / f"proc/{pid}/comm").is_file(), pid)

    def test_EveryStateClassAndFamilyAppears(self):
        for seed in range(1, 6):
            flows = self.generate("--seed", seed).flows()
            self.assertEqual({u32(f, 168) for f in flows}, {*range(11), 20, 21, 22}, seed)
            self.assertEqual(len({u32(f, 140) for f in flows}), 10, seed)
            self.assertEqual({(f[81], f[136]) for f in flows}, {(2, 6), (2, 17), (30, 6), (30, 17)}, seed)
            local = [f for f in flows if f[81] == 30 and f[88:90] == b"\xfe\x80"]
            self.assertTrue(local and all(f[90:92] != b"\0\0" and f[90:92] == f[118:120] for f in local), seed)
            self.assertTrue(all(u32(f, 172) == 0 for f in flows if f[136] == 17))

    def test_FieldsStandWhereTheFormatsHaveThem(self):
        kernel = self.generate("--rings", 3)
        head, items = kernel.providers()[0]
        self.assertEqual((text(head, 64, 64), u32(head, 128)), ("com.example.multistack.en0", 26))
        self.assertEqual([u32(head, at) for at in (132, 184, 256, 152, 156, 168)], [3, 1, len(items), 2, 1, 2048])
        self.assertEqual({u32(h, 132) for h, _ in kernel.providers()}, {0, 1, 2, 3})
        self.assertIn(1, {u32(h, 144) for h, _ in kernel.providers()})
        self.assertEqual(kernel.table("ring_stat_enable"), b"\1")
        _, _, rings = next(kernel.channels())
        self.assertEqual([u32(ring, 0) for ring in rings], [0, 1, 0])
        flow = kernel.flows()[0]
        self.assertEqual((text(flow, 16, 16), text(flow, 36, 32)), ("en0", "browser"))
        self.assertEqual({text(r, 16, 16) for r in kernel.records("stats/net_if", 320)}, {"en0", "en1", "en2"})
        self.assertEqual({text(r, 16, 16) for r in kernel.records("stats/flow_switch", 448)}, {"en0", "en1", "bridge0"})
        for stack in kernel.records("stats/userstack", 2496):  # IP and IPv6 carry what TCP and UDP deliver
            self.assertEqual(u64(stack, 48 + 8 * 15) + u64(stack, 400 + 8 * 11), u64(stack, 688 + 8 * 15) + u64(stack, 2320 + 8 * 9))
        for route in kernel.records("stats/flow_route", 256):
            self.assertEqual(route[73], route[101])
        namespaces = [tuple(head[16:18]) for head, _ in kernel.chains("stats/netns", 32, 18, 32)]
        self.assertEqual(namespaces[:4], [(0, 6), (0, 17), (4, 6), (4, 17)])

    def test_SharedRegionsAreTheSameInAllArenas(self):
        regions, shared = {}, 0
        for arena in self.generate().records("stats/arena", 2608):
            for region in (arena[80 + 208 * i:288 + 208 * i] for i in range(12)):
                if u64(region, 104):
                    shared += region[64:80] in regions
                    self.assertEqual(regions.setdefault(region[64:80], region), region)
                    self.assertLessEqual(u64(region, 176), u64(region, 104))
                    self.assertEqual(u64(region, 152), u64(region, 104) * u64(region, 96))
                    self.assertLessEqual(u64(region, 120), u64(region, 136))
        self.assertGreater(shared, 5)

    def test_SizesAreKeptToTheLastRecord(self):
        kernel = self.generate("--providers", 30, "--nexuses", 77, "--channels", 500, "--flows", 4000, "--stacks", 90,
                               "--arenas", 41, "--namespaces", 25, "--rings", 0)
        self.assertEqual((len(kernel.providers()), sum(len(items) for _, items in kernel.providers())), (30, 77))
        self.assertEqual(sum(entry is not None for _, entry, _ in kernel.channels()), 500)
        self.assertEqual(len(kernel.flows()), 4000)
        self.assertEqual([len(kernel.records("stats/" + n, size)) for n, size in (("userstack", 2496), ("arena", 2608))], [90, 41])
        self.assertEqual(len(list(kernel.chains("stats/netns", 32, 18, 32))), 25)
        for size, table in ("arenas", "arena"), ("stacks", "userstack"), ("namespaces", "netns"):
            self.assertEqual(self.generate("--" + size, 0).table("stats/" + table), b"")

    def test_WrongWordsAreUsageErrors(self):
        for words in ("", "nothing", "generate", "generate a b", "generate a --flows", "generate a --flows -1",
                      "generate a --flows 1x", "generate a --flows 99999999999", "generate a --interval 50", "run",
                      "run --", "capture a --seed 1", "run a --flows 1 -- true", "simulate a --interval 0", "generate a --seed x",
                      "generate a --flows 10000001", "generate a --every 1", "generate a --count 1", "generate a --",
                      "capture a --count 2 --every", "generate a --redact", "generate --seed 1"):
            failed = run(*words.split(), cwd=self.directory)
            self.assertEqual((failed.returncode, failed.stdout), (64, ""), words)
        self.assertEqual(list(self.directory.iterdir()), [])

    def test_WhatCannotBeWrittenIsNamed(self):
        flow, comm, made = node_dir + "stats/flow", "proc/94/comm", self.directory / "made"
        link = functools.partial(os.symlink, "nowhere")
        for path, make, named, reason in (
                (flow, os.mkdir, "/" + flow, "Is a directory"), (comm, os.mkdir, "/" + comm, "Is a directory"),
                *(("/".join(path), make, "/".join(["", *path]), "Not a directory") for path in (["proc", "94"], ["proc"], [])
                  for make in (link, pathlib.Path.touch))):
            for command in "generate", "simulate":
                (made / path).parent.mkdir(parents=True, exist_ok=True)
                make(made / path)
                failed = run(command, made)
                self.assertEqual((failed.returncode, failed.stdout, failed.stderr), (1, "", f"tarvellab: {made}{named}: {reason}\n"))
                made.unlink() if made.is_file() or made.is_symlink() else shutil.rmtree(made)
        for size, named in (0, "proc/\\d+/comm"), (1000, node_dir + ".*"):
            failed = run("generate", made, preexec_fn=functools.partial(limit_files, size))
            self.assertEqual(failed.returncode, 1)
            self.assertRegex(failed.stderr, f"^tarvellab: {made}/{named}: File too large\n$")
            self.assertEqual([name for name in files(made) if "/." in name], [])
        for name in "/dev/null/a", "/proc/none/a":
            self.assertEqual(run("generate", name).returncode, 1)


if __name__ == "__main__":
    unittest.main()
