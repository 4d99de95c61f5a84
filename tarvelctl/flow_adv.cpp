// flow-adv: the flow advisories of each flow switch.

#include "common/names/process_names.h"
#include "common/tables/flow.h"
#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"
#include "tarvelctl/netstat_options.h"
#include "tarvelctl/reports.h"

namespace {

void __tv_stats_flow_adv_print(const tv_stats_flow_adv &advisories, record_walk sfa_entries,
                               process_names &processes) {
  print<" - %s\n">(processes.of(advisories.sfa_pid));
  print<"\tNexus UUID: %s\n">(advisories.sfa_nx_uuid);
  print<"\tNetif     : %s\n">(advisories.sfa_if_name);
  print<"\tFlowAdvIdx               Flow UUID                 Flags\n">();
  require(advisories.sfa_entries_count <= tv_stats_flow_adv::max_entries,
          {"__tv_stats_flow_adv_print", "tarvelctl/tarvelctl", 729, "sfa->sfa_entries_count <= 512"});
  tv_stats_flow_adv_entry entry;
  for (int i = 0; sfa_entries.take(entry); ++i) {
    print<"\t    [%3d] : %s ">(i, entry.sfae_flow_uuid);
    print_flags("flags", entry.sfae_flags, advisory_flag_names);
    print<"\n">();
  }
}

}  // namespace

int list_flow_advisories() {
  kernel_table table;
  if (const int error = table.fetch(flow_adv_node)) return error;
  process_names processes(true);
  record_walk walk(table.bytes());
  tv_stats_flow_adv advisories;
  std::span<const std::byte> sfa_entries;
  while (walk.take(advisories, sfa_entries)) {
    if (!netstat_options.selects(advisories.sfa_nx_uuid, advisories.sfa_pid)) continue;
    __tv_stats_flow_adv_print(advisories, record_walk(sfa_entries), processes);
  }
  require(walk.at_end(), {"cmd_flow_adv", "tarvelctl/tarvelctl", 766, "scan == (buffer + length)"});
  return 0;
}

int cmd_flow_adv(int /*argc*/, char ** /*argv*/) {
  return list_flow_advisories();
}
