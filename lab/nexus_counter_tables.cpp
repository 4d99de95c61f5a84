// kern.tarvel.stats.net_if and kern.tarvel.stats.flow_switch

#include <algorithm>

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Packets that were moved, flows that were given up, and behind them packets lost, by lost::reason.
constexpr int tx = 0, rx = 1, aborted = 2, first_lost = 3;

constexpr known_counter net_if_known[] = {{"TxPkt", tx},
                                          {"RxPkt", rx},
                                          {"TxCopyDirect", tx},
                                          {"RxCopyDirect", rx},
                                          {"Dropped", first_lost + lost::no_memory},
                                          {"Dropped", first_lost + lost::bad_length},
                                          {"Dropped", first_lost + lost::not_sent},
                                          {"NoMemPkt", first_lost + lost::no_memory},
                                          {"BadLen", first_lost + lost::bad_length},
                                          {"TxEnqueueDrop", first_lost + lost::not_sent}};

constexpr derived_counter net_if_derived[] = {
    {"TxIRQ", "TxPkt", 3, false},           {"TxSYNC", "TxPkt", 4, false},
    {"TxRepl", "TxPkt", 25, false},         {"RxIRQ", "RxPkt", 5, false},
    {"RxSYNC", "RxPkt", 6, false},          {"MitTxIRQ", "TxIRQ", 10, false},
    {"MitRxIRQ", "RxIRQ", 4, false},        {"TxCopyMbuf", "TxCopyDirect", 10, true},
    {"TxCopySum", "TxCopyMbuf", 4, true},   {"RxCopyAttach", "RxCopyDirect", 8, true},
    {"RxCopySum", "RxCopyAttach", 5, true}, {"TxIRQBusy", "TxIRQ", 1300, false},
    {"TxIRQAgain", "TxIRQ", 3000, false},   {"RxIRQBusy", "RxIRQ", 1200, false},
    {"RxIRQAgain", "RxIRQ", 3000, false}};

constexpr known_counter flow_switch_known[] = {{"TxCopyDirect", tx},
                                               {"RxCopyDirect", rx},
                                               {"FlowsAborted", aborted},
                                               {"Dropped", first_lost + lost::no_match},
                                               {"Dropped", first_lost + lost::torn_down},
                                               {"Dropped", first_lost + lost::port_defunct},
                                               {"Dropped", first_lost + lost::no_space},
                                               {"Dropped", first_lost + lost::no_memory},
                                               {"Dropped", first_lost + lost::bad_length},
                                               {"Dropped", first_lost + lost::not_sent},
                                               {"RxLookupNoMatch", first_lost + lost::no_match},
                                               {"RxLookupTornDown", first_lost + lost::torn_down},
                                               {"DestNexusPortDefunct", first_lost + lost::port_defunct},
                                               {"DestKrSpaceDrop", first_lost + lost::no_space},
                                               {"NoMemPkt", first_lost + lost::no_memory},
                                               {"BadLenPkt", first_lost + lost::bad_length},
                                               {"TxEnqueueDrop", first_lost + lost::not_sent}};

constexpr derived_counter flow_switch_derived[] = {{"TxCopySum", "TxCopyDirect", 30, true},
                                                   {"RxCopySum", "RxCopyDirect", 25, true},
                                                   {"ResolvePending", "TxCopyDirect", 60'000, false},
                                                   {"ResolveStale", "TxCopyDirect", 200'000, false},
                                                   {"FragReassed", "RxCopyDirect", 80'000, false},
                                                   {"FragRxV4", "FragReassed", 2, false},
                                                   {"FragRxV4", "FragReassed", 2, false},
                                                   {"FragRxV6", "FragReassed", 3, false},
                                                   {"FragRxV6", "FragReassed", 3, false}};

template <class Record>
void put_counters(const nexus &place, const counter_recipe &recipe, table_file &file) {
  Record record{};
  record.head.nx_uuid = place.id;
  set_text(record.head.name, interface_name(place.kind, place.ordinal));
  std::uint64_t sources[first_lost + lost::reasons] = {place.moved.out.packets, place.moved.in.packets,
                                                       place.aborted};
  std::ranges::copy(place.lost, sources + first_lost);
  recipe.fill(record.counters, sources, key_of(place.id));
  file.put(record);
}

}  // namespace

void write_net_ifs(const world &state, table_file &file) {
  static const counter_recipe recipe(net_if_counter_names, net_if_known, net_if_derived);
  for (const nexus &place : state.nexuses) {
    if (place.kind == nexus_kind::net_if) put_counters<tv_stats_net_if>(place, recipe, file);
  }
}

void write_flow_switches(const world &state, table_file &file) {
  static const counter_recipe recipe(flow_switch_counter_names, flow_switch_known, flow_switch_derived);
  for (const nexus &place : state.nexuses) {
    if (place.kind != nexus_kind::multistack && place.kind != nexus_kind::bridge) continue;
    put_counters<tv_stats_flow_switch>(place, recipe, file);
  }
}

}  // namespace lab
