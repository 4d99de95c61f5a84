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
  if (per == 1) return counter;
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

counter_recipe::counter_recipe(const counter_name *names, std::span<const ingredient> ingredients,
                               std::span<const part> parts) {
  for (const auto &[counter, source, per] : ingredients) {
    ingredients_.push_back({position_of(names, counter), static_cast<std::size_t>(source), per});
  }
  for (const auto &[counter, from, per] : parts) {
    parts_.push_back({position_of(names, counter), position_of(names, from), per});
  }
}

void counter_recipe::fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources,
                          std::uint64_t key) const {
  for (const step &next : ingredients_) counters[next.to] += part_of(sources[next.from], next.per, ++key);
  for (const step &next : parts_) {
    const std::uint64_t taken = part_of(counters[next.from], next.per, ++key);
    counters[next.to] += taken;
    counters[next.from] -= taken;
  }
}

}  // namespace lab
