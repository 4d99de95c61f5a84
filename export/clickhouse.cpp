// schema --clickhouse: statements that make tables into which the lines load as they are.

#include <iterator>
#include <utility>

#include "common/text/output.h"
#include "common/text/text.h"
#include "export/command_line.h"

namespace exporter {

namespace {

// By value_form. Texts and names repeat from line to line: each is kept once.
constexpr const char *type_names[] = {"",
                                      "Bool",
                                      "LowCardinality",
                                      "UUID",
                                      "IPv6",
                                      "",
                                      "LowCardinality",
                                      "LowCardinality",
                                      "LowCardinality",
                                      "LowCardinality",
                                      "DateTime64(3, 'UTC')",
                                      ""};
static_assert(std::size(type_names) == static_cast<std::size_t>(value_form::object) + 1);

std::string type_of_each(const key &each);

std::string type_of(const key &of) {
  const std::string each = type_of_each(of);
  return of.is_array ? "Array(" + each + ")" : each;
}

std::string tuple_of(const std::vector<key> &members) {
  std::string type;
  for (const key &each : members) {
    type += type.empty() ? "Tuple(" : ", ";
    type.append("`").append(each.name).append("` ").append(type_of(each));
  }
  return type + ")";
}

std::string integer_type(const key &of) {
  const integer_width width = width_of(of);
  return (width.is_signed ? "Int" : "UInt") + std::to_string(width.bits);
}

// Without its array.
std::string type_of_each(const key &of) {
  const bool has_plain_elements = of.members.size() == 1;
  if (has_plain_elements) return type_of_each(of.members[0]);
  const bool has_counters = !of.is_array && of.field && of.field->names && !of.members.empty();
  if (has_counters) return "Map(LowCardinality(String), " + integer_type(of.members[0]) + ")";
  if (!of.members.empty()) return tuple_of(of.members);
  std::string type = type_names[static_cast<std::size_t>(of.form)];
  const bool is_low = type == "LowCardinality";
  if (is_low) type = "String";
  if (type.empty()) type = integer_type(of);
  if (of.may_be_null) type = "Nullable(" + type + ")";
  return is_low ? "LowCardinality(" + type + ")" : type;
}

// A text as a literal.
std::string literal(std::string_view text) {
  std::string made = "'";
  for (const char each : text) {
    if (each == '\'' || each == '\\') made += '\\';
    made += each;
  }
  return made + "'";
}

void print_table(const kind &of) {
  print<"\nCREATE TABLE IF NOT EXISTS tarvel_%s\n">(of.name);
  const char *before = "(";
  for (const key &each : of.all_keys()) {
    print<"%s\n    `%s` %s COMMENT %s">(std::exchange(before, ","), each.name, type_of(each),
                                        literal(each.meaning));
  }
  print<"\n)\nENGINE = MergeTree\nORDER BY (ifNull(host, ''), time);\n">();
}

}  // namespace

void print_statements() {
  print<
      "-- Lines of one kind load into the table of that kind:\n"
      "--   INSERT INTO tarvel_flow FORMAT JSONEachRow\n"
      "-- with these settings, which a session or a user has to have where it loads.\n"
      "SET date_time_input_format = 'best_effort';\n"
      "SET input_format_null_as_default = 0;\n"
      "SET input_format_skip_unknown_fields = 1;\n">();
  for (const kind &each : all_kinds()) print_table(each);
}

}  // namespace exporter
