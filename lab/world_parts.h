// The steps by which a world is made and moves, and the states that its flows walk through.

#ifndef TARVELCTL_LAB_WORLD_PARTS_H
#define TARVELCTL_LAB_WORLD_PARTS_H

#include "lab/world.h"

namespace lab {

inline constexpr std::uint16_t first_ephemeral = 49152;
inline constexpr std::uint32_t ephemeral_ports = 16384;

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

// The states of a flow's ends.
two_way<std::uint32_t> states_of(const flow &source);

// Enters a state, from which on it is known when to leave it. What no longer sends or receives falls silent.
void enter(world &state, flow &walker, tcp::state next);

// Gives a flow that has data the rates of its next seconds, and measures its round trip.
void make_busy(world &state, flow &moving);

// Gives the nexuses their channels, open and owned by processes.
void open_channels(world &state);

// Lets channels with flows become defunct, close and come back, and their processes end and start.
void replace_channels(world &state, std::uint32_t milliseconds);

// Takes a channel with flows from its owner, and closes it at a time. At 0 that is soon, and for good.
void make_defunct(world &state, channel &lost, std::uint64_t until);

// Lets round-trip times rise and fall.
void wander_routes(world &state);

// Gives the switches their routes, and the channels flows, in all states that there are.
void open_flows(world &state);

// Ends flows of channels that are not open and walks others through their states; opens those that are
// missing.
void replace_flows(world &state, std::uint32_t milliseconds);

// Opens a flow of a channel as its program does, from the first packet on, within the latest milliseconds.
void open_new_flow(world &state, std::uint32_t channel_index, std::uint32_t within);

// Lets a channel that was opened wait for what its program serves.
void start_listening(world &state, std::uint32_t channel_index);

// Moves what flows move in so many milliseconds.
void move_flows(world &state, std::uint32_t milliseconds);

// The laws of traffic. A packet is counted once by each who handles it: its flow and its channel here, stack,
// ring, switch and interface, or who loses it, when the step ends.

// Takes what a flow moves in this step. A slow reader lets most of what arrives go.
void carry(world &state, flow &carrier, two_way<traffic> moved);

// Ends a step: takes what flows have carried, and what all others move in so many milliseconds, to its end.
void deliver(world &state, std::uint32_t milliseconds);

}  // namespace lab

#endif
