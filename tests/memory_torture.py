#!/usr/bin/env python3
"""Lets each allocation of each command fail, once and with all that follow."""
import pathlib
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
import tool_model
from fault_injection import FOREVER, Torture, exactly, that

NO_MEMORY = 255
HEAD = "a prefix of {!r} and of {!r}, then {!r}, status {}"


def last_words(line, letter, turn):
    """What is said where the allocation of this letter and turn ends the process."""
    if letter == "r" and "memory" in line:
        return f"Error expanding tv_region_set-> capacity {1024 << turn - 1}\n"
    return {"r": "realloc failed", "n": "malloc failed"}[letter]


def cut_off(out, err, last):
    return that(HEAD.format(out, err, last, NO_MEMORY), lambda seen: seen.status == NO_MEMORY and
                out.startswith(seen.out) and seen.err.endswith(last) and err.startswith(seen.err.removesuffix(last)))


def cases(torture):
    started = torture.clean("").calls.count("m")  # by the start of the C++ library, which can do without
    for line in tool_model.lines(torture):
        clean = torture.clean(line)
        turns = dict.fromkeys("mrn", 0)
        for letter in clean.calls:
            if letter not in turns:
                continue
            turns[letter] += 1
            turn = turns[letter]
            once = [(letter, turn, 1, 1)]
            onwards = [(each, count + (each != letter), FOREVER, 1) for each, count in turns.items()]
            if letter != "m":
                judge = cut_off(clean.out, clean.err, last_words(line, letter, turn))
                yield line, once, judge, {}
                yield line, onwards, judge, {}
            elif turn <= started:
                yield line, once, exactly(*clean[:3]), {}
            else:
                fetch = turn - started
                alone = tool_model.Model(torture, line, starved=range(fetch, fetch + 1))
                yield line, once, exactly(alone.out, alone.err, alone.status), {}
                all_after = tool_model.Model(torture, line, starved=range(fetch, FOREVER))

                def judge(seen, line=line, model=all_after, turns=dict(turns)):
                    """The next one of another letter ends the process, where there is one."""
                    end = next((letter for letter in seen.calls[::-1] if letter in "rn"), None)
                    if seen.status == 0 or not end:
                        return exactly(model.out, model.err, model.status)(seen)
                    return cut_off(model.out, model.err, last_words(line, end, turns[end] + 1))(seen)
                yield line, onwards, judge, {}


Torture("memory_torture", __doc__, 250, "--providers 4 --nexuses 4 --channels 12 --flows 9 --arenas 90 --namespaces 5"
        " --processes 4").finish(cases)
