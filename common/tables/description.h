// What is known of a record, said once: its fields as rows, and what follows it in its table.
//
// A record is a plain struct, which reports read by name. Behind it stands its description: a row for each of
// its fields, unread ones too, in order and without a gap, or it does not compile. Whoever has to know what a
// field is without knowing the record asks the rows: redaction, captures, the drivers of the tests, the
// comparison with the manual.

#ifndef TARVELCTL_COMMON_TABLES_DESCRIPTION_H
#define TARVELCTL_COMMON_TABLES_DESCRIPTION_H

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>
#include <string_view>
#include <type_traits>
#include <utility>

#include "common/tables/record_walk.h"
#include "common/tables/uuid.h"
#include "common/tables/values.h"
#include "common/text/text.h"

// How a field lies in its record. `net16` is a u16 in network byte order.
enum class field_type : std::uint8_t { u8, u16, net16, u32, u64, i32, i64, text, uuid, bytes, record };

// What a field means; what may be done with it follows from that alone.
enum class field_kind : std::uint8_t {
  unread,       // may hold anything
  identifier,   // tells objects apart
  number,       // how much, or which
  gauge,        // a number that rises and falls
  counter,      // so far, modulo 2^64
  flags,        // bits with names
  enumeration,  // a number with a name
  boolean,      // not 0: yes
  pid,          // a process
  process,      // the name of one
  interface,    // the name of an interface
  name,         // any other text
  address,      // IPv4 or IPv6, in network byte order
  mac,          // of a link layer
  nested,       // has rows of its own
};

// A record's bytes, as they lie in its table.
using record_bytes = std::span<const std::byte>;

// Where a number lies that decides something about another field of the same record.
struct number_at {
  std::uint16_t offset = 0;
  field_type type = field_type::u8;

  // The number, sign extended.
  std::int64_t in(record_bytes record) const {
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
        return std::rotl(read(std::uint16_t{}), 8);
      case field_type::u32:
        return read(std::uint32_t{});
      case field_type::i32:
        return read(std::int32_t{});
      default:
        return read(std::int64_t{});
    }
  }
};

// On what a field says anything: that a number of the record is, masked, one of some small ones or, inverted,
// none of them.
struct field_condition {
  number_at at;
  std::uint64_t mask = 0;   // 0: on nothing
  std::uint64_t among = 0;  // bit n for the number n
  bool is_inverted = false;

  bool holds(record_bytes record) const {
    if (!mask) return true;
    const std::uint64_t number = static_cast<std::uint64_t>(at.in(record)) & mask;
    return (number < 64 && (among >> number & 1)) != is_inverted;
  }
};

struct record_description;

struct row {
  std::string_view field;    // as in the struct and in tarvel-tables(5)
  std::uint16_t offset = 0;  // in the record
  std::uint16_t size = 0;    // of an element
  std::uint16_t count = 1;   // of elements
  field_type type = field_type::bytes;
  field_kind kind = field_kind::unread;
  std::string_view name = {};                // what programs call it
  std::string_view meaning = "not read";     // in a few words
  std::string_view unit = {};                // of a number
  std::string_view part = {};                // of the record that it belongs to, as `field`,
  std::string_view part_name = {};           // as `name`
  std::string_view part_meaning = {};        // and as `meaning`
  std::span<const named_value> values = {};  // of an enumeration
  const bit_names *flags = nullptr;          // of flags
  const counter_name *names = nullptr;       // of the elements
  const record_description *nested = nullptr;
  field_condition condition = {};           // it says something where this holds,
  field_condition of_part = {};             // and this, of its part
  std::optional<number_at> length = {};     // how many of its bytes count
  std::optional<std::uint32_t> none = {};   // the number that means that there is none
  bool ends_at_none = false;                // elements from the first `none` on say nothing
  bool identifies = false;                  // as an identifier does, together with those
  std::optional<std::uint16_t> level = {};  // the element among counters that rises and falls

  constexpr number_at at(std::size_t element = 0) const {
    return {static_cast<std::uint16_t>(offset + element * size), type};
  }

  // How many of its elements say anything.
  std::size_t count_in(record_bytes record) const;

  // How many bytes of its only element say anything: of a text those in front of a NUL, of what has a length
  // those that count. An address of a length that no family has says nothing.
  std::size_t size_in(record_bytes record) const {
    return length || type == field_type::text ? size_said_in(record) : size;
  }

  // Whether it tells its record from others: an equal one, at another moment, is the same record.
  constexpr bool is_key() const {
    return kind == field_kind::identifier || (identifies && kind != field_kind::unread);
  }

  // Whether what it says depends on another field.
  constexpr bool depends() const { return condition.mask || of_part.mask || length; }

  bool holds(record_bytes record) const { return condition.holds(record) && of_part.holds(record); }

  template <class Member>
  constexpr row with(Member row::*which, const std::type_identity_t<Member> &value) const {
    row said = *this;
    said.*which = value;
    return said;
  }

  // What there is to say of a field, one behind the other.
  constexpr row is(field_kind of_kind, std::string_view called, std::string_view means) const {
    return with(&row::kind, of_kind).with(&row::name, called).with(&row::meaning, means);
  }
  constexpr row as(field_type lies) const { return with(&row::type, lies); }
  constexpr row in(std::string_view measure) const { return with(&row::unit, measure); }
  template <std::size_t N>
  constexpr row of(const value_names<N> &named) const {
    return with(&row::values, named.rows);
  }
  constexpr row of(const bit_names &bits) const { return with(&row::flags, &bits); }
  constexpr row of(const counter_name *counters) const { return with(&row::names, counters); }
  constexpr row of(const record_description &element) const { return with(&row::nested, &element); }
  constexpr row or_none(std::uint32_t number) const { return with(&row::none, number); }
  constexpr row up_to(std::uint32_t number) const { return or_none(number).with(&row::ends_at_none, true); }
  constexpr row identifying() const { return with(&row::identifies, true); }
  constexpr row with_level(std::uint16_t element) const { return with(&row::level, element); }
  constexpr row cut_to(const row &bytes) const { return with(&row::length, bytes.at()); }
  // Only where the other field is this number, or either of two; where it has the bit; where it is not 0.
  constexpr row where(const row &decides, std::uint32_t number) const {
    return where(decides, number, number);
  }
  constexpr row where(const row &decides, std::uint32_t number, std::uint32_t other) const {
    return on({decides.at(), UINT64_MAX, std::uint64_t{1} << number | std::uint64_t{1} << other, false});
  }
  constexpr row where_bit(const row &decides, std::uint32_t bit) const {
    return on({decides.at(), bit, 1, true});
  }
  constexpr row unless_zero(const row &decides) const { return on({decides.at(), UINT64_MAX, 1, true}); }
  // As a member of a struct that is a part of the record.
  constexpr row part_of(const row &whole) const {
    return with(&row::offset, static_cast<std::uint16_t>(offset + whole.offset))
        .with(&row::part, whole.field)
        .with(&row::part_name, whole.name)
        .with(&row::part_meaning, whole.meaning)
        .with(&row::identifies, identifies || whole.identifies)
        .with(&row::of_part, whole.condition);
  }

 private:
  std::size_t size_said_in(record_bytes record) const;

  constexpr row on(const field_condition &decisive) const { return with(&row::condition, decisive); }
};

// Records that follow another one, as many as a number of its says.
struct follower {
  std::string_view name;  // what programs call them
  number_at count;
  const record_description *each;
  std::int64_t most = INT64_MAX;  // where there are more, none of them says anything
};

inline constexpr std::size_t most_followers = 2;  // kinds of them behind a record

struct record_description {
  std::string_view name;  // of the struct
  std::string_view noun;  // what programs call one
  std::size_t size;
  std::span<const row> rows;
  std::span<const follower> followers;  // in their order
};

// How a member of this type lies in its record, and that of an array's elements. What is no struct and none
// of those below does not compile.
template <class Member>
consteval field_type type_of_part() {
  static_assert(std::is_class_v<Member>);
  return field_type::record;
}
template <class Member>
inline constexpr field_type type_of = type_of_part<Member>();
template <>
inline constexpr field_type type_of<std::uint8_t> = field_type::u8;
template <>
inline constexpr field_type type_of<std::uint16_t> = field_type::u16;
template <>
inline constexpr field_type type_of<std::uint32_t> = field_type::u32;
template <>
inline constexpr field_type type_of<std::uint64_t> = field_type::u64;
template <>
inline constexpr field_type type_of<std::int32_t> = field_type::i32;
template <>
inline constexpr field_type type_of<std::int64_t> = field_type::i64;
template <>
inline constexpr field_type type_of<uuid> = field_type::uuid;
template <std::size_t Width>
inline constexpr field_type type_of<text_field<Width>> = field_type::text;
template <class Element, std::size_t N>
inline constexpr field_type type_of<Element[N]> = type_of<Element>;
template <std::size_t N>
inline constexpr field_type type_of<std::uint8_t[N]> = field_type::bytes;

template <class Member>
constexpr row row_of(std::string_view member, std::size_t offset) {
  constexpr bool is_array = std::is_array_v<Member> && type_of<Member> != field_type::bytes;
  constexpr std::size_t count = is_array ? std::extent_v<Member> : 1;
  row made;
  made.field = member.substr(member.rfind('.') + 1);
  made.offset = static_cast<std::uint16_t>(offset);
  made.size = sizeof(Member) / count;
  made.count = count;
  made.type = type_of<Member>;
  return made;
}

// The row of a member of `record`, a type that is in sight where this stands; unread until more is said.
#define ROW(member) row_of<decltype(std::declval<record>().member)>(#member, offsetof(record, member))

// Where the number of this name lies. A name that is none does not compile.
template <std::size_t N>
consteval number_at row_at(const std::array<row, N> &rows, std::string_view field) {
  std::size_t i = 0;
  while (rows[i].field != field) ++i;
  return rows[i].at();
}

// Rows and arrays of rows, as one array.
template <class Part>
inline constexpr std::size_t rows_of = std::tuple_size_v<Part>;
template <>
inline constexpr std::size_t rows_of<row> = 1;

constexpr row *append(row *to, const row &part) {
  *to = part;
  return to + 1;
}
template <std::size_t N>
constexpr row *append(row *to, const std::array<row, N> &part) {
  for (const row &each : part) *to++ = each;
  return to;
}

template <class... Parts>
constexpr auto join(const Parts &...parts) {
  std::array<row, (rows_of<Parts> + ...)> all{};
  row *end = all.data();
  ((end = append(end, parts)), ...);
  return all;
}

// Never defined: a call to it stops the compiler, with the reason in the call.
void bad_description(const char *reason);

// Whether the struct's own trailing_size(), where it has one, counts what its followers say.
template <class Record>
consteval bool agrees_with(std::span<const follower> followers) {
  if constexpr (requires(const Record &record) { record.trailing_size(); }) {
    for (const follower &each : followers) {
      std::array<std::byte, sizeof(Record)> bytes{};
      bytes[each.count.offset] = std::byte{3};
      if (std::bit_cast<Record>(bytes).trailing_size() != 3 * each.each->size) return false;
    }
  }
  return true;
}

// Whether a field that identifies depends on fields that identify by themselves, if on any, and is one value.
consteval bool can_identify(const row &field, std::span<const row> rows) {
  const auto decides = [&](std::size_t offset) {
    for (const row &each : rows) {
      if (each.offset == offset) return each.is_key() && !each.depends();
    }
    return false;
  };
  return field.count == 1 && field.size <= UINT8_MAX &&
         (!field.condition.mask || decides(field.condition.at.offset)) &&
         (!field.of_part.mask || decides(field.of_part.at.offset)) &&
         (!field.length || decides(field.length->offset));
}

template <class Record>
consteval record_description describe(std::string_view name, std::string_view noun, std::span<const row> rows,
                                      std::span<const follower> followers = {}) {
  std::size_t end = 0;
  for (const row &each : rows) {
    if (each.offset != end) bad_description("rows do not tile the record");
    end += std::size_t{each.size} * each.count;
    const bool says_so = each.field.starts_with("reserved") || !each.part.empty();
    if (each.kind == field_kind::unread && !says_so) bad_description("nothing is said of a field");
    if (each.type == field_type::text && each.length && each.length->type != field_type::u32) {
      bad_description("the length of a text is no u32");
    }
    if (each.kind == field_kind::address && each.length && each.size != 16) {
      bad_description("an address of any length needs room for the longest");
    }
    if (each.is_key() && !can_identify(each, rows)) {
      bad_description("what identifies is no single value, or depends on what does not");
    }
  }
  if (end != sizeof(Record)) bad_description("rows do not tile the record");
  if (followers.size() > most_followers) bad_description("too many kinds of followers");
  for (std::size_t i = 0; i < followers.size(); ++i) {
    const field_type type = followers[i].count.type;
    if (type != field_type::u8 && type != field_type::u16 && type != field_type::u32) {
      bad_description("a count may be negative, or more than 64 bits hold of bytes");
    }
    if (i && followers[i].each->followers.empty() && !followers[i - 1].each->followers.empty()) {
      bad_description("followers with followers come last");
    }
  }
  if (!agrees_with<Record>(followers)) bad_description("trailing_size() counts otherwise");
  return {name, noun, sizeof(Record), rows, followers};
}

#endif
