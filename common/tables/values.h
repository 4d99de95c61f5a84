// The numbers that records hold, and their names: each pair once, for those who read tables and those who
// make them.

#ifndef TARVELCTL_COMMON_TABLES_VALUES_H
#define TARVELCTL_COMMON_TABLES_VALUES_H

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "common/text/output_helpers.h"
#include "common/text/print.h"

struct named_value {
  std::int64_t number;
  format::name_text name;
};

// The names of a field's numbers.
template <std::size_t N>
struct value_names {
  std::array<named_value, N> rows;
  format::name_text unknown;  // what reports call a number without a name
  std::array<std::uint8_t, 32> small_numbers;

  consteval value_names(const format::name_text &other, const named_value (&named)[N]) : unknown(other) {
    for (std::uint8_t &place : small_numbers) place = N;
    for (std::size_t i = 0; i < N; ++i) {
      rows[i] = named[i];
      const auto number = static_cast<std::uint64_t>(named[i].number);
      if (number < small_numbers.size()) small_numbers[number] = static_cast<std::uint8_t>(i);
    }
  }

  // The position of a number among the rows; N where it has no name.
  constexpr std::size_t find(std::int64_t number) const {
    if (static_cast<std::uint64_t>(number) < small_numbers.size()) {
      return small_numbers[static_cast<std::size_t>(number)];
    }
    std::size_t i = 0;
    while (i < N && rows[i].number != number) ++i;
    return i;
  }

  constexpr const format::name_text &at(std::size_t position) const {
    return position < N ? rows[position].name : unknown;
  }

  constexpr const format::name_text &of(std::int64_t number) const { return at(find(number)); }

  // The number that has this name. A name that is none does not compile.
  consteval std::uint32_t number(std::string_view name) const {
    std::size_t i = 0;
    while (rows[i].name.view() != name) ++i;  // beyond the rows the compiler stops here
    return static_cast<std::uint32_t>(rows[i].number);
  }
};

// The name of a counter, as every report shows it.
using counter_name = format::column_text<16, 24>;

// Protocols above IP.
inline constexpr value_names ip_protocols{"unk.", {{6, "tcp"}, {17, "udp"}}};

// "tcp", "udp" or "unk." for an IP protocol number.
inline const format::name_text &proto_name(std::uint8_t protocol) {
  return ip_protocols.of(protocol);
}

#endif
