// Flows: how they open, walk through their states and end.

#include <algorithm>

#include "common/tables/flow.h"
#include "lab/flow_states.h"
#include "lab/programs.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

// A flow that someone wants to see: a TCP state, or how many packets a datagram flow has sent.
struct wish {
  std::uint8_t protocol;
  std::uint8_t state;
};

// Every fourth flow of a small machine that is new is one of these, so that there is one in each state.
constexpr wish rare[] = {
    {tcp_protocol, tcp::syn_sent},
    {tcp_protocol, tcp::time_wait},
    {tcp_protocol, tcp::close_wait},
    {tcp_protocol, tcp::fin_wait_1},
    {udp_protocol, 1},
    {tcp_protocol, tcp::closing},
    {tcp_protocol, tcp::last_ack},
    {tcp_protocol, tcp::fin_wait_2},
    {tcp_protocol, tcp::closed},
    {tcp_protocol, tcp::syn_received},
};

bool fits(const service &offered, const wish &wanted) {
  if (offered.protocol != wanted.protocol) return false;
  if (offered.protocol == udp_protocol) return true;
  if (wanted.state == tcp::syn_received) return offered.inbound;
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

bool connect(world &state, flow &made, bool connected) {
  flow_switch &carrier = state.switches[state.channels[made.channel].flow_switch];
  made.route = choose_route(state, carrier, connected || made.use->inbound);
  if (made.route == none) return false;
  route &way = state.routes[made.route];
  made.ipv6 = way.kind != address_kind::ipv4;
  const bool exhausted = carrier.reserved == ephemeral_ports && made.use->protocol == tcp_protocol;
  if (exhausted && !made.ipv6 && !made.use->inbound) return false;
  const auto ephemeral = static_cast<std::uint16_t>(first_ephemeral + way.used++ % ephemeral_ports);
  made.local_port = made.use->inbound ? made.use->port : ephemeral;
  made.remote_port = made.use->inbound ? ephemeral : made.use->port;
  ++way.flows;
  take_advisory(carrier, made);
  return true;
}

// A server has its known port, and then, as everyone else, ports of its own.
void listen(world &state, flow &made) {
  const std::uint32_t before = state.channels[made.channel].listeners++;
  made.route = none;
  made.due = never;
  made.ipv6 = state.random.chance(1, 2);
  const bool known = made.use->inbound && before < 2;
  made.local_port = known ? made.use->port : static_cast<std::uint16_t>(49'151 - before % 40'000);
}

// The flow, which opened at some time within the latest milliseconds, or null where nobody can be reached.
flow *open_flow(world &state, std::uint32_t channel_index, const service &use, const wish &wanted,
                std::uint32_t within) {
  flow made{.id = state.random.identity(), .channel = channel_index, .use = &use, .advisory = none};
  made.due = state.elapsed - state.random.below(within);
  made.state = wanted.protocol == tcp_protocol ? wanted.state : std::uint8_t{tcp::closed};
  const bool is_tcp = wanted.protocol == tcp_protocol;
  if (wanted.state == (is_tcp ? tcp::listening : 0)) {
    listen(state, made);
  } else if (!connect(state, made, is_tcp ? wanted.state > tcp::syn_sent : wanted.state > 1)) {
    return nullptr;
  }
  // Most are short, and most of the time belongs to the long ones.
  made.ends = made.due + state.random.between(1000, 2000) * (1U << state.random.below(10));
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

// False where nobody can be reached.
bool open_wish(world &state, std::uint32_t channel_index, const service &use, const wish &wanted,
               std::uint32_t within) {
  flow *const made = open_flow(state, channel_index, use, wanted, within);
  if (!made) return false;
  if (use.protocol == tcp_protocol) {
    open_tcp(state, *made);
  } else if (wanted.state == 1) {
    carry(state, *made, {{use.packet_size.out, 1}, {}});
    made->due += state.random.below(600);
  } else if (wanted.state > 1) {
    remember_past(state, *made);
  }
  return true;
}

// Opens flow number `number` of a new machine on one of the channels, as if it had been there for some time.
void open_old_flow(world &state, const std::vector<std::uint32_t> &open, std::uint64_t number) {
  const std::uint32_t every = number < 60 ? 4 : 16;
  const wish wanted = rare[number / every % std::size(rare)];
  const service *use = nullptr;
  std::uint32_t index = open[number % open.size()];
  // The next channel whose program has such a service.
  for (std::uint32_t ahead = 0; number % every == 3 && !use && ahead < flow_programs; ++ahead) {
    index = open[(number + ahead) % open.size()];
    use = fitting_service(state, index, wanted);
  }
  if (use) {
    open_wish(state, index, *use, wanted, 1);
  } else if ((use = any_service(state, index))) {
    const bool is_tcp = use->protocol == tcp_protocol;
    open_wish(state, index, *use, {use->protocol, is_tcp ? std::uint8_t{tcp::established} : std::uint8_t{2}},
              1);
  }
}

}  // namespace

void start_listening(world &state, std::uint32_t channel_index) {
  for (const service &offered : program_of(state, channel_index).services) {
    const std::uint8_t waiting =
        offered.protocol == tcp_protocol ? std::uint8_t{tcp::listening} : std::uint8_t{};
    if (offered.inbound && state.flows.size() < state.size.flows)
      open_wish(state, channel_index, offered, {offered.protocol, waiting}, 1);
  }
}

void open_new_flow(world &state, std::uint32_t channel_index, std::uint32_t within) {
  const service *use = any_service(state, channel_index);
  if (!use) return;
  const std::uint8_t first_tcp = use->inbound ? tcp::syn_received : tcp::syn_sent;
  const std::uint8_t first = use->protocol == tcp_protocol ? first_tcp : std::uint8_t{1};
  open_wish(state, channel_index, *use, {use->protocol, first}, within);
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
  for (const std::uint32_t index : open) start_listening(state, index);
  // Some cannot be opened: whoever they are for may not answer.
  const std::uint64_t attempts = std::uint64_t{2} * state.size.flows + 100;
  for (std::uint64_t i = 0; i < attempts && state.flows.size() < state.size.flows; ++i) {
    open_old_flow(state, open, i);
  }
}

}  // namespace lab
