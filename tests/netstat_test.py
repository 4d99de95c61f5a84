"""netstat and its counter reports, interface, flow-switch."""
import itertools
import re

from records import RECORDS, make
from runs import MISSING, Case

USAGE = """Usage:
tarvelctl netstat arguments
\t-a              all flows\n\t--flow-adv      flow advisory\n\t--flow-owner    flow owner
\t-n              numerical display\n\t--netif         netif statistics\n\t--flowswitch    flowswitch statistics
\t-p <protocol>   show protocol statistics (tcp, udp, ip, ip6)\n\t-s              protocol statistics
\t--global        fold statistics into single global one
\t--pid <pid>     filter statistics based on process <pid>\n\t--uuid <uuid>   filter statistics based on nexus <uuid>
\t--show-zeros    print out zero fields in statistics
"""
A, B = "AAAAAAAA-0123-4567-89AB-AAAAAAAAAAAF", "BBBBBBBB-0123-4567-89AB-BBBBBBBBBBBF"
MOST = (1 << 64) - 1
TWO, FIVE = "\tip:\n\t\tTotalRcvd       : 2\n", "\tip6:\n\t\tDADLoop         : 5\n"
FOUR, UDP = "\ttcp:\n\t\tConnInit        : 4\n", "\tudp:\n\t\tSend6SWCsumBytes: 2\n"


def stack(pid, nexus=A, **counters):
    return make("userstack", nx_uuid=nexus, if_name="en0", pid=pid, **counters)


def head(process, nexus=A):
    return f" - {process}\n\tNexus UUID: {nexus}\n\tNetif     : en0\n"


STACKS = {"stats/userstack": stack(0, tcp={0: MOST}) + stack(42, ip={0: 1}, udp={21: 2})
          + stack(-1, ip={0: MOST}, tcp={0: 4}) + stack(42, B, ip={0: 2}, ip6={35: 5})}
CLOSED = head("<Closed Port Stats>") + f"\tip:\n\tip6:\n\ttcp:\n\t\tConnInit        : {MOST}\n\tudp:\n"
CURL_A = head("curl.42") + f"\tip:\n\t\tTotalRcvd       : 1\n\tip6:\n\ttcp:\n{UDP}"
GONE = head("<unknown>.-1") + f"\tip:\n\t\tTotalRcvd       : {MOST}\n\tip6:\n{FOUR}\tudp:\n"
CURL_B = head("curl.42", B) + f"{TWO}{FIVE}\ttcp:\n\tudp:\n"
# The twins: table, title, commands, the last counter and the lines of it and the first.
TWINS = (("net_if", "netif:\n", "interface", "--netif", 28, "\t\tTxIRQ           : {}\n\t\tTxEnqueueDrop   : {}\n"),
         ("flow_switch", "flowswitch:\n", "flow-switch", "--flowswitch", 51,
          "\t\tDropped         : {}\n\t\tChanErrUppAlloc : {}\n"))


class Netstat(Case):
    def test_WithoutAReportItPrintsItsUsageAndNothingAfterWrongValues(self):
        for error, *options in (
                (USAGE, "", "-n", "--global", "--pid 5", "--show-zeros", "-p tcp", "--wait -s", "a -- -s",
                 f"--uuid {A}"),
                ("netstat: invalid option -- 'w'\nnetstat: invalid option -- '1'\n" + USAGE, "-w1"),
                ("netstat: option requires an argument -- 'p'\n" + USAGE, "-p"),
                ("netstat: option '--pid' requires an argument\n" + USAGE, "--pid"),
                ("netstat: option '--netif' doesn't allow an argument\n" + USAGE, "--netif=1"),
                *((f'Unsupported protocol "{each}"\n', f"-s -pudp -p '{each}'") for each in ("icmp", "TCP", "ip4", "")),
                *(("Bad UUID\n", f"-s --uuid '{each}' -x") for each in (A + "0", A[1:], "G" + A[1:], ""))):
            self.expect(STACKS, [f"netstat {each}" for each in options], err=error, name="tv")
            if USAGE not in error:
                self.expect(STACKS, f"-w 60 netstat {options[0]}", "\n<time>\n", error)

    def test_ReportsRunOnceInAFixedOrderWhateverFails(self):
        letters = {"Proto Local": "f", "<Closed Port": "s", "netif:": "i", "FlowAdvIdx": "a", "NetIf     Port": "o",
                   "flowswitch:": "w"}
        every = "--flowswitch --flow-owner --flow-adv --netif -s -a --flow -s"
        for table in "flow", "userstack", "net_if", "flow_adv", "flow_owner", "flow_switch":
            self.kernel.put("stats/" + table, make(table))
        for expected, options, *missing in (
                ("f", "-an"), ("f", "--flow"), ("s", "--pro"), ("i", "-n --net --wait 9"), ("a", "--flow-adv"),
                ("o", "--flow-o"), ("w", "--flowswitch"), ("fs", "-sna"), ("fi", "x -a y --netif -- -s"),
                ("fsiaow", every), ("saow", every, "stats/flow", "stats/net_if")):
            seen = self.run_on(dict.fromkeys(missing), f"NETSTAT {options}")
            reports = "".join(letters[each] for each in re.findall("|".join(letters), seen.out))
            self.assertEqual((reports, seen.err, seen.status), (expected, MISSING * len(missing), 0), options)

    def test_StacksAreChosenByProtocolProcessAndNexusAndFolded(self):
        for expected, *options in (
                (CLOSED + CURL_A + GONE + CURL_B, "-s", "--protocol --per-protocol udp -p ip6 -p tcp -p ip"),
                (CLOSED, "-s --pid abc"), (CURL_A + CURL_B, "-s --pid 42"), (GONE, "-s --pid -1"), ("", "-s --pid 43"),
                (CURL_B, f"-s --uuid {B.lower()}"), (CURL_A, f"-s --pid 42 --uuid {A}"),
                (head("<unknown>.-1") + FOUR, "-sptcp --pid -1"),
                (head("curl.42", B) + TWO + "\tudp:\n", f"--per-protocol udp -p ip -s --uuid {B}"),
                (head("curl.42", B) + FIVE, f"-s --pe=ip6 -p ip6 --uuid {B}"), (FIVE, "-s --global -p ip6"),
                (TWO + FIVE + "\ttcp:\n\t\tConnInit        : 3\n" + UDP, "-s --global"),  # sums wrap
                ("\tip:\n\t\tTotalRcvd       : 3\n" + FIVE + "\ttcp:\n" + UDP, "-s --global --pid 42"),
                (TWO + FIVE + "\ttcp:\n\tudp:\n", f"-s --global --uuid {B}"),
                ("\tip:\n\tip6:\n\ttcp:\n\tudp:\n", f"-s --global --uuid {B} --pid -1")):
            self.expect(STACKS, [f"netstat {each}" for each in options], expected)

    def test_CountersAreNamedByPositionAsTheManualSaysByHand(self):
        for table, option, *blocks in (("userstack", "-s", "ip", "ip6", "tcp", "udp"),
                                       ("net_if", "--netif", "counters"), ("flow_switch", "--flowswitch", "counters")):
            names = {block: RECORDS["tv_stats_" + table]["fields"][block]["names"] for block in blocks}
            for step, zeros in (1 << 55, ""), (0, " --show-zeros"):
                numbers = itertools.count(step, step)
                values = {block: [next(numbers) for _ in names[block]] for block in blocks}
                pairs = [pair for block in blocks for pair in zip(names[block], values[block])]
                out = self.run_on({"stats/" + table: make(table, **values)}, f"netstat {option}{zeros}").out
                self.assertEqual(re.findall("\t\t(.*)", out), [f"{name:16}: {value}" for name, value in pairs])

    def test_TwinsAreSortedByNameAndFilteredByNexusOrAllFolded(self):
        for table, title, command, option, end, lines in TWINS:
            names = "\u00e9", "en", "EN0", "0123456789abcdef", "bridge10"
            self.kernel.put("stats/" + table, make(table, nx_uuid=B, name="en1", counters={0: 3, end: 4})
                            + b"".join(make(table, nx_uuid=A, name=name) for name in names)
                            + make(table, nx_uuid=A, name="en0", counters={0: MOST, end: 1}))
            rows = [f" - {name} {A}\n" for name in (
                "0123456789abcdef", "EN0     ", "bridge10", "en      ", "en0     ", "\u00e9      ")]
            en1 = f" - en1      {B}\n" + lines.format(3, 4)
            rows.insert(-1, lines.format(MOST, 1) + en1)
            self.expect({}, f"{command} x --nope", title + "".join(rows))
            self.expect({}, f"netstat {option} --pid 7 --uuid {B}", title + en1)
            self.expect({}, f"netstat {option} --uuid {A.replace('A', '0')}", title)
            self.expect({}, f"netstat {option} --global --uuid {A}", title + lines.format(2, 5))
