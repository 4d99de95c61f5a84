#include "common/mib.h"

#include <algorithm>

#include "common/channel_snapshot.h"
#include "common/tables/flow.h"
#include "common/tables/provider.h"
#include "common/text/invariant.h"
#include "common/text/memory.h"
#include "common/text/output.h"

// A channel's record in the table, with its sort key.
struct channel_position {
  std::uint32_t port;
  const std::byte *at;
};

// A group of the channel table, as far as it has been read; of a nexus that the tree lacks, nothing.
struct channel_group {
  object_id nexus = no_object;
  std::uint32_t claimed_count = 0;
  std::vector<channel_position> channels{};
};

namespace {

// How the channels of a nexus are ordered: by the difference of their ports in 32 bits, below 0 where `a`
// comes first.
std::int32_t compare_channel_port(const channel_position &a, const channel_position &b) {
  return static_cast<std::int32_t>(a.port - b.port);
}

// Such a comparison runs in a circle, in which each port comes before the half that follows it, and so cannot
// sort by itself. Where all ports lie within one half of the circle, the first is the one behind the gap that
// their numbers show. Channels of one port keep the table's order.
void sort_by_port(std::vector<channel_position> &channels) {
  const auto by_port = [](const channel_position &a, const channel_position &b) { return a.port < b.port; };
  const auto gap = [](const channel_position &a, const channel_position &b) {
    return compare_channel_port(a, b) > 0;
  };
  std::stable_sort(channels.begin(), channels.end(), by_port);
  const auto before_gap = std::adjacent_find(channels.begin(), channels.end(), gap);
  if (before_gap != channels.end()) std::rotate(channels.begin(), before_gap + 1, channels.end());
}

}  // namespace

int object_tree::scrape_tree() {
  if (const int error = scrape_providers()) return error;
  scrape_channels();
  index_ports();
  scrape_flows();
  return 0;
}

int object_tree::scrape_providers() {
  if (const int error = providers_.fetch(provider_list_node)) return error;
  nodes_.push_back({.node = {.uuid = {}, .type = object_type::root}});
  make_findable(root);
  record_walk walk(providers_.bytes());
  nexus_provider_record record;
  std::span<const std::byte> instances;
  for (const std::byte *at = walk.position(); walk.take(record, instances); at = walk.position()) {
    const object_id provider =
        append_child(root, {.uuid = record.provider_uuid,
                            .type = object_type::nexus_provider,
                            .payload = at + offsetof(nexus_provider_record, parameters)});
    make_findable(provider);
    record_walk uuids(instances);
    for (uuid instance; uuids.take(instance);) {
      make_findable(append_child(provider, {.uuid = instance, .type = object_type::nexus}));
    }
  }
  if (!walk.at_end()) complain<"Buffer too short\n">();
  return 0;
}

void object_tree::scrape_channels() {
  if (channels_.fetch(channel_list_node) != 0) return;
  channel_group group;
  const bool is_whole = walk_channels(channels_.bytes(), [&](const channel_ref &ref) {
    if (ref.entry) {
      if (group.nexus != no_object) group.channels.push_back({ref.channel().port, ref.entry});
      return;
    }
    append_group(group);
    const nexus_channel_header header = ref.nexus();
    group = {find_object(header.nexus_uuid), header.channel_count, {}};
  });
  append_group(group);
  if (!is_whole) complain<"Buffer too short\n">();
}

// Hangs the channels of a group under its nexus, in place of all that the node had. Where the table ends
// inside the group, they are those before that, as they come.
void object_tree::append_group(channel_group &group) {
  if (group.nexus == no_object || group.claimed_count == 0) return;
  if (group.channels.size() == group.claimed_count) sort_by_port(group.channels);
  release_children(group.nexus);
  for (const channel_position &channel : group.channels) {
    uuid channel_uuid;
    std::memcpy(&channel_uuid, channel.at, sizeof channel_uuid);
    make_findable(append_child(group.nexus,
                               {.uuid = channel_uuid, .type = object_type::channel, .payload = channel.at}));
  }
}

void object_tree::index_ports() {
  for (object_id id = 0; id < nodes_.size(); ++id) {
    if (nodes_[id].released || nodes_[id].node.type != object_type::channel) continue;
    const object_node &channel = nodes_[id].node;
    by_port_.add({channel.parent, channel.record<channel_entry>().port}, id);
  }
}

int object_tree::scrape_flows() {
  if (const int error = flows_.fetch(flow_node)) return error;
  require(flows_.size() % sizeof(tv_stats_flow) == 0,
          {"scrape_flows", "common/mib", 223, "(length % sizeof (*sf)) == 0"});
  const new_failure attaching(end_without_growth);
  flow_keys_ = find_channels();
  sort_keys(flow_keys_);
  for (std::uint32_t i = 0; i < flow_keys_.size(); ++i) {
    object_node &channel = nodes_[number_of(flow_keys_[i])].node;
    if (channel.flow_count++ == 0) channel.first_flow = i;
  }
  return 0;
}

// The number of its channel for each flow that has one.
std::vector<sort_key> object_tree::find_channels() {
  const std::span<const std::byte> flows = flows_.bytes();
  const std::size_t count = flows.size() / sizeof(tv_stats_flow);
  std::vector<sort_key> found;
  found.reserve(count);
  for (std::size_t i = 0; i < count; ++i) {
    const object_id nexus =
        find_object(member_at<tv_stats_flow, uuid>(flows, i, offsetof(tv_stats_flow, sf_nx_uuid)));
    if (nexus == no_object) {
      complain<"orphan flow orphan nx_uuid">();
      continue;
    }
    const auto port = member_at<tv_stats_flow, std::uint32_t>(flows, i, offsetof(tv_stats_flow, sf_nx_port));
    const object_id channel = by_port_.find({nexus, port});
    if (channel != key_index::none) found.push_back(make_sort_key(channel, i));
  }
  return found;
}

// Adds a copy of `child` behind the children of `parent`. Siblings have ascending numbers.
object_id object_tree::append_child(object_id parent, const object_node &child) {
  const auto id = static_cast<object_id>(nodes_.size());
  const entry &over = nodes_[parent];
  const entry &far = nodes_[over.jump];
  const bool is_even = over.depth - far.depth == far.depth - nodes_[far.jump].depth;
  const object_id jump = is_even ? far.jump : parent;
  nodes_.push_back({.node = child, .depth = over.depth + 1, .jump = jump});
  nodes_[id].node.parent = parent;
  object_node &above = nodes_[parent].node;
  if (above.first_child != no_object) {
    nodes_[above.last_child].node.next_sibling = id;
  } else {
    above.first_child = id;
  }
  above.last_child = id;
  return id;
}

// Takes everything below a node out of the tree.
void object_tree::release_children(object_id top) {
  object_id id = nodes_[top].node.first_child;
  while (id != no_object) {
    nodes_[id].released = true;
    const object_node *node = &nodes_[id].node;
    if (node->first_child != no_object) {
      id = node->first_child;
      continue;
    }
    while (node->next_sibling == no_object && node->parent != top) node = &nodes_[node->parent].node;
    id = node->next_sibling;
  }
  nodes_[top].node.first_child = nodes_[top].node.last_child = no_object;
}

// Adds a node to those that a search may find. Nodes with the same UUID are rare: a table made by the kernel
// has none.
void object_tree::make_findable(object_id id) {
  const uuid &key = nodes_[id].node.uuid;
  if (by_uuid_.add(key, id)) return;
  const object_id first = by_uuid_.find(key);
  if (nodes_[first].rivals == no_rivals) {
    nodes_[first].rivals = static_cast<std::uint32_t>(rivals_.size());
    rivals_.emplace_back(in_pre_order{this}).insert(first);
  }
  rivals_[nodes_[first].rivals].insert(id);
}

object_id object_tree::find_object(const uuid &key) {
  const object_id first = by_uuid_.find(key);
  if (first == key_index::none) return no_object;
  if (nodes_[first].rivals == no_rivals) return nodes_[first].released ? no_object : first;
  rival_set &rivals = rivals_[nodes_[first].rivals];
  while (!rivals.empty() && nodes_[*rivals.begin()].released) rivals.erase(rivals.begin());
  return rivals.empty() ? no_object : *rivals.begin();
}

// Whether `a` comes before `b` in depth-first pre-order.
bool object_tree::precedes(object_id a, object_id b) const {
  const bool a_is_higher = nodes_[a].depth < nodes_[b].depth;
  const unsigned depth = std::min(nodes_[a].depth, nodes_[b].depth);
  a = ancestor_at(a, depth);
  b = ancestor_at(b, depth);
  if (a == b) return a_is_higher;
  while (nodes_[a].node.parent != nodes_[b].node.parent) {
    const bool is_too_far = nodes_[a].jump == nodes_[b].jump;
    a = is_too_far ? nodes_[a].node.parent : nodes_[a].jump;
    b = is_too_far ? nodes_[b].node.parent : nodes_[b].jump;
  }
  return a < b;
}

object_id object_tree::ancestor_at(object_id id, unsigned depth) const {
  while (nodes_[id].depth > depth) {
    const object_id jump = nodes_[id].jump;
    id = nodes_[jump].depth >= depth ? jump : nodes_[id].node.parent;
  }
  return id;
}
