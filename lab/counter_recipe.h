// Counters that follow from others: the more packets, the more of everything that happens to packets, on each
// machine and at each time in proportions of its own; and what adds up in a kernel adds up here.

#ifndef TARVELCTL_LAB_COUNTER_RECIPE_H
#define TARVELCTL_LAB_COUNTER_RECIPE_H

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "common/tables/counters.h"

namespace lab {

// A counter that the world keeps itself. One that has several is their sum.
struct known_counter {
  std::string_view counter;
  int source;
};

// About one in `per` of another counter, 2 at least, counts here, too; or, where it is `moved`, only here.
// The counter it is taken from must be complete in the rows above: so none ever falls.
struct derived_counter {
  std::string_view counter;
  std::string_view from;
  std::uint32_t per;
  bool moved;
};

class counter_recipe {
 public:
  // `names` ends with an empty one; all counters are among them.
  counter_recipe(const counter_name *names, std::span<const known_counter> known,
                 std::span<const derived_counter> derived);

  // Sets the counters by the values of the sources. `key` decides on the proportions.
  void fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources,
            std::uint64_t key) const;

 private:
  struct step {
    std::size_t to;
    std::size_t from;
  };
  std::span<const derived_counter> derived_;
  std::vector<step> known_;  // from a source
  std::vector<step> steps_;  // from a counter
};

}  // namespace lab

#endif
