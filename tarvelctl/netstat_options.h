// The settings of the flow listings and the counter reports.

#ifndef TARVELCTL_TARVELCTL_NETSTAT_OPTIONS_H
#define TARVELCTL_TARVELCTL_NETSTAT_OPTIONS_H

#include <cstdint>

#include "common/tables/uuid.h"
#include "common/text/print.h"

// One record for the process, all zero at its start and then only ever set: by the netstat command from its
// options, and `numerical` by the flow listings too. Reports that run as commands of their own see no filter.
struct netstat_settings {
  int all_flows;
  int numerical;
  int global;
  int uuid_filter;
  ::uuid uuid;
  int proto_filter;
  int proto_ip;
  int proto_ip6;
  int proto_tcp;
  int proto_udp;
  int proto_stats;
  int flow_adv;
  int flow_owner;
  int netif;
  int flowswitch;
  int pid_filter;
  std::int32_t pid;
  int show_zeros;

  // Whether the filters let a record pass.
  bool selects(const ::uuid &nexus) const { return !uuid_filter || nexus == uuid; }
  bool selects(const ::uuid &nexus, std::int32_t process) const {
    return selects(nexus) && (!pid_filter || process == pid);
  }
};

extern netstat_settings netstat_options;

// A word of the command line and the setting that it turns on.
struct named_setting {
  format::name_text name;
  int netstat_settings::*turned_on;
};

// Of `netstat -p`, for completions too.
inline constexpr named_setting netstat_protocols[] = {
    {"ip", &netstat_settings::proto_ip},
    {"ip6", &netstat_settings::proto_ip6},
    {"tcp", &netstat_settings::proto_tcp},
    {"udp", &netstat_settings::proto_udp},
};

#endif
