// kern.tarvel.stats.net_if and kern.tarvel.stats.flow_switch

#include <algorithm>

#include "common/tables/counters.h"
#include "lab/counter_recipe.h"
#include "lab/tables.h"

namespace lab {

namespace {

// Packets that were moved, flows that were given up, and packets lost, in the order of lost::reason.
enum source { tx, rx, given_up, miss, torn, dead, full, mem, len, unsent, source_count };
static_assert(source_count == miss + int{lost::reasons});

constexpr ingredient net_if_ingredients[] = {
    {"TxPkt", tx, 1},
    {"TxIRQ", tx, 3},
    {"TxSYNC", tx, 4},
    {"TxRepl", tx, 25},
    {"MitTxIRQ", tx, 30},
    {"RxPkt", rx, 1},
    {"RxIRQ", rx, 5},
    {"RxSYNC", rx, 6},
    {"MitRxIRQ", rx, 18},
    {"TxCopyDirect", tx, 1},
    {"RxCopyDirect", rx, 1},
    {"Dropped", mem, 1},
    {"Dropped", len, 1},
    {"Dropped", unsent, 1},
    {"NoMemPkt", mem, 1},
    {"BadLen", len, 1},
    {"TxEnqueueDrop", unsent, 1},
    {"TxIRQBusy", tx, 4000},
    {"TxIRQAgain", tx, 9000},
    {"RxIRQBusy", rx, 6000},
    {"RxIRQAgain", rx, 15'000},
};

constexpr part net_if_parts[] = {{"TxCopyMbuf", "TxCopyDirect", 10},
                                 {"TxCopySum", "TxCopyMbuf", 4},
                                 {"RxCopyAttach", "RxCopyDirect", 8},
                                 {"RxCopySum", "RxCopyAttach", 5}};

constexpr ingredient flow_switch_ingredients[] = {
    {"TxCopyDirect", tx, 1},
    {"RxCopyDirect", rx, 1},
    {"FlowsAborted", given_up, 1},
    {"Dropped", miss, 1},
    {"Dropped", torn, 1},
    {"Dropped", dead, 1},
    {"Dropped", full, 1},
    {"Dropped", mem, 1},
    {"Dropped", len, 1},
    {"Dropped", unsent, 1},
    {"RxLookupNoMatch", miss, 1},
    {"RxLookupTornDown", torn, 1},
    {"DestNexusPortDefunct", dead, 1},
    {"DestKrSpaceDrop", full, 1},
    {"NoMemPkt", mem, 1},
    {"BadLenPkt", len, 1},
    {"TxEnqueueDrop", unsent, 1},
    {"ResolvePending", tx, 60'000},
    {"ResolveStale", tx, 200'000},
    {"FragRxV4", rx, 40'000},
    {"FragRxV6", rx, 80'000},
    {"FragReassed", rx, 160'000},
};

constexpr part flow_switch_parts[] = {{"TxCopySum", "TxCopyDirect", 30}, {"RxCopySum", "RxCopyDirect", 25}};

template <class Record>
void put_counters(const nexus &place, const counter_recipe &recipe, table_file &file) {
  Record record{};
  record.head.nx_uuid = place.id;
  set_text(record.head.name, interface_name(place.kind, place.ordinal));
  std::uint64_t sources[source_count] = {place.moved.out.packets, place.moved.in.packets, place.aborted};
  std::ranges::copy(place.lost, sources + miss);
  recipe.fill(record.counters, sources, key_of(place.id));
  file.put(record);
}

}  // namespace

void write_net_ifs(const world &state, table_file &file) {
  static const counter_recipe recipe(net_if_counter_names, net_if_ingredients, net_if_parts);
  for (const nexus &place : state.nexuses) {
    if (place.kind == nexus_kind::net_if) put_counters<tv_stats_net_if>(place, recipe, file);
  }
}

void write_flow_switches(const world &state, table_file &file) {
  static const counter_recipe recipe(flow_switch_counter_names, flow_switch_ingredients, flow_switch_parts);
  for (const nexus &place : state.nexuses) {
    if (place.kind != nexus_kind::multistack && place.kind != nexus_kind::bridge) continue;
    put_counters<tv_stats_flow_switch>(place, recipe, file);
  }
}

}  // namespace lab
