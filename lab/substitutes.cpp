#include "lab/substitutes.h"

#include <algorithm>
#include <cstring>

#include "platform/process.h"

namespace lab {

namespace {

constexpr std::size_t known_length = platform::process_name_size - 1;

// A kind of IPv4 address and the network that its substitutes are in.
struct ipv4_kind {
  std::uint32_t network;
  std::uint32_t mask;
  std::uint32_t pool;
  std::uint32_t pool_mask;
};

constexpr ipv4_kind kinds[] = {
    {0xa9fe0000, 0xffff0000, 0xa9fe0000, 0xffff0000},  // link-local; the first 256 are no host's
    {0xe0000000, 0xf0000000, 0xef000000, 0xf0000000},  // multicast; from 239.0.0.1
    {0, 0, 0xf0000000, 0xf0000000},                    // any other
};

std::uint32_t number_of(const ipv4_address &address) {
  std::uint32_t number = 0;
  for (const std::uint8_t byte : address.bytes) number = number << 8 | byte;
  return number;
}

// Writes a number to the last four bytes of an address.
template <std::size_t Size>
void put_number(std::uint32_t number, std::uint8_t (&bytes)[Size]) {
  for (std::size_t i = 0; i < 4; ++i) bytes[Size - 1 - i] = static_cast<std::uint8_t>(number >> 8 * i);
}

bool stays(std::uint32_t ipv4) {
  return ipv4 == 0 || ipv4 >> 24 == 127 || ipv4 == 0xffffffff;
}

bool is_mapped(const ipv6_address &address) {
  static constexpr std::uint8_t prefix[12] = {0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0xff, 0xff};
  return std::memcmp(address.bytes, prefix, sizeof prefix) == 0;
}

// Unspecified or loopback.
bool stays(const ipv6_address &address) {
  const auto last = std::end(address.bytes) - 1;
  return *last <= 1 && std::all_of(address.bytes, last, [](std::uint8_t byte) { return byte == 0; });
}

// Types of interfaces that a name may begin with, none longer than an interface field with a number behind.
constexpr std::string_view interface_types[] = {"bond",  "bridge", "en",     "eth", "gif",
                                                "ipsec", "lo",     "pdp_ip", "ppp", "tap",
                                                "tun",   "utun",   "vlan",   "wl",  "wlan"};

bool is_digit(char c) {
  return c >= '0' && c <= '9';
}

}  // namespace

std::uint32_t substitutes::numbering::of(const index_key &key) {
  const std::uint32_t known = numbers_.find(key);
  if (known != key_index::none) return known;
  numbers_.add(key, ++used_);
  return used_;
}

void substitutes::replace(ipv4_address &address) {
  static_assert(std::size(kinds) == ipv4_kinds);
  const std::uint32_t original = number_of(address);
  if (stays(original)) return;
  std::size_t kind = 0;
  while ((original & kinds[kind].mask) != kinds[kind].network) ++kind;
  const ipv4_kind &row = kinds[kind];
  const std::uint32_t host = row.pool + ipv4_[kind].of(address);
  put_number((row.pool & row.pool_mask) | (host & ~row.pool_mask), address.bytes);
}

void substitutes::replace(ipv6_address &address) {
  if (stays(address)) return;
  if (is_mapped(address)) {
    ipv4_address tail;
    std::memcpy(tail.bytes, address.bytes + 12, sizeof tail.bytes);
    replace(tail);
    std::memcpy(address.bytes + 12, tail.bytes, sizeof tail.bytes);
    return;
  }
  ipv6_address substitute{{0x3f, 0xff}};
  ipv6_address key = address;
  const bool is_multicast = address.bytes[0] == 0xff;
  const bool is_link_local = address.bytes[0] == 0xfe && (address.bytes[1] & 0xc0) == 0x80;
  if (is_multicast || is_link_local) {
    substitute = {{address.bytes[0], static_cast<std::uint8_t>(is_multicast ? address.bytes[1] : 0x80)}};
    substitute.bytes[8] = 0x3f;
    substitute.bytes[9] = 0xff;
  }
  const unsigned multicast_scope = address.bytes[1] & 0x0f;
  if (is_link_local || (is_multicast && (multicast_scope == 1 || multicast_scope == 2))) {
    std::memcpy(substitute.bytes + 2, address.bytes + 2, 2);
    key.bytes[2] = key.bytes[3] = 0;  // one address, with its scope or without
  }
  put_number(ipv6_.of(key), substitute.bytes);
  address = substitute;
}

void substitutes::replace_mac(std::uint8_t (&address)[6]) {
  const auto is = [&address](std::uint8_t value) {
    return std::ranges::all_of(address, [value](std::uint8_t byte) { return byte == value; });
  };
  if (is(0) || is(0xff)) return;
  const index_key key(address);
  address[0] = static_cast<std::uint8_t>(0x02 | (address[0] & 0x01));  // a group stays one
  address[1] = 0;
  put_number(macs_.of(key), address);
}

std::string substitutes::numbered(std::string_view word, std::string_view text) {
  if (text.empty()) return {};
  auto &known = texts_[word];
  auto found = known.find(text);
  if (found == known.end()) found = known.emplace(text, known.size() + 1).first;
  return std::string(word) + std::to_string(found->second);
}

std::string substitutes::process(std::string_view name) {
  return numbered("process", name.substr(0, known_length));
}

std::string substitutes::interface(std::string_view name) {
  const auto digits = std::find_if_not(name.rbegin(), name.rend(), is_digit).base();
  const auto type = std::ranges::find(interface_types, std::string_view(name.begin(), digits));
  const bool is_known = type != std::end(interface_types) && digits != name.end();
  return numbered(is_known ? *type : "if", name);
}

}  // namespace lab
