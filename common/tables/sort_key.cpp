#include "common/tables/sort_key.h"

#include <array>
#include <numeric>

// Digit by digit of the number, from the lowest. A digit that is the same in all keys takes no pass of its
// own.
void sort_keys(std::vector<sort_key> &keys) {
  constexpr unsigned digit_bits = 11;
  constexpr std::size_t digits = std::size_t{1} << digit_bits;
  std::vector<sort_key> sorted(keys.size());
  for (unsigned shift = 32; shift < 64 && !keys.empty(); shift += digit_bits) {
    const auto digit = [shift](sort_key key) { return key >> shift & (digits - 1); };
    std::array<std::size_t, digits> place{};
    for (const sort_key key : keys) ++place[digit(key)];
    if (place[digit(keys[0])] == keys.size()) continue;
    std::exclusive_scan(place.begin(), place.end(), place.begin(), std::size_t{0});
    for (const sort_key key : keys) sorted[place[digit(key)]++] = key;
    keys.swap(sorted);
  }
}
