// Names of hosts and endpoints, by name services that this file puts in the place of the system's.

#include <arpa/inet.h>
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <netdb.h>

#include <functional>
#include <iostream>
#include <map>
#include <random>

#include "common/names/host_naming.h"

namespace {

// What the services know, and what they were asked.
struct name_services {
  std::map<std::string, const char *> hosts;       // by address
  std::map<std::uint32_t, const char *> networks;  // by number; an entry may lack a name
  std::map<std::string, const char *> services;    // by "port/protocol"
  const char *host_name = nullptr;                 // nullptr: cannot be read
  std::map<std::uint32_t, const char *> scoped;    // whole texts by scope; nullptr: cannot be rendered
  std::string asked;
  int scopes_asked = 0;
} services;

template <class Entry>
Entry *answer(const auto &known, const auto &key, char *Entry::*name) {
  static Entry entry;
  const auto found = known.find(key);
  if (found == known.end()) return nullptr;
  entry.*name = const_cast<char *>(found->second);
  return &entry;
}

}  // namespace

extern "C" {

hostent *gethostbyaddr(const void *address, socklen_t length, int family) {
  char text[INET6_ADDRSTRLEN] = "?";
  if (length == (family == AF_INET ? 4U : 16U)) inet_ntop(family, address, text, sizeof text);
  services.asked += std::string("host ") + text + "\n";
  return answer(services.hosts, text, &hostent::h_name);
}

netent *getnetbyaddr(std::uint32_t number, int family) {
  services.asked += "net " + std::to_string(number) + (family == AF_INET ? "\n" : " ?\n");
  return answer(services.networks, number, &netent::n_name);
}

servent *getservbyport(int port, const char *protocol) {
  const std::string text = std::to_string(ntohs(static_cast<std::uint16_t>(port))) + "/" + protocol;
  services.asked += "service " + text + "\n";
  return answer(services.services, text, &servent::s_name);
}

int gethostname(char *name, std::size_t size) noexcept {
  services.asked += "host name\n";
  if (!services.host_name) return -1;
  snprintf(name, size, "%s", services.host_name);
  return 0;
}

// The system's own, but for scopes that the test knows.
int getnameinfo(const sockaddr *address, socklen_t length, char *host, socklen_t host_size, char *service,
                socklen_t service_size, int flags) {
  ++services.scopes_asked;
  const auto found = services.scoped.find(reinterpret_cast<const sockaddr_in6 *>(address)->sin6_scope_id);
  if (found == services.scoped.end()) {
    static const auto system = reinterpret_cast<decltype(&getnameinfo)>(dlsym(RTLD_NEXT, "getnameinfo"));
    return system(address, length, host, host_size, service, service_size, flags);
  }
  if (!found->second) return EAI_FAMILY;
  snprintf(host, host_size, "%s", found->second);
  return 0;
}

}  // extern "C"

namespace {

template <class Address>
Address parsed(const char *text) {
  Address address;
  inet_pton(sizeof address == 4 ? AF_INET : AF_INET6, text, &address);
  return address;
}
std::string host4(const char *address, bool numerical = false) {
  return std::string(host_naming(numerical).ipv4_host_name(parsed<ipv4_address>(address)).view());
}
std::string host6(const char *address, host_naming &naming) {
  return std::string(naming.ipv6_host_name(parsed<ipv6_address>(address)).view());
}
std::string host6(const char *address, bool numerical = false) {
  host_naming naming(numerical);
  return host6(address, naming);
}
std::string end4(const char *address, std::uint16_t port, const char *protocol, bool numerical = false) {
  return std::string(
      host_naming(numerical).ipv4_endpoint_name(parsed<ipv4_address>(address), htons(port), protocol).view());
}
std::string end6(const char *address, std::uint16_t port, const char *protocol, bool numerical = false) {
  return std::string(
      host_naming(numerical).ipv6_endpoint_name(parsed<ipv6_address>(address), htons(port), protocol).view());
}

TEST(flow_naming, Ipv4NetworksAreAskedForByClass) {
  services = {
      .hosts = {{"10.0.0.1", "www.example.org"}, {"172.16.0.0", "host-of-net"}, {"192.0.2.0", "not this"}},
      .networks = {{172 << 8 | 16, nullptr}, {192 << 16 | 2, "test-net"}}};
  const std::pair<const char *, const char *> names[] = {
      {"10.0.0.1", "www.example.org"}, {"10.0.0.2", "10.0.0.2"},  {"10.0.0.0", "10.0.0.0"},
      {"172.16.0.0", "host-of-net"},   {"192.0.2.0", "test-net"}, {"0.0.0.0", "*"}};
  for (const auto &[address, name] : names) EXPECT_EQ(host4(address), name);
  EXPECT_EQ(
      services.asked,
      "host 10.0.0.1\nhost 10.0.0.2\nnet 10\nhost 10.0.0.0\nnet 44048\nhost 172.16.0.0\nnet 12582914\n");
}

// The local domain is read once in the life of a process, so what resolves IPv6 has one of its own.
void expect_told(const std::function<std::string()> &tell, const std::string &expected) {
  EXPECT_EXIT((std::cerr << tell(), _exit(0)), testing::ExitedWithCode(0), testing::Eq(expected));
}

TEST(flow_naming, Ipv6NamesGoWithoutTheLocalDomain) {
  services = {.hosts = {{"fd00::1", "www.example.org"},
                        {"fd00::2", "a.b.example.org"},
                        {"fd00::3", "www.example.organic"},
                        {"fd00::4", "example.org"},
                        {"fd00::5", "dot."}}};
  const auto names = [](const char *host_name) {
    services.host_name = host_name;
    std::string all = host4("10.0.0.1") + host6("fd00::1", true) + "\n" + services.asked;
    services.asked.clear();
    for (const char *address : {"::", "fd00::1", "fd00::2", "fd00::3", "fd00::4", "fd00::5", "fd00::6"}) {
      all += host6(address) + "\n" + services.asked;
      services.asked.clear();
      services.host_name = "other.org";
    }
    return all;
  };
  const auto told = [](const std::string &www, const std::string &dot) {
    return "10.0.0.1fd00::1\nhost 10.0.0.1\n*\nhost name\n" + www +
           "\nhost fd00::1\n"
           "a.b.example.org\nhost fd00::2\nwww.example.organic\nhost fd00::3\nexample.org\nhost fd00::4\n" +
           dot + "\nhost fd00::5\nfd00::6\nhost fd00::6\n";
  };
  expect_told([&] { return names("box.example.org"); }, told("www", "dot."));
  for (const char *without_domain : {"box", "box.", static_cast<const char *>(nullptr)})
    expect_told([&] { return names(without_domain); }, told("www.example.org", "dot"));
}

TEST(flow_naming, ServicesAreAskedForByProtocol) {
  services = {.services = {{"443/tcp", "https"}, {"443/tcp6", "six"}, {"443/udp", "quic"}}};
  const struct {
    std::uint16_t port;
    const char *protocol;
    std::string port4, port6;
  } cases[] = {{443, "tcp", "https ", "https"},    {443, "tcp6", "six ", "https"},
               {443, "udp", "quic ", "quic"},      {443, "udp6", "443 ", "quic"},
               {65535, "unk.", "65535 ", "65535"}, {0, "tcp", "* ", "*"}};
  for (const auto &each : cases) {
    services.asked.clear();
    EXPECT_EQ(end4("10.0.0.1", each.port, each.protocol), "10.0.0.1." + each.port4);
    const std::string asked = "service " + std::to_string(each.port) + "/" + each.protocol + "\n";
    EXPECT_EQ(services.asked, "host 10.0.0.1\n" + (each.port == 0 ? "" : asked));
    expect_told([&] { return end6("fd00::1", each.port, each.protocol); }, "fd00::1." + each.port6);
  }
}

TEST(flow_naming, NumbersAreAskedOfNobody) {
  const char long6[] = "fd11:1111:2222:3333:4444:5555:6666:7777";
  services = {};
  EXPECT_EQ(host4("10.0.0.0", true), "10.0.0.0");
  EXPECT_EQ(host6(long6, true), long6);
  EXPECT_EQ(end4("10.0.0.1", 443, "tcp", true) + end4("0.0.0.0", 443, "tcp", true), "10.0.0.1.443 *.443 ");
  EXPECT_EQ(end6(long6, 443, "tcp", true), std::string(long6, 37) + ".443");
  EXPECT_EQ(end6("::", 0, "tcp", true), "*.*");
  EXPECT_EQ(services.asked, "");
}

TEST(flow_naming, ScopesAreShownAsTheSystemHasThem) {
  const std::string cut = "fe80::7%" + std::string(41, 'i'), whole = cut + "i";
  services = {.scoped = {{0x101, nullptr},
                         {0x102, "fe80::7%interface-of-15"},
                         {0x103, "fe80::7%interface-of-16c"},
                         {0x104, "fe80:104::7"},
                         {0x105, whole.c_str()},
                         {0x106, "fe80::7%en0"},
                         {0x107, "fe80:0:1111:2222:3333:4444:5555:6666%interface-of-16c"}}};
  host_naming naming(true);
  const std::pair<const char *, std::string> texts[] = {
      {"fe80:101::7", "?"},
      {"fe80:102::7", "fe80::7%interface-of-15"},
      {"fe80:104::7", "fe80:104::7"},
      {"fe80:103::7", "fe80::7%interface-of-16c"},
      {"fe80:105::7", cut},
      {"fe80:106::7", "fe80::7%en0"},
      {"fe80:102:1111:2222:3333:4444:5555:6666", "fe80:0:1111:2222:3333:4444:5555:6666%interface-of"},
      {"fe80:107:1111:2222:3333:4444:5555:6666", "fe80:0:1111:2222:3333:4444:5555:6666%interface-of"},
      {"fe80:107::7", "fe80:0:1111:2222:3333:4444:5555:6666%interface-of"}};
  for (const auto &[address, text] : texts) {
    for (int times = 0; times < 2; ++times) EXPECT_EQ(host6(address, naming), text);
  }
  services.scoped.clear();
  EXPECT_EQ(host6("fe80:106::7", naming), "fe80::7%en0");
  EXPECT_EQ(host6("fe80:106::7", true), "fe80::7%262");
}

TEST(flow_naming, ScopesOfManyInterfacesAreAskedForOnce) {
  services = {};
  host_naming naming(true);
  for (int times = 0; times < 3; ++times) {
    for (std::uint32_t scope = 20'000; scope < 21'280; scope += 2) {  // of no interface here
      char address[32];
      snprintf(address, sizeof address, "fe80:%x::7", scope);
      EXPECT_EQ(host6(address, naming), "fe80::7%" + std::to_string(scope));
    }
  }
  EXPECT_EQ(services.scopes_asked, 640);
}

// The numeric form by the system's own means.
std::string numeric_form(const ipv6_address &address) {
  sockaddr_in6 socket{.sin6_family = AF_INET6};
  std::uint8_t *bytes = socket.sin6_addr.s6_addr;
  std::memcpy(bytes, address.bytes, 16);
  const bool link_local = bytes[0] == 0xFE && (bytes[1] & 0xC0) == 0x80;
  const bool local_multicast = bytes[0] == 0xFF && ((bytes[1] & 0x0F) == 1 || (bytes[1] & 0x0F) == 2);
  if (link_local || local_multicast) {
    socket.sin6_scope_id = static_cast<std::uint32_t>(bytes[2] << 8 | bytes[3]);
    bytes[2] = bytes[3] = 0;
  }
  char text[1025] = "?";
  const auto *generic = reinterpret_cast<const sockaddr *>(&socket);
  getnameinfo(generic, sizeof socket, text, sizeof text, nullptr, 0, NI_NUMERICHOST);
  return std::string(text).substr(0, 49);
}

TEST(flow_naming, NumericIpv6IsTheSystemsForm) {
  constexpr std::uint16_t special[] = {0, 1, 0xFE80, 0xFEBF, 0xFEC0, 0xFF01, 0xFF02, 0xFF12, 0xFF05, 0xFFFF};
  std::mt19937_64 random(1);
  host_naming naming(true);
  for (unsigned i = 0; i < 1000000; ++i) {
    ipv6_address address{};
    for (unsigned group = 0; group < 8; ++group) {
      // Of one to four digits, or zero by a bit of `i`: every shape of zeros.
      auto value = static_cast<std::uint16_t>(random() >> 48 >> 4 * (random() & 3));
      if (i >> group & 1) value = 0;
      if (group == 0 && i % 7 == 0) value = special[random() % std::size(special)];
      if (group == 1 && i % 5 == 0) value &= 3;      // interfaces with a name
      if (group == 5 && i % 3 == 0) value = 0xFFFF;  // an IPv4 address, where all before it is zero
      address.bytes[2 * group] = static_cast<std::uint8_t>(value >> 8);
      address.bytes[2 * group + 1] = static_cast<std::uint8_t>(value);
    }
    const std::string expected = numeric_form(address);
    ASSERT_EQ(naming.ipv6_host_name(address).view(), expected == "::" ? "*" : expected);
  }
}

}  // namespace
