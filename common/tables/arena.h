// Memory arenas and their regions, as kern.tarvel.stats.arena delivers them.

#ifndef TARVELCTL_COMMON_TABLES_ARENA_H
#define TARVELCTL_COMMON_TABLES_ARENA_H

#include <cstddef>
#include <cstdint>

#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char arena_node[] = "kern.tarvel.stats.arena";

// How many types of regions there are: 0 to SREG_MAX - 1.
inline constexpr std::size_t SREG_MAX = 12;

// A region slot of an arena. A region may belong to several arenas; its UUID tells.
struct tv_stats_region {
  text_field<64> name;
  uuid region_uuid;
  std::int32_t type;           // SCHEMA, RING, ... in the report
  std::uint32_t mode;          // bits that print_flags names
  std::uint64_t seg_size_req;  // bytes, requested
  std::uint64_t seg_size;      // bytes, effective
  std::uint64_t seg_count;     // 0: an empty slot
  std::uint64_t obj_size_req;  // bytes
  std::uint64_t obj_count_req;
  std::uint64_t obj_size;  // bytes
  std::uint64_t obj_count;
  std::uint64_t objs_per_seg;
  std::uint64_t mem_total;  // bytes
  std::uint64_t mem_wired;  // bytes; 0: not wired
  std::uint64_t reserved_168;
  std::uint64_t seg_in_use;
  std::uint64_t rescales;
  std::uint64_t allocs;
  std::uint64_t frees;
};

// An arena. The table is an array of these.
struct tv_stats_arena {
  static constexpr std::size_t region_slots = 12;
  static constexpr std::size_t pid_slots = 8;

  text_field<64> name;
  std::int32_t type;  // NEXUS, PLCY, SYSTEM
  std::uint8_t reserved_68[12];
  tv_stats_region regions[region_slots];
  std::int32_t pids[pid_slots];  // processes that use the arena, up to the first 0
};

static_assert(sizeof(tv_stats_region) == 208);
static_assert(offsetof(tv_stats_region, region_uuid) == 64);
static_assert(offsetof(tv_stats_region, type) == 80);
static_assert(offsetof(tv_stats_region, mode) == 84);
static_assert(offsetof(tv_stats_region, seg_size_req) == 88);
static_assert(offsetof(tv_stats_region, seg_size) == 96);
static_assert(offsetof(tv_stats_region, seg_count) == 104);
static_assert(offsetof(tv_stats_region, obj_size_req) == 112);
static_assert(offsetof(tv_stats_region, obj_count_req) == 120);
static_assert(offsetof(tv_stats_region, obj_size) == 128);
static_assert(offsetof(tv_stats_region, obj_count) == 136);
static_assert(offsetof(tv_stats_region, objs_per_seg) == 144);
static_assert(offsetof(tv_stats_region, mem_total) == 152);
static_assert(offsetof(tv_stats_region, mem_wired) == 160);
static_assert(offsetof(tv_stats_region, seg_in_use) == 176);
static_assert(offsetof(tv_stats_region, rescales) == 184);
static_assert(offsetof(tv_stats_region, allocs) == 192);
static_assert(offsetof(tv_stats_region, frees) == 200);
static_assert(sizeof(tv_stats_arena) == 64 + 16 + 12 * 208 + 8 * 4);
static_assert(offsetof(tv_stats_arena, type) == 64);
static_assert(offsetof(tv_stats_arena, regions) == 80);
static_assert(offsetof(tv_stats_arena, pids) == 2576);

#endif
