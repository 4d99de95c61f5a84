#include "common/changes.h"

#include <algorithm>
#include <utility>

namespace {

// A counter goes on by less than this between two moments.
constexpr std::uint64_t most_progress = std::uint64_t{1} << 48;

// Of a clock that may stand still or go back.
double seconds_between(std::int64_t before, std::int64_t now) {
  constexpr double nanosecond = 1e-9;
  if (now <= before) return 0;
  return static_cast<double>(static_cast<std::uint64_t>(now) - static_cast<std::uint64_t>(before)) *
         nanosecond;
}

}  // namespace

// One table at two moments.
class table_comparison {
 public:
  using kept_table = earlier_moment::kept_table;

  table_comparison(const record_kinds &kinds, kept_table *before, const kept_table &now,
                   earlier_moment::visitor visitor, void *to)
      : kinds_(kinds), before_(before), now_(now), visitor_(visitor), to_(to), each_(kinds.size()) {
    for (std::size_t kind = 0; kind < kinds.size(); ++kind) {
      const record_kind &of = kinds[kind];
      for (const counter_at &counter : of.counters) each_[kind].counters.push_back({counter, {}});
      changed_record &record = each_[kind].record;
      record = {.what = of.what, .part = of.part, .counters = each_[kind].counters};
      if (of.has_above()) record.above = &each_[of.above].record;
      if (before) record.seconds = seconds_between(before->monotonic, now.monotonic);
    }
  }

  void visit(record_bytes table) {
    kinds_.walk(table, [&](std::size_t kind, std::size_t place, record_bytes record) {
      changed_record &changed = each_[kind].record;
      changed.bytes = record;
      changed.place = place;
      for (counter_change &each : each_[kind].counters) each.difference.reset();
      changed.became = compare(kind);
      visitor_(to_, changed);
    });
    if (before_ && now_.is_whole) visit_gone();
  }

 private:
  struct current {
    changed_record record;
    std::vector<counter_change> counters;
    std::vector<std::byte> bytes;  // of what is put back
  };

  fate compare(std::size_t kind) {
    const kept_record own = now_.records.at(own_at_);
    own_at_ = own.next;
    if (!before_) return fate::unknown;
    const std::size_t at = before_->records.find(own.key, likely_);
    if (at == kept_records::none) {
      if (own.is_ambiguous) return fate::ambiguous;
      return before_->is_whole ? fate::appeared : fate::unknown;
    }
    const kept_record found = before_->records.at(at);
    before_->records.mark(at);
    likely_ = found.next;
    if (own.is_ambiguous || found.is_ambiguous) return fate::ambiguous;
    return subtract(kind, found.counters, own.counters) ? fate::same : fate::restarted;
  }

  // False, and no difference, where a counter has restarted.
  bool subtract(std::size_t kind, kept_counters before, kept_counters now) {
    for (counter_change &each : each_[kind].counters) {
      const std::optional<std::uint64_t> from = before.take(each);
      const std::optional<std::uint64_t> to = now.take(each);
      if (!from || !to) continue;
      each.difference = *to - *from;
      if (*each.difference < most_progress) continue;
      for (counter_change &other : each_[kind].counters) other.difference.reset();
      return false;
    }
    return true;
  }

  void visit_gone() {
    kept_records &records = before_->records;
    for (std::size_t at = 0; at < records.end();) {
      const kept_record kept = records.at(at);
      at = kept.next;
      const bool is_gone = !is_there(kept);
      if (!is_gone && kinds_[kept.kind].below.empty()) continue;
      current &each = each_[kept.kind];
      each.bytes.resize(kinds_[kept.kind].what->size);
      each.record.place = put_back(kinds_[kept.kind], kept, each.bytes);
      each.record.bytes = each.bytes;
      each.record.became = is_gone ? fate::gone : fate::same;
      for (counter_change &counter : each.counters) counter.difference.reset();
      if (is_gone) visitor_(to_, each.record);
    }
  }

  // Of several with one key, the first is marked for all.
  bool is_there(const kept_record &kept) const {
    if (kept.is_marked || !kept.is_ambiguous) return kept.is_marked;
    return before_->records.at(before_->records.find(kept.key, before_->records.end())).is_marked;
  }

  const record_kinds &kinds_;
  kept_table *before_;
  const kept_table &now_;
  earlier_moment::visitor visitor_;
  void *to_;
  std::vector<current> each_;  // by kind
  std::size_t own_at_ = 0;
  std::size_t likely_ = 0;  // where the next record was before, if the order is still the same
};

void earlier_moment::follow(const moment &now, visitor visit, void *to) {
  for (const table_reading &reading : now.tables) {
    if (reading.error) continue;
    const record_kinds kinds(*reading.what);
    kept_table kept{reading.what, reading.monotonic, false, {}};
    kept.is_whole = kept.records.keep(kinds, reading.bytes());
    const auto before = std::ranges::find(tables_, reading.what, &kept_table::what);
    const bool is_known = before != tables_.end();
    if (visit) table_comparison(kinds, is_known ? &*before : nullptr, kept, visit, to).visit(reading.bytes());
    if (is_known) {
      *before = std::move(kept);
    } else {
      tables_.push_back(std::move(kept));
    }
  }
}

std::size_t earlier_moment::size() const {
  std::size_t size = 0;
  for (const kept_table &each : tables_) size += each.records.size();
  return size;
}
