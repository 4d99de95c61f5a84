#include "lab/flow_states.h"

#include <algorithm>
#include <iterator>

#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr std::uint32_t control_packet = 60;  // bytes of a segment that carries no data

// By state.
constexpr tcp_behaviour tcp_behaviours[] = {
    {tcp::time_wait, false, false, 1500, tcp::gone, tcp::gone, 0},                 // closed
    {tcp::closed, false, false, 0, tcp::listening, tcp::listening, 0},             // listening
    {tcp::listening, false, false, 400, tcp::established, tcp::closed, 5},         // syn_sent
    {tcp::syn_sent, false, false, 300, tcp::established, tcp::established, 0},     // syn_received
    {tcp::established, true, true, 40'000, tcp::fin_wait_1, tcp::close_wait, 45},  // established
    {tcp::fin_wait_2, true, false, 2500, tcp::last_ack, tcp::last_ack, 0},         // close_wait
    {tcp::established, false, true, 600, tcp::fin_wait_2, tcp::closing, 12},       // fin_wait_1
    {tcp::closing, false, false, 500, tcp::time_wait, tcp::time_wait, 0},          // closing
    {tcp::fin_wait_2, false, false, 500, tcp::closed, tcp::closed, 0},             // last_ack
    {tcp::close_wait, false, true, 1500, tcp::time_wait, tcp::time_wait, 0},       // fin_wait_2
    {tcp::closed, false, false, 8000, tcp::gone, tcp::gone, 0},                    // time_wait
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

bool was_connected(const flow &source) {
  return source.use->protocol == tcp_protocol &&
         (source.state >= tcp::established || source.state == tcp::closed);
}

void make_busy(world &state, flow &moving) {
  // Many flows share what an interface can carry.
  const std::uint32_t fair = std::max(400'000 / std::max(state.size.flows, 1U), 1U);
  const std::uint32_t most = std::min(moving.use->packets_per_second, fair);
  moving.packets_per_second.out = state.random.between(1, most);
  moving.packets_per_second.in = 1 + moving.packets_per_second.out * state.random.between(60, 120) / 100;
}

void enter(world &state, flow &walker, tcp::state next) {
  walker.state = next;
  if (next == tcp::established) make_busy(state, walker);
  if (!behaviour_of(next).sends) walker.packets_per_second.out = 0;
  if (!behaviour_of(next).receives) walker.packets_per_second.in = 0;
  const traffic segment{control_packet, 1};
  carry(state, walker, {segment, next == tcp::syn_sent ? traffic() : segment});
}

}  // namespace lab
