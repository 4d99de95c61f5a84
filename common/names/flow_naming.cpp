#include "common/names/flow_naming.h"

#include <netinet/in.h>

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

char *flags_text::append_to(char *to) const {
  for (const flag_letter &flag : letters) *to++ = flags & flag.mask ? flag.letter : '-';
  return to;
}

format::name_text flow_flags_text(std::uint32_t flags) {
  static constexpr flag_letter letters[] = {
      {1U << 4, 't'},  {1U << 5, 'c'},  {1U << 6, 'l'},  {1U << 8, 'q'},  {1U << 9, 'b'},
      {1U << 12, 'w'}, {1U << 13, 'e'}, {1U << 24, 'a'}, {1U << 25, 'n'}, {1U << 26, 'd'},
      {1U << 27, 'o'}, {1U << 30, 'x'}, {1U << 31, 'r'},
  };
  static_assert(std::size(letters) < sizeof format::name_text::chars);
  format::name_text text;
  char *end = flags_text{flags, letters}.append_to(text.chars);
  *end++ = ' ';
  text.end_at(end);
  return text;
}

format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]) {
  const auto byte = [&address](std::size_t i) { return static_cast<unsigned>(address[i]); };
  return format::text_of<"%02x:%02x:%02x:%02x:%02x:%02x", 18>(byte(0), byte(1), byte(2), byte(3), byte(4),
                                                              byte(5));
}
