// Channels and their rings, as kern.tarvel.nexus_channel_list delivers them: a group for each nexus instance,
// its header first, then its channels, each followed by the blocks of its rings.

#ifndef TARVELCTL_COMMON_TABLES_CHANNEL_H
#define TARVELCTL_COMMON_TABLES_CHANNEL_H

#include <cstddef>
#include <cstdint>

#include "common/tables/uuid.h"

inline constexpr char channel_list_node[] = "kern.tarvel.nexus_channel_list";

// The header of a group.
struct nexus_channel_header {
  uuid nexus_uuid;
  std::uint32_t channel_count;
  std::uint8_t reserved_20[4];
};

static_assert(sizeof(nexus_channel_header) == 24);
static_assert(offsetof(nexus_channel_header, channel_count) == 16);

// What a ring has moved. Rates, averages, minima and maxima are the kernel's own.
struct ring_activity {
  std::uint64_t slots;  // cumulative
  std::uint64_t bytes;  // cumulative
  std::uint64_t count;  // cumulative operations
  std::uint32_t min_slots;
  std::uint32_t max_slots;
  std::uint32_t slots_per_sec;
  std::uint32_t slots_per_sec_avg;
  std::uint64_t bytes_per_sec;
  std::uint64_t bytes_per_sec_avg;
};

// The statistics block of a ring.
struct ring_stats {
  std::uint32_t ring_id;
  std::uint8_t reserved_4[4];
  ring_activity xfer;  // transfers
  std::uint8_t reserved_64[8];
  std::uint64_t mem_total;  // bytes
  std::uint64_t mem_used;   // bytes
  ring_activity sync;       // syncs
  std::uint8_t reserved_144[8];
  std::uint64_t err_corrupted;
  std::uint64_t err_len_modified;
  std::uint64_t err_len_too_large;
  std::uint8_t reserved_176[8];
};

static_assert(sizeof(ring_activity) == 56);
static_assert(offsetof(ring_activity, slots) == 0);
static_assert(offsetof(ring_activity, bytes) == 8);
static_assert(offsetof(ring_activity, count) == 16);
static_assert(offsetof(ring_activity, min_slots) == 24);
static_assert(offsetof(ring_activity, max_slots) == 28);
static_assert(offsetof(ring_activity, slots_per_sec) == 32);
static_assert(offsetof(ring_activity, slots_per_sec_avg) == 36);
static_assert(offsetof(ring_activity, bytes_per_sec) == 40);
static_assert(offsetof(ring_activity, bytes_per_sec_avg) == 48);
static_assert(sizeof(ring_stats) == 184);
static_assert(offsetof(ring_stats, xfer) == 8);
static_assert(offsetof(ring_stats, mem_total) == 72);
static_assert(offsetof(ring_stats, mem_used) == 80);
static_assert(offsetof(ring_stats, sync) == 88);
static_assert(offsetof(ring_stats, err_corrupted) == 152);
static_assert(offsetof(ring_stats, err_len_modified) == 160);
static_assert(offsetof(ring_stats, err_len_too_large) == 168);

// The fixed part of a channel. Its transmit ring blocks follow, then its receive ring blocks.
struct channel_entry {
  // Bits of `flags`; the listings name some more.
  static constexpr std::uint32_t defunct = 0x80000000;

  uuid channel_uuid;  // a channel is known by it from one snapshot to the next
  std::uint32_t flags;
  std::int32_t pid;  // owner
  std::int32_t fd;   // the owner's descriptor for the channel
  std::uint32_t port;
  std::uint32_t n_tx_rings;
  std::uint32_t n_rx_rings;
  std::uint8_t reserved_40[8];

  // Bytes of the ring blocks behind the fixed part.
  std::uint64_t trailing_size() const {
    return (std::uint64_t{n_tx_rings} + std::uint64_t{n_rx_rings}) * sizeof(ring_stats);
  }
};

static_assert(sizeof(channel_entry) == 48);
static_assert(offsetof(channel_entry, flags) == 16);
static_assert(offsetof(channel_entry, pid) == 20);
static_assert(offsetof(channel_entry, fd) == 24);
static_assert(offsetof(channel_entry, port) == 28);
static_assert(offsetof(channel_entry, n_tx_rings) == 32);
static_assert(offsetof(channel_entry, n_rx_rings) == 36);

// One byte: whether the kernel collects ring statistics.
inline constexpr char ring_stat_enable_node[] = "kern.tarvel.ring_stat_enable";

#endif
