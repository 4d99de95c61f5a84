#include "common/text/guard.h"

#include <langinfo.h>
#include <locale.h>

#include <algorithm>
#include <bit>
#include <cstddef>
#include <string_view>

namespace format {

namespace {

struct character {
  char32_t code;
  std::size_t size;
};

constexpr character stray{0, 1};  // a byte that is no part of a character is as good as a control

// The first character of a text in UTF-8.
character first_character(std::span<const char> text) {
  const auto byte = [text](std::size_t at) { return static_cast<unsigned char>(text[at]); };
  const auto size = static_cast<std::size_t>(std::countl_one(byte(0)));  // 0: one byte
  if (size == 0) return {byte(0), 1};
  if (size == 1 || size > 4 || size > text.size()) return stray;
  char32_t code = byte(0) & (0x7fU >> size);
  for (std::size_t at = 1; at < size; ++at) {
    if (std::countl_one(byte(at)) != 1) return stray;
    code = code << 6 | (byte(at) & 0x3fU);
  }
  constexpr char32_t smallest[] = {0, 0, 0x80, 0x800, 0x10000};
  const bool is_surrogate = code >= 0xd800 && code <= 0xdfff;
  return code < smallest[size] || is_surrogate || code > 0x10ffff ? stray : character{code, size};
}

guard ask_for_guard() {
  const locale_t locale = newlocale(LC_CTYPE_MASK, "", nullptr);
  if (!locale) return guard::bytes;
  const bool is_utf8 = std::string_view(nl_langinfo_l(CODESET, locale)) == "UTF-8";
  freelocale(locale);
  return is_utf8 ? guard::utf8 : guard::bytes;
}

}  // namespace

bool is_hidden(char32_t code) {
  return code < 0x20 || (code >= 0x7f && code < 0xa0) ||  // C0, DEL, C1
         (code >= 0x2028 && code <= 0x202e) ||            // separators, embeddings and overrides
         (code >= 0x2066 && code <= 0x2069);              // isolates
}

guard terminal_guard() {
  static const guard answer = ask_for_guard();
  return answer;
}

void hide_controls(std::span<char> text, guard against) noexcept {
  while (!text.empty()) {
    const character next = against == guard::utf8 ? first_character(text)
                                                  : character{static_cast<unsigned char>(text.front()), 1};
    if (is_hidden(next.code)) std::fill_n(text.begin(), next.size, '?');
    text = text.subspan(next.size);
  }
}

}  // namespace format
