"""Kernels made of files, and the records of their tables, written and read by the names of their fields.

The names, and where fields are, come from the rows that describe each record. The manual says both by hand, and a test
compares the two.
"""
import ipaddress
import json
import os
import pathlib
import subprocess
import uuid

NODES = "proc/sys/kern/tarvel/"  # below the root of a kernel
TABLES, RECORDS = {}, {}  # by name: the record that a table is a sequence of, and what is known of a record


def load(describe):
    """Asks the program that prints the rows."""
    said = json.loads(subprocess.check_output([describe]))
    TABLES.update((node.removeprefix("kern.tarvel.").replace(".", "/"), name) for node, name in said["tables"].items())
    RECORDS.update(said["records"])
    for record in RECORDS.values():
        record["fields"] = {f"{row['part']}.{row['field']}".lstrip("."): row for row in record["rows"]}
        for behind in record["followers"]:
            behind["count"], = (field for field, row in record["fields"].items() if row["offset"] == behind["at"])


class Record:
    """A record where it lies in its table. By name it gives the values of its fields and lists of what follows it."""

    def __init__(self, name, table, at):
        self.about, self.table, self.at, self.followers = RECORDS[name], table, at, {}
        self.fields = self.about["fields"]
        self.end = self.head_end = at + self.about["size"]
        for behind in self.about["followers"]:
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


def encoded(row, value):
    """A value as the bytes of one element: a number, a text, a UUID or an address as it is written, or bytes."""
    if isinstance(value, int):
        order = "big" if row["type"] == "net16" else "little"
        return (value % (1 << 8 * row["size"])).to_bytes(row["size"], order)
    if isinstance(value, str):
        value = {"uuid": lambda: uuid.UUID(value).bytes, "text": value.encode,
                 "bytes": lambda: ipaddress.ip_address(value).packed}[row["type"]]()
    assert len(value) <= row["size"]
    return value


def make(name, /, **values):
    """A record with what follows it, from values by name: one, a list from the first element on, elements by number, or
    those of a part by name. What is not given is 0; what nobody reads is not, so that nobody takes it for that."""
    record = RECORDS.get(name) or RECORDS["tv_stats_" + name]
    fields, table, behind = record["fields"], bytearray(record["size"]), b""
    for follower in record["followers"]:
        each = values.pop(follower["name"], [])
        values = {follower["count"]: len(each), **values}
        behind += b"".join(each)
    given = {field: b"\xEE" * row["size"] for field, row in fields.items() if row["kind"] == "unread"}
    for field, value in values.items():
        given |= {f"{field}.{key}": v for key, v in value.items()} if field not in fields else {field: value}
    for field, value in given.items():
        row = fields[field]
        value = dict(enumerate(value)) if isinstance(value, list) else value
        for number, each in value.items() if isinstance(value, dict) else [(0, value)]:
            data = encoded(row, each)
            at = row["offset"] + number * row["size"]
            table[at:at + len(data)] = data
    return bytes(table) + behind


class Kernel:
    def __init__(self, root):
        self.root = pathlib.Path(root)
        self.environment = {**os.environ, "TARVEL_ROOT": str(root)}

    def path(self, table):
        return self.root / NODES / table

    def table(self, name):
        return self.path(name).read_bytes()

    def put(self, name, contents):
        """Publishes a table: who reads along gets the old one or the new one. None takes it away."""
        if contents is None:
            return self.path(name).unlink(missing_ok=True)
        self.path(name).parent.mkdir(parents=True, exist_ok=True)
        (self.root / "unpublished").write_bytes(contents)
        (self.root / "unpublished").rename(self.path(name))

    def process(self, pid, name):
        """Gives a process a name, which its file ends with a line end."""
        (self.root / f"proc/{pid}").mkdir(parents=True, exist_ok=True)
        (self.root / f"proc/{pid}/comm").write_text(name + "\n")

    def records(self, name):
        return walk(TABLES[name], self.table(name))

    def pids(self):
        records = (record for name in TABLES for record in self.records(name))
        return {record.value(row, at) for record in records for row, at in record.find("kind", "pid")}
