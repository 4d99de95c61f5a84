// Small pieces of output that several commands share.

#ifndef TARVELCTL_COMMON_TEXT_OUTPUT_HELPERS_H
#define TARVELCTL_COMMON_TEXT_OUTPUT_HELPERS_H

#include <getopt.h>

#include <cstddef>
#include <cstdint>

#include "common/text/text.h"

// Bit of an option flags word: the option may be left out.
inline constexpr std::uint32_t option_is_optional = 1;

// Writes one usage line per option to standard error. `options` ends with a record without a name; `flags`
// has a word for each record before it.
void print_options_usage(const option *options, const std::uint32_t *flags);

namespace colour {
inline constexpr char cyan[] = "\033[36m";
inline constexpr char red[] = "\033[31m";
}  // namespace colour

// Returns `text` itself, or, where the report goes to a terminal, the text in a colour. The result is valid
// until the next call; more than 1023 bytes of it are cut.
const char *highlight(const char *text, const char *colour);

// The names of a word's bits, written as a string in the kernel's %b convention: a first byte for the base of
// the value (8 octal, any other hexadecimal), then for each named bit its number from 1 (least significant)
// to 32 as one byte and its name in characters above 32. The string is taken apart when the program is
// compiled.
struct bit_names {
  template <std::size_t N>
  consteval bit_names(const char (&packed)[N]) : is_octal(packed[0] == 8) {
    constexpr char last_bit_number = 32;
    for (std::size_t at = 1; at + 1 < N; ++count) {
      entry &named = entries[count];
      named.bit = 1U << (packed[at++] - 1);
      while (packed[at] > last_bit_number) named.name.chars[named.name.size++] = packed[at++];
    }
  }

  struct entry {
    std::uint32_t bit = 0;
    format::small_text<24> name = "";
  };

  // The bit of this name. A name that is none does not compile.
  consteval std::uint32_t bit(std::string_view name) const {
    std::size_t i = 0;
    while (entries[i].name.view() != name) ++i;
    return entries[i].bit;
  }

  bool is_octal;
  std::size_t count = 0;
  entry entries[32];
};

// Prints "label=value<NAME,NAME>" without line end, or just "<NAME,NAME>" where `label` is null. Names appear
// in the order of the string that they were written in.
void print_flags(const char *label, std::uint32_t value, const bit_names &names);

// The letter of each bit that is set, the first of its name, and "-" for each that is clear, in the order of
// the names.
struct flags_text {
  std::uint32_t flags;
  const bit_names &letters;

  static constexpr std::size_t text_size = 32;
  char *append_to(char *to) const {
    for (std::size_t i = 0; i < letters.count; ++i) {
      *to++ = flags & letters.entries[i].bit ? letters.entries[i].name.chars[0] : '-';
    }
    return to;
  }
};

// Stores the short name of process `pid` in `buffer`, cut to `size` - 1 bytes and terminated, and returns it.
// `with_pid` appends "." and the id where there is room behind the full name. A process that cannot be
// queried is "<unknown>." and the id, whatever `with_pid` says.
foreign_text pid_to_name(int pid, char *buffer, std::size_t size, bool with_pid);

#endif
