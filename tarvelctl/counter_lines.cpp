#include "tarvelctl/counter_lines.h"

#include <algorithm>

#include "common/text/output.h"
#include "tarvelctl/netstat_options.h"

void print_counters(const counter_name *names, std::span<const std::uint64_t> counters) {
  const auto begin = counters.begin(), end = counters.end();
  for (auto at = begin;; ++at) {
    if (!netstat_options.show_zeros)
      at = std::find_if(at, end, [](std::uint64_t value) { return value != 0; });
    if (at == end) return;
    print<"\t\t%s: %llu\n">(names[at - begin], *at);
  }
}

void add_counters(std::span<std::uint64_t> total, std::span<const std::uint64_t> counters) {
  for (std::size_t i = 0; i < total.size(); ++i) total[i] += counters[i];
}
