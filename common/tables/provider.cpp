#include "common/tables/provider.h"

format::small_text<32> provider_type_name(std::uint32_t type, std::uint32_t subtype) {
  constexpr std::uint32_t flow_switch = nexus_types.number("flow-switch");
  if (type != flow_switch) return format::text_of<"%.12s", 32>(nexus_types.of(type));
  return format::text_of<"%.12s (%.13s)", 32>(nexus_types.of(type), flow_switch_subtypes.of(subtype));
}
