// Names of hosts and endpoints, by name services that stand in for the system's.

#include <arpa/inet.h>
#include <netdb.h>

#include <bit>
#include <iostream>
#include <map>

#include "common/names/host_naming.h"
#include "tests/units/units.h"

static std::map<std::string, std::string> known;  // names by questions, "-" for an entry without one
static std::string asked;                         // the questions

template <class Entry>
static Entry *answer(const std::string &question, char *Entry::*name) {
  static Entry entry;
  asked += " " + question;
  const auto found = known.find(question);
  if (found == known.end()) return nullptr;
  entry.*name = found->second == "-" ? nullptr : found->second.data();
  return &entry;
}

extern "C" {

hostent *gethostbyaddr(const void *address, socklen_t length, int family) {
  char text[INET6_ADDRSTRLEN] = "?";
  if (length == (family == AF_INET ? 4U : 16U)) inet_ntop(family, address, text, sizeof text);
  return answer(text, &hostent::h_name);
}
netent *getnetbyaddr(std::uint32_t number, int family) {
  return answer("net" + std::to_string(family == AF_INET ? number : 0), &netent::n_name);
}
servent *getservbyport(int port, const char *protocol) {
  return answer(std::to_string(htons(static_cast<std::uint16_t>(port))) + "/" + protocol, &servent::s_name);
}
int __wrap_gethostname(char *name, std::size_t size) {
  const hostent *self = answer("self", &hostent::h_name);
  return self && snprintf(name, size, "%s", self->h_name) ? 0 : -1;
}

// Scopes are asked for by number; what is known of one is the whole text.
decltype(getnameinfo) __real_getnameinfo;
int __wrap_getnameinfo(const sockaddr *address, socklen_t length, char *host, socklen_t host_size,
                       char *service, socklen_t service_size, int flags) {
  const std::uint32_t scope = reinterpret_cast<const sockaddr_in6 *>(address)->sin6_scope_id;
  const hostent *whole = answer(std::to_string(scope), &hostent::h_name);
  if (!whole) return __real_getnameinfo(address, length, host, host_size, service, service_size, flags);
  return whole->h_name && snprintf(host, host_size, "%s", whole->h_name) ? 0 : EAI_FAMILY;
}

}  // extern "C"

namespace {

// Has the services know "question name question name ...".
void know(const std::string &pairs) {
  known.clear();
  std::istringstream words(pairs);
  for (std::string question; words >> question;) words >> known[question];
}

// The names of hosts, or of endpoints where there is a protocol, and behind a bar what was asked for them.
std::string tell(host_naming &naming, const std::string &addresses, const char *protocol = nullptr,
                 std::uint16_t port = 443) {
  std::string names;
  asked = "|";
  std::istringstream words(addresses);
  for (std::string address; words >> address; names += " ") {
    ipv4_address ipv4;
    ipv6_address ipv6;
    if (inet_pton(AF_INET, address.c_str(), &ipv4) == 1) {
      names += protocol ? naming.ipv4_endpoint_name(ipv4, htons(port), protocol).view()
                        : naming.ipv4_host_name(ipv4).view();
    } else if (inet_pton(AF_INET6, address.c_str(), &ipv6) == 1) {
      names += protocol ? naming.ipv6_endpoint_name(ipv6, htons(port), protocol).view()
                        : naming.ipv6_host_name(ipv6).view();
    }
  }
  return names + asked;
}

TEST(naming, HostsAreAskedForByClassAndShownWithoutTheLocalDomain) {
  know(
      "10.0.0.1 www.example.org 172.16.0.0 host 192.0.2.0 not-this net44048 - net12582914 test-net"
      " fd00::1 www.example.org fd00::2 a.b.example.org fd00::3 www.example.organic fd00::4 example.org"
      " fd00::5 dot.");
  host_naming naming(false);
  EXPECT_EQ(tell(naming, "10.0.0.1 10.0.0.2 10.0.0.0 172.16.0.0 192.0.2.0 0.0.0.0"),
            "www.example.org 10.0.0.2 10.0.0.0 host test-net * "
            "| 10.0.0.1 10.0.0.2 net10 10.0.0.0 net44048 172.16.0.0 net12582914");
  // The domain is asked for once in the life of a process.
  for (const char *without_domain : {"", "box", "box."}) {
    if (*without_domain) known["self"] = without_domain;
    EXPECT_EXIT((std::cerr << tell(naming, "fd00::1 fd00::5"), _exit(0)), testing::ExitedWithCode(0),
                testing::Eq("www.example.org dot | self fd00::1 fd00::5"));
  }
  known["self"] = "box.example.org";
  EXPECT_EQ(tell(naming, "::"), "* | self");
  known["self"] = "other.org";
  EXPECT_EQ(tell(naming, "fd00::1 fd00::2 fd00::3 fd00::4 fd00::5 fd00::6"),
            "www a.b.example.org www.example.organic example.org dot. fd00::6 "
            "| fd00::1 fd00::2 fd00::3 fd00::4 fd00::5 fd00::6");
}

TEST(naming, ServicesAreAskedForByProtocol) {
  know("443/tcp https 443/tcp6 six 443/udp quic 80/tcp a-service-of-17-");
  host_naming naming(false);
  EXPECT_EQ(tell(naming, "1.2.3.4 ::", "tcp"), "1.2.3.4.https  *.https | 1.2.3.4 443/tcp 443/tcp");
  EXPECT_EQ(tell(naming, "1.2.3.4 ::", "tcp6"), "1.2.3.4.six  *.https | 1.2.3.4 443/tcp6 443/tcp");
  EXPECT_EQ(tell(naming, "1.2.3.4 ::", "udp6"), "1.2.3.4.443  *.quic | 1.2.3.4 443/udp6 443/udp");
  EXPECT_EQ(tell(naming, "1.2.3.4", "tcp", 80), "1.2.3.4.a-service-of-17  | 1.2.3.4 80/tcp");
  EXPECT_EQ(tell(naming, "::", "udp", 65535), "*.65535 | 65535/udp");
  EXPECT_EQ(tell(naming, "1.2.3.4 ::", "tcp", 0), "1.2.3.4.*  *.* | 1.2.3.4");
}

TEST(naming, NumbersAreAskedOfNobodyButForScopesNotYetKnown) {
  const std::string cut = "fe80::7%" + std::string(41, 'i'), long_end = ":1111:2222:3333:4444:5555:6666";
  know("257 - 258 fe80::7%interface-of-15 259 fe80::7%interface-of-16c 260 fe80:104::7 261 " + cut +
       "i 262 fe80:0" + long_end + "%interface-of-15");
  host_naming naming(true);
  EXPECT_EQ(tell(naming, "1.2.3.0 0.0.0.0 ::"), "1.2.3.0 * * |");
  EXPECT_EQ(tell(naming, "1.2.3.4 0.0.0.0 :: fd11:1111:2222:3333:4444:5555:6666:7777", "tcp"),
            "1.2.3.4.443  *.443  *.443 fd11:1111:2222:3333:4444:5555:6666:77.443 |");
  EXPECT_EQ(tell(naming, "fe80:102::7 fe80:102::8 fe80:102" + long_end),
            "fe80::7%interface-of-15 fe80::8%interface-of-15 fe80:0" + long_end + "%interface-of | 258");
  std::string all = "? fe80::7%interface-of-16c fe80:104::7 ";
  all.append(cut).append(" fe80:0").append(long_end).append("%interface-of | 257 259 260 261 262");
  for (int times = 0; times < 2; ++times) {  // what can be of use for no other address
    EXPECT_EQ(tell(naming, "fe80:101::7 fe80:103::7 fe80:104::7 fe80:105::7 fe80:106" + long_end), all);
  }
}

TEST(naming, NumericIpv6IsTheSystemsForm) {
  constexpr std::uint16_t special[] = {0, 1, 0xFE80, 0xFEBF, 0xFEC0, 0xFF01, 0xFF02, 0xFF12, 0xFF05, 0xFFFF};
  std::mt19937_64 random(1);
  host_naming naming(true);
  know("");
  for (unsigned i = 0; i < 1'000'000; ++i) {
    std::uint64_t groups[8];  // of one to four digits, or zero by a bit of `i`: every shape of zeros
    for (unsigned at = 0; at < 8; ++at) groups[at] = i >> at & 1 ? 0 : random() >> 48 >> 4 * (random() & 3);
    if (i % 7 == 0) groups[0] = special[random() % std::size(special)];
    if (i % 5 == 0) groups[1] &= 3;      // interfaces with a name
    if (i % 3 == 0) groups[5] = 0xFFFF;  // an IPv4 address, where all before it is zero
    sockaddr_in6 socket{.sin6_family = AF_INET6};
    for (unsigned at = 0; at < 8; ++at) {
      socket.sin6_addr.s6_addr16[at] = htons(static_cast<std::uint16_t>(groups[at]));
    }
    const auto address = std::bit_cast<ipv6_address>(socket.sin6_addr);
    if (IN6_IS_ADDR_LINKLOCAL(&socket.sin6_addr) || IN6_IS_ADDR_MC_NODELOCAL(&socket.sin6_addr) ||
        IN6_IS_ADDR_MC_LINKLOCAL(&socket.sin6_addr)) {
      socket.sin6_scope_id = ntohs(std::exchange(socket.sin6_addr.s6_addr16[1], 0));
    }
    char text[1025] = "?";
    __real_getnameinfo(reinterpret_cast<const sockaddr *>(&socket), sizeof socket, text, sizeof text, nullptr,
                       0, NI_NUMERICHOST);
    const std::string_view expected = text;
    ASSERT_EQ(naming.ipv6_host_name(address).view(), expected == "::" ? "*" : expected.substr(0, 49));
  }
}

}  // namespace
