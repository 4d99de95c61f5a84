// The steps by which a world is made and moves.

#ifndef TARVELCTL_LAB_WORLD_PARTS_H
#define TARVELCTL_LAB_WORLD_PARTS_H

#include "lab/world.h"

namespace lab {

// Gives the nexuses their channels, open and owned by processes.
void open_channels(world &state);

// Lets channels with flows become defunct, close and come back, and their processes end and start.
void replace_channels(world &state, std::uint32_t milliseconds);

// Gives the switches their routes, and the channels flows, in all states that there are.
void open_flows(world &state);

// Walks flows through their states to their end, opens new ones and ends those of channels that are not open.
void replace_flows(world &state, std::uint32_t milliseconds);

// Opens a flow of a channel as its program does: from the first packet on.
void open_new_flow(world &state, std::uint32_t channel_index);

// Lets a channel that was opened listen for what its program serves.
void start_listening(world &state, std::uint32_t channel_index);

// Accounts for traffic of a flow: in the flow, its channel, its switch and the stack of its process.
void carry(world &state, flow &carrier, const two_way<traffic> &moved);

// Accounts for traffic of a channel without flows that anyone remembers.
void carry(world &state, channel &carrier, bool ipv6, bool udp, const two_way<traffic> &moved);

// Moves what everyone moves in so many milliseconds and sets the rates.
void move_traffic(world &state, std::uint32_t milliseconds);

}  // namespace lab

#endif
