#include "lab/tables.h"

namespace lab {

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
