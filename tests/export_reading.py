"""What tarvelexport has to say of each table, read at offsets that tarvel-tables(5) states, each by hand."""
import socket
import struct
import uuid

from records import RECORDS

NAMES = {42: "curl", 43: 'a"b\\\n\x7f\u0085'}
STATES = dict(enumerate("CLOSED LISTEN SYN_SENT SYN_RCVD ESTABLISHED CLOSE_WAIT FIN_WAIT_1 CLOSING LAST_ACK FIN_WAIT_2 "
                        "TIME_WAIT".split())) | {20: "NO_TRAFFIC", 21: "SINGLE", 22: "MULTIPLE"}
CLASSES = {0: "BE", 0x80090: "BKS", 0x100080: "BK", 0x180010: "RD", 0x200020: "OAM", 0x280120: "AV", 0x300110: "RV",
           0x380100: "VI", 0x400180: "VO", 0x480190: "CTL"}
PROTOCOLS = {6: "tcp", 17: "udp"}
CHANNEL = {**dict(enumerate("MON_TX MON_RX NO_COPY USER_PACKET_POOL DEFUNCT_OK EXCLUSIVE".split())), 31: "DEFUNCT"}
FLOW = dict(zip((4, 5, 6, 8, 9, 12, 13, 24, 25, 26, 27, 30, 31), "tclqbweandoxr"))
MODE = {0: "NOREDIRECT", 1: "MMAPOK", 2: "READONLY", 3: "PERSISTENT", 4: "MONOLITHIC", 5: "NOCACHE", 31: "MIRRORED"}
ROUTE = dict(zip((4, 5, 6, 7, 8), "ogrid"))
ADVISORY = {0: "VALID", 1: "CONTROLLED"}
TYPES = dict(enumerate("user-pipe kernel-pipe net-if flow-switch".split()))
SUBTYPES = {0: "bridge", 1: "multistack"}
REGIONS = dict(enumerate("SCHEMA RING BUF MDU USD USTATS FLOWADV NEXUSADV SYSCTLS MDK KSD KSTATS".split()))
ARENAS = {0: "NEXUS", 1: "PLCY", 2: "SYSTEM"}


class Cut(Exception):
    """The table ends inside a record."""


class Bytes:
    """Bytes from somewhere on in a table, of which so many must be there."""

    def __init__(self, table, at, size):
        self.table, self.at = table, at
        if at + size > len(table):
            raise Cut

    def number(self, form, at):
        return struct.unpack_from("<" + form, self.table, self.at + at)[0]

    def numbers(self, names, form, at):
        names = names.split()
        return dict(zip(names, struct.unpack_from(f"<{len(names)}{form}", self.table, self.at + at)))

    def raw(self, at, size):
        return self.table[self.at + at:self.at + at + size]

    def text(self, at, size):
        return self.raw(at, size).split(b"\0")[0].decode("utf-8", "replace")

    def uuid(self, at):
        return str(uuid.UUID(bytes=self.raw(at, 16))).upper()

    def index(self, at, none=0xFFFFFFFF):
        found = self.number("I", at)
        return None if found == none else found

    def named(self, names, form, at):
        found = self.number(form, at)
        return names.get(found, f"unknown({found})")

    def flags(self, names, at):
        bits = self.number("I", at)
        return [names.get(bit, f"bit({bit})") for bit in range(32) if bits >> bit & 1]

    def address(self, at, family):
        """Of a socket address; the scope stands in bytes 2 and 3 of some."""
        if family == 2:
            return {"address": socket.inet_ntop(socket.AF_INET, self.raw(at + 4, 4)), "scope": None}
        if family != 30:
            return {"address": None, "scope": None}
        plain, scope = self.raw(at + 8, 16), 0
        if plain[0] == 0xFE and 0x80 <= plain[1] < 0xC0 or plain[0] == 0xFF and plain[1] & 15 in (1, 2):
            scope, plain = plain[2] << 8 | plain[3], plain[:2] + b"\0\0" + plain[4:]
        return {"address": socket.inet_ntop(socket.AF_INET6, plain), "scope": scope or None}

    def counters(self, record, field, at):
        names = RECORDS[record]["fields"][field]["names"]
        return dict(zip(names, struct.unpack_from(f"<{len(names)}Q", self.table, self.at + at), strict=True))


def provider(table, at):
    r = Bytes(table, at, 264)
    behind = Bytes(table, at + 264, 16 * r.number("I", 256))
    kind = r.named(TYPES, "I", 132)
    yield at + 264 + 16 * r.number("I", 256), "provider", {
        "provider": r.uuid(0), "name": r.text(64, min(64, r.number("I", 128))), "type": kind,
        "subtype": r.named(SUBTYPES, "I", 184) if kind == "flow-switch" else None,
        "anonymous": bool(r.number("I", 144) & 1),
        **r.numbers("format tx_rings rx_rings tx_slots rx_slots buf_size meta_size", "i", 148),
        "pipes": r.number("i", 180), "mhints": r.number("i", 188), "ifindex": r.number("i", 192),
        "instances": [behind.uuid(16 * i) for i in range(r.number("I", 256))]}


def activity(r, at):
    return {**r.numbers("slots bytes count", "Q", at),
            **r.numbers("min_slots max_slots slots_per_sec slots_per_sec_avg", "I", at + 24),
            **r.numbers("bytes_per_sec bytes_per_sec_avg", "Q", at + 40)}


def ring(r):
    return {"ring": r.number("I", 0), **r.numbers("memory_total memory_used", "Q", 72),
            **r.numbers("corrupted length_modified length_too_large", "Q", 152), "xfer": activity(r, 8),
            "sync": activity(r, 88)}


def group(table, at):
    head = Bytes(table, at, 24)
    yield at, "nexus", {"nexus": head.uuid(0), "channels": head.number("I", 16)}
    at += 24
    for _ in range(head.number("I", 16)):
        r = Bytes(table, at, 48)
        tx, rx = r.number("I", 32), r.number("I", 36)
        Bytes(table, at + 48, 184 * (tx + rx))
        rings = [ring(Bytes(table, at + 48 + 184 * i, 184)) for i in range(tx + rx)]
        at += 48 + 184 * (tx + rx)
        yield at, "channel", {
            "nexus": head.uuid(0), "channel": r.uuid(0), "flags": r.flags(CHANNEL, 16), "pid": r.number("i", 20),
            "process": NAMES.get(r.number("i", 20)), "fd": r.number("i", 24), "port": r.number("I", 28),
            "tx": rings[:tx], "rx": rings[tx:]}
    yield at, None, None


def flow(table, at):
    r = Bytes(table, at, 320)
    family = r.number("B", 81)
    ends = {name: {**r.address(place, family), "port": int.from_bytes(r.raw(place + 2, 2), "big")
                   if family in (2, 30) else None} for name, place in (("local", 80), ("remote", 108))}
    counts = {name: {**r.numbers("bytes packets", "Q", place), "state": r.named(STATES, "I", place + 16),
                     "rtt_us": r.index(place + 20, 0)} for name, place in (("tx", 152), ("rx", 216))}
    yield at + 320, "flow", {
        "nexus": r.uuid(0), "interface": r.text(16, 16), "bucket": r.index(32), "process": r.text(36, 32),
        "pid": r.number("i", 68), "flags": r.flags(FLOW, 72), "port": r.index(76),
        "protocol": r.named(PROTOCOLS, "B", 136), "service_class": r.named(CLASSES, "i", 140),
        "advisory": r.index(144), **ends, **counts}


def advisory(table, at):
    r = Bytes(table, at, 40)
    count = r.number("I", 36)
    entries = Bytes(table, at + 40, 20 * count)
    yield at + 40 + 20 * count, "flow_advisory" if count <= 512 else "left out", {
        "nexus": r.uuid(0), "interface": r.text(16, 16), "pid": r.number("i", 32),
        "process": NAMES.get(r.number("i", 32)),
        "entries": [{"flow": entries.uuid(20 * i), "flags": entries.flags(ADVISORY, 20 * i + 16)}
                    for i in range(count)]}


def owner(table, at):
    r = Bytes(table, at, 128)
    yield at + 128, "flow_owner", {
        "nexus": r.uuid(0), "interface": r.text(16, 16), "bucket": r.index(32), "process": r.text(36, 32),
        "pid": r.number("i", 68), "port": r.number("I", 72), "pid_bound": r.number("I", 76) != 0,
        "destroyed": r.number("I", 80) != 0}


def route(table, at):
    r = Bytes(table, at, 256)
    family, flags = r.number("B", 101), r.flags(ROUTE, 56)
    yield at + 256, "flow_route", {
        "interface": r.text(32, 16), "bidx": r.number("I", 48), "ibidx": r.number("I", 52), "flags": flags,
        "refs": r.number("I", 60), "expire": r.number("q", 64), "local": r.address(72, family),
        "remote": r.address(100, family), "gateway": r.address(128, family if "g" in flags else 0),
        "mac": r.raw(192, 6).hex(":") if "i" in flags else None}


def nexus_counters(name, size):
    def read(table, at):
        r = Bytes(table, at, size)
        counters = r.counters("tv_stats_net_if" if name == "interface" else "tv_stats_flow_switch", "counters", 32)
        yield at + size, name, {"nexus": r.uuid(0), "interface": r.text(16, 16), "counters": counters}
    return read


def stack(table, at):
    r = Bytes(table, at, 2496)
    blocks = ("ip", 48), ("ip6", 400), ("tcp", 688), ("udp", 2320)
    yield at + 2496, "userstack", {
        "nexus": r.uuid(0), "interface": r.text(16, 16), "pid": r.number("i", 32),
        "process": NAMES.get(r.number("i", 32)),
        **{name: r.counters("tv_stats_userstack", name, place) for name, place in blocks}}


def namespace(table, at):
    r = Bytes(table, at, 32)
    count, families = r.number("B", 18), {4: socket.AF_INET, 16: socket.AF_INET6}
    ranges = Bytes(table, at + 32, 32 * count)
    family = families.get(r.number("B", 16))
    yield at + 32 + 32 * count, "netns", {
        "protocol": r.named(PROTOCOLS, "B", 17),
        "address": family and socket.inet_ntop(family, r.raw(0, r.number("B", 16))),
        "ranges": [{"first": ranges.number("H", 32 * i), "last": ranges.number("H", 32 * i + 2) or None,
                    **ranges.numbers("tarvel bsd", "i", 32 * i + 4), "listeners": ranges.number("i", 32 * i + 16)}
                   for i in range(count)]}


def arena(table, at):
    r = Bytes(table, at, 2608)
    pids = [r.number("i", 2576 + 4 * i) for i in range(8)] + [0]
    pids = pids[:pids.index(0)]
    regions = [Bytes(table, at + 80 + 208 * i, 208) for i in range(12)]
    yield at + 2608, "arena", {
        "name": r.text(0, 64), "type": r.named(ARENAS, "i", 64), "pids": pids, "processes": [*map(NAMES.get, pids)],
        "regions": [{"region": each.uuid(64), "name": each.text(0, 64), "type": each.named(REGIONS, "i", 80),
                     "mode": each.flags(MODE, 84),
                     **each.numbers("seg_size_req seg_size seg_count obj_size_req obj_count_req obj_size obj_count "
                                    "objs_per_seg mem_total mem_wired", "Q", 88),
                     **each.numbers("seg_in_use rescales allocs frees", "Q", 176)}
                    for each in regions if each.number("Q", 104)]}


READERS = {"nexus_provider_list": provider, "nexus_channel_list": group, "stats/flow": flow, "stats/flow_adv": advisory,
           "stats/flow_owner": owner, "stats/flow_route": route, "stats/net_if": nexus_counters("interface", 320),
           "stats/flow_switch": nexus_counters("flow_switch", 448), "stats/userstack": stack,
           "stats/netns": namespace, "stats/arena": arena}


def read(name, table):
    """The lines of a table, as (kind, keys), and whether it ends with a record."""
    at, lines = 0, []
    try:
        while at < len(table):
            for at, kind, keys in READERS[name](table, at):
                lines += [(kind, keys)] * bool(kind)
    except Cut:
        return lines, False
    return lines, True
