"""capture, and run on a capture: what is saved, shown again, refused and hidden."""
import os
import re
import shutil
import signal
import time

from records import NODES, RECORDS, TABLES, Kernel, make, walk
from runs import LabCase, files, generate, hidden, limit_files, preloaded, remove, tarvellab, top, wait_for

FLOW, NAME = NODES + "stats/flow", "proc/94/comm"
DATE = "%Y-%m-%dT%H:%M:%SZ"
HOST = os.uname().nodename
GONE = "tarvellab: no table can be read: No such file or directory\n"
NOTE = "tarvellab: saved holds addresses and process names; --redact replaces them\n"
COUNTS = "saved in saved: moments {} of {}, tables {} of {}, names {}, bytes {}\n"


def link_out(path):
    path.symlink_to("/dev/zero")


class CaptureCase(LabCase):
    def setUp(self):
        super().setUp()
        self.saved = Kernel(self.directory / "saved")

    def moments(self):
        return [*self.saved.root.glob("moments/[0-9]*")]

    def capture(self, line="", out=None, err=NOTE, status=0, **options):
        """Captures anew. The counts that are printed are those of the files."""
        shutil.rmtree(self.saved.root, ignore_errors=True)
        seen = self.lab(f"capture saved {line}", **options)
        roots = [self.saved.root, *self.moments()]
        tables, names = ([each.stat().st_size for root in roots for each in root.glob(what) if each.is_file()]
                         for what in ("proc/sys/**/*", "proc/*/comm"))
        counts = COUNTS.format(len(roots), len(roots), len(tables), 12 * len(roots), len(names), sum(tables))
        self.assertEqual(seen, (counts if out is None else out, err, status))

    def replay(self, *command, **options):
        return self.lab(["run", self.kernel.root, "--", *command], **options)

    def moment(self, offset, flow=b"", name=b"same\n"):
        """A moment of a capture by hand, the first where there is no offset; None takes a file away."""
        root = self.kernel.root / "moments" / offset if offset else generate(self.kernel.root, "--flows", 3).root
        if offset:
            shutil.copytree(self.kernel.root / "proc", root / "proc")
        else:
            (root / "capture.txt").write_text("format: 1\nhost: time: a\ntime: noon\n")
        for path, content in (root / FLOW, flow), (root / NAME, name):
            path.unlink(missing_ok=True)
            content is None or path.write_bytes(content)
        return root


class Capture(CaptureCase):
    def test_ACaptureIsTheKernelForItsOwnerOnly(self):
        kernel = generate(self.kernel.root)
        kernel.process(12345, "of no one's interest")
        names = sorted(f"proc/{pid}/comm" for pid in kernel.pids() - {0})
        for path, name in zip(names, (b"sixteen bytes ..", b"", b"\n", b"a\nb\n", b"\x1b[2J\xff\n")):
            (kernel.root / path).write_bytes(name)
        before = time.strftime(DATE, time.gmtime())
        self.saved.root.mkdir(0o755)
        self.assertEqual(self.lab("capture saved").err, NOTE)
        modes = {(path.is_dir(), path.stat().st_mode & 0o777)
                 for path in [self.saved.root, *self.saved.root.rglob("*")]}
        self.assertEqual(modes, {(True, 0o700), (False, 0o600)})
        made, saved = files(kernel.root), files(self.saved.root)
        note = saved.pop("capture.txt").decode()
        said = re.fullmatch(f"format: 1\ntime: (.*)\nhost: {HOST}\nredacted: no\n", note)[1]
        self.assertTrue(before <= said <= time.strftime(DATE, time.gmtime()))
        made[names[0]] = b"sixteen bytes .\n"
        self.assertEqual(saved, {path: made[path] for path in made if path in names and made[path] or NODES in path})
        shown = self.start("flow -n").end()._replace(err=f"tarvellab: this is {HOST} at {said}\n")
        self.assertEqual(self.lab("run saved -- tarvelctl flow -n"), shown)
        self.capture()

    def test_NothingIsOverwrittenAndWhatCannotBeReadIsLeftOut(self):
        self.capture("", "", GONE, 1)
        self.assertFalse(self.saved.root.exists())
        made = files(generate(self.kernel.root).root)
        for place, reason in ("kernel", "Directory not empty"), (tarvellab, "Not a directory"):
            self.assertEqual(self.lab(f"capture {place}"), ("", f"tarvellab: {place}: {reason}\n", 1))
        self.assertEqual(files(self.kernel.root), made)
        flow = self.kernel.path("stats/flow")
        flow.unlink()
        left_out = "tarvellab: kern.tarvel.stats.flow is left out"
        self.capture("", None, f"sysctl for len failed, No such file or directory\n{left_out}\n{NOTE}", 1)
        os.mknod(flow)
        os.truncate(flow, 17 << 20)
        self.capture("", None, f"{left_out}: mostly holes\n{NOTE}", 1)
        flow.write_bytes(bytes(17 << 20))  # large, and all there
        self.capture()

    def test_MomentsAreTakenAtTheirTimes(self):
        generate(self.kernel.root)
        self.capture("--every .5 --count 4", environment=preloaded("no_entropy", LATE="700"))
        # Each is .7 s late; the next that can be reached is the one after the next.
        self.assertEqual(sorted(path.name for path in self.moments()), ["1.200", "2.200", "3.200"])

    def test_ATerminalSeesHowFarALongCaptureHasCome(self):
        generate(self.kernel.root)
        wipe = "\r" + " " * 39 + "\r"
        told = "moment 3 of 4 in 1 s\r", "moment 4 of 4 in 2 s\r", "moment 4 of 4 in 1 s\r"
        for to, lines in ("terminal", [each + wipe for each in told]), ("pipe", []):
            seen = self.lab(f"capture {to} --every 1.5 --count 4", to=to, merged=True,
                            environment=preloaded("no_entropy"))
            note = NOTE.replace("saved", to)
            self.assertEqual(seen.out.partition("saved in")[0], note + "".join(lines))

    def test_WhatEndsACaptureLeavesTheMomentsSoFar(self):
        def take_away(run):
            self.kernel.root.rename(self.directory / "gone")
            run.wait(GONE)
            time.sleep(.1)  # is said once
            run.process.send_signal(signal.SIGTERM)
        for act, err in ((take_away, f"((?!{GONE}).*\n)*{GONE}"),
                         (lambda run: run.process.send_signal(signal.SIGINT), ""),
                         (lambda run: self.kernel.put("stats/flow", bytes(3200)), ".*/flow: File too large\n")):
            self.put(dict.fromkeys(TABLES, b""))
            run = self.start("capture saved --every .02 --count 1000", tarvellab, preexec_fn=lambda: limit_files(1000))
            wait_for(lambda: len(self.moments()) > 1)
            act(run)
            seen, count = run.end(), len(self.moments()) + 1
            self.assertEqual(seen[::2], (COUNTS.format(count, 1000, 12 * count, 12 * count, 0, 0), 1))
            self.assertRegex(seen.err, f"^{NOTE}{err}$")
            self.assertEqual(hidden(self.saved.root), [])
            shutil.rmtree(self.saved.root)


class Replay(CaptureCase):
    def test_ACommandSeesEachMomentInItsTime(self):
        temporary, order = self.directory / "temporary", self.directory / "order"
        temporary.mkdir()
        self.moment("", b"1" * 320, b"first\n")
        self.moment("3.200", b"2" * 640, None)
        self.moment("3.300", None, b"third\n")
        # All come a quarter of the first interval early: the second moment here before that of a shorter, later one.
        other = shutil.copytree(self.kernel.root, self.directory / "other")
        (other / "moments/3.200").rename(other / "moments/3.000")
        shutil.copytree(self.kernel.root / "proc", other / "moments/0.100/proc")
        script = f"""r=$TARVEL_ROOT; cd $r; echo $r; cat {NAME}; f=$r/{FLOW} n=$r/{NAME}; wc -c <$f
                     while [ -e $n ]; do sleep .01; done; echo $0 >>{order}; wc -c <$f
                     while [ -e $f ]; do sleep .01; done; cat $n; wc -c <{FLOW}"""
        began = time.monotonic()
        runs = [self.start(["run", root, "--", "sh", "-c", script, root.name], tarvellab,
                           environment={"TMPDIR": str(temporary)}) for root in (self.kernel.root, other)]
        wait_for(order.exists)
        self.assertGreaterEqual(time.monotonic() - began, 2.4)
        for run in runs:
            seen = run.end()
            self.assertRegex(seen.out, f"^{temporary}/tarvellab-....../moment\nfirst\n320\n640\nthird\n320\n$")
            self.assertEqual(seen[1:], ("tarvellab: this is time: a at noon\ntarvellab: the last moment is shown\n", 0))
        self.assertEqual((order.read_text(), [*temporary.iterdir()]), ("kernel\nother\n", []))

    def test_WhatIsNoMomentDoesNotCount(self):
        root = self.moment("")
        for name in ("1e1.000 -1.000 0.000 .000 99999999999999999999.000 999999999999999999999999999999 x .new 0.1"
                     " nan.000 0.1000 0.x00 000000000001.000").split():
            self.moment(name)
        (root / "moments/0.100").touch()
        self.assertEqual(self.replay("sh", "-c", "echo $TARVEL_ROOT").out, f"{root}\n")
        (root / "moments/0.010").mkdir()  # without any table
        self.moment("99999999999.000")  # never comes
        (root / "capture.txt").write_text("format: 1\n")
        seen = self.replay("sh", "-c", "while [ -e $TARVEL_ROOT/proc ]; do sleep .01; done")
        self.assertEqual(seen, ("", "tarvellab: this is unknown at unknown\n", 0))

    def test_OtherFormatsAreRefused(self):
        note, newer = self.moment("") / "capture.txt", "format {} is newer than this program, which knows 1"
        unknown = "", "format: 0", "format: -1", "format: \x1b", "a format: 1", "x" * 10**6 + "\nformat: 1"
        for content, said in (("format: 2\n", newer.format(2)), ("a: b\nformat: " + "9" * 20, newer.format("9" * 20)),
                              *((text, "does not state the capture's format") for text in unknown),
                              *((make, "Invalid argument") for make in (os.mkfifo, os.mkdir, link_out))):
            remove(note)
            note.write_text(content) if isinstance(content, str) else content(note)
            self.assertEqual(self.replay("echo", "seen"), ("", f"tarvellab: {note}: {said}\n", 1))

    def test_OnlyFilesAreReplayed(self):
        root, deepest = self.moment(""), self.moment("0.100") / NODES / "stats/more"
        for place, *makes in ([root / "proc/94/more"], [root / "moments/more"], [root / "more"], [deepest, os.mkdir]):
            for put in os.mkfifo, link_out, lambda path: (path / "x/x/x/x/x/x/x/x").mkdir(parents=True), *makes:
                put(place)
                seen = self.replay("echo", "seen")
                self.assertRegex(seen.err, f"^tarvellab: {place}(/x)*: no part of a capture\n$")
                self.assertEqual(seen[::2], ("", 1))
                remove(place)
        os.truncate(root / FLOW, 17 << 20)
        self.assertEqual(self.replay("echo"), ("", f"tarvellab: {root / FLOW}: mostly holes\n", 1))
        (root / FLOW).write_bytes(bytes(17 << 20))  # large, and all there
        self.assertEqual(self.replay("echo", "seen").out, "seen\n")

    def test_PathsDoNotDriveTheTerminal(self):
        self.kernel.root = self.directory / "gr\u00f6\u00dfe\u202e\x1b\x07"
        (self.kernel.root / "proc").mkdir(parents=True)
        (self.kernel.root / "proc/\x07").symlink_to(".")
        for locale, name in ("C", "gr\u00f6\udcc3?e\udce2?\udcae??"), ("C.UTF-8", "gr\u00f6\u00dfe?????"):
            seen = self.replay("true", to="terminal", merged=True, environment={"LC_ALL": locale})
            self.assertEqual(seen.out, f"tarvellab: {self.directory}/{name}/proc/?: no part of a capture\n")


KEPT = "identifier", "number", "gauge", "counter", "flags", "enumeration", "boolean", "pid"
WORDS = {"process": {b"process"}, "name": {b"provider", b"arena", b"region"}, "interface": {b"en", b"bridge"}}
# Fields of tables, and what they hold, each with what stands in its place.
SUBSTITUTES = """
stats/netns address 10.0.0.1 240.0.0.1 10.0.0.2 240.0.0.2 10.0.0.1 240.0.0.1 127.0.0.9 127.0.0.9 0.0.0.0 0.0.0.0
255.255.255.255 255.255.255.255 224.0.0.251 239.0.0.1 169.254.7.7 169.254.0.1 169.253.0.1 240.0.0.3 239.255.0.1
239.0.0.2 223.255.0.1 240.0.0.4 2001:db8::7 3fff::1 :: :: ::1 ::1 fe80:4::7 fe80:4::3fff:0:0:2 fe80::7
fe80::3fff:0:0:2 febf::7 fe80::3fff:0:0:3 ff02:5::fb ff02:5::3fff:0:0:4 ff01:5::fb ff01:5::3fff:0:0:5 ff05:5::fb
ff05::3fff:0:0:6 fec0::7 3fff::7 ::ffff:10.0.0.2 ::ffff:240.0.0.2 ::2 3fff::8 1::1 3fff::9
stats/flow_owner sfo_if_name en0 en1 en01 en2 EN0 if1 en if2 7 if3 enx00 if4 enp0s31f6 if5 bond0 bond1 bridge9
bridge1 eth1 eth1 gif0 gif1 ipsec2 ipsec1 lo0 lo1 pdp_ip3 pdp_ip1 ppp0 ppp1 tap0 tap1 tun4 tun1 utun9 utun1 vlan7 vlan1
wl0 wl1 wlan0 wlan1 wlan1 wlan2 en0 en1
stats/flow_owner sfo_proc_name browser process1 com.example.bro process2 com.example.browser process2
com.example.brO process3 Browser process4 browser process1
stats/flow_route sfr_mac 010203040506 030000000001 020203040506 020000000002 ffffffffffff ffffffffffff 000000000000
000000000000 ffffffffff00 030000000003 010203040506 030000000001
nexus_provider_list name com.example.en0 provider1 en0 provider2 com.example.en0 provider1"""
# Tables, what is chosen in their records, and what then says nothing.
SILENT = """
stats/flow sf_local.family=2 sf_local.ipv6 sf_remote.ipv6
stats/flow sf_local.family=30 sf_local.ipv4 sf_remote.ipv4
stats/flow sf_local.family=3 sf_local.ipv4 sf_remote.ipv4 sf_local.ipv6 sf_remote.ipv6 sf_local.port sf_remote.port
stats/flow_route sfr_remote.family=2 sfr_flags=160 sfr_local.ipv6 sfr_remote.ipv6 sfr_gateway.ipv6
stats/flow_route sfr_remote.family=30 sfr_flags=127 sfr_local.ipv4 sfr_remote.ipv4 sfr_gateway.ipv4 sfr_mac
stats/flow_route sfr_remote.family=2 sfr_flags=223 sfr_gateway.ipv4 sfr_gateway.ipv6
stats/netns address_length=5 address"""


def rows(text):
    """Lists of words, each of which begins with a table."""
    found = []
    for word in text.split():
        found.append([word]) if word in TABLES else found[-1].append(word)
    return found


class Redact(CaptureCase):
    def redact(self, name, table, err="", status=0):
        self.put({**dict.fromkeys(TABLES, b""), name: table})
        self.capture("--redact", err=err, status=status)
        return self.saved.table(name)

    def held(self, kernel, kind):
        """What all fields of a kind hold, and, where they are names of processes, the files of these."""
        names = [*kernel.root.glob("proc/*/comm")] if kind == "process" else []
        return [each.rstrip(b"\n\0") for each in [path.read_bytes() for path in sorted(names)] + [
            record.table[at:at + row["size"]] for name in TABLES for record in kernel.records(name)
            for row, at in record.find("kind", kind) if row["field"] != "name_length"]]

    def test_WhatSaysNothingIsCleared(self):
        for name, *words in rows(SILENT):
            record = RECORDS[TABLES[name]]["fields"]
            chosen = {field: int(value) for field, _, value in (word.partition("=") for word in words) if value}
            noise = {field: b"\xCC" * record[field]["size"] for field in words if "=" not in field}
            seen, expected = (self.redact(name, make(TABLES[name], **chosen, **more)) for more in (noise, {}))
            self.assertEqual(seen, expected, words)
        zero, entry = (make("flow_adv_entry", sfae_flags=flags, sfae_flow_uuid=bytes([flags] * 16)) for flags in (0, 3))
        shown = "region_uuid", "type", "seg_count", "mem_total", "mem_wired"
        fields = [field for field in RECORDS["tv_stats_region"]["fields"] if field not in shown]
        region = make("region", **dict.fromkeys(fields, b"\xCC"))
        for name, noisy, silent in (
                ("flow_adv", make("flow_adv", entries=[entry] * 513), make("flow_adv", entries=[zero] * 513)),
                ("arena", make("arena", pids=[5, 6, 0, 7], regions=region), make("arena", pids=[5, 6]))):
            seen, expected = (self.redact("stats/" + name, table) for table in (noisy, silent))
            self.assertEqual(seen, expected)
        # And what nobody reads, and what is behind the ends of texts.
        made = generate(self.kernel.root)
        self.capture("--redact", err="")
        before = files(self.saved.root / "proc")
        for name in TABLES:
            table = bytearray(made.table(name))
            for record in made.records(name):
                for row, at in [*record.find("type", "text"), *record.find("kind", "unread")]:
                    start, end = at if row["kind"] == "unread" else table.index(0, at) + 1, at + row["size"]
                    table[start:end] = b"\xCC" * (end - start)
            made.put(name, bytes(table))
        self.capture("--redact", err="")
        self.assertEqual(files(self.saved.root / "proc"), before)

    def test_TheManualNamesWhatIsKept(self):
        page = re.findall(r"^\.It Vt (.*)\n((?:[^.].*\n)+)", (top / "docs/tarvellab.1").read_text(), flags=re.M)
        manual = {record: re.findall(r"[\w.]+", fields) for records, fields in page for record in records.split(" , ")}
        for name, record in RECORDS.items():
            for field, row in record["fields"].items():
                kept = row["kind"] in KEPT and field != "name_length"
                if row["kind"] not in ("unread", "nested"):
                    self.assertEqual(kept, field in manual[name] or row["part"] in manual[name], (name, field))

    def test_NoOriginalIsLeftAnywhere(self):
        originals, made = {b"box.made"}, generate(self.kernel.root, "--flows", 300, "--seed", 3, "--host", "box.made")
        self.capture("--redact --every .05 --count 3", err="")
        saved = files(self.saved.root)
        for root in self.moments():
            self.assertEqual(files(root / "proc"), files(self.saved.root / "proc"))
        for kind in KEPT:
            self.assertEqual(self.held(self.saved, kind), self.held(made, kind))
        for kind in "process", "interface", "name", "address", "mac":
            was, now = self.held(made, kind), self.held(self.saved, kind)
            pairs = {*zip(was, now, strict=True)}  # the same stands for the same, and for nothing else
            self.assertEqual(len({*now}), len(pairs))
            if kind in WORDS:
                self.assertEqual({each.rstrip(b"0123456789") for each in now} - {b""}, WORDS[kind])
            if kind != "interface":
                originals |= {each for text in was for each in (text, text[-8:]) if any(each[:-1])}
        self.assertGreater(len(originals), 200)
        self.assertEqual([each for each in originals if each in b" ".join(saved.values())], [])
        # What was redacted stays so; what lies below it is another's.
        for number, root in enumerate([self.saved.root, *self.moments()]):
            self.assertEqual(self.lab(f"capture again{number}", kernel=Kernel(root)).err, "")
            note = (self.directory / f"again{number}/capture.txt").read_text()
            self.assertRegex(note, "host: redacted\nredacted: yes\n$")
        self.kernel = generate(self.saved.root / "a/kernel")
        self.assertIn("addresses", self.lab("capture other").err)

    def test_SubstitutesAreOfTheKindOfTheirOriginals(self):
        more = {"address": lambda text: {"address_length": 16 if ":" in text else 4},
                "name": lambda text: {"name_length": len(text)},
                "sfr_mac": lambda text: {"sfr_mac": bytes.fromhex(text), "sfr_flags": 0x80}}
        for name, field, *texts in rows(SUBSTITUTES):
            values = [{field: text, **more.get(field, lambda text: {})(text)} for text in texts]
            records = [make(TABLES[name], **each) for each in values]
            tables = self.redact(name, b"".join(records[::2])), b"".join(records[1::2])
            seen, expected = ([[each[key] for key in values[0]] for each in walk(TABLES[name], table)]
                              for table in tables)
            self.assertEqual(seen, expected)

    def test_WhatCannotBeDecodedIsLeftOut(self):
        secret, entry = b"secret".ljust(64, b"\0"), make("channel_entry", tx=[make("ring_stats")])
        for name, table, kept in (
                ("stats/arena", secret, 0), ("stats/flow", bytes(640) + secret, 640), ("stats/flow_owner", secret, 0),
                ("nexus_channel_list", bytes(16) + b"\2".ljust(8, b"\0") + entry + secret[:40], 24 + len(entry)),
                ("stats/netns", bytes(32) + make("netns", ranges=[secret[:32]])[:-1], 32),
                ("stats/flow_adv", bytes(40) + secret[:36] + b"\xff" * 4 + secret, 40),
                ("nexus_provider_list", secret * 4 + b"\xff" * 8 + secret, 0), ("ring_stat_enable", b"\1secret", 1)):
            node = "kern.tarvel." + name.replace("/", ".")
            seen = self.redact(name, table, f"tarvellab: {node} is cut: the rest of it cannot be redacted\n", 1)
            self.assertEqual((len(seen), b"secret" in seen), (kept, False), name)
            self.capture()
            self.assertEqual(self.saved.table(name), table)
