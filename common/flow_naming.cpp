#include "common/flow_naming.h"

#include <netinet/in.h>

#include <array>
#include <iterator>

const format::name_text &proto_name(std::uint8_t protocol) {
  static constexpr format::name_text tcp = "tcp";
  static constexpr format::name_text udp = "udp";
  static constexpr format::name_text unknown = "unk.";
  return protocol == IPPROTO_TCP ? tcp : protocol == IPPROTO_UDP ? udp : unknown;
}

const format::name_text &flow_state_name(std::uint32_t state) {
  static constexpr format::name_text unknown = "UNKNOWN";
  static constexpr format::name_text names[] = {
      "CLOSED",     "LISTEN",  "SYN_SENT", "SYN_RCVD",   "ESTABLISHED", "CLOSE_WAIT",
      "FIN_WAIT_1", "CLOSING", "LAST_ACK", "FIN_WAIT_2", "TIME_WAIT",
  };
  // States of flows without connection state.
  static constexpr std::uint32_t first_connectionless = 20;
  static constexpr format::name_text connectionless[] = {"NO_TRAFFIC", "SINGLE", "MULTIPLE"};
  if (state < std::size(names)) return names[state];
  const std::uint32_t rest = state - first_connectionless;  // far above where the state is below
  return rest < std::size(connectionless) ? connectionless[rest] : unknown;
}

const format::name_text &svc_class_name(std::int32_t service_class) {
  static constexpr format::name_text unknown = "UNK";
  static constexpr struct {
    std::int32_t value;
    format::name_text label;
  } classes[] = {
      {0x000000, "BE"}, {0x080090, "BKS"}, {0x100080, "BK"}, {0x180010, "RD"}, {0x200020, "OAM"},
      {0x280120, "AV"}, {0x300110, "RV"},  {0x380100, "VI"}, {0x400180, "VO"}, {0x480190, "CTL"},
  };
  for (const auto &entry : classes) {
    if (entry.value == service_class) return entry.label;
  }
  return unknown;
}

flags_text letters_of_flags(std::uint32_t flags, std::span<const flag_letter> letters) {
  flags_text text;
  for (const flag_letter &flag : letters) text.chars[text.size++] = flags & flag.mask ? flag.letter : '-';
  return text;
}

flags_text flow_flags_text(std::uint32_t flags) {
  static constexpr flag_letter letters[] = {
      {1U << 4, 't'},  {1U << 5, 'c'},  {1U << 6, 'l'},  {1U << 8, 'q'},  {1U << 9, 'b'},
      {1U << 12, 'w'}, {1U << 13, 'e'}, {1U << 24, 'a'}, {1U << 25, 'n'}, {1U << 26, 'd'},
      {1U << 27, 'o'}, {1U << 30, 'x'}, {1U << 31, 'r'},
  };
  flags_text text = letters_of_flags(flags, letters);
  text.chars[text.size++] = ' ';
  return text;
}

format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]) {
  const auto byte = [&address](std::size_t i) { return static_cast<unsigned>(address[i]); };
  return format::text_of<"%02x:%02x:%02x:%02x:%02x:%02x", 18>(byte(0), byte(1), byte(2), byte(3), byte(4),
                                                              byte(5));
}

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

char *put_ipv4_address(char *to, const ipv4_address &address) {
  for (const std::uint8_t byte : address.bytes) {
    const auto &text = decimal_bytes[byte];
    std::memcpy(to, text.chars, sizeof text.chars);
    to += text.size;
    *to++ = '.';
  }
  return to - 1;
}

char *put_ipv6_address(char *to, const ipv6_address &address) {
  unsigned words[8];
  unsigned zero_mask = 0;
  for (unsigned i = 0; i < std::size(words); ++i) {
    words[i] = static_cast<unsigned>(address.bytes[2 * i] << 8 | address.bytes[2 * i + 1]);
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
      ipv4_address tail;
      std::memcpy(tail.bytes, address.bytes + 12, sizeof tail.bytes);
      return put_ipv4_address(to, tail);
    }
    to = put_hexadecimal(to, words[i++]);
  }
  return to;
}

format::small_text<16> address_text(const ipv4_address &address) {
  format::small_text<16> text;
  text.end_at(put_ipv4_address(text.chars, address));
  return text;
}

format::small_text<46> address_text(const ipv6_address &address) {
  format::small_text<46> text;
  text.end_at(put_ipv6_address(text.chars, address));
  return text;
}
