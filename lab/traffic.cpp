// Who moves how much, and what becomes of it: the laws of traffic.

#include <algorithm>

#include "lab/programs.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr std::uint32_t million = 1'000'000;
constexpr std::uint32_t lost_size = 90;  // bytes of a packet that nobody has looked at

// Counts packets as lost. Those that came in have come from outside, beside what arrives.
void lose(nexus &place, lost::reason why, std::uint64_t packets) {
  place.lost[why] += packets;
  (why == lost::not_sent ? place.lost_now.out : place.lost_now.in) += packets;
}

traffic without(const traffic &moved, std::uint64_t packets) {
  return {moved.bytes - std::min(moved.bytes, packets * lost_size), moved.packets - packets};
}

// What is moved by who has no flows: `busy` packets each second at most.
two_way<traffic> background(world &state, const uuid &id, std::uint32_t busy, std::uint32_t milliseconds) {
  const std::uint32_t level = tide(state.elapsed, key_of(id));
  const auto some = [&](std::uint32_t rate, std::uint32_t size) -> traffic {
    const std::uint64_t packets = state.random.share(std::uint64_t{rate} * level, milliseconds, 100'000);
    return {packets * size, packets};
  };
  return {some(2 + id.bytes[0] * busy / 256, 180U + id.bytes[2] * 3U),
          some(2 + id.bytes[1] * busy / 256, 180U + id.bytes[3] * 4U)};
}

// Counts what a ring has moved. About 20 ms of traffic wait in it, or as much as is moved; what is not read
// stays.
void count(meter &ring, const traffic &moved, bool read, std::uint32_t milliseconds) {
  ring.add(moved);
  const std::uint64_t few = ring.waiting - std::min<std::uint64_t>(ring.waiting, moved.packets);
  const std::uint64_t usual = read ? std::max(moved.packets * 20 / milliseconds, few) : channel::slots;
  ring.waiting = static_cast<std::uint32_t>(
      std::min<std::uint64_t>({usual, ring.waiting + moved.packets, channel::slots}));
}

void count(channel &port, const two_way<traffic> &moved, std::uint32_t milliseconds) {
  count(port.moved.out, moved.out, true, milliseconds);
  count(port.moved.in, moved.in, !port.reads_slowly, milliseconds);
}

// What a stack meets beside what its flows move: packets that have to be sent again, more of them where the
// link loses some, and datagrams for no one.
void disturb(world &state, channel &user, std::uint32_t loss) {
  const auto key = static_cast<std::uint32_t>(key_of(user.id));
  const std::uint32_t level = tide(state.elapsed, key);
  for (auto &[by_tcp, by_udp] : user.now) {
    const std::uint64_t fresh = by_tcp.out.packets - std::min(by_tcp.out.packets, user.resent_now);
    const std::uint32_t rate = (300 + key % 5000) * level / 100 + loss;
    const std::uint64_t again = state.random.share(fresh, rate, million);
    const std::uint64_t timeouts = state.random.share(again, 1, 6);
    user.stack.count[stack::resent] += again;
    user.stack.count[stack::timeouts] += timeouts;
    if (again) {
      user.stack.count[stack::resent_bytes] +=
          again * (by_tcp.out.bytes / by_tcp.out.packets - segment_headers);
    }
    const std::uint32_t astray = (20 + key % 150) * level / 100;
    const std::uint64_t no_port = state.random.share(by_udp.in.packets, astray, million);
    user.stack.count[stack::no_port] += no_port;
    by_udp.in += {no_port * lost_size, no_port};
  }
  user.stack.count[stack::resent] += user.resent_now;
  user.resent_now = 0;
}

// What a channel with flows moves, by its stack and its rings.
two_way<traffic> settle(world &state, channel &user, std::uint32_t loss, std::uint32_t milliseconds) {
  disturb(state, user, loss);
  two_way<traffic> sum{};
  for (int kind = 0; kind < 4; ++kind) {
    two_way<traffic> &now = user.now[kind / 2][kind % 2];
    user.stack.moved[kind / 2][kind % 2] += now;
    sum += now;
    now = {};
  }
  count(user, sum, milliseconds);
  return sum;
}

// Takes what crosses an interface. What it loses it has not received.
void cross(world &state, nexus &place, const two_way<traffic> &moved, std::uint32_t loss,
           std::uint32_t milliseconds) {
  const auto key = static_cast<std::uint32_t>(key_of(place.id));
  const std::uint32_t level = tide(state.elapsed, key);
  const auto losses = [&](std::uint32_t parts) {
    return state.random.share(moved.in.packets, parts * level / 100 + loss / 2, million);
  };
  lose(place, lost::bad_length, losses(1 + key % 2));
  lose(place, lost::no_memory, losses(1 + key / 2 % 3));
  lose(place, lost::not_sent, state.random.share(moved.out.packets, loss / 4, million));
  place.moved += moved;
  // Whoever looks at the interface sees all of it.
  for (std::uint32_t i = 0; i < place.channel_count; ++i) {
    count(state.channels[place.first_channel + i], moved, milliseconds);
  }
}

// What a switch loses of so much.
void lose_some(world &state, nexus &place, const two_way<traffic> &moved, std::uint32_t milliseconds) {
  constexpr std::uint32_t full = 1300;  // thousandths of the usual memory
  const auto key = static_cast<std::uint32_t>(key_of(place.id));
  const std::uint32_t level = tide(state.elapsed, key / 3);
  const auto share = [&](std::uint64_t packets, std::uint32_t parts) {
    return state.random.share(packets, parts * level / 100, million);
  };
  lose(place, lost::no_match, share(moved.in.packets, 30 + key % 100));
  lose(place, lost::no_match, state.random.share(place.strays, milliseconds, 1000));
  lose(place, lost::torn_down, share(moved.in.packets, 4 + key % 10));
  lose(place, lost::torn_down, state.random.share(place.strays, milliseconds, 4000));
  lose(place, lost::not_sent, std::min(share(moved.out.packets, 1 + key % 4), moved.out.packets));
  if (place.leaked > full) lose(place, lost::no_memory, 1 + moved.in.packets / 2);
}

// What passes a multistack switch passes its device port and the interface below it.
void pass_switch(world &state, nexus &place, std::uint32_t milliseconds) {
  two_way<traffic> sum = background(state, place.id, 300, milliseconds);
  channel *device = nullptr;
  for (std::uint32_t i = 0; i < place.channel_count; ++i) {
    channel &port = state.channels[place.first_channel + i];
    if (port.port == channel::device_port) device = &port;
    if (port.port == channel::host_port) count(port, sum, milliseconds);
  }
  for (std::uint32_t i = 0; i < place.channel_count; ++i) {
    channel &port = state.channels[place.first_channel + i];
    if (port.flow_switch == none || port.state == channel::phase::closed) continue;
    sum += settle(state, port, place.loss, milliseconds);
    // Who does not know yet that the kernel has taken the channel sends on.
    if (port.state == channel::phase::defunct) {
      lose(place, lost::defunct, state.random.share(1, std::min(milliseconds, 2000U), 2000));
    }
  }
  lose_some(state, place, sum, milliseconds);
  sum.out = without(sum.out, place.lost_now.out);
  sum.in += {place.lost_now.in * lost_size, place.lost_now.in};
  place.lost_now = {};
  place.moved += sum;
  if (device) count(*device, sum, milliseconds);
  if (place.interface != none) cross(state, state.nexuses[place.interface], sum, place.loss, milliseconds);
}

// The ports of a bridge and the ends of a pipe: what one sends the next one receives, or it is lost. A single
// one has the kernel at its other end.
void forward(world &state, nexus &place, std::uint32_t milliseconds) {
  for (std::uint32_t i = 0; i < place.channel_count; ++i) {
    channel &sender = state.channels[place.first_channel + i];
    channel &receiver = state.channels[place.first_channel + (i + 1) % place.channel_count];
    const bool to_kernel = place.channel_count == 1;
    const auto [sent, answer] = background(state, sender.id, 120, milliseconds);
    const std::uint32_t parts = sender.id.bytes[4] < 64 ? 12 : 1;
    const std::uint64_t gone = to_kernel ? 0 : state.random.share(sent.packets, parts, million);
    const traffic arrived = to_kernel ? answer : without(sent, gone);
    count(sender.moved.out, sent, true, milliseconds);
    count(receiver.moved.in, arrived, true, milliseconds);
    place.moved += {sent, arrived};
    (place.kind == nexus_kind::bridge ? place.lost[lost::not_sent] : sender.errors) += gone;
  }
}

}  // namespace

void carry(world &state, flow &carrier, two_way<traffic> moved) {
  channel &user = state.channels[carrier.channel];
  const bool udp = carrier.use->protocol == udp_protocol;
  two_way<traffic> &now = user.now[carrier.ipv6][udp];
  if (user.reads_slowly && moved.in.packets) {
    const std::uint64_t size = moved.in.bytes / moved.in.packets;
    const std::uint64_t read = state.random.share(moved.in.packets, 1, 8);
    lose(state.nexuses[user.nexus], lost::no_space, moved.in.packets - read);
    moved.in = {read * size, read};
    if (udp) {  // it passes the ring, and meets a full socket
      user.stack.count[stack::full_socket] += read;
      now.in += moved.in;
      moved.in = {};
    }
  }
  carrier.moved += moved;
  now += moved;
}

void move_flows(world &state, std::uint32_t milliseconds) {
  const auto part = [milliseconds](std::uint32_t rate, std::uint32_t &rest, std::uint32_t size) -> traffic {
    const std::uint64_t thousandths = std::uint64_t{rate} * milliseconds + rest;
    rest = static_cast<std::uint32_t>(thousandths % 1000);
    return {thousandths / 1000 * size, thousandths / 1000};
  };
  for (flow &mover : state.flows) {
    const auto &rate = mover.packets_per_second;
    if (rate.out == 0 && rate.in == 0) continue;
    const two_way<std::uint32_t> &size = mover.use->packet_size;
    carry(state, mover, {part(rate.out, mover.rest.out, size.out), part(rate.in, mover.rest.in, size.in)});
  }
}

void deliver(world &state, std::uint32_t milliseconds) {
  for (nexus &place : state.nexuses) {
    if (place.kind == nexus_kind::multistack) {
      pass_switch(state, place, milliseconds);
    } else if (place.kind != nexus_kind::net_if) {
      forward(state, place, milliseconds);
    } else if (place.ordinal >= state.multistacks.size() || state.multistacks[place.ordinal] == none) {
      cross(state, place, background(state, place.id, 300, milliseconds), 0, milliseconds);
    }
  }
}

}  // namespace lab
