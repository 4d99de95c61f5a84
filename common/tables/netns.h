// Port namespaces and the ranges reserved in them, as kern.tarvel.stats.netns delivers them.

#ifndef TARVELCTL_COMMON_TABLES_NETNS_H
#define TARVELCTL_COMMON_TABLES_NETNS_H

#include <cstddef>
#include <cstdint>

inline constexpr char netns_node[] = "kern.tarvel.stats.netns";

// The head of a namespace. `entry_count` ranges follow, then the next record.
struct tv_stats_netns {
  static constexpr std::uint8_t tcp = 6;  // values of `protocol`
  static constexpr std::uint8_t udp = 17;

  std::uint8_t address[16];     // network byte order; the first `address_length` bytes count
  std::uint8_t address_length;  // 4: IPv4, 16: IPv6, any other: the global namespace
  std::uint8_t protocol;        // any value but udp is shown as TCP
  std::uint8_t entry_count;
  std::uint8_t reserved_19[13];

  // Bytes of the ranges behind the head.
  std::uint64_t trailing_size() const;
};

struct tv_stats_netns_range {
  std::uint16_t first_port;  // host byte order
  std::uint16_t last_port;   // 0: a single port
  std::int32_t subsystem;    // reservations of the kernel subsystem
  std::int32_t bsd;          // reservations of BSD sockets
  std::uint8_t reserved_12[4];
  std::int32_t listeners;
  std::uint8_t reserved_20[12];
};

inline std::uint64_t tv_stats_netns::trailing_size() const {
  return std::uint64_t{entry_count} * sizeof(tv_stats_netns_range);
}

static_assert(sizeof(tv_stats_netns) == 32);
static_assert(offsetof(tv_stats_netns, address_length) == 16);
static_assert(offsetof(tv_stats_netns, protocol) == 17);
static_assert(offsetof(tv_stats_netns, entry_count) == 18);
static_assert(sizeof(tv_stats_netns_range) == 32);
static_assert(offsetof(tv_stats_netns_range, last_port) == 2);
static_assert(offsetof(tv_stats_netns_range, subsystem) == 4);
static_assert(offsetof(tv_stats_netns_range, bsd) == 8);
static_assert(offsetof(tv_stats_netns_range, listeners) == 16);

#endif
