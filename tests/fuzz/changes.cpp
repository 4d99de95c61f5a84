// What is said of two damaged tables, judged by what must hold whatever they are.

#include "common/changes.h"

#include <cmath>
#include <set>
#include <string>

#include "tests/fuzz/fuzz.h"

#pragma clang attribute push([[clang::no_sanitize("coverage")]], apply_to = function)

namespace {

template <class Visit>
void for_each_record(const record_description &what, record_bytes records, Visit &visit) {
  for (; !records.empty(); records = records.subspan(what.size)) {
    visit(what, records.first(what.size));
    for (const row &each : what.rows) {
      if (!each.nested) continue;
      for_each_record(*each.nested, records.subspan(each.offset, std::size_t{each.size} * each.count), visit);
    }
  }
}

template <class Visit>
void for_each_record(const table_reading &table, Visit visit) {
  walk_table(*table.what->record, table.bytes(), [&](const found_record &found) {
    for_each_record(*found.what, found.bytes, visit);
    for (std::size_t i = 0; i < found.what->followers.size(); ++i) {
      const follower &behind = found.what->followers[i];
      if (behind.count.in(found.bytes) > behind.most) continue;
      for_each_record(*behind.each, found.followers[i], visit);
    }
  });
}

void add(std::string &text, std::uint64_t number) {
  text.append(reinterpret_cast<const char *>(&number), sizeof number);
}

// What is surely equal in a record at both moments.
std::string fixed_part(const record_description &what, record_bytes record) {
  std::string text(what.name);
  for (const row &each : what.rows) {
    if (each.kind != field_kind::identifier) continue;
    text.append(reinterpret_cast<const char *>(record.data()) + each.offset, each.size);
  }
  return text;
}

// Each record with its counters.
std::set<std::string> states_of(const table_reading &table) {
  std::set<std::string> states;
  for_each_record(table, [&](const record_description &what, record_bytes record) {
    std::string state = fixed_part(what, record);
    for (const row &each : what.rows) {
      for (std::size_t i = 0; each.kind == field_kind::counter && i < each.count; ++i) {
        if (each.level != i) add(state, static_cast<std::uint64_t>(each.at(i).in(record)));
      }
    }
    states.insert(std::move(state));
  });
  return states;
}

void judge_rates(const changed_record &each) {
  for (const counter_change &counter : each.counters) {
    const auto rate = each.rate(counter);
    expect(each.became == fate::same || !counter.difference, "a difference of what is not the same", "");
    expect(counter.difference.value_or(0) < std::uint64_t{1} << 48, "a spike", "");
    expect(rate.has_value() == (counter.difference && each.seconds > 0), "a rate without a time", "");
    expect(!rate || (std::isfinite(*rate) && *rate >= 0), "no rate", "");
  }
}

// Whether there was a record with the counters that the differences lead back to.
bool was_there(const changed_record &each, const std::set<std::string> &before) {
  std::string state = fixed_part(*each.what, each.bytes);
  for (const counter_change &counter : each.counters) {
    if (!counter.difference) return true;  // it held at one moment only
    add(state, counter.in(each.bytes) - *counter.difference);
  }
  return before.contains(state);
}

// Returns how many records are the same.
std::size_t judge(earlier_moment &kept, const table_reading &before, const moment &now) {
  const std::set<std::string> states = states_of(before);
  const table_reading &table = now.tables[0];
  std::set<std::pair<std::string_view, const std::byte *>> seen;
  std::size_t same = 0, expected = 0;
  kept.follow(now, [&](const changed_record &each) {
    judge_rates(each);
    expect(each.seconds > 0 == table.monotonic > before.monotonic, "a time by another clock", "");
    expect(each.became != fate::same || was_there(each, states), "a difference from nothing",
           each.what->noun);
    same += each.became == fate::same || each.became == fate::restarted;
    if (each.became == fate::gone) return;
    expect(seen.insert({each.what->noun, each.bytes.data()}).second, "visited twice", each.what->noun);
  });
  for_each_record(table, [&](const record_description &, record_bytes) { ++expected; });
  expect(seen.size() == expected, "not all are visited", table.what->node);
  return same;
}

}  // namespace

void judge_changes(const moment &before, const moment &now) {
  earlier_moment kept, reverse;
  kept.keep(before);
  reverse.keep(now);
  const std::size_t same = judge(kept, before.tables[0], now);
  expect(same == judge(reverse, now.tables[0], before), "other records are the same backwards", "");
  expect(kept.size() <= 4096 + 8 * now.tables[0].content.size(), "far more is kept than there is", "");
  kept.follow(now, [](const changed_record &each) {
    const bool is_known = each.became == fate::same || each.became == fate::ambiguous;
    expect(is_known, "changed without a change", each.what->noun);
    for (const counter_change &counter : each.counters) {
      expect(counter.difference.value_or(0) == 0, "counted without a change", each.what->noun);
    }
  });
}

#pragma clang attribute pop
