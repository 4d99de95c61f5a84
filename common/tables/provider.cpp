#include "common/tables/provider.h"

#include <array>
#include <utility>

namespace {

using type_text = format::small_text<32>;

// A type and, where there is one, its subtype.
constexpr type_text joined(std::string_view type, std::string_view subtype = {}) {
  type_text text = "";
  const auto add = [&text](std::string_view part) {
    for (const char character : part) text.chars[text.size++] = character;
  };
  add(type);
  if (subtype.empty()) return text;
  add(" (");
  add(subtype);
  add(")");
  return text;
}

constexpr std::size_t flow_switch = nexus_types.find(nexus_types.number("flow-switch"));

// By position among the names, the one for all other numbers last. They are put together when the program is
// compiled.
constexpr auto type_texts = []<std::size_t... I>(std::index_sequence<I...>) {
  return std::array{joined(nexus_types.at(I).view())...};
}
(std::make_index_sequence<std::size(nexus_types.rows) + 1>());
constexpr auto flow_switch_texts = []<std::size_t... I>(std::index_sequence<I...>) {
  return std::array{joined(nexus_types.at(flow_switch).view(), flow_switch_subtypes.at(I).view())...};
}
(std::make_index_sequence<std::size(flow_switch_subtypes.rows) + 1>());

}  // namespace

const format::small_text<32> &provider_type_name(std::uint32_t type, std::uint32_t subtype) {
  const std::size_t at = nexus_types.find(type);
  return at == flow_switch ? flow_switch_texts[flow_switch_subtypes.find(subtype)] : type_texts[at];
}
