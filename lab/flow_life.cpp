// Flows: how they walk through their states and end.

#include <algorithm>

#include "lab/flow_states.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

void step_tcp(world &state, flow &walker, std::uint32_t milliseconds) {
  const tcp_behaviour &behaviour = behaviour_of(walker.state);
  if (behaviour.lasts == 0 || !state.random.chance(milliseconds, behaviour.lasts)) return;
  const bool other_way = state.random.chance(behaviour.percent_instead, 100);
  const tcp::state next = other_way ? behaviour.instead : behaviour.next;
  if (next == tcp::gone) {
    walker.state = next;
  } else {
    enter(state, walker, next);
  }
}

// A first packet, an answer, then more or nothing.
void step_udp(world &state, flow &walker, std::uint32_t milliseconds) {
  constexpr std::uint32_t lasts = 30'000;
  constexpr std::uint32_t answered_in = 600;
  if (walker.route == none) return;
  if (state.random.chance(milliseconds, lasts)) {
    walker.state = tcp::gone;
  } else if (walker.moved.out.packets < 2 && state.random.chance(milliseconds, answered_in)) {
    const two_way<std::uint32_t> &size = walker.use->packet_size;
    carry(state, walker, {{size.out, 1}, {size.in, 1}});
    make_busy(state, walker);
  }
}

void release(world &state, const flow &ended) {
  channel &user = state.channels[ended.channel];
  if (ended.use->protocol == tcp_protocol && ended.route != none) ++user.stack.closed;
  if (ended.route != none) --state.routes[ended.route].flows;
  if (ended.advisory != none) state.switches[user.flow_switch].free_advisories.push_back(ended.advisory);
}

}  // namespace

void replace_flows(world &state, std::uint32_t milliseconds) {
  for (flow &walker : state.flows) {
    if (state.channels[walker.channel].state != channel::phase::open) {
      walker.state = tcp::gone;
    } else if (walker.use->protocol == tcp_protocol) {
      step_tcp(state, walker, milliseconds);
    } else {
      step_udp(state, walker, milliseconds);
    }
    const bool advised = walker.advisory != none && state.random.chance(milliseconds, 20'000);
    walker.controlled = walker.controlled != advised;
  }
  std::erase_if(state.flows, [&state](const flow &ended) {
    if (ended.state != tcp::gone) return false;
    release(state, ended);
    return true;
  });

  const std::uint64_t wanted = state.size.flows;
  const std::uint64_t missing = wanted - std::min<std::uint64_t>(wanted, state.flows.size());
  const std::uint64_t usual = state.random.share(missing + wanted / 16, std::min(milliseconds, 2000U), 2000);
  if (state.flow_channels.empty() || wanted == 0 || state.flows.size() > wanted + wanted / 4) return;
  for (std::uint32_t left = state.random.below(static_cast<std::uint32_t>(2 * usual + 2)); left; --left) {
    const auto channels = static_cast<std::uint32_t>(state.flow_channels.size());
    const std::uint32_t index = state.flow_channels[state.random.below(channels)];
    if (state.channels[index].state == channel::phase::open) open_new_flow(state, index);
  }
}

}  // namespace lab
