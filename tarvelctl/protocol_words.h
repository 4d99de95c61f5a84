// The protocols that commands know by name: what their options accept and completions offer.

#ifndef TARVELCTL_TARVELCTL_PROTOCOL_WORDS_H
#define TARVELCTL_TARVELCTL_PROTOCOL_WORDS_H

#include <string_view>

#include "common/tables/netns.h"
#include "tarvelctl/netstat_options.h"

// Of `netns -p`, with the number of each in the table.
struct netns_protocol_word {
  std::string_view name;
  std::uint8_t number;
};
inline constexpr netns_protocol_word netns_protocols[] = {
    {"tcp", ip_protocols.number("tcp")},
    {"udp", ip_protocols.number("udp")},
};

// A word of the command line of netstat and the setting that it turns on.
struct named_setting {
  std::string_view name;
  int netstat_settings::*turned_on;
};

// Of `netstat -p`.
inline constexpr named_setting netstat_protocols[] = {
    {"ip", &netstat_settings::proto_ip},
    {"ip6", &netstat_settings::proto_ip6},
    {"tcp", &netstat_settings::proto_tcp},
    {"udp", &netstat_settings::proto_udp},
};

#endif
