// schema: the kinds of lines and their keys, as one JSON document.

#include <cstdlib>
#include <iterator>

#include "common/text/output.h"
#include "common/text/text.h"
#include "export/command_line.h"
#include "export/json_text.h"

namespace exporter {

namespace {

// By value_form.
constexpr const char *form_names[] = {"integer", "boolean", "string", "uuid",   "address", "integer",
                                      "mac",     "string",  "string", "string", "time",    "object"};
static_assert(std::size(form_names) == static_cast<std::size_t>(value_form::object) + 1);

// A text, null where it is empty.
std::string text_or_null(std::string_view text) {
  return text.empty() ? "null" : quoted(text);
}

template <class Items, class Name>
void print_names(const Items &items, Name name_of) {
  const char *comma = "";
  print<R"(,"values":[)">();
  for (const auto &each : items) print<"%s%s">(std::exchange(comma, ","), quoted(name_of(each)));
  print<"]">();
}

void print_values(const row *field, value_form form) {
  if (form == value_form::enumeration) {
    print_names(field->values, [](const named_value &each) { return each.name.view(); });
  }
  if (form == value_form::flags) {
    print_names(std::span(field->flags->entries, field->flags->count),
                [](const bit_names::entry &each) { return each.name.view(); });
  }
}

void print_keys(const std::vector<key> &keys, const std::string &indent);

// What a key is, behind its name; of an array, what each of its elements is.
void print_type(const key &each, const std::string &indent) {
  const bool is_plain = each.is_array && each.members.size() == 1;
  const key &of = is_plain ? each.members[0] : each;
  print<R"("type":"%s","array":%s,"null":%s,"unit":%s,"meaning":%s)">(
      form_names[static_cast<std::size_t>(of.members.empty() ? of.form : value_form::object)],
      each.is_array ? "true" : "false", of.may_be_null ? "true" : "false", text_or_null(each.unit),
      text_or_null(each.meaning));
  if (of.members.empty() && form_names[static_cast<std::size_t>(of.form)] == std::string_view("integer")) {
    const integer_width width = width_of(of);
    print<R"(,"bits":%u,"signed":%s)">(width.bits, width.is_signed ? "true" : "false");
  }
  print_values(of.field, of.form);
  if (!of.members.empty()) print_keys(of.members, indent);
}

void print_keys(const std::vector<key> &keys, const std::string &indent) {
  const char *comma = "";
  print<R"(,"keys":[)">();
  for (const key &each : keys) {
    print<"%s\n%s{\"key\":%s,">(std::exchange(comma, ","), indent, quoted(each.name));
    print_type(each, indent + "  ");
    print<"}">();
  }
  print<"]">();
}

}  // namespace

int print_schema(const options &asked) {
  if (asked.clickhouse) {
    print_statements();
    return EXIT_SUCCESS;
  }
  print<"{\"version\":%d,\"kinds\":[">(schema_version);
  const char *comma = "";
  for (const kind &each : all_kinds()) {
    print<"%s\n  {\"kind\":%s">(std::exchange(comma, ","), quoted(each.name));
    print_keys(each.all_keys(), "    ");
    print<"}">();
  }
  print<"]}\n">();
  return EXIT_SUCCESS;
}

}  // namespace exporter
