#include "common/text/output_helpers.h"

#include <cstdio>
#include <span>

#include "common/text/output.h"
#include "platform/process.h"

void print_options_usage(const option *options, const std::uint32_t *flags) {
  for (; options->name; ++options, ++flags) {
    const bool optional = *flags & option_is_optional;
    const bool bracketed = options->has_arg == optional_argument;
    complain<"\t%s--%s, -%c">(optional ? "[" : "", options->name, static_cast<char>(options->val));
    if (options->has_arg != no_argument) {
      complain<"%s <%s>%s">(bracketed ? " [" : "", options->name, bracketed ? " ]" : "");
    }
    complain<"%s\n">(optional ? " ]" : "");
  }
}

const char *highlight(const char *text, const char *colour) {
  static char result[1024];
  if (!report.is_terminal()) return text;
  std::snprintf(result, sizeof result, "%s%s%s", colour, text, "\033[0m");
  return result;
}

void print_flags(const char *label, std::uint32_t value, const bit_names &names) {
  if (label && names.is_octal) print<"%s=%o">(label, value);
  if (label && !names.is_octal) print<"%s=%x">(label, value);
  char separator = '<';
  for (const bit_names::entry &named : std::span(names.entries, names.count)) {
    if (!(value & named.bit)) continue;
    print<"%c%s">(separator, named.name);
    separator = ',';
  }
  if (separator == '<') print<"<">();
  print<">">();
}

foreign_text pid_to_name(int pid, char *buffer, std::size_t size, bool with_pid) {
  char name[platform::process_name_size];
  if (!platform::query_process_name(pid, name)) {
    std::snprintf(buffer, size, "<unknown>.%d", pid);
  } else {
    const std::size_t length = std::strlen(name);
    std::snprintf(buffer, size, "%s", name);
    if (with_pid && length + 1 < size) std::snprintf(buffer + length, size - length, ".%d", pid);
  }
  return {buffer};
}
