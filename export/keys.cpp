#include "export/keys.h"

#include <algorithm>
#include <iterator>

#include "export/special.h"

namespace exporter {

namespace {

constexpr value_form form_of_kind[] = {
    value_form::object,       // unread
    value_form::integer,      // identifier, unless it is a UUID
    value_form::integer,      // number
    value_form::integer,      // gauge
    value_form::integer,      // counter
    value_form::flags,        // flags
    value_form::enumeration,  // enumeration
    value_form::boolean,      // boolean
    value_form::integer,      // pid
    value_form::text,         // process
    value_form::text,         // interface
    value_form::text,         // name
    value_form::address,      // address
    value_form::mac,          // mac
    value_form::object,       // nested
};
static_assert(std::size(form_of_kind) == static_cast<std::size_t>(field_kind::nested) + 1);

value_form form_of(const row &field) {
  if (field.type == field_type::uuid) return value_form::uuid;
  return is_single_flag(field) ? value_form::boolean : form_of_kind[static_cast<std::size_t>(field.kind)];
}

// Whether two conditions ask the same.
bool is_same(const field_condition &a, const field_condition &b) {
  return a.at.offset == b.at.offset && a.mask == b.mask && a.among == b.among &&
         a.is_inverted == b.is_inverted;
}

// On what the records of an array in place say anything: what their fields depend on.
const field_condition *condition_of(const record_description &what) {
  const auto found =
      std::ranges::find_if(what.rows, [](const row &each) { return each.condition.mask != 0; });
  return found == what.rows.end() ? nullptr : &found->condition;
}

// Whether the field is there only for another one: how long that is, or of which family.
bool serves_another(const record_description &what, const row &field) {
  return std::ranges::any_of(what.rows, [&](const row &each) {
    const bool is_its_length = each.length && each.length->offset == field.offset;
    const bool is_its_family =
        each.kind == field_kind::address && each.condition.mask && each.condition.at.offset == field.offset;
    return is_its_length || is_its_family;
  });
}

// Keys come in this order, and else as their fields do.
enum class place : std::uint8_t { identity, value, composite, values, records };

place place_of(const key &of) {
  if (!of.members.empty()) return of.is_array ? place::records : place::composite;
  if (of.is_array && of.form != value_form::flags) return place::values;
  const bool is_endpoint = of.form == value_form::scope || (of.form == value_form::address && of.ipv6);
  if (is_endpoint || (of.field && of.field->kind == field_kind::identifier)) return place::identity;
  return of.form == value_form::address || of.form == value_form::mac ? place::composite : place::value;
}

class record_keys {
 public:
  // `given` is what is known to hold, or null.
  record_keys(const record_description &what, const field_condition *given) : what_(what), given_(given) {
    for (const row &field : what.rows) {
      if (field.kind == field_kind::unread || serves_another(what, field)) continue;
      add(field, field.part.empty() ? keys_ : members_of_part(field));
    }
    sort(keys_);
  }

  std::vector<key> take() { return std::move(keys_); }

 private:
  static void sort(std::vector<key> &keys) {
    for (key &each : keys) sort(each.members);
    std::ranges::stable_sort(keys, {}, place_of);
  }

  std::vector<key> &members_of_part(const row &field) {
    const auto found = std::ranges::find(keys_, field.part_name, &key::name);
    if (found != keys_.end()) return found->members;
    keys_.push_back({.name = field.part_name, .meaning = field.part_meaning});
    return keys_.back().members;
  }

  bool may_be_null(const row &field) const {
    const bool depends = field.condition.mask && !(given_ && is_same(field.condition, *given_));
    const bool is_address_of_any_length = field.kind == field_kind::address && field.length;
    return depends || field.of_part.mask || is_address_of_any_length || (field.none && !field.ends_at_none);
  }

  key key_of(const row &field) const {
    return {.name = field.name,
            .meaning = shown_meaning(field),
            .unit = field.unit,
            .form = form_of(field),
            .is_array = field.count > 1 || form_of(field) == value_form::flags,
            .may_be_null = may_be_null(field),
            .field = &field};
  }

  void add(const row &field, std::vector<key> &to) {
    if (add_followers(field, to) || add_ipv6(field, to)) return;
    key made = key_of(field);
    if (field.nested) {
      made.each = field.nested;
      made.counts_if = condition_of(*field.nested);
      made.members = record_keys(*field.nested, made.counts_if).take();
    }
    if (field.names) add_counters(made);
    // A value that another one of its sort decides on stands behind that.
    const auto decisive = std::ranges::find_if(to, [&](const key &each) {
      return made.may_be_null && each.form == made.form && each.field->offset == field.condition.at.offset;
    });
    to.insert(decisive == to.end() ? to.end() : decisive + 1, made);
    if (field.kind == field_kind::address && field.condition.mask) add_scope(field, to);
    if (field.kind == field_kind::pid) add_process(field, to);
  }

  // A count becomes what it counts, unless that has lines of its own.
  bool add_followers(const row &field, std::vector<key> &to) const {
    for (std::size_t i = 0; i < what_.followers.size(); ++i) {
      const follower &behind = what_.followers[i];
      if (behind.count.offset != field.offset || !behind.each->followers.empty()) continue;
      key made = key_of(field);
      made.is_array = true;
      made.each = behind.each;
      made.behind = i;
      made.members = record_keys(*behind.each, nullptr).take();
      if (made.members.size() == 1) made.members[0].name = {};
      to.push_back(made);
      return true;
    }
    return false;
  }

  static bool add_ipv6(const row &field, std::vector<key> &to) {
    const auto found = std::ranges::find(to, field.name, &key::name);
    if (field.kind != field_kind::address || found == to.end()) return false;
    found->ipv6 = (found + 1)->ipv6 = &field;
    found->meaning = address_meaning;
    return true;
  }

  static void add_counters(key &to) {
    for (std::size_t i = 0; i < to.field->count; ++i) {
      to.members.push_back({.name = to.field->names[i].name(),
                            .meaning = {},
                            .form = value_form::integer,
                            .field = to.field,
                            .element = i});
    }
    to.form = value_form::object;
    to.is_array = false;
  }

  static void add_scope(const row &field, std::vector<key> &to) {
    to.push_back(scope_key);
    to.back().field = &field;
  }

  void add_process(const row &field, std::vector<key> &to) const {
    if (std::ranges::find(what_.rows, field_kind::process, &row::kind) != what_.rows.end()) return;
    key made = process_key;
    made.field = &field;
    made.is_array = field.count > 1;
    if (made.is_array) {
      made.name = processes_name;
      made.meaning = processes_meaning;
    }
    to.push_back(made);
  }

  const record_description &what_;
  const field_condition *given_;
  std::vector<key> keys_;
};

// Adds the kind of a record, and those of the records behind it that have followers themselves.
void add_kinds(const table_description &table, const record_description &what,
               const record_description *parent, std::vector<kind> &to) {
  kind made{what.noun, &table, &what, parent, {}, record_keys(what, nullptr).take()};
  if (parent) {
    made.parent_keys = record_keys(*parent, nullptr).take();
    std::erase_if(made.parent_keys, [](const key &each) { return place_of(each) != place::identity; });
  }
  to.push_back(std::move(made));
  for (const follower &behind : what.followers) {
    if (!behind.each->followers.empty()) add_kinds(table, *behind.each, &what, to);
  }
}

}  // namespace

integer_width width_of(const key &of) {
  if (!of.field) return {32, false};
  if (of.form == value_form::scope) return {16, false};
  const bool is_signed = of.field->type == field_type::i32 || of.field->type == field_type::i64;
  return {8U * of.field->size, is_signed};
}

std::vector<key> kind::all_keys() const {
  std::vector<key> all = common_keys;
  all.insert(all.end(), parent_keys.begin(), parent_keys.end());
  all.insert(all.end(), keys.begin(), keys.end());
  return all;
}

const std::vector<kind> &all_kinds() {
  static const std::vector<kind> kinds = [] {
    std::vector<kind> made;
    for (const table_description &table : all_tables) {
      if (has_lines(table)) add_kinds(table, *table.record, nullptr, made);
    }
    return made;
  }();
  return kinds;
}

}  // namespace exporter
