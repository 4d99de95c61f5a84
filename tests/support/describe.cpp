// Prints what is known of every table as one JSON document, for tests that are no C++.

#include <unistd.h>

#include <vector>

#include "common/tables/tables.h"
#include "common/text/output.h"

namespace {

constexpr const char *types[] = {"u8",  "u16",  "net16", "u32",   "u64",   "i32",
                                 "i64", "text", "uuid",  "bytes", "record"};
constexpr const char *kinds[] = {"unread",    "identifier",  "number",  "gauge", "counter",
                                 "flags",     "enumeration", "boolean", "pid",   "process",
                                 "interface", "name",        "address", "mac",   "nested"};

static_assert(std::size(types) == static_cast<std::size_t>(field_type::record) + 1);
static_assert(std::size(kinds) == static_cast<std::size_t>(field_kind::nested) + 1);

template <class Items, class Print>
void print_each(const Items &items, Print print_one) {
  const char *comma = "";
  for (const auto &item : items) {
    print<"%s">(std::exchange(comma, ",\n"));
    print_one(item);
  }
}

constexpr auto print_value = [](const auto &value) {
  const auto &[number, name] = value;
  print<R"("%lld": "%s")">(std::int64_t{number}, name);
};

void print_row(const row &field) {
  print<
      R"({"field": "%s", "part": "%s", "name": "%s", "meaning": "%s", "part_meaning": "%s", "unit": "%s", )">(
      field.field, field.part, field.name, field.meaning, field.part_meaning, field.unit);
  print<R"("offset": %u, "size": %u, "count": %u, "type": "%s", "kind": "%s", "nested": "%s", "values": {)">(
      field.offset, field.size, field.count, types[static_cast<int>(field.type)],
      kinds[static_cast<int>(field.kind)], field.nested ? field.nested->name : "");
  print_each(field.values, print_value);
  if (field.flags) print_each(std::span(field.flags->entries, field.flags->count), print_value);
  print<R"(}, "names": [)">();
  if (field.names) {
    print_each(std::span(field.names, field.count), [](auto &each) { print<R"("%s")">(each.name()); });
  }
  print<"]}">();
}

// The records that it consists of and that follow it, and itself, behind a comma but for the first of all.
void print_record(const record_description &record, const char *&comma) {
  for (const row &field : record.rows) {
    if (field.nested) print_record(*field.nested, comma);
  }
  for (const follower &each : record.followers) print_record(*each.each, comma);
  print<R"(%s"%s": {"size": %llu, "rows": [)">(std::exchange(comma, ",\n"), record.name, record.size);
  print_each(record.rows, print_row);
  print<R"(], "followers": [)">();
  print_each(record.followers, [](const follower &each) {
    print<R"({"name": "%s", "at": %u, "record": "%s"})">(each.name, each.count.offset, each.each->name);
  });
  print<"]}">();
}

}  // namespace

int main() {
  report.attach(STDOUT_FILENO);
  print<R"({"records": {)">();
  const char *comma = "";
  for (const table_description &table : all_tables) print_record(*table.record, comma);
  print<R"(}, "tables": {)">();
  print_each(all_tables,
             [](const table_description &table) { print<R"("%s": "%s")">(table.node, table.record->name); });
  print<"}}\n">();
  report.close();
}
