// memory: the arenas with their processes and regions, and what the regions take by type.

#include <iterator>
#include <limits>

#include "common/names/process_names.h"
#include "common/tables/arena.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"
#include "tarvelctl/region_set.h"

namespace {

// Outlives a run of the watch loop: a region counts with what it had when it was first seen.
region_set tv_region_set;

void tv_region_set_add(const tv_stats_region &region) {
  tv_region_set.add(region);
}

void print_separator(char character) {
  format::small_text<71> line;
  line.size = 70;
  std::memset(line.chars, character, line.size);
  print<"%s\n">(line);
}

// Bytes in all, and those of them that are wired.
struct memory_size {
  std::uint64_t total = 0;
  std::uint64_t wired = 0;

  void add(const memory_size &other) {
    total += other.total;
    wired += other.wired;
  }
};

std::uint64_t kilobytes(std::uint64_t bytes) {
  return bytes >> 10;
}

double megabytes(std::uint64_t bytes) {
  constexpr double per_unit = 1.0 / 1024;
  return static_cast<double>(bytes) * per_unit * per_unit;
}

// By how many per cent what is there exceeds what was asked for. The products wrap as the kernel's own do.
double object_inflation(const tv_stats_region &region) {
  if (region.obj_count_req == 0 || region.obj_size_req == 0) return 0;
  const auto effective = static_cast<double>(region.obj_size * region.obj_count);
  const auto requested = static_cast<double>(region.obj_size_req * region.obj_count_req);
  // Machines differ in the sign of 0 / 0, which is printed.
  if (effective == 0 && requested == 0) return -std::numeric_limits<double>::quiet_NaN();
  return (effective / requested - 1) * 100;
}

double segment_inflation(const tv_stats_region &region) {
  if (region.seg_size_req == 0) return 0;
  return (static_cast<double>(region.seg_size) / static_cast<double>(region.seg_size_req) - 1) * 100;
}

double occupancy(const tv_stats_region &region) {
  return static_cast<double>(region.seg_in_use * 100) / static_cast<double>(region.seg_count);
}

void print_region(const tv_stats_region &region) {
  print<"%15s  %s\n">(format::text_of<"%.12s region:", 64>(region_types.of(region.type)), region.name);
  print<"        allocs:  %llu\n">(region.allocs);
  print<"         frees:  %llu\n">(region.frees);
  print<"      rescales:  %llu\n">(region.rescales);
  print<"          mode:  0x%x">(region.mode);
  print_flags(nullptr, region.mode, region_mode_names);
  print<"\n">();
  print<"          objs:  %llu per segment\n">(region.objs_per_seg);
  print<" objs cnt*size:  %llu*%llu -> %llu*%llu (%.2f%% inflation)\n">(
      region.obj_count_req, region.obj_size_req, region.obj_count, region.obj_size, object_inflation(region));
  print<"       segsize:  %llu -> %llu (%.2f%% inflation)\n">(region.seg_size_req, region.seg_size,
                                                              segment_inflation(region));
  print<"      segments:  %llu/%llu (%.2f%% in use)\n">(region.seg_in_use, region.seg_count,
                                                        occupancy(region));
  if (region.mem_wired) {
    print<"  wired memory:  %llu KB\n">(kilobytes(region.mem_wired));
  } else {
    print<"        memory:  %llu KB\n">(kilobytes(region.mem_total));
  }
}

void print_arena_total(const memory_size &memory) {
  print_separator('-');
  print<"         TOTAL:  %llu KB">(kilobytes(memory.total));
  if (memory.wired) print<" (wired %llu KB)">(kilobytes(memory.wired));
  print<"\n">();
  print_separator('-');
  print<"\n">();
}

void print_arena(const tv_stats_arena &arena, process_names &processes) {
  for (const tv_stats_region &region : arena.regions) tv_region_set.prefetch(region);
  print_separator('=');
  print<"%15s  %s\n">(format::text_of<"%.12s arena:", 64>(arena_types.of(arena.type)), arena.name);
  for (const std::int32_t pid : arena.pids) {
    if (pid == 0) break;
    print<"%15s  %s\n">("", processes.of(pid));
  }
  print_separator('=');
  memory_size memory;
  bool is_first = true;
  for (const tv_stats_region &region : arena.regions) {
    tv_region_set_add(region);
    if (region.seg_count == 0) continue;
    if (!is_first) print<"              |\n">();
    is_first = false;
    print_region(region);
    memory.add({region.mem_total, region.mem_wired});
  }
  print_arena_total(memory);
}

// Regions of a type without a name are left out.
void __tv_region_set_print_summary() {
  memory_size by_type[SREG_MAX];
  for (const region_set::item &item : tv_region_set.items()) {
    if (item.id < SREG_MAX) by_type[item.id].add({item.mem_total, item.mem_wired});
  }
  print_separator('+');
  print<" Tarvel Region Memory Usage Summary (deduplicated)\n">();
  print_separator('+');
  print<"                         Total         Wired\n">();
  memory_size all;
  for (std::size_t type = 0; type < SREG_MAX; ++type) {
    const memory_size &memory = by_type[type];
    print<"%14s:   %9llu KB  %9llu KB\n">(region_types.rows[type].name, kilobytes(memory.total),
                                          kilobytes(memory.wired));
    all.add(memory);
  }
  print_separator('-');
  print<"         TOTAL:       %5.2f MB      %5.2f MB\n">(megabytes(all.total), megabytes(all.wired));
  print_separator('-');
}

void __memory_arena_stats() {
  kernel_table table;
  if (table.fetch(arena_node) != 0 || table.empty()) return;
  process_names processes(true);
  record_walk walk(table.bytes());
  for (tv_stats_arena arena; walk.take(arena);) print_arena(arena, processes);
  __tv_region_set_print_summary();
  require(walk.at_end(), {"__memory_arena_stats", "tarvelctl/tarvelctl", 1620, "scan == (buffer + length)"});
}

}  // namespace

int cmd_memory(int argc, char **argv) {
  report.flush();
  while (getopt_long(argc, argv, "", no_options, nullptr) != -1)
    print_options_usage(no_options, no_option_flags);
  __memory_arena_stats();
  return 0;
}
