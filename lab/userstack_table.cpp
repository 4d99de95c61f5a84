// kern.tarvel.stats.userstack

#include <algorithm>

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Packets and bytes of data that left and arrived, what is left of those that left without those that were
// sent again, and behind them what was counted, by stack::event.
enum source { ip_tx, ip_rx, ip6_tx, ip6_rx, tx, rx, txd, rxd, fresh, freshd, udp_tx, udp_rx, sources_count };
constexpr int first_event = sources_count;

constexpr known_counter ip_known[] = {
    {"TotalRcvd", ip_rx}, {"Delivered", ip_rx}, {"LocalOut", ip_tx}, {"RxChn", ip_rx}, {"IPInPkt", ip_rx}};

constexpr derived_counter ip_derived[] = {
    {"Reassembled", "Delivered", 50'000, true}, {"FragRcvd", "Reassembled", 2, false},
    {"FragRcvd", "Reassembled", 2, false},      {"NoRoute", "LocalOut", 250'000, false},
    {"RxChnColl", "RxChn", 14, false},          {"RxChnGT2", "RxChn", 8, false},
    {"RxChnGT4", "RxChnGT2", 4, false}};

constexpr known_counter ip6_known[] = {
    {"TotalRcvd", ip6_rx}, {"Delivered", ip6_rx}, {"LocalOut", ip6_tx}, {"Fwd$Hit", ip6_tx}};

constexpr derived_counter ip6_derived[] = {{"Reassembled", "Delivered", 90'000, true},
                                           {"FrafRcvd", "Reassembled", 2, false},
                                           {"FrafRcvd", "Reassembled", 2, false},
                                           {"NoRoute", "LocalOut", 350'000, false},
                                           {"Fwd$Miss", "Fwd$Hit", 400, true}};

constexpr known_counter tcp_known[] = {{"ConnInit", first_event + stack::initiated},
                                       {"ConnAcpt", first_event + stack::accepted},
                                       {"ConnEst", first_event + stack::established},
                                       {"EConnDrop", first_event + stack::refused},
                                       {"DropTO", first_event + stack::timed_out},
                                       {"ConnDrop", first_event + stack::timed_out},
                                       {"ConnClosed", first_event + stack::closed},
                                       {"SndTotalPkt", tx},
                                       {"SndTotalDP", fresh},
                                       {"SndDataByte", freshd},
                                       {"SndDPktReXmt", first_event + stack::resent},
                                       {"SndDByteReXmt", first_event + stack::resent_bytes},
                                       {"ReXmtTO", first_event + stack::timeouts},
                                       {"RcvTotalPkt", rx},
                                       {"RcvPktInSeq", rx},
                                       {"RcvBInSeq", rxd},
                                       {"RcvAckByte", freshd},
                                       {"SCAdded", first_event + stack::accepted},
                                       {"SCCompl", first_event + stack::accepted},
                                       {"ECNCliSetup", first_event + stack::initiated}};

constexpr derived_counter tcp_derived[] = {{"SndAck", "SndTotalDP", 3, true},
                                           {"SndWinUpd", "SndAck", 10, true},
                                           {"SndCtlPkt", "SndWinUpd", 100, true},
                                           {"RcvAckPkt", "RcvPktInSeq", 4, true},
                                           {"RcvDupPkt", "RcvAckPkt", 100, true},
                                           {"RcvOOPkt", "RcvDupPkt", 2, true},
                                           {"RcvDupByte", "RcvBInSeq", 400, true},
                                           {"RcvOOByte", "RcvDupByte", 2, true},
                                           {"RcvDupAck", "RcvAckPkt", 30, false},
                                           {"RcvWinUpdPkt", "RcvAckPkt", 20, false},
                                           {"PredAck", "RcvTotalPkt", 5, false},
                                           {"PredData", "RcvTotalPkt", 2, false},
                                           {"Pcb$Miss", "RcvTotalPkt", 70, false},
                                           {"RTTTimed", "SndTotalPkt", 6, false},
                                           {"RTTUpdated", "SndTotalPkt", 6, false},
                                           {"DelayAck", "RcvTotalPkt", 9, false},
                                           {"KAProbe", "ConnClosed", 5, false},
                                           {"KATO", "KAProbe", 2, false},
                                           {"RTT$Upd", "ConnClosed", 2, false},
                                           {"RTTVar$Upd", "ConnClosed", 2, false},
                                           {"RTTUsed", "ConnInit", 3, false},
                                           {"RTTVarUsed", "ConnInit", 3, false},
                                           {"SACKRecEpi", "SndDPktReXmt", 9, false},
                                           {"SACKReXmt", "SndDPktReXmt", 5, false},
                                           {"SACKReXmtB", "SndDByteReXmt", 5, false},
                                           {"SACKRcvBlk", "RcvTotalPkt", 900, false},
                                           {"SACKSntBlk", "RcvTotalPkt", 700, false},
                                           {"CoalPkt", "RcvTotalPkt", 7, false},
                                           {"LRO2Pkt", "CoalPkt", 3, false},
                                           {"LROMultiPkt", "CoalPkt", 2, false},
                                           {"TailLossTRO", "SndDPktReXmt", 16, false},
                                           {"ReOrdPkt", "RcvOOPkt", 2, false},
                                           {"RecoveryPkt", "SndDPktReXmt", 6, false},
                                           {"ProbTO", "SndDPktReXmt", 8, false},
                                           {"ECNNegoSucc", "ECNCliSetup", 3, false},
                                           {"ECNSvrNoSupt", "ECNCliSetup", 2, false},
                                           {"TmrDriftLE1Ms", "SndTotalPkt", 15, false},
                                           {"TmrDriftLE10Ms", "SndTotalPkt", 90, false},
                                           {"TmrDriftLE20Ms", "SndTotalPkt", 800, false}};

constexpr known_counter udp_known[] = {{"InPkt", udp_rx},
                                       {"NoPort", first_event + stack::no_port},
                                       {"FullSock", first_event + stack::full_socket},
                                       {"OutPkt", udp_tx},
                                       {"FastOut", udp_tx}};

constexpr derived_counter udp_derived[] = {{"PCBCacheMiss", "InPkt", 25, false},
                                           {"NoCsum", "InPkt", 60, false}};

std::uint64_t data_of(const traffic &moved) {
  return moved.bytes - std::min(moved.bytes, segment_headers * moved.packets);
}

void put_stack(const nexus &carrier, std::int32_t pid, const stack_totals &seen, table_file &file) {
  static const counter_recipe ip(ip_counter_names, ip_known, ip_derived);
  static const counter_recipe ip6(ip6_counter_names, ip6_known, ip6_derived);
  static const counter_recipe tcp(tcp_counter_names, tcp_known, tcp_derived);
  static const counter_recipe udp(udp_counter_names, udp_known, udp_derived);

  std::uint64_t sources[first_event + stack::events] = {};
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
  sources[fresh] = sources[tx] - seen.count[stack::resent];
  sources[freshd] = sources[txd] - seen.count[stack::resent_bytes];
  std::ranges::copy(seen.count, sources + first_event);

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
