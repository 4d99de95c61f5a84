#!/usr/bin/env python3
"""Tests of captures: what they save, what they hide, and how they are shown again.

usage: lab_capture_test.py TARVELLAB [unittest options]
"""
import ipaddress
import os
import pathlib
import pty
import random
import re
import shutil
import signal
import struct
import subprocess
import sys
import time
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from records import RECORDS, TABLES  # noqa: E402
from lab_kernel import Kernel, LabTest, files, lab, limit_files, node_dir, run  # noqa: E402

commands = ("channel", "flow -n", "flow-adv", "flow-owner", "flow-route -n", "flow-switch", "interface", "memory", "netns -a",
            "provider -D", "show -n", "tree", "channel-stats -n", "list-providers", "netstat -a -n")
tarvelctl = pathlib.Path(lab).with_name("tarvelctl")


class CaptureTest(LabTest):
    def capture(self, root, *words, name="saved", status=0, **options):
        saved = run("capture", *words, self.directory / name, env={**os.environ, "TARVEL_ROOT": str(root)}, **options)
        self.assertEqual(saved.returncode, status, saved.stderr)
        self.printed = saved.stdout
        return saved.stderr

    def saved(self, name="saved"):
        return Kernel(self.directory / name)

    def recapture(self, root, *options, **more):
        shutil.rmtree(self.directory / "saved", ignore_errors=True)
        return self.capture(root, *options, **more)

    def write(self, path, content=b""):
        (self.directory / path).parent.mkdir(parents=True, exist_ok=True)
        (self.directory / path).write_bytes(content)


class Capture(CaptureTest):
    def test_EveryCommandPrintsTheSameElsewhere(self):
        kernel = self.generate()
        named = sorted(kernel.root.glob("proc/*/comm"))
        for path, name in zip(named, (b"\n", b"a\nb\n", b"\x1b[2J\xff\n", b"fifteen bytes ..", b"")):
            path.write_bytes(name)
        named[5].unlink()
        self.capture(kernel.root)
        for command in commands:
            live, elsewhere = (subprocess.run([*map(str, words), *command.split()], capture_output=True, env={**os.environ, "TARVEL_ROOT": root})
                               for words, root in (([tarvelctl], str(kernel.root)),
                                                   ([lab, "run", self.directory / "saved", "--", "tarvelctl"], "/")))
            shown, *errors = elsewhere.stderr.splitlines(keepends=True)
            self.assertRegex(shown.decode(), f"^tarvellab: this is {os.uname().nodename} at 20..-..-..T..:..:..Z\n$")
            self.assertEqual((live.stdout, live.stderr, live.returncode), (elsewhere.stdout, b"".join(errors), elsewhere.returncode))
            self.assertGreater(len(live.stdout), 300, command)

    def test_CapturedKernelIsTheSameByteForByteForItsOwnerOnly(self):
        kernel = self.generate()
        before = time.strftime("%Y-%m-%dT%H:%M:%SZ", time.gmtime())
        self.assertIn("holds addresses and process names", self.capture(kernel.root))
        made, saved = files(kernel.root), files(self.directory / "saved")
        note = dict(line.split(": ") for line in saved.pop("capture.txt").decode().splitlines())
        self.assertTrue(before <= note.pop("time") <= time.strftime("%Y-%m-%dT%H:%M:%SZ", time.gmtime()))
        self.assertEqual(note, {"format": "1", "host": os.uname().nodename, "redacted": "no"})
        mentioned = {f"proc/{pid}/comm" for pid in kernel.pids()}
        self.assertEqual(saved, {name: made[name] for name in made if "comm" not in name or name in mentioned})
        sizes = [len(content) for name, content in saved.items() if "comm" not in name]
        self.assertEqual(self.printed, f"saved in {self.directory}/saved: moments 1 of 1, tables 12 of 12, names {len(saved) - 12}, bytes {sum(sizes)}\n")
        modes = {(p.is_dir(), p.stat().st_mode & 0o777) for p in (self.directory / "saved", *(self.directory / "saved").rglob("*"))}
        self.assertEqual(modes, {(True, 0o700), (False, 0o600)})

    def test_NamesOfProcessesThatNoOneReadsAreNotSaved(self):
        self.generate("--processes", "0")
        self.write(f"made/{node_dir}stats/arena", bytes(2576) + struct.pack("<8i", 7, 0, 8, 0, 0, 0, 0, 0))
        for pid in 7, 8:
            self.write(f"made/proc/{pid}/comm", b"name\n")
        self.capture(self.directory / "made")
        self.assertEqual([path.parent.name for path in self.directory.glob("saved/proc/*/comm")], ["7"])

    def test_NothingIsOverwritten(self):
        kernel = self.generate()
        made = files(kernel.root)
        self.assertIn("Directory not empty", self.capture(kernel.root, name="made", status=1))
        self.assertEqual(files(kernel.root), made)
        self.write("file")
        self.assertIn("Not a directory", self.capture(kernel.root, name="file", status=1))
        (self.directory / "empty").mkdir(0o755)
        self.capture(kernel.root, name="empty")
        self.assertEqual((self.directory / "empty").stat().st_mode & 0o777, 0o700)

    def test_MissingTablesAreLeftOut(self):
        kernel = self.generate()
        (kernel.root / node_dir / "stats/flow").unlink()
        self.assertIn("kern.tarvel.stats.flow is left out", self.capture(kernel.root, status=1))
        self.assertIn("tables 11 of 12", self.printed)
        self.assertEqual(files(self.directory / "saved").keys() & {node_dir + "stats/flow"}, set())
        errors = self.capture(self.directory / "empty", name="nothing", status=1)
        self.assertEqual(errors, "tarvellab: no table can be read: No such file or directory\n")
        self.assertFalse((self.directory / "nothing").exists())

    def test_DamagedTablesAreSavedAsTheyAre(self):
        kernel = self.generate()
        for name, keep, damage in (("nexus_channel_list", 3000, (16, b"\xff" * 4)), ("nexus_channel_list", 71, (60, b"\xff" * 8)),
                                   ("stats/flow_adv", 59, (36, b"\xff" * 4)), ("stats/flow", 639, (68, b"\xff" * 4)),
                                   ("stats/arena", 2607, (0, b"")), ("stats/userstack", 1, (0, b""))):
            table, (at, value) = kernel.table(name)[:keep], damage
            table = table[:at] + value + table[at + len(value):]
            (kernel.root / node_dir / name).write_bytes(table)
            self.recapture(kernel.root)
            self.assertEqual(self.saved().table(name), table)

    def test_AMomentThatDoesNotFitEndsItAndLeavesTheOthers(self):
        small, saved = self.directory / "small", self.directory / "saved"
        self.write(f"small/{node_dir}ring_stat_enable", b"\1")
        capture = subprocess.Popen([lab, "capture", "--every", "0.05", "--count", "1000", saved], stdout=subprocess.PIPE, stderr=subprocess.PIPE,
                                   text=True, env={**os.environ, "TARVEL_ROOT": str(small)}, preexec_fn=lambda: limit_files(1000))
        self.wait_for(lambda: len(list(saved.glob("moments/[0-9]*"))) > 1)
        self.write(f"small/{node_dir}stats/flow", bytes(3200))
        printed, errors = capture.communicate(timeout=10)
        self.assertIn("File too large", errors)
        self.assertRegex(printed, "^saved in .*: moments (\\d+) of 1000, tables \\1 of \\d+, names 0, bytes \\1\n$")
        self.assertEqual(capture.returncode, 1)
        self.assertEqual([name for name in files(saved) if "/." in name], [])
        errors = self.capture(self.generate().root, name="first", status=1, preexec_fn=lambda: limit_files(1000))
        self.assertEqual((errors.count("File too large"), files(self.directory / "first")), (1, {}))
        self.assertIn("moments 0 of 1, tables 0 of 0, names 0, bytes 0\n", self.printed)

    @unittest.skipIf(os.path.exists("/proc/sys/kern/tarvel"), "there is a kernel")
    def test_WithoutAKernelThereIsNothingToCapture(self):
        seen = run("capture", self.directory / "live")
        self.assertEqual((seen.returncode, seen.stderr), (1, "tarvellab: no table can be read: No such file or directory\n"))
        self.assertFalse((self.directory / "live").exists())

    def test_WrongArgumentsShowTheUsage(self):
        for words in ("", "a b", "--redact", "--every 1 a", "--count 2 a", "--seed 1 a", "--every 1 --count 0 a", "--every 1 --count a",
                      *(f"--every {every} --count 2 a" for every in ("0", "0.009", "3601", "-1", "nan", "inf", "1e1", "1s", ""))):
            wrong = run("capture", *words.split(" "), cwd=self.directory)
            self.assertEqual((wrong.returncode, wrong.stderr[:7]), (64, "usage:\n"), words)
        for command in "generate", "simulate":
            self.assertEqual(run(command, "--redact", "a").returncode, 64)


class Moments(CaptureTest):
    def moment(self, offset, comm=None, flows=None, channels=None):
        """Adds a moment to a capture by hand; all else in it is the first's."""
        root = self.directory / "made" / ("moments/" + offset if offset else "")
        if offset:
            shutil.copytree(self.directory / "made/proc", root / "proc")
        for path, content in (("proc/94/comm", comm), (node_dir + "stats/flow", flows), (node_dir + "nexus_channel_list", channels)):
            (root / path).unlink(missing_ok=True)
            if content is not None:
                (root / path).write_bytes(content)

    def make(self):
        kernel = self.generate("--flows", 3)
        (kernel.root / "capture.txt").write_text("format: 1\nhost: a\ntime: noon\n")
        return kernel

    def replay(self, *command, **options):
        return run("run", self.directory / "made", "--", *command, env={**os.environ, "TMPDIR": str(self.directory)}, **options)

    def test_MomentsAreTakenInTimeUntilInterrupted(self):
        process, _ = self.start("simulate", self.directory / "made", "--interval", "20")
        self.capture(self.directory / "made", "--every", ".25", "--count", 4)
        offsets = [float(p.name) for p in sorted((self.directory / "saved/moments").iterdir())]
        self.assertEqual(len(offsets), 3)
        self.assertLess(sorted(offset % .25 for offset in offsets)[1], .1)  # a machine under load is late now and then
        for root in self.directory / "saved", *(self.directory / "saved/moments").iterdir():
            self.assertGreater(len(Kernel(root).channels()), 10)
            self.assertGreater(len(list(root.glob("proc/*/comm"))), 5)
        long = subprocess.Popen([lab, "capture", "--every", "0.05", "--count", "1000", self.directory / "long"],
                                stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL, env={**os.environ, "TARVEL_ROOT": str(self.directory / "made")})
        self.wait_for(lambda: len(list(self.directory.glob("long/moments/[0-9]*"))) > 2)
        long.send_signal(signal.SIGINT)
        self.assertEqual(long.wait(5), 1)
        self.assertEqual([p for p in files(self.directory / "long") if "/." in p], [])
        process.kill()

    def test_ACommandSeesEachMomentInItsTime(self):
        self.make()
        self.moment("", b"first\n", b"1" * 320)
        self.moment("0.800", None, b"2" * 640)
        self.moment("1.600", b"third\n", None)
        seen = self.replay("sh", "-c", "r=$TARVEL_ROOT; until cat $r/proc/94/comm; wc -c <$r/proc/sys/kern/tarvel/stats/flow; grep third $r/proc/94/comm; do sleep 0.1;"
                           " done 2>/dev/null; echo $r")
        *words, place = seen.stdout.split()
        self.assertFalse(pathlib.Path(place).parent.exists())
        self.assertEqual(" ".join(dict.fromkeys(words)), "first 320 640 third")
        self.assertEqual(seen.stderr, "tarvellab: this is a at noon\ntarvellab: the last moment is shown\n")

    def test_AWatchShowsTheRatesOfThen(self):
        kernel = self.make()
        shutil.rmtree(kernel.root / "proc/94")
        (kernel.root / "proc/94").mkdir()
        moved = 0
        for number in range(4):
            moved += 1000 * number * number
            ring = struct.pack("<8xQQ", 0, moved).ljust(184, b"\0")
            self.moment(f"{number}.000" if number else "", channels=b"n" * 16 + struct.pack("<Q", 1) + b"c" * 16
                        + struct.pack("<6I8x", 0, 94, 1, 0, 1, 0) + ring)
        watch = self.replay("timeout", "--preserve-status", "-s", "INT", "4.4", tarvelctl, "-w", "1", "channel")
        self.assertEqual([line.split()[3] for line in watch.stdout.splitlines() if line.startswith("TX[0]")][:3], ["1.00K", "4.00K", "9.00K"])

    def test_AKernelThatGoesAwayIsMissed(self):
        capture = subprocess.Popen([lab, "capture", "--every", "0.05", "--count", "8", self.directory / "saved"], stdout=subprocess.PIPE,
                                   stderr=subprocess.PIPE, text=True, env={**os.environ, "TARVEL_ROOT": str(self.make().root)})
        self.wait_for(lambda: (self.directory / "saved/moments").exists())
        (self.directory / "made").rename(self.directory / "gone")
        printed, errors = capture.communicate(timeout=10)
        self.assertEqual(errors.splitlines()[-1], "tarvellab: no table can be read: No such file or directory")
        self.assertLess(len(errors.splitlines()), 5)  # one table may be missed first
        self.assertRegex(printed, "moments [2-7] of 8, tables (24|36|48|60|72|84) of \\1, ")
        self.assertEqual(capture.returncode, 1)

    def test_WhatWasRedactedStaysRedacted(self):
        self.capture(self.generate().root, "--redact", "--every", "0.01", "--count", 2)
        for root in self.directory / "saved", *(self.directory / "saved/moments").iterdir():
            self.assertEqual(self.capture(root, name=f"again {root.name}"), "")
            self.assertRegex((self.directory / f"again {root.name}/capture.txt").read_text(), "host: redacted\nredacted: yes\n$")
        inside = self.generate(name="saved/a/kernel").root
        self.assertIn("addresses", self.capture(inside, name="of another"))

    def test_PathsDoNotDriveTheTerminal(self):
        (self.directory / "named").symlink_to("\x1b[2Jthere")
        (self.directory / "\x1b[2Jthere/proc/\x9b1m").mkdir(parents=True)
        (self.directory / "\x1b[2Jthere/proc/\x9b1m/link").symlink_to(".")
        mine, terminal = pty.openpty()
        for words in ("run", "named", "--", "true"), ("generate", "/proc/\x1b]0;x\x07"):
            subprocess.run([lab, *words], cwd=self.directory, stderr=terminal)
        seen = os.read(mine, 10000)
        self.assertIn(b"/?[2Jthere/proc/", seen)
        self.assertEqual(set(b"\x1b\x07\x9b") & set(seen), set())

    def test_OtherFormatsAreRefused(self):
        kernel = self.make()
        note = kernel.root / "capture.txt"
        for content, message in (("format: 2\n", "format 2 is newer than this program, which knows 1"), ("host: a\nformat: 99999999999999999999", "is newer"),
                                 ("", "does not state"), ("format: 0\n", "does not state"), ("format: -1\n", "does not state"),
                                 ("format: \x1b[2J\n", "does not state"), ("x" * 10**6 + "\nformat: 1\n", "does not state")):
            note.write_text(content)
            seen = self.replay("true")
            self.assertEqual(seen.returncode, 1, content[:50])
            self.assertIn(f"{note}: {message}" if "is" not in message else message, seen.stderr)
        for make in os.mkfifo, os.mkdir, lambda path: os.symlink("/dev/zero", path):
            note.unlink()
            make(note)
            seen = self.replay("true")
            self.assertEqual((seen.returncode, seen.stderr.count("\n")), (1, 1))
            note.rmdir() if note.is_dir() else None
            note.touch()

    def test_WhatIsNoMomentDoesNotCount(self):
        kernel = self.make()
        moments = kernel.root / "moments"
        for name in "1e1.000", "-1.000", "0.000", ".000", "99999999999999999999.000", "9" * 30, "x", ".new", "0.1", "nan.000", "0.1000", "0.x00":
            shutil.copytree(kernel.root / "proc", moments / name / "proc")
        (moments / "0.100").touch()
        self.assertEqual(self.replay("sh", "-c", "echo $TARVEL_ROOT").stdout, f"{kernel.root.resolve()}\n")
        (moments / "0.010").mkdir()  # without any table
        self.moment("99999999999.000")  # never comes
        self.assertIn("No such file or directory", self.replay("sh", "-c", f"sleep 0.2; {tarvelctl} provider").stderr)
        os.truncate(kernel.root / node_dir / "stats/flow", 2**42)
        self.assertRegex(self.replay("true").stderr, "/stats/flow: mostly holes\n$")
        (kernel.root / node_dir / "stats/flow").unlink()
        (kernel.root / "capture.txt").write_text("format: 1\n")
        self.assertIn("this is unknown at unknown\n", self.replay("true").stderr)
        os.mknod(kernel.root / node_dir / "stats/flow")
        os.truncate(kernel.root / node_dir / "stats/flow", 2**42)
        self.assertIn("flow is left out: mostly holes\n", self.capture(self.directory / "made", status=1))
        (kernel.root / node_dir / "stats/flow").write_bytes(bytes(17 << 20))  # large, and all there
        self.assertNotIn("holes", self.replay("true").stderr)

    def test_OnlyFilesAreReplayed(self):
        kernel = self.make()
        self.moment("0.100")
        for path in "proc/94/comm", node_dir + "stats/flow", "moments/0.100/proc", "moments", "more":
            for make in os.mkfifo, lambda path: os.symlink("/etc", path), lambda path: os.makedirs(path / ("x/" * 8)):
                kept = (kernel.root / path).exists() and (kernel.root / path).rename(self.directory / "kept")
                make(kernel.root / path)
                seen = self.replay("echo", "seen")
                self.assertEqual((seen.returncode, seen.stdout), (1, ""))
                self.assertRegex(seen.stderr, f"{path}(/x)*: no part of a capture\n")
                (kernel.root / path).rename(self.directory / f"removed {time.monotonic_ns()}")
                kept and kept.rename(kernel.root / path)
        self.assertEqual(self.replay("echo", "seen").stdout, "seen\n")
        os.mkfifo(kernel.root / "größe\u202e")
        reader, terminal = pty.openpty()
        subprocess.run([lab, "run", kernel.root, "--", "true"], stderr=terminal, env={**os.environ, "LC_ALL": "C.UTF-8"})
        self.assertRegex(os.read(reader, 4096).decode(), r"größe\?\?\?: no part of a capture\r\n")


docs = pathlib.Path(__file__).parents[1] / "docs"
# Of each record the fields, and the parts with all that is read of them, that survive redaction.
surviving = {record: set(re.findall(r"[\w.]+", names)) for records, names in
             re.findall(r"^\.It Vt (.*)\n((?:[^.].*\n)+)", (docs / "tarvellab.1").read_text(), flags=re.M) for record in records.split(" , ")}


def survives(record):
    """For each byte of a record whether it survives."""
    result = []
    for field, row in RECORDS[record]["fields"].items():
        listed = row["kind"] != "unread" and bool({field, row["part"]} & surviving[record])
        result += (survives(row["nested"]) if row["nested"] else [listed] * row["size"]) * row["count"]
    return result


v4, v6 = (lambda t: ipaddress.ip_address(t).packed), (lambda t: ipaddress.ip_address(t).packed)
entry = ("tv_stats_flow_adv_entry", [], [])
mac, group = (b"\1\2\3\4\5\6", b"\3\0\0\0\0\1"), (b"\xff" * 6, b"\xff" * 6)


class Redact(CaptureTest):
    def redacted(self, tables, message=""):
        """What becomes of tables, by name."""
        shutil.rmtree(self.directory / "bare", ignore_errors=True)
        for name, table in tables.items():
            self.write(f"bare/{node_dir}{name}", table)
        errors = self.recapture(self.directory / "bare", "--redact", status=1)  # the other tables are missing
        self.assertIn(message, errors)
        self.assertNotIn("holds", errors)
        return {name: self.saved().table(name) for name in tables}

    # Of each table its records: what they are amid noise, as (offset, before, after), and what does not survive then, as (offset, width).
    formats = {
        "stats/flow": [
            ("tv_stats_flow", [(16, b"en0\0", b"en1"), (36, b"browser\0", b"process1"), (81, b"\2"), (84, v4("10.0.0.1"), v4("240.0.0.1")),
                               (112, v4("10.0.0.2"), v4("240.0.0.2"))], []),
            ("tv_stats_flow", [(16, b"enx0050b6112233\0", b"if1"), (36, b"com.example.browser\0", b"process2"), (81, b"\x1e"),
                               (88, v6("2001:db8::7"), v6("3fff::1")), (116, v6("fe80:4::7"), v6("fe80:4::3fff:0:0:2"))], []),
            ("tv_stats_flow", [(16, b"pdp_ip3\0", b"pdp_ip1"), (36, b"\0", b""), (81, b"\3")], [(82, 2), (110, 2)]),
            ("tv_stats_flow", [(16, b"en7\0", b"en2"), (36, b"com.example.bro\0", b"process2"), (81, b"\2"), (84, v4("10.0.0.2"), v4("240.0.0.2")),
                               (112, v4("127.0.0.9"), v4("127.0.0.9"))], [])],
        "stats/flow_route": [
            ("tv_stats_flow_route", [(32, b"wlan\0", b"if1"), (56, b"\xa0"), (101, b"\2"), (76, bytes(4), bytes(4)),
                                     (104, v4("224.0.0.251"), v4("239.0.0.1")), (132, v4("169.254.7.7"), v4("169.254.0.1")), (192, *mac)], []),
            ("tv_stats_flow_route", [(32, b"7\0", b"if2"), (56, b"\xa0"), (101, b"\x1e"), (80, v6("::1"), v6("::1")),
                                     (108, v6("ff02:5::fb"), v6("ff02:5::3fff:0:0:1")), (136, v6("::ffff:10.0.0.1"), v6("::ffff:240.0.0.1")),
                                     (192, b"\0" * 6, b"\0" * 6)], []),
            ("tv_stats_flow_route", [(32, b"\0", b""), (56, b"\x80"), (101, b"\2"), (76, v4("255.255.255.255"), v4("255.255.255.255")),
                                     (104, v4("224.0.0.251"), v4("239.0.0.1")), (192, *group)], []),
            ("tv_stats_flow_route", [(32, b"wlan\0", b"if1"), (56, b"\x20"), (101, b"\x1e"), (80, v6("fec0::7"), v6("3fff::2")),
                                     (108, v6("ff01:5::fb"), v6("ff01:5::3fff:0:0:3")), (136, v6("ff05:5::fb"), v6("ff05::3fff:0:0:4"))], [])],
        "stats/flow_owner": [("tv_stats_flow_owner", [(16, before + b"\0", after), (36, b"x" * size + b"\0" * (size < 32), b"process1")], [])
                             for before, after, size in ((b"EN0", b"if1", 15), (b"en", b"if2", 16), (b"en0", b"en1", 32), (b"en00", b"en2", 31))],
        "stats/netns": [("tv_stats_netns", [(0, v4("10.0.0.7"), v4("240.0.0.1")), (16, b"\4"), (18, b"\0")], []),
                        ("tv_stats_netns", [(0, v6("fe80::7"), v6("fe80::3fff:0:0:1")), (16, b"\x10"), (18, b"\1")], []),
                        ("tv_stats_netns_range", [], []), ("tv_stats_netns", [(16, b"\0"), (18, b"\0")], [])],
        "stats/net_if": [("tv_stats_net_if", [(16, b"bridge0\0", b"bridge1")], [])],
        "stats/flow_switch": [("tv_stats_flow_switch", [(16, b"enp0s31f6\0", b"if1")], [])],
        "stats/userstack": [("tv_stats_userstack", [(16, b"lo0\0", b"lo1")], [])],
        "stats/flow_adv": [("tv_stats_flow_adv", [(16, b"utun9\0", b"utun1"), (36, struct.pack("<I", 512))], []), *[entry] * 512,
                           ("tv_stats_flow_adv", [(16, b"utun99\0", b"utun2"), (36, struct.pack("<I", 513))], []), *[(entry[0], [], [(0, 20)])] * 513],
        "nexus_provider_list": [("nexus_provider_record", [(64, b"com.Browser.10.0.0.7\0", b"provider1"), (128, b"\x14\0\0\0", b"\x09"), (256, b"\1\0\0\0")], []),
                                ("uuid", [], []),
                                ("nexus_provider_record", [(64, b"en0\0", b"provider2"), (128, b"\0\0\0\0", b""), (256, b"\0\0\0\0")], [])],
        "ring_stat_enable": [("ring_stat_enable", [], [])],
        "nexus_channel_list": [("nexus_channel_header", [(16, b"\1\0\0\0")], []), ("channel_entry", [(32, b"\1\0\0\0\0\0\0\0")], []), ("ring_stats", [], [])],
        "stats/arena": [("tv_stats_arena", [(0, b"host.example\0", b"arena1"), *((80 + 208 * i, b"r%d\0" % (i // 2), b"region%d" % (i // 2 + 1)) for i in range(11)),
                                            (80 + 208 * 11 + 104, bytes(8)), (2584, bytes(4))], [(2368 + 84, 68), (2368 + 168, 40), (2588, 20)])],
    }

    def test_OnlyWhatTheManualListsSurvives(self):
        noise = random.Random(1)
        self.assertEqual({name for records in self.formats.values() for name, *_ in records} | {"tv_stats_region"}, RECORDS.keys())
        for name, records in self.formats.items():
            before = after = b""
            for record, fields, gone in records:
                mask = survives(record)
                made = bytearray(noise.choices(range(1, 256), k=len(mask)))
                for at, value, *_ in fields:
                    made[at:at + len(value)] = value
                expected = bytearray(byte * kept for byte, kept in zip(made, mask))
                for at, width in gone:
                    expected[at:at + width] = bytes(width)
                for at, _, substitute in (field for field in fields if len(field) == 3):
                    expected[at:at + len(substitute)] = substitute
                before, after = before + made, after + expected
            self.assertEqual(self.redacted({name: before})[name], after, name)

    def test_ReportsAreTheSameButForSubstitutes(self):
        kernel, mapped = self.generate(), {}
        self.capture(kernel.root, "--redact")
        substitute = re.compile(r"(process|provider|arena|region|en|bridge)\d+|2(40|39)(\.\d+){3}|169\.254(\.\d+){2}|3fff::[\da-f]+|[\da-f:]+:3fff:0:0:[\da-f]+|0[23](:..){5}")
        for command in commands:
            live, redacted = (subprocess.run([tarvelctl, *command.split()], capture_output=True, text=True, env={**os.environ, "TARVEL_ROOT": str(root)}).stdout
                              for root in (kernel.root, self.directory / "saved"))
            self.assertEqual(live.count("\n"), redacted.count("\n"))
            for original, shown in zip(live.split(), redacted.split(), strict=True):
                found = substitute.search(shown)
                self.assertTrue(shown == original or found and original.startswith(shown[:found.start()]) and original.endswith(shown[found.end():]), (command, original, shown))
                self.assertEqual(mapped.setdefault(original, shown), shown)
        self.assertEqual(len(set(mapped.values())), len(mapped))

    def test_WhatCannotBeDecodedIsLeftOut(self):
        secret = b"secret".ljust(64, b"\0")
        head, entry = bytes(16) + struct.pack("<Q", 0xffffffff), bytes(32) + struct.pack("<IIQ", 1, 0, 0)
        for name, table, kept in (("stats/flow", bytes(640) + secret * 4, 640), ("stats/flow_owner", secret, 0), ("stats/flow_route", secret, 0),
                                  ("stats/arena", secret * 40, 0), ("nexus_channel_list", head + entry + bytes(184) + entry + secret, 24 + 232),
                                  ("stats/netns", bytes(32) + b"secret".ljust(18, b"\0") + b"\2".ljust(14, b"\0") + secret[:63], 32),
                                  ("stats/flow_adv", bytes(40) + secret[:36] + b"\xff" * 4 + secret, 40),
                                  ("nexus_provider_list", secret * 4 + b"\xff" * 8 + secret, 0), ("ring_stat_enable", b"\1secret", 1)):
            seen = self.redacted({name: table}, f"{name.replace('/', '.')} is cut")
            self.assertEqual((len(seen[name]), b"secret" in seen[name]), (kept, False), name)

    def test_NoOriginalIsLeftAnywhere(self):
        made = self.generate("--flows", 300, "--seed", 3)
        self.assertEqual(self.capture(made.root, "--redact", "--every", "0.05", "--count", 3), "")
        originals, saved = set(), files(self.directory / "saved")
        for records in map(made.records, TABLES):
            for row, at in (place for record in records for place in record.find("type", "bytes")):
                held = records[0].table[at:at + row["size"]].rstrip(b"\0")  # an IPv4 address of 16 bytes is the first 4
                originals |= {held, held[-8:]}
        originals = {original for original in originals if any(original[:-1])}  # all but unspecified, and the 1 of fe80::1
        names = {path.read_bytes().strip() for path in made.root.glob("proc/*/comm")} | {b"com.example"}  # of arenas, ...
        self.assertGreater(len(originals), 100)
        self.assertGreater(len(names), 11)
        self.assertEqual([(path, found) for path, content in saved.items() for found in originals | names if found in content], [])
        self.assertIn(b"host: redacted\n", saved["capture.txt"])
        # The same stand for the same, in every moment.
        for moment in (self.directory / "saved/moments").iterdir():
            self.assertEqual(files(moment / "proc"), files(self.directory / "saved/proc"))


if __name__ == "__main__":
    unittest.main()
