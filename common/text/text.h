// Texts that come from outside the program.

#ifndef TARVELCTL_COMMON_TEXT_TEXT_H
#define TARVELCTL_COMMON_TEXT_TEXT_H

#include <cstddef>
#include <cstring>
#include <string_view>

#include "common/text/print.h"

// A text from the kernel, a process or a name service, to be printed as data from strangers
// (common/text/print.h).
struct foreign_text {
  std::string_view text;

  format::text_view printable() const { return {text.data(), text.size(), true}; }
};

// A text field of a kernel record: it ends at the first NUL or with the field.
template <std::size_t Width>
struct text_field {
  char bytes[Width];

  std::string_view view() const { return {bytes, strnlen(bytes, Width)}; }

  // At most the first `length` bytes of the text.
  foreign_text first(std::size_t length) const { return {view().substr(0, length)}; }

  format::small_text<Width> printable() const {
    format::small_text<Width> text;
    std::memcpy(text.chars, bytes, Width);
    text.size = view().size();
    text.foreign = true;
    return text;
  }
};

#endif
