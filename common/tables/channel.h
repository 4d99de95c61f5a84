// Channels and their rings, as kern.tarvel.nexus_channel_list delivers them: a group for each nexus instance,
// its header first, then its channels, each followed by the blocks of its rings.

#ifndef TARVELCTL_COMMON_TABLES_CHANNEL_H
#define TARVELCTL_COMMON_TABLES_CHANNEL_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/uuid.h"

inline constexpr char channel_list_node[] = "kern.tarvel.nexus_channel_list";

inline constexpr bit_names channel_flag_names =
    "\20"
    "\1MON_TX"
    "\2MON_RX"
    "\3NO_COPY"
    "\4USER_PACKET_POOL"
    "\5DEFUNCT_OK"
    "\6EXCLUSIVE"
    "\40DEFUNCT";

// The header of a group.
struct nexus_channel_header {
  uuid nexus_uuid;
  std::uint32_t channel_count;
  std::uint8_t reserved_20[4];
};

static_assert(sizeof(nexus_channel_header) == 24);

// What a ring has moved. Rates, averages, minima and maxima are the kernel's own.
struct ring_activity {
  std::uint64_t slots;
  std::uint64_t bytes;
  std::uint64_t count;
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
  ring_activity xfer;
  std::uint8_t reserved_64[8];
  std::uint64_t mem_total;
  std::uint64_t mem_used;
  ring_activity sync;
  std::uint8_t reserved_144[8];
  std::uint64_t err_corrupted;
  std::uint64_t err_len_modified;
  std::uint64_t err_len_too_large;
  std::uint8_t reserved_176[8];
};

static_assert(sizeof(ring_activity) == 56);
static_assert(sizeof(ring_stats) == 184);

// The fixed part of a channel. Its transmit ring blocks follow, then its receive ring blocks.
struct channel_entry {
  static constexpr std::uint32_t defunct = channel_flag_names.bit("DEFUNCT");

  uuid channel_uuid;
  std::uint32_t flags;
  std::int32_t pid;
  std::int32_t fd;
  std::uint32_t port;
  std::uint32_t n_tx_rings;
  std::uint32_t n_rx_rings;
  std::uint8_t reserved_40[8];

  // Bytes of the ring blocks behind the fixed part.
  constexpr std::uint64_t trailing_size() const {
    return (std::uint64_t{n_tx_rings} + std::uint64_t{n_rx_rings}) * sizeof(ring_stats);
  }
};

static_assert(sizeof(channel_entry) == 48);

constexpr auto activity_rows(const row &whole) {
  using record = ring_activity;
  using enum field_kind;
  return join(
      ROW(slots).is(counter, "slots", "slots moved so far").in("slots").part_of(whole),
      ROW(bytes).is(counter, "bytes", "bytes moved so far").in("bytes").part_of(whole),
      ROW(count).is(counter, "count", "transfers or syncs so far").part_of(whole),
      ROW(min_slots).is(gauge, "min_slots", "fewest slots a transfer or sync").in("slots").part_of(whole),
      ROW(max_slots).is(gauge, "max_slots", "most slots a transfer or sync").in("slots").part_of(whole),
      ROW(slots_per_sec).is(gauge, "slots_per_sec", "slots/s now").in("slots/s").part_of(whole),
      ROW(slots_per_sec_avg).is(gauge, "slots_per_sec_avg", "average slots/s").in("slots/s").part_of(whole),
      ROW(bytes_per_sec).is(gauge, "bytes_per_sec", "bytes/s now").in("bytes/s").part_of(whole),
      ROW(bytes_per_sec_avg).is(gauge, "bytes_per_sec_avg", "average bytes/s").in("bytes/s").part_of(whole));
}

inline constexpr auto ring_rows = [] {
  using record = ring_stats;
  using enum field_kind;
  return join(ROW(ring_id).is(identifier, "ring", "number of the ring"), ROW(reserved_4),
              activity_rows(ROW(xfer).is(nested, "xfer", "transfers of the ring")), ROW(reserved_64),
              ROW(mem_total).is(gauge, "memory_total", "bytes of ring memory").in("bytes"),
              ROW(mem_used).is(gauge, "memory_used", "bytes of ring memory in use").in("bytes"),
              activity_rows(ROW(sync).is(nested, "sync", "syncs of the ring")), ROW(reserved_144),
              ROW(err_corrupted).is(counter, "corrupted", "corrupted data so far"),
              ROW(err_len_modified).is(counter, "length_modified", "modified lengths so far"),
              ROW(err_len_too_large).is(counter, "length_too_large", "too large lengths so far"),
              ROW(reserved_176));
}();
inline constexpr record_description ring_description = describe<ring_stats>("ring_stats", "ring", ring_rows);

inline constexpr auto channel_rows = [] {
  using record = channel_entry;
  using enum field_kind;
  return join(ROW(channel_uuid).is(identifier, "channel", "UUID of the channel"),
              ROW(flags).is(field_kind::flags, "flags", "flags of the channel").of(channel_flag_names),
              ROW(pid).is(field_kind::pid, "pid", "process id of the owner"),
              ROW(fd).is(number, "fd", "the owner's descriptor"),
              ROW(port).is(number, "port", "port of the nexus"),
              ROW(n_tx_rings).is(number, "tx", "transmit rings that follow"),
              ROW(n_rx_rings).is(number, "rx", "receive rings that follow"), ROW(reserved_40));
}();
inline constexpr follower channel_followers[] = {
    {"tx", row_at(channel_rows, "n_tx_rings"), &ring_description},
    {"rx", row_at(channel_rows, "n_rx_rings"), &ring_description}};
inline constexpr record_description channel_description =
    describe<channel_entry>("channel_entry", "channel", channel_rows, channel_followers);

inline constexpr auto channel_header_rows = [] {
  using record = nexus_channel_header;
  using enum field_kind;
  return join(ROW(nexus_uuid).is(identifier, "nexus", "UUID of the nexus instance"),
              ROW(channel_count).is(number, "channels", "channels that follow"), ROW(reserved_20));
}();
inline constexpr follower channel_header_followers[] = {
    {"channels", row_at(channel_header_rows, "channel_count"), &channel_description}};
inline constexpr record_description channel_header_description = describe<nexus_channel_header>(
    "nexus_channel_header", "nexus", channel_header_rows, channel_header_followers);

// One byte: whether the kernel collects ring statistics.
inline constexpr char ring_stat_enable_node[] = "kern.tarvel.ring_stat_enable";

inline constexpr row ring_stat_enable_rows[] = {{.field = "enabled",
                                                 .size = 1,
                                                 .type = field_type::u8,
                                                 .kind = field_kind::boolean,
                                                 .name = "enabled",
                                                 .meaning = "not 0: ring statistics are collected"}};
inline constexpr record_description ring_stat_enable_description =
    describe<std::uint8_t>("ring_stat_enable", "ring_stat_enable", ring_stat_enable_rows);

#endif
