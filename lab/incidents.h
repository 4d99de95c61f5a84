// Trouble: what may go wrong on the machine, each a story that all tables tell.

#ifndef TARVELCTL_LAB_INCIDENTS_H
#define TARVELCTL_LAB_INCIDENTS_H

#include <cstdint>
#include <span>
#include <string_view>

#include "lab/world.h"

namespace lab {

// It happens to the first flow switch with clients, and goes on until the world ends.
struct incident {
  std::string_view name;
  const char *story;

  // What happens at once, and what in every so many milliseconds from then on; either may be null.
  void (*begin)(world &, flow_switch &);
  void (*go_on)(world &, flow_switch &, std::uint32_t milliseconds);
};

extern const std::span<const incident> incidents;

// Lets those happen, for so many milliseconds, whose time has come.
void cause_trouble(world &state, std::uint32_t milliseconds);

}  // namespace lab

#endif
