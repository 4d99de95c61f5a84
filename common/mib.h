// The kernel's objects as one tree: providers, their nexus instances, the channels of each and the flows that
// use the channels' ports.

#ifndef TARVELCTL_COMMON_MIB_H
#define TARVELCTL_COMMON_MIB_H

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <set>
#include <vector>

#include "common/tables/flow.h"
#include "common/tables/kernel_table.h"
#include "common/tables/key_index.h"
#include "common/tables/record_walk.h"
#include "common/tables/sort_key.h"

// What an object is, and what the payload of its node is.
enum class object_type : std::uint32_t {
  root,            // the single root, with the null UUID; no payload
  nexus_provider,  // nexus_provider_parameters
  nexus,           // no payload
  channel,         // channel_entry, its ring blocks behind it
  flow,            // has no node of its own; shown with the null UUID
};

// "root", "nexus_provider", ..., or "???" for a value that is none.
const format::name_text &object_type_name(object_type type);

// A node, known by its number. Numbers are good as long as the tree.
using object_id = std::uint32_t;
inline constexpr object_id no_object = UINT32_MAX;

struct object_node {
  ::uuid uuid;
  object_type type;
  object_id parent = no_object;
  object_id first_child = no_object;
  object_id last_child = no_object;
  object_id next_sibling = no_object;
  std::uint32_t first_flow = 0;  // for object_tree::for_each_flow()
  std::uint32_t flow_count = 0;
  const std::byte *payload = nullptr;  // in the table that it came from

  bool has_children() const { return first_child != no_object || flow_count != 0; }

  // The payload's record, or its fixed part.
  template <class Record>
  Record record() const {
    Record value;
    std::memcpy(&value, payload, sizeof value);
    return value;
  }
};

struct channel_group;

// The tree, as three snapshots taken one after the other give it. It owns the three tables, whose records it
// points at. However deep a table makes the tree, walking and releasing it takes no more stack.
//
// Flows are by far the most objects, and have neither a UUID of their own nor children: they are no nodes,
// but the last children of the node that they belong to.
class object_tree {
 public:
  static constexpr object_id root = 0;

  object_tree() = default;
  object_tree(const object_tree &) = delete;  // its sets refer to it
  object_tree &operator=(const object_tree &) = delete;

  // Builds the tree. Returns 0, or the error of the fetch when the provider table cannot be read; there is no
  // tree then. What is wrong with the other tables is reported on standard error, and the tree has what could
  // be read.
  int scrape_tree();

  const object_node &operator[](object_id id) const { return nodes_[id].node; }

  // Calls `visit` with each flow of a node, in the order of the table.
  template <class Visit>
  void for_each_flow(const object_node &node, Visit visit) const {
    constexpr std::size_t ahead = 16;  // the flows of a channel lie all over their table
    const std::size_t end = std::size_t{node.first_flow} + node.flow_count;
    for (std::size_t i = node.first_flow; i < end; ++i) {
      if (i + ahead < flow_keys_.size()) {
        prefetch_record<tv_stats_flow>(flows_.bytes(), position_of(flow_keys_[i + ahead]));
      }
      visit(record_at<tv_stats_flow>(flows_.bytes(), position_of(flow_keys_[i])));
    }
  }

  // The first node with this UUID in depth-first pre-order, or no_object. The cost does not depend on the
  // size of the tree; where many nodes have one UUID it grows with the logarithm of their number.
  object_id find_object(const uuid &key);

  // Prints a node and all below it as nested JSON objects, without a line end behind the last brace.
  void dump_object(object_id top) const;

 private:
  // A node and what the search needs.
  struct entry {
    object_node node;
    unsigned depth = 0;
    object_id jump = root;  // an ancestor, near or far, so that any ancestor is few steps away
    std::uint32_t rivals = no_rivals;
    bool released = false;
  };

  // Orders nodes as a depth-first walk meets them. What was taken out of the tree keeps its place in the
  // order.
  struct in_pre_order {
    const object_tree *tree;
    bool operator()(object_id a, object_id b) const { return tree->precedes(a, b); }
  };
  using rival_set = std::set<object_id, in_pre_order>;
  static constexpr std::uint32_t no_rivals = UINT32_MAX;

  int scrape_providers();
  void scrape_channels();
  void append_group(channel_group &group);
  void index_ports();
  int scrape_flows();
  std::vector<sort_key> find_channels();
  void dump_end(const object_node &node, unsigned level) const;

  object_id append_child(object_id parent, const object_node &child);
  void release_children(object_id top);
  void make_findable(object_id id);
  bool precedes(object_id a, object_id b) const;
  object_id ancestor_at(object_id id, unsigned depth) const;

  kernel_table providers_, channels_, flows_;
  std::vector<entry> nodes_;
  std::vector<sort_key> flow_keys_;  // what hangs in the tree: positions in flows_, by node
  key_index by_uuid_;                // the node that came first with a UUID
  std::vector<rival_set> rivals_;    // all nodes with one UUID, where there are several
  key_index by_port_;                // channels, by the number of their parent and their port
};

#endif
