#include "lab/tables.h"

#include "common/tables/arena.h"
#include "common/tables/channel.h"
#include "common/tables/counters.h"
#include "common/tables/flow.h"
#include "common/tables/netns.h"
#include "common/tables/provider.h"

namespace lab {

namespace {

constexpr table all_tables[] = {
    {provider_list_node, write_providers, nullptr},
    {arena_node, write_arenas, pids_of_arenas},
    {ring_stat_enable_node, write_ring_stat_enable, nullptr},
    {channel_list_node, write_channels, pids_of_channels},
    {flow_adv_node, write_advisories, pids_of_advisories},
    {flow_owner_node, write_owners, pids_of_array<tv_stats_flow_owner, &tv_stats_flow_owner::sfo_pid>},
    {flow_route_node, write_routes, nullptr},
    {net_if_node, write_net_ifs, nullptr},
    {flow_switch_node, write_flow_switches, nullptr},
    {userstack_node, write_userstacks, pids_of_array<tv_stats_userstack, &tv_stats_userstack::pid>},
    {netns_node, write_namespaces, nullptr},
    {flow_node, write_flows, pids_of_array<tv_stats_flow, &tv_stats_flow::sf_pid>},
};

}  // namespace

const std::span<const table> tables = all_tables;

}  // namespace lab
