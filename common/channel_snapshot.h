// Walking the channel table, and one snapshot of it, framed.

#ifndef TARVELCTL_COMMON_CHANNEL_SNAPSHOT_H
#define TARVELCTL_COMMON_CHANNEL_SNAPSHOT_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>

#include "common/tables/channel.h"
#include "common/tables/kernel_table.h"
#include "common/tables/key_index.h"
#include "common/tables/record_walk.h"

// Where the bytes of a channel lie in the table that holds them.
struct channel_ref {
  const std::byte *header;  // of the channel's nexus group
  const std::byte *entry;   // null for a nexus without channels
  std::size_t entry_size;   // ring blocks included

  nexus_channel_header nexus() const {
    return record_at<nexus_channel_header>({header, sizeof(nexus_channel_header)}, 0);
  }
  channel_entry channel() const { return record_at<channel_entry>({entry, entry_size}, 0); }

  // The ring blocks, ring_stats records back to back: transmit, then receive.
  std::span<const std::byte> rings() const {
    return {entry + sizeof(channel_entry), entry_size - sizeof(channel_entry)};
  }
};

// Steps through a channel table. Calls `visit` with a ref for each nexus, which has no entry, and behind it
// with one for each of its channels. Returns false where the table ends before all that it claims; what is
// whole has been visited then.
template <class Visit>
bool walk_channels(std::span<const std::byte> table, Visit visit) {
  record_walk walk(table);
  while (!walk.at_end()) {
    const std::byte *const header_at = walk.position();
    nexus_channel_header header;
    if (!walk.take(header)) return false;
    visit(channel_ref{header_at, nullptr, 0});
    for (std::uint32_t i = 0; i < header.channel_count; ++i) {
      const std::byte *const entry_at = walk.position();
      channel_entry entry;
      std::span<const std::byte> rings;
      if (!walk.take(entry, rings)) return false;
      visit(channel_ref{header_at, entry_at, sizeof entry + rings.size()});
    }
  }
  return true;
}

// A fetched table with a ref for each of its channels and one for each nexus without any, in table order. It
// is either complete or empty.
class channel_snapshot {
 public:
  std::uint32_t nexus_count() const { return nexus_count_; }
  std::size_t ref_count() const { return ref_count_; }
  std::span<const channel_ref> refs() const { return {refs_.get(), ref_count()}; }
  bool empty() const { return nexus_count_ == 0; }

 private:
  friend bool channel_snapshot_fetch(channel_snapshot &snapshot);
  friend const channel_ref *channel_snapshot_find(const channel_snapshot &snapshot, const uuid &channel);

  bool frame();
  void append(const channel_ref &ref);

  kernel_table table_;
  std::uint32_t nexus_count_ = 0;
  std::unique_ptr<channel_ref[], c_free> refs_;
  std::size_t ref_count_ = 0;
  std::size_t capacity_ = 0;
  mutable std::optional<key_index> by_channel_;  // made when it is first asked
};

// Fills an empty snapshot from the kernel. Returns false, with the snapshot empty, when the table cannot be
// fetched (the fetch has said why), holds nothing, or ends inside a group ("Buffer too short\n" on standard
// error).
bool channel_snapshot_fetch(channel_snapshot &snapshot);

// Returns the first ref, in table order, of the channel, or null. It belongs to the snapshot.
const channel_ref *channel_snapshot_find(const channel_snapshot &snapshot, const uuid &channel);

#endif
