// Flows, their advisories, owners and routes, as the kern.tarvel.stats.flow* tables deliver them.

#ifndef TARVELCTL_COMMON_TABLES_FLOW_H
#define TARVELCTL_COMMON_TABLES_FLOW_H

#include <cstddef>
#include <cstdint>

#include "common/tables/description.h"
#include "common/tables/socket_address.h"
#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char flow_node[] = "kern.tarvel.stats.flow";
inline constexpr char flow_adv_node[] = "kern.tarvel.stats.flow_adv";
inline constexpr char flow_owner_node[] = "kern.tarvel.stats.flow_owner";
inline constexpr char flow_route_node[] = "kern.tarvel.stats.flow_route";

// In an index field: there is none.
inline constexpr std::uint32_t no_index = 0xffffffff;

inline constexpr value_names flow_states{"UNKNOWN",
                                         {{0, "CLOSED"},
                                          {1, "LISTEN"},
                                          {2, "SYN_SENT"},
                                          {3, "SYN_RCVD"},
                                          {4, "ESTABLISHED"},
                                          {5, "CLOSE_WAIT"},
                                          {6, "FIN_WAIT_1"},
                                          {7, "CLOSING"},
                                          {8, "LAST_ACK"},
                                          {9, "FIN_WAIT_2"},
                                          {10, "TIME_WAIT"},
                                          // Of flows without connection state.
                                          {20, "NO_TRAFFIC"},
                                          {21, "SINGLE"},
                                          {22, "MULTIPLE"}}};

// The name of an endpoint's state, or "UNKNOWN".
inline const format::name_text &flow_state_name(std::uint32_t state) {
  return flow_states.of(state);
}

inline constexpr value_names service_classes{"UNK",
                                             {{0x000000, "BE"},
                                              {0x080090, "BKS"},
                                              {0x100080, "BK"},
                                              {0x180010, "RD"},
                                              {0x200020, "OAM"},
                                              {0x280120, "AV"},
                                              {0x300110, "RV"},
                                              {0x380100, "VI"},
                                              {0x400180, "VO"},
                                              {0x480190, "CTL"}}};

// The label of a service class, or "UNK".
inline const format::name_text &svc_class_name(std::int32_t service_class) {
  return service_classes.of(service_class);
}

inline constexpr bit_names flow_flag_names =
    "\20"
    "\5t"
    "\6c"
    "\7l"
    "\11q"
    "\12b"
    "\15w"
    "\16e"
    "\31a"
    "\32n"
    "\33d"
    "\34o"
    "\37x"
    "\40r";

// The thirteen letters of a flow's flags and a blank.
inline format::name_text flow_flags_text(std::uint32_t flags) {
  static_assert(flow_flag_names.count < sizeof format::name_text::chars);
  format::name_text text;
  char *end = flags_text{flags, flow_flag_names}.append_to(text.chars);
  *end++ = ' ';
  text.end_at(end);
  return text;
}

inline constexpr bit_names route_flag_names =
    "\20"
    "\5o"
    "\6g"
    "\7r"
    "\10i"
    "\11d";

inline constexpr bit_names advisory_flag_names =
    "\20"
    "\1VALID"
    "\2CONTROLLED";

// An end of a flow.
struct tv_flow_endpoint_stats {
  std::uint64_t bytes;
  std::uint64_t packets;
  std::uint32_t state;
  std::uint32_t rtt;
  std::uint8_t reserved_24[40];
};

static_assert(sizeof(tv_flow_endpoint_stats) == 64);

// A flow. The table is an array of these.
struct tv_stats_flow {
  uuid sf_nx_uuid;
  text_field<16> sf_if_name;
  std::uint32_t sf_bucket;
  text_field<32> sf_proc_name;
  std::int32_t sf_pid;
  std::uint32_t sf_flags;
  std::uint32_t sf_nx_port;
  socket_address sf_local;
  socket_address sf_remote;
  std::uint8_t sf_protocol;
  std::uint8_t reserved_137[3];
  std::int32_t sf_svc;
  std::uint32_t sf_adv_idx;
  std::uint8_t reserved_148[4];
  tv_flow_endpoint_stats sf_lstats;
  tv_flow_endpoint_stats sf_rstats;
  std::uint8_t reserved_280[40];

  // Calls `visit` with the addresses of the local and the remote end, both of the local one's family. False
  // where that is neither IPv6 nor IPv4.
  template <class Visit>
  bool visit_addresses(Visit visit) const {
    if (sf_local.family == address_family::ipv6) {
      visit(sf_local.ipv6, sf_remote.ipv6);
      return true;
    }
    if (sf_local.family == address_family::ipv4) {
      visit(sf_local.ipv4, sf_remote.ipv4);
      return true;
    }
    return false;
  }
};

static_assert(sizeof(tv_stats_flow) == 320);

constexpr auto endpoint_rows(const row &whole) {
  using record = tv_flow_endpoint_stats;
  using enum field_kind;
  return join(
      ROW(bytes).is(counter, "bytes", "bytes so far").in("bytes").part_of(whole),
      ROW(packets).is(counter, "packets", "packets so far").in("packets").part_of(whole),
      ROW(state).is(enumeration, "state", "state of the end").of(flow_states).part_of(whole),
      ROW(rtt).is(gauge, "rtt_us", "round trip in us, 0: not measured").in("us").or_none(0).part_of(whole),
      ROW(reserved_24).part_of(whole));
}

inline constexpr auto flow_rows = [] {
  using record = tv_stats_flow;
  using enum field_kind;
  constexpr row family = ROW(sf_local.family);
  return join(
      ROW(sf_nx_uuid).is(identifier, "nexus", "UUID of the flow switch"),
      ROW(sf_if_name).is(interface, "interface", "name of the interface").identifying(),
      ROW(sf_bucket).is(number, "bucket", "bucket of the flow, or none").or_none(no_index),
      ROW(sf_proc_name).is(process, "process", "name of the owner"),
      ROW(sf_pid).is(pid, "pid", "process id of the owner").identifying(),
      ROW(sf_flags).is(flags, "flags", "flags of the flow").of(flow_flag_names),
      ROW(sf_nx_port).is(number, "port", "port of the nexus, or none").or_none(no_index),
      address_rows(ROW(sf_local).is(nested, "local", "local address and port").identifying(), family, true),
      address_rows(ROW(sf_remote).is(nested, "remote", "remote address and port").identifying(), family,
                   true),
      ROW(sf_protocol).is(enumeration, "protocol", "transport protocol").of(ip_protocols).identifying(),
      ROW(reserved_137), ROW(sf_svc).is(enumeration, "service_class", "service class").of(service_classes),
      ROW(sf_adv_idx).is(number, "advisory", "index of the advisory, or none").or_none(no_index),
      ROW(reserved_148), endpoint_rows(ROW(sf_lstats).is(nested, "tx", "local end, and what was sent")),
      endpoint_rows(ROW(sf_rstats).is(nested, "rx", "remote end, and what was received")), ROW(reserved_280));
}();
inline constexpr record_description flow_description =
    describe<tv_stats_flow>("tv_stats_flow", "flow", flow_rows);

struct tv_stats_flow_adv_entry {
  uuid sfae_flow_uuid;
  std::uint32_t sfae_flags;
};

// The advisories of a flow switch. Its entries, `sfa_entries`, follow, then the next record.
struct tv_stats_flow_adv {
  static constexpr std::uint32_t max_entries = 512;

  uuid sfa_nx_uuid;
  text_field<16> sfa_if_name;
  std::int32_t sfa_pid;
  std::uint32_t sfa_entries_count;

  // Bytes of `sfa_entries` behind the header.
  constexpr std::uint64_t trailing_size() const {
    return std::uint64_t{sfa_entries_count} * sizeof(tv_stats_flow_adv_entry);
  }
};

static_assert(sizeof(tv_stats_flow_adv) == 40);
static_assert(sizeof(tv_stats_flow_adv_entry) == 20);

inline constexpr auto advisory_entry_rows = [] {
  using record = tv_stats_flow_adv_entry;
  using enum field_kind;
  return join(ROW(sfae_flow_uuid).is(identifier, "flow", "UUID of the flow"),
              ROW(sfae_flags).is(flags, "flags", "flags of the advisory").of(advisory_flag_names));
}();
inline constexpr record_description advisory_entry_description =
    describe<tv_stats_flow_adv_entry>("tv_stats_flow_adv_entry", "entry", advisory_entry_rows);

inline constexpr auto advisory_rows = [] {
  using record = tv_stats_flow_adv;
  using enum field_kind;
  return join(ROW(sfa_nx_uuid).is(identifier, "nexus", "UUID of the flow switch"),
              ROW(sfa_if_name).is(interface, "interface", "name of the interface").identifying(),
              ROW(sfa_pid).is(pid, "pid", "process id").identifying(),
              ROW(sfa_entries_count).is(number, "entries", "entries that follow, up to 512"));
}();
inline constexpr follower advisory_followers[] = {{"entries", row_at(advisory_rows, "sfa_entries_count"),
                                                   &advisory_entry_description,
                                                   tv_stats_flow_adv::max_entries}};
inline constexpr record_description advisory_description =
    describe<tv_stats_flow_adv>("tv_stats_flow_adv", "flow_advisory", advisory_rows, advisory_followers);

// The owner of a nexus port. The table is an array of these.
struct tv_stats_flow_owner {
  uuid sfo_nx_uuid;
  text_field<16> sfo_if_name;
  std::uint32_t sfo_bucket;
  text_field<32> sfo_proc_name;
  std::int32_t sfo_pid;
  std::uint32_t sfo_nx_port;
  std::uint32_t sfo_pid_bound;
  std::uint32_t sfo_destroyed;
  std::uint8_t reserved_84[44];
};

static_assert(sizeof(tv_stats_flow_owner) == 128);

inline constexpr auto owner_rows = [] {
  using record = tv_stats_flow_owner;
  using enum field_kind;
  return join(ROW(sfo_nx_uuid).is(identifier, "nexus", "UUID of the flow switch"),
              ROW(sfo_if_name).is(interface, "interface", "name of the interface").identifying(),
              ROW(sfo_bucket).is(number, "bucket", "bucket of the owner, or none").or_none(no_index),
              ROW(sfo_proc_name).is(process, "process", "name of the owner"),
              ROW(sfo_pid).is(pid, "pid", "process id of the owner").identifying(),
              ROW(sfo_nx_port).is(number, "port", "port of the nexus").identifying(),
              ROW(sfo_pid_bound).is(boolean, "pid_bound", "not 0: bound to the process id"),
              ROW(sfo_destroyed).is(boolean, "destroyed", "not 0: destroyed"), ROW(reserved_84));
}();
inline constexpr record_description owner_description =
    describe<tv_stats_flow_owner>("tv_stats_flow_owner", "flow_owner", owner_rows);

// A flow route. The table is an array of these.
struct tv_stats_flow_route {
  static constexpr std::uint32_t has_gateway = route_flag_names.bit("g");
  static constexpr std::uint32_t has_mac = route_flag_names.bit("i");

  std::uint8_t reserved_0[32];
  text_field<16> sfr_if_name;
  std::uint32_t sfr_bidx;
  std::uint32_t sfr_ibidx;
  std::uint32_t sfr_flags;
  std::uint32_t sfr_refs;
  std::int64_t sfr_expire;
  socket_address sfr_local;
  socket_address sfr_remote;
  socket_address sfr_gateway;
  std::uint8_t reserved_156[36];
  std::uint8_t sfr_mac[6];
  std::uint8_t reserved_198[58];
};

static_assert(sizeof(tv_stats_flow_route) == 256);

inline constexpr auto route_rows = [] {
  using record = tv_stats_flow_route;
  using enum field_kind;
  constexpr row family = ROW(sfr_remote.family);
  constexpr row bits = ROW(sfr_flags).is(flags, "flags", "flags of the route").of(route_flag_names);
  return join(
      ROW(reserved_0), ROW(sfr_if_name).is(interface, "interface", "name of the interface").identifying(),
      ROW(sfr_bidx).is(number, "bidx", "bucket of the route"),
      ROW(sfr_ibidx).is(number, "ibidx", "second bucket of the route"), bits,
      ROW(sfr_refs).is(gauge, "refs", "reference count"),
      ROW(sfr_expire).is(gauge, "expire", "expiry, as the kernel keeps it"),
      address_rows(ROW(sfr_local).is(nested, "local", "local address").identifying(), family, false),
      address_rows(ROW(sfr_remote).is(nested, "remote", "remote address").identifying(), family, false),
      address_rows(ROW(sfr_gateway)
                       .is(nested, "gateway", "gateway, where flag 0x20 is set")
                       .where_bit(bits, record::has_gateway),
                   family, false),
      ROW(reserved_156),
      ROW(sfr_mac).is(mac, "mac", "next hop, where flag 0x80 is set").where_bit(bits, record::has_mac),
      ROW(reserved_198));
}();
inline constexpr record_description route_description =
    describe<tv_stats_flow_route>("tv_stats_flow_route", "flow_route", route_rows);

#endif
