#include "common/tables/description.h"

#include <arpa/inet.h>

#include <cstring>

std::size_t row::count_in(record_bytes record) const {
  if (!holds(record)) return 0;
  std::size_t found = 0;
  while (found < count && !(ends_at_none && at(found).in(record) == none)) ++found;
  return found;
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
