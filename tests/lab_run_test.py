"""generate, simulate and run: what tables hold and how they move, what a command gets, and what is left behind."""
import hashlib
import itertools
import os
import pathlib
import pty
import re
import resource
import shlex
import shutil
import signal

from records import NODES, TABLES
from runs import LabCase, files, generate, hidden, limit_files, preloaded, remove, tarvellab, wait_for

# Options of kernels, how many intervals they have moved, and a digest of all their files. On every machine and with
# every compiler it is the same; a change of the simulated world renews it.
DIGESTS = (("", 90, "161d6e404628d8e7"), ("--stacks 0 --arenas 0 --namespaces 0", 0, "547c0a3f9895bffd"),
           ("--providers 30 --nexuses 77 --channels 500 --rings 0 --flows 4000 --stacks 90 --arenas 41 --namespaces 25"
            " --processes 50", 1, "f1527711c36e28c3"),
           ("--interval 200 --flows 3000 --namespaces 200 --rings 3", 30, "7af4a0d633365f80"),
           ("--providers 2400 --channels 3000 --flows 3000 --rings 4", 1, "25233c7bc70e9901"),
           ("--channels 400 --nexuses 60 --processes 1", 2, "82afa6ef2e0ef613"))


class Kernels(LabCase):
    def test_SameSeedSameKernelAndNothingOfAnother(self):
        for options, intervals, expected in DIGESTS:
            kernel = self.simulated(f"--seed 7 {options}", intervals, late=300)
            made = files(kernel.root)
            self.check(kernel)
            with self.subTest(options):
                self.assertEqual(hashlib.sha256(repr(made).encode()).hexdigest()[:16], expected)
        made = generate(self.directory / "made", "--seed", 7)
        self.assertEqual(files(self.simulated("--seed 7", 0).root), files(made.root))

    def test_NothingStandsOrMovesOnNothing(self):
        for size in "providers", "nexuses", "channels", "processes", "flows":
            self.check(self.simulated(f"--{size} 0", 3))
            self.assertEqual(self.kernel.table("stats/flow"), b"", size)

    def check(self, kernel):
        """Tables agree: pids have names, and UUIDs are those of instances."""
        groups, providers = map(kernel.records, ("nexus_channel_list", "nexus_provider_list"))
        instances = [each["uuid"] for provider in providers for each in provider["instances"]]
        self.assertEqual(instances, [group["nexus_uuid"] for group in groups])
        named = {record.value(row, at) for records in map(kernel.records, TABLES) for record in records
                 for row, at in record.find("name", "nexus")}
        self.assertLessEqual(named, {*instances})
        self.assertLessEqual(kernel.pids() - {0}, {int(path.parent.name) for path in kernel.root.glob("proc/*/comm")})

    def test_WrongWordsAreUsageErrors(self):
        wrong = """
nothing|run|run --|run a b -- true|generate ''|generate a --|generate a --flows -1|generate a --flows 1x
|generate a --flows 10000001|generate --seed 1|generate a --flows 99999999999|generate a --seed x
|generate a --seed 18446744073709551616|generate a --interval 50|generate a --every 1|generate a --count 1
|generate a --redact|generate a --incident nope|generate a --incident leak@x|generate a --incident leak@-1
|generate a --host ''|generate a --after 86401|simulate a --after 1|simulate a --interval 9
|simulate a --interval 3600001|simulate a --redact|capture|capture a b|capture a --host b|capture --redact
|capture --every 1 a|capture --count 2 a|capture a --count 2 --every|capture --every 1 --count 0 a
|capture --every 1 --count 10000001 a|capture --every 1 --count a""".replace("\n", "").split("|")
        wrong += [f"capture a --count 2 --every {each}" for each in "0 0.009 3600.01 -1 nan inf 1e1 1s ''".split()]
        for words in wrong:
            seen = self.lab(words)
            self.assertEqual((seen.out, seen.status), ("", 64), words)
            self.assertRegex(seen.err, "^tarvellab: .*; see tarvellab --help\n$")
        self.assertEqual([path.name for path in self.directory.iterdir()], ["kernel"])
        # Diagnostics do without a descriptor of their own.
        few = self.lab("nope", preexec_fn=lambda: [os.close(0), resource.setrlimit(resource.RLIMIT_NOFILE, (3, 3))])
        self.assertEqual(few, self.lab("nope"))
        for words in ("generate a --seed 0", "generate a --seed 18446744073709551615", "generate a --rings 1024",
                      "generate a --channels 0 --flows 10000000", "run --interval 3600000 -- true",
                      "capture b --every 0.01 --count 1", "capture c --every 3600 --count 10000000"):
            self.assertNotEqual(self.lab(words).status, 64, words)

    def test_AUsageErrorNamesWhatIsWrongAndHelpIsNone(self):
        for words, said in (("", "a command is missing"), ("'n\x1bpe'", "there is no command 'n\x1bpe'"),
                            ("capture a --seed 1", "capture has no option --seed"),
                            ("generate a --rings 1025", "--rings takes 0 to 1024, not '1025'"),
                            ("generate a --flows", "--flows takes 0 to 10000000"),
                            ("generate a -v", "generate has no option -v"), ("generate", "generate takes a directory"),
                            ("generate a b", "generate takes one directory, and 'b' cannot be it"),
                            ("capture a --count 2", "--count and --every go together"),
                            ("run --flows 1", "run takes a command, behind --"),
                            ("run a --flows 1 -- true", "--flows is for a kernel to be made, and a is there")):
            self.assertEqual(self.lab(words), ("", f"tarvellab: {said}; see tarvellab --help\n", 64))
        terminal = self.lab(["n\x1bpe"], to="terminal", merged=True).out
        self.assertEqual(terminal, "tarvellab: there is no command 'n?pe'; see tarvellab --help\n")
        whole, own = self.lab("--help"), self.lab("capture k --count --help x")
        self.assertEqual((whole.err, own.err, whole.status, own.status), ("", "", 0, 0))
        self.assertTrue({*own.out.splitlines()} < {*whole.out.splitlines()})
        self.assertEqual(re.findall("--[a-z]+", own.out), ["--help", "--version", "--every", "--count", "--redact"])
        headings = re.findall("options of (.*):", whole.out)
        self.assertEqual(headings, ["generate simulate run", "generate", "simulate run", "capture"])
        self.assertEqual(self.lab("run -- sh -c 'echo $0' --help").out, "--help\n")
        self.assertRegex(self.lab("--version").out, r"^tarvellab \d+\.\d+\.\d+\n$")
        for words in "--help", "--version":
            self.assertEqual(self.lab(words, to="/dev/full").status, 74)

    def test_WhatCannotBeWrittenIsNamed(self):
        made, flow, comm = self.kernel.root, NODES + "stats/flow", "proc/94/comm"
        rows = [(path, os.mkdir, "Is a directory") for path in (flow, comm)]
        rows += [(path, make, "Not a directory") for path in ("proc/94", "proc", "")
                 for make in (pathlib.Path.touch, lambda place: place.symlink_to("nowhere"))]
        for (path, make, reason), command in itertools.product(rows, ("generate", "simulate")):
            (made / path).parent.mkdir(parents=True, exist_ok=True)
            make(made / path)
            self.assertEqual(self.lab([command, made]), ("", f"tarvellab: {made / path}: {reason}\n", 1))
            self.assertEqual(hidden(made), [])
            remove(made)
        for size, path in (0, r"proc/\d+/comm"), (1000, NODES + ".*"):
            seen = self.lab(["generate", made], preexec_fn=lambda: limit_files(size))
            self.assertRegex(seen.err, f"^tarvellab: {made}/{path}: File too large\n$")
            self.assertEqual((seen.status, hidden(made)), (1, []))

    def test_WhatLiesInTheWayOfATemporaryFileStays(self):
        folder, flows = generate(self.kernel.root).path(""), self.kernel.table("stats/flow")

        def plant():  # without random numbers the name is known
            (folder / f".nexus_provider_list.{os.getpid()}").hardlink_to(folder / "stats/flow")
        seen = self.lab(["generate", self.kernel.root, "--seed", 2], preexec_fn=plant,
                        environment=preloaded("no_entropy"))
        self.assertEqual(seen, ("", f"tarvellab: {folder}/nexus_provider_list: File exists\n", 1))
        self.assertEqual(self.kernel.table("stats/flow"), flows)

    def simulate(self, *options):
        run = self.start(["simulate", self.kernel.root, *options], tarvellab)
        run.wait(f"simulating in {self.kernel.root}\n")
        return run

    def test_ReadersMeetWholeTablesOnly(self):
        run, folder = self.simulate("--interval", 10, "--flows", 20000), self.kernel.path("stats")
        sizes, moments, names = set(), set(), set()

        def has_moved():
            moments.add((folder / "flow").stat().st_ino)
            sizes.add(len(self.kernel.records("stats/flow")))
            names.update(name for name in os.listdir(folder) if name.startswith(".flow."))
            [self.kernel.records(name) for name in ("nexus_provider_list", "nexus_channel_list", "stats/flow_adv")]
            return min(len(sizes), len(moments), len(names)) > 3  # no two new files have one name
        wait_for(has_moved)
        self.assertEqual((run.end(signal.SIGINT).status, hidden(self.kernel.root)), (0, []))

    def test_ATerminalSeesLongWorkAndNothingOfItStays(self):
        def made(line, to="terminal", **clock):
            return self.lab(line.format("--flows 100000"), to=to, merged=True,
                            environment=preloaded("no_entropy", WAITS="3", **{"TICK": "1000", **clock}))
        wipe, line = "\r" + " " * 39 + "\r", r"(?:making flow \d+ of 100000|writing \w+: \d+ MB)\r"
        out = made("generate {} k", TICK="100").out
        self.assertRegex(out, f"^({line}{wipe})+$")
        self.assertIn("writing flow", out)
        first, second = [int(each) // 4096 for each in re.findall(r"making flow (\d+)", out)]
        self.assertEqual((first, second - first), (18, 3))  # 2 s, and 0.25 s with a look at the clock more
        self.assertRegex(made("simulate {} k").out, f"^({line}{wipe})+simulating in k\n$")
        self.assertEqual([made("generate {} k", "pipe"), made("run {} -- true")], [("", "", 0)] * 2)
        seen = made("generate {} k", LOOKS="9")
        self.assertRegex(seen.out, f"^({line}{wipe})+$")
        self.assertEqual(seen.status, -signal.SIGINT)

    def test_EndsWhereItCannotGoOn(self):
        self.assertEqual(self.lab("simulate made", to="/dev/full"), ("", "write error: No space left on device\n", 74))
        run, proc = self.simulate("--interval", 10), self.kernel.root / "proc"
        proc.rename(self.directory / "gone")
        seen = run.end()
        self.assertEqual((seen.err.splitlines()[0], seen.status), (f"tarvellab: {proc}: No such file or directory", 1))


class Run(LabCase):
    def setUp(self):
        super().setUp()
        self.temporary = self.directory / "temporary"
        self.temporary.mkdir()
        self.addCleanup(self.wait_until_nothing_is_left)

    def run_lab(self, *words, program=tarvellab, **options):
        options["environment"] = {"TMPDIR": str(self.temporary), **options.get("environment", {})}
        return self.start(["run", *words], program, **options)

    def wait_until_nothing_is_left(self):
        mark = f"TMPDIR={self.temporary}"
        wait_for(lambda: not any(self.temporary.iterdir()) and mark not in
                 self.start(["-c", "cat /proc/[0-9]*/environ 2>&1"], "/bin/sh").end().out)

    def test_EndsAsTheCommandDid(self):
        def ignore():
            for number in signal.SIGCHLD, signal.SIGTERM:
                signal.signal(number, signal.SIG_IGN)
        commands = {"true": 0, "sh -c 'exit 7'": 7, "no-such-command": 127, "/dev/null": 126,
                    "sh -c 'kill -KILL $$'": -9, "env --default-signal=TERM sh -c 'kill -TERM $$'": -15}
        for command, prepare in itertools.product(commands, (None, ignore)):
            seen = self.run_lab("--", *shlex.split(command), preexec_fn=prepare).end()
            self.assertEqual(seen.status, commands[command], command)
        self.assertEqual(self.lab("run none -- true"), ("", "tarvellab: none: No such file or directory\n", 1))

    def test_ACommandGetsWhatItsCallerHas(self):
        def prepare():
            signal.pthread_sigmask(signal.SIG_BLOCK, {signal.SIGUSR1})
            signal.signal(signal.SIGTERM, signal.SIG_IGN)
            os.close(0)
        generate(self.kernel.root, "--providers", 3)
        for words in ["ls", "/proc/self/fd"], ["grep", "-E", "Sig(Blk|Ign|Cgt)", "/proc/self/status"]:
            given = self.start(words[1:], shutil.which(words[0]), preexec_fn=prepare).end()
            for options in [], ["kernel"]:
                self.assertEqual(self.run_lab(*options, "--", *words, preexec_fn=prepare).end(), given)
        seen = self.run_lab("kernel", "--", "sh", "-c", "cd /; echo $TARVEL_ROOT").end()
        self.assertEqual(seen.out, f"{self.kernel.root.resolve()}\n")

    def test_TemporaryDirectoryIsTheCallersOrTheSystems(self):
        for name, parent in (self.temporary, self.temporary), ("", "/tmp"), (".", f"{self.directory}/."):
            words = "--", "sh", "-c", "stat -c '%n %a' $TARVEL_ROOT"
            seen = self.run_lab(*words, environment={"TMPDIR": str(name)}).end()
            self.assertRegex(seen.out, f"^{parent}/tarvellab-...... 700\n$")
            self.assertFalse(os.path.exists(seen.out.split()[0]))
        seen = self.run_lab("--", "true", environment={"TMPDIR": "/none"}).end()
        self.assertRegex(seen.err, "^tarvellab: /none/tarvellab-......: No such file or directory\n$")
        full = self.run_lab("--", "true", preexec_fn=lambda: limit_files(1000)).end()
        self.assertEqual((seen.status, full.status, full.err.count("File too large")), (1, 1, 1))

    def test_TarvelctlIsTheOneBesideIt(self):
        other, copied = self.directory / "tarvelctl", self.directory / "copied/tarvellab"
        other.write_text("#!/bin/sh\necho other\n")
        other.chmod(0o700)
        copied.parent.mkdir()
        shutil.copy(tarvellab, copied)
        path = {"PATH": f"{self.directory}:{os.environ['PATH']}"}
        seen = self.run_lab("--", "tarvelctl", "provider", environment=path).end()
        self.assertEqual((seen.err, seen.out.count("com.example."), seen.status), ("", 9, 0))
        self.assertEqual(self.run_lab("--", "tarvelctl", program=copied, environment=path).end(), ("other\n", "", 0))

    def test_SignalsArePassedOn(self):
        for number in signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT:
            for trap, status in (f"trap 'exit 9' {int(number)}; ", 9), ("", -number):
                run = self.run_lab("--interval", 20, "--", "sh", "-c", trap + "echo ready; while :; do sleep .01; done")
                run.wait("ready")
                self.assertEqual(run.end(number).status, status)

            def signalled():
                signal.pthread_sigmask(signal.SIG_BLOCK, {number})
                os.kill(os.getpid(), number)
            self.assertEqual(self.run_lab("--", "echo", "seen", preexec_fn=signalled).end(), ("", "", -number))

    def test_TheTerminalInterruptsTheCommandOnceAndTheSimulationNever(self):
        script = f"""n=0; trap 'n=$((n+1))' INT; echo ready; while [ $n = 0 ]; do sleep .01; done
            f=$TARVEL_ROOT/{NODES}stats/flow; for each in 1 2 3; do i=$(stat -c %i $f)
            until [ $i != $(stat -c %i $f) ]; do sleep .01; done; done; echo moved, $n times"""
        process, terminal = pty.fork()
        if process == 0:
            os.environ["TMPDIR"] = str(self.temporary)
            os.execv(tarvellab, [tarvellab, "run", "--interval", "20", "--", "sh", "-c", script])
        output = b""
        while b"times" not in output:
            output += os.read(terminal, 1000)
            if b"ready" in output and b"^C" not in output:
                os.write(terminal, b"\3")
        self.assertEqual(os.waitstatus_to_exitcode(os.waitpid(process, 0)[1]), 0)
        os.close(terminal)
        self.assertIn(b"moved, 1 times", output)

    def test_TheSimulationDoesNotOutliveAKilledRun(self):
        run = self.run_lab("--interval", 20, "--", "sh", "-c", "echo $$; exec sleep 60")
        run.wait("\n")
        run.process.kill()
        os.kill(int(run.out), signal.SIGKILL)
        self.assertEqual(run.end().status, -signal.SIGKILL)
