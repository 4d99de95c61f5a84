#!/usr/bin/env python3
"""Runs every command, once and as a watch, on simulated kernels whose tables change all the time.

Nothing that changes between two system calls may show: a report follows its grammar to its end, nothing is said on
standard error, and the status is 0. Only names of processes that have ended may be unknown. One kernel has another
beside it, whose objects must not appear. Two are moved by two simulations at once, and by a loop that swaps files: there
flows may be orphans.
"""
import itertools
import json
import multiprocessing
import os
import pathlib
import re
import signal
import subprocess
import sys
import tempfile
import time

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from torture import Kernel, Torture  # noqa: E402

UUID = r"[0-9A-F]{8}(?:-[0-9A-F]{4}){3}-[0-9A-F]{12}"
NAME, PROCESS, NETIF, INDEX, UNITS = r"[\w.-]+", r"(?:[\w-]+|<unknown>)\.-?\d+", r"[a-z]+\d+", r"(?:\d+|-)", r"[\d.]+[KMGT]?"
COUNTERS, KB = r"(?:\t\t[\w$]+ *: \d+\n)*", r"\d+ KB"
RTT = r"(?: *\d+\.\d\d ms| {10})(?: *\d+\.\d\d ms| {12})"
FLOWS = (r"Proto Local Address.* Process\.PID\n"
         rf"(?: (?:tcp|udp)[46] \S+ +\S+(?: +\d+){{4}} +[A-Z]+ +{NETIF} +{INDEX} +{INDEX} +[a-z-]{{13}}  "
         rf"[A-Z_12]+ +[A-Z_12]+ +{RTT} {INDEX} +{PROCESS}\n)+")
RING = rf"[TR]X\[\d+\](?: +{UNITS}){{9,10}}\n +\S+/\S+(?: +{UNITS}){{9,10}}\n(?: +Errors:(?: [A-Z][a-z ]+: {UNITS})+\n)?"
CHANNEL = rf"\tPort\[ ?\d+\] {PROCESS} +\(fd \d+\)\t(?: flags=[0-9a-f]+<[A-Z_,]+>)?\n(?:Ring .*\n Mem .*\n)?(?:{RING})*\n"
SHOW = rf"(?:flow-switch {UUID} {NAME}\n(?:\tPort\[ ?\d+\] {PROCESS} *(?:defunct)?\n(?:\t\t \S+\.\d+ <-> \S+\.\d+\n)*)*)+"
REGION = (rf" *[A-Z]+ region:  {NAME}\n *allocs:  \d+\n *frees:  \d+\n *rescales:  \d+\n"
          r" *mode:  0x[0-9a-f]+<[A-Z,]*>\n *objs:  \d+ per segment\n"
          r" objs cnt\*size:  \d+\*\d+ -> \d+\*\d+ \(\d+\.\d\d% inflation\)\n *segsize:  \d+ -> \d+ \(\d+\.\d\d% inflation\)\n"
          rf" *segments:  \d+/\d+ \(\d+\.\d\d% in use\)\n *(?:wired )?memory:  {KB}\n")
ARENA = (rf"={{70}}\n *[A-Z]+ arena:  {NAME}\n(?: +{PROCESS}\n){{0,8}}={{70}}\n(?:{REGION} +\|\n)*{REGION}"
         rf"-{{70}}\n +TOTAL:  {KB}(?: \(wired {KB}\))?\n-{{70}}\n\n")
NEXUS = rf"\tNexus UUID: {UUID}\n\tNetif     : {NETIF}\n"
MAC = r"(?:[0-9a-f]{2}(?::[0-9a-f]{2}){5}|-)"
STACK = "".join(rf"\t{protocol}:\n{COUNTERS}" for protocol in ("ip", "ip6", "tcp", "udp"))
TREE = object()
GRAMMARS = {
    "channel": rf"Instances: \d+\n(?:\d+\. {UUID}\n(?:{CHANNEL})*)+\n",
    "flow": FLOWS,
    "flow-adv": rf"(?: - {PROCESS}\n{NEXUS}\tFlowAdvIdx .*Flags\n(?:\t    \[ *\d+\] : {UUID} flags=[0-3]<[A-Z,]*>\n)*)+",
    "flow-owner": rf"NetIf .* Process\n(?:{NETIF} +\d+ +(?:PID-Bound)? +(?:Destroyed)? +\d+ +[\w-]+\(\d+\)\n)+",
    "flow-route -n": rf"Local Address .* Flags\n(?:\S+ +\S+ +\S+ +{MAC} +{NETIF} +\d+ +-?\d+ +\d+ +\d+  [ogrid-]{{5}}\n)+",
    "flow-switch": rf"flowswitch:\n(?: - \w+ +{UUID}\n{COUNTERS})+",
    "interface": rf"netif:\n(?: - {NETIF} +{UUID}\n{COUNTERS})+",
    "memory": (rf"(?:{ARENA})+\+{{70}}\n Tarvel .*\n\+{{70}}\n +Total +Wired\n(?: *[A-Z]+: +{KB} +{KB}\n){{12}}"
               r"-{70}\n +TOTAL: +[\d.]+ MB +[\d.]+ MB\n-{70}\n"),
    "netns -a": (r"(?:(?:tcp|udp) port reservations for (?:global namespace|\S+)\n"
                 r" +PORT\(S\) .*\n(?: *\d+(?:-\d+)?(?: +\d+){3}\n)*-{44}\n)+"),
    "netstat -an": FLOWS,
    "netstat -s": rf"(?: - (?:<Closed Port Stats>|{PROCESS})\n{NEXUS}{STACK})+",
    "netstat -s --global --netif --flowswitch": rf"{STACK}netif:\n{COUNTERS}flowswitch:\n{COUNTERS}",
    "provider -D": rf"(?:[a-z-]+(?: \([a-z]+\))? {NAME} {UUID}(?: \[anon\])?\n\trings: .* mhints \d+\n(?:\tinstance {UUID}\n)*)+",
    "show": SHOW, "channel-stats": SHOW, "tree": TREE,
}
HEADING = r"\n\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\n"
GRAMMARS = {command: grammar if grammar is TREE else re.compile(grammar) for command, grammar in GRAMMARS.items()}
SIZES = "--flows", "300", "--channels", "60", "--interval", "10"


def follows(report, command):
    if GRAMMARS[command] is not TREE:
        return bool(GRAMMARS[command].fullmatch(report))
    try:
        tree = json.loads(report)
    except ValueError:
        return False
    kinds = ["root", "nexus_provider", "nexus", "channel", "flow"]

    def fits(node, level):
        return node["type"] == kinds[level] and all(fits(child, level + 1) for child in node["children"])
    return fits(tree, 0)


def swap(root, versions):
    """Replaces every table by that of another version, over and over, faster than a simulation can; processes end and start."""
    tables = [path.relative_to(root) for path in root.glob("proc/sys/**/*") if path.is_file()]
    processes = itertools.cycle(list(root.glob("proc/*/comm")))
    for version in itertools.cycle(versions):
        for table in tables:
            os.link(version / table, root / "new")
            os.rename(root / "new", root / table)
        process = next(processes)
        ended = process.with_name("ended")
        os.rename(*((ended, process) if ended.exists() else (process, ended)))


class Race(Torture):
    def __init__(self):
        super().__init__("race", __doc__)
        self.simulations = []
        self.alone, self.beside, self.twice = (self.simulate(*seeds) for seeds in ((1,), (2,), (3, 4)))
        self.fast = self.make_kernel()
        sizes = [self.make_kernel("--flows", flows, "--channels", flows, "--arenas", flows) for flows in (30, 60)]
        self.swapping = multiprocessing.Process(target=swap, args=(self.fast.root, [size.root for size in sizes]), daemon=True)
        self.swapping.start()
        own = {kernel: set(re.findall(UUID, self.run(kernel, "provider").out.decode())) for kernel in (self.alone, self.beside)}
        self.foreign = {self.alone: own[self.beside], self.beside: own[self.alone], self.twice: set(), self.fast: set()}

    def simulate(self, *seeds):
        root = tempfile.mkdtemp(dir=self.directory.name)
        for seed in seeds:
            process = self.start([self.options.tarvellab, "simulate", root, "--seed", str(seed), *SIZES], stdout=subprocess.PIPE)
            process.stdout.readline()
            self.simulations.append(process)
        return Kernel(root)

    def check(self, kernel, command, fault, reports, errors, status):
        errors = errors.replace(b"orphan flow orphan nx_uuid", b"") if kernel in (self.twice, self.fast) else errors
        self.expect(command, fault, (errors, status), (b"", 0))
        for report in reports:
            if not follows(report, command):
                self.expect(command, fault, report, "a report that follows its grammar")
            self.expect(command, fault, self.foreign[kernel] & set(re.findall(UUID, report)), set())

    def start_watches(self):
        for command in GRAMMARS:
            file = tempfile.TemporaryFile()
            yield command, file, self.start([self.options.tarvelctl, "-w", "1", *command.split()], env=self.alone.environment,
                                            stdout=file, stderr=subprocess.PIPE)

    def end_watches(self, watches):
        for command, file, process in watches:
            process.send_signal(signal.SIGINT)
            errors = process.communicate()[1]
            file.seek(0)
            text = file.read().decode()
            if command == "channel":
                text = text.replace("\n\nInstances", "\n\n\0Instances")
            _, *reports = re.split("\0" if command == "channel" else HEADING, text)
            self.runs += len(reports)
            self.expect(command, "a watch", len(reports) > 1, True)
            self.check(self.alone, command, "a watch", reports[:-1], errors, process.returncode)  # the last one may be cut


def main():
    race = Race()
    watches = list(race.start_watches())
    end = time.monotonic() + (600 if race.long else 8)
    while time.monotonic() < end:
        for kernel in race.alone, race.beside, race.twice, race.fast:
            for command in GRAMMARS:
                before = kernel.path("stats/flow").stat().st_ino
                seen = race.run(kernel, command)
                race.faults += kernel.path("stats/flow").stat().st_ino != before
                race.check(kernel, command, "the tables change", [seen.out.decode()], seen.err, seen.status)
    race.end_watches(watches)
    race.expect("swap", "at the end", race.swapping.exitcode, None)
    race.swapping.kill()
    race.swapping.join()
    for process in race.simulations:
        race.expect("tarvellab simulate", "others read and write, too", process.poll(), None)
        process.terminate()
        race.expect("tarvellab simulate", "SIGTERM", process.wait(), 0)
    race.end()


if __name__ == "__main__":
    main()
