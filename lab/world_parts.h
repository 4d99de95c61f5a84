// The steps by which a world is made and moves.

#ifndef TARVELCTL_LAB_WORLD_PARTS_H
#define TARVELCTL_LAB_WORLD_PARTS_H

#include "lab/world.h"

namespace lab {

inline constexpr std::uint16_t first_ephemeral = 49152;
inline constexpr std::uint32_t ephemeral_ports = 16384;

// Gives the nexuses their channels, open and owned by processes.
void open_channels(world &state);

// Lets channels with flows become defunct, close and come back, and their processes end and start.
void replace_channels(world &state, std::uint32_t milliseconds);

// Takes a channel with flows from its owner, and closes it at a time. At 0 that is soon, and for good.
void make_defunct(world &state, channel &lost, std::uint64_t until);

// Gives a switch its routes.
void make_routes(world &state, flow_switch &carrier, std::uint32_t count);

// The route of a flow that is opened, or none: for who connects to a host, which may be someone new, or is
// `connected` to one.
std::uint32_t choose_route(world &state, flow_switch &carrier, bool connected);

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
