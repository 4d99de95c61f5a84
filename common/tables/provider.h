// Nexus providers: the registered kinds of nexus, as kern.tarvel.nexus_provider_list delivers them.

#ifndef TARVELCTL_COMMON_TABLES_PROVIDER_H
#define TARVELCTL_COMMON_TABLES_PROVIDER_H

#include <cstddef>
#include <cstdint>

#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char provider_list_node[] = "kern.tarvel.nexus_provider_list";

// What the instances of a provider get.
struct nexus_provider_parameters {
  static constexpr std::int32_t anonymous = 1;  // a bit of `flags`

  text_field<64> name;
  std::uint32_t name_length;  // bytes of the name to show; what exceeds the field does not exist
  std::uint32_t type;         // nexus_type
  std::uint8_t reserved_72[8];
  std::int32_t flags;
  std::int32_t format;
  std::int32_t tx_rings;  // per instance
  std::int32_t rx_rings;
  std::int32_t tx_slots;  // per ring
  std::int32_t rx_slots;
  std::int32_t buf_size;   // bytes
  std::int32_t meta_size;  // bytes
  std::uint8_t reserved_112[4];
  std::int32_t pipes;
  std::uint32_t subtype;  // of a flow switch: flow_switch_subtype
  std::int32_t mhints;    // memory hints
  std::int32_t ifindex;   // interface index
  std::uint8_t reserved_132[60];

  foreign_text shown_name() const { return name.first(name_length); }
};

// The fixed part of a record. `instance_count` UUIDs of nexus instances follow it, then the next record.
struct nexus_provider_record {
  uuid provider_uuid;
  std::uint8_t reserved_16[48];
  nexus_provider_parameters parameters;
  std::uint32_t instance_count;
  std::uint8_t reserved_260[4];

  // Bytes of the instance UUIDs behind the fixed part.
  std::uint64_t trailing_size() const { return std::uint64_t{instance_count} * sizeof(uuid); }
};

static_assert(sizeof(nexus_provider_parameters) == 192);
static_assert(sizeof(nexus_provider_record) == 16 + 48 + 192 + 8);
static_assert(offsetof(nexus_provider_record, parameters) == 64);
static_assert(offsetof(nexus_provider_record, parameters.name_length) == 128);
static_assert(offsetof(nexus_provider_record, parameters.type) == 132);
static_assert(offsetof(nexus_provider_record, parameters.flags) == 144);
static_assert(offsetof(nexus_provider_record, parameters.format) == 148);
static_assert(offsetof(nexus_provider_record, parameters.tx_rings) == 152);
static_assert(offsetof(nexus_provider_record, parameters.rx_rings) == 156);
static_assert(offsetof(nexus_provider_record, parameters.tx_slots) == 160);
static_assert(offsetof(nexus_provider_record, parameters.rx_slots) == 164);
static_assert(offsetof(nexus_provider_record, parameters.buf_size) == 168);
static_assert(offsetof(nexus_provider_record, parameters.meta_size) == 172);
static_assert(offsetof(nexus_provider_record, parameters.pipes) == 180);
static_assert(offsetof(nexus_provider_record, parameters.subtype) == 184);
static_assert(offsetof(nexus_provider_record, parameters.mhints) == 188);
static_assert(offsetof(nexus_provider_record, parameters.ifindex) == 192);
static_assert(offsetof(nexus_provider_record, instance_count) == 256);

enum nexus_type : std::uint32_t { user_pipe = 0, kernel_pipe = 1, network_interface = 2, flow_switch = 3 };
enum flow_switch_subtype : std::uint32_t { bridge = 0, multistack = 1 };

// The name of a provider's type; `subtype` tells flow switches apart.
const char *provider_type_name(std::uint32_t type, std::uint32_t subtype);

#endif
