#include "common/channel_snapshot.h"

#include "common/text/memory.h"
#include "common/text/output.h"

bool channel_snapshot_fetch(channel_snapshot &snapshot) {
  if (snapshot.table_.fetch(channel_list_node) != 0 || snapshot.table_.empty()) return false;
  if (snapshot.frame()) return true;
  snapshot = {};
  complain<"Buffer too short\n">();
  return false;
}

// Finds the groups and their channels. False where the table ends too early.
bool channel_snapshot::frame() {
  return walk_channels(table_.bytes(), [&](const channel_ref &ref) {
    if (!ref.entry) ++nexus_count_;
    if (ref.entry || ref.nexus().channel_count == 0) append(ref);
  });
}

void channel_snapshot::append(const channel_ref &ref) {
  if (ref_count_ == capacity_) {
    capacity_ = capacity_ ? 2 * capacity_ : 10;
    void *const grown = xrealloc(refs_.get(), capacity_ * sizeof ref);
    static_cast<void>(refs_.release());
    refs_.reset(static_cast<channel_ref *>(grown));
  }
  refs_[ref_count_++] = ref;
}

const channel_ref *channel_snapshot_find(const channel_snapshot &snapshot, const uuid &channel) {
  std::optional<key_index> &index = snapshot.by_channel_;
  if (!index) {
    index.emplace();
    for (std::uint32_t i = 0; i < snapshot.ref_count_; ++i) {
      if (snapshot.refs_[i].entry) index->add(snapshot.refs_[i].channel().channel_uuid, i);
    }
  }
  const std::uint32_t found = index->find(channel);
  return found == key_index::none ? nullptr : &snapshot.refs_[found];
}
