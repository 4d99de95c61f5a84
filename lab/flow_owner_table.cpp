// kern.tarvel.stats.flow_owner

#include "common/tables/flow.h"
#include "lab/tables.h"

namespace lab {

void write_owners(const world &state, table_file &file) {
  for (const std::uint32_t index : state.flow_channels) {
    const channel &held = state.channels[index];
    if (held.state == channel::phase::closed) continue;
    const nexus &carrier = state.nexuses[held.nexus];
    const process &owner = state.processes[held.process];
    tv_stats_flow_owner record{};
    record.sfo_nx_uuid = carrier.id;
    set_text(record.sfo_if_name, interface_name(carrier.kind, carrier.ordinal));
    record.sfo_bucket = held.id.bytes[0] % 128;
    set_text(record.sfo_proc_name, programs[owner.program].name);
    record.sfo_pid = owner.pid;
    record.sfo_nx_port = held.port;
    record.sfo_pid_bound = held.id.bytes[1] % 4 != 0;
    record.sfo_destroyed = held.state == channel::phase::defunct;
    file.put(record);
  }
}

}  // namespace lab
