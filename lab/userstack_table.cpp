// kern.tarvel.stats.userstack

#include <algorithm>

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Packets and bytes of data that left and arrived, those that left for the first time, and what was counted,
// in the order of stack::event.
enum moved { ip_tx, ip_rx, ip6_tx, ip6_rx, tx, rx, txd, rxd, fresh, freshd, udp_tx, udp_rx, moved_count };
enum seen {
  init = moved_count,
  acpt,
  est,
  failed,
  late,
  done,
  again,
  againd,
  rto,
  stray,
  full,
  source_count
};
static_assert(source_count == init + int{stack::events});

constexpr ingredient ip_ingredients[] = {
    {"TotalRcvd", ip_rx, 1},     {"Delivered", ip_rx, 1}, {"FragRcvd", ip_rx, 25'000}, {"LocalOut", ip_tx, 1},
    {"NoRoute", ip_tx, 250'000}, {"RxChn", ip_rx, 1},     {"RxChnColl", ip_rx, 14},    {"RxChnGT2", ip_rx, 8},
    {"RxChnGT4", ip_rx, 30},     {"IPInPkt", ip_rx, 1},
};
constexpr part ip_parts[] = {{"Reassembled", "Delivered", 50'000}};

constexpr ingredient ip6_ingredients[] = {
    {"TotalRcvd", ip6_rx, 1}, {"Delivered", ip6_rx, 1},     {"FrafRcvd", ip6_rx, 45'000},
    {"LocalOut", ip6_tx, 1},  {"NoRoute", ip6_tx, 350'000}, {"Fwd$Hit", ip6_tx, 1},
};
constexpr part ip6_parts[] = {{"Reassembled", "Delivered", 90'000}, {"Fwd$Miss", "Fwd$Hit", 400}};

constexpr ingredient tcp_ingredients[] = {
    {"ConnInit", init, 1},      {"ConnAcpt", acpt, 1},      {"ConnEst", est, 1},
    {"EConnDrop", failed, 1},   {"DropTO", late, 1},        {"ConnDrop", late, 1},
    {"ConnClosed", done, 1},    {"SndTotalPkt", tx, 1},     {"SndTotalDP", fresh, 1},
    {"SndDataByte", freshd, 1}, {"SndDPktReXmt", again, 1}, {"SndDByteReXmt", againd, 1},
    {"ReXmtTO", rto, 1},        {"RcvTotalPkt", rx, 1},     {"RcvPktInSeq", rx, 1},
    {"RcvBInSeq", rxd, 1},      {"RcvAckByte", freshd, 1},  {"RcvDupAck", rx, 120},
    {"RcvWinUpdPkt", rx, 80},   {"PredAck", rx, 5},         {"PredData", rx, 2},
    {"Pcb$Miss", rx, 70},       {"RTTTimed", tx, 6},        {"RTTUpdated", tx, 6},
    {"DelayAck", rx, 9},        {"KATO", done, 5},          {"KAProbe", done, 5},
    {"RTT$Upd", done, 2},       {"RTTVar$Upd", done, 2},    {"RTTUsed", init, 3},
    {"RTTVarUsed", init, 3},    {"SCAdded", acpt, 1},       {"SCCompl", acpt, 1},
    {"SACKRecEpi", again, 9},   {"SACKReXmt", again, 5},    {"SACKReXmtB", againd, 5},
    {"SACKRcvBlk", rx, 900},    {"SACKSntBlk", rx, 700},    {"CoalPkt", rx, 7},
    {"LRO2Pkt", rx, 22},        {"LROMultiPkt", rx, 12},    {"TailLossTRO", again, 16},
    {"ReOrdPkt", rx, 1100},     {"RecoveryPkt", again, 6},  {"ProbTO", again, 8},
    {"ECNCliSetup", init, 1},   {"ECNNegoSucc", init, 3},   {"ECNSvrNoSupt", init, 2},
    {"TmrDriftLE1Ms", tx, 15},  {"TmrDriftLE10Ms", tx, 90}, {"TmrDriftLE20Ms", tx, 800},
};
constexpr part tcp_parts[] = {
    {"SndAck", "SndTotalDP", 3},      {"SndWinUpd", "SndAck", 10},     {"SndCtlPkt", "SndWinUpd", 100},
    {"RcvAckPkt", "RcvPktInSeq", 4},  {"RcvDupPkt", "RcvAckPkt", 100}, {"RcvOOPkt", "RcvDupPkt", 2},
    {"RcvDupByte", "RcvBInSeq", 400}, {"RcvOOByte", "RcvDupByte", 2},
};

constexpr ingredient udp_ingredients[] = {
    {"InPkt", udp_rx, 1},  {"NoPort", stray, 1},   {"FullSock", full, 1},  {"PCBCacheMiss", udp_rx, 25},
    {"OutPkt", udp_tx, 1}, {"FastOut", udp_tx, 1}, {"NoCsum", udp_rx, 60},
};

std::uint64_t data_of(const traffic &moved) {
  return moved.bytes - std::min(moved.bytes, segment_headers * moved.packets);
}

void put_stack(const nexus &carrier, std::int32_t pid, const stack_totals &totals, table_file &file) {
  static const counter_recipe ip(ip_counter_names, ip_ingredients, ip_parts);
  static const counter_recipe ip6(ip6_counter_names, ip6_ingredients, ip6_parts);
  static const counter_recipe tcp(tcp_counter_names, tcp_ingredients, tcp_parts);
  static const counter_recipe udp(udp_counter_names, udp_ingredients, {});

  std::uint64_t sources[source_count] = {};
  for (int ipv6 = 0; ipv6 < 2; ++ipv6) {
    const auto &[by_tcp, by_udp] = totals.moved[ipv6];
    sources[ipv6 ? ip6_tx : ip_tx] = by_tcp.out.packets + by_udp.out.packets;
    sources[ipv6 ? ip6_rx : ip_rx] = by_tcp.in.packets + by_udp.in.packets;
    sources[tx] += by_tcp.out.packets;
    sources[rx] += by_tcp.in.packets;
    sources[txd] += data_of(by_tcp.out);
    sources[rxd] += data_of(by_tcp.in);
    sources[udp_tx] += by_udp.out.packets;
    sources[udp_rx] += by_udp.in.packets;
  }
  sources[fresh] = sources[tx] - totals.count[stack::resent];
  sources[freshd] = sources[txd] - totals.count[stack::resent_bytes];
  std::ranges::copy(totals.count, sources + init);

  tv_stats_userstack record{};
  record.nx_uuid = carrier.id;
  set_text(record.if_name, interface_name(carrier.kind, carrier.ordinal));
  record.pid = pid;
  const std::uint64_t key = key_of(carrier.id) + static_cast<std::uint64_t>(pid) * 1000;
  ip.fill(record.ip, sources, key);
  ip6.fill(record.ip6, sources, key + 100);
  tcp.fill(record.tcp, sources, key + 200);
  udp.fill(record.udp, sources, key + 300);
  file.put(record);
}

}  // namespace

// The closed ports of each switch first, then the stacks that run. Where more are wanted than there are
// channels, processes have further stacks that have seen nothing yet.
void write_userstacks(const world &state, table_file &file) {
  std::size_t left = state.size.stacks;
  if (state.size.stacks == none) left = state.switches.size() + state.flow_channels.size();
  for (const flow_switch &carrier : state.switches) {
    if (left == 0) return;
    put_stack(state.nexuses[carrier.nexus], 0, carrier.closed, file);
    --left;
  }
  if (state.flow_channels.empty()) return;
  for (std::size_t i = 0; i < left; ++i) {
    const channel &user = state.channels[state.flow_channels[i % state.flow_channels.size()]];
    if (user.state == channel::phase::closed) continue;
    const stack_totals &seen = i < state.flow_channels.size() ? user.stack : stack_totals();
    put_stack(state.nexuses[user.nexus], state.processes[user.process].pid, seen, file);
  }
}

}  // namespace lab
