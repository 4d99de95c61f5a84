// Records that several tests build on, and what several commands say.

#ifndef TARVELCTL_TESTS_SUPPORT_RECORDS_H
#define TARVELCTL_TESTS_SUPPORT_RECORDS_H

#include <vector>

#include "tests/support/bytes.h"
#include "tests/support/run.h"

inline constexpr char provider_list[] = "kern.tarvel.nexus_provider_list";
inline constexpr char channel_list[] = "kern.tarvel.nexus_channel_list";
inline constexpr char flow_list[] = "kern.tarvel.stats.flow";

inline constexpr char null_uuid[] = "00000000-0000-0000-0000-000000000000";
inline constexpr char nexus_a[] = "AAAAAAAA-0000-0000-0000-00000000000A";
inline constexpr char nexus_b[] = "BBBBBBBB-0000-0000-0000-00000000000B";
inline constexpr char mixed_uuid[] = "FEDCBA98-7654-3210-0123-456789ABCDEF";

inline const std::string missing = "sysctl for len failed, No such file or directory\n";
inline const std::string too_short = "Buffer too short\n";

// `command` on a kernel of one table, and process 42, which is "curl".
inline run_result run_on(const std::string &table, const std::string &contents, const words &command,
                         const run_options &options = {}) {
  kernel_dir kernel;
  kernel.table(table, contents).process(42, "curl\n");
  return run_tarvelctl(kernel, command, options);
}

// Fills what nobody reads, and nobody may take for zero.
inline bytes &unread(bytes &record, std::size_t at, std::size_t size) {
  return record.text(at, std::string(size, '\xEE'));
}

// Each number of a provider is its own offset.
inline bytes provider(std::string_view name, std::uint32_t type = 0, std::uint32_t subtype = 0) {
  bytes record =
      bytes(264).uuid(0, mixed_uuid).text(64, name).u32(128, static_cast<std::uint32_t>(name.size()));
  for (const std::uint32_t at : {148U, 152U, 156U, 160U, 164U, 168U, 172U, 180U, 188U, 192U})
    record.u32(at, at);
  return record.u32(132, type).u32(184, subtype);
}
inline std::string provider(bytes record, const std::vector<const char *> &instances) {
  std::string all = record.u32(256, static_cast<std::uint32_t>(instances.size()));
  for (const char *uuid : instances) all += bytes(16).uuid(0, uuid);
  return all;
}

inline bytes group(const char *nexus, std::uint32_t channels) {
  return bytes(24).uuid(0, nexus).u32(16, channels).u32(20, ~0U);
}

// Process 42 holds it at descriptor 5. Some of its ring blocks, all zero, come with it.
inline bytes channel(const char *uuid, std::uint32_t port, std::uint32_t tx_rings = 0,
                     std::uint32_t rx_rings = 0, std::size_t blocks = 0) {
  bytes entry = bytes(48 + 184 * blocks).uuid(0, uuid).u32(20, 42).u32(24, 5).u32(28, port);
  return entry.u32(32, tx_rings).u32(36, rx_rings).u64(40, ~0ULL);
}

inline bytes flow(int pid = 0, const char *nexus = mixed_uuid) {
  bytes record = bytes(320).uuid(0, nexus).u32(68, static_cast<std::uint32_t>(pid));
  return unread(unread(unread(unread(record, 137, 3), 148, 4), 176, 40), 240, 80);
}

// A socket address: one record has an address for each way of reading it.
inline bytes &endpoint(bytes &record, std::size_t at, int family, std::uint16_t port, std::string_view ipv4,
                       std::string_view ipv6) {
  unread(record, at, 28).u8(at + 1, static_cast<std::uint8_t>(family)).net16(at + 2, port);
  return record.text(at + 4, ipv4).text(at + 8, ipv6);
}
inline constexpr std::string_view any4("\0\0\0\0", 4);
inline constexpr std::string_view any6("\0\0\0\0\0\0\0\0\0\0\0\0\0\0\0\0", 16);

#endif
