// Finding things by UUID at a cost that does not grow with their number.

#ifndef TARVELCTL_COMMON_UUID_INDEX_H
#define TARVELCTL_COMMON_UUID_INDEX_H

#include <cstdint>
#include <vector>

#include "common/uuid.h"

// Positions by UUID. The first position added for a UUID stays, which is what a linear search would find.
class uuid_index {
 public:
  static constexpr std::uint32_t none = UINT32_MAX;

  bool empty() const { return used_ == 0; }

  // The position added first for `key`, or none.
  std::uint32_t find(const uuid &key) const;

  // Asks for what find() and add() will look at to be in the cache soon.
  void prefetch(const uuid &key) const;

  // Adds `position`, which is not none, unless `key` has one. Returns whether it was added.
  bool add(const uuid &key, std::uint32_t position);

 private:
  struct slot {
    uuid key;
    std::uint32_t position = none;
  };

  std::size_t first_slot_of(const uuid &key) const;
  std::size_t slot_of(const uuid &key) const;
  void grow();

  std::vector<slot> slots_;  // a power of two of them, at most half in use
  std::size_t used_ = 0;
};

#endif
