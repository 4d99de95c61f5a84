#!/usr/bin/env python3
"""Lets each call of the kernel, each allocation, each write and each close of the commands fail in turn.

What is left of a report is told by runs without faults, on kernels without the tables that could not be had, and by the
rows below. The long form takes every way to report, on several kernels.
"""
import array
import errno
import functools
import itertools
import os
import pathlib
import signal

from driver import Driver
from runs import Result, Run, TIME, build, limit_files

FOREVER, STAMP, INTERRUPT = 1 << 31, "\n<time>\n", (1, signal.SIGINT)
TREE = ["nexus_provider_list", "nexus_channel_list", "stats/flow"]
NETSTAT = "netstat -n --flowswitch --flow-owner --flow-adv --netif -s -a"
# By command line the tables in the order of their fetches.
TABLES = {"channel": TREE[1:2], "provider -D": TREE[:1], "show": TREE, "tree": TREE, **{
    line: ["stats/" + name for name in names.split()] for line, names in {
        "flow -n": "flow", "flow-adv": "flow_adv", "flow-owner": "flow_owner", "flow-route -n": "flow_route",
        "flow-switch": "flow_switch", "interface": "net_if", "memory": "arena", "netns -a": "netns",
        "netns -i global -p tcp": "netns", NETSTAT: "flow userstack net_if flow_adv flow_owner flow_switch"}.items()}}
# What is printed and said where the first cannot be had, if anything. That ends a watch, but not of these.
PRINTED, SAID = {"channel": "No channels\n"}, {"provider -D": "failed to retrieve nexus provider list, {}\n"}
EIO_SAID = "sysctl for len failed, Input/output error\n"
GOES_ON = "memory", "provider -D", "show", NETSTAT
EXPANDING = "Error expanding tv_region_set-> capacity 1024\n"
LAST_WORDS = {"memory": EXPANDING, "channel": "realloc failed", "show": "realloc failed", "tree": "realloc failed"}
ERRORS = errno.EPERM, errno.ENOENT, errno.EINTR, errno.EIO
HARMLESS = (1, errno.EINTR), (3, errno.EINTR), (3, errno.EAGAIN), (1, -1), (1, -100), (FOREVER, -4095), (40, -1)
FATAL = errno.ENOSPC, errno.EIO, errno.EDQUOT, errno.EBADF, errno.EFBIG, 524, 0, errno.EPIPE  # 524 has no description
SINKS = "pipe", "file", "-f", "socket", "terminal"
SIZES = "--providers {} --nexuses {} --channels {} --flows {} --arenas {} --stacks 3 --namespaces 4 --seed {}"


def failed_write(error, interrupted=False):
    """What is said, and the status, after a failed write. Writing nothing is an error of the device."""
    if error == errno.EPIPE:
        return {"status": 0 if interrupted else -signal.SIGPIPE}
    return {"err": f"write error: {os.strerror(error or errno.EIO)}\n", "status": 74}


def fetch_faults(turn, allocation, counts):
    """Faults of a fetch, and which of its steps says so; none says of ten failures that the table has grown."""
    yield ("m", allocation, 1, errno.ENOMEM), "malloc"
    for read, step in enumerate(("for len", "for buf")):
        yield from ((("s", turn + read, 1, error), step) for error in ERRORS)
        yield from ((("s", turn + read, count, errno.ENOMEM), count > 10 and "for len") for count in counts)
    yield from ((("s", turn, 2 * count, -1), count > 10 and "for buf") for count in counts)  # grows between the calls


class Faults(Driver):
    def made(self, letter):
        """How many calls of a letter the last run made."""
        return array.array("I", self.calls.read_bytes())[ord(letter)]

    def turns(self, letters):
        return [(letter, turn) for letter in letters for turn in range(1, self.made(letter) + 1)]

    def attempt(self, line, *faults, to="pipe", sleeps=2, **options):
        """A run with faults, as failing_calls.cpp has them. A watch is interrupted in front of its last sleep."""
        plan = "".join("%s%d+%d=%d," % fault for fault in (*faults, ("Z", sleeps, *INTERRUPT)))
        self.file.write_bytes(b"")
        self.calls.write_bytes(bytes(4096))
        words = [build / "tests/faulted_tarvelctl", *line.split(), *(["-f", self.file] if to == "-f" else [])]
        seen = Run(words, self.kernel, {"-f": "pipe", "file": self.file}.get(to, to), name="tarvelctl", environment={
            "CALLS": str(self.calls), "FAULTS": plan, "ASAN_OPTIONS": "alloc_dealloc_mismatch=0"}, **options).end()
        self.runs += 1
        self.faults += sum(self.made(letter.lower()) >= first for letter, first, _, _ in faults)
        return seen._replace(out=TIME.sub("<time>", seen.out + self.file.read_text()))

    def judge(self, line, *faults, out, err="", status=0, part=False, **options):
        """A run leaves just this behind, or of the report rows, all those before the turn of its first fault."""
        seen, torn = self.attempt(line, *faults, **options), options.get("to") in ("socket", "terminal")
        letter, turn = faults[0][:2] if part else ("", 0)
        if letter == "w" and self.made(letter) < turn:  # with a reader in time
            part, err, status = False, "", 0
        in_turn = letter != "w" or (turn == 1) == (seen.out == "")
        if part and in_turn and out.startswith(seen.out) and (torn or seen.out[-1:] in "\n"):
            out = seen.out
        self.expect(line, (faults, options), seen, Result(out, err, status))

    @functools.lru_cache(None)
    def cut(self, kernel, line, size, *tables):
        """A run without faults where so many bytes at the end of some tables are missing."""
        before = {table: kernel.table(table) for table in tables}
        for table, contents in before.items():
            kernel.put(table, contents[:-size])
        seen = self.attempt(line)
        for table, contents in before.items():
            kernel.put(table, contents)
        return seen

    def fail_fetch(self, line, fault, at, step):
        """Lets a fetch fail, in the first run of a watch."""
        error, left = max(fault[3], 0) or errno.ENOMEM, self.cut(self.kernel, line, FOREVER, TABLES[line][at])
        said = f"sysctl {step} failed{f', {os.strerror(error)}' if step != 'malloc' else ''}\n"
        if at == 0 and line != NETSTAT:
            left = Result(PRINTED.get(line, ""), SAID.get(line, "").format(os.strerror(error)), 0)
        if line == "channel":  # whose watch is a test of its own
            return self.judge(line, fault, out=left.out, err=said)
        goes_on = at > 0 or line in GOES_ON or (line, error) == ("netns -a", errno.ENOMEM)
        again = STAMP + self.cut(self.kernel, line, 0).out if goes_on else ""
        self.judge("-w 1 " + line, fault, out=STAMP + left.out + again, err=said + left.err)

    def fetches(self, line):
        """Each call of the kernel for a table, and the allocation for it."""
        clean, started = self.attempt(line).out, self.made("m") - len(TABLES[line])
        for at, table in enumerate(TABLES[line]):
            for fault, step in fetch_faults(2 * at + 1, started + at + 1, range(1, 13) if self.long else (10, 11)):
                if step:
                    self.fail_fetch(line, fault, at, step)
                else:
                    self.judge(line, fault, out=clean)
            for size in 1, 320, FOREVER:  # shrinks between the calls
                self.judge(line, ("s", 2 * at + 2, 1, -size), **self.cut(self.kernel, line, size, table)._asdict())
        for turn in range(1, started + 1):  # the C++ library can do without
            self.judge(line, ("m", turn, 1, errno.ENOMEM), out=clean)

    def channels(self):
        """The switch that is read for each channel, and a watch of its own, which wants two snapshots in a row."""
        parts, listing = self.attempt("channel").out.split("\tPort["), self.attempt("-w 1 channel").out[len(STAMP):]
        bare = self.cut(self.kernel, "channel", FOREVER, "ring_stat_enable").out.split("\tPort[")
        for at in range(1, len(parts)):
            out, said = "\tPort[".join(parts[:at] + bare[at:]), "failed to get channel stat, Input/output error\n"
            self.judge("channel", ("s", 2 + at, FOREVER, errno.EIO), out=out, err=said * (len(parts) - at))
        for failing in itertools.product((False, True), repeat=4):
            turn, out, faults = 1, STAMP, []
            for before, now in zip((None, *failing), failing):
                shown = before is False and not now
                out += listing if shown else "No channels\n" if now and not before else ""
                faults += [("s", turn, 1, errno.EIO)] * now
                turn += 1 if now else len(parts) + 1 if shown else 2
            self.judge("-w 1 channel", *faults, out=out, err=EIO_SAID * sum(failing), sleeps=4)

    def allocations(self, line):
        """Each allocation but those of the fetches, with all that follow."""
        clean, words = self.attempt(line).out, {"malloc failed"}
        for letter, turn in self.turns("rn"):
            seen = self.attempt(line, (letter, turn, FOREVER, errno.ENOMEM))
            self.expect(line, (letter, turn), (clean.startswith(seen.out), seen.status), (True, 255))
            words.add(seen.err)
        self.expect(line, "last words", words, {"malloc failed", LAST_WORDS.get(line, "malloc failed")})

    def writes(self, line, to):
        """Each write, the close, and an interrupt at each call of a report."""
        clean = self.attempt(line, to=to).out
        closes, turns = self.made("c"), self.turns("wsmnr")
        whole = functools.partial(self.judge, line, out=clean, to=to)
        for letter, turn in turns:
            interrupt = letter.upper(), turn, *INTERRUPT
            if (letter, turn) != ("m", 1):  # which comes before main()
                whole(interrupt, part=True)
            for count, value in HARMLESS if letter == "w" else ():
                whole(("w", turn, count, value))
            for error in FATAL if letter == "w" else ():
                whole(("w", turn, FOREVER, error), part=True, **failed_write(error))
                whole(("w", turn, FOREVER, error), interrupt, part=True, **failed_write(error, interrupted=True))
            if letter == "w" and to in ("pipe", "socket"):  # whose reader takes nothing
                whole(("w", turn, FOREVER, errno.EAGAIN), interrupt, part=True)
        for error in (errno.EIO, errno.ENOSPC, errno.EDQUOT) * closes:
            whole(("c", 1, 1, error), **failed_write(error))
        whole(("c", 1, 1, errno.EINTR))

    def devices(self, line):
        """Diagnostics that are lost, full devices, limits on the size of files, closed standard descriptors."""
        clean, full, broken = self.attempt(line).out, failed_write(errno.ENOSPC)["err"], ("s", 1, 1, errno.EIO)
        said = EIO_SAID, SAID["provider -D"].format("Input/output error")
        for turn, fault in itertools.product(range(2), [*HARMLESS, *((1, error) for error in FATAL)]):
            left = "".join(said) if fault in HARMLESS else said[1 - turn]
            self.judge("provider -D", broken, ("d", turn + 1, *fault), out="", err=left)
        reader, writer = os.pipe()  # nobody reads it, and it takes no more
        os.write(writer, bytes(1 << 16))
        self.judge("tree", ("w", 1, FOREVER, errno.EIO), ("W", 1, *INTERRUPT), out="", status=74,
                   preexec_fn=lambda: os.dup2(writer, 2))
        self.judge("memory", ("r", 1, 1, errno.ENOMEM), out="", to="/dev/full", err=full + EXPANDING, status=255)
        ends = (signal.SIG_IGN, failed_write(errno.EFBIG)), (signal.SIG_DFL, {"status": -signal.SIGXFSZ})
        sizes = 0, 1, 4096, 32768, 40000, len(clean) - 1, len(clean)
        for size, (action, end), to in itertools.product(sizes, ends, ("file", "-f")):
            self.judge(line, out=clean[:size], to=to, **(end if size < len(clean) else {}),
                       preexec_fn=lambda: [signal.signal(signal.SIGXFSZ, action), limit_files(size)])
        for mask, to in itertools.product(range(8), SINKS[:3]):
            lost = {**failed_write(errno.EBADF), "out": ""} if mask & 2 and to != "-f" else {}
            closed = [fd for fd in range(3) if mask & 1 << fd]
            self.judge(line, to=to, closed=closed, **{"out": clean, **lost, **({"err": ""} if 2 in closed else {})})


driver = Faults(__doc__)
driver.file, driver.calls = (pathlib.Path(driver.directory, name) for name in ("output", "calls"))
for sizes in ((4, 4, 3, 5, 90), (250, 60, 40, 90, 99), (30, 9, 9, 40, 60))[:3 if driver.long else 1]:
    driver.kernel = driver.make_kernel(*SIZES.format(*sizes, driver.random.randrange(1 << 31)).split())
    for each in TABLES:
        driver.fetches(each)
        driver.allocations(each)
    driver.channels()
    driver.devices("memory")
    for each in itertools.product(TABLES if driver.long else ["tree"], SINKS):
        driver.writes(*each)
    for each in ("memory", "file"), ("-w 1 show", "pipe"), ("-w 1 show", "-f"):
        driver.writes(*each)
driver.end()
