"""The simulated kernel conserves, whatever the seed and the interval, and its incidents show where the guide says.

All figures are read as they lie in the tables. A moment is the kernel so many intervals after its start.
"""
import collections
import re

from records import TABLES
from runs import LabCase, files, generate, top

SYN_SENT, SYN_RECEIVED, TIME_WAIT, NO_TRAFFIC = 2, 3, 10, 20
CONTROLLED, RESOLVED, CLIENTS = 2, 1 << 6, 2  # flags of advisories and routes; the first port that may have flows
# Where the guide says that an incident is seen, and how much more of it there is than without; the first group of the
# pattern is summed up, and matches without groups are counted.
SIGNS = (("lossy-link", "interface", r"BadLen +: (\d+)", 500),
         ("lossy-link", "netstat -s -p tcp", r"SndDPktReXmt +: (\d+)", 500),
         ("lossy-link", "flow", r"tcp.* ESTABLISHED +(\d{3})\.\d\d ms", 1000),
         ("lookup-miss", "flow-switch", r"RxLookupNoMatch *: (\d+)", 5000),
         ("lookup-miss", "flow-switch", r"RxLookupTornDown *: (\d+)", 1000),
         ("slow-reader", "channel", r"1MB/1MB", 1), ("slow-reader", "flow-switch", r"DestKrSpaceDrop *: (\d+)", 5000),
         ("slow-reader", "netstat -s -p udp", r"FullSock *: (\d+)", 200),
         ("leak", "memory", r"BUF region(?:.*\n){8} *segments: .*\(100.00% in use\)", 1),
         ("leak", "flow-switch", r"NoMemPkt *: (\d+)", 5000),
         ("dead-peer", "flow", r"SYN_SENT +LISTEN +(?![\d.]+ ms)", 2),
         ("dead-peer", "netstat -s -p tcp", r"DropTO +: (\d+)", 2),
         ("port-exhaustion", "netns -i 10.0.0.2 -p tcp", r"49152-65535 +1 ", 1),
         ("port-exhaustion", "netstat -s -p tcp", r"EConnDrop +: (\d+)", 3),
         ("crash", "channel", r"<unknown>\.\d+ .*DEFUNCT>", 1), ("crash", "netstat --flow-owner", r"Destroyed", 1))


def count(record, *names, block="counters"):
    known = record.fields[block]["names"]
    return sum(record[block][known.index(name)] for name in names)


def slots(channels, way):
    return sum(ring["xfer.slots"] for each in channels for ring in each[way])


def errors(channels):
    return sum(ring[f"err_{why}"] for each in channels for ring in each["tx"]
               for why in ("corrupted", "len_modified", "len_too_large"))


def host(record, end):
    return tuple(str(record[f"{end}.{family}"]) for family in ("ipv4", "ipv6"))


class Moment:
    """Records by table; flows by what identifies them, and with stacks and channels by nexus and process."""

    def __init__(self, kernel):
        self.tables = {name: kernel.records(name) for name in TABLES}
        self.groups = {group["nexus_uuid"]: group["channels"] for group in self.tables["nexus_channel_list"]}
        self.providers = {at["uuid"]: each for each in self.tables["nexus_provider_list"] for at in each["instances"]}
        self.flows = {self.key(each): each for each in self.tables["stats/flow"]}
        self.switches = {each["nx_uuid"]: each for each in self.tables["stats/flow_switch"]}
        self.states = [each["sf_lstats.state"] for each in self.flows.values()]
        self.owners = collections.defaultdict(lambda: {"stacks": [], "channels": [], "flows": []})
        for stack in self.tables["stats/userstack"]:
            self.owners[stack["nx_uuid"], stack["pid"]]["stacks"].append(stack)
        for nexus in self.switches:
            clients = [each for each in self.groups.get(nexus, ()) if each["port"] >= CLIENTS]
            for each in clients if (nexus, 0) in self.owners else ():
                self.owners[nexus, each["pid"]]["channels"].append(each)
        for flow in self.tables["stats/flow"]:
            self.owners[flow["sf_nx_uuid"], flow["sf_pid"]]["flows"].append(flow)

    @staticmethod
    def key(flow):
        ends = flow.places("sf_local.length")[0], flow.places("sf_protocol")[0] + 1
        return flow["sf_nx_uuid"], flow["sf_pid"], flow.table[slice(*ends)]

    def sums(self, owner):
        """What an owner's stacks, rings and flows have sent and received, and how many datagrams
        met no flow and connections ended."""
        stacks, flows = self.owners[owner]["stacks"], self.owners[owner]["flows"]
        by_stack = [sum(count(each, name, block="ip") + count(each, name, block="ip6") for each in stacks)
                    for name in ("LocalOut", "TotalRcvd")]
        return (by_stack, [slots(self.owners[owner]["channels"], way) for way in ("tx", "rx")],
                [sum(each[f"sf_{end}stats.packets"] for each in flows) for end in "lr"],
                sum(count(each, "NoPort", "FullSock", block="udp") for each in stacks),
                sum(count(each, "ConnClosed", block="tcp") for each in stacks))

    def counters(self):
        """All counters of all records that have a name of their own."""
        found = {}
        for table, records in self.tables.items():
            for each in records:
                names = [each.value(row, at) for row, at in each.find("kind", "identifier") if row["type"] == "uuid"]
                if table == "stats/userstack":  # a channel that is opened again has a new one
                    names += [each["pid"], *(c["channel_uuid"] for c in self.owners[names[0], each["pid"]]["channels"])]
                key = self.key(each) if table == "stats/flow" else (table, *names)
                values = [each.value(row, at) for row, at in each.find("kind", "counter")]
                found[key] = None if key in found else values
        return found


class Laws(LabCase):
    def moment(self, ticks, options):
        return Moment(self.simulated(options, ticks))

    def check_pipes_and_bridges(self, seen):
        """What one end sends the other receives, or it is lost: of a pipe, and of a bridge, which sums its ports."""
        for nexus, ends in seen.groups.items():
            kind, = {"content-filter", "tunnel", "bridge"} & {*seen.providers[nexus]["name"].split(".")} or [""]
            if kind == "content-filter" and len(ends) == 2:
                self.assertEqual(slots(ends[:1], "tx"), slots(ends[1:], "rx") + errors(ends[:1]))
                self.assertEqual(slots(ends[1:], "tx"), slots(ends[:1], "rx") + errors(ends[1:]))
            elif kind == "bridge":
                moved = [count(seen.switches[nexus], way + "CopyDirect", way + "CopySum") for way in ("Tx", "Rx")]
                self.assertEqual(moved, [slots(ends, "tx"), slots(ends, "rx")])
                self.assertEqual(moved[0], moved[1] + count(seen.switches[nexus], "Dropped"))

    def check_switches(self, seen):
        """What crosses an interface is what host and stacks have sent and got, and what got lost."""
        for each in seen.tables["stats/net_if"]:
            self.assertEqual(count(each, "Dropped"), count(each, "NoMemPkt", "BadLen", "TxEnqueueDrop"))
            for monitor in seen.groups[each["nx_uuid"]]:
                self.assertEqual([slots([monitor], way) for way in ("tx", "rx")],
                                 [count(each, name) for name in ("TxPkt", "RxPkt")])
        interfaces = {each["name"]: each for each in seen.tables["stats/net_if"]}
        for nexus, switch in seen.switches.items():
            unsent = count(switch, "TxEnqueueDrop")
            self.assertEqual(count(switch, "Dropped") - unsent, count(
                switch, "RxLookupNoMatch", "RxLookupTornDown", "DestNexusPortDefunct", "DestKrSpaceDrop", "NoMemPkt",
                "BadLenPkt"))
            if switch["name"] in interfaces:
                crossed = interfaces[switch["name"]]
                parts = [sum(seen.sums(owner)[0][way] for owner in seen.owners if owner[0] == nexus) for way in (0, 1)]
                host = [each for each in seen.groups[nexus] if each["port"] == 1]
                self.assertEqual(count(crossed, "TxPkt"), parts[0] + slots(host, "tx") - unsent)
                self.assertEqual(count(crossed, "RxPkt"),
                                 parts[1] + slots(host, "rx") + count(switch, "Dropped") - unsent)

    def check_stacks(self, seen):
        for owner, held in seen.owners.items():
            by_stack, by_ring, by_flow, *_ = seen.sums(owner)
            if owner[1]:
                self.assertEqual(by_stack, by_ring)
            self.assertTrue(all(some <= whole for some, whole in zip(by_flow, by_stack)))
            tcp = [sum(count(each, *names, block="tcp") for each in held["stacks"]) for names in (
                ["ConnInit", "ConnAcpt"], ["ConnClosed"], ["ConnEst", "EConnDrop"], ["SndTotalPkt"],
                ["SndTotalDP", "SndAck", "SndWinUpd", "SndCtlPkt", "SndDPktReXmt"])]
            flows = [each["sf_lstats.state"] for each in held["flows"] if each["sf_protocol"] == 6]
            self.assertEqual(tcp[0] - tcp[1], len([each for each in flows if each != 1]))
            self.assertEqual(tcp[0] - tcp[2], len([each for each in flows if each in (SYN_SENT, SYN_RECEIVED)]))
            self.assertEqual(tcp[3], tcp[4])
            transports = sum(count(each, "SndTotalPkt", block="tcp") + count(each, "OutPkt", block="udp")
                             for each in held["stacks"])
            self.assertEqual(transports, by_stack[0])

    def check_what_is_held(self, seen):
        descriptors = collections.defaultdict(list)
        for each in (each for group in seen.groups.values() for each in group):
            descriptors[each["pid"]].append(each["fd"])
        for taken in descriptors.values():
            self.assertEqual(len({*taken}), len(taken))
            self.assertLess(max(taken) - min(taken), len(taken) + 2)
        for region in (each for arena in seen.tables["stats/arena"] for each in arena["regions"]):
            self.assertEqual(region["allocs"] - region["frees"], region["seg_in_use"])
            self.assertLessEqual(region["seg_in_use"], region["seg_count"])
        self.assertIn(NO_TRAFFIC, seen.states)

    def check_change(self, before, seen, near):
        """Nothing counted falls; what flows have moved, stacks have; and a flow that is over learns nothing new."""
        earlier = before.counters()
        for key, values in seen.counters().items():
            for old, new in zip(earlier.get(key) or (), values or ()):
                self.assertLessEqual(old, new, key)
        for owner in before.owners.keys() & seen.owners.keys():
            held = [{Moment.key(each) for each in each.owners[owner]["flows"]} for each in (before, seen)]
            then, now = before.sums(owner), seen.sums(owner)
            if near and owner[1] and held[0] <= held[1] and then[4] == now[4]:
                astray = now[3] - then[3]
                self.assertEqual([now[0][0] - then[0][0], now[0][1] - then[0][1] - astray],
                                 [now[2][0] - then[2][0], now[2][1] - then[2][1]])
        resolved = {host(each, "sfr_remote") for moment in (before, seen)
                    for each in moment.tables["stats/flow_route"] if each["sfr_flags"] & RESOLVED}
        for key in before.flows.keys() & seen.flows.keys():
            then, now = before.flows[key], seen.flows[key]
            if then["sf_lstats.state"] == TIME_WAIT:
                self.assertEqual(now["sf_lstats.rtt"], then["sf_lstats.rtt"])
            if now["sf_remote.port"] and host(now, "sf_remote") not in resolved:
                self.assertEqual(now["sf_rstats.packets"], then["sf_rstats.packets"])

    def check(self, seen, before, near):
        self.check_pipes_and_bridges(seen)
        self.check_switches(seen)
        self.check_stacks(seen)
        self.check_what_is_held(seen)
        if before:
            self.check_change(before, seen, near)

    def test_WhatGoesInComesOutAtEveryMoment(self):
        troubles = ("lossy-link@2 slow-reader crash@5 dead-peer lookup-miss leak@1 port-exhaustion@1 stalled-flow "
                    "slow-reader@20")
        cases = ((1, 100, "", (0, 1, 2, 3, 40, 41)), (2, 1000, "", (0, 1, 60)),
                 (8, 10_000, "--flows 700", (8, 9)), (4, 60_000, "", (1, 60)),
                 (5, 700, "".join(" --incident " + each for each in troubles.split()), (1, 2, 7, 8, 40, 41, 60)))
        for seed, interval, options, ticks in cases:
            before = None
            for last, each in zip((0, *ticks), ticks):
                with self.subTest(seed=seed, options=options, ticks=each):
                    seen = self.moment(each, f"--seed {seed} --interval {interval} {options}")
                    before, last_seen = seen, before
                    self.check(seen, last_seen, (each - last) * interval <= 1000)

    def test_TheIntervalDoesNotMatter(self):
        """Whoever looks seldom sees the same machine, with as many flows as were asked for."""
        seen = [self.moment(60_000 // each, f"--interval {each} --flows 1000") for each in (500, 6000, 60_000)]
        tables = [[each.tables[name][0].table for name in TABLES if name != "nexus_channel_list"] for each in seen]
        self.assertTrue(tables[0] == tables[1] == tables[2])
        self.assertLess(abs(len(seen[0].states) - 1000), 60)
        self.assertLess(sum(each in (SYN_SENT, SYN_RECEIVED) for each in seen[0].states), 20)

    def test_AnHourHasItsChanges(self):
        first, *_, last = seen = [self.moment(each, "--interval 60000") for each in (0, 1, 5, 60)]
        lives = [len(first.flows.keys() & each.flows.keys()) / len(first.flows) for each in seen]
        self.assertTrue(1 > lives[1] > 0.6 > lives[2] > 0.2 > lives[3] > 0.1, lives)  # servers go on listening
        hosts = [{host(each, "sf_remote") for each in moment.flows.values()} for moment in (first, last)]
        self.assertLess(len(hosts[0] & hosts[1]), len(hosts[0]) / 2)
        shells = [{key for key in each.flows if key[2][4:] and each.flows[key]["sf_local.port"] == 22
                   and not each.flows[key]["sf_remote.port"]} for each in (first, last)]
        self.assertEqual(*shells)
        resent = {round(count(each, "SndDPktReXmt", block="tcp") / max(count(each, "SndTotalDP", block="tcp"), 1), 4)
                  for each in last.tables["stats/userstack"]}
        self.assertGreater(len(resent), 8)
        frees = sum(region["frees"] for arena in last.tables["stats/arena"] for region in arena["regions"])
        self.assertGreater(frees, sum(count(each, "RxPkt") for each in last.tables["stats/net_if"]) / 1000)
        crowd = [self.moment(each, "--interval 60000 --channels 300") for each in (0, 60)]
        highest = [max(each["fd"] for group in moment.groups.values() for each in group) for moment in crowd]
        self.assertLess(highest[1], highest[0] + 20)

    def test_WhoIsHeldBackIsSlow(self):
        for incident, is_usual in ("", True), ("--incident stalled-flow", False):
            sent = collections.defaultdict(list)
            moments = [self.moment(each, incident) for each in (20, 30)]
            held = [{(each["sfa_nx_uuid"], number): entry["sfae_flags"] & CONTROLLED
                     for each in moment.tables["stats/flow_adv"] for number, entry in enumerate(each["entries"])}
                    for moment in moments]
            for key, flow in moments[0].flows.items():
                advisory = flow["sf_nx_uuid"], flow["sf_adv_idx"]
                if key in moments[1].flows and {advisory} <= held[0].keys() & held[1].keys():
                    sent[held[0][advisory] & held[1][advisory]].append(
                        moments[1].flows[key]["sf_lstats.packets"] - flow["sf_lstats.packets"])
            slow, others = [sum(sent[each]) / max(len(sent[each]), 1) for each in (CONTROLLED, 0)]
            self.assertLess(4 * slow, others)
            self.assertEqual(0 in sent[CONTROLLED], not is_usual)

    def test_OptionsOfTheMachine(self):
        known = [line.split()[0] for line in self.lab("run --incident list").out.splitlines()]
        self.assertEqual((len(known), known[0], known[-1]), (8, "lossy-link", "crash"))
        late, early = [generate(self.directory / at, "--incident", f"leak@{at}", "--after", 2.5).table("stats/arena")
                       for at in ("7.5", "0")]
        self.assertNotEqual(late, early)
        generate(self.kernel.root, "--host", "box.example")
        self.assertEqual(self.lab("capture named").status, 0)
        self.assertIn("\nhost: box.example\n", (self.directory / "named/capture.txt").read_text())
        self.assertEqual(self.lab("capture redacted --redact").status, 0)
        self.assertFalse([path for path, held in files(self.directory / "redacted").items() if b"box" in held])
        self.assertFalse(generate(self.kernel.root).path("../../kernel").exists())

    def test_IncidentsShowWhereTheGuideLooks(self):
        usual = generate(self.directory / "usual", "--after", 120)
        page = (top / "docs/from-symptom-to-command.md").read_text()
        for name, command, pattern, least in SIGNS:
            with self.subTest(name=name, command=command):
                struck = generate(self.directory / name, "--after", 120, "--incident", name)
                found = [sum(int(each) if each.isdigit() else 1 for each in re.findall(pattern, self.start(
                    command, kernel=kernel).end().out)) for kernel in (usual, struck)]
                self.assertGreaterEqual(found[1] - found[0], least, found)
        self.assertLessEqual({name for name, *_ in SIGNS}, {*re.findall("--incident ([a-z-]+)", page)})
