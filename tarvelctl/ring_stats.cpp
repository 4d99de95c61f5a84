#include "tarvelctl/ring_stats.h"

#include <optional>

#include "common/tables/key_index.h"
#include "common/tables/record_walk.h"
#include "common/text/output.h"

unit_suffixes decimal_suffixes = {"", "K", "M", "G", "T"};
unit_suffixes power_of_two_suffixes = {"", "KB", "MB", "GB", "TB"};

unit_text format_units(unsigned divisor, unit_suffixes &suffixes, double value) {
  std::size_t divisions = 0;
  for (; value >= divisor && divisions < 4; ++divisions) value /= divisor;
  if (divisor == 1000) return format::text_of<"%.2f%.2s", 32>(value, suffixes[divisions]);
  return format::text_of<"%g%.2s", 32>(value, suffixes[divisions]);
}

namespace {

unit_text decimal(std::uint64_t value) {
  return format_units(1000, decimal_suffixes, static_cast<double>(value));
}

unit_text power_of_two(std::uint64_t value) {
  return format_units(1024, power_of_two_suffixes, static_cast<double>(value));
}

std::uint64_t per_operation(const ring_activity &activity) {
  return activity.count ? activity.slots / activity.count : 0;
}

std::size_t ring_count(ring_blocks rings) {
  return rings.size() / sizeof(ring_stats);
}

std::uint32_t ring_id_at(ring_blocks rings, std::size_t index) {
  return member_at<ring_stats, std::uint32_t>(rings, index, offsetof(ring_stats, ring_id));
}

// The position of the first ring with this id, or key_index::none.
std::uint32_t ring_stats_find(ring_blocks rings, std::uint32_t ring_id) {
  for (std::uint32_t i = 0; i < ring_count(rings); ++i) {
    if (ring_id_at(rings, i) == ring_id) return i;
  }
  return key_index::none;
}

// The previous states of a channel's rings. Where there are many they are indexed; a channel of today has
// few, and a search costs less.
class previous_rings {
 public:
  explicit previous_rings(ring_blocks rings) : rings_(rings) {
    if (!are_many()) return;
    for (std::uint32_t i = 0; i < ring_count(rings); ++i) by_id_.add(ring_id_at(rings, i), i);
  }

  // The first one with this id.
  std::optional<ring_stats> find(std::uint32_t ring_id) const {
    const std::uint32_t at = are_many() ? by_id_.find(ring_id) : ring_stats_find(rings_, ring_id);
    if (at == key_index::none) return {};
    return record_at<ring_stats>(rings_, at);
  }

 private:
  bool are_many() const { return ring_count(rings_) > 16; }

  ring_blocks rings_;
  key_index by_id_;
};

ring_delta ring_stats_delta(const previous_rings &previous, const ring_stats &ring) {
  const std::optional<ring_stats> before = previous.find(ring.ring_id);
  if (!before) return {};
  return {.xfer_bytes = ring.xfer.bytes - before->xfer.bytes,
          .sync_bytes = ring.sync.bytes - before->sync.bytes,
          .xfer_slots = ring.xfer.slots - before->xfer.slots,
          .sync_slots = ring.sync.slots - before->sync.slots,
          .sync_count = ring.sync.count - before->sync.count,
          .xfer_count = ring.xfer.count - before->xfer.count};
}

// The columns behind the first one, of transfers or syncs.
void print_totals(const ring_activity &activity) {
  print<" %8s %8s %12qu %8s %8s %12qu %4d %4qu %4d\n">(
      decimal(activity.bytes_per_sec), decimal(activity.bytes_per_sec_avg), activity.bytes,
      decimal(activity.slots_per_sec), decimal(activity.slots_per_sec_avg), activity.slots,
      static_cast<int>(activity.min_slots), per_operation(activity), static_cast<int>(activity.max_slots));
}

void print_differences(const ring_activity &activity, std::uint64_t bytes, std::uint64_t slots,
                       std::uint64_t operations_per_sec) {
  print<" %8s %8s %8s %8s %8s %8s %4d %4qu %4d %8s\n">(
      decimal(activity.bytes_per_sec), decimal(activity.bytes_per_sec_avg), decimal(bytes),
      decimal(activity.slots_per_sec), decimal(activity.slots_per_sec_avg), decimal(slots),
      static_cast<int>(activity.min_slots), per_operation(activity), static_cast<int>(activity.max_slots),
      decimal(operations_per_sec));
}

void print_errors(const ring_stats &ring) {
  if (!ring.err_len_modified && !ring.err_len_too_large && !ring.err_corrupted) return;
  print<"%12s">("Errors:");
  if (ring.err_len_modified) print<" Length modified: %s">(decimal(ring.err_len_modified));
  if (ring.err_len_too_large) print<" Length too large: %s">(decimal(ring.err_len_too_large));
  if (ring.err_corrupted) print<" Corrupted data: %s">(decimal(ring.err_corrupted));
  print<"\n">();
}

}  // namespace

void ring_stats_print_header(bool watch) {
  if (watch) {
    print<"%-14s %8s %8s %8s %8s %8s %8s %4s %4s %4s %8s\n">(
        "Ring", "Bytes/s", "average", "delta", "Slots/s", "average", "delta", "Min", "Avg", "Max", "Xfer/s");
    print<"%14s %8s %8s %8s %8s %8s %8s %4s %4s %4s %8s\n">("Mem Use/Total", "/sync", "", "", "/sync", "", "",
                                                            "", "", "", "Sync/s");
  } else {
    print<"%-14s %8s %8s %12s %8s %8s %12s %4s %4s %4s\n">("Ring", "Bytes/s", "average", "Bytes", "Slots/s",
                                                           "average", "Slots", "Min", "Avg", "Max");
    print<"%14s %8s %8s %12s %8s %8s %12s %4s %4s %4s\n">("Mem Use/Total", "/sync", "", "Bytes", "/sync", "",
                                                          "Slots", "", "", "");
  }
}

void ring_stats_print(const char *direction, ring_blocks rings, ring_blocks previous, int interval) {
  const previous_rings before(previous);
  for (std::size_t i = 0; i < ring_count(rings); ++i) {
    const auto ring = record_at<ring_stats>(rings, i);
    const auto name = format::text_of<"%.2s[%d]", 16>(direction, static_cast<int>(ring.ring_id));
    const auto memory =
        format::text_of<"%.31s/%.31s", 32>(power_of_two(ring.mem_used), power_of_two(ring.mem_total));
    if (interval == 0) {
      print<"%-14s">(name);
      print_totals(ring.xfer);
      print<"%14s">(memory);
      print_totals(ring.sync);
    } else {
      const ring_delta delta = ring_stats_delta(before, ring);
      const auto seconds = static_cast<unsigned>(interval);
      print<"%-14s">(name);
      print_differences(ring.xfer, delta.xfer_bytes, delta.xfer_slots, delta.xfer_count / seconds);
      print<"%14s">(memory);
      print_differences(ring.sync, delta.sync_bytes, delta.sync_slots, delta.sync_count / seconds);
    }
    print_errors(ring);
  }
}
