#include "common/tables/key_index.h"

#include <unistd.h>

#include <algorithm>
#include <bit>
#include <utility>

namespace {

// Drawn once for the process: whoever chooses the keys of a table must not be able to choose their slots.
struct hash_key {
  std::uint64_t halves[2] = {0x9e3779b97f4a7c15, 0xc2b2ae3d27d4eb4f};

  hash_key() {
    // Where there is none to draw, the slots are only hard to choose.
    [[maybe_unused]] const int error = getentropy(halves, sizeof halves);
  }
};

const hash_key &secret() {
  static const hash_key drawn;
  return drawn;
}

std::uint64_t folded_product(std::uint64_t a, std::uint64_t b) {
  __extension__ using wide = unsigned __int128;
  const wide product = static_cast<wide>(a) * b;
  return static_cast<std::uint64_t>(product) ^ static_cast<std::uint64_t>(product >> 64);
}

// Of 16 bytes, and of what was hashed before them.
std::uint64_t hash_block(const void *bytes, std::uint64_t before, const hash_key &by) {
  std::uint64_t halves[2];
  std::memcpy(halves, bytes, sizeof halves);
  const std::uint64_t once = folded_product(halves[0] ^ by.halves[0] ^ before, halves[1] ^ by.halves[1]);
  return folded_product(once ^ by.halves[1], 0x9e3779b97f4a7c15);
}

std::uint64_t hash(const index_key &key) {
  return hash_block(key.bytes, 0, secret());
}

}  // namespace

std::uint64_t keyed_hash(std::span<const std::byte> bytes) {
  constexpr std::size_t block = sizeof(index_key);
  const hash_key &by = secret();
  std::uint64_t hash = bytes.size();
  for (; bytes.size() > block; bytes = bytes.subspan(block)) hash = hash_block(bytes.data(), hash, by);
  unsigned char last[block] = {};
  std::copy_n(reinterpret_cast<const unsigned char *>(bytes.data()), bytes.size(), last);
  return hash_block(last, hash, by);
}

// Where the search for `key` begins. There are slots.
std::size_t key_index::first_slot_of(const index_key &key) const {
  return hash(key) & (slots_.size() - 1);
}

void key_index::prefetch(const index_key &key) const {
  if (!slots_.empty()) __builtin_prefetch(&slots_[first_slot_of(key)]);
}

// The slot that holds `key`, or the free one where it belongs. There is a free one.
std::size_t key_index::slot_of(const index_key &key) const {
  const std::size_t mask = slots_.size() - 1;
  std::size_t at = first_slot_of(key);
  while (slots_[at].position != none && !(slots_[at].key == key)) at = (at + 1) & mask;
  return at;
}

std::uint32_t key_index::find(const index_key &key) const {
  return slots_.empty() ? none : slots_[slot_of(key)].position;
}

bool key_index::add(const index_key &key, std::uint32_t position) {
  if (2 * used_ >= slots_.size()) reserve(used_ + 1);
  slot &place = slots_[slot_of(key)];
  if (place.position != none) return false;
  place = {key, position};
  ++used_;
  return true;
}

// Without a call for each key: as many keys move as ever were added.
[[gnu::flatten]] void key_index::reserve(std::size_t count) {
  const std::size_t size = std::max<std::size_t>(64, std::bit_ceil(2 * count));
  if (size <= slots_.size()) return;
  std::vector<slot> before(size);
  std::swap(before, slots_);
  for (const slot &old : before) {
    if (old.position != none) slots_[slot_of(old.key)] = old;
  }
}
