#include "common/names/host_naming.h"

#include <arpa/inet.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <iterator>
#include <string_view>

namespace {

constexpr std::string_view unspecified = "*";

// Cuts `name` to what the text holds. Names come from strangers.
template <std::size_t Capacity>
format::small_text<Capacity> named(std::string_view name) {
  format::small_text<Capacity> text;
  text.size = std::min(name.size(), Capacity - 1);
  text.foreign = true;
  std::memcpy(text.chars, name.data(), text.size);
  return text;
}

// The official name of a host, or null.
const char *look_up_host(const void *address, socklen_t size, int family) {
  const hostent *host = gethostbyaddr(address, size, family);
  return host ? host->h_name : nullptr;
}

const char *look_up_ipv4(const ipv4_address &address) {
  in_addr in;
  std::memcpy(&in, address.bytes, sizeof in);
  if (inet_lnaof(in) == 0) {
    const netent *network = getnetbyaddr(inet_netof(in), AF_INET);
    if (network && network->n_name) return network->n_name;
  }
  return look_up_host(&in, sizeof in, AF_INET);
}

// The domain of this host, empty where it has none. It is read once, when an IPv6 name is first looked up.
std::string_view local_domain() {
  static char domain[256];
  static bool attempted = false;
  if (!attempted) {
    attempted = true;
    char host[256];
    if (gethostname(host, sizeof host) == 0) {
      host[sizeof host - 1] = '\0';
      const char *dot = std::strchr(host, '.');
      if (dot) std::strcpy(domain, dot + 1);
    }
  }
  return domain;
}

// The name without the local domain.
std::string_view short_name(std::string_view name) {
  const std::string_view domain = local_domain();
  const std::size_t dot = name.find('.');
  if (dot == name.npos || name.substr(dot + 1) != domain) return name;
  return name.substr(0, dot);
}

// What the rendering depends on: the scope, and which kind of address carries it.
std::uint32_t scope_key(const ipv6_address &address, unsigned scope) {
  const bool is_multicast = address.bytes[0] == 0xff;
  return static_cast<std::uint32_t>(is_multicast ? address.bytes[1] & 0x0f : 0) << 16 | scope;
}

// The whole text, "?" where there is none.
ipv6_host_text ask_for_number(const ipv6_address &address, unsigned scope) {
  sockaddr_in6 socket_address{};
  socket_address.sin6_family = AF_INET6;
  std::memcpy(&socket_address.sin6_addr, address.bytes, sizeof address.bytes);
  socket_address.sin6_scope_id = scope;
  char host[NI_MAXHOST];
  const int error = getnameinfo(reinterpret_cast<const sockaddr *>(&socket_address), sizeof socket_address,
                                host, sizeof host, nullptr, 0, NI_NUMERICHOST);
  return named<sizeof(ipv6_host_text::chars)>(error ? "?" : host);
}

constexpr std::size_t named_host_limit = 33;
constexpr std::size_t numerical_host_limit = 37;
constexpr std::size_t service_name_limit = 15;

// Appends a text, cut to `limit` bytes.
char *put_cut(char *to, std::string_view text, std::size_t limit) {
  return std::copy_n(text.data(), std::min(text.size(), limit), to);
}

// Appends the service to the host that `text` holds up to `host_end`.
void put_service(endpoint_text &text, char *host_end, std::uint16_t port, const char *protocol,
                 bool numerical) {
  const servent *service = port && !numerical ? getservbyport(port, protocol) : nullptr;
  char *end = host_end;
  *end++ = '.';
  if (port && !service) {
    const std::uint16_t number = ntohs(port);
    end = format::put_digits(end, number, format::decimal_digits(number));
  } else {
    end = put_cut(end, service ? service->s_name : unspecified, service_name_limit);
  }
  text.end_at(end);
  text.foreign = true;  // names of hosts and services, and of the interfaces in scopes
}

// Starts an endpoint with the host of any kind.
template <class Host>
char *put_host(endpoint_text &text, const Host &host, bool numerical) {
  return put_cut(text.chars, host.view(), numerical ? numerical_host_limit : named_host_limit);
}

template <class Address>
bool is_unspecified(const Address &address) {
  static constexpr Address any{};
  return std::memcmp(address.bytes, any.bytes, sizeof any.bytes) == 0;
}

}  // namespace

ipv6_host_text host_naming::numeric(const ipv6_address &address) {
  const unsigned scope = address.embedded_scope();
  const ipv6_address plain = address.without_scope();
  ipv6_host_text text;
  text.end_at(plain.append_to(text.chars));
  if (scope == 0) return text;

  const std::uint32_t key = scope_key(address, scope);
  auto known = known_scopes_.find(key);
  if (known == known_scopes_.end()) {
    const ipv6_host_text whole = ask_for_number(plain, scope);
    const std::string_view rendered = whole.view();
    const bool may_be_cut = rendered.size() == sizeof whole.chars - 1;
    format::name_text answer;
    if (may_be_cut || !rendered.starts_with(text.view()) ||
        rendered.size() - text.size > sizeof answer.chars) {
      return whole;
    }
    answer.end_at(std::copy(rendered.begin() + text.size, rendered.end(), answer.chars));
    known = known_scopes_.emplace(key, answer).first;
  }
  text.foreign = true;
  const std::size_t room = sizeof text.chars - 1 - text.size;
  text.end_at(std::copy_n(known->second.chars, std::min(room, known->second.size), text.chars + text.size));
  return text;
}

ipv4_host_text host_naming::ipv4_host_name(const ipv4_address &address) const {
  constexpr std::size_t size = sizeof(ipv4_host_text::chars);
  if (is_unspecified(address)) return named<size>(unspecified);
  const char *name = numerical_ ? nullptr : look_up_ipv4(address);
  if (name) return named<size>(name);
  ipv4_host_text text;
  text.end_at(address.append_to(text.chars));
  return text;
}

ipv6_host_text host_naming::ipv6_host_name(const ipv6_address &address) {
  constexpr std::size_t size = sizeof(ipv6_host_text::chars);
  if (!numerical_) local_domain();
  if (is_unspecified(address)) return named<size>(unspecified);
  const char *name = numerical_ ? nullptr : look_up_host(address.bytes, sizeof address.bytes, AF_INET6);
  return name ? named<size>(short_name(name)) : numeric(address);
}

// The common case, a number, is written in place.

endpoint_text host_naming::ipv4_endpoint_name(const ipv4_address &address, std::uint16_t port,
                                              const char *protocol) const {
  endpoint_text text;
  char *const end = numerical_ && !is_unspecified(address)
                        ? address.append_to(text.chars)
                        : put_host(text, ipv4_host_name(address), numerical_);
  put_service(text, end, port, protocol, numerical_);
  text.chars[text.size++] = ' ';
  return text;
}

endpoint_text host_naming::ipv6_endpoint_name(const ipv6_address &address, std::uint16_t port,
                                              const char *protocol) {
  const std::string_view name = protocol;
  if (name == "tcp6") protocol = "tcp";
  if (name == "udp6") protocol = "udp";
  endpoint_text text;
  char *const end = numerical_ && !is_unspecified(address) && !address.may_embed_scope()
                        ? std::min(address.append_to(text.chars), text.chars + numerical_host_limit)
                        : put_host(text, ipv6_host_name(address), numerical_);
  put_service(text, end, port, protocol, numerical_);
  return text;
}
