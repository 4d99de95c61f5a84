// Every record with what of it may be shown, field by field. What is not named here is zero, so that a field
// has to be known to get through; what stands in place of names and addresses is decided in
// lab/substitutes.h.

#include "lab/redacted_tables.h"

#include <algorithm>
#include <vector>

#include "common/tables/arena.h"
#include "common/tables/channel.h"
#include "common/tables/counters.h"
#include "common/tables/flow.h"
#include "common/tables/netns.h"
#include "common/tables/provider.h"
#include "lab/tables.h"

namespace lab {

namespace {

template <std::size_t Width>
text_field<Width> field_of(std::string_view text) {
  text_field<Width> field;
  set_text(field, text);
  return field;
}

template <std::size_t Width>
text_field<Width> interface(const text_field<Width> &name, substitutes &by) {
  return field_of<Width>(by.interface(name.view()));
}

template <std::size_t Width>
text_field<Width> process(const text_field<Width> &name, substitutes &by) {
  return field_of<Width>(by.process(name.view()));
}

template <std::size_t Width>
text_field<Width> numbered(std::string_view word, const text_field<Width> &text, substitutes &by) {
  return field_of<Width>(by.numbered(word, text.view()));
}

// The address that the family says is there, and nothing else.
socket_address address(const socket_address &from, std::uint8_t family, substitutes &by) {
  socket_address to{};
  if (family == address_family::ipv4) by.replace(to.ipv4 = from.ipv4);
  if (family == address_family::ipv6) by.replace(to.ipv6 = from.ipv6);
  return to;
}

// Where there is no address, no one reads the port.
socket_address endpoint(const socket_address &from, std::uint8_t family, substitutes &by) {
  socket_address to = address(from, family, by);
  if (family == address_family::ipv4 || family == address_family::ipv6) to.port = from.port;
  return to;
}

uuid redacted(const uuid &id, substitutes & /*by*/) {
  return id;
}

nexus_provider_record redacted(const nexus_provider_record &from, substitutes &by) {
  const nexus_provider_parameters &p = from.parameters;
  const std::string name = by.numbered("provider", p.name.view());
  return {.provider_uuid = from.provider_uuid,
          .parameters = {.name = field_of<64>(name),
                         .name_length = p.name_length ? static_cast<std::uint32_t>(name.size()) : 0,
                         .type = p.type,
                         .flags = p.flags,
                         .format = p.format,
                         .tx_rings = p.tx_rings,
                         .rx_rings = p.rx_rings,
                         .tx_slots = p.tx_slots,
                         .rx_slots = p.rx_slots,
                         .buf_size = p.buf_size,
                         .meta_size = p.meta_size,
                         .pipes = p.pipes,
                         .subtype = p.subtype,
                         .mhints = p.mhints,
                         .ifindex = p.ifindex},
          .instance_count = from.instance_count};
}

nexus_channel_header redacted(const nexus_channel_header &from, substitutes & /*by*/) {
  return {.nexus_uuid = from.nexus_uuid, .channel_count = from.channel_count};
}

channel_entry redacted(const channel_entry &from, substitutes & /*by*/) {
  return {.channel_uuid = from.channel_uuid,
          .flags = from.flags,
          .pid = from.pid,
          .fd = from.fd,
          .port = from.port,
          .n_tx_rings = from.n_tx_rings,
          .n_rx_rings = from.n_rx_rings};
}

ring_stats redacted(const ring_stats &from, substitutes & /*by*/) {
  return {.ring_id = from.ring_id,
          .xfer = from.xfer,
          .mem_total = from.mem_total,
          .mem_used = from.mem_used,
          .sync = from.sync,
          .err_corrupted = from.err_corrupted,
          .err_len_modified = from.err_len_modified,
          .err_len_too_large = from.err_len_too_large};
}

tv_flow_endpoint_stats redacted(const tv_flow_endpoint_stats &from) {
  return {.bytes = from.bytes, .packets = from.packets, .state = from.state, .rtt = from.rtt};
}

tv_stats_flow redacted(const tv_stats_flow &from, substitutes &by) {
  const std::uint8_t family = from.sf_local.family;
  tv_stats_flow to{.sf_nx_uuid = from.sf_nx_uuid,
                   .sf_if_name = interface(from.sf_if_name, by),
                   .sf_bucket = from.sf_bucket,
                   .sf_proc_name = process(from.sf_proc_name, by),
                   .sf_pid = from.sf_pid,
                   .sf_flags = from.sf_flags,
                   .sf_nx_port = from.sf_nx_port,
                   .sf_local = endpoint(from.sf_local, family, by),
                   .sf_remote = endpoint(from.sf_remote, family, by),
                   .sf_protocol = from.sf_protocol,
                   .sf_svc = from.sf_svc,
                   .sf_adv_idx = from.sf_adv_idx,
                   .sf_lstats = redacted(from.sf_lstats),
                   .sf_rstats = redacted(from.sf_rstats)};
  to.sf_local.family = family;
  return to;
}

tv_stats_flow_adv redacted(const tv_stats_flow_adv &from, substitutes &by) {
  return {.sfa_nx_uuid = from.sfa_nx_uuid,
          .sfa_if_name = interface(from.sfa_if_name, by),
          .sfa_pid = from.sfa_pid,
          .sfa_entries_count = from.sfa_entries_count};
}

tv_stats_flow_adv_entry redacted(const tv_stats_flow_adv_entry &from, substitutes & /*by*/) {
  return {.sfae_flow_uuid = from.sfae_flow_uuid, .sfae_flags = from.sfae_flags};
}

tv_stats_flow_owner redacted(const tv_stats_flow_owner &from, substitutes &by) {
  return {.sfo_nx_uuid = from.sfo_nx_uuid,
          .sfo_if_name = interface(from.sfo_if_name, by),
          .sfo_bucket = from.sfo_bucket,
          .sfo_proc_name = process(from.sfo_proc_name, by),
          .sfo_pid = from.sfo_pid,
          .sfo_nx_port = from.sfo_nx_port,
          .sfo_pid_bound = from.sfo_pid_bound,
          .sfo_destroyed = from.sfo_destroyed};
}

tv_stats_flow_route redacted(const tv_stats_flow_route &from, substitutes &by) {
  const std::uint8_t family = from.sfr_remote.family;
  tv_stats_flow_route to{.sfr_if_name = interface(from.sfr_if_name, by),
                         .sfr_bidx = from.sfr_bidx,
                         .sfr_ibidx = from.sfr_ibidx,
                         .sfr_flags = from.sfr_flags,
                         .sfr_refs = from.sfr_refs,
                         .sfr_expire = from.sfr_expire,
                         .sfr_local = address(from.sfr_local, family, by),
                         .sfr_remote = address(from.sfr_remote, family, by)};
  to.sfr_remote.family = family;
  if (from.sfr_flags & from.has_gateway) to.sfr_gateway = address(from.sfr_gateway, family, by);
  if (from.sfr_flags & from.has_mac) {
    std::ranges::copy(from.sfr_mac, to.sfr_mac);
    by.replace_mac(to.sfr_mac);
  }
  return to;
}

// Both nexus tables.
template <class Record>
Record redacted_counters(const Record &from, substitutes &by) {
  Record to{.head = {.nx_uuid = from.head.nx_uuid, .name = interface(from.head.name, by)}};
  std::ranges::copy(from.counters, to.counters);
  return to;
}

tv_stats_net_if redacted(const tv_stats_net_if &from, substitutes &by) {
  return redacted_counters(from, by);
}

tv_stats_flow_switch redacted(const tv_stats_flow_switch &from, substitutes &by) {
  return redacted_counters(from, by);
}

tv_stats_userstack redacted(const tv_stats_userstack &from, substitutes &by) {
  tv_stats_userstack to{.nx_uuid = from.nx_uuid, .if_name = interface(from.if_name, by), .pid = from.pid};
  std::ranges::copy(from.ip, to.ip);
  std::ranges::copy(from.ip6, to.ip6);
  std::ranges::copy(from.tcp, to.tcp);
  std::ranges::copy(from.udp, to.udp);
  return to;
}

// An empty slot is not shown, but counts in the report's summary.
tv_stats_region redacted(const tv_stats_region &from, substitutes &by) {
  if (from.seg_count == 0) {
    return {.region_uuid = from.region_uuid,
            .type = from.type,
            .mem_total = from.mem_total,
            .mem_wired = from.mem_wired};
  }
  return {.name = numbered("region", from.name, by),
          .region_uuid = from.region_uuid,
          .type = from.type,
          .mode = from.mode,
          .seg_size_req = from.seg_size_req,
          .seg_size = from.seg_size,
          .seg_count = from.seg_count,
          .obj_size_req = from.obj_size_req,
          .obj_count_req = from.obj_count_req,
          .obj_size = from.obj_size,
          .obj_count = from.obj_count,
          .objs_per_seg = from.objs_per_seg,
          .mem_total = from.mem_total,
          .mem_wired = from.mem_wired,
          .seg_in_use = from.seg_in_use,
          .rescales = from.rescales,
          .allocs = from.allocs,
          .frees = from.frees};
}

tv_stats_arena redacted(const tv_stats_arena &from, substitutes &by) {
  tv_stats_arena to{.name = numbered("arena", from.name, by), .type = from.type};
  for (std::size_t i = 0; i < from.region_slots; ++i) to.regions[i] = redacted(from.regions[i], by);
  std::copy(from.pids, std::ranges::find(from.pids, 0), to.pids);
  return to;
}

tv_stats_netns redacted(const tv_stats_netns &from, substitutes &by) {
  tv_stats_netns to{
      .address_length = from.address_length, .protocol = from.protocol, .entry_count = from.entry_count};
  const auto put = [&](auto space) {
    std::memcpy(&space, from.address, sizeof space);
    by.replace(space);
    std::memcpy(to.address, &space, sizeof space);
  };
  if (from.address_length == sizeof(ipv4_address)) put(ipv4_address{});
  if (from.address_length == sizeof(ipv6_address)) put(ipv6_address{});
  return to;
}

tv_stats_netns_range redacted(const tv_stats_netns_range &from, substitutes & /*by*/) {
  return {.first_port = from.first_port,
          .last_port = from.last_port,
          .subsystem = from.subsystem,
          .bsd = from.bsd,
          .listeners = from.listeners};
}

// Whether anyone reads what follows a record. A list of too many advisories ends the report that shows it.
template <class Record>
bool items_are_read(const Record & /*record*/) {
  return true;
}

bool items_are_read(const tv_stats_flow_adv &record) {
  return record.sfa_entries_count <= tv_stats_flow_adv::max_entries;
}

template <class Record>
bool redact_array(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  for (Record record; walk.take(record);) {
    file.put(redacted(record, by));
  }
  return walk.at_end();
}

template <class Record, class Item>
bool redact_lists(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  std::span<const std::byte> items;
  for (Record record; walk.take(record, items);) {
    file.put(redacted(record, by));
    const std::vector<std::byte> zeros(items_are_read(record) ? 0 : items.size());
    file.put(std::as_bytes(std::span(zeros)));
    if (zeros.empty()) redact_array<Item>(items, by, file);
  }
  return walk.at_end();
}

bool redact_channels(std::span<const std::byte> table, substitutes &by, table_file &file) {
  record_walk walk(table);
  for (nexus_channel_header header; walk.take(header);) {
    file.put(redacted(header, by));
    for (std::uint32_t left = header.channel_count; left; --left) {
      channel_entry entry;
      std::span<const std::byte> rings;
      if (!walk.take(entry, rings)) return false;
      file.put(redacted(entry, by));
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

redaction redact_table(std::string_view node, std::span<const std::byte> table, substitutes &by,
                       table_file &file) {
  const auto row = std::ranges::find(rows, node, [](const auto &entry) { return entry.node; });
  if (row == std::end(rows)) return redaction::unknown;
  return row->redact(table, by, file) ? redaction::whole : redaction::cut;
}

}  // namespace lab
