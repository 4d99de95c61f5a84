// Texts from strangers as JSON has them: always valid, whatever their bytes are.

#ifndef TARVELCTL_EXPORT_JSON_TEXT_H
#define TARVELCTL_EXPORT_JSON_TEXT_H

#include <cstddef>
#include <string>
#include <string_view>

namespace exporter {

// Bytes that a text of `size` bytes takes at most.
constexpr std::size_t quoted_size(std::size_t size) {
  constexpr std::size_t escaped = 6;
  return escaped * size + 2;
}

// Appends a text in quotation marks. It ends at the first NUL, or after `size` bytes. What is not UTF-8
// becomes U+FFFD, one for as many bytes as a character could have begun with; quotation marks, backslashes
// and all that a terminal might obey are escaped. May write up to format::slack bytes behind what it appends.
char *put_quoted(char *to, const char *text, std::size_t size);

// The same as a text of its own.
std::string quoted(std::string_view text);

}  // namespace exporter

#endif
