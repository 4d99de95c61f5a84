// The machine that the lab stands in for: one model, from which every table is made, so that the tables
// agree.

#ifndef TARVELCTL_LAB_WORLD_H
#define TARVELCTL_LAB_WORLD_H

#include <cstdint>
#include <string>
#include <vector>

#include "common/uuid.h"
#include "lab/random.h"

namespace lab {

inline constexpr std::uint32_t none = 0xffffffff;  // in place of an index

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

enum class nexus_kind : std::uint8_t { multistack, net_if, bridge, user_pipe, kernel_pipe, scratch_pipe };

struct process {
  std::int32_t pid;
  std::uint32_t program;  // index into `programs`
};

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
};

struct world {
  sizes size;
  std::uint64_t seed;
  random_source random;

  std::vector<process> processes;
  std::vector<provider> providers;
  std::vector<nexus> nexuses;  // those of a provider stand together

  // Since the world was published last.
  std::vector<std::uint32_t> started;  // indexes of processes
  std::vector<std::int32_t> ended;     // process ids that are no more
};

// The name of the interface of an instance, empty for a kind without any, and its number in the system.
std::string interface_name(nexus_kind kind, std::uint32_t ordinal);
std::uint32_t interface_index(nexus_kind kind, std::uint32_t ordinal);

// The same for the same sizes and seed.
world make_world(const sizes &size, std::uint64_t seed);

// What happens in so many milliseconds.
void advance(world &state, std::uint32_t milliseconds);

}  // namespace lab

#endif
