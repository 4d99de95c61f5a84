// The memory regions that the process has seen, each once.

#ifndef TARVELCTL_TARVELCTL_REGION_SET_H
#define TARVELCTL_TARVELCTL_REGION_SET_H

#include <cstdint>
#include <memory>
#include <span>

#include "common/tables/arena.h"
#include "common/tables/key_index.h"
#include "common/text/memory.h"

// Regions by UUID, with type and memory as they were when each was first seen. It only grows.
class region_set {
 public:
  struct item {
    ::uuid uuid;
    std::uint32_t id;         // region type
    std::uint64_t mem_total;  // bytes
    std::uint64_t mem_wired;  // bytes
  };

  // Told of a region that is about to be added, asks for its place to be in the cache by then.
  void prefetch(const tv_stats_region &region) const { by_uuid_.prefetch(region.region_uuid); }

  // Adds the region unless its UUID is there. Where there is no memory the process ends with a message and
  // status 255.
  void add(const tv_stats_region &region);

  std::span<const item> items() const { return {items_.get(), count_}; }

 private:
  void grow();

  std::unique_ptr<item[], c_free> items_;
  std::size_t count_ = 0;
  std::size_t capacity_ = 0;
  key_index by_uuid_;
};

#endif
