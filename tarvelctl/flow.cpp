// flow: every flow of the flow switches, by owning process.

#include "common/tables/flow.h"

#include <concepts>
#include <string_view>
#include <vector>

#include "common/names/host_naming.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/tables/sort_key.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

// An index, or "-" for none.
format::name_text index_text(std::uint32_t index) {
  format::name_text text;
  char *end = text.chars;
  if (index == no_index) {
    *end++ = '-';
  } else {
    end = format::put_digits(end, index, format::decimal_digits(index));
  }
  text.end_at(end);
  return text;
}

// A round-trip time in milliseconds, or as many blanks where none was measured.
format::small_text<32> rtt_text(std::uint32_t microseconds) {
  if (microseconds == 0) return "          ";
  return format::text_of<"%7.2f ms", 32>(static_cast<float>(microseconds) / 1000);
}

void print_endpoints(const tv_stats_flow &flow, const char *protocol, host_naming &hosts) {
  flow.visit_addresses([&]<class Address>(const Address &local, const Address &remote) {
    if constexpr (std::same_as<Address, ipv6_address>) {
      const endpoint_text from = hosts.ipv6_endpoint_name(local, flow.sf_local.port, protocol);
      const endpoint_text to = hosts.ipv6_endpoint_name(remote, flow.sf_remote.port, protocol);
      print<"6 %-43.43s %-43.43s ">(from, to);
    } else {
      const endpoint_text from = hosts.ipv4_endpoint_name(local, flow.sf_local.port, protocol);
      const endpoint_text to = hosts.ipv4_endpoint_name(remote, flow.sf_remote.port, protocol);
      print<"4 %-43s %-43s ">(from, to);
    }
  });
}

void print_flow(const tv_stats_flow &flow, host_naming &hosts) {
  const format::name_text &protocol = proto_name(flow.sf_protocol);
  print<"%4s">(protocol);
  print_endpoints(flow, protocol.chars, hosts);
  const tv_flow_endpoint_stats &local = flow.sf_lstats;
  const tv_flow_endpoint_stats &remote = flow.sf_rstats;
  print<" %-12llu %-12llu %-10llu %-10llu %-3s %-8s %-4s %-3s %s %-12s %-12s%s  %s %-3s %s.%d\n">(
      remote.bytes, local.bytes, remote.packets, local.packets, svc_class_name(flow.sf_svc), flow.sf_if_name,
      index_text(flow.sf_nx_port), index_text(flow.sf_adv_idx), flow_flags_text(flow.sf_flags),
      flow_state_name(local.state), flow_state_name(remote.state), rtt_text(local.rtt), rtt_text(remote.rtt),
      index_text(flow.sf_bucket), flow.sf_proc_name, flow.sf_pid);
}

// The records that the filters let pass, by process id; flows of a process keep the table's order.
std::vector<sort_key> selected_flows(std::span<const std::byte> flows) {
  std::vector<sort_key> keys;
  const std::size_t count = flows.size() / sizeof(tv_stats_flow);
  keys.reserve(count);
  for (std::size_t i = 0; i < count; ++i) {
    const auto nexus = member_at<tv_stats_flow, uuid>(flows, i, offsetof(tv_stats_flow, sf_nx_uuid));
    const auto pid = member_at<tv_stats_flow, std::int32_t>(flows, i, offsetof(tv_stats_flow, sf_pid));
    if (netstat_options.selects(nexus, pid)) keys.push_back(make_sort_key(ascending(pid), i));
  }
  sort_keys(keys);
  return keys;
}

void print_flows(std::span<const std::byte> flows) {
  constexpr std::size_t ahead = 16;
  host_naming hosts(netstat_options.numerical);
  const std::vector<sort_key> keys = selected_flows(flows);
  for (std::size_t i = 0; i < keys.size(); ++i) {
    if (i + ahead < keys.size()) prefetch_record<tv_stats_flow>(flows, position_of(keys[i + ahead]));
    print_flow(record_at<tv_stats_flow>(flows, position_of(keys[i])), hosts);
  }
}

}  // namespace

int list_flows() {
  if (!netstat_options.all_flows) netstat_options.numerical = 1;
  kernel_table table;
  if (const int error = table.fetch(flow_node)) return error;
  if (table.empty()) return 0;

  print<
      "%-5s %-43s %-43s %-12s %-12s %-10s %-10s %-3s %-8s %-4s %-3s %-14s %-12s %-12s %-10s %-10s %-3s %s\n">(
      "Proto", "Local Address", "Remote Address", "InBytes", "OutBytes", "InPackets", "OutPackets", "SvC",
      "NetIf", "Port", "Adv", "Flags", "Local State", "Remote State", "Local RTT", "Remote RTT", "Bkt",
      "Process.PID");
  require(table.size() % sizeof(tv_stats_flow) == 0,
          {"cmd_flow", "tarvelctl/tarvelctl", 689, "(length % sizeof (*sf)) == 0"});
  print_flows(table.bytes());
  return 0;
}

void take_numerical_option(int argc, char **argv, const char *letters) {
  for (int result; (result = getopt_long(argc, argv, letters, no_options, nullptr)) != -1;) {
    if (result == 'n') netstat_options.numerical = 1;
  }
}

int cmd_flow(int argc, char **argv) {
  take_numerical_option(argc, argv, short_options_of(cmd_flow));
  return list_flows();
}
