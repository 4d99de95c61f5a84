// What stands in a redacted capture in place of addresses and names: an operation for each kind of field.
//
// The same original has the same substitute as long as the object lives. Substitutes are numbered as they are
// first asked for, and from nothing else: there is no way back.
//
// A text is replaced as a whole and never searched for another one. So it does not matter which names come
// later, or never: one object can redact the moments of a capture one after the other, each for good.

#ifndef TARVELCTL_LAB_SUBSTITUTES_H
#define TARVELCTL_LAB_SUBSTITUTES_H

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "common/tables/key_index.h"
#include "common/tables/socket_address.h"

namespace lab {

class substitutes {
 public:
  // The substitutes are in 240.0.0.0/4 and 3fff::/32, which no one uses, or, where the kind of an address
  // shows in reports, of the same kind: link-local, multicast, IPv4-mapped; the scope that the kernel embeds
  // stays. The unspecified, loopback and broadcast addresses stay what they are.
  void replace(ipv4_address &address);
  void replace(ipv6_address &address);

  // 02:00 and a number. The null and the broadcast address stay.
  void replace_mac(std::uint8_t (&address)[6]);

  // The word and a number, empty where the text is; each word has numbers of its own. `word` must outlive the
  // object.
  std::string numbered(std::string_view word, std::string_view text);

  // "process" and a number. A process is known by the first 15 bytes of its name: some fields hold no more.
  std::string process(std::string_view name);

  // The interface's type and a number where the name is just that, a known type and a number; "if" and a
  // number for any other name: it may hold an address or the name of a place. Fits the interface fields.
  std::string interface(std::string_view name);

 private:
  // Numbers in the order of the questions, from 1.
  class numbering {
   public:
    std::uint32_t of(const index_key &key);

   private:
    key_index numbers_;
    std::uint32_t used_ = 0;
  };

  static constexpr std::size_t ipv4_kinds = 3;
  numbering ipv4_[ipv4_kinds];
  numbering ipv6_;
  numbering macs_;
  std::map<std::string_view, std::map<std::string, std::size_t, std::less<>>> texts_;  // by word
};

}  // namespace lab

#endif
