// kern.tarvel.stats.flow_route

#include "common/tables/flow.h"
#include "lab/tables.h"

namespace lab {

namespace {

constexpr std::uint32_t has_no_gateway = route_flag_names.bit("o");
constexpr std::uint32_t resolved = route_flag_names.bit("r");

constexpr std::uint32_t lifetime = 1200;  // seconds

// Of whoever sends the frames on: the gateway's is the same for all routes of an interface. 02 marks
// addresses that no vendor gave out.
void set_mac(const world &state, tv_stats_flow_route &record, std::uint32_t ordinal, std::size_t number) {
  random_source random(state.seed, 3, number == none ? ordinal : std::uint64_t{number} << 32);
  const std::uint64_t digits = random.next();
  record.sfr_mac[0] = 0x02;
  for (unsigned i = 1; i < 6; ++i) record.sfr_mac[i] = static_cast<std::uint8_t>(digits >> 8 * i);
}

}  // namespace

void write_routes(const world &state, table_file &file) {
  for (std::size_t i = 0; i < state.routes.size(); ++i) {
    const route &way = state.routes[i];
    if (way.flows == 0) continue;
    const nexus &carrier = state.nexuses[state.switches[way.flow_switch].nexus];
    random_source random(state.seed, 2, i);
    tv_stats_flow_route record{};
    set_text(record.sfr_if_name, interface_name(carrier.kind, carrier.ordinal));
    record.sfr_bidx = random.below(256);
    record.sfr_ibidx = random.below(256);
    record.sfr_refs = way.flows;
    record.sfr_local = interface_address(state.seed, carrier.ordinal, way.kind);
    record.sfr_remote = way.remote;
    // It is resolved anew shortly before it expires. A neighbour that does not answer has no address.
    const std::uint64_t age = state.elapsed / 1000 + random.below(lifetime);
    const bool has_mac = way.answers || !way.on_link;
    record.sfr_expire = has_mac ? lifetime - static_cast<std::int64_t>(age % (lifetime - 60)) : 0;
    record.sfr_flags = way.on_link ? has_no_gateway : tv_stats_flow_route::has_gateway;
    if (!way.on_link) record.sfr_gateway = gateway_address(carrier.ordinal, way.kind != address_kind::ipv4);
    if (has_mac) {
      record.sfr_flags |= resolved | tv_stats_flow_route::has_mac;
      set_mac(state, record, carrier.ordinal, way.on_link ? i : none);
    }
    file.put(record);
  }
}

}  // namespace lab
