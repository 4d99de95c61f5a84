#include "common/output_helpers.h"

#include <cstdio>

#include "common/output.h"
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

void print_flags(const char *label, std::uint32_t value, const char *bit_names) {
  constexpr char octal = 8;
  constexpr char last_bit_number = 32;
  if (label && *bit_names == octal) print<"%s=%o">(label, value);
  if (label && *bit_names != octal) print<"%s=%x">(label, value);
  print<"<">();
  const char *separator = "";
  for (const char *at = bit_names + 1; *at;) {
    const unsigned bit = static_cast<unsigned char>(*at++);
    const char *name = at;
    while (*at > last_bit_number) ++at;
    if (value >> (bit - 1) & 1) {
      print<"%s%s">(separator, std::string_view(name, static_cast<std::size_t>(at - name)));
      separator = ",";
    }
  }
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
