#!/usr/bin/env python3
"""Puts every byte value and what terminals obey into every text, of tables, processes and name services alike.

On a terminal each byte that it might obey shows as "?" and nothing else moves; a pipe and a file get the bytes as they
are. Which bytes that are follows from what Python knows of characters, in UTF-8 or where each byte is one. The
expectation is a report in which the same texts are harmless, with the bytes put in.
"""
import functools
import os
import pathlib
import pty
import re
import struct
import subprocess
import sys
import tty
import unicodedata

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from records import TABLES  # noqa: E402
from torture import Torture  # noqa: E402

# With how many texts on a kernel of one provider, three channels and two flows, at least.
COMMANDS = {"channel": 3, "flow": 4, "flow-adv": 2, "flow-owner": 2, "flow-route -n": 1, "flow-route": 3, "flow-switch": 1,
            "interface": 1, "memory": 4, "netstat -a": 8, "netstat -s": 2, "provider -D": 1, "show": 2, "tree": 6}
SEQUENCES = (b"\x1b[31m", b"\x9b31m", b"\xc2\x9b31m", b"\x1b[2J\x1b[1;1H", b"\x1b[6n", b"\x1b[?1049h", b"\x1b]52;c;QQ==\x07",
             b"\x9d52;c;QQ\x9c", b"\xc2\x9d52;c;Q\xc2\x9c", b"\x1b]0;t\x07", b"\x1b]2;t\x1b\\", b"\x9d0;t\x9c", b"\x1bP$q\"p\x1b\\", b"\x90$qm\x9c",
             b"\xc2\x90$qm\xc2\x9c", b"\x1bc", b"\x1b#8", b"\x1bZ", b"\x1b_t\x1b\\", b"\x1b^t\x1b\\", b"\x8e\x8f\x0e\x0f",
             b"a\r\nb\x85\t\b\x7f", b"\xc0\x9b\xe0\x80\x9b", b"\xed\xa0\x80\xf4\x90\x80\x80", b"\xf0\x9f\x9b\x1b\xe2\x80")
# What UTF-8 is made of, and what comes near it.
PIECES = (*(character.encode() for character in "a\u0085\u00e4\u20ac\u2027\u2028\u202e\u2066\u206a\U0001f9ed"),
          *(bytes([value]) for value in b"\x80\x9f\xa0\xbf\xc2\xe0\xe2\xed\xf0\xf4\xf8"))
HARMLESS = b"~"  # a character in every locale, and nowhere else in a report
REORDERING = ("LRE", "RLE", "PDF", "LRO", "RLO", "LRI", "RLI", "FSI", "PDI")


def texts(torture):
    """Texts of 16 bytes, of which a process name takes 15."""
    alphabet = bytes([*range(1, 256), 0])
    yield from (alphabet[at:at + 15].ljust(15, b".") + b"x" for at in range(0, 256, 15))
    yield from (sequence.ljust(16, b".") for sequence in (SEQUENCES if torture.long else torture.random.sample(SEQUENCES, 6)))
    for _ in range(1000 if torture.long else 10):
        yield b"".join(torture.random.choices(PIECES, k=16))[:16]
    if torture.long:
        for value in alphabet:
            yield from (bytes([value]), bytes([value]).ljust(16, b"."), bytes([value]).rjust(15, b"."), bytes([value]) * 16)


def fill(kernel, tables, text):
    """Makes it the text of everything; one of 16 bytes goes on to the end of its field."""
    for name, records in tables.items():
        table = bytearray(records[0].table)
        for record in records:
            for row, at in record.find("type", "text"):
                table[at:at + row["size"]] = (text * (row["size"] // 16) if len(text) == 16 else text).ljust(row["size"], b"\0")
            if name == "nexus_provider_list":
                struct.pack_into("<I", table, record.places("name_length")[0], 64)
        kernel.put(name, bytes(table))
    for name in kernel.root.glob("proc/*/comm"):
        name.write_bytes(text[:15] + b"\n")
    kernel.environment["NAME_SERVICES_ANSWER"] = os.fsdecode(text.split(b"\0")[0] * 3)


def on_terminal(torture, kernel, line, locale="C"):
    reader, terminal = pty.openpty()
    tty.setraw(terminal)  # line ends arrive as they were written
    process = subprocess.Popen([torture.options.tarvelctl, *line.split()], env={**kernel.environment, "LC_ALL": locale},
                               stdout=terminal, stderr=terminal)
    os.close(terminal)
    shown = b""
    try:
        while got := os.read(reader, 65536):
            shown += got
    except OSError:  # how a terminal ends
        pass
    os.close(reader)
    torture.runs += 1
    return shown, process.wait()


def on_utf8_terminal(torture, kernel, line):
    return on_terminal(torture, kernel, line, "C.UTF-8")


def on_pipe(torture, kernel, line):
    seen = torture.run(kernel, line)
    return seen.out + seen.err, seen.status


def in_file(torture, kernel, line):
    path = os.path.join(torture.directory.name, "report")
    seen = torture.run(kernel, f"-f {path} {line}")
    return pathlib.Path(path).read_bytes() + seen.out + seen.err, seen.status


def hidden(text, charset="latin-1"):
    """Without controls, separators of lines, what reorders a text, and strays, which Python makes surrogates of."""
    def show(character):
        whole = character.encode(charset, "surrogateescape")
        is_obeyed = unicodedata.category(character) in ("Cc", "Cs", "Zl", "Zp") or unicodedata.bidirectional(character) in REORDERING
        return b"?" * len(whole) if is_obeyed else whole
    return b"".join(map(show, text.decode(charset, "surrogateescape")))


def main():
    torture = Torture("terminal", __doc__)
    kernel = torture.make_kernel("--providers", 2, "--channels", 6, "--flows", 2, "--arenas", 1, "--processes", 2)
    kernel.environment.update(torture.name_services())
    tables = {name: kernel.records(name) for name in TABLES}
    sinks = {on_terminal: hidden, on_utf8_terminal: functools.partial(hidden, charset="utf-8"), on_pipe: bytes,
             **({in_file: bytes} if torture.long else {})}
    harmless = {}
    for text in texts(torture):
        shown = text.split(b"\0")[0]
        if len(shown) not in harmless:
            fill(kernel, tables, HARMLESS * len(shown))
            harmless[len(shown)] = {(command, sink): sink(torture, kernel, command) for command in COMMANDS for sink in sinks}
            for command, least in COMMANDS.items():
                (report, _), (plain, _) = (harmless[len(shown)][command, sink] for sink in (on_terminal, on_pipe))
                count = len(re.findall(HARMLESS + b"+", plain))
                torture.expect(command, "harmless texts on a terminal, without colours", re.sub(rb"\x1b\[3?[016]m", b"", report), plain)
                torture.expect(command, "how many texts there are, at least", min(count, least), least if shown else 0)
        fill(kernel, tables, text)
        for (command, sink), (report, status) in harmless[len(shown)].items():
            expected = re.sub(HARMLESS + b"+", lambda run: sinks[sink]((shown * 4)[:len(run[0])]), report)
            torture.faults += 1
            torture.expect(command, f"the text {text!r}, {sink.__name__}", sink(torture, kernel, command), (expected, status))
    torture.end()


if __name__ == "__main__":
    main()
