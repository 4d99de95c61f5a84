// Blocks of counters, as every counter report prints them.

#ifndef TARVELCTL_TARVELCTL_COUNTER_LINES_H
#define TARVELCTL_TARVELCTL_COUNTER_LINES_H

#include <cstdint>
#include <span>

#include "common/tables/counters.h"

// Prints a line for each counter that is not 0, or for each one where the settings ask for zeros. `names` has
// as many names as there are counters, and is closed by an empty one.
void print_counters(const counter_name *names, std::span<const std::uint64_t> counters);

// Adds a block of counters to a total, position by position and modulo 2^64. Both have the same size.
void add_counters(std::span<std::uint64_t> total, std::span<const std::uint64_t> counters);

#endif
