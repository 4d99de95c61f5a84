// Tables without the addresses and process names of whom they came from.

#ifndef TARVELCTL_LAB_REDACTED_TABLES_H
#define TARVELCTL_LAB_REDACTED_TABLES_H

#include <cstddef>
#include <span>
#include <string_view>

#include "lab/substitutes.h"
#include "lab/table_file.h"

namespace lab {

// Writes the bytes of a table with substitutes for every address and process name, zeroes in place of what is
// never read, and all else as it is. Names of providers, arenas and regions lose the process names seen so
// far. Returns false where the table ends inside a record or is not known: all from there on is left out.
bool redact_table(std::string_view node, std::span<const std::byte> table, substitutes &by, table_file &file);

}  // namespace lab

#endif
