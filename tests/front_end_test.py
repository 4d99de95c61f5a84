"""The command line: usage, global options, the watch loop, the ways out; and what the commands have in common."""
import os
import signal
import time

from records import TABLES, make
from runs import MISSING, SHORT, TIME, Case, tarvelctl, wait_for

os.environ["POSIXLY_CORRECT"] = ""  # options behind operands are options none the less
EMPTY = dict.fromkeys(TABLES, b"")
USAGE = """usage: tarvelctl [global options] <command> [args]

Global options:
\t-f <output_file>\tWrite output to <file>\n\t-w <seconds>    \tRefresh every <seconds>

Command:
\tchannel\n\tflow\n\tflow-adv\n\tflow-owner\n\tflow-route\n\tflow-switch\n\tinterface\n\tmemory\n\tnetns\n\tprovider
\tshow\n\ttree\n\tchannel-stats\n\tlist-providers\n\tnetstat
"""
REPORT = "No providers\n"  # the shortest there is
NO_FILE = MISSING + "failed to retrieve nexus provider list, No such file or directory\n"
NOT_X, DETAILS = "invalid option -- 'x'", "\t[--details, -D ]\n"


class FrontEnd(Case):
    def test_GlobalOptionsAreTakenFromAnywhereWithTheirValues(self):
        error = f"provider: {NOT_X}\n{DETAILS}"  # which ends a watch
        for files, expected, *lines in (
                ({}, [REPORT], "-w 0 provider -D", "PROVIDER -w 0 -D", "List-Providers x -w 0", "-w 7 provider -w 0"),
                ({"out": REPORT}, [], "-f out provider -D", "provider -f out -D", "provider -D -f out",
                 "-w 0 -f out provider", "provider -f last -f out"),
                ({"-w": REPORT}, [], "provider -f -w"), ({"-f": REPORT}, [], "provider -f -f"),
                ({"out": "", "last": REPORT}, [], "-f out provider -f last"),
                ({}, ["", "Couldn't open file no/out:No such file or directory\n", 64], "provider -f no/out"),
                ({}, ["", "Couldn't open file .:Is a directory\n", 64], "-f . provider"),
                ({"out": ""}, ["", USAGE, 64], "-f out nope", "-f out provider -w", "-f out provider -w x", "-f out"),
                ({}, ["", USAGE, 64], "", "''", "nope", "provide", "providers", "-D provider", "-w 1", "-w0 provider",
                 "-W 0 provider", "-fout provider", "-w", "-f", "provider -w", "-w 0 provider -w", "-w -f provider"),
                ({}, ["", USAGE, 64], *(f"provider -w {value}" for value in (
                    "2x", "x", "''", "' '", "-1", "'1 '", "0x1", "1.5", "2147483648", "4294967296",
                    "9223372036854775808", "-9223372036854775809", "9" * 20))),
                ({}, ["", error], *(f"provider -x -w {value}" for value in ("0", "00", "-0", "+0"))),
                ({}, ["\n<time>\n", error], *(
                    f"provider -x -w {value}" for value in ("1", "+1", "' 1'", "010", "2147483647")))):
            for line in lines:
                (self.directory / "out").write_text("older and longer than the report")
                self.expect(EMPTY, line, *expected)
                self.assertEqual({name: (self.directory / name).read_text() for name in files}, files, line)
        for name in "tv", "/opt/net/tv":
            self.expect({}, "nope", "", USAGE.replace("tarvelctl", "tv"), 64, name=name)

    def test_OptionErrorsAreTheLibrarysWordsAndEndTheWatch(self):
        for line, error in (("Provider -Dx", NOT_X), ("provider -w1", "invalid option -- 'w'"), ("channel -x", NOT_X),
                            ("list-providers --nope", "unrecognized option '--nope'"),
                            ("provider --de=2", "option '--details' doesn't allow an argument"),
                            ("channel x --all", "unrecognized option '--all'")):
            error = f"{line.split()[0]}: {error}\n" + (DETAILS if "rov" in line else "")
            self.expect({}, (line, f"{line} -f out"), err=error)
            self.expect({}, f"{line} -w 60", "\n<time>\n" + error, merged=True)
            self.expect({}, f"{line} -f out", closed=[2])
            self.assertEqual((self.directory / "out").read_text(), "")

    def test_EachCommandReadsItsTableWhateverTheCaseOfItsName(self):
        """Some skip what they do not understand. Some go on watching where there is no table."""
        for table, ends_watch, line, *errors in (
                ("stats/flow", True, "FLOW -xn --no", NOT_X, "unrecognized option '--no'"),
                ("stats/flow_adv", True, "Flow-Adv -x"), ("stats/flow_owner", True, "flow-Owner"),
                ("stats/flow_route", True, "flow-Route x -an", "invalid option -- 'a'"),
                ("stats/flow_switch", True, "flow-switcH"), ("stats/net_if", True, "interFACE -x --nope"),
                ("stats/netns", True, "NETNS -a"), ("stats/netns", True, "netns -i global -p tcp"),
                ("stats/arena", False, "Memory x -xy", NOT_X, "invalid option -- 'y'"),
                ("stats/userstack", False, "netSTAT -xs", NOT_X),
                ("nexus_provider_list", False, "Show"), ("nexus_provider_list", False, "Channel-Stats")):
            said = "".join(f"{line.split()[0]}: {error}\n" for error in errors)
            self.expect(EMPTY, line, err=said)
            self.expect({table: None}, line, err=said + MISSING)
            self.expect({}, [f"-w 60 {line}"] * ends_watch, "\n<time>\n", said + MISSING)

    def test_WatchShowsTheTimeInColourOnATerminalAlone(self):
        self.kernel.put("nexus_provider_list", b"")
        before, run = time.strftime("%Y-%m-%d %H:%M:%S"), self.start("-w 60 provider", to="terminal")
        run.wait(REPORT)
        seen = run.end(signal.SIGINT)
        shown, = TIME.findall(seen.out)
        self.assertEqual(seen, (f"\n\033[36m{shown}\033[0m\n{REPORT}", "", 0))
        self.assertTrue(before <= shown <= time.strftime("%Y-%m-%d %H:%M:%S"))
        run, out = self.start("-w 60 provider -f out", to="terminal"), self.directory / "out"
        wait_for(lambda: out.exists() and out.read_text().endswith(REPORT))
        self.assertEqual((run.end(signal.SIGINT), TIME.sub("", out.read_text())), (("", "", 0), "\n\n" + REPORT))

    def test_WatchReadsOptionsAndTableAfreshAndGoesOnAfterFailures(self):
        run, reports = self.start("provider ignored -D -w 1", merged=True), ["", NO_FILE]
        run.wait(NO_FILE)
        for name in "first", "other":  # and diagnostics follow the report that they belong to
            self.kernel.put("nexus_provider_list", make("nexus_provider_record", name=name, name_length=5) + b"\0")
            reports.append(f"user-pipe {name} 00000000-0000-0000-0000-000000000000\n\trings: tx 0 rx 0 slots: "
                           f"tx 0 rx 0 bufsize 0 metasize 0 mhints 0\n{SHORT}")
            run.wait(reports[-1])
        out, _, status = run.end(signal.SIGINT)
        self.assertEqual(([*dict.fromkeys(TIME.sub("<time>", out).split("\n<time>\n"))], status), (reports, 0))

    def test_WatchFollowsTheSystemsTimeZone(self):
        (self.directory / "etc").mkdir()
        for name, seconds in ("etc/localtime", bytes(4)), ("later", b"\x40\0\0\0"):  # 34 years later
            (self.directory / name).write_bytes(b"TZif%b\1\0\0\0\4%b\0\0ABC\0" % (bytes(35), seconds))
        enter = f"mount --bind etc /etc && exec {tarvelctl} provider -w 1"
        run = self.start(["-u", "TZ", "unshare", "-rm", "sh", "-c", enter], program="/usr/bin/env")
        run.wait(NO_FILE)
        (self.directory / "later").rename(self.directory / "etc/localtime")
        run.wait(NO_FILE, 2)
        years = [int(each[:4]) for each in TIME.findall(run.end(signal.SIGINT).out)]
        if not years:
            self.skipTest("there can be no other /etc here")
        self.assertEqual(years[-1], years[0] + 34)

    def test_ReaderThatLeavesEndsTheProcessQuietlyWhateverTheCallerIgnores(self):
        self.kernel.put("nexus_provider_list", bytes(264) * 5000)  # more than a pipe holds
        pipe = self.directory / "pipe"
        os.mkfifo(pipe)
        reader = os.open(pipe, os.O_RDONLY | os.O_NONBLOCK)
        run = self.start("provider", to=pipe, preexec_fn=lambda: signal.signal(signal.SIGPIPE, signal.SIG_IGN))
        os.close(reader)
        self.assertEqual(run.end(), ("", "", -signal.SIGPIPE))
