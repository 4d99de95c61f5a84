// kern.tarvel.stats.netns

#include "common/tables/netns.h"

#include <algorithm>
#include <map>

#include "lab/tables.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

struct reservation {
  std::int32_t subsystem = 0;
  std::int32_t bsd = 0;
  std::int32_t listeners = 0;

  void operator+=(const reservation &more) {
    subsystem += more.subsystem;
    bsd += more.bsd;
    listeners += more.listeners;
  }
};

// What the global namespaces hold, whoever runs.
struct known_range {
  std::uint8_t protocol;
  std::uint16_t first;
  std::uint16_t last;
  reservation held;
};

constexpr known_range known_ranges[] = {
    {tcp_protocol, 22, 0, {0, 1, 0}},        {tcp_protocol, 53, 0, {0, 1, 0}},
    {tcp_protocol, 80, 0, {0, 1, 1}},        {tcp_protocol, 443, 0, {0, 2, 2}},
    {tcp_protocol, 49152, 65535, {1, 0, 0}}, {udp_protocol, 53, 0, {0, 1, 0}},
    {udp_protocol, 123, 0, {0, 1, 0}},       {udp_protocol, 500, 0, {1, 0, 0}},
    {udp_protocol, 4500, 0, {1, 0, 0}},      {udp_protocol, 5353, 0, {0, 4, 0}},
    {udp_protocol, 16384, 16403, {1, 0, 0}}, {udp_protocol, 49152, 65535, {1, 0, 0}},
};

constexpr std::size_t most_entries = 255;

// By port.
using reservations = std::map<std::uint16_t, reservation>;

// The namespaces of an address are numbered from 2, TCP's before UDP's; 0 and 1 are the global ones.
std::size_t number_of(std::uint32_t ordinal, address_kind kind, bool udp) {
  return 2 + (std::size_t{ordinal} * address_kinds + static_cast<std::size_t>(kind)) * 2 + udp;
}

// What flows hold in the namespaces of their local addresses.
std::vector<reservations> reservations_of_flows(const world &state) {
  std::vector<reservations> held(state.size.namespaces);
  for (const flow &holder : state.flows) {
    const bool udp = holder.use->protocol == udp_protocol;
    std::size_t number = udp;
    if (holder.route != none) {
      const std::uint32_t ordinal = state.nexuses[state.channels[holder.channel].nexus].ordinal;
      number = number_of(ordinal, state.routes[holder.route].kind, udp);
    }
    if (number >= held.size()) continue;
    constexpr std::size_t most_ports = 200;
    if (held[number].size() < most_ports || held[number].contains(holder.local_port)) {
      held[number][holder.local_port] += {1, 0, !udp && holder.state == tcp::listening};
    }
  }
  return held;
}

tv_stats_netns head_of(const world &state, std::size_t number) {
  tv_stats_netns head{};
  head.protocol = number % 2 ? udp_protocol : tcp_protocol;
  if (number < 2) return head;
  const auto ordinal = static_cast<std::uint32_t>((number - 2) / 2 / address_kinds);
  const auto kind = static_cast<address_kind>((number - 2) / 2 % address_kinds);
  const socket_address address = interface_address(state.seed, ordinal, kind);
  if (kind == address_kind::ipv4) {
    head.address_length = sizeof address.ipv4;
    std::memcpy(head.address, address.ipv4.bytes, sizeof address.ipv4);
    return head;
  }
  head.address_length = sizeof address.ipv6;
  std::memcpy(head.address, address.ipv6.bytes, sizeof address.ipv6);
  // A namespace is known by its address alone, without the scope that the kernel keeps inside.
  if (kind == address_kind::link_local) head.address[2] = head.address[3] = 0;
  return head;
}

// How many ephemeral ports someone holds of a namespace, in one piece.
std::uint32_t reserved_ports(const world &state, std::size_t number) {
  for (const flow_switch &carrier : state.switches) {
    const std::uint32_t ordinal = state.nexuses[carrier.nexus].ordinal;
    if (number == number_of(ordinal, address_kind::ipv4, false)) return carrier.reserved;
  }
  return 0;
}

tv_stats_netns_range range_of(std::uint32_t first, std::uint32_t last, const reservation &held) {
  return {.first_port = static_cast<std::uint16_t>(first),
          .last_port = static_cast<std::uint16_t>(last),
          .subsystem = held.subsystem,
          .bsd = held.bsd,
          .listeners = held.listeners};
}

}  // namespace

void write_namespaces(const world &state, table_file &file) {
  std::vector<reservations> held = reservations_of_flows(state);
  for (std::size_t number = 0; number < held.size(); ++number) {
    tv_stats_netns head = head_of(state, number);
    std::vector<tv_stats_netns_range> ranges;
    for (const known_range &known : known_ranges) {
      if (number > 1 || known.protocol != head.protocol) continue;
      if (known.last) {
        ranges.push_back(range_of(known.first, known.last, known.held));
      } else {
        held[number][known.first] += known.held;
      }
    }
    const std::uint32_t reserved = reserved_ports(state, number);
    if (reserved) ranges.push_back(range_of(first_ephemeral, first_ephemeral + reserved - 1, {1, 0, 0}));
    for (const auto &[port, entry] : held[number]) {
      const bool is_within = port >= first_ephemeral && port < first_ephemeral + reserved;
      if (!is_within) ranges.push_back(range_of(port, 0, entry));
    }
    std::ranges::sort(ranges, {}, &tv_stats_netns_range::first_port);
    head.entry_count = static_cast<std::uint8_t>(std::min(ranges.size(), most_entries));
    file.put(head);
    file.put(std::as_bytes(std::span(ranges).first(head.entry_count)));
  }
}

}  // namespace lab
