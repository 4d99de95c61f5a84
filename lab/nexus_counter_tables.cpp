// kern.tarvel.stats.net_if and kern.tarvel.stats.flow_switch

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

enum source { tx, rx, source_count };  // packets over the interface

constexpr ingredient net_if_ingredients[] = {
    {"TxIRQ", tx, 1, 3},           {"TxSYNC", tx, 1, 4},         {"TxRepl", tx, 1, 25},
    {"TxPkt", tx, 1, 1},           {"RxIRQ", rx, 1, 5},          {"RxSYNC", rx, 1, 6},
    {"RxPkt", rx, 1, 1},           {"MitTxIRQ", tx, 1, 30},      {"MitRxIRQ", rx, 1, 18},
    {"NoMemPkt", rx, 1, 700'000},  {"BadLen", rx, 1, 2'000'000}, {"Dropped", rx, 1, 700'000},
    {"Dropped", rx, 1, 2'000'000}, {"TxCopyDirect", tx, 1, 1},   {"TxCopyDirect", tx, -1, 10},
    {"TxCopyMbuf", tx, 1, 10},     {"TxCopyMbuf", tx, -1, 40},   {"TxCopySum", tx, 1, 40},
    {"RxCopyDirect", rx, 1, 1},    {"RxCopyDirect", rx, -1, 8},  {"RxCopyAttach", rx, 1, 8},
    {"RxCopyAttach", rx, -1, 40},  {"RxCopySum", rx, 1, 40},     {"TxIRQBusy", tx, 1, 4000},
    {"TxIRQAgain", tx, 1, 9000},   {"RxIRQBusy", rx, 1, 6000},   {"RxIRQAgain", rx, 1, 15'000},
};

constexpr ingredient flow_switch_ingredients[] = {
    {"Dropped", rx, 1, 9000},
    {"Dropped", rx, 1, 350'000},
    {"Dropped", tx, 1, 500'000},
    {"TxCopyDirect", tx, 1, 1},
    {"TxCopyDirect", tx, -1, 30},
    {"TxCopySum", tx, 1, 30},
    {"RxCopyDirect", rx, 1, 1},
    {"RxCopyDirect", rx, -1, 25},
    {"RxCopySum", rx, 1, 25},
    {"RxLookupNoMatch", rx, 1, 9000},
    {"FlowsAborted", tx, 1, 250'000},
    {"RxLookupTornDown", rx, 1, 120'000},
    {"ResolvePending", tx, 1, 60'000},
    {"ResolveStale", tx, 1, 200'000},
    {"DestNexusPortDefunct", rx, 1, 350'000},
    {"FragRxV4", rx, 2, 80'000},
    {"FragRxV6", rx, 2, 160'000},
    {"FragReassed", rx, 1, 80'000},
    {"FragReassed", rx, 1, 160'000},
    {"TxEnqueueDrop", tx, 1, 500'000},
};

template <class Record>
void put_counters(const nexus &place, const two_way<traffic> &moved, const counter_recipe &recipe,
                  table_file &file) {
  Record record{};
  record.head.nx_uuid = place.id;
  set_text(record.head.name, interface_name(place.kind, place.ordinal));
  const std::uint64_t sources[source_count] = {moved.out.packets, moved.in.packets};
  recipe.fill(record.counters, sources);
  file.put(record);
}

}  // namespace

// What passes a flow switch passes its interface.
void write_net_ifs(const world &state, table_file &file) {
  static const counter_recipe recipe(net_if_counter_names, net_if_ingredients);
  for (const nexus &place : state.nexuses) {
    if (place.kind != nexus_kind::net_if) continue;
    const bool carries_switch =
        place.ordinal < state.multistacks.size() && state.multistacks[place.ordinal] != none;
    const nexus &busy = carries_switch ? state.nexuses[state.multistacks[place.ordinal]] : place;
    put_counters<tv_stats_net_if>(place, busy.moved, recipe, file);
  }
}

void write_flow_switches(const world &state, table_file &file) {
  static const counter_recipe recipe(flow_switch_counter_names, flow_switch_ingredients);
  for (const nexus &place : state.nexuses) {
    if (place.kind != nexus_kind::multistack && place.kind != nexus_kind::bridge) continue;
    put_counters<tv_stats_flow_switch>(place, place.moved, recipe, file);
  }
}

}  // namespace lab
