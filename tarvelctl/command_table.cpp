#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

const option no_options[] = {{}};
const std::uint32_t no_option_flags[] = {0};

const command_entry command_table[] = {
    {"channel", cmd_channel, 0, nullptr, no_options, channel_option_flags},
    {"flow", cmd_flow, 0, nullptr, no_options, no_option_flags},
    {"flow-adv", cmd_flow_adv, 0, nullptr, no_options, no_option_flags},
    {"flow-owner", cmd_flow_owner, 0, nullptr, no_options, no_option_flags},
    {"flow-route", cmd_flow_route, 0, nullptr, no_options, no_option_flags},
    {"flow-switch", cmd_flow_switch, 0, nullptr, no_options, no_option_flags},
    {"interface", cmd_interface, 0, nullptr, no_options, no_option_flags},
    {"memory", cmd_memory, 0, nullptr, no_options, no_option_flags},
    {"netns", cmd_netns, 0, nullptr, netns_options, netns_option_flags},
    {"provider", cmd_provider, 0, nullptr, provider_options, provider_option_flags},
    {"show", cmd_show, 0, nullptr, no_options, no_option_flags},
    {"tree", cmd_tree, 0, nullptr, no_options, no_option_flags},
    {"channel-stats", cmd_show, 0, nullptr, no_options, no_option_flags},
    {"list-providers", cmd_provider, 0, nullptr, provider_options, provider_option_flags},
    {"netstat", cmd_netstat, 0, nullptr, netstat_long_options, netstat_option_flags},
    {},
};

namespace {

constexpr struct {
  command_handler handler;
  const char *letters;
} short_options[] = {
    {cmd_flow, "n"}, {cmd_flow_route, "n"}, {cmd_netns, "ai:p:"}, {cmd_netstat, "ansp:"}, {cmd_provider, "D"},
};

}  // namespace

const char *short_options_of(command_handler handler) {
  for (const auto &row : short_options) {
    if (row.handler == handler) return row.letters;
  }
  return "";
}
