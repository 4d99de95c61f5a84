#!/usr/bin/env python3
"""Lets each write of a report or of a diagnostic fail, be short or be interrupted, and real devices be closed or full."""
import errno
import fcntl
import itertools
import os
import pathlib
import resource
import signal
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
import tool_model
from fault_injection import FOREVER, SIGINT, Torture, exactly, that

HARMLESS = (1, errno.EINTR), (3, errno.EINTR), (3, errno.EAGAIN), (1, -1), (1, -100), (FOREVER, -4095), (40, -1)
FATAL = errno.ENOSPC, errno.EIO, errno.EDQUOT, errno.EBADF, errno.EFBIG, 524, 0, errno.EPIPE  # 524 has no description


def error_end(error, signalled=False):
    """What is left to say, and the status, after a failure. Writing nothing is an error of the device."""
    if error == errno.EPIPE:
        return "", 0 if signalled else -signal.SIGPIPE
    return f"write error: {os.strerror(error or errno.EIO)}\n", 74


def prefix_then(clean, err, status, turn=0, torn=False):
    """A judge that wants rows of the report, all that was written before the turn of the fault, and then that end.
    The last row may be torn where the device takes parts of writes. With a reader in time there are fewer turns."""
    def holds(seen):
        if seen.calls.count("w") < turn:
            return seen[:3] == clean[:3]
        return (clean.out.startswith(seen.out) and (torn or ("\n" + seen.out).endswith("\n")) and
                (turn == 0 or (turn == 1) == (seen.out == "")) and seen[1:3] == (err, status))
    return that(f"{'a part' if torn else 'rows'} of the report, then {err!r} and status {status}", holds)


def write_cases(torture, line, to):
    clean = torture.clean(line, to=to)
    whole, options, torn = exactly(*clean[:3]), {"to": to}, to in ("socket", "terminal")
    for turn in range(1, clean.calls.count("w") + 1):
        for count, value in HARMLESS:
            yield line, [("w", turn, count, value)], whole, options
        for error in FATAL:
            fault = ("w", turn, FOREVER, error)
            yield line, [fault], prefix_then(clean, *error_end(error), turn, torn), options
            judge = prefix_then(clean, *error_end(error, signalled=True), turn, torn)
            yield line, [fault, ("w", turn, 1, SIGINT)], judge, options
        yield line, [("w", turn, 1, SIGINT)], prefix_then(clean, "", 0, torn=torn), options
        if to in ("pipe", "socket"):
            faults = [("w", turn, 1, SIGINT), ("w", turn, FOREVER, errno.EAGAIN)]
            yield line, faults, prefix_then(clean, "", 0, turn, torn), options
    for error in (errno.EIO, errno.ENOSPC, errno.EDQUOT):
        if "c" in clean.calls:
            yield line, [("c", 1, 1, error)], exactly(clean.out, *error_end(error)), options
    yield line, [("c", 1, 1, errno.EINTR)], whole, options
    for letter in "smnr":  # the first allocation comes before main()
        for turn in range(2, clean.calls.count(letter) + 1, 7):
            yield line, [(letter, turn, 1, SIGINT)], prefix_then(clean, "", 0, torn=torn), options


def diagnostic_cases(torture, line, faults):
    """No one is left to tell of a diagnostic that is lost; those after it and the report are as ever."""
    clean = torture.run(line, faults)
    turns = range(1, clean.calls.count("d") + 1)
    starts = [len(torture.run(line, [*faults, ("d", turn, FOREVER, errno.EIO)]).err) for turn in turns]
    for turn, start, end in zip(turns, starts, [*starts[1:], len(clean.err)]):
        for count, value in HARMLESS:
            yield line, [*faults, ("d", turn, count, value)], exactly(*clean[:3]), {}
        for error in FATAL:
            judge = exactly(clean.out, clean.err[:start] + clean.err[end:], clean.status)
            yield line, [*faults, ("d", turn, 1, error)], judge, {}


def limit(size, disposition):
    """Before the program starts: files may not grow beyond a size, and a signal says so or not."""
    signal.signal(signal.SIGXFSZ, disposition)
    resource.setrlimit(resource.RLIMIT_CORE, (0, 0))
    resource.setrlimit(resource.RLIMIT_FSIZE, (size, resource.RLIM_INFINITY))


def device_cases(torture, line):
    """Without injection: a full device, a limit on the size of files, standard descriptors that are closed."""
    clean = torture.clean(line)
    full, closed = error_end(errno.ENOSPC), error_end(errno.EBADF)
    yield line, [], exactly("", *full), {"to": "/dev/full"}
    yield f"{line} -f /dev/full", [], exactly("", *full), {}
    for size in (0, 1, 100, 4096, 32768, 40000, len(clean.out) - 1, len(clean.out)):
        fits = size >= len(clean.out)
        for disposition, end in (signal.SIG_IGN, error_end(errno.EFBIG)), (signal.SIG_DFL, ("", -signal.SIGXFSZ)):
            for to in "file", "-f":
                yield line, [], exactly(clean.out[:size], *(clean[1:3] if fits else end)), {
                    "to": to, "prepare": lambda size=size, disposition=disposition: limit(size, disposition)}
    for fds in itertools.chain.from_iterable(itertools.combinations(range(3), n) for n in range(4)):
        def prepare(fds=fds):
            for fd in fds:
                os.close(fd)
        for to in "pipe", "file", "-f":
            out, err, status = ("", *closed) if 1 in fds and to != "-f" else clean[:3]
            yield line, [], exactly(out, "" if 2 in fds else err, status), {"to": to, "prepare": prepare}


def cases(torture):
    reader, writer = os.pipe()  # nobody reads it, and it takes no more
    os.write(writer, bytes(fcntl.fcntl(writer, fcntl.F_GETPIPE_SZ)))
    yield "tree", [("w", 1, FOREVER, 5), ("w", 1, 1, SIGINT)], exactly("", "", 74), {"prepare": lambda: os.dup2(writer, 2)}
    reports = ["provider -D", f"netstat -n --show-zeros {tool_model.ALL}", "tree"]
    for line in reports:
        for to in "pipe", "file", "-f", "socket", "terminal":
            yield from write_cases(torture, line, to)
    yield from device_cases(torture, reports[0])
    for to in "pipe", "-f":
        yield from write_cases(torture, "-w 1 show", to)
    for line, faults in ("", []), ("tree x", []), ("netstat", []), ("netns --no", []), ("provider", [("s", 1, 1, 5)]), (
            f"netstat {tool_model.ALL}", [("s", 2, FOREVER, 5)]), ("tree", [("s", 3, FOREVER, 5)]):
        yield from diagnostic_cases(torture, line, faults)


Torture("output_torture", __doc__, 700, "--providers 250 --nexuses 60 --channels 40 --flows 90 --arenas 2 --stacks 9"
        " --namespaces 5 --processes 9").finish(cases)
