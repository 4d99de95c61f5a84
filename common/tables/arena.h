// Memory arenas and their regions, as kern.tarvel.stats.arena delivers them.

#ifndef TARVELCTL_COMMON_TABLES_ARENA_H
#define TARVELCTL_COMMON_TABLES_ARENA_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char arena_node[] = "kern.tarvel.stats.arena";

inline constexpr value_names arena_types{"UNKNOWN", {{0, "NEXUS"}, {1, "PLCY"}, {2, "SYSTEM"}}};

inline constexpr value_names region_types{"UNKNOWN",
                                          {{0, "SCHEMA"},
                                           {1, "RING"},
                                           {2, "BUF"},
                                           {3, "MDU"},
                                           {4, "USD"},
                                           {5, "USTATS"},
                                           {6, "FLOWADV"},
                                           {7, "NEXUSADV"},
                                           {8, "SYSCTLS"},
                                           {9, "MDK"},
                                           {10, "KSD"},
                                           {11, "KSTATS"}}};

inline constexpr bit_names region_mode_names =
    "\20"
    "\1NOREDIRECT"
    "\2MMAPOK"
    "\3READONLY"
    "\4PERSISTENT"
    "\5MONOLITHIC"
    "\6NOCACHE"
    "\40MIRRORED";

// How many types of regions there are: 0 to SREG_MAX - 1.
inline constexpr std::size_t SREG_MAX = std::size(region_types.rows);
static_assert(region_types.rows[SREG_MAX - 1].number == SREG_MAX - 1);

// A region slot of an arena. A region may belong to several arenas; its UUID tells.
struct tv_stats_region {
  text_field<64> name;
  uuid region_uuid;
  std::int32_t type;
  std::uint32_t mode;
  std::uint64_t seg_size_req;
  std::uint64_t seg_size;
  std::uint64_t seg_count;
  std::uint64_t obj_size_req;
  std::uint64_t obj_count_req;
  std::uint64_t obj_size;
  std::uint64_t obj_count;
  std::uint64_t objs_per_seg;
  std::uint64_t mem_total;
  std::uint64_t mem_wired;
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
  std::int32_t type;
  std::uint8_t reserved_68[12];
  tv_stats_region regions[region_slots];
  std::int32_t pids[pid_slots];
};

static_assert(sizeof(tv_stats_region) == 208);
static_assert(sizeof(tv_stats_arena) == 64 + 16 + 12 * 208 + 8 * 4);

inline constexpr auto region_rows = [] {
  using record = tv_stats_region;
  using enum field_kind;
  constexpr row segments = ROW(seg_count).is(gauge, "seg_count", "segments, 0: no region here");
  // What the summary of the regions reads of an empty slot, too, is there without segments.
  const auto of_region = [&](const row &each) { return each.unless_zero(segments); };
  return join(
      of_region(ROW(name).is(field_kind::name, "name", "name of the region")),
      ROW(region_uuid).is(identifier, "region", "UUID of the region in all its arenas"),
      ROW(type).is(enumeration, "type", "type of the region").of(region_types),
      of_region(ROW(mode).is(flags, "mode", "mode of the region").of(region_mode_names)),
      of_region(ROW(seg_size_req).is(gauge, "seg_size_req", "bytes of a segment, asked for").in("bytes")),
      of_region(ROW(seg_size).is(gauge, "seg_size", "bytes of a segment, given").in("bytes")), segments,
      of_region(ROW(obj_size_req).is(gauge, "obj_size_req", "bytes of an object, asked for").in("bytes")),
      of_region(ROW(obj_count_req).is(gauge, "obj_count_req", "objects, asked for")),
      of_region(ROW(obj_size).is(gauge, "obj_size", "bytes of an object, given").in("bytes")),
      of_region(ROW(obj_count).is(gauge, "obj_count", "objects, given")),
      of_region(ROW(objs_per_seg).is(gauge, "objs_per_seg", "objects in a segment")),
      ROW(mem_total).is(gauge, "mem_total", "bytes of memory").in("bytes"),
      ROW(mem_wired).is(gauge, "mem_wired", "bytes of wired memory, 0: not wired").in("bytes"),
      ROW(reserved_168), of_region(ROW(seg_in_use).is(gauge, "seg_in_use", "segments in use")),
      of_region(ROW(rescales).is(counter, "rescales", "rescales so far")),
      of_region(ROW(allocs).is(counter, "allocs", "allocations so far")),
      of_region(ROW(frees).is(counter, "frees", "frees so far")));
}();
inline constexpr record_description region_description =
    describe<tv_stats_region>("tv_stats_region", "region", region_rows);

inline constexpr auto arena_rows = [] {
  using record = tv_stats_arena;
  using enum field_kind;
  return join(
      ROW(name).is(field_kind::name, "name", "name of the arena").identifying(),
      ROW(type).is(enumeration, "type", "type of the arena").of(arena_types).identifying(), ROW(reserved_68),
      ROW(regions).is(nested, "regions", "regions, empty where seg_count is 0").of(region_description),
      ROW(pids).is(pid, "pids", "process ids of users, up to the first 0").up_to(0));
}();
inline constexpr record_description arena_description =
    describe<tv_stats_arena>("tv_stats_arena", "arena", arena_rows);

#endif
