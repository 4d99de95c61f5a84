// kern.tarvel.nexus_channel_list and kern.tarvel.ring_stat_enable

#include "common/tables/channel.h"

#include <algorithm>

#include "lab/tables.h"

namespace lab {

namespace {

constexpr std::uint32_t buffer_size = 2048;

// The share of ring `number` among `rings`, so that the rings sum up to the channel.
std::uint64_t share_of(std::uint64_t total, std::uint32_t number, std::uint32_t rings) {
  return total / rings + (number < total % rings);
}

std::uint32_t share_of(std::uint32_t total, std::uint32_t number, std::uint32_t rings) {
  return static_cast<std::uint32_t>(share_of(std::uint64_t{total}, number, rings));
}

// What a ring moves, in operations of about `batch` slots. A packet takes a slot.
ring_activity activity_of(const meter &moved, std::uint64_t key, std::uint32_t number, std::uint32_t rings) {
  const auto batch = static_cast<std::uint32_t>(3 + key % 6);
  const std::uint64_t slots = share_of(moved.total.packets, number, rings);
  return {.slots = slots,
          .bytes = share_of(moved.total.bytes, number, rings),
          .count = (slots + batch - 1) / batch,
          .min_slots = slots > 0,
          .max_slots = static_cast<std::uint32_t>(std::min<std::uint64_t>(slots, 8 * batch)),
          .slots_per_sec = share_of(moved.packets_per_second, number, rings),
          .slots_per_sec_avg = share_of(moved.packets_average, number, rings),
          .bytes_per_sec = share_of(moved.bytes_per_second, number, rings),
          .bytes_per_sec_avg = share_of(moved.bytes_average, number, rings)};
}

// What the process has put into a ring to send, or taken from one: `waiting` slots more or less than was
// transferred. Its rates are those of one sync.
ring_activity sync_of(meter moved, std::uint64_t waiting, std::uint64_t key, std::uint32_t number,
                      std::uint32_t rings) {
  constexpr std::uint64_t least = 60;  // bytes of a packet
  moved.total.packets += waiting;
  moved.total.bytes += least * waiting;
  ring_activity sync = activity_of(moved, key, number, rings);
  sync.count = (sync.count + 1) / 2;
  const std::uint64_t count = std::max<std::uint64_t>(sync.count, 1);
  const std::uint64_t size = sync.bytes / std::max<std::uint64_t>(sync.slots, 1);
  sync.slots_per_sec_avg = static_cast<std::uint32_t>(sync.slots / count);
  sync.bytes_per_sec_avg = sync.bytes / count;
  sync.slots_per_sec = std::min(sync.slots_per_sec, sync.slots_per_sec_avg + (sync.slots_per_sec & 1));
  sync.bytes_per_sec = sync.slots_per_sec * size;
  return sync;
}

// `errors` of what is sent: most packets come from who does not keep to the rules.
void put_rings(const meter &moved, std::uint64_t key, bool sent, std::uint64_t errors, std::uint32_t rings,
               table_file &file) {
  for (std::uint32_t number = 0; number < rings; ++number) {
    ring_stats ring{};
    ring.ring_id = number;
    ring.xfer = activity_of(moved, key, number, rings);
    const std::uint64_t waiting = moved.waiting;
    ring.sync = sync_of(moved, sent ? waiting : 0 - waiting, key, number, rings);
    ring.mem_total = channel::slots * buffer_size;
    ring.mem_used = share_of(waiting, number, rings) * buffer_size;
    ring.err_corrupted = share_of(errors / 16, number, rings);
    ring.err_len_modified = share_of(errors - errors / 16, number, rings);
    file.put(ring);
  }
}

std::uint32_t flags_of(const world &state, const channel &source) {
  constexpr auto bit = [](std::string_view name) consteval {
    return channel_flag_names.bit(name);
  };
  constexpr std::uint32_t monitor = bit("MON_TX") | bit("MON_RX") | bit("NO_COPY");
  constexpr std::uint32_t user_pool = bit("USER_PACKET_POOL");
  constexpr std::uint32_t may_be_taken = bit("DEFUNCT_OK");
  constexpr std::uint32_t exclusive = bit("EXCLUSIVE");
  if (source.state == channel::phase::defunct) return user_pool | may_be_taken | channel_entry::defunct;
  if (source.flow_switch != none) return user_pool | (is_server(state, source) ? 0 : may_be_taken);
  switch (state.nexuses[source.nexus].kind) {
    case nexus_kind::net_if:
      return monitor;
    case nexus_kind::user_pipe:
      return 0;
    case nexus_kind::kernel_pipe:
      return user_pool | exclusive;
    default:
      return source.port <= channel::host_port ? exclusive : user_pool;
  }
}

void put_channel(const world &state, const channel &source, table_file &file) {
  const std::uint32_t tx_rings = (state.size.rings + 1) / 2;
  const std::uint32_t rx_rings = state.size.rings / 2;
  file.put(channel_entry{.channel_uuid = source.id,
                         .flags = flags_of(state, source),
                         .pid = state.processes[source.process].pid,
                         .fd = source.fd,
                         .port = source.port,
                         .n_tx_rings = tx_rings,
                         .n_rx_rings = rx_rings});
  const std::uint64_t key = key_of(source.id);
  put_rings(source.moved.out, key, true, source.errors, tx_rings, file);
  put_rings(source.moved.in, key / 8, false, 0, rx_rings, file);
}

}  // namespace

void write_channels(const world &state, table_file &file) {
  for (const nexus &place : state.nexuses) {
    if (!place.alive) continue;
    const auto channels = std::span(state.channels).subspan(place.first_channel, place.channel_count);
    const auto is_there = [](const channel &source) { return source.state != channel::phase::closed; };
    file.put(nexus_channel_header{
        .nexus_uuid = place.id,
        .channel_count = static_cast<std::uint32_t>(std::ranges::count_if(channels, is_there))});
    for (const channel &source : channels) {
      if (is_there(source)) put_channel(state, source, file);
    }
  }
}

void write_ring_stat_enable(const world & /*state*/, table_file &file) {
  file.put(std::byte{1});
}

}  // namespace lab
