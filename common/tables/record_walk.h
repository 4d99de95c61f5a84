// Walking a table record by record, with each step checked against the table's end, and reading the records
// of an array out of order, for callers that have counted them.

#ifndef TARVELCTL_COMMON_TABLES_RECORD_WALK_H
#define TARVELCTL_COMMON_TABLES_RECORD_WALK_H

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <type_traits>

// Records are copied as they lie, so the machine must order bytes as the tables do; and sizes made of 32-bit
// counts must fit in a size_t.
static_assert(std::endian::native == std::endian::little);
static_assert(sizeof(std::size_t) == 8);

// A position in a table, which never leaves it. A step that does not fit leaves the position where it is.
class record_walk {
 public:
  explicit record_walk(std::span<const std::byte> table) : rest_(table) {}

  bool at_end() const { return rest_.empty(); }
  const std::byte *position() const { return rest_.data(); }

  // Copies the record here, which may lie at any address, and steps over it. False where too few bytes
  // remain.
  template <class Record>
  bool take(Record &record) {
    static_assert(std::is_trivially_copyable_v<Record>);
    if (rest_.size() < sizeof record) return false;
    std::memcpy(&record, rest_.data(), sizeof record);
    rest_ = rest_.subspan(sizeof record);
    return true;
  }

  // Copies the record here and points `trailing` at the record.trailing_size() bytes behind it, then steps
  // over both. False where the two do not fit in whole.
  template <class Record>
  bool take(Record &record, std::span<const std::byte> &trailing) {
    const record_walk before = *this;
    if (take(record) && take(record.trailing_size(), trailing)) return true;
    *this = before;
    return false;
  }

  // Points `bytes` at the next `count` bytes and steps over them. False where fewer remain. A count is
  // computed in 64 bits, so that what a table claims cannot wrap around.
  bool take(std::uint64_t count, std::span<const std::byte> &bytes) {
    if (rest_.size() < count) return false;
    bytes = rest_.first(static_cast<std::size_t>(count));
    rest_ = rest_.subspan(static_cast<std::size_t>(count));
    return true;
  }

 private:
  std::span<const std::byte> rest_;
};

// What follows reads arrays of records and checks nothing. The caller guarantees that the record at `index`
// lies in `records` with all its bytes: it has divided their size by that of a record, or a walk has stepped
// over them.

// The record at `index`, which may lie at any address, by value. It is copied in blocks, because the
// compilers' one instruction for copies of this size takes longer to start than to copy.
template <class Record>
Record record_at(std::span<const std::byte> records, std::size_t index) {
  static_assert(std::is_trivially_copyable_v<Record>);
  constexpr std::size_t block = 64, in_blocks = sizeof(Record) / block * block;
  Record record;
  auto *const to = reinterpret_cast<std::byte *>(&record);
  const std::byte *const from = records.data() + index * sizeof record;
  for (std::size_t done = 0; done < in_blocks; done += block) std::memcpy(to + done, from + done, block);
  std::memcpy(to + in_blocks, from + in_blocks, sizeof record - in_blocks);
  return record;
}

// A member of the record at `index`: `offset` and type as in the record, within which it lies.
template <class Record, class Member>
Member member_at(std::span<const std::byte> records, std::size_t index, std::size_t offset) {
  Member value;
  std::memcpy(&value, records.data() + index * sizeof(Record) + offset, sizeof value);
  return value;
}

// Asks for the record at `index` to be in the cache soon: records that are read out of order would each be
// waited for.
template <class Record>
void prefetch_record(std::span<const std::byte> records, std::size_t index) {
  constexpr std::size_t cache_line = 64;
  const std::byte *at = records.data() + index * sizeof(Record);
  for (std::size_t i = 0; i < sizeof(Record); i += cache_line) __builtin_prefetch(at + i);
  __builtin_prefetch(at + sizeof(Record) - 1);  // records do not begin where cache lines do
}

#endif
