// Channels: who has which port of which nexus, and how they come and go.

#include <algorithm>
#include <iterator>

#include "lab/programs.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr std::uint32_t unlimited = none;

struct port_plan {
  std::uint32_t each_turn;  // channels that a nexus gets in a turn of the deal
  std::uint32_t most;
  std::uint32_t owners[2];  // programs, of port 0 and of the others
};

// By nexus_kind. Others than the host and its devices use a multistack switch: the programs with flows.
constexpr port_plan plans[] = {
    {3, unlimited, {network_daemon, network_daemon}}, {1, 1, {packet_monitor, packet_monitor}},
    {1, unlimited, {network_daemon, machine_daemon}}, {1, 2, {network_daemon, packet_monitor}},
    {1, 1, {tunnel_daemon, tunnel_daemon}},           {0, 0, {0, 0}},
};
static_assert(std::size(plans) == nexus_kinds);

std::uint32_t most_channels(const nexus &owner) {
  // Someone looks at every third interface.
  if (owner.kind == nexus_kind::net_if && owner.ordinal % 3) return 0;
  return plans[static_cast<int>(owner.kind)].most;
}

// Deals in turns, so that few channels are spread over all kinds of nexus.
void deal_channels(std::vector<nexus> &nexuses, std::uint32_t count) {
  for (bool dealt = true; dealt && count;) {
    dealt = false;
    for (nexus &owner : nexuses) {
      const std::uint32_t room = most_channels(owner) - owner.channel_count;
      const std::uint32_t given = std::min({plans[static_cast<int>(owner.kind)].each_turn, room, count});
      owner.channel_count += given;
      count -= given;
      dealt |= given > 0;
    }
  }
}

// A switch has its first client before its device and its host.
std::uint32_t port_of(nexus_kind kind, std::uint32_t number) {
  const bool is_switch = kind == nexus_kind::multistack || kind == nexus_kind::bridge;
  if (!is_switch || number > 2) return number;
  return number == 0 ? 2 : number - 1;
}

// The lowest free descriptor, as every kernel gives it.
std::int32_t take_descriptor(process &owner) {
  return owner.free.empty() ? owner.next_fd++ : owner.free.extract(owner.free.begin()).value();
}

void open_channel(world &state, channel &opened) {
  process &owner = state.processes[opened.process];
  // Whoever has a channel has a few files, too.
  if (owner.next_fd == 0) owner.next_fd = static_cast<std::int32_t>(state.random.between(3, 20));
  opened.id = state.random.identity();
  opened.fd = take_descriptor(owner);
  ++owner.channels;
  ++state.nexuses[opened.nexus].opened;
  ++state.nexuses[opened.nexus].open;
  opened.state = channel::phase::open;
}

// What a program did before anyone looked.
void remember_past(world &state, channel &opened) {
  for (int kind = 0; kind < 4; ++kind) {
    const std::uint64_t packets = state.random.between(5000, 400'000);
    const std::uint64_t answers = packets / state.random.between(1, 4);
    opened.now[kind / 2][kind % 2] += {{packets * 300, packets}, {answers * 900, answers}};
  }
  std::uint32_t initiated = state.random.between(10, 900);
  std::uint32_t accepted = state.random.between(0, 12);
  if (is_server(state, opened)) std::swap(initiated, accepted);
  auto &count = opened.stack.count;
  count[stack::initiated] = initiated;
  count[stack::accepted] = accepted;
  count[stack::closed] = initiated + accepted;
  count[stack::refused] = initiated / state.random.between(15, 60);
  count[stack::established] = count[stack::closed] - count[stack::refused];
}

std::uint32_t owner_of(const world &state, const nexus &place, std::uint32_t port) {
  if (place.kind == nexus_kind::multistack && port > channel::host_port) {
    const auto client = static_cast<std::uint32_t>(state.flow_channels.size());
    return process_for(state, client % flow_programs, client / flow_programs);
  }
  return process_for(state, plans[static_cast<int>(place.kind)].owners[port > 0], place.ordinal);
}

// The kernel takes the channel of a client that sleeps.
void take_channel(world &state, channel &taken) {
  if (taken.state != channel::phase::open || is_server(state, taken)) return;
  if (!state.incidents.empty()) return;  // trouble does not hide behind another
  make_defunct(state, taken, state.elapsed + state.random.between(4'000, 60'000));
}

void populate(world &state, std::uint32_t nexus_index) {
  nexus &place = state.nexuses[nexus_index];
  place.first_channel = static_cast<std::uint32_t>(state.channels.size());
  for (std::uint32_t i = 0; i < place.channel_count; ++i) {
    const std::uint32_t port = port_of(place.kind, i);
    const bool has_flows = place.kind == nexus_kind::multistack && port > channel::host_port;
    channel made{
        .nexus = nexus_index, .port = port, .process = owner_of(state, place, port), .flow_switch = none};
    if (has_flows) {
      if (i == 0) state.switches.push_back({.nexus = nexus_index});
      made.flow_switch = static_cast<std::uint32_t>(state.switches.size() - 1);
      state.flow_channels.push_back(static_cast<std::uint32_t>(state.channels.size()));
    }
    open_channel(state, made);
    // Now and then the kernel has taken a channel from a process that sleeps.
    if (has_flows && state.flow_channels.size() % 9 == 0) take_channel(state, made);
    state.channels.push_back(made);
  }
}

void forget_process(world &state, channel &last) {
  process &owner = state.processes[last.process];
  // Nobody has heard of a process that came and went between two snapshots.
  const bool is_news = std::erase(state.started, last.process) == 0;
  if (is_news && !owner.crashed) state.ended.push_back(owner.pid);
  owner = {.pid = 0, .program = owner.program};
}

void close_channel(world &state, channel &closed) {
  closed.state = channel::phase::closed;
  state.switches[closed.flow_switch].closed += closed.stack;
  closed.stack = {};
  closed.moved = {};
  closed.reads_slowly = false;
  process &owner = state.processes[closed.process];
  owner.free.insert(closed.fd);
  if (--owner.channels == 0) forget_process(state, closed);
}

void reopen_channel(world &state, std::uint32_t index) {
  channel &opened = state.channels[index];
  process &owner = state.processes[opened.process];
  if (owner.pid == 0) {
    state.next_pid += static_cast<std::int32_t>(state.random.between(1, 30));
    owner.pid = state.next_pid;
    state.started.push_back(opened.process);
  }
  open_channel(state, opened);
  start_listening(state, index);
}

}  // namespace

void make_defunct(world &state, channel &lost, std::uint64_t until) {
  if (lost.state == channel::phase::open) --state.nexuses[lost.nexus].open;
  lost.state = channel::phase::defunct;
  lost.due = until;
}

std::uint32_t process_for(const world &state, std::uint32_t program, std::uint32_t instance) {
  const auto processes = static_cast<std::uint32_t>(state.processes.size());
  const auto kinds = static_cast<std::uint32_t>(programs.size());
  if (processes <= program) return program % processes;
  const std::uint32_t instances = (processes - program + kinds - 1) / kinds;
  return program + instance % instances * kinds;
}

bool is_server(const world &state, const channel &owned) {
  const auto services = programs[state.processes[owned.process].program].services;
  return std::ranges::any_of(services, &service::inbound);
}

void open_channels(world &state) {
  if (state.processes.empty()) return;
  deal_channels(state.nexuses, state.size.channels);
  for (std::uint32_t i = 0; i < state.nexuses.size(); ++i) populate(state, i);
  for (const std::uint32_t index : state.flow_channels) remember_past(state, state.channels[index]);
}

void replace_channels(world &state, std::uint32_t milliseconds) {
  constexpr std::uint32_t lasts = 600'000;
  const auto count = static_cast<std::uint32_t>(state.flow_channels.size());
  for (std::uint64_t left = state.random.share(count, milliseconds, lasts); left; --left) {
    take_channel(state, state.channels[state.flow_channels[state.random.below(count)]]);
  }
  for (const std::uint32_t index : state.flow_channels) {
    channel &waiting = state.channels[index];
    if (waiting.state == channel::phase::open || waiting.due > state.elapsed) continue;
    if (waiting.state == channel::phase::closed) {
      if (!state.processes[waiting.process].crashed) reopen_channel(state, index);
      continue;
    }
    close_channel(state, waiting);
    waiting.due = waiting.due == 0 ? never : state.elapsed + state.random.between(1000, 10'000);
  }
}

}  // namespace lab
