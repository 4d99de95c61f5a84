#include "common/flow_naming.h"

#include <iterator>

const char *proto_name(std::uint8_t protocol) {
  constexpr std::uint8_t tcp = 6;
  constexpr std::uint8_t udp = 17;
  return protocol == tcp ? "tcp" : protocol == udp ? "udp" : "unk.";
}

const char *flow_state_name(std::uint32_t state) {
  static constexpr const char *names[] = {
      "CLOSED",     "LISTEN",  "SYN_SENT", "SYN_RCVD",   "ESTABLISHED", "CLOSE_WAIT",
      "FIN_WAIT_1", "CLOSING", "LAST_ACK", "FIN_WAIT_2", "TIME_WAIT",
  };
  // States of flows without connection state.
  static constexpr const char *connectionless[] = {"NO_TRAFFIC", "SINGLE", "MULTIPLE"};
  constexpr std::uint32_t first_connectionless = 20;
  if (state < std::size(names)) return names[state];
  if (state < first_connectionless) return "UNKNOWN";
  const std::uint32_t rest = state - first_connectionless;
  return rest < std::size(connectionless) ? connectionless[rest] : "UNKNOWN";
}

const char *svc_class_name(std::int32_t service_class) {
  static constexpr struct {
    std::int32_t value;
    const char *label;
  } classes[] = {
      {0x000000, "BE"}, {0x080090, "BKS"}, {0x100080, "BK"}, {0x180010, "RD"}, {0x200020, "OAM"},
      {0x280120, "AV"}, {0x300110, "RV"},  {0x380100, "VI"}, {0x400180, "VO"}, {0x480190, "CTL"},
  };
  for (const auto &entry : classes) {
    if (entry.value == service_class) return entry.label;
  }
  return "UNK";
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

char *put_ipv4_address(char *to, const ipv4_address &address) {
  for (std::size_t i = 0; i < sizeof address.bytes; ++i) {
    if (i) *to++ = '.';
    to = format::put_digits(to, address.bytes[i], format::decimal_digits(address.bytes[i]));
  }
  return to;
}

namespace {

struct run_of_zeros {
  std::size_t first = 0;
  std::size_t length = 0;
};

// The first of the longest runs of two or more zero words: "::" stands for it.
run_of_zeros longest_run(const unsigned (&words)[8]) {
  run_of_zeros best, current;
  for (std::size_t i = 0; i < std::size(words); ++i) {
    if (words[i] != 0) {
      current.length = 0;
      continue;
    }
    if (current.length++ == 0) current.first = i;
    if (current.length > best.length) best = current;
  }
  return best.length >= 2 ? best : run_of_zeros{};
}

char *put_hexadecimal(char *to, unsigned word) {
  for (unsigned digits = (static_cast<unsigned>(std::bit_width(word | 1)) + 3) / 4; digits-- > 0;) {
    *to++ = "0123456789abcdef"[word >> (4 * digits) & 0xf];
  }
  return to;
}

}  // namespace

char *put_ipv6_address(char *to, const ipv6_address &address) {
  unsigned words[8];
  for (std::size_t i = 0; i < std::size(words); ++i) {
    words[i] = static_cast<unsigned>(address.bytes[2 * i] << 8 | address.bytes[2 * i + 1]);
  }
  const run_of_zeros zeros = longest_run(words);
  // An IPv4 address in the last two words, by itself or mapped, keeps its dots.
  const bool holds_ipv4 =
      zeros.first == 0 && (zeros.length == 6 || (zeros.length == 5 && words[5] == 0xffff));
  for (std::size_t i = 0; i < std::size(words);) {
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
  text.size = static_cast<std::size_t>(put_ipv4_address(text.chars, address) - text.chars);
  return text;
}

format::small_text<46> address_text(const ipv6_address &address) {
  format::small_text<46> text;
  text.size = static_cast<std::size_t>(put_ipv6_address(text.chars, address) - text.chars);
  return text;
}
