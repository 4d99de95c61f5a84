// Object identities.

#ifndef TARVELCTL_COMMON_UUID_H
#define TARVELCTL_COMMON_UUID_H

#include <uuid/uuid.h>

#include <cstring>

#include "common/print.h"

// 16 bytes, compared byte by byte and printed in upper-case canonical form, 36 characters. All zero is the
// null UUID.
struct uuid {
  uuid_t bytes;

  friend bool operator==(const uuid &a, const uuid &b) {
    return std::memcmp(a.bytes, b.bytes, sizeof a.bytes) == 0;
  }

  format::small_text<UUID_STR_LEN> printable() const {
    format::small_text<UUID_STR_LEN> text;
    uuid_unparse_upper(bytes, text.chars);
    text.size = UUID_STR_LEN - 1;
    return text;
  }
};

#endif
