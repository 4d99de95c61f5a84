#include "common/kept_records.h"

#include <bit>
#include <cstring>

#include "common/tables/key_index.h"
#include "common/tables/record_walk.h"

namespace {

// In front of each record. Its key begins with the kind.
struct kept_head {
  std::uint32_t size;  // of it all
  std::uint16_t key_size;
  std::byte marks;
  std::uint8_t kind;
};

constexpr std::size_t kind_offset = offsetof(kept_head, kind);
static_assert(sizeof(kept_head) == kind_offset + 1);

constexpr std::size_t most_bytes = sizeof(std::uint64_t);  // of a number

// A slot has a position, from 1, below a part of the hash.
constexpr unsigned position_bits = 40;
constexpr std::uint64_t position_mask = (std::uint64_t{1} << position_bits) - 1;

template <class Value>
std::byte *put(const Value &value, std::byte *to) {
  std::memcpy(to, &value, sizeof value);
  return to + sizeof value;
}

// A copy of constant size needs no call, and most fields are of either.
std::byte *put_bytes(const std::byte *from, std::size_t size, std::byte *to) {
  if (size == sizeof(std::uint32_t)) {
    std::memcpy(to, from, sizeof(std::uint32_t));
  } else if (size == sizeof(uuid)) {
    std::memcpy(to, from, sizeof(uuid));
  } else {
    std::memcpy(to, from, size);
  }
  return to + size;
}

// A number is kept as how many bytes it needs, because most counters are small, and as those. Eight are
// copied each time, which needs no branch: they may belong to what comes behind.
std::byte *put_number(std::uint64_t number, std::byte *to) {
  const auto size = static_cast<std::size_t>(std::bit_width(number) + 7) / 8;
  *to = static_cast<std::byte>(size);
  put(number, to + 1);
  return to + 1 + size;
}

// What follows the kind in a key. Above a record there may be several that nothing tells apart, so it is
// known by their key, of which 64 bits are enough: no one can choose them.
std::byte *put_key(const record_kind &kind, std::uint64_t above, std::size_t place, record_bytes record,
                   std::byte *to) {
  if (kind.has_above()) to = put(above, to);
  if (kind.field) to = put(static_cast<std::uint16_t>(place), to);
  for (const row *field : kind.keys) {
    if (field->depends() && !field->holds(record)) continue;
    const std::size_t size = field->size_in(record);
    if (field->type == field_type::text) *to++ = static_cast<std::byte>(size);
    to = put_bytes(record.data() + field->offset, size, to);
  }
  return to;
}

std::byte *put_counters(const record_kind &kind, record_bytes record, std::byte *to) {
  for (const counter_at &counter : kind.counters) {
    const bool holds = counter.holds(record);
    if (counter.field->depends()) *to++ = static_cast<std::byte>(holds);
    if (holds) to = put_number(counter.in(record), to);
  }
  return to;
}

// The most that one record takes.
std::size_t room_for(const record_kinds &kinds) {
  std::size_t most = 0;
  for (std::size_t kind = 0; kind < kinds.size(); ++kind) {
    std::size_t room = sizeof(kept_head) + sizeof(std::uint64_t) + sizeof(std::uint16_t);
    for (const row *field : kinds[kind].keys) room += 1U + field->size;
    most = std::max(most, room + kinds[kind].counters.size() * (2 + most_bytes) + most_bytes);
  }
  return most;
}

std::uint64_t high_product(std::uint64_t a, std::uint64_t b) {
  __extension__ using wide = unsigned __int128;
  return static_cast<std::uint64_t>((static_cast<wide>(a) * b) >> 64);
}

}  // namespace

std::uint64_t kept_counters::take_number() {
  const auto size = static_cast<std::size_t>(*at_);
  std::uint64_t number;
  std::memcpy(&number, at_ + 1, sizeof number);
  at_ += 1 + size;
  return size ? number & UINT64_MAX >> 8 * (most_bytes - size) : 0;
}

std::size_t put_back(const record_kind &kind, const kept_record &kept, std::span<std::byte> record) {
  std::ranges::fill(record, std::byte{});
  record_walk key(kept.key.subspan(1 + (kind.has_above() ? sizeof(std::uint64_t) : 0)));
  std::uint16_t place = 0;
  if (kind.field) key.take(place);
  for (const row *field : kind.keys) {
    if (field->depends() && !field->holds(record)) continue;
    const bool is_text = field->type == field_type::text;
    std::uint8_t said = 0;
    if (is_text) key.take(said);
    const std::size_t size = is_text ? said : field->size_in(record);
    record_bytes value;
    key.take(size, value);
    std::ranges::copy(value, record.begin() + field->offset);
  }
  kept_counters counters = kept.counters;
  for (const counter_at &each : kind.counters) {
    const std::uint64_t value = counters.take(each).value_or(0);
    std::memcpy(record.data() + each.field->at(each.element).offset, &value, each.field->size);
  }
  return place;
}

bool kept_records::keep(const record_kinds &kinds, record_bytes table) {
  const std::size_t most = room_for(kinds);
  std::vector<std::uint64_t> hashes;
  std::vector<std::uint64_t> last(kinds.size());  // by kind
  const bool is_whole = kinds.walk(table, [&](std::size_t kind, std::size_t place, record_bytes record) {
    if (room_ - end_ < most) resize(2 * room_ + most);
    std::byte *const start = bytes_.get() + end_;
    std::byte *const key = start + kind_offset;
    std::byte *const key_end =
        put_key(kinds[kind], last[kinds[kind].above], place, record, start + sizeof(kept_head));
    std::byte *const end = put_counters(kinds[kind], record, key_end);
    put(kept_head{static_cast<std::uint32_t>(end - start),
                  static_cast<std::uint16_t>(key_end - key),
                  {},
                  static_cast<std::uint8_t>(kind)},
        start);
    end_ += static_cast<std::size_t>(end - start);
    hashes.push_back(last[kind] = keyed_hash({key, key_end}));
  });
  resize(end_ + most_bytes);
  index(hashes);
  return is_whole;
}

void kept_records::resize(std::size_t room) {
  void *const resized = xrealloc(bytes_.get(), room);
  static_cast<void>(bytes_.release());
  bytes_.reset(static_cast<std::byte *>(resized));
  room_ = room;
}

// Slots are waited for unless they are asked for ahead.
void kept_records::index(std::span<const std::uint64_t> hashes) {
  constexpr std::size_t ahead = 16;
  slots_.assign(hashes.size() + hashes.size() / 2 + 1, 0);
  std::size_t position = 0;
  for (std::size_t i = 0; i < hashes.size(); ++i) {
    if (i + ahead < hashes.size()) __builtin_prefetch(&slots_[first_slot_of(hashes[i + ahead])]);
    enter(position, hashes[i]);
    position = at(position).next;
  }
}

void kept_records::enter(std::size_t position, std::uint64_t hash) {
  std::uint64_t &slot = slots_[slot_of(at(position).key, hash)];
  if (slot) {
    marks_of((slot & position_mask) - 1) |= ambiguous;
    marks_of(position) |= ambiguous;
  } else {
    slot = hash << position_bits | (position + 1);
  }
}

kept_record kept_records::at(std::size_t position) const {
  kept_head head;
  std::memcpy(&head, bytes_.get() + position, sizeof head);
  const record_bytes record(bytes_.get() + position, head.size);
  return {.next = position + head.size,
          .kind = head.kind,
          .is_ambiguous = (head.marks & ambiguous) != std::byte{},
          .is_marked = (head.marks & seen) != std::byte{},
          .key = record.subspan(kind_offset, head.key_size),
          .counters = kept_counters(record.data() + kind_offset + head.key_size)};
}

std::byte &kept_records::marks_of(std::size_t position) {
  return bytes_.get()[position + offsetof(kept_head, marks)];
}

bool kept_records::has_key(std::size_t position, record_bytes key) const {
  const record_bytes own = at(position).key;
  return own.size() == key.size() && std::memcmp(own.data(), key.data(), key.size()) == 0;
}

std::size_t kept_records::first_slot_of(std::uint64_t hash) const {
  return high_product(hash, slots_.size());
}

// The slot that has this key, or the free one where it belongs. There is a free one.
std::size_t kept_records::slot_of(record_bytes key, std::uint64_t hash) const {
  std::size_t at = first_slot_of(hash);
  const auto is_other = [&](std::uint64_t slot) {
    const bool may_be_it = (slot ^ hash << position_bits) >> position_bits == 0;
    return !may_be_it || !has_key((slot & position_mask) - 1, key);  // GCOVR_EXCL_BR_LINE: 1 in 2^24 differs
  };
  while (slots_[at] && is_other(slots_[at])) at = at + 1 == slots_.size() ? 0 : at + 1;
  return at;
}

std::size_t kept_records::find(record_bytes key, std::size_t likely) const {
  if (likely < end() && has_key(likely, key) && !at(likely).is_ambiguous) return likely;
  const std::uint64_t slot = slots_[slot_of(key, keyed_hash(key))];
  return slot ? (slot & position_mask) - 1 : none;
}
