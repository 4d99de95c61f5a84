// What a table holds, by its description: records of its own, those that follow them and those that lie in
// them, each kind with the fields that identify one of them and with its counters.

#ifndef TARVELCTL_COMMON_RECORD_KINDS_H
#define TARVELCTL_COMMON_RECORD_KINDS_H

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "common/tables/table_walk.h"
#include "common/tables/tables.h"

// One value of a record that only counts up.
struct counter_at {
  const row *field;
  std::uint16_t element;

  bool holds(record_bytes record) const { return !field->depends() || field->holds(record); }
  std::uint64_t in(record_bytes record) const {
    return static_cast<std::uint64_t>(field->at(element).in(record));
  }
};

struct record_kind {
  const record_description *what;
  std::string_view part;  // the follower or field that it is; empty for the table's own records
  std::size_t above;      // the kind that it follows or lies in; for the table's own the first: itself
  const row *field;       // that it lies in, or null
  std::size_t follower;   // which one of those of the kind above it is, where it does not lie in a field
  std::vector<const row *> keys;  // what decides about others comes first
  std::vector<counter_at> counters;
  std::vector<std::size_t> below;  // kinds

  bool has_above() const { return !part.empty(); }
};

// The kinds of a table, each behind the one above it. There are few, and they are cheap to find out.
class record_kinds {
 public:
  explicit record_kinds(const table_description &table) { add(*table.record, {}, 0, nullptr, 0); }

  std::size_t size() const { return kinds_.size(); }
  const record_kind &operator[](std::size_t kind) const { return kinds_[kind]; }

  // Walks a table. Calls `visit` with the kind of each record, its place in the field or among the followers
  // that it is one of, and its bytes; with each record before those that follow it or lie in it. Where there
  // are more followers than may be, they are none. Returns false where the table ends too early.
  template <class Visit>
  bool walk(record_bytes table, Visit visit) const {
    return walk_table(*kinds_[0].what, table, [&](const found_record &found) {
      std::size_t kind = 0;
      while (kinds_[kind].what != found.what) ++kind;
      visit_one(kind, 0, found, visit);
    });
  }

 private:
  std::size_t add(const record_description &what, std::string_view part, std::size_t above, const row *field,
                  std::size_t follower);

  template <class Visit>
  void visit_one(std::size_t kind, std::size_t place, const found_record &found, Visit &visit) const {
    visit(kind, place, found.bytes);
    for (const std::size_t below : kinds_[kind].below) visit_below(below, found, visit);
  }

  template <class Visit>
  void visit_below(std::size_t kind, const found_record &above, Visit &visit) const {
    const record_kind &each = kinds_[kind];
    record_bytes records;
    if (each.field) {
      records = above.bytes.subspan(each.field->offset, each.field->count_in(above.bytes) * each.what->size);
    } else {
      const follower &behind = above.what->followers[each.follower];
      if (behind.count.in(above.bytes) <= behind.most) records = above.followers[each.follower];
    }
    for (std::size_t place = 0; !records.empty(); ++place) {
      visit_one(kind, place, {each.what, records.first(each.what->size), {}}, visit);
      records = records.subspan(each.what->size);
    }
  }

  std::vector<record_kind> kinds_;
};

#endif
