// Counters that follow from what was moved: the more packets, the more of everything that happens to packets,
// and what adds up in a kernel adds up here.

#ifndef TARVELCTL_LAB_COUNTER_RECIPE_H
#define TARVELCTL_LAB_COUNTER_RECIPE_H

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "common/tables/counters.h"

namespace lab {

// Adds `times` for each `per` of a source to the counter of this name. A counter may have several. Where they
// take away, it never falls as long as each `per` is a multiple of the one before.
struct ingredient {
  std::string_view counter;
  int source;
  int times;
  int per;
};

class counter_recipe {
 public:
  // `names` ends with an empty one; every ingredient's counter is among them.
  counter_recipe(const counter_name *names, std::span<const ingredient> ingredients);

  // Sets the counters that have ingredients, by the values of the sources.
  void fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources) const;

 private:
  std::span<const ingredient> ingredients_;
  std::vector<std::size_t> positions_;  // of the ingredients' counters
};

}  // namespace lab

#endif
