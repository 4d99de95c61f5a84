#include "common/tables/socket_address.h"

#include <array>
#include <cstring>
#include <iterator>

namespace {

// The decimal text of each byte.
constexpr auto decimal_bytes = [] {
  struct entry {
    char chars[4];
    unsigned char size;
  };
  std::array<entry, 256> table{};
  for (unsigned value = 0; value < table.size(); ++value) {
    entry &text = table[value];
    if (value >= 100) text.chars[text.size++] = static_cast<char>('0' + value / 100);
    if (value >= 10) text.chars[text.size++] = static_cast<char>('0' + value / 10 % 10);
    text.chars[text.size++] = static_cast<char>('0' + value % 10);
  }
  return table;
}();

struct run_of_zeros {
  unsigned char first;
  unsigned char length;
};

// The run of words that "::" stands for, by the mask of the words that are zero (bit 0 is the first word):
// the first of the longest ones of two or more.
constexpr auto zero_runs = [] {
  std::array<run_of_zeros, 256> table{};
  for (unsigned mask = 0; mask < table.size(); ++mask) {
    run_of_zeros current{};
    for (unsigned char i = 0; i < 8; ++i) {
      if (!(mask >> i & 1)) {
        current.length = 0;
        continue;
      }
      if (current.length++ == 0) current.first = i;
      if (current.length >= 2 && current.length > table[mask].length) table[mask] = current;
    }
  }
  return table;
}();

char *put_hexadecimal(char *to, unsigned word) {
  static constexpr char digits[] = "0123456789abcdef";
  if (word >= 0x1000) *to++ = digits[word >> 12];
  if (word >= 0x100) *to++ = digits[word >> 8 & 0xf];
  if (word >= 0x10) *to++ = digits[word >> 4 & 0xf];
  *to++ = digits[word & 0xf];
  return to;
}

}  // namespace

char *ipv4_address::append_to(char *to) const {
  for (const std::uint8_t byte : bytes) {
    const auto &text = decimal_bytes[byte];
    std::memcpy(to, text.chars, sizeof text.chars);
    to += text.size;
    *to++ = '.';
  }
  return to - 1;
}

char *ipv6_address::append_to(char *to) const {
  unsigned words[8];
  unsigned zero_mask = 0;
  for (unsigned i = 0; i < std::size(words); ++i) {
    words[i] = static_cast<unsigned>(bytes[2 * i] << 8 | bytes[2 * i + 1]);
    zero_mask |= static_cast<unsigned>(words[i] == 0) << i;
  }
  const run_of_zeros zeros = zero_runs[zero_mask];
  // An IPv4 address in the last two words, by itself or mapped, keeps its dots.
  const bool holds_ipv4 =
      zeros.first == 0 && (zeros.length == 6 || (zeros.length == 5 && words[5] == 0xffff));
  for (unsigned i = 0; i < std::size(words);) {
    if (zeros.length && i == zeros.first) {
      *to++ = ':';
      i += zeros.length;
      if (i == std::size(words)) *to++ = ':';
      continue;
    }
    if (i) *to++ = ':';
    if (i == 6 && holds_ipv4) {
      return ipv4_address{bytes[12], bytes[13], bytes[14], bytes[15]}.append_to(to);
    }
    to = put_hexadecimal(to, words[i++]);
  }
  return to;
}

bool ipv6_address::may_embed_scope() const {
  if (bytes[0] == 0xfe) return (bytes[1] & 0xc0) == 0x80;
  const unsigned scope = bytes[1] & 0x0f;
  return bytes[0] == 0xff && (scope == 1 || scope == 2);
}

ipv6_address ipv6_address::without_scope() const {
  ipv6_address plain = *this;
  if (may_embed_scope()) plain.bytes[2] = plain.bytes[3] = 0;
  return plain;
}

format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]) {
  const auto byte = [&address](std::size_t i) { return static_cast<unsigned>(address[i]); };
  return format::text_of<"%02x:%02x:%02x:%02x:%02x:%02x", 18>(byte(0), byte(1), byte(2), byte(3), byte(4),
                                                              byte(5));
}
