// Reading a printf format while the program is compiled.

#ifndef TARVELCTL_COMMON_TEXT_FORMAT_TEXT_H
#define TARVELCTL_COMMON_TEXT_FORMAT_TEXT_H

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace format {

// A format text as a template argument.
template <std::size_t N>
struct text {
  char chars[N];
  consteval text(const char (&source)[N]) { std::copy_n(source, N, chars); }
};

inline constexpr std::size_t no_precision = SIZE_MAX;

// One conversion, with the literal text in front of it.
struct piece {
  std::size_t literal = 0;  // offset into parsed_text::literals
  std::size_t literal_size = 0;
  std::size_t width = 0;
  std::size_t precision = no_precision;
  char kind = 0;  // the conversion's letter; 0 for the literal text after the last one
  bool left = false;
  bool zero = false;
  bool wide = false;  // "ll" or "q": a 64-bit argument
};

template <std::size_t N>
struct parsed_text {
  std::array<char, N> literals{};  // all literal text, with %% reduced to %
  std::size_t literals_size = 0;
  std::array<piece, N> pieces{};  // one per conversion, then the tail
  std::size_t conversions = 0;
};

// Never defined: a call to it while a format is read stops the compiler here, with the reason in the call.
void malformed_format(const char *reason);

template <std::size_t N>
consteval parsed_text<N> parse(const text<N> &format) {
  parsed_text<N> parsed;
  piece current;
  const char *at = format.chars;
  const auto number = [&at] {
    std::size_t value = 0;
    while (*at >= '0' && *at <= '9') value = value * 10 + static_cast<std::size_t>(*at++ - '0');
    return value;
  };
  while (*at) {
    if (*at != '%' || *++at == '%') {
      parsed.literals[parsed.literals_size++] = *at++;
      ++current.literal_size;
      continue;
    }
    for (; *at == '-' || *at == '0'; ++at) (*at == '-' ? current.left : current.zero) = true;
    current.width = number();
    if (*at == '.') {
      ++at;
      current.precision = number();
    }
    if (*at == 'q') {
      current.wide = true;
      ++at;
    } else if (*at == 'l') {
      if (*++at != 'l') malformed_format("a single l is not portable");
      current.wide = true;
      ++at;
    }
    if (*at == 0 || std::string_view("duxocsfg").find(*at) == std::string_view::npos) {
      malformed_format("unknown conversion");
    }
    current.kind = *at++;
    parsed.pieces[parsed.conversions++] = current;
    current = {};
    current.literal = parsed.literals_size;
  }
  parsed.pieces[parsed.conversions] = current;
  return parsed;
}

}  // namespace format

#endif
