// schema: the kinds of lines and their keys, as one JSON document.

#include <cstdlib>
#include <iterator>
#include <utility>

#include "common/text/output.h"
#include "common/text/text.h"
#include "export/command_line.h"
#include "export/json_text.h"

namespace exporter {

namespace {

constexpr const char *form_names[] = {"integer", "boolean",     "string", "uuid",   "address", "integer",
                                      "mac",     "enumeration", "flags",  "string", "object"};
static_assert(std::size(form_names) == static_cast<std::size_t>(value_form::object) + 1);
}  // namespace

int print_schema(const options &asked) {
  if (asked.clickhouse) print_statements();
  return EXIT_SUCCESS;
}

}  // namespace exporter
