// kern.tarvel.stats.flow

#include "common/tables/flow.h"

#include "lab/tables.h"
#include "lab/world_parts.h"

namespace lab {

namespace {

constexpr std::uint32_t tracked = flow_flag_names.bit("t");
constexpr std::uint32_t connected = flow_flag_names.bit("c");
constexpr std::uint32_t listener = flow_flag_names.bit("l");
constexpr std::uint32_t marked = flow_flag_names.bit("q");  // its packets carry their service class
constexpr std::uint32_t waits_for_close = flow_flag_names.bit("w");
constexpr std::uint32_t tells_close = flow_flag_names.bit("e");

std::uint32_t flags_of(const flow &source) {
  std::uint32_t flags = 0;
  if (source.use->service_class != service_classes.number("BE")) flags |= marked;
  if (source.route == none) return flags | listener;
  flags |= connected;
  if (source.use->protocol != tcp_protocol) return flags;
  flags |= tracked;
  if (source.state == tcp::time_wait || source.state == tcp::closed) return flags | waits_for_close;
  return source.state > tcp::established ? flags | tells_close : flags;
}

tv_flow_endpoint_stats end_of(const traffic &moved, std::uint32_t end_state, std::uint32_t rtt) {
  return {.bytes = moved.bytes, .packets = moved.packets, .state = end_state, .rtt = rtt};
}

}  // namespace

void write_flows(const world &state, table_file &file) {
  for (const flow &source : state.flows) {
    const channel &user = state.channels[source.channel];
    const nexus &carrier = state.nexuses[user.nexus];
    const process &owner = state.processes[user.process];
    tv_stats_flow record{};
    record.sf_nx_uuid = carrier.id;
    set_text(record.sf_if_name, interface_name(carrier.kind, carrier.ordinal));
    record.sf_bucket = source.id.bytes[0] % 16 ? source.id.bytes[1] : no_index;
    set_text(record.sf_proc_name, programs[owner.program].name);
    record.sf_pid = owner.pid;
    record.sf_flags = flags_of(source);
    record.sf_nx_port = user.port;
    if (source.route == none) {
      record.sf_local = record.sf_remote = any_address(source.ipv6);
    } else {
      const route &way = state.routes[source.route];
      record.sf_local = interface_address(state.seed, carrier.ordinal, way.kind);
      record.sf_remote = way.remote;
    }
    set_port(record.sf_local, source.local_port);
    set_port(record.sf_remote, source.remote_port);
    record.sf_protocol = source.use->protocol;
    record.sf_svc = source.use->service_class;
    record.sf_adv_idx = source.advisory;
    const two_way<std::uint32_t> ends = states_of(source);
    record.sf_lstats = end_of(source.moved.out, ends.out, source.rtt);
    record.sf_rstats = end_of(source.moved.in, ends.in, source.rtt - source.rtt / 16);
    file.put(record);
  }
}

}  // namespace lab
