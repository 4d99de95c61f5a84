// flow: every flow of the flow switches, by owning process.

#include "common/flow.h"

#include <algorithm>
#include <string_view>
#include <vector>

#include "common/flow_naming.h"
#include "common/invariant.h"
#include "common/kernel_table.h"
#include "common/output.h"
#include "common/record_walk.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

// An index, or "-" for none.
format::small_text<12> index_text(std::uint32_t index) {
  if (index == no_index) return {.chars = "-", .size = 1};
  return format::text_of<"%u", 12>(index);
}

// A round-trip time in milliseconds, or as many blanks where none was measured.
format::small_text<20> rtt_text(std::uint32_t microseconds) {
  if (microseconds == 0) return {.chars = "          ", .size = 10};
  return format::text_of<"%7.2f ms", 20>(static_cast<float>(microseconds) / 1000);
}

void print_endpoints(const tv_stats_flow &flow, const char *protocol) {
  const bool numerical = netstat_options.numerical;
  const auto name = [&](auto naming, auto address) {
    return std::pair{naming(flow.sf_local.*address, flow.sf_local.port, protocol, numerical),
                     naming(flow.sf_remote.*address, flow.sf_remote.port, protocol, numerical)};
  };
  if (flow.sf_local.family == address_family::ipv6) {
    const auto [local, remote] = name(ipv6_endpoint_name, &socket_address::ipv6);
    print<"%c %-43.43s %-43.43s ">('6', local, remote);
  } else if (flow.sf_local.family == address_family::ipv4) {
    const auto [local, remote] = name(ipv4_endpoint_name, &socket_address::ipv4);
    print<"%c %-43s %-43s ">('4', local, remote);
  }
}

void print_flow(const tv_stats_flow &flow) {
  const char *protocol = proto_name(flow.sf_protocol);
  print<"%4s">(protocol);
  print_endpoints(flow, protocol);
  const tv_flow_endpoint_stats &local = flow.sf_lstats;
  const tv_flow_endpoint_stats &remote = flow.sf_rstats;
  print<" %-12llu %-12llu %-10llu %-10llu %-3s %-8s %-4s %-3s %s %-12s %-12s%s  %s %-3s %s.%d\n">(
      remote.bytes, local.bytes, remote.packets, local.packets, svc_class_name(flow.sf_svc), flow.sf_if_name,
      index_text(flow.sf_nx_port), index_text(flow.sf_adv_idx), flow_flags_text(flow.sf_flags),
      flow_state_name(local.state), flow_state_name(remote.state), rtt_text(local.rtt), rtt_text(remote.rtt),
      index_text(flow.sf_bucket), flow.sf_proc_name, flow.sf_pid);
}

// The positions of the records that the filters let pass, by process id; flows of a process keep the table's
// order.
std::vector<std::uint32_t> selected_by_pid(std::span<const std::byte> flows) {
  std::vector<std::uint64_t> keys;
  const std::size_t count = flows.size() / sizeof(tv_stats_flow);
  keys.reserve(count);
  for (std::size_t i = 0; i < count; ++i) {
    const auto flow = record_at<tv_stats_flow>(flows, i);
    if (!netstat_options.selects(flow.sf_nx_uuid, flow.sf_pid)) continue;
    const std::uint32_t ascending = static_cast<std::uint32_t>(flow.sf_pid) ^ 0x80000000;
    keys.push_back(std::uint64_t{ascending} << 32 | i);
  }
  std::sort(keys.begin(), keys.end());
  return {keys.begin(), keys.end()};
}

}  // namespace

int list_flows() {
  if (!netstat_options.all_flows) netstat_options.numerical = 1;
  kernel_table table;
  if (const int error = table.fetch(flow_node_name)) return error;
  if (table.empty()) return 0;

  print<
      "%-5s %-43s %-43s %-12s %-12s %-10s %-10s %-3s %-8s %-4s %-3s %-14s %-12s %-12s %-10s %-10s %-3s %s\n">(
      "Proto", "Local Address", "Remote Address", "InBytes", "OutBytes", "InPackets", "OutPackets", "SvC",
      "NetIf", "Port", "Adv", "Flags", "Local State", "Remote State", "Local RTT", "Remote RTT", "Bkt",
      "Process.PID");
  require(table.size() % sizeof(tv_stats_flow) == 0,
          {"cmd_flow", "tarvelctl/tarvelctl", 689, "(length % sizeof (*sf)) == 0"});
  for (const std::uint32_t at : selected_by_pid(table.bytes())) {
    print_flow(record_at<tv_stats_flow>(table.bytes(), at));
  }
  return 0;
}

void take_numerical_option(int argc, char **argv) {
  for (int result; (result = getopt_long(argc, argv, "n", no_options, nullptr)) != -1;) {
    if (result == 'n') netstat_options.numerical = 1;
  }
}

int cmd_flow(int argc, char **argv) {
  take_numerical_option(argc, argv);
  return list_flows();
}
