#!/usr/bin/env python3
"""Tests that the manual says what the program and the record formats are.

usage: manual_test.py SOURCES GENERATE_COMPLETIONS TARVELLAB [unittest options]
"""
import pathlib
import re
import subprocess
import sys
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).parent / "support"))
from records import RECORDS, TABLES, load  # noqa: E402

sources, generate_completions, tarvellab = pathlib.Path(sys.argv[1]), *sys.argv[2:4]
del sys.argv[1:4]
load(pathlib.Path(tarvellab).with_name("tests") / "describe")


def sections(page, macro):
    """The text below each heading, by heading."""
    parts = re.split(rf"^\.{macro} (.*)\n", (sources / "docs" / page).read_text(), flags=re.M)
    return dict(zip(parts[1::2], parts[2::2]))


def options_in(text):
    """The options that lines of the manual name, such as `.It Fl p , -proto Ar protocol`."""
    found = set()
    for line in re.findall(r"^\.(?:It |Op )?(Fl .*)", text, flags=re.M):
        for words in re.findall(r"Fl ((?:(?![A-Z][a-z]\b).)+)", line.replace("Fl Fl ", "Fl -")):
            for word in words.split():
                found |= {"-" + word} if word.startswith("-") else {"-" + letter for letter in word if letter.isalpha()}
    return found - {"-f", "-w"}


class Commands(unittest.TestCase):
    def test_EveryCommandHasItsSectionWithItsOptionsAndNoOthers(self):
        program = {}
        with open("/dev/full", "w") as full:
            self.assertEqual(subprocess.run([generate_completions, "words"], stdout=full, stderr=subprocess.PIPE).returncode, 1)
        for line in subprocess.check_output([generate_completions, "words"], text=True).splitlines():
            command, *option = line.split()
            program.setdefault(command, set()).update(option)
        commands = sections("tarvelctl.1", "Sh")["COMMANDS"]
        page = dict(re.findall(r"^\.Ss (\S+)\n(.*?)(?=^\.Ss|\Z)", commands, flags=re.M | re.S))
        self.assertEqual(list(page), list(program))
        self.assertGreater(len(program["netstat"]), 10)
        for command, text in page.items():
            same = re.search(r"Another name for\n\.Ic (\S+)", text)
            with self.subTest(command=command):
                self.assertEqual(options_in(text) | options_in(page[same[1]] if same else ""), program[command])

    def test_LabHasItsCommandsAndOptionsAndNoOthers(self):
        page = (sources / "docs/tarvellab.1").read_text()
        usage = subprocess.run([tarvellab], capture_output=True, text=True).stderr
        names = re.findall(r"^  tarvellab (\w+)", usage, flags=re.M)
        self.assertGreater(len(names), 2)
        self.assertEqual(re.findall(r"^\.It Cm (\w+)", page, flags=re.M), names)
        self.assertEqual(options_in(page), set(re.findall(r"--[a-z]+", usage)))


class Tables(unittest.TestCase):
    text = (sources / "docs/tarvel-tables.5").read_text()

    def rows(self, text):
        return [[cell.replace("\\&", "").replace("\\-", "-") for cell in line.split(" Ta ")] for line in re.findall(r"^\.It (\d.*)", text, flags=re.M)]

    def records(self):
        """The size and the rows of each record on the page. A row has offset, size, type, field, meaning, and the names of values or counters."""
        found = re.findall(r"^\.Vt (\w+) ,\n(\d+) bytes:\n(.*?)\.El(.*?)(?=^\.Vt \w+ ,$|^\.S[hs] )", self.text, flags=re.M | re.S)
        for record, size, rows, more in found:
            names = {field: {int(number, 0): name for number, name in re.findall(r"\b(0x[\da-f]+|\d+)\s([\w-]+)", values)}
                     for field, values in re.findall(r"^\.It Va (\w+)\n((?:[^.].*\n)+)", more, flags=re.M)}
            for block, lines in re.findall(r"^\.Va (\w+) :\n(.*?)\.El", more, flags=re.M | re.S):
                names[block] = {int(at) + i: name for at, *line in self.rows(lines) for i, name in enumerate(line) if name}
            yield record, (int(size), [[int(at), int(width), *row, names.get(row[1], {})] for at, width, *row in self.rows(rows)])

    def test_RecordsAreWhatTheProgramReads(self):
        page = dict(self.records())
        parts = {size: rows for record, (size, rows) in page.items() if record not in RECORDS}
        unread = re.findall(r"^\.Va (\w+\.\w+)", self.text, flags=re.M)
        self.assertEqual(RECORDS.keys() - page.keys(), {"uuid", "ring_stat_enable"})  # shown by words alone
        for record in RECORDS.keys() & page.keys():
            shown, known = [], []
            for at, width, kind, field, meaning, names in page[record][1]:
                for part_at, *row in parts[width] if kind == "record" else ():
                    row[2] = "-" if row[2] == "-" else f"{field}.{row[2]}"
                    row[3:] = ["not read", {}] if row[2] in unread else row[3:]
                    shown.append([at + part_at, *row, meaning])
                if kind != "record":
                    shown.append([at, width, kind, field, meaning, names, ""])
            for field, row in RECORDS[record]["fields"].items():
                kind = row["type"] + (f"[{row['count']}]" if row["count"] > 1 else "")
                names = dict(enumerate(row["names"])) or {int(number): name for number, name in row["values"].items()}
                known.append([row["offset"], row["size"] * row["count"], *(("bytes", "-") if "reserved" in field else (kind, field)),
                              row["meaning"], names, row["part_meaning"]])
            with self.subTest(record=record):
                self.assertEqual((page[record][0], shown), (RECORDS[record]["size"], known))

    def test_EveryTableHasItsSection(self):
        self.assertEqual(sections("tarvel-tables.5", "Ss").keys(), TABLES.keys())

    def test_FlagsOfFlowsAndRoutesHaveTheirLetters(self):
        for command, record, field in ("flow", "tv_stats_flow", "sf_flags"), ("flow-route", "tv_stats_flow_route", "sfr_flags"):
            letters = re.findall(r"\b([a-z]) (0x\d+)", sections("tarvelctl.1", "Ss")[command])
            self.assertEqual({str(int(bit, 0)): letter for letter, bit in letters}, RECORDS[record]["fields"][field]["values"])


if __name__ == "__main__":
    unittest.main()
