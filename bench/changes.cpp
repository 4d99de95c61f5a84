// What it costs to find out what changed between two moments of a kernel, in CPU seconds: with the reading of
// the later one and without. Behind that come the bytes of its tables, those that are kept of them, and the
// records that became each of what a record can become.

#include <time.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <vector>

#include "common/changes.h"

namespace {

double cpu_seconds() {
  timespec now{};
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

moment read_below(const char *root, const std::vector<const table_description *> &tables) {
  setenv("TARVEL_ROOT", root, 1);
  return read_moment(tables);
}

}  // namespace

int main(int argc, char **argv) {
  if (argc < 3) return std::fprintf(stderr, "usage: changes BEFORE AFTER [NODE...]\n"), 64;
  std::vector<const table_description *> tables;
  for (const table_description &table : all_tables) {
    bool is_asked = argc == 3;
    for (int i = 3; i < argc; ++i) is_asked |= std::string_view(table.node) == argv[i];
    if (is_asked) tables.push_back(&table);
  }
  earlier_moment kept;
  kept.keep(read_below(argv[1], tables));
  const double start = cpu_seconds();
  const moment later = read_below(argv[2], tables);
  const double read = cpu_seconds();
  std::array<unsigned long, 6> fates{};
  kept.follow(later, [&](const changed_record &each) { ++fates[static_cast<std::size_t>(each.became)]; });
  const double end = cpu_seconds();
  std::size_t size = 0;
  for (const table_reading &each : later.tables) {
    if (each.error) return std::fprintf(stderr, "%s: no such table\n", each.what->node), 1;
    size += each.content.size();
  }
  std::printf("%.6f %.6f %zu %zu", end - start, end - read, size, kept.size());
  for (const unsigned long count : fates) std::printf(" %lu", count);
  std::printf("\n");
  return 0;
}
