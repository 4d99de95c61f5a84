#include "common/tables/description.h"

#include <algorithm>
#include <cstring>

std::size_t row::count_in(record_bytes record) const {
  if (!holds(record)) return 0;
  std::size_t found = 0;
  while (found < count && !(ends_at_none && at(found).in(record) == none)) ++found;
  return found;
}

std::size_t row::size_said_in(record_bytes record) const {
  const std::size_t said = length ? static_cast<std::size_t>(length->in(record)) : size;
  if (type == field_type::text) {
    return std::min(said, strnlen(reinterpret_cast<const char *>(record.data()) + offset, size));
  }
  return said == size || said == 4 ? said : 0;
}
