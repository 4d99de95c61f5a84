// Every table with substitutes for addresses and process names, record by record: what is not known to be
// harmless does not get through. Bytes that no one reads may hold anything, so they are zeroed.

#include "lab/redacted_tables.h"

#include <algorithm>

#include "common/arena.h"
#include "common/channel.h"
#include "common/counters.h"
#include "common/flow.h"
#include "common/netns.h"
#include "common/provider.h"
#include "lab/tables.h"

namespace lab {

namespace {

template <class... Fields>
void clear(Fields &...fields) {
  (std::memset(&fields, 0, sizeof fields), ...);
}

// Clears what an earlier, longer text may have left behind a text.
template <std::size_t Width>
void clear_rest(text_field<Width> &field) {
  const std::size_t length = field.view().size();
  std::memset(field.bytes + length, 0, Width - length);
}

template <std::size_t Width>
void redact_process(text_field<Width> &field, substitutes &by) {
  set_text(field, by.process(field.view()));
}

// A name in which those of processes may stand.
template <std::size_t Width>
void redact_text(text_field<Width> &field, const substitutes &by) {
  set_text(field, by.without_processes(field.view()));
}

void redact(socket_address &address, std::uint8_t family, substitutes &by) {
  if (family == address_family::ipv4) {
    by.replace(address.ipv4);
  } else {
    clear(address.ipv4);
  }
  if (family == address_family::ipv6) {
    by.replace(address.ipv6);
  } else {
    clear(address.ipv6);
  }
}

void redact(nexus_provider_record &record, substitutes &by) {
  nexus_provider_parameters &shown = record.parameters;
  const std::size_t length = shown.name.view().size();
  redact_text(shown.name, by);
  if (shown.name_length == length) shown.name_length = static_cast<std::uint32_t>(shown.name.view().size());
  clear(record.reserved_16, shown.reserved_72, shown.reserved_112, shown.reserved_132, record.reserved_260);
}

void redact(tv_stats_flow &flow, substitutes &by) {
  clear_rest(flow.sf_if_name);
  redact_process(flow.sf_proc_name, by);
  const std::uint8_t family = flow.sf_local.family;
  redact(flow.sf_local, family, by);
  redact(flow.sf_remote, family, by);
  clear(flow.reserved_137, flow.reserved_148, flow.reserved_280);
  clear(flow.sf_lstats.reserved_24, flow.sf_rstats.reserved_24);
}

void redact(tv_stats_flow_adv &record, substitutes & /*by*/) {
  clear_rest(record.sfa_if_name);
}

void redact(tv_stats_flow_owner &owner, substitutes &by) {
  clear_rest(owner.sfo_if_name);
  redact_process(owner.sfo_proc_name, by);
  clear(owner.reserved_84);
}

void redact(tv_stats_flow_route &route, substitutes &by) {
  clear_rest(route.sfr_if_name);
  const std::uint8_t family = route.sfr_remote.family;
  for (socket_address *address : {&route.sfr_local, &route.sfr_remote, &route.sfr_gateway}) {
    redact(*address, family, by);
  }
  by.replace_mac(route.sfr_mac);
  clear(route.reserved_0, route.reserved_156, route.reserved_198);
}

void redact(tv_stats_net_if &record, substitutes & /*by*/) {
  clear_rest(record.head.name);
  clear(record.reserved_264);
}

void redact(tv_stats_flow_switch &record, substitutes & /*by*/) {
  clear_rest(record.head.name);
}

void redact(tv_stats_userstack &stack, substitutes & /*by*/) {
  clear_rest(stack.if_name);
  clear(stack.reserved_36, stack.reserved_392, stack.reserved_2312);
}

void redact(tv_stats_arena &arena, substitutes &by) {
  redact_text(arena.name, by);
  clear(arena.reserved_68);
  for (tv_stats_region &region : arena.regions) {
    redact_text(region.name, by);
    clear(region.reserved_168);
  }
}

void redact(tv_stats_netns &space, substitutes &by) {
  ipv4_address ipv4{};
  ipv6_address ipv6{};
  if (space.address_length == sizeof ipv4) std::memcpy(&ipv4, space.address, sizeof ipv4);
  if (space.address_length == sizeof ipv6) std::memcpy(&ipv6, space.address, sizeof ipv6);
  by.replace(ipv4);
  by.replace(ipv6);
  std::memcpy(space.address, &ipv6, sizeof ipv6);
  if (space.address_length == sizeof ipv4) std::memcpy(space.address, &ipv4, sizeof ipv4);
  clear(space.reserved_19);
}

void redact(tv_stats_netns_range &range, substitutes & /*by*/) {
  clear(range.reserved_12, range.reserved_20);
}

void redact(ring_stats &ring, substitutes & /*by*/) {
  clear(ring.reserved_4, ring.reserved_64, ring.reserved_144, ring.reserved_176);
}

// What has nothing to hide.
void redact(uuid & /*id*/, substitutes & /*by*/) {}
void redact(tv_stats_flow_adv_entry & /*entry*/, substitutes & /*by*/) {}

template <class Record>
bool redact_array(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  for (Record record; walk.take(record);) {
    redact(record, by);
    file.put(record);
  }
  return walk.at_end();
}

template <class Record, class Item>
bool redact_lists(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  std::span<const std::byte> items;
  for (Record record; walk.take(record, items);) {
    redact(record, by);
    file.put(record);
    redact_array<Item>(items, by, file);
  }
  return walk.at_end();
}

bool redact_channels(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  for (nexus_channel_header header; walk.take(header);) {
    clear(header.reserved_20);
    file.put(header);
    for (std::uint32_t left = header.channel_count; left; --left) {
      channel_entry entry;
      std::span<const std::byte> rings;
      if (!walk.take(entry, rings)) return false;
      clear(entry.reserved_40);
      file.put(entry);
      redact_array<ring_stats>(rings, by, file);
    }
  }
  return walk.at_end();
}

// Its one byte.
bool redact_switch(std::span<const std::byte> table, substitutes & /*by*/, table_file &file) {
  file.put(table.first(std::min<std::size_t>(table.size(), 1)));
  return table.size() == 1;
}

constexpr struct {
  std::string_view node;
  bool (*redact)(std::span<const std::byte>, substitutes &, table_file &);
} rows[] = {
    {provider_list_node, redact_lists<nexus_provider_record, uuid>},
    {ring_stat_enable_node, redact_switch},
    {channel_list_node, redact_channels},
    {flow_adv_node, redact_lists<tv_stats_flow_adv, tv_stats_flow_adv_entry>},
    {flow_owner_node, redact_array<tv_stats_flow_owner>},
    {flow_route_node, redact_array<tv_stats_flow_route>},
    {net_if_node, redact_array<tv_stats_net_if>},
    {flow_switch_node, redact_array<tv_stats_flow_switch>},
    {userstack_node, redact_array<tv_stats_userstack>},
    {arena_node, redact_array<tv_stats_arena>},
    {netns_node, redact_lists<tv_stats_netns, tv_stats_netns_range>},
    {flow_node, redact_array<tv_stats_flow>},
};

}  // namespace

bool redact_table(std::string_view node, std::span<const std::byte> table, substitutes &by,
                  table_file &file) {
  const auto row = std::ranges::find(rows, node, [](const auto &entry) { return entry.node; });
  return row != std::end(rows) && row->redact(table, by, file);
}

}  // namespace lab
