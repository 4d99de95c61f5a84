// Names of hosts and services, by the system's databases or as numbers.

#ifndef TARVELCTL_COMMON_NAMES_HOST_NAMING_H
#define TARVELCTL_COMMON_NAMES_HOST_NAMING_H

#include <cstdint>
#include <unordered_map>

#include "common/tables/socket_address.h"
#include "common/text/print.h"

using ipv4_host_text = format::small_text<256>;
using ipv6_host_text = format::small_text<50>;
using endpoint_text = format::small_text<64>;  // longest: a host of 37 bytes, ".", a service of 15, a blank

// Names in one listing, for which it keeps the names of interfaces in scopes. All else it asks the system's
// name services at every call and may wait for them; nothing with `numerical`.
class host_naming {
 public:
  explicit host_naming(bool numerical) : numerical_(numerical) {}

  // The name of a host, or "*" for the unspecified address. With `numerical`, and where no name is found, the
  // number: a dotted quad or the numeric form of getnameinfo, which renders the scope that the kernel embeds
  // in bytes 2 and 3 of link-local addresses. An IPv6 host of the local domain goes without the domain.
  ipv4_host_text ipv4_host_name(const ipv4_address &address) const;
  ipv6_host_text ipv6_host_name(const ipv6_address &address);

  // Host, "." and service: a name where there is one and not `numerical`, else the port's number, or "*" for
  // port 0. `port` is in network byte order, `protocol` names the service database's protocol. An IPv4 text
  // ends in a blank.
  endpoint_text ipv4_endpoint_name(const ipv4_address &address, std::uint16_t port,
                                   const char *protocol) const;
  endpoint_text ipv6_endpoint_name(const ipv6_address &address, std::uint16_t port, const char *protocol);

 private:
  ipv6_host_text numeric(const ipv6_address &address);

  bool numerical_;
  // How getnameinfo renders the scopes of addresses: "%" and an interface or a number behind it. Asking for
  // an interface's name takes longer than all else in a row of a listing.
  std::unordered_map<std::uint32_t, format::name_text> known_scopes_{};
};

#endif
