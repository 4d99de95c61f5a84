#!/usr/bin/env python3
"""generate, simulate and run: what tables hold and how they move, what a command gets, and what is left behind."""
import os
import pathlib
import pty
import resource
import shutil
import signal
import sys
import unittest

from records import TABLES
from runs import LabCase, build, files, generate, limit_files, remove, tarvellab, wait_for

NODES = "proc/sys/kern/tarvel/"
NONE = 0xFFFFFFFF  # in place of an index


def hidden(root):
    return [path for path in files(root) if "/." in path]


class Generate(LabCase):
    def test_SameSeedSameBytesAnotherSeedOthers(self):
        one, other = (files(generate(self.directory / str(seed), "--seed", seed).root) for seed in (7, 8))
        same = {path for path in one if NODES in path and one[path] == other[path]}
        self.assertEqual(same, {NODES + "ring_stat_enable"})
        for seed, made in (7, one), (8, other):  # nothing of what was there is left
            self.assertEqual(files(generate(self.kernel.root, "--seed", seed).root), made)

    def test_TablesAgree(self):
        for options in (("--rings", 3), ("--flows", 3000), ("--channels", 400, "--nexuses", 60), ("--processes", 1),
                        ("--providers", 2400, "--channels", 3000, "--flows", 3000)):
            self.check(generate(self.kernel.root, *options))
        for size in "providers", "nexuses", "channels", "processes":  # nothing stands on nothing
            kernel = generate(self.kernel.root, "--" + size, 0)
            self.assertEqual(kernel.table("stats/flow"), b"", size)
            self.check(kernel)

    def check(self, kernel):
        groups, providers, flows = map(kernel.records, ("nexus_channel_list", "nexus_provider_list", "stats/flow"))
        instances = [each["uuid"] for provider in providers for each in provider["instances"]]
        self.assertEqual(instances, [group["nexus_uuid"] for group in groups])
        for records in map(kernel.records, TABLES):
            named = {record.value(row, at) for record in records for row, at in record.find("name", "nexus")}
            self.assertLessEqual(named, {*instances})
        for pid in kernel.pids() - {0}:
            self.assertTrue((kernel.root / f"proc/{pid}/comm").read_text().endswith("\n"), pid)
        ports = {(group["nexus_uuid"], channel["port"]): channel for group in groups for channel in group["channels"]}
        advised = [(flow["sf_nx_uuid"], flow["sf_adv_idx"]) for flow in flows if flow["sf_adv_idx"] != NONE]
        self.assertEqual(sorted(advised), sorted(
            (each["sfa_nx_uuid"], index) for each in kernel.records("stats/flow_adv")
            for index, entry in enumerate(each["entries"]) if entry["sfae_flags"] & 1))
        moved = dict.fromkeys(ports, 0)
        for flow in flows:
            self.assertEqual(ports[flow["sf_nx_uuid"], flow["sf_nx_port"]]["pid"], flow["sf_pid"])
            moved[flow["sf_nx_uuid"], flow["sf_nx_port"]] += flow["sf_lstats.bytes"]
            local, remote = flow["sf_local.ipv6"], flow["sf_remote.ipv6"]  # on one link
            self.assertTrue(local[:2] != b"\xfe\x80" or local[:4] == remote[:4] and any(local[2:4]))
        homes = {(flow["sf_local.ipv4"], flow["sf_nx_uuid"]) for flow in flows if any(flow["sf_local.ipv4"])}
        self.assertEqual(len(homes), len(dict(homes)))  # an address belongs to one interface
        for place, channel in ports.items():
            self.assertGreaterEqual(sum(ring["xfer.bytes"] for ring in channel["tx"]), moved[place])
        for owner in kernel.records("stats/flow_owner"):
            self.assertEqual(ports[owner["sfo_nx_uuid"], owner["sfo_nx_port"]]["pid"], owner["sfo_pid"])
        regions = [each for arena in kernel.records("stats/arena") for each in arena["regions"] if each["seg_count"]]
        shared = {(each["region_uuid"], each.table[each.at:each.end]) for each in regions}
        self.assertEqual(len(shared), len({name for name, _ in shared}))

    def test_EveryValueWithANameAppears(self):
        kernel, seen = generate(self.kernel.root), {}
        for name in TABLES:
            for record in kernel.records(name):
                for row, at in record.find("kind", "enumeration"):
                    seen.setdefault((name, *row["values"]), set()).add(record.value(row, at))
        for (name, *values), found in seen.items():
            self.assertEqual(found, {*map(int, values)}, name)

    def test_WhatPassesASwitchPassesItsDevice(self):
        kernel = generate(self.kernel.root, "--rings", 4)
        interfaces = {each["name"]: each for each in kernel.records("stats/net_if")}
        switches = {each["nx_uuid"]: interfaces.get(each["name"]) for each in kernel.records("stats/flow_switch")}
        for group in kernel.records("nexus_channel_list"):
            for way, counter in ("tx", "TxPkt"), ("rx", "RxPkt"):
                slots, rates = ({port["port"]: sum(ring[what] for ring in port[way]) for port in group["channels"]}
                                for what in ("xfer.slots", "xfer.bytes_per_sec"))
                self.assertEqual(len({*slots.values()} - {0}), len(slots))  # each port has its own
                if interface := switches.get(group["nexus_uuid"]):
                    counted = interface["counters"][interface.fields["counters"]["names"].index(counter)]
                    self.assertEqual((slots[0], rates[0]), (counted, sum(rates.values()) - rates[0]))

    def test_SizesAreKeptToTheLastRecord(self):
        sizes = {"providers": (30, "nexus_provider_list"), "flows": (4000, "stats/flow"), "arenas": (41, "stats/arena"),
                 "namespaces": (25, "stats/netns"), "stacks": (90, "stats/userstack")}
        kernel = generate(self.kernel.root, "--nexuses", 77, "--channels", 500, "--processes", 50, "--rings", 0,
                          *(word for name in sizes for word in ("--" + name, sizes[name][0])))
        instances = sum(len(each["instances"]) for each in kernel.records("nexus_provider_list"))
        self.assertEqual((instances, len(kernel.channels()), len([*kernel.root.glob("proc/*/comm")])), (77, 500, 50))
        for name, (count, table) in sizes.items():
            empty = generate(self.directory / name, "--" + name, 0)
            self.assertEqual((len(kernel.records(table)), empty.table(table)), (count, b""))

    def test_WrongWordsAreUsageErrors(self):
        wrong = """
|nothing|run|run --|run a --flows 1 -- true|run a b -- true|generate|generate a b|generate ''|generate a --
|generate a --flows|generate a --flows -1|generate a --flows 1x|generate a --flows 10000001
|generate a --flows 99999999999|generate a --seed x|generate a --seed 18446744073709551616|generate a --rings 1025
|generate a --interval 50|generate a --every 1|generate a --count 1|generate a --redact|generate --seed 1
|simulate a --interval 9|simulate a --interval 3600001|simulate a --redact|capture|capture a b|capture a --seed 1
|capture --redact|capture --every 1 a|capture --count 2 a|capture a --count 2 --every|capture --every 1 --count 0 a
|capture --every 1 --count 10000001 a|capture --every 1 --count a"""
        seconds = "0", "0.009", "3600.01", "-1", "nan", "inf", "1e1", "1s", "''"
        for words in wrong.replace("\n", "").split("|") + [f"capture a --count 2 --every {each}" for each in seconds]:
            seen = self.lab(words)
            self.assertEqual((seen.out, seen.err[:7], seen.status), ("", "usage:\n", 64), words)
        self.assertEqual([path.name for path in self.directory.iterdir()], ["kernel"])
        for words in ("generate a --seed 0", "generate a --seed 18446744073709551615", "generate a --rings 1024",
                      "generate a --channels 0 --flows 10000000", "run --interval 3600000 -- true",
                      "capture b --every 0.01 --count 1", "capture c --every 3600 --count 10000000"):
            self.assertNotEqual(self.lab(words).status, 64, words)

    def test_WhatCannotBeWrittenIsNamed(self):
        made = self.kernel.root
        for path, make, reason in (
                (NODES + "stats/flow", os.mkdir, "Is a directory"), ("proc/94/comm", os.mkdir, "Is a directory"),
                *((path, make, "Not a directory") for path in ("proc/94", "proc", "")
                  for make in (pathlib.Path.touch, lambda place: place.symlink_to("nowhere")))):
            for command in "generate", "simulate":
                (made / path).parent.mkdir(parents=True, exist_ok=True)
                make(made / path)
                self.assertEqual(self.lab([command, made]), ("", f"tarvellab: {made / path}: {reason}\n", 1))
                self.assertEqual(hidden(made), [])
                remove(made)
        for size, path in (0, r"proc/\d+/comm"), (1000, NODES + ".*"):
            seen = self.lab(["generate", made], preexec_fn=lambda: limit_files(size))
            self.assertRegex(seen.err, f"^tarvellab: {made}/{path}: File too large\n$")
            self.assertEqual((seen.status, hidden(made)), (1, []))

    def test_WhatLiesInTheWayOfATemporaryFileStays(self):
        folder, flows = generate(self.kernel.root).path(""), self.kernel.table("stats/flow")

        def plant():  # without random numbers the name is known
            (folder / f".nexus_provider_list.{os.getpid()}").hardlink_to(folder / "stats/flow")
        seen = self.lab(["generate", self.kernel.root, "--seed", 2], preexec_fn=plant,
                        environment={"LD_PRELOAD": str(build / "tests/libno_entropy.so")})
        self.assertEqual(seen, ("", f"tarvellab: {folder}/nexus_provider_list: File exists\n", 1))
        self.assertEqual(self.kernel.table("stats/flow"), flows)


class Simulate(LabCase):
    def simulate(self, *options):
        run = self.start(["simulate", self.kernel.root, *options], tarvellab)
        run.wait(f"simulating in {self.kernel.root}\n")
        return run

    def test_ReadersMeetWholeTablesOnly(self):
        run, folder = self.simulate("--interval", 10, "--flows", 20000), self.kernel.path("stats")
        sizes, moments, names = set(), set(), set()

        def has_moved():
            moments.add((folder / "flow").stat().st_ino)
            sizes.add(len(self.kernel.records("stats/flow")))
            names.update(name for name in os.listdir(folder) if name.startswith(".flow."))
            [self.kernel.records(name) for name in ("nexus_provider_list", "nexus_channel_list", "stats/flow_adv")]
            return min(len(sizes), len(moments), len(names)) > 3  # no two new files have one name
        wait_for(has_moved)
        self.assertEqual((run.end(signal.SIGINT).status, hidden(self.kernel.root)), (0, []))
        self.assertTrue(all(10000 < size < 30000 for size in sizes))
        running = {int(path.parent.name) for path in self.kernel.root.glob("proc/*/comm")}
        self.assertLessEqual(self.kernel.pids() - {0}, running)

    def test_FlowsChangeAndRatesAreTheDifferencesOfSnapshots(self):
        run, snapshots, states = self.simulate("--interval", 200), [{}], {}

        def follow_each_other():
            """Whether the last two snapshots are one interval apart, and some flow has been established so far."""
            snapshots.append({(channel["channel_uuid"], way): channel[way][0]
                              for channel in self.kernel.channels() for way in ("tx", "rx")})
            for flow in self.kernel.records("stats/flow"):
                ends = "nx_uuid protocol local.ipv4 local.port remote.ipv4 remote.ipv6 remote.port".split()
                states.setdefault(tuple(flow["sf_" + end] for end in ends), set()).add(flow["sf_lstats.state"])
            before, now = snapshots[-2:]
            moved = {ring: now[ring]["xfer.bytes"] - before[ring]["xfer.bytes"] for ring in now.keys() & before.keys()}
            self.assertGreaterEqual(min(moved.values(), default=0), 0)
            return any({2, 4} <= each for each in states.values()) and sum(map(bool, moved.values())) > 30 and all(
                now[ring]["xfer.bytes_per_sec"] == moved[ring] * 5 for ring in moved)
        wait_for(follow_each_other)
        self.assertEqual(run.end(signal.SIGTERM).status, 0)

    def test_NothingMovesOnNothing(self):
        for size, table in ("flows", "stats/flow"), ("channels", "stats/flow"), ("providers", "nexus_provider_list"):
            run, path = self.simulate("--interval", 10, "--" + size, 0), self.kernel.path(table)
            first = path.stat().st_ino
            wait_for(lambda: path.stat().st_ino != first)
            self.assertEqual((self.kernel.table(table), run.end(signal.SIGTERM).status), (b"", 0))

    def test_EndsWhereItCannotGoOn(self):
        self.assertEqual(self.lab("simulate made", to="/dev/full"), ("", "write error: No space left on device\n", 74))
        run, proc = self.simulate("--interval", 10), self.kernel.root / "proc"
        proc.rename(self.directory / "gone")
        seen = run.end()
        self.assertEqual((seen.err.splitlines()[0], seen.status), (f"tarvellab: {proc}: No such file or directory", 1))


class Run(LabCase):
    def setUp(self):
        super().setUp()
        self.temporary = self.directory / "temporary"
        self.temporary.mkdir()
        self.addCleanup(self.wait_until_nothing_is_left)

    def run_lab(self, *words, program=tarvellab, **options):
        options["environment"] = {"TMPDIR": str(self.temporary), **options.get("environment", {})}
        return self.start(["run", *words], program, **{"cwd": self.directory, **options})

    def wait_until_nothing_is_left(self):
        mark = f"TMPDIR={self.temporary}"
        wait_for(lambda: not any(self.temporary.iterdir()) and mark not in
                 self.start(["-c", "cat /proc/[0-9]*/environ 2>&1"], "/bin/sh").end().out)

    def test_EndsAsTheCommandDid(self):
        def ignore():
            for number in signal.SIGCHLD, signal.SIGTERM:
                signal.signal(number, signal.SIG_IGN)
        for status, *command in ((0, "true"), (7, "sh", "-c", "exit 7"), (-9, "sh", "-c", "kill -KILL $$"),
                                 (-15, "env", "--default-signal=TERM", "sh", "-c", "kill -TERM $$"),
                                 (127, "no-such-command"), (126, "/dev/null")):
            for prepare in None, ignore:
                seen = self.run_lab("--", *command, preexec_fn=prepare).end()
                self.assertEqual(seen.status, status, command)
        self.assertEqual(self.lab("run none -- true"), ("", "tarvellab: none: No such file or directory\n", 1))

    def test_ACommandGetsWhatItsCallerHas(self):
        def prepare():
            signal.pthread_sigmask(signal.SIG_BLOCK, {signal.SIGUSR1})
            signal.signal(signal.SIGTERM, signal.SIG_IGN)
            os.close(0)
        generate(self.kernel.root, "--providers", 3)
        for words in ["ls", "/proc/self/fd"], ["grep", "-E", "Sig(Blk|Ign|Cgt)", "/proc/self/status"]:
            given = self.start(words[1:], shutil.which(words[0]), preexec_fn=prepare).end()
            for options in [], ["kernel"]:
                self.assertEqual(self.run_lab(*options, "--", *words, preexec_fn=prepare).end(), given)
        seen = self.run_lab("kernel", "--", "sh", "-c", "cd /; echo $TARVEL_ROOT").end()
        self.assertEqual(seen.out, f"{self.kernel.root.resolve()}\n")

    def test_TemporaryDirectoryIsTheCallersOrTheSystems(self):
        for name, parent in (self.temporary, self.temporary), ("", "/tmp"), (".", f"{self.directory}/."):
            words = "--", "sh", "-c", "stat -c '%n %a' $TARVEL_ROOT"
            seen = self.run_lab(*words, environment={"TMPDIR": str(name)}).end()
            self.assertRegex(seen.out, f"^{parent}/tarvellab-...... 700\n$")
            self.assertFalse(os.path.exists(seen.out.split()[0]))
        seen = self.run_lab("--", "true", environment={"TMPDIR": "/none"}).end()
        self.assertRegex(seen.err, "^tarvellab: /none/tarvellab-......: No such file or directory\n$")
        full = self.run_lab("--", "true", preexec_fn=lambda: limit_files(1000)).end()
        self.assertEqual((seen.status, full.status, full.err.count("File too large")), (1, 1, 1))

    def test_DiagnosticsDoWithoutADescriptorOfTheirOwn(self):
        seen = self.lab("nope", preexec_fn=lambda: [os.close(0), resource.setrlimit(resource.RLIMIT_NOFILE, (3, 3))])
        self.assertRegex(seen.err, "^usage:\n")

    def test_TarvelctlIsTheOneBesideIt(self):
        other, copied = self.directory / "tarvelctl", self.directory / "copied/tarvellab"
        other.write_text("#!/bin/sh\necho other\n")
        other.chmod(0o700)
        copied.parent.mkdir()
        shutil.copy(tarvellab, copied)
        path = {"PATH": f"{self.directory}:{os.environ['PATH']}"}
        seen = self.run_lab("--", "tarvelctl", "provider", environment=path).end()
        self.assertEqual((seen.err, seen.out.count("com.example."), seen.status), ("", 9, 0))
        self.assertEqual(self.run_lab("--", "tarvelctl", program=copied, environment=path).end(), ("other\n", "", 0))
        # Where the lab cannot tell its place there is nothing beside it.
        script = ("import os, sys\nfor _ in range(20): os.mkdir('x' * 250); os.chdir('x' * 250)\n"
                  "os.link(sys.argv[3], 'lab'); os.link(sys.argv[2], 'tarvelctl')\n"
                  "os.execv('lab', ['lab', 'run', '--', 'tarvelctl'])")
        seen = self.start(["-c", script, "run", other, copied], sys.executable, cwd=self.directory).end()
        self.assertRegex(seen.err, "^tarvellab: /proc/self/exe: File name too long\ntarvellab: tarvelctl: No such file")
        self.assertEqual((seen.out, seen.status), ("", 127))

    def test_SignalsArePassedOn(self):
        for number in signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT:
            for trap, status in (f"trap 'exit 9' {int(number)}; ", 9), ("", -number):
                run = self.run_lab("--interval", 20, "--", "sh", "-c", trap + "echo ready; while :; do sleep .01; done")
                run.wait("ready")
                self.assertEqual(run.end(number).status, status)

            def signalled():
                signal.pthread_sigmask(signal.SIG_BLOCK, {number})
                os.kill(os.getpid(), number)
            self.assertEqual(self.run_lab("--", "echo", "seen", preexec_fn=signalled).end(), ("", "", -number))

    def test_TheTerminalInterruptsTheCommandOnceAndTheSimulationNever(self):
        script = f"""n=0; trap 'n=$((n+1))' INT; echo ready; while [ $n = 0 ]; do sleep .01; done
            f=$TARVEL_ROOT/{NODES}stats/flow; for each in 1 2 3; do i=$(stat -c %i $f)
            until [ $i != $(stat -c %i $f) ]; do sleep .01; done; done; echo moved, $n times"""
        process, terminal = pty.fork()
        if process == 0:
            os.environ["TMPDIR"] = str(self.temporary)
            os.execv(tarvellab, [tarvellab, "run", "--interval", "20", "--", "sh", "-c", script])
        output = b""
        while b"times" not in output:
            output += os.read(terminal, 1000)
            if b"ready" in output and b"^C" not in output:
                os.write(terminal, b"\3")
        self.assertEqual(os.waitstatus_to_exitcode(os.waitpid(process, 0)[1]), 0)
        os.close(terminal)
        self.assertIn(b"moved, 1 times", output)

    def test_TheSimulationDoesNotOutliveAKilledRun(self):
        run = self.run_lab("--interval", 20, "--", "sh", "-c", "echo $$; exec sleep 60")
        run.wait("\n")
        run.process.kill()
        os.kill(int(run.out), signal.SIGKILL)
        self.assertEqual(run.end().status, -signal.SIGKILL)


if __name__ == "__main__":
    unittest.main()
