#!/usr/bin/env python3
"""Runs every command, once and as a watch, while its tables are replaced all the time and processes end and start.

Each table changes between a few known versions, so what is shown must be one of the reports of these: of one version
for a command that reads one table, of any combination for one that reads several, of any pair for the channels of a
watch. Only names of processes that have ended may be unknown. Then every command runs on a kernel that a simulation
moves, where nothing is amiss at any time, and reading a table gives whole records.
"""
import itertools
import multiprocessing
import os
import re
import shutil
import signal
import tempfile

from driver import Driver
from records import TABLES, Kernel
from runs import Run, TIME, tarvelctl, tarvellab

TREE = "nexus_provider_list", "nexus_channel_list", "stats/flow"
COMMANDS = {"channel": TREE[1:2], "flow": TREE[2:], "flow-adv": ["stats/flow_adv"], "flow-owner": ["stats/flow_owner"],
            "flow-route -n": ["stats/flow_route"], "flow-switch": ["stats/flow_switch"], "memory": ["stats/arena"],
            "interface": ["stats/net_if"], "netns -a": ["stats/netns"], "netstat -s": ["stats/userstack"],
            "netstat -an --netif": ["stats/flow", "stats/net_if"], "provider -D": TREE[:1], "show": TREE, "tree": TREE}


def plain(report, names):
    """A report without times and names of processes, and what their length moves."""
    named = "|".join(['"proc_name":.*', "<unknown>", *map(re.escape, names)])
    return re.sub(" +", " ", re.sub(named, "process", TIME.sub("", report)))


def swap(root, versions):
    """Replaces every table by that of another version, over and over; processes end and start."""
    processes = itertools.cycle(list(root.glob("proc/*/comm")))
    for version, table in itertools.cycle(itertools.product(versions, TABLES)):
        os.link(version.path(table), root / "new")
        os.rename(root / "new", Kernel(root).path(table))
        process = next(processes)
        ended = process.with_name("ended")
        os.rename(*((ended, process) if ended.exists() else (process, ended)))


class Moments(Driver):
    def __init__(self):
        super().__init__(__doc__)
        sizes = "--providers", 3, "--channels", 12, "--flows", 25, "--arenas", 3, "--stacks", 6, "--namespaces", 4
        self.versions = [self.make_kernel("--seed", seed, *sizes) for seed in range(3)]
        self.kernel = self.make_kernel()
        for comm in (comm for each in self.versions for comm in each.root.glob("proc/*/comm")):
            self.kernel.process(comm.parent.name, comm.read_text().strip())
        self.names = sorted({comm.read_text().strip() for comm in self.kernel.root.glob("proc/*/comm")}, key=len)[::-1]
        self.known = {command: self.reports(command, tables) for command, tables in COMMANDS.items()}
        self.pairs = self.channel_pairs()

    def reports(self, command, tables):
        """What a command may show: of each table any version."""
        found = set()
        for versions in itertools.product(self.versions, repeat=len(tables)):
            for table, version in zip(tables, versions):
                self.kernel.put(table, version.table(table))
            seen = self.run(self.kernel, command)
            found.add((plain(seen.out, self.names), seen.err, seen.status))
        return found

    def channel_pairs(self):
        """The listings of a watch, between any two snapshots."""
        watches, table = [], "nexus_channel_list"
        for before, after in itertools.product(self.versions, repeat=2):
            kernel = Kernel(shutil.copytree(self.kernel.root, tempfile.mkdtemp(dir=self.directory), dirs_exist_ok=True))
            kernel.put(table, before.table(table))
            watches.append((Run([tarvelctl, "-w", "1", "channel"], kernel), kernel, after.table(table)))
        for watch, kernel, after in watches:
            watch.wait("\n", 2)  # behind the heading, which is written when the first snapshot has been read
            kernel.put(table, after)
        return {self.listings(watch)[0] for watch, *_ in watches if watch.wait("\n\n\n") is None}

    def listings(self, watch):
        """Ends a watch. Returns the listings that are whole."""
        seen = watch.end(signal.SIGINT)
        said = seen.err.replace("orphan flow orphan nx_uuid", "")  # of tables that do not belong together
        self.expect("a watch", "its end", (said, seen.status), ("", 0))
        listings = seen.out.split("\n\n\n") if "Ring " in seen.out else TIME.split(seen.out)[1:]
        return [plain(each, self.names).strip("\n") for each in listings[:-1]]

    def check_swapped(self, turns):
        swapping = multiprocessing.Process(target=swap, args=(self.kernel.root, self.versions), daemon=True)
        swapping.start()
        watches = {command: Run([tarvelctl, "-w", "1", *command.split()], self.kernel) for command in COMMANDS}
        seen_of = {command: set() for command in COMMANDS}
        for command in [*COMMANDS] * turns:
            seen = self.run(self.kernel, command)
            report = plain(seen.out, self.names), seen.err, seen.status
            seen_of[command].add(report)
            self.faults += 1
            if report not in self.known[command]:
                self.expect(command, "while tables are replaced", report, "a report of whole tables")
        for command, seen in seen_of.items():
            self.expect(command, "how many reports were seen, at least", min(len(seen), 2), 2)
        for command, watch in watches.items():
            watch.wait("\n\n\n" if command == "channel" else "\n\n2", 2)
            known = self.pairs if command == "channel" else {out.strip("\n") for out, _, _ in self.known[command]}
            for listing in self.listings(watch):
                if listing not in known and command != "memory":  # which remembers the regions of earlier runs
                    self.expect(f"-w 1 {command}", "while tables are replaced", listing, "a report of whole tables")
        self.expect("what replaces tables", "its end", swapping.exitcode, None)
        swapping.kill()
        swapping.join()

    def check_simulated(self, turns):
        kernel = Kernel(tempfile.mkdtemp(dir=self.directory))
        simulation = Run([tarvellab, "simulate", str(kernel.root), "--seed", "1", "--flows", "300", "--channels", "60",
                          "--interval", "10"], kernel)
        simulation.wait("\n")
        for command in [*COMMANDS] * turns:
            seen = self.run(kernel, command)
            self.expect(command, "on a simulated kernel", (seen.err, seen.status), ("", 0))
            for table in TABLES:
                kernel.records(table)
        self.expect("tarvellab simulate", "SIGTERM", simulation.end(signal.SIGTERM)[1:], ("", 0))


def main():
    moments = Moments()
    moments.check_swapped(2000 if moments.long else 25)
    moments.check_simulated(500 if moments.long else 4)
    moments.end()


if __name__ == "__main__":
    main()
