#!/usr/bin/env python3
"""Cuts every table inside its last three records, at every byte in the long form, and reads it with every command.

Each ending is that of a table below: what is said of a cut table, and what is shown of its whole records. What the
tool shows of whole records alone must be lines of the uncut report, one block for each record; sums are made here.
"""
import collections
import functools
import pathlib
import re
import signal
import struct
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from torture import RECORDS, Result, Torture, walk  # noqa: E402

def broken(function, line, expression="scan == (buffer + length)", file="tarvelctl/tarvelctl"):
    return f"Assertion failed: ({expression}), function {function}, file {file}, line {line}.\n".encode(), -signal.SIGABRT


SHORT = b"Buffer too short\n", 0
SCRAPE = broken("scrape_flows", 223, "(length % sizeof (*sf)) == 0", "common/mib")
FLOW = broken("cmd_flow", 689, "(length % sizeof (*sf)) == 0")
ADVISORY, STACK, ARENA = broken("cmd_flow_adv", 766), broken("cmd_userstack", 1038), broken("__memory_arena_stats", 1620)
OWNER, ROUTE = broken("cmd_flow_owner", 817, "sfo == (buffer + length)"), broken("cmd_flow_route", 933, "sfr == (buffer + length)")
WIDTH = "(length % width) == 0"
INTERFACE, SWITCH = broken("cmd_interface", 1073, WIDTH), broken("cmd_flow_switch", 1138, WIDTH)


def whole(report):
    return report


def title(report):
    return report[:report.find(b"\n") + 1]


def nothing(_):
    return b""


def in_any_order(report):
    """Channels are sorted when their group is whole."""
    return sorted(rows(report))


# Command, its table, how it ends on a cut one, what is shown then, and the line that a record starts with.
CASES = [(command, *case) for commands, *case in (
    (("provider", "list-providers -D"), "nexus_provider_list", SHORT, whole, r"\S.* [0-9A-F-]{36}( \[anon\])?$"),
    (("tree", "show", "channel-stats"), "nexus_provider_list", SHORT, whole, None),
    (("channel",), "nexus_channel_list", SHORT, lambda _: b"No channels\n", None),
    (("tree", "show", "channel-stats"), "nexus_channel_list", SHORT, in_any_order, None),
    (("tree", "show", "channel-stats"), "stats/flow", SCRAPE, nothing, None),
    (("flow", "netstat -an"), "stats/flow", FLOW, title, r" (tcp|udp)"),
    (("flow-adv", "netstat --flow-adv"), "stats/flow_adv", ADVISORY, whole, " - "),
    (("flow-owner", "netstat --flow-owner"), "stats/flow_owner", OWNER, whole, r".*\(\d+\)$"),
    (("flow-route -n",), "stats/flow_route", ROUTE, whole, "[0-9a-f*]"),
    (("netstat -s", "netstat -sp ip6 --show-zeros"), "stats/userstack", STACK, whole, " - "),
    (("netstat -s --global",), "stats/userstack", STACK, whole, None),
    (("interface", "netstat --netif"), "stats/net_if", INTERFACE, nothing, " - "),
    (("netstat --netif --global",), "stats/net_if", INTERFACE, nothing, None),
    (("flow-switch", "netstat --flowswitch"), "stats/flow_switch", SWITCH, nothing, " - "),
    (("netstat --flowswitch --global",), "stats/flow_switch", SWITCH, nothing, None),
    (("memory",), "stats/arena", ARENA, whole, ".* arena:  "),
    (("netns -a",), "stats/netns", SHORT, whole, "(tcp|udp) .*reservations"),
    (("netns -i global -p tcp", "netns -i LAST"), "stats/netns", SHORT, whole, None)) for command in commands]


def whole_part(name, table, cut):
    """The table of the whole records before `cut`. The group of channels that is cut counts those it still has."""
    ends, groups = walk(name, table)
    end = max(end for end in ends if end <= cut)
    last = max((at for at, _ in groups if at + 24 <= cut), default=None)
    if last is None:
        return table[:end]
    end = max(end, last + 24)
    return table[:last + 16] + struct.pack("<I", sum(last + 24 < at <= end for at in ends)) + table[last + 20:end]


def orphans(kernel, providers):
    """What the tree says of flows whose nexus no provider has."""
    ends, _ = walk("nexus_provider_list", providers)
    known = {providers[at:at + 16] for start, end in zip(ends, ends[1:]) for at in range(start + 264, end, 16)}
    flows = kernel.table("stats/flow")
    return b"orphan flow orphan nx_uuid" * sum(flows[at:at + 16] not in known for at in range(0, len(flows), 320))


def sums(name, table):
    """The counters that are left of all records folded into one, without zeros."""
    size, blocks = RECORDS[name][0], {"stats/userstack": ((48, 43), (400, 36), (688, 203), (2320, 22)), "stats/net_if": ((32, 29),),
                                      "stats/flow_switch": ((32, 52),)}[name]
    parts = [struct.unpack_from(f"<{count}Q", table, at + start) for at in range(0, len(table), size) for start, count in blocks]
    folded = [sum(column) % 2**64 for block in range(len(blocks)) for column in zip(*parts[block::len(blocks)])]
    return [value for value in folded if value]


def region_sums(table):
    """Total and wired memory in kilobytes for each of the twelve types, each region counted once."""
    regions, by_type = {}, collections.Counter()
    for at in (arena + 80 + 208 * slot for arena in range(0, len(table), 2608) for slot in range(12)):
        regions.setdefault(table[at + 64:at + 80], struct.unpack_from("<i", table, at + 80) + struct.unpack_from("<QQ", table, at + 152))
    for kind, total, wired in regions.values():
        by_type[kind, 0] += total
        by_type[kind, 1] += wired
    return [(by_type[kind, 0] >> 10, by_type[kind, 1] >> 10) for kind in range(12)]


def rows(report):
    """The lines of objects, as they are whatever comes behind them."""
    return [line.rstrip(", ") for line in report.decode().partition("+" * 70)[0].splitlines()
            if re.search(r"\w", line) and not re.search('"children"|Instances:', line)]


def check_whole(torture, kernel, case, table, seen, uncut):
    """Whether the report of whole records is right."""
    command, name, _, _, start = case
    report, all_rows = seen.out.decode(), iter(uncut)
    records = len(walk(name, table)[0]) - 1
    said = orphans(kernel, kernel.table("nexus_provider_list")) if command in ("tree", "show", "channel-stats") else b""
    right = {"ends": (said, 0)}
    found = {"ends": seen[1:]}
    if "--global" in command:
        right["sums"], found["sums"] = sums(name, table), [int(number) for number in re.findall(r": (\d+)$", report, re.MULTILINE)]
    else:
        right["strange rows"], found["strange rows"] = [], [row for row in rows(seen.out) if row not in all_rows]
    if start:
        right["records"], found["records"] = records, sum(bool(re.match(start, line)) for line in report.splitlines())
    if command == "memory":
        right["summary"] = region_sums(table)
        found["summary"] = [(int(a), int(b)) for a, b in re.findall(r"^ *[A-Z]+: +(\d+) KB +(\d+) KB$", report, re.MULTILINE)]
    torture.expect(command, f"{records} whole records of {name}", found, right)


def of_none(command, start, report):
    """The report of a table without one whole record, made from another report."""
    if command == "channel":
        return b"No channels\n"
    if command == "memory":
        zeros = re.sub(rb" *[\d.]+(?= [KM]B)", lambda number: (b"0.00" if b"." in number[0] else b"0").rjust(len(number[0])), report)
        return zeros[zeros.index(b"+" * 70):]
    if start:
        return report[:re.search(f"^{start}".encode(), report, re.MULTILINE).start()]
    return re.sub(rb"\t\t.*\n", b"", report) if "--global" in command else None


def cuts(torture, ends):
    first, last = ends[max(len(ends) - 4, 0)], ends[-1]
    if torture.long:
        return range(first + 1, last)
    near = {end + step for end in ends[-4:] for step in (-1, 0, 1)}
    return sorted(cut for cut in near | {torture.random.randrange(first, last) for _ in range(4)} if first < cut < last)


def last_namespace(table):
    at = walk("stats/netns", table)[0][-2]
    address, length = table[at:at + 16], table[at + 16]
    text = "global" if length == 0 else address_text(address, length)
    return f"netns -i {text} -p {'udp' if table[at + 17] == 17 else 'tcp'}"


def address_text(address, length):
    return ".".join(map(str, address[:4])) if length == 4 else ":".join(f"{a:02x}{b:02x}" for a, b in zip(address[::2], address[1::2]))


def torture_case(torture, kernel, case):
    command, name, (message, status), shown, start = case
    table = kernel.table(name)
    line = last_namespace(table) if "LAST" in command else command
    report = torture.run(kernel, line).out
    uncut, none = rows(report), of_none(command, start, report)

    @functools.cache
    def run_whole(contents):
        kernel.put(name, contents)
        seen = torture.run(kernel, line)
        check_whole(torture, kernel, case, contents, seen, uncut)
        return seen

    for cut in cuts(torture, walk(name, table)[0]):
        left = whole_part(name, table, cut)
        expected = Result(none, b"", 0) if not left and none is not None else run_whole(left)
        kernel.put(name, table[:cut])
        if left != table[:cut] and not ("netns -i" in line and expected.out):
            expected = Result(shown(expected.out), message + expected.err, status)
        torture.faults += 1
        seen = torture.run(kernel, line)
        if isinstance(expected.out, list):
            seen = Result(shown(seen.out), *seen[1:])
        torture.expect(line, f"{name} cut at {cut} of {len(table)}", seen, expected)
    kernel.put(name, table)


def main():
    torture = Torture("truncation", __doc__)
    small = ("--providers", 2, "--channels", 6, "--flows", 1, "--arenas", 1, "--namespaces", 1, "--processes", 1)
    for sizes in ((), small):  # also where no whole record is left, and where flows lose their nexus
        kernel = torture.make_kernel(*sizes)
        for case in CASES:
            torture_case(torture, kernel, case)
    torture.end()


if __name__ == "__main__":
    main()
