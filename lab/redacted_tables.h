// Tables without the addresses and names of whom they came from.

#ifndef TARVELCTL_LAB_REDACTED_TABLES_H
#define TARVELCTL_LAB_REDACTED_TABLES_H

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "lab/substitutes.h"
#include "lab/table_file.h"

namespace lab {

enum class redaction : std::uint8_t { whole, cut, unknown };

// Writes the bytes of a table with what its records may show: numbers and UUIDs that reports read, and
// substitutes for addresses and names; all else is zero. A table that ends inside a record is cut before it;
// of one that is not known, nothing is written.
redaction redact_table(std::string_view node, std::span<const std::byte> table, substitutes &by,
                       table_file &file);

}  // namespace lab

#endif
