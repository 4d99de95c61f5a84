// flow-owner: which process holds which nexus port.

#include "common/tables/flow.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

int list_flow_owners() {
  kernel_table table;
  if (const int error = table.fetch(flow_owner_node)) return error;
  if (table.empty()) return 0;

  print<"%-8s  %-5s  %-9s  %-9s  %-3s  %s\n">("NetIf", "Port", "Property", "", "Bkt", "Process");
  record_walk walk(table.bytes());
  for (tv_stats_flow_owner owner; walk.take(owner);) {
    if (!netstat_options.selects(owner.sfo_nx_uuid, owner.sfo_pid)) continue;
    print<"%-8s  %-5u  %-9s  %-9s  %-3u  %s(%d)\n">(
        owner.sfo_if_name, owner.sfo_nx_port, owner.sfo_pid_bound ? "PID-Bound" : "",
        owner.sfo_destroyed ? "Destroyed" : "", owner.sfo_bucket, owner.sfo_proc_name, owner.sfo_pid);
  }
  require(walk.at_end(), {"cmd_flow_owner", "tarvelctl/tarvelctl", 817, "sfo == (buffer + length)"});
  return 0;
}

int cmd_flow_owner(int /*argc*/, char ** /*argv*/) {
  return list_flow_owners();
}
