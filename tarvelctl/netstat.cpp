// netstat: selects, filters and runs the flow and counter reports.

#include <cstdlib>
#include <cstring>
#include <iterator>
#include <string_view>

#include "common/text/output.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

netstat_settings netstat_options;

const option netstat_long_options[] = {
    {"flow", no_argument, nullptr, 'a'},       {"flow-adv", no_argument, nullptr, 0},
    {"flow-owner", no_argument, nullptr, 0},   {"global", no_argument, nullptr, 0},
    {"numerical", no_argument, nullptr, 'n'},  {"netif", no_argument, nullptr, 0},
    {"flowswitch", no_argument, nullptr, 0},   {"per-protocol", required_argument, nullptr, 'p'},
    {"pid", required_argument, nullptr, 0},    {"protocol", no_argument, nullptr, 's'},
    {"show-zeros", no_argument, nullptr, 0},   {"uuid", required_argument, nullptr, 0},
    {"wait", required_argument, nullptr, 'w'}, {},
};

const std::uint32_t netstat_option_flags[std::size(netstat_long_options) - 1] = {};

namespace {

constexpr named_setting long_settings[] = {
    {"global", &netstat_settings::global},         {"flow-adv", &netstat_settings::flow_adv},
    {"flow-owner", &netstat_settings::flow_owner}, {"netif", &netstat_settings::netif},
    {"flowswitch", &netstat_settings::flowswitch}, {"pid", &netstat_settings::pid_filter},
    {"uuid", &netstat_settings::uuid_filter},      {"show-zeros", &netstat_settings::show_zeros},
};

// The reports, in the order in which they run.
constexpr struct {
  int netstat_settings::*selected;
  int (*run)();
} reports[] = {
    {&netstat_settings::all_flows, list_flows},        {&netstat_settings::proto_stats, cmd_userstack},
    {&netstat_settings::netif, list_interfaces},       {&netstat_settings::flow_adv, list_flow_advisories},
    {&netstat_settings::flow_owner, list_flow_owners}, {&netstat_settings::flowswitch, list_flow_switches},
};

// Turns on the setting that `word` names. False where none has that name.
bool turn_on(std::span<const named_setting> settings, std::string_view word) {
  for (const named_setting &each : settings) {
    if (each.name.view() != word) continue;
    netstat_options.*each.turned_on = 1;
    return true;
  }
  return false;
}

bool take_protocol(const char *name) {
  netstat_options.proto_filter = 1;
  if (turn_on(netstat_protocols, name)) return true;
  complain<"Unsupported protocol \"%s\"\n">(name);
  return false;
}

bool take_long_option(std::string_view name) {
  turn_on(long_settings, name);
  if (name == "pid") netstat_options.pid = std::atoi(optarg);
  if (name != "uuid" || uuid_parse(optarg, netstat_options.uuid.bytes) == 0) return true;
  complain<"Bad UUID\n">();
  return false;
}

// Fills the settings from the command line. False after a message about a bad value. Everything else that the
// option parser cannot use it has reported itself.
bool take_options(int argc, char **argv) {
  const char *letters = short_options_of(cmd_netstat);
  int index = 0;
  for (int result; (result = getopt_long(argc, argv, letters, netstat_long_options, &index)) != -1;) {
    switch (result) {
      case 'a':
        netstat_options.all_flows = 1;
        break;
      case 'n':
        netstat_options.numerical = 1;
        break;
      case 's':
        netstat_options.proto_stats = 1;
        break;
      case 'p':
        if (!take_protocol(optarg)) return false;
        break;
      case 0:
        if (!take_long_option(netstat_long_options[index].name)) return false;
        break;
    }
  }
  return true;
}

void print_usage() {
  complain<
      "Usage:\n"
      "%s arguments\n"
      "\t-a              all flows\n"
      "\t--flow-adv      flow advisory\n"
      "\t--flow-owner    flow owner\n"
      "\t-n              numerical display\n"
      "\t--netif         netif statistics\n"
      "\t--flowswitch    flowswitch statistics\n"
      "\t-p <protocol>   show protocol statistics (tcp, udp, ip, ip6)\n"
      "\t-s              protocol statistics\n"
      "\t--global        fold statistics into single global one\n"
      "\t--pid <pid>     filter statistics based on process <pid>\n"
      "\t--uuid <uuid>   filter statistics based on nexus <uuid>\n"
      "\t--show-zeros    print out zero fields in statistics\n">("tarvelctl netstat");
}

}  // namespace

int cmd_netstat(int argc, char **argv) {
  report.flush();
  if (!take_options(argc, argv)) return -1;
  if (netstat_options.proto_stats && !netstat_options.proto_filter) {
    for (const named_setting &each : netstat_protocols) netstat_options.*each.turned_on = 1;
  }
  bool any = false;
  for (const auto &each : reports) {
    if (!(netstat_options.*each.selected)) continue;
    any = true;
    each.run();
  }
  if (!any) print_usage();
  return 0;
}
