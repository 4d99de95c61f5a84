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

void open_channel(world &state, channel &opened) {
  process &owner = state.processes[opened.process];
  if (owner.next_fd == 0) owner.next_fd = static_cast<std::int32_t>(state.random.between(3, 20));
  opened.id = state.random.identity();
  opened.fd = owner.next_fd;
  owner.next_fd += static_cast<std::int32_t>(state.random.between(1, 3));
  ++owner.channels;
  opened.state = channel::phase::open;
}

// What a program did before anyone looked.
void remember_past(world &state, channel &opened) {
  for (int kind = 0; kind < 4; ++kind) {
    const std::uint64_t packets = state.random.between(5000, 400'000);
    const std::uint64_t answers = packets / state.random.between(1, 4);
    carry(state, opened, kind & 2, kind & 1, {{packets * 300, packets}, {answers * 900, answers}});
  }
  const auto services = programs[state.processes[opened.process].program].services;
  const bool serves = !services.empty() && services.front().inbound;
  const std::uint32_t many = state.random.between(10, 900);
  const std::uint32_t few = state.random.between(0, 12);
  opened.stack.initiated = serves ? few : many;
  opened.stack.accepted = serves ? many : few;
  opened.stack.closed = many + few;
}

std::uint32_t owner_of(const world &state, const nexus &place, std::uint32_t port) {
  if (place.kind == nexus_kind::multistack && port > channel::host_port) {
    const auto client = static_cast<std::uint32_t>(state.flow_channels.size());
    return process_for(state, client % flow_programs, client / flow_programs);
  }
  return process_for(state, plans[static_cast<int>(place.kind)].owners[port > 0], place.ordinal);
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
    if (has_flows && state.flow_channels.size() % 9 == 0) made.state = channel::phase::defunct;
    state.channels.push_back(made);
  }
}

void close_channel(world &state, channel &closed) {
  closed.state = channel::phase::closed;
  state.switches[closed.flow_switch].closed += closed.stack;
  closed.stack = {};
  closed.moved = {};
  process &owner = state.processes[closed.process];
  if (--owner.channels) return;
  state.ended.push_back(owner.pid);
  owner.pid = 0;
}

void reopen_channel(world &state, std::uint32_t index) {
  channel &opened = state.channels[index];
  process &owner = state.processes[opened.process];
  if (owner.pid == 0) {
    state.next_pid += static_cast<std::int32_t>(state.random.between(1, 30));
    owner.pid = state.next_pid;
    owner.next_fd = 0;
    state.started.push_back(opened.process);
  }
  opened.listeners = 0;
  open_channel(state, opened);
  start_listening(state, index);
}

}  // namespace

std::uint32_t process_for(const world &state, std::uint32_t program, std::uint32_t instance) {
  const auto processes = static_cast<std::uint32_t>(state.processes.size());
  const auto kinds = static_cast<std::uint32_t>(programs.size());
  if (processes <= program) return program % processes;
  const std::uint32_t instances = (processes - program + kinds - 1) / kinds;
  return program + instance % instances * kinds;
}

void open_channels(world &state) {
  if (state.processes.empty()) return;
  deal_channels(state.nexuses, state.size.channels);
  for (std::uint32_t i = 0; i < state.nexuses.size(); ++i) populate(state, i);
  for (const std::uint32_t index : state.flow_channels) {
    channel &opened = state.channels[index];
    flow_switch &carrier = state.switches[opened.flow_switch];
    if (carrier.closed.closed == 0) {
      // Each switch has seen someone who is gone.
      remember_past(state, opened);
      carrier.closed = opened.stack;
      opened.stack = {};
      opened.moved = {};
    }
    remember_past(state, opened);
  }
}

void replace_channels(world &state, std::uint32_t milliseconds) {
  const auto count = static_cast<std::uint32_t>(state.flow_channels.size());
  const auto losses = std::min<std::uint64_t>(state.random.share(count, milliseconds, 60'000), count / 4 + 1);
  for (std::uint64_t left = losses; left; --left) {
    channel &lost = state.channels[state.flow_channels[state.random.below(count)]];
    if (lost.state != channel::phase::open) continue;
    lost.state = channel::phase::defunct;
    lost.left = state.random.between(1500, 5000);
  }
  for (const std::uint32_t index : state.flow_channels) {
    channel &waiting = state.channels[index];
    if (waiting.state == channel::phase::open) continue;
    if (waiting.left > milliseconds) {
      waiting.left -= milliseconds;
    } else if (waiting.state == channel::phase::defunct) {
      close_channel(state, waiting);
      waiting.left = state.random.between(500, 3000);
    } else {
      reopen_channel(state, index);
    }
  }
}

}  // namespace lab
