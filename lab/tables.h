// Every table of the kernel: how the world looks in it.

#ifndef TARVELCTL_LAB_TABLES_H
#define TARVELCTL_LAB_TABLES_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>
#include <vector>

#include "common/tables/tables.h"
#include "common/text/text.h"
#include "lab/table_file.h"
#include "lab/world.h"

namespace lab {

struct table {
  const table_description *what;

  // Writes the table's bytes.
  void (*write)(const world &, table_file &);
};

// In the order in which they are published: what others refer to comes first.
extern const std::span<const table> tables;

// Each in the file of its name.
void write_providers(const world &, table_file &);
void write_channels(const world &, table_file &);
void write_ring_stat_enable(const world &, table_file &);
void write_flows(const world &, table_file &);
void write_advisories(const world &, table_file &);
void write_owners(const world &, table_file &);
void write_routes(const world &, table_file &);
void write_net_ifs(const world &, table_file &);
void write_flow_switches(const world &, table_file &);
void write_userstacks(const world &, table_file &);
void write_arenas(const world &, table_file &);
void write_namespaces(const world &, table_file &);

// Fills a text field: cut to its width, the rest NUL.
template <std::size_t Width>
void set_text(text_field<Width> &field, std::string_view text) {
  std::memset(field.bytes, 0, Width);
  std::memcpy(field.bytes, text.data(), std::min(text.size(), Width));
}

}  // namespace lab

#endif
