#!/usr/bin/env python3
"""Sends signals at random moments to watches of every command, and looks at what they left behind.

A watch writes to a file by -f, to a pipe that is read, at once or slowly, or to a pipe whose reader stops after a random
number of bytes. It may wait for a name service that never answers, or sleep between two runs. What it wrote must be a
prefix of the true output that is cut at the end of a line, and nothing is on standard error. SIGINT gives status 0 within
the limit, and behind a sleep the listings are whole; SIGTERM, SIGHUP and SIGKILL end it by themselves.
"""
import collections
import os
import pathlib
import re
import select
import signal
import subprocess
import sys
import threading
import time

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from torture import Torture  # noqa: E402

TIME, HEADING = re.compile(rb"^\d{4}-\d\d-\d\d \d\d:\d\d:\d\d$", re.MULTILINE), b"\n<time>\n"
COMMANDS = ("channel", "flow", "flow-adv", "flow-owner", "flow-route -n", "flow-switch", "interface", "memory", "netns -a",
            "netstat -an", "netstat -s", "provider -D", "show", "channel-stats", "tree", "list-providers")
NAMING, SINKS = ("flow-route", "netstat -a"), ("file", "pipe", "slow pipe", "stopped pipe")
SIZES = ("--flows", 1500, "--channels", 400, "--providers", 600, "--arenas", 60, "--namespaces", 800, "--processes", 60, "--stacks", 60)
KILLERS = signal.SIGTERM, signal.SIGHUP, signal.SIGKILL


class Reader(threading.Thread):
    """Reads a pipe: to its end, so many bytes until rest() is called, or slowly until then."""

    def __init__(self, pipe, limit=None, pause=0.0):
        super().__init__(daemon=True)
        self.pipe, self.limit, self.pause, self.data = pipe, limit, pause, bytearray()
        self.start()

    def run(self):
        while self.limit is None or len(self.data) < self.limit:
            size = 2048 if self.pause else 65536
            got = os.read(self.pipe, size if self.limit is None else min(size, self.limit - len(self.data)))
            if not got:
                return
            self.data += got
            time.sleep(self.pause)

    def rest(self):
        self.pause = 0
        self.join()
        self.limit = None
        self.run()
        return bytes(self.data)


def wait_for_handler(process):
    """Returns once the process catches SIGINT."""
    mask = 1 << (signal.SIGINT - 1)
    while process.poll() is None:
        caught = re.search(r"^SigCgt:\s*(\w+)", pathlib.Path(f"/proc/{process.pid}/status").read_text(), re.MULTILINE)
        if caught and int(caught[1], 16) & mask:
            return


class Signals(Torture):
    def __init__(self):
        super().__init__("signal", __doc__, limit=0.2, count=0)
        self.kernel, self.slowest, self.cuts = self.make_kernel(*SIZES), 0.0, collections.Counter()
        self.file = os.path.join(self.directory.name, "output")
        self.listings, self.run_times = {}, {}
        for command in COMMANDS + NAMING:
            if command in NAMING:
                self.kernel.environment.update(self.name_services(NAME_SERVICES_ANSWER="name.example.org"))
            started = time.monotonic()
            self.listings[command] = self.run(self.kernel, command).out
            self.run_times[command] = time.monotonic() - started
        self.listings["channel"] = self.watch_of_channels()

    def watch_of_channels(self):
        """What all runs but the first one print: that one prints nothing, and none but that one has a heading."""
        text, watch = b"", self.start([self.options.tarvelctl, "-w", "1", "channel"], env=self.kernel.environment,
                                      stdout=subprocess.PIPE)
        while text.count(b"Instances: ") < 2:
            text += os.read(watch.stdout.fileno(), 65536)
        watch.kill()
        return b"Instances: " + text.split(b"Instances: ")[1]

    def behind_whole_listings(self, command, output):
        """How many bytes of a listing the output ends with, or None where it is no prefix of whole lines of the true output."""
        text = TIME.sub(b"<time>", output)
        unit = self.listings[command] if command == "channel" else HEADING + self.listings[command]
        if HEADING.startswith(text):
            return 0 if command == "channel" else len(text)
        if command == "channel":
            text = text.removeprefix(HEADING) if text.startswith(HEADING) else b"no heading"
        whole, rest = divmod(len(text), len(unit))
        return rest if text == unit * whole + unit[:rest] and output.endswith(b"\n") else None

    def start_watch(self, command, sink, block_at):
        environment = {**self.kernel.environment, "NAME_SERVICES_BLOCK_AT": str(block_at)}
        pathlib.Path(self.file).write_bytes(b"")
        redirection = ["-f", self.file] if sink == "file" else []
        process = subprocess.Popen([self.options.tarvelctl, "-w", "1", *redirection, *command.split()], env=environment,
                                   stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.PIPE)
        limit = self.random.randrange(max(len(self.listings[command]), 1)) if sink == "stopped pipe" else None
        return process, Reader(process.stdout.fileno(), limit, self.random.uniform(0.0001, 0.002) if sink == "slow pipe" else 0.0)

    def wait_for_sleep(self, process, command, reader, sink):
        """Returns once the first run is behind the process."""
        size = len(HEADING) - len("<time>") + 19 + (0 if command == "channel" else len(self.listings[command]))
        while process.poll() is None and (os.path.getsize(self.file) if sink == "file" else len(reader.data)) < size:
            time.sleep(0.001)
        time.sleep(self.random.uniform(0.005, 0.2))

    def signal_one(self, number, command, sink, state):
        self.runs += 1
        self.faults += 1
        block_at = self.random.randrange(1, 1000) if state == "blocked" else 0
        process, reader = self.start_watch(command, sink, block_at)
        wait_for_handler(process)
        if state == "asleep":
            self.wait_for_sleep(process, command, reader, sink)
        else:
            rare = self.random.random() < 0.03  # in the sleep or the second run
            time.sleep(self.random.uniform(0, 1.3 if rare else 0.05 if state == "blocked" else self.run_times[command]))
        sent = time.monotonic()
        process.send_signal(number)
        with open(os.pidfd_open(process.pid), "rb", buffering=0) as end:
            ended = select.select([end], [], [], 20)[0]
        took = time.monotonic() - sent
        if not ended:
            process.kill()
        output, errors = reader.rest(), process.stderr.read()
        process.stdout.close(), process.stderr.close()
        self.judge(number, f"-w 1 {command}", sink, state, process.wait(), took, output, errors, command)

    def judge(self, number, line, sink, state, status, took, output, errors, command):
        fault = f"{number.name} while {state}, writing to a {sink}"
        by_interrupt = number == signal.SIGINT
        self.expect(line, fault, (status, errors), (0 if by_interrupt else -number, b""))
        if sink == "file":
            self.expect(line, fault, output, b"")
            output = pathlib.Path(self.file).read_bytes()
        if by_interrupt:
            self.slowest = max(self.slowest, took)
            self.expect(line, fault, f"ended after {max(took, self.options.limit):.3f} s", f"ended after {self.options.limit:.3f} s")
        rest = self.behind_whole_listings(command, output)
        if rest is None:
            self.expect(line, fault, output[-300:], "a prefix of whole lines of the true output")
        elif state == "asleep":
            self.expect(line, fault, rest, 0)
        self.cuts["inside a listing" if rest else "between two"] += 1


def main():
    torture = Signals()
    count = torture.options.count or (10_000 if torture.long else 120)
    running = [(command, sink, "running") for command in COMMANDS for sink in SINKS]
    others = [(command, sink, "blocked") for command in NAMING for sink in SINKS]
    others += [(command, sink, "asleep") for command in COMMANDS for sink in SINKS[:2]]
    for turn in range(count):
        torture.signal_one(signal.SIGINT, *torture.random.choice(others if turn % 4 == 0 else running))
    for turn in range(count // 4):
        torture.signal_one(KILLERS[turn % 3], torture.random.choice(COMMANDS), torture.random.choice(SINKS[1:]), "running")
    print(f"slowest end {torture.slowest:.3f} s; outputs end {dict(torture.cuts)}")
    torture.end()


if __name__ == "__main__":
    main()
