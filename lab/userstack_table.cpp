// kern.tarvel.stats.userstack

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Packets that left and arrived, bytes of them that are data, connections.
enum source {
  ip_tx,
  ip_rx,
  ip6_tx,
  ip6_rx,
  tx,
  rx,
  txd,
  rxd,
  udp_tx,
  udp_rx,
  init,
  acpt,
  done,
  source_count
};

constexpr ingredient ip_ingredients[] = {
    {"TotalRcvd", ip_rx, 1, 1},        {"Delivered", ip_rx, 1, 1},
    {"Delivered", ip_rx, -1, 50'000},  {"FragRcvd", ip_rx, 2, 50'000},
    {"Reassembled", ip_rx, 1, 50'000}, {"LocalOut", ip_tx, 1, 1},
    {"NoRoute", ip_tx, 1, 250'000},    {"RxChn", ip_rx, 1, 1},
    {"RxChnColl", ip_rx, 1, 14},       {"RxChnGT2", ip_rx, 1, 8},
    {"RxChnGT4", ip_rx, 1, 30},        {"IPInPkt", ip_rx, 1, 1},
};

constexpr ingredient ip6_ingredients[] = {
    {"TotalRcvd", ip6_rx, 1, 1},     {"Delivered", ip6_rx, 1, 1},        {"Delivered", ip6_rx, -1, 90'000},
    {"FrafRcvd", ip6_rx, 2, 90'000}, {"Reassembled", ip6_rx, 1, 90'000}, {"LocalOut", ip6_tx, 1, 1},
    {"NoRoute", ip6_tx, 1, 350'000}, {"Fwd$Hit", ip6_tx, 1, 1},          {"Fwd$Hit", ip6_tx, -1, 400},
    {"Fwd$Miss", ip6_tx, 1, 400},
};

constexpr ingredient tcp_ingredients[] = {
    {"ConnInit", init, 1, 1},       {"ConnAcpt", acpt, 1, 1},       {"ConnEst", init, 1, 1},
    {"ConnEst", init, -1, 25},      {"ConnEst", acpt, 1, 1},        {"ConnDrop", init, 1, 25},
    {"ConnClosed", done, 1, 1},     {"SndTotalPkt", tx, 1, 1},      {"SndTotalDP", tx, 1, 1},
    {"SndTotalDP", tx, -1, 3},      {"SndAck", tx, 1, 3},           {"SndAck", tx, -1, 30},
    {"SndWinUpd", tx, 1, 30},       {"SndWinUpd", tx, -1, 300},     {"SndDPktReXmt", tx, 1, 300},
    {"SndDPktReXmt", tx, -1, 3000}, {"SndCtlPkt", tx, 1, 3000},     {"SndDataByte", txd, 1, 1},
    {"SndDataByte", txd, -1, 300},  {"SndDByteReXmt", txd, 1, 300}, {"RcvTotalPkt", rx, 1, 1},
    {"RcvPktInSeq", rx, 1, 1},      {"RcvPktInSeq", rx, -1, 4},     {"RcvAckPkt", rx, 1, 4},
    {"RcvAckPkt", rx, -1, 400},     {"RcvDupPkt", rx, 1, 400},      {"RcvDupPkt", rx, -1, 800},
    {"RcvOOPkt", rx, 1, 800},       {"RcvBInSeq", rxd, 1, 1},       {"RcvBInSeq", rxd, -1, 400},
    {"RcvDupByte", rxd, 1, 400},    {"RcvDupByte", rxd, -1, 800},   {"RcvOOByte", rxd, 1, 800},
    {"RcvAckByte", txd, 1, 1},      {"RcvAckByte", txd, -1, 300},   {"RcvDupAck", rx, 1, 120},
    {"RcvWinUpdPkt", rx, 1, 80},    {"PredAck", rx, 1, 5},          {"PredData", rx, 1, 2},
    {"Pcb$Miss", rx, 1, 70},        {"RTTTimed", tx, 1, 6},         {"RTTUpdated", tx, 1, 6},
    {"DelayAck", rx, 1, 9},         {"ReXmtTO", tx, 1, 4000},       {"KATO", done, 1, 5},
    {"KAProbe", done, 1, 5},        {"RTT$Upd", done, 1, 2},        {"RTTVar$Upd", done, 1, 2},
    {"RTTUsed", init, 1, 3},        {"RTTVarUsed", init, 1, 3},     {"SCAdded", acpt, 1, 1},
    {"SCCompl", acpt, 1, 1},        {"SACKRecEpi", tx, 1, 2600},    {"SACKReXmt", tx, 1, 1400},
    {"SACKReXmtB", txd, 1, 1400},   {"SACKRcvBlk", rx, 1, 900},     {"SACKSntBlk", rx, 1, 700},
    {"CoalPkt", rx, 1, 7},          {"LRO2Pkt", rx, 1, 22},         {"LROMultiPkt", rx, 1, 12},
    {"TailLossTRO", tx, 1, 5000},   {"ReOrdPkt", rx, 1, 1100},      {"RecoveryPkt", tx, 1, 1800},
    {"ProbTO", tx, 1, 2400},        {"ECNCliSetup", init, 1, 1},    {"ECNNegoSucc", init, 1, 3},
    {"ECNSvrNoSupt", init, 2, 3},   {"TmrDriftLE1Ms", tx, 1, 15},   {"TmrDriftLE10Ms", tx, 1, 90},
    {"TmrDriftLE20Ms", tx, 1, 800},
};

constexpr ingredient udp_ingredients[] = {
    {"InPkt", udp_rx, 1, 1},         {"NoPort", udp_rx, 1, 9000}, {"FullSock", udp_rx, 1, 120'000},
    {"PCBCacheMiss", udp_rx, 1, 25}, {"OutPkt", udp_tx, 1, 1},    {"FastOut", udp_tx, 1, 1},
    {"FastOut", udp_tx, -1, 40},     {"NoCsum", udp_rx, 1, 60},
};

std::uint64_t data_of(const traffic &moved) {
  constexpr std::uint64_t headers = 52;  // of a segment with the usual options
  return moved.bytes - std::min(moved.bytes, headers * moved.packets);
}

void put_stack(const nexus &carrier, std::int32_t pid, const stack_totals &seen, table_file &file) {
  static const counter_recipe ip(ip_counter_names, ip_ingredients);
  static const counter_recipe ip6(ip6_counter_names, ip6_ingredients);
  static const counter_recipe tcp(tcp_counter_names, tcp_ingredients);
  static const counter_recipe udp(udp_counter_names, udp_ingredients);

  std::uint64_t sources[source_count] = {};
  for (int ipv6 = 0; ipv6 < 2; ++ipv6) {
    const auto &[by_tcp, by_udp] = seen.moved[ipv6];
    sources[ipv6 ? ip6_tx : ip_tx] = by_tcp.out.packets + by_udp.out.packets;
    sources[ipv6 ? ip6_rx : ip_rx] = by_tcp.in.packets + by_udp.in.packets;
    sources[tx] += by_tcp.out.packets;
    sources[rx] += by_tcp.in.packets;
    sources[txd] += data_of(by_tcp.out);
    sources[rxd] += data_of(by_tcp.in);
    sources[udp_tx] += by_udp.out.packets;
    sources[udp_rx] += by_udp.in.packets;
  }
  sources[init] = seen.initiated;
  sources[acpt] = seen.accepted;
  sources[done] = seen.closed;

  tv_stats_userstack record{};
  record.nx_uuid = carrier.id;
  set_text(record.if_name, interface_name(carrier.kind, carrier.ordinal));
  record.pid = pid;
  ip.fill(record.ip, sources);
  ip6.fill(record.ip6, sources);
  tcp.fill(record.tcp, sources);
  udp.fill(record.udp, sources);
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
