#include "lab/tables.h"

namespace lab {

// Each in the file of its name.
void write_providers(const world &, table_file &);
void write_channels(const world &, table_file &);
void write_ring_stat_enable(const world &, table_file &);
void write_flows(const world &, table_file &);
void write_advisories(const world &, table_file &);
void write_owners(const world &, table_file &);
void write_routes(const world &, table_file &);
void write_net_ifs(const world &, table_file &);
void write_flow_switches(const world &, table_file &);
void write_userstacks(const world &, table_file &);
void write_arenas(const world &, table_file &);
void write_namespaces(const world &, table_file &);

namespace {

constexpr table rows[] = {
    {&table_of(provider_list_node), write_providers},
    {&table_of(arena_node), write_arenas},
    {&table_of(ring_stat_enable_node), write_ring_stat_enable},
    {&table_of(channel_list_node), write_channels},
    {&table_of(flow_adv_node), write_advisories},
    {&table_of(flow_owner_node), write_owners},
    {&table_of(flow_route_node), write_routes},
    {&table_of(net_if_node), write_net_ifs},
    {&table_of(flow_switch_node), write_flow_switches},
    {&table_of(userstack_node), write_userstacks},
    {&table_of(netns_node), write_namespaces},
    {&table_of(flow_node), write_flows},
};
static_assert(std::size(rows) == std::size(all_tables));

}  // namespace

const std::span<const table> tables = rows;

}  // namespace lab
