// The programs that run on the lab's machine and what they use the network for.

#ifndef TARVELCTL_LAB_PROGRAMS_H
#define TARVELCTL_LAB_PROGRAMS_H

#include <cstdint>
#include <span>
#include <string_view>

#include "lab/traffic.h"

namespace lab {

inline constexpr std::uint8_t tcp_protocol = 6;
inline constexpr std::uint8_t udp_protocol = 17;

enum service_class : std::int32_t {
  best_effort = 0,
  background_system = 0x080090,
  background = 0x100080,
  responsive = 0x180010,
  management = 0x200020,
  audio_video = 0x280120,
  responsive_video = 0x300110,
  video = 0x380100,
  voice = 0x400180,
  control = 0x480190,
};

struct service {
  std::uint8_t protocol;
  std::uint16_t port;
  service_class urgency;
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
