// A moment: the tables of one kernel, read one after the other.
//
// Tables are not read at once, so each has a time of its own. What is compared with another moment, or put
// together from several tables, starts here; who reads a capture sets the capture's own times.

#ifndef TARVELCTL_COMMON_MOMENT_H
#define TARVELCTL_COMMON_MOMENT_H

#include <algorithm>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "common/tables/kernel_table.h"
#include "common/tables/tables.h"

// One table, as it was read, or why it was not.
struct table_reading {
  const table_description *what = nullptr;
  int error = 0;  // an error number; the table is empty then
  kernel_table content{};
  std::int64_t monotonic = 0;  // when it was read, in ns of a clock that no one sets: differences only
  std::int64_t wall = 0;       // in ns since 1970

  // The bytes of it that anyone reads.
  record_bytes bytes() const { return content.bytes().first(std::min(content.size(), what->most)); }
};

struct moment {
  std::vector<table_reading> tables;  // in the order in which they were read
  std::string host;                   // the kernel's own name, a text from strangers; empty where it has none

  // The reading of a table; null where it was not asked for.
  const table_reading *find(const table_description &table) const;
};

// Reads these tables, or all of them, and the kernel's name, now. Nothing is said on standard error: a table
// that cannot be read has its reason. Where its memory cannot be had that is ENOMEM.
moment read_moment(std::span<const table_description *const> wanted);
moment read_moment();

#endif
