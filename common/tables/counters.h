// Counters of network interfaces, flow switches and user-space protocol stacks, as the tables
// kern.tarvel.stats.net_if, kern.tarvel.stats.flow_switch and kern.tarvel.stats.userstack deliver them.

#ifndef TARVELCTL_COMMON_TABLES_COUNTERS_H
#define TARVELCTL_COMMON_TABLES_COUNTERS_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char net_if_node[] = "kern.tarvel.stats.net_if";
inline constexpr char flow_switch_node[] = "kern.tarvel.stats.flow_switch";
inline constexpr char userstack_node[] = "kern.tarvel.stats.userstack";

inline constexpr std::size_t net_if_counter_count = 29;
inline constexpr std::size_t flow_switch_counter_count = 52;
inline constexpr std::size_t ip_counter_count = 43;
inline constexpr std::size_t ip6_counter_count = 36;
inline constexpr std::size_t tcp_counter_count = 203;
inline constexpr std::size_t udp_counter_count = 22;

// Where TCP counts the connections that wait now, among all that counts up.
inline constexpr std::uint16_t tcp_time_wait = 193;

// The names of the counters of a block, by position. Each list is closed by an empty name.
extern const counter_name net_if_counter_names[];
extern const counter_name flow_switch_counter_names[];
extern const counter_name ip_counter_names[];
extern const counter_name ip6_counter_names[];
extern const counter_name tcp_counter_names[];
extern const counter_name udp_counter_names[];

// What the records of both nexus tables begin with.
struct tv_stats_nexus_head {
  uuid nx_uuid;
  text_field<16> name;
};

struct tv_stats_net_if {
  tv_stats_nexus_head head;
  std::uint64_t counters[net_if_counter_count];
  std::uint8_t reserved_264[56];
};

struct tv_stats_flow_switch {
  tv_stats_nexus_head head;
  std::uint64_t counters[flow_switch_counter_count];
};

// The counters of one protocol stack in user space.
struct tv_stats_userstack {
  uuid nx_uuid;
  text_field<16> if_name;
  std::int32_t pid;
  std::uint8_t reserved_36[12];
  std::uint64_t ip[ip_counter_count];
  std::uint64_t reserved_392;
  std::uint64_t ip6[ip6_counter_count];
  std::uint64_t tcp[tcp_counter_count];
  std::uint64_t reserved_2312;
  std::uint64_t udp[udp_counter_count];
};

static_assert(sizeof(tv_stats_net_if) == 320);
static_assert(sizeof(tv_stats_flow_switch) == 32 + 52 * 8);
static_assert(sizeof(tv_stats_userstack) == 2496);

// Of a nexus with counters.
template <class Nexus>
constexpr auto nexus_rows(const counter_name *names) {
  using record = Nexus;
  using enum field_kind;
  return join(ROW(head.nx_uuid).is(identifier, "nexus", "UUID of the nexus"),
              ROW(head.name).is(interface, "interface", "name of the interface"),
              ROW(counters).is(counter, "counters", "counters, by position").of(names));
}

inline constexpr auto net_if_rows = join(nexus_rows<tv_stats_net_if>(net_if_counter_names), [] {
  using record = tv_stats_net_if;
  return ROW(reserved_264);
}());
inline constexpr record_description net_if_description =
    describe<tv_stats_net_if>("tv_stats_net_if", "interface", net_if_rows);

inline constexpr auto flow_switch_rows = nexus_rows<tv_stats_flow_switch>(flow_switch_counter_names);
inline constexpr record_description flow_switch_description =
    describe<tv_stats_flow_switch>("tv_stats_flow_switch", "flow_switch", flow_switch_rows);

inline constexpr auto userstack_rows = [] {
  using record = tv_stats_userstack;
  using enum field_kind;
  return join(
      ROW(nx_uuid).is(identifier, "nexus", "UUID of the nexus"),
      ROW(if_name).is(interface, "interface", "name of the interface").identifying(),
      ROW(pid).is(field_kind::pid, "pid", "process id, 0: all ports now closed").identifying(),
      ROW(reserved_36), ROW(ip).is(counter, "ip", "counters of IP, by position").of(ip_counter_names),
      ROW(reserved_392), ROW(ip6).is(counter, "ip6", "counters of IPv6, by position").of(ip6_counter_names),
      ROW(tcp)
          .is(counter, "tcp", "counters of TCP, by position")
          .of(tcp_counter_names)
          .with_level(tcp_time_wait),
      ROW(reserved_2312), ROW(udp).is(counter, "udp", "counters of UDP, by position").of(udp_counter_names));
}();
inline constexpr record_description userstack_description =
    describe<tv_stats_userstack>("tv_stats_userstack", "userstack", userstack_rows);

#endif
