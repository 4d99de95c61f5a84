#!/usr/bin/env python3
"""Tests of how the lab's tables move and of what `run` leaves behind.

usage: lab_run_test.py TARVELLAB [unittest options]
"""
import os
import pathlib
import pty
import resource
import shutil
import signal
import subprocess
import sys
import time
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from lab_kernel import Kernel, LabTest, files, lab, limit_files, node_dir, run  # noqa: E402


class Simulate(LabTest):
    def simulate(self, *words, **options):
        process, line = self.start("simulate", self.directory, *words, **options)
        self.assertEqual(line, f"simulating in {self.directory}")
        return process, Kernel(self.directory)

    def test_ReadersMeetWholeTablesOnly(self):
        process, kernel = self.simulate("--interval", "10", "--flows", "2000")
        sizes, inodes, end = set(), set(), time.monotonic() + 2
        while time.monotonic() < end:
            inodes.add((kernel.root / node_dir / "stats/flow").stat().st_ino)
            sizes.add(len(kernel.records("stats/flow")))
            [kernel.records(name) for name in ("nexus_provider_list", "nexus_channel_list", "stats/flow_adv")]
        process.send_signal(signal.SIGINT)
        self.assertEqual(process.wait(5), 0)
        self.assertGreater(min(len(sizes), len(inodes)), 10)
        self.assertTrue(all(1000 < size < 3000 for size in sizes))
        self.assertEqual([name for name in files(self.directory) if "/." in name], [])
        running = {int(p.parent.name) for p in self.directory.glob("proc/*/comm")}
        self.assertLessEqual(kernel.pids() - {0}, running)

    def test_RatesAreTheDifferencesOfSnapshots(self):
        process, kernel = self.simulate("--interval", "200")
        path = kernel.root / node_dir / "nexus_channel_list"

        def next_snapshot(last=[None]):
            self.wait_for(lambda: path.stat().st_ino != last[0])
            last[0] = path.stat().st_ino
            return {channel["channel_uuid"]: channel["tx"] + channel["rx"] for channel in kernel.channels()}

        before, compared = next_snapshot(), 0
        for _ in range(8):
            after = next_snapshot()
            for old, new in ((old, new) for c in before.keys() & after for old, new in zip(before[c], after[c])):
                moved = new["xfer.bytes"] - old["xfer.bytes"]
                self.assertGreaterEqual(moved, 0)
                compared += moved > 0 and abs(new["xfer.bytes_per_sec"] - 5 * moved) < 5
            before = after
        process.terminate()
        self.assertEqual(process.wait(5), 0)
        # Now and then a machine under load takes a snapshot more between two reads.
        self.assertGreater(compared, 200)


    def test_NothingMovesOnNothing(self):
        for size, path in ("flows", "stats/flow"), ("channels", "stats/flow"), ("providers", "nexus_provider_list"):
            process, kernel = self.simulate("--interval", "10", "--" + size, "0")
            first = (kernel.root / node_dir / path).stat().st_ino
            self.wait_for(lambda: (kernel.root / node_dir / path).stat().st_ino != first)
            self.assertEqual(kernel.table(path), b"")
            process.terminate()
            self.assertEqual(process.wait(5), 0)

    def test_EndsWhereItsLineCannotBeWritten(self):
        with open("/dev/full", "w") as full:
            failed = subprocess.run([lab, "simulate", self.directory], stdout=full, stderr=subprocess.PIPE, timeout=10)
        self.assertEqual((failed.returncode, failed.stderr), (74, b"write error: No space left on device\n"))

    def test_EndsWhereItsDirectoryIsTakenAway(self):
        process, kernel = self.simulate("--interval", "10", stderr=subprocess.PIPE)
        (self.directory / "proc").rename(self.directory / "gone")
        self.assertEqual(process.wait(5), 1)
        self.assertIn("No such file or directory", process.stderr.read())
        process.stderr.close()


class Run(LabTest):
    def setUp(self):
        super().setUp()
        self.env = {**os.environ, "TMPDIR": str(self.directory)}

    def start_run(self, script):
        return self.start("run", "--interval", "20", "--", "sh", "-c", script, env=self.env)

    def nothing_left(self):
        return not any(self.directory.iterdir()) and not any(map(self.mentions, pathlib.Path("/proc").glob("[0-9]*/environ")))

    def mentions(self, path):
        try:
            return f"TMPDIR={self.directory}\0".encode() in path.read_bytes()
        except OSError:
            return False

    def test_StatusIsTheCommandsOwn(self):
        for status, *command in ((0, "true"), (7, "sh", "-c", "exit 7"), (-9, "sh", "-c", "kill -KILL $$"),
                                 (-15, "sh", "-c", "kill -TERM $$"), (127, "no-such-command"), (126, "/dev/null")):
            self.assertEqual(run("run", "--", *command, env=self.env).returncode, status)
        self.assertEqual(run("run", self.directory / "none", "--", "true", env=self.env).returncode, 1)
        self.assertTrue(self.nothing_left())

    def test_TemporaryDirectoryIsTheCallersOrTheSystems(self):
        for name, parent in (self.directory, self.directory), ("", "/tmp"), (None, "/tmp"):
            env = {**os.environ, "TMPDIR": str(name)} if name is not None else {k: v for k, v in os.environ.items() if k != "TMPDIR"}
            seen = run("run", "--", "sh", "-c", "echo $TARVEL_ROOT", env=env)
            self.assertRegex(seen.stdout, f"^{parent}/tarvellab-......\n$")
            self.assertFalse(pathlib.Path(seen.stdout.strip()).exists())
        seen = run("run", "--", "true", env={**os.environ, "TMPDIR": "/none"})
        self.assertEqual(seen.returncode, 1)
        self.assertRegex(seen.stderr, "^tarvellab: /none/tarvellab-......: No such file or directory\n$")
        seen = run("run", "--", "true", env=self.env, preexec_fn=lambda: limit_files(1000))
        self.assertEqual((seen.returncode, seen.stderr.count("File too large")), (1, 1))
        self.assertTrue(self.nothing_left())

    @unittest.skipIf(b"__asan_init" in pathlib.Path(lab).read_bytes(), "the sanitizer does not start without a descriptor")
    def test_DiagnosticsDoWithoutADescriptorOfTheirOwn(self):
        def leave_no_descriptor():
            os.close(0)  # the loader needs one
            resource.setrlimit(resource.RLIMIT_NOFILE, (3, 3))
        self.assertRegex(run("nope", preexec_fn=leave_no_descriptor).stderr, "^usage:\n")
    def test_ACommandGetsItsDescriptorsAsTheyWere(self):
        seen = run("run", "--", "sh", "-c", "[ ! -e /proc/$$/fd/0 ]", preexec_fn=lambda: os.close(0))
        self.assertEqual((seen.returncode, seen.stderr), (0, ""))

    def test_AProgramThatCannotTellItsPlaceHasNoneBesideIt(self):
        script = "import os, sys\nfor _ in range(20): os.mkdir('x' * 250); os.chdir('x' * 250)\n" \
                 "os.link(sys.argv[1], 'lab'); open('tarvelctl', 'w').write('#!/bin/sh\\necho seen'); os.chmod('tarvelctl', 0o700)\n" \
                 "os.execv('./lab', ['lab', 'run', '--', 'tarvelctl'])"
        copied = shutil.copy(lab, self.directory)
        seen = subprocess.run([sys.executable, "-c", script, copied], env=self.env, cwd=self.directory, capture_output=True, text=True)
        self.assertEqual((seen.returncode, seen.stdout), (127, ""))
        self.assertIn("/proc/self/exe: File name too long", seen.stderr)
        alone = subprocess.run([copied, "run", "--", "tarvelctl"], env={**self.env, "PATH": "/nowhere"}, capture_output=True, text=True)
        self.assertEqual(alone.returncode, 127)

    def test_ASignalThatCameBeforeTheCommandIsItsEnd(self):
        def signalled():
            signal.pthread_sigmask(signal.SIG_BLOCK, {signal.SIGTERM})
            os.kill(os.getpid(), signal.SIGTERM)
        seen = run("run", "--", "echo", "seen", env=self.env, preexec_fn=signalled)
        self.assertEqual((seen.returncode, seen.stdout), (-signal.SIGTERM, ""))
        self.assertTrue(self.nothing_left())

    def test_CommandSeesACompleteKernel(self):
        seen = run("run", "--", "tarvelctl", "provider", env=self.env)
        self.assertEqual((seen.returncode, seen.stderr, seen.stdout.count("com.example.")), (0, "", 9))
        kernel = self.generate("--providers", "3")
        seen = run("run", kernel.root.name, "--", "sh", "-c", "cd /; echo $TARVEL_ROOT", cwd=self.directory)
        self.assertEqual(seen.stdout, f"{kernel.root.resolve()}\n")

    def test_SignalsArePassedOnAndAllIsCleanedUp(self):
        for number in signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT:
            process, _ = self.start_run(f"trap 'exit 9' {int(number)}; echo ready; while :; do sleep 0.01; done")
            process.send_signal(number)
            self.assertEqual(process.wait(5), 9)
            self.assertTrue(self.nothing_left())
            process, _ = self.start_run("echo ready; exec sleep 60")
            process.send_signal(number)
            self.assertEqual(process.wait(5), -number)
            self.assertTrue(self.nothing_left())

    def test_TheTerminalInterruptsTheCommandOnceAndTheSimulationNever(self):
        script = ("n=0; trap 'n=$((n+1)); i=$(stat -c %i $f)' INT; f=$TARVEL_ROOT/proc/sys/kern/tarvel/stats/flow; echo ready;"
                  "while [ $n = 0 ]; do sleep 0.01; done; sleep 0.3; [ $i != $(stat -c %i $f) ] && echo moves; echo $n times")
        pid, terminal = pty.fork()
        if pid == 0:
            os.execve(lab, [lab, "run", "--interval", "20", "--", "sh", "-c", script], self.env)
        output = b""
        while b"times" not in output:
            output += os.read(terminal, 1000)
            if b"ready" in output and b"^C" not in output:
                os.write(terminal, b"\3")
        self.assertEqual(os.waitstatus_to_exitcode(os.waitpid(pid, 0)[1]), 0)
        os.close(terminal)
        self.assertIn(b"moves\r\n1 times", output)
        self.assertTrue(self.nothing_left())

    def test_TheSimulationDoesNotOutliveAKilledRun(self):
        process, child = self.start_run("echo $$; exec sleep 60")
        process.kill()
        process.wait()
        os.kill(int(child), signal.SIGKILL)
        self.wait_for(self.nothing_left)


if __name__ == "__main__":
    unittest.main()
