// interface and flow-switch: the counters of each nexus of that kind, by interface name.

#include <algorithm>
#include <vector>

#include "common/tables/counters.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "tarvelctl/command.h"
#include "tarvelctl/counter_lines.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

void __tv_stats_net_if_print(std::span<const std::uint64_t> counters) {
  print_counters(net_if_counter_names, counters);
}

void __tv_stats_flow_switch_print(std::span<const std::uint64_t> counters) {
  print_counters(flow_switch_counter_names, counters);
}

// One of the twin reports. Record has a head and counters.
template <class Record>
struct counter_report {
  const char *node;
  const char *title;
  void (*print_block)(std::span<const std::uint64_t> counters);
  invariant whole_records;

  int run() const;

 private:
  void print_each(std::span<const std::byte> records) const;
  void print_total(std::span<const std::byte> records) const;
};

constexpr counter_report<tv_stats_net_if> interface_report = {
    net_if_node,
    "netif:",
    __tv_stats_net_if_print,
    {"cmd_interface", "tarvelctl/tarvelctl", 1073, "(length % width) == 0"},
};

constexpr counter_report<tv_stats_flow_switch> flow_switch_report = {
    flow_switch_node,
    "flowswitch:",
    __tv_stats_flow_switch_print,
    {"cmd_flow_switch", "tarvelctl/tarvelctl", 1138, "(length % width) == 0"},
};

template <class Record>
int counter_report<Record>::run() const {
  kernel_table table;
  if (const int error = table.fetch(node)) return error;
  if (table.empty()) return 0;
  require(table.size() % sizeof(Record) == 0, whole_records);
  print<"%s\n">(title);
  if (netstat_options.global) {
    print_total(table.bytes());
  } else {
    print_each(table.bytes());
  }
  return 0;
}

// What a record is sorted by, and where it lies. Records with equal names keep the table's order.
struct name_key {
  text_field<16> name;
  std::uint32_t position;
};

// Below 0 where `a` comes first, above where `b` does, else 0.
int tv_stats_name_compare(const name_key &a, const name_key &b) {
  return a.name.view().compare(b.name.view());
}

template <class Record>
void counter_report<Record>::print_each(std::span<const std::byte> records) const {
  std::vector<name_key> keys(records.size() / sizeof(Record));
  for (std::uint32_t i = 0; i < keys.size(); ++i) keys[i] = {record_at<Record>(records, i).head.name, i};
  std::stable_sort(keys.begin(), keys.end(),
                   [](const name_key &a, const name_key &b) { return tv_stats_name_compare(a, b) < 0; });
  for (const name_key &key : keys) {
    const auto record = record_at<Record>(records, key.position);
    if (!netstat_options.selects(record.head.nx_uuid)) continue;
    print<" - %-8s %s\n">(record.head.name, record.head.nx_uuid);
    print_block(std::span(record.counters));
  }
}

template <class Record>
void counter_report<Record>::print_total(std::span<const std::byte> records) const {
  Record total{};
  record_walk walk(records);
  for (Record record; walk.take(record);) add_counters(total.counters, record.counters);
  print_block(std::span(total.counters));
}

}  // namespace

int list_interfaces() {
  return interface_report.run();
}

int list_flow_switches() {
  return flow_switch_report.run();
}

int cmd_interface(int /*argc*/, char ** /*argv*/) {
  return list_interfaces();
}

int cmd_flow_switch(int /*argc*/, char ** /*argv*/) {
  return list_flow_switches();
}
