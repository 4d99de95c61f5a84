// The machine that the lab stands in for: one model, from which every table is made, so that the tables
// agree.

#ifndef TARVELCTL_LAB_WORLD_H
#define TARVELCTL_LAB_WORLD_H

#include <cstddef>
#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "common/tables/flow.h"
#include "common/tables/uuid.h"
#include "lab/addresses.h"
#include "lab/programs.h"
#include "lab/random.h"
#include "lab/traffic.h"

namespace lab {

inline constexpr std::uint32_t none = no_index;  // in place of an index, in tables too

// How much there is of everything. What has nothing to stand on is not made: no instance without a provider,
// no channel without a process, no flow without a channel of a flow switch.
struct sizes {
  std::uint32_t providers = 9;
  std::uint32_t nexuses = none;  // none: as many as fit the providers
  std::uint32_t channels = 28;
  std::uint32_t rings = 2;  // of each channel, to and fro together
  std::uint32_t flows = 60;
  std::uint32_t stacks =
      none;  // none: one for each channel that may have flows, one for each switch with such
  std::uint32_t arenas = 10;
  std::uint32_t namespaces = 14;
  std::uint32_t processes = 13;
};

struct process {
  std::int32_t pid;  // 0 while it does not run
  std::uint32_t program;
  std::uint32_t channels = 0;  // how many it has open
  bool crashed = false;        // it is no more, and its channels are not closed yet
  std::int32_t next_fd = 0;    // where no lower descriptor is free
  std::set<std::int32_t> free = {};
};

enum class nexus_kind : std::uint8_t { multistack, net_if, bridge, user_pipe, kernel_pipe, scratch_pipe };

// How many rows a table by kind has.
inline constexpr std::size_t nexus_kinds = static_cast<std::size_t>(nexus_kind::scratch_pipe) + 1;

struct provider {
  uuid id;
  nexus_kind kind;
  std::uint32_t ordinal;  // among those of its kind
  std::uint32_t first_nexus;
  std::uint32_t nexus_count;
};

struct nexus {
  uuid id;
  nexus_kind kind;
  bool alive;
  std::uint32_t ordinal;  // among those of its kind; also the number of its interface
  std::uint32_t first_channel;
  std::uint32_t channel_count;
  std::uint32_t interface = none;  // of a multistack one: the index of the interface below it
  std::uint32_t opened = 0;        // channels so far,
  std::uint32_t open = 0;          // and now
  two_way<traffic> moved;          // over its interface, or from and to its channels
  std::uint64_t lost[lost::reasons] = {};
  two_way<std::uint64_t> lost_now = {};  // in this step
  std::uint64_t aborted = 0;             // flows

  // Trouble, 0 where there is none.
  std::uint32_t loss = 0;    // of a million packets
  std::uint32_t delay = 0;   // microseconds
  std::uint32_t strays = 0;  // packets a second for a service that is no more
  std::uint32_t leaked = 0;  // thousandths of the usual memory for packets
};

struct channel {
  enum class phase : std::uint8_t { open, defunct, closed };
  static constexpr std::uint32_t device_port = 0;
  static constexpr std::uint32_t host_port = 1;
  static constexpr std::uint32_t slots = 512;  // of a ring

  uuid id;
  std::uint32_t nexus;
  std::uint32_t port;
  std::uint32_t process;
  std::uint32_t flow_switch;  // whose flows it may have, or none
  std::int32_t fd;
  phase state;
  bool reads_slowly = false;
  std::uint64_t due = 0;     // when a defunct one is closed, a closed one opened
  std::uint64_t errors = 0;  // packets lost for what the sender did to them
  two_way<meter> moved;
  two_way<traffic> now[2][2];    // of its flows in this step, by IPv6 and UDP,
  std::uint64_t resent_now = 0;  // and packets of these that were sent again
  stack_totals stack;            // of what its flows moved
};

// A multistack nexus with channels that may have flows.
struct flow_switch {
  std::uint32_t nexus;
  std::uint32_t first_route;
  std::uint32_t route_count;
  std::uint32_t hosts[address_kinds] = {};  // that it has talked to
  std::uint32_t advisories = 0;             // entries of its list
  std::vector<std::uint32_t> free_advisories;
  stack_totals closed;              // of channels that are no more
  std::uint32_t dead_route = none;  // that its programs try again and again
  std::uint32_t reserved = 0;       // ephemeral ports of its IPv4 address that someone else holds
};

struct route {
  std::uint32_t flow_switch;
  address_kind kind;
  bool on_link;
  bool answers;           // someone is there
  socket_address remote;  // without port
  std::uint32_t flows;    // that use it
  std::uint32_t used;     // how often, which makes the ports of its flows differ
  std::uint32_t rtt;      // microseconds
};

struct flow {
  uuid id;
  std::uint32_t channel;
  std::uint32_t route;  // none: it has no remote end
  const service *use;
  std::uint16_t local_port;
  std::uint16_t remote_port;
  std::uint8_t state;  // tcp::state
  std::uint8_t tries;  // without an answer
  bool ipv6;
  bool connected;          // its ends have, or had, a connection
  bool controlled;         // by its advisory,
  bool stalled;            // for good
  std::uint32_t advisory;  // index in the switch's list, or none
  std::uint32_t rtt;       // microseconds, 0: not measured
  two_way<std::uint32_t> packets_per_second;
  two_way<std::uint32_t> rest;  // thousandths of a packet
  two_way<traffic> moved;
  std::uint64_t due;   // when it does what its state wants next
  std::uint64_t ends;  // when its program has done with it
};

inline constexpr std::uint64_t never = UINT64_MAX;  // in place of a time

struct incident;

// Trouble that the machine gets into.
struct planned_incident {
  const incident *what;
  std::uint64_t begins;  // milliseconds after the world was made
  bool began = false;
};

struct world {
  sizes size;
  std::uint64_t seed;
  random_source random;

  std::vector<process> processes;
  std::vector<provider> providers;
  std::vector<nexus> nexuses;     // those of a provider stand together
  std::vector<channel> channels;  // those of a nexus stand together
  std::vector<flow_switch> switches;
  std::vector<route> routes;  // those of a switch stand together
  std::vector<flow> flows;

  std::vector<std::uint32_t> flow_channels;  // indexes of the channels that may have flows
  std::vector<std::uint32_t> multistacks;    // indexes of the multistack nexuses, by ordinal
  std::int32_t next_pid = 60;
  std::uint64_t elapsed = 0;  // milliseconds
  std::vector<planned_incident> incidents;

  // Since the world was published last; whoever publishes it forgets them.
  std::vector<std::uint32_t> started;  // indexes of processes
  std::vector<std::int32_t> ended;     // process ids that are no more
};

// The name of the interface of an instance, empty for a kind without any, and its number in the system.
std::string interface_name(nexus_kind kind, std::uint32_t ordinal);
std::uint32_t interface_index(nexus_kind kind, std::uint32_t ordinal);

// What a provider or an instance is called.
std::string registered_name(nexus_kind kind, std::uint32_t ordinal);

// A number that goes with an identity.
std::uint64_t key_of(const uuid &id);

// Whether others connect to what the owner of a channel does: it is not taken from a server.
bool is_server(const world &state, const channel &owned);

// The index of a process that runs the program: of the `instance`th one, if there are as many. On a small
// machine one process does the work of several programs; there must be one.
std::uint32_t process_for(const world &state, std::uint32_t program, std::uint32_t instance);

// The same for the same sizes and seed.
world make_world(const sizes &size, std::uint64_t seed);

// What happens in so many milliseconds, 1 at least, which is an interval of rates.
void advance(world &state, std::uint32_t milliseconds);

}  // namespace lab

#endif
