#include "common/record_kinds.h"

namespace {

void add_field(record_kind &made, const row &field) {
  if (field.is_key()) made.keys.push_back(&field);
  if (field.kind != field_kind::counter) return;
  for (std::uint16_t i = 0; i < field.count; ++i) {
    if (field.level != i) made.counters.push_back({&field, i});
  }
}

}  // namespace

std::size_t record_kinds::add(const record_description &what, std::string_view part, std::size_t above,
                              const row *field, std::size_t follower) {
  const std::size_t kind = kinds_.size();
  record_kind made{&what, part, above, field, follower, {}, {}, {}};
  for (const row &each : what.rows) add_field(made, each);
  std::stable_partition(made.keys.begin(), made.keys.end(), [](const row *each) { return !each->depends(); });
  kinds_.push_back(std::move(made));
  const auto add_below = [&](const record_description &each, std::string_view name, const row *in,
                             std::size_t place) {
    const std::size_t below = add(each, name, kind, in, place);
    kinds_[kind].below.push_back(below);
  };
  for (const row &each : what.rows) {
    if (each.nested) add_below(*each.nested, each.name, &each, 0);
  }
  for (std::size_t i = 0; i < what.followers.size(); ++i) {
    add_below(*what.followers[i].each, what.followers[i].name, nullptr, i);
  }
  return kind;
}
