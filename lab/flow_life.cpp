// Flows: how they walk through their states and end.

#include <algorithm>
#include <iterator>

#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr std::uint32_t control_packet = 60;  // bytes of a segment that carries no data

struct tcp_behaviour {
  tcp::state remote;  // the other end's state
  bool sends;
  bool receives;
  std::uint32_t lasts;  // milliseconds on average; 0: until the peer answers
  tcp::state next;
};

// By state.
constexpr tcp_behaviour tcp_behaviours[] = {
    {tcp::time_wait, false, false, 1500, tcp::gone},       // closed
    {tcp::closed, false, false, 0, tcp::listening},        // listening
    {tcp::listening, false, false, 0, tcp::established},   // syn_sent
    {tcp::syn_sent, false, false, 0, tcp::established},    // syn_received
    {tcp::established, true, true, 0, tcp::fin_wait_1},    // established
    {tcp::fin_wait_2, true, false, 2500, tcp::last_ack},   // close_wait
    {tcp::established, false, true, 0, tcp::fin_wait_2},   // fin_wait_1
    {tcp::closing, false, false, 0, tcp::time_wait},       // closing
    {tcp::fin_wait_2, false, false, 0, tcp::closed},       // last_ack
    {tcp::close_wait, false, true, 1500, tcp::time_wait},  // fin_wait_2
    {tcp::closed, false, false, 15'000, tcp::gone},        // time_wait
};
static_assert(std::size(tcp_behaviours) == tcp::gone);

// Of ends without connection state, by the packets that they have sent.
constexpr std::uint32_t datagram_states[] = {flow_states.number("NO_TRAFFIC"), flow_states.number("SINGLE"),
                                             flow_states.number("MULTIPLE")};

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
  const auto next = tcp_behaviours[walker.state].next;
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

two_way<std::uint32_t> states_of(const flow &source) {
  if (source.use->protocol == tcp_protocol) return {source.state, tcp_behaviours[source.state].remote};
  const auto by_packets = [](const traffic &sent) {
    return datagram_states[std::min<std::uint64_t>(sent.packets, 2)];
  };
  return {by_packets(source.moved.out), by_packets(source.moved.in)};
}

void make_busy(world &state, flow &moving) {
  constexpr std::uint32_t held_back = 16;  // times slower
  // Many flows share what an interface can carry.
  const std::uint32_t fair = std::max(400'000 / std::max(state.size.flows, 1U), 1U);
  const std::uint32_t most = std::min(moving.use->packets_per_second, fair);
  auto &[out, in] = moving.packets_per_second;
  out = state.random.between(1, most);
  in = 1 + out * state.random.between(60, 120) / 100;
  moving.controlled = moving.stalled || (moving.advisory != none && state.random.chance(1, 24));
  if (moving.controlled) {
    out = moving.stalled ? 0 : out / held_back;
    in = moving.stalled ? 0 : in / held_back;
  }
  moving.due += state.random.between(2000, 6000);
  if (!moving.connected) return;
  const nexus &carrier = state.nexuses[state.channels[moving.channel].nexus];
  const std::uint32_t usual = state.routes[moving.route].rtt;
  const std::uint32_t seen = usual + state.random.below(usual / 8 + 1) + carrier.delay;
  moving.rtt = moving.rtt ? (3 * moving.rtt + seen) / 4 : seen;
}

void enter(world &state, flow &walker, tcp::state next) {
  const tcp_behaviour &behaviour = tcp_behaviours[next];
  walker.state = next;
  walker.tries = 0;
  if (!behaviour.sends) walker.packets_per_second.out = 0;
  if (!behaviour.receives) walker.packets_per_second.in = 0;
  if (next == tcp::established) {
    make_busy(state, walker);
  } else {
    const std::uint32_t trip = state.routes[walker.route].rtt / 1000 + 1;
    const std::uint32_t lasts = behaviour.lasts ? behaviour.lasts : trip;
    walker.due += lasts / 2 + state.random.below(lasts);
  }
  const traffic segment{control_packet, 1};
  carry(state, walker, {segment, next == tcp::syn_sent ? traffic() : segment});
}

void replace_flows(world &state, std::uint32_t milliseconds) {
  open_missing_flows(state, milliseconds);
  for (flow &walker : state.flows) {
    const bool is_open = state.channels[walker.channel].state == channel::phase::open;
    // Whatever the step, what happens to a flow has a time of its own.
    while (is_open && walker.due <= state.elapsed && walker.state != tcp::gone) {
      walker.use->protocol == tcp_protocol ? step_tcp(state, walker) : step_udp(state, walker);
    }
    if (is_open && walker.state != tcp::gone) continue;
    release(state, walker);
    walker.state = tcp::gone;
  }
  std::erase_if(state.flows, [](const flow &ended) { return ended.state == tcp::gone; });
}

}  // namespace lab
