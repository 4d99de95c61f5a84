#!/usr/bin/env python3
"""Tests that the manual says what the program and the record formats are.

usage: manual_test.py SOURCES GENERATE_COMPLETIONS TARVELLAB [unittest options]
"""
import pathlib
import re
import subprocess
import sys
import unittest

sources, generate_completions, tarvellab = pathlib.Path(sys.argv[1]), *sys.argv[2:4]
del sys.argv[1:4]


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
    headers = "".join(path.read_text() for path in sorted((sources / "common").rglob("*.h")))

    def rows(self, text):
        return [[cell.replace("\\&", "") for cell in line.split(" Ta ")] for line in re.findall(r"^\.It (\d.*)", text, flags=re.M)]

    def records(self):
        """(size, rows) of each record on the page; a row has offset, size, type, field and meaning."""
        found = re.findall(r"^\.Vt (\w+) ,\n(\d+) bytes:\n(\.Bl -column.*?)\.El", self.text, flags=re.M | re.S)
        return {name: (int(size), self.rows(rows)) for name, size, rows in found}

    def test_RecordsHaveTheirSizesWithoutGaps(self):
        sizes = {name: sum(int(factor) * int(other or 1) for factor, other in re.findall(r"(\d+)(?: \* (\d+))?", value))
                 for name, value in re.findall(r"static_assert\(sizeof\((\w+)\) == ([^)]*)\)", self.headers)}
        records = self.records()
        self.assertEqual(sizes.keys() - records.keys(), {"nexus_provider_parameters"})  # shown in its record
        for name, (size, rows) in records.items():
            with self.subTest(record=name):
                self.assertEqual(size, sizes.get(name, size))
                ends = [int(at) + int(width) for at, width, *_ in rows]
                self.assertEqual([int(row[0]) for row in rows], [0, *ends[:-1]])
                self.assertEqual(ends[-1], size)

    def test_FieldsHaveTheirOffsets(self):
        records = self.records()
        asserted = re.findall(r"static_assert\(offsetof\((\w+), ([\w.]+)\) == (\d+)\)", self.headers)
        self.assertGreater(len(asserted), 100)
        parts = {f"{record} {field.split('.')[0]}" for record, field, _ in asserted if "." in field}
        for record, field, offset in asserted:
            if f"{record} {field}" not in parts:  # its fields stand on the page in its place
                with self.subTest(record=record, field=field):
                    self.assertEqual([row[0] for row in records[record][1] if row[3] == field.split(".")[-1]], [offset])

    def test_EveryTableHasItsSection(self):
        nodes = re.findall(r'_node\[\] = "kern\.tarvel\.([\w.]+)"', self.headers)
        self.assertEqual(set(sections("tarvel-tables.5", "Ss")), {node.replace(".", "/") for node in nodes})

    def test_CountersHaveTheirPositions(self):
        names = (sources / "common/tables/counters.cpp").read_text()
        for block in "net_if", "flow_switch", "ip", "ip6", "tcp", "udp":
            body = re.search(rf" {block}_counter_names\[\] = {{(.*?)}};", names, flags=re.S)[1]
            place = rf"\.Ss stats/{block}\n" if block in ("net_if", "flow_switch") else rf"\.Va {block} :\n"
            lists = re.search(place + r'.*?(\.Bl -column "200".*?)\.El', self.text, flags=re.S)[1]
            shown = {}
            for at, *row in self.rows(lists):
                shown.update((int(at) + i, name) for i, name in enumerate(row) if name)
            with self.subTest(block=block):
                self.assertEqual(shown, dict(enumerate(re.findall(r'"([^"]+)"', body))))


if __name__ == "__main__":
    unittest.main()
