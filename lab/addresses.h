// Addresses of the lab's machine and of those it talks to: from private ranges and those kept for
// documentation, so that no one's own shows up.

#ifndef TARVELCTL_LAB_ADDRESSES_H
#define TARVELCTL_LAB_ADDRESSES_H

#include <cstdint>

#include "common/tables/socket_address.h"
#include "lab/random.h"

namespace lab {

enum class address_kind : std::uint8_t { ipv4, global_ipv6, link_local };
inline constexpr std::uint32_t address_kinds = 3;

// No address and port 0, of either family.
socket_address any_address(bool ipv6);

// The addresses of interface number `ordinal` and of its gateway. The same whenever asked. A link-local
// address holds the index of its interface in bytes 2 and 3, as the kernel keeps it.
socket_address interface_address(std::uint64_t seed, std::uint32_t ordinal, address_kind kind);
socket_address gateway_address(std::uint32_t ordinal, bool ipv6);

// An address that interface number `ordinal` talks to, different for each `number`. Where `on_link`, it is
// in the interface's own network.
socket_address remote_address(random_source &random, std::uint32_t ordinal, address_kind kind,
                              std::uint32_t number, bool on_link);

void set_port(socket_address &address, std::uint16_t port);

}  // namespace lab

#endif
