#include "export/value_step.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <iterator>
#include <string>
#include <utility>

#include "common/tables/socket_address.h"
#include "common/text/print.h"
#include "export/json_text.h"
#include "platform/process.h"

namespace exporter {

namespace {

template <class Value>
Value load(const std::byte *at) {
  Value value;
  std::memcpy(&value, at, sizeof value);
  return value;
}

template <class Number>
char *put_decimal(char *to, Number value) {
  auto magnitude = static_cast<std::uint64_t>(value);
  if (value < 0) {
    *to++ = '-';
    magnitude = 0 - magnitude;
  }
  return format::put_digits(to, magnitude, format::decimal_digits(magnitude));
}

template <class Number>
char *put_integer(char *to, const value_step & /*how*/, const std::byte *at) {
  return put_decimal(to, load<Number>(at));
}

char *put_network_integer(char *to, const value_step & /*how*/, const std::byte *at) {
  return put_decimal(to, std::to_integer<unsigned>(at[0]) << 8 | std::to_integer<unsigned>(at[1]));
}

// By field_type.
constexpr value_step::writer integer_writers[] = {
    put_integer<std::uint8_t>,  put_integer<std::uint16_t>, put_network_integer,
    put_integer<std::uint32_t>, put_integer<std::uint64_t>, put_integer<std::int32_t>,
    put_integer<std::int64_t>,
};
static_assert(std::size(integer_writers) == static_cast<std::size_t>(field_type::i64) + 1);

std::int64_t number_of(const value_step &how, const std::byte *at) {
  return number_at{0, how.of->field->type}.in({at, how.of->field->size});
}

char *put_boolean(char *to, const value_step &how, const std::byte *at) {
  const bit_names *flags = how.of->field->flags;
  const auto number = static_cast<std::uint64_t>(number_of(how, at));
  return put_plain(to, number & (flags ? flags->entries[0].bit : UINT64_MAX) ? "true" : "false");
}

char *put_text(char *to, const value_step &how, const std::byte *at) {
  const row &field = *how.of->field;
  std::size_t size = field.size;
  if (field.length) size = std::min(size, static_cast<std::size_t>(field.length->in(how.record(at))));
  return put_quoted(to, reinterpret_cast<const char *>(at), size);
}

// What appends itself, in quotation marks.
template <class Value>
char *put_in_quotes(char *to, const Value &value) {
  *to++ = '"';
  to = value.append_to(to);
  *to++ = '"';
  return to;
}

char *put_uuid(char *to, const value_step & /*how*/, const std::byte *at) {
  return put_in_quotes(to, load<uuid>(at));
}

// The field of an address that holds, by its family or its length.
char *put_address_of_family(char *to, const value_step &how, const std::byte *at) {
  const row &ipv4 = *how.of->field, &ipv6 = *how.of->ipv6;
  if (!ipv4.of_part.holds(how.record(at))) return put_plain(to, "null");
  if (ipv4.condition.holds(how.record(at))) return put_in_quotes(to, load<ipv4_address>(at));
  if (!ipv6.condition.holds(how.record(at))) return put_plain(to, "null");
  return put_in_quotes(to, load<ipv6_address>(at - ipv4.offset + ipv6.offset).without_scope());
}

char *put_address_of_length(char *to, const value_step &how, const std::byte *at) {
  const std::int64_t size = how.of->field->length->in(how.record(at));
  if (size == sizeof(ipv4_address)) return put_in_quotes(to, load<ipv4_address>(at));
  if (size == sizeof(ipv6_address)) return put_in_quotes(to, load<ipv6_address>(at));
  return put_plain(to, "null");
}

char *put_scope(char *to, const value_step &how, const std::byte *at) {
  const row &ipv4 = *how.of->field, &ipv6 = *how.of->ipv6;
  if (!ipv6.holds(how.record(at))) return put_plain(to, "null");
  const unsigned scope = load<ipv6_address>(at - ipv4.offset + ipv6.offset).embedded_scope();
  return scope ? put_decimal(to, scope) : put_plain(to, "null");
}

char *put_mac(char *to, const value_step & /*how*/, const std::byte *at) {
  std::uint8_t address[6];
  std::memcpy(address, at, sizeof address);
  *to++ = '"';
  to = put_plain(to, link_layer_address_text(address).view());
  *to++ = '"';
  return to;
}

char *put_name(char *to, const quoted_names::text &name) {
  std::memcpy(to, name.chars, sizeof name.chars);  // a constant size needs no call
  return to + name.size;
}

char *put_enumeration(char *to, const value_step &how, const std::byte *at) {
  const std::int64_t number = number_of(how, at);
  const auto values = how.of->field->values;
  auto place = static_cast<std::size_t>(number);  // where most are
  if (place >= values.size() || values[place].number != number) {
    const auto found = std::ranges::find(values, number, &named_value::number);
    place = static_cast<std::size_t>(found - values.begin());
  }
  if (place < values.size()) return put_name(to, how.names->texts[place]);
  return put_plain(put_decimal(put_plain(to, "\"unknown("), number), ")\"");
}

char *put_flags(char *to, const value_step &how, const std::byte *at) {
  char *const begin = to;
  for (auto bits = static_cast<std::uint32_t>(number_of(how, at)); bits; bits &= bits - 1) {
    *to++ = ',';
    to = put_name(to, how.names->texts[static_cast<std::size_t>(std::countr_zero(bits))]);
  }
  if (to == begin) ++to;
  *begin = '[';
  *to++ = ']';
  return to;
}

char *put_process(char *to, const value_step &how, const std::byte *at) {
  return put_plain(to, how.processes->of(load<std::int32_t>(at)));
}

char *put_array(char *to, const value_step &how, const std::byte *at) {
  const row &field = *how.of->field;
  *to++ = '[';
  const std::size_t count = field.count_in(how.record(at));
  for (std::size_t i = 0; i < count; ++i) {
    if (i) *to++ = ',';
    to = how.put_element(to, how, at + i * field.size);
  }
  *to++ = ']';
  return to;
}

bool is_none_number(const value_step &how, const std::byte *at) {
  return static_cast<std::uint32_t>(number_of(how, at)) == *how.of->field->none;
}

bool is_without_meaning(const value_step &how, const std::byte *at) {
  return !how.of->field->holds(how.record(at));
}

constexpr struct {
  value_form form;
  value_step::writer put;
  std::size_t most;
} rules[] = {
    {value_form::integer, nullptr, 20},
    {value_form::boolean, put_boolean, 5},
    {value_form::text, put_text, 0},
    {value_form::uuid, put_uuid, uuid::text_size + 2},
    {value_form::address, put_address_of_family, ipv6_address::text_size + 2},
    {value_form::scope, put_scope, 10},
    {value_form::mac, put_mac, 20},
    {value_form::enumeration, put_enumeration, 40},
    {value_form::flags, put_flags, 32 * (sizeof(quoted_names::text::chars) + 1) + 2},
    {value_form::process, put_process, quoted_size(platform::process_name_size)},
};

void take_name(quoted_names::text &to, std::string_view name) {
  const std::string shown = quoted(name);
  to.size = shown.copy(to.chars, sizeof to.chars);
}

std::unique_ptr<quoted_names> names_of(const row &field) {
  auto made = std::make_unique<quoted_names>();
  for (std::size_t i = 0; i < field.values.size(); ++i)
    take_name(made->texts[i], field.values[i].name.view());
  if (!field.flags) return made;
  for (std::size_t bit = 0; bit < made->texts.size(); ++bit) {
    take_name(made->texts[bit], "bit(" + std::to_string(bit) + ")");
  }
  for (const bit_names::entry &named : std::span(field.flags->entries, field.flags->count)) {
    take_name(made->texts[static_cast<std::size_t>(std::countr_zero(named.bit))], named.name.view());
  }
  return made;
}

value_step::writer writer_of(const key &of, value_step::writer usual) {
  if (of.form == value_form::integer) return integer_writers[static_cast<std::size_t>(of.field->type)];
  return of.form == value_form::address && of.field->length ? put_address_of_length : usual;
}

}  // namespace

char *put_plain(char *to, std::string_view text) {
  return std::copy(text.begin(), text.end(), to);
}

value_step step_of(const key &of, process_texts &processes) {
  const row &field = *of.field;
  const auto *const rule = std::ranges::find(rules, of.form, [](const auto &each) { return each.form; });
  value_step made{.put = writer_of(of, rule->put),
                  .of = &of,
                  .offset = field.offset + of.element * field.size,
                  .most = of.form == value_form::text ? quoted_size(field.size) : rule->most,
                  .processes = &processes,
                  .names = names_of(field)};
  if (of.is_array && of.form != value_form::flags) {
    made.put_element = std::exchange(made.put, put_array);
    made.most = field.count * (made.most + 1) + 2;
    return made;
  }
  const bool sees_to_it =
      of.form == value_form::address || of.form == value_form::scope || of.form == value_form::process;
  if (of.may_be_null && !sees_to_it) made.is_none = field.none ? is_none_number : is_without_meaning;
  return made;
}

}  // namespace exporter
