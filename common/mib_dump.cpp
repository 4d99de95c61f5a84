// The object tree as nested JSON objects, a member a line. Texts are printed as they are, without escapes.

#include <arpa/inet.h>

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <iterator>

#include "common/mib.h"
#include "common/names/process_names.h"
#include "common/tables/channel.h"
#include "common/tables/flow.h"
#include "common/tables/provider.h"
#include "common/text/output.h"

namespace {

using indent_text = format::small_text<32>;

// Three blanks a level, down to level 7; what lies deeper is indented as that.
indent_text indent_of(unsigned level) {
  indent_text blanks;
  blanks.size = 3 * std::min(level, 7U);
  std::memset(blanks.chars, ' ', sizeof blanks.chars);
  return blanks;
}

void print_provider_payload(const object_node &node, const indent_text &indent, process_names & /*owners*/) {
  const auto p = node.record<nexus_provider_parameters>();
  print<"%s\"name\":\"%s\",\n">(indent, p.shown_name());
  print<"%s\"provider_type\":\"%s\",\n">(indent, provider_type_name(p.type, p.subtype));
  print<"%s\"flags\":%d,\n">(indent, p.flags);
  print<"%s\"anonymous\":%s,\n">(indent, p.flags & p.anonymous ? "true" : "false");
  print<"%s\"format\":%d,\n">(indent, p.format);
  print<"%s\"tx_rings\":%d,\n">(indent, p.tx_rings);
  print<"%s\"rx_rings\":%d,\n">(indent, p.rx_rings);
  print<"%s\"tx_slots\":%d,\n">(indent, p.tx_slots);
  print<"%s\"rx_slots\":%d,\n">(indent, p.rx_slots);
  print<"%s\"buf_size\":%d,\n">(indent, p.buf_size);
  print<"%s\"meta_size\":%d,\n">(indent, p.meta_size);
  print<"%s\"pipes\":%d,\n">(indent, p.pipes);
  print<"%s\"mhints\":%d,\n">(indent, p.mhints);
  print<"%s\"ifindex\":%d,\n">(indent, p.ifindex);
}

void print_channel_payload(const object_node &node, const indent_text &indent, process_names &owners) {
  const auto channel = node.record<channel_entry>();
  print<"%s\"flags\":%d,\n">(indent, static_cast<int>(channel.flags));
  print<"%s\"pid\":%d,\n">(indent, channel.pid);
  print<"%s\"proc_name\":\"%s\",\n">(indent, owners.of(channel.pid));
  print<"%s\"fd\":%d,\n">(indent, channel.fd);
  print<"%s\"port\":%d,\n">(indent, static_cast<int>(channel.port));
  print<"%s\"n_tx_rings\":%d,\n">(indent, static_cast<int>(channel.n_tx_rings));
  print<"%s\"n_rx_rings\":%d,\n">(indent, static_cast<int>(channel.n_rx_rings));
}

void print_flow_payload(const tv_stats_flow &flow, const indent_text &indent) {
  const tv_flow_endpoint_stats &in = flow.sf_rstats;
  const tv_flow_endpoint_stats &out = flow.sf_lstats;
  flow.visit_addresses([&](const auto &local, const auto &remote) {
    print<"%s\"local_addr\":\"%s\",\n">(indent, local);
    print<"%s\"local_port\":%d,\n">(indent, static_cast<int>(ntohs(flow.sf_local.port)));
    print<"%s\"remote_addr\":\"%s\",\n">(indent, remote);
    print<"%s\"remote_port\":%d,\n">(indent, static_cast<int>(ntohs(flow.sf_remote.port)));
  });
  print<"%s\"protocol\":\"%s\",\n">(indent, proto_name(flow.sf_protocol));
  print<"%s\"in_bytes\":%llu,\n">(indent, in.bytes);
  print<"%s\"out_bytes\":%llu,\n">(indent, out.bytes);
  print<"%s\"in_packets\":%llu,\n">(indent, in.packets);
  print<"%s\"out_packets\":%llu,\n">(indent, out.packets);
  print<"%s\"interface\":\"%s\",\n">(indent, flow.sf_if_name);
  print<"%s\"flags\":\"%s\",\n">(indent, flow_flags_text(flow.sf_flags));
  print<"%s\"local_state\":\"%s\",\n">(indent, flow_state_name(out.state));
  print<"%s\"remote_state\":\"%s\",\n">(indent, flow_state_name(in.state));
  print<"%s\"process\":\"%s\",\n">(indent, flow.sf_proc_name);
  print<"%s\"pid\":%d,\n">(indent, flow.sf_pid);
}

// What the nodes of a type differ in.
struct node_ops {
  object_type type;
  format::name_text name;
  void (*print_payload)(const object_node &node, const indent_text &indent, process_names &owners);
};

// By type. Flows, which are no nodes, have a payload of their own.
constexpr node_ops types[] = {
    {object_type::root, "root", nullptr},
    {object_type::nexus_provider, "nexus_provider", print_provider_payload},
    {object_type::nexus, "nexus", nullptr},
    {object_type::channel, "channel", print_channel_payload},
    {object_type::flow, "flow", nullptr},
};

static_assert(std::ranges::all_of(types, [](const node_ops &row) {
  return static_cast<std::ptrdiff_t>(row.type) == &row - types;
}));

// An object up to its children.
template <class Uuid, class Payload>
void open_object(const Uuid &uuid, object_type type, const indent_text &indent, bool has_children,
                 Payload print_payload) {
  print<"%s{\n%s\"uuid\":\"%s\",\n%s\"type\":\"%s\",\n">(indent, indent, uuid, indent,
                                                         types[static_cast<std::size_t>(type)].name);
  print_payload();
  if (has_children) {
    print<"%s\"children\": [\n">(indent);
  } else {
    print<"%s\"children\": []\n">(indent);
  }
}

void close_object(const indent_text &indent, bool has_children) {
  if (has_children) {
    print<" \n">();
    print<"%s]\n">(indent);
  }
  print<"%s}">(indent);
}

void open_node(const object_node &node, const indent_text &indent, process_names &owners) {
  open_object(node.uuid, node.type, indent, node.has_children(), [&] {
    const node_ops &ops = types[static_cast<std::size_t>(node.type)];
    if (ops.print_payload) ops.print_payload(node, indent, owners);
  });
}

void print_flow(const tv_stats_flow &flow, const indent_text &indent) {
  static constexpr format::small_text<40> no_uuid = "00000000-0000-0000-0000-000000000000";
  open_object(no_uuid, object_type::flow, indent, false, [&] { print_flow_payload(flow, indent); });
  close_object(indent, false);
}

}  // namespace

const format::name_text &object_type_name(object_type type) {
  static constexpr format::name_text unknown = "???";
  const auto index = static_cast<std::size_t>(type);
  return index < std::size(types) ? types[index].name : unknown;
}

// Everything of a node behind the children that are nodes: its flows, and what closes it.
void object_tree::dump_end(const object_node &node, unsigned level) const {
  const indent_text inner = indent_of(level + 1);
  bool is_first = node.first_child == no_object;
  for_each_flow(node, [&](const tv_stats_flow &flow) {
    if (!is_first) print<",\n">();
    is_first = false;
    print_flow(flow, inner);
  });
  close_object(indent_of(level), node.has_children());
}

void object_tree::dump_object(object_id top) const {
  process_names owners(false);
  object_id id = top;
  unsigned level = 0;
  for (;;) {
    open_node((*this)[id], indent_of(level), owners);
    if ((*this)[id].first_child != no_object) {
      id = (*this)[id].first_child;
      ++level;
      continue;
    }
    dump_end((*this)[id], level);
    while (id != top && (*this)[id].next_sibling == no_object) {
      id = (*this)[id].parent;
      dump_end((*this)[id], --level);
    }
    if (id == top) return;
    print<",\n">();
    id = (*this)[id].next_sibling;
  }
}
