#!/usr/bin/env python3
"""Lets the kernel fail, or its tables grow and shrink, at each call that each command makes."""
import errno
import pathlib
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
import tool_model
from fault_injection import FOREVER, Torture, exactly, that

ERRORS = errno.EPERM, errno.ENOENT, errno.EINTR, errno.EIO
SHORTER = -1, -320, -FOREVER  # as a size: a table that grows before it is read; at a read: one that shrinks


def cases(torture):
    for line in tool_model.lines(torture):
        calls = tool_model.Model(torture, line).turn
        yield line, [], that(f"{calls} calls of the kernel", lambda seen, n=calls: seen.calls.count("s") == n), {}
        kinds = [(1, error) for error in ERRORS] + [(FOREVER, error) for error in (*ERRORS, errno.ENOMEM)]
        kinds += [(count, errno.ENOMEM) for count in range(1, 13)]
        kinds += [] if line.startswith("-w") else [(1, value) for value in SHORTER]
        for turn in range(1, calls + 1):
            for count, value in kinds:
                faults = [("s", turn, count, value)]

                def judge(seen, line=line, faults=faults):
                    model = tool_model.Model(torture, line, faults)
                    return exactly(model.out, model.err, model.status)(seen)
                yield line, faults, judge, {}


Torture("kernel_torture", __doc__, 250, "--providers 4 --nexuses 4 --channels 6 --flows 9 --arenas 2 --namespaces 5"
        " --processes 4").finish(cases)
