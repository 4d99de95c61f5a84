// Tables without the addresses and names of whom they came from.

#ifndef TARVELCTL_LAB_REDACTED_TABLES_H
#define TARVELCTL_LAB_REDACTED_TABLES_H

#include "common/tables/tables.h"
#include "lab/substitutes.h"
#include "lab/table_file.h"

namespace lab {

// Writes the bytes of a table with what its records may show: numbers and UUIDs that reports read, and
// substitutes for addresses and names; all else is zero. Returns false where the table ends inside a record,
// or holds more than anyone reads: all from there on is left out.
bool redact_table(const table_description &table, record_bytes bytes, substitutes &by, table_file &file);

}  // namespace lab

#endif
