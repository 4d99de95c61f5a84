#include "common/tables/provider.h"

#include <iterator>

const char *provider_type_name(std::uint32_t type, std::uint32_t subtype) {
  static constexpr const char *types[] = {"user-pipe", "kernel-pipe", "net-if"};
  static constexpr const char *flow_switches[] = {"flow-switch (bridge)", "flow-switch (multistack)"};
  static_assert(std::size(types) == nexus_type::flow_switch);
  static_assert(std::size(flow_switches) == flow_switch_subtype::multistack + 1);
  if (type < std::size(types)) return types[type];
  if (type != nexus_type::flow_switch) return "unknown";
  // Both parentheses have been there for ever; scripts know them.
  return subtype < std::size(flow_switches) ? flow_switches[subtype] : "flow-switch (unknown type))";
}
