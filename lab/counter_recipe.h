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

// Adds a source, or about one in `per` of it, to the counter of this name. A counter may have several.
struct ingredient {
  std::string_view counter;
  int source;
  std::uint32_t per;
};

// Takes about one in `per`, 2 at least, of what a counter has got and gives it to another one.
struct part {
  std::string_view counter;
  std::string_view from;
  std::uint32_t per;
};

class counter_recipe {
 public:
  // `names` ends with an empty one; all counters are among them.
  counter_recipe(const counter_name *names, std::span<const ingredient> ingredients,
                 std::span<const part> parts);

  // Sets the counters by the values of the sources. `key` decides on the proportions. None falls as long as
  // no source does.
  void fill(std::span<std::uint64_t> counters, std::span<const std::uint64_t> sources,
            std::uint64_t key) const;

 private:
  struct step {
    std::size_t to;
    std::size_t from;  // a source, or another counter
    std::uint32_t per;
  };
  std::vector<step> ingredients_;
  std::vector<step> parts_;
};

}  // namespace lab

#endif
