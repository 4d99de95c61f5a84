// flow-route: the routes of the flow switches, with gateway and link-layer address of the next hop.

#include "common/names/host_naming.h"
#include "common/tables/flow.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

// IPv6 names are cut where the next column begins, but for the gateway's.
void print_addresses(const tv_stats_flow_route &route, host_naming &hosts) {
  const bool has_gateway = route.sfr_flags & route.has_gateway;
  if (route.sfr_remote.family == address_family::ipv6) {
    print<"%-40.40s ">(hosts.ipv6_host_name(route.sfr_local.ipv6));
    print<"%-40.40s ">(hosts.ipv6_host_name(route.sfr_remote.ipv6));
    if (has_gateway) print<"%-40s">(hosts.ipv6_host_name(route.sfr_gateway.ipv6));
  } else if (route.sfr_remote.family == address_family::ipv4) {
    print<"%-40s ">(hosts.ipv4_host_name(route.sfr_local.ipv4));
    print<"%-40s ">(hosts.ipv4_host_name(route.sfr_remote.ipv4));
    if (has_gateway) print<"%-40s">(hosts.ipv4_host_name(route.sfr_gateway.ipv4));
  } else {
    return;
  }
  if (!has_gateway) print<"%-40s">("-");
}

void print_route(const tv_stats_flow_route &route, host_naming &hosts) {
  print_addresses(route, hosts);
  if (route.sfr_flags & route.has_mac) {
    print<" %s">(link_layer_address_text(route.sfr_mac));
  } else {
    print<" %-17s">("-");
  }
  print<" %8s %6u %6lld %5u %5u  %s\n">(route.sfr_if_name, route.sfr_refs, route.sfr_expire, route.sfr_bidx,
                                        route.sfr_ibidx, flags_text{route.sfr_flags, route_flag_names});
}

}  // namespace

int cmd_flow_route(int argc, char **argv) {
  take_numerical_option(argc, argv, short_options_of(cmd_flow_route));
  kernel_table table;
  if (const int error = table.fetch(flow_route_node)) return error;
  if (table.empty()) return 0;

  print<"%-40s %-40s %-40s %-17s %8s %6s %6s %5s %5s %6s\n">("Local Address", "Remote Address",
                                                             "Gateway Address", "MAC Address", "NetIf",
                                                             "Refs", "Expire", "bidx", "ibidx", "Flags");
  host_naming hosts(netstat_options.numerical);
  record_walk walk(table.bytes());
  for (tv_stats_flow_route route; walk.take(route);) print_route(route, hosts);
  require(walk.at_end(), {"cmd_flow_route", "tarvelctl/tarvelctl", 933, "sfr == (buffer + length)"});
  return 0;
}
