// Flows: how they walk through their states and end.

#include <algorithm>

#include "lab/world_parts.h"

namespace lab {

namespace {

auto &counts_of(world &state, const flow &source) {
  return state.channels[source.channel].stack.count;
}

// Nobody answers: the same again, later each time, until it is given up.
void try_again(world &state, flow &waiting) {
  constexpr std::uint8_t most_tries = 5;
  if (waiting.tries == most_tries) {
    ++counts_of(state, waiting)[stack::timed_out];
    if (!waiting.connected) ++counts_of(state, waiting)[stack::refused];
    waiting.state = tcp::gone;
    return;
  }
  waiting.packets_per_second = {};
  if (waiting.tries) {  // the first time is its own
    carry(state, waiting, {{control_packet, 1}, {}});
    ++state.channels[waiting.channel].resent_now;
    ++counts_of(state, waiting)[stack::timeouts];
  }
  waiting.due += 1000U << waiting.tries++;
}

void leave_handshake(world &state, flow &walker) {
  if (walker.state == tcp::syn_sent && state.random.chance(1, 25)) {
    ++counts_of(state, walker)[stack::refused];
    enter(state, walker, tcp::closed);
    return;
  }
  ++counts_of(state, walker)[stack::established];
  walker.connected = true;
  enter(state, walker, tcp::established);
}

// What its state wants when its time has come.
void step_tcp(world &state, flow &walker) {
  const bool is_over = walker.due >= walker.ends && !walker.stalled;
  const auto next = behaviour_of(walker.state).next;
  if (next == tcp::gone) {
    walker.state = tcp::gone;
  } else if (!state.routes[walker.route].answers) {
    try_again(state, walker);
  } else if (walker.state == tcp::syn_sent || walker.state == tcp::syn_received) {
    leave_handshake(state, walker);
  } else if (walker.state == tcp::established && !is_over) {
    make_busy(state, walker);
  } else if (walker.state == tcp::established) {
    enter(state, walker, state.random.chance(45, 100) ? tcp::close_wait : tcp::fin_wait_1);
  } else {
    const bool both = walker.state == tcp::fin_wait_1 && state.random.chance(12, 100);
    enter(state, walker, both ? tcp::closing : next);
  }
}

// A first packet, an answer, then more; where nobody answers, a packet now and then.
void step_udp(world &state, flow &walker) {
  const bool answers = state.routes[walker.route].answers;
  const two_way<std::uint32_t> &size = walker.use->packet_size;
  if (walker.due >= walker.ends && !walker.stalled) {
    walker.state = tcp::gone;
    return;
  }
  if (walker.moved.out.packets < 2 && state.random.chance(1, 3)) {  // nobody wants more of it yet
    walker.due += state.random.between(1000, 4000);
    return;
  }
  if (walker.moved.out.packets < 2) carry(state, walker, {{size.out, 1}, {answers ? size.in : 0U, answers}});
  make_busy(state, walker);
  if (!answers) walker.packets_per_second = {1, 0};
}

// Flows have a time at which the next thing happens to them, whatever the step.
void step(world &state, flow &walker) {
  while (walker.due <= state.elapsed && walker.state != tcp::gone) {
    walker.use->protocol == tcp_protocol ? step_tcp(state, walker) : step_udp(state, walker);
  }
}

void release(world &state, const flow &ended) {
  channel &user = state.channels[ended.channel];
  if (ended.use->protocol == tcp_protocol && ended.route != none) {
    ++user.stack.count[stack::closed];
    const bool was_asked = ended.state == tcp::syn_sent || ended.state == tcp::syn_received;
    if (was_asked) ++user.stack.count[stack::refused];
  }
  if (user.state != channel::phase::open) ++state.nexuses[user.nexus].aborted;
  if (ended.route != none) --state.routes[ended.route].flows;
  if (ended.advisory != none) state.switches[user.flow_switch].free_advisories.push_back(ended.advisory);
}

void open_missing_flows(world &state, std::uint32_t milliseconds) {
  const std::uint64_t wanted =
      std::uint64_t{state.size.flows} * (950 + tide(state.elapsed, state.seed)) / 1050;
  const std::uint64_t missing = wanted - std::min<std::uint64_t>(wanted, state.flows.size());
  if (state.flow_channels.empty()) return;
  for (std::uint64_t left = state.random.share(missing, milliseconds, 1000); left; --left) {
    const auto channels = static_cast<std::uint32_t>(state.flow_channels.size());
    const std::uint32_t index = state.flow_channels[state.random.below(channels)];
    if (state.channels[index].state == channel::phase::open) open_new_flow(state, index, milliseconds);
  }
}

}  // namespace

void replace_flows(world &state, std::uint32_t milliseconds) {
  open_missing_flows(state, milliseconds);
  for (flow &walker : state.flows) {
    const bool is_open = state.channels[walker.channel].state == channel::phase::open;
    if (is_open && walker.due > state.elapsed) continue;
    if (is_open) step(state, walker);
    if (is_open && walker.state != tcp::gone) continue;
    release(state, walker);
    walker.state = tcp::gone;
  }
  std::erase_if(state.flows, [](const flow &ended) { return ended.state == tcp::gone; });
}

}  // namespace lab
