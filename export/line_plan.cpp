#include "export/line_plan.h"

#include <cstring>
#include <utility>

#include "export/json_text.h"

namespace exporter {

record_plan::record_plan(const std::vector<key> &keys, std::string_view opening, std::string_view closing,
                         process_texts &processes)
    : processes_(processes), pending_(opening) {
  compile(keys);
  closing_.swap(pending_);
  closing_ += closing;
  literals_.append(format::slack, '\0');
}

void record_plan::compile(const std::vector<key> &keys) {
  const char *comma = "";
  for (const key &each : keys) {
    pending_ += std::exchange(comma, ",");
    if (!each.name.empty()) pending_ += quoted(each.name) + ":";
    if (each.members.empty()) {
      value_step &made = steps_.emplace_back(step_of(each, processes_));
      made.literal = literals_.size();
      made.literal_size = pending_.size();
      most_ += pending_.size() + made.most;
      literals_ += pending_;
      pending_.clear();
    } else if (each.is_array) {
      const bool is_object = !each.members[0].name.empty();
      record_plan element(each.members, is_object ? "{" : "", is_object ? "}" : "", processes_);
      list &made = lists_.emplace_back();
      made.of = &each;
      made.each.push_back(std::move(element));
      pending_ += '[';
      made.opening.swap(pending_);
      pending_ = ']';
    } else {
      pending_ += "{";
      compile(each.members);
      pending_ += "}";
    }
  }
}

char *record_plan::put_values(char *to, record_bytes record) const {
  constexpr std::size_t usual = 32;
  static_assert(usual <= format::slack);
  const char *const literals = literals_.data();
  for (const value_step &each : steps_) {
    std::memcpy(to, literals + each.literal, usual);  // a constant size needs no call
    if (each.literal_size > usual) std::memcpy(to, literals + each.literal, each.literal_size);
    to += each.literal_size;
    const std::byte *const at = record.data() + each.offset;
    to = each.is_none && each.is_none(each, at) ? put_plain(to, "null") : each.put(to, each, at);
  }
  return to;
}

void record_plan::put_list(output &to, const list &which, record_bytes record,
                           std::span<const record_bytes> followers) const {
  to.commit(put_plain(to.room(which.opening.size()), which.opening), false);
  const key &of = *which.of;
  record_bytes rest = of.behind < followers.size()
                          ? followers[of.behind]
                          : record.subspan(of.field->offset, std::size_t{of.field->size} * of.field->count);
  std::string_view comma;
  for (; !rest.empty(); rest = rest.subspan(of.each->size)) {
    if (of.counts_if && !of.counts_if->holds(rest)) continue;
    which.each[0].put(to, std::exchange(comma, ","), rest, {}, false);
  }
}

void record_plan::put(output &to, std::string_view head, record_bytes record,
                      std::span<const record_bytes> followers, bool ends_line) const {
  char *end = put_values(put_plain(to.room(head.size() + most_ + closing_.size()), head), record);
  if (!lists_.empty()) {
    to.commit(end, false);
    for (const list &each : lists_) put_list(to, each, record, followers);
    end = to.room(closing_.size());
  }
  to.commit(put_plain(end, closing_), ends_line);
}

std::string record_plan::text(record_bytes record) const {
  std::string made(most_ + closing_.size() + format::slack, '\0');
  char *const end = put_plain(put_values(made.data(), record), closing_);
  made.resize(static_cast<std::size_t>(end - made.data()));
  return made;
}

}  // namespace exporter
