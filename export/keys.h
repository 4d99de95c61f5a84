// What programs are told of each table: its kinds of lines and their keys, as the rows of the records say.
//
// From keys follow the lines themselves (line_plan.h), the schema and the statements for ClickHouse. What a
// row cannot say is in special.h.

#ifndef TARVELCTL_EXPORT_KEYS_H
#define TARVELCTL_EXPORT_KEYS_H

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "common/tables/tables.h"

namespace exporter {

// How a value is written, whatever number or bytes it is made of.
enum class value_form : std::uint8_t {
  integer,
  boolean,
  text,
  uuid,
  address,
  scope,  // of an address
  mac,
  enumeration,
  flags,
  process,  // the name that the kernel gives for a pid
  time,
  object,
};

struct key {
  std::string_view name;
  std::string_view meaning;
  std::string_view unit;
  value_form form = value_form::object;
  bool is_array = false;
  bool may_be_null = false;  // or its elements, where it is an array

  const row *field = nullptr;  // where the value lies; of an array in place, its elements
  std::size_t element = 0;     // which of the field's elements it is, where it is one
  const row *ipv6 = nullptr;   // of an address: the field to look at where `field` does not hold

  // Of an object its members; of an array of records those of each. Members without a name are the elements
  // themselves.
  std::vector<key> members = {};
  const record_description *each = nullptr;    // of an array of records
  std::size_t behind = SIZE_MAX;               // where they follow: which of the record's followers they are
  const field_condition *counts_if = nullptr;  // where they lie in the record: which of them say anything
};

// Of an integer.
struct integer_width {
  unsigned bits;
  bool is_signed;
};
integer_width width_of(const key &of);

// A kind of lines: one for each record of its sort, in the order of the table.
struct kind {
  std::string_view name;
  const table_description *table;
  const record_description *record;
  const record_description *parent;  // the record that this one follows; null where it begins the table
  std::vector<key> parent_keys;      // what of the parent each line says, in front of its own keys
  std::vector<key> keys;

  // All keys of its lines, the common ones first.
  std::vector<key> all_keys() const;
};

// The version of all this: it grows when a key goes or changes its meaning.
inline constexpr int schema_version = 1;

// Every kind, in the order in which they are written. Those of one table stand together.
const std::vector<kind> &all_kinds();

}  // namespace exporter

#endif
