// A world that moves.

#ifndef TARVELCTL_LAB_SIMULATION_H
#define TARVELCTL_LAB_SIMULATION_H

#include <signal.h>

#include "lab/root_directory.h"

namespace lab {

// Publishes what happens every `interval` milliseconds, until one of the signals in `stop`, which must be
// blocked, arrives. Returns false when publishing fails.
bool keep_moving(world &state, root_directory &root, std::uint32_t interval, const sigset_t &stop);

}  // namespace lab

#endif
