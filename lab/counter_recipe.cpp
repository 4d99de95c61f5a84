#include "lab/counter_recipe.h"

#include "lab/random.h"

namespace lab {

namespace {

std::size_t position_of(const counter_name *names, std::string_view counter) {
  std::size_t position = 0;
  while (names[position].name_size && counter != names[position].name()) ++position;
  return position;
}

// One in `per` of a counter that never falls: never falls, and never rises by more than the counter does.
std::uint64_t part_of(std::uint64_t counter, std::uint32_t per, std::uint64_t key) {
  // Half of each block has more of it, by up to a half, and the other half less.
  constexpr std::uint64_t half = 4096;
  const std::uint64_t rest = counter % (2 * half);
  random_source random(key, counter / (2 * half));
  const std::uint64_t times = 32 + random.below(64);  // out of 64
  const std::uint64_t in_block =
      rest < half ? rest * times / 64 : half * times / 64 + (rest - half) * (128 - times) / 64;
  const std::uint64_t own = 96 + random_source(key).below(96);  // out of 128
  return (counter - rest + in_block) * 128 / (per * own);
}

}  // namespace

counter_recipe::counter_recipe(const counter_name *names, std::span<const known_counter> known,
                               std::span<const derived_counter> derived)
    : derived_(derived) {
  for (const known_counter &row : known) {
    known_.push_back({position_of(names, row.counter), static_cast<std::size_t>(row.source)});
  }
  for (const derived_counter &row : derived) {
    steps_.push_back({position_of(names, row.counter), position_of(names, row.from)});
  }
}

void counter_recipe::fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources,
                          std::uint64_t key) const {
  for (const step &next : known_) counters[next.to] += sources[next.from];
  for (std::size_t i = 0; i < steps_.size(); ++i) {
    const auto &[to, from] = steps_[i];
    const std::uint64_t part = part_of(counters[from], derived_[i].per, key + i);
    counters[to] += part;
    if (derived_[i].moved) counters[from] -= part;
  }
}

}  // namespace lab
