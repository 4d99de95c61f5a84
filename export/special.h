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

// Beside an address that may be of either family stands its scope, which the kernel hides in the address.
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
