// Routes: whom the programs of a switch talk to.

#include <algorithm>
#include <iterator>

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

}  // namespace

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

std::uint32_t choose_route(world &state, flow_switch &carrier, bool connected) {
  if (carrier.route_count == 0) return none;
  if (!connected && carrier.dead_route != none && state.random.chance(1, 2)) return carrier.dead_route;
  const std::uint32_t index = carrier.first_route + state.random.below(carrier.route_count);
  route &way = state.routes[index];
  if (way.flows == 0 && index != carrier.dead_route && state.random.chance(3, 4)) {
    meet_someone(state, carrier, way);
  }
  return connected && !way.answers ? none : index;
}

void wander_routes(world &state) {
  for (route &way : state.routes) {
    const std::uint32_t step = way.rtt / 64 + 1;
    way.rtt += state.random.below(2 * step + 1) - step;
    way.rtt = std::clamp(way.rtt, way.on_link ? 200U : 4000U, way.on_link ? 3000U : 150'000U);
  }
}

}  // namespace lab
