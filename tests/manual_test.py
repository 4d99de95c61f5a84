"""Tests that the manual says what the programs and the record formats are."""
import json
import re
import subprocess
import unittest

from records import RECORDS, TABLES
from runs import build, tarvelexport, tarvellab, top

tool, lab, tables, readme = (
    (top / name).read_text().replace(r"\&", "").replace(r"\-", "-")
    for name in ("docs/tarvelctl.1", "docs/tarvellab.1", "docs/tarvel-tables.5", "README.md"))


def sections(page):
    """The text below each heading, by heading."""
    return dict(re.findall(r"^\.Ss (\S+)\n(.*?)(?=^\.S[hs] )", page, re.M | re.S))


def options_in(text):
    """The options that lines of the manual name, such as `.It Fl p , -proto Ar protocol`."""
    lines = " ".join(re.findall(r"^\.(?:It |Op )?Fl .*", text.replace("Fl Fl ", "Fl -"), re.M))
    words = re.findall(r"(?:(?<=Fl )|(?<=Fl \w , ))(?!Fl)[\w-]+", lines)
    return {"-" + option for word in words for option in ([word] if word[0] == "-" else word)} - {"-f", "-w"}


def rows_in(text):
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
        self.assertEqual([command for command in program if f"`{command}`" not in readme], [])

    def test_LabHasItsCommandsAndOptionsAndNoOthers(self):
        usage = subprocess.check_output([tarvellab, "--help"], text=True)
        commands, options = re.findall(r"^  tarvellab (\w+)", usage, re.M), set(re.findall(r"--[a-z]+", usage))
        self.assertTrue(commands and options)
        self.assertEqual((re.findall(r"^\.It Cm (\w+)", lab, re.M), options_in(lab)), (commands, options))

    def test_ExportHasItsOptionsAndEveryKeyInItsPlace(self):
        said, known = subprocess.run([tarvelexport, "--help"], capture_output=True, text=True).stdout, {}
        options = set(re.findall(r"^  (-[a-z-]+)", said, re.M)) | {"--help", "--version"}
        page = (top / "docs/tarvelexport.1").read_text()
        self.assertEqual(options, set(re.findall(r"^\.It (-[a-z-]+)", re.sub("Fl Fl ", "--", page).replace("Fl ", "-"),
                                                 re.M)))

        def names(keys):
            return [key["key"] for key in keys]

        for kind in json.loads(subprocess.check_output([tarvelexport, "schema"]))["kinds"]:
            known[kind["kind"]] = names(kind["keys"])[4:]
            known.update({" ".join(names(key["keys"])): names(key["keys"]) for key in kind["keys"]
                          if "keys" in key and len(key["keys"]) < 20})
        text = re.sub(r"\s+", " ", re.sub(r"^\.Va |[ ,;.]*$", "", page, flags=re.M))
        kinds = dict(re.findall(r"^\.It Cm (\w+)\n((?:\.Va .*\n)+)", page, re.M))
        for kind, keys in known.items():
            with self.subTest(kind=kind):
                shown = kinds.get(kind)
                self.assertEqual(re.findall(r"\b(?!Va\b)\w+", shown), keys) if shown else self.assertIn(kind, text)

    def test_TablesAndRecordsAreWhatTheProgramReads(self):
        self.assertEqual(sections(tables).keys(), TABLES.keys())
        self.assertEqual(RECORDS.keys() - page.keys(), {"uuid", "ring_stat_enable"})  # shown by words alone
        for record in RECORDS.keys() & page.keys():
            with self.subTest(record=record):
                self.assertEqual((page[record][0], [*shown(record)]), (RECORDS[record]["size"], [*known(record)]))

    def test_FlagsOfFlowsAndRoutesHaveTheirLetters(self):
        for command, field in ("flow", "sf_flags"), ("flow-route", "sfr_flags"):
            letters = re.findall(r"\b([a-z]) (0x\d+)", sections(tool)[command])
            known = RECORDS["tv_stats_" + command.replace("-", "_")]["fields"][field]["values"]
            self.assertEqual({str(int(bit, 0)): letter for letter, bit in letters}, known)
