#!/usr/bin/env python3
"""Cuts every table, lets every count in it lie, and puts hostile texts into every text.

Cuts are at and right behind every field of the last two records, or at every byte in the long form; counts say one more
than there are, what is out of any proportion, and what wraps in 32 bits. Each ending is that of a table below, behind
the report of the whole records. On a terminal each byte that it might obey shows as "?" and nothing else moves, in
UTF-8 or where each byte is a character, while a pipe gets the bytes as they are: what is expected is a report in which
the same texts are harmless, with the bytes put in.
"""
import functools
import os
import re

from driver import Driver
from records import RECORDS, TABLES, encoded
from runs import SHORT, Result, aborted, name_services

WIDTH = "(length % width) == 0"
SCAN = "scan == (buffer + length)"
CUT = Result("", SHORT, 0)
TREES = "tree", "show", "channel-stats"


def title(report):
    return report[:report.find("\n") + 1]


def in_any_order(report):
    """Channels are sorted when their group is whole, and in a dump the last one has no comma behind it."""
    lines = (line.rstrip(", ") for line in report.splitlines())
    return sorted(line for line in lines if re.search(r"\w", line) and '"children"' not in line)


# Commands, their table, how they end where it is damaged, and what they show then of the report of the whole records.
CASES = [(command, *case) for commands, *case in (
    (("provider", "list-providers -D", *TREES), "nexus_provider_list", CUT, str),
    (("channel",), "nexus_channel_list", CUT, lambda _: "No channels\n"),
    (TREES, "nexus_channel_list", CUT, in_any_order),
    (TREES, "stats/flow", aborted("scrape_flows", 223, "(length % sizeof (*sf)) == 0", file="common/mib"),
     lambda _: ""),
    (("flow", "netstat -an"), "stats/flow", aborted("cmd_flow", 689, "(length % sizeof (*sf)) == 0"), title),
    (("flow-adv", "netstat --flow-adv"), "stats/flow_adv", aborted("cmd_flow_adv", 766, SCAN), str),
    (("flow-owner", "netstat --flow-owner"), "stats/flow_owner",
     aborted("cmd_flow_owner", 817, "sfo == (buffer + length)"), str),
    (("flow-route -n",), "stats/flow_route", aborted("cmd_flow_route", 933, "sfr == (buffer + length)"), str),
    (("netstat -s", "netstat -sp ip6 --show-zeros", "netstat -s --global"), "stats/userstack",
     aborted("cmd_userstack", 1038, SCAN), str),
    (("interface", "netstat --netif", "netstat --netif --global"), "stats/net_if",
     aborted("cmd_interface", 1073, WIDTH), lambda _: ""),
    (("flow-switch", "netstat --flowswitch", "netstat --flowswitch --global"), "stats/flow_switch",
     aborted("cmd_flow_switch", 1138, WIDTH), lambda _: ""),
    (("memory",), "stats/arena", aborted("__memory_arena_stats", 1620, SCAN), str),
    (("netns -a", "netns -i global -p tcp", "netns -i 10.255.255.255 -p tcp"), "stats/netns", CUT, str))
    for command in commands]


def all_of(record):
    """A record and all that follows it, directly or not."""
    return [record, *(inner for behind in record.followers.values() for each in behind for inner in all_of(each))]


def whole_part(records, table, cut):
    """What is whole before `cut`. A group of channels that is cut counts those it still has."""
    left = table[:max((record.end for record in records if record.end <= cut), default=0)]
    for group in records:
        if "channels" in group.followers and group.head_end <= cut < group.end:
            whole = [each.end for each in group["channels"] if each.end <= cut]
            count, = group.places("channel_count")
            left += table[group.at:count] + encoded(group.fields["channel_count"], len(whole))
            left += table[count + 4:max(whole, default=group.head_end)]
    return left


def damages(records, table):
    """Damaged tables, as (what is wrong, the table, where one with the same end would be cut)."""
    last = records[-2:]
    cuts = {place + step for record in last for each in all_of(record) for field in each.fields
            for place in each.places(field)[::max(1, len(each.places(field)) - 1)] for step in (0, 1)}
    for cut in sorted(range(last[0].at + 1, len(table)) if driver.long else cuts - {0, len(table)}):
        yield f"cut at {cut} of {len(table)}", table[:cut], cut
    for record in all_of(records[-1]):
        for behind in record.about["followers"]:
            row, (at,) = record.fields[behind["count"]], record.places(behind["count"])
            size, true = RECORDS[behind["record"]]["size"], record[behind["count"]]
            counts = {true + 1 + len(table) // size, 2**31 // size + 1, 2**32 // size + 1, 2**31, 2**32 - 1}
            for count in counts if row["size"] == 4 else {255}:
                cut = len(table) if behind["name"] == "channels" else at + 1
                yield f"{count} for {true} at {at}", table[:at] + encoded(row, count) + table[at + row["size"]:], cut


def empty_report(command, report):
    """The report of a table with bytes, but without one whole record, from a report of some."""
    if command == "memory":
        zeros = re.sub(r" *[\d.]+(?= [KM]B)", lambda n: ("0.00" if "." in n[0] else "0").rjust(len(n[0])), report)
        return zeros[zeros.index("+" * 70):]
    if command.startswith("netstat -s --global"):
        return re.sub(r"\t\t.*\n", "", report)
    return title(report) if re.match("Proto|NetIf|Local", report) else ""


def damage_case(kernel, command, name, ending, shown):
    table, records = kernel.table(name), kernel.records(name)
    intact = driver.run(kernel, command)

    @functools.cache
    def whole(contents):
        if not contents and command not in TREES:
            return Result(empty_report(command, intact.out), "", 0)
        kernel.put(name, contents)
        return driver.run(kernel, command)

    for what, damaged, cut in damages(records, table):
        left = whole_part(records, table, cut)
        expected = whole(left)
        if left != damaged and not ("netns -i" in command and expected.out):
            expected = Result(shown(expected.out), ending.err + expected.err, ending.status)
        kernel.put(name, damaged)
        driver.faults += 1
        seen = driver.run(kernel, command)
        if isinstance(expected.out, list):
            seen = seen._replace(out=shown(seen.out))
        driver.expect(command, f"{name}, {what}", seen, expected)
    kernel.put(name, table)


# Commands, with how many texts they show of the kernel below.
SHOWING = {"channel": 3, "flow": 4, "flow-adv": 2, "flow-owner": 2, "flow-route -n": 1, "flow-route": 3,
           "flow-switch": 1, "interface": 1, "memory": 4, "netstat -a": 8, "netstat -s": 2, "provider -D": 1, "show": 2,
           "tree": 6}
# What UTF-8 is made of, and what comes near it.
PIECES = (*(character.encode() for character in "a\u0085\u00e4\u20ac\u2027\u2028\u202e\u2066\u206a\U0001f9ed"),
          *(bytes([value]) for value in b"\x80\x9f\xa0\xbf\xc2\xe0\xe2\xed\xf0\xf4\xf8"))
# Controls, separators of lines and paragraphs, what reorders a text, and strays, which Python makes surrogates of.
OBEYED = re.compile("[\0-\x1f\x7f-\x9f\u2028-\u202e\u2066-\u2069\udc80-\udcff]")
HARMLESS = b"~"  # a character in every locale, and nowhere else in a report


def texts():
    """Texts of 16 bytes, of which a process name takes 15."""
    alphabet = bytes([*range(1, 256), 0])
    yield from (alphabet[at:at + 15].ljust(15, b".") + b"x" for at in range(0, 256, 15))
    yield from (b"".join(driver.random.choices(PIECES, k=16))[:16] for _ in range(1000 if driver.long else 12))
    yield from (bytes([value]) for value in (alphabet if driver.long else b"\x1b\x9b"))


def fill(kernel, tables, hostile):
    """Makes it the text of everything; one of 16 bytes goes on to the end of its field."""
    for name, records in tables.items():
        table = bytearray(records[0].table)
        for record in records:
            for row, at in record.find("type", "text"):
                whole = hostile * (row["size"] // 16) if len(hostile) == 16 else hostile
                table[at:at + row["size"]] = whole.ljust(row["size"], b"\0")
            if name == "nexus_provider_list":
                at, = record.places("name_length")
                table[at:at + 4] = encoded(record.fields["name_length"], 64)
        kernel.put(name, bytes(table))
    for name in kernel.root.glob("proc/*/comm"):
        name.write_bytes(hostile[:15] + b"\n")
    kernel.environment["NAME_SERVICES_ANSWER"] = os.fsdecode(hostile.split(b"\0")[0] * 3)


def hidden(shown, charset):
    text = shown.decode(charset, "surrogateescape")
    return OBEYED.sub(lambda found: "?" * len(found[0].encode(charset, "surrogateescape")), text).encode(
        charset, "surrogateescape")


# What a text becomes, by where the output leads and the locale; a character is a byte where there is no such locale.
BY_BYTE = "terminal", "no_WHERE.UTF-8"
SINKS = {BY_BYTE: lambda shown: hidden(shown, "latin-1"),
         ("terminal", "C.UTF-8"): lambda shown: hidden(shown, "utf-8"), ("pipe", "C"): bytes}


def hostile_texts():
    kernel = driver.make_kernel("--providers", 2, "--channels", 6, "--flows", 2, "--arenas", 1, "--processes", 2)
    kernel.environment.update(name_services())
    tables = {name: kernel.records(name) for name in TABLES}

    def report(command, to, locale):
        seen = driver.run(kernel, command, to=to, merged=True, environment={"LC_ALL": locale})
        return seen.out.encode("utf-8", "surrogateescape"), seen.status

    harmless = {}
    for hostile in texts():
        shown = hostile.split(b"\0")[0]
        if len(shown) not in harmless:
            fill(kernel, tables, HARMLESS * len(shown))
            harmless[len(shown)] = {(line, sink): report(line, *sink) for line in SHOWING for sink in SINKS}
            for line, least in SHOWING.items():
                colourful, plain = (harmless[len(shown)][line, sink][0] for sink in (BY_BYTE, ("pipe", "C")))
                count = len(re.findall(HARMLESS + b"+", plain))
                driver.expect(line, "harmless, but for colours", re.sub(rb"\x1b\[3?[016]m", b"", colourful), plain)
                driver.expect(line, "how many texts there are, at least", min(count, least), least if shown else 0)
        fill(kernel, tables, hostile)
        for (line, sink), (plain, status) in harmless[len(shown)].items():
            expected = re.sub(HARMLESS + b"+", lambda found: SINKS[sink]((shown * 4)[:len(found[0])]), plain)
            driver.faults += 1
            driver.expect(line, f"the text {hostile!r} to {sink}", report(line, *sink), (expected, status))


driver = Driver(__doc__)
small = "--providers", 2, "--channels", 6, "--flows", 2, "--arenas", 1, "--namespaces", 2, "--processes", 1
for sizes in (small, ()) if driver.long else (small,):
    made = driver.make_kernel(*sizes)
    for each in CASES:
        damage_case(made, *each)
hostile_texts()
driver.end()
