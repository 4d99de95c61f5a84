#!/usr/bin/env python3
"""Sends signals at random moments to watches of every command, and looks at what they left behind.

A watch writes to a file by -f, to a pipe that is read, at once or slowly, or to one whose reader rests behind a random
number of bytes until the process has ended. It may wait for a name service that never answers, or sleep between runs.
What it wrote is a prefix of the true output, cut at the end of a line, or whole behind a sleep. Nothing is on standard
error. SIGINT gives status 0 within --limit, other signals end it by themselves.
"""
import os
import pathlib
import re
import signal
import subprocess
import threading
import time

from driver import Driver
from runs import Run, TIME, name_services, tarvelctl, text, wait_for

STAMP, KILLERS = "\n<time>\n", (signal.SIGTERM, signal.SIGHUP, signal.SIGKILL)
SIZES = "--flows 1500 --channels 400 --providers 600 --arenas 60 --namespaces 800 --processes 60 --stacks 60"
COMMANDS = ("channel", "flow", "flow-adv", "flow-owner", "flow-route -n", "flow-switch", "interface", "memory",
            "netns -a", "netstat -an", "netstat -s", "provider -D", "show", "channel-stats", "tree", "list-providers")
NAMING, SINKS = ("flow-route", "netstat -a"), ("file", "pipe", "slow pipe", "stopped pipe")
# One in five; a row of a file may be torn where a process is killed.
TURNS = (COMMANDS, SINKS, "running"), (COMMANDS, SINKS, "running"), (COMMANDS + NAMING, SINKS[:2], "asleep"), (
    NAMING, SINKS, "blocked"), (COMMANDS, SINKS[1:], "killed")


class PacedRun(Run):
    """A run whose output is read with pauses, or only so far, until its process has ended."""

    def __init__(self, *arguments, pause=0, stop=1 << 40, **options):
        self.pause, self.stop, self.ended = pause, stop, threading.Event()
        super().__init__(*arguments, **options)

    def read(self, fd):
        while fd == self.reader and not self.ended.wait(self.pause):
            got = os.read(fd, min(2048 if self.pause else 1 << 16, self.stop - len(self.data[fd])))
            self.data[fd] += got
            if not got:
                self.ended.wait()
        super().read(fd)


def catches_interrupts(process):
    status = pathlib.Path(f"/proc/{process.pid}/status").read_text()
    return process.poll() is not None or int(re.search(r"SigCgt:\s*(\w+)", status)[1], 16) & 1 << signal.SIGINT - 1


class Interrupts(Driver):
    def learn(self, command):
        """What a watch writes up to its first sleep, what in its next runs, and how long a run takes."""
        started = time.monotonic()
        listing = STAMP + self.run(self.kernel, command).out
        if command != "channel":
            return listing, listing, time.monotonic() - started
        watch = Run([tarvelctl, "-w", "1", command], self.kernel)  # prints from its second run on, and what has changed
        watch.wait("Instances: ", 2)
        _, part, *_ = watch.end(signal.SIGKILL).out.split("Instances: ")
        return STAMP, "Instances: " + part, time.monotonic() - started

    def signal_one(self, command, sink, state, number):
        self.runs, self.faults = self.runs + 1, self.faults + 1
        self.file.write_bytes(b"")
        first, following, duration = self.learned[command]
        paced = {"slow pipe": {"pause": self.random.uniform(0.0001, 0.002)},
                 "stopped pipe": {"stop": self.random.randrange(len(first))}}.get(sink, {})
        blocked = {"NAME_SERVICES_BLOCK_AT": str(self.random.randrange(1, 1000) if state == "blocked" else 0)}
        interval, to = "1000" if state == "asleep" else "1", ["-f", self.file] if sink == "file" else []
        run = PacedRun([tarvelctl, "-w", interval, *to, *command.split()], self.kernel, environment=blocked, **paced)

        def written():
            return TIME.sub("<time>", run.out + text(self.file.read_bytes()))
        while not catches_interrupts(run.process):
            pass
        if state == "asleep":
            wait_for(lambda: written() == first)
        rare = self.random.random() < 0.03  # in the sleep or the second run
        time.sleep(self.random.uniform(0, 1.3 if rare else 0.05 if state in ("asleep", "blocked") else duration))
        run.process.send_signal(number)
        try:
            status = run.process.wait(self.limit)
        except subprocess.TimeoutExpired:
            status = "late"
        run.ended.set()
        errors, left = run.end().err, written()
        true = first + following * (len(left) // len(following) + 1)
        whole = left == first or state != "asleep" and true.startswith(left) and left[-1:] in "\n"
        self.expect(command, (number, sink, state), (status, errors, whole or left[-300:]),
                    (0 if number == signal.SIGINT else -number, "", True))


driver = Interrupts(__doc__, limit=0.0, count=0)
driver.limit = driver.options.limit or (0.2 if driver.long else 60.0)
driver.file, driver.kernel = pathlib.Path(driver.directory, "output"), driver.make_kernel(*SIZES.split())
driver.kernel.environment.update(name_services(NAME_SERVICES_ANSWER="name.example.org"))
driver.learned = {command: driver.learn(command) for command in COMMANDS + NAMING}
for turn in range(driver.options.count or (12_500 if driver.long else 150)):
    *choices, kind = TURNS[turn % 5]
    sent = KILLERS[turn // 5 % 3] if kind == "killed" else signal.SIGINT
    driver.signal_one(*map(driver.random.choice, choices), kind, sent)
driver.end()
