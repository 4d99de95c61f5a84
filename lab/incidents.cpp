#include "lab/incidents.h"

#include <algorithm>
#include <iterator>

#include "lab/world_parts.h"

namespace lab {

namespace {

// The channels of a switch's clients that are open.
template <class Visit>
void for_each_client(world &state, const flow_switch &place, Visit visit) {
  const nexus &carrier = state.nexuses[place.nexus];
  for (std::uint32_t i = 0; i < carrier.channel_count; ++i) {
    channel &client = state.channels[carrier.first_channel + i];
    if (client.flow_switch != none && client.state == channel::phase::open) visit(client);
  }
}

void lose_packets(world &state, flow_switch &place, std::uint32_t milliseconds) {
  constexpr std::uint32_t longest = 400'000;
  nexus &carrier = state.nexuses[place.nexus];
  carrier.loss = 40'000;
  carrier.delay = std::min(carrier.delay + 20 * milliseconds, longest);
}

// The first server is no more, and its peers do not know yet.
void end_service(world &state, flow_switch &place) {
  nexus &carrier = state.nexuses[place.nexus];
  for_each_client(state, place, [&](channel &served) {
    if (!is_server(state, served) || carrier.strays) return;
    carrier.strays = 200;
    make_defunct(state, served, 0);
  });
}

// Whoever receives most stops reading.
void stop_reading(world &state, flow_switch &place) {
  channel *busiest = nullptr;
  for_each_client(state, place, [&](channel &reader) {
    const auto received = [](const channel &by) { return by.moved.in.packets_average; };
    if (!busiest || received(reader) > received(*busiest)) busiest = &reader;
  });
  if (busiest) busiest->reads_slowly = true;
}

void leak_memory(world &state, flow_switch &place, std::uint32_t milliseconds) {
  constexpr std::uint32_t most = 3000;
  nexus &carrier = state.nexuses[place.nexus];
  carrier.leaked = std::min(carrier.leaked + milliseconds / 10, most);
}

// The busiest flow that may be held back is, and stays so.
void hold_flow_back(world &state, flow_switch &place) {
  flow *busiest = nullptr;
  for (flow &candidate : state.flows) {
    const channel &user = state.channels[candidate.channel];
    const bool fits = &state.switches[user.flow_switch] == &place && candidate.advisory != none &&
                      (candidate.state == tcp::established || candidate.state == tcp::closed);
    const auto rate = [](const flow &of) { return of.packets_per_second.out; };
    if (fits && (!busiest || rate(candidate) > rate(*busiest))) busiest = &candidate;
  }
  if (!busiest) return;
  busiest->stalled = true;
  busiest->due = state.elapsed;
}

// The host that has most flows does not answer any more, and programs do not give up.
void lose_peer(world &state, flow_switch &place) {
  const auto routes = std::span(state.routes).subspan(place.first_route, place.route_count);
  if (routes.empty()) return;
  const auto most = std::ranges::max_element(routes, {}, &route::flows);
  most->answers = false;
  place.dead_route = place.first_route + static_cast<std::uint32_t>(most - routes.begin());
  for (flow &waiting : state.flows) {
    if (waiting.route == place.dead_route) waiting.due = std::min(waiting.due, state.elapsed);
  }
}

void insist(world &state, flow_switch &place, std::uint32_t milliseconds) {
  for_each_client(state, place, [&](const channel &client) {
    const auto index = static_cast<std::uint32_t>(&client - state.channels.data());
    if (state.random.chance(milliseconds, 10'000)) open_new_flow(state, index, milliseconds);
  });
}

void reserve_ports(world & /*state*/, flow_switch &place, std::uint32_t milliseconds) {
  place.reserved = std::min(place.reserved + 4 * milliseconds, ephemeral_ports);
}

// The first client's process is gone: the kernel finds that its channels have no owner.
void end_process(world &state, flow_switch &place) {
  constexpr std::uint32_t kept = 600'000;
  std::uint32_t crashed = none;
  for_each_client(state, place, [&](const channel &client) {
    if (crashed == none && !is_server(state, client)) crashed = client.process;
  });
  if (crashed == none) return;
  for (const std::uint32_t index : state.flow_channels) {
    channel &left = state.channels[index];
    if (left.process != crashed || left.state == channel::phase::closed) continue;
    make_defunct(state, left, state.elapsed + kept);
  }
  state.processes[crashed].crashed = true;
  if (std::erase(state.started, crashed) == 0) state.ended.push_back(state.processes[crashed].pid);
}

constexpr incident stories[] = {
    {"lossy-link", "an interface drops packets, and round trips take longer", nullptr, lose_packets},
    {"lookup-miss", "a service has died, and its peers keep sending", end_service, nullptr},
    {"slow-reader", "a process stops reading what it receives", stop_reading, nullptr},
    {"leak", "an arena grows until nothing is left for packets", nullptr, leak_memory},
    {"stalled-flow", "the busiest flow is held back by its advisory", hold_flow_back, nullptr},
    {"dead-peer", "the host with most flows does not answer any more", lose_peer, insist},
    {"port-exhaustion", "the ephemeral ports of an address are reserved to the last", nullptr, reserve_ports},
    {"crash", "a process ends and leaves its channels behind", end_process, nullptr},
};

}  // namespace

const std::span<const incident> incidents = stories;

void cause_trouble(world &state, std::uint32_t milliseconds) {
  if (state.switches.empty()) return;
  flow_switch &place = state.switches.front();
  for (planned_incident &planned : state.incidents) {
    if (state.elapsed <= planned.begins) continue;
    if (!planned.began && planned.what->begin) planned.what->begin(state, place);
    planned.began = true;
    if (planned.what->go_on) planned.what->go_on(state, place, milliseconds);
  }
}

}  // namespace lab
