#include "lab/world.h"

#include <algorithm>
#include <cstring>
#include <iterator>

#include "lab/incidents.h"
#include "lab/programs.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

// A machine of the usual size has these providers, a larger one has them several times over. So many
// instances of each fit.
struct provider_pattern {
  nexus_kind kind;
  std::uint32_t instances;
};

constexpr provider_pattern pattern[] = {
    {nexus_kind::multistack, 1}, {nexus_kind::net_if, 1},      {nexus_kind::multistack, 1},
    {nexus_kind::net_if, 1},     {nexus_kind::net_if, 1},      {nexus_kind::bridge, 1},
    {nexus_kind::user_pipe, 3},  {nexus_kind::kernel_pipe, 3}, {nexus_kind::scratch_pipe, 2},
};
constexpr std::uint32_t pattern_instances = 14;
constexpr std::uint32_t most_instances = 3;

void start_processes(world &state) {
  const std::uint32_t count = state.size.processes;
  const std::uint32_t gap = std::clamp<std::uint32_t>(60'000 / std::max(count, 1U), 1, 60);
  for (std::uint32_t i = 0; i < count; ++i) {
    state.next_pid += static_cast<std::int32_t>(state.random.between(1, gap));
    state.processes.push_back(
        {.pid = state.next_pid, .program = i % static_cast<std::uint32_t>(programs.size())});
    state.started.push_back(i);
  }
}

// Deals out instances in turns: each provider gets one, then those that take more.
void deal_instances(std::vector<provider> &providers, std::uint32_t count) {
  if (providers.empty()) return;
  for (std::uint32_t turn = 0; count; ++turn) {
    for (std::size_t i = 0; i < providers.size() && count; ++i) {
      if (turn % most_instances >= pattern[i % std::size(pattern)].instances) continue;
      ++providers[i].nexus_count;
      --count;
    }
  }
}

void register_providers(world &state) {
  std::uint32_t of_kind[nexus_kinds] = {};
  for (std::uint32_t i = 0; i < state.size.providers; ++i) {
    const nexus_kind kind = pattern[i % std::size(pattern)].kind;
    state.providers.push_back({state.random.identity(), kind, of_kind[static_cast<int>(kind)]++, 0, 0});
  }
  std::uint32_t count = state.size.nexuses;
  if (count == none) count = (state.size.providers * pattern_instances + 8) / 9;
  deal_instances(state.providers, count);
  for (provider &owner : state.providers) {
    owner.first_nexus = static_cast<std::uint32_t>(state.nexuses.size());
    for (std::uint32_t i = 0; i < owner.nexus_count; ++i) {
      // A provider's first instance has its ordinal, later ones follow the last provider's.
      const std::uint32_t ordinal = i ? of_kind[static_cast<int>(owner.kind)]++ : owner.ordinal;
      state.nexuses.push_back(
          {.id = state.random.identity(), .kind = owner.kind, .alive = true, .ordinal = ordinal});
    }
  }
  state.multistacks.resize(of_kind[static_cast<int>(nexus_kind::multistack)], none);
  for (std::uint32_t i = 0; i < state.nexuses.size(); ++i) {
    const nexus &instance = state.nexuses[i];
    if (instance.kind == nexus_kind::multistack) state.multistacks[instance.ordinal] = i;
  }
  for (const nexus &below : state.nexuses) {
    if (below.kind != nexus_kind::net_if || below.ordinal >= state.multistacks.size()) continue;
    const std::uint32_t above = state.multistacks[below.ordinal];
    if (above != none)
      state.nexuses[above].interface = static_cast<std::uint32_t>(&below - state.nexuses.data());
  }
}

// Pipes without a name come and go with those who talk through them.
void replace_pipes(world &state, std::uint32_t milliseconds) {
  for (nexus &instance : state.nexuses) {
    if (instance.kind != nexus_kind::scratch_pipe || !state.random.chance(milliseconds, 4000)) continue;
    instance.alive = !instance.alive;
    if (instance.alive) instance.id = state.random.identity();
  }
}

void step(world &state, std::uint32_t milliseconds) {
  replace_pipes(state, milliseconds);
  replace_channels(state, milliseconds);
  cause_trouble(state, milliseconds);  // the flows of what it takes end before it is closed
  wander_routes(state);
  replace_flows(state, milliseconds);
  move_flows(state, milliseconds);
  deliver(state, milliseconds);
}

void end_interval(world &state, std::uint32_t milliseconds) {
  for (channel &port : state.channels) {
    port.moved.out.end_interval(milliseconds);
    port.moved.in.end_interval(milliseconds);
  }
}

}  // namespace

std::string interface_name(nexus_kind kind, std::uint32_t ordinal) {
  static constexpr const char *prefixes[] = {"en", "en", "bridge"};
  const auto row = static_cast<std::size_t>(kind);
  return row < std::size(prefixes) ? prefixes[row] + std::to_string(ordinal) : std::string();
}

std::uint32_t interface_index(nexus_kind kind, std::uint32_t ordinal) {
  if (kind > nexus_kind::bridge) return 0;
  return kind == nexus_kind::bridge ? 5 + 2 * ordinal : 4 + 2 * ordinal;  // 1 to 3 are the system's own
}

std::uint64_t key_of(const uuid &id) {
  std::uint64_t key;
  std::memcpy(&key, id.bytes, sizeof key);
  return key;
}

world make_world(const sizes &size, std::uint64_t seed) {
  constexpr std::uint32_t uptime = 5 * 3600 * 1000;
  constexpr std::uint32_t second = 1000;
  world state{.size = size, .seed = seed, .random = random_source(seed)};
  start_processes(state);
  register_providers(state);
  open_channels(state);
  open_flows(state);
  deliver(state, uptime);
  end_interval(state, uptime);
  // All states that there are last for a second: none is left.
  move_flows(state, second);
  deliver(state, second);
  end_interval(state, second);
  return state;
}

std::string registered_name(nexus_kind kind, std::uint32_t ordinal) {
  static constexpr const char *names[] = {"multistack",     "net-if", "bridge",
                                          "content-filter", "tunnel", "scratch"};
  static_assert(std::size(names) == nexus_kinds);
  const std::string interface = interface_name(kind, ordinal);
  std::string name = std::string("com.example.").append(names[static_cast<int>(kind)]).append(1, '.');
  return name.append(interface.empty() ? std::to_string(ordinal) : interface);
}

void advance(world &state, std::uint32_t milliseconds) {
  constexpr std::uint32_t longest = 250;
  for (std::uint32_t left = milliseconds; left;) {
    const std::uint32_t now = std::min(left, longest);
    left -= now;
    state.elapsed += now;
    step(state, now);
  }
  end_interval(state, milliseconds);
}

}  // namespace lab
