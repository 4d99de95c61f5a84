// What stands in a redacted capture in place of addresses and process names.
//
// The same address or name has the same substitute as long as the object lives. Substitutes are numbered as
// they are first asked for, and from nothing else: there is no way back.

#ifndef TARVELCTL_LAB_SUBSTITUTES_H
#define TARVELCTL_LAB_SUBSTITUTES_H

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "common/key_index.h"
#include "common/socket_address.h"

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

  // "process" and a number; empty where the name is. A process is known by the first 15 bytes of its name:
  // some texts have no more of it.
  std::string process(std::string_view name);

  // The text with a substitute for each name seen so far that stands in it by itself, no letter beside it.
  std::string without_processes(std::string_view text) const;

 private:
  // Numbers in the order of the questions, from 1.
  class numbering {
   public:
    std::uint32_t of(const index_key &key);

   private:
    key_index numbers_;
    std::uint32_t used_ = 0;
  };

  std::size_t process_at(std::string_view text, std::string &substitute) const;

  static constexpr std::size_t ipv4_kinds = 3;
  numbering ipv4_[ipv4_kinds];
  numbering ipv6_;
  numbering macs_;
  std::map<std::string, std::uint32_t, std::less<>> processes_;  // by what is known of the name, and in full
  std::uint32_t used_ = 0;                                       // numbers of processes
};

}  // namespace lab

#endif
