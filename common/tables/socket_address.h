// Socket addresses as the kernel's records hold them. The system's own structures may look different.

#ifndef TARVELCTL_COMMON_TABLES_SOCKET_ADDRESS_H
#define TARVELCTL_COMMON_TABLES_SOCKET_ADDRESS_H

#include <cstddef>
#include <cstdint>

// The kernel's numbers of address families, whatever this system's constants are.
namespace address_family {
inline constexpr std::uint8_t ipv4 = 2;
inline constexpr std::uint8_t ipv6 = 30;
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
};

// The family says which of the two addresses is meant.
struct socket_address {
  std::uint8_t length;  // not read
  std::uint8_t family;
  std::uint16_t port;  // network byte order
  ipv4_address ipv4;   // the flow label of an IPv6 address, not read
  ipv6_address ipv6;
  std::uint32_t scope_id;  // not read
};

static_assert(sizeof(socket_address) == 28);
static_assert(offsetof(socket_address, family) == 1);
static_assert(offsetof(socket_address, port) == 2);
static_assert(offsetof(socket_address, ipv4) == 4);
static_assert(offsetof(socket_address, ipv6) == 8);

#endif
