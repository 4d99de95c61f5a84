// Sorting many records by a number: small keys move, the records stay.

#ifndef TARVELCTL_COMMON_TABLES_SORT_KEY_H
#define TARVELCTL_COMMON_TABLES_SORT_KEY_H

#include <cstddef>
#include <cstdint>
#include <vector>

// A number to sort by, over the position of what it belongs to.
using sort_key = std::uint64_t;

inline sort_key make_sort_key(std::uint32_t number, std::size_t position) {
  return sort_key{number} << 32 | static_cast<std::uint32_t>(position);
}

// A signed number as an unsigned one of the same order.
inline std::uint32_t ascending(std::int32_t number) {
  return static_cast<std::uint32_t>(number) ^ 0x80000000;
}

inline std::uint32_t number_of(sort_key key) {
  return static_cast<std::uint32_t>(key >> 32);
}
inline std::uint32_t position_of(sort_key key) {
  return static_cast<std::uint32_t>(key);
}

// Sorts by number; keys with the same number keep their order. The time is linear.
void sort_keys(std::vector<sort_key> &keys);

#endif
