// Flows and their routes: who talks to whom.

#include <algorithm>
#include <iterator>

#include "common/tables/flow.h"
#include "lab/programs.h"
#include "lab/progress.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr address_kind route_kinds[] = {
    address_kind::ipv4,        address_kind::global_ipv6, address_kind::ipv4,       address_kind::ipv4,
    address_kind::global_ipv6, address_kind::ipv4,        address_kind::link_local, address_kind::ipv4,
    address_kind::ipv4,        address_kind::global_ipv6,
};

// Leads a route to a host that nobody has talked to yet, and that is not always there.
void meet_someone(world &state, flow_switch &carrier, route &way) {
  const std::uint32_t ordinal = state.nexuses[carrier.nexus].ordinal;
  const std::uint32_t number = carrier.hosts[static_cast<int>(way.kind)]++;
  way.remote = remote_address(state.random, ordinal, way.kind, number, way.on_link);
  way.rtt = way.on_link ? state.random.between(250, 1800) : state.random.between(6'000, 90'000);
  way.answers = !state.random.chance(1, 30);
}

void make_routes(world &state, flow_switch &carrier, std::uint32_t count) {
  carrier.first_route = static_cast<std::uint32_t>(state.routes.size());
  carrier.route_count = count;
  for (std::uint32_t i = 0; i < count; ++i) {
    const address_kind kind = route_kinds[i % std::size(route_kinds)];
    state.routes.push_back({.flow_switch = static_cast<std::uint32_t>(&carrier - state.switches.data()),
                            .kind = kind,
                            .on_link = kind == address_kind::link_local || i % 7 == 6,
                            .used = state.random.below(ephemeral_ports)});
    meet_someone(state, carrier, state.routes.back());
  }
}

// The route of a flow, or none: for who connects to a host, which may be someone new, or is `answered` by
// one.
std::uint32_t choose_route(world &state, flow_switch &carrier, bool answered) {
  if (carrier.route_count == 0) return none;
  if (!answered && carrier.dead_route != none && state.random.chance(1, 2)) return carrier.dead_route;
  const std::uint32_t index = carrier.first_route + state.random.below(carrier.route_count);
  route &way = state.routes[index];
  if (way.flows == 0 && index != carrier.dead_route && state.random.chance(3, 4)) {
    meet_someone(state, carrier, way);
  }
  return answered && !way.answers ? none : index;
}

// Some flows of a new machine are in one of these, so that there is one in each state.
constexpr std::uint8_t rare[] = {tcp::syn_sent, tcp::time_wait, tcp::close_wait, tcp::fin_wait_1,
                                 tcp::closing,  tcp::last_ack,  tcp::fin_wait_2, tcp::closed};

const program &program_of(const world &state, std::uint32_t channel_index) {
  return programs[state.processes[state.channels[channel_index].process].program];
}

const service *any_service(world &state, std::uint32_t channel_index) {
  const auto services = program_of(state, channel_index).services;
  return services.empty() ? nullptr
                          : &services[state.random.below(static_cast<std::uint32_t>(services.size()))];
}

// The state of a flow when it opens. What has no states has the number of packets that it has sent instead.
std::uint8_t first_state(const service &use) {
  if (use.protocol == udp_protocol) return 1;
  return use.inbound ? tcp::syn_received : tcp::syn_sent;
}

void take_advisory(flow_switch &carrier, flow &taker) {
  if (!carrier.free_advisories.empty()) {
    taker.advisory = carrier.free_advisories.back();
    carrier.free_advisories.pop_back();
  } else if (carrier.advisories < tv_stats_flow_adv::max_entries) {
    taker.advisory = carrier.advisories++;
  }
}

bool connect(world &state, flow &made, bool answered) {
  flow_switch &carrier = state.switches[state.channels[made.channel].flow_switch];
  made.route = choose_route(state, carrier, answered || made.use->inbound);
  if (made.route == none) return false;
  route &way = state.routes[made.route];
  made.ipv6 = way.kind != address_kind::ipv4;
  const bool exhausted = carrier.reserved == ephemeral_ports && made.use->protocol == tcp_protocol;
  if (exhausted && !made.ipv6 && !made.use->inbound) {
    auto &count = state.channels[made.channel].stack.count;
    for (const stack::connections each : {stack::initiated, stack::refused, stack::closed}) ++count[each];
    return false;
  }
  const auto ephemeral = static_cast<std::uint16_t>(first_ephemeral + way.used++ % ephemeral_ports);
  made.local_port = made.use->inbound ? made.use->port : ephemeral;
  made.remote_port = made.use->inbound ? ephemeral : made.use->port;
  ++way.flows;
  take_advisory(carrier, made);
  return true;
}

// The flow, which opened at some time within the latest milliseconds, or null where nobody can be reached.
flow *open_flow(world &state, std::uint32_t channel_index, const service &use, std::uint8_t wanted,
                std::uint32_t within) {
  flow made{.id = state.random.identity(), .channel = channel_index, .use = &use, .advisory = none};
  made.due = state.elapsed - state.random.below(within);
  const bool is_tcp = use.protocol == tcp_protocol;
  if (is_tcp) made.state = wanted;
  if (wanted == (is_tcp ? std::uint8_t{tcp::listening} : std::uint8_t{})) {
    made.route = none;
    made.due = never;
    made.ipv6 = state.random.chance(1, 2);
    made.local_port = use.port;
  } else if (!connect(state, made, wanted != first_state(use))) {
    return nullptr;
  }
  // Most are short, and most of the time belongs to the long ones.
  const std::uint32_t octave = state.random.below(10);
  made.ends = made.due + (state.random.between(1000, 2000) << octave);
  state.flows.push_back(made);
  return &state.flows.back();
}

// What a flow has moved in the time before anyone looked: long ones are met more often than they are opened,
// and go on for a while.
void remember_past(world &state, flow &old) {
  make_busy(state, old);
  const std::uint32_t lasts = state.random.between(1, 1024);
  const std::uint32_t seconds = lasts - lasts / 8 - state.random.below(lasts * 3 / 4 + 1);
  old.ends = state.elapsed + (lasts - seconds) * std::uint64_t{1000} + state.random.below(1000);
  const std::uint64_t out = std::uint64_t{old.packets_per_second.out} * seconds + 2;
  const std::uint64_t in = std::uint64_t{old.packets_per_second.in} * seconds + 2;
  carry(state, old, {{out * old.use->packet_size.out, out}, {in * old.use->packet_size.in, in}});
}

void open_tcp(world &state, flow &made) {
  const auto wanted = static_cast<tcp::state>(made.state);
  auto &count = state.channels[made.channel].stack.count;
  if (wanted == tcp::listening) return;
  ++count[made.use->inbound ? stack::accepted : stack::initiated];
  made.connected = wanted >= tcp::established || wanted == tcp::closed;
  if (made.connected) {
    ++count[stack::established];
    remember_past(state, made);
    made.due = state.elapsed;
  }
  enter(state, made, wanted);
}

void open_in(world &state, std::uint32_t channel_index, const service &use, std::uint8_t wanted,
             std::uint32_t within) {
  flow *const made = open_flow(state, channel_index, use, wanted, within);
  if (!made) return;
  if (use.protocol == tcp_protocol) {
    open_tcp(state, *made);
  } else if (wanted == 1) {
    carry(state, *made, {{use.packet_size.out, 1}, {}});
    made->due += state.random.below(600);
  } else if (wanted > 1) {
    remember_past(state, *made);
  }
}

// Opens a flow as if it had been there for some time: every fourth, or of many every sixteenth, in a rare
// state.
void open_old_flow(world &state, std::uint32_t channel_index, std::uint64_t number, std::size_t &rare_ones) {
  const service *use = any_service(state, channel_index);
  if (!use) return;
  const bool is_tcp = use->protocol == tcp_protocol;
  std::uint8_t wanted = is_tcp ? std::uint8_t{tcp::established} : std::uint8_t{2};
  if (number % (number < 60 ? 4 : 16) == 3)
    wanted = is_tcp ? rare[rare_ones++ % std::size(rare)] : std::uint8_t{1};
  if (is_tcp && wanted == tcp::syn_sent) wanted = first_state(*use);
  open_in(state, channel_index, *use, wanted, 1);
}

}  // namespace

void wander_routes(world &state) {
  for (route &way : state.routes) {
    const std::uint32_t step = way.rtt / 64 + 1;
    way.rtt += state.random.below(2 * step + 1) - step;
    way.rtt = std::clamp(way.rtt, way.on_link ? 200U : 4000U, way.on_link ? 3000U : 150'000U);
  }
}

void start_listening(world &state, std::uint32_t channel_index) {
  for (const service &offered : program_of(state, channel_index).services) {
    const std::uint8_t waiting = offered.protocol == tcp_protocol ? tcp::listening : tcp::closed;
    const bool fits = offered.inbound && 2 * state.flows.size() < state.size.flows;
    if (fits) open_in(state, channel_index, offered, waiting, 1);
  }
}

void open_new_flow(world &state, std::uint32_t channel_index, std::uint32_t within) {
  const service *use = any_service(state, channel_index);
  if (use) open_in(state, channel_index, *use, first_state(*use), within);
}

void open_flows(world &state) {
  std::vector<std::uint32_t> open;
  for (const std::uint32_t index : state.flow_channels) {
    if (state.channels[index].state == channel::phase::open) open.push_back(index);
  }
  if (open.empty() || state.size.flows == 0) return;
  const std::size_t per_switch = state.size.flows / state.switches.size();
  for (flow_switch &carrier : state.switches) {
    make_routes(state, carrier, static_cast<std::uint32_t>(std::clamp<std::size_t>(per_switch, 10, 4096)));
  }
  for (const std::uint32_t index : open) start_listening(state, index);
  // Some cannot be opened: whoever they are for may not answer.
  const std::uint64_t attempts = std::uint64_t{2} * state.size.flows + 100;
  std::size_t rare_ones = 0;
  for (std::uint64_t i = 0; i < attempts && state.flows.size() < state.size.flows; ++i) {
    if (i % 4096 == 0)
      progress::tell<"making flow %u of %u">(static_cast<std::uint32_t>(state.flows.size()),
                                             state.size.flows);
    open_old_flow(state, open[i % open.size()], i, rare_ones);
  }
}

}  // namespace lab
