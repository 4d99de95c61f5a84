#include "common/names/flow_naming.h"

#include <netinet/in.h>

#include <iterator>

const format::name_text &proto_name(std::uint8_t protocol) {
  return ip_protocols.of(protocol);
}

const format::name_text &flow_state_name(std::uint32_t state) {
  return flow_states.of(state);
}

const format::name_text &svc_class_name(std::int32_t service_class) {
  return service_classes.of(service_class);
}

char *flags_text::append_to(char *to) const {
  for (std::size_t i = 0; i < letters.count; ++i) {
    *to++ = flags & letters.entries[i].bit ? letters.entries[i].name.chars[0] : '-';
  }
  return to;
}

format::name_text flow_flags_text(std::uint32_t flags) {
  static_assert(flow_flag_names.count < sizeof format::name_text::chars);
  format::name_text text;
  char *end = flags_text{flags, flow_flag_names}.append_to(text.chars);
  *end++ = ' ';
  text.end_at(end);
  return text;
}

format::small_text<18> link_layer_address_text(const std::uint8_t (&address)[6]) {
  const auto byte = [&address](std::size_t i) { return static_cast<unsigned>(address[i]); };
  return format::text_of<"%02x:%02x:%02x:%02x:%02x:%02x", 18>(byte(0), byte(1), byte(2), byte(3), byte(4),
                                                              byte(5));
}
