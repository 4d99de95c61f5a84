#include "tarvelctl/counter_lines.h"

#include "common/output.h"
#include "tarvelctl/netstat_options.h"

void print_counters(const counter_name *names, std::span<const std::uint64_t> counters) {
  for (const std::uint64_t value : counters) {
    const counter_name &name = *names++;
    if (value || netstat_options.show_zeros) print<"\t\t%-16s: %llu\n">(name, value);
  }
}

void add_counters(std::span<std::uint64_t> total, std::span<const std::uint64_t> counters) {
  for (std::size_t i = 0; i < total.size(); ++i) total[i] += counters[i];
}
