"""Tests of the completions, typed into those shells that are here."""
import os
import pty
import re
import select
import shlex
import shutil
import subprocess
import uuid

from records import make
from runs import Case, build

# Beside its two providers, the kernel has names that would like to be commands, or to be taken for other lines.
ids = [str(uuid.UUID(int=0xABCDEF << 100 | number)).upper() for number in range(4)]
names = ["$(touch hurt)`touch hurt`;touch hurt\n\tinstance $(touch hurt)",
         f'x",\n"uuid":"$(touch hurt)",\n"uuid":"{ids[0]}'[:64]]
providers = b"".join(make("nexus_provider_record", provider_uuid=provider, name=name, name_length=64,
                          instances=[uuid.UUID(instance).bytes])
                     for provider, instance, name in zip(ids, ids[2:], names))

commands = ("channel flow flow-adv flow-owner flow-route flow-switch interface memory netns provider show tree "
            "channel-stats list-providers netstat").split()

# What is typed behind the program's name, and what the last word of it may become. Empty: it stays as it is.
cases = [
    ("", commands),
    ("NET", ["netns", "netstat"]),
    ("-", ["-f", "-w"]),
    ("-w 1 -f net:b flow-r", ["flow-route"]),
    ("netns -", ["-a", "--all", "-i", "--ip", "-p", "--proto", "-f", "-w"]),
    ("flow -", ["-n", "-f", "-w"]),
    ("NetStat --flow-o", ["--flow-owner"]),
    ("netns -p ", ["tcp", "udp"]),
    ("netns --proto=t", ["--proto=tcp"]),
    ("netns -i g", ["global"]),
    ("netns --ip fe80::", ["fe80::1"]),
    ("netns -i ", ["global", "10.0.0.9", "fe80::1"]),
    ("netstat -asp ", ["ip", "ip6", "tcp", "udp"]),
    ("netstat -s -w 3 --per-protocol u", ["udp"]),
    ("netstat -s -pudp t", []),
    ("netstat --uuid ", ids[2:]),
    ("netstat --flow --uuid=" + ids[2], ["--uuid=" + ids[2]]),
    ("netstat --pid ", []),
    ("tree " + ids[1][:35].lower(), ids),
    ("-f x tree " + ids[1], [ids[1]]),
    ("tree '$(touch hurt)'", []),
    ("-f wi", ["with blanks.log"]),
    ("flow -n -f wi", ["with blanks.log"]),
    ("channel wi", []),
]

# The same of the lab.
lab_options = """--providers --nexuses --channels --rings --flows --stacks --arenas --namespaces --processes --seed
    --host --incident --after --help""".split()
lab_cases = [
    ("", "generate simulate run capture".split()),
    ("--", ["--help", "--version"]),
    ("capture --", ["--every", "--count", "--redact", "--help"]),
    ("generate k --", lab_options),
    ("capture --every ", []),
    ("run --incident l", ["list", "lossy-link", "lookup-miss", "leak"]),
    ("simulate f", ["folder"]),
    ("run f", ["folder"]),
    ("run --flows 3 -- tarvelc", ["tarvelctl"]),
    ("run -- tarvelctl net", ["netns", "netstat"]),
    ("run folder -- tarvelctl -w 1 netns --proto=t", ["--proto=tcp"]),
    ("run -- tarvelctl tree " + ids[1][:35], ids),
]

export_cases = [
    ("", ["json", "schema"]),
    ("json -", ["-o", "--every", "--count", "--host", "--capture", "--help"]),
    ("json flow flow_", ["flow_advisory", "flow_owner", "flow_route", "flow_switch"]),
    ("json -o wi", ["with blanks.log"]),
    ("json --capture f", ["folder"]),
    ("json --every ", []),
    ("schema --c", ["--clickhouse"]),
]

# How a shell is started, and what it reads then. Control-G inserts everything that could stand there, the command
# writes down how the shell reads the line then, and the shell says when it is ready for the next.
command = """tarvelctl() { (IFS=@; printf '%s\\n' "$*" >>../typed); }
tarvellab() { tarvelctl "$@"; }; tarvelexport() { tarvelctl "$@"; }; PS1=
"""
start_ups = {
    "bash": ("--noprofile --rcfile ../.bashrc -i", """for each in ctl lab export; do . $MADE/tarvel$each.bash; done
PROMPT_COMMAND='printf "<%s>" ready'
bind 'set bell-style none' '"\\C-g": insert-completions'"""),
    "zsh": ("-di", """precmd() { printf '<%s>' ready }; unsetopt beep prompt_cr prompt_sp
for each in ctl lab export; do cp $MADE/tarvel$each.zsh ../_tarvel$each; done
fpath=($PWD/.. $fpath); autoload -U compinit; compinit -u -d ../dump
zle -C all-matches complete-word _generic; bindkey '^G' all-matches
zstyle ':completion:all-matches:*' insert yes
zstyle ':completion:all-matches::::' completer _all_matches _complete"""),
}


class Completions(Case):
    def setUp(self):
        super().setUp()
        self.top, self.means = self.directory, {}
        netns = b"".join(make("netns", address=each, address_length=size, protocol=6)
                         for each, size in (("10.0.0.9", 4), ("fe80::1", 16)))
        self.put({"nexus_provider_list": providers, "nexus_channel_list": b"", "stats/flow": b"", "stats/netns": netns})
        (self.top / "work/folder").mkdir(parents=True)
        (self.top / "work/with blanks.log").touch()
        self.options = {"cwd": self.top / "work", "env": {
            "PATH": f"{self.top}:{build}:{os.environ['PATH']}", "MADE": str(build / "completions"), "TERM": "dumb",
            "HOME": str(self.top), "TARVEL_ROOT": str(self.kernel.root), "LC_ALL": "C.UTF-8"}}

    def typed(self, shell, lines):
        """What a shell on a terminal makes of each line."""
        options, start_up = start_ups[shell]
        (self.top / f".{shell}rc").write_text(command + start_up)
        terminal, its = pty.openpty()
        process = subprocess.Popen([shell, *options.split()], stdin=its, stdout=its, stderr=its,
                                   start_new_session=True, **self.options)
        self.addCleanup(process.kill)
        for line in *(f"{line}\a\n" for line in lines), "exit\n":
            seen = b""
            while b"<ready>" not in seen:
                self.assertTrue(select.select([terminal], [], [], 20)[0], seen)
                seen += os.read(terminal, 4096)
            os.write(terminal, line.encode())
        process.wait(20)
        return [line.split("@") for line in (self.top / "typed").read_text().splitlines()[-len(lines):]]

    def listed(self, lines):
        """What fish says could stand at the end of each line."""
        ask = """source $MADE/tarvelctl.fish; source $MADE/tarvellab.fish; source $MADE/tarvelexport.fish
            for line in $argv; complete -C "$line"; printf '\\0'; end"""
        fish = ["fish", "--no-config", "-c", ask, *lines]
        answer = subprocess.check_output(fish, stderr=subprocess.STDOUT, text=True, timeout=60, **self.options)
        self.assertNotRegex(answer, r"\t.*[^\w(),.\n -]")  # nor does what a word means drive the shell
        self.means.update(re.findall(r"(.*)\t(.*)", answer))
        return [re.findall(r"^[^\t\n]+?(?=/?$|\t)", words, re.M) for words in answer.split("\0")[:-1]]

    def check(self, cases, program="tarvelctl"):
        lines = [f"{program} {line}" for line, _ in cases]
        for shell in filter(shutil.which, ("bash", "zsh", "fish")):
            made = self.listed(lines) if shell == "fish" else self.typed(shell, lines)
            for (line, expected), words in zip(cases, made, strict=True):
                *before, last = [""] if shell == "fish" else shlex.split(line + "''")  # fish leaves the line alone
                with self.subTest(shell=shell, line=line):
                    self.assertEqual(words[:len(before)] + sorted(words[len(before):]),
                                     before + sorted(expected or filter(None, [last])))

    def test_EveryWordIsCompletedAndNothingIsRun(self):
        self.check(cases)
        self.check(lab_cases, "tarvellab")
        self.check(export_cases, "tarvelexport")
        if shutil.which("fish"):
            meant = {ids[1]: "nexus_provider x", ids[2]: "nexus of touchhurttouchhurttouchhurt",
                     "--redact": "put substitutes for addresses and names"}
            self.assertEqual({**self.means, **meant}, self.means)
        self.assertFalse((self.top / "work/hurt").exists())

    def test_ToolThatDoesNotAnswerIsGivenUp(self):
        (self.top / "tarvelctl").write_text("#!/bin/sh\nexec sleep 100\n")
        (self.top / "tarvelctl").chmod(0o755)
        self.check([("tree ", [])])
