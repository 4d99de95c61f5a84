#include "lab/addresses.h"

#include <arpa/inet.h>

#include <cstring>

#include "lab/world.h"

namespace lab {

namespace {

constexpr std::uint8_t documentation[][3] = {{192, 0, 2}, {198, 51, 100}, {203, 0, 113}};
constexpr std::uint32_t documentation_hosts = 3 * 250;

socket_address of_ipv4(std::uint8_t a, std::uint8_t b, std::uint8_t c, std::uint8_t d) {
  return {.length = 16, .family = address_family::ipv4, .ipv4 = {{a, b, c, d}}};
}

// An IPv6 address of a prefix of 64 bits, in network order, and an interface identity.
socket_address of_ipv6(const std::uint8_t (&prefix)[8], std::uint64_t host) {
  socket_address made{.length = sizeof(socket_address), .family = address_family::ipv6};
  std::memcpy(made.ipv6.bytes, prefix, sizeof prefix);
  for (int i = 0; i < 8; ++i) made.ipv6.bytes[15 - i] = static_cast<std::uint8_t>(host >> 8 * i);
  return made;
}

socket_address of_link_local(std::uint32_t ordinal, std::uint64_t host) {
  const std::uint32_t scope = interface_index(nexus_kind::net_if, ordinal);
  return of_ipv6({0xfe, 0x80, static_cast<std::uint8_t>(scope >> 8), static_cast<std::uint8_t>(scope)}, host);
}

socket_address of_global(std::uint32_t subnet, std::uint64_t host) {
  return of_ipv6({0x20, 0x01, 0x0d, 0xb8, 0, static_cast<std::uint8_t>(subnet >> 16),
                  static_cast<std::uint8_t>(subnet >> 8), static_cast<std::uint8_t>(subnet)},
                 host);
}

// A host in the private IPv4 network of an interface.
socket_address of_private(std::uint32_t ordinal, std::uint32_t host) {
  return of_ipv4(10, static_cast<std::uint8_t>(ordinal >> 8), static_cast<std::uint8_t>(ordinal),
                 static_cast<std::uint8_t>(host));
}

}  // namespace

socket_address any_address(bool ipv6) {
  if (!ipv6) return of_ipv4(0, 0, 0, 0);
  return of_ipv6({}, 0);
}

socket_address interface_address(std::uint64_t seed, std::uint32_t ordinal, address_kind kind) {
  random_source random(seed, 1, ordinal);
  const std::uint64_t host = random.next();
  if (kind == address_kind::ipv4) return of_private(ordinal, 2 + (ordinal >> 16));
  return kind == address_kind::link_local ? of_link_local(ordinal, host) : of_global(ordinal, host);
}

socket_address gateway_address(std::uint32_t ordinal, bool ipv6) {
  return ipv6 ? of_link_local(ordinal, 1) : of_private(ordinal, 1);
}

socket_address remote_address(random_source &random, std::uint32_t ordinal, address_kind kind,
                              std::uint32_t number, bool on_link) {
  if (kind == address_kind::link_local) return of_link_local(ordinal, random.next());
  if (kind == address_kind::global_ipv6) {
    const std::uint32_t elsewhere = 0x800000 | random.below(0x10000);
    return of_global(on_link ? ordinal : elsewhere, random.next());
  }
  if (on_link && number < 200) return of_private(ordinal, 254 - number % 200);
  // 89 has no factor in common with 250: hosts look scattered and do not repeat.
  const auto &network = documentation[number % 3];
  const auto host = static_cast<std::uint8_t>(1 + number / 3 * 89 % 250);
  if (number < documentation_hosts) return of_ipv4(network[0], network[1], network[2], host);
  return of_private(0x8000 + number / 250, 1 + number % 250);
}

void set_port(socket_address &address, std::uint16_t port) {
  address.port = htons(port);
}

}  // namespace lab
