// Every record by its rows: what a field means decides what of it may be shown. A field gets through by a
// rule for its kind and where it says anything; all else is zero.

#include "lab/redacted_tables.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <vector>

#include "common/tables/table_walk.h"

namespace lab {

namespace {

// An element of a field, with the record that it belongs to.
struct element {
  const record_description &what;
  const row &field;
  record_bytes record;
  std::span<std::byte> redacted;  // the record as it is shown, still zero
  std::size_t offset;

  record_bytes from() const { return record.subspan(offset, field.size); }
  std::span<std::byte> to() const { return redacted.subspan(offset, field.size); }
};

std::string_view text_in(record_bytes field) {
  const auto *chars = reinterpret_cast<const char *>(field.data());
  return {chars, strnlen(chars, field.size())};
}

template <class Value>
Value value_in(record_bytes bytes) {
  Value value;
  std::memcpy(&value, bytes.data(), sizeof value);
  return value;
}

template <class Value>
void put_value(const Value &value, std::span<std::byte> to) {
  std::memcpy(to.data(), &value, sizeof value);
}

void put_text(const element &each, const std::string &text) {
  std::memcpy(each.to().data(), text.data(), std::min(text.size(), each.to().size()));
}

void keep(const element &each, substitutes & /*by*/) {
  std::ranges::copy(each.from(), each.to().begin());
}

void redact_process(const element &each, substitutes &by) {
  put_text(each, by.process(text_in(each.from())));
}

void redact_interface(const element &each, substitutes &by) {
  put_text(each, by.interface(text_in(each.from())));
}

void redact_name(const element &each, substitutes &by) {
  put_text(each, by.numbered(each.what.noun, text_in(each.from())));
}

template <class Address>
void redact_as(const element &each, substitutes &by) {
  auto address = value_in<Address>(each.from());
  by.replace(address);
  put_value(address, each.to());
}

void redact_address(const element &each, substitutes &by) {
  const auto &length = each.field.length;
  const auto size = length ? static_cast<std::size_t>(length->in(each.record)) : each.field.size;
  if (size == sizeof(ipv4_address)) redact_as<ipv4_address>(each, by);
  if (size == sizeof(ipv6_address)) redact_as<ipv6_address>(each, by);
}

void redact_mac(const element &each, substitutes &by) {
  std::uint8_t address[6];
  std::memcpy(address, each.from().data(), sizeof address);
  by.replace_mac(address);
  put_value(address, each.to());
}

void redact_nested(const element &each, substitutes &by);

constexpr struct {
  field_kind kind;
  void (*redact)(const element &, substitutes &);
} rules[] = {
    {field_kind::identifier, keep},
    {field_kind::number, keep},
    {field_kind::gauge, keep},
    {field_kind::counter, keep},
    {field_kind::flags, keep},
    {field_kind::enumeration, keep},
    {field_kind::boolean, keep},
    {field_kind::pid, keep},
    {field_kind::process, redact_process},
    {field_kind::interface, redact_interface},
    {field_kind::name, redact_name},
    {field_kind::address, redact_address},
    {field_kind::mac, redact_mac},
    {field_kind::nested, redact_nested},
};

void redact_field(const record_description &what, const row &field, record_bytes record,
                  std::span<std::byte> redacted, substitutes &by) {
  const auto rule = std::ranges::find(rules, field.kind, [](const auto &each) { return each.kind; });
  if (rule == std::end(rules)) return;
  for (std::size_t i = 0; i < field.count_in(record); ++i) {
    rule->redact({what, field, record, redacted, field.offset + i * field.size}, by);
  }
}

void redact_record(const record_description &what, record_bytes record, std::span<std::byte> redacted,
                   substitutes &by) {
  for (const row &field : what.rows) redact_field(what, field, record, redacted, by);
  // Where the record says how long a text is, it says the new length.
  for (const row &field : what.rows) {
    if (field.type != field_type::text || !field.length || !field.length->in(record)) continue;
    const std::size_t size = text_in(redacted.subspan(field.offset, field.size)).size();
    put_value(static_cast<std::uint32_t>(size), redacted.subspan(field.length->offset));
  }
}

void redact_nested(const element &each, substitutes &by) {
  redact_record(*each.field.nested, each.from(), each.to(), by);
}

}  // namespace

bool redact_table(const table_description &table, record_bytes bytes, substitutes &by, table_file &file) {
  const record_bytes read = bytes.first(std::min(bytes.size(), table.most));
  const auto put = [&](const record_description &what, record_bytes records, bool says_anything) {
    for (; !records.empty(); records = records.subspan(what.size)) {
      std::vector<std::byte> redacted(what.size);
      if (says_anything) redact_record(what, records.first(what.size), redacted, by);
      file.put(record_bytes(redacted));
    }
  };
  const bool is_whole = walk_table(*table.record, read, [&](const found_record &found) {
    put(*found.what, found.bytes, true);
    for (std::size_t i = 0; i < found.what->followers.size(); ++i) {
      const follower &behind = found.what->followers[i];
      put(*behind.each, found.followers[i], behind.count.in(found.bytes) <= behind.most);
    }
  });
  return is_whole && read.size() == bytes.size();
}

}  // namespace lab
