#include "tarvelctl/region_set.h"

#include <cstdlib>

#include "common/text/output.h"

namespace {

std::size_t expanding_to;  // the capacity that there may be no memory for

[[noreturn]] void end_without_room() {
  say_last_words<"Error expanding tv_region_set-> capacity %d\n">(static_cast<int>(expanding_to));
  std::exit(exit_status::out_of_memory);
}

}  // namespace

void region_set::add(const tv_stats_region &region) {
  if (count_ == capacity_) {
    if (by_uuid_.find(region.region_uuid) != key_index::none) return;
    grow();
  }
  if (!by_uuid_.add(region.region_uuid, static_cast<std::uint32_t>(count_))) return;
  items_[count_++] = {region.region_uuid, static_cast<std::uint32_t>(region.type), region.mem_total,
                      region.mem_wired};
}

void region_set::grow() {
  constexpr std::size_t first_capacity = 1024;
  capacity_ = expanding_to = capacity_ ? 2 * capacity_ : first_capacity;
  void *const grown = std::realloc(items_.get(), capacity_ * sizeof(item));
  if (!grown) end_without_room();
  static_cast<void>(items_.release());
  items_.reset(static_cast<item *>(grown));
  const new_failure expanding(end_without_room);
  by_uuid_.reserve(capacity_);
}
