"""tree; show, also called channel-stats."""
import json
import textwrap

from records import make
from runs import MISSING, SHORT, Case, aborted

ORPHAN = "orphan flow orphan nx_uuid"
CHAIN = "1/1; 1 2/2; 2 3/3; 3 4/4; 4 5/5; 5 6/6; 6 7/7"


def uid(digit):
    return f"{digit * 8}-0000-0000-0000-00000000000{digit}"


def provider(instances, name="wifiX", **values):
    return make("nexus_provider_record", provider_uuid=uid("F"), name=name, name_length=4,
                instances=[make("uuid", uuid=uid(each)) for each in instances], **values)


def groups(text, **values):
    """Channels of one ring, as "A 7 2/B; E": nexuses, their ports and the digits of UUIDs that are not C."""
    table, values = b"", {"pid": 42, "fd": 5, "tx": [make("ring_stats")], **values}
    for nexus, *channels in map(str.split, text.split(";")):
        table += make("nexus_channel_header", nexus_uuid=uid(nexus), channels=[
            make("channel_entry", port=int(port), channel_uuid=uid(digit or "C"), **values)
            for port, _, digit in (each.partition("/") for each in channels)])
    return table


def flow(nexus, port, family, remote_port=0, **values):
    return make("flow", sf_nx_uuid=uid(nexus), sf_nx_port=port, **values,
                sf_local={"family": family, "port": 443, "ipv4": "10.0.0.1", "ipv6": "fe80::1"},
                sf_remote={"port": remote_port, "ipv4": "192.0.2.9", "ipv6": "2001:db8::9"})


def shape(node):
    """Objects by the first digit, the port or the remote port, each with its children in parentheses."""
    children = " ".join(map(shape, node["children"]))
    return str(node.get("port", node.get("remote_port", node["uuid"][0]))) + (children and f"({children})")


def opened(digit, kind):
    return f'{{|"uuid":"{uid(digit)}",|"type":"{kind}",|'


def dump(rows):
    """Texts with their levels, "|" for a line end, as they stand where the first of them is alone."""
    texts = (textwrap.indent(text.replace("|", "\n") + "\n", "   " * (level - rows[0][0])) for level, text in rows)
    return "".join(texts).rstrip(" ,\n") + "\n"


BASE = {"nexus_provider_list": provider("AB"), "nexus_channel_list": b"", "stats/flow": b""}
NUMBERS = {"format": 148, "tx_rings": 152, "rx_rings": 156, "tx_slots": 160, "rx_slots": 164, "buf_size": 168,
           "meta_size": 172, "pipes": 180, "mhints": 188, "ifindex": -1}
ONE_OF_EACH = {
    "nexus_provider_list": provider("AB", type=2, subtype=1, flags=3, **NUMBERS)
    + provider("", 'a"\\', type=9, flags=3, **NUMBERS), "nexus_channel_list": groups("A 2", flags=0x80000001),
    "stats/flow": flow("A", 2, 2, 51000, sf_if_name="en0", sf_proc_name="cli", sf_pid=-1, sf_flags=0x80000010,
                       sf_protocol=6, sf_lstats={"bytes": (1 << 64) - 1, "packets": 2, "state": 4},
                       sf_rstats={"bytes": 3, "packets": 4, "state": 10})
    + flow("A", 2, 30, sf_protocol=17, sf_lstats={"state": 20}, sf_rstats={"state": 23}) + flow("A", 2, 10)}
NUMBERED = '"flags":3,|"anonymous":true,|' + "".join(f'"{name}":{each},|' for name, each in NUMBERS.items())
IDLE = '"in_bytes":0,|"out_bytes":0,|"in_packets":0,|"out_packets":0,|"interface":"",|"flags":"------------- ",|'
END = '|"process":"",|"pid":0,|"children": []|}'
DUMP = [(0, opened("0", "root") + '"children": ['),
        (1, opened("F", "nexus_provider") + f'"name":"wifi",|"provider_type":"net-if",|{NUMBERED}"children": ['),
        (2, opened("A", "nexus") + '"children": ['),
        (3, opened("C", "channel") + '"flags":-2147483647,|"pid":42,|"proc_name":"curl",|"fd":5,|"port":2,|'
            '"n_tx_rings":1,|"n_rx_rings":0,|"children": ['),
        (4, opened("0", "flow") + '"local_addr":"10.0.0.1",|"local_port":443,|"remote_addr":"192.0.2.9",|'
            '"remote_port":51000,|"protocol":"tcp",|"in_bytes":3,|"out_bytes":18446744073709551615,|"in_packets":4,|'
            '"out_packets":2,|"interface":"en0",|"flags":"t-----------r ",|"local_state":"ESTABLISHED",|'
            '"remote_state":"TIME_WAIT",|"process":"cli",|"pid":-1,|"children": []|},'),
        (4, opened("0", "flow") + '"local_addr":"fe80::1",|"local_port":443,|"remote_addr":"2001:db8::9",|'
            f'"remote_port":0,|"protocol":"udp",|{IDLE}"local_state":"NO_TRAFFIC",|"remote_state":"UNKNOWN",{END},'),
        (4, opened("0", "flow") + f'"protocol":"unk.",|{IDLE}"local_state":"CLOSED",|"remote_state":"CLOSED",{END} '),
        (3, "]|} "), (2, "]|},"), (2, opened("B", "nexus") + '"children": []|} '), (1, "]|},"),
        (1, opened("F", "nexus_provider") + f'"name":"a"\\",|"provider_type":"unknown",|{NUMBERED}"children": []|}} '),
        (0, "]|}")]


class Tree(Case):
    def expect_shape(self, expected, tables, err=""):
        """By the children of the root."""
        seen = self.run_on({**BASE, **tables}, "tree")
        self.assertEqual((shape(json.loads(seen.out))[2:-1], seen.err, seen.status), (expected, err, 0))

    def test_DumpsEveryKindOfObjectFromTheOneThatIsNamed(self):
        for rows, *words in ((DUMP, "", f"{uid('0')} ignored -x"), (DUMP[3:8], uid("C").lower()), (DUMP[2:9], uid("A")),
                             (DUMP[9:10], uid("b"))):
            self.expect(ONE_OF_EACH, [f"tree {each}" for each in words], dump(rows))

    def test_WordsThatNameNoObjectEndTheWatch(self):
        for error, *words in ((f"No tarvel object with UUID {uid('E')}\n", uid("e")), (
                "Invalid UUID\n", "-D", uid("A").replace("-", ""), uid("A")[1:], uid("A") + "A", uid("G"))):
            self.expect(BASE, [f"tree {word}" for word in words], err=error)
            self.expect(BASE, [f"-w 60 tree {word}" for word in words], "\n<time>\n", error)

    def test_ChannelsHangUnderTheirNexusByPort(self):
        for expected, text in (
                ("F(A(2 5 7) B)", "A 7 2 5"), ("F(A(-1 2 7) B)", "A 7 2 -1"), ("F(A(3) B(9))", "B 9; A 3"),
                ("F(A(4) B)", "A 7 2; A 4"), ("F(A(2 7) B)", "A 7 2; A"), ("F(A(4) B)", "E 8 9; A 4"),
                ("4", "0 4; F 5"), ("F(4)", "F 4; A 5"),
                # Of objects with one UUID the first counts, from the root down; none that has been replaced does.
                ("F(A(7(9)) B)", "A 7/B; B 9"), ("F(A(9) B(7))", "B 7/A; A 9"), ("F(A(1(3)) B(2))", "B 2; A 1; C 3"),
                ("F(A(1(3)) B)", "A 1; C 2; C 3"), ("F(A(2 3(5)) B)", "A 3/D 2/E; D 5"),
                ("F(A(3) B)", "A 2; C 8/F; A 3/E"), ("F(A(4) B)", "A 7 2; A 4/E; C 5"),
                ("F(A(8(9)) B(1(2(3(4(5(6(7))))))))", f"B {CHAIN}; A 8/7; 7 9"),
                ("F(A(1(2(3(4(5(6(7(9)))))))) B(8))", f"B 8/7; A {CHAIN}; 7 9")):
            self.expect_shape(expected, {"nexus_channel_list": groups(text)})
        for expected, text, cut in (  # a group that is cut is shown as it comes
                ("F(A(2 7) B)", "A 7 2; A 5", 246), ("F(A(7 2) B)", "A 7 2 5", 232), ("F(A B)", "A 7 2; A 3", 185)):
            self.expect_shape(expected, {"nexus_channel_list": groups(text)[:-cut]}, SHORT)

    def test_FlowsHangUnderTheChannelOfTheirPort(self):
        flows = b"".join(flow(nexus, int(port), 2, number) for number, (nexus, port) in enumerate(
            ("A3", "E2", "A2", "A4", "A3", "F2", "C2", "02", "E3"), 1))
        for expected, text, orphans in ("F(A(2(3) 3(1 5)) B(4))", "A 3; A 2 3; B 4", 2), ("2(8)", "0 2", 7):
            self.expect_shape(expected, {"nexus_channel_list": groups(text), "stats/flow": flows}, ORPHAN * orphans)

    def test_IndentStopsGrowingAtLevel7(self):
        out = self.run_on({**BASE, "nexus_channel_list": groups(f"A {CHAIN}")}, "tree").out.splitlines()
        for brace in "{}":
            levels = [line.index(brace) / 3 for line in out if brace in line]
            self.assertEqual(sorted(levels), [0, 1, 2, 2, 3, 4, 5, 6, 7, 7, 7])

    def test_TablesThatAreMissingLeaveTheRest(self):
        self.expect_shape("F(A B)", {"nexus_channel_list": None, "stats/flow": None}, MISSING * 2)
        tables = {"nexus_provider_list": b"", "nexus_channel_list": None, "stats/flow": flow("A", 2, 2)}
        self.expect_shape("", tables, MISSING + ORPHAN)
        self.expect({"nexus_provider_list": None}, ("tree", f"tree {uid('A')}"), err=MISSING)
        self.expect({}, "-w 60 TREE", "\n<time>\n", MISSING)

    def test_ShowHasPortsAndFlowsOfMultistackFlowSwitches(self):
        flows = flow("A", 2, 30, 53) + flow("A", 1, 9) + flow("A", 2, 2, 65535)
        tables = {"nexus_provider_list": provider("E", type=3) + provider("D", type=3, subtype=2)
                  + provider("", type=3, subtype=1) + provider("BA", "n" * 64, subtype=1),
                  "nexus_channel_list": groups("A 12 2/D 1 -1 0; D 9; E 2", flags=1 << 31)
                  + groups("B 3", pid=77, flags=63), "stats/flow": flows}
        report = (f"flow-switch {uid('B')} {'n' * 64}\n\tPort[ 3] <unknown>.77          \n"
                  f"flow-switch {uid('A')} {'n' * 64}\n\tPort[4294967295] curl.42               defunct\n"
                  "\tPort[ 2] curl.42               defunct\n\t\t fe80::1.443 <-> 2001:db8::9.53\n"
                  "\t\t 10.0.0.1.443 <-> 192.0.2.9.65535\n\tPort[12] curl.42               defunct\n")
        self.expect(tables, ("show", "channel-stats", "show -x ignored"), report)
        self.expect({}, "show", report.replace("defunct", "\033[31mdefunct\033[0m"), to="terminal")
        self.expect({"stats/flow": flows + flow("A", 12, 9)}, "channel-stats", aborted("cmd_show", 2030, "0", report))
