#!/usr/bin/env python3
"""Tests of the completions, typed into the shells themselves.

usage: completions_test.py SHELL SCRIPT PROGRAM_DIRECTORY [unittest options]
"""
import os
import pathlib
import pty
import select
import shlex
import shutil
import struct
import subprocess
import sys
import tempfile
import unittest
import uuid

shell, script, programs = sys.argv[1:4]
del sys.argv[1:4]

# Beside its two providers, the kernel has names that would like to be commands, or to be taken for other lines.
ids = [str(uuid.UUID(int=0xABCDEF << 100 | number)).upper() for number in range(4)]
names = ["$(touch hurt)`touch hurt`;touch hurt\n\tinstance $(touch hurt)", f'x",\n"uuid":"$(touch hurt)",\n"uuid":"{ids[0]}'[:64]]
tree_ids, nexus_ids = sorted(ids), sorted(ids[2:])

commands = ("channel flow flow-adv flow-owner flow-route flow-switch interface memory netns provider show tree "
            "channel-stats list-providers netstat").split()
everywhere = ["-f", "-w"]

# What is typed behind the program's name, and what the last word of it may become. Empty: it stays as it is.
cases = [
    ("", commands),
    ("net", ["netns", "netstat"]),
    ("NETN", ["netns"]),
    ("nothing", []),
    ("-", everywhere),
    ("-w 1 -f net netst", ["netstat"]),
    ("netns -", ["-a", "--all", "-i", "--ip", "-p", "--proto"] + everywhere),
    ("NetNS --p", ["--proto"]),
    ("provider -", ["-D", "--details"] + everywhere),
    ("flow -", ["-n"] + everywhere),
    ("netstat --flow-o", ["--flow-owner"]),
    ("netns -p ", ["tcp", "udp"]),
    ("netns -a --proto t", ["tcp"]),
    ("netns --proto=t", ["--proto=tcp"]),
    ("netns -i g", ["global"]),
    ("netstat -s -p ", ["ip", "ip6", "tcp", "udp"]),
    ("netstat -s -w 3 --per-protocol u", ["udp"]),
    ("netstat -asp t", ["tcp"]),
    ("netstat -s -pudp t", []),
    ("tree ", tree_ids),
    ("tree " + ids[1][:35].lower(), tree_ids),
    ("-f x tree " + ids[1], [ids[1]]),
    ("netstat --uuid ", nexus_ids),
    ("netstat --flow --uuid=" + ids[2], ["--uuid=" + ids[2]]),
    ("netstat --pid ", []),
    ("tree '$(touch hurt)'", []),
    ("-f wi", ["with blanks.log"]),
    ("flow -n -f wi", ["with blanks.log"]),
    ("-f a:b flow-r", ["flow-route"]),
    ("channel wi", []),
]

# What each shell reads at its start. Control-G inserts everything that could stand there, the command writes down
# how the shell reads the line then, and the shell says when it is ready for the next.
ready = b"<ready>"
start_up = {
    "bash": """tarvelctl() { (IFS=@; printf '%s\\n' "$*" >>../typed); }
PS1=; PROMPT_COMMAND='printf "<%s>" ready'; . SCRIPT
bind 'set bell-style none' '"\\C-g": insert-completions'""",
    "zsh": """tarvelctl() { (IFS=@; printf '%s\\n' "$*" >>../typed) }
PS1=; precmd() { printf '<%s>' ready }; unsetopt beep prompt_cr prompt_sp
fpath=($PWD/../functions $fpath); autoload -U compinit; compinit -u -d ../dump
zle -C all-matches complete-word _generic; bindkey '^G' all-matches
zstyle ':completion:all-matches:*' insert yes
zstyle ':completion:all-matches::::' completer _all_matches _complete""",
}


class Terminal:
    """A shell on a terminal of its own."""

    def __init__(self, command, **options):
        self.master, slave = pty.openpty()
        self.process = subprocess.Popen(command, stdin=slave, stdout=slave, stderr=slave, start_new_session=True, **options)
        os.close(slave)

    def type(self, text):
        os.write(self.master, text.encode())

    def wait_for(self, text):
        seen = b""
        while text not in seen:
            ready = select.select([self.master], [], [], 20)[0]
            assert ready, f"no {text} in {seen}"
            seen += os.read(self.master, 4096)

    def close(self):
        self.process.kill()
        self.process.wait()
        os.close(self.master)


class Completions(unittest.TestCase):
    def setUp(self):
        self.top = pathlib.Path(tempfile.mkdtemp(prefix="completions_test"))
        self.addCleanup(shutil.rmtree, self.top)
        self.directory = self.top / "work"
        for name in "work", "home", "functions", "kernel/proc/sys/kern/tarvel/stats":
            (self.top / name).mkdir(parents=True)
        (self.directory / "with blanks.log").touch()
        shutil.copy(script, self.top / "functions/_tarvelctl")
        tables = self.top / "kernel/proc/sys/kern/tarvel"
        for name in "nexus_channel_list", "stats/flow":
            (tables / name).touch()
        (tables / "nexus_provider_list").write_bytes(b"".join(
            uuid.UUID(ids[i]).bytes + bytes(48) + struct.pack("64sI", name.encode(), 64) + bytes(124) +
            struct.pack("II", 1, 0) + uuid.UUID(ids[2 + i]).bytes for i, name in enumerate(names)))
        self.environment = {"PATH": f"{programs}:{os.environ['PATH']}", "TARVEL_ROOT": str(self.top / "kernel"),
                            "HOME": str(self.top / "home"), "TERM": "dumb", "LC_ALL": "C.UTF-8"}

    def typed(self, lines):
        """What the shell makes of each line."""
        rc = self.top / "start_up"
        rc.write_text(start_up[shell].replace("SCRIPT", script))
        command = {"bash": ["bash", "--noprofile", "--rcfile", rc, "-i"], "zsh": ["zsh", "-dfi"]}[shell]
        terminal = Terminal(command, cwd=self.directory, env=self.environment)
        self.addCleanup(terminal.close)
        if shell == "zsh":
            terminal.type(f". {rc}\n")
        for line in lines:
            terminal.wait_for(ready)
            terminal.type(f"tarvelctl {line}\a\n")
        terminal.wait_for(ready)
        return [line.split("@") for line in (self.top / "typed").read_text().splitlines()]

    def listed(self, lines):
        """What fish says could stand at the end of each line."""
        ask = f"source {script}; for line in $argv; complete -C \"tarvelctl $line\"; printf '\\0'; end"
        answer = subprocess.run(["fish", "--no-config", "-c", ask, *lines], cwd=self.directory, env=self.environment,
                                capture_output=True, text=True, timeout=60, check=True)
        self.assertEqual(answer.stderr, "")
        return [words.splitlines() for words in answer.stdout.split("\0")[:-1]]

    def check(self, cases):
        lines = [line for line, _ in cases]
        made = self.listed(lines) if shell == "fish" else self.typed(lines)
        for (line, expected), words in zip(cases, made, strict=True):
            if shell != "fish":  # which leaves the line alone
                *before, last = shlex.split(line + "''")
                before, words = words[:len(before)], words[len(before):]
                self.assertEqual(before, shlex.split(line)[:len(before)])
                expected = expected or list(filter(None, [last]))
            with self.subTest(line=line):
                self.assertEqual(sorted(words), sorted(expected))

    def test_EveryWordIsCompletedAndNothingIsRun(self):
        self.check(cases)
        self.assertFalse((self.directory / "hurt").exists())

    def test_ToolThatDoesNotAnswerIsGivenUp(self):
        tool = self.top / "tarvelctl"
        tool.write_text("#!/bin/sh\nexec sleep 100\n")
        tool.chmod(0o755)
        self.environment["PATH"] = f"{self.top}:{self.environment['PATH']}"
        self.check([("tree ", [])])


if __name__ == "__main__":
    unittest.main()
