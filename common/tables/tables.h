// Every table of the kernel.

#ifndef TARVELCTL_COMMON_TABLES_TABLES_H
#define TARVELCTL_COMMON_TABLES_TABLES_H

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "common/tables/arena.h"
#include "common/tables/channel.h"
#include "common/tables/counters.h"
#include "common/tables/flow.h"
#include "common/tables/netns.h"
#include "common/tables/provider.h"

struct table_description {
  const char *node;                  // the kernel variable
  const record_description *record;  // the records that it is a sequence of
  std::size_t most = SIZE_MAX;       // bytes of it that anyone reads
};

inline constexpr table_description all_tables[] = {
    {provider_list_node, &provider_description},
    {channel_list_node, &channel_header_description},
    {ring_stat_enable_node, &ring_stat_enable_description, 1},
    {flow_node, &flow_description},
    {flow_adv_node, &advisory_description},
    {flow_owner_node, &owner_description},
    {flow_route_node, &route_description},
    {net_if_node, &net_if_description},
    {flow_switch_node, &flow_switch_description},
    {userstack_node, &userstack_description},
    {netns_node, &netns_description},
    {arena_node, &arena_description},
};

// The table of a node. A node that is none does not compile.
consteval const table_description &table_of(std::string_view node) {
  const table_description *table = all_tables;
  while (table->node != node) ++table;
  return *table;
}

#endif
