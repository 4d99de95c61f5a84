// The states of flows, by the numbers that the kernel gives them.

#ifndef TARVELCTL_LAB_FLOW_STATES_H
#define TARVELCTL_LAB_FLOW_STATES_H

#include <cstdint>

#include "lab/world.h"

namespace lab {

namespace tcp {
enum state : std::uint8_t {
  closed = flow_states.number("CLOSED"),
  listening = flow_states.number("LISTEN"),
  syn_sent = flow_states.number("SYN_SENT"),
  syn_received = flow_states.number("SYN_RCVD"),
  established = flow_states.number("ESTABLISHED"),
  close_wait = flow_states.number("CLOSE_WAIT"),
  fin_wait_1 = flow_states.number("FIN_WAIT_1"),
  closing = flow_states.number("CLOSING"),
  last_ack = flow_states.number("LAST_ACK"),
  fin_wait_2 = flow_states.number("FIN_WAIT_2"),
  time_wait = flow_states.number("TIME_WAIT"),
  gone  // no flow any more, whatever its protocol
};
}  // namespace tcp

inline constexpr std::uint32_t control_packet = 60;  // bytes of a segment that carries no data

struct tcp_behaviour {
  tcp::state remote;  // the other end's state
  bool sends;
  bool receives;
  std::uint32_t lasts;  // milliseconds on average; 0: until the peer answers
  tcp::state next;
};
const tcp_behaviour &behaviour_of(std::uint8_t state);

// The states of a flow's ends.
two_way<std::uint32_t> states_of(const flow &source);

// Enters a state, from which on it is known when to leave it. What no longer sends or receives falls silent.
void enter(world &state, flow &walker, tcp::state next);

// Gives a flow that has data the rates of its next seconds, and measures its round trip.
void make_busy(world &state, flow &moving);

}  // namespace lab

#endif
