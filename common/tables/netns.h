// Port namespaces and the ranges reserved in them, as kern.tarvel.stats.netns delivers them.

#ifndef TARVELCTL_COMMON_TABLES_NETNS_H
#define TARVELCTL_COMMON_TABLES_NETNS_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"

inline constexpr char netns_node[] = "kern.tarvel.stats.netns";

struct tv_stats_netns_range {
  std::uint16_t first_port;
  std::uint16_t last_port;
  std::int32_t subsystem;
  std::int32_t bsd;
  std::uint8_t reserved_12[4];
  std::int32_t listeners;
  std::uint8_t reserved_20[12];
};

// The head of a namespace. `entry_count` ranges follow, then the next record.
struct tv_stats_netns {
  std::uint8_t address[16];
  std::uint8_t address_length;
  std::uint8_t protocol;
  std::uint8_t entry_count;
  std::uint8_t reserved_19[13];

  // Bytes of the ranges behind the head.
  constexpr std::uint64_t trailing_size() const {
    return std::uint64_t{entry_count} * sizeof(tv_stats_netns_range);
  }
};

static_assert(sizeof(tv_stats_netns) == 32);
static_assert(sizeof(tv_stats_netns_range) == 32);

inline constexpr auto range_rows = [] {
  using record = tv_stats_netns_range;
  using enum field_kind;
  return join(
      ROW(first_port).is(number, "first", "first port of the range").identifying(),
      ROW(last_port).is(number, "last", "last port of the range, 0: a single port").or_none(0).identifying(),
      ROW(subsystem).is(gauge, "tarvel", "reservations of the subsystem"),
      ROW(bsd).is(gauge, "bsd", "reservations of sockets"), ROW(reserved_12),
      ROW(listeners).is(gauge, "listeners", "listeners"), ROW(reserved_20));
}();
inline constexpr record_description range_description =
    describe<tv_stats_netns_range>("tv_stats_netns_range", "range", range_rows);

inline constexpr auto netns_rows = [] {
  using record = tv_stats_netns;
  using enum field_kind;
  constexpr row length =
      ROW(address_length).is(number, "address_length", "4: IPv4, 16: IPv6, others: global").identifying();
  return join(ROW(address)
                  .is(field_kind::address, "address", "address of the namespace")
                  .cut_to(length)
                  .identifying(),
              length,
              ROW(protocol).is(enumeration, "protocol", "transport protocol").of(ip_protocols).identifying(),
              ROW(entry_count).is(number, "ranges", "ranges that follow"), ROW(reserved_19));
}();
inline constexpr follower netns_followers[] = {
    {"ranges", row_at(netns_rows, "entry_count"), &range_description}};
inline constexpr record_description netns_description =
    describe<tv_stats_netns>("tv_stats_netns", "netns", netns_rows, netns_followers);

#endif
