// Walking any table by its description.

#ifndef TARVELCTL_COMMON_TABLES_TABLE_WALK_H
#define TARVELCTL_COMMON_TABLES_TABLE_WALK_H

#include <array>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/record_walk.h"

// A record where it lies in its table, with those of its followers that have no followers of their own.
struct found_record {
  const record_description *what;
  record_bytes bytes;
  std::array<record_bytes, most_followers> followers;  // by what->followers, each kind back to back
};

// Steps over a record and all that follows it. Calls `visit` with it, then with those behind it that have
// followers themselves. Returns false where the table ends before all of it: what is whole has been visited
// then, and the walk stands behind it.
template <class Visit>
bool walk_record(const record_description &what, record_walk &walk, Visit &visit) {
  found_record found{&what, {}, {}};
  record_walk ahead = walk;
  if (!ahead.take(what.size, found.bytes)) return false;
  for (std::size_t i = 0; i < what.followers.size(); ++i) {
    const follower &behind = what.followers[i];
    if (!behind.each->followers.empty()) continue;
    const auto count = static_cast<std::uint64_t>(behind.count.in(found.bytes));
    if (!ahead.take(count * behind.each->size, found.followers[i])) return false;
  }
  walk = ahead;
  visit(found);
  for (const follower &behind : what.followers) {
    if (behind.each->followers.empty()) continue;
    for (std::int64_t left = behind.count.in(found.bytes); left; --left) {
      if (!walk_record(*behind.each, walk, visit)) return false;
    }
  }
  return true;
}

// Walks a whole table of such records. What it claims to hold is neither believed nor allocated.
template <class Visit>
bool walk_table(const record_description &what, record_bytes table, Visit visit) {
  record_walk walk(table);
  while (!walk.at_end()) {
    if (!walk_record(what, walk, visit)) return false;
  }
  return true;
}

#endif
