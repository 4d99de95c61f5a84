// What the rows of the records cannot say.

#ifndef TARVELCTL_EXPORT_SPECIAL_H
#define TARVELCTL_EXPORT_SPECIAL_H

#include "export/keys.h"

namespace exporter {

// A switch is a table, but nothing to write lines of.
constexpr bool has_lines(const table_description &table) {
  return table.record != &ring_stat_enable_description;
}

// Flags of which only one has a name, that of the field itself, are that one: whether a provider is
// anonymous.
constexpr bool is_single_flag(const row &field) {
  return field.flags && field.flags->count == 1 && field.flags->entries[0].name.view() == field.name;
}

// What every line begins with.
inline const std::vector<key> common_keys = {
    {.name = "schema", .meaning = "version of the schema", .form = value_form::integer},
    {.name = "kind", .meaning = "what the line tells of", .form = value_form::text},
    {.name = "time", .meaning = "when the table was read", .form = value_form::time},
    {.name = "host",
     .meaning = "the kernel's own name for itself",
     .form = value_form::text,
     .may_be_null = true},
};

// What the field means where its number is not seen: rows say "0: ..." behind that, and "not 0: ..." of a
// boolean. Of a single flag it is the flag.
constexpr std::string_view shown_meaning(const row &field) {
  constexpr std::string_view not_zero = "not 0: ";
  if (is_single_flag(field)) return field.flags->entries[0].name.view();
  if (field.meaning.starts_with(not_zero)) return field.meaning.substr(not_zero.size());
  return field.none ? field.meaning.substr(0, field.meaning.find(", 0: ")) : field.meaning;
}

// Beside an address that may be of either family stands its scope, which the kernel hides in the address.
inline constexpr std::string_view address_meaning = "address, IPv4 or IPv6";
inline constexpr key scope_key{.name = "scope",
                               .meaning = "index of the interface that an IPv6 address is bound to",
                               .form = value_form::scope,
                               .may_be_null = true};

// A record that names a process by its pid alone is written with the name that the kernel gives for it.
inline constexpr key process_key{.name = "process",
                                 .meaning = "short name of the process",
                                 .form = value_form::process,
                                 .may_be_null = true};
inline constexpr std::string_view processes_name = "processes";
inline constexpr std::string_view processes_meaning = "short names of the processes";

}  // namespace exporter

#endif
