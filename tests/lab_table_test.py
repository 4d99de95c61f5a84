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
from lab_kernel import LabTest, files, limit_files, node_dir, none, run  # noqa: E402


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
            self.assertEqual(kernel.table("stats/flow"), b"", size)
            self.check_references(kernel)

    def check_references(self, kernel):
        groups, lists = kernel.records("nexus_channel_list"), kernel.records("stats/flow_adv")
        instances = [instance["uuid"] for provider in kernel.records("nexus_provider_list") for instance in provider["instances"]]
        ports = {(group["nexus_uuid"], channel["port"]): channel for group in groups for channel in group["channels"]}
        self.assertEqual(instances, [group["nexus_uuid"] for group in groups])
        advisories = {(each["sfa_nx_uuid"], index): entry for each in lists for index, entry in enumerate(each["entries"])}
        taken, moved = set(), collections.Counter()
        for flow in kernel.records("stats/flow"):
            nexus, port, advisory = flow["sf_nx_uuid"], flow["sf_nx_port"], flow["sf_adv_idx"]
            self.assertEqual(ports[nexus, port]["pid"], flow["sf_pid"])
            self.assertGreaterEqual(port, 2)
            moved[nexus, port] += flow["sf_lstats.bytes"]
            if advisory != none:
                self.assertNotIn((nexus, advisory), taken)
                self.assertEqual(advisories[nexus, advisory]["sfae_flags"] & 1, 1)
                taken.add((nexus, advisory))
        for place, channel in ports.items():
            self.assertGreaterEqual(sum(ring["xfer.bytes"] for ring in channel["tx"]), moved[place])
        for owner in kernel.records("stats/flow_owner"):
            self.assertEqual(ports[owner["sfo_nx_uuid"], owner["sfo_nx_port"]]["pid"], owner["sfo_pid"])
        for pid in kernel.pids():
            self.assertTrue(pid == 0 or (kernel.root / f"proc/{pid}/comm").is_file(), pid)

    def test_EveryStateClassAndFamilyAppears(self):
        for seed in range(1, 6):
            flows = self.generate("--seed", seed).records("stats/flow")
            self.assertEqual({f["sf_lstats.state"] for f in flows}, {*range(11), 20, 21, 22}, seed)
            self.assertEqual(len({f["sf_svc"] for f in flows}), 10, seed)
            self.assertEqual({(f["sf_local.family"], f["sf_protocol"]) for f in flows}, {(2, 6), (2, 17), (30, 6), (30, 17)}, seed)
            scopes = [(f["sf_local.ipv6"][2:4], f["sf_remote.ipv6"][2:4]) for f in flows if f["sf_local.ipv6"][:2] == b"\xfe\x80"]
            self.assertTrue(scopes and all(local == remote != b"\0\0" for local, remote in scopes), seed)
            self.assertTrue(all(f["sf_lstats.rtt"] == 0 for f in flows if f["sf_protocol"] == 17))

    def test_FieldsHoldWhatBelongsThere(self):
        kernel = self.generate("--rings", 3)
        providers = kernel.records("nexus_provider_list")
        fields = "name", "name_length", "type", "subtype", "tx_rings", "rx_rings", "buf_size"
        self.assertEqual([providers[0][field] for field in fields], ["com.example.multistack.en0", 26, 3, 1, 2, 1, 2048])
        self.assertEqual({provider["type"] for provider in providers}, {0, 1, 2, 3})
        self.assertIn(1, {provider["flags"] for provider in providers})
        self.assertEqual(kernel.table("ring_stat_enable"), b"\1")
        self.assertEqual([[ring["ring_id"] for ring in kernel.channels()[0][way]] for way in ("tx", "rx")], [[0, 1], [0]])
        flow = kernel.records("stats/flow")[0]
        self.assertEqual((flow["sf_if_name"], flow["sf_proc_name"]), ("en0", "browser"))
        self.assertEqual({r["name"] for r in kernel.records("stats/net_if")}, {"en0", "en1", "en2"})
        self.assertEqual({r["name"] for r in kernel.records("stats/flow_switch")}, {"en0", "en1", "bridge0"})
        for stack in kernel.records("stats/userstack"):  # IP and IPv6 carry what TCP and UDP deliver
            self.assertEqual(stack["ip"][15] + stack["ip6"][11], stack["tcp"][15] + stack["udp"][9])
        for route in kernel.records("stats/flow_route"):
            self.assertEqual(route["sfr_local.family"], route["sfr_remote.family"])
        namespaces = [(each["address_length"], each["protocol"]) for each in kernel.records("stats/netns")]
        self.assertEqual(namespaces[:4], [(0, 6), (0, 17), (4, 6), (4, 17)])

    def test_SharedRegionsAreTheSameInAllArenas(self):
        regions, shared = {}, 0
        for region in (region for arena in self.generate().records("stats/arena") for region in arena["regions"]):
            if region["seg_count"]:
                held, shared = region.table[region.at:region.end], shared + (region["region_uuid"] in regions)
                self.assertEqual(regions.setdefault(region["region_uuid"], held), held)
                self.assertLessEqual(region["seg_in_use"], region["seg_count"])
                self.assertEqual(region["mem_total"], region["seg_count"] * region["seg_size"])
                self.assertLessEqual(region["obj_count_req"], region["obj_count"])
        self.assertGreater(shared, 5)

    def test_SizesAreKeptToTheLastRecord(self):
        kernel = self.generate("--providers", 30, "--nexuses", 77, "--channels", 500, "--flows", 4000, "--stacks", 90,
                               "--arenas", 41, "--namespaces", 25, "--rings", 0)
        self.assertEqual(sum(len(provider["instances"]) for provider in kernel.records("nexus_provider_list")), 77)
        self.assertEqual(len(kernel.channels()), 500)
        for table, count in ("nexus_provider_list", 30), ("stats/flow", 4000), ("stats/userstack", 90), ("stats/arena", 41), ("stats/netns", 25):
            self.assertEqual(len(kernel.records(table)), count)
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
