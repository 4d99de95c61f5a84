// The programs that run on the lab's machine and what they use the network for.

#ifndef TARVELCTL_LAB_PROGRAMS_H
#define TARVELCTL_LAB_PROGRAMS_H

#include <cstdint>
#include <span>
#include <string_view>

#include "common/tables/flow.h"
#include "lab/traffic.h"

namespace lab {

inline constexpr std::uint8_t tcp_protocol = ip_protocols.number("tcp");
inline constexpr std::uint8_t udp_protocol = ip_protocols.number("udp");

struct service {
  std::uint8_t protocol;
  std::uint16_t port;
  std::int32_t service_class;
  bool inbound;  // others connect to it
  two_way<std::uint32_t> packet_size;
  std::uint32_t packets_per_second;  // at most, of the busier direction
};

struct program {
  std::string_view name;
  std::span<const service> services;
};

// The first ones have flows; those named below run the machine.
extern const std::span<const program> programs;
inline constexpr std::uint32_t flow_programs = 8;
inline constexpr std::uint32_t network_daemon = 8;
inline constexpr std::uint32_t tunnel_daemon = 9;
inline constexpr std::uint32_t machine_daemon = 10;
inline constexpr std::uint32_t packet_monitor = 11;

}  // namespace lab

#endif
