// Who moves how much.

#include "lab/programs.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

// What a flow, or nobody in particular, sends in an interval, a little more or less than usual.
traffic some(random_source &random, std::uint32_t packets_per_second, std::uint32_t size,
             std::uint32_t milliseconds) {
  const std::uint64_t usual = std::uint64_t{packets_per_second} * random.between(90, 110);
  const std::uint64_t packets = random.share(usual, milliseconds, 100'000);
  return {packets * size, packets};
}

// Accounts for traffic over the interface of a nexus, which its device port sees, too.
void pass_interface(world &state, nexus &place, const two_way<traffic> &moved) {
  place.moved.out += moved.out;
  place.moved.in += moved.in;
  for (std::uint32_t i = 0; i < place.channel_count && i < 3; ++i) {
    channel &port = state.channels[place.first_channel + i];
    if (place.kind != nexus_kind::multistack || port.port != channel::device_port) continue;
    port.moved.out.add(moved.out);
    port.moved.in.add(moved.in);
  }
}

// The rates of what has no flows: `busy` packets each second at most, the same each time it is asked.
two_way<traffic> background_traffic(world &state, const uuid &id, std::uint32_t busy,
                                    std::uint32_t milliseconds) {
  const std::uint32_t out = 2 + id.bytes[0] * busy / 256;
  const std::uint32_t in = 2 + id.bytes[1] * busy / 256;
  return {some(state.random, out, 180U + id.bytes[2] * 3U, milliseconds),
          some(state.random, in, 180U + id.bytes[3] * 4U, milliseconds)};
}

void move_background(world &state, std::uint32_t milliseconds) {
  for (nexus &place : state.nexuses) {
    const bool has_interface = place.kind <= nexus_kind::bridge;
    if (has_interface) {
      // The host's own traffic: all of it passes the host port of a switch.
      const two_way<traffic> moved = background_traffic(state, place.id, 300, milliseconds);
      pass_interface(state, place, moved);
      if (place.kind == nexus_kind::multistack && place.channel_count > 2) {
        channel &host = state.channels[place.first_channel + 2];
        host.moved.out.add(moved.out);
        host.moved.in.add(moved.in);
      }
    }
    if (place.kind == nexus_kind::multistack) continue;
    for (std::uint32_t i = 0; i < place.channel_count; ++i) {
      channel &port = state.channels[place.first_channel + i];
      const two_way<traffic> moved = background_traffic(state, port.id, 120, milliseconds);
      port.moved.out.add(moved.out);
      port.moved.in.add(moved.in);
    }
  }
}

}  // namespace

void carry(world &state, channel &carrier, bool ipv6, bool udp, const two_way<traffic> &moved) {
  carrier.moved.out.add(moved.out);
  carrier.moved.in.add(moved.in);
  two_way<traffic> &kind = carrier.stack.moved[ipv6][udp];
  kind.out += moved.out;
  kind.in += moved.in;
  pass_interface(state, state.nexuses[carrier.nexus], moved);
}

void carry(world &state, flow &carrier, const two_way<traffic> &moved) {
  carrier.moved.out += moved.out;
  carrier.moved.in += moved.in;
  carry(state, state.channels[carrier.channel], carrier.ipv6, carrier.use->protocol == udp_protocol, moved);
}

void move_traffic(world &state, std::uint32_t milliseconds) {
  for (flow &mover : state.flows) {
    const auto &rate = mover.packets_per_second;
    if (rate.out == 0 && rate.in == 0) continue;
    carry(state, mover,
          {some(state.random, rate.out, mover.use->packet_size.out, milliseconds),
           some(state.random, rate.in, mover.use->packet_size.in, milliseconds)});
  }
  move_background(state, milliseconds);
  for (channel &port : state.channels) {
    port.moved.out.end_interval(milliseconds);
    port.moved.in.end_interval(milliseconds);
  }
}

}  // namespace lab
