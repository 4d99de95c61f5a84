#include "export/json_text.h"

#include <bit>
#include <cstdint>
#include <cstring>

#include "common/text/guard.h"
#include "common/text/print.h"

namespace exporter {

namespace {

// Marks bytes of a word that need a closer look, by their high bits: NUL and other control characters, the
// quotation mark, the backslash, DEL, and all beyond ASCII. Above the lowest mark others may be wrong.
std::uint64_t unusual_bytes(std::uint64_t word) {
  constexpr std::uint64_t each = 0x0101'0101'0101'0101;
  const auto below = [](std::uint64_t bytes, std::uint64_t limit) { return (bytes - limit * each) & ~bytes; };
  const auto equal = [&](std::uint64_t byte) { return below(word ^ byte * each, 1); };
  return (word | below(word, 0x20) | equal('"') | equal('\\') | equal(0x7f)) & 0x80 * each;
}

// What a text begins with: the bytes of a character in UTF-8, or as many as one could have begun with.
struct sequence {
  std::size_t size;
  bool is_character;
};

sequence first_sequence(std::string_view text) {
  const auto byte = [text](std::size_t at) { return static_cast<unsigned char>(text[at]); };
  const unsigned lead = byte(0);
  if (lead < 0x80) return {1, true};
  if (lead < 0xc2 || lead > 0xf4) return {1, false};
  const auto size = static_cast<std::size_t>(std::countl_one(byte(0)));
  // Neither longer than need be, nor a surrogate, nor beyond U+10FFFF.
  unsigned least = lead == 0xe0 ? 0xa0 : lead == 0xf0 ? 0x90 : 0x80;
  unsigned most = lead == 0xed ? 0x9f : lead == 0xf4 ? 0x8f : 0xbf;
  for (std::size_t at = 1; at < size; ++at) {
    if (at == text.size() || byte(at) < least || byte(at) > most) return {at, false};
    least = 0x80;
    most = 0xbf;
  }
  return {size, true};
}

char *put(char *to, std::string_view bytes) {
  std::memcpy(to, bytes.data(), bytes.size());
  return to + bytes.size();
}

char *put_escaped(char *to, unsigned code) {
  static constexpr char digits[] = "0123456789abcdef";
  to = put(to, "\\u");
  for (int shift = 12; shift >= 0; shift -= 4) *to++ = digits[code >> shift & 0xf];
  return to;
}

// The code of a character of at most three bytes.
unsigned code_of(std::string_view character) {
  unsigned code =
      static_cast<unsigned char>(character[0]) & (0xffU >> (character.size() + (character.size() > 1)));
  for (const char byte : character.substr(1)) code = code << 6 | (static_cast<unsigned char>(byte) & 0x3fU);
  return code;
}

char *put_sequence(char *to, std::string_view bytes, bool is_character) {
  if (!is_character) return put(to, "\xef\xbf\xbd");
  const unsigned code = bytes.size() <= 3 ? code_of(bytes) : 0x10000;
  if (format::is_hidden(code)) return put_escaped(to, code);  // also what a terminal would obey
  if (code == '"' || code == '\\') *to++ = '\\';
  return put(to, bytes);
}

}  // namespace

char *put_quoted(char *to, const char *text, std::size_t size) {
  static_assert(sizeof(std::uint64_t) <= format::slack);
  std::string_view rest(text, size);
  *to++ = '"';
  while (!rest.empty()) {
    std::uint64_t word = 0;
    if (rest.size() >= sizeof word) {
      std::memcpy(&word, rest.data(), sizeof word);
      std::memcpy(to, &word, sizeof word);
      const std::uint64_t marks = unusual_bytes(word);
      const auto plain = marks ? static_cast<std::size_t>(std::countr_zero(marks)) / 8 : sizeof word;
      to += plain;
      rest.remove_prefix(plain);
      if (!marks) continue;
    }
    if (rest.front() == '\0') break;
    const sequence first = first_sequence(rest);
    to = put_sequence(to, rest.substr(0, first.size), first.is_character);
    rest.remove_prefix(first.size);
  }
  *to++ = '"';
  return to;
}

std::string quoted(std::string_view text) {
  std::string made(quoted_size(text.size()) + format::slack, '\0');
  made.resize(static_cast<std::size_t>(put_quoted(made.data(), text.data(), text.size()) - made.data()));
  return made;
}

}  // namespace exporter
