// Prints what is known of every table as one JSON document, for tests that are no C++.

#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include "common/tables/tables.h"

namespace {

constexpr const char *types[] = {"u8",  "u16",  "net16", "u32",   "u64",   "i32",
                                 "i64", "text", "uuid",  "bytes", "record"};
constexpr const char *kinds[] = {"unread", "identifier",  "number", "gauge",   "counter",
                                 "flags",  "enumeration", "pid",    "process", "interface",
                                 "name",   "address",     "mac",    "nested"};

static_assert(std::size(types) == static_cast<std::size_t>(field_type::record) + 1);
static_assert(std::size(kinds) == static_cast<std::size_t>(field_kind::nested) + 1);

std::string said(std::string_view text) {
  return '"' + std::string(text) + '"';
}
std::string said(std::size_t number) {
  return std::to_string(number);
}

std::string list(const std::vector<std::string> &items) {
  std::string text;
  for (const std::string &item : items) text += (text.empty() ? "" : ", ") + item;
  return '[' + text + ']';
}

std::string object(const std::vector<std::pair<std::string, std::string>> &members) {
  std::string text;
  for (const auto &[key, value] : members) text += (text.empty() ? "" : ", ") + said(key) + ": " + value;
  return '{' + text + '}';
}

std::string described(const row &field) {
  std::vector<std::pair<std::string, std::string>> values;
  for (const auto &[number, name] : field.values)
    values.emplace_back(std::to_string(number), said(name.view()));
  for (std::size_t i = 0; field.flags && i < field.flags->count; ++i) {
    const auto &[bit, name] = field.flags->entries[i];
    values.emplace_back(std::to_string(bit), said(name.view()));
  }
  std::vector<std::string> names;
  for (std::size_t i = 0; field.names && i < field.count; ++i) names.push_back(said(field.names[i].name()));
  return object({{"field", said(field.field)},
                 {"part", said(field.part)},
                 {"offset", said(field.offset)},
                 {"size", said(field.size)},
                 {"count", said(field.count)},
                 {"type", said(types[static_cast<int>(field.type)])},
                 {"kind", said(kinds[static_cast<int>(field.kind)])},
                 {"name", said(field.name)},
                 {"meaning", said(field.meaning)},
                 {"part_meaning", said(field.part_meaning)},
                 {"unit", said(field.unit)},
                 {"nested", said(field.nested ? field.nested->name : "")},
                 {"values", object(values)},
                 {"names", list(names)}});
}

void describe(const record_description &what, std::map<std::string, std::string> &records) {
  std::vector<std::string> rows, followers;
  for (const row &field : what.rows) {
    rows.push_back(described(field));
    if (field.nested) describe(*field.nested, records);
  }
  for (const follower &each : what.followers) {
    followers.push_back(object(
        {{"name", said(each.name)}, {"at", said(each.count.offset)}, {"record", said(each.each->name)}}));
    describe(*each.each, records);
  }
  records[std::string(what.name)] =
      object({{"size", said(what.size)}, {"rows", list(rows)}, {"followers", list(followers)}});
}

}  // namespace

int main() {
  std::map<std::string, std::string> records;
  std::vector<std::pair<std::string, std::string>> tables;
  for (const table_description &table : all_tables) {
    tables.emplace_back(table.node, said(table.record->name));
    describe(*table.record, records);
  }
  std::printf("{\"tables\": %s,\n\"records\": %s}\n", object(tables).c_str(),
              object({records.begin(), records.end()}).c_str());
}
