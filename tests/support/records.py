"""Kernels made of files, and the records of their tables as the rows say that describe them."""
import json
import os
import pathlib
import subprocess

TABLES, RECORDS = {}, {}  # by name: the record that a table is a sequence of, and what is known of a record


def load(lab):
    """Asks the program `describe`, which is built beside the lab."""
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
        self.table, self.at, self.fields, self.followers = table, at, RECORDS[name]["fields"], {}
        self.end = self.head_end = at + RECORDS[name]["size"]
        for behind in RECORDS[name]["followers"]:
            self.followers[behind["name"]] = walk(behind["record"], table, self.end, self[behind["count"]])
            self.end = max((each.end for each in self.followers[behind["name"]]), default=self.end)

    def places(self, field):
        """Where in the table the elements of a field are."""
        row = self.fields[field]
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
        values = [self.value(self.fields[name], at) for at in self.places(name)]
        return values if self.fields[name]["count"] > 1 else values[0]

    def find(self, key, value):
        """What fields of a kind or type there are, in the record and all that belongs to it, as (row, place)."""
        for field, row in self.fields.items():
            if row["nested"]:
                yield from (found for each in self[field] for found in each.find(key, value))
            elif row[key] == value:
                yield from ((row, at) for at in self.places(field))
        yield from (found for behind in self.followers.values() for each in behind for found in each.find(key, value))


def walk(name, table, at=0, count=None):
    """So many records from there on, or as many as the table has, which ends with one."""
    found = []
    while at < len(table) if count is None else len(found) < count:
        found.append(Record(name, table, at))
        at = found[-1].end
    assert at <= len(table), f"{name}: {len(table)} bytes"
    return found


class Kernel:
    def __init__(self, root):
        self.root = pathlib.Path(root)
        self.environment = {**os.environ, "TARVEL_ROOT": str(root)}

    def path(self, table):
        return self.root / "proc/sys/kern/tarvel" / table

    def table(self, name):
        return self.path(name).read_bytes()

    def put(self, name, contents):
        self.path(name).write_bytes(contents)

    def records(self, name):
        return walk(TABLES[name], self.table(name))

    def channels(self):
        return [channel for group in self.records("nexus_channel_list") for channel in group["channels"]]

    def pids(self):
        return {record.value(row, at) for name in TABLES for record in self.records(name) for row, at in record.find("kind", "pid")}
