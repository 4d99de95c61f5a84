// kern.tarvel.nexus_provider_list

#include <algorithm>
#include <iterator>
#include <string>

#include "common/tables/provider.h"
#include "lab/tables.h"

namespace lab {

namespace {

struct provider_shape {
  std::uint32_t type;
  std::uint32_t subtype;
  std::int32_t flags;
  std::int32_t tx_slots;
  std::int32_t rx_slots;
  std::int32_t meta_size;
  std::int32_t mhints;
};

constexpr std::uint32_t flow_switch_type = nexus_types.number("flow-switch");
constexpr std::uint32_t user_pipe_type = nexus_types.number("user-pipe");

// By nexus_kind.
constexpr provider_shape provider_shapes[] = {
    {flow_switch_type, flow_switch_subtypes.number("multistack"), 0, 512, 1024, 512, 1},
    {nexus_types.number("net-if"), 0, 0, 512, 512, 512, 0},
    {flow_switch_type, flow_switch_subtypes.number("bridge"), 0, 1024, 1024, 512, 0},
    {user_pipe_type, 0, 0, 256, 256, 128, 0},
    {nexus_types.number("kernel-pipe"), 0, 0, 256, 512, 512, 2},
    {user_pipe_type, 0, nexus_provider_parameters::anonymous, 128, 128, 128, 0},
};
static_assert(std::size(provider_shapes) == nexus_kinds);

nexus_provider_parameters parameters_of(const world &state, const provider &source) {
  const provider_shape &shape = provider_shapes[static_cast<int>(source.kind)];
  const std::string name = registered_name(source.kind, source.ordinal);
  nexus_provider_parameters made{};
  set_text(made.name, name);
  made.name_length = static_cast<std::uint32_t>(name.size());
  made.type = shape.type;
  made.flags = shape.flags;
  made.tx_rings = static_cast<std::int32_t>((state.size.rings + 1) / 2);
  made.rx_rings = static_cast<std::int32_t>(state.size.rings / 2);
  made.tx_slots = shape.tx_slots;
  made.rx_slots = shape.rx_slots;
  made.buf_size = 2048;
  made.meta_size = shape.meta_size;
  made.subtype = shape.subtype;
  made.mhints = shape.mhints;
  made.ifindex = static_cast<std::int32_t>(interface_index(source.kind, source.ordinal));
  return made;
}

}  // namespace

void write_providers(const world &state, table_file &file) {
  for (const provider &source : state.providers) {
    const auto instances = std::span(state.nexuses).subspan(source.first_nexus, source.nexus_count);
    nexus_provider_record record{};
    record.provider_uuid = source.id;
    record.parameters = parameters_of(state, source);
    record.instance_count = static_cast<std::uint32_t>(std::ranges::count(instances, true, &nexus::alive));
    file.put(record);
    for (const nexus &instance : instances) {
      if (instance.alive) file.put(instance.id);
    }
  }
}

}  // namespace lab
