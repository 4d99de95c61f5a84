// Every table of the kernel: how the world looks in it, and whom it mentions.

#ifndef TARVELCTL_LAB_TABLES_H
#define TARVELCTL_LAB_TABLES_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>
#include <vector>

#include "common/tables/record_walk.h"
#include "common/text/text.h"
#include "lab/table_file.h"
#include "lab/world.h"

namespace lab {

struct table {
  const char *node;

  // Writes the table's bytes.
  void (*write)(const world &, table_file &);

  // Adds the ids of the processes that the bytes of such a table mention, whatever they are: the table may be
  // cut or wrong. Null where a table mentions none.
  void (*mentioned)(std::span<const std::byte>, std::vector<std::int32_t> &);
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
void pids_of_channels(std::span<const std::byte>, std::vector<std::int32_t> &);
void pids_of_advisories(std::span<const std::byte>, std::vector<std::int32_t> &);
void pids_of_arenas(std::span<const std::byte>, std::vector<std::int32_t> &);

// The ids in a field of an array of records.
template <class Record, std::int32_t Record::*Pid>
void pids_of_array(std::span<const std::byte> table, std::vector<std::int32_t> &pids) {
  Record record;
  for (record_walk walk(table); walk.take(record);) pids.push_back(record.*Pid);
}

// Fills a text field: cut to its width, the rest NUL.
template <std::size_t Width>
void set_text(text_field<Width> &field, std::string_view text) {
  std::memset(field.bytes, 0, Width);
  std::memcpy(field.bytes, text.data(), std::min(text.size(), Width));
}

}  // namespace lab

#endif
