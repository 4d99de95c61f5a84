// Socket addresses as the kernel's records hold them. The system's own structures may look different.

#ifndef TARVELCTL_COMMON_TABLES_SOCKET_ADDRESS_H
#define TARVELCTL_COMMON_TABLES_SOCKET_ADDRESS_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"

// The kernel's numbers of address families, whatever this system's constants are.
inline constexpr value_names address_families{"unknown", {{2, "IPv4"}, {30, "IPv6"}}};
namespace address_family {
inline constexpr std::uint8_t ipv4 = address_families.number("IPv4");
inline constexpr std::uint8_t ipv6 = address_families.number("IPv6");
}  // namespace address_family

// Addresses in network byte order. Their texts are made without any look-up: a dotted quad, and the form of
// inet_ntop.
struct ipv4_address {
  std::uint8_t bytes[4];

  static constexpr std::size_t text_size = 15;
  char *append_to(char *to) const;
};
struct ipv6_address {
  std::uint8_t bytes[16];

  static constexpr std::size_t text_size = 45;
  char *append_to(char *to) const;

  // Whether the kernel embeds a scope in bytes 2 and 3 of such an address, most significant byte first; 0:
  // none.
  bool may_embed_scope() const;
  unsigned embedded_scope() const {
    return may_embed_scope() ? static_cast<unsigned>(bytes[2] << 8 | bytes[3]) : 0;
  }
  ipv6_address without_scope() const;
};

// The six bytes of a link layer's address as "02:00:5e:10:00:01".
format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]);

// The family says which of the two addresses is meant.
struct socket_address {
  std::uint8_t length;
  std::uint8_t family;
  std::uint16_t port;
  ipv4_address ipv4;
  ipv6_address ipv6;
  std::uint32_t scope_id;
};

static_assert(sizeof(socket_address) == 28);

// Of an address that is part of a record, where one of its families decides for all of them.
constexpr auto address_rows(const row &whole, const row &family, bool has_port) {
  using record = socket_address;
  using enum field_kind;
  const row of_family = ROW(family).part_of(whole);
  const row of_port = ROW(port).as(field_type::net16).part_of(whole);
  return join(
      ROW(length).part_of(whole),
      of_family.offset == family.offset
          ? of_family.is(enumeration, "family", "address family").of(address_families)
          : of_family,
      has_port ? of_port.is(number, "port", "port").where(family, address_family::ipv4, address_family::ipv6)
               : of_port,
      ROW(ipv4)
          .as(field_type::bytes)
          .is(address, "address", "address, if it is IPv4")
          .where(family, address_family::ipv4)
          .part_of(whole),
      ROW(ipv6)
          .as(field_type::bytes)
          .is(address, "address", "address, if it is IPv6")
          .where(family, address_family::ipv6)
          .part_of(whole),
      ROW(scope_id).part_of(whole));
}

#endif
