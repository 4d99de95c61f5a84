// Flows, their advisories, owners and routes, as the kern.tarvel.stats.flow* tables deliver them.

#ifndef TARVELCTL_COMMON_TABLES_FLOW_H
#define TARVELCTL_COMMON_TABLES_FLOW_H

#include <cstddef>
#include <cstdint>

#include "common/tables/socket_address.h"
#include "common/tables/uuid.h"
#include "common/text/text.h"

inline constexpr char flow_node[] = "kern.tarvel.stats.flow";
inline constexpr char flow_adv_node[] = "kern.tarvel.stats.flow_adv";
inline constexpr char flow_owner_node[] = "kern.tarvel.stats.flow_owner";
inline constexpr char flow_route_node[] = "kern.tarvel.stats.flow_route";

// In an index field: there is none.
inline constexpr std::uint32_t no_index = 0xffffffff;

struct tv_flow_endpoint_stats {
  std::uint64_t bytes;
  std::uint64_t packets;
  std::uint32_t state;  // flow_state_name
  std::uint32_t rtt;    // microseconds; 0: not measured
  std::uint8_t reserved_24[40];
};

static_assert(sizeof(tv_flow_endpoint_stats) == 64);
static_assert(offsetof(tv_flow_endpoint_stats, bytes) == 0);
static_assert(offsetof(tv_flow_endpoint_stats, packets) == 8);
static_assert(offsetof(tv_flow_endpoint_stats, state) == 16);
static_assert(offsetof(tv_flow_endpoint_stats, rtt) == 20);

// A flow. The table is an array of these.
struct tv_stats_flow {
  uuid sf_nx_uuid;  // the flow switch that carries the flow
  text_field<16> sf_if_name;
  std::uint32_t sf_bucket;  // or no_index
  text_field<32> sf_proc_name;
  std::int32_t sf_pid;
  std::uint32_t sf_flags;    // flow_flags_text
  std::uint32_t sf_nx_port;  // or no_index
  socket_address sf_local;   // its family holds for both endpoints
  socket_address sf_remote;  // its family is not read
  std::uint8_t sf_protocol;  // IP protocol number
  std::uint8_t reserved_137[3];
  std::int32_t sf_svc;       // svc_class_name
  std::uint32_t sf_adv_idx;  // among the advisory entries of the nexus, or no_index
  std::uint8_t reserved_148[4];
  tv_flow_endpoint_stats sf_lstats;  // outgoing traffic
  tv_flow_endpoint_stats sf_rstats;  // incoming traffic
  std::uint8_t reserved_280[40];
};

static_assert(sizeof(tv_stats_flow) == 320);
static_assert(offsetof(tv_stats_flow, sf_if_name) == 16);
static_assert(offsetof(tv_stats_flow, sf_bucket) == 32);
static_assert(offsetof(tv_stats_flow, sf_proc_name) == 36);
static_assert(offsetof(tv_stats_flow, sf_pid) == 68);
static_assert(offsetof(tv_stats_flow, sf_flags) == 72);
static_assert(offsetof(tv_stats_flow, sf_nx_port) == 76);
static_assert(offsetof(tv_stats_flow, sf_local) == 80);
static_assert(offsetof(tv_stats_flow, sf_remote) == 108);
static_assert(offsetof(tv_stats_flow, sf_protocol) == 136);
static_assert(offsetof(tv_stats_flow, sf_svc) == 140);
static_assert(offsetof(tv_stats_flow, sf_adv_idx) == 144);
static_assert(offsetof(tv_stats_flow, sf_lstats) == 152);
static_assert(offsetof(tv_stats_flow, sf_rstats) == 216);

// The advisories of a flow switch. Its entries, `sfa_entries`, follow, then the next record.
struct tv_stats_flow_adv {
  static constexpr std::uint32_t max_entries = 512;

  uuid sfa_nx_uuid;
  text_field<16> sfa_if_name;
  std::int32_t sfa_pid;
  std::uint32_t sfa_entries_count;

  // Bytes of `sfa_entries` behind the header.
  std::uint64_t trailing_size() const;
};

struct tv_stats_flow_adv_entry {
  static constexpr std::uint32_t valid = 1;  // bits of `sfae_flags`
  static constexpr std::uint32_t controlled = 2;

  uuid sfae_flow_uuid;
  std::uint32_t sfae_flags;
};

inline std::uint64_t tv_stats_flow_adv::trailing_size() const {
  return std::uint64_t{sfa_entries_count} * sizeof(tv_stats_flow_adv_entry);
}

static_assert(sizeof(tv_stats_flow_adv) == 40);
static_assert(offsetof(tv_stats_flow_adv, sfa_if_name) == 16);
static_assert(offsetof(tv_stats_flow_adv, sfa_pid) == 32);
static_assert(offsetof(tv_stats_flow_adv, sfa_entries_count) == 36);
static_assert(sizeof(tv_stats_flow_adv_entry) == 20);
static_assert(offsetof(tv_stats_flow_adv_entry, sfae_flags) == 16);

// The owner of a nexus port. The table is an array of these.
struct tv_stats_flow_owner {
  uuid sfo_nx_uuid;
  text_field<16> sfo_if_name;
  std::uint32_t sfo_bucket;
  text_field<32> sfo_proc_name;
  std::int32_t sfo_pid;
  std::uint32_t sfo_nx_port;
  std::uint32_t sfo_pid_bound;  // not 0: bound to the process id
  std::uint32_t sfo_destroyed;  // not 0: destroyed
  std::uint8_t reserved_84[44];
};

static_assert(sizeof(tv_stats_flow_owner) == 128);
static_assert(offsetof(tv_stats_flow_owner, sfo_if_name) == 16);
static_assert(offsetof(tv_stats_flow_owner, sfo_bucket) == 32);
static_assert(offsetof(tv_stats_flow_owner, sfo_proc_name) == 36);
static_assert(offsetof(tv_stats_flow_owner, sfo_pid) == 68);
static_assert(offsetof(tv_stats_flow_owner, sfo_nx_port) == 72);
static_assert(offsetof(tv_stats_flow_owner, sfo_pid_bound) == 76);
static_assert(offsetof(tv_stats_flow_owner, sfo_destroyed) == 80);

// A flow route. The table is an array of these.
struct tv_stats_flow_route {
  static constexpr std::uint32_t has_gateway = 0x20;  // bits of `sfr_flags`
  static constexpr std::uint32_t has_mac = 0x80;

  std::uint8_t reserved_0[32];
  text_field<16> sfr_if_name;
  std::uint32_t sfr_bidx;
  std::uint32_t sfr_ibidx;
  std::uint32_t sfr_flags;
  std::uint32_t sfr_refs;
  std::int64_t sfr_expire;
  socket_address sfr_local;
  socket_address sfr_remote;   // its family holds for all three addresses
  socket_address sfr_gateway;  // where has_gateway is set
  std::uint8_t reserved_156[36];
  std::uint8_t sfr_mac[6];  // of the next hop, where has_mac is set
  std::uint8_t reserved_198[58];
};

static_assert(sizeof(tv_stats_flow_route) == 256);
static_assert(offsetof(tv_stats_flow_route, sfr_if_name) == 32);
static_assert(offsetof(tv_stats_flow_route, sfr_bidx) == 48);
static_assert(offsetof(tv_stats_flow_route, sfr_ibidx) == 52);
static_assert(offsetof(tv_stats_flow_route, sfr_flags) == 56);
static_assert(offsetof(tv_stats_flow_route, sfr_refs) == 60);
static_assert(offsetof(tv_stats_flow_route, sfr_expire) == 64);
static_assert(offsetof(tv_stats_flow_route, sfr_local) == 72);
static_assert(offsetof(tv_stats_flow_route, sfr_remote) == 100);
static_assert(offsetof(tv_stats_flow_route, sfr_gateway) == 128);
static_assert(offsetof(tv_stats_flow_route, sfr_mac) == 192);

#endif
