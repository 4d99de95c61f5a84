"""tarvelexport: what its lines say of random and hostile tables, and how it ends."""
import json
import os
import random
import re
import shutil
import signal
import struct

from export_reading import NAMES, READERS, read
from records import make
from runs import Case, generate, limit_files, tarvelexport, tarvellab, wait_for

KINDS = ("provider nexus channel flow flow_advisory flow_owner flow_route interface flow_switch userstack netns "
         "arena").split()
KIND_OF = {"nexus_provider_list": "provider", "stats/flow_adv": "flow_advisory", "stats/net_if": "interface"}
CUT, MANY = "{}: ends inside a record\n", "{}: too many followers claimed by {} records, which are left out\n"
# Numbers that decide something, by table: where in a record, how wide, and which; and the size of its first record.
NONE = (0xFFFFFFFF, 0xFFFFFFFE, 0)
PIDS = (42, 43, 0, -1, -1 << 31, (1 << 31) - 1)
FAMILIES, SCOPED = (2, 30, 9), tuple(int.from_bytes(bytes.fromhex(each), "little") for each in (
    "fe800000", "fe800004", "febfffff", "fec00001", "ff010002", "ff120003", "ff030004", "00000000"))
DECISIVE = {
    "nexus_provider_list": (264, (128, "I", (0, 3, 63, 64, 65, 1 << 31)), (132, "I", (0, 1, 2, 3, 3, 3, 4)),
                            (144, "I", (0, 1, 2, 3)), (184, "I", (0, 1, 2)), (256, "I", (0, 1, 3))),
    "nexus_channel_list": (24, (16, "I", (0,))),
    "stats/flow": (320, (32, "I", NONE), (68, "i", PIDS), (76, "I", NONE), (81, "B", FAMILIES), (88, "I", SCOPED),
                   (92, "I", (0, 1)), (109, "B", FAMILIES), (116, "I", SCOPED), (136, "B", (6, 17, 0)),
                   (144, "I", NONE), (140, "i", (0, 0x80090, 0x480190, -1, 0x300110)),
                   (168, "I", (0, 10, 11, 20, 22, 23, 1 << 31)),
                   (172, "I", (0, 1, 0xFFFFFFFF)), (152, "Q", ((1 << 64) - 1, 1 << 63, 0))),
    "stats/flow_adv": (40, (32, "i", PIDS), (36, "I", (0, 1, 5, 512, 513))),
    "stats/flow_owner": (128, (32, "I", NONE), (68, "i", PIDS), (76, "I", (0, 1, 256)), (80, "I", (0, 1 << 31))),
    "stats/flow_route": (256, (101, "B", FAMILIES), (56, "I", (0, 0x20, 0x80, 0x1F0, 0xA0)), (64, "q", (-1 << 63, -1)),
                         (80, "I", SCOPED), (136, "I", SCOPED)),
    "stats/net_if": (320,), "stats/flow_switch": (448,), "stats/userstack": (2496, (32, "i", PIDS)),
    "stats/netns": (32, (16, "B", (4, 16, 0, 5, 255)), (17, "B", (6, 17, 1)), (18, "B", (0, 1, 3))),
    "stats/arena": (2608, (64, "i", (0, 2, 3, -1)), *((2576 + 4 * i, "i", PIDS[:4]) for i in range(8)),
                    *((80 + 208 * i + 104, "Q", (0, 1, 1 << 32)) for i in range(12))),
}
BEHIND = {"nexus_provider_list": (256, "I", 16), "stats/flow_adv": (36, "I", 20), "stats/netns": (18, "B", 32)}
HOSTILE = [bytes([each]) for each in range(256)] + [
    b"plain", b"\xc3\xa9", b"\xe2\x82\xac", b"\xf0\x9f\x92\xa9", b"\xe2\x82", b"\xf0\x9f\x92", b"\xed\xa0\x80",
    b"\xc2\x85", b"\xc0\xaf", b"\xe2\x80\xa8", b"\xf4\x90\x80\x80", b"\xe0\x9f\xbf", b"\xf0\x8f\xbf\xbf",
    b"\xed\x9f\xbf", b'","a":"', b"\xf4\x8f\xbf\xbf"]


def refuse(what):
    raise ValueError(what)


def unique(pairs):
    return dict(pairs) if len({name for name, _ in pairs}) == len(pairs) else refuse(pairs)


def parse(line):
    return json.loads(line, object_pairs_hook=unique, parse_float=refuse, parse_constant=refuse)


def fitting(value, said):
    """Whether a value is what the schema says of its key."""
    if said["array"]:
        return isinstance(value, list) and all(fitting(each, {**said, "array": False}) for each in value)
    if value is None:
        return said["null"]
    if said["type"] == "object":
        return [*value] == [key["key"] for key in said["keys"]] and all(
            fitting(value[key["key"]], key) for key in said["keys"])
    if said["type"] in ("integer", "boolean"):
        least = -(1 << said["bits"] - 1) if said.get("signed") else 0
        return type(value).__name__.startswith(said["type"][:3]) and least <= value < least + (1 << said.get("bits", 1))
    known = said.get("values", [value])
    return isinstance(value, str) and (value in known or re.fullmatch(r"(unknown|bit)\(-?\d+\)", value) is not None)


class Export(Case):
    maxDiff = 2000

    def setUp(self):
        super().setUp()
        self.random = random.Random(7)
        (self.kernel.root / "proc/43").mkdir(parents=True)
        (self.kernel.root / "proc/43/comm").write_bytes(NAMES[43].encode() + b"\n")

    def export(self, line="json", **options):
        return self.start(line, tarvelexport, **options).end()

    def text(self, size):
        return b"".join(self.random.choices(HOSTILE, k=size))[:size]

    def record(self, name):
        """A record of any bytes, but that numbers which decide something often have values that do."""
        size, *decisive = DECISIVE[name]
        made = bytearray(self.random.choice((self.text, self.random.randbytes))(size))
        for at, form, values in decisive:
            if at >= 2576 or self.random.random() < 0.9 or name in BEHIND:
                struct.pack_into("<" + form, made, at, self.random.choice(values)
                                 % (1 << 8 * struct.calcsize(form)) if form.isupper() else self.random.choice(values))
        if name in BEHIND:
            at, form, each = BEHIND[name]
            made += self.random.randbytes(struct.unpack_from("<" + form, made, at)[0] * each)
        for _ in range(self.random.randrange(4) if name == "nexus_channel_list" else 0):
            made[16] += 1
            tx, rx = self.random.choices((0, 0, 1, 2), k=2)
            made += self.random.randbytes(20) + struct.pack("<i8xII", self.random.choice(PIDS), tx, rx)
            made += self.random.randbytes(8 + 184 * (tx + rx))
        return bytes(made)

    def tables(self, most=12):
        return {name: b"".join(self.record(name) for _ in range(self.random.randrange(1, most))) for name in READERS}

    def check(self, tables, line="json", host=None):
        """Has tables exported, and compares lines and messages with what is read by hand."""
        seen, expected, said = self.run_on(tables, line, program=tarvelexport), [], ""
        for name, table in tables.items():
            lines, whole = read(name, table)
            expected += sorted((each for each in lines if each[0] in KINDS), key=lambda each: KINDS.index(each[0]))
            node, left_out = "tarvelexport: kern.tarvel." + name.replace("/", "."), [*dict(lines)].count("left out")
            said += MANY.format(node, [kind for kind, _ in lines].count("left out")) * left_out
            said += CUT.format(node) * (not whole)
        made = parse_lines(seen.out)
        seen.out.encode()  # raises what is not UTF-8
        for each in made:
            self.assertEqual([*each][:4], ["schema", "kind", "time", "host"])
            self.assertEqual((each.pop("schema"), each.pop("host")), (1, host))
            self.assertRegex(each.pop("time"), r"^20\d\d-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{3}Z$")
        for one, (kind, keys) in zip(made, expected):
            self.assertEqual(one, {"kind": kind, **keys})
        self.assertEqual((len(made), seen.err, seen.status), (len(expected), said, int(said != "")))
        return made

    def test_EveryKeySaysWhatTheTablesHold(self):
        (self.kernel.root / "proc/sys/kernel").mkdir(parents=True)
        (self.kernel.root / "proc/sys/kernel/hostname").write_bytes(b"n\xff\x01\n")
        schema = {each["kind"]: each["keys"] for each in parse(self.export("schema").out)["kinds"]}
        self.assertEqual([*schema], KINDS)
        for _ in range(6):
            for line in self.check(self.tables(), host="n\ufffd\x01"):
                said = {"array": False, "type": "object", "keys": schema[line["kind"]][4:]}
                self.assertTrue(fitting({key: line[key] for key in line if key != "kind"}, said), line)

    def test_CutTablesGiveTheirWholeRecords(self):
        for name, (size, *_) in DECISIVE.items():
            table = b"".join(self.record(name) for _ in range(3))
            for cut in {0, 1, size - 1, size, size + 1, len(table) - 1, *self.random.choices(range(len(table)), k=12)}:
                with self.subTest(table=name, cut=cut):
                    self.check({name: table[:cut]}, "json " + {"nexus_channel_list": "channel nexus"}.get(
                        name, KIND_OF.get(name, name.removeprefix("stats/"))))

    def test_CountsThatLieAreNotBelieved(self):
        for name, form, at in (("nexus_provider_list", "I", 256), ("nexus_channel_list", "I", 16),
                               ("stats/flow_adv", "I", 36), ("stats/netns", "B", 18)):
            for count in (1, 255, *(1 << 31, 0xFFFFFFFF, 0x0CCCCCCD) * (form == "I")):
                table = bytearray(self.record(name)[:DECISIVE[name][0]])
                struct.pack_into("<" + form, table, at, count)
                kind = "nexus channel" if name == "nexus_channel_list" else KIND_OF.get(name, "netns")
                self.check({name: bytes(table)}, f"json {kind}")
        lying = struct.pack("<16xI4x16x4xi8xII8x", 1, 42, 0xFFFFFFFF, 0xFFFFFFFF)
        self.check({"nexus_channel_list": lying + bytes(184)}, "json nexus channel")

    def test_TablesAreASetAndThoseThatAreMissingAreNamed(self):
        tables = self.tables(3)
        self.put(tables)
        several = parse_lines(self.export("json netns flow --host x netns nexus").out)
        self.assertEqual([*dict.fromkeys(each["kind"] for each in several)], ["nexus", "flow", "netns"])
        self.assertEqual({each["host"] for each in several}, {"x"})
        seen = self.run_on({"stats/flow": None, "nexus_channel_list": None}, "json", program=tarvelexport)
        gone = "tarvelexport: kern.tarvel.{}: No such file or directory\n".format
        self.assertEqual((seen.err, seen.status), (gone("nexus_channel_list") + gone("stats.flow"), 1))
        self.assertEqual({*KINDS} - {each["kind"] for each in parse_lines(seen.out)}, {"nexus", "channel", "flow"})
        self.assertEqual(self.run_on({"stats/flow": b""}, "json flow", program=tarvelexport), ("", "", 0))

    def test_WordsThatAreWrongAreNamed(self):
        for line, said in (
                ("", "a command is missing"), ("lines", "there is no command 'lines'"),
                ("json flw", "there is no table 'flw'"), ("json --evry 1", "json has no option --evry"),
                ("json --clickhouse", "json has no option --clickhouse"), ("schema flow", "schema takes no 'flow'"),
                ("json --every", "--every takes a time from 0.01 to 1000000"),
                ("json --every 1s", "--every takes a time from 0.01 to 1000000, not '1s'"),
                ("json --every nan", "--every takes a time from 0.01 to 1000000, not 'nan'"),
                ("json --every 0.009", "--every takes a time from 0.01 to 1000000, not '0.009'"),
                ("json --every 1 --count 0", "--count takes a number from 1 to 18446744073709551615, not '0'"),
                ("json --every 1 --count 1x", "--count takes a number from 1 to 18446744073709551615, not '1x'"),
                ("json --count 3", "--count is for --every"), ("json -o ''", "-o takes a name, not ''"),
                ("json -o f --every 1", "-o with --every takes --count"),
                ("json --capture ''", "--capture takes a directory, not ''"),
                ("json --capture d --every 1", "--every is not for --capture, which has its moments")):
            self.assertEqual(self.export(line), ("", f"tarvelexport: {said}; see tarvelexport --help\n", 64), line)
        for line in "--help", "json --help":
            seen = self.export(line)
            self.assertEqual((seen.err, seen.status, seen.out.splitlines()[-1].split()), ("", 0, KINDS))
        self.assertRegex(self.export("--version").out, r"^tarvelexport \d+\.\d+\.\d+\n$")

    def test_AWatchEndsWithItsCountItsReaderOrAnInterruptAndLeavesWholeLines(self):
        flow = make("flow", sf_pid=1)
        self.put({"stats/flow": flow})
        self.assertEqual(self.export("json flow --every 0.01 --count 3").out.count("\n"), 3)
        run = self.start("json flow --every 1000", tarvelexport)
        run.wait("}\n")
        self.assertEqual(run.end(signal.SIGINT)[1:], ("", 0))
        reader, writer = os.pipe()
        run = self.start("json flow --every 1000", tarvelexport, preexec_fn=lambda: os.dup2(writer, 1))
        os.close(writer)
        os.read(reader, 1 << 16)
        os.close(reader)  # during the wait
        self.assertEqual(run.end(), ("", "", -signal.SIGPIPE))
        self.put({"stats/flow": flow * 20_000})
        reader, writer = os.pipe()
        run = self.start("json flow", tarvelexport, preexec_fn=lambda: os.dup2(writer, 1))
        os.close(writer)
        data = os.read(reader, 1 << 16)
        run.process.send_signal(signal.SIGINT)
        while got := os.read(reader, 1 << 16):
            data += got
        self.assertEqual((run.end().status, data[-2:]), (0, b"}\n"))
        self.assertTrue(parse_lines(data.decode()))
        full = "write error: No space left on device\n"
        self.assertEqual(self.export("json flow", to="/dev/full"), ("", full, 74))

    def test_AFileIsReplacedAtOnceOrNotAtAll(self):
        self.put({"stats/flow": make("flow") * 500})
        file, link = self.directory / "file", self.directory / "link"
        link.symlink_to(file)

        def check(line, out, err="", status=1, **options):
            file.write_text("old")
            self.assertEqual(self.export(line, preexec_fn=lambda: [os.umask(0o022), *options.values()]),
                             ("", err, status))
            self.assertEqual((len(parse_lines(file.read_text())) if out else file.read_text(), link.is_symlink()),
                             (out or "old", True))
            self.assertEqual([each.name for each in self.directory.iterdir()].count("file"), 1)
            self.assertEqual([*self.directory.glob(".tarvel*")], [])

        check("json flow -o file", 500, status=0)
        self.assertEqual(file.stat().st_mode & 0o777, 0o644)
        check("json flow --every 0.01 --count 2 -o link", 1000, status=0)
        check("json flow flow_owner -o link", 500, "tarvelexport: kern.tarvel.stats.flow_owner: "
              "No such file or directory\n")
        for path, reason in ("absent/file", "No such file or directory"), (".", "no plain file"), (
                "/dev/null", "no plain file"), (f"{'d' * 200}/" * 30 + "file", "File name too long"):
            check(f"json flow -o {path}", None, f"tarvelexport: {path}: {reason}\n")
        seen = self.export("json flow -o file", preexec_fn=lambda: limit_files(5000))
        self.assertEqual((seen, file.read_text()), (("", "write error: File too large\n", 74), "old"))
        for number in signal.SIGINT, signal.SIGTERM:
            run = self.start("json flow -o file --every 1000 --count 2", tarvelexport)
            wait_for(lambda: any(each.stat().st_size for each in self.directory.glob(".tarvel*")))
            self.assertEqual((run.end(number).status, file.read_text()), (-number, "old"))
        self.assertEqual([*self.directory.glob(".tarvel*")], [])

    def test_ACaptureIsWalkedThroughAllItsMoments(self):
        root, capture = generate(self.kernel.root, "--flows", 3).root, self.directory / "saved"
        for redact, host in ("", os.uname().nodename), ("--redact", "redacted"):
            shutil.rmtree(capture, ignore_errors=True)
            done = self.start(f"capture {capture} --every 0.01 --count 3 {redact}", tarvellab).end()
            self.assertEqual(done.status, 0)
            self.kernel.root = self.directory / "elsewhere"
            lines = parse_lines(self.export(f"json flow --capture {capture}").out)
            self.kernel.root = root
            times = [*dict.fromkeys(each["time"] for each in lines)]
            note = re.search(r"time: (.*)Z", (capture / "capture.txt").read_text())[1]
            self.assertEqual((len(lines), len(times), {each["host"] for each in lines}), (9, 3, {host}))
            self.assertEqual((times[0], times), (note + ".000Z", sorted(times)))
        self.assertEqual(self.export(f"json flow --capture {capture}/proc/none").status, 1)

    def test_StatementsForClickHouseHaveEveryKey(self):
        said = self.export("schema --clickhouse")
        tables = dict(re.findall(r"^CREATE TABLE IF NOT EXISTS tarvel_(\w+)\n\((.*?)\n\)$", said.out, re.M | re.S))
        kinds = parse(self.export("schema").out)["kinds"]
        columns = {kind: re.findall(r"^    `(\w+)` (.*) COMMENT '.*'", text, re.M) for kind, text in tables.items()}
        self.assertEqual({each["kind"]: [key["key"] for key in each["keys"]] for each in kinds},
                         {kind: [name for name, _ in rows] for kind, rows in columns.items()})
        shown = {(kind, name): form for kind, rows in columns.items() for name, form in rows}
        for key, form in {
                ("flow", "time"): "DateTime64(3, 'UTC')", ("flow", "host"): "LowCardinality(Nullable(String))",
                ("flow", "nexus"): "UUID", ("flow", "bucket"): "Nullable(UInt32)", ("flow", "pid"): "Int32",
                ("flow", "flags"): "Array(LowCardinality(String))", ("flow_owner", "destroyed"): "Bool",
                ("flow", "local"): "Tuple(`address` Nullable(IPv6), `scope` Nullable(UInt16), `port` Nullable(UInt16))",
                ("provider", "instances"): "Array(UUID)", ("provider", "anonymous"): "Bool",
                ("interface", "counters"): "Map(LowCardinality(String), UInt64)", ("flow_route", "expire"): "Int64",
                ("netns", "ranges"): "Array(Tuple(`first` UInt16, `last` Nullable(UInt16), `tarvel` Int32, "
                                     "`bsd` Int32, `listeners` Int32))",
                ("arena", "processes"): "Array(LowCardinality(Nullable(String)))"}.items():
            self.assertEqual(shown[key], form)


def parse_lines(text):
    return [parse(line) for line in text.split("\n")[:-1]]
