// kern.tarvel.stats.arena

#include "common/tables/arena.h"

#include <algorithm>
#include <cctype>

#include "lab/tables.h"

namespace lab {

namespace {

constexpr std::uint32_t no_redirect = region_mode_names.bit("NOREDIRECT");
constexpr std::uint32_t map_ok = region_mode_names.bit("MMAPOK");
constexpr std::uint32_t read_only = region_mode_names.bit("READONLY");
constexpr std::uint32_t persistent = region_mode_names.bit("PERSISTENT");
constexpr std::uint32_t monolithic = region_mode_names.bit("MONOLITHIC");
constexpr std::uint32_t no_cache = region_mode_names.bit("NOCACHE");
constexpr std::uint32_t mirrored = region_mode_names.bit("MIRRORED");

// Whose region it is: arenas of one channel, of one nexus or of the whole machine share it.
enum scope : std::uint8_t { channel_scope, nexus_scope, machine_scope, scopes };

struct region_shape {
  scope shared;
  std::uint32_t mode;
  std::uint32_t object_size;  // as asked for
  std::uint32_t objects;
  std::uint32_t alignment;  // of objects
  std::uint32_t segment_size;
  bool wired;
};

// By region type.
constexpr region_shape region_shapes[tv_stats_arena::region_slots] = {
    {channel_scope, no_redirect | map_ok | read_only | monolithic, 2904, 1, 64, 16384, false},
    {channel_scope, map_ok, 12'440, 4, 64, 32768, false},
    {nexus_scope, map_ok | persistent, 2048, 2000, 128, 65536, true},
    {nexus_scope, map_ok | persistent, 480, 2000, 64, 32768, false},
    {channel_scope, map_ok, 16, 1500, 16, 16384, false},
    {channel_scope, map_ok | monolithic, 9800, 1, 64, 16384, false},
    {nexus_scope, map_ok | read_only | monolithic, 20, 512, 4, 16384, false},
    {nexus_scope, map_ok | read_only | monolithic, 64, 1, 64, 16384, false},
    {machine_scope, no_redirect | map_ok | read_only | monolithic | mirrored, 1100, 1, 64, 16384, false},
    {nexus_scope, persistent, 600, 2000, 64, 32768, true},
    {channel_scope, no_cache, 24, 1500, 8, 16384, false},
    {nexus_scope, no_cache | monolithic, 5200, 1, 64, 16384, true},
};

constexpr char machine_name[] = "com.example.machine";
constexpr char system_name[] = "com.example.system";
constexpr char policy_name[] = "com.example.policy";

struct arena_parts {
  std::int32_t type;
  std::uint32_t regions;  // bits
};

constexpr arena_parts system_parts{arena_types.number("SYSTEM"), 1 << 8};
constexpr arena_parts policy_parts{arena_types.number("PLCY"), 1 << 0 | 1 << 5 | 1 << 11};
constexpr arena_parts switch_parts{arena_types.number("NEXUS"), 0xfff};
constexpr arena_parts pipe_parts{arena_types.number("NEXUS"), 0xfff & ~(1 << 6 | 1 << 7)};

struct region_usage {
  std::uint64_t packets = 0;   // that came and went
  std::uint32_t channels = 1;  // that there may be, were opened so far, and are open
  std::uint32_t opened = 1;
  std::uint32_t open = 1;
  std::uint32_t leaked = 0;  // thousandths
};

// By scope.
struct arena_owner {
  uuid ids[scopes];
  std::string names[scopes];
  region_usage used[scopes];
};

std::uint64_t rounded_up(std::uint64_t value, std::uint64_t step) {
  return (value + step - 1) / step * step;
}

// How a region is used, in segments. None of it ever falls but what is in use.
void use_region(tv_stats_region &made, const region_usage &usage, std::uint64_t key) {
  const std::uint64_t usual = made.seg_count;
  // A third for the channels that are open, a tenth more or less with the packets that come and go.
  const std::uint64_t each = usual / 3 / std::max(usage.channels, 1U);
  const std::uint64_t wave = usual / 10;
  const std::uint64_t cached = std::max<std::uint64_t>(made.objs_per_seg, 1) * (3 + key % 4);
  made.allocs = usual * 2 / 5 + wave + usage.packets / cached;
  const std::uint64_t at = wave ? made.allocs / 2 % (2 * wave) : 0;
  made.seg_in_use = usual * 2 / 5 + std::min(at, 2 * wave - at) + usage.open * each;
  made.allocs += usage.opened * each;
  if (usual == 1) made.seg_in_use = made.allocs = 1;
  // It is scaled anew to up to twice its size, and then it is full.
  const std::uint64_t leaked = usual * usage.leaked / 1000;
  made.seg_count += usual > 1 ? std::min(leaked, usual) : 0;
  made.rescales = usual > 8 ? key / 8 % 5 + (made.seg_count - usual + 7) / 8 : 0;
  made.allocs += leaked;
  made.seg_in_use += leaked;
  made.frees = made.allocs - made.seg_in_use;
  const std::uint64_t missing = made.seg_in_use - std::min(made.seg_in_use, made.seg_count);
  made.seg_in_use -= missing;
  made.allocs -= missing;
}

// The state of a region follows from whose it is, so that all arenas that have it show the same.
tv_stats_region region_of(const world &state, std::size_t type, const arena_owner &whose) {
  const region_shape &shape = region_shapes[type];
  random_source random(state.seed, 16 + type, key_of(whose.ids[shape.shared]));
  tv_stats_region made{};
  std::string name = whose.names[shape.shared] + ".";
  for (const char c : region_types.rows[type].name.view()) name += static_cast<char>(std::tolower(c));
  set_text(made.name, name);
  made.region_uuid = random.identity();
  made.type = static_cast<std::int32_t>(type);
  made.mode = shape.mode;
  made.obj_size_req = shape.object_size;
  made.obj_count_req = shape.objects;
  made.obj_size = rounded_up(shape.object_size, shape.alignment);
  // What is asked for becomes pages, what is made whole segments.
  made.seg_size_req = rounded_up(std::max<std::uint64_t>(made.obj_size, shape.segment_size / 4 * 3), 4096);
  made.seg_size = shape.segment_size;
  made.objs_per_seg = shape.mode & monolithic ? shape.objects : made.seg_size / made.obj_size;
  made.seg_count = rounded_up(shape.objects, made.objs_per_seg) / made.objs_per_seg;
  use_region(made, whose.used[shape.shared], key_of(made.region_uuid));
  made.obj_count = made.seg_count * made.objs_per_seg;
  made.mem_total = made.seg_count * made.seg_size;
  made.mem_wired = shape.wired ? made.seg_in_use * made.seg_size : 0;
  return made;
}

void put_arena(const world &state, const arena_parts &parts, const arena_owner &owner,
               const std::vector<std::int32_t> &pids, table_file &file) {
  tv_stats_arena arena{};
  set_text(arena.name, owner.names[channel_scope]);
  arena.type = parts.type;
  for (std::size_t type = 0; type < tv_stats_arena::region_slots; ++type) {
    if ((parts.regions >> type & 1) == 0) continue;
    arena.regions[type] = region_of(state, type, owner);
  }
  for (std::size_t i = 0; i < std::min(pids.size(), tv_stats_arena::pid_slots); ++i) arena.pids[i] = pids[i];
  file.put(arena);
}

// The first processes that run, from a program on.
std::vector<std::int32_t> running(const world &state, std::uint32_t first_program) {
  std::vector<std::int32_t> pids;
  for (const process &source : state.processes) {
    if (source.pid && source.program >= first_program) pids.push_back(source.pid);
    if (pids.size() == tv_stats_arena::pid_slots) break;
  }
  return pids;
}

// Who has an arena of a channel: its owner, and the owner of the second port of its nexus, a switch's device
// or a pipe's other end.
std::vector<std::int32_t> users_of(const world &state, const channel &used) {
  const nexus &place = state.nexuses[used.nexus];
  std::vector<std::int32_t> pids{state.processes[used.process].pid};
  if (place.channel_count < 2) return pids;
  const std::int32_t other = state.processes[state.channels[place.first_channel + 1].process].pid;
  if (other && other != pids[0]) pids.push_back(other);
  return pids;
}

// Where there are more arenas than channels, channels have several: `turn` tells them apart.
void put_channel_arena(const world &state, const channel &used, std::size_t turn, table_file &file) {
  const nexus &place = state.nexuses[used.nexus];
  arena_owner owner{{used.id, place.id, {}}, {"", registered_name(place.kind, place.ordinal), machine_name}};
  owner.names[channel_scope] = owner.names[nexus_scope] + ".port";
  owner.names[channel_scope] += std::to_string(used.port);
  if (turn) {
    owner.ids[channel_scope] = random_source(turn, used.id.bytes[0], used.id.bytes[1]).identity();
    owner.names[channel_scope].append(1, '.').append(std::to_string(turn));
  }
  owner.used[nexus_scope] = {place.moved.out.packets + place.moved.in.packets, place.channel_count,
                             place.opened, place.open, place.leaked};
  owner.used[channel_scope].packets = used.moved.out.total.packets + used.moved.in.total.packets;
  owner.used[channel_scope].open = used.state == channel::phase::open;
  const arena_parts &parts = place.kind == nexus_kind::multistack ? switch_parts : pipe_parts;
  put_arena(state, parts, owner, users_of(state, used), file);
}

}  // namespace

void write_arenas(const world &state, table_file &file) {
  const std::size_t count = state.size.arenas;
  const arena_owner system{{}, {system_name, "", machine_name}};
  const arena_owner policy{{}, {policy_name, policy_name, machine_name}};
  if (count > 0) put_arena(state, system_parts, system, running(state, 0), file);
  if (count > 1) put_arena(state, policy_parts, policy, running(state, flow_programs), file);
  const std::size_t channels = state.channels.size();
  const std::size_t stride = channels % 3 ? 3 : 1;  // a few arenas are of all kinds of nexus
  for (std::size_t i = 2; i < count && channels; ++i) {
    const channel &used = state.channels[(i - 2) * stride % channels];
    if (used.state != channel::phase::closed) put_channel_arena(state, used, (i - 2) / channels, file);
  }
}

}  // namespace lab
