// netns: port reservations, of one namespace or of all.

#include "common/tables/netns.h"

#include <arpa/inet.h>
#include <netinet/in.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <string_view>

#include "common/tables/kernel_table.h"
#include "common/tables/record_walk.h"
#include "common/tables/socket_address.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "tarvelctl/command.h"

const option netns_options[] = {
    {"all", no_argument, nullptr, 'a'},
    {"ip", required_argument, nullptr, 'i'},
    {"proto", required_argument, nullptr, 'p'},
    {},
};
const std::uint32_t netns_option_flags[] = {option_is_optional, option_is_optional, option_is_optional};
static_assert(std::size(netns_option_flags) == std::size(netns_options) - 1);

namespace {

// What one run asks for.
struct netns_request {
  bool all = false;
  bool global = false;
  int family = 0;  // 4, 6 or 0 for none
  std::uint8_t ipv4[4] = {};
  std::uint8_t ipv6[16] = {};
  std::uint8_t protocol = 0;  // tcp, udp or 0 for none
};

// Which family an address text looks like: 4, 6 or 0. The first six characters tell.
int netns_address_family(std::string_view text) {
  const std::size_t at = text.substr(0, 6).find_first_of(".:");
  if (at == text.npos) return 0;
  return text[at] == '.' ? 4 : 6;
}

void take_address(netns_request &request, const char *text) {
  if (std::string_view(text) == "global") {
    request.global = true;
    return;
  }
  const int family = netns_address_family(text);
  const bool parsed = (family == 4 && inet_pton(AF_INET, text, request.ipv4) == 1) ||
                      (family == 6 && inet_pton(AF_INET6, text, request.ipv6) == 1);
  request.family = parsed ? family : 0;
}

void take_protocol(netns_request &request, std::string_view name) {
  for (const named_value &known : ip_protocols.rows) {
    if (known.name.view() == name) request.protocol = static_cast<std::uint8_t>(known.number);
  }
}

// False where the option parser found something that it has reported.
bool take_options(netns_request &request, int argc, char **argv) {
  const char *letters = short_options_of(cmd_netns);
  for (int result; (result = getopt_long(argc, argv, letters, netns_options, nullptr)) != -1;) {
    switch (result) {
      case 'a':
        request.all = true;
        break;
      case 'i':
        take_address(request, optarg);
        break;
      case 'p':
        take_protocol(request, optarg);
        break;
      default:
        return false;
    }
  }
  return true;
}

void print_range(const tv_stats_netns_range &range) {
  const int first = range.first_port;
  const int last = range.last_port;
  const auto ports = last ? format::text_of<"%d-%d", 16>(first, last) : format::text_of<"%d", 16>(first);
  print<"%11s %10d %10d %10d\n">(ports, range.subsystem, range.bsd, range.listeners);
}

template <class Address>
format::small_text<48> address_text(const tv_stats_netns &netns) {
  Address address;
  std::memcpy(address.bytes, netns.address, sizeof address.bytes);
  format::small_text<48> text;
  text.end_at(address.append_to(text.chars));
  return text;
}

void __tv_stats_netns_print(const tv_stats_netns &netns, record_walk ranges) {
  format::small_text<48> address = "global namespace";
  if (netns.address_length == 4) address = address_text<ipv4_address>(netns);
  if (netns.address_length == 16) address = address_text<ipv6_address>(netns);
  print<"%s port reservations for %s\n">(netns.protocol == ip_protocols.number("udp") ? "udp" : "tcp",
                                         address);
  print<"%11s %10s %10s %10s\n">("PORT(S)", "TARVEL", "BSD", "LISTENER");
  for (tv_stats_netns_range range; ranges.take(range);) print_range(range);
  print<"--------------------------------------------\n">();
}

// The whole table. Its readers take ENOMEM for an empty one.
int netns_fetch_all(kernel_table &table) {
  return table.fetch(netns_node);
}

// Where a namespace lies, or, where `error` is not 0, why there is none.
struct netns_record {
  int error = 0;
  kernel_table table{};
  tv_stats_netns netns{};
  std::span<const std::byte> ranges{};
};

// The first namespace of the protocol with these address bytes; the global one has none.
netns_record netns_lookup(std::span<const std::uint8_t> key, std::uint8_t protocol) {
  netns_record found;
  found.error = netns_fetch_all(found.table);
  if (found.error && found.error != ENOMEM) return found;
  found.error = 0;
  record_walk walk(found.table.bytes());
  while (walk.take(found.netns, found.ranges)) {
    if (found.netns.protocol != protocol || found.netns.address_length != key.size()) continue;
    if (std::equal(key.begin(), key.end(), found.netns.address)) return found;
  }
  if (!walk.at_end()) complain<"Buffer too short\n">();
  found.error = ENOENT;
  return found;
}

netns_record netns_lookup_global(std::uint8_t protocol) {
  return netns_lookup({}, protocol);
}

netns_record netns_lookup_ipv4(const std::uint8_t (&address)[4], std::uint8_t protocol) {
  return netns_lookup(address, protocol);
}

netns_record netns_lookup_ipv6(const std::uint8_t (&address)[16], std::uint8_t protocol) {
  return netns_lookup(address, protocol);
}

netns_record lookup(const netns_request &request) {
  if (request.global) return netns_lookup_global(request.protocol);
  if (request.family == 6) return netns_lookup_ipv6(request.ipv6, request.protocol);
  return netns_lookup_ipv4(request.ipv4, request.protocol);
}

int print_all(const netns_request &request) {
  if (request.family || request.global || request.protocol) {
    print<"WARNING: With -a, any further namespace specifiers are ignored\n">();
  }
  kernel_table table;
  const int error = netns_fetch_all(table);
  if (error && error != ENOMEM) return error;
  record_walk walk(table.bytes());
  tv_stats_netns netns;
  std::span<const std::byte> ranges;
  while (walk.take(netns, ranges)) __tv_stats_netns_print(netns, record_walk(ranges));
  if (!walk.at_end()) complain<"Buffer too short\n">();
  return 0;
}

int print_one(const netns_request &request) {
  if (request.family == 0 && !request.global) {
    print<"Specify -a or a valid IP address\n">();
    return EINVAL;
  }
  if (request.protocol == 0) {
    print<"Specify -a or a valid L4 protocol name\n">();
    return EINVAL;
  }
  const netns_record found = lookup(request);
  if (found.error == 0) __tv_stats_netns_print(found.netns, record_walk(found.ranges));
  return found.error;
}

}  // namespace

int cmd_netns(int argc, char **argv) {
  netns_request request;
  if (!take_options(request, argc, argv)) {
    print_options_usage(netns_options, netns_option_flags);
    return EINVAL;
  }
  return request.all ? print_all(request) : print_one(request);
}
