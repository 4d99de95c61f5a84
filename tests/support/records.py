"""The records of the kernel's tables, as the rows say that describe them: the program `describe` prints those."""
import json
import pathlib
import subprocess

TABLES, RECORDS = {}, {}  # by name: the record that a table is a sequence of, and what is known of a record


def load(lab):
    """Asks the program that is built beside the lab."""
    said = json.loads(subprocess.check_output([pathlib.Path(lab).with_name("tests") / "describe"]))
    TABLES.update((node.removeprefix("kern.tarvel.").replace(".", "/"), name) for node, name in said["tables"].items())
    RECORDS.update(said["records"])
    for record in RECORDS.values():
        record["fields"] = {f"{row['part']}.{row['field']}".lstrip("."): row for row in record["rows"]}
        for behind in record["followers"]:
            behind["count"], = (field for field, row in record["fields"].items() if row["offset"] == behind["at"])


class Record:
    """A record where it lies in its table. By name it gives the values of its fields and lists of what follows it."""

    def __init__(self, name, table, at):
        self.table, self.at, self.known, self.followers = table, at, RECORDS[name], {}
        self.end = self.head_end = at + self.known["size"]
        for behind in self.known["followers"]:
            self.followers[behind["name"]] = [self.follow(behind["record"]) for _ in range(self[behind["count"]])]

    def follow(self, name):
        found = Record(name, self.table, self.end)
        self.end = found.end
        return found

    @property
    def bytes(self):
        return self.table[self.at:self.head_end]

    def places(self, field):
        """Where in the table the elements of a field are."""
        row = self.known["fields"][field]
        return range(self.at + row["offset"], self.at + row["offset"] + row["size"] * row["count"], row["size"])

    def value(self, row, at):
        held = self.table[at:at + row["size"]]
        if row["type"] == "record":
            return Record(row["nested"], self.table, at)
        if row["type"] == "text":
            return held.split(b"\0")[0].decode()
        if row["type"] in ("bytes", "uuid"):
            return held
        return int.from_bytes(held, "big" if row["type"] == "net16" else "little", signed=row["type"][0] == "i")

    def __getitem__(self, name):
        if name in self.followers:
            return self.followers[name]
        values = [self.value(self.known["fields"][name], at) for at in self.places(name)]
        return values if self.known["fields"][name]["count"] > 1 else values[0]

    def find(self, key, value):
        """What fields of a kind or type there are, in the record and all that belongs to it, as (row, place)."""
        for field, row in self.known["fields"].items():
            if row["nested"]:
                for each in self[field]:
                    yield from each.find(key, value)
            elif row[key] == value:
                yield from ((row, at) for at in self.places(field))
        for behind in self.followers.values():
            for each in behind:
                yield from each.find(key, value)


def walk(name, table):
    """The records of a table, which it is full of."""
    found, at = [], 0
    while at < len(table):
        found.append(Record(TABLES[name], table, at))
        at = found[-1].end
    assert at == len(table), f"{name}: {len(table)} bytes"
    return found
