// The IP, IPv6, TCP and UDP counters of the protocol stacks in user space, for netstat.

#include "common/names/process_names.h"
#include "common/tables/counters.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "tarvelctl/counter_lines.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

// A block of counters in a stack's record.
struct protocol {
  const char *name;
  int netstat_settings::*selected;
  const counter_name *counter_names;
  std::span<std::uint64_t> (*counters)(tv_stats_userstack &stack);
};

// The blocks have types of their own, by their lengths; a span hides that.
template <auto Block>
std::span<std::uint64_t> block(tv_stats_userstack &stack) {
  return stack.*Block;
}

constexpr protocol protocols[] = {
    {"ip", &netstat_settings::proto_ip, ip_counter_names, block<&tv_stats_userstack::ip>},
    {"ip6", &netstat_settings::proto_ip6, ip6_counter_names, block<&tv_stats_userstack::ip6>},
    {"tcp", &netstat_settings::proto_tcp, tcp_counter_names, block<&tv_stats_userstack::tcp>},
    {"udp", &netstat_settings::proto_udp, udp_counter_names, block<&tv_stats_userstack::udp>},
};

void print_header(const tv_stats_userstack &stack, process_names &processes) {
  if (stack.pid == 0) {
    print<" - <Closed Port Stats>\n">();
  } else {
    print<" - %s\n">(processes.of(stack.pid));
  }
  print<"\tNexus UUID: %s\n">(stack.nx_uuid);
  print<"\tNetif     : %s\n">(stack.if_name);
}

void print_sections(tv_stats_userstack &stack) {
  for (const protocol &each : protocols) {
    if (!(netstat_options.*each.selected)) continue;
    print<"\t%s:\n">(each.name);
    print_counters(each.counter_names, each.counters(stack));
  }
}

void __tv_stats_userstack_print(tv_stats_userstack &stack, process_names &processes) {
  print_header(stack, processes);
  print_sections(stack);
}

}  // namespace

int cmd_userstack() {
  kernel_table table;
  if (const int error = table.fetch(userstack_node)) return error;
  if (table.empty()) return 0;

  process_names processes(true);
  tv_stats_userstack total{};
  record_walk walk(table.bytes());
  for (tv_stats_userstack stack; walk.take(stack);) {
    if (!netstat_options.selects(stack.nx_uuid, stack.pid)) continue;
    if (!netstat_options.global) {
      __tv_stats_userstack_print(stack, processes);
      continue;
    }
    for (const protocol &each : protocols) add_counters(each.counters(total), each.counters(stack));
  }
  if (netstat_options.global) print_sections(total);
  report.flush();
  require(walk.at_end(), {"cmd_userstack", "tarvelctl/tarvelctl", 1038, "scan == (buffer + length)"});
  return 0;
}
