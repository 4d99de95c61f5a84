"""flow, flow-adv, flow-owner, flow-route."""

from records import make
from runs import Case, Result, aborted, name_services

NEXUS, OTHER = "FEDCBA98-7654-3210-0123-456789ABCDEF", "FEDCBA98-7654-3210-0123-456789ABCDE0"
LONG6 = "fd11:1111:2222:3333:4444:5555:6666:7777"
FLOWS = ("Proto Local Address                               Remote Address                              "
         "InBytes      OutBytes     InPackets  OutPackets SvC NetIf    Port Adv Flags          "
         "Local State  Remote State Local RTT  Remote RTT Bkt Process.PID\n")
OWNER = "en0       3                            7    curl({})\n"
OWNERS = "NetIf     Port   Property              Bkt  Process\n"
ROUTES = ("Local Address                            Remote Address                           "
          "Gateway Address                          MAC Address          NetIf   Refs Expire  bidx ibidx  Flags\n")
STATES = [*enumerate("CLOSED LISTEN SYN_SENT SYN_RCVD ESTABLISHED CLOSE_WAIT FIN_WAIT_1 CLOSING LAST_ACK".split()),
          (9, "FIN_WAIT_2"), (10, "TIME_WAIT"), (11, "UNKNOWN"), (19, "UNKNOWN"), (20, "NO_TRAFFIC"), (21, "SINGLE"),
          (22, "MULTIPLE"), (23, "UNKNOWN"), (-1, "UNKNOWN")]
CLASSES = {0x080090: "BKS", 0x100080: "BK ", 0x180010: "RD ", 0x200020: "OAM", 0x280120: "AV ", 0x300110: "RV ",
           0x380100: "VI ", 0x480190: "CTL", 0x1400180: "UNK", -1: "UNK"}


def full(family, protocol, remote=None):
    """A flow with something else in each field. Only its local family is right."""
    return make("flow", sf_nx_uuid=NEXUS, sf_if_name="en0", sf_bucket=17, sf_proc_name="curl", sf_pid=42, sf_nx_port=5,
                sf_flags=0x80000010, sf_adv_idx=3, sf_protocol=protocol, sf_svc=0x400180,
                sf_local={"family": family, "port": 443, "ipv4": "127.0.0.1", "ipv6": "fe80:fe4d::1"},
                sf_remote=remote or {"family": 32 - family, "ipv4": "0.0.0.0", "ipv6": LONG6, "port": 0},
                sf_lstats={"bytes": 1000, "packets": 10, "state": 4, "rtt": 1500},
                sf_rstats={"bytes": -1, "packets": 20, "state": 22, "rtt": 20250})


def full_row(protocol, *ends):
    return protocol + "".join(f"{end:43} " for end in ends) + (
        " 18446744073709551615 1000         20         10         VO  en0      5    3   t-----------r "
        " ESTABLISHED  MULTIPLE       1.50 ms    20.25 ms 17  curl.42\n")


def row(pid, service="BE ", interface=" " * 8, indexes="0    0  ", flags="-" * 13, local="CLOSED", remote="CLOSED",
        times=" " * 22, bucket="0  ", process=""):
    """Of a flow of zeros, but for what is given."""
    return (f"unk. 0            0            0          0          {service} {interface} {indexes} {flags}  {local:12} "
            f"{remote:12}{times} {bucket} {process}.{pid}\n")


def advisories(pid, nexus, *flags):
    entries = [make("flow_adv_entry", sfae_flow_uuid=OTHER, sfae_flags=each) for each in flags]
    return make("flow_adv", sfa_nx_uuid=nexus, sfa_if_name="en0", sfa_pid=pid, entries=entries)


def advisory_block(process, nexus, *flags):
    return (f" - {process}\n\tNexus UUID: {nexus}\n\tNetif     : en0\n"
            "\tFlowAdvIdx               Flow UUID                 Flags\n"
            + "".join(f"\t    [{i:3}] : {OTHER} flags={each}\n" for i, each in enumerate(flags)))


def owner(pid, nexus=NEXUS, **values):
    usual = {"sfo_if_name": "en0", "sfo_bucket": 7, "sfo_proc_name": "curl", "sfo_nx_port": 3}
    return make("flow_owner", sfo_nx_uuid=nexus, sfo_pid=pid, **{**usual, **values})


def route(family, flags, remote=None, **values):
    """From here to anywhere by a long way. Only the remote family is right."""
    here = {"family": 32 - family, "port": 443, "ipv4": "127.0.0.1", "ipv6": "febf:fe4d:1111:2222:3333:4444:5555:6666"}
    usual = {"sfr_if_name": "en0", "sfr_bidx": 4, "sfr_ibidx": 5, "sfr_refs": 6, "sfr_expire": -1, "sfr_local": here,
             "sfr_remote": {"ipv4": "0.0.0.0", "ipv6": "::", "port": 443, **(remote or {}), "family": family},
             "sfr_gateway": here, "sfr_mac": b"\2\0\x5e\xff\x0a\1"}
    return make("flow_route", sfr_flags=flags, **{**usual, **values})


def route_row(local, gateway, mac, flags, remote="*"):
    return f"{local:40} {remote:40} {gateway:40} {mac:17}      en0      6     -1     4     5  {flags}\n"


NUMERIC = full_row(" tcp4 ", "127.0.0.1.443 ", "*.* ")


class Flow(Case):
    def test_FlowPrintsEveryColumnWithNamesOnlyUnderNetstat(self):
        for table, shown, *lines in (
                (full(2, 6) + full(30, 17) + full(10, 1),
                 NUMERIC + full_row(" udp6 ", "fe80::1%65101.443", LONG6[:37] + ".*") + full_row("unk."), "flow"),
                (full(2, 6), NUMERIC, "flow -n", "flow x -nn -- -x", "netstat -na", "netstat --flow --numerical"),
                (full(2, 6), full_row(" tcp4 ", "localhost.https ", "*.* "), "netstat -a", "netstat --flow"),
                (full(2, 1), full_row("unk.4 ", "localhost.443 ", "*.* "), "netstat -a")):
            self.expect({"stats/flow": table}, lines, FLOWS + shown)

    def test_FlowsAreNamedAndSortedByProcessIdOverTheWholeRange(self):
        process = "0123456789abcdef0123456789ABCDEF"
        cases = [
            ({}, {}), ({"sf_flags": 0x30FFCC8F}, {}), ({"sf_flags": -1}, {"flags": "tclqbweandoxr"}),
            ({"sf_flags": 0x45001120}, {"flags": "-c-q-w-a-d-x-"}),
            ({"sf_nx_port": -1, "sf_adv_idx": -2}, {"indexes": "-    4294967294"}),
            ({"sf_nx_port": -2, "sf_adv_idx": -1}, {"indexes": "4294967294 -  "}),
            ({"sf_bucket": -1}, {"bucket": "-  "}), ({"sf_if_name": process[:16]}, {"interface": process[:16]}),
            ({"sf_bucket": -2}, {"bucket": "4294967294"}), ({"sf_proc_name": process}, {"process": process}),
            ({"sf_lstats": {"rtt": 5}}, {"times": "   0.00 ms            "}),  # 0.00499... in single precision
            ({"sf_rstats": {"rtt": 245}}, {"times": "               0.25 ms"}),  # 0.245000005...
            ({"sf_lstats": {"rtt": -1}}, {"times": "4294967.50 ms            "}),
            *(({"sf_svc": value}, {"service": label}) for value, label in CLASSES.items()),
            *(({"sf_lstats": {"state": a}, "sf_rstats": {"state": b}}, {"local": local, "remote": remote})
              for (a, local), (b, remote) in zip(STATES, STATES[1:]))]
        pids = -1 << 31, -300, -1, 0, 25, 300, 1 << 16, *range(1 << 24, (1 << 24) + len(cases) - 8), (1 << 31) - 1
        flows = [make("flow", sf_pid=pid, **values) for pid, (values, _) in zip(pids, cases)]
        self.expect({"stats/flow": b"".join(reversed(flows))}, "flow", FLOWS + "".join(
            row(pid, **shown) for pid, (_, shown) in zip(pids, cases)))

    def test_EveryWatchRunSeesTheWordsAsTyped(self):
        self.assertEqual(self.watch("netstat -a -n x -p -w 1", {"stats/flow": full(2, 6)}, {}), Result(
            f"\n<time>\n{FLOWS}{NUMERIC}" * 2, "netstat: option requires an argument -- 'p'\nsleep 1\n" * 2, 0))

    def test_AdvisoriesAreBlocksOfUpTo512(self):
        one, shown = advisories(42, NEXUS, 1), advisory_block("curl.42", NEXUS, "1<VALID>")
        most, title = advisories(42, NEXUS, *[0] * 512), advisory_block("<unknown>.43", NEXUS)
        self.expect({"stats/flow_adv": advisories(43, NEXUS) + one + most + advisories(-7, OTHER, 3, 0x80000006, 12)},
                    "flow-adv --pid 1", title + shown + advisory_block("curl.42", NEXUS, *["0<>"] * 512)
                    + advisory_block("<unknown>.-7", OTHER, "3<VALID,CONTROLLED>", "80000006<CONTROLLED>", "c<>"))
        self.expect({"stats/flow_adv": one + advisories(43, NEXUS, *[0] * 513) + one}, "flow-adv", aborted(
            "__tv_stats_flow_adv_print", 729, "sfa->sfa_entries_count <= 512", shown + title))
        self.expect({}, "netstat --flow-adv --pid 42", shown * 2)

    def test_OwnersArePrintedInTheOrderOfTheTable(self):
        most = owner(1, sfo_if_name="0123456789abcdef", sfo_bucket=-1, sfo_proc_name="p" * 32, sfo_nx_port=-1,
                     sfo_pid_bound=1, sfo_destroyed=1)
        self.expect({"stats/flow_owner": owner(42, sfo_pid_bound=256) + owner(-1, sfo_destroyed=1 << 31) + most},
                    "flow-owner x", OWNERS + "en0       3      PID-Bound             7    curl(42)\n"
                    "en0       3                 Destroyed  7    curl(-1)\n"
                    f"0123456789abcdef  4294967295  PID-Bound  Destroyed  4294967295  {'p' * 32}(1)\n")

    def test_RoutesArePrintedInTheOrderOfTheTable(self):
        mac, local = "02:00:5e:ff:0a:01", "febf:0:1111:2222:3333:4444:5555:6666%651"  # the gateway is two digits longer
        most = dict(sfr_if_name="0123456789abcdef", sfr_bidx=-1, sfr_ibidx=-2, sfr_refs=1 << 31, sfr_expire=1 << 63)
        table = route(30, 0x1F0) + route(2, 0xFFFFFE0F) + route(2, 0x120) + route(30, 0xC0) + route(9, 0x90, **most)
        self.expect({"stats/flow_route": table}, "flow-route -n", "".join((
            ROUTES, route_row(local, local + "01", mac, "ogrid"), route_row("127.0.0.1", "-", "-", "-----"),
            route_row("127.0.0.1", "127.0.0.1", "-", "-g--d"), route_row(local, "-", mac, "--ri-"),
            f" {mac} 0123456789abcdef 2147483648 -9223372036854775808 4294967295 4294967294  o--i-\n")))

    def test_OnlyIpv6NamesAreCutToTheirColumnsAndNoGateways(self):
        name, there = "n" * 300, {"ipv4": "127.0.0.1", "ipv6": LONG6, "port": 80}
        end4, end6 = f"{name[:33]}.{name[:15]} ", f"{name[:33]}.{name[:9]}"
        environment = name_services(NAME_SERVICES_ANSWER=name)
        self.expect({"stats/flow": full(2, 6, there) + full(30, 6, there)}, "netstat -a",
                    FLOWS + full_row(" tcp4 ", end4, end4) + full_row(" tcp6 ", end6, end6), environment=environment)
        self.expect({"stats/flow_route": route(2, 0x20, there) + route(30, 0x20, there)}, "flow-route", ROUTES
                    + route_row(name[:255], name[:255], "-", "-g---", name[:255])
                    + route_row(name[:40], name[:49], "-", "-g---", name[:40]), environment=environment)

    def test_NetstatFilters(self):
        keys, by_nexus = ((42, NEXUS), (42, OTHER), (43, NEXUS)), f"--uuid {NEXUS} "
        for name, header, records, rows in (
                ("flow", FLOWS, [make("flow", sf_pid=pid, sf_nx_uuid=nexus) for pid, nexus in keys],
                 [row(42), row(42), row(43)]),
                ("flow_adv", "", [advisories(*key) for key in keys],
                 [advisory_block("curl.42" if pid == 42 else f"<unknown>.{pid}", nexus) for pid, nexus in keys]),
                ("flow_owner", OWNERS, [owner(*key) for key in keys], [OWNER.format(pid) for pid, _ in keys])):
            for options, left in (("--pid 42", rows[:2]), ("--pid x", []), (by_nexus, rows[::2]),
                                  (by_nexus + "--pid 43", rows[2:])):
                self.expect({f"stats/{name}": b"".join(records)}, f"netstat --{name.replace('_', '-')} {options}",
                            header + "".join(left))
