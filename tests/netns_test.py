"""netns: one port namespace, or all of them."""

from records import make
from runs import Case

TCP, UDP = 6, 17
V4 = "10.0.0.1"


def namespace(address, protocol, *ranges, length=None):
    """Of an address; the global one has none. A range has first and last port and reservations of three subsystems."""
    names = "first_port", "last_port", "subsystem", "bsd", "listeners"
    length = length or (16 if ":" in address else 4 if address else 0)
    return make("netns", address=address or b"", address_length=length,
                protocol=protocol, ranges=[make("netns_range", **dict(zip(names, each))) for each in ranges])


def report(of, *rows):
    protocol, name = of.split(" ", 1)
    return (f"{protocol} port reservations for {name}\n    PORT(S)     TARVEL        BSD   LISTENER\n"
            + "".join(row + "\n" for row in rows) + "--------------------------------------------\n")


RANGES = (49152, 65535, 1, -1, 3), (53, 0, 0, -1 << 31, 2), (2, 1), (0, 0, 1234567890)
GLOBAL_TCP = report("tcp global namespace", "49152-65535          1         -1          3",
                    "         53          0 -2147483648          2", "        2-1          0          0          0",
                    "          0 1234567890          0          0")
GLOBAL_UDP = report("udp global namespace", "          2          0          0          0")
V4_TCP = report("tcp 10.0.0.1", "          6          0          0          0")
V4_UDP = report("udp 10.0.0.1")
V6_UDP = report("udp fe80::1", "          8          0          0          0")
LONG_TCP = report("tcp a00:1::")
# Namespaces that differ in one thing each, the one that is found with rows of its own.
TABLE = {"stats/netns": b"".join([
    namespace(V4, TCP, length=7), namespace("", 200), make("netns", address="fe80::1", protocol=UDP, ranges=[
        make("netns_range", first_port=2)]), namespace("", TCP, *RANGES), namespace("a00:1::", TCP), namespace(V4, UDP),
    namespace(V4, TCP, (6,)), namespace(V4, TCP), namespace("fe80::1", UDP, (8,))])}
ALL = (report("tcp global namespace") * 2 + GLOBAL_UDP + GLOBAL_TCP + LONG_TCP + V4_UDP + V4_TCP
       + report("tcp 10.0.0.1") + V6_UDP)


class Netns(Case):
    def test_AllShowsEveryNamespaceInTableOrder(self):
        self.expect(TABLE, ("netns -a", "netns --all", "netns x -a -p icmp -i localhost", "netns -a -i 10.0.0"), ALL)
        self.expect(TABLE, ("netns -a -p udp", "netns -i 10.0.0.2 -a", "netns -ai global", "netns -i :: --all"),
                    "WARNING: With -a, any further namespace specifiers are ignored\n" + ALL)

    def test_ShowsTheNamespaceThatIsNamed(self):
        for expected, *lines in (
                (GLOBAL_TCP, "-i global -p tcp", "-i global -i 10.0.0.1 -p tcp", "-i global -i localhost -p tcp"),
                (GLOBAL_UDP, "-p udp -i global", "-i 10.0.0.1 -i global -p udp"),
                (V4_UDP, "x --ip=10.0.0.1 --proto udp", "-i fe80::1 -i 10.0.0.1 -p udp", "-i 10.0.0.1 -p tcp -p udp",
                 "-i 10.0.0.1 -p udp -p icmp", "-i localhost -i 10.0.0.1 -p udp"),
                (V4_TCP, "-i 10.0.0.1 -p tcp"), (LONG_TCP, "-i a00:1:: -p tcp"),
                (V6_UDP, "-i FE80:0:0:0:0:0:0:1 -p udp", "-i 10.0.0.1 -i fe80::1 -p udp")):
            self.expect(TABLE, [f"netns {line}" for line in lines], expected)

    def test_FailuresEndWithTheirTextAndTheWatch(self):
        options = "\n\t[--all, -a ]\n\t[--ip, -i <ip> ]\n\t[--proto, -p <proto> ]\n"
        for out, err, *lines in (
                ("Specify -a or a valid IP address\n", "", "", "-p udp", "-p udp -i localhost", "-p udp -i Global",
                 "-p udp -i global.", "-p udp -i ''", "-p udp -i 10.0.0", "-p udp -i ::g", "-p udp -i 10.0.0.1:80",
                 "-p udp -i fe80::1 -i 10.0.0"),
                ("Specify -a or a valid L4 protocol name\n", "", "-i 10.0.0.1", "-i 10.0.0.1 -p icmp",
                 "-i global -p UDP", "-i fe80::1 -p udp6"),
                ("", "", "-i 10.0.0.2 -p tcp", "-i fe80::1 -p tcp", "-i fe80::2 -p udp"),
                ("", f"netns: invalid option -- 'x'{options}", "-x -a"),
                ("", f"netns: option '--proto' requires an argument{options}", "-a --proto")):
            self.expect(TABLE, [f"netns {line}" for line in lines], out, err)
            self.expect(TABLE, [f"-w 60 netns {line}" for line in lines], "\n<time>\n" + out, err)
