#include "common/joins.h"

#include <algorithm>
#include <array>
#include <string>

#include "common/tables/record_walk.h"
#include "common/tables/table_walk.h"

namespace {

constexpr std::size_t name_size = sizeof(tv_stats_arena::name);
constexpr std::int32_t nexus_arena = arena_types.number("NEXUS");

// What is made when it is first asked for.
template <class Kept, class Make>
const Kept &made(std::optional<Kept> &kept, Make make) {
  if (!kept) make(kept.emplace());
  return *kept;
}

// A text field where it lies.
std::string_view text_in(record_bytes field) {
  const std::string_view whole(reinterpret_cast<const char *>(field.data()), field.size());
  return whole.substr(0, whole.find('\0'));
}

template <std::size_t Size>
std::array<char, Size> padded(std::string_view text) {
  std::array<char, Size> field{};
  std::ranges::copy(text, field.begin());
  return field;
}

bool is_known(std::uint8_t family) {
  return family == address_family::ipv4 || family == address_family::ipv6;
}

index_key address_key(std::uint8_t family, const socket_address &address) {
  return family == address_family::ipv6 ? index_key(address.ipv6) : index_key(address.ipv4);
}

}  // namespace

record_bytes joins::table(const table_description &which) const {
  const table_reading *const reading = moment_.find(which);
  return reading ? reading->bytes() : record_bytes();
}

// Calls `visit` with each record and where it lies, all that follows it included.
template <class Record, class Visit>
void joins::walk(const table_description &which, Visit visit) const {
  walk_table(*which.record, table(which), [&](const found_record &found) {
    visit(record_at<Record>(found.bytes, 0),
          record_bytes(found.bytes.data(), found.bytes.size() + found.followers[0].size()));
  });
}

// Equal parts have equal numbers, whatever they are.
std::uint32_t joins::number_of(const index_key &part) {
  if (numbers_.add(part, number_count_)) ++number_count_;
  return numbers_.find(part);
}

index_key joins::port_key(const uuid &nexus, std::uint32_t port) {
  return {number_of(nexus), port};
}

// The name fits in a field.
index_key joins::name_key(std::string_view name, std::int32_t pid) {
  constexpr std::size_t size = sizeof(index_key);
  static_assert(name_size == 4 * size);
  const std::array<char, name_size> field = padded<name_size>(name);
  std::array<std::uint32_t, 4> quarters;
  for (std::size_t i = 0; i < quarters.size(); ++i) {
    quarters[i] = number_of(padded<size>({&field[i * size], size}));
  }
  return {number_of(quarters), pid};
}

index_key joins::route_key(std::string_view interface, std::uint8_t family, const socket_address &local,
                           const socket_address &remote) {
  return {number_of(padded<sizeof(index_key)>(interface)), number_of(address_key(family, local)),
          number_of(address_key(family, remote)), family};
}

const joins::records_by_key &joins::providers() {
  return made(providers_, [&](records_by_key &by_nexus) {
    walk<nexus_provider_record>(table_of(provider_list_node), [&](const auto &, record_bytes bytes) {
      record_walk instances(bytes.subspan(sizeof(nexus_provider_record)));
      for (uuid nexus; instances.take(nexus);) by_nexus.add(nexus, bytes);
    });
  });
}

const joins::records_by_key &joins::interfaces() {
  return made(interfaces_, [&](records_by_key &by_nexus) {
    const auto add = [&](const auto &nexus, record_bytes bytes) {
      by_nexus.add(nexus.head.nx_uuid,
                   bytes.subspan(offsetof(tv_stats_nexus_head, name), sizeof nexus.head.name));
    };
    walk<tv_stats_net_if>(table_of(net_if_node), add);
    walk<tv_stats_flow_switch>(table_of(flow_switch_node), add);
  });
}

const joins::records_by_key &joins::owners() {
  return made(owners_, [&](records_by_key &by_port) {
    walk<tv_stats_flow_owner>(table_of(flow_owner_node),
                              [&](const tv_stats_flow_owner &owner, record_bytes bytes) {
                                by_port.add(port_key(owner.sfo_nx_uuid, owner.sfo_nx_port), bytes);
                              });
  });
}

const joins::records_by_key &joins::advisories() {
  return made(advisories_, [&](records_by_key &by_nexus) {
    walk<tv_stats_flow_adv>(table_of(flow_adv_node),
                            [&](const tv_stats_flow_adv &advisories, record_bytes bytes) {
                              by_nexus.add(advisories.sfa_nx_uuid, bytes);
                            });
  });
}

const joins::records_by_key &joins::routes() {
  return made(routes_, [&](records_by_key &by_ends) {
    walk<tv_stats_flow_route>(
        table_of(flow_route_node), [&](const tv_stats_flow_route &route, record_bytes bytes) {
          const std::uint8_t family = route.sfr_remote.family;
          if (!is_known(family)) return;
          by_ends.add(route_key(route.sfr_if_name.view(), family, route.sfr_local, route.sfr_remote), bytes);
        });
  });
}

const joins::records_by_key &joins::flows_by_pid() {
  return made(flows_by_pid_, [&](records_by_key &by_pid) {
    walk<tv_stats_flow>(table_of(flow_node), [&](const tv_stats_flow &flow, record_bytes bytes) {
      by_pid.add(flow.sf_pid, bytes);
    });
  });
}

const joins::channel_lists &joins::channels() {
  return made(channels_, [&](channel_lists &lists) {
    walk_channels(table(table_of(channel_list_node)), [&](const channel_ref &ref) {
      if (!ref.entry) return;
      const channel_entry channel = ref.channel();
      lists.by_port.add(port_key(ref.nexus().nexus_uuid, channel.port), ref);
      lists.by_pid.add(channel.pid, ref);
    });
  });
}

const joins::arena_lists &joins::arenas() {
  return made(arenas_, [&](arena_lists &lists) {
    walk<tv_stats_arena>(table_of(arena_node), [&](const tv_stats_arena &arena, record_bytes bytes) {
      const auto *const end = std::ranges::find(arena.pids, 0);
      for (const std::int32_t *pid = arena.pids; pid != end; ++pid) {
        if (std::find(arena.pids, pid, *pid) != pid) continue;  // named twice
        lists.by_pid.add(*pid, bytes);
        if (arena.type != nexus_arena) continue;
        lists.nexus_by_pid.add(*pid, bytes);
        lists.nexus_by_name.add(name_key(arena.name.view(), *pid), bytes);
      }
    });
  });
}

record_bytes joins::provider_of(const uuid &nexus) {
  return providers().first(nexus);
}

std::string_view joins::provider_name_of(const uuid &nexus) {
  const record_bytes found = provider_of(nexus);
  if (found.empty()) return {};
  const auto parameters = record_at<nexus_provider_record>(found, 0).parameters;
  const record_bytes name =
      found.subspan(offsetof(nexus_provider_record, parameters.name), sizeof parameters.name);
  return text_in(name).substr(0, parameters.name_length);
}

std::string_view joins::interface_of(const uuid &nexus) {
  return text_in(interfaces().first(nexus));
}

template <class Value>
Value joins::at_port_of(const tv_stats_flow &flow, const lists_by_key<Value> &by_port) {
  if (flow.sf_nx_port == no_index) return {};
  return by_port.first(port_key(flow.sf_nx_uuid, flow.sf_nx_port));
}

channel_ref joins::channel_of(const tv_stats_flow &flow) {
  return at_port_of(flow, channels().by_port);
}

record_bytes joins::owner_of(const tv_stats_flow &flow) {
  return at_port_of(flow, owners());
}

record_bytes joins::advisory_of(const tv_stats_flow &flow) {
  const record_bytes found = advisories().first(flow.sf_nx_uuid);
  if (found.empty()) return {};
  const std::uint32_t count = record_at<tv_stats_flow_adv>(found, 0).sfa_entries_count;
  if (count > tv_stats_flow_adv::max_entries || flow.sf_adv_idx >= count) return {};
  constexpr std::size_t size = sizeof(tv_stats_flow_adv_entry);
  return found.subspan(sizeof(tv_stats_flow_adv) + flow.sf_adv_idx * size, size);
}

record_bytes joins::route_of(const tv_stats_flow &flow) {
  const std::uint8_t family = flow.sf_local.family;
  if (!is_known(family)) return {};
  return routes().first(route_key(flow.sf_if_name.view(), family, flow.sf_local, flow.sf_remote));
}

record_bytes joins::arena_of(const tv_stats_flow &flow) {
  std::string name(provider_name_of(flow.sf_nx_uuid));
  name.append(".port").append(std::to_string(flow.sf_nx_port));
  if (name.size() <= name_size) {
    const record_bytes named = arenas().nexus_by_name.first(name_key(name, flow.sf_pid));
    if (!named.empty()) return named;
  }
  const bool is_clear = arenas().nexus_by_pid.is_single(flow.sf_pid) &&
                        channels().by_pid.is_single(flow.sf_pid) &&
                        channels().by_pid.first(flow.sf_pid).entry == channel_of(flow).entry;
  return is_clear ? arenas().nexus_by_pid.first(flow.sf_pid) : record_bytes();
}

joins::memory joins::memory_of(std::int32_t pid) {
  memory sum;
  key_index seen;
  for_each_arena_of(pid, [&](record_bytes bytes) {
    for (const tv_stats_region &region : record_at<tv_stats_arena>(bytes, 0).regions) {
      if (region.seg_count == 0 || !seen.add(region.region_uuid, 0)) continue;
      sum.total += region.mem_total;
      sum.wired += region.mem_wired;
    }
  });
  return sum;
}
