"""What the tool does where calls of the kernel or allocations fail, worked out step by step from its contract.

What a report says of a whole table is not the model's business: it asks for a run on a kernel with that table.
"""
import errno
import os
import re

PROVIDERS, CHANNELS, FLOWS = "nexus_provider_list", "nexus_channel_list", "stats/flow"
TABLE = {"flow": FLOWS, "flow-adv": "stats/flow_adv", "flow-owner": "stats/flow_owner",
         "flow-route": "stats/flow_route", "flow-switch": "stats/flow_switch", "interface": "stats/net_if",
         "memory": "stats/arena", "netns": "stats/netns", "provider": PROVIDERS, "list-providers": PROVIDERS}
# The reports of netstat, in the order in which they run.
NETSTAT = {"-a": FLOWS, "-s": "stats/userstack", "--netif": "stats/net_if", "--flow-adv": "stats/flow_adv",
           "--flow-owner": "stats/flow_owner", "--flowswitch": "stats/flow_switch"}
ALL = " ".join(reversed(NETSTAT))


def lines(torture):
    """Command lines that reach all that the commands do with their tables."""
    namespaces = re.findall(r"^(tcp|udp) port reservations for ([\d.:a-f]+)$", torture.clean("netns -a").out, re.M)
    nexus = re.search(r'"uuid":"(.*)",\n *"type":"nexus",', torture.clean("tree").out)[1]
    pid = re.search(r"\.(\d+)$", torture.clean("flow").out, re.M)[1]
    return [*TABLE, "channel", "show", "channel-stats", "tree", f"tree {nexus}", f"tree {nexus[:-12]}000000000000", "provider -D",
            "list-providers --details", "flow -n", "flow-route -n", "netns -a", "netns -a -p tcp", "netns -i global -p udp",
            *(f"netns -i {address} -p {protocol}" for protocol, address in namespaces[:2]),
            f"netstat {ALL}", f"netstat {ALL} -n --global --show-zeros", f"netstat --netif -s -p tcp --pid {pid}",
            f"netstat --uuid {nexus} {ALL}", *(f"-w 1 {line}" for line in (
                *TABLE, "channel", "netns -a", "netns -i global -p tcp", "netstat -s -a", "show", "tree"))]


class Ended(Exception):
    pass


class Model:
    """A run, with its outputs and status, under faults of the kernel and in fetches that find no memory."""

    def __init__(self, torture, line, faults=(), starved=range(0)):
        self.torture, self.faults, self.starved = torture, faults, starved
        self.turn = self.fetches = self.status = 0
        self.out = self.err = ""
        try:
            self.rounds(line.removeprefix("-w 1 ")) if line.startswith("-w") else self.handle(line)
        except Ended:
            pass

    def ask(self):
        """The kernel's next answer: an error, or 0, or how many bytes it is short of."""
        self.turn += 1
        return next((value for _, first, count, value in self.faults if 0 <= self.turn - first < count), 0)

    def fetch(self, node):
        """The table as the tool gets it, or an error number. Eleven times too little memory is too often."""
        whole, failures = len(self.torture.tables[node]), 0
        self.fetches += 1
        while True:
            answer, step = self.ask(), "len"
            size = max(0, whole + answer)
            if answer <= 0 and size == 0:
                return b""
            if answer <= 0 and self.fetches in self.starved:
                self.err += "sysctl malloc failed\n"
                return errno.ENOMEM
            if answer <= 0:
                answer, step = self.ask(), "buf"
                if answer <= 0 and size == whole:
                    return self.torture.tables[node][:max(0, whole + answer)]
            error = max(answer, 0) or errno.ENOMEM
            failures += error == errno.ENOMEM
            if error != errno.ENOMEM or failures == 11:
                self.err += f"sysctl for {step} failed, {os.strerror(error)}\n"
                return error

    def show(self, line, tables):
        """What a command says of tables; of one that is not empty, or of several."""
        shown = self.torture.clean(line, tables)
        self.out += shown.out
        self.err += shown.err
        self.status = shown.status
        if shown.status:
            raise Ended
        return shown

    def rounds(self, line):
        """A watch, interrupted in its third sleep."""
        if line == "channel":
            return self.watch_channels()
        for _ in range(3):
            self.out += "\n<time>\n"
            if self.handle(line):
                return

    def handle(self, line):
        """One run of a command. Returns whether it ends a watch."""
        word, *arguments = line.split()
        if word == "netstat":
            others = [word for word in arguments if word not in NETSTAT]
            for option, node in NETSTAT.items():
                if option in arguments:
                    self.report(" ".join(["netstat", option, *others]), node)
            return False
        if word == "channel":
            return self.channels()
        if word in TABLE:
            return self.report(line, TABLE[word])
        return self.tree(line)

    def report(self, line, node):
        """A command that reads one table."""
        word, *arguments = line.split()
        is_provider = word in ("provider", "list-providers")
        if word == "netns" and not {"-a", "-i"} & set(arguments):
            self.out += "Specify -a or a valid IP address\n"
            return True
        got = self.fetch(node)
        if isinstance(got, bytes) and got:
            return not self.show(line, {node: got}).out and word == "netns"
        if word == "netns" and {"-a", "-p"} <= set(arguments):
            self.out += "WARNING: With -a, any further namespace specifiers are ignored\n"
        if got == b"":
            self.out += "No providers\n" if is_provider else ""
        elif is_provider:
            self.err += f"failed to retrieve nexus provider list, {os.strerror(got)}\n"
        if word == "netns":
            return "-a" not in arguments or got not in (b"", errno.ENOMEM)
        return isinstance(got, int) and not is_provider and word != "memory"

    def tree(self, line):
        """A command that needs the providers, and takes what it gets of channels and flows."""
        providers = self.fetch(PROVIDERS)
        if isinstance(providers, int):
            return line.startswith("tree")
        others = {node: got if isinstance(got := self.fetch(node), bytes) else b"" for node in (CHANNELS, FLOWS)}
        self.show(line, {PROVIDERS: providers, **others})
        return False

    def channels(self):
        got = self.fetch(CHANNELS)
        if isinstance(got, bytes) and got:
            shown = self.torture.clean("channel", {CHANNELS: got})
            self.err += shown.err
            self.out += self.listing(shown.out)
        else:
            self.out += "No channels\n"
        return False

    def listing(self, whole):
        """The listing where the kernel does not say for each channel whether it counts."""
        heading = re.search(r"^Ring  .*\n.*\n", whole, re.M)
        heading = heading[0] if heading else ""

        def channel(match):
            nonlocal heading
            port, rings = match.groups()
            if (error := self.ask()) > 0:
                self.err += f"failed to get channel stat, {os.strerror(error)}\n"
                return port
            shown, heading = (heading, "") if rings.strip() else ("", heading)
            return port + shown + rings

        return re.sub(r"(\tPort.*\n)((?:.+\n)*\n)", channel, whole.replace(heading, ""))

    def watch_channels(self):
        """A listing wants two snapshots in a row; a row of failures is told once."""
        steady = self.torture.clean("-w 1 channel").out.removeprefix("\n<time>\n")
        steady = steady[:len(steady) // 2]  # of its three snapshots, two are shown
        self.out, base, told = "\n<time>\n", False, False
        for _ in range(3):
            got = self.fetch(CHANNELS)
            fine = isinstance(got, bytes) and got != b""
            if fine and base:
                self.out += self.listing(steady)
            if not fine and not told:
                self.out += "No channels\n"
            base, told = fine, not fine
