// kern.tarvel.stats.flow_adv

#include "common/tables/flow.h"
#include "lab/tables.h"

namespace lab {

void write_advisories(const world &state, table_file &file) {
  std::vector<std::vector<tv_stats_flow_adv_entry>> lists(state.switches.size());
  for (std::size_t i = 0; i < lists.size(); ++i) lists[i].resize(state.switches[i].advisories);
  for (const flow &source : state.flows) {
    if (source.advisory == none) continue;
    lists[state.channels[source.channel].flow_switch][source.advisory] = {
        .sfae_flow_uuid = source.id,
        .sfae_flags = advisory_flag_names.bit("VALID") |
                      (source.controlled ? advisory_flag_names.bit("CONTROLLED") : 0)};
  }
  for (std::size_t i = 0; i < lists.size(); ++i) {
    const nexus &carrier = state.nexuses[state.switches[i].nexus];
    tv_stats_flow_adv record{.sfa_nx_uuid = carrier.id,
                             .sfa_pid = state.processes[process_for(state, network_daemon, 0)].pid,
                             .sfa_entries_count = state.switches[i].advisories};
    set_text(record.sfa_if_name, interface_name(carrier.kind, carrier.ordinal));
    file.put(record);
    file.put(std::as_bytes(std::span(lists[i])));
  }
}

}  // namespace lab
