// Finding things by what they are known by, at a cost that does not grow with their number.

#ifndef TARVELCTL_COMMON_TABLES_KEY_INDEX_H
#define TARVELCTL_COMMON_TABLES_KEY_INDEX_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <type_traits>
#include <vector>

// What something is known by: a UUID, a process id, an address, or several values of at most 16 bytes in all.
struct index_key {
  unsigned char bytes[16] = {};

  template <class... Value>
  index_key(const Value &...values) {
    static_assert((std::size_t{} + ... + sizeof(Value)) <= std::size_t{16});
    static_assert((std::has_unique_object_representations_v<Value> && ...));
    unsigned char *to = bytes;
    ((std::memcpy(to, &values, sizeof values), to += sizeof values), ...);
  }

  friend bool operator==(const index_key &a, const index_key &b) {
    return std::memcmp(a.bytes, b.bytes, sizeof a.bytes) == 0;
  }
};

// A hash of any bytes that is another one in each process: who chooses what is hashed cannot choose it.
std::uint64_t keyed_hash(std::span<const std::byte> bytes);

// Positions by key. The first position added for a key stays, which is what a linear search would find.
class key_index {
 public:
  static constexpr std::uint32_t none = UINT32_MAX;

  // Makes room: no call of add() asks for memory until there are more than `count` keys.
  void reserve(std::size_t count);

  // The position added first for `key`, or none.
  std::uint32_t find(const index_key &key) const;

  // Asks for what find() and add() will look at to be in the cache soon.
  void prefetch(const index_key &key) const;

  // Adds `position`, which is not none, unless `key` has one. Returns whether it was added.
  bool add(const index_key &key, std::uint32_t position);

 private:
  struct slot {
    index_key key;
    std::uint32_t position = none;
  };

  std::size_t first_slot_of(const index_key &key) const;
  std::size_t slot_of(const index_key &key) const;

  std::vector<slot> slots_;  // a power of two of them, at most half in use
  std::size_t used_ = 0;
};

#endif
