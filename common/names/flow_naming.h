// Texts for the numbers in flow and route records.

#ifndef TARVELCTL_COMMON_NAMES_FLOW_NAMING_H
#define TARVELCTL_COMMON_NAMES_FLOW_NAMING_H

#include <cstdint>
#include <span>

#include "common/tables/flow.h"
#include "common/text/print.h"

// "tcp", "udp" or "unk." for an IP protocol number.
const format::name_text &proto_name(std::uint8_t protocol);

// The name of an endpoint's state, or "UNKNOWN".
const format::name_text &flow_state_name(std::uint32_t state);

// The label of a service class, or "UNK".
const format::name_text &svc_class_name(std::int32_t service_class);

// The letter of each flag that is set, "-" for each that is clear, in the order of the names.
struct flags_text {
  std::uint32_t flags;
  const bit_names &letters;

  static constexpr std::size_t text_size = 32;
  char *append_to(char *to) const;
};

// The thirteen letters of a flow's flags and a blank.
format::name_text flow_flags_text(std::uint32_t flags);

// Six bytes as "02:00:5e:10:00:01".
format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]);

using ipv4_host_text = format::small_text<256>;
using ipv6_host_text = format::small_text<50>;
using endpoint_text = format::small_text<64>;  // longest: a host of 37 bytes, ".", a service of 15, a blank

// The name of a host, or "*" for the unspecified address. With `numerical`, and where no name is found, the
// number: a dotted quad or the numeric form of getnameinfo, which renders the scope that the kernel embeds in
// bytes 2 and 3 of link-local addresses. An IPv6 host of the local domain goes without the domain. Nothing is
// looked up with `numerical`; without it every call asks the system's name services again and may wait for
// them.
//
// Names of interfaces in scopes are kept, until forget_scopes() at the start of a listing.
void forget_scopes();
ipv4_host_text ipv4_host_name(const ipv4_address &address, bool numerical);
ipv6_host_text ipv6_host_name(const ipv6_address &address, bool numerical);

// Host, "." and service: a name where there is one and `numerical` is false, else the port's number, or "*"
// for port 0. `port` is in network byte order, `protocol` names the service database's protocol. An IPv4 text
// ends in a blank.
endpoint_text ipv4_endpoint_name(const ipv4_address &address, std::uint16_t port, const char *protocol,
                                 bool numerical);
endpoint_text ipv6_endpoint_name(const ipv6_address &address, std::uint16_t port, const char *protocol,
                                 bool numerical);

#endif
