#include "common/tables/description.h"

#include <arpa/inet.h>

#include <algorithm>
#include <cstring>

std::size_t row::count_in(record_bytes record) const {
  if (!holds(record)) return 0;
  std::size_t found = 0;
  while (found < count && !(ends_at_none && at(found).in(record) == none)) ++found;
  return found;
}

std::size_t row::size_in(record_bytes record) const {
  const std::size_t said = length ? static_cast<std::size_t>(length->in(record)) : size;
  if (type == field_type::text) {
    return std::min(said, strnlen(reinterpret_cast<const char *>(record.data()) + offset, size));
  }
  return said == size || said == 4 ? said : 0;
}

std::int64_t number_at::in(record_bytes record) const {
  const auto read = [&]<class Number>(Number value) {
    std::memcpy(&value, record.data() + offset, sizeof value);
    return value;
  };
  switch (type) {
    case field_type::u8:
      return read(std::uint8_t{});
    case field_type::u16:
      return read(std::uint16_t{});
    case field_type::net16:
      return ntohs(read(std::uint16_t{}));
    case field_type::u32:
      return read(std::uint32_t{});
    case field_type::i32:
      return read(std::int32_t{});
    default:
      return read(std::int64_t{});
  }
}
