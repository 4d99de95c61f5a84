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

std::string quoted(std::string_view text) {
  return '"' + std::string(text) + '"';
}

std::string list(char open, const std::vector<std::string> &items, char close) {
  std::string text(1, open);
  for (const std::string &item : items) text += (text.size() > 1 ? ", " : "") + item;
  return text + close;
}

std::string values_of(const row &field) {
  std::vector<std::string> found;
  for (const named_value &each : field.values) {
    found.push_back(quoted(std::to_string(each.number)) + ": " + quoted(each.name.view()));
  }
  for (std::size_t i = 0; field.flags && i < field.flags->count; ++i) {
    const auto &each = field.flags->entries[i];
    found.push_back(quoted(std::to_string(each.bit)) + ": " + quoted(each.name.view()));
  }
  return list('{', found, '}');
}

std::string names_of(const row &field) {
  std::vector<std::string> found;
  for (std::size_t i = 0; field.names && i < field.count; ++i) found.push_back(quoted(field.names[i].name()));
  return list('[', found, ']');
}

std::string described(const row &field) {
  return list(
      '{',
      {"\"field\": " + quoted(field.field), "\"part\": " + quoted(field.part),
       "\"offset\": " + std::to_string(field.offset), "\"size\": " + std::to_string(field.size),
       "\"count\": " + std::to_string(field.count),
       "\"type\": " + quoted(types[static_cast<int>(field.type)]),
       "\"kind\": " + quoted(kinds[static_cast<int>(field.kind)]), "\"name\": " + quoted(field.name),
       "\"meaning\": " + quoted(field.meaning), "\"part_meaning\": " + quoted(field.part_meaning),
       "\"unit\": " + quoted(field.unit), "\"nested\": " + quoted(field.nested ? field.nested->name : ""),
       "\"values\": " + values_of(field), "\"names\": " + names_of(field)},
      '}');
}

void describe(const record_description &what, std::map<std::string, std::string> &records) {
  std::vector<std::string> rows, followers;
  for (const row &field : what.rows) {
    rows.push_back(described(field));
    if (field.nested) describe(*field.nested, records);
  }
  for (const follower &each : what.followers) {
    followers.push_back(
        list('{',
             {"\"name\": " + quoted(each.name), "\"at\": " + std::to_string(each.count.offset),
              "\"record\": " + quoted(each.each->name)},
             '}'));
    describe(*each.each, records);
  }
  records[std::string(what.name)] =
      list('{',
           {"\"size\": " + std::to_string(what.size), "\"rows\": " + list('[', rows, ']'),
            "\"followers\": " + list('[', followers, ']')},
           '}');
}

}  // namespace

int main() {
  std::map<std::string, std::string> records;
  std::vector<std::string> tables, all;
  for (const table_description &table : all_tables) {
    tables.push_back(quoted(table.node) + ": " + quoted(table.record->name));
    describe(*table.record, records);
  }
  for (const auto &[name, text] : records) all.push_back(quoted(name) + ": " + text);
  std::printf("{\"tables\": %s,\n\"records\": %s}\n", list('{', tables, '}').c_str(),
              list('{', all, '}').c_str());
}
