#!/usr/bin/env python3
"""Tests that the manual says what the programs and the record formats are.

usage: manual_test.py BUILD [unittest options]
"""
import pathlib
import re
import subprocess
import sys
import unittest

docs, build = pathlib.Path(__file__).resolve().parent.parent / "docs", pathlib.Path(sys.argv.pop(1)).resolve()
sys.path.insert(0, str(docs.parent / "tests/support"))
from records import RECORDS, TABLES, load

load(build / "tests/describe")
tool, lab, tables = ((docs / name).read_text().replace(r"\&", "").replace(r"\-", "-")
                     for name in ("tarvelctl.1", "tarvellab.1", "tarvel-tables.5"))


def sections(page):
    """The text below each heading, by heading."""
    return dict(re.findall(r"^\.Ss (\S+)\n(.*?)(?=^\.S[hs] )", page, re.M | re.S))


def options_in(text):
    """The options that lines of the manual name, such as `.It Fl p , -proto Ar protocol`."""
    lines = " ".join(re.findall(r"^\.(?:It |Op )?Fl .*", text.replace("Fl Fl ", "Fl -"), re.M))
    words = re.findall(r"(?:(?<=Fl )|(?<=Fl \w , ))(?!Fl)[\w-]+", lines)
    return {"-" + option for word in words for option in ([word] if word[0] == "-" else word)} - {"-f", "-w"}


def rows_in(text):
    """The rows of tables, each a list of cells."""
    return [line.split(" Ta ") for line in re.findall(r"^\.It (\d.*)", text, re.M)]


def names_in(text):
    """What values or counters are called, by field."""
    names = {field: {str(int(number, 0)): name for number, name in re.findall(r"\b(0x[\da-f]+|\d+)\s([\w-]+)", values)}
             for field, values in re.findall(r"^\.It Va (\w+)\n((?:[^.].*\n)+)", text, re.M)}
    for field, rows in re.findall(r"^\.Va (\w+) :\n(.*?)\.El", text, re.M | re.S):
        names[field] = {int(at) + i: name for at, *line in rows_in(rows) for i, name in enumerate(line) if name}
    return names


page = {record: (int(size), rows_in(rows), names_in(more)) for record, size, rows, more in re.findall(
    r"^\.Vt (\w+) ,\n(\d+) bytes:\n(.*?)\.El(.*?)(?=^\.Vt \w+ ,$|^\.S[hs] )", tables, re.M | re.S)}
parts = {size: record for record, (size, *_) in page.items() if record not in RECORDS}
not_read = re.findall(r"^\.Va (\w+\.\w+)", tables, re.M)


def shown(record, start=0, part="", part_meaning=""):
    """The fields of a record on the page, and those of its parts: where, how long, what, and what it means."""
    for at, width, kind, field, meaning in page[record][1]:
        place, name = (start + int(at), int(width)), part + field
        if kind == "record":
            yield from shown(parts[int(width)], place[0], name + ".", meaning)
        elif name in not_read:
            yield *place, kind, name, "not read", {}, part_meaning
        else:
            yield *place, kind, name, meaning, page[record][2].get(field, {}), part_meaning


def known(record):
    """The same, as the program knows it."""
    for field, row in RECORDS[record]["fields"].items():
        kind = row["type"] + (f"[{row['count']}]" if row["count"] > 1 else "")
        name = re.sub(r"reserved_\d+$", "-", field)
        yield (row["offset"], row["size"] * row["count"], kind if name == field else "bytes", name, row["meaning"],
               row["values"] | dict(enumerate(row["names"])), row["part_meaning"])


class Manual(unittest.TestCase):
    maxDiff = None

    def test_EveryCommandHasItsSectionWithItsOptionsAndNoOthers(self):
        generate, program, page = [build / "completions/generate_completions", "words"], {}, sections(tool)
        with open("/dev/full", "w") as full:
            self.assertEqual(subprocess.run(generate, stdout=full, stderr=subprocess.DEVNULL).returncode, 1)
        for line in subprocess.check_output(generate, text=True).splitlines():
            command, *option = line.split()
            program.setdefault(command, set()).update(option)
        same = {command: re.search(r"Another name for\n\.Ic (\S+)", text) for command, text in page.items()}
        shown = {command: options_in(page[other[1] if other else command]) for command, other in same.items()}
        self.assertEqual(list(shown.items()), list(program.items()))

    def test_LabHasItsCommandsAndOptionsAndNoOthers(self):
        usage = subprocess.run([build / "tarvellab"], capture_output=True, text=True).stderr
        commands = re.findall(r"^  tarvellab (\w+)", usage, re.M)
        self.assertIn("run", commands)
        self.assertEqual(re.findall(r"^\.It Cm (\w+)", lab, re.M), commands)
        self.assertEqual(options_in(lab), set(re.findall(r"--[a-z]+", usage)))

    def test_TablesAndRecordsAreWhatTheProgramReads(self):
        self.assertEqual(sections(tables).keys(), TABLES.keys())
        self.assertEqual(RECORDS.keys() - page.keys(), {"uuid", "ring_stat_enable"})  # shown by words alone
        for record in RECORDS.keys() & page.keys():
            with self.subTest(record=record):
                self.assertEqual((page[record][0], [*shown(record)]), (RECORDS[record]["size"], [*known(record)]))

    def test_FlagsOfFlowsAndRoutesHaveTheirLetters(self):
        for command, record, field in (("flow", "tv_stats_flow", "sf_flags"),
                                       ("flow-route", "tv_stats_flow_route", "sfr_flags")):
            letters = re.findall(r"\b([a-z]) (0x\d+)", sections(tool)[command])
            self.assertEqual({str(int(bit, 0)): letter for letter, bit in letters},
                             RECORDS[record]["fields"][field]["values"])


if __name__ == "__main__":
    unittest.main()
