#!/usr/bin/env python3
"""Lets each allocation of each command fail, once and with all that follow."""
import pathlib
import re
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
import tool_model
from fault_injection import FOREVER, Torture, exactly, that

NO_MEMORY = 255
HEAD = "a prefix of {!r} and of {!r}, then {!r}, status {}"


def last_words(line, calls):
    """What is said where the last of these calls, an allocation, ends the process."""
    if "memory" in line and re.search("rn?$", calls):  # the set, then its index
        return f"Error expanding tv_region_set-> capacity {1024 << calls.count('r') - 1}\n"
    has_tree = {"tree", "show", "channel-stats"} & {*line.split()}
    if has_tree and re.search("smsnn?$", calls) and calls.count("sms") % 3 == 0:  # flows are attached and sorted
        return "realloc failed"
    return {"r": "realloc failed", "n": "malloc failed"}[calls[-1]]


def cut_off(out, err, last):
    judge = that(HEAD.format(out, err, last, NO_MEMORY), lambda seen: seen.status == NO_MEMORY and
                 out.startswith(seen.out) and seen.err.endswith(last) and err.startswith(seen.err.removesuffix(last)))
    judge.__doc__ = last
    return judge


def cases(torture):
    expanding = "write error: No space left on device\nError expanding tv_region_set-> capacity 1024\n"
    yield "memory", [("r", 1, 1, 1)], exactly("", expanding, NO_MEMORY), {"to": "/dev/full"}
    started = torture.clean("").calls.count("m")  # by the start of the C++ library, which can do without
    for line in tool_model.lines(torture):
        clean = torture.clean(line)
        turns = dict.fromkeys("mrn", 0)
        for at, letter in enumerate(clean.calls, 1):
            if letter not in turns:
                continue
            turns[letter] += 1
            turn = turns[letter]
            once = [(letter, turn, 1, 1)]
            onwards = [(each, count + (each != letter), FOREVER, 1) for each, count in turns.items()]
            if letter != "m":
                judge = cut_off(clean.out, clean.err, last_words(line, clean.calls[:at]))
                yield line, once, judge, {}
                yield line, onwards, judge, {}
            elif turn <= started:
                yield line, once, exactly(*clean[:3]), {}
            else:
                fetch = turn - started
                alone = tool_model.Model(torture, line, starved=range(fetch, fetch + 1))
                yield line, once, exactly(alone.out, alone.err, alone.status), {}
                all_after = tool_model.Model(torture, line, starved=range(fetch, FOREVER))

                def judge(seen, line=line, model=all_after):
                    """The next one of another letter ends the process, where there is one."""
                    end = max(seen.calls.rfind(letter) for letter in "rn") + 1
                    if seen.status == 0 or not end:
                        return exactly(model.out, model.err, model.status)(seen)
                    return cut_off(model.out, model.err, last_words(line, seen.calls[:end]))(seen)
                yield line, onwards, judge, {}


Torture("memory_torture", __doc__, 250, "--providers 4 --nexuses 4 --channels 12 --flows 9 --arenas 90 --namespaces 5"
        " --processes 4").finish(cases)
