// What is said of two damaged tables, judged by what must hold whatever they are.

#include "common/changes.h"

#include <cmath>
#include <set>
#include <string>

#include "tests/fuzz/fuzz.h"

#pragma clang attribute push([[clang::no_sanitize("coverage")]], apply_to = function)

namespace {

// What is surely equal in a record at both moments.
std::string fixed_part(const record_kind &kind, record_bytes record) {
  std::string text(kind.part);
  for (const row *each : kind.keys) {
    if (each->kind != field_kind::identifier) continue;
    text.append(reinterpret_cast<const char *>(record.data()) + each->offset, each->size);
  }
  return text;
}

void add(std::string &text, std::uint64_t number) {
  text.append(reinterpret_cast<const char *>(&number), sizeof number);
}

// Each record with its counters.
std::set<std::string> states_of(const table_reading &table, const record_kinds &kinds) {
  std::set<std::string> states;
  kinds.walk(table.bytes(), [&](std::size_t kind, std::size_t, record_bytes record) {
    std::string state = fixed_part(kinds[kind], record);
    for (const counter_at &each : kinds[kind].counters) add(state, each.in(record));
    states.insert(std::move(state));
  });
  return states;
}

// Whether there was a record with the counters that the differences lead back to.
bool was_there(const changed_record &each, const record_kinds &kinds, const std::set<std::string> &before) {
  std::size_t kind = 0;
  while (kinds[kind].what != each.what || kinds[kind].part != each.part) ++kind;
  std::string state = fixed_part(kinds[kind], each.bytes);
  for (const counter_change &counter : each.counters) {
    if (!counter.difference) return true;  // it held at one moment only
    add(state, counter.in(each.bytes) - *counter.difference);
  }
  return before.contains(state);
}

// Returns how many records are the same.
std::size_t judge(const moment &before, const moment &now) {
  const table_reading &table = now.tables[0];
  const record_kinds kinds(*table.what);
  const std::set<std::string> states = states_of(before.tables[0], kinds);
  const bool goes_on = table.monotonic > before.tables[0].monotonic;
  std::set<std::pair<const void *, const std::byte *>> seen;
  std::size_t same = 0, expected = 0;
  earlier_moment kept;
  kept.keep(before);
  kept.follow(now, [&](const changed_record &each) {
    for (const counter_change &counter : each.counters) {
      const auto rate = each.rate(counter);
      expect(each.became == fate::same || !counter.difference, "a difference of what is not the same", "");
      expect(counter.difference.value_or(0) < std::uint64_t{1} << 48, "a spike", "");
      expect(rate.has_value() == (counter.difference && goes_on), "a rate by another clock", "");
      expect(!rate || (std::isfinite(*rate) && *rate >= 0), "no rate", "");
    }
    expect(each.became != fate::same || was_there(each, kinds, states), "a difference from nothing", "");
    same += each.became == fate::same || each.became == fate::restarted;
    const bool is_first = each.became == fate::gone || seen.insert({each.what, each.bytes.data()}).second;
    expect(is_first, "visited twice", each.what->noun);
  });
  kinds.walk(table.bytes(), [&](std::size_t, std::size_t, record_bytes) { ++expected; });
  expect(seen.size() == expected, "not all are visited", table.what->node);
  expect(kept.size() <= 4096 + 8 * table.content.size(), "far more is kept than there is", "");
  return same;
}

}  // namespace

void judge_changes(const moment &before, const moment &now) {
  expect(judge(before, now) == judge(now, before), "other records are the same backwards", "");
}

#pragma clang attribute pop
