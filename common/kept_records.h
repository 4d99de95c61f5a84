// The records of a table as the comparison with the next moment needs them: of each its key, which is all
// that identifies it, and its counters, in the order of the table, found by key.

#ifndef TARVELCTL_COMMON_KEPT_RECORDS_H
#define TARVELCTL_COMMON_KEPT_RECORDS_H

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <vector>

#include "common/record_kinds.h"
#include "common/text/memory.h"

// The counters of a kept record, in the order of its kind.
class kept_counters {
 public:
  explicit kept_counters(const std::byte *first) : at_(first) {}

  // The next one, which is this one; none where it did not hold.
  std::optional<std::uint64_t> take(const counter_at &counter) {
    if (counter.field->depends() && *at_++ == std::byte{}) return {};
    return take_number();
  }

 private:
  std::uint64_t take_number();

  const std::byte *at_;
};

// A record as it is kept.
struct kept_record {
  std::size_t next;   // the position behind it
  std::size_t kind;   // among the kinds of its table
  bool is_ambiguous;  // others have the same key
  bool is_marked;
  record_bytes key;  // equal for records that are the same
  kept_counters counters;
};

// Makes a record of this kind from what is kept of it: all else is zero. Returns its place, 0 for one that
// lies in no field.
std::size_t put_back(const record_kind &kind, const kept_record &kept, std::span<std::byte> record);

class kept_records {
 public:
  static constexpr std::size_t none = SIZE_MAX;

  // Keeps a table's records. Returns false where the table ends too early: what is whole is kept.
  bool keep(const record_kinds &kinds, record_bytes table);

  // The records by position: from 0, each leads to the next, up to end(). There is one at `position`.
  std::size_t end() const { return end_; }
  kept_record at(std::size_t position) const;

  // The position of the first record with this key, or none. It is asked for at `likely` before all others,
  // which is a position or end().
  std::size_t find(record_bytes key, std::size_t likely) const;

  // Marks a record that the next moment has, too.
  void mark(std::size_t position) { marks_of(position) |= seen; }

  // Bytes of memory.
  std::size_t size() const { return room_ + slots_.size() * sizeof slots_[0]; }

 private:
  static constexpr std::byte seen{1}, ambiguous{2};  // marks

  void resize(std::size_t room);
  void index(std::span<const std::uint64_t> hashes);
  void enter(std::size_t position, std::uint64_t hash);
  std::size_t first_slot_of(std::uint64_t hash) const;
  std::size_t slot_of(record_bytes key, std::uint64_t hash) const;
  bool has_key(std::size_t position, record_bytes key) const;
  std::byte &marks_of(std::size_t position);

  std::unique_ptr<std::byte, c_free> bytes_;
  std::size_t end_ = 0;
  std::size_t room_ = 0;              // bytes that there are
  std::vector<std::uint64_t> slots_;  // of a position and a part of its hash each, 0 where it is free
};

#endif
