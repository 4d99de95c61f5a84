// The ring table of the channel listing: two lines for each ring, transfers and syncs, and a third one for
// errors.

#ifndef TARVELCTL_TARVELCTL_RING_STATS_H
#define TARVELCTL_TARVELCTL_RING_STATS_H

#include <cstddef>
#include <cstdint>
#include <span>

#include "common/tables/channel.h"
#include "common/text/print.h"

// Ring blocks as they lie in a table: ring_stats records back to back.
using ring_blocks = std::span<const std::byte>;

// A figure in a short form, such as 1.50M or 4KB.
using unit_text = format::small_text<32>;
using unit_suffixes = const char *const[5];

extern unit_suffixes decimal_suffixes;       // "" K M G T, for a divisor of 1000
extern unit_suffixes power_of_two_suffixes;  // "" KB MB GB TB, for a divisor of 1024

// `value`, divided by `divisor` while it is not below it, at most four times, and the suffix for that many
// divisions. The unit is chosen before rounding, so that 999999 is 1000.00K.
unit_text format_units(unsigned divisor, unit_suffixes &suffixes, double value);

// What a ring has moved since its previous state. All zero where there is none; a counter that went down
// gives the difference modulo 2^64.
struct ring_delta {
  std::uint64_t xfer_bytes, sync_bytes, xfer_slots, sync_slots, sync_count, xfer_count;
};

// Prints the two header lines, of a table with differences and rates where `watch` is true, else with totals.
void ring_stats_print_header(bool watch);

// Prints the lines of each ring in `rings`. `direction` is "TX" or "RX"; `previous` are the blocks of the
// same channel and direction in the snapshot before, or none; `interval` is the time between both in seconds,
// or 0 for totals in place of differences and rates.
void ring_stats_print(const char *direction, ring_blocks rings, ring_blocks previous, int interval);

#endif
