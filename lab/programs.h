// The programs that run on the lab's machine.

#ifndef TARVELCTL_LAB_PROGRAMS_H
#define TARVELCTL_LAB_PROGRAMS_H

#include <cstdint>
#include <iterator>
#include <string_view>

namespace lab {

struct program {
  std::string_view name;
};

// The first ones have flows; those named below run the machine.
inline constexpr program programs[] = {
    {"browser"},  {"sshd"},   {"softphone"}, {"videocall"}, {"syncd"}, {"player"},
    {"resolver"}, {"mailer"}, {"netd"},      {"tunneld"},   {"vmd"},   {"packetd"},
};
inline constexpr std::uint32_t program_count = std::size(programs);
inline constexpr std::uint32_t network_daemon = 8;
inline constexpr std::uint32_t tunnel_daemon = 9;
inline constexpr std::uint32_t machine_daemon = 10;
inline constexpr std::uint32_t packet_monitor = 11;
inline constexpr std::uint32_t flow_programs = network_daemon;  // how many have flows

}  // namespace lab

#endif
