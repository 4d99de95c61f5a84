// Flows: how they open, walk through their states and end.

#include <algorithm>

#include "common/tables/flow.h"
#include "lab/flow_states.h"
#include "lab/programs.h"
#include "lab/progress.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

// A flow that someone wants to see: a TCP state, or how many packets a datagram flow has sent.
struct wish {
  std::uint8_t protocol;
  std::uint8_t state;
};

// Every fourth flow of a new machine is one of these, so that there is one in each state.
constexpr wish rare[] = {
    {tcp_protocol, tcp::listening},
    {tcp_protocol, tcp::syn_sent},
    {tcp_protocol, tcp::time_wait},
    {udp_protocol, 0},
    {tcp_protocol, tcp::close_wait},
    {tcp_protocol, tcp::fin_wait_1},
    {udp_protocol, 1},
    {tcp_protocol, tcp::closing},
    {tcp_protocol, tcp::last_ack},
    {tcp_protocol, tcp::fin_wait_2},
    {tcp_protocol, tcp::closed},
    {tcp_protocol, tcp::syn_received},
};

constexpr std::uint16_t first_ephemeral = 49152;
constexpr std::uint32_t ephemeral_ports = 16384;

constexpr address_kind route_kinds[] = {
    address_kind::ipv4,        address_kind::global_ipv6, address_kind::ipv4,       address_kind::ipv4,
    address_kind::global_ipv6, address_kind::ipv4,        address_kind::link_local, address_kind::ipv4,
    address_kind::ipv4,        address_kind::global_ipv6,
};

bool fits(const service &offered, const wish &wanted) {
  if (offered.protocol != wanted.protocol) return false;
  if (offered.protocol == udp_protocol) return true;
  if (wanted.state == tcp::listening || wanted.state == tcp::syn_received) return offered.inbound;
  return wanted.state != tcp::syn_sent || !offered.inbound;
}

const program &program_of(const world &state, std::uint32_t channel_index) {
  return programs[state.processes[state.channels[channel_index].process].program];
}

const service *any_service(world &state, std::uint32_t channel_index) {
  const auto services = program_of(state, channel_index).services;
  return services.empty() ? nullptr
                          : &services[state.random.below(static_cast<std::uint32_t>(services.size()))];
}

const service *fitting_service(const world &state, std::uint32_t channel_index, const wish &wanted) {
  for (const service &offered : program_of(state, channel_index).services) {
    if (fits(offered, wanted)) return &offered;
  }
  return nullptr;
}

void take_advisory(flow_switch &carrier, flow &taker) {
  if (!carrier.free_advisories.empty()) {
    taker.advisory = carrier.free_advisories.back();
    carrier.free_advisories.pop_back();
  } else if (carrier.advisories < tv_stats_flow_adv::max_entries) {
    taker.advisory = carrier.advisories++;
  }
}

void connect(world &state, flow &made) {
  flow_switch &carrier = state.switches[state.channels[made.channel].flow_switch];
  made.route = carrier.first_route + state.random.below(carrier.route_count);
  route &way = state.routes[made.route];
  made.ipv6 = way.kind != address_kind::ipv4;
  const auto ephemeral = static_cast<std::uint16_t>(first_ephemeral + way.used++ % ephemeral_ports);
  made.local_port = made.use->inbound ? made.use->port : ephemeral;
  made.remote_port = made.use->inbound ? ephemeral : made.use->port;
  ++way.flows;
  take_advisory(carrier, made);
  made.controlled = state.random.chance(1, 10);
}

// A server has its known port, and then, as everyone else, ports of its own.
void listen(world &state, flow &made) {
  const std::uint32_t before = state.channels[made.channel].listeners++;
  made.route = none;
  made.ipv6 = state.random.chance(1, 2);
  const bool known = made.use->inbound && before == 0;
  made.local_port = known ? made.use->port : static_cast<std::uint16_t>(49'151 - before % 40'000);
}

flow &open_flow(world &state, std::uint32_t channel_index, const service &use, bool listening) {
  flow made{.id = state.random.identity(), .channel = channel_index, .use = &use, .advisory = none};
  if (listening) {
    listen(state, made);
  } else {
    connect(state, made);
  }
  state.flows.push_back(made);
  return state.flows.back();
}

// What a flow has moved in the time before anyone looked.
void remember_past(world &state, flow &old) {
  const std::uint32_t seconds = state.random.between(1, 1800);
  make_busy(state, old);
  const std::uint64_t out = std::uint64_t{old.packets_per_second.out} * seconds + 2;
  const std::uint64_t in = std::uint64_t{old.packets_per_second.in} * seconds + 2;
  carry(state, old, {{out * old.use->packet_size.out, out}, {in * old.use->packet_size.in, in}});
}

void open_tcp(world &state, std::uint32_t channel_index, const service &use, tcp::state wanted) {
  flow &made = open_flow(state, channel_index, use, wanted == tcp::listening);
  made.state = wanted;
  if (wanted == tcp::listening) return;
  if (was_connected(made)) remember_past(state, made);
  enter(state, made, wanted);
  stack_totals &stack = state.channels[channel_index].stack;
  ++(use.inbound ? stack.accepted : stack.initiated);
}

void open_udp(world &state, std::uint32_t channel_index, const service &use, std::uint32_t packets) {
  flow &made = open_flow(state, channel_index, use, packets == 0);
  if (packets == 1) carry(state, made, {{use.packet_size.out, 1}, {}});
  if (packets > 1) remember_past(state, made);
}

void open_wish(world &state, std::uint32_t channel_index, const service &use, const wish &wanted) {
  if (use.protocol == tcp_protocol) {
    open_tcp(state, channel_index, use, static_cast<tcp::state>(wanted.state));
  } else {
    open_udp(state, channel_index, use, wanted.state);
  }
}

void make_routes(world &state, flow_switch &carrier, std::uint32_t count) {
  const std::uint32_t ordinal = state.nexuses[carrier.nexus].ordinal;
  carrier.first_route = static_cast<std::uint32_t>(state.routes.size());
  carrier.route_count = count;
  std::uint32_t of_kind[address_kinds] = {};
  for (std::uint32_t i = 0; i < count; ++i) {
    const address_kind kind = route_kinds[i % std::size(route_kinds)];
    const bool on_link = kind == address_kind::link_local || i % 7 == 6;
    const std::uint32_t number = of_kind[static_cast<int>(kind)]++;
    const std::uint32_t rtt = on_link ? state.random.between(250, 1800) : state.random.between(6'000, 90'000);
    state.routes.push_back({.flow_switch = static_cast<std::uint32_t>(&carrier - state.switches.data()),
                            .kind = kind,
                            .on_link = on_link,
                            .remote = remote_address(state.random, ordinal, kind, number, on_link),
                            .used = state.random.below(ephemeral_ports),
                            .rtt = rtt});
  }
}

}  // namespace

void start_listening(world &state, std::uint32_t channel_index) {
  if (state.size.flows == 0) return;
  const wish wanted{tcp_protocol, tcp::listening};
  const service *use = fitting_service(state, channel_index, wanted);
  if (use) open_wish(state, channel_index, *use, wanted);
}

void open_new_flow(world &state, std::uint32_t channel_index) {
  const service *use = any_service(state, channel_index);
  if (!use) return;
  const std::uint8_t first_tcp = use->inbound ? tcp::syn_received : tcp::syn_sent;
  const std::uint8_t first = use->protocol == tcp_protocol ? first_tcp : std::uint8_t{1};
  open_wish(state, channel_index, *use, {use->protocol, first});
}

void open_flows(world &state) {
  std::vector<std::uint32_t> open;
  for (const std::uint32_t index : state.flow_channels) {
    if (state.channels[index].state == channel::phase::open) open.push_back(index);
  }
  if (open.empty() || state.size.flows == 0) return;
  const std::size_t per_switch = state.size.flows / state.switches.size();
  for (flow_switch &carrier : state.switches) {
    make_routes(state, carrier,
                static_cast<std::uint32_t>(std::clamp<std::size_t>(per_switch / 2, 10, 4096)));
  }
  for (std::uint32_t i = 0; i < state.size.flows; ++i) {
    if (i % 4096 == 0) progress::tell<"making flow %u of %u">(i, state.size.flows);
    const wish wanted = rare[i / 4 % std::size(rare)];
    const service *use = nullptr;
    std::uint32_t index = open[i % open.size()];
    // The next channel whose program has such a service.
    for (std::uint32_t ahead = 0; i % 4 == 3 && !use && ahead < flow_programs; ++ahead) {
      index = open[(i + ahead) % open.size()];
      use = fitting_service(state, index, wanted);
    }
    if (use) {
      open_wish(state, index, *use, wanted);
    } else if ((use = any_service(state, index))) {
      const bool is_tcp = use->protocol == tcp_protocol;
      open_wish(state, index, *use,
                {use->protocol, is_tcp ? std::uint8_t{tcp::established} : std::uint8_t{2}});
    }
  }
}

}  // namespace lab
