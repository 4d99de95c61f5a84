// Object identities.

#ifndef TARVELCTL_COMMON_TABLES_UUID_H
#define TARVELCTL_COMMON_TABLES_UUID_H

#include <uuid/uuid.h>

#include <cstring>

#include "common/text/print.h"

// 16 bytes, compared byte by byte and printed in upper-case canonical form, 36 characters. All zero is the
// null UUID.
struct uuid {
  uuid_t bytes;

  friend bool operator==(const uuid &a, const uuid &b) {
    return std::memcmp(a.bytes, b.bytes, sizeof a.bytes) == 0;
  }

  static constexpr std::size_t text_size = UUID_STR_LEN - 1;
  char *append_to(char *to) const {
    uuid_unparse_upper(bytes, to);
    return to + text_size;
  }
};

#endif
