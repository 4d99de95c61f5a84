// channel: the channels of each nexus instance with their owners and, where the kernel collects them, the
// statistics of their rings.

#include "common/tables/channel.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "common/channel_snapshot.h"
#include "common/names/process_names.h"
#include "common/text/output.h"
#include "common/text/output_helpers.h"
#include "platform/sysctl.h"
#include "tarvelctl/command.h"
#include "tarvelctl/ring_stats.h"

const std::uint32_t channel_option_flags[] = {option_is_optional};

namespace {

// Stores whether the kernel collects ring statistics. Returns 0, or -1 with a message on standard error.
int ring_stat_enabled(bool &enabled) {
  char value = 0;
  std::size_t length = sizeof value;
  if (sysctlbyname(ring_stat_enable_node, &value, &length, nullptr, 0) != 0) {
    complain<"failed to get channel stat, %s\n">(std::strerror(errno));
    return -1;
  }
  enabled = value != 0;
  return 0;
}

void print_port(const channel_entry &channel, process_names &owners) {
  print<"\tPort[%2u] %-22s (fd %d)\t">(channel.port, owners.of(channel.pid), channel.fd);
  if (channel.flags) print_flags(" flags", channel.flags, channel_flag_names);
  print<"\n">();
}

// A channel's ring blocks by direction.
struct channel_rings {
  ring_blocks tx, rx;

  channel_rings() = default;
  explicit channel_rings(const channel_ref &ref) {
    const ring_blocks all = ref.rings();
    tx = all.first(ref.channel().n_tx_rings * sizeof(ring_stats));
    rx = all.subspan(tx.size());
  }
};

void channel_list_print(const channel_snapshot &current, const channel_snapshot *previous, int interval) {
  if (current.empty()) {
    print<"No channels\n">();
    return;
  }
  print<"Instances: %d\n">(static_cast<int>(current.nexus_count()));
  process_names owners(true);
  unsigned nexus_number = 0;
  const std::byte *group = nullptr;
  bool header_is_printed = false;
  for (const channel_ref &ref : current.refs()) {
    if (ref.header != group) {
      group = ref.header;
      print<"%u. %s\n">(++nexus_number, ref.nexus().nexus_uuid);
    }
    if (!ref.entry) continue;
    const channel_entry channel = ref.channel();
    print_port(channel, owners);
    bool collected = false;
    if (ring_stat_enabled(collected) != 0 || !collected) continue;

    const channel_ref *before = previous ? channel_snapshot_find(*previous, channel.channel_uuid) : nullptr;
    const channel_rings rings(ref);
    const channel_rings rings_before = before ? channel_rings(*before) : channel_rings();
    if (!ref.rings().empty() && !header_is_printed) {
      ring_stats_print_header(interval != 0);
      header_is_printed = true;
    }
    ring_stats_print("TX", rings.tx, rings_before.tx, interval);
    ring_stats_print("RX", rings.rx, rings_before.rx, interval);
    print<"\n">();
  }
  print<"\n">();
}

// Prints differences and rates between snapshots until the process is interrupted. The first snapshot, and
// the first one after a failure, only serves as the base of the next.
[[noreturn]] void watch_channels() {
  channel_snapshot previous;
  bool failure_is_reported = false;
  for (;;) {
    channel_snapshot current;
    if (channel_snapshot_fetch(current)) {
      failure_is_reported = false;
      if (!previous.empty()) channel_list_print(current, &previous, refresh_interval);
    } else if (!failure_is_reported) {
      channel_list_print(current, nullptr, 0);
      failure_is_reported = true;
    }
    previous = std::move(current);
    report.flush();
    sleep(static_cast<unsigned>(refresh_interval));
  }
}

}  // namespace

int cmd_channel(int argc, char **argv) {
  if (getopt_long(argc, argv, short_options_of(cmd_channel), no_options, nullptr) != -1) {
    print_options_usage(no_options, channel_option_flags);
    return exit_status::usage;
  }
  if (refresh_interval != 0) watch_channels();
  channel_snapshot snapshot;
  channel_snapshot_fetch(snapshot);
  channel_list_print(snapshot, nullptr, 0);
  return 0;
}
