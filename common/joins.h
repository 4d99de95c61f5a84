// What belongs together in a moment, though it lies in different tables.
//
// Records are found by what they have in common, at a cost that does not depend on how many there are. Of
// several that would fit, the first in its table is taken, as a search from the front would. Each table is
// indexed when it is first needed. What a missing, empty or cut table does not hold is not found.

#ifndef TARVELCTL_COMMON_JOINS_H
#define TARVELCTL_COMMON_JOINS_H

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "common/channel_snapshot.h"
#include "common/moment.h"
#include "common/tables/key_index.h"

// Things by a key that several of them may have, in the order in which they were added.
template <class Value>
class lists_by_key {
 public:
  void add(const index_key &key, const Value &value) {
    const auto at = static_cast<std::uint32_t>(links_.size());
    links_.push_back({value, key_index::none, at});
    if (first_.add(key, at)) return;
    std::uint32_t &last = links_[first_.find(key)].last;
    links_[last].next = at;
    last = at;
  }

  // Calls `visit` with each of them.
  template <class Visit>
  void for_each(const index_key &key, Visit visit) const {
    for (std::uint32_t at = first_.find(key); at != key_index::none; at = links_[at].next) {
      visit(links_[at].value);
    }
  }

  // The first of them; an empty one where there is none.
  Value first(const index_key &key) const {
    const std::uint32_t at = first_.find(key);
    return at == key_index::none ? Value{} : links_[at].value;
  }

  // Whether there is just one.
  bool is_single(const index_key &key) const {
    const std::uint32_t at = first_.find(key);
    return at != key_index::none && links_[at].next == key_index::none;
  }

 private:
  struct link {
    Value value;
    std::uint32_t next;
    std::uint32_t last;  // of the list that begins here
  };

  key_index first_;
  std::vector<link> links_;
};

class joins {
 public:
  // Bytes of regions.
  struct memory {
    std::uint64_t total = 0;
    std::uint64_t wired = 0;
  };

  // The moment must outlive this, and all that is found lies in its tables. Records that are not found are
  // empty.
  explicit joins(const moment &of) : moment_(of) {}

  // The nexus_provider_record that has this instance, its instances behind it, and its name, a text from
  // strangers; empty where there is none.
  record_bytes provider_of(const uuid &nexus);
  std::string_view provider_name_of(const uuid &nexus);

  // The interface of a nexus, as its counters say, those of an interface first; a text from strangers, empty
  // where there is none.
  std::string_view interface_of(const uuid &nexus);

  // The channel at the flow's port of its nexus, its rings behind it; no entry where there is none.
  channel_ref channel_of(const tv_stats_flow &flow);

  // The tv_stats_flow_owner of the flow's port of its nexus.
  record_bytes owner_of(const tv_stats_flow &flow);

  // The tv_stats_flow_adv_entry with the flow's index in the advisories of its nexus.
  record_bytes advisory_of(const tv_stats_flow &flow);

  // The tv_stats_flow_route of the flow's interface from its local to its remote address.
  record_bytes route_of(const tv_stats_flow &flow);

  // The tv_stats_arena of the flow's channel. Of the NEXUS arenas that name the flow's process, the one that
  // is called as the nexus's provider with ".port" and the port behind it. Where none is, as in redacted
  // captures, the only one, if the process has no channel but the flow's.
  record_bytes arena_of(const tv_stats_flow &flow);

  // Calls `visit` with what a process has, in the order of the tables: each tv_stats_flow, as its bytes, each
  // channel, as its ref, and each tv_stats_arena that names it among its users.
  template <class Visit>
  void for_each_flow_of(std::int32_t pid, Visit visit) {
    flows_by_pid().for_each(pid, visit);
  }
  template <class Visit>
  void for_each_channel_of(std::int32_t pid, Visit visit) {
    channels().by_pid.for_each(pid, visit);
  }
  template <class Visit>
  void for_each_arena_of(std::int32_t pid, Visit visit) {
    arenas().by_pid.for_each(pid, visit);
  }

  // The memory of all regions with segments in the arenas of a process, each region once, as it is where it
  // comes first. Others may use it, too.
  memory memory_of(std::int32_t pid);

 private:
  using records_by_key = lists_by_key<record_bytes>;
  struct channel_lists {
    lists_by_key<channel_ref> by_port, by_pid;
  };
  struct arena_lists {
    records_by_key by_pid;
    records_by_key nexus_by_pid, nexus_by_name;  // those of that type; by name and pid
  };

  record_bytes table(const table_description &which) const;
  template <class Record, class Visit>
  void walk(const table_description &which, Visit visit) const;

  std::uint32_t number_of(const index_key &part);
  index_key port_key(const uuid &nexus, std::uint32_t port);
  index_key name_key(std::string_view name, std::int32_t pid);
  index_key route_key(std::string_view interface, std::uint8_t family, const socket_address &local,
                      const socket_address &remote);
  template <class Value>
  Value at_port_of(const tv_stats_flow &flow, const lists_by_key<Value> &by_port);

  const records_by_key &providers();
  const records_by_key &interfaces();
  const records_by_key &owners();
  const records_by_key &advisories();
  const records_by_key &routes();
  const records_by_key &flows_by_pid();
  const channel_lists &channels();
  const arena_lists &arenas();

  const moment &moment_;
  key_index numbers_;  // of what makes a key too long
  std::uint32_t number_count_ = 0;
  std::optional<records_by_key> providers_, interfaces_, owners_, advisories_, routes_, flows_by_pid_;
  std::optional<channel_lists> channels_;
  std::optional<arena_lists> arenas_;
};

#endif
