// show and channel-stats: the ports of every multistack flow switch, with their owners and flows.

#include <arpa/inet.h>

#include "common/mib.h"
#include "common/names/process_names.h"
#include "common/tables/channel.h"
#include "common/tables/flow.h"
#include "common/tables/provider.h"
#include "common/text/invariant.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

namespace {

// The first port of a client; those before it belong to the host and the device.
constexpr std::uint32_t first_client_port = 2;

// Calls `visit` with each child of a type.
template <class Visit>
void for_each_child(const object_tree &tree, const object_node &node, object_type type, Visit visit) {
  for (object_id id = node.first_child; id != no_object; id = tree[id].next_sibling) {
    if (tree[id].type == type) visit(tree[id]);
  }
}

void print_ends(const tv_stats_flow &flow) {
  const bool has_family = flow.visit_addresses([&](const auto &local, const auto &remote) {
    print<"\t\t %s.%d <-> %s.%d\n">(local, static_cast<int>(ntohs(flow.sf_local.port)), remote,
                                    static_cast<int>(ntohs(flow.sf_remote.port)));
  });
  require(has_family, {"cmd_show", "tarvelctl/tarvelctl", 2030, "0"});
}

void print_port(const object_tree &tree, const object_node &node, process_names &owners) {
  const auto channel = node.record<channel_entry>();
  if (channel.port < first_client_port) return;
  const char *status = channel.flags & channel.defunct ? highlight("defunct", colour::red) : "";
  print<"\tPort[%2u] %-22s%s\n">(channel.port, owners.of(channel.pid), status);
  tree.for_each_flow(node, print_ends);
}

void print_flow_switches(const object_tree &tree, const object_node &provider, process_names &owners) {
  const auto parameters = provider.record<nexus_provider_parameters>();
  if (parameters.subtype != flow_switch_subtypes.number("multistack")) return;
  for_each_child(tree, provider, object_type::nexus, [&](const object_node &nexus) {
    print<"flow-switch %s %s\n">(nexus.uuid, parameters.name);
    for_each_child(tree, nexus, object_type::channel,
                   [&](const object_node &channel) { print_port(tree, channel, owners); });
  });
}

}  // namespace

int cmd_show(int /*argc*/, char ** /*argv*/) {
  object_tree tree;
  if (tree.scrape_tree() != 0) return 0;
  process_names owners(true);
  for_each_child(tree, tree[object_tree::root], object_type::nexus_provider,
                 [&](const object_node &provider) { print_flow_switches(tree, provider, owners); });
  return 0;
}
