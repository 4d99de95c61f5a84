#!/usr/bin/env python3
"""Cuts every table inside its last three records, at every byte in the long form, and reads it with every command.

Each ending is that of a table below: what is said of a cut table, and what is shown of its whole records. What the
tool shows of whole records alone must be lines of the uncut report, one block for each record.
"""
import functools
import pathlib
import re
import signal
import struct
import sys

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from records import TABLES, walk  # noqa: E402
from torture import Result, Torture  # noqa: E402

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
    (("netns -i global -p tcp", "netns -i 10.255.255.255 -p tcp"), "stats/netns", SHORT, whole, None)) for command in commands]


def ends_of(records):
    """Where the records end; a group of channels ends with each of them."""
    return [0, *(each.end for record in records for each in record.followers.get("channels") or [record])]


def whole_part(records, table, cut):
    """The table of the whole records before `cut`. The group of channels that is cut counts those it still has."""
    left = table[:max((record.end for record in records if record.end <= cut), default=0)]
    for group in records:
        if "channels" in group.followers and group.head_end <= cut < group.end:
            whole, at = [each.end for each in group["channels"] if each.end <= cut], group.places("channel_count")[0]
            left += table[group.at:at] + struct.pack("<I", len(whole)) + table[at + 4:max(whole, default=group.head_end)]
    return left


def orphans(kernel):
    """What the tree says of flows whose nexus no provider has."""
    known = {instance["uuid"] for provider in kernel.records("nexus_provider_list") for instance in provider["instances"]}
    return b"orphan flow orphan nx_uuid" * sum(flow["sf_nx_uuid"] not in known for flow in kernel.records("stats/flow"))


def rows(report):
    """The lines of objects, as they are whatever comes behind them."""
    return [line.rstrip(", ") for line in report.decode().partition("+" * 70)[0].splitlines()
            if re.search(r"\w", line) and not re.search('"children"|Instances:', line)]


def check_whole(torture, kernel, case, table, seen, uncut):
    """Whether the report of whole records has one block for each, and no rows but those of the uncut report."""
    command, name, _, _, start = case
    records, uncut_rows = len(ends_of(walk(TABLES[name], table))) - 1, iter(uncut)
    said = orphans(kernel) if command in ("tree", "show", "channel-stats") else b""
    strange = [] if "--global" in command else [row for row in rows(seen.out) if row not in uncut_rows]
    blocks = len(re.findall(f"^{start}".encode(), seen.out, re.MULTILINE)) if start else records
    torture.expect(command, f"{records} whole records of {name}", (strange, blocks, seen[1:]), ([], records, (said, 0)))


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
    near = {end + step for end in ends[-2:] for step in (-1, 0, 1)} | {first + 1}
    return sorted(cut for cut in near | {torture.random.randrange(first, last) for _ in range(4)} if first < cut < last)


def torture_case(torture, kernel, case):
    command, name, (message, status), shown, start = case
    table, records = kernel.table(name), kernel.records(name)
    report = torture.run(kernel, command).out
    uncut, none = rows(report), of_none(command, start, report)

    @functools.cache
    def run_whole(contents):
        kernel.put(name, contents)
        seen = torture.run(kernel, command)
        check_whole(torture, kernel, case, contents, seen, uncut)
        return seen

    for cut in cuts(torture, ends_of(records)):
        left = whole_part(records, table, cut)
        expected = Result(none, b"", 0) if not left and none is not None else run_whole(left)
        kernel.put(name, table[:cut])
        if left != table[:cut] and not ("netns -i" in command and expected.out):
            expected = Result(shown(expected.out), message + expected.err, status)
        torture.faults += 1
        seen = torture.run(kernel, command)
        if isinstance(expected.out, list):
            seen = Result(shown(seen.out), *seen[1:])
        torture.expect(command, f"{name} cut at {cut} of {len(table)}", seen, expected)
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
