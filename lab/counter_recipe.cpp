#include "lab/counter_recipe.h"

#include <algorithm>

namespace lab {

counter_recipe::counter_recipe(const counter_name *names, std::span<const ingredient> ingredients)
    : ingredients_(ingredients) {
  for (const ingredient &row : ingredients) {
    std::size_t position = 0;
    while (names[position].name_size && row.counter != names[position].name()) ++position;
    positions_.push_back(position);
  }
}

void counter_recipe::fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources) const {
  for (std::size_t i = 0; i < ingredients_.size(); ++i) {
    const ingredient &row = ingredients_[i];
    const std::uint64_t share =
        sources[static_cast<std::size_t>(row.source)] / static_cast<std::uint64_t>(row.per);
    std::uint64_t &counter = counters[positions_[i]];
    if (row.times > 0) {
      counter += share * static_cast<std::uint64_t>(row.times);
    } else {
      counter -= std::min(counter, share * static_cast<std::uint64_t>(-row.times));
    }
  }
}

}  // namespace lab
