// kern.tarvel.stats.userstack

#include "common/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

enum source {
  ip_out,
  ip_in,
  ip6_out,
  ip6_in,
  tcp_out,
  tcp_in,
  tcp_out_data,  // bytes without headers
  tcp_in_data,
  udp_out,
  udp_in,
  initiated,
  accepted,
  closed,
  source_count
};

constexpr ingredient ip_ingredients[] = {
    {"TotalRcvd", ip_in, 1, 1},       {"BadCsum", ip_in, 1, 900'000},    {"FragRcvd", ip_in, 2, 50'000},
    {"FragTimeO", ip_in, 1, 600'000}, {"Reassembled", ip_in, 1, 50'000}, {"UnkwnProto", ip_in, 1, 800'000},
    {"Delivered", ip_in, 1, 1},       {"Delivered", ip_in, -1, 900'000}, {"Delivered", ip_in, -1, 800'000},
    {"Delivered", ip_in, -1, 50'000}, {"LocalOut", ip_out, 1, 1},        {"NoRoute", ip_out, 1, 250'000},
    {"RxChn", ip_in, 1, 1},           {"RxChnColl", ip_in, 1, 14},       {"RxChnGT2", ip_in, 1, 8},
    {"RxChnGT4", ip_in, 1, 30},       {"IPInPkt", ip_in, 1, 1},
};

constexpr ingredient ip6_ingredients[] = {
    {"TotalRcvd", ip6_in, 1, 1},
    {"Delivered", ip6_in, 1, 1},
    {"Delivered", ip6_in, -1, 700'000},
    {"Delivered", ip6_in, -1, 90'000},
    {"FrafRcvd", ip6_in, 2, 90'000},
    {"Reassembled", ip6_in, 1, 90'000},
    {"ScopeErr", ip6_in, 1, 700'000},
    {"LocalOut", ip6_out, 1, 1},
    {"NoRoute", ip6_out, 1, 350'000},
    {"Fwd$Hit", ip6_out, 1, 1},
    {"Fwd$Hit", ip6_out, -1, 400},
    {"Fwd$Miss", ip6_out, 1, 400},
    {"AddrSelFail", ip6_out, 1, 2'000'000},
};

constexpr ingredient tcp_ingredients[] = {
    {"ConnInit", initiated, 1, 1},
    {"ConnAcpt", accepted, 1, 1},
    {"ConnEst", initiated, 1, 1},
    {"ConnEst", initiated, -1, 25},
    {"ConnEst", accepted, 1, 1},
    {"ConnDrop", initiated, 1, 25},
    {"EConnDrop", initiated, 1, 50},
    {"ConnClosed", closed, 1, 1},
    {"RTTTimed", tcp_out, 1, 6},
    {"RTTUpdated", tcp_out, 1, 6},
    {"DelayAck", tcp_in, 1, 9},
    {"ReXmtTO", tcp_out, 1, 4000},
    {"KATO", closed, 1, 5},
    {"KAProbe", closed, 1, 5},
    {"SndTotalPkt", tcp_out, 1, 1},
    {"SndTotalDP", tcp_out, 1, 1},
    {"SndTotalDP", tcp_out, -1, 300},
    {"SndTotalDP", tcp_out, -1, 4},
    {"SndTotalDP", tcp_out, -1, 60},
    {"SndTotalDP", initiated, -1, 1},
    {"SndTotalDP", closed, -1, 1},
    {"SndDPktReXmt", tcp_out, 1, 300},
    {"SndAck", tcp_out, 1, 4},
    {"SndWinUpd", tcp_out, 1, 60},
    {"SndCtlPkt", initiated, 1, 1},
    {"SndCtlPkt", closed, 1, 1},
    {"SndDataByte", tcp_out_data, 1, 1},
    {"SndDataByte", tcp_out_data, -1, 300},
    {"SndDByteReXmt", tcp_out_data, 1, 300},
    {"RcvTotalPkt", tcp_in, 1, 1},
    {"RcvPktInSeq", tcp_in, 1, 1},
    {"RcvPktInSeq", tcp_in, -1, 4},
    {"RcvPktInSeq", tcp_in, -1, 500},
    {"RcvPktInSeq", tcp_in, -1, 350},
    {"RcvBInSeq", tcp_in_data, 1, 1},
    {"RcvBInSeq", tcp_in_data, -1, 500},
    {"RcvBInSeq", tcp_in_data, -1, 350},
    {"RcvBadCsum", tcp_in, 1, 900'000},
    {"RcvDupPkt", tcp_in, 1, 500},
    {"RcvDupByte", tcp_in_data, 1, 500},
    {"RcvOOPkt", tcp_in, 1, 350},
    {"RcvOOByte", tcp_in_data, 1, 350},
    {"RcvAckPkt", tcp_in, 1, 4},
    {"RcvAckByte", tcp_out_data, 1, 1},
    {"RcvAckByte", tcp_out_data, -1, 300},
    {"RcvDupAck", tcp_in, 1, 120},
    {"RcvWinUpdPkt", tcp_in, 1, 80},
    {"PredAck", tcp_in, 1, 5},
    {"PredData", tcp_in, 1, 2},
    {"Pcb$Miss", tcp_in, 1, 70},
    {"RTT$Upd", closed, 1, 2},
    {"RTTVar$Upd", closed, 1, 2},
    {"RTTUsed", initiated, 1, 3},
    {"RTTVarUsed", initiated, 1, 3},
    {"SSTholdUsed", initiated, 1, 9},
    {"ListenDrop", accepted, 1, 200},
    {"BadRST", closed, 1, 150},
    {"SCAdded", accepted, 1, 1},
    {"SCCompl", accepted, 1, 1},
    {"HCAdd", closed, 1, 2},
    {"SACKRecEpi", tcp_out, 1, 2600},
    {"SACKReXmt", tcp_out, 1, 1400},
    {"SACKReXmtB", tcp_out_data, 1, 1400},
    {"SACKRcvBlk", tcp_in, 1, 900},
    {"SACKSntBlk", tcp_in, 1, 700},
    {"CoalPkt", tcp_in, 1, 7},
    {"LRO2Pkt", tcp_in, 1, 22},
    {"LROMultiPkt", tcp_in, 1, 12},
    {"LROLargePkt", tcp_in, 1, 45},
    {"LimitedXmt", tcp_out, 1, 3200},
    {"TailLossTRO", tcp_out, 1, 5000},
    {"ReOrdPkt", tcp_in, 1, 1100},
    {"RecoveryPkt", tcp_out, 1, 1800},
    {"ProbTO", tcp_out, 1, 2400},
    {"TLPFastRecvr", tcp_out, 1, 7000},
    {"DSACKSnd", tcp_in, 1, 2200},
    {"DSACKRcv", tcp_out, 1, 3900},
    {"ECNCliSetup", initiated, 1, 1},
    {"ECNNegoSucc", initiated, 1, 3},
    {"ECNSvrSetup", accepted, 1, 2},
    {"ECNSvrNoSupt", initiated, 2, 3},
    {"TFOCkReq", initiated, 1, 12},
    {"TFOCkRcv", initiated, 1, 20},
    {"TmrDriftLE1Ms", tcp_out, 1, 15},
    {"TmrDriftLE10Ms", tcp_out, 1, 90},
    {"TmrDriftLE20Ms", tcp_out, 1, 800},
    {"TmrDriftLE50Ms", tcp_out, 1, 2500},
    {"TmrDriftLE100Ms", tcp_out, 1, 9000},
    {"TmrDriftLE200Ms", tcp_out, 1, 70'000},
};

constexpr ingredient udp_ingredients[] = {
    {"InPkt", udp_in, 1, 1},          {"BadCsum", udp_in, 1, 800'000}, {"NoPort", udp_in, 1, 9000},
    {"FullSock", udp_in, 1, 120'000}, {"PCBCacheMiss", udp_in, 1, 25}, {"PCBHashMiss", udp_in, 1, 9000},
    {"OutPkt", udp_out, 1, 1},        {"FastOut", udp_out, 1, 1},      {"FastOut", udp_out, -1, 40},
    {"NoCsum", udp_in, 1, 60},
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
    sources[ipv6 ? ip6_out : ip_out] = by_tcp.out.packets + by_udp.out.packets;
    sources[ipv6 ? ip6_in : ip_in] = by_tcp.in.packets + by_udp.in.packets;
    sources[tcp_out] += by_tcp.out.packets;
    sources[tcp_in] += by_tcp.in.packets;
    sources[tcp_out_data] += data_of(by_tcp.out);
    sources[tcp_in_data] += data_of(by_tcp.in);
    sources[udp_out] += by_udp.out.packets;
    sources[udp_in] += by_udp.in.packets;
  }
  sources[initiated] = seen.initiated;
  sources[accepted] = seen.accepted;
  sources[closed] = seen.closed;

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
