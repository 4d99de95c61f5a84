// Nexus providers: the registered kinds of nexus, as kern.tarvel.nexus_provider_list delivers them.

#ifndef TARVELCTL_COMMON_TABLES_PROVIDER_H
#define TARVELCTL_COMMON_TABLES_PROVIDER_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char provider_list_node[] = "kern.tarvel.nexus_provider_list";

inline constexpr value_names nexus_types{
    "unknown", {{0, "user-pipe"}, {1, "kernel-pipe"}, {2, "net-if"}, {3, "flow-switch"}}};
// The parenthesis has been there for ever; scripts know it.
inline constexpr value_names flow_switch_subtypes{"unknown type)", {{0, "bridge"}, {1, "multistack"}}};
inline constexpr bit_names provider_flag_names = "\20\1anonymous";

// What the instances of a provider get.
struct nexus_provider_parameters {
  static constexpr std::int32_t anonymous = provider_flag_names.bit("anonymous");

  text_field<64> name;
  std::uint32_t name_length;
  std::uint32_t type;
  std::uint8_t reserved_72[8];
  std::int32_t flags;
  std::int32_t format;
  std::int32_t tx_rings;
  std::int32_t rx_rings;
  std::int32_t tx_slots;
  std::int32_t rx_slots;
  std::int32_t buf_size;
  std::int32_t meta_size;
  std::uint8_t reserved_112[4];
  std::int32_t pipes;
  std::uint32_t subtype;
  std::int32_t mhints;
  std::int32_t ifindex;
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
  constexpr std::uint64_t trailing_size() const { return std::uint64_t{instance_count} * sizeof(uuid); }
};

static_assert(sizeof(nexus_provider_record) == 16 + 48 + 192 + 8);

// One that follows its record, by itself.
inline constexpr row uuid_rows[] = {{.field = "uuid",
                                     .size = sizeof(uuid),
                                     .type = field_type::uuid,
                                     .kind = field_kind::identifier,
                                     .name = "nexus",
                                     .meaning = "UUID of a nexus instance"}};
inline constexpr record_description instance_description = describe<uuid>("uuid", "instance", uuid_rows);

inline constexpr auto provider_rows = [] {
  using record = nexus_provider_record;
  using enum field_kind;
  constexpr row length = ROW(parameters.name_length).is(number, "name_length", "bytes of the name, up to 64");
  constexpr row type = ROW(parameters.type).is(enumeration, "type", "kind of nexus").of(nexus_types);
  return join(ROW(provider_uuid).is(identifier, "provider", "UUID of the provider"), ROW(reserved_16),
              ROW(parameters.name).is(name, "name", "name of the provider").cut_to(length), length, type,
              ROW(parameters.reserved_72),
              ROW(parameters.flags).is(flags, "anonymous", "flags of the provider").of(provider_flag_names),
              ROW(parameters.format).is(number, "format", "format, as the kernel keeps it"),
              ROW(parameters.tx_rings).is(number, "tx_rings", "transmit rings of an instance"),
              ROW(parameters.rx_rings).is(number, "rx_rings", "receive rings of an instance"),
              ROW(parameters.tx_slots).is(number, "tx_slots", "slots of a transmit ring"),
              ROW(parameters.rx_slots).is(number, "rx_slots", "slots of a receive ring"),
              ROW(parameters.buf_size).is(number, "buf_size", "bytes of a buffer").in("bytes"),
              ROW(parameters.meta_size).is(number, "meta_size", "bytes of a buffer's metadata").in("bytes"),
              ROW(parameters.reserved_112),
              ROW(parameters.pipes).is(number, "pipes", "pipes, as the kernel keeps them"),
              ROW(parameters.subtype)
                  .is(enumeration, "subtype", "kind of flow switch")
                  .of(flow_switch_subtypes)
                  .where(type, nexus_types.number("flow-switch")),
              ROW(parameters.mhints).is(number, "mhints", "memory hints"),
              ROW(parameters.ifindex).is(number, "ifindex", "index of the interface"),
              ROW(parameters.reserved_132),
              ROW(instance_count).is(number, "instances", "instances that follow"), ROW(reserved_260));
}();
inline constexpr follower provider_followers[] = {
    {"instances", row_at(provider_rows, "instance_count"), &instance_description}};
inline constexpr record_description provider_description =
    describe<nexus_provider_record>("nexus_provider_record", "provider", provider_rows, provider_followers);

// The name of a provider's type; `subtype` tells flow switches apart.
const format::small_text<32> &provider_type_name(std::uint32_t type, std::uint32_t subtype);

#endif
