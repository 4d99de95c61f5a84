// The states of flows: how they are entered, and what a flow moves meanwhile.

#include <algorithm>
#include <iterator>

#include "lab/world_parts.h"

namespace lab {

namespace {

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

}  // namespace

const tcp_behaviour &behaviour_of(std::uint8_t state) {
  return tcp_behaviours[state];
}

two_way<std::uint32_t> states_of(const flow &source) {
  if (source.use->protocol == tcp_protocol) return {source.state, behaviour_of(source.state).remote};
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
  const tcp_behaviour &behaviour = behaviour_of(next);
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

}  // namespace lab
